#include "platform/dbus/Address.h"

#include "platform/dbus/Names.h"
#include "platform/dbus/Protocol.h"

#include <cerrno>
#include <cstddef>
#include <cstring>
#include <optional>
#include <sys/socket.h>
#include <sys/un.h>

namespace vela::platform::dbus {

namespace {

constexpr std::string_view kSystemRuntime = "/run/vela";
constexpr std::string_view kUnreservedMarks = "-_/.\\*";

bool isUnreserved(char letter) {
    return (letter >= '0' && letter <= '9') || (letter >= 'a' && letter <= 'z') || (letter >= 'A' && letter <= 'Z') ||
           kUnreservedMarks.find(letter) != std::string_view::npos;
}

int digitOf(char letter) {
    if (letter >= '0' && letter <= '9') {
        return letter - '0';
    }
    if (letter >= 'a' && letter <= 'f') {
        return letter - 'a' + 10;
    }
    return letter >= 'A' && letter <= 'F' ? letter - 'A' + 10 : -1;
}

std::optional<std::string> unescaped(std::string_view text) {
    std::string result;
    for (std::size_t at = 0; at < text.size(); ++at) {
        if (text[at] != '%') {
            result += text[at];
            continue;
        }
        const int high = at + 2 < text.size() ? digitOf(text[at + 1]) : -1;
        const int low = at + 2 < text.size() ? digitOf(text[at + 2]) : -1;
        if (high < 0 || low < 0) {
            return std::nullopt;
        }
        result += static_cast<char>(high * 16 + low);
        at += 2;
    }
    return result;
}

std::string escaped(std::string_view text) {
    constexpr std::string_view kDigits = "0123456789abcdef";
    std::string result;
    for (const char letter : text) {
        if (isUnreserved(letter)) {
            result += letter;
        } else {
            const auto byte = static_cast<unsigned char>(letter);
            result += {'%', kDigits[byte >> 4U], kDigits[byte & 0xFU]};
        }
    }
    return result;
}

/// Cuts the text before `separator` off the front of `rest`.
std::string_view cut(std::string_view& rest, char separator) {
    const std::size_t end = rest.find(separator);
    const std::string_view first = rest.substr(0, end);
    rest = end == std::string_view::npos ? std::string_view() : rest.substr(end + 1);
    return first;
}

Failure entryFault(std::string_view entry, std::string_view reason) {
    return {0, "the address " + quoted(entry) + " " + std::string(reason)};
}

Result<SocketAddress> parseEntry(std::string_view entry) {
    constexpr std::string_view kTransport = "unix:";
    if (!entry.starts_with(kTransport)) {
        return entryFault(entry, "does not begin with unix:");
    }
    std::optional<SocketAddress> found;
    std::string_view keys = entry.substr(kTransport.size());
    while (!keys.empty()) {
        std::string_view value = cut(keys, ',');
        const std::string_view key = cut(value, '=');
        if (key != "path" && key != "abstract") {
            continue;
        }
        std::optional<std::string> name = unescaped(value);
        if (!name || name->empty() || found) {
            return entryFault(entry, "has no single valid path or abstract name");
        }
        found = SocketAddress{*std::move(name), key == "abstract"};
    }
    if (!found) {
        return entryFault(entry, "has neither a path nor an abstract name");
    }
    return *std::move(found);
}

std::string systemWords(int error) { return std::strerror(error); } // NOLINT(concurrency-mt-unsafe): glibc's is safe

/// None with errno set when it fails.
FileDescriptor tryConnect(const SocketAddress& address, bool blocking) {
    sockaddr_un place{};
    place.sun_family = AF_UNIX;
    const std::size_t offset = address.abstract ? 1 : 0;
    if (address.name.size() + 1 > sizeof(place.sun_path)) {
        errno = ENAMETOOLONG;
        return {};
    }
    std::memcpy(place.sun_path + offset, address.name.data(), address.name.size());
    // One byte more than the name: the NUL that begins an abstract name or ends a path.
    const std::size_t length = offsetof(sockaddr_un, sun_path) + address.name.size() + 1;
    FileDescriptor descriptor(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | (blocking ? 0 : SOCK_NONBLOCK), 0));
    if (!descriptor) {
        return {};
    }
    while (::connect(descriptor.get(), reinterpret_cast<const sockaddr*>(&place), static_cast<socklen_t>(length)) < 0) {
        if (errno != EINTR) {
            return {};
        }
    }
    return descriptor;
}

} // namespace

std::string SocketAddress::text() const { return (abstract ? "unix:abstract=" : "unix:path=") + escaped(name); }

Result<std::vector<SocketAddress>> parseAddress(std::string_view address) {
    std::vector<SocketAddress> addresses;
    for (std::string_view rest = address; !rest.empty();) {
        const std::string_view entry = cut(rest, ';');
        if (entry.empty()) {
            continue;
        }
        Result<SocketAddress> read = parseEntry(entry);
        if (!read) {
            return read.failure();
        }
        addresses.push_back(*std::move(read));
    }
    if (addresses.empty()) {
        return entryFault(address, "names no socket");
    }
    return addresses;
}

Result<std::vector<SocketAddress>> serviceAddresses(std::string_view address, std::string_view runtimeHome) {
    if (!address.empty()) {
        return parseAddress(address);
    }
    std::vector<SocketAddress> addresses;
    if (!runtimeHome.empty()) {
        addresses.push_back({std::string(runtimeHome) + "/vela/" + std::string(kSocketName)});
    }
    addresses.push_back({std::string(kSystemRuntime) + "/" + std::string(kSocketName)});
    return addresses;
}

Result<FileDescriptor> connectTo(const std::vector<SocketAddress>& addresses, bool blocking) {
    Failure failure{EINVAL, "there is no address"};
    for (const SocketAddress& address : addresses) {
        FileDescriptor descriptor = tryConnect(address, blocking);
        if (descriptor) {
            return descriptor;
        }
        const int error = errno;
        failure = {error, address.text() + ": " + systemWords(error)};
    }
    return failure;
}

} // namespace vela::platform::dbus
