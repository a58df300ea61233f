// The sending side of a connection, and how much is under way on it. Replies hold it, if need be for longer than the
// connection lives. Thread-safe.
//
// Reading stops (the channel is paused) while too many calls are under way or too many bytes wait for a client that
// does not read; whoever brings the numbers down rings the endpoint's loop with the connection's token.
//
// While it gathers, the endpoint's thread looks at the connection every now and then by itself: the loop does not watch
// for what the client sends, and replies wait for the next look. So many calls and replies share one wake-up each.
// When the last call under way ends, the replies are sent and the loop is rung, so that nobody is idle until then.
#pragma once

#include "platform/Mutex.h"
#include "platform/dbus/EventLoop.h"
#include "platform/dbus/MessageWriter.h"
#include "platform/linux/FileDescriptor.h"

#include <atomic>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <string>
#include <string_view>

namespace vela::platform::dbus {

struct ChannelLimits {
    std::size_t unsentBytes = 0;
    std::uint32_t callsInFlight = 0;
    std::uint64_t callBytes = 0; ///< of the calls in flight
};

class ConnectionChannel {
public:
    /// `socket` is connected and does not block. Registers it with `loop`; held until `release`.
    ConnectionChannel(FileDescriptor socket, std::shared_ptr<EventLoop> loop, std::uint64_t token,
                      ChannelLimits limits);
    ConnectionChannel(const ConnectionChannel&) = delete;
    ConnectionChannel& operator=(const ConnectionChannel&) = delete;

    /// Whether the loop watches the socket; if not, the connection must be given up.
    bool registered() const { return registered_; }

    /// Whether the process at the other end is still the one that connected; true where that cannot be told.
    bool confirmPeer() const;

    /// Sends bytes as they are: for the authentication.
    void sendBytes(std::string_view bytes);

    /// Sends what `write(writer, serial)` appends. Nothing is sent once the client is gone.
    template <class Write>
    void send(const Write& write) {
        const MutexLock lock(mutex_);
        append(write);
        flushUnlessGathering();
    }
    /// For the endpoint's thread. A call of so many bytes.
    void callBegins(std::uint64_t bytes) { underWay_.fetch_add(underWay(bytes), std::memory_order_relaxed); }
    /// Sends a call's answer, as `send`, and ends the call.
    template <class Write>
    void callEnds(std::uint64_t bytes, const Write& write) {
        const MutexLock lock(mutex_);
        append(write);
        end(bytes);
    }
    void callEnds(std::uint64_t bytes);

    /// Whether the next message may be dispatched. If not, reading stops, and the loop is rung when it may.
    bool mayProceed();
    /// Ends the holding.
    void release();
    bool held() const;

    // For the endpoint's thread: see above.
    void beginGathering();
    /// Sends what was gathered, and answers whether there was anything. Until `endLook` the end of the last call under
    /// way is no reason to ring.
    bool beginLook();
    /// Answers whether no call is under way: then the replies are sent.
    bool endLook();
    /// Sends what was gathered, and watches again.
    void endGathering();
    /// Whether the next message may be dispatched; nobody is told when it may.
    bool hasRoom() const;
    std::uint32_t inFlight() const { return callsOf(underWay_.load(std::memory_order_relaxed)); }

    /// The socket takes bytes again.
    void writable();
    /// The client is gone: nothing is sent any more, and the loop forgets the socket, which may still be read.
    void hangUp();
    /// Closes the socket.
    void close();
    /// For the endpoint's thread, until `close`.
    int descriptor() const { return descriptor_; }

    /// Replies of so many bytes wait for no look.
    static constexpr std::size_t kGatheredBytes = 16 * 1024;

private:
    template <class Write>
    void append(const Write& write) VELA_REQUIRES(mutex_) {
        if (sending_) {
            MessageWriter writer(output_);
            write(writer, nextSerial());
            noteOpen();
        }
    }
    // Calls under way and their bytes are one number, so that a call changes both in one step.
    static constexpr unsigned kCallBits = 24;
    static constexpr std::uint64_t underWay(std::uint64_t bytes) { return bytes << kCallBits | 1U; }
    static constexpr std::uint32_t callsOf(std::uint64_t underWay) {
        return static_cast<std::uint32_t>(underWay & ((1U << kCallBits) - 1U));
    }
    static constexpr std::uint64_t bytesOf(std::uint64_t underWay) { return underWay >> kCallBits; }
    /// One call may be larger than all may be together.
    bool hasRoomForCall() const {
        const std::uint64_t underWay = underWay_.load(std::memory_order_relaxed);
        return callsOf(underWay) < limits_.callsInFlight && bytesOf(underWay) < limits_.callBytes;
    }
    bool isHalfEmpty() const {
        const std::uint64_t underWay = underWay_.load(std::memory_order_relaxed);
        return callsOf(underWay) <= limits_.callsInFlight / 2 && bytesOf(underWay) <= limits_.callBytes / 2;
    }
    void end(std::uint64_t bytes) VELA_REQUIRES(mutex_);
    void flushUnlessGathering() VELA_REQUIRES(mutex_);
    std::uint32_t nextSerial() VELA_REQUIRES(mutex_) { return ++serial_ == 0 ? ++serial_ : serial_; }
    std::size_t unsent() const VELA_REQUIRES(mutex_) { return output_.size() - sent_; }
    /// Without the lock, which each reply takes; only a hint as far as `open_` goes.
    bool belowLimits() const { return open_.load(std::memory_order_acquire) && hasRoomForCall(); }
    void noteOpen() VELA_REQUIRES(mutex_);
    void flush() VELA_REQUIRES(mutex_);
    void discardOutput() VELA_REQUIRES(mutex_);
    void resumeIfPossible() VELA_REQUIRES(mutex_);
    void watch(bool reading, bool writing) VELA_REQUIRES(mutex_);

    // Constant after construction.
    const std::shared_ptr<EventLoop> loop_;
    const std::uint64_t token_;
    const ChannelLimits limits_;
    const int descriptor_;
    bool registered_ = false;

    /// It grows on the endpoint's thread alone, and becomes less with the lock held.
    std::atomic<std::uint64_t> underWay_ = 0;
    /// Whether neither `held_` nor bytes that wait are in the way. Changes with the lock held.
    std::atomic<bool> open_ = false;

    mutable Mutex mutex_;
    FileDescriptor socket_ VELA_GUARDED_BY(mutex_);
    std::string output_ VELA_GUARDED_BY(mutex_); ///< what was not sent yet, behind `sent_` bytes that were
    std::size_t sent_ VELA_GUARDED_BY(mutex_) = 0;
    std::uint32_t serial_ VELA_GUARDED_BY(mutex_) = 0; ///< of the last message sent
    bool sending_ VELA_GUARDED_BY(mutex_) = true;      ///< false once nobody reads
    bool watched_ VELA_GUARDED_BY(mutex_) = false;     ///< by the loop
    bool reading_ VELA_GUARDED_BY(mutex_) = true;      ///< events that the loop waits for
    bool writing_ VELA_GUARDED_BY(mutex_) = false;
    bool paused_ VELA_GUARDED_BY(mutex_) = false;
    bool held_ VELA_GUARDED_BY(mutex_) = true;
    bool gathering_ VELA_GUARDED_BY(mutex_) = false;
    bool looking_ VELA_GUARDED_BY(mutex_) = false;
};

} // namespace vela::platform::dbus
