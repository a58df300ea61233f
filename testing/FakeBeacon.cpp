#include "testing/FakeBeacon.h"

#include "platform/Mutex.h"

#include <algorithm>
#include <cassert>
#include <deque>
#include <iterator>
#include <map>
#include <ostream>
#include <string_view>
#include <utility>

namespace vela::testing {

/// What the framework and its sessions share.
class FakeBeacon::State {
public:
    void record(Call call) VELA_EXCLUDES(mutex_) {
        std::function<void(Operation)> observer;
        const Operation operation = call.operation;
        {
            const MutexLock lock(mutex_);
            calls_.push_back(std::move(call));
            observer = observer_;
        }
        if (observer) {
            observer(operation);
        }
    }

    platform::Result<platform::Done> outcomeOfSend() VELA_EXCLUDES(mutex_) {
        const MutexLock lock(mutex_);
        if (failure_) {
            return *failure_;
        }
        return platform::Done();
    }

    void discover(std::uint32_t session, Completion completion) VELA_EXCLUDES(mutex_) {
        Array backends;
        Discovery discovery{};
        {
            const MutexLock lock(mutex_);
            const auto own = discoveriesOf_.find(session);
            discovery = own == discoveriesOf_.end() ? discovery_ : own->second;
            backends = backends_;
            if (discovery == Discovery::Waits) {
                waiting_.push_back(std::move(completion));
                return;
            }
        }
        if (discovery != Discovery::Lost) {
            completion(discovery == Discovery::FindsBackends ? std::optional(backends) : std::nullopt);
        }
    }

    Mutex mutex_;
    std::vector<Call> calls_ VELA_GUARDED_BY(mutex_);
    std::deque<Completion> waiting_ VELA_GUARDED_BY(mutex_);
    std::map<std::uint32_t, Discovery> discoveriesOf_ VELA_GUARDED_BY(mutex_);
    Discovery discovery_ VELA_GUARDED_BY(mutex_) = Discovery::Waits;
    Array backends_ VELA_GUARDED_BY(mutex_) = {"store"};
    std::optional<platform::Failure> failure_ VELA_GUARDED_BY(mutex_);
    std::string description_ VELA_GUARDED_BY(mutex_) = "FakeBeaconSession";
    std::function<void(Operation)> observer_ VELA_GUARDED_BY(mutex_);
    std::int64_t tokens_ VELA_GUARDED_BY(mutex_) = 0;
    std::uint32_t sessions_ VELA_GUARDED_BY(mutex_) = 0;
};

class FakeBeacon::Session final : public platform::BeaconSession {
public:
    Session(std::shared_ptr<State> state, std::uint32_t number) : state_(std::move(state)), number_(number) {}
    ~Session() override { state_->record({.operation = Operation::EndSession, .session = number_}); }
    Session(const Session&) = delete;
    Session& operator=(const Session&) = delete;

