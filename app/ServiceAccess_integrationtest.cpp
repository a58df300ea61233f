// Clients of another user than the service's. Only root can become another user.
#include "app/ForkedClient_integrationtest.h"
#include "app/RunningService_integrationtest.h"

#include <filesystem>
#include <grp.h>
#include <optional>
#include <pwd.h>

namespace vela {

namespace {

using ::testing::HasSubstr;
using ::testing::Not;

constexpr const char* kOtherUser = "nobody";

/// Gives up everything that root has; false when the system refuses.
bool becomeOther(const passwd& other) {
    return setgroups(0, nullptr) == 0 && setresgid(other.pw_gid, other.pw_gid, other.pw_gid) == 0 &&
           setresuid(other.pw_uid, other.pw_uid, other.pw_uid) == 0;
}

class ServiceAccessTest : public ::testing::Test {
protected:
    void SetUp() override {
        other_ = getpwnam(kOtherUser); // NOLINT(concurrency-mt-unsafe): one thread
        if (geteuid() != 0 || other_ == nullptr) {
            GTEST_SKIP() << "these tests need root and a user " << kOtherUser;
        }
    }

    /// Lets others reach the socket, as they do below /run.
    static void openFolders(const RunningService& service) {
        using std::filesystem::perms;
        const perms search = perms::group_exec | perms::others_exec;
        for (const std::string& folder : {service.folder(""), service.folder("runtime")}) {
            std::filesystem::permissions(folder, search, std::filesystem::perm_options::add);
        }
    }

    /// A client process of the other user that calls the operations, and reports each answer, or why it has none.
    ForkedClient otherClient(const RunningService& service,
                             const std::vector<std::pair<std::string, std::string>>& calls) const {
        return ForkedClient([&, this](const ForkedClient::Report& report) {
            if (!becomeOther(*other_)) {
                report("cannot become another user");
                ForkedClient::stay();
            }
            const auto opened =
                platform::dbus::BlockingConnection::open({{service.socket()}}, std::chrono::seconds(30));
            if (!opened) {
                report(opened.failure().description);
                ForkedClient::stay();
            }
            ServiceClient client = service.client();
            for (const auto& [operation, arguments] : calls) {
                report(client.call(operation, arguments));
            }
            ForkedClient::stay();
        });
    }

private:
    const passwd* other_ = nullptr;
};

TEST_F(ServiceAccessTest, AnotherUserIsRefusedInWords) {
    const RunningService service;
    openFolders(service);
    EXPECT_EQ(otherClient(service, {}).report(), "the service refused the connection: REJECTED access-denied");
    EXPECT_EQ(service.client().call("getAllReporters"), "[]");
    EXPECT_EQ(service.linesWith("newConnection: "), 1U) << "that of root, not of the other";
}

TEST_F(ServiceAccessTest, AUserOfTheSettingsIsServedButMayNotEndTheService) {
    RunningService service({R"(access.users=["nobody"])"});
    openFolders(service);
    const ForkedClient other =
        otherClient(service, {{"createReportingSession", "[42]"}, {"getAllReporters", "[]"}, {"killService", "[]"}});
    EXPECT_EQ(other.report(), "true");
    EXPECT_EQ(other.report(), "[42]");
    EXPECT_THAT(other.report(), HasSubstr("org.freedesktop.DBus.Error.AccessDenied: "));
    EXPECT_EQ(service.client().call("getAllReporters"), "[42]");
    EXPECT_THAT(service.log(), Not(HasSubstr("DESTROYING SERVICE")));
    EXPECT_TRUE(service.program().runs());
}

} // namespace

} // namespace vela
