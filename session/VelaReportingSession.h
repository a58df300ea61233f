// One reporter's session: takes its messages, keeps them for its end, carries them to real-time reporting as they come.
//
//     created -> configured -> started -> stopped -> started again ... -> released
//
// Thread-safe. Held by its client instance; work that is queued holds it as well, so that it may be released on any
// thread, its own queue's among them. Released without `stop`, it sends nothing more.
//
// Real-time reporting (Beacon) has a life of its own on the session's queue:
//
//     none -> set-up queued -> waiting, at most 9 s -> running -> ended
//                                                  \-> abandoned: no back end, or none in time
//
// While it waits the queue is suspended and no thread is held; messages that are queued meanwhile see the outcome.
#pragma once

#include "common/DeliveryLedger.h"
#include "common/VelaReportingVocabulary.h"
#include "common/values/Dictionary.h"
#include "platform/Beacon.h"
#include "platform/Clock.h"
#include "platform/FileSystem.h"
#include "platform/HwStats.h"
#include "platform/Identity.h"
#include "platform/JsonWriting.h"
#include "platform/Mutex.h"
#include "platform/Spoor.h"
#include "platform/WorkQueue.h"
#include "session/VelaReportingSessionMemory.h"
#include "session/VelaReportingSessionMessageList.h"
#include "session/VelaReportingSessionTracing.h"
#include "session/VelaReportingStartTransaction.h"

#include <atomic>
#include <cstdint>
#include <map>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace vela {

class VelaReportingSession;

/// Samples of the audio drivers' statistics at one moment, by the driver's description.
using VelaReportingDriverSnapShot = std::map<std::string, std::shared_ptr<const platform::HwStatsSamples>, std::less<>>;

/// What the session hands its volume messages to, besides its own send: the analytics bridge.
class VelaReportingSessionEventHandler {
public:
    virtual ~VelaReportingSessionEventHandler() = default;

    virtual void handleEvent(const Dictionary& message, std::uint32_t category, std::uint32_t type,
                             const std::shared_ptr<VelaReportingSession>& session) = 0;
};

/// What a session takes from outside; all of it outlives every session.
struct VelaReportingSessionPlatform {
    platform::Beacon& beacon;
    platform::Clock& clock;
    platform::FileSystem& fileSystem;
    const platform::JsonWriting& jsonWriting;
    platform::Spoor& spoor;
    platform::WorkQueues& workQueues;
    VelaReportingSessionEventHandler& analytics;
    std::string pathRoot;                         ///< what absolute paths of the service stand under; empty for "/"
    VelaReportingSessionMemory* memory = nullptr; ///< bounds what sessions keep; null for no bounds
    DeliveryLedger* ledger = nullptr;             ///< counts what becomes of messages; null where nobody asks
    const VelaReportingTracePlatform* tracing = nullptr; ///< performance traces; null for none
};

class VelaReportingSession : public std::enable_shared_from_this<VelaReportingSession> {
    struct Private {
        explicit Private() = default;
    };

public:
    /// Called with no error when what was asked of the session is queued, or with what became of a single message.
    using ErrorReply = platform::UniqueFunction<void(const std::optional<platform::Failure>& error)>;

    /// `processIdentifiers`: pids of the client, its own first. `sessionPlatform` outlives the session. `client`: whose
    /// rights files are read with that the client names; without one none is read.
    static std::shared_ptr<VelaReportingSession> initWithID(std::int64_t reporterID,
                                                            std::vector<std::int32_t> processIdentifiers,
                                                            const VelaReportingSessionPlatform& sessionPlatform,
                                                            std::optional<platform::Identity> client = std::nullopt);
    VelaReportingSession(Private, std::int64_t reporterID, std::vector<std::int32_t> processIdentifiers,
                         const VelaReportingSessionPlatform& sessionPlatform, std::optional<platform::Identity> client);
    ~VelaReportingSession();
    VelaReportingSession(const VelaReportingSession&) = delete;
    VelaReportingSession& operator=(const VelaReportingSession&) = delete;

    // Life. Calls of `start` and `stop` come from one thread at a time.

