// What became of everything that was to be delivered. For every client, session and back end
//
//     received = delivered + queued + redundant + dropped (by reason)
//
// holds at any moment: what was received and has no other outcome yet is queued. Who receives a delivery counts it, and
// who ends its way counts its outcome, once: the session until it hands a message over, the back end's binding from
// then on. Everything here is thread-safe.
#pragma once

#include "common/values/Dictionary.h"
#include "platform/Mutex.h"

#include <array>
#include <atomic>
#include <cstddef>
#include <cstdint>
#include <map>
#include <memory>
#include <optional>
#include <string_view>
#include <utility>
#include <vector>

namespace vela {

enum class DeliveryBackend : std::uint8_t { Beacon, Tally, Joule, Telem, Malady };
constexpr std::size_t kDeliveryBackends = 5;

/// In the place of a pid: the account that sums up entries long gone. 0 will not do, which is what the kernel tells of
/// a client outside the service's name space.
constexpr std::int32_t kEarlierClient = -1;

enum class DropReason : std::uint8_t {
    NoConsumer,  ///< nobody uses an analytics event of this name
    NoBackends,  ///< real-time reporting found no back end for the session, or none in time
    NotReported, ///< the session has no real-time reporting
    Limit,       ///< a memory limit refused the message
    Failed,      ///< the back end did not take it
    QueueFull,   ///< the store's queue was full
    StoreFailed, ///< the store could not be written, a full disk say
    Abandoned,   ///< its session was released before it was sent
    Restart,     ///< the service ended before it was stored
};
constexpr std::size_t kDropReasons = 9;

/// "beacon", "tally", ...
std::string_view nameOf(DeliveryBackend backend);
std::optional<DeliveryBackend> backendNamed(std::string_view name);
/// "no_consumer", "no_backends", ...
std::string_view nameOf(DropReason reason);

/// Plain numbers of one account at one moment.
struct LedgerCounts {
    std::uint64_t received = 0;
    std::uint64_t delivered = 0;
    std::uint64_t redundant = 0;
    std::array<std::uint64_t, kDropReasons> dropped{};

    std::uint64_t allDropped() const;
    std::uint64_t queued() const { return received - delivered - redundant - allDropped(); }
    LedgerCounts& operator+=(const LedgerCounts& other);
    friend bool operator==(const LedgerCounts&, const LedgerCounts&) = default;
};

/// One client's session: an account for each back end.
class LedgerEntry {
public:
    LedgerEntry(std::int32_t clientPid, std::int64_t session) : client(clientPid), reporterID(session) {}

    void received(DeliveryBackend backend) { count(account(backend).received, 1); }
    void delivered(DeliveryBackend backend, std::uint64_t number = 1) { count(account(backend).delivered, number); }
    void redundant(DeliveryBackend backend) { count(account(backend).redundant, 1); }
    void dropped(DeliveryBackend backend, DropReason reason, std::uint64_t number = 1) {
        count(account(backend).dropped[static_cast<std::size_t>(reason)], number);
    }

    LedgerCounts counts(DeliveryBackend backend) const;
    /// Whether anything was counted since the last call.
    bool takeChange() { return changed_.load(std::memory_order_relaxed) && changed_.exchange(false); }

    const std::int32_t client;     ///< pid, or kEarlierClient
    const std::int64_t reporterID; ///< 0 for what belongs to no session

private:
    friend class DeliveryLedger;
    struct Account {
        std::atomic<std::uint64_t> received{0};
        std::atomic<std::uint64_t> delivered{0};
        std::atomic<std::uint64_t> redundant{0};
        std::array<std::atomic<std::uint64_t>, kDropReasons> dropped{};
    };

    Account& account(DeliveryBackend backend) { return accounts_[static_cast<std::size_t>(backend)]; }
    void add(DeliveryBackend backend, const LedgerCounts& counts);
    void count(std::atomic<std::uint64_t>& counter, std::uint64_t number) {
        counter.fetch_add(number, std::memory_order_release);
        changed_.store(true, std::memory_order_release);
    }

    std::array<Account, kDeliveryBackends> accounts_;
    std::atomic<bool> changed_{false};
};

/// One account as it is kept over a restart.
struct LedgerRow {
    std::int32_t client = 0;
    std::int64_t reporterID = 0;
    DeliveryBackend backend = DeliveryBackend::Beacon;
    LedgerCounts counts;

