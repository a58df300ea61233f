// What the tests of the whole client share: a folder, a service in this process, clients of it. Confined to the test's
// thread.
#pragma once

#include "client/FakeService_integrationtest.h"
#include "client/include/vela/reporting.h"
#include "testing/TemporaryFolder.h"

#include <cstring>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <memory>
#include <string>
#include <thread>

namespace vela::client {

struct ClientEnd {
    void operator()(VelaReportingClient* client) const { VelaReportingClientDestroy(client); }
};
using OwnedClient = std::unique_ptr<VelaReportingClient, ClientEnd>;

/// Long enough for a loaded machine.
inline constexpr std::int32_t kPatience = 30'000;

inline VelaReportingField field(const char* key, VelaReportingValue value) { return {key, std::strlen(key), value}; }

/// Twelve entries of every kind.
inline VelaReportingStatus sendTwelve(const OwnedClient& client) {
    static const VelaReportingValue kChannels[] = {VelaReportingText("left"), VelaReportingText("right")};
    const VelaReportingField inner[] = {field("x", VelaReportingInteger(1))};
    const VelaReportingField fields[] = {
        field("sample_rate", VelaReportingDouble(48000)),    field("frames", VelaReportingInteger(512)),
        field("overload", VelaReportingBoolean(true)),       field("device", VelaReportingText("Built-in")),
        field("data", VelaReportingData("\1\2\3", 3)),       field("when", VelaReportingDate(1e9)),
        field("channels", VelaReportingArray(kChannels, 2)), field("inner", VelaReportingDictionary(inner, 1)),
        field("broken", VelaReportingText("\xFF")),          field("large", VelaReportingUnsigned(UINT64_MAX)),
        field("volume", VelaReportingDouble(0.5)),           field("route", VelaReportingText("speaker")),
    };
    const std::int64_t ids[] = {42};
    return VelaReportingSendMessage(client.get(), fields, std::size(fields), 1, 3, ids, 1);
}

class ClientTestBase : public ::testing::Test {
protected:
    VelaReportingClientOptions options() const {
        VelaReportingClientOptions options{};
        options.size = sizeof(options);
        options.address = address_.c_str();
        options.flushMilliseconds = kPatience;
        return options;
    }

    OwnedClient make(const VelaReportingClientOptions& options) const {
        VelaReportingClient* client = nullptr;
        EXPECT_EQ(VelaReportingClientCreate(&options, &client), VelaReportingStatusOk);
        return OwnedClient(client);
    }
    OwnedClient make() const { return make(options()); }

    /// A message {"n": number} to session 42.
    static VelaReportingStatus send(const OwnedClient& client, std::int64_t number, std::size_t extraBytes = 0) {
        const std::string extra(extraBytes, 'x');
        const VelaReportingField fields[] = {
            field("n", VelaReportingInteger(number)),
            field("extra", VelaReportingTextOfSize(extra.data(), extra.size())),
        };
        const std::int64_t ids[] = {42};
        return VelaReportingSendMessage(client.get(), fields, extraBytes == 0 ? 1 : 2, 1, 3, ids, 1);
    }
    /// How the service records that message.
    static std::string sent(std::int64_t number) {
        return "sendMessage {\"n\":" + std::to_string(number) + "} 1 3 [42]";
    }

    static VelaReportingClientState stateOf(const OwnedClient& client) {
        VelaReportingClientState state{};
        state.size = sizeof(state);
        EXPECT_EQ(VelaReportingClientGetState(client.get(), &state), VelaReportingStatusOk);
        return state;
    }

    static VelaReportingError emptyError() {
        VelaReportingError error{};
        error.size = sizeof(error);
        return error;
    }

    /// Waits until the client's state satisfies `condition`; fails the test after half a minute.
    template <class Condition>
    static void waitForState(const OwnedClient& client, const Condition& condition) {
        const auto end = std::chrono::steady_clock::now() + std::chrono::milliseconds(kPatience);
        while (!condition(stateOf(client))) {
            ASSERT_LT(std::chrono::steady_clock::now(), end);
            std::this_thread::sleep_for(std::chrono::milliseconds(1));
        }
    }
    static void waitForConnection(const OwnedClient& client) {
        waitForState(client, [](const VelaReportingClientState& state) { return state.connected; });
    }

    testing::TemporaryFolder folder_;
    const std::string path_ = folder_ / "service";
    const std::string address_ = "unix:path=" + path_;
};

class ClientTest : public ClientTestBase {
protected:
    testing::FakeService service_{path_};
};

} // namespace vela::client
