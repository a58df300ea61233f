#include "reporters/pipewire/StreamSession.h"

#include "common/VelaReportingVocabulary.h"
#include "reporters/pipewire/StreamRules.h"

#include <algorithm>
#include <utility>

namespace vela::reporter {

namespace {

using std::chrono::nanoseconds;

constexpr std::chrono::seconds kBurstWindow{1};
constexpr std::chrono::seconds kBurstPause{10};

std::int64_t milliseconds(nanoseconds time) {
    return std::chrono::duration_cast<std::chrono::milliseconds>(time).count();
}

std::string textOf(const Key& key) { return std::string(key.text()); }

double seconds(nanoseconds time) { return std::chrono::duration<double>(time).count(); }

std::string namesOf(const std::vector<DeviceFacts>& devices) {
    std::vector<std::string> names;
    names.reserve(devices.size());
    for (const DeviceFacts& device : devices) {
        names.push_back(device.name);
    }
    return listText(names);
}

const DeviceFacts* findDevice(const std::vector<DeviceFacts>& devices, const std::string& name) {
    const auto found = std::ranges::find(devices, name, &DeviceFacts::name);
    return found == devices.end() ? nullptr : &*found;
}

} // namespace

StreamSession::StreamSession(SessionPlan plan, ReportSink& reports, StatisticsSink& statistics, const Moment& now)
    : plan_(std::move(plan)),
      reports_(reports),
      statistics_(statistics),
      created_(now) {
    reports_.createSession(plan_.description);
}

void StreamSession::setState(NodeState state, const std::string& error, const Moment& now) {
    if (phase_ == Phase::Gone || isRemoved_ || state == state_) {
        return;
    }
    state_ = state;
    if (state == NodeState::Error) {
        tellError(now, error.empty() ? "the node failed" : error);
    }
    if (state == NodeState::Running) {
        comeUp(now);
    } else {
        goDown(now);
    }
    watchStall(now);
}

void StreamSession::comeUp(const Moment& now) {
    if (phase_ == Phase::Gap) {
        if (now.monotonic - gapStart_.monotonic <= kStopDelay) {
            resume(now);
            return;
        }
        endRun(gapStart_, "paused"); // the timer comes late on a loaded machine
    }
    if (phase_ == Phase::Ending) {
        finishRun();
    }
    if (phase_ == Phase::Waiting) {
        phase_ = Phase::Starting;
        runStart_ = now;
        totals_ = {};
        incomplete_.clear();
        startWhenKnown(now);
    }
}

void StreamSession::goDown(const Moment& now) {
    if (phase_ == Phase::Starting) {
        startRun();
    }
    if (phase_ == Phase::Running) {
        phase_ = Phase::Gap;
        gapStart_ = now;
        if (moved_ && now.monotonic - *moved_ > kMoveDelay) {
            moved_.reset();
        }
    }
}

void StreamSession::resume(const Moment& now) {
    phase_ = Phase::Running;
    gap_ = now.monotonic - gapStart_.monotonic;
    tellVolume(now);
    tellFormat(now);
    unsettled_ = now; // what caused the silence may become known later than its end
}

void StreamSession::startWhenKnown(const Moment& now) {
    const bool known = now_.volume && now_.format && !now_.devices.empty();
    if (phase_ == Phase::Starting && (known || now.monotonic - runStart_.monotonic >= kStartDelay)) {
        startRun();
    }
}

void StreamSession::startRun() {
    phase_ = Phase::Running;
    ++runs_;
    told_ = {};
    gap_.reset();
    moved_.reset();
    unsettled_.reset();
    if (runs_ == 1) {
        statistics_.transition(Transition::Start, milliseconds(runStart_.monotonic - created_.monotonic));
    }
    reports_.startSession(plan_.description.reporterID);
    tellEverything(runStart_);
    std::vector<ReportField> fields{{"start_count", runs_}, {"direction", plan_.isCapture ? "capture" : "playback"}};
    if (plan_.isCapture) {
        fields.push_back({"session_input_running", true});
    } else {
        fields.push_back({textOf(VelaReportingMessageKeySessionOutputRunning), true});
        fields.push_back({textOf(VelaReportingMessageKeySpatializationEnabled), false});
    }
    report(runStart_, plan_.isCapture ? AudioEventCategoryRecord : AudioEventCategoryPlayback, AudioEventTypeStart,
           std::move(fields));
}

void StreamSession::endRun(const Moment& end, std::string_view reason) {
    runEnd_ = end;
    phase_ = Phase::Ending;
    unsettled_.reset();
    std::vector<ReportField> fields{
        {textOf(VelaReportingMessageKeySessionOutputRunning), false},
        {textOf(VelaReportingMessageKeySessionDuration), seconds(end.monotonic - runStart_.monotonic)},
        {"stop_count", runs_},
        {"reason", std::string(reason)}};
    if (plan_.isCapture) {
        fields.push_back({"session_input_running", false});
    }
    report(end, plan_.isCapture ? AudioEventCategoryRecord : AudioEventCategoryPlayback, AudioEventTypeStop,
           std::move(fields));
    if (!plan_.hasStatistics) {
        finishRun();
    }
}

void StreamSession::finishRun() {
    if (totals_.cycles() > 0) {
        report(runEnd_, AudioEventCategoryPerformance, AudioEventTypeSummary, totals_.summary());
        if (std::vector<ReportField> histograms = totals_.histograms(); !histograms.empty()) {
            report(runEnd_, AudioEventCategoryPerformance, AudioEventTypeHistogram, std::move(histograms));
        }
    }
    reports_.stopSession(plan_.description.reporterID);
    phase_ = Phase::Waiting;
    if (isRemoved_) {
        destroy();
    }
}

void StreamSession::destroy() {
    reports_.destroySession(plan_.description.reporterID);
    phase_ = Phase::Gone;
}

void StreamSession::remove(const Moment& now) {
    if (phase_ == Phase::Gone || isRemoved_) {
        return;
    }
    isRemoved_ = true;
    stalled_.reset();
    if (phase_ == Phase::Starting) {
        startRun();
    }
    if (phase_ == Phase::Running || phase_ == Phase::Gap) {
        endRun(phase_ == Phase::Gap ? gapStart_ : now, "ended");
    } else if (phase_ == Phase::Waiting) {
        destroy();
    }
}

void StreamSession::lose(const Moment& now) {
    remove(now);
    if (phase_ == Phase::Ending) {
        finishRun();
    }
}

void StreamSession::setVolume(const Volume& volume, const Moment& now) {
    if (now_.volume == volume) {
        return;
    }
    now_.volume = volume;
    startWhenKnown(now);
    if (phase_ == Phase::Running) {
        if (unsettled_) {
            tellDevices(*unsettled_); // happened first
        }
        tellVolume(now);
    }
}

void StreamSession::setFormat(const Format& format, const Moment& now) {
    if (now_.format == format) {
        return;
    }
    now_.format = format;
    startWhenKnown(now);
    if (phase_ == Phase::Running) {
        if (unsettled_) {
            tellDevices(*unsettled_);
        }
        tellFormat(now);
    }
}

void StreamSession::setDevices(std::vector<DeviceFacts> devices, const Moment& now) {
    if (now_.devices == devices) {
        return;
    }
    now_.devices = std::move(devices);
    startWhenKnown(now);
    watchStall(now);
    if (phase_ == Phase::Running && !unsettled_) {
        unsettled_ = now;
    }
}

void StreamSession::tellVolume(const Moment& at) {
    if (!now_.volume || now_.volume == told_.volume) {
        return;
    }
    const Volume& volume = *now_.volume;
    const bool isSame =
        told_.volume && userVolume(*told_.volume) == userVolume(volume) && told_.volume->muted == volume.muted;
    told_.volume = volume;
    if (!isSame) {
        report(at, AudioEventCategoryVolume, AudioEventTypeState,
               {{textOf(VelaReportingMessageKeyVolume), userVolume(volume)}, {"muted", volume.muted}});
    }
}

void StreamSession::tellFormat(const Moment& at) {
    if (!now_.format || now_.format == told_.format) {
        return;
    }
    told_.format = now_.format;
    report(at, AudioEventCategorySetup, AudioEventTypeState,
           {{textOf(VelaReportingMessageKeySelectedFormat), formatText(*now_.format)},
            {textOf(VelaReportingMessageKeyChannelsPerFrame), std::int64_t{now_.format->channels}},
            {"sample_rate", std::int64_t{now_.format->rate}}});
}

void StreamSession::tellDevices(const Moment& at) {
    unsettled_.reset();
    if (now_.devices.empty()) {
        return; // on its way from one device to another
    }
    noteTransition(at);
    const std::string names = namesOf(now_.devices);
    if (names != namesOf(told_.devices)) {
        report(at, AudioEventCategoryRouteChange, AudioEventTypeState,
               {{textOf(VelaReportingMessageKeyActiveDevices), names},
                {"device_count", static_cast<std::int64_t>(now_.devices.size())}});
    }
    for (const DeviceFacts& device : now_.devices) {
        const DeviceFacts* const before = findDevice(told_.devices, device.name);
        if (before != nullptr && *before == device) {
            continue;
        }
        std::vector<ReportField> fields{{"device", device.name}, {"device_state", textOf(device.state)}};
        if (device.format) {
            fields.push_back({"device_format", formatText(*device.format)});
        }
        if (device.volume) {
            fields.push_back({"device_volume", userVolume(*device.volume)});
            fields.push_back({"device_muted", device.volume->muted});
        }
        report(at, plan_.isCapture ? AudioEventCategoryInput : AudioEventCategoryOutput, AudioEventTypeState,
               std::move(fields));
    }
    told_.devices = now_.devices;
}

/// What the last silence was about shows in how the devices differ across it. A move may also have been told before:
/// where the stream's process is slow to answer, its silence begins later.
void StreamSession::noteTransition(const Moment& at) {
    const std::optional<nanoseconds> gap = std::exchange(gap_, std::nullopt);
    if (told_.devices.empty()) {
        return;
    }
    if (namesOf(now_.devices) != namesOf(told_.devices)) {
        moved_ = at.monotonic;
    }
    if (!gap) {
        return;
    }
    if (std::exchange(moved_, std::nullopt)) {
        statistics_.transition(Transition::Move, milliseconds(*gap));
        return;
    }
    const bool otherFormat = std::ranges::any_of(now_.devices, [&](const DeviceFacts& device) {
        const DeviceFacts* const before = findDevice(told_.devices, device.name);
        // A format that was not known is no other one.
        return before != nullptr && before->format && device.format && before->format != device.format;
    });
    if (otherFormat) {
        statistics_.transition(Transition::RateChange, milliseconds(*gap));
    }
}

void StreamSession::tellEverything(const Moment& at) {
    tellFormat(at);
    tellDevices(at);
    tellVolume(at);
}

void StreamSession::watchStall(const Moment& now) {
    const bool stalls = !plan_.isDevice && !now_.devices.empty() && !isRemoved_ && state_ != NodeState::Running &&
                        state_ != NodeState::Idle && state_ != NodeState::Error;
    if (!stalls) {
        stalled_.reset();
        isStallTold_ = false;
    } else if (!stalled_) {
        stalled_ = now.monotonic;
    }
}

void StreamSession::tellError(const Moment& at, const std::string& what) {
    report(at, AudioEventCategoryError, AudioEventTypeError, {{"error", what}, {"where", deviceNames()}});
}

bool StreamSession::covers(nanoseconds time) const {
    const bool hasRun = phase_ != Phase::Waiting && phase_ != Phase::Gone;
    return hasRun && time >= runStart_.monotonic && (phase_ != Phase::Ending || time <= runEnd_.monotonic);
}

void StreamSession::addCycle(nanoseconds signal, const std::optional<StatisticsSink::CycleTimes>& times) {
    if (!covers(signal)) {
        return;
    }
    totals_.add(times);
    if (!times) {
        noteIncomplete(signal);
    }
}

void StreamSession::noteIncomplete(nanoseconds signal) {
    incomplete_.push_back(signal);
    if (incomplete_.size() > kIncompleteBurst) {
        incomplete_.pop_front();
    }
    const bool isBurst = incomplete_.size() == kIncompleteBurst && signal - incomplete_.front() <= kBurstWindow;
    if (isBurst && (!burstTold_ || signal - *burstTold_ > kBurstPause)) {
        burstTold_ = signal;
        tellError(momentAt(signal), std::to_string(kIncompleteBurst) + " incomplete cycles within a second");
    }
}

void StreamSession::statisticsReach(nanoseconds time) {
    if (phase_ == Phase::Ending && time > runEnd_.monotonic) {
        finishRun();
    }
}

std::optional<nanoseconds> StreamSession::deadline() const {
    std::optional<nanoseconds> first;
    const auto consider = [&first](nanoseconds time) { first = first ? std::min(*first, time) : time; };
    if (phase_ == Phase::Starting) {
        consider(runStart_.monotonic + kStartDelay);
    } else if (phase_ == Phase::Gap) {
        consider(gapStart_.monotonic + kStopDelay + nanoseconds(1));
    } else if (phase_ == Phase::Ending) {
        consider(runEnd_.monotonic + kStatisticsDelay);
    } else if (phase_ == Phase::Running && unsettled_) {
        consider(unsettled_->monotonic + kSettleDelay);
    }
    if (stalled_ && !isStallTold_ && phase_ != Phase::Gone) {
        consider(*stalled_ + kStallDelay + nanoseconds(1));
    }
    return first;
}

void StreamSession::onTime(const Moment& now) {
    startWhenKnown(now);
    if (phase_ == Phase::Running && unsettled_ && now.monotonic - unsettled_->monotonic >= kSettleDelay) {
        tellDevices(*unsettled_);
    }
    if (phase_ == Phase::Gap && now.monotonic - gapStart_.monotonic > kStopDelay) {
        endRun(gapStart_, "paused");
    }
    if (phase_ == Phase::Ending && now.monotonic - runEnd_.monotonic >= kStatisticsDelay) {
        finishRun();
    }
    if (stalled_ && !isStallTold_ && now.monotonic - *stalled_ > kStallDelay) {
        isStallTold_ = true;
        tellError(now, "linked and not running for more than a second");
    }
}

void StreamSession::report(const Moment& at, std::uint32_t category, std::uint16_t type,
                           std::vector<ReportField> fields) {
    const bool isCondition = category != AudioEventCategoryError && category != AudioEventCategoryPerformance;
    reports_.send(plan_.description.reporterID,
                  {momentAt(at.monotonic).epoch, category, type, isCondition, std::move(fields)});
}

/// Within a run, by the length since its start, so that a clock that is set does not change play times.
Moment StreamSession::momentAt(nanoseconds monotonic) const {
    const Moment& anchor = runs_ > 0 ? runStart_ : created_;
    return {monotonic, anchor.epoch + seconds(monotonic - anchor.monotonic)};
}

std::string StreamSession::deviceNames() const { return namesOf(now_.devices); }

} // namespace vela::reporter
