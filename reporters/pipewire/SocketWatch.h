// Tells when a socket of the audio server may have come, so that nobody needs to look for it again and again.
// Queue-confined: the thread of the graph.
#pragma once

#include <string>

namespace vela::reporter {

/// Where the server library would look for the server `remote` (empty: the one that the environment names).
std::string socketPathOf(const std::string& remote);

class SocketWatch {
public:
    explicit SocketWatch(const std::string& socketPath);
    ~SocketWatch();
    SocketWatch(const SocketWatch&) = delete;
    SocketWatch& operator=(const SocketWatch&) = delete;

    /// To wait on until it can be read; -1 when the folder cannot be watched.
    int descriptor() const { return descriptor_; }

    /// Reads what has happened. Whether a file of the socket's name came or changed its rights.
    bool hasCome();

private:
    std::string name_;
    int descriptor_ = -1;
};

} // namespace vela::reporter
