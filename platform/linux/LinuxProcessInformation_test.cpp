#include "platform/linux/FileDescriptor.h"
#include "platform/linux/LinuxProcessInformation.h"
#include "testing/ProcessInformationContract.h"
#include "testing/TemporaryFolder.h"

#include <array>
#include <fcntl.h>
#include <filesystem>
#include <fstream>
#include <gtest/gtest.h>
#include <string>
#include <sys/prctl.h>
#include <sys/wait.h>

namespace vela::platform {

namespace {

/// A child that takes a name and then lives until it is told to end or its parent is gone.
class Child {
public:
    explicit Child(const char* name) {
        std::array<int, 2> ready{};
        std::array<int, 2> leave{};
        EXPECT_EQ(pipe2(ready.data(), O_CLOEXEC), 0);
        EXPECT_EQ(pipe2(leave.data(), O_CLOEXEC), 0);
        pid_ = fork();
        if (pid_ == 0) {
            char byte = 0;
            prctl(PR_SET_NAME, name);
            close(leave[1]);
            const bool told = ::write(ready[1], &byte, 1) == 1 && ::read(leave[0], &byte, 1) == 0;
            _exit(told ? 0 : 1);
        }
        const FileDescriptor readyReader(ready[0]);
        const FileDescriptor readyWriter(ready[1]);
        const FileDescriptor leaveReader(leave[0]);
        leave_ = FileDescriptor(leave[1]);
        char byte = 0;
        EXPECT_EQ(::read(ready[0], &byte, 1), 1);
    }
    ~Child() { reap(); }
    Child(const Child&) = delete;
    Child& operator=(const Child&) = delete;

    pid_t pid() const { return pid_; }
    /// The child has ended afterwards, and nobody has waited for it.
    void end() {
        leave_ = FileDescriptor();
        siginfo_t information{};
        EXPECT_EQ(waitid(P_PID, static_cast<id_t>(pid_), &information, WEXITED | WNOWAIT), 0);
    }
    void reap() {
        leave_ = FileDescriptor();
        if (!reaped_) {
            EXPECT_EQ(waitpid(pid_, nullptr, 0), pid_);
            reaped_ = true;
        }
    }

private:
    pid_t pid_ = -1;
    FileDescriptor leave_;
    bool reaped_ = false;
};

struct LinuxHarness {
    const ProcessInformation& processes() { return processes_; }
    std::int32_t child() { return living_.pid(); }
    std::int32_t gone() {
        ended_.reap();
        return ended_.pid();
    }

    LinuxProcessInformation processes_;
    Child living_{"velachild"};
    Child ended_{"velagone"};
};

} // namespace

} // namespace vela::platform

namespace vela::testing {

INSTANTIATE_TYPED_TEST_SUITE_P(Linux, ProcessInformationContract, platform::LinuxHarness);

} // namespace vela::testing

namespace vela::platform {

namespace {

std::string nameOfChildNamed(const char* name) {
    const Child child(name);
    ProcessRecord record;
    EXPECT_TRUE(LinuxProcessInformation().read(child.pid(), record));
    EXPECT_EQ(record.parent, getpid());
    EXPECT_GT(record.startTimeTicks, 0U);
    return record.commandName;
}

TEST(LinuxProcessInformationTest, ANameMayHoldABracketSpacesAndALineEnd) {
    EXPECT_EQ(nameOfChildNamed("a) b (c\nd) R 1"), "a) b (c\nd) R 1");
}

TEST(LinuxProcessInformationTest, ANameMayBeOneBracket) { EXPECT_EQ(nameOfChildNamed(")"), ")"); }

TEST(LinuxProcessInformationTest, ANameMayBeEmpty) { EXPECT_EQ(nameOfChildNamed(""), ""); }

TEST(LinuxProcessInformationTest, ANameThatIsNotUtf8ComesAsItIs) {
    EXPECT_EQ(nameOfChildNamed("a\xff\xc3"), "a\xff\xc3");
}

TEST(LinuxProcessInformationTest, ANameHasAtMostFifteenBytes) {
    EXPECT_EQ(nameOfChildNamed("0123456789abcdefgh"), "0123456789abcde");
}

TEST(LinuxProcessInformationTest, AProcessThatNobodyWaitedForStillHasItsRecord) {
    Child child("velazombie");
    child.end();
    ProcessRecord record;
    ASSERT_TRUE(LinuxProcessInformation().read(child.pid(), record));
    EXPECT_EQ(record.commandName, "velazombie");
    child.reap();
    EXPECT_FALSE(LinuxProcessInformation().read(child.pid(), record));
}

TEST(LinuxProcessInformationTest, TheOwnNumberIsThatOfTheSystem) {
    EXPECT_EQ(LinuxProcessInformation().ownPid(), getpid());
}

/// A recorded tree of procfs.
class LinuxProcessInformationTreeTest : public ::testing::Test {
protected:
    void put(const std::string& file, const std::string& content) {
        std::filesystem::create_directories((folder_ / file).substr(0, (folder_ / file).rfind('/')));
        std::ofstream(folder_ / file, std::ios::binary) << content;
    }
    bool read(std::int32_t pid) { return LinuxProcessInformation(folder_.path()).read(pid, record_); }

