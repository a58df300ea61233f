// A diagnostic reporter that keeps the snapshots it is asked for; a test replies to them or never does. Thread-safe.
// Its reporters may outlive it; replies that nobody called go with it.
#pragma once

#include "platform/Malady.h"
#include "platform/Mutex.h"

#include <cassert>
#include <cstddef>
#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <utility>
#include <vector>

namespace vela::testing {

class FakeMalady final : public platform::Malady {
public:
    struct Request {
        std::uint32_t reporter; ///< reporters are numbered from 1
        platform::MaladySignature signature;
        double seconds;
        std::optional<Dictionary> event;
        std::optional<Dictionary> payload;
    };
    using Reply = platform::UniqueFunction<void(const Dictionary&)>;

    /// Called at the start of every request, outside the lock.
    void setObserver(std::function<void(const Request&)> observer) {
        const MutexLock lock(state_->mutex);
        state_->observer = std::move(observer);
    }

    std::vector<Request> requests() const {
        const MutexLock lock(state_->mutex);
        return state_->requests;
    }
    std::uint32_t reportersMade() const {
        const MutexLock lock(state_->mutex);
        return state_->reporters;
    }
    std::uint32_t reportersAlive() const {
        const MutexLock lock(state_->mutex);
        return state_->reportersAlive;
    }

    /// The reply of the request made as the `index`th, from 0, for the test to call or drop; empty once taken.
    Reply takeReply(std::size_t index) {
        const MutexLock lock(state_->mutex);
        assert(index < state_->replies.size());
        return std::exchange(state_->replies[index], {});
    }
    /// Replies on this thread.
    void reply(std::size_t index, const Dictionary& response) { takeReply(index)(response); }

    std::unique_ptr<platform::MaladyReporter> createReporter() override {
        const MutexLock lock(state_->mutex);
        ++state_->reportersAlive;
        return std::make_unique<Reporter>(state_, ++state_->reporters);
    }

private:
    struct State {
        Mutex mutex;
        std::vector<Request> requests VELA_GUARDED_BY(mutex);
        std::vector<Reply> replies VELA_GUARDED_BY(mutex);
        std::function<void(const Request&)> observer VELA_GUARDED_BY(mutex);
        std::uint32_t reporters VELA_GUARDED_BY(mutex) = 0;
        std::uint32_t reportersAlive VELA_GUARDED_BY(mutex) = 0;
    };

    class Reporter final : public platform::MaladyReporter {
    public:
        Reporter(std::shared_ptr<State> state, std::uint32_t number) : state_(std::move(state)), number_(number) {}
        ~Reporter() override {
            const MutexLock lock(state_->mutex);
            --state_->reportersAlive;
        }
        Reporter(const Reporter&) = delete;
        Reporter& operator=(const Reporter&) = delete;

        void requestSnapshot(const platform::MaladySignature& signature, double seconds,
                             std::optional<Dictionary> event, std::optional<Dictionary> payload, Reply reply) override {
            const Request request{number_, signature, seconds, std::move(event), std::move(payload)};
            std::function<void(const Request&)> observer;
            {
                const MutexLock lock(state_->mutex);
                state_->requests.push_back(request);
                state_->replies.push_back(std::move(reply));
                observer = state_->observer;
            }
            if (observer) {
                observer(request);
            }
        }

    private:
        const std::shared_ptr<State> state_;
        const std::uint32_t number_;
    };

    const std::shared_ptr<State> state_ = std::make_shared<State>();
};

} // namespace vela::testing
