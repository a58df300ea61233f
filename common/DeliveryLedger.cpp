#include "common/DeliveryLedger.h"

#include <algorithm>
#include <string>

namespace vela {

namespace {

constexpr std::array<std::string_view, kDeliveryBackends> kBackendNames{"beacon", "tally", "joule", "telem", "malady"};
constexpr std::array<std::string_view, kDropReasons> kReasonNames{"no_consumer",  "no_backends", "not_reported",
                                                                  "limit",        "failed",      "queue_full",
                                                                  "store_failed", "abandoned",   "restart"};

thread_local std::shared_ptr<LedgerEntry> currentEntry;

DeliveryBackend backendNumber(std::size_t number) { return static_cast<DeliveryBackend>(number); }

Dictionary describe(const LedgerCounts& counts) {
    DictionaryBuilder dropped;
    for (std::size_t reason = 0; reason < kDropReasons; ++reason) {
        if (counts.dropped[reason] != 0) {
            dropped.add(kReasonNames[reason], counts.dropped[reason]);
        }
    }
    DictionaryBuilder account;
    account.add("received", counts.received);
    account.add("delivered", counts.delivered);
    account.add("queued", counts.queued());
    account.add("redundant", counts.redundant);
    account.add("dropped", dropped.build());
    return account.build();
}

using AllCounts = std::array<LedgerCounts, kDeliveryBackends>;

void addBackends(DictionaryBuilder& builder, const AllCounts& counts) {
    for (std::size_t backend = 0; backend < kDeliveryBackends; ++backend) {
        if (counts[backend].received != 0) {
            builder.add(kBackendNames[backend], describe(counts[backend]));
        }
    }
}

} // namespace

std::string_view nameOf(DeliveryBackend backend) { return kBackendNames[static_cast<std::size_t>(backend)]; }

std::optional<DeliveryBackend> backendNamed(std::string_view name) {
    const auto* found = std::ranges::find(kBackendNames, name);
    return found == kBackendNames.end()
               ? std::nullopt
               : std::optional(backendNumber(static_cast<std::size_t>(found - kBackendNames.begin())));
}

std::string_view nameOf(DropReason reason) { return kReasonNames[static_cast<std::size_t>(reason)]; }

std::uint64_t LedgerCounts::allDropped() const {
    std::uint64_t sum = 0;
    for (const std::uint64_t number : dropped) {
        sum += number;
    }
    return sum;
}

LedgerCounts& LedgerCounts::operator+=(const LedgerCounts& other) {
    received += other.received;
    delivered += other.delivered;
    redundant += other.redundant;
    for (std::size_t reason = 0; reason < kDropReasons; ++reason) {
        dropped[reason] += other.dropped[reason];
    }
    return *this;
}

LedgerCounts LedgerEntry::counts(DeliveryBackend backend) const {
    const Account& account = accounts_[static_cast<std::size_t>(backend)];
    LedgerCounts counts;
    // Outcomes first: each was counted behind its receipt, so none is seen without it.
    counts.delivered = account.delivered.load(std::memory_order_acquire);
    counts.redundant = account.redundant.load(std::memory_order_acquire);
    for (std::size_t reason = 0; reason < kDropReasons; ++reason) {
        counts.dropped[reason] = account.dropped[reason].load(std::memory_order_acquire);
    }
    counts.received = account.received.load(std::memory_order_acquire);
    return counts;
}

void LedgerEntry::add(DeliveryBackend backend, const LedgerCounts& counts) {
    Account& to = account(backend);
    count(to.received, counts.received);
    count(to.delivered, counts.delivered);
    count(to.redundant, counts.redundant);
    for (std::size_t reason = 0; reason < kDropReasons; ++reason) {
        count(to.dropped[reason], counts.dropped[reason]);
    }
}

DeliveryLedger::DeliveryLedger(std::int32_t servicePid)
    : own_(std::make_shared<LedgerEntry>(servicePid, 0)),
      earlier_(std::make_shared<LedgerEntry>(kEarlierClient, 0)) {}

std::shared_ptr<LedgerEntry> DeliveryLedger::open(std::int32_t clientPid, std::int64_t reporterID) {
    // What an earlier service of the same pid left.
    if (clientPid == own_->client && reporterID == own_->reporterID) {
        return own_;
    }
    const MutexLock lock(mutex_);
    const Name name(clientPid, reporterID);
    if (const auto found = places_.find(name); found != places_.end()) {
        return entries_[found->second];
    }
    if (entries_.size() >= foldAt_) {
        foldOldest();
    }
    places_.emplace(name, entries_.size());
    return entries_.emplace_back(std::make_shared<LedgerEntry>(clientPid, reporterID));
}

// Makes one entry of those that nobody holds, the oldest half of all at most. All are looked at, so the next time comes
// only after a quarter as many more: what an entry costs does not rise with the number of those that are held.
void DeliveryLedger::foldOldest() {
    std::size_t left = entries_.size() / 2;
    std::size_t kept = 0;
    for (std::size_t place = 0; place < entries_.size(); ++place) {
        std::shared_ptr<LedgerEntry>& entry = entries_[place];
        if (left > 0 && fold(entry)) {
            --left;
            continue;
        }
        if (kept != place) {
            places_[Name(entry->client, entry->reporterID)] = kept;
            entries_[kept] = std::move(entry);
        }
        ++kept;
    }
    entries_.resize(kept);
    foldAt_ = std::max(kMostEntries, kept + kept / 4);
}

// Answers whether the entry was summed up: whether nobody holds it.
bool DeliveryLedger::fold(const std::shared_ptr<LedgerEntry>& entry) {
    if (entry.use_count() > 1) {
        return false;
    }
    for (std::size_t backend = 0; backend < kDeliveryBackends; ++backend) {
        earlier_->add(backendNumber(backend), entry->counts(backendNumber(backend)));
    }
    const Name name(entry->client, entry->reporterID);
    folded_.push_back(name);
    places_.erase(name);
    return true;
}

void DeliveryLedger::restore(const std::vector<LedgerRow>& rows) {
    for (const LedgerRow& row : rows) {
        LedgerCounts counts = row.counts;
        counts.dropped[static_cast<std::size_t>(DropReason::Restart)] += counts.queued();
        // Older files say 0, and a pid of 0 is of many processes.
        const bool summed = row.client == kEarlierClient || row.client == 0;
        (summed ? earlier_ : open(row.client, row.reporterID))->add(row.backend, counts);
    }
}

std::vector<LedgerRow> DeliveryLedger::takeChanged(bool all) {
    std::vector<LedgerRow> rows;
    const auto take = [&](LedgerEntry& entry) {
        if (!entry.takeChange() && !all) {
            return;
        }
        for (std::size_t backend = 0; backend < kDeliveryBackends; ++backend) {
            const LedgerCounts counts = entry.counts(backendNumber(backend));
            if (counts.received != 0) {
                rows.push_back({entry.client, entry.reporterID, backendNumber(backend), counts});
            }
        }
    };
    const MutexLock lock(mutex_);
    take(*earlier_);
    take(*own_);
    for (const auto& entry : entries_) {
        take(*entry);
    }
    // A row of no counts tells that an entry was summed up.
    for (const auto& [client, reporterID] : std::exchange(folded_, {})) {
        for (std::size_t backend = 0; backend < kDeliveryBackends; ++backend) {
            rows.push_back({client, reporterID, backendNumber(backend), {}});
        }
    }
    return rows;
}

Dictionary DeliveryLedger::asDictionary() const {
    AllCounts totals;
    ArrayBuilder entries;
    const auto add = [&](const LedgerEntry& entry) {
        AllCounts counts;
        for (std::size_t backend = 0; backend < kDeliveryBackends; ++backend) {
            counts[backend] = entry.counts(backendNumber(backend));
            totals[backend] += counts[backend];
        }
        DictionaryBuilder line;
        line.add("client", entry.client);
        line.add("session", entry.reporterID);
        addBackends(line, counts);
        if (line.size() > 2) {
            entries.add(line.build());
        }
    };
    {
        const MutexLock lock(mutex_);
        add(*earlier_);
        add(*own_);
        for (const auto& entry : entries_) {
            add(*entry);
        }
    }
    DictionaryBuilder sums;
    addBackends(sums, totals);
    DictionaryBuilder ledger;
    ledger.add("totals", sums.build());
    ledger.add("entries", entries.build());
    return ledger.build();
}

LedgerScope::LedgerScope(std::shared_ptr<LedgerEntry> entry) : outer_(std::exchange(currentEntry, std::move(entry))) {}

LedgerScope::~LedgerScope() { currentEntry = std::move(outer_); }

const std::shared_ptr<LedgerEntry>& LedgerScope::current() { return currentEntry; }

} // namespace vela
