#include "reporters/pipewire/ServerConnection.h"

#include "reporters/pipewire/Pods.h"

#include <cerrno>
#include <chrono>
#include <ctime>
#include <optional>
#include <spa/param/param.h>
#include <string_view>
#include <utility>

namespace vela::reporter {

namespace {

constexpr double kNanosecondsPerSecond = 1e9;

NodeState stateOf(pw_node_state state) {
    switch (state) {
    case PW_NODE_STATE_ERROR:
        return NodeState::Error;
    case PW_NODE_STATE_CREATING:
        return NodeState::Creating;
    case PW_NODE_STATE_SUSPENDED:
        return NodeState::Suspended;
    case PW_NODE_STATE_IDLE:
        return NodeState::Idle;
    case PW_NODE_STATE_RUNNING:
        return NodeState::Running;
    }
    return NodeState::Creating;
}

} // namespace

Moment momentNow() {
    const auto secondsSince = [](clockid_t clock) {
        timespec time{};
        clock_gettime(clock, &time);
        return time;
    };
    const timespec monotonic = secondsSince(CLOCK_MONOTONIC);
    const timespec real = secondsSince(CLOCK_REALTIME);
    return {std::chrono::seconds(monotonic.tv_sec) + std::chrono::nanoseconds(monotonic.tv_nsec),
            static_cast<double>(real.tv_sec) + static_cast<double>(real.tv_nsec) / kNanosecondsPerSecond};
}

const pw_core_events ServerConnection::kCoreEvents = [] {
    pw_core_events events{};
    events.version = PW_VERSION_CORE_EVENTS;
    events.error = onCoreError;
    return events;
}();

const pw_registry_events ServerConnection::kRegistryEvents = [] {
    pw_registry_events events{};
    events.version = PW_VERSION_REGISTRY_EVENTS;
    events.global = onGlobal;
    events.global_remove = onGlobalRemove;
    return events;
}();

const pw_node_events ServerConnection::kNodeEvents = [] {
    pw_node_events events{};
    events.version = PW_VERSION_NODE_EVENTS;
    events.info = onNodeInfo;
    events.param = onNodeParameter;
    return events;
}();

const pw_profiler_events ServerConnection::kProfilerEvents = [] {
    pw_profiler_events events{};
    events.version = PW_VERSION_PROFILER_EVENTS;
    events.profile = onProfile;
    return events;
}();

ServerConnection::ServerConnection(ServerConnectionOwner& owner, pw_core* core)
    : owner_(owner),
      core_(core),
      registry_(pw_core_get_registry(core, PW_VERSION_REGISTRY, 0)) {
    pw_core_add_listener(core_, &coreHook_, &kCoreEvents, this);
    if (registry_ == nullptr) {
        isLost_ = true;
        return;
    }
    pw_registry_add_listener(registry_, &registryHook_, &kRegistryEvents, this);
}

ServerConnection::~ServerConnection() {
    for (auto& [id, node] : nodes_) {
        unbind(node->proxy, node->hook);
    }
    unbind(profiler_, profilerHook_);
    if (registry_ != nullptr) {
        spa_hook_remove(&registryHook_);
        pw_proxy_destroy(reinterpret_cast<pw_proxy*>(registry_));
    }
    spa_hook_remove(&coreHook_);
    pw_core_disconnect(core_);
}

void ServerConnection::unbind(pw_proxy*& proxy, spa_hook& hook) {
    if (proxy != nullptr) {
        spa_hook_remove(&hook);
        pw_proxy_destroy(std::exchange(proxy, nullptr));
    }
}

void ServerConnection::onCoreError(void* data, std::uint32_t id, int /*sequence*/, int result,
                                   const char* /*message*/) {
    auto* const self = static_cast<ServerConnection*>(data);
    // Everything else comes from objects that were gone before they could be bound.
    if (id == PW_ID_CORE && result == -EPIPE && !std::exchange(self->isLost_, true)) {
        self->owner_.model().serverLost(momentNow());
        self->owner_.modelChanged();
        self->owner_.connectionLost();
    }
}

void ServerConnection::onGlobal(void* data, std::uint32_t id, std::uint32_t /*permissions*/, const char* type,
                                std::uint32_t /*version*/, const spa_dict* properties) {
    auto* const self = static_cast<ServerConnection*>(data);
    const std::string_view kind(type);
    if (kind == PW_TYPE_INTERFACE_Node) {
        self->bindNode(id, properties);
    } else if (kind == PW_TYPE_INTERFACE_Link) {
        if (const std::optional<Link> link = readLink(properties)) {
            self->owner_.model().addLink(id, *link, momentNow());
        }
    } else if (kind == PW_TYPE_INTERFACE_Client) {
        self->owner_.model().setClient(id, readText(properties, PW_KEY_APP_NAME));
    } else if (kind == PW_TYPE_INTERFACE_Profiler && self->owner_.wantsCycles()) {
        self->bindProfiler(id);
    }
    self->owner_.modelChanged();
}

void ServerConnection::onGlobalRemove(void* data, std::uint32_t id) {
    auto* const self = static_cast<ServerConnection*>(data);
    if (const auto found = self->nodes_.find(id); found != self->nodes_.end()) {
        unbind(found->second->proxy, found->second->hook);
        self->nodes_.erase(found);
    }
    self->owner_.model().remove(id, momentNow());
    self->owner_.modelChanged();
}

void ServerConnection::bindNode(std::uint32_t id, const spa_dict* properties) {
    if (nodeKind(readText(properties, PW_KEY_MEDIA_CLASS)) == NodeKind::Other || nodes_.contains(id)) {
        return;
    }
    void* const proxy = pw_registry_bind(registry_, id, PW_TYPE_INTERFACE_Node, PW_VERSION_NODE, 0);
    if (proxy == nullptr) {
        return;
    }
    auto node = std::make_unique<BoundNode>();
    node->connection = this;
    node->id = id;
    node->proxy = static_cast<pw_proxy*>(proxy);
    pw_node_add_listener(static_cast<pw_node*>(proxy), &node->hook, &kNodeEvents, node.get());
    nodes_.emplace(id, std::move(node));
}

void ServerConnection::bindProfiler(std::uint32_t id) {
    if (profiler_ != nullptr) {
        return;
    }
    void* const proxy = pw_registry_bind(registry_, id, PW_TYPE_INTERFACE_Profiler, PW_VERSION_PROFILER, 0);
    if (proxy == nullptr) {
        return;
    }
    profiler_ = static_cast<pw_proxy*>(proxy);
    pw_proxy_add_object_listener(profiler_, &profilerHook_, &kProfilerEvents, this);
    owner_.model().cyclesBegin(momentNow());
}

void ServerConnection::onNodeInfo(void* data, const pw_node_info* info) {
    auto* const node = static_cast<BoundNode*>(data);
    ServerConnectionOwner& owner = node->connection->owner_;
    const Moment now = momentNow();
    if (!std::exchange(node->isKnown, true)) {
        owner.model().addNode(node->id, readNodeProperties(info->props), now);
    }
    if ((info->change_mask & PW_NODE_CHANGE_MASK_PARAMS) != 0) {
        subscribe(*node, *info);
    }
    if ((info->change_mask & PW_NODE_CHANGE_MASK_STATE) != 0) {
        owner.model().setNodeState(node->id, stateOf(info->state), info->error == nullptr ? "" : info->error, now);
    }
    owner.modelChanged();
}

/// To subscribe before a parameter can be read gives an error and no parameter.
void ServerConnection::subscribe(BoundNode& node, const pw_node_info& info) {
    std::vector<std::uint32_t> readable;
    for (std::uint32_t i = 0; i < info.n_params; ++i) {
        const spa_param_info& parameter = info.params[i];
        const bool isWanted = parameter.id == SPA_PARAM_Props || parameter.id == SPA_PARAM_Format;
        if (isWanted && (parameter.flags & SPA_PARAM_INFO_READ) != 0) {
            readable.push_back(parameter.id);
        }
    }
    if (readable != node.parameters) {
        node.parameters = readable;
        pw_node_subscribe_params(reinterpret_cast<pw_node*>(node.proxy), readable.data(),
                                 static_cast<std::uint32_t>(readable.size()));
    }
}

void ServerConnection::onNodeParameter(void* data, int /*sequence*/, std::uint32_t id, std::uint32_t /*index*/,
                                       std::uint32_t /*next*/, const spa_pod* parameter) {
    const auto* const node = static_cast<BoundNode*>(data);
    ServerConnectionOwner& owner = node->connection->owner_;
    if (id == SPA_PARAM_Props) {
        if (const std::optional<Volume> volume = readVolume(parameter)) {
            owner.model().setNodeVolume(node->id, *volume, momentNow());
        }
    } else if (id == SPA_PARAM_Format) {
        if (const std::optional<Format> format = readFormat(parameter)) {
            owner.model().setNodeFormat(node->id, *format, momentNow());
        }
    }
    owner.modelChanged();
}

void ServerConnection::onProfile(void* data, const spa_pod* batch) {
    auto* const self = static_cast<ServerConnection*>(data);
    for (const Cycle& cycle : readCycles(batch)) {
        self->owner_.model().addCycle(cycle);
    }
    self->owner_.modelChanged();
}

} // namespace vela::reporter
