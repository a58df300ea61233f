// What every FileSystem does, as a test suite that runs on the fake and on the real one.
//
// A harness has: `FileSystem& fileSystem()`; `std::string root()`, an empty folder; `std::optional<std::uint32_t>
// permissionsOf(path)`, none for what is not there; `std::vector<std::string> filesBelow()`, the paths of all files in
// the root, sorted; `void limitFileSize(std::optional<std::size_t> bytes)`: files of more bytes cannot be written
// (EFBIG) until it is called with none.
#pragma once

#include "platform/FileSystem.h"

#include <cerrno>
#include <cstdint>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <optional>
#include <string>
#include <vector>

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

TYPED_TEST_P(FileSystemContract, AFileOfManyPiecesIsReadWhole) {
    std::string content;
    const auto file = this->fileSystem().createFile(this->path("a"), 0640);
    for (int number = 0; number < 20; ++number) {
        const std::string piece(1'048'576 + static_cast<std::size_t>(number), static_cast<char>('a' + number));
        file->append(piece);
        content += piece;
    }
    ASSERT_TRUE(file->commit());
    const auto read = this->fileSystem().readFile(this->path("a"), 30'000'000);
    ASSERT_TRUE(read);
    EXPECT_TRUE(*read == content) << read->size(); // not printed: twenty million bytes
    EXPECT_EQ(this->harness_.permissionsOf(this->path("a")), 0640U);
    EXPECT_THAT(this->harness_.filesBelow(), ::testing::ElementsAre(this->path("a")));
}

TYPED_TEST_P(FileSystemContract, AFileWithoutPiecesIsEmpty) {
    const auto file = this->fileSystem().createFile(this->path("a"), 0644);
    file->append("");
    ASSERT_TRUE(file->commit());
    EXPECT_EQ(*this->fileSystem().readFile(this->path("a"), 100), "");
}

TYPED_TEST_P(FileSystemContract, AFileIsNotSeenBeforeItIsWhole) {
    ASSERT_TRUE(this->fileSystem().writeFileAtomically(this->path("a"), "old", 0644));
    const auto file = this->fileSystem().createFile(this->path("a"), 0644);
    file->append("new");
    EXPECT_EQ(*this->fileSystem().readFile(this->path("a"), 100), "old");
    ASSERT_TRUE(file->commit());
    EXPECT_EQ(*this->fileSystem().readFile(this->path("a"), 100), "new");
}

TYPED_TEST_P(FileSystemContract, AFileThatIsGivenUpLeavesTheOldOneAndNothingElse) {
    ASSERT_TRUE(this->fileSystem().writeFileAtomically(this->path("a"), "old", 0600));
    auto file = this->fileSystem().createFile(this->path("a"), 0644);
    file->append("half");
    file.reset();
    EXPECT_EQ(*this->fileSystem().readFile(this->path("a"), 100), "old");
    EXPECT_EQ(this->harness_.permissionsOf(this->path("a")), 0600U);
    EXPECT_THAT(this->harness_.filesBelow(), ::testing::ElementsAre(this->path("a")));
}

TYPED_TEST_P(FileSystemContract, APieceThatCannotBeWrittenLeavesTheOldFileAndNothingElse) {
    ASSERT_TRUE(this->fileSystem().writeFileAtomically(this->path("a"), "old", 0600));
    auto file = this->fileSystem().createFile(this->path("a"), 0644);
    file->append("fits");
    this->harness_.limitFileSize(4096);
    file->append(std::string(10'000, 'x'));
    this->harness_.limitFileSize(std::nullopt);
    file->append("too late");
    const auto written = file->commit();
    file.reset();
    ASSERT_FALSE(written);
    EXPECT_EQ(written.failure().code, EFBIG);
    EXPECT_EQ(written.failure().description, "write " + this->path("a") + ": File too large");
    EXPECT_EQ(*this->fileSystem().readFile(this->path("a"), 100), "old");
    EXPECT_EQ(this->harness_.permissionsOf(this->path("a")), 0600U);
    EXPECT_THAT(this->harness_.filesBelow(), ::testing::ElementsAre(this->path("a")));
}

TYPED_TEST_P(FileSystemContract, AFileThatCannotBeBegunTellsAtItsEnd) {
    const auto file = this->fileSystem().createFile(this->path("missing/a"), 0644);
    ASSERT_NE(file, nullptr);
    file->append("1");
    const auto written = file->commit();
    ASSERT_FALSE(written);
    EXPECT_EQ(written.failure().code, ENOENT);
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
                            APathThatEndsInASlashNamesNoFile, APathWithANulIsNotCutThere, AFileOfManyPiecesIsReadWhole,
                            AFileWithoutPiecesIsEmpty, AFileIsNotSeenBeforeItIsWhole,
                            AFileThatIsGivenUpLeavesTheOldOneAndNothingElse,
                            APieceThatCannotBeWrittenLeavesTheOldFileAndNothingElse,
                            AFileThatCannotBeBegunTellsAtItsEnd, MissingFoldersAreCreatedWithThePermissions,
                            AFolderThatIsThereKeepsItsPermissions, AFolderMayBeNamedWithASlashAtItsEnd, AFileIsNoFolder,
                            TheCurrentDirectoryIsAbsolute);

} // namespace vela::testing
