#include "reporters/pipewire/CallAdmission.h"

#include <variant>

namespace vela::reporter {

bool CallAdmission::admits(const Call& call, std::size_t waiting) {
    return std::visit([&](const auto& one) { return admits(one, waiting >= mostCalls_); }, call);
}

bool CallAdmission::admits(const CreateCall& call, bool isFull) {
    if (isFull) {
        missing_[call.session.reporterID] = Missing::Session;
    } else {
        missing_.erase(call.session.reporterID);
    }
    return !isFull;
}

bool CallAdmission::admits(const StartCall& call, bool isFull) {
    if (isFull) {
        missing_.emplace(call.reporterID, Missing::Run); // or the session is missing already
    }
    return !missing_.contains(call.reporterID);
}

bool CallAdmission::admits(const SendCall& call, bool isFull) { return !isFull && !missing_.contains(call.reporterID); }

bool CallAdmission::admits(const StopCall& call, bool /*isFull*/) {
    const auto found = missing_.find(call.reporterID);
    if (found == missing_.end()) {
        return true;
    }
    if (found->second == Missing::Run) {
        missing_.erase(found);
    }
    return false;
}

bool CallAdmission::admits(const DestroyCall& call, bool /*isFull*/) {
    const auto found = missing_.find(call.reporterID);
    const bool isSessionMissing = found != missing_.end() && found->second == Missing::Session;
    missing_.erase(call.reporterID);
    return !isSessionMissing;
}

} // namespace vela::reporter
