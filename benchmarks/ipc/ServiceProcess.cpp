#include "benchmarks/ipc/ServiceProcess.h"

#include "benchmarks/ipc/BenchMessage.h"
#include "platform/dbus/Address.h"
#include "platform/dbus/MessageWriter.h"

#include <cstdio>
#include <cstdlib>

namespace vela::ipcbench {

namespace dbus = platform::dbus;

namespace {

void putValue(dbus::MessageWriter& writer, bool value) { writer.signature("b"), writer.boolean(value); }
void putValue(dbus::MessageWriter& writer, std::int64_t value) { writer.variantInt64(value); }
void putValue(dbus::MessageWriter& writer, double value) { writer.signature("d"), writer.real(value); }
void putValue(dbus::MessageWriter& writer, std::string_view value) { writer.signature("s"), writer.string(value); }

void requireGoodReply(const platform::Result<dbus::Reply>& reply) {
    if (!reply || reply->isError()) {
        const std::string text = reply ? reply->errorText() : reply.failure().description;
        std::fprintf(stderr, "ipc_benchmark: the service answered: %s\n", text.c_str());
        std::_Exit(EXIT_FAILURE);
    }
}

} // namespace

ServiceProcess::ServiceProcess(bool onDemand, std::vector<std::string> furtherSettings)
    : onDemand_(onDemand),
      furtherSettings_(std::move(furtherSettings)) {
    program_.emplace(commandLine(), std::vector<std::string>{"PATH=/usr/bin:/bin", "HOME=/nonexistent"});
    const bool there = testing::waitUntil([this] {
        // On demand, a connection would start it before its time, and the socket's file is there before it listens.
        return onDemand_ ? program_->error().find("Listening on") != std::string::npos
                         : static_cast<bool>(dbus::connectTo({{socket(), false}}, true));
    });
    if (!there) {
        std::fprintf(stderr, "ipc_benchmark: the service does not start: %s\n", program_->error().c_str());
        std::_Exit(EXIT_FAILURE);
    }
}

std::vector<std::string> ServiceProcess::commandLine() const {
    std::vector<std::string> words;
    if (onDemand_) {
        words = {"/usr/bin/systemd-socket-activate", "-l", socket()};
    }
    words.emplace_back(VELA_REPORTINGD);
    // Room for the messages of a whole measurement: the standard limits refuse what passes 64 MiB.
    for (const std::string& setting :
         {"paths.root=" + (folder_ / "root"), "paths.state=" + (folder_ / "state"),
          "paths.runtime=" + (folder_ / "runtime"), std::string("log.target=stderr"),
          std::string("limits.session_bytes=4 GiB"), std::string("limits.total_bytes=8 GiB")}) {
        words.insert(words.end(), {"--set", setting});
    }
    for (const std::string& setting : furtherSettings_) {
        words.insert(words.end(), {"--set", setting});
    }
    return words;
}

std::optional<dbus::BlockingConnection> ServiceProcess::connection() const {
    auto connection = dbus::BlockingConnection::open({{socket(), false}}, kPatience);
    return connection ? std::optional(*std::move(connection)) : std::nullopt;
}

void callWithID(dbus::BlockingConnection& connection, std::string_view member, std::int64_t reporterID) {
    std::string bytes;
    const std::uint32_t serial = connection.nextSerial();
    dbus::MessageWriter writer(bytes);
    writer.beginCall({.serial = serial,
                      .path = dbus::kObjectPath,
                      .interface = dbus::kReportingInterface,
                      .member = member,
                      .signature = "x"});
    writer.int64(reporterID);
    require(writer.finish() && connection.send(bytes), "service: call");
    requireGoodReply(connection.receive(serial, kPatience));
}

void startSession(dbus::BlockingConnection& connection, std::int64_t reporterID) {
    callWithID(connection, dbus::kCreateReportingSession, reporterID);
    callWithID(connection, dbus::kStartReportingSessionForID, reporterID);
}

Dictionary ledgerTotals(dbus::BlockingConnection& connection) {
    std::string bytes;
    const std::uint32_t serial = connection.nextSerial();
    dbus::MessageWriter writer(bytes);
    writer.beginCall({.serial = serial,
                      .path = dbus::kObjectPath,
                      .interface = dbus::kInspectionInterface,
                      .member = dbus::kGetLedger});
    require(writer.finish() && connection.send(bytes), "service: GetLedger");
    const auto reply = connection.receive(serial, kPatience);
    requireGoodReply(reply);
    const Dictionary ledger = dbus::BodyReader(reply->header).dictionary();
    const ValueRef totals = ledger.find("totals");
    require(totals.isDictionary(), "service: the ledger has no totals");
    return totals.dictionary();
}

void appendMessage(std::string& bytes, std::uint32_t serial, std::int64_t number, std::int64_t reporterID, bool reply) {
    dbus::MessageWriter writer(bytes);
    writer.beginCall({.serial = serial,
                      .path = dbus::kObjectPath,
                      .interface = dbus::kReportingInterface,
                      .member = dbus::kSendMessage,
                      .signature = "a{sv}uqaax",
                      .replyExpected = reply});
    const auto entries = writer.openDictionary();
    forEachEntry(number, [&writer](std::string_view key, auto value) {
        writer.key(key);
        putValue(writer, value);
    });
    writer.closeArray(entries);
    writer.uint32(kCategory);
    writer.uint16(kType);
    writer.optionalInt64s(std::vector<std::int64_t>{reporterID});
    require(writer.finish(), "service: message");
}

namespace {

class ServiceChannel final : public Channel {
public:
    ServiceChannel(dbus::BlockingConnection connection, std::int64_t reporterID)
        : connection_(std::move(connection)),
          reporterID_(reporterID) {
        startSession(connection_, reporterID);
        nextReply_ = connection_.nextSerial();
        nextSerial_ = nextReply_;
    }

