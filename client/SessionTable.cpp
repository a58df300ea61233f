#include "client/SessionTable.h"

#include "client/Operations.h"
#include "platform/dbus/MessageReader.h"
#include "platform/dbus/MessageWriter.h"
#include "platform/dbus/Protocol.h"

#include <algorithm>
#include <string_view>
#include <vector>

namespace vela::client {

namespace {

namespace dbus = platform::dbus;

/// Appends one call that nobody waits for; `arguments` writes its body.
template <class Arguments>
void call(std::string& output, std::uint32_t serial, Operation operation, const Arguments& arguments) {
    const OperationForm& form = formOf(operation);
    dbus::MessageWriter writer(output);
    writer.beginCall({.serial = serial,
                      .path = dbus::kObjectPath,
                      .interface = dbus::kReportingInterface,
                      .member = form.member,
                      .destination = {},
                      .signature = form.arguments,
                      .replyExpected = false});
    arguments(writer);
    // Within the limits: what came in was smaller than the table's own.
    [[maybe_unused]] const bool fits = writer.finish();
    assert(fits);
}

} // namespace

bool SessionTable::apply(const CallRecord& record) {
    const auto operation = static_cast<Operation>(record.operation);
    if (operation == Operation::CreateReportingSession) {
        return create(record.reporterID);
    }
    const auto found = sessions_.find(record.reporterID);
    if (found == sessions_.end()) {
        return true;
    }
    Session& session = found->second;
    switch (operation) {
    case Operation::SetServiceType:
        session.serviceType = record.serviceType;
        return true;
    case Operation::SetConfiguration:
        return configure(session, record);
    case Operation::StartReportingSessionForID:
        session.started = true;
        return true;
    case Operation::StopReportingSessionForID:
        session.started = false;
        return true;
    case Operation::DestroyReportingSession:
        // The service answers a stop, a start or an end of ID 0 without doing anything.
        if (record.reporterID != 0) {
            sessions_.erase(found);
        }
        return true;
    default:
        return true;
    }
}

bool SessionTable::create(std::int64_t reporterID) {
    const auto found = sessions_.find(reporterID);
    if (found == sessions_.end() && sessions_.size() >= kMostSessions) {
        return false;
    }
    Session& session = sessions_[reporterID];
    session = {};
    session.creation = ++creations_;
    return true;
}

bool SessionTable::configure(Session& session, const CallRecord& record) {
    if (session.configurationBytes + record.bodyBytes > kMostConfigurationBytes) {
        // Much of it may have been replaced since: count what is there.
        session.configurationBytes = dbus::MessageWriter::bytesOf(session.configuration);
        if (session.configurationBytes + record.bodyBytes > kMostConfigurationBytes) {
            return false;
        }
    }
    dbus::MessageHeader header;
    header.body = std::string_view(reinterpret_cast<const char*>(record.body()), record.bodyBytes);
    dbus::BodyReader body(header);
    const Dictionary added = body.dictionary();
    assert(!body.error());
    session.configuration = session.configuration.merging(added);
    session.configurationBytes += record.bodyBytes;
    return true;
}

void SessionTable::replay(std::string& output, std::uint32_t& serial) const {
    std::vector<std::pair<std::int64_t, const Session*>> ordered;
    ordered.reserve(sessions_.size());
    for (const auto& [reporterID, session] : sessions_) {
        ordered.emplace_back(reporterID, &session);
    }
    std::sort(ordered.begin(), ordered.end(),
              [](const auto& left, const auto& right) { return left.second->creation < right.second->creation; });
    for (const auto& entry : ordered) {
        const std::int64_t reporterID = entry.first;
        const Session& session = *entry.second;
        const auto about = [reporterID](dbus::MessageWriter& writer) { writer.int64(reporterID); };
        call(output, serial++, Operation::CreateReportingSession, about);
        if (session.serviceType) {
            call(output, serial++, Operation::SetServiceType, [&](dbus::MessageWriter& writer) {
                writer.uint16(*session.serviceType);
                writer.int64(reporterID);
            });
        }
        if (!session.configuration.empty()) {
            call(output, serial++, Operation::SetConfiguration, [&](dbus::MessageWriter& writer) {
                writer.dictionary(session.configuration);
                writer.int64(reporterID);
            });
        }
        if (session.started) {
            call(output, serial++, Operation::StartReportingSessionForID, about);
        }
    }
}

} // namespace vela::client
