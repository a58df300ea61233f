// The file of a session on the real file system.
#include "platform/linux/LinuxFileSystem.h"
#include "session/SessionFile.h"
#include "session/Session_test.h"
#include "testing/TemporaryFolder.h"

#include <filesystem>
#include <fstream>
#include <random>
#include <sstream>
#include <string_view>
#include <sys/stat.h>

namespace vela {

namespace {

namespace fs = std::filesystem;
using ::testing::ElementsAre;

/// Sets the process's umask for a scope.
class UmaskScope {
public:
    explicit UmaskScope(mode_t mask) : before_(umask(mask)) {}
    ~UmaskScope() { umask(before_); }
    UmaskScope(const UmaskScope&) = delete;
    UmaskScope& operator=(const UmaskScope&) = delete;

private:
    const mode_t before_;
};

class SessionFileIntegrationTest : public SessionTest {
protected:
    SessionFileIntegrationTest() { makeInternalBuild(); }
    void startSession() {
        session_ = VelaReportingSession::initWithID(42, {7}, real_);
        session_->setServiceType(3);
        session_->start();
    }
    void TearDown() override {
        session_.reset();
        SessionTest::TearDown();
    }
    void write(const Dictionary& message) {
        session_->sendMessage(message, 1, 1, {});
        session_->writeSummaryJson();
    }
    std::string directory() const { return folder_.path() + std::string(kSessionFileDirectory); }
    std::string path() const { return directory() + "/20231114-221320+0000-vela-Unknown-haptics.json"; }
    std::vector<std::string> filesBelow() const {
        std::vector<std::string> paths;
        for (const auto& entry : fs::recursive_directory_iterator(folder_.path())) {
            if (!entry.is_directory()) {
                paths.push_back(entry.path().string());
            }
        }
        return paths;
    }
    static std::string contentOf(const std::string& path) {
        const std::ifstream file(path, std::ios::binary);
        std::ostringstream content;
        content << file.rdbuf();
        return content.str();
    }
    static unsigned permissionsOf(const std::string& path) {
        struct stat status {};
        return lstat(path.c_str(), &status) == 0 ? status.st_mode & 07777U : 0;
    }

    testing::TemporaryFolder folder_;
    platform::LinuxFileSystem files_;
    VelaReportingSessionPlatform real_{beacon_, clock_, files_, json_, spoor_, queues_, analytics_, folder_.path()};
    std::shared_ptr<VelaReportingSession> session_;
};

constexpr const char* kText = R"([
  {
    "Generic_Start_1": {
      "a": 1,
      "audiotag": "GenericStart"
    }
  }
])";

TEST_F(SessionFileIntegrationTest, TheFileLetterByLetter) {
    startSession();
    write({{"a", 1}});
    EXPECT_EQ(contentOf(path()), kText);
    EXPECT_THAT(filesBelow(), ElementsAre(path()));
}

TEST_F(SessionFileIntegrationTest, DirectoriesAreOpenToAllWhateverTheUmask) {
    const UmaskScope umask(077);
    startSession();
    write({{"a", 1}});
    for (fs::path made = directory(); made != folder_.path(); made = made.parent_path()) {
        EXPECT_EQ(permissionsOf(made), 0777U) << made;
    }
    EXPECT_EQ(permissionsOf(path()), 0644U);
}

TEST_F(SessionFileIntegrationTest, ADirectoryThatIsThereStaysAsItIs) {
    fs::create_directories(directory());
    fs::permissions(directory(), fs::perms::owner_all);
    startSession();
    write({{"a", 1}});
    EXPECT_EQ(permissionsOf(directory()), 0700U);
    EXPECT_EQ(contentOf(path()), kText);
}

TEST_F(SessionFileIntegrationTest, ALinkInTheFilesPlaceIsReplacedAndNotFollowed) {
    fs::create_directories(directory());
    const std::string victim = folder_ / "victim";
    std::ofstream(victim) << "untouched";
    fs::create_symlink(victim, path());
    startSession();
    write({{"a", 1}});
    EXPECT_EQ(contentOf(victim), "untouched");
    EXPECT_FALSE(fs::is_symlink(path()));
    EXPECT_EQ(contentOf(path()), kText);
}

TEST_F(SessionFileIntegrationTest, AFolderInTheFilesPlaceIsAFailureWithoutALeftover) {
    fs::create_directories(path());
    startSession();
    log_.clear();
    write({{"a", 1}});
    const CapturedLine last = log_.lines().back();
    EXPECT_EQ(last.level, LogLevel::Error);
    EXPECT_TRUE(last.message.starts_with("jsonOutput writeToURL: ")) << last.message;
    EXPECT_TRUE(filesBelow().empty());
}

TEST_F(SessionFileIntegrationTest, AFileInTheDirectorysPlaceFailsTwice) {
    fs::create_directories(fs::path(directory()).parent_path());
    std::ofstream(directory()) << "in the way";
    startSession();
    log_.clear();
    write({{"a", 1}});
    const auto lines = log_.lines();
    ASSERT_GE(lines.size(), 2U);
    EXPECT_TRUE(lines[lines.size() - 2].message.starts_with("can't create logging directory at " + directory() + ": "));
    EXPECT_TRUE(lines.back().message.starts_with("jsonOutput writeToURL: "));
    EXPECT_EQ(lines.back().level, LogLevel::Error);
    EXPECT_EQ(contentOf(directory()), "in the way");
}

TEST_F(SessionFileIntegrationTest, TheLaterFileOfASecondReplacesTheEarlier) {
    startSession();
    write({{"a", 1}});
    write({{"a", 2}});
    EXPECT_THAT(filesBelow(), ElementsAre(path()));
    EXPECT_NE(contentOf(path()).find("Generic_Start_2"), std::string::npos);
}

TEST_F(SessionFileIntegrationTest, OddApplicationNamesStayInTheDirectory) {
    std::mt19937 random(7);
    constexpr std::string_view kOdd("/.\0\xFF\xC3\xF0~ \n", 9);
    startSession();
    session_->sendMessage({{"a", 1}}, 1, 1, {});
    std::vector<std::string> names = {
        "../../../../../../../../x", "/", "..", ".", "/etc/passwd", "a/../../b", "", std::string(300, 'x'),
        std::string("a\0/../b", 7)};
    for (int name = 0; name < 150; ++name) {
        std::string odd;
        for (auto size = random() % 200; odd.size() < size;) {
            odd += random() % 2 == 0 ? kOdd[random() % kOdd.size()] : static_cast<char>(random() % 256);
        }
        names.push_back(odd);
    }
    for (const std::string& name : names) {
        session_->setConfiguration(Dictionary{{"HostApplicationDisplayID", std::string_view(name)}});
        log_.clear();
        session_->writeSummaryJson();
        ASSERT_EQ(log_.lines().back().level, LogLevel::Info) << log_.lines().back();
    }
    for (const auto& entry : fs::recursive_directory_iterator(folder_.path())) {
        if (!entry.is_directory()) {
            ASSERT_EQ(entry.path().parent_path(), fs::path(directory())) << entry.path();
        }
    }
    EXPECT_GT(filesBelow().size(), 100U);
}

} // namespace

} // namespace vela
