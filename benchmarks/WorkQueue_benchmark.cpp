// What it costs to move work between threads. Beside the queues stands the plainest thing that does the same, so that a
// ratio can be read that means something on every machine.
#include "platform/linux/LinuxWorkQueues.h"

#include <atomic>
#include <benchmark/benchmark.h>
#include <condition_variable>
#include <cstdint>
#include <deque>
#include <functional>
#include <memory>
#include <mutex>
#include <optional>
#include <semaphore>
#include <thread>
#include <vector>

namespace vela::platform {

namespace {

/// std::function in a std::deque under a mutex, with a condition variable and a thread.
class PlainQueue {
public:
    ~PlainQueue() {
        post(nullptr);
        thread_.join();
    }

    void post(std::function<void()> item) {
        {
            const std::scoped_lock lock(mutex_);
            items_.push_back(std::move(item));
        }
        posted_.notify_one();
    }

private:
    void run() {
        while (const std::function<void()> item = take()) {
            item();
        }
    }

    std::function<void()> take() {
        std::unique_lock lock(mutex_);
        posted_.wait(lock, [this] { return !items_.empty(); });
        std::function<void()> item = std::move(items_.front());
        items_.pop_front();
        return item;
    }

    std::mutex mutex_;
    std::condition_variable posted_;
    std::deque<std::function<void()>> items_;
    std::thread thread_{[this] { run(); }};
};

/// Posts items in bulk from this thread and waits for the last: time per item, posting and running together.
template <class Post>
void postInBulk(benchmark::State& state, const Post& post) {
    const auto items = static_cast<std::uint64_t>(state.range(0));
    std::uint64_t ran = 0; // touched by the items only
    std::binary_semaphore finished(0);
    for (auto _ : state) {
        for (std::uint64_t i = 1; i < items; ++i) {
            post([&ran] { ++ran; });
        }
        post([&ran, &finished] {
            ++ran;
            finished.release();
        });
        finished.acquire();
    }
    state.SetItemsProcessed(state.iterations() * state.range(0));
    state.counters["per_item"] = benchmark::Counter(static_cast<double>(state.iterations() * state.range(0)),
                                                    benchmark::Counter::kIsRate | benchmark::Counter::kInvert);
    if (ran != static_cast<std::uint64_t>(state.iterations()) * items) {
        state.SkipWithError("items were lost");
    }
}

void bulkPostPlain(benchmark::State& state) {
    PlainQueue queue;
    postInBulk(state, [&queue](auto item) { queue.post(item); });
}

void bulkPostSerialQueue(benchmark::State& state) {
    LinuxWorkQueues queues;
    const auto queue = queues.makeSerialQueue("com.orvex.vela.benchmark", QualityOfService::UserInteractive);
    postInBulk(state, [&queue](auto item) { queue->post(item); });
}

BENCHMARK(bulkPostPlain)->Arg(1'000)->Arg(100'000)->UseRealTime();
BENCHMARK(bulkPostSerialQueue)->Arg(1'000)->Arg(100'000)->UseRealTime();

constexpr int kRounds = 10'000;

/// Two queues post to each other; time per post.
template <class Queue>
void pingPong(benchmark::State& state, Queue& ping, Queue& pong) {
    int left = 0; // handed from item to item
    std::binary_semaphore finished(0);
    std::function<void()> toPing;
    const std::function<void()> toPong = [&] { pong.post([&toPing] { toPing(); }); };
    toPing = [&] {
        if (--left > 0) {
            ping.post([&toPong] { toPong(); });
        } else {
            finished.release();
        }
    };
    for (auto _ : state) {
        left = kRounds;
        toPing();
        finished.acquire();
    }
    state.counters["per_post"] = benchmark::Counter(static_cast<double>(state.iterations()) * 2 * kRounds,
                                                    benchmark::Counter::kIsRate | benchmark::Counter::kInvert);
}

void pingPongPlain(benchmark::State& state) {
    PlainQueue ping;
    PlainQueue pong;
    pingPong(state, ping, pong);
}

void pingPongSerialQueues(benchmark::State& state) {
    LinuxWorkQueues queues;
    const auto ping = queues.makeSerialQueue("com.orvex.vela.benchmark", QualityOfService::Default);
    const auto pong = queues.makeSerialQueue("com.orvex.vela.benchmark", QualityOfService::Default);
    pingPong(state, *ping, *pong);
}

BENCHMARK(pingPongPlain)->UseRealTime()->Unit(benchmark::kMillisecond);
BENCHMARK(pingPongSerialQueues)->UseRealTime()->Unit(benchmark::kMillisecond);

/// A thousand queues with a hundred items each, posted round by round; time per item.
void thousandQueues(benchmark::State& state) {
    constexpr int kQueues = 1'000;
    constexpr int kItems = 100;
    std::atomic<int> left = 0;
    std::binary_semaphore finished(0);
    LinuxWorkQueues queues;
    std::vector<std::unique_ptr<SerialQueue>> all;
    all.reserve(kQueues);
    for (int i = 0; i < kQueues; ++i) {
        all.push_back(queues.makeSerialQueue("com.orvex.vela.session.beaconreporting", QualityOfService::Utility));
    }
    for (auto _ : state) {
        left = kQueues;
        for (int item = 1; item <= kItems; ++item) {
            for (const auto& queue : all) {
                queue->post([&left, &finished, last = item == kItems] {
                    if (last && --left == 0) {
                        finished.release();
                    }
                });
            }
        }
        finished.acquire();
    }
    state.SetItemsProcessed(state.iterations() * kQueues * kItems);
    state.counters["per_item"] = benchmark::Counter(static_cast<double>(state.iterations()) * kQueues * kItems,
                                                    benchmark::Counter::kIsRate | benchmark::Counter::kInvert);
}

BENCHMARK(thousandQueues)->UseRealTime()->Unit(benchmark::kMillisecond);

} // namespace

} // namespace vela::platform

BENCHMARK_MAIN();
