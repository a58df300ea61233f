// The service's objects as tools see them. Pure functions.
#pragma once

#include <string>
#include <string_view>

namespace vela::platform::dbus {

/// The XML text about the node `path`: the service's object with its interfaces, or a node on the way to it with its
/// one child. Empty for other paths.
std::string introspectionText(std::string_view path);

/// The name of the child that the node `path` has on the way to the service's object; empty for other paths and for the
/// object itself.
std::string_view childOfNode(std::string_view path);

} // namespace vela::platform::dbus
