#include "platform/sqlite/StoreTally.h"

#include <algorithm>
#include <fnmatch.h>
#include <memory>
#include <utility>

namespace vela::platform {

StoreTally::StoreTally(DeliveryStore& store, std::vector<std::string> used)
    : store_(store),
      patterns_(std::move(used)) {}

bool StoreTally::tallyIsEventUsed(std::string_view eventName) {
    {
        const MutexLock lock(mutex_);
        if (find(eventName).used) {
            return true;
        }
    }
    const std::shared_ptr<LedgerEntry>& account = store_.account();
    account->received(DeliveryBackend::Tally);
    account->dropped(DeliveryBackend::Tally, DropReason::NoConsumer);
    store_.noteLedgerChange();
    return false;
}

void StoreTally::tallySendEventLazy(std::string_view eventName, UniqueFunction<Dictionary()> payload,
                                    std::size_t payloadBytes) {
    StoreRecord record = store_.newDelivery(DeliveryBackend::Tally, StoreOperation::Send);
    {
        const MutexLock lock(mutex_);
        record.name = find(eventName).text;
    }
    record.builder = std::move(payload);
    record.builderBytes = payloadBytes;
    store_.add(std::move(record));
}

const StoreTally::Name& StoreTally::find(std::string_view eventName) {
    for (const auto* const recent : recent_) {
        if (recent != nullptr && recent->first == eventName) {
            return recent->second;
        }
    }
    auto found = names_.find(eventName);
    if (found == names_.end()) {
        if (names_.size() >= kMostNames) {
            names_.clear();
            recent_.fill(nullptr);
        }
        std::string text(eventName);
        Name name{String(eventName), matches(text)};
        found = names_.emplace(std::move(text), std::move(name)).first;
    }
    recent_[nextRecent_] = &*found;
    nextRecent_ = (nextRecent_ + 1) % recent_.size();
    return found->second;
}

bool StoreTally::matches(const std::string& eventName) const {
    return std::ranges::any_of(
        patterns_, [&](const std::string& pattern) { return fnmatch(pattern.c_str(), eventName.c_str(), 0) == 0; });
}

} // namespace vela::platform
