// What the service tells of its sessions to whoever asks from outside, while it works on.
#include "common/values/Utf8.h"
#include "service/VelaReportingClientServerInstance.h"
#include "service/VelaReportingServiceDelegate.h"

namespace vela {

namespace {

/// A client's application name is its own to choose; longer ones are cut, so that an answer stays of a size.
constexpr std::size_t kLongestApplication = 256;

Value applicationOf(const Dictionary& configuration) {
    const ValueRef name = configuration.find(VelaReportingApplicationName);
    if (!name.isString() && !name.isNumber()) {
        return {};
    }
    if (!name.isString() || name.text().size() <= kLongestApplication) {
        return Value(name);
    }
    std::size_t length = 0;
    while (length + utf8Step(name.text().substr(length)).bytes <= kLongestApplication) {
        length += utf8Step(name.text().substr(length)).bytes;
    }
    return Value(std::string_view(std::string(name.text().substr(0, length)) + "..."));
}

Dictionary inspectionOf(VelaReportingSession& session, std::int32_t owner,
                        const std::optional<std::string>& processName) {
    DictionaryBuilder inspection;
    inspection.add("reporterID", session.reporterID());
    inspection.add("serviceType", session.serviceType());
    inspection.add("serviceName", session.serviceName());
    inspection.add("owner", owner);
    if (processName) {
        inspection.add("process", std::string_view(*processName));
    }
    if (Value application = applicationOf(session.configuration())) {
        inspection.add("application", std::move(application));
    }
    inspection.add("started", session.started());
    inspection.add("beaconReportingEnabled", session.beaconReportingEnabled());
    inspection.add("messages", session.nestedAggregatedPayloadData().messageCount());
    return inspection.build();
}

} // namespace

Array VelaReportingServiceDelegate::sessions() const {
    ArrayBuilder inspections;
    for (const auto& client : clients()) {
        const std::optional<std::string> processName = client->clientProcessName();
        for (const auto& session : client->clientReportingSessions()) {
            inspections.add(inspectionOf(*session, client->processIdentifier(), processName));
        }
    }
    return inspections.build();
}

Dictionary VelaReportingServiceDelegate::ledger() const {
    const DeliveryLedger* counts = context_->sessionPlatform.ledger;
    return counts == nullptr ? Dictionary() : counts->asDictionary();
}

} // namespace vela
