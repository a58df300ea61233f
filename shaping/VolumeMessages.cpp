#include "shaping/VolumeMessages.h"

#include "common/VelaReportingLogCategories.h"
#include "common/VelaReportingUtility.h"
#include "common/VelaReportingVocabulary.h"
#include "common/values/TextualForm.h"
#include "shaping/RapidMessages.h"

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <utility>

namespace vela {

namespace {

constexpr const char* kOperation = "createVolumeMessages:process:minimumPlaytime:";

/// Seconds between two changes of spatial settings that are one.
constexpr double kMaximumPause = 2.0;

NamedLogCategory sessionLog() { return VelaReportingSessionCategory().as("VelaReportingSession"); }

/// What is remembered of the messages so far. Other keys are neither compared nor reported.
enum Condition : std::uint8_t {
    OutputRunning,
    SelectedFormat,
    ActiveDevices,
    Volume,
    AccessoryFeature,
    Spatialization,
    RingerState,
    Channels,
};

constexpr std::array kConditionKeys = {
    &VelaReportingMessageKeySessionOutputRunning,
    &VelaReportingMessageKeySelectedFormat,
    &VelaReportingMessageKeyActiveDevices,
    &VelaReportingMessageKeyVolume,
    &VelaReportingMessageKeySpatialAudioAccessoryFeature,
    &VelaReportingMessageKeySpatializationEnabled,
    &VelaReportingMessageKeyRingerState,
    &VelaReportingMessageKeyChannelsPerFrame,
};

/// In the order of `Condition`; none where a message does not say.
using MessageConditions = std::array<ValueRef, kConditionKeys.size()>;
using RememberedConditions = std::array<Value, kConditionKeys.size()>;

MessageConditions conditionsOf(const Dictionary& message) {
    MessageConditions conditions;
    std::transform(kConditionKeys.begin(), kConditionKeys.end(), conditions.begin(),
                   [&message](const Key* key) { return message.find(*key); });
    return conditions;
}

bool sameText(ValueRef left, ValueRef right) {
    if (left.isString() && right.isString()) {
        return left.text() == right.text();
    }
    return left.isSameObject(right) || textualForm(left) == textualForm(right);
}

bool sameNumber(ValueRef left, ValueRef right) {
    const Value zero = 0;
    return left == right || numericallyEqual(left.isNumber() ? left : zero, right.isNumber() ? right : zero);
}

bool sameVolume(ValueRef left, ValueRef right) {
    const bool areNumbers = left.kind() != ValueKind::Boolean && right.kind() != ValueKind::Boolean;
    return left == right || (areNumbers && numericallyEqual(left, right));
}

/// Whether one of the conditions that a message tells ends a stretch.
bool differ(const MessageConditions& told, const RememberedConditions& remembered) {
    const auto differs = [&](Condition condition, bool (*same)(ValueRef, ValueRef)) {
        return told[condition] && remembered[condition] && !same(told[condition], remembered[condition]);
    };
    return differs(SelectedFormat, sameText) || differs(ActiveDevices, sameText) ||
           differs(Spatialization, sameNumber) || differs(RingerState, sameNumber) || differs(Volume, sameVolume);
}

Value bucket(double number, std::span<const double> buckets, std::uint32_t fractionDigits) {
    return std::string_view(VelaReportingUtilityBucketNumberToString(number, buckets, fractionDigits).value_or(""));
}

/// One walk over a session's messages. Confined to one call.
class Walk {
public:
    Walk(const Value& process, double minimumPlaytime) : process_(process), minimumPlaytime_(minimumPlaytime) {
        remembered_[SelectedFormat] = "unknown";
        remembered_[ActiveDevices] = "unknown";
        remembered_[AccessoryFeature] = false;
        remembered_[Spatialization] = false;
        remembered_[RingerState] = false;
        remembered_[Channels] = -1;
    }

