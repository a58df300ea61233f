// One connection to a PipeWire server: listens to its registry, nodes and profiler, and tells the model what happens.
// Queue-confined: the thread of the server library's loop.
#pragma once

#include "reporters/pipewire/GraphModel.h"

#include <cstdint>
#include <map>
#include <memory>
#include <pipewire/impl.h>
#include <pipewire/pipewire.h>
#include <vector>

// Stands on the interface of the implementation.
#include <pipewire/extensions/profiler.h>

namespace vela::reporter {

/// This instant on both clocks.
Moment momentNow();

/// What a connection needs of who keeps it.
class ServerConnectionOwner {
public:
    virtual ~ServerConnectionOwner() = default;

    virtual GraphModel& model() = 0;
    virtual bool wantsCycles() const = 0;
    /// The model was told something.
    virtual void modelChanged() = 0;
    /// The server is gone, and the model knows. The connection must not be destroyed within this call.
    virtual void connectionLost() = 0;
};

class ServerConnection {
public:
    /// `owner` outlives this object. Takes `core` over.
    ServerConnection(ServerConnectionOwner& owner, pw_core* core);
    ~ServerConnection();
    ServerConnection(const ServerConnection&) = delete;
    ServerConnection& operator=(const ServerConnection&) = delete;

    bool isLost() const { return isLost_; }

private:
    struct BoundNode {
        ServerConnection* connection = nullptr;
        std::uint32_t id = 0;
        pw_proxy* proxy = nullptr;
        spa_hook hook{};
        bool isKnown = false; ///< to the model
        std::vector<std::uint32_t> parameters{};
    };

    static void onCoreError(void* data, std::uint32_t id, int sequence, int result, const char* message);
    static void onGlobal(void* data, std::uint32_t id, std::uint32_t permissions, const char* type,
                         std::uint32_t version, const spa_dict* properties);
    static void onGlobalRemove(void* data, std::uint32_t id);
    static void onNodeInfo(void* data, const pw_node_info* info);
    static void onNodeParameter(void* data, int sequence, std::uint32_t id, std::uint32_t index, std::uint32_t next,
                                const spa_pod* parameter);
    static void onProfile(void* data, const spa_pod* batch);

    static const pw_core_events kCoreEvents;
    static const pw_registry_events kRegistryEvents;
    static const pw_node_events kNodeEvents;
    static const pw_profiler_events kProfilerEvents;

    void bindNode(std::uint32_t id, const spa_dict* properties);
    void bindProfiler(std::uint32_t id);
    static void subscribe(BoundNode& node, const pw_node_info& info);
    static void unbind(pw_proxy*& proxy, spa_hook& hook);

    ServerConnectionOwner& owner_;
    pw_core* core_;
    spa_hook coreHook_{};
    pw_registry* registry_ = nullptr;
    spa_hook registryHook_{};
    pw_proxy* profiler_ = nullptr;
    spa_hook profilerHook_{};
    std::map<std::uint32_t, std::unique_ptr<BoundNode>> nodes_;
    bool isLost_ = false;
};

} // namespace vela::reporter
