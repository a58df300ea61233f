// The socket at which clients arrive: given by the service manager, or made at a path. One that was made here takes its
// file with it. Confined to its owner's thread.
#pragma once

#include "platform/Result.h"
#include "platform/linux/FileDescriptor.h"

#include <string>
#include <sys/types.h>
#include <utility>

namespace vela::platform::dbus {

class ListeningSocket {
public:
    /// Takes over a listening Unix stream socket, whose file is its giver's.
    static Result<ListeningSocket> adopt(int descriptor);

    /// Makes one at `path`, in a folder that exists, with exactly the permissions `mode`. A socket that nobody listens
    /// at any more is replaced; where a service answers, or something else stands there, this fails.
    static Result<ListeningSocket> create(const std::string& path, unsigned mode);

    ListeningSocket(ListeningSocket&& other) noexcept = default;
    ListeningSocket& operator=(ListeningSocket&&) = delete;
    ~ListeningSocket() { close(); }

    int descriptor() const { return socket_.get(); }

    /// Stops listening; removes the file unless another service has replaced it.
    void close();

private:
    explicit ListeningSocket(FileDescriptor socket) : socket_(std::move(socket)) {}

    FileDescriptor socket_;
    std::string path_; ///< of the file made here, or empty
    dev_t device_ = 0; ///< what tells that file from a later one
    ino_t inode_ = 0;
};

} // namespace vela::platform::dbus
