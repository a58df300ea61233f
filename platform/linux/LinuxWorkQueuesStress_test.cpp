// Many threads at once post to, suspend, wait with and destroy the same kind of objects: what the thread and address
// sanitizers are to look at. Each test ends by counting that nothing was lost or done twice.
#include "platform/linux/LinuxWorkQueues.h"

#include <array>
#include <atomic>
#include <chrono>
#include <cstdint>
#include <functional>
#include <gtest/gtest.h>
#include <memory>
#include <optional>
#include <random>
#include <thread>
#include <utility>
#include <vector>

namespace vela::platform {

namespace {

using namespace std::chrono_literals;

/// Counts the items that exist and those that ran.
struct Ledger {
    std::atomic<int> live = 0;
    std::atomic<int> ran = 0;
};

/// A capture that stands in the ledger while it lives.
class Entry {
public:
    explicit Entry(Ledger& ledger) : ledger_(&ledger) { ++ledger_->live; }
    Entry(Entry&& other) noexcept : ledger_(std::exchange(other.ledger_, nullptr)) {}
    Entry& operator=(Entry&&) = delete;
    Entry(const Entry&) = delete;
    Entry& operator=(const Entry&) = delete;
    ~Entry() {
        if (ledger_ != nullptr) {
            --ledger_->live;
        }
    }
    void run() const { ++ledger_->ran; }

private:
    Ledger* ledger_;
};

WorkItem entryItem(Ledger& ledger) {
    return [entry = Entry(ledger)] { entry.run(); };
}

void onThreads(int count, const std::function<void(unsigned seed)>& body) {
    std::vector<std::thread> threads;
    threads.reserve(static_cast<std::size_t>(count));
    for (int i = 0; i < count; ++i) {
        threads.emplace_back(body, static_cast<unsigned>(i));
    }
    for (std::thread& thread : threads) {
        thread.join();
    }
}

/// Returns when everything posted to `queue` so far has run.
void drain(WorkQueues& queues, WorkQueue& queue) {
    const auto reached = queues.makeSemaphore(0);
    queue.post([&reached] { reached->signal(); });
    EXPECT_TRUE(reached->wait(60s));
}

QualityOfService qualityFor(std::uint_fast32_t number) { return static_cast<QualityOfService>(number % 4); }

TEST(LinuxWorkQueuesStressTest, ItemsPostedFromManyThreadsRunOnceAndInEachThreadsOrder) {
    std::array<int, 4> last{}; // touched by the queue's items only
    std::atomic<int> outOfOrder = 0;
    std::atomic<int> ran = 0;
    LinuxWorkQueues queues(4);
    const auto finished = queues.makeSemaphore(0);
    const auto queue = queues.makeSerialQueue("queue", QualityOfService::Default);
    onThreads(4, [&](unsigned thread) {
        for (int i = 1; i <= 2'000; ++i) {
            queue->post([&, thread, i] {
                outOfOrder += std::exchange(last[thread], i) == i - 1 ? 0 : 1;
                if (++ran == 8'000) {
                    finished->signal();
                }
            });
        }
    });
    EXPECT_TRUE(finished->wait(60s));
    EXPECT_EQ(outOfOrder, 0);
    EXPECT_EQ(ran, 8'000);
}

TEST(LinuxWorkQueuesStressTest, QueuesComeAndGoWithWorkPending) {
    Ledger ledger;
    {
        LinuxWorkQueues queues(3);
        onThreads(4, [&](unsigned seed) {
            std::mt19937 random(seed);
            for (int round = 0; round < 200; ++round) {
                const auto queue = queues.makeSerialQueue("queue", qualityFor(random()));
                for (auto i = random() % 40; i > 0; --i) {
                    switch (random() % 4) {
                    case 0:
                        queue->postAfter(std::chrono::microseconds(random() % 300), entryItem(ledger));
                        break;
                    case 1:
                        queue->suspend();
                        queue->post(entryItem(ledger));
                        queue->resumeWith(entryItem(ledger));
                        break;
                    default:
                        queue->post(entryItem(ledger));
                    }
                }
                queues.background().post(entryItem(ledger));
                if (round % 8 == 0) {
                    const int before = ledger.ran;
                    queue->post(entryItem(ledger));
                    drain(queues, *queue);
                    EXPECT_GT(ledger.ran, before);
                }
            }
        });
    }
    EXPECT_EQ(ledger.live, 0);
}

TEST(LinuxWorkQueuesStressTest, ItemsDestroyQueuesTheirOwnAndOthers) {
    Ledger ledger;
    {
        LinuxWorkQueues queues(3);
        const auto ended = queues.makeSemaphore(0);
        for (unsigned round = 0; round < 500; ++round) {
            auto own = queues.makeSerialQueue("own", qualityFor(round));
            auto other = queues.makeSerialQueue("other", qualityFor(round / 4));
            SerialQueue& queue = *own;
            other->post(entryItem(ledger));
            // The handle that the item holds goes with its captures, or at once.
            queue.suspend();
            queue.post(
                [&ended, entry = Entry(ledger), round, mine = std::move(own), theirs = std::move(other)]() mutable {
                    theirs.reset();
                    if (round % 2 == 0) {
                        mine.reset();
                    }
                    entry.run();
                    ended->signal();
                });
            queue.post(entryItem(ledger));
            queue.postAfter(50us, entryItem(ledger));
            queue.resume();
        }
        for (int round = 0; round < 500; ++round) {
            ASSERT_TRUE(ended->wait(60s));
        }
    }
    EXPECT_EQ(ledger.live, 0);
    EXPECT_GE(ledger.ran, 500);
}

TEST(LinuxWorkQueuesStressTest, SuspensionsFromManyThreadsBalance) {
    Ledger ledger;
    LinuxWorkQueues queues(4);
    const auto queue = queues.makeSerialQueue("queue", QualityOfService::Default);
    onThreads(4, [&](unsigned) {
        for (int i = 0; i < 500; ++i) {
            queue->suspend();
            queue->post([&] {
                queue->suspend();
                queue->resumeWith(entryItem(ledger));
            });
            queue->resume();
        }
    });
    const auto finished = queues.makeSemaphore(0);
    queue->post([&finished] { finished->signal(); });
    EXPECT_TRUE(finished->wait(60s));
    EXPECT_EQ(ledger.ran, 2'000);
    EXPECT_EQ(ledger.live, 0);
}

TEST(LinuxWorkQueuesStressTest, EveryWaitEndsOnceWhateverEndsIt) {
    Ledger ledger;
    {
        LinuxWorkQueues queues(3);
        const auto shared = queues.makeSemaphore(0);
        onThreads(4, [&](unsigned seed) {
            std::mt19937 random(seed);
            for (int round = 0; round < 200; ++round) {
                std::atomic<int> ends = 0;
                auto queue = queues.makeSerialQueue("queue", qualityFor(random()));
                auto own = queues.makeSemaphore(random() % 2 == 0 ? 0 : 1);
                Semaphore& waited = random() % 2 == 0 ? *own : *shared;
                waited.waitSuspending(*queue, std::chrono::microseconds(random() % 200),
                                      [&ends, entry = Entry(ledger)](bool) { ++ends; });
                queues.background().post([&shared, entry = Entry(ledger)] { shared->wait(100us); });
                if (random() % 2 == 0) {
                    waited.signal();
                }
                if (round % 8 == 0) {
                    drain(queues, *queue);
                    EXPECT_EQ(ends, 1);
                }
                queue->post(entryItem(ledger));
                if (random() % 2 == 0) {
                    own.reset();
                }
                queue.reset();
                EXPECT_LE(ends, 1);
            }
        });
        while (ledger.live > 0) { // background items use the semaphore, which goes before them otherwise
            std::this_thread::yield();
        }
    }
    EXPECT_EQ(ledger.live, 0);
}

TEST(LinuxWorkQueuesStressTest, PoolsComeAndGo) {
    Ledger ledger;
    for (unsigned round = 0; round < 100; ++round) {
        LinuxWorkQueues queues(1 + round % 4);
        const auto queue = queues.makeSerialQueue("queue", qualityFor(round));
        for (int i = 0; i < 20; ++i) {
            queue->post(entryItem(ledger));
            queues.background().post(entryItem(ledger));
            queues.background().postAfter(10us, entryItem(ledger));
        }
    }
    EXPECT_EQ(ledger.live, 0);
}

TEST(LinuxWorkQueuesStressTest, BlockedThreadsComeAndGo) {
    std::atomic<int> ended = 0;
    LinuxWorkQueues queues(2);
    const auto all = queues.makeSemaphore(0);
    const auto semaphore = queues.makeSemaphore(0);
    for (int i = 0; i < 200; ++i) {
        queues.background().post([&] {
            semaphore->wait(std::nullopt);
            if (++ended == 200) {
                all->signal();
            }
        });
        queues.background().post([&semaphore] { semaphore->signal(); });
    }
    EXPECT_TRUE(all->wait(60s));
}

} // namespace

} // namespace vela::platform
