// The messages of a running session in order, each under its identifier and count, and the counts. Absent before a
// session's first start and after its stop.
//
// The list is its own lock: hold `mutex()` around every use. Identifying a message takes constant time however long the
// list is.
#pragma once

#include "platform/Mutex.h"
#include "shaping/StoredMessage.h"

#include <array>
#include <atomic>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <unordered_map>
#include <vector>

namespace vela {

class VelaReportingSessionMessageList {
public:
    Mutex& mutex() VELA_RETURN_CAPABILITY(mutex_) { return mutex_; }

    /// A new empty list with no counts.
    void begin() VELA_REQUIRES(mutex_);
    /// No list and no counts; their memory is given back.
    void clear() VELA_REQUIRES(mutex_);
    bool exists() const VELA_REQUIRES(mutex_) { return exists_; }
    /// Another number for each list: who reads one in several steps sees whether it is still the same.
    std::uint64_t generation() const VELA_REQUIRES(mutex_) { return generation_; }

    /// Gives a tagged message its identifier and count and records it, or answers true when it is redundant: when it
    /// repeats the last one of its identifier, times aside, and is no error. Without a list nothing is recorded or
    /// redundant.
    bool createMessageIdentifierWithCategory(std::uint32_t category, std::uint16_t type, const Dictionary& message)
        VELA_REQUIRES(mutex_);

    std::span<const StoredMessage> messages() const VELA_REQUIRES(mutex_) { return messages_; }
    /// How many messages there are. Needs no lock and waits for nobody who holds it.
    std::size_t messageCount() const { return messageCount_; }
    /// The key that a message of this list stands under: "Volume_State_3".
    std::string keyOf(const StoredMessage& message) const VELA_REQUIRES(mutex_);
    /// Appends that key to `text`.
    void appendKeyOf(const StoredMessage& message, std::string& text) const VELA_REQUIRES(mutex_);
    /// How many messages of the identifier were kept, or none when there was none.
    std::optional<std::uint32_t> messageIdentifierCount(std::string_view identifier) const VELA_REQUIRES(mutex_);

private:
    struct Kind {
        std::string identifier;
        std::uint32_t count = 0;
        std::size_t last = 0; ///< place of the newest one in the list
    };
    /// A category and type that came lately, and their kind. Different numbers may have one identifier.
    struct Recent {
        std::uint64_t numbers = 0;
        std::uint32_t kind = 0;
    };
    static constexpr std::uint64_t kKnown = std::uint64_t{1} << 63U; ///< marks a place of `recent_` that is used

    std::uint32_t kindOf(std::uint32_t category, std::uint16_t type) VELA_REQUIRES(mutex_);
    std::uint32_t kindOfIdentifier(std::string identifier) VELA_REQUIRES(mutex_);

    Mutex mutex_;
    bool exists_ VELA_GUARDED_BY(mutex_) = false;
    std::uint64_t generation_ VELA_GUARDED_BY(mutex_) = 0;
    std::vector<StoredMessage> messages_ VELA_GUARDED_BY(mutex_);
    std::atomic<std::size_t> messageCount_ = 0; // written with the lock held
    std::vector<Kind> kinds_ VELA_GUARDED_BY(mutex_);
    std::unordered_map<std::string, std::uint32_t> kindsByIdentifier_ VELA_GUARDED_BY(mutex_);
    std::array<Recent, 32> recent_ VELA_GUARDED_BY(mutex_){};
};

} // namespace vela