    /// Begins a new list of messages, queues the set-up of real-time reporting, without waiting for it, and starts the
    /// performance trace where there is to be one. A session that is started already stays as it is.
    void start();

    /// Sends the volume messages, writes the session file, sends the summary and queues the end of real-time reporting.
    /// Waits for the end of the performance trace, for ever if need be.
    void stop();

    // Messages.

    /// Shapes, records and forwards a message. `sync` has no effect: forwarding is always queued. `reply` (may be
    /// empty) is called on this thread before that work runs; its failure says which memory limit refused the message.
    void sendMessage(const Dictionary& message, std::uint32_t category, std::uint16_t type, bool sync,
                     ErrorReply reply);
    void sendMessage(const Dictionary& message, std::uint32_t category, std::uint16_t type, ErrorReply reply) {
        sendMessage(message, category, type, false, std::move(reply));
    }

    /// Sends one message without a session, a second from now. `userInfo` is not used.
    static void sendSingleMessage(const VelaReportingSessionPlatform& sessionPlatform, const Dictionary& message,
                                  std::uint32_t category, std::uint16_t type, std::uint16_t serviceType,
                                  const Dictionary& userInfo, ErrorReply reply);

    /// Every key of every recorded message with its values joined by ","; none where there is no message.
    std::optional<Dictionary> createSummaryEventForSession();

    /// Writes the recorded messages as a JSON file; on internal builds only.
    void writeSummaryJson();

    // Properties.

    std::int64_t reporterID() const { return reporterID_; }
    const std::vector<std::int32_t>& processIdentifiers() const { return processIdentifiers_; }
    bool started() const { return started_; }

    bool beaconReportingEnabled() const { return beaconReportingEnabled_; }
    void setBeaconReportingEnabled(bool enabled) { beaconReportingEnabled_ = enabled; }

    std::uint16_t serviceType() const { return serviceType_; }
    void setServiceType(std::uint16_t serviceType);
    /// The service type's name, so "unknown" until a type is set.
    std::string_view serviceName() const;

    /// Empty until something is merged into it.
    Dictionary configuration() const;
    /// Merges; none is ignored. Answers why not, when the session may not keep so much, or none.
    std::optional<platform::Failure> setConfiguration(const std::optional<Dictionary>& configuration);
    std::optional<platform::Failure> updateConfigurationWithContentsOfConfiguration(const Dictionary& configuration);

    /// Drivers' statistics at the start; none while nobody took them. For the thread that starts and stops the session.
    const std::optional<VelaReportingDriverSnapShot>& driverSnapShot() const { return driverSnapShot_; }
    void setDriverSnapShot(std::optional<VelaReportingDriverSnapShot> snapShot) {
        driverSnapShot_ = std::move(snapShot);
    }

    /// Reply of the start that is under way. Stored when its real-time set-up still goes on, else called at once.
    void setTransactionCompleteBlock(VelaReportingStartTransaction::Block block) {
        transaction_.setBlock(std::move(block));
    }
    /// Calls and clears what is stored. Whether there was one.
    bool completeTransaction() { return transaction_.callBlock(); }

    /// The messages and counters of the running session; absent when it does not run.
    VelaReportingSessionMessageList& nestedAggregatedPayloadData() { return nestedAggregatedPayloadData_; }

    /// Whether real-time reporting found back ends: the flag itself, for callers that poll it. Lives as long as the
    /// session.
    const std::atomic<bool>& getBeaconReportingStartedState() const { return beaconReportingSessionStarted_; }
    /// Null while there is none. For the session's queue, or when that is idle.
    const std::shared_ptr<platform::BeaconSession>& beaconReportingSession() const { return beaconReportingSession_; }
    const Value& beaconReportingAgentToken() const { return beaconReportingAgentToken_; }

    bool shouldReportOrientation() const { return false; }

    /// Null where there are no performance traces.
    VelaReportingSessionTracing* tracing() const { return tracing_.get(); }
    /// File URL of the last platform trace that completed; none before.
    std::optional<std::string> getProbeTraceFileURL() const;

    /// What its deliveries are counted in; null where nobody asks.
    const std::shared_ptr<LedgerEntry>& ledgerEntry() const { return ledgerEntry_; }

