// The built service in a folder of its own, and a client that speaks with it.
#pragma once

#include "cli/JsonReading.h"
#include "cli/Operations.h"
#include "common/values/Dictionary.h"
#include "common/values/Json.h"
#include "platform/dbus/BlockingConnection.h"
#include "platform/dbus/Protocol.h"
#include "testing/RunProgram.h"
#include "testing/RunningProgram.h"
#include "testing/TemporaryFolder.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <optional>
#include <string>
#include <utility>
#include <vector>

namespace vela {

/// One connection. Calls are made with JSON texts and answered with them.
class ServiceClient {
public:
    explicit ServiceClient(const std::string& socket)
        : connection_(*platform::dbus::BlockingConnection::open({{socket}}, kPatience)) {}

    /// Sends a call without waiting; `arguments` is a JSON array.
    std::uint32_t send(const std::string& operation, const std::string& arguments) {
        const std::uint32_t serial = connection_.nextSerial();
        std::string bytes;
        std::vector<Value> values;
        const Value array = *readJson(arguments);
        for (const ValueRef value : array.ref().array()) {
            values.emplace_back(value);
        }
        EXPECT_TRUE(appendCall(bytes, serial, *findOperation(operation), values));
        EXPECT_TRUE(connection_.send(bytes));
        return serial;
    }
    /// The reply as JSON ("null" for nothing), or "NAME: text" of an error.
    std::string answer(const std::string& operation, std::uint32_t serial) {
        const auto reply = connection_.receive(serial, kPatience);
        if (!reply) {
            return reply.failure().description;
        }
        if (reply->isError()) {
            return std::string(reply->header.errorName) + ": " + reply->errorText();
        }
        const auto value = replyValue(*findOperation(operation), reply->header);
        return value ? jsonText(*value) : value.failure().description;
    }
    std::string call(const std::string& operation, const std::string& arguments = "[]") {
        return answer(operation, send(operation, arguments));
    }
    platform::dbus::BlockingConnection& connection() { return connection_; }

private:
    static constexpr std::chrono::seconds kPatience{30};

    platform::dbus::BlockingConnection connection_;
};

class RunningService {
public:
    /// `settings`: further "section.key=value".
    explicit RunningService(std::vector<std::string> settings = {}) : settings_(std::move(settings)) { start(); }

    void start() {
        program_.emplace(commandLine(), environment());
        EXPECT_TRUE(testing::waitUntil([this] {
            return static_cast<bool>(platform::dbus::connectTo({{socket()}}, true));
        })) << program_->error();
    }
    std::vector<std::string> commandLine() const {
        std::vector<std::string> words{VELA_REPORTINGD,
                                       "--set",
                                       "paths.root=" + root(),
                                       "--set",
                                       "paths.state=" + (folder_ / "state"),
                                       "--set",
                                       "paths.runtime=" + (folder_ / "runtime"),
                                       "--set",
                                       "log.target=stderr",
                                       "--set",
                                       "log.level=debug"};
        for (const std::string& setting : settings_) {
            words.insert(words.end(), {"--set", setting});
        }
        return words;
    }
    static std::vector<std::string> environment() { return {"PATH=/usr/bin:/bin", "HOME=/nonexistent"}; }

    ServiceClient client() const { return ServiceClient(socket()); }
    std::string socket() const { return folder_ / "runtime/com.orvex.vela.reporting.server"; }
    std::string address() const { return "unix:path=" + socket(); }
    std::string root() const { return folder_ / "root"; }
    std::string folder(const std::string& below) const { return folder_ / below; }
    testing::RunningProgram& program() { return *program_; }

    /// Runs a program that finds the service by its environment.
    testing::ProgramRun run(const std::vector<std::string>& arguments) const {
        std::vector<std::string> environmentOfClient = environment();
        environmentOfClient.push_back("VELA_REPORTING_ADDRESS=" + address());
        return testing::runProgram(arguments, environmentOfClient);
    }
    /// velactl with the service's own folders.
    testing::ProgramRun velactl(std::vector<std::string> arguments) const {
        arguments.insert(arguments.begin(), VELACTL);
        return run(arguments);
    }

    std::string log() const { return program_->error(); }
    std::size_t linesWith(const std::string& text) const {
        std::istringstream lines(log());
        std::size_t count = 0;
        for (std::string line; std::getline(lines, line);) {
            count += line.find(text) == std::string::npos ? 0U : 1U;
        }
        return count;
    }
    bool waitForLine(const std::string& text) const {
        return testing::waitUntil([&] { return linesWith(text) > 0; });
    }

private:
    const testing::TemporaryFolder folder_;
    const std::vector<std::string> settings_;
    std::optional<testing::RunningProgram> program_;
};

} // namespace vela