    void startBeaconBackendDiscovery(Completion completion) override {
        state_->record({.operation = Operation::Discover, .session = number_});
        state_->discover(number_, std::move(completion));
    }
    platform::Result<platform::Done> sendBeaconMessage(std::uint16_t category, std::uint16_t type,
                                                       const Dictionary& payload) override {
        state_->record(
            {.operation = Operation::Send, .session = number_, .category = category, .type = type, .payload = payload});
        return state_->outcomeOfSend();
    }
    void flushBeaconMessages() override { state_->record({.operation = Operation::Flush, .session = number_}); }
    std::string description() const override {
        const MutexLock lock(state_->mutex_);
        return state_->description_;
    }

private:
    const std::shared_ptr<State> state_;
    const std::uint32_t number_;
};

std::ostream& operator<<(std::ostream& stream, FakeBeacon::Operation operation) {
    constexpr std::string_view kNames[] = {"NewToken", "CreateSession", "Discover", "Send",
                                           "Flush",    "EndSession",    "SendOne"};
    return stream << kNames[static_cast<std::size_t>(operation)];
}

FakeBeacon::FakeBeacon() : state_(std::make_shared<State>()) {}

FakeBeacon::~FakeBeacon() {
    // What waits may hold sessions of this framework, which hold the state.
    while (takeDiscovery()) {
    }
}

void FakeBeacon::setDiscovery(Discovery discovery) {
    const MutexLock lock(state_->mutex_);
    state_->discovery_ = discovery;
}

void FakeBeacon::setDiscoveryOf(std::uint32_t number, Discovery discovery) {
    const MutexLock lock(state_->mutex_);
    state_->discoveriesOf_[number] = discovery;
}

void FakeBeacon::setBackends(Array backends) {
    const MutexLock lock(state_->mutex_);
    state_->backends_ = std::move(backends);
}

void FakeBeacon::failSends(std::optional<std::string> description, int code) {
    const MutexLock lock(state_->mutex_);
    state_->failure_ = description ? std::optional(platform::Failure{code, *std::move(description)}) : std::nullopt;
}

void FakeBeacon::setDescription(std::string description) {
    const MutexLock lock(state_->mutex_);
    state_->description_ = std::move(description);
}

void FakeBeacon::setObserver(std::function<void(Operation)> observer) {
    const MutexLock lock(state_->mutex_);
    state_->observer_ = std::move(observer);
}

void FakeBeacon::answer(bool found) {
    Array backends;
    {
        const MutexLock lock(state_->mutex_);
        backends = state_->backends_;
    }
    Completion completion = takeDiscovery();
    assert(completion);
    completion(found ? std::optional(backends) : std::nullopt);
}

FakeBeacon::Completion FakeBeacon::takeDiscovery() {
    const MutexLock lock(state_->mutex_);
    if (state_->waiting_.empty()) {
        return {};
    }
    Completion completion = std::move(state_->waiting_.front());
    state_->waiting_.pop_front();
    return completion;
}

std::vector<FakeBeacon::Call> FakeBeacon::calls() const {
    const MutexLock lock(state_->mutex_);
    return state_->calls_;
}

std::vector<FakeBeacon::Operation> FakeBeacon::operations() const {
    const std::vector<Call> calls = this->calls();
    std::vector<Operation> operations;
    std::transform(calls.begin(), calls.end(), std::back_inserter(operations),
                   [](const Call& call) { return call.operation; });
    return operations;
}

std::vector<FakeBeacon::Call> FakeBeacon::callsOf(Operation operation) const {
    std::vector<Call> calls = this->calls();
    std::erase_if(calls, [operation](const Call& call) { return call.operation != operation; });
    return calls;
}

std::size_t FakeBeacon::waitingDiscoveries() const {
    const MutexLock lock(state_->mutex_);
    return state_->waiting_.size();
}

void FakeBeacon::clearCalls() {
    const MutexLock lock(state_->mutex_);
    state_->calls_.clear();
}

Value FakeBeacon::newBeaconHierarchyToken(ValueRef parent) {
    state_->record({.operation = Operation::NewToken, .token = Value(parent)});
    const MutexLock lock(state_->mutex_);
    return std::string_view("token " + std::to_string(++state_->tokens_));
}

std::shared_ptr<platform::BeaconSession> FakeBeacon::createBeaconSession(const Dictionary& sessionInfo,
                                                                         const Dictionary& userInfo) {
    std::uint32_t number = 0;
    {
        const MutexLock lock(state_->mutex_);
        number = ++state_->sessions_;
    }
    state_->record(
        {.operation = Operation::CreateSession, .session = number, .sessionInfo = sessionInfo, .userInfo = userInfo});
    return std::make_shared<Session>(state_, number);
}

platform::Result<platform::Done> FakeBeacon::sendOneBeaconMessage(const Dictionary& sessionInfo,
                                                                  const Dictionary& userInfo, std::uint16_t category,
                                                                  std::uint16_t type, const Dictionary& payload) {
    state_->record({.operation = Operation::SendOne,
                    .sessionInfo = sessionInfo,
                    .userInfo = userInfo,
                    .category = category,
                    .type = type,
                    .payload = payload});
    return state_->outcomeOfSend();
}

} // namespace vela::testing
