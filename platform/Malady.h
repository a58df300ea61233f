// The diagnostic reporter: snapshots of the service's state when an issue was detected.
#pragma once

#include "common/values/Dictionary.h"
#include "platform/UniqueFunction.h"

#include <memory>
#include <optional>
#include <string>

namespace vela::platform {

/// What kind of issue a snapshot belongs to.
struct MaladySignature {
    std::string domain;
    std::string type;
    std::string subType;
    std::string subtypeContext;
    std::string detectedProcess;
    std::optional<std::string> triggerThresholdValues;
};

/// Thread-safe.
class MaladyReporter {
public:
    virtual ~MaladyReporter() = default;

    /// Takes a snapshot that lasts `seconds`, with an optional event and payload. `reply` is called at most once, on a
    /// thread of the reporter's choosing, with a dictionary that tells what came of it.
    virtual void requestSnapshot(const MaladySignature& signature, double seconds, std::optional<Dictionary> event,
                                 std::optional<Dictionary> payload, UniqueFunction<void(const Dictionary&)> reply) = 0;
};

/// Thread-safe.
class Malady {
public:
    virtual ~Malady() = default;

    virtual std::unique_ptr<MaladyReporter> createReporter() = 0;
};

} // namespace vela::platform
