#include "platform/linux/LinuxFileSystem.h"
#include "platform/sqlite/SnapshotFolder.h"
#include "platform/sqlite/StoreHarness_test.h"
#include "platform/sqlite/StoreMalady.h"

#include <algorithm>
#include <filesystem>
#include <fstream>
#include <future>
#include <gmock/gmock.h>
#include <iterator>

namespace vela::platform {

namespace {

using ::testing::Contains;
using ::testing::ElementsAre;
using ::testing::Not;

const MaladySignature kSignature{.domain = "AudioAnalytics",
                                 .type = "haptics",
                                 .subType = "playback",
                                 .subtypeContext = "Joule",
                                 .detectedProcess = "game",
                                 .triggerThresholdValues = std::nullopt};
const std::string kSignatureJson = R"({"domain":"AudioAnalytics","type":"haptics","subType":"playback",)"
                                   R"("subtypeContext":"Joule","detectedProcess":"game"})";

std::string contentOf(const std::string& path) {
    std::ifstream file(path, std::ios::binary);
    return {std::istreambuf_iterator<char>(file), std::istreambuf_iterator<char>()};
}

class StoreMaladyTest : public StoreHarness {
protected:
    /// Asks for a snapshot and waits for the reply.
    Dictionary snapshot(StoreMalady& malady, const MaladySignature& signature = kSignature) {
        std::promise<Dictionary> reply;
        malady.createReporter()->requestSnapshot(signature, 0, std::nullopt, std::nullopt,
                                                 [&reply](const Dictionary& response) { reply.set_value(response); });
        return reply.get_future().get();
    }
    std::string snapshots() const { return folder_ / "snapshots"; }

    LinuxFileSystem files_;
    const std::unique_ptr<DeliveryStore> store_ = openStore();
    StoreMalady malady_{*store_,
                        files_,
                        {.folder = snapshots(),
                         .sessions =
                             [] {
                                 return Array{Value(Dictionary{{"reporterID", 42}})};
                             },
                         .log =
                             [] {
                                 return std::vector<std::string>{"first", "second"};
                             }}};
};

TEST_F(StoreMaladyTest, ASnapshotIsARecordAndAFile) {
    const std::string path = snapshots() + "/20231114T221320Z-1.json";
    EXPECT_EQ(snapshot(malady_), (Dictionary{{"path", std::string_view(path)}, {"state", "stored"}}));
    EXPECT_THAT(query("SELECT backend, operation, session_id, payload FROM deliveries"),
                ElementsAre("malady|snapshot|NULL|{\"signature\":" + kSignatureJson + ",\"seconds\":0.0,\"path\":\"" +
                            path + "\"}"));
    EXPECT_EQ(contentOf(path), R"({
  "time": "2023-11-14T22:13:20Z",
  "signature": {
    "domain": "AudioAnalytics",
    "type": "haptics",
    "subType": "playback",
    "subtypeContext": "Joule",
    "detectedProcess": "game"
  },
  "seconds": 0.0,
  "sessions": [
    {
      "reporterID": 42
    }
  ],
  "log": [
    "first",
    "second"
  ]
}
)");
}

// The harness's store commits after an hour: that the reply comes shows that a snapshot does not wait.
TEST_F(StoreMaladyTest, TheReplyComesWhenTheRecordIsCommitted) {
    std::promise<std::vector<std::string>> rows;
    malady_.createReporter()->requestSnapshot(kSignature, 0, std::nullopt, std::nullopt, [&](const Dictionary&) {
        rows.set_value(query("SELECT operation FROM deliveries"));
    });
    EXPECT_THAT(rows.get_future().get(), ElementsAre("snapshot"));
}

TEST_F(StoreMaladyTest, ThresholdsEventAndPayloadAreKept) {
    MaladySignature signature = kSignature;
    signature.triggerThresholdValues = "2";
    std::promise<void> replied;
    malady_.createReporter()->requestSnapshot(signature, 1.5, Dictionary{{"e", 1}}, Dictionary{{"p", 2}},
                                              [&](const Dictionary&) { replied.set_value(); });
    replied.get_future().get();
    EXPECT_THAT(query("SELECT payload ->> '$.signature.triggerThresholdValues', payload -> '$.seconds', "
                      "payload -> '$.event', payload -> '$.payload' FROM deliveries"),
                ElementsAre(R"(2|1.5|{"e":1}|{"p":2})"));
}

TEST_F(StoreMaladyTest, ASnapshotIsCountedOnItsCallersAccount) {
    const auto entry = ledger_.open(7, 42);
    const LedgerScope scope(entry);
    snapshot(malady_);
    EXPECT_EQ(entry->counts(DeliveryBackend::Malady), (LedgerCounts{.received = 1, .delivered = 1}));
    EXPECT_THAT(query("SELECT session_id FROM deliveries"), ElementsAre("42"));
}

TEST_F(StoreMaladyTest, AFileThatCannotBeWrittenIsToldAndTheRecordIsKept) {
    StoreMalady malady(*store_, files_, {.folder = "/proc/nowhere", .sessions = {}, .log = {}});
    const Dictionary reply = snapshot(malady);
    EXPECT_EQ(reply.find("state"), Value("stored"));
    EXPECT_FALSE(reply.contains("path"));
    EXPECT_TRUE(reply.contains("error"));
    EXPECT_THAT(query("SELECT payload ->> '$.error' IS NOT NULL FROM deliveries"), ElementsAre("1"));
}

TEST_F(StoreMaladyTest, AClosedStoreAnswersThatNothingWasStored) {
    store_->close();
    EXPECT_EQ(snapshot(malady_), (Dictionary{{"state", "dropped"}}));
    EXPECT_EQ(dropped(ledger_.own(), DeliveryBackend::Malady, DropReason::Restart), 1U);
}

TEST_F(StoreMaladyTest, AReplyIsOptional) {
    malady_.createReporter()->requestSnapshot(kSignature, 0, std::nullopt, std::nullopt, {});
    ASSERT_TRUE(store_->commitAll());
    EXPECT_THAT(query("SELECT operation FROM deliveries"), ElementsAre("snapshot"));
}

class SnapshotFolderTest : public ::testing::Test {
protected:
    std::vector<std::string> names() const {
        std::vector<std::string> names;
        for (const auto& file : std::filesystem::directory_iterator(path_)) {
            names.push_back(file.path().filename());
        }
        std::ranges::sort(names);
        return names;
    }

