#include "service/Service_test.h"

namespace vela {

namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;

class VelaReportingServiceDelegateInspectionTest : public ServiceTest {
protected:
    std::vector<Dictionary> sessions() {
        std::vector<Dictionary> sessions;
        for (const ValueRef session : service().sessions()) {
            sessions.push_back(session.dictionary());
        }
        return sessions;
    }
};

TEST_F(VelaReportingServiceDelegateInspectionTest, WithoutSessionsTheListIsEmpty) {
    connect(7);
    EXPECT_THAT(sessions(), IsEmpty());
    EXPECT_EQ(service().ledger(), Dictionary());
}

TEST_F(VelaReportingServiceDelegateInspectionTest, EverySessionIsDescribedInTheRegistrysOrder) {
    const Client first = connect(99); // a process without a name
    const Client second = connect(7);
    second.running(42);
    second.setConfiguration({{"HostApplicationDisplayID", "com.example.player"}}, 42);
    second.send({{"a", 1}}, 1, 1, to({42}));
    second.send({{"a", 2}}, 1, 1, to({42}));
    second.send({{"a", 2}}, 1, 1, to({42})); // redundant
    setActiveSessionCount(6);
    first.create(-1);
    EXPECT_THAT(sessions(), ElementsAre(Dictionary{{"reporterID", -1},
                                                   {"serviceType", 65535},
                                                   {"serviceName", "unknown"},
                                                   {"owner", 99},
                                                   {"started", false},
                                                   {"beaconReportingEnabled", false},
                                                   {"messages", 0}},
                                        Dictionary{{"reporterID", 42},
                                                   {"serviceType", 1},
                                                   {"serviceName", "muse"},
                                                   {"owner", 7},
                                                   {"process", "player"},
                                                   {"application", "com.example.player"},
                                                   {"started", true},
                                                   {"beaconReportingEnabled", true},
                                                   {"messages", 2}}));
}

TEST_F(VelaReportingServiceDelegateInspectionTest, AStoppedSessionKeepsNoMessages) {
    const Client client = connect(7);
    client.running(42);
    client.send({{"a", 1}}, 1, 1, to({42}));
    EXPECT_EQ(sessions()[0].find("messages"), Value(1));
    client.stop(42);
    EXPECT_EQ(sessions()[0].find("messages"), Value(0));
    EXPECT_EQ(sessions()[0].find("started"), Value(false));
}

TEST_F(VelaReportingServiceDelegateInspectionTest, AnApplicationIsAShortTextOrANumber) {
    const Client client = connect(7);
    client.create(1);
    const auto shownFor = [&](Value application) {
        client.setConfiguration({{"HostApplicationDisplayID", std::move(application)}}, 1);
        return Value(sessions()[0].find("application"));
    };
    EXPECT_EQ(shownFor(5), Value(5));
    EXPECT_EQ(shownFor(Array{1}), Value());
    EXPECT_EQ(shownFor(Data("x")), Value());
    const std::string longest(256, 'a');
    EXPECT_EQ(shownFor(std::string_view(longest)), Value(std::string_view(longest)));
    EXPECT_EQ(shownFor(std::string_view(longest + "b")), Value(std::string_view(longest + "...")));
    // Never cut inside a character.
    const std::string stub(255, 'a');
    EXPECT_EQ(shownFor(std::string_view(stub + "\xC3\xA4")), Value(std::string_view(stub + "...")));
}

TEST_F(VelaReportingServiceDelegateInspectionTest, ItWaitsForNoQueueAndForNoMessageList) {
    const Client client = connect(7);
    const auto session = client.running(42);
    onQueue([&] {
        // What a session's stop may do for minutes.
        const MutexLock lock(session->nestedAggregatedPayloadData().mutex());
        EXPECT_EQ(sessions().size(), 1U);
    });
}

} // namespace

} // namespace vela
