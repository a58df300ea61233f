// The analytics service: events whose name matches one of the settings' patterns are stored; their payloads are built
// on the store's thread. Thread-safe; the store outlives it.
#pragma once

#include "platform/Mutex.h"
#include "platform/Tally.h"
#include "platform/sqlite/DeliveryStore.h"

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

    Name find(std::string_view eventName);
    bool matches(const std::string& eventName) const;

    DeliveryStore& store_;
    const std::vector<std::string> patterns_;
    Mutex mutex_;
    std::unordered_map<std::string, Name, TextHash, std::equal_to<>> names_ VELA_GUARDED_BY(mutex_);
    /// The one asked for last, which is asked for twice; null for none.
    const std::pair<const std::string, Name>* last_ VELA_GUARDED_BY(mutex_) = nullptr;
};

} // namespace vela::platform
