// The record's bytes against an independent reader of the wire format: the protobuf compiler's own decoder.
#include "backends/AudioIssueDetected.h"
#include "testing/RunProgram.h"
#include "testing/TemporaryFolder.h"

#include <fstream>
#include <gtest/gtest.h>
#include <string>

namespace vela::telemmetrics {

namespace {

constexpr const char* kSchema = R"(syntax = "proto2";
message AudioIssueDetected {
  optional uint64 timestamp = 1;
  required int32 duration = 2;
  required string issuetype = 3;
  required string node = 4;
  required string rtaidclient = 5;
}
)";

/// What `protoc` reads from the record's bytes; its complaint where it fails.
std::string decoded(const AudioIssueDetected& record) {
    const testing::TemporaryFolder folder;
    std::ofstream(folder / "record.proto") << kSchema;
    RecordWriter writer;
    record.writeTo(writer);
    std::ofstream(folder / "record.bin", std::ios::binary) << writer.bytes();
    const testing::ProgramRun run = testing::runProgram(
        {"/bin/sh", "-c", "exec \"$0\" --proto_path=\"$1\" --decode=AudioIssueDetected record.proto <\"$1/record.bin\"",
         VELA_PROTOC, folder.path()},
        {});
    return run.status == 0 ? run.out : run.error;
}

TEST(AudioIssueDetectedIntegrationTest, AFreshRecordIsDecoded) {
    EXPECT_EQ(decoded({}), "duration: 0\nissuetype: \"\"\nnode: \"\"\nrtaidclient: \"\"\n");
}

TEST(AudioIssueDetectedIntegrationTest, EveryFieldIsDecoded) {
    AudioIssueDetected record;
    record.issuetype = "silence";
    record.node = "T\xC3\xB6n";
    record.rtaidclient = std::string(200, 'r');
    record.timestamp = 18446744073709551615U;
    record.presence = AudioIssueDetected::kTimestampPresent;
    record.duration = -2147483647 - 1;
    EXPECT_EQ(decoded(record), "timestamp: 18446744073709551615\nduration: -2147483648\nissuetype: \"silence\"\n"
                               "node: \"T\\303\\266n\"\nrtaidclient: \"" +
                                   std::string(200, 'r') + "\"\n");
}

} // namespace

} // namespace vela::telemmetrics
