// The graph as the reporter sees it: nodes, what links them and who made them. Decides which nodes have a reporting
// session, keeps these sessions, and sorts cycles to them. Pure: events and times come in, calls of the two sinks go
// out. Queue-confined: the thread of the graph.
#pragma once

#include "reporters/pipewire/Graph.h"
#include "reporters/pipewire/NamePolicy.h"
#include "reporters/pipewire/Reports.h"
#include "reporters/pipewire/StreamSession.h"

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <list>
#include <map>
#include <optional>
#include <set>
#include <string>
#include <vector>

namespace vela::reporter {

/// Which nodes are reported, and how. Patterns are the shell's.
struct ReportingRules {
    std::vector<std::string> leftOutApplications;
    std::vector<std::string> leftOutRoles;
    std::vector<std::string> leftOutNodes;
    NamePolicy names{NameTreatment::Report, {}};
    bool devices = false; ///< sessions of sinks and sources too
};

class GraphModel {
public:
    /// Both sinks outlive this object.
    GraphModel(ReportingRules rules, ReportSink& reports, StatisticsSink& statistics);

    /// Reporter IDs are `base` and the serial numbers of nodes. Another one for each connection, because a server that
    /// was started anew counts from the beginning.
    void connected(std::int64_t base);
    /// All is over: whatever runs is ended.
    void serverLost(const Moment& now);

    void setClient(std::uint32_t id, const std::string& application);
    void addNode(std::uint32_t id, const NodeProperties& properties, const Moment& now);
    void setNodeState(std::uint32_t id, NodeState state, const std::string& error, const Moment& now);
    void setNodeVolume(std::uint32_t id, const Volume& volume, const Moment& now);
    void setNodeFormat(std::uint32_t id, const Format& format, const Moment& now);
    void addLink(std::uint32_t id, const Link& link, const Moment& now);
    /// Of a node, a link or a client; unknown ones are ignored.
    void remove(std::uint32_t id, const Moment& now);

    /// The server tells cycles from `now` on; what it had gathered before is not ours.
    void cyclesBegin(const Moment& now);
    void addCycle(const Cycle& cycle);

    std::optional<std::chrono::nanoseconds> deadline() const;
    void onTime(const Moment& now);

    std::size_t sessionCount() const;

private:
    struct Node {
        NodeProperties properties;
        NodeKind kind = NodeKind::Other;
        NodeState state = NodeState::Creating;
        std::optional<Format> format;
        std::optional<Volume> volume;
        std::optional<StreamSession> session;
    };
    /// A node that is gone, whose last cycles are still to come.
    struct EndedNode {
        std::string name;
        std::uint32_t id = 0;
        NodeKind kind = NodeKind::Other;
        StreamSession session;
    };

    std::string applicationOf(const NodeProperties& node) const;
    bool isLeftOut(const NodeProperties& node, const std::string& application) const;
    SessionPlan planFor(const Node& node, const std::string& application) const;
    void removeNode(std::uint32_t id, const Moment& now);
    DeviceFacts factsOf(const Node& node) const;
    std::vector<DeviceFacts> devicesOf(std::uint32_t id, const Node& node) const;
    /// Tells the sessions around a node, and its own, what they are linked with.
    void relink(std::uint32_t id, const Moment& now);
    void tellRunningStreams();
    void addNodeCycle(const NodeCycle& node, const Cycle& cycle);
    Node* findNode(std::uint32_t id);
    void forgetEnded();

    const ReportingRules rules_;
    ReportSink& reports_;
    StatisticsSink& statistics_;
    std::int64_t base_ = 0;
    std::map<std::uint32_t, std::string> clients_; ///< application names
    std::map<std::uint32_t, Node> nodes_;
    std::map<std::uint32_t, Link> links_;
    std::list<EndedNode> ended_;
    std::map<std::string, std::int64_t> xruns_;           ///< by the driver's name, as last told
    std::optional<std::chrono::nanoseconds> cyclesSince_; ///< none: no cycles are told
};

} // namespace vela::reporter
