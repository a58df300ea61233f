#include "cli/ServiceConnection.h"

#include "common/SettingValues.h"
#include "platform/dbus/Protocol.h"
#include "platform/host/HostFacts.h"

#include <cerrno>
#include <ostream>

namespace vela {

namespace dbus = platform::dbus;

namespace {

platform::Result<dbus::Reply> callInspection(dbus::BlockingConnection& connection, std::string_view member) {
    const std::uint32_t serial = connection.nextSerial();
    std::string bytes;
    dbus::MessageWriter writer(bytes);
    writer.beginCall({.serial = serial,
                      .path = dbus::kObjectPath,
                      .interface = dbus::kInspectionInterface,
                      .member = member,
                      .destination = dbus::kServiceName,
                      .signature = {},
                      .replyExpected = true});
    static_cast<void>(writer.finish()); // a call without arguments is never too large
    if (const auto sent = connection.send(bytes, kReplyPatience); !sent) {
        return sent.failure();
    }
    auto reply = connection.receive(serial, kReplyPatience);
    if (reply && reply->isError()) {
        return platform::Failure{0, std::string(reply->header.errorName) + ": " + reply->errorText()};
    }
    return reply;
}

/// Calls a member of the inspection interface and reads its answer of type `signature`.
template <class Answer, class Read>
platform::Result<Answer> inspect(dbus::BlockingConnection& connection, std::string_view member,
                                 std::string_view signature, Read read) {
    const auto reply = callInspection(connection, member);
    if (!reply) {
        return reply.failure();
    }
    dbus::BodyReader body(reply->header);
    if (reply->header.signature != signature) {
        return platform::Failure{0, std::string(member) + " answered something else than " + std::string(signature)};
    }
    Answer answer = read(body);
    if (body.error()) {
        return platform::Failure{0, std::string(member) + ": " + body.error()->text};
    }
    return answer;
}

} // namespace

std::optional<dbus::BlockingConnection> connectToService(Console& console) {
    constexpr std::chrono::seconds kConnectPatience{10};
    const auto addresses = dbus::serviceAddresses(platform::environmentText("VELA_REPORTING_ADDRESS"),
                                                  platform::environmentText("XDG_RUNTIME_DIR"));
    if (!addresses) {
        console.error << "velactl: VELA_REPORTING_ADDRESS: " << addresses.failure().description << '\n';
        return std::nullopt;
    }
    auto connection = dbus::BlockingConnection::open(*addresses, kConnectPatience);
    if (!connection) {
        console.error << "velactl: no service: " << escapedText(connection.failure().description) << '\n';
        return std::nullopt;
    }
    return *std::move(connection);
}

platform::Result<std::string> readVersion(dbus::BlockingConnection& connection) {
    return inspect<std::string>(connection, dbus::kGetVersion, "s",
                                [](dbus::BodyReader& body) { return std::string(body.string()); });
}

platform::Result<Array> readSessions(dbus::BlockingConnection& connection) {
    return inspect<Array>(connection, dbus::kGetSessions, "aa{sv}",
                          [](dbus::BodyReader& body) { return body.dictionaries(); });
}

platform::Result<Dictionary> readLedger(dbus::BlockingConnection& connection) {
    return inspect<Dictionary>(connection, dbus::kGetLedger, "a{sv}",
                               [](dbus::BodyReader& body) { return body.dictionary(); });
}

int statusOf(const platform::Failure& failure) { return failure.code == 0 ? kFailed : kNoService; }

} // namespace vela
