#include "reporters/pipewire/ReportDelivery.h"

#include "common/VelaReportingVocabulary.h"

#include <algorithm>
#include <chrono>

namespace vela::reporter {

namespace {

/// A service that does not answer in that time is asked again.
constexpr std::chrono::seconds kPatience{5};

bool isStart(const Report& report) { return report.type == AudioEventTypeStart; }

} // namespace

bool ReportDelivery::perform(const Call& call) {
    return std::visit([this](const auto& one) { return perform(one); }, call);
}

ReportDelivery::Session* ReportDelivery::findSession(std::int64_t reporterID) {
    const auto found = sessions_.find(reporterID);
    return found == sessions_.end() ? nullptr : &found->second;
}

/// The one call that is made without a service too: with a session to bring, the client looks for one.
bool ReportDelivery::perform(const CreateCall& call) {
    if (!service_.createSession(call.session)) {
        return false;
    }
    sessions_[call.session.reporterID].description = call.session;
    return true;
}

bool ReportDelivery::perform(const StartCall& call) {
    Session* const session = findSession(call.reporterID);
    if (session == nullptr) {
        return true;
    }
    const std::uint64_t connection = service_.connections();
    if (!service_.isConnected() || !service_.startSession(call.reporterID)) {
        return false;
    }
    session->isStarted = true;
    session->connection = connection;
    session->conditions.clear();
    return true;
}

bool ReportDelivery::perform(const SendCall& call) {
    Session* const session = findSession(call.reporterID);
    if (session == nullptr) {
        return true;
    }
    if (!service_.isConnected() || !repeatConditions(*session) || !service_.send(call.reporterID, call.report)) {
        return false;
    }
    if (session->isStarted && call.report.isCondition) {
        keep(*session, call.report);
    }
    return true;
}

bool ReportDelivery::perform(const StopCall& call) {
    Session* const session = findSession(call.reporterID);
    if (session == nullptr || !session->isStarted) {
        return true;
    }
    if (!service_.isConnected() || !prepareStop(*session)) {
        return false;
    }
    session->isToRepeat =
        !service_.stopSession(call.reporterID, kPatience) || service_.connections() != session->connection;
    if (session->isToRepeat) {
        return false;
    }
    session->isStarted = false;
    session->conditions.clear();
    return true;
}

bool ReportDelivery::perform(const DestroyCall& call) {
    if (sessions_.contains(call.reporterID) && !service_.destroySession(call.reporterID)) {
        return false;
    }
    sessions_.erase(call.reporterID);
    return true;
}

/// On its own connection a stop that was not answered is only late: the service handles it, and answers the next one
/// behind it. To tell the run again would deliver it twice.
bool ReportDelivery::prepareStop(Session& session) {
    if (!session.isToRepeat) {
        return repeatConditions(session);
    }
    return service_.connections() == session.connection || repeatRun(session);
}

/// To a service that was started since: it has the session, started, without what was said.
bool ReportDelivery::repeatConditions(Session& session) {
    const std::uint64_t connection = service_.connections();
    if (!session.isStarted || session.connection == connection) {
        return true;
    }
    for (const Report& report : session.conditions) {
        if (!service_.send(session.description.reporterID, report)) {
            return false;
        }
    }
    session.connection = connection;
    return true;
}

/// To a service that may or may not have the session, in whatever state. One that is started is stopped first, because
/// the service counts those that are.
bool ReportDelivery::repeatRun(Session& session) {
    const std::int64_t reporterID = session.description.reporterID;
    if (!service_.stopSession(reporterID, kPatience) || !service_.createSession(session.description) ||
        !service_.startSession(reporterID)) {
        return false;
    }
    session.connection = 0; // so that the conditions are told
    return repeatConditions(session);
}

void ReportDelivery::keep(Session& session, const Report& report) {
    session.conditions.push_back(report);
    if (session.conditions.size() > kMostConditions) {
        // Without the oldest, a stretch counts as one with the next; without the start there would be none.
        session.conditions.erase(std::ranges::find_if_not(session.conditions, isStart));
    }
}

} // namespace vela::reporter
