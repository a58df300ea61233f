// Brings calls to the service so that no end of a session is lost when the service ends and is started anew. A run
// (from the start of a session to its stop) is done when the service has answered the stop; until then its conditions
// are kept, and told again to a service that does not know them. They bear the times at which they came about, so that
// play times do not depend on when they are told. Queue-confined: one thread.
#pragma once

#include "reporters/pipewire/Reports.h"
#include "reporters/pipewire/ServiceCalls.h"

#include <cstddef>
#include <cstdint>
#include <deque>
#include <map>
#include <variant>

namespace vela::reporter {

struct CreateCall {
    SessionDescription session;
};
struct StartCall {
    std::int64_t reporterID = 0;
};
struct SendCall {
    std::int64_t reporterID = 0;
    Report report;
};
struct StopCall {
    std::int64_t reporterID = 0;
};
struct DestroyCall {
    std::int64_t reporterID = 0;
};
using Call = std::variant<CreateCall, StartCall, SendCall, StopCall, DestroyCall>;

class ReportDelivery {
public:
    /// `service` outlives this object.
    explicit ReportDelivery(ServiceCalls& service) : service_(service) {}

    /// Whether the call is done. If not, it is to be made again later, before any other.
    bool perform(const Call& call);

    /// Conditions of one run that are kept.
    static constexpr std::size_t kMostConditions = 512;

private:
    struct Session {
        SessionDescription description;
        bool isStarted = false;
        bool isToRepeat = false;         ///< whether its stop was not answered: to another service all is told again
        std::uint64_t connection = 0;    ///< that the run was told on
        std::deque<Report> conditions{}; ///< of the run
    };

    bool perform(const CreateCall& call);
    bool perform(const StartCall& call);
    bool perform(const SendCall& call);
    bool perform(const StopCall& call);
    bool perform(const DestroyCall& call);
    Session* findSession(std::int64_t reporterID);
    bool prepareStop(Session& session);
    bool repeatConditions(Session& session);
    bool repeatRun(Session& session);
    static void keep(Session& session, const Report& report);

    ServiceCalls& service_;
    std::map<std::int64_t, Session> sessions_;
};

} // namespace vela::reporter