    /// One line that names the session, for logs.
    std::string description() const;

private:
    /// What the set-up takes from the session when it is queued.
    struct BeaconSetup {
        Dictionary configuration;
        std::uint64_t startNumber;
        std::uint16_t serviceType;
    };
    struct BeaconMessage {
        Dictionary forwarded; ///< tagged, without its timestamp where that is taken off
        Dictionary original;  ///< as the client gave it
        VelaReportingSessionShare share;
        LedgerItem item;
        std::uint32_t category;
        std::uint16_t type;
        bool started;
        bool redundant;
    };
    /// How far the list is written to the session file: its messages at one moment, read a stretch at a time.
    struct MessageReading {
        std::uint64_t generation = 0;
        std::size_t next = 0;
        std::size_t end = 0;
    };
    /// Whether the memory limits hold for a message. What the session itself says at its end is never refused.
    enum class Limits : std::uint8_t { Hold, Lifted };

    platform::SerialQueue& beaconReportingQueue();
    VelaReportingSessionTracing::Subject traceSubject() const;

    void setupBeaconReporting(const BeaconSetup& setup);
    void createBeaconReportingSession(const BeaconSetup& setup);
    void startBeaconBackendDiscovery();
    void waitForBeaconBackends(std::uint64_t startNumber);
    void finishBeaconSetup(bool signalled);
    void dropBeaconReportingSession();
    void sendBeaconReportingMessage(BeaconMessage message);
    std::optional<platform::Failure> shapeAndSend(const Dictionary& message, std::uint32_t category, std::uint16_t type,
                                                  Limits limits);
    std::string textOf(VelaReportingMemoryLimit limit) const;
    platform::Failure refuse(VelaReportingMemoryLimit limit);
    void endBeaconReporting();
    void endList();
    void sendVolumeMessages();
    void sendSummaryEvent();
    Value applicationName() const;
    bool appendMessages(platform::PendingFile& file, MessageReading reading);
    std::optional<platform::Failure> appendPiece(std::string& piece, MessageReading& reading);
    std::string summaryFileName();

    // Constant after construction.
    const std::int64_t reporterID_;
    const std::vector<std::int32_t> processIdentifiers_;
    const VelaReportingSessionPlatform& platform_;
    const std::unique_ptr<platform::Semaphore> beaconreportingBackendSemaphore_;
    const std::shared_ptr<VelaReportingSessionBudget> budget_; ///< null where nothing bounds the session
    const std::shared_ptr<LedgerEntry> ledgerEntry_;
    const std::shared_ptr<VelaReportingSessionTracing> tracing_; ///< null where there are none

    // Confined to the thread that starts and stops the session.
    std::optional<VelaReportingDriverSnapShot> driverSnapShot_;

    // Any thread.
    std::atomic<bool> started_ = false;
    std::atomic<bool> beaconReportingEnabled_ = false;
    std::atomic<bool> beaconReportingSessionStarted_ = false;
    std::atomic<std::uint16_t> serviceType_ = AudioServiceTypeUnknown;
    std::atomic<bool> refusalTold_ = false; ///< since the start
    VelaReportingSessionMessageList nestedAggregatedPayloadData_;
    std::uint64_t listBytes_ VELA_GUARDED_BY(nestedAggregatedPayloadData_.mutex()) = 0; ///< taken from the budget
    VelaReportingStartTransaction transaction_;
    mutable Mutex configurationMutex_;
    Dictionary configuration_ VELA_GUARDED_BY(configurationMutex_);
    VelaReportingSessionShare configurationShare_ VELA_GUARDED_BY(configurationMutex_){budget_, 0};
    bool configurationRefusalTold_ VELA_GUARDED_BY(configurationMutex_) = false;
    std::once_flag beaconReportingQueueMade_;

    // Confined to the session's queue.
    std::shared_ptr<platform::BeaconSession> beaconReportingSession_;
    Value beaconReportingAgentToken_;

    // Destroyed first: what it still holds refers to the members above.
    std::unique_ptr<platform::SerialQueue> beaconReportingQueue_;
};

/// "%@" of a session.
void appendDescription(std::string& text, const VelaReportingSession& session);

} // namespace vela
