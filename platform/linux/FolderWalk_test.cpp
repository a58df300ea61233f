#include "platform/linux/FolderWalk.h"
#include "platform/linux/LinuxFileSystem.h"
#include "testing/TemporaryFolder.h"

#include <cerrno>
#include <fcntl.h>
#include <filesystem>
#include <gtest/gtest.h>
#include <optional>
#include <string>
#include <sys/fsuid.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <thread>
#include <unistd.h>

namespace vela::platform {

namespace {

namespace fs = std::filesystem;

class FolderWalkTest : public ::testing::Test {
protected:
    static constexpr uid_t kStranger = 4001;

    void link(const std::string& target, const std::string& name) const {
        fs::create_directory_symlink(target, folder_ / name);
    }
    /// A link that is another user's. False where only root could make one.
    bool linkOfStranger(const std::string& target, const std::string& name) const {
        link(target, name);
        return lchown((folder_ / name).c_str(), kStranger, kStranger) == 0;
    }
    /// Whether the two name the same folder.
    static bool isAt(const FileDescriptor& folder, const std::string& path) {
        struct stat opened {};
        struct stat named {};
        return fstat(folder.get(), &opened) == 0 && stat(path.c_str(), &named) == 0 && opened.st_dev == named.st_dev &&
               opened.st_ino == named.st_ino;
    }
    /// Of a path below the folder; empty where it can be opened.
    std::string failureAt(const std::string& below) const {
        const Result<FileDescriptor> folder = openFolder(folder_ / below);
        return folder ? "" : folder.failure().description;
    }

