#include "platform/hwstats/AlsaSource.h"
#include "platform/hwstats/SystemTree_test.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace vela::platform::hwstats {
namespace {

using std::chrono::seconds;
using ::testing::ElementsAre;
using ::testing::IsEmpty;

constexpr const char* kRate48000 = "access: MMAP_INTERLEAVED\nformat: S16_LE\nsubformat: STD\nchannels: 2\n"
                                   "rate: 48000 (48000/1)\nperiod_size: 1024\nbuffer_size: 8192\n";

std::string statusText(const std::string& state, const std::string& trigger, const std::string& now,
                       const std::string& pointer) {
    return "state: " + state + "\nowner_pid   : 812\ntrigger_time: " + trigger + "\ntstamp      : " + now +
           "\ndelay       : 1024\navail       : 7168\navail_max   : 7168\n-----\nhw_ptr      : " + pointer +
           "\nappl_ptr    : 999999\n";
}

class AlsaSourceTest : public ::testing::Test {
protected:
    AlsaSourceTest() {
        tree_.write("/proc/asound/card0/id", "PCH\n");
        tree_.write("/proc/asound/cards", " 0 [PCH            ]: HDA-Intel\n");
        tree_.write("/proc/asound/version", "x");
    }
    void setStatus(const std::string& text) const {
        tree_.write("/proc/asound/card0/pcm0p/sub0/status", text);
        tree_.write("/proc/asound/card0/pcm0p/sub0/hw_params", text == "closed\n" ? "closed\n" : kRate48000);
    }
    /// Frames, milliseconds, transitions and residency of each state that was ever entered.
    std::string observed() {
        std::string text;
        for (const std::string& line : linesOf(sampled(source_, tree_, clock_))) {
            text += (text.empty() ? "" : " | ") + line.substr(line.find("sub0 ") + 5);
        }
        for (std::size_t at = 0; (at = text.find(", ", at)) != std::string::npos;) {
            const std::size_t end = std::min(text.find(", ", at + 2), text.size());
            text = text.compare(end - 5, 5, " 0x 0") == 0 ? text.substr(0, at) + text.substr(end)
                                                          : (at += 2, std::move(text));
        }
        return text;
    }

