#include "platform/hwstats/SystemSampler.h"
#include "testing/ManualClock.h"

#include <chrono>
#include <future>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <string>

namespace vela::platform::hwstats {
namespace {

using namespace std::chrono_literals;
using ::testing::ElementsAre;
using ::testing::IsEmpty;

class CountingSource final : public SystemSource {
public:
    explicit CountingSource(std::string name) : SystemSource({"Tarn", {}}), name_(std::move(name)) {}

    void sample(SystemReading&, Samples& samples) override {
        ++samplings;
        BlockBuilder block(name_, name_);
        block.simple("samplings", "", samplings);
        add(std::move(block), samples);
    }
    std::uint64_t samplings = 0;

private:
    const std::string name_;
};

/// A file whose driver does not answer until it is told to.
class StuckSource final : public SystemSource {
public:
    StuckSource() : SystemSource({"Tarn", {}}) {}

    void sample(SystemReading&, Samples& samples) override {
        entered_.set_value();
        released_.get_future().wait();
        BlockBuilder block("stuck", "stuck");
        block.simple("late", "", samples.time);
        add(std::move(block), samples);
    }
    void waitUntilEntered() { entered_.get_future().wait(); }
    void release() { released_.set_value(); }

private:
    std::promise<void> entered_;
    std::promise<void> released_;
};

std::vector<std::string> keysOf(const Samples& samples) {
    std::vector<std::string> keys;
    for (const SampleBlock& block : samples.blocks) {
        keys.push_back(block.key);
    }
    return keys;
}

class SystemSamplerTest : public ::testing::Test {
protected:
    testing::ManualClock clock_;
    CountingSource one_{"one"};
    CountingSource two_{"two"};
    Samples samples_;
};

TEST_F(SystemSamplerTest, BlocksComeInTheOrderOfTheSources) {
    SystemSampler sampler("", clock_);
    EXPECT_TRUE(sampler.sample({&two_, &one_}, samples_, 60s));
    EXPECT_THAT(keysOf(samples_), ElementsAre("two", "one"));
}

TEST_F(SystemSamplerTest, WhatTheSamplesHeldStays) {
    SystemSampler sampler("", clock_);
    EXPECT_TRUE(sampler.sample({&one_}, samples_, 60s));
    EXPECT_TRUE(sampler.sample({&two_}, samples_, 60s));
    EXPECT_THAT(keysOf(samples_), ElementsAre("one", "two"));
}

TEST_F(SystemSamplerTest, AReadingThatIsStuckIsLeftOut) {
    StuckSource stuck;
    SystemSampler sampler("", clock_);
    EXPECT_FALSE(sampler.sample({&one_, &stuck}, samples_, 1ms));
    EXPECT_THAT(keysOf(samples_), IsEmpty());
    stuck.waitUntilEntered();
    stuck.release();
}

TEST_F(SystemSamplerTest, WhileOneIsStuckTheNextIsNotBegun) {
    StuckSource stuck;
    SystemSampler sampler("", clock_);
    EXPECT_FALSE(sampler.sample({&stuck}, samples_, 1ms));
    stuck.waitUntilEntered();
    EXPECT_FALSE(sampler.sample({&one_}, samples_, 1ms));
    EXPECT_EQ(one_.samplings, 0U);
    stuck.release();
}

TEST_F(SystemSamplerTest, AfterAStuckReadingHasEndedSamplingsWorkAgain) {
    StuckSource stuck;
    SystemSampler sampler("", clock_);
    EXPECT_FALSE(sampler.sample({&stuck}, samples_, 1ms));
    stuck.waitUntilEntered();
    stuck.release();
    EXPECT_TRUE(sampler.sample({&one_}, samples_, 60s));
    EXPECT_THAT(keysOf(samples_), ElementsAre("one"));
}

TEST_F(SystemSamplerTest, IsBusyWhileAReadingIsOverdue) {
    StuckSource stuck;
    SystemSampler sampler("", clock_);
    EXPECT_FALSE(sampler.isBusy());
    EXPECT_TRUE(sampler.sample({&one_}, samples_, 60s));
    EXPECT_FALSE(sampler.isBusy());
    EXPECT_FALSE(sampler.sample({&stuck}, samples_, 1ms));
    EXPECT_TRUE(sampler.isBusy());
    stuck.release();
    EXPECT_TRUE(sampler.sample({&two_}, samples_, 60s));
    EXPECT_FALSE(sampler.isBusy());
}

TEST_F(SystemSamplerTest, WithoutAnySamplingThereIsNoThreadToEnd) { const SystemSampler sampler("", clock_); }

} // namespace
} // namespace vela::platform::hwstats
