// The back ends of a build without the embedded store: nothing takes deliveries.
#include "app/DeliveryBackends.h"
#include "platform/absent/AbsentFacilities.h"

namespace vela {

namespace {

class AbsentDeliveryBackends final : public DeliveryBackends {
public:
    platform::Beacon& beacon() override { return beacon_; }
    platform::Tally& tally() override { return tally_; }
    platform::Joule& joule() override { return joule_; }
    platform::Telem& telem() override { return telem_; }
    platform::Malady& malady() override { return malady_; }
    void setInspection(const platform::ServiceInspection&) override {}
    bool isBehind() const override { return false; }
    void close() override {}

private:
    platform::AbsentBeacon beacon_;
    platform::AbsentTally tally_;
    platform::AbsentJoule joule_;
    platform::AbsentTelem telem_;
    platform::AbsentMalady malady_;
};

} // namespace

platform::Result<std::unique_ptr<DeliveryBackends>> makeDeliveryBackends(const DeliveryBackendsParts&) {
    return std::unique_ptr<DeliveryBackends>(std::make_unique<AbsentDeliveryBackends>());
}

} // namespace vela
