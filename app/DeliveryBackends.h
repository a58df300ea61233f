// The telemetry back ends that the service delivers to, as this build has them.
#pragma once

#include "common/DeliveryLedger.h"
#include "common/Settings.h"
#include "platform/Beacon.h"
#include "platform/Clock.h"
#include "platform/Ipc.h"
#include "platform/Joule.h"
#include "platform/Malady.h"
#include "platform/Result.h"
#include "platform/Tally.h"
#include "platform/Telem.h"

#include <functional>
#include <memory>
#include <string>
#include <vector>

namespace vela {

/// Thread-safe.
class DeliveryBackends {
public:
    virtual ~DeliveryBackends() = default;

    virtual platform::Beacon& beacon() = 0;
    virtual platform::Tally& tally() = 0;
    virtual platform::Joule& joule() = 0;
    virtual platform::Telem& telem() = 0;
    virtual platform::Malady& malady() = 0;

    /// What snapshots tell of the service's sessions; none before. `inspection` outlives this.
    virtual void setInspection(const platform::ServiceInspection& inspection) = 0;

    /// Whether deliveries come faster than they are stored, and hardly find room any more.
    virtual bool isBehind() const = 0;

    /// Makes durable what was delivered so far, and takes nothing more. Blocks until it is done.
    virtual void close() = 0;
};

struct DeliveryBackendsParts {
    const Settings& settings;
    DeliveryLedger& ledger;
    const platform::Clock& clock;
    std::function<std::vector<std::string>()> recentLog; ///< the log's last lines, for snapshots
};

/// The embedded store where this build has it, else nothing that takes deliveries. Everything in `parts` outlives the
/// result. Fails where there is a store that cannot be opened.
platform::Result<std::unique_ptr<DeliveryBackends>> makeDeliveryBackends(const DeliveryBackendsParts& parts);

} // namespace vela
