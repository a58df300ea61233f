// Files that somebody else named, read by a service that may change its user and by one that may not. What both have
// in common with every other file system is in testing/FileSystemContract.h.
#include "platform/linux/FileOpening.h"
#include "platform/linux/LinuxFileSystem.h"
#include "platform/linux/UnprivilegedFileSystem_test.h"
#include "testing/TemporaryFolder.h"

#include <cerrno>
#include <csignal>
#include <fcntl.h>
#include <filesystem>
#include <gtest/gtest.h>
#include <string>
#include <string_view>
#include <sys/fsuid.h>
#include <sys/prctl.h>
#include <sys/stat.h>
#include <sys/xattr.h>
#include <thread>
#include <unistd.h>
#include <vector>

namespace vela::platform {

namespace {

namespace fs = std::filesystem;

enum class Service : std::uint8_t { AsItIs, Unprivileged };

class FileOpeningTest : public ::testing::TestWithParam<Service> {
protected:
    FileOpeningTest() { fs::permissions(folder_.path(), fs::perms{0755}); }

    bool isUnprivileged() const {
        return GetParam() == Service::Unprivileged || !UnprivilegedFileSystem::isPrivileged();
    }
    const FileSystem& fileSystem() const {
        return GetParam() == Service::AsItIs ? static_cast<const FileSystem&>(linux_) : unprivileged_;
    }
    void write(const std::string& below, std::string_view content, std::uint32_t permissions = 0644) {
        ASSERT_TRUE(linux_.writeFileAtomically(folder_ / below, content, permissions));
    }
    void makeFolder(const std::string& below, std::uint32_t permissions = 0755) {
        ASSERT_TRUE(linux_.createDirectories(folder_ / below, permissions));
    }
    void link(const std::string& target, const std::string& below) { fs::create_symlink(target, folder_ / below); }

    /// What a stranger reads there; the failure's text when it is none.
    std::string readOf(const std::string& path) const {
        const Result<std::string> read = fileSystem().readFileFor(kStranger, path, 100);
        return read ? *read : read.failure().description;
    }
    std::string read(const std::string& below) const { return readOf(folder_ / below); }
    std::string denied(const std::string& below) const { return "open " + (folder_ / below) + ": Permission denied"; }
    std::string opened(const std::string& below, const std::string& failure) const {
        return "open " + (folder_ / below) + ": " + failure;
    }

