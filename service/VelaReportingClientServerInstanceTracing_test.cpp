// Performance traces of clients' sessions, by way of the service.
#include "service/Service_test.h"
#include "session/TraceKeys.h"

namespace vela {

namespace {

using ::testing::Contains;
using ::testing::ElementsAre;
using ::testing::IsEmpty;
using ::testing::StartsWith;

class VelaReportingClientServerInstanceTracingTest : public ServiceTest {
protected:
    VelaReportingClientServerInstanceTracingTest() {
        fakes_.device.setFeature("AudioAnalytics", "Tracing", true);
        fakes_.fileSystem.addFile("/srv/traces.plist", "{ Children = ({ Name = T; }); }");
    }
    /// A client of this identity, with a session of type "test".
    Client clientOf(std::optional<platform::Identity> identity, const Dictionary& configuration) {
        auto connection = std::make_shared<testing::FakeIpcConnection>(7);
        connection->setPeerIdentity(std::move(identity));
        connections_.push_back(connection);
        EXPECT_TRUE(service().shouldAcceptNewConnection(connection));
        const Client client{connection, queues_};
        client.create(42);
        client.setServiceType(11, 42);
        client.setConfiguration(configuration, 42);
        return client;
    }
    const Dictionary kWithFile{{"VelaReportingKilnPlistFilePath", "/srv/traces.plist"}};
};

TEST_F(VelaReportingClientServerInstanceTracingTest, TheParametersFileIsReadForTheClient) {
    const platform::Identity identity{1000, 1001, {29, 30}};
    const Client client = clientOf(identity, kWithFile);
    client.start(42);
    EXPECT_THAT(fakes_.fileSystem.readers(), ElementsAre(identity));
    EXPECT_EQ(client.session(42)->tracing()->traceParams()->name, "T");
}

TEST_F(VelaReportingClientServerInstanceTracingTest, ForAClientThatNobodyKnowsNothingIsRead) {
    const Client client = clientOf(std::nullopt, kWithFile);
    client.start(42);
    EXPECT_THAT(fakes_.fileSystem.readers(), IsEmpty());
    EXPECT_EQ(client.session(42)->tracing()->traceParams()->name, "");
    EXPECT_EQ(linesSaying("Reading from plist file failed with error: open /srv/traces.plist: nobody can tell which "
                          "user named it"),
              1U);
}

TEST_F(VelaReportingClientServerInstanceTracingTest, ResultsStandUnderThePathRoot) {
    delegate_ = VelaReportingServiceDelegate::init({platform_, "/var/lib/vela/root"});
    const Client client = clientOf(platform::Identity{1000, 1000, {}}, kWithFile);
    client.start(42);
    EXPECT_EQ(client.stop(42), true);
    ASSERT_EQ(fakes_.metricsheet.files().size(), 1U);
    EXPECT_THAT(fakes_.metricsheet.files().at(0).path, StartsWith("/var/lib/vela/root/private/"));
}

TEST_F(VelaReportingClientServerInstanceTracingTest, AWordThatAClientSendsIsNotTheServicesConstant) {
    const Client client =
        clientOf(platform::Identity{1000, 1000, {}}, kWithFile.merging({{"VelaReportingTraceType", "spoor"}}));
    client.start(42);
    EXPECT_EQ(client.session(42)->tracing()->tracingFileName(), std::nullopt);
    EXPECT_THAT(fakes_.probe.calls(), Contains("startProbeTrace"));
}

TEST_F(VelaReportingClientServerInstanceTracingTest, EveryWayToEndASessionEndsItsTrace) {
    const Client stopped = clientOf(std::nullopt, {});
    stopped.start(42);
    fakes_.probe.clear();
    EXPECT_EQ(stopped.stop(42), true);
    EXPECT_THAT(fakes_.probe.calls(), ElementsAre("stopProbeTrace", "setDelegate null", "released"));
    const Client destroyed = clientOf(std::nullopt, {});
    destroyed.start(42);
    fakes_.probe.clear();
    EXPECT_EQ(destroyed.destroy(42), true);
    EXPECT_THAT(fakes_.probe.calls(), ElementsAre("stopProbeTrace", "setDelegate null", "released"));
    const Client lost = clientOf(std::nullopt, {});
    lost.start(42);
    fakes_.probe.clear();
    lost.connection->breakStream();
    queues_.runUntilIdle();
    EXPECT_THAT(fakes_.probe.calls(), ElementsAre("stopProbeTrace", "setDelegate null", "released"));
}

} // namespace

} // namespace vela
