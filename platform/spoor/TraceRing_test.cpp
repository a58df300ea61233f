#include "platform/spoor/TraceRing.h"
#include "testing/TemporaryFolder.h"

#include <fstream>
#include <gtest/gtest.h>
#include <memory>
#include <string>
#include <sys/mman.h>
#include <sys/resource.h>
#include <vector>

namespace vela::platform::spoor {
namespace {

/// What this process may lock, while it lives.
class LockedMemoryScope {
public:
    explicit LockedMemoryScope(rlim_t bytes) {
        EXPECT_EQ(getrlimit(RLIMIT_MEMLOCK, &before_), 0);
        const rlimit limit{bytes, before_.rlim_max};
        set_ = bytes <= before_.rlim_max && setrlimit(RLIMIT_MEMLOCK, &limit) == 0;
    }
    ~LockedMemoryScope() { EXPECT_EQ(setrlimit(RLIMIT_MEMLOCK, &before_), 0); }
    LockedMemoryScope(const LockedMemoryScope&) = delete;
    LockedMemoryScope& operator=(const LockedMemoryScope&) = delete;

    bool isSet() const { return set_; }

private:
    rlimit before_{};
    bool set_ = false;
};

/// What the kernel says that this process has locked.
std::size_t lockedKilobytes() {
    std::ifstream status("/proc/self/status");
    std::string word;
    std::size_t kilobytes = 0;
    while (status >> word && word != "VmLck:") {
    }
    status >> kilobytes;
    return kilobytes;
}

/// Sanitizers' run times lock nothing and say that they did.
bool isMemoryLocked() {
    alignas(4096) static char page[4096];
    const std::size_t before = lockedKilobytes();
    const bool isLocked = mlock(page, sizeof(page)) == 0 && lockedKilobytes() > before;
    munlock(page, sizeof(page));
    return isLocked;
}

class TraceRingTest : public ::testing::Test {
protected:
    void make(std::size_t count) {
        for (std::size_t i = 0; i < count; ++i) {
            auto ring = TraceRing::create(folder_.path());
            ASSERT_TRUE(ring) << ring.failure().description;
            rings_.push_back(*std::move(ring));
        }
    }

    static constexpr std::size_t kRingKilobytes = 1028;
    const testing::TemporaryFolder folder_;
    const std::size_t before_ = lockedKilobytes();
    std::vector<std::unique_ptr<TraceRing>> rings_;
};

TEST_F(TraceRingTest, RingsLeaveHalfOfTheMemoryThatMayBeLockedToTheProgram) {
    const LockedMemoryScope limit(8 << 20);
    if (!limit.isSet() || !isMemoryLocked()) {
        GTEST_SKIP() << "8 MiB cannot be locked here";
    }
    make(6);
    EXPECT_EQ(lockedKilobytes() - before_, 3 * kRingKilobytes);
    for (const auto& ring : rings_) {
        EXPECT_TRUE(ring->write(traceNow(), 1, {}));
    }
}

TEST_F(TraceRingTest, ARingThatGoesGivesItsLockedMemoryBack) {
    const LockedMemoryScope limit(8 << 20);
    if (!limit.isSet() || !isMemoryLocked()) {
        GTEST_SKIP() << "8 MiB cannot be locked here";
    }
    make(4);
    rings_.erase(rings_.begin());
    EXPECT_EQ(lockedKilobytes() - before_, 2 * kRingKilobytes);
    make(1);
    EXPECT_EQ(lockedKilobytes() - before_, 3 * kRingKilobytes);
}

TEST_F(TraceRingTest, WhereLittleMayBeLockedNothingIs) {
    const LockedMemoryScope limit(2 << 20);
    make(2);
    EXPECT_EQ(lockedKilobytes(), before_);
    EXPECT_TRUE(rings_[0]->write(traceNow(), 1, {}));
}

} // namespace
} // namespace vela::platform::spoor
