#include "platform/host/HostFacts.h"
#include "testing/TemporaryFolder.h"

#include <cstdlib>
#include <fcntl.h>
#include <filesystem>
#include <fstream>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

namespace vela::platform {
namespace {

using vela::testing::TemporaryFolder;

/// Sets an environment variable over a scope.
class ScopedVariable {
public:
    ScopedVariable(const char* name, const char* value) : name_(name) {
        const char* before = std::getenv(name);
        had_ = before != nullptr;
        before_ = had_ ? before : "";
        setenv(name, value, 1);
    }
    ~ScopedVariable() { had_ ? setenv(name_, before_.c_str(), 1) : unsetenv(name_); }
    ScopedVariable(const ScopedVariable&) = delete;
    ScopedVariable& operator=(const ScopedVariable&) = delete;

private:
    const char* name_;
    bool had_ = false;
    std::string before_;
};

TEST(HostFactsTest, TheEnvironmentIsReadAsItIs) {
    const ScopedVariable runtime("XDG_RUNTIME_DIR", "/run/user/9");
    const ScopedVariable state("XDG_STATE_HOME", "");
    const ScopedVariable home("HOME", "/home/x");
    const SettingsEnvironment environment = processEnvironment();
    EXPECT_EQ(environment.ordinaryUser, geteuid() != 0);
    EXPECT_EQ(environment.runtimeHome, "/run/user/9");
    EXPECT_EQ(environment.stateHome, "");
    EXPECT_EQ(environment.home, "/home/x");
}

TEST(HostFactsTest, AFolderThatIsThereIsWritable) {
    const TemporaryFolder folder;
    EXPECT_EQ(folderState(folder.path()), FolderState::Writable);
    EXPECT_EQ(folderState(folder.path() + "///"), FolderState::Writable);
}

TEST(HostFactsTest, AFolderBelowAWritableOneCanBeCreatedAndIsNot) {
    const TemporaryFolder folder;
    EXPECT_EQ(folderState(folder / "a"), FolderState::CanBeCreated);
    EXPECT_EQ(folderState(folder / "a/b//c/"), FolderState::CanBeCreated);
    EXPECT_FALSE(std::filesystem::exists(folder / "a"));
}

TEST(HostFactsTest, AFileIsNoFolderAndHasNoneBelowIt) {
    const TemporaryFolder folder;
    std::ofstream(folder / "file") << "x";
    EXPECT_EQ(folderState(folder / "file"), FolderState::NoFolder);
    EXPECT_EQ(folderState(folder / "file/below"), FolderState::NoFolder);
}

TEST(HostFactsTest, AFolderThatTheKernelKeepsIsNotWritable) {
    // Also for root: files cannot be made in procfs.
    EXPECT_NE(folderState("/proc/self/fd/nothing"), FolderState::Writable);
    if (geteuid() == 0) {
        GTEST_SKIP() << "root may write everywhere";
    }
    const TemporaryFolder folder;
    std::filesystem::create_directory(folder / "closed");
    std::filesystem::permissions(folder / "closed",
                                 std::filesystem::perms::owner_read | std::filesystem::perms::owner_exec);
    EXPECT_EQ(folderState(folder / "closed"), FolderState::NotWritable);
    EXPECT_EQ(folderState(folder / "closed/below"), FolderState::CannotBeCreated);
}

TEST(HostFactsTest, AProgramIsFoundInTheFirstFolderThatHasIt) {
    const TemporaryFolder folder;
    for (const char* name : {"one", "two"}) {
        std::filesystem::create_directory(folder / name);
        std::ofstream(folder / (std::string(name) + "/tool")) << "#!/bin/sh\n";
    }
    std::filesystem::permissions(folder / "two/tool", std::filesystem::perms::owner_all);
    const std::string path = "relative:" + (folder / "none") + ":" + (folder / "one") + ":" + (folder / "two");
    const ScopedVariable variable("PATH", path.c_str());
    EXPECT_EQ(findProgram("tool"), folder / "two/tool"); // the first one is not executable
    EXPECT_EQ(findProgram("other"), std::nullopt);
}

TEST(HostFactsTest, WithoutAPathNoProgramIsFound) {
    const ScopedVariable variable("PATH", "");
    EXPECT_EQ(findProgram("sh"), std::nullopt);
}

TEST(HostFactsTest, APipeIsNoTerminal) {
    int ends[2];
    ASSERT_EQ(pipe2(ends, O_CLOEXEC), 0);
    EXPECT_FALSE(isTerminal(ends[1]));
    EXPECT_FALSE(isTerminal(-1));
    close(ends[0]);
    close(ends[1]);
}

TEST(HostFactsTest, APseudoTerminalIsOne) {
    const int master = posix_openpt(O_RDWR | O_NOCTTY | O_CLOEXEC);
    if (master < 0) {
        GTEST_SKIP() << "no pseudo-terminals here";
    }
    EXPECT_TRUE(isTerminal(master));
    close(master);
}

TEST(HostFactsTest, StandardErrorIsTheJournalOnlyWhereTheServiceManagerNamesIt) {
    {
        const ScopedVariable variable("JOURNAL_STREAM", "1:2");
        EXPECT_FALSE(isStandardErrorJournal());
    }
    struct stat status {};
    ASSERT_EQ(fstat(STDERR_FILENO, &status), 0);
    const std::string own = std::to_string(status.st_dev) + ":" + std::to_string(status.st_ino);
    const ScopedVariable variable("JOURNAL_STREAM", own.c_str());
    EXPECT_TRUE(isStandardErrorJournal());
}

} // namespace
} // namespace vela::platform
