#include "platform/linux/LinuxFileSystem.h"
#include "platform/linux/UnprivilegedFileSystem_test.h"
#include "testing/FileSystemContract.h"
#include "testing/TemporaryFolder.h"

#include <algorithm>
#include <csignal>
#include <filesystem>
#include <fstream>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <limits>
#include <optional>
#include <string>
#include <sys/resource.h>
#include <sys/stat.h>
#include <thread>
#include <unistd.h>
#include <vector>

namespace vela::platform {

namespace {

using ::testing::ElementsAre;

std::optional<std::uint32_t> permissionsAt(const std::string& path) {
    struct stat status {};
    return lstat(path.c_str(), &status) == 0 ? std::optional<std::uint32_t>(status.st_mode & 07777U) : std::nullopt;
}

std::vector<std::string> filesBelow(const std::string& folder) {
    std::vector<std::string> paths;
    for (const auto& entry : std::filesystem::recursive_directory_iterator(folder)) {
        if (!entry.is_directory()) {
            paths.push_back(entry.path().string());
        }
    }
    std::sort(paths.begin(), paths.end());
    return paths;
}

/// Files of the process cannot be longer than a limit while this lives.
class FileSizeScope {
public:
    explicit FileSizeScope(std::size_t bytes) {
        EXPECT_EQ(getrlimit(RLIMIT_FSIZE, &before_), 0);
        const rlimit limit{bytes, before_.rlim_max};
        EXPECT_EQ(setrlimit(RLIMIT_FSIZE, &limit), 0);
    }
    ~FileSizeScope() {
        EXPECT_EQ(setrlimit(RLIMIT_FSIZE, &before_), 0);
        static_cast<void>(signal(SIGXFSZ, handler_));
    }
    FileSizeScope(const FileSizeScope&) = delete;
    FileSizeScope& operator=(const FileSizeScope&) = delete;

private:
    rlimit before_{};
    sighandler_t const handler_ = signal(SIGXFSZ, SIG_IGN);
};

struct LinuxHarness {
    LinuxHarness() { std::filesystem::permissions(folder_.path(), std::filesystem::perms{0755}); }
    FileSystem& fileSystem() { return fileSystem_; }
    std::string root() { return folder_.path(); }
    std::optional<std::uint32_t> permissionsOf(const std::string& path) { return permissionsAt(path); }
    std::vector<std::string> filesBelow() { return platform::filesBelow(folder_.path()); }
    void limitFileSize(std::optional<std::size_t> bytes) {
        fileSize_.reset();
        if (bytes) {
            fileSize_.emplace(*bytes);
        }
    }

    bool own(const std::string& path, std::uint32_t user, std::uint32_t group) {
        return lchown(path.c_str(), user, group) == 0;
    }

    LinuxFileSystem fileSystem_;
    testing::TemporaryFolder folder_;
    std::optional<FileSizeScope> fileSize_;
};

/// As a service that may not change its user has it.
struct UnprivilegedHarness : LinuxHarness {
    FileSystem& fileSystem() { return unprivileged_; }

    UnprivilegedFileSystem unprivileged_{fileSystem_};
};

} // namespace

} // namespace vela::platform

namespace vela::testing {

INSTANTIATE_TYPED_TEST_SUITE_P(Linux, FileSystemContract, platform::LinuxHarness);
INSTANTIATE_TYPED_TEST_SUITE_P(LinuxUnprivileged, FileSystemContract, platform::UnprivilegedHarness);

} // namespace vela::testing