    void post(std::int64_t number, bool reply) override {
        appendMessage(bytes_, nextSerial_, number, reporterID_, reply);
        ++nextSerial_;
        nextReply_ += reply ? 0 : 1; // nothing is under way when the sending without replies begins
        if (bytes_.size() >= kWriteBytes) {
            flush();
        }
    }
    void flush() override {
        require(static_cast<bool>(connection_.send(bytes_)), "service: send");
        bytes_.clear();
    }
    void takeReply() override { requireGoodReply(connection_.receive(nextReply_++, kPatience)); }

private:
    /// Calls that are made together leave in writes of about so many bytes, as the client library has it.
    static constexpr std::size_t kWriteBytes = 16 * 1024;

    dbus::BlockingConnection connection_;
    const std::int64_t reporterID_;
    std::uint32_t nextSerial_ = 0;
    std::uint32_t nextReply_ = 0;
    std::string bytes_;
};

/// What the service's ledger counts as dropped, of all that it counts as received.
double lostShareOf(dbus::BlockingConnection& connection) {
    const Dictionary totals = ledgerTotals(connection);
    double received = 0;
    double kept = 0;
    for (const auto& [backend, account] : totals) {
        const Dictionary counts = account.dictionary();
        received += static_cast<double>(counts.find("received").integerValue());
        for (const char* const outcome : {"delivered", "queued", "redundant"}) {
            kept += static_cast<double>(counts.find(outcome).integerValue());
        }
    }
    return received == 0 ? 0 : 1 - kept / received;
}

class RunningService final : public Running {
public:
    explicit RunningService(unsigned clients) {
        process_ = service_.process();
        for (unsigned client = 1; client <= clients; ++client) {
            auto connection = service_.connection();
            require(connection.has_value(), "service: connect");
            channels_.push_back(std::make_unique<ServiceChannel>(*std::move(connection), client));
        }
    }
    RunningService(const RunningService&) = delete;
    RunningService& operator=(const RunningService&) = delete;
    ~RunningService() override { channels_.clear(); }

    double lostShare() override {
        auto connection = service_.connection();
        require(connection.has_value(), "service: connect");
        return lostShareOf(*connection);
    }

private:
    ServiceProcess service_;
};

} // namespace

Subject serviceSubject() {
    return {"(c) service", [](unsigned clients) { return std::make_unique<RunningService>(clients); }};
}

} // namespace vela::ipcbench
