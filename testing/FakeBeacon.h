// A real-time reporting framework that keeps what it is told, in order, and answers as a test says. Thread-safe. Its
// sessions may outlive it.
#pragma once

#include "platform/Beacon.h"

#include <cstddef>
#include <cstdint>
#include <functional>
#include <iosfwd>
#include <memory>
#include <optional>
#include <string>
#include <vector>

namespace vela::testing {

class FakeBeacon final : public platform::Beacon {
public:
    enum class Operation : std::uint8_t { NewToken, CreateSession, Discover, Send, Flush, EndSession, SendOne };
    friend std::ostream& operator<<(std::ostream& stream, Operation operation);

    /// One call; what it has no use for stays empty.
    struct Call {
        Operation operation;
        std::uint32_t session = 0; ///< sessions are numbered from 1
        Value token{};             ///< NewToken: the parent
        Dictionary sessionInfo{};
        Dictionary userInfo{};
        std::uint16_t category = 0;
        std::uint16_t type = 0;
        Dictionary payload{};
    };

    /// What becomes of a discovery. The first two answer inside the call.
    enum class Discovery : std::uint8_t {
        FindsBackends,
        FindsNone,
        Waits, ///< until the test answers it
        Lost,  ///< its completion is destroyed without being called
    };
    using Completion = platform::UniqueFunction<void(std::optional<Array> backends)>;

    FakeBeacon();
    ~FakeBeacon() override;
    FakeBeacon(const FakeBeacon&) = delete;
    FakeBeacon& operator=(const FakeBeacon&) = delete;

    // What a test arranges.
    /// For the discoveries from now on; at first they wait.
    void setDiscovery(Discovery discovery);
    /// For the discoveries of the session that will be made as the `number`th.
    void setDiscoveryOf(std::uint32_t number, Discovery discovery);
    /// What is found: "store" unless a test says otherwise.
    void setBackends(Array backends);
    /// Sends fail with this description, or work again with none.
    void failSends(std::optional<std::string> description, int code = 0);
    /// Of all sessions: "FakeBeaconSession" at first.
    void setDescription(std::string description);
    /// Called at the start of every call, outside the lock.
    void setObserver(std::function<void(Operation)> observer);

    /// Answers the discovery that waits the longest; there must be one.
    void findBackends() { answer(true); }
    void findNone() { answer(false); }
    /// Takes the discovery that waits the longest, for the test to call or drop; empty when none waits.
    Completion takeDiscovery();

    // What a test looks at.
    std::vector<Call> calls() const;
    std::vector<Operation> operations() const;
    std::vector<Call> callsOf(Operation operation) const;
    std::size_t waitingDiscoveries() const;
    void clearCalls();

    Value newBeaconHierarchyToken(ValueRef parent) override;
    std::shared_ptr<platform::BeaconSession> createBeaconSession(const Dictionary& sessionInfo,
                                                                 const Dictionary& userInfo) override;
    platform::Result<platform::Done> sendOneBeaconMessage(const Dictionary& sessionInfo, const Dictionary& userInfo,
                                                          std::uint16_t category, std::uint16_t type,
                                                          const Dictionary& payload) override;

private:
    class Session;
    class State;

    void answer(bool found);

    const std::shared_ptr<State> state_;
};

} // namespace vela::testing
