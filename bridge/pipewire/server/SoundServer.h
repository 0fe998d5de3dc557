#pragma once

#include "bridge/pipewire/graph/Graph.h"
#include "bridge/pipewire/server/BoundObject.h"
#include "bridge/pipewire/server/Loop.h"

#include <cstdint>
#include <memory>
#include <string>
#include <string_view>
#include <unordered_map>

#include <pipewire/pipewire.h>

namespace tamblo::pipewire {

/// The connection to PipeWire: fills the graph, and empties it when the server goes. It binds what carries
/// sound, and of the clients those that have streams; links and all else are known well enough from the
/// registry. The loop's thread; nothing here waits.
class SoundServer {
public:
    SoundServer(Loop& loop, Graph& graph, std::string socketPath);
    ~SoundServer();
    SoundServer(const SoundServer&) = delete;
    SoundServer& operator=(const SoundServer&) = delete;

    /// The socket of the server, from the environment as PipeWire's own clients find it: the one for all
    /// where there is only that. They look each time anew; who waits for it has to know which.
    [[nodiscard]] static std::string findSocket();

    /// Tries at once. False, with `errno`, when nobody answers.
    [[nodiscard]] bool connect();
    [[nodiscard]] bool isConnected() const noexcept { return core_ != nullptr; }
    /// The server has gone: `disconnect` is due, which cannot be done inside the event that tells of it.
    [[nodiscard]] bool hasGone() const noexcept { return hasGone_; }
    void disconnect();
    /// Whether everything that was there at the connection's beginning, and what was asked of it, has come.
    [[nodiscard]] bool isComplete() const noexcept { return roundTrips_ >= kRoundTrips; }

private:
    /// One for the registry, one for the objects' information, one for their parameters.
    static constexpr unsigned kRoundTrips = 3;
    /// Objects that are listened to.
    static constexpr std::size_t kMostBound = 8192;

    static void coreTold(void* data, const pw_core_info* info);
    static void coreDone(void* data, std::uint32_t id, int number);
    static void coreFailed(void* data, std::uint32_t id, int number, int result, const char* message);
    static void appeared(void* data, std::uint32_t id, std::uint32_t permissions, const char* type,
                         std::uint32_t version, const spa_dict* properties);
    static void vanished(void* data, std::uint32_t id);
    static const pw_core_events kCoreEvents;
    static const pw_registry_events kRegistryEvents;

    void add(ObjectID id, std::string_view type, const spa_dict* properties);
    void addNode(ObjectID id, const spa_dict* properties);
    void addMetadata(ObjectID id, const spa_dict* properties);
    void keep(ObjectID id, std::unique_ptr<BoundObject> object);

    Graph& graph_;
    const std::string socketPath_;
    pw_context* context_;
    pw_core* core_ = nullptr;
    pw_registry* registry_ = nullptr;
    spa_hook coreHook_{};
    spa_hook registryHook_{};
    std::unordered_map<ObjectID, std::unique_ptr<BoundObject>> bound_;
    ObjectID defaults_ = kNoObject; ///< the metadata object that names the default devices
    unsigned roundTrips_ = 0;
    bool hasGone_ = false;
};

} // namespace tamblo::pipewire
