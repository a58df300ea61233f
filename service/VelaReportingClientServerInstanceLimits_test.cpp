// Messages that a session does not keep, and what their sender is told.
#include "service/Service_test.h"

namespace vela {

namespace {

class VelaReportingClientServerInstanceLimitsTest : public ServiceTest {
protected:
    VelaReportingClientServerInstanceLimitsTest() {
        delegate_ = VelaReportingServiceDelegate::init({platform_, "", &memory_});
    }
    std::shared_ptr<Answer<>> send(const Client& client, const Dictionary& message, ReporterIDs reporterIDs) {
        const auto answer = newAnswer<>();
        client.operations().sendMessage(message, 1, 1, std::move(reporterIDs), Answer<>::into(answer));
        queues_.runUntilIdle();
        return answer;
    }

    VelaReportingSessionMemory memory_{{.sessionBytes = 4096, .totalBytes = 1024 * 1024}};
    const std::string long_ = std::string(8192, 'a');
    const Dictionary longMessage_{{"a", std::string_view(long_)}};
};

TEST_F(VelaReportingClientServerInstanceLimitsTest, AMessageThatASessionRefusesIsAnsweredWithTheLimit) {
    const Client client = connect(7);
    client.running(1);
    client.running(2);
    const auto refused = send(client, longMessage_, to({1, 2}));
    EXPECT_EQ(refused->calls, 1);
    EXPECT_EQ(refused->error, std::pair(std::string(), 0));
    EXPECT_EQ(refused->limit, "limits.session_bytes is 4 KiB");
    EXPECT_EQ(memory_.refusals(), 2U);
    EXPECT_EQ(fakes_.tally.events().size(), 4U); // the bridges have it
    const auto taken = send(client, {{"a", 1}}, to({1, 2}));
    EXPECT_EQ(taken->calls, 1);
    EXPECT_EQ(taken->error, std::nullopt);
}

TEST_F(VelaReportingClientServerInstanceLimitsTest, ABroadcastIsAnsweredWithTheLimitAsWell) {
    const Client client = connect(7);
    EXPECT_EQ(send(client, longMessage_, std::nullopt)->limit, "limits.session_bytes is 4 KiB");
    client.running(1);
    EXPECT_EQ(send(client, longMessage_, std::nullopt)->limit, "limits.session_bytes is 4 KiB");
}

TEST_F(VelaReportingClientServerInstanceLimitsTest, AConfigurationThatASessionRefusesIsAnsweredWithTheLimit) {
    const Client client = connect(7);
    client.create(1);
    const auto answer = newAnswer<bool>();
    client.operations().setConfiguration(longMessage_, 1, Answer<bool>::into(answer));
    queues_.runUntilIdle();
    EXPECT_EQ(answer->calls, 1);
    EXPECT_EQ(answer->limit, "limits.session_bytes is 4 KiB");
    EXPECT_EQ(client.session(1)->configuration(), Dictionary());
    EXPECT_EQ(client.setConfiguration({{"a", 1}}, 1), true);
}

} // namespace

} // namespace vela
