#include "client/Doorbell.h"

#include <cerrno>
#include <sys/eventfd.h>
#include <unistd.h>

namespace vela::client {

Doorbell::Doorbell() : descriptor_(eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK)) {}

void Doorbell::ring() {
    if (rest_.exchange(Rest::Awake, std::memory_order_seq_cst) != Rest::Awake) {
        ringAlways();
    }
}

void Doorbell::ringAlways() const {
    const int error = errno; // the caller's business
    const std::uint64_t one = 1;
    // It fails only when it was rung 2^64 times without being heard.
    [[maybe_unused]] const ssize_t written = write(descriptor_.get(), &one, sizeof(one));
    errno = error;
}

void Doorbell::silence() const {
    std::uint64_t rings = 0;
    [[maybe_unused]] const ssize_t taken = read(descriptor_.get(), &rings, sizeof(rings));
}

} // namespace vela::client
