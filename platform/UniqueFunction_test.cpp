#include "platform/UniqueFunction.h"

#include <array>
#include <cstdint>
#include <gtest/gtest.h>
#include <memory>
#include <utility>

namespace vela::platform {

namespace {

/// What happened to a callable.
struct Counts {
    int constructed = 0;
    int destroyed = 0;
    int moved = 0;
    int called = 0;
};

/// A callable of `kBytes` bytes beyond its pointer that counts what happens to it.
template <std::size_t kBytes, bool kMovesWithoutThrowing = true>
class Counting {
public:
    explicit Counting(Counts& counts) : counts_(&counts) { ++counts_->constructed; }
    // NOLINTNEXTLINE(performance-noexcept-move-constructor): one kind must not promise it
    Counting(Counting&& other) noexcept(kMovesWithoutThrowing) : counts_(other.counts_) {
        ++counts_->constructed;
        ++counts_->moved;
    }
    Counting& operator=(Counting&&) = delete;
    Counting(const Counting&) = delete;
    Counting& operator=(const Counting&) = delete;
    ~Counting() { ++counts_->destroyed; }

    void operator()() { ++counts_->called; }

    bool liesWithin(const void* object, std::size_t size) const {
        const auto self = reinterpret_cast<std::uintptr_t>(this);
        const auto begin = reinterpret_cast<std::uintptr_t>(object);
        return self >= begin && self < begin + size;
    }

private:
    Counts* counts_;
    std::array<std::byte, kBytes> bytes_{};
};

using Small = Counting<8>;
using Largest = Counting<40>;
using TooLarge = Counting<41>;
using MayThrow = Counting<8, false>;

/// Whether a function made of `Callable` keeps it inside itself: seen by the address that the callable has when called.
template <class Callable>
bool isKeptInPlace() {
    Counts counts;
    UniqueFunction<bool(const void*)> function = [callable = Callable(counts)](const void* self) {
        return callable.liesWithin(self, sizeof(UniqueFunction<bool(const void*)>));
    };
    return function(&function);
}

/// Looks, when it is destroyed, whether a function is empty.
class LooksAtTheEnd {
public:
    LooksAtTheEnd(const UniqueFunction<void()>& function, bool& wasEmpty)
        : function_(&function),
          wasEmpty_(&wasEmpty) {}
    LooksAtTheEnd(LooksAtTheEnd&& other) noexcept
        : function_(std::exchange(other.function_, nullptr)),
          wasEmpty_(other.wasEmpty_) {}
    LooksAtTheEnd& operator=(LooksAtTheEnd&&) = delete;
    LooksAtTheEnd(const LooksAtTheEnd&) = delete;
    LooksAtTheEnd& operator=(const LooksAtTheEnd&) = delete;
    ~LooksAtTheEnd() {
        if (function_ != nullptr) {
            *wasEmpty_ = !*function_;
        }
    }

private:
    const UniqueFunction<void()>* function_;
    bool* wasEmpty_;
};

struct alignas(64) OverAligned {
    void operator()() const {}
};

int freeFunction(int value) { return value + 1; }

TEST(UniqueFunctionTest, IsEmptyWithoutACallable) {
    const UniqueFunction<void()> none{};
    const UniqueFunction<void()> null = nullptr;
    EXPECT_FALSE(none);
    EXPECT_FALSE(null);
}

TEST(UniqueFunctionTest, CallsWithArgumentsAndAnswersTheResult) {
    UniqueFunction<int(int, int)> subtract = [](int left, int right) { return left - right; };
    EXPECT_EQ(subtract(7, 5), 2);
}

TEST(UniqueFunctionTest, TakesFunctionPointersAndMembers) {
    struct Number {
        int value = 3;
        int plus(int other) const { return value + other; }
    };
    UniqueFunction<int(int)> pointer = &freeFunction;
    UniqueFunction<int(const Number&, int)> member = &Number::plus;
    EXPECT_EQ(pointer(1), 2);
    EXPECT_EQ(member(Number{}, 4), 7);
}

TEST(UniqueFunctionTest, HandsReferencesAndMoveOnlyArgumentsThrough) {
    int target = 0;
    UniqueFunction<void(int&, std::unique_ptr<int>)> assign = [](int& to, std::unique_ptr<int> from) { to = *from; };
    assign(target, std::make_unique<int>(9));
    EXPECT_EQ(target, 9);
}

TEST(UniqueFunctionTest, IgnoresAResultThatItsSignatureDoesNotName) {
    int called = 0;
    UniqueFunction<void()> function = [&called] { return ++called; };
    function();
    EXPECT_EQ(called, 1);
}

TEST(UniqueFunctionTest, HoldsMoveOnlyCaptures) {
    UniqueFunction<int()> function = [value = std::make_unique<int>(5)] { return *value; };
    UniqueFunction<int()> moved = std::move(function);
    EXPECT_EQ(moved(), 5);
}

TEST(UniqueFunctionTest, KeepsItsStateBetweenCalls) {
    UniqueFunction<int()> count = [calls = 0]() mutable { return ++calls; };
    count();
    UniqueFunction<int()> moved = std::move(count);
    EXPECT_EQ(moved(), 2);
}

TEST(UniqueFunctionTest, KeepsUpTo48BytesInPlace) {
    static_assert(sizeof(Small) == 16);
    static_assert(sizeof(Largest) == 48);
    EXPECT_TRUE(isKeptInPlace<Small>());
    EXPECT_TRUE(isKeptInPlace<Largest>());
}

TEST(UniqueFunctionTest, AllocatesLargerCallables) {
    static_assert(sizeof(TooLarge) == 56);
    EXPECT_FALSE(isKeptInPlace<TooLarge>());
}

TEST(UniqueFunctionTest, AllocatesCallablesWhoseMoveMayThrow) { EXPECT_FALSE(isKeptInPlace<MayThrow>()); }

TEST(UniqueFunctionTest, CallsAnOverAlignedCallableAtItsAlignment) {
    bool aligned = false;
    UniqueFunction<void()> function = [&aligned, over = OverAligned{}] {
        aligned = reinterpret_cast<std::uintptr_t>(&over) % alignof(OverAligned) == 0;
    };
    function();
    EXPECT_TRUE(aligned);
}

TEST(UniqueFunctionTest, DestroysACallableInPlaceOnce) {
    Counts counts;
    {
        UniqueFunction<void()> function = Small(counts);
        EXPECT_EQ(counts.constructed - counts.destroyed, 1);
    }
    EXPECT_EQ(counts.constructed, 2);
    EXPECT_EQ(counts.destroyed, 2);
}

TEST(UniqueFunctionTest, DestroysAnAllocatedCallableOnce) {
    Counts counts;
    {
        UniqueFunction<void()> function = TooLarge(counts);
        EXPECT_EQ(counts.constructed - counts.destroyed, 1);
    }
    EXPECT_EQ(counts.constructed, 2);
    EXPECT_EQ(counts.destroyed, 2);
}

TEST(UniqueFunctionTest, MovingMovesACallableInPlaceAndEmptiesItsSource) {
    Counts counts;
    UniqueFunction<void()> source = Small(counts);
    UniqueFunction<void()> target = std::move(source);
    EXPECT_EQ(counts.moved, 2); // into the first function, then into the second
    EXPECT_EQ(counts.constructed - counts.destroyed, 1);
    EXPECT_FALSE(source); // NOLINT(bugprone-use-after-move,hicpp-invalid-access-moved): its emptiness is the test
    target();
    EXPECT_EQ(counts.called, 1);
}

TEST(UniqueFunctionTest, MovingAnAllocatedCallableLeavesItWhereItIs) {
    Counts counts;
    UniqueFunction<void()> source = MayThrow(counts);
    EXPECT_EQ(counts.moved, 1);
    UniqueFunction<void()> target = std::move(source);
    EXPECT_EQ(counts.moved, 1);
    target();
    EXPECT_EQ(counts.called, 1);
}

TEST(UniqueFunctionTest, AssigningDestroysThePreviousCallable) {
    Counts previous;
    Counts next;
    UniqueFunction<void()> function = Small(previous);
    function = UniqueFunction<void()>(TooLarge(next));
    EXPECT_EQ(previous.constructed, previous.destroyed);
    EXPECT_EQ(next.constructed - next.destroyed, 1);
    function = nullptr;
    EXPECT_EQ(next.constructed, next.destroyed);
    EXPECT_FALSE(function);
}

TEST(UniqueFunctionTest, AssigningToItselfKeepsTheCallable) {
    Counts counts;
    UniqueFunction<void()> function = Small(counts);
    UniqueFunction<void()>& same = function;
    function = std::move(same);
    ASSERT_TRUE(function);
    function();
    EXPECT_EQ(counts.called, 1);
}

TEST(UniqueFunctionTest, ResetDestroysOnceAndMayBeRepeated) {
    Counts counts;
    UniqueFunction<void()> function = Small(counts);
    function.reset();
    function.reset();
    EXPECT_EQ(counts.constructed, 2);
    EXPECT_EQ(counts.destroyed, 2);
    EXPECT_FALSE(function);
}

TEST(UniqueFunctionTest, IsEmptyWhileItsCapturesAreDestroyed) {
    bool wasEmpty = false;
    UniqueFunction<void()> function;
    function = UniqueFunction<void()>([looking = LooksAtTheEnd(function, wasEmpty)] {});
    function.reset();
    EXPECT_TRUE(wasEmpty);
}

} // namespace

} // namespace vela::platform