    void visit(const Dictionary& message) {
        const MessageConditions told = conditionsOf(message);
        const double time = message.find(VelaReportingMessageKeyVelaTimestamp).doubleValue();
        const bool wasRunning = remembered_[OutputRunning].ref().booleanValue();
        const bool sessionEnded = message.contains(VelaReportingMessageKeySessionDuration);
        bool changed = sessionEnded;
        if (told[OutputRunning]) {
            running_ = told[OutputRunning].booleanValue();
            if (running_ && !wasRunning) {
                start_ = time;
            }
            changed = changed || (wasRunning && !running_);
        } else {
            running_ = running_ && !sessionEnded;
        }
        changed = changed || (running_ && differ(told, remembered_));
        if (wasRunning && changed) {
            endStretch(time - start_);
            start_ = time;
        }
        if (!running_) {
            start_ = 0;
        }
        remember(told);
    }

    std::vector<Dictionary> finish() {
        for (Dictionary& message : output_) {
            message = message.setting(VelaReportingMessageKeyMessageCount, output_.size());
        }
        return std::move(output_);
    }

private:
    void endStretch(double seconds) {
        if (seconds <= minimumPlaytime_ || !process_ || !remembered_[Volume]) {
            sessionLog().debug("skipped volume message, too short { func=%s, action=skip, count=%lu }", kOperation,
                               output_.size());
            return;
        }
        output_.push_back(volumeMessage(seconds));
        sessionLog().debug("added volume message { func=%s, action=add, count=%lu }", kOperation, output_.size());
    }

    Dictionary volumeMessage(double seconds) const {
        DictionaryBuilder message;
        message.add(VelaReportingMessageKeySelectedFormat, remembered_[SelectedFormat]);
        message.add(VelaReportingMessageKeyActiveDevices, remembered_[ActiveDevices]);
        message.add(VelaReportingApplicationName, process_);
        message.add(VelaReportingMessageKeyVolume, remembered_[Volume]);
        message.add(VelaReportingMessageKeyVolumeBucketed, bucket(remembered_[Volume].ref().doubleValue(),
                                                                  VelaReportingUtilityBucketNumberToStringVolumes, 4));
        message.add(VelaReportingMessageKeyPlaySeconds, static_cast<float>(seconds));
        message.add(VelaReportingMessageKeySpatialAudioAccessoryFeature, remembered_[AccessoryFeature]);
        message.add(VelaReportingMessageKeySpatializationEnabled, remembered_[Spatialization]);
        message.add(VelaReportingMessageKeyRingerState, remembered_[RingerState]);
        message.add(VelaReportingMessageKeyChannelsPerFrame, remembered_[Channels]);
        message.add(VelaReportingMessageKeyPlaySecondsBucketed,
                    bucket(seconds, VelaReportingUtilityBucketNumberToStringTimes, 0));
        message.add(VelaReportingMessageKeyMessageIndex, output_.size() + 1);
        return message.build();
    }

    void remember(const MessageConditions& told) {
        for (std::size_t condition = 0; condition < told.size(); ++condition) {
            if (told[condition]) {
                remembered_[condition] = Value(told[condition]);
            }
        }
    }

    const Value& process_;
    const double minimumPlaytime_;
    RememberedConditions remembered_; ///< of all messages before the current one
    bool running_ = false;            ///< as the current message says; `remembered_` holds what the ones before it said
    double start_ = 0;                ///< of the stretch, in epoch seconds; 0 also where there is none
    std::vector<Dictionary> output_;
};

} // namespace

std::vector<Dictionary> createVolumeMessages(std::span<const StoredMessage> messages, const Value& process,
                                             double minimumPlaytime) {
    sessionLog().debug("entering createVolumeMessages %s", kOperation);
    const std::array spatialKeys = {VelaReportingMessageKeySpatialAudioAccessoryFeature,
                                    VelaReportingMessageKeySpatializationEnabled};
    Walk walk(process, minimumPlaytime);
    for (const Dictionary& message : combineRapidMessages(messages, spatialKeys, kMaximumPause)) {
        walk.visit(message);
    }
    std::vector<Dictionary> volumeMessages = walk.finish();
    sessionLog().debug("returning volume message { func=%s, action=return, count=%lu }", kOperation,
                       volumeMessages.size());
    return volumeMessages;
}

} // namespace vela
