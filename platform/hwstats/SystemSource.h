// A source of channels in the system's own files. Each instance feeds one group and may remember what it saw. Confined
// to its owner's lock.
#pragma once

#include "platform/hwstats/HwStatsGroups.h"
#include "platform/hwstats/Samples.h"
#include "platform/hwstats/SystemReading.h"

#include <memory>

namespace vela::platform::hwstats {

class SystemSource {
public:
    explicit SystemSource(HwStatsGroupName group) : group_(std::move(group)) {}
    virtual ~SystemSource() = default;

    /// Adds the source's blocks, as they are at `samples.time`.
    virtual void sample(SystemReading& system, Samples& samples) = 0;

protected:
    void add(BlockBuilder&& block, Samples& samples) const {
        if (!block.empty()) {
            samples.blocks.push_back(std::move(block).build(group_.group, group_.subGroup));
        }
    }

private:
    const HwStatsGroupName group_;
};

/// The source of a kind other than channel files.
std::unique_ptr<SystemSource> makeSystemSource(HwStatsSource kind, const HwStatsGroupName& group);

} // namespace vela::platform::hwstats
