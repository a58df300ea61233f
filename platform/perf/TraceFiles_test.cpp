#include "platform/perf/TraceFiles.h"
#include "testing/ManualClock.h"
#include "testing/TemporaryFolder.h"

#include <algorithm>
#include <cerrno>
#include <filesystem>
#include <fstream>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <optional>
#include <sstream>
#include <string>
#include <sys/stat.h>
#include <unistd.h>
#include <utility>
#include <vector>

namespace vela::platform::perf {

namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;

class TraceFilesTest : public ::testing::Test {
protected:
    static void write(const std::string& path) { std::ofstream(path) << "profile"; }
    void make(const std::string& name) const {
        std::filesystem::create_directories(path());
        write(path() + "/" + name);
    }
    std::string path() const { return folder_ / "below/traces"; }
    static std::string contentOf(const std::string& path) {
        std::ostringstream text;
        text << std::ifstream(path).rdbuf();
        return text.str();
    }
    std::vector<std::string> names() const {
        std::vector<std::string> names;
        std::error_code ignored;
        for (const auto& entry : std::filesystem::directory_iterator(path(), ignored)) {
            names.push_back(entry.path().filename().string());
        }
        std::sort(names.begin(), names.end());
        return names;
    }
    /// The name that a trace's file gets.
    std::string publishOne() const {
        Result<TraceFile> file = files_.reserve();
        EXPECT_TRUE(file) << file.failure().description;
        TraceFile taken = *std::move(file);
        write(taken.partPath());
        const Result<std::string> published = taken.publish();
        EXPECT_TRUE(published);
        return std::filesystem::path(*published).filename().string();
    }

