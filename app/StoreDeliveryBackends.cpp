// The embedded store as every back end.
#include "app/DeliveryBackends.h"
#include "platform/linux/LinuxFileSystem.h"
#include "platform/sqlite/DeliveryStore.h"
#include "platform/sqlite/StoreBeacon.h"
#include "platform/sqlite/StoreJoule.h"
#include "platform/sqlite/StoreMalady.h"
#include "platform/sqlite/StoreTally.h"
#include "platform/sqlite/StoreTelem.h"

#include <algorithm>
#include <atomic>

namespace vela {

namespace {

class StoreDeliveryBackends final : public DeliveryBackends {
public:
    StoreDeliveryBackends(std::unique_ptr<platform::DeliveryStore> store, const DeliveryBackendsParts& parts)
        : store_(std::move(store)),
          beacon_(*store_, parts.settings.beacon.backends),
          tally_(*store_, parts.settings.tally.used),
          joule_(*store_),
          telem_(*store_),
          malady_(*store_, fileSystem_,
                  {parts.settings.paths.state + "/snapshots", [this] { return sessions(); }, parts.recentLog}) {}

    platform::Beacon& beacon() override { return beacon_; }
    platform::Tally& tally() override { return tally_; }
    platform::Joule& joule() override { return joule_; }
    platform::Telem& telem() override { return telem_; }
    platform::Malady& malady() override { return malady_; }
    void setInspection(const platform::ServiceInspection& inspection) override { inspection_ = &inspection; }
    bool isBehind() const override { return store_->isBehind(); }
    void close() override { store_->close(); }

private:
    Array sessions() const {
        const platform::ServiceInspection* inspection = inspection_;
        return inspection == nullptr ? Array() : inspection->sessions();
    }

    platform::LinuxFileSystem fileSystem_;
    std::atomic<const platform::ServiceInspection*> inspection_ = nullptr;
    const std::unique_ptr<platform::DeliveryStore> store_;
    platform::StoreBeacon beacon_;
    platform::StoreTally tally_;
    platform::StoreJoule joule_;
    platform::StoreTelem telem_;
    platform::StoreMalady malady_;
};

} // namespace

platform::Result<std::unique_ptr<DeliveryBackends>> makeDeliveryBackends(const DeliveryBackendsParts& parts) {
    const Settings::Store& settings = parts.settings.store;
    platform::DeliveryStore::Options options;
    options.file.path = settings.path;
    options.file.maxBytes = settings.maxBytes;
    options.commitMessages = settings.commitMessages;
    options.commitDelay = settings.commitDelay;
    auto store = platform::DeliveryStore::open(options, parts.ledger, parts.clock);
    if (!store) {
        return store.failure();
    }
    return std::unique_ptr<DeliveryBackends>(std::make_unique<StoreDeliveryBackends>(*std::move(store), parts));
}

} // namespace vela
