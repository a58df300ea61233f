// Log lines to the system journal, in its native protocol. Thread-safe.
//
// One line is one datagram of fields to the journal's socket; see JournalLog.cpp. Nothing here waits: a line that the
// journal does not take at once is lost and counted. The socket is addressed anew with every line, so that a journal
// that was restarted is found again.
#pragma once

#include "platform/Log.h"
#include "platform/Result.h"

#include <atomic>
#include <cstdint>
#include <memory>
#include <string>
#include <string_view>

namespace vela::platform {

class JournalLog final : public LogSink {
public:
    /// `identifier` is the program's name in the journal ("vela-reportingd"). Fails where `socketPath` is no socket:
    /// there is no journal then.
    static Result<std::unique_ptr<JournalLog>> open(std::string identifier,
                                                    std::string socketPath = "/run/systemd/journal/socket");
    ~JournalLog() override;
    JournalLog(const JournalLog&) = delete;
    JournalLog& operator=(const JournalLog&) = delete;

    void write(const LogRecord& record) override;
    std::uint64_t lost() const override { return lost_.load(std::memory_order_relaxed); }

private:
    JournalLog(std::string identifier, std::string socketPath, int socket)
        : identifier_(std::move(identifier)),
          socketPath_(std::move(socketPath)),
          socket_(socket) {}

    bool send(std::string_view fields) const;
    bool sendAsFile(std::string_view fields) const;

    const std::string identifier_;
    const std::string socketPath_;
    const int socket_; ///< owned
    std::atomic<std::uint64_t> lost_{0};
};

} // namespace vela::platform