namespace vela::platform {

namespace {

/// Sets the process's umask for a while.
class UmaskScope {
public:
    explicit UmaskScope(mode_t mask) : before_(umask(mask)) {}
    ~UmaskScope() { umask(before_); }
    UmaskScope(const UmaskScope&) = delete;
    UmaskScope& operator=(const UmaskScope&) = delete;

private:
    const mode_t before_;
};

class LinuxFileSystemTest : public ::testing::Test {
protected:
    LinuxFileSystem fileSystem_;
    const testing::TemporaryFolder folder_;
};

TEST_F(LinuxFileSystemTest, AFilesPermissionsHoldWhateverTheUmask) {
    const UmaskScope scope(0777);
    ASSERT_TRUE(fileSystem_.writeFileAtomically(folder_ / "a", "text", 0664));
    EXPECT_EQ(permissionsAt(folder_ / "a"), 0664U);
}

TEST_F(LinuxFileSystemTest, AFoldersPermissionsHoldWhateverTheUmask) {
    const UmaskScope scope(0777);
    ASSERT_TRUE(fileSystem_.createDirectories(folder_ / "a/b", 02775));
    EXPECT_EQ(permissionsAt(folder_ / "a"), 02775U);
    EXPECT_EQ(permissionsAt(folder_ / "a/b"), 02775U);
}

TEST_F(LinuxFileSystemTest, WritingReplacesALinkAndNotWhatItNames) {
    ASSERT_TRUE(fileSystem_.writeFileAtomically(folder_ / "target", "kept", 0644));
    std::filesystem::create_symlink(folder_ / "target", folder_ / "link");
    ASSERT_TRUE(fileSystem_.writeFileAtomically(folder_ / "link", "new", 0600));
    EXPECT_EQ(*fileSystem_.readFile(folder_ / "target", 100), "kept");
    EXPECT_EQ(*fileSystem_.readFile(folder_ / "link", 100), "new");
    EXPECT_FALSE(std::filesystem::is_symlink(folder_ / "link"));
}

TEST_F(LinuxFileSystemTest, AnOpenReaderKeepsTheOldContent) {
    ASSERT_TRUE(fileSystem_.writeFileAtomically(folder_ / "a", "old", 0644));
    std::ifstream reader(folder_ / "a");
    ASSERT_TRUE(fileSystem_.writeFileAtomically(folder_ / "a", "new", 0644));
    std::string content;
    reader >> content;
    EXPECT_EQ(content, "old");
}

TEST_F(LinuxFileSystemTest, AFailedWriteLeavesTheOldFileAndNothingElse) {
    ASSERT_TRUE(fileSystem_.writeFileAtomically(folder_ / "a", "old", 0644));
    std::optional<FileSizeScope> limit(4096);
    const Result<Done> written = fileSystem_.writeFileAtomically(folder_ / "a", std::string(10000, 'x'), 0644);
    limit.reset();
    ASSERT_FALSE(written);
    EXPECT_EQ(written.failure().code, EFBIG);
    EXPECT_EQ(*fileSystem_.readFile(folder_ / "a", 100), "old");
    EXPECT_THAT(filesBelow(folder_.path()), ElementsAre(folder_ / "a"));
}

TEST_F(LinuxFileSystemTest, AFailureSaysWhatAndWhereInTheSystemsWords) {
    const Result<Done> written = fileSystem_.writeFileAtomically(folder_ / "missing/a", "x", 0644);
    ASSERT_FALSE(written);
    EXPECT_EQ(written.failure().description, "open folder " + (folder_ / "missing") + ": No such file or directory");
}

TEST_F(LinuxFileSystemTest, ConcurrentWritersLeaveOneWholeFile) {
    std::vector<std::thread> writers;
    for (const char letter : {'a', 'b', 'c', 'd'}) {
        writers.emplace_back([this, letter] {
            for (int round = 0; round < 10; ++round) {
                EXPECT_TRUE(fileSystem_.writeFileAtomically(folder_ / "file", std::string(20000, letter), 0644));
            }
        });
    }
    for (std::thread& writer : writers) {
        writer.join();
    }
    const Result<std::string> content = fileSystem_.readFile(folder_ / "file", 20000);
    ASSERT_TRUE(content);
    EXPECT_EQ(*content, std::string(20000, content->front()));
    EXPECT_THAT(filesBelow(folder_.path()), ElementsAre(folder_ / "file"));
}

TEST_F(LinuxFileSystemTest, AFileNameMayHaveTheLargestLength) {
    const std::string name(255, 'n');
    ASSERT_TRUE(fileSystem_.writeFileAtomically(folder_ / name, "text", 0644));
    EXPECT_EQ(*fileSystem_.readFile(folder_ / name, 100), "text");
    EXPECT_EQ(fileSystem_.writeFileAtomically(folder_ / (name + "n"), "text", 0644).failure().code, ENAMETOOLONG);
    EXPECT_THAT(filesBelow(folder_.path()), ElementsAre(folder_ / name));
}

TEST_F(LinuxFileSystemTest, ReadingAFifoIsRefusedAndDoesNotWait) {
    ASSERT_EQ(mkfifo((folder_ / "fifo").c_str(), 0600), 0);
    const Result<std::string> read = fileSystem_.readFile(folder_ / "fifo", 100);
    ASSERT_FALSE(read);
    EXPECT_EQ(read.failure().code, EINVAL);
    EXPECT_EQ(read.failure().description, "read " + (folder_ / "fifo") + ": not a regular file");
}

TEST_F(LinuxFileSystemTest, ReadingADeviceIsRefused) {
    EXPECT_EQ(fileSystem_.readFile("/dev/zero", 100).failure().description, "read /dev/zero: not a regular file");
}

TEST_F(LinuxFileSystemTest, AFileWithoutASizeIsReadToItsEnd) {
    const Result<std::string> read = fileSystem_.readFile("/proc/self/stat", 4096);
    ASSERT_TRUE(read);
    EXPECT_TRUE(read->ends_with('\n'));
}

TEST_F(LinuxFileSystemTest, AFileWithoutASizeIsHeldToTheLimit) {
    EXPECT_EQ(fileSystem_.readFile("/proc/self/stat", 5).failure().code, EFBIG);
}

TEST_F(LinuxFileSystemTest, TheLargestLimitIsNone) {
    ASSERT_TRUE(fileSystem_.writeFileAtomically(folder_ / "a", std::string(100000, 'x'), 0644));
    const auto read = fileSystem_.readFile(folder_ / "a", std::numeric_limits<std::size_t>::max());
    ASSERT_TRUE(read);
    EXPECT_EQ(read->size(), 100000U);
}

TEST_F(LinuxFileSystemTest, ALinkToAFolderIsAFolderThatIsThere) {
    std::filesystem::create_directory(folder_ / "real");
    std::filesystem::create_symlink(folder_ / "real", folder_ / "link");
    ASSERT_TRUE(fileSystem_.createDirectories(folder_ / "link/below", 0755));
    EXPECT_TRUE(std::filesystem::is_directory(folder_ / "real/below"));
}

TEST_F(LinuxFileSystemTest, ALinkToNothingIsNoFolder) {
    std::filesystem::create_symlink(folder_ / "missing", folder_ / "link");
    EXPECT_EQ(fileSystem_.createDirectories(folder_ / "link", 0755).failure().code, EEXIST);
    EXPECT_FALSE(std::filesystem::exists(folder_ / "missing"));
}

TEST_F(LinuxFileSystemTest, TheCurrentDirectoryIsThatOfTheProcess) {
    EXPECT_EQ(fileSystem_.currentDirectory(), std::filesystem::current_path().string());
}

} // namespace

} // namespace vela::platform
