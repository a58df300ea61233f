// Where the service's socket is, for its clients. Pure functions, but for `connectTo`.
#pragma once

#include "platform/Result.h"
#include "platform/linux/FileDescriptor.h"

#include <string>
#include <string_view>
#include <vector>

namespace vela::platform::dbus {

/// A Unix stream socket.
struct SocketAddress {
    std::string name;      ///< path of its file, or its abstract name
    bool abstract = false; ///< has no file

    /// As a D-Bus address.
    std::string text() const;
    friend bool operator==(const SocketAddress&, const SocketAddress&) = default;
};

/// Reads a D-Bus address: "unix:path=/run/vela/socket", "unix:abstract=name", several of them with ";" between; other
/// keys of an entry are passed over, "%2f" stands for a byte. The failure names the entry.
Result<std::vector<SocketAddress>> parseAddress(std::string_view address);

/// Where to look for the service, in order: only at `address` (of $VELA_REPORTING_ADDRESS) where it is not empty, else
/// the user's own service below `runtimeHome` ($XDG_RUNTIME_DIR, may be empty) and the system's.
Result<std::vector<SocketAddress>> serviceAddresses(std::string_view address, std::string_view runtimeHome);

/// Connects to the first of `addresses` that answers, without waiting longer than the listening socket's queue demands
/// when `blocking`, else without waiting at all (the descriptor stays so). The failure is that of the last address.
Result<FileDescriptor> connectTo(const std::vector<SocketAddress>& addresses, bool blocking);

} // namespace vela::platform::dbus