    vela::testing::TemporaryFolder temporary_;
    const std::string path_ = temporary_ / "snapshots";
    LinuxFileSystem files_;
    SnapshotFolder folder_{path_, files_};
    const WallTime time_ = vela::testing::ManualClock().now();
};

TEST_F(SnapshotFolderTest, FilesOfOneSecondAreNumbered) {
    EXPECT_EQ(*folder_.write(time_, "a"), path_ + "/20231114T221320Z-1.json");
    EXPECT_EQ(*folder_.write(time_, "b"), path_ + "/20231114T221320Z-2.json");
    EXPECT_EQ(contentOf(path_ + "/20231114T221320Z-1.json"), "a");
    EXPECT_EQ(contentOf(path_ + "/20231114T221320Z-2.json"), "b");
}

TEST_F(SnapshotFolderTest, TheNewestFilesAreKept) {
    for (int second = 0; second < 40; ++second) {
        ASSERT_TRUE(folder_.write(time_ + std::chrono::seconds(second), "x"));
    }
    const std::vector<std::string> left = names();
    EXPECT_EQ(left.size(), 32U);
    EXPECT_EQ(left.front(), "20231114T221328Z-1.json");
    EXPECT_EQ(left.back(), "20231114T221359Z-1.json");
}

TEST_F(SnapshotFolderTest, TheTenthFileOfASecondIsNewerThanTheSecond) {
    for (int number = 0; number < 33; ++number) {
        ASSERT_TRUE(folder_.write(time_, "x"));
    }
    EXPECT_THAT(names(), Not(Contains("20231114T221320Z-1.json")));
    EXPECT_THAT(names(), Contains("20231114T221320Z-33.json"));
}

TEST_F(SnapshotFolderTest, ANumberIsNotGivenToAnotherFile) {
    for (int number = 0; number < 33; ++number) {
        ASSERT_TRUE(folder_.write(time_, "x"));
    }
    EXPECT_EQ(*folder_.write(time_, "x"), path_ + "/20231114T221320Z-34.json");
    EXPECT_THAT(names(), Contains("20231114T221320Z-34.json"));
    EXPECT_THAT(names(), Not(Contains("20231114T221320Z-2.json")));
    EXPECT_EQ(names().size(), 32U);
}

// A device without a battery for its clock starts in 1970.
TEST_F(SnapshotFolderTest, FilesThatAreWrittenAfterTheClockWentBackAreKept) {
    for (int second = 0; second < 32; ++second) {
        ASSERT_TRUE(folder_.write(time_ + std::chrono::seconds(second), "x"));
    }
    EXPECT_EQ(*folder_.write(WallTime(), "a"), path_ + "/19700101T000000Z-1.json");
    EXPECT_EQ(*folder_.write(WallTime(std::chrono::seconds(5)), "b"), path_ + "/19700101T000005Z-1.json");
    const std::vector<std::string> left = names();
    ASSERT_EQ(left.size(), 32U);
    EXPECT_EQ(left[0], "19700101T000000Z-1.json");
    EXPECT_EQ(left[1], "19700101T000005Z-1.json");
    EXPECT_EQ(left[2], "20231114T221322Z-1.json");
    EXPECT_EQ(left[31], "20231114T221351Z-1.json");
    // The clock was set.
    ASSERT_TRUE(folder_.write(time_ + std::chrono::seconds(60), "c"));
    EXPECT_EQ(names().front(), "19700101T000005Z-1.json");
    EXPECT_EQ(names().back(), "20231114T221420Z-1.json");
}

TEST_F(SnapshotFolderTest, OtherFilesAreLeftAlone) {
    ASSERT_TRUE(folder_.write(time_, "x"));
    for (const std::string name : {"notes.json", "20231114T221320Z-x.json", "20231114T221320Z-1.json.bak", "a"}) {
        std::ofstream(path_ + "/" + name) << "mine";
    }
    for (int second = 1; second < 40; ++second) {
        ASSERT_TRUE(folder_.write(time_ + std::chrono::seconds(second), "x"));
    }
    EXPECT_EQ(names().size(), 36U);
}

} // namespace

} // namespace vela::platform
