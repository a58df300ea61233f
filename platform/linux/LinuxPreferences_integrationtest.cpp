#include "platform/linux/LinuxFileSystem.h"
#include "platform/linux/LinuxPreferences.h"
#include "platform/linux/LinuxPreferencesEditing.h"
#include "platform/plist/PropertyListCodec.h"
#include "testing/PreferencesContract.h"
#include "testing/TemporaryFolder.h"

#include <cerrno>
#include <filesystem>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <string>
#include <sys/stat.h>
#include <thread>
#include <vector>

namespace vela::platform {

namespace {

struct LinuxHarness {
    const Preferences& preferences() { return preferences_; }
    void set(std::string_view domain, std::string_view key, const Value& value) {
        EXPECT_TRUE(editing_.write(domain, key, value));
    }
    void remove(std::string_view domain, std::string_view key) {
        const auto removed = editing_.remove(domain, key);
        EXPECT_TRUE(removed && *removed);
    }

    testing::TemporaryFolder folder_;
    LinuxFileSystem files_;
    PropertyListCodec propertyLists_;
    LinuxPreferences preferences_{folder_.path(), files_, propertyLists_};
    LinuxPreferencesEditing editing_{folder_.path(), files_, propertyLists_};
};

class LinuxPreferencesTest : public ::testing::Test, protected LinuxHarness {
protected:
    std::string path() const { return folder_ / "preferences/com.orvex.audio.plist"; }
    void writeFile(std::string_view content) {
        ASSERT_TRUE(files_.createDirectories(folder_ / "preferences", 0755));
        ASSERT_TRUE(files_.writeFileAtomically(path(), content, 0644));
    }
    Value value() const { return preferences_.copyValue("com.orvex.audio", "level"); }
    static unsigned permissionsOf(const std::string& path) {
        struct stat status {};
        return stat(path.c_str(), &status) == 0 ? status.st_mode & 07777U : 0;
    }
};

TEST_F(LinuxPreferencesTest, AFileMayHaveAnyOfTheThreeFormats) {
    writeFile("{ level = 3; }");
    EXPECT_EQ(value(), Value("3"));
    const Value content = Dictionary{{"level", 3}};
    writeFile(*propertyLists_.write(content, PropertyListFormat::Xml));
    EXPECT_EQ(value(), Value(3));
    writeFile(*propertyLists_.write(content, PropertyListFormat::Binary));
    EXPECT_EQ(value(), Value(3));
}

TEST_F(LinuxPreferencesTest, ABrokenFileHasNoValues) {
    for (const std::string_view content : {"", "{ level = 3;", "bplist00", "<plist>", "(level, 3)", "level"}) {
        writeFile(content);
        EXPECT_EQ(value(), Value()) << content;
        EXPECT_FALSE(preferences_.readDomain("com.orvex.audio")) << content;
    }
}

TEST_F(LinuxPreferencesTest, WhatIsWrongWithAFileIsSaidWithItsPath) {
    writeFile("(level, 3)");
    EXPECT_EQ(preferences_.readDomain("com.orvex.audio").failure().description, path() + ": not a dictionary");
    writeFile("{ level = 3;");
    const std::string description = preferences_.readDomain("com.orvex.audio").failure().description;
    EXPECT_TRUE(description.starts_with(path() + ": property list: line 1, ")) << description;
}

TEST_F(LinuxPreferencesTest, AFileOfOneMebibyteIsReadAndALargerOneIsNot) {
    const std::string content = "{ level = 3; }";
    writeFile(content + std::string(1'048'576 - content.size(), '\n'));
    EXPECT_EQ(value(), Value("3"));
    writeFile(content + std::string(1'048'577 - content.size(), '\n'));
    EXPECT_EQ(value(), Value());
}

TEST_F(LinuxPreferencesTest, AFolderInAFilesPlaceHasNoValues) {
    std::filesystem::create_directories(path());
    EXPECT_EQ(value(), Value());
}

TEST_F(LinuxPreferencesTest, NamesThatCannotBeAFilesAreRefused) {
    writeFile("{ level = 3; }");
    ASSERT_TRUE(files_.writeFileAtomically(folder_ / "outside.plist", "{ level = 4; }", 0644));
    ASSERT_TRUE(files_.writeFileAtomically(folder_ / "preferences/.hidden.plist", "{ level = 4; }", 0644));
    for (const std::string& domain :
         {std::string(), std::string("../outside"), std::string(".hidden"), std::string("."), std::string(".."),
          std::string("/etc/passwd"), std::string("a/b"), std::string("com.orvex.audio\0x", 17),
          std::string(250, 'x')}) {
        EXPECT_EQ(preferences_.copyValue(domain, "level"), Value()) << domain;
        EXPECT_EQ(preferences_.readDomain(domain).failure().code, EINVAL) << domain;
        EXPECT_EQ(editing_.readAll(domain).failure().code, EINVAL) << domain;
        EXPECT_EQ(editing_.write(domain, "level", 1).failure().code, EINVAL) << domain;
        EXPECT_EQ(editing_.remove(domain, "level").failure().code, EINVAL) << domain;
    }
}

TEST_F(LinuxPreferencesTest, ALongNameThatFitsIsTaken) {
    const std::string domain(249, 'x');
    ASSERT_TRUE(editing_.write(domain, "a", 1));
    EXPECT_EQ(preferences_.copyValue(domain, "a"), Value(1));
}

TEST_F(LinuxPreferencesTest, ARefusedNameMakesNoFolder) {
    ASSERT_FALSE(editing_.write("../x", "a", 1));
    EXPECT_FALSE(std::filesystem::exists(folder_ / "preferences"));
}

TEST_F(LinuxPreferencesTest, AWriteMakesFolderAndFileForAllToRead) {
    ASSERT_TRUE(editing_.write("com.orvex.audio", "level", 1));
    EXPECT_EQ(permissionsOf(folder_ / "preferences"), 0755U);
    EXPECT_EQ(permissionsOf(path()), 0644U);
    EXPECT_TRUE(files_.readFile(path(), 1000)->starts_with("<?xml"));
}

TEST_F(LinuxPreferencesTest, AWriteKeepsTheOtherKeys) {
    writeFile("{ a = x; level = 3; b = (1, 2); }");
    ASSERT_TRUE(editing_.write("com.orvex.audio", "level", 4));
    EXPECT_EQ(*editing_.readAll("com.orvex.audio"), (Dictionary{{"a", "x"}, {"level", 4}, {"b", Array{"1", "2"}}}));
}

TEST_F(LinuxPreferencesTest, ABrokenFileIsNotOverwritten) {
    writeFile("{ level = 3;");
    EXPECT_FALSE(editing_.write("com.orvex.audio", "level", 4));
    EXPECT_FALSE(editing_.remove("com.orvex.audio", "level"));
    EXPECT_EQ(*files_.readFile(path(), 100), "{ level = 3;");
}

TEST_F(LinuxPreferencesTest, AValueThatMakesTheFileTooLargeIsRefused) {
    ASSERT_TRUE(editing_.write("com.orvex.audio", "level", 1));
    const std::string large(1'048'576, 'x');
    EXPECT_EQ(editing_.write("com.orvex.audio", "large", std::string_view(large)).failure().code, EFBIG);
    EXPECT_EQ(value(), Value(1));
}

TEST_F(LinuxPreferencesTest, NoValueCannotBeWritten) {
    EXPECT_EQ(editing_.write("com.orvex.audio", "level", Value()).failure().code, EINVAL);
}

TEST_F(LinuxPreferencesTest, WithoutAFileThereIsNothingToReadOrToRemove) {
    EXPECT_EQ(*editing_.readAll("com.orvex.audio"), Dictionary());
    const auto removed = editing_.remove("com.orvex.audio", "level");
    ASSERT_TRUE(removed);
    EXPECT_FALSE(*removed);
    EXPECT_FALSE(std::filesystem::exists(folder_ / "preferences"));
}

TEST_F(LinuxPreferencesTest, ARemovedKeyIsGoneAndTheOthersStay) {
    writeFile("{ a = x; level = 3; }");
    const auto removed = editing_.remove("com.orvex.audio", "level");
    ASSERT_TRUE(removed);
    EXPECT_TRUE(*removed);
    EXPECT_EQ(*editing_.readAll("com.orvex.audio"), (Dictionary{{"a", "x"}}));
    const auto again = editing_.remove("com.orvex.audio", "level");
    ASSERT_TRUE(again);
    EXPECT_FALSE(*again);
}

TEST_F(LinuxPreferencesTest, TheLastKeyLeavesAnEmptyFile) {
    writeFile("{ level = 3; }");
    ASSERT_TRUE(editing_.remove("com.orvex.audio", "level"));
    EXPECT_TRUE(std::filesystem::exists(path()));
    EXPECT_EQ(*editing_.readAll("com.orvex.audio"), Dictionary());
}

TEST_F(LinuxPreferencesTest, AllKeysAreRemovedAtOnceAndAnEmptyFileStays) {
    writeFile("{ a = x; level = 3; }");
    const auto removed = editing_.removeAll("com.orvex.audio");
    ASSERT_TRUE(removed);
    EXPECT_TRUE(*removed);
    EXPECT_TRUE(std::filesystem::exists(path()));
    EXPECT_EQ(*editing_.readAll("com.orvex.audio"), Dictionary());
    const auto again = editing_.removeAll("com.orvex.audio");
    ASSERT_TRUE(again);
    EXPECT_FALSE(*again);
}

TEST_F(LinuxPreferencesTest, RemovingAllTouchesNoOtherDomainAndNoBrokenFile) {
    ASSERT_TRUE(editing_.write("com.orvex.vela", "a", 1));
    writeFile("{ level = 3;");
    EXPECT_FALSE(editing_.removeAll("com.orvex.audio"));
    EXPECT_EQ(*files_.readFile(path(), 100), "{ level = 3;");
    EXPECT_EQ(*editing_.readAll("com.orvex.vela"), (Dictionary{{"a", 1}}));
    EXPECT_EQ(editing_.removeAll("../x").failure().code, EINVAL);
}

TEST_F(LinuxPreferencesTest, WithoutAFolderThereIsNothingToRemoveAtAll) {
    const auto removed = editing_.removeAll("com.orvex.audio");
    ASSERT_TRUE(removed);
    EXPECT_FALSE(*removed);
    EXPECT_FALSE(std::filesystem::exists(folder_ / "preferences"));
}

TEST_F(LinuxPreferencesTest, AFolderThatCannotBeMadeIsAFailure) {
    ASSERT_TRUE(files_.writeFileAtomically(folder_ / "preferences", "in the way", 0644));
    EXPECT_EQ(editing_.write("com.orvex.audio", "level", 1).failure().code, ENOTDIR);
    EXPECT_EQ(editing_.remove("com.orvex.audio", "level").failure().code, ENOTDIR);
    EXPECT_EQ(value(), Value());
}

TEST_F(LinuxPreferencesTest, NoWriterLosesAnothersKey) {
    constexpr int kWriters = 4;
    std::vector<std::thread> writers;
    writers.reserve(kWriters);
    for (int writer = 0; writer < kWriters; ++writer) {
        writers.emplace_back([this, writer] {
            for (int number = 0; number < 10; ++number) {
                EXPECT_TRUE(editing_.write("com.orvex.audio", std::to_string(10 * writer + number), number));
                EXPECT_TRUE(preferences_.readDomain("com.orvex.audio"));
            }
        });
    }
    for (std::thread& writer : writers) {
        writer.join();
    }
    EXPECT_EQ(editing_.readAll("com.orvex.audio")->size(), 40U);
}

} // namespace

} // namespace vela::platform

namespace vela::testing {

INSTANTIATE_TYPED_TEST_SUITE_P(Linux, PreferencesContract, platform::LinuxHarness);

} // namespace vela::testing
