// What every FileSystem does, as a test suite that runs on the fake and on the real one.
//
// A harness has: `FileSystem& fileSystem()`; `std::string root()`, an empty folder; `std::optional<std::uint32_t>
// permissionsOf(path)`, none for what is not there; `std::vector<std::string> filesBelow()`, the paths of all files in
// the root, sorted; `void limitFileSize(std::optional<std::size_t> bytes)`: files of more bytes cannot be written
// (EFBIG) until it is called with none; `void own(path, user, group)` gives what is there to somebody else, or answers
// false where it cannot. Everybody may search the root.
#pragma once

#include "platform/FileSystem.h"

#include <cerrno>
#include <cstdint>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <optional>
#include <string>
#include <utility>
#include <vector>

namespace vela::testing {

template <class Harness>
class FileSystemContract : public ::testing::Test {
protected:
    platform::FileSystem& fileSystem() { return harness_.fileSystem(); }
    std::string path(const std::string& below) { return harness_.root() + "/" + below; }
    platform::Result<std::string> readFor(const platform::Identity& reader, const std::string& below) {
        platform::Result<std::string> read = fileSystem().readFileFor(reader, path(below), 100);
        EXPECT_TRUE(read) << (read ? "" : read.failure().description);
        return read ? std::move(read) : platform::Result<std::string>(std::string("nothing"));
    }
    void expectDenied(const platform::Identity& reader, const std::string& below) {
        const platform::Result<std::string> read = fileSystem().readFileFor(reader, path(below), 100);
        ASSERT_FALSE(read);
        EXPECT_EQ(read.failure().code, EACCES);
        EXPECT_EQ(read.failure().description, "open " + path(below) + ": Permission denied");
    }

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

// On behalf of others. 4001 and 4002 are users, 4101 and 4102 groups.

TYPED_TEST_P(FileSystemContract, AFileForEverybodyIsReadForAStranger) {
    ASSERT_TRUE(this->fileSystem().writeFileAtomically(this->path("a"), "text", 0644));
    EXPECT_EQ(*this->readFor({4001, 4101}, "a"), "text");
}

TYPED_TEST_P(FileSystemContract, AFileForItsOwnerIsRefusedToAStranger) {
    ASSERT_TRUE(this->fileSystem().writeFileAtomically(this->path("a"), "text", 0600));
    this->expectDenied({4001, 4101}, "a");
}

TYPED_TEST_P(FileSystemContract, AFileForItsOwnerIsReadForThem) {
    ASSERT_TRUE(this->fileSystem().writeFileAtomically(this->path("a"), "text", 0600));
    if (!this->harness_.own(this->path("a"), 4001, 4101)) {
        GTEST_SKIP() << "files cannot be given away here";
    }
    EXPECT_EQ(*this->readFor({4001, 4102}, "a"), "text");
    this->expectDenied({4002, 4101}, "a");
}

TYPED_TEST_P(FileSystemContract, AFileForAGroupIsReadForThoseInIt) {
    ASSERT_TRUE(this->fileSystem().writeFileAtomically(this->path("a"), "text", 0640));
    if (!this->harness_.own(this->path("a"), 4001, 4101)) {
        GTEST_SKIP() << "files cannot be given away here";
    }
    EXPECT_EQ(*this->readFor({4002, 4101}, "a"), "text");
    EXPECT_EQ(*this->readFor({4002, 4102, {4103, 4101}}, "a"), "text");
    this->expectDenied({4002, 4102, {4103}}, "a");
}

TYPED_TEST_P(FileSystemContract, TheOwnersRightsHoldForTheOwnerAlsoWhereOthersHaveMore) {
    ASSERT_TRUE(this->fileSystem().writeFileAtomically(this->path("a"), "text", 0044));
    if (!this->harness_.own(this->path("a"), 4001, 4101)) {
        GTEST_SKIP() << "files cannot be given away here";
    }
    this->expectDenied({4001, 4101}, "a");
    EXPECT_EQ(*this->readFor({4002, 4102}, "a"), "text");
}

TYPED_TEST_P(FileSystemContract, TheGroupsRightsHoldForTheGroupAlsoWhereOthersHaveMore) {
    ASSERT_TRUE(this->fileSystem().writeFileAtomically(this->path("a"), "text", 0604));
    if (!this->harness_.own(this->path("a"), 4001, 4101)) {
        GTEST_SKIP() << "files cannot be given away here";
    }
    this->expectDenied({4002, 4101}, "a");
    this->expectDenied({4002, 4102, {4101}}, "a");
}

TYPED_TEST_P(FileSystemContract, AFileBelowAFolderThatTheReaderMayNotSearchIsRefused) {
    ASSERT_TRUE(this->fileSystem().createDirectories(this->path("closed"), 0755));
    ASSERT_TRUE(this->fileSystem().createDirectories(this->path("closed/inner"), 0755));
    ASSERT_TRUE(this->fileSystem().writeFileAtomically(this->path("closed/inner/a"), "text", 0644));
    EXPECT_EQ(*this->readFor({4001, 4101}, "closed/inner/a"), "text");
    ASSERT_TRUE(this->fileSystem().createDirectories(this->path("shut"), 0744)); // to be listed, not to be searched
    ASSERT_TRUE(this->fileSystem().writeFileAtomically(this->path("shut/a"), "text", 0644));
    this->expectDenied({4001, 4101}, "shut/a");
    this->expectDenied({4001, 4101}, "shut/missing");
}

TYPED_TEST_P(FileSystemContract, RootReadsEveryFile) {
    ASSERT_TRUE(this->fileSystem().createDirectories(this->path("shut"), 0700));
    ASSERT_TRUE(this->fileSystem().writeFileAtomically(this->path("shut/a"), "text", 0600));
    this->harness_.own(this->path("shut/a"), 4001, 4101);
    this->harness_.own(this->path("shut"), 4001, 4101);
    EXPECT_EQ(*this->readFor({0, 0}, "shut/a"), "text");
}

TYPED_TEST_P(FileSystemContract, NobodyInParticularReadsWhatIsForEverybody) {
    ASSERT_TRUE(this->fileSystem().writeFileAtomically(this->path("a"), "text", 0604));
    ASSERT_TRUE(this->fileSystem().writeFileAtomically(this->path("b"), "text", 0600));
    EXPECT_EQ(*this->readFor({}, "a"), "text");
    this->expectDenied({}, "b");
}

TYPED_TEST_P(FileSystemContract, WhatIsReadForOthersIsHeldToTheSameRules) {
    ASSERT_TRUE(this->fileSystem().createDirectories(this->path("folder"), 0755));
    ASSERT_TRUE(this->fileSystem().writeFileAtomically(this->path("a"), "12345", 0644));
    const platform::Identity reader{4001, 4101};
    EXPECT_EQ(this->fileSystem().readFileFor(reader, "", 100).failure().code, EINVAL);
    const auto missing = this->fileSystem().readFileFor(reader, this->path("missing"), 100);
    EXPECT_EQ(missing.failure().code, ENOENT);
    EXPECT_EQ(missing.failure().description, "open " + this->path("missing") + ": No such file or directory");
    const auto folder = this->fileSystem().readFileFor(reader, this->path("folder"), 100);
    EXPECT_EQ(folder.failure().code, EISDIR);
    EXPECT_EQ(folder.failure().description, "read " + this->path("folder") + ": not a regular file");
    const auto large = this->fileSystem().readFileFor(reader, this->path("a"), 4);
    EXPECT_EQ(large.failure().code, EFBIG);
    EXPECT_EQ(large.failure().description, "read " + this->path("a") + ": larger than its limit of 4 bytes");
    EXPECT_EQ(*this->fileSystem().readFileFor(reader, this->path("a"), 5), "12345");
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
    EXPECT_EQ(file->failure(), nullptr);
    this->harness_.limitFileSize(4096);
    file->append(std::string(10'000, 'x'));
    EXPECT_NE(file->failure(), nullptr);
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

TYPED_TEST_P(FileSystemContract, AFileThatCannotBeBegunTellsAtOnceAndAtItsEnd) {
    const auto file = this->fileSystem().createFile(this->path("missing/a"), 0644);
    ASSERT_NE(file, nullptr);
    ASSERT_NE(file->failure(), nullptr);
    EXPECT_EQ(file->failure()->code, ENOENT);
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

REGISTER_TYPED_TEST_SUITE_P(
    FileSystemContract, WhatWasWrittenIsRead, AnEmptyFileIsReadWithALimitOfNothing, AFileForEverybodyIsReadForAStranger,
    AFileForItsOwnerIsRefusedToAStranger, AFileForItsOwnerIsReadForThem, AFileForAGroupIsReadForThoseInIt,
    TheOwnersRightsHoldForTheOwnerAlsoWhereOthersHaveMore, TheGroupsRightsHoldForTheGroupAlsoWhereOthersHaveMore,
    AFileBelowAFolderThatTheReaderMayNotSearchIsRefused, RootReadsEveryFile, NobodyInParticularReadsWhatIsForEverybody,
    WhatIsReadForOthersIsHeldToTheSameRules, AFileAboveTheLimitIsRefusedWithTheLimitsValue,
    AFileThatIsNotThereCannotBeRead, AFolderIsNotReadAsAFile, WritingReplacesContentAndPermissions,
    WritingLeavesNothingElseBehind, WritingIntoAMissingFolderFails, WritingOverAFolderFailsAndLeavesNothingBehind,
    AnEmptyPathIsRefused, APathThatEndsInASlashNamesNoFile, APathWithANulIsNotCutThere, AFileOfManyPiecesIsReadWhole,
    AFileWithoutPiecesIsEmpty, AFileIsNotSeenBeforeItIsWhole, AFileThatIsGivenUpLeavesTheOldOneAndNothingElse,
    APieceThatCannotBeWrittenLeavesTheOldFileAndNothingElse, AFileThatCannotBeBegunTellsAtOnceAndAtItsEnd,
    MissingFoldersAreCreatedWithThePermissions, AFolderThatIsThereKeepsItsPermissions,
    AFolderMayBeNamedWithASlashAtItsEnd, AFileIsNoFolder, TheCurrentDirectoryIsAbsolute);

} // namespace vela::testing
