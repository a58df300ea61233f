// The analytics service: events whose name matches one of the settings' patterns are stored; their payloads are built
// on the store's thread. Thread-safe; the store outlives it.
#pragma once

#include "platform/Mutex.h"
#include "platform/Tally.h"
#include "platform/sqlite/DeliveryStore.h"

#include <array>
#include <cstddef>
#include <functional>
#include <string>
#include <string_view>
#include <unordered_map>
#include <utility>
#include <vector>

namespace vela::platform {

class StoreTally final : public Tally {
public:
    /// Answers that are remembered, by name; names come from clients.
    static constexpr std::size_t kMostNames = 1024;

    /// `used`: shell patterns over event names.
    StoreTally(DeliveryStore& store, std::vector<std::string> used);

    /// An event that nobody uses is counted as received and dropped.
    bool tallyIsEventUsed(std::string_view eventName) override;
    void tallySendEventLazy(std::string_view eventName, UniqueFunction<Dictionary()> payload,
                            std::size_t payloadBytes) override;
    using Tally::tallySendEventLazy;

private:
    struct Name {
        String text; ///< shared by the records of this name
        bool used = false;
    };
    struct TextHash {
        using is_transparent = void;
        std::size_t operator()(std::string_view text) const { return std::hash<std::string_view>()(text); }
    };

    const Name& find(std::string_view eventName) VELA_REQUIRES(mutex_);
    bool matches(const std::string& eventName) const;

    DeliveryStore& store_;
    const std::vector<std::string> patterns_;
    Mutex mutex_;
    std::unordered_map<std::string, Name, TextHash, std::equal_to<>> names_ VELA_GUARDED_BY(mutex_);
    /// Those looked up last, null for none: a message has two names, which the next one often has as well.
    std::array<const std::pair<const std::string, Name>*, 2> recent_ VELA_GUARDED_BY(mutex_){};
    std::size_t nextRecent_ VELA_GUARDED_BY(mutex_) = 0;
};

} // namespace vela::platform
