// libvelareporting: publishes the statistics channels of a driver. C++20 over the C API of vela/channels.h, which
// describes threads, files and fork. Nothing here throws; only making a Channels allocates.
//
//     namespace reporting = vela::reporting;
//     constexpr std::int64_t kBounds[] = {0, 500, 1000, 2000, 5000};
//     constexpr const char* kStates[] = {"idle", "running"};
//     const reporting::Channels channels({.driver = "My Driver", .group = "Speaker"},
//                                        {reporting::counter("xruns"), reporting::histogram("busy", "us", kBounds),
//                                         reporting::states("stream", kStates)});
//     const reporting::Counter xruns(channels[0]);
//     xruns.add(1);
#pragma once

#include <cstddef>
#include <cstdint>
#include <initializer_list>
#include <span>
#include <utility>
#include <vela/channels.h>

namespace vela::reporting {

using ChannelDefinition = VelaReportingChannelDefinition;

inline ChannelDefinition counter(const char* name) noexcept { return VelaReportingCounterDefinition(name); }
/// `bounds` rise; there is one more than there are buckets.
inline ChannelDefinition histogram(const char* name, const char* unit, std::span<const std::int64_t> bounds) noexcept {
    return VelaReportingHistogramDefinition(name, unit, bounds.data(), bounds.size());
}
inline ChannelDefinition states(const char* name, std::span<const char* const> names) noexcept {
    return VelaReportingStateDefinition(name, names.data(), names.size());
}

/// As in VelaReportingChannelsOptions.
struct ChannelsOptions {
    const char* driver = nullptr;
    const char* group = nullptr;
    const char* subGroup = nullptr;
    const char* publisher = nullptr;
    const char* folder = nullptr;
};

// Each is a channel for updates; one that is null, or of another format, takes them and does nothing.

class Counter {
public:
    explicit Counter(VelaReportingChannel* channel) noexcept : channel_(channel) {}
    void add(std::int64_t change) const noexcept { VelaReportingCounterAdd(channel_, change); }
    void set(std::int64_t value) const noexcept { VelaReportingCounterSet(channel_, value); }

private:
    VelaReportingChannel* channel_;
};

class Histogram {
public:
    explicit Histogram(VelaReportingChannel* channel) noexcept : channel_(channel) {}
    void record(std::int64_t value) const noexcept { VelaReportingHistogramRecord(channel_, value); }

private:
    VelaReportingChannel* channel_;
};

class StateChannel {
public:
    explicit StateChannel(VelaReportingChannel* channel) noexcept : channel_(channel) {}
    void enter(std::uint64_t state) const noexcept { VelaReportingStateEnter(channel_, state); }
    /// `nanoseconds` of CLOCK_MONOTONIC.
    void enterAt(std::uint64_t state, std::uint64_t nanoseconds) const noexcept {
        VelaReportingStateEnterAt(channel_, state, nanoseconds);
    }
    void leave() const noexcept { VelaReportingStateEnter(channel_, VELA_REPORTING_NO_STATE); }

private:
    VelaReportingChannel* channel_;
};

/// The channels of one driver, published as long as it lives. May be moved; its channels stay where they are.
class Channels {
public:
    Channels(const ChannelsOptions& options, std::span<const ChannelDefinition> definitions) noexcept {
        error_.size = sizeof(error_);
        VelaReportingChannelsOptions all{};
        all.size = sizeof(all);
        all.driver = options.driver;
        all.group = options.group;
        all.subGroup = options.subGroup;
        all.publisher = options.publisher;
        all.folder = options.folder;
        status_ = VelaReportingChannelsCreate(&all, definitions.data(), definitions.size(), &channels_, &error_);
    }
    Channels(const ChannelsOptions& options, std::initializer_list<ChannelDefinition> definitions) noexcept
        : Channels(options, std::span<const ChannelDefinition>(definitions.begin(), definitions.size())) {}
    ~Channels() { VelaReportingChannelsDestroy(channels_); }
    Channels(Channels&& other) noexcept
        : channels_(std::exchange(other.channels_, nullptr)),
          status_(other.status_),
          error_(other.error_) {}
    Channels& operator=(Channels&& other) noexcept {
        std::swap(channels_, other.channels_);
        std::swap(status_, other.status_);
        std::swap(error_, other.error_);
        return *this;
    }

    /// Whether they are published. Where they are not, every channel is null.
    explicit operator bool() const noexcept { return channels_ != nullptr; }
    VelaReportingStatus status() const noexcept { return status_; }
    /// Why they are not, for a person.
    const char* errorText() const noexcept { return &error_.text[0]; }

    /// The channel of that definition; null where there is none.
    VelaReportingChannel* operator[](std::size_t index) const noexcept {
        return VelaReportingChannelsGet(channels_, index);
    }

private:
    VelaReportingChannels* channels_ = nullptr;
    VelaReportingStatus status_ = VelaReportingStatusOk;
    VelaReportingError error_{};
};

} // namespace vela::reporting