    const testing::TemporaryFolder folder_;
};

TEST_F(FolderWalkTest, AFolderIsFoundByItsWholePath) {
    fs::create_directories(folder_ / "a/b");
    const Result<FileDescriptor> folder = openFolder(folder_ / "a//./c/../b/");
    ASSERT_FALSE(folder); // "c" is not there
    EXPECT_EQ(folder.failure().code, ENOENT);
    const Result<FileDescriptor> found = openFolder(folder_ / "a//./../a/b/");
    ASSERT_TRUE(found);
    EXPECT_TRUE(isAt(*found, folder_ / "a/b"));
    EXPECT_TRUE(isAt(*openFolder("/"), "/"));
    EXPECT_TRUE(isAt(*openFolder("."), fs::current_path()));
}

TEST_F(FolderWalkTest, OwnLinksAreFollowedRelativeOnesAndWholePathsToo) {
    fs::create_directories(folder_ / "a/b");
    link("a", "one");
    link(folder_ / "one/b", "two");
    link("../two/../../one", "a/three");
    for (const char* const path : {"one/b", "two", "a/three/b", "a/three/three/b"}) {
        const Result<FileDescriptor> found = openFolder(folder_ / path);
        ASSERT_TRUE(found) << path << found.failure().description;
        EXPECT_TRUE(isAt(*found, folder_ / "a/b"));
    }
}

TEST_F(FolderWalkTest, AnOrdinaryUserFollowsRootsLinksAndItsOwn) {
    constexpr uid_t kOther = 4002;
    fs::permissions(folder_.path(), fs::perms{0755});
    fs::create_directories(folder_ / "a/b");
    link("a", "roots");
    link("a", "others");
    if (!linkOfStranger("a", "own") || lchown((folder_ / "others").c_str(), kOther, kOther) != 0) {
        GTEST_SKIP() << "gives links to other users, which takes root";
    }
    const pid_t child = fork();
    if (child == 0) {
        const bool isStranger = setresuid(kStranger, kStranger, kStranger) == 0;
        const bool follows = isStranger && openFolder(folder_ / "roots/b") && openFolder(folder_ / "own/b");
        const Result<FileDescriptor> others = openFolder(folder_ / "others/b");
        _exit(follows && !others && others.failure().code == EACCES ? 0 : 1);
    }
    int status = -1;
    ASSERT_EQ(waitpid(child, &status, 0), child);
    EXPECT_EQ(status, 0);
}

TEST_F(FolderWalkTest, AnotherUsersLinkIsNotFollowed) {
    fs::create_directories(folder_ / "a/b");
    if (!linkOfStranger("a", "link")) {
        GTEST_SKIP() << "gives a link to another user, which takes root";
    }
    const std::string refused = ": a link of user 4001 is not followed";
    EXPECT_EQ(failureAt("link"), "open folder " + (folder_ / "link") + refused);
    EXPECT_EQ(failureAt("link/b"), "open folder " + (folder_ / "link/b") + refused);
    link("link", "own");
    EXPECT_EQ(failureAt("own/b"), "open folder " + (folder_ / "own/b") + refused);
    EXPECT_EQ(openFolder(folder_ / "link").failure().code, EACCES);
    const Result<FileDescriptor> made = makeFolders(folder_ / "link/new/below", 0755);
    ASSERT_FALSE(made);
    EXPECT_EQ(made.failure().description, "create folder " + (folder_ / "link") + refused);
    EXPECT_FALSE(fs::exists(folder_ / "a/new"));
}

TEST_F(FolderWalkTest, NothingIsWrittenBehindAnotherUsersLink) {
    fs::create_directory(folder_ / "a");
    if (!linkOfStranger("a", "link")) {
        GTEST_SKIP() << "gives a link to another user, which takes root";
    }
    LinuxFileSystem fileSystem;
    const Result<Done> written = fileSystem.writeFileAtomically(folder_ / "link/file", "text", 0644);
    ASSERT_FALSE(written);
    EXPECT_EQ(written.failure().description,
              "open folder " + (folder_ / "link") + ": a link of user 4001 is not followed");
    EXPECT_EQ(fileSystem.createDirectories(folder_ / "link/new", 0777).failure().code, EACCES);
    EXPECT_TRUE(fs::is_empty(folder_ / "a"));
}

TEST_F(FolderWalkTest, ALinkInTheNewFoldersPlaceIsNotFollowed) {
    fs::create_directory(folder_ / "a");
    if (!linkOfStranger(folder_ / "missing", "link")) {
        GTEST_SKIP() << "gives a link to another user, which takes root";
    }
    EXPECT_EQ(makeFolders(folder_ / "link", 0777).failure().code, EACCES);
    EXPECT_FALSE(fs::exists(folder_ / "missing"));
}

TEST_F(FolderWalkTest, AFolderThatIsRenamedMeanwhileStaysTheOneThatWasFound) {
    fs::create_directory(folder_ / "a");
    const Result<FileDescriptor> found = openFolder(folder_ / "a");
    ASSERT_TRUE(found);
    fs::rename(folder_ / "a", folder_ / "b");
    fs::create_directory(folder_ / "c");
    link("c", "a");
    const FileDescriptor file(openat(found->get(), "file", O_WRONLY | O_CREAT | O_EXCL | O_CLOEXEC, 0600));
    ASSERT_TRUE(file);
    EXPECT_TRUE(fs::exists(folder_ / "b/file"));
    EXPECT_TRUE(fs::is_empty(folder_ / "c"));
}

TEST_F(FolderWalkTest, LinksInARingEndInAFailure) {
    link("two", "one");
    link("one", "two");
    EXPECT_EQ(openFolder(folder_ / "one").failure().code, ELOOP);
}

TEST_F(FolderWalkTest, AFileIsNoFolderAndALinkToOneIsNone) {
    const FileDescriptor file(open((folder_ / "file").c_str(), O_WRONLY | O_CREAT | O_CLOEXEC, 0600));
    link("file", "link");
    EXPECT_EQ(failureAt("file/below"), "open folder " + (folder_ / "file/below") + ": Not a directory");
    EXPECT_EQ(openFolder(folder_ / "link").failure().code, ENOTDIR);
    EXPECT_EQ(makeFolders(folder_ / "link/below", 0755).failure().code, ENOTDIR);
}

TEST_F(FolderWalkTest, WhatIsNoPathIsRefused) {
    EXPECT_EQ(openFolder("").failure().code, EINVAL);
    EXPECT_EQ(openFolder(std::string("/\0tmp", 5)).failure().code, EINVAL);
    EXPECT_EQ(openFolder(folder_ / std::string(256, 'n')).failure().code, ENAMETOOLONG);
}

// The thread takes a user for file systems only, as the walk looks at who the process is.
TEST_F(FolderWalkTest, AFolderThatMayNotBeSearchedIsRefused) {
    fs::create_directories(folder_ / "shut/inner");
    fs::permissions(folder_.path(), fs::perms{0755});
    fs::permissions(folder_ / "shut", fs::perms{0700});
    std::optional<int> code;
    std::thread([&] {
        setfsuid(kStranger);
        if (static_cast<uid_t>(setfsuid(kStranger)) == kStranger) {
            const Result<FileDescriptor> folder = openFolder(folder_ / "shut/inner");
            code = folder ? 0 : folder.failure().code;
        }
    }).join();
    if (!code) {
        GTEST_SKIP() << "takes another user, which takes root";
    }
    EXPECT_EQ(*code, EACCES);
}

} // namespace

} // namespace vela::platform
