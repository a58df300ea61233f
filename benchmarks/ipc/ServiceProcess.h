// The built service in a folder of its own, as an administrator runs it: its store, its log at the standard level.
#pragma once

#include "benchmarks/ipc/Subject.h"
#include "common/values/Dictionary.h"
#include "platform/dbus/BlockingConnection.h"
#include "platform/dbus/Protocol.h"
#include "testing/RunningProgram.h"
#include "testing/TemporaryFolder.h"

#include <chrono>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace vela::ipcbench {

inline constexpr std::chrono::seconds kPatience{60};

class ServiceProcess {
public:
    /// Starts it and waits until it takes connections. With `onDemand`, only its socket is there, and the first
    /// connection starts it. `furtherSettings`: "section.key=value".
    explicit ServiceProcess(bool onDemand = false, std::vector<std::string> furtherSettings = {});

    std::string socket() const { return onDemand_ ? folder_ / "socket" : folder_ / "runtime/" + kSocket; }
    std::string storeFile() const { return folder_ / "state/deliveries.db"; }
    pid_t process() const { return program_->pid(); }
    /// Null when the connection is refused or breaks.
    std::optional<platform::dbus::BlockingConnection> connection() const;

private:
    static inline const std::string kSocket{platform::dbus::kSocketName};

    std::vector<std::string> commandLine() const;

    const testing::TemporaryFolder folder_;
    const bool onDemand_;
    const std::vector<std::string> furtherSettings_;
    std::optional<testing::RunningProgram> program_;
};

/// Calls an operation that takes a reporter ID, and waits for its reply.
void callWithID(platform::dbus::BlockingConnection& connection, std::string_view member, std::int64_t reporterID);

/// A session that is created and started.
void startSession(platform::dbus::BlockingConnection& connection, std::int64_t reporterID);

/// The sums of the service's ledger, by back end.
Dictionary ledgerTotals(platform::dbus::BlockingConnection& connection);

/// Appends a call of sendMessage with message `number`.
void appendMessage(std::string& bytes, std::uint32_t serial, std::int64_t number, std::int64_t reporterID, bool reply);

} // namespace vela::ipcbench