    friend bool operator==(const LedgerRow&, const LedgerRow&) = default;
};

class DeliveryLedger {
public:
    /// `servicePid`: client of what belongs to no session.
    explicit DeliveryLedger(std::int32_t servicePid);

    /// The entry of a client's session, which counts on where one of the same numbers is still held.
    std::shared_ptr<LedgerEntry> open(std::int32_t clientPid, std::int64_t reporterID);
    /// The entry of what the service says of itself.
    const std::shared_ptr<LedgerEntry>& own() const { return own_; }

    /// Takes up what an earlier run of the service left; what was queued then is dropped.
    void restore(const std::vector<LedgerRow>& rows);

    /// Accounts that were changed since the last call, for the store; `all` gives every one.
    std::vector<LedgerRow> takeChanged(bool all = false);

    /// "totals" by back end and "entries" with "client", "session" and the back ends, each with "received",
    /// "delivered", "queued", "redundant" and "dropped" by reason. Accounts in which nothing was received are left out.
    Dictionary asDictionary() const;

    /// So many entries are kept one by one, or a quarter more than those that are held when these are many; older ones
    /// that nobody holds are summed up in one.
    static constexpr std::size_t kMostEntries = 1024;

private:
    using Name = std::pair<std::int32_t, std::int64_t>; ///< client and session

    void foldOldest() VELA_REQUIRES(mutex_);
    bool fold(const std::shared_ptr<LedgerEntry>& entry) VELA_REQUIRES(mutex_);

    const std::shared_ptr<LedgerEntry> own_;
    const std::shared_ptr<LedgerEntry> earlier_;
    mutable Mutex mutex_;
    std::vector<std::shared_ptr<LedgerEntry>>
        entries_ VELA_GUARDED_BY(mutex_);                        ///< oldest first, the two above not in it
    std::map<Name, std::size_t> places_ VELA_GUARDED_BY(mutex_); ///< in entries_
    std::size_t foldAt_ VELA_GUARDED_BY(mutex_) = kMostEntries;  ///< entries with which some are summed up next
    std::vector<Name> folded_ VELA_GUARDED_BY(mutex_);           ///< whose rows are to be erased
};

/// While it lives, what the calling thread hands to back ends belongs to this entry. Scopes nest; the inner one holds.
class LedgerScope {
public:
    explicit LedgerScope(std::shared_ptr<LedgerEntry> entry);
    ~LedgerScope();
    LedgerScope(const LedgerScope&) = delete;
    LedgerScope& operator=(const LedgerScope&) = delete;

    /// Of the calling thread; null outside all scopes.
    static const std::shared_ptr<LedgerEntry>& current();

private:
    std::shared_ptr<LedgerEntry> outer_;
};

/// One delivery on its way: counts it as received, and as abandoned when it is destroyed without another outcome.
class LedgerItem {
public:
    /// None: counts nothing.
    LedgerItem() = default;
    LedgerItem(std::shared_ptr<LedgerEntry> entry, DeliveryBackend backend)
        : entry_(std::move(entry)),
          backend_(backend) {
        if (entry_ != nullptr) {
            entry_->received(backend_);
        }
    }
    LedgerItem(LedgerItem&& other) noexcept = default;
    LedgerItem& operator=(LedgerItem&& other) noexcept {
        std::swap(entry_, other.entry_);
        std::swap(backend_, other.backend_);
        return *this;
    }
    ~LedgerItem() { drop(DropReason::Abandoned); }

    void deliver() {
        if (const auto entry = std::exchange(entry_, nullptr)) {
            entry->delivered(backend_);
        }
    }
    void repeat() {
        if (const auto entry = std::exchange(entry_, nullptr)) {
            entry->redundant(backend_);
        }
    }
    void drop(DropReason reason) {
        if (const auto entry = std::exchange(entry_, nullptr)) {
            entry->dropped(backend_, reason);
        }
    }
    /// Somebody else counts its outcome.
    void handOver() { entry_ = nullptr; }
    const std::shared_ptr<LedgerEntry>& entry() const { return entry_; }

private:
    std::shared_ptr<LedgerEntry> entry_;
    DeliveryBackend backend_ = DeliveryBackend::Beacon;
};

} // namespace vela