    const std::string front_ = "1234 (audio host) S 17 1234 1234 0 -1 4194560 1201 0 3 0 22 11 0 0 20 0 5 0 ";
    const testing::TemporaryFolder folder_;
    ProcessRecord record_;
};

TEST_F(LinuxProcessInformationTreeTest, AWholeLineIsARecord) {
    put("1234/stat", front_ + "98765 230178816 1443 18446744073709551615 1 1 0 0 0 0 0 4096 1 0 0 0 17 1 0 0 0 0 0\n");
    ASSERT_TRUE(read(1234));
    EXPECT_EQ(record_.pid, 1234);
    EXPECT_EQ(record_.parent, 17);
    EXPECT_EQ(record_.commandName, "audio host");
    EXPECT_EQ(record_.startTimeTicks, 98765U);
}

TEST_F(LinuxProcessInformationTreeTest, TwentyTwoFieldsAreEnough) {
    put("1234/stat", front_ + "98765\n");
    ASSERT_TRUE(read(1234));
    EXPECT_EQ(record_.startTimeTicks, 98765U);
}

TEST_F(LinuxProcessInformationTreeTest, TwentyOneFieldsAreNoRecord) {
    put("1234/stat", front_.substr(0, front_.size() - 1) + "\n");
    EXPECT_FALSE(read(1234));
}

TEST_F(LinuxProcessInformationTreeTest, ALineWithoutItsEndIsNoRecord) {
    put("1234/stat", front_ + "98765");
    EXPECT_FALSE(read(1234));
    EXPECT_EQ(record_.commandName, "");
}

TEST_F(LinuxProcessInformationTreeTest, AnEmptyFileIsNoRecord) {
    put("1234/stat", "");
    EXPECT_FALSE(read(1234));
}

TEST_F(LinuxProcessInformationTreeTest, ALineEndAloneIsNoRecord) {
    put("1234/stat", "\n");
    EXPECT_FALSE(read(1234));
}

TEST_F(LinuxProcessInformationTreeTest, ALineWithoutBracketsIsNoRecord) {
    put("1234/stat", "1234 name S 17 1234 1234 0 -1 4194560 1201 0 3 0 22 11 0 0 20 0 5 0 98765\n");
    EXPECT_FALSE(read(1234));
}

TEST_F(LinuxProcessInformationTreeTest, BracketsTheWrongWayRoundAreNoRecord) {
    put("1234/stat", "1234 )name( S 17 1234 1234 0 -1 4194560 1201 0 3 0 22 11 0 0 20 0 5 0 98765\n");
    EXPECT_FALSE(read(1234));
}

TEST_F(LinuxProcessInformationTreeTest, TheRecordOfAnotherProcessIsNone) {
    put("1235/stat", front_ + "98765\n");
    EXPECT_FALSE(read(1235));
}

TEST_F(LinuxProcessInformationTreeTest, FieldsThatAreNoNumbersAreNoRecord) {
    put("1234/stat", "1234 (a) S x 1234 1234 0 -1 4194560 1201 0 3 0 22 11 0 0 20 0 5 0 98765\n");
    EXPECT_FALSE(read(1234));
    put("1234/stat", front_ + "98765x\n");
    EXPECT_FALSE(read(1234));
}

TEST_F(LinuxProcessInformationTreeTest, AnEndlessFileIsNoRecord) {
    put("1234/stat", front_ + "98765 " + std::string(10000, '1') + "\n");
    EXPECT_FALSE(read(1234));
}

TEST_F(LinuxProcessInformationTreeTest, NoFileIsReadForNumbersBelowOne) {
    put("0/stat", "0 (a) S 17 1234 1234 0 -1 4194560 1201 0 3 0 22 11 0 0 20 0 5 0 98765\n");
    put("-1/stat", "-1 (a) S 17 1234 1234 0 -1 4194560 1201 0 3 0 22 11 0 0 20 0 5 0 98765\n");
    EXPECT_FALSE(read(0));
    EXPECT_FALSE(read(-1));
}

TEST_F(LinuxProcessInformationTreeTest, TheOwnNameIsReadWithoutItsLineEnd) {
    put("self/comm", "vela) \nd\n");
    EXPECT_EQ(LinuxProcessInformation(folder_.path()).ownName(), "vela) \nd");
}

TEST_F(LinuxProcessInformationTreeTest, WithoutProcfsTheOwnNameIsEmpty) {
    EXPECT_EQ(LinuxProcessInformation(folder_.path()).ownName(), "");
}

} // namespace

} // namespace vela::platform