    const SystemTree tree_{};
    testing::ManualClock clock_;
    AlsaSource source_{{"Tx", std::nullopt}, true};
};

TEST_F(AlsaSourceTest, AStatusIsRead) {
    const auto status = readAlsaStatus(statusText("RUNNING", "12.000000345", "13.500000345", "72000"));
    ASSERT_TRUE(status.has_value());
    EXPECT_EQ(kAlsaStates[status->state], "running");
    EXPECT_EQ(status->triggerTime, 12'000'000'345U);
    EXPECT_EQ(status->time, 13'500'000'345U);
    EXPECT_EQ(status->hardwarePointer, 72'000U);
    EXPECT_EQ(readAlsaStatus("closed\n")->state, 0U);
    EXPECT_FALSE(readAlsaStatus("").has_value());
    EXPECT_FALSE(readAlsaStatus("state: DANCING\nhw_ptr: 5\n").has_value());
    EXPECT_EQ(readAlsaRate(kRate48000), 48'000U);
    EXPECT_EQ(readAlsaRate("closed\n"), 0U);
    EXPECT_EQ(readAlsaRate("no setup\n"), 0U);
}

TEST_F(AlsaSourceTest, PlaybackAndCaptureAreApart) {
    setStatus("closed\n");
    tree_.write("/proc/asound/card0/pcm1c/sub0/status", "closed\n");
    AlsaSource capture({"Rx", std::nullopt}, false);
    const auto playbackLines = linesOf(sampled(source_, tree_, clock_));
    const auto captureLines = linesOf(sampled(capture, tree_, clock_));
    EXPECT_THAT(playbackLines,
                ElementsAre("PCH/Tx/- pcm0p sub0 frames: 0", "PCH/Tx/- pcm0p sub0 milliseconds: 0", ::testing::_));
    EXPECT_THAT(captureLines,
                ElementsAre("PCH/Rx/- pcm1c sub0 frames: 0", "PCH/Rx/- pcm1c sub0 milliseconds: 0", ::testing::_));
}

TEST_F(AlsaSourceTest, AMachineWithoutCardsHasNoChannels) {
    tree_.remove("/proc/asound");
    EXPECT_THAT(sampled(source_, tree_, clock_).blocks, IsEmpty());
}

TEST_F(AlsaSourceTest, ARunningStreamCountsFromItsStart) {
    setStatus(statusText("RUNNING", "10.000000000", "12.000000000", "96000"));
    EXPECT_EQ(observed(), "frames: 96000 | milliseconds: 2000 | state: closed 0x 0, running 1x 2000000000");
    clock_.advance(seconds(1));
    setStatus(statusText("RUNNING", "10.000000000", "13.000000000", "144000"));
    EXPECT_EQ(observed(), "frames: 144000 | milliseconds: 3000 | state: closed 0x 0, running 1x 3000000000");
}

TEST_F(AlsaSourceTest, AStreamThatWasOpenedSinceCountsWhole) {
    setStatus("closed\n");
    EXPECT_EQ(observed(), "frames: 0 | milliseconds: 0 | state: closed 1x 0");
    clock_.advance(seconds(5));
    setStatus(statusText("RUNNING", "20.000000000", "22.000000000", "96000"));
    EXPECT_EQ(observed(), "frames: 96000 | milliseconds: 2000 | state: closed 1x 3000000000, running 1x 2000000000");
}

TEST_F(AlsaSourceTest, AStreamThatWasClosedKeepsItsCount) {
    setStatus(statusText("RUNNING", "10.000000000", "11.000000000", "48000"));
    observed();
    clock_.advance(seconds(2));
    setStatus("closed\n");
    EXPECT_EQ(observed(), "frames: 48000 | milliseconds: 1000 | state: closed 1x 0, running 1x 3000000000");
}

TEST_F(AlsaSourceTest, APauseIsNoNewStart) {
    setStatus(statusText("RUNNING", "10.000000000", "11.000000000", "48000"));
    observed();
    clock_.advance(seconds(2));
    setStatus(statusText("PAUSED", "12.000000000", "13.000000000", "96000"));
    EXPECT_EQ(observed(),
              "frames: 96000 | milliseconds: 2000 | state: closed 0x 0, running 1x 2000000000, paused 1x 1000000000");
    clock_.advance(seconds(3));
    setStatus(statusText("RUNNING", "15.000000000", "16.000000000", "144000"));
    EXPECT_EQ(observed(),
              "frames: 144000 | milliseconds: 3000 | state: closed 0x 0, running 2x 3000000000, paused 1x 3000000000");
}

TEST_F(AlsaSourceTest, ARestartCountsSinceTheRestart) {
    setStatus(statusText("RUNNING", "10.000000000", "11.000000000", "48000"));
    observed();
    clock_.advance(seconds(10));
    setStatus(statusText("RUNNING", "20.500000000", "21.000000000", "24000"));
    EXPECT_EQ(observed(), "frames: 72000 | milliseconds: 1500 | state: closed 0x 0, running 2x 11000000000");
}

TEST_F(AlsaSourceTest, AnXrunIsAState) {
    setStatus(statusText("RUNNING", "10.000000000", "11.000000000", "48000"));
    observed();
    clock_.advance(seconds(2));
    setStatus(statusText("XRUN", "12.500000000", "13.000000000", "120000"));
    EXPECT_EQ(observed(),
              "frames: 120000 | milliseconds: 2500 | state: closed 0x 0, running 1x 2500000000, xrun 1x 500000000");
}

TEST_F(AlsaSourceTest, ThePointerWraps) {
    setStatus(statusText("RUNNING", "10.000000000", "11.000000000", "1073741000"));
    observed();
    clock_.advance(seconds(1));
    setStatus(statusText("RUNNING", "10.000000000", "12.000000000", "480"));
    EXPECT_EQ(observed().substr(0, 18), "frames: 1073741480");
}

TEST_F(AlsaSourceTest, ACardThatIsUnpluggedIsForgotten) {
    setStatus(statusText("RUNNING", "10.000000000", "11.000000000", "48000"));
    observed();
    tree_.remove("/proc/asound/card0/pcm0p");
    EXPECT_THAT(sampled(source_, tree_, clock_).blocks, IsEmpty());
    setStatus(statusText("RUNNING", "10.000000000", "11.000000000", "48000"));
    EXPECT_EQ(observed().substr(0, 13), "frames: 48000");
}

} // namespace
} // namespace vela::platform::hwstats
