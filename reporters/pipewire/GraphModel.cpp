#include "reporters/pipewire/GraphModel.h"

#include "reporters/pipewire/StreamRules.h"

#include <algorithm>
#include <array>
#include <utility>

namespace vela::reporter {

namespace {

using std::chrono::nanoseconds;

/// A cycle's status when the node was done.
constexpr int kDone = 3;
constexpr std::int64_t kNanosecondsPerMicrosecond = 1000;
/// No cycle takes longer; what says so was never measured.
constexpr std::int64_t kLongestCycle = 10'000'000'000;

bool isStream(NodeKind kind) { return kind == NodeKind::PlaybackStream || kind == NodeKind::CaptureStream; }
bool isDevice(NodeKind kind) { return kind == NodeKind::Sink || kind == NodeKind::Source; }

bool isPlausible(std::int64_t from, std::int64_t to) { return from > 0 && to >= from && to - from < kLongestCycle; }

std::optional<StatisticsSink::CycleTimes> timesOf(const NodeCycle& node) {
    if (node.status != kDone || !isPlausible(node.signal, node.awake) || !isPlausible(node.awake, node.finish)) {
        return std::nullopt;
    }
    return StatisticsSink::CycleTimes{(node.awake - node.signal) / kNanosecondsPerMicrosecond,
                                      (node.finish - node.awake) / kNanosecondsPerMicrosecond};
}

} // namespace

GraphModel::GraphModel(ReportingRules rules, ReportSink& reports, StatisticsSink& statistics)
    : rules_(std::move(rules)),
      reports_(reports),
      statistics_(statistics) {}

void GraphModel::connected(std::int64_t base) { base_ = base; }

void GraphModel::serverLost(const Moment& now) {
    for (auto& [id, node] : nodes_) {
        if (node.session) {
            node.session->lose(now);
        }
        if (node.kind == NodeKind::Sink) {
            statistics_.removeSink(node.properties.name);
        }
    }
    for (EndedNode& node : ended_) {
        node.session.lose(now);
    }
    nodes_.clear();
    ended_.clear();
    links_.clear();
    clients_.clear();
    xruns_.clear();
    cyclesSince_.reset();
    tellRunningStreams();
}

void GraphModel::setClient(std::uint32_t id, const std::string& application) { clients_[id] = application; }

std::string GraphModel::applicationOf(const NodeProperties& node) const {
    if (!node.application.empty()) {
        return node.application;
    }
    if (node.client) {
        const auto client = clients_.find(*node.client);
        if (client != clients_.end() && !client->second.empty()) {
            return client->second;
        }
    }
    return node.name;
}

bool GraphModel::isLeftOut(const NodeProperties& node, const std::string& application) const {
    return matchesAny(rules_.leftOutApplications, application) || matchesAny(rules_.leftOutRoles, node.role) ||
           matchesAny(rules_.leftOutNodes, node.name);
}

SessionPlan GraphModel::planFor(const Node& node, const std::string& application) const {
    SessionPlan plan;
    plan.isCapture = node.kind == NodeKind::CaptureStream || node.kind == NodeKind::Source;
    plan.isDevice = isDevice(node.kind);
    plan.hasStatistics = cyclesSince_.has_value();
    plan.description.reporterID = base_ + static_cast<std::int64_t>(node.properties.serial);
    plan.description.serviceType = serviceTypeOf(node.properties);
    // A device is named whatever becomes of the names of applications.
    plan.description.application = isDevice(node.kind) ? node.properties.name : rules_.names.apply(application);
    if (!node.properties.role.empty()) {
        plan.description.details.push_back({"media_role", node.properties.role});
    }
    return plan;
}

void GraphModel::addNode(std::uint32_t id, const NodeProperties& properties, const Moment& now) {
    const NodeKind kind = nodeKind(properties.mediaClass);
    if (kind == NodeKind::Other || nodes_.contains(id)) {
        return;
    }
    Node& node = nodes_[id];
    node.properties = properties;
    node.kind = kind;
    if (kind == NodeKind::Sink) {
        statistics_.addSink(properties.name);
    }
    const std::string application = applicationOf(properties);
    if ((isStream(kind) || rules_.devices) && !isLeftOut(properties, application)) {
        node.session.emplace(planFor(node, application), reports_, statistics_, now);
    }
    relink(id, now);
}

GraphModel::Node* GraphModel::findNode(std::uint32_t id) {
    const auto found = nodes_.find(id);
    return found == nodes_.end() ? nullptr : &found->second;
}

void GraphModel::setNodeState(std::uint32_t id, NodeState state, const std::string& error, const Moment& now) {
    Node* const node = findNode(id);
    if (node == nullptr || node->state == state) {
        return;
    }
    node->state = state;
    if (node->kind == NodeKind::Sink) {
        statistics_.sinkState(node->properties.name, static_cast<std::uint8_t>(state));
    }
    if (isDevice(node->kind)) {
        relink(id, now);
    }
    if (node->session) {
        node->session->setState(state, error, now);
        tellRunningStreams();
    }
}

void GraphModel::setNodeVolume(std::uint32_t id, const Volume& volume, const Moment& now) {
    if (Node* const node = findNode(id)) {
        node->volume = volume;
        if (node->session) {
            node->session->setVolume(volume, now);
        }
        if (isDevice(node->kind)) {
            relink(id, now);
        }
    }
}

void GraphModel::setNodeFormat(std::uint32_t id, const Format& format, const Moment& now) {
    if (Node* const node = findNode(id)) {
        node->format = format;
        if (node->session) {
            node->session->setFormat(format, now);
        }
        if (isDevice(node->kind)) {
            relink(id, now);
        }
    }
}

void GraphModel::addLink(std::uint32_t id, const Link& link, const Moment& now) {
    links_[id] = link;
    relink(link.output, now);
    relink(link.input, now);
}

void GraphModel::remove(std::uint32_t id, const Moment& now) {
    if (const auto link = links_.find(id); link != links_.end()) {
        const Link ends = link->second;
        links_.erase(link);
        relink(ends.output, now);
        relink(ends.input, now);
    }
    clients_.erase(id);
    removeNode(id, now);
}

void GraphModel::removeNode(std::uint32_t id, const Moment& now) {
    const auto found = nodes_.find(id);
    if (found == nodes_.end()) {
        return;
    }
    Node node = std::move(found->second);
    nodes_.erase(found);
    if (node.kind == NodeKind::Sink) {
        statistics_.removeSink(node.properties.name);
    }
    if (node.session) {
        node.session->remove(now);
        if (!node.session->isGone()) {
            ended_.push_back({node.properties.name, id, node.kind, *std::move(node.session)});
        }
        tellRunningStreams();
    }
    if (isDevice(node.kind)) {
        relink(id, now);
    }
}

DeviceFacts GraphModel::factsOf(const Node& node) const {
    // Another stream's name would give away what applications are called.
    return isDevice(node.kind) ? DeviceFacts{node.properties.name, node.state, node.format, node.volume}
                               : DeviceFacts{"stream", NodeState::Running, std::nullopt, std::nullopt};
}

std::vector<DeviceFacts> GraphModel::devicesOf(std::uint32_t id, const Node& node) const {
    if (isDevice(node.kind)) {
        return {factsOf(node)};
    }
    const bool isCapture = node.kind == NodeKind::CaptureStream;
    std::set<std::uint32_t> peers;
    for (const auto& [linkID, link] : links_) {
        if ((isCapture ? link.input : link.output) == id) {
            peers.insert(isCapture ? link.output : link.input);
        }
    }
    std::vector<DeviceFacts> devices;
    for (const std::uint32_t peer : peers) {
        if (const auto found = nodes_.find(peer); found != nodes_.end()) {
            devices.push_back(factsOf(found->second));
        }
    }
    return devices;
}

void GraphModel::relink(std::uint32_t id, const Moment& now) {
    std::set<std::uint32_t> around{id};
    for (const auto& [linkID, link] : links_) {
        if (link.output == id || link.input == id) {
            around.insert(link.output == id ? link.input : link.output);
        }
    }
    for (const std::uint32_t neighbour : around) {
        Node* const node = findNode(neighbour);
        if (node != nullptr && node->session) {
            node->session->setDevices(devicesOf(neighbour, *node), now);
        }
    }
}

void GraphModel::tellRunningStreams() {
    std::array<std::size_t, 2> running{};
    for (const auto& [id, node] : nodes_) {
        if (node.session && isStream(node.kind) && node.session->isRunning()) {
            ++running[node.session->isCapture() ? 1 : 0];
        }
    }
    statistics_.runningStreams(false, running[0]);
    statistics_.runningStreams(true, running[1]);
}

void GraphModel::cyclesBegin(const Moment& now) { cyclesSince_ = now.monotonic; }

void GraphModel::addCycle(const Cycle& cycle) {
    const nanoseconds signal(cycle.driver.signal);
    if (!cyclesSince_ || signal < *cyclesSince_) {
        return;
    }
    const auto [known, isNew] = xruns_.try_emplace(cycle.driver.name, cycle.xruns);
    const std::int64_t missed = cycle.xruns - std::exchange(known->second, cycle.xruns);
    const Node* const driver = findNode(cycle.driver.id);
    if (missed > 0 && driver != nullptr && driver->kind == NodeKind::Sink) {
        statistics_.sinkXruns(driver->properties.name, missed);
    }
    addNodeCycle(cycle.driver, cycle);
    for (const NodeCycle& follower : cycle.followers) {
        addNodeCycle(follower, cycle);
    }
    for (auto& [id, node] : nodes_) {
        if (node.session) {
            node.session->statisticsReach(signal);
        }
    }
    for (EndedNode& node : ended_) {
        node.session.statisticsReach(signal);
    }
    forgetEnded();
}

void GraphModel::addNodeCycle(const NodeCycle& cycleOfNode, const Cycle& cycle) {
    const std::optional<StatisticsSink::CycleTimes> times = timesOf(cycleOfNode);
    // A follower that this cycle did not wake still bears the times of an earlier one, or none.
    const bool isOfCycle = cycleOfNode.signal >= cycle.driver.signal;
    if (!isOfCycle || (!times && cycleOfNode.status == kDone)) {
        return;
    }
    const nanoseconds signal(cycle.driver.signal);
    const auto count = [&](NodeKind kind, StreamSession& session) {
        session.addCycle(signal, times);
        if (isStream(kind) && session.covers(signal)) {
            statistics_.streamCycle(kind == NodeKind::CaptureStream, cycle.frames, times);
        }
    };
    // IDs are used again at once, and by nodes of the same name: the time tells whose cycle it is.
    const auto ended = std::ranges::find_if(ended_, [&](const EndedNode& node) {
        return node.id == cycleOfNode.id && node.name == cycleOfNode.name && node.session.covers(signal);
    });
    if (ended != ended_.end()) {
        count(ended->kind, ended->session);
        return;
    }
    Node* const node = findNode(cycleOfNode.id);
    if (node == nullptr || node->properties.name != cycleOfNode.name) {
        return;
    }
    if (node->kind == NodeKind::Sink) {
        statistics_.sinkCycle(node->properties.name, times);
    }
    if (node->session) {
        count(node->kind, *node->session);
    }
}

void GraphModel::forgetEnded() {
    std::erase_if(ended_, [](const EndedNode& node) { return node.session.isGone(); });
}

std::optional<nanoseconds> GraphModel::deadline() const {
    std::optional<nanoseconds> first;
    const auto consider = [&first](const StreamSession& session) {
        const std::optional<nanoseconds> time = session.deadline();
        if (time && (!first || *time < *first)) {
            first = time;
        }
    };
    for (const auto& [id, node] : nodes_) {
        if (node.session) {
            consider(*node.session);
        }
    }
    for (const EndedNode& node : ended_) {
        consider(node.session);
    }
    return first;
}

void GraphModel::onTime(const Moment& now) {
    for (auto& [id, node] : nodes_) {
        if (node.session) {
            node.session->onTime(now);
        }
    }
    for (EndedNode& node : ended_) {
        node.session.onTime(now);
    }
    forgetEnded();
}

std::size_t GraphModel::sessionCount() const {
    const auto count =
        std::ranges::count_if(nodes_, [](const auto& entry) { return entry.second.session.has_value(); });
    return static_cast<std::size_t>(count) + ended_.size();
}

} // namespace vela::reporter