    testing::TemporaryFolder folder_;
    testing::ManualClock clock_;
    TraceFiles files_{path(), 3, clock_};
};

TEST_F(TraceFilesTest, AFileIsNamedByNumberAndTime) { EXPECT_EQ(publishOne(), "probe-000001-20231114T221320Z.data"); }

TEST_F(TraceFilesTest, MakingThemTouchesNothing) { EXPECT_FALSE(std::filesystem::exists(folder_ / "below")); }

TEST_F(TraceFilesTest, TheFolderIsReadableAndTheFileIsNot) {
    const Result<TraceFile> file = files_.reserve();
    ASSERT_TRUE(file);
    struct stat status {};
    ASSERT_EQ(stat(path().c_str(), &status), 0);
    EXPECT_EQ(status.st_mode & 07777, 0755U);
    ASSERT_EQ(stat(file->partPath().c_str(), &status), 0);
    EXPECT_EQ(status.st_mode & 07777, 0600U);
}

TEST_F(TraceFilesTest, AReservedFileHasANameOfItsOwnUntilItIsPublished) {
    std::optional<Result<TraceFile>> file(files_.reserve());
    ASSERT_TRUE(*file);
    EXPECT_EQ((*file)->partPath(), path() + "/probe-000001-20231114T221320Z.data.part");
    EXPECT_THAT(names(), ElementsAre("probe-000001-20231114T221320Z.data.part"));
    file.reset();
    EXPECT_THAT(names(), IsEmpty());
}

TEST_F(TraceFilesTest, NumbersGoUpWhateverTheClockSays) {
    EXPECT_EQ(publishOne(), "probe-000001-20231114T221320Z.data");
    clock_.setNow(WallTime(std::chrono::seconds(0)));
    EXPECT_EQ(publishOne(), "probe-000002-19700101T000000Z.data");
}

TEST_F(TraceFilesTest, NumbersMayGrowLonger) {
    make("probe-999999-20231114T221320Z.data");
    EXPECT_EQ(publishOne(), "probe-1000000-20231114T221320Z.data");
    EXPECT_EQ(publishOne(), "probe-1000001-20231114T221320Z.data");
}

TEST_F(TraceFilesTest, FilesReservedAtOneTimeAreDifferent) {
    const Result<TraceFile> first = files_.reserve();
    const Result<TraceFile> second = files_.reserve();
    ASSERT_TRUE(first && second);
    EXPECT_THAT(names(),
                ElementsAre("probe-000001-20231114T221320Z.data.part", "probe-000002-20231114T221320Z.data.part"));
}

TEST_F(TraceFilesTest, WhatAKilledServiceLeftIsRemoved) {
    make("probe-000007-20231114T221320Z.data.part");
    const Result<TraceFile> file = files_.reserve();
    EXPECT_THAT(names(), ElementsAre("probe-000001-20231114T221320Z.data.part"));
}

TEST_F(TraceFilesTest, TheOldestAreRemovedByNumber) {
    for (const int number : {10, 9, 8, 11, 12}) {
        make("probe-0000" + std::string(number < 10 ? "0" : "") + std::to_string(number) + "-20231114T221320Z.data");
    }
    files_.removeOldest();
    EXPECT_THAT(names(), ElementsAre("probe-000010-20231114T221320Z.data", "probe-000011-20231114T221320Z.data",
                                     "probe-000012-20231114T221320Z.data"));
}

TEST_F(TraceFilesTest, OtherFilesAreLeftAlone) {
    const std::vector<std::string> others = {"notes.txt",         "probe-.data",         "probe-000001.data",
                                             "probe-12-x.data",   "probe-00000x-y.data", "probe-000001-.d",
                                             "tracing-results.x", "xprobe-000001-y.data"};
    for (const std::string& name : others) {
        make(name);
    }
    TraceFiles(path(), 1, clock_).removeOldest();
    EXPECT_EQ(publishOne(), "probe-000001-20231114T221320Z.data");
    TraceFiles(path(), 1, clock_).removeOldest();
    EXPECT_EQ(names().size(), others.size() + 1);
}

TEST_F(TraceFilesTest, NothingIsPublishedWhereNothingWasWritten) {
    Result<TraceFile> file = files_.reserve();
    ASSERT_TRUE(file);
    const Result<std::string> published = (*std::move(file)).publish();
    ASSERT_FALSE(published);
    EXPECT_EQ(published.failure().code, ENODATA);
    EXPECT_EQ(published.failure().description,
              "result of the trace, " + path() + "/probe-000001-20231114T221320Z.data.part: nothing was written");
}

TEST_F(TraceFilesTest, WhatIsWrittenToTheDescriptorIsPublished) {
    Result<TraceFile> file = files_.reserve();
    ASSERT_TRUE(file);
    TraceFile taken = *std::move(file);
    ASSERT_EQ(::write(taken.held().get(), "profile", 7), 7);
    const Result<std::string> published = taken.publish();
    ASSERT_TRUE(published);
    EXPECT_EQ(*published, path() + "/probe-000001-20231114T221320Z.data");
    EXPECT_EQ(contentOf(*published), "profile");
}

TEST_F(TraceFilesTest, AnotherFileInItsPlaceIsNotPublishedAndStays) {
    const std::string part = path() + "/probe-000001-20231114T221320Z.data.part";
    {
        Result<TraceFile> file = files_.reserve();
        ASSERT_TRUE(file);
        TraceFile taken = *std::move(file);
        ASSERT_EQ(::write(taken.held().get(), "profile", 7), 7);
        std::filesystem::remove(part);
        std::ofstream(part) << "theirs";
        const Result<std::string> published = taken.publish();
        ASSERT_FALSE(published);
        EXPECT_EQ(published.failure().code, ESTALE);
        EXPECT_EQ(published.failure().description,
                  "result of the trace, " + part + ": something else has taken its place");
    }
    EXPECT_THAT(names(), ElementsAre("probe-000001-20231114T221320Z.data.part"));
    EXPECT_EQ(contentOf(part), "theirs");
}

TEST_F(TraceFilesTest, ALinkInItsPlaceIsNotPublishedAndStays) {
    const std::string part = path() + "/probe-000001-20231114T221320Z.data.part";
    {
        Result<TraceFile> file = files_.reserve();
        ASSERT_TRUE(file);
        TraceFile taken = *std::move(file);
        ASSERT_EQ(::write(taken.held().get(), "profile", 7), 7);
        std::filesystem::rename(part, folder_ / "profile");
        std::filesystem::create_symlink(folder_ / "profile", part);
        const Result<std::string> published = taken.publish();
        ASSERT_FALSE(published);
        EXPECT_EQ(published.failure().code, ESTALE);
    }
    EXPECT_THAT(names(), ElementsAre("probe-000001-20231114T221320Z.data.part"));
    EXPECT_TRUE(std::filesystem::is_symlink(part));
    EXPECT_EQ(contentOf(folder_ / "profile"), "profile");
}

TEST_F(TraceFilesTest, AFolderThatIsMovedAwayMeanwhileKeepsItsFile) {
    Result<TraceFile> file = files_.reserve();
    ASSERT_TRUE(file);
    TraceFile taken = *std::move(file);
    ASSERT_EQ(::write(taken.held().get(), "profile", 7), 7);
    std::filesystem::rename(path(), folder_ / "moved");
    std::filesystem::create_directory(folder_ / "elsewhere");
    std::filesystem::create_directory_symlink(folder_ / "elsewhere", path());
    ASSERT_TRUE(taken.publish());
    EXPECT_EQ(contentOf(folder_ / "moved/probe-000001-20231114T221320Z.data"), "profile");
    EXPECT_TRUE(std::filesystem::is_empty(folder_ / "elsewhere"));
}

TEST_F(TraceFilesTest, AnotherUsersLinkInTheFoldersPlaceIsNotFollowed) {
    constexpr uid_t kStranger = 4001;
    std::filesystem::create_directories(folder_ / "elsewhere");
    for (const char* const number : {"1", "2", "3", "4"}) {
        write(folder_ / "elsewhere/probe-00000" + number + "-20231114T221320Z.data");
    }
    write(folder_ / "elsewhere/probe-000005-20231114T221320Z.data.part");
    std::filesystem::create_directories(folder_ / "below");
    std::filesystem::create_directory_symlink(folder_ / "elsewhere", path());
    if (lchown(path().c_str(), kStranger, kStranger) != 0) {
        GTEST_SKIP() << "gives a link to another user, which takes root";
    }
    files_.removeOldest();
    const Result<TraceFile> file = files_.reserve();
    ASSERT_FALSE(file);
    EXPECT_EQ(file.failure().code, EACCES);
    EXPECT_EQ(file.failure().description, "create folder " + path() + ": a link of user 4001 is not followed");
    EXPECT_EQ(names().size(), 5U);
}

TEST_F(TraceFilesTest, ARelativeFolderGivesAnAbsolutePath) {
    const std::filesystem::path before = std::filesystem::current_path();
    std::filesystem::current_path(folder_.path());
    const TraceFiles relative("./here/../traces", 1, clock_);
    std::filesystem::current_path(before);
    const Result<TraceFile> file = relative.reserve();
    ASSERT_TRUE(file);
    EXPECT_EQ(file->partPath(), folder_ / "traces/probe-000001-20231114T221320Z.data.part");
}

TEST(FileUrlTest, APlainPathIsKept) { EXPECT_EQ(fileUrl("/a/b-c_d.e~1"), "file:///a/b-c_d.e~1"); }

TEST(FileUrlTest, EverythingElseIsEscaped) {
    EXPECT_EQ(fileUrl("/a b%?#\xC3\xBC\n,"), "file:///a%20b%25%3F%23%C3%BC%0A%2C");
}

} // namespace

} // namespace vela::platform::perf
