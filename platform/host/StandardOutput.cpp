#include "platform/host/StandardOutput.h"

#include "platform/host/HostFacts.h"

#include <cerrno>
#include <iostream>
#include <poll.h>
#include <system_error>
#include <unistd.h>

namespace vela::platform {

namespace {

constexpr std::size_t kBlockBytes = std::size_t{64} * 1024;

} // namespace

DescriptorBuffer::int_type DescriptorBuffer::overflow(int_type byte) {
    if (traits_type::eq_int_type(byte, traits_type::eof())) {
        return traits_type::not_eof(byte);
    }
    const char character = traits_type::to_char_type(byte);
    return append({&character, 1}) ? byte : traits_type::eof();
}

std::streamsize DescriptorBuffer::xsputn(const char* text, std::streamsize count) {
    return append({text, static_cast<std::size_t>(count)}) ? count : 0;
}

int DescriptorBuffer::sync() { return writePending() ? 0 : -1; }

bool DescriptorBuffer::append(std::string_view text) {
    if (error_ != 0) {
        return false;
    }
    pending_ += text;
    const bool due = pending_.size() >= kBlockBytes || (lineByLine_ && text.find('\n') != std::string_view::npos);
    return !due || writePending();
}

bool DescriptorBuffer::writePending() {
    std::string_view rest = pending_;
    while (error_ == 0 && !rest.empty()) {
        const ssize_t written = ::write(descriptor_, rest.data(), rest.size());
        if (written >= 0) {
            rest.remove_prefix(static_cast<std::size_t>(written));
        } else if (errno != EINTR && !(errno == EAGAIN && waitUntilWritable())) {
            error_ = errno;
        }
    }
    pending_.clear();
    return error_ == 0;
}

/// Whoever gave this program its output may have made it one that does not block.
bool DescriptorBuffer::waitUntilWritable() const {
    struct pollfd output {
        descriptor_, POLLOUT, 0
    };
    return poll(&output, 1, -1) >= 0 || errno == EINTR;
}

StandardOutput::StandardOutput(int descriptor)
    : descriptor_(descriptor),
      terminal_(platform::isTerminal(descriptor)),
      buffer_(descriptor, terminal_),
      stream_(&buffer_),
      tiedBefore_(std::cerr.tie(&stream_)) {}

StandardOutput::~StandardOutput() { std::cerr.tie(tiedBefore_); }

bool StandardOutput::isReaderGone() const {
    struct pollfd output {
        descriptor_, 0, 0
    };
    return poll(&output, 1, 0) > 0 && (output.revents & (POLLERR | POLLHUP)) != 0;
}

bool StandardOutput::finish(std::string_view program, std::ostream& error) {
    stream_.flush();
    if (const int reason = buffer_.error(); reason != 0 && reason != EPIPE) {
        error << program << ": standard output cannot be written: " << std::generic_category().message(reason) << '\n';
    }
    return buffer_.error() == 0;
}

} // namespace vela::platform