    const Identity kStranger{4001, 4101, {4102}};
    LinuxFileSystem linux_;
    UnprivilegedFileSystem unprivileged_{linux_};
    const testing::TemporaryFolder folder_;
};

TEST_P(FileOpeningTest, AFifoIsRefusedAndNotWaitedFor) {
    ASSERT_EQ(mkfifo((folder_ / "fifo").c_str(), 0666), 0);
    ASSERT_EQ(chmod((folder_ / "fifo").c_str(), 0666), 0);
    EXPECT_EQ(read("fifo"), "read " + (folder_ / "fifo") + ": not a regular file");
}

TEST_P(FileOpeningTest, ADeviceIsRefusedAlsoBehindALink) {
    EXPECT_EQ(readOf("/dev/zero"), "read /dev/zero: not a regular file");
    link("/dev/zero", "link");
    EXPECT_EQ(read("link"), "read " + (folder_ / "link") + ": not a regular file");
}

TEST_P(FileOpeningTest, TheRootFolderIsNoFile) { EXPECT_EQ(readOf("/"), "read /: not a regular file"); }

TEST_P(FileOpeningTest, LinksLeadToFiles) {
    makeFolder("one/two");
    write("one/two/a", "text");
    link("one/two/a", "relative");
    link(folder_ / "one/two/a", "absolute");
    link("relative", "chain");
    link("one/two", "folder");
    link("../two/a", "one/two/back");
    for (const char* const below : {"relative", "absolute", "chain", "folder/a", "one/two/back", "one/../one/./two/a",
                                    "one//two///a", "folder/../two/a"}) {
        EXPECT_EQ(read(below), "text") << below;
    }
}

TEST_P(FileOpeningTest, LinksThatLeadNowhereAreRefused) {
    link("missing", "dangling");
    link("loop", "loop");
    EXPECT_EQ(read("dangling"), opened("dangling", "No such file or directory"));
    EXPECT_EQ(read("loop"), opened("loop", "Too many levels of symbolic links"));
}

TEST_P(FileOpeningTest, FortyLinksAreFollowed) {
    write("0", "text");
    for (int number = 1; number <= 41; ++number) {
        link(std::to_string(number - 1), std::to_string(number));
    }
    EXPECT_EQ(read("40"), "text");
    EXPECT_EQ(read("41"), opened("41", "Too many levels of symbolic links"));
}

TEST_P(FileOpeningTest, AFileIsNoFolder) {
    write("a", "text");
    EXPECT_EQ(read("a/"), opened("a/", "Not a directory"));
    EXPECT_EQ(read("a/b"), opened("a/b", "Not a directory"));
    EXPECT_EQ(read("a/.."), opened("a/..", "Not a directory"));
}

TEST_P(FileOpeningTest, APathIsShorterThan4096Bytes) {
    write("a", "text");
    std::string path = folder_.path();
    while (path.size() + 4 < 4095) {
        path += "/.";
    }
    path += std::string(4095 - path.size() - 1, '/') + "a";
    ASSERT_EQ(path.size(), 4095U);
    EXPECT_EQ(readOf(path), "text");
    EXPECT_EQ(readOf("/" + path), "open /" + path + ": File name too long");
}

TEST_P(FileOpeningTest, APathWithANulIsNotCutThere) {
    write("a", "text");
    EXPECT_EQ(fileSystem().readFileFor(kStranger, folder_ / std::string("a\0b", 3), 100).failure().code, EINVAL);
}

TEST_P(FileOpeningTest, APathWithoutASlashBeginsInTheCurrentFolder) {
    const fs::path before = fs::current_path();
    write("a", "text");
    fs::current_path(folder_.path());
    EXPECT_EQ(readOf("a"), "text");
    EXPECT_EQ(readOf("./a"), "text");
    fs::current_path(before);
}

TEST_P(FileOpeningTest, ALinkGivesNoRightsToWhatItNames) {
    makeFolder("shut", 0700);
    write("shut/a", "text");
    write("private", "text", 0600);
    link("shut/a", "first");
    link("private", "second");
    link("shut", "folder");
    EXPECT_EQ(read("first"), denied("first"));
    EXPECT_EQ(read("second"), denied("second"));
    EXPECT_EQ(read("folder/a"), denied("folder/a"));
}

TEST_P(FileOpeningTest, AFolderIsLeftThroughDotsOnlyByWhoMaySearchIt) {
    makeFolder("shut", 0744);
    write("a", "text");
    EXPECT_EQ(read("shut/../a"), denied("shut/../a"));
}

TEST_P(FileOpeningTest, WhatTheServiceHasOpenIsNotOpenToOthers) {
    makeFolder("shut", 0700);
    write("shut/a", "text");
    const FileDescriptor held(open((folder_ / "shut/a").c_str(), O_RDONLY | O_CLOEXEC));
    const std::string path = "/proc/self/fd/" + std::to_string(held.get());
    EXPECT_EQ(readOf(path), "open " + path + ": Permission denied");
    EXPECT_EQ(readOf("/proc/self/environ"), "open /proc/self/environ: Permission denied");
}

TEST_P(FileOpeningTest, AFileWithALeaseIsNotWaitedFor) {
    write("a", "text", 0666);
    auto* const handler = std::signal(SIGIO, SIG_IGN);
    const FileDescriptor holder(open((folder_ / "a").c_str(), O_RDWR | O_CLOEXEC));
    const bool leased = fcntl(holder.get(), F_SETLEASE, F_WRLCK) == 0;
    const std::string answer = read("a");
    static_cast<void>(fcntl(holder.get(), F_SETLEASE, F_UNLCK));
    static_cast<void>(std::signal(SIGIO, handler));
    if (!leased) {
        GTEST_SKIP() << "no leases here";
    }
    EXPECT_EQ(answer, opened("a", "Resource temporarily unavailable"));
}

TEST_P(FileOpeningTest, AnAccessListIsWeighedByTheKernelOrRefused) {
    write("a", "text", 0644);
    // Version 2; owner rw-, user 4001 ---, group r--, mask r--, others r--: the bits alone would let 4001 read.
    const std::string list("\x02\0\0\0"
                           "\x01\0\x06\0\xFF\xFF\xFF\xFF"
                           "\x02\0\0\0\xA1\x0F\0\0"
                           "\x04\0\x04\0\xFF\xFF\xFF\xFF"
                           "\x10\0\x04\0\xFF\xFF\xFF\xFF"
                           "\x20\0\x04\0\xFF\xFF\xFF\xFF",
                           44);
    if (setxattr((folder_ / "a").c_str(), "system.posix_acl_access", list.data(), list.size(), 0) != 0) {
        GTEST_SKIP() << "no access lists here";
    }
    EXPECT_EQ(read("a"), isUnprivileged() ? opened("a", "an access list is in force, which needs a privileged service")
                                          : denied("a"));
    EXPECT_EQ(*fileSystem().readFileFor({0, 0, {}}, folder_ / "a", 100), "text");
}

TEST_P(FileOpeningTest, TheCallersOwnRightsStayAsTheyAre) {
    write("a", "text");
    EXPECT_EQ(read("a"), "text");
    EXPECT_EQ(static_cast<uid_t>(setfsuid(static_cast<uid_t>(-1))), geteuid());
    EXPECT_EQ(static_cast<gid_t>(setfsgid(static_cast<gid_t>(-1))), getegid());
    EXPECT_EQ(linux_.readFile(folder_ / "a", 100).operator*(), "text");
    write("own", "secret", 0600);
    EXPECT_EQ(*linux_.readFile(folder_ / "own", 100), "secret");
}

TEST_P(FileOpeningTest, TheProcessMayDumpItsCoreAsBefore) {
    write("a", "text");
    ASSERT_EQ(prctl(PR_SET_DUMPABLE, 1), 0);
    std::vector<std::thread> threads;
    for (int i = 0; i < 4; ++i) {
        threads.emplace_back([this] {
            for (int round = 0; round < 20; ++round) {
                EXPECT_EQ(read("a"), "text");
            }
        });
    }
    for (std::thread& thread : threads) {
        thread.join();
    }
    EXPECT_EQ(prctl(PR_GET_DUMPABLE), 1);
    ASSERT_EQ(prctl(PR_SET_DUMPABLE, 0), 0);
    EXPECT_EQ(read("a"), "text");
    EXPECT_EQ(prctl(PR_GET_DUMPABLE), 0) << "who forbade it finds it forbidden";
    prctl(PR_SET_DUMPABLE, 1);
}

TEST_P(FileOpeningTest, ManyThreadsReadForDifferentUsers) {
    constexpr std::uint32_t kUsers = 4;
    for (std::uint32_t user = 0; user < kUsers; ++user) {
        const std::string name = std::to_string(user);
        write(name, name, 0600);
        if (lchown((folder_ / name).c_str(), 5000 + user, 5000) != 0) {
            GTEST_SKIP() << "files cannot be given away here";
        }
    }
    std::vector<std::thread> threads;
    for (std::uint32_t user = 0; user < kUsers; ++user) {
        threads.emplace_back([this, user] {
            const Identity reader{5000 + user, 6000, {}};
            for (int round = 0; round < 20; ++round) {
                for (std::uint32_t owner = 0; owner < kUsers; ++owner) {
                    const auto content = fileSystem().readFileFor(reader, folder_ / std::to_string(owner), 100);
                    EXPECT_EQ(static_cast<bool>(content), owner == user);
                }
            }
        });
    }
    for (std::thread& thread : threads) {
        thread.join();
    }
}

TEST_P(FileOpeningTest, AnIdentityThatCannotBeTakenReadsNothing) {
    if (isUnprivileged()) {
        GTEST_SKIP() << "takes no identity";
    }
    write("a", "text");
    const Identity tooMany{4001, 4101, std::vector<std::uint32_t>(70'000, 4102)};
    EXPECT_EQ(fileSystem().readFileFor(tooMany, folder_ / "a", 100).failure().code, EINVAL);
    const Identity noUser{0xFFFFFFFF, 4101, {}};
    EXPECT_EQ(fileSystem().readFileFor(noUser, folder_ / "a", 100).failure().code, EPERM);
}

INSTANTIATE_TEST_SUITE_P(Services, FileOpeningTest, ::testing::Values(Service::AsItIs, Service::Unprivileged),
                         [](const auto& service) {
                             return service.param == Service::AsItIs ? "AsItIs" : "Unprivileged";
                         });

} // namespace

} // namespace vela::platform
