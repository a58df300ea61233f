// What every FileSystem does, as a test suite that runs on the fake and on the real one.
//
// A harness has: `FileSystem& fileSystem()`; `std::string root()`, an empty folder; `std::optional<std::uint32_t>
// permissionsOf(path)`, none for what is not there; `std::vector<std::string> filesBelow()`, the paths of all files in
// the root, sorted.
#pragma once

#include "platform/FileSystem.h"

#include <cerrno>
#include <cstdint>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <optional>
#include <string>

namespace vela::testing {

template <class Harness>
class FileSystemContract : public ::testing::Test {
protected:
    platform::FileSystem& fileSystem() { return harness_.fileSystem(); }
    std::string path(const std::string& below) { return harness_.root() + "/" + below; }

    Harness harness_;
};

TYPED_TEST_SUITE_P(FileSystemContract);

TYPED_TEST_P(FileSystemContract, WhatWasWrittenIsRead) {
    const std::string content("one\0two\n\xff", 9);
    ASSERT_TRUE(this->fileSystem().writeFileAtomically(this->path("a"), content, 0644));
    const auto read = this->fileSystem().readFile(this->path("a"), 9);
    ASSERT_TRUE(read);
    EXPECT_EQ(*read, content);
}

TYPED_TEST_P(FileSystemContract, AnEmptyFileIsReadWithALimitOfNothing) {
    ASSERT_TRUE(this->fileSystem().writeFileAtomically(this->path("a"), "", 0644));
    const auto read = this->fileSystem().readFile(this->path("a"), 0);
    ASSERT_TRUE(read);
    EXPECT_EQ(*read, "");
}

TYPED_TEST_P(FileSystemContract, AFileAboveTheLimitIsRefusedWithTheLimitsValue) {
    ASSERT_TRUE(this->fileSystem().writeFileAtomically(this->path("a"), "12345", 0644));
    const auto read = this->fileSystem().readFile(this->path("a"), 4);
    ASSERT_FALSE(read);
    EXPECT_EQ(read.failure().code, EFBIG);
    EXPECT_EQ(read.failure().description, "read " + this->path("a") + ": larger than its limit of 4 bytes");
}

TYPED_TEST_P(FileSystemContract, AFileThatIsNotThereCannotBeRead) {
    const auto read = this->fileSystem().readFile(this->path("a"), 100);
    ASSERT_FALSE(read);
    EXPECT_EQ(read.failure().code, ENOENT);
    EXPECT_EQ(read.failure().description, "open " + this->path("a") + ": No such file or directory");
}

TYPED_TEST_P(FileSystemContract, AFolderIsNotReadAsAFile) {
    ASSERT_TRUE(this->fileSystem().createDirectories(this->path("folder"), 0755));
    const auto read = this->fileSystem().readFile(this->path("folder"), 100);
    ASSERT_FALSE(read);
    EXPECT_EQ(read.failure().code, EISDIR);
    EXPECT_EQ(read.failure().description, "read " + this->path("folder") + ": not a regular file");
}

TYPED_TEST_P(FileSystemContract, WritingReplacesContentAndPermissions) {
    ASSERT_TRUE(this->fileSystem().writeFileAtomically(this->path("a"), "a long first content", 0644));
    ASSERT_TRUE(this->fileSystem().writeFileAtomically(this->path("a"), "second", 0600));
    EXPECT_EQ(*this->fileSystem().readFile(this->path("a"), 100), "second");
    EXPECT_EQ(this->harness_.permissionsOf(this->path("a")), 0600U);
}

TYPED_TEST_P(FileSystemContract, WritingLeavesNothingElseBehind) {
    ASSERT_TRUE(this->fileSystem().writeFileAtomically(this->path("a"), "1", 0644));
    EXPECT_THAT(this->harness_.filesBelow(), ::testing::ElementsAre(this->path("a")));
}

TYPED_TEST_P(FileSystemContract, WritingIntoAMissingFolderFails) {
    const auto written = this->fileSystem().writeFileAtomically(this->path("missing/a"), "1", 0644);
    ASSERT_FALSE(written);
    EXPECT_EQ(written.failure().code, ENOENT);
}

TYPED_TEST_P(FileSystemContract, WritingOverAFolderFailsAndLeavesNothingBehind) {
    ASSERT_TRUE(this->fileSystem().createDirectories(this->path("folder"), 0755));
    const auto written = this->fileSystem().writeFileAtomically(this->path("folder"), "1", 0644);
    ASSERT_FALSE(written);
    EXPECT_EQ(written.failure().code, EISDIR);
    EXPECT_THAT(this->harness_.filesBelow(), ::testing::IsEmpty());
}

TYPED_TEST_P(FileSystemContract, AnEmptyPathIsRefused) {
    EXPECT_FALSE(this->fileSystem().readFile("", 100));
    EXPECT_EQ(this->fileSystem().writeFileAtomically("", "1", 0644).failure().code, EINVAL);
    EXPECT_EQ(this->fileSystem().createDirectories("", 0755).failure().code, EINVAL);
}

TYPED_TEST_P(FileSystemContract, APathThatEndsInASlashNamesNoFile) {
    EXPECT_EQ(this->fileSystem().writeFileAtomically(this->path("a/"), "1", 0644).failure().code, EINVAL);
}

TYPED_TEST_P(FileSystemContract, APathWithANulIsNotCutThere) {
    const std::string path = this->path(std::string("a\0b", 3));
    EXPECT_EQ(this->fileSystem().writeFileAtomically(path, "1", 0644).failure().code, EINVAL);
    EXPECT_EQ(this->fileSystem().createDirectories(path, 0755).failure().code, EINVAL);
    EXPECT_THAT(this->harness_.filesBelow(), ::testing::IsEmpty());
}

TYPED_TEST_P(FileSystemContract, MissingFoldersAreCreatedWithThePermissions) {
    ASSERT_TRUE(this->fileSystem().createDirectories(this->path("a/b/c"), 0750));
    EXPECT_EQ(this->harness_.permissionsOf(this->path("a")), 0750U);
    EXPECT_EQ(this->harness_.permissionsOf(this->path("a/b")), 0750U);
    EXPECT_EQ(this->harness_.permissionsOf(this->path("a/b/c")), 0750U);
}

TYPED_TEST_P(FileSystemContract, AFolderThatIsThereKeepsItsPermissions) {
    ASSERT_TRUE(this->fileSystem().createDirectories(this->path("a"), 0700));
    ASSERT_TRUE(this->fileSystem().createDirectories(this->path("a/b"), 0755));
    ASSERT_TRUE(this->fileSystem().createDirectories(this->path("a/b"), 0711));
    EXPECT_EQ(this->harness_.permissionsOf(this->path("a")), 0700U);
    EXPECT_EQ(this->harness_.permissionsOf(this->path("a/b")), 0755U);
}

TYPED_TEST_P(FileSystemContract, AFolderMayBeNamedWithASlashAtItsEnd) {
    ASSERT_TRUE(this->fileSystem().createDirectories(this->path("a/b/"), 0755));
    EXPECT_EQ(this->harness_.permissionsOf(this->path("a/b")), 0755U);
}

TYPED_TEST_P(FileSystemContract, AFileIsNoFolder) {
    ASSERT_TRUE(this->fileSystem().writeFileAtomically(this->path("a"), "1", 0644));
    EXPECT_EQ(this->fileSystem().createDirectories(this->path("a"), 0755).failure().code, ENOTDIR);
    EXPECT_EQ(this->fileSystem().createDirectories(this->path("a/b"), 0755).failure().code, ENOTDIR);
    EXPECT_EQ(this->fileSystem().writeFileAtomically(this->path("a/b"), "1", 0644).failure().code, ENOTDIR);
}

TYPED_TEST_P(FileSystemContract, TheCurrentDirectoryIsAbsolute) {
    EXPECT_TRUE(this->fileSystem().currentDirectory().starts_with('/'));
}

REGISTER_TYPED_TEST_SUITE_P(FileSystemContract, WhatWasWrittenIsRead, AnEmptyFileIsReadWithALimitOfNothing,
                            AFileAboveTheLimitIsRefusedWithTheLimitsValue, AFileThatIsNotThereCannotBeRead,
                            AFolderIsNotReadAsAFile, WritingReplacesContentAndPermissions,
                            WritingLeavesNothingElseBehind, WritingIntoAMissingFolderFails,
                            WritingOverAFolderFailsAndLeavesNothingBehind, AnEmptyPathIsRefused,
                            APathThatEndsInASlashNamesNoFile, APathWithANulIsNotCutThere,
                            MissingFoldersAreCreatedWithThePermissions, AFolderThatIsThereKeepsItsPermissions,
                            AFolderMayBeNamedWithASlashAtItsEnd, AFileIsNoFolder, TheCurrentDirectoryIsAbsolute);

} // namespace vela::testing
