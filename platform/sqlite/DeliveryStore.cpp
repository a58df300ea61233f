#include "platform/sqlite/DeliveryStore.h"

#include "common/VelaReportingUtility.h"

#include <algorithm>
#include <cassert>
#include <chrono>
#include <csignal>
#include <limits>
#include <pthread.h>
#include <system_error>
#include <utility>

namespace vela::platform {

namespace {

constexpr const char* kThreadName = "vela-store";

StoreQueue::Limits limitsFor(const DeliveryStore::Options& options) {
    StoreQueue::Limits limits;
    limits.group = options.commitMessages;
    // A group must fit twice: one is written while the next one collects.
    limits.records = std::max(limits.records, 2 * options.commitMessages);
    return limits;
}

// Deadlines are waited for, so they are of the clock that the waiting goes by.
MonotonicTime monotonicNow() { return std::chrono::steady_clock::now(); }

// Signals are for the threads that wait for them.
class AllSignalsBlocked {
public:
    AllSignalsBlocked() {
        sigset_t all;
        sigfillset(&all);
        for (const int fault : {SIGSEGV, SIGBUS, SIGFPE, SIGILL, SIGTRAP, SIGABRT, SIGSYS}) {
            sigdelset(&all, fault);
        }
        pthread_sigmask(SIG_SETMASK, &all, &before_);
    }
    ~AllSignalsBlocked() { pthread_sigmask(SIG_SETMASK, &before_, nullptr); }
    AllSignalsBlocked(const AllSignalsBlocked&) = delete;
    AllSignalsBlocked& operator=(const AllSignalsBlocked&) = delete;

private:
    sigset_t before_;
};

} // namespace

Result<std::unique_ptr<DeliveryStore>> DeliveryStore::open(const Options& options, DeliveryLedger& ledger,
                                                           const Clock& clock) {
    Result<StoreLock> lock = StoreLock::acquire(options.file.path);
    if (!lock) {
        return lock.failure();
    }
    std::unique_ptr<DeliveryStore> store(new DeliveryStore(options, *std::move(lock), ledger, clock));
    if (const Result<Done> opened = store->writer_.open(monotonicNow()); !opened) {
        return opened.failure();
    }
    const AllSignalsBlocked blocked;
    try {
        store->thread_ = std::thread([self = store.get()] { self->work(); });
    } catch (const std::system_error& error) {
        return Failure{error.code().value(), "the store's thread cannot be made"};
    }
    return store;
}

DeliveryStore::DeliveryStore(const Options& options, StoreLock lock, DeliveryLedger& ledger, const Clock& clock)
    : ledger_(ledger),
      clock_(clock),
      lock_(std::move(lock)),
      queue_(limitsFor(options)),
      writer_(options, queue_, ledger) {}

DeliveryStore::~DeliveryStore() { close(); }

void DeliveryStore::work() {
    pthread_setname_np(pthread_self(), kThreadName);
    while (!queue_.state().closed) {
        queue_.wait(writer_.run(monotonicNow()));
    }
    writer_.finish(monotonicNow());
    queue_.flushed(std::numeric_limits<std::uint64_t>::max());
}

StoreRecord DeliveryStore::newDelivery(DeliveryBackend backend, StoreOperation operation) const {
    StoreRecord record;
    record.backend = backend;
    record.operation = operation;
    record.entry = account();
    if (record.entry->reporterID != 0) {
        record.session = VelaReportingUtilityExtractSessionIDFromReporterID(record.entry->reporterID);
    }
    record.entry->received(backend);
    return record;
}

void DeliveryStore::add(StoreRecord&& record) {
    const std::optional<DropReason> refused = tryAdd(record);
    if (refused && record.entry != nullptr) {
        record.entry->dropped(record.backend, *refused);
        noteLedgerChange();
    }
    if (refused && record.done != nullptr) {
        (*record.done)(false);
    }
}

std::optional<DropReason> DeliveryStore::tryAdd(StoreRecord& record) {
    record.time = clock_.now();
    return queue_.push(record);
}

bool DeliveryStore::commitAll() {
    assert(thread_.get_id() != std::this_thread::get_id());
    queue_.waitFlushed(queue_.requestFlush());
    return !status().degraded;
}

void DeliveryStore::close() {
    queue_.close();
    if (thread_.joinable()) {
        thread_.join();
    }
}

const std::shared_ptr<LedgerEntry>& DeliveryStore::account() const {
    const std::shared_ptr<LedgerEntry>& current = LedgerScope::current();
    return current == nullptr ? ledger_.own() : current;
}

} // namespace vela::platform
