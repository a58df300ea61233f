// Whatever the record's reader takes is written and read again as the same record; what it refuses is refused within
// the bytes given.
#include "backends/AudioIssueDetected.h"

#include <cstdint>
#include <cstdlib>
#include <iostream>
#include <string>

namespace {

void require(bool holds, const char* what) {
    if (!holds) {
        std::cerr << what << '\n';
        std::abort();
    }
}

std::string bytesOf(const vela::telemmetrics::AudioIssueDetected& record) {
    vela::telemmetrics::RecordWriter writer;
    record.writeTo(writer);
    return writer.bytes();
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    using namespace vela::telemmetrics;
    const std::string bytes(data, data + size);
    RecordReader reader(bytes);
    AudioIssueDetected first;
    const bool read = first.readFrom(reader);
    require(read != reader.hasError(), "the answer is not the reader's");
    require(first.issuetype.size() + first.node.size() + first.rtaidclient.size() <= size, "texts from nowhere");

    // Also after an error the record is a whole one.
    const std::string written = bytesOf(first);
    RecordReader again(written);
    AudioIssueDetected second;
    require(second.readFrom(again), "what was written is refused");
    require(second == first, "what was written is another record");
    require(hash_value(second) == hash_value(first), "equal records with different hashes");
    require(bytesOf(second) == written, "equal records with different bytes");
    return 0;
}
