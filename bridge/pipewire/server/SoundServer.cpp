#include "bridge/pipewire/server/SoundServer.h"
#include "bridge/pipewire/graph/Namespace.h"

#include "base/Format.h"
#include "bridge/common/CleanText.h"
#include "bridge/pipewire/graph/Properties.h"
#include "bridge/pipewire/server/Context.h"
#include "bridge/pipewire/server/Proxy.h"

#include <array>
#include <cerrno>
#include <cstdlib>
#include <utility>

#include <pipewire/extensions/metadata.h>
#include <pipewire/impl.h>
#include <unistd.h>

namespace tamblo::pipewire {

namespace {

constexpr std::array<const char*, 2> kModules{"libpipewire-module-protocol-native",
                                              "libpipewire-module-metadata"};

std::string_view textOf(const spa_dict* properties, const char* key) noexcept {
    const char* const text = properties == nullptr ? nullptr : spa_dict_lookup(properties, key);
    return text == nullptr ? std::string_view() : text;
}

} // namespace

const pw_core_events SoundServer::kCoreEvents = [] {
    pw_core_events events{};
    events.version = PW_VERSION_CORE_EVENTS;
    events.info = coreTold;
    events.done = coreDone;
    events.error = coreFailed;
    return events;
}();

const pw_registry_events SoundServer::kRegistryEvents = [] {
    pw_registry_events events{};
    events.version = PW_VERSION_REGISTRY_EVENTS;
    events.global = appeared;
    events.global_remove = vanished;
    return events;
}();

SoundServer::SoundServer(Loop& loop, Graph& graph, std::string socketPath)
    : graph_(graph), socketPath_(std::move(socketPath)), context_(makeContext(loop.get(), kModules)) {}

SoundServer::~SoundServer() {
    disconnect();
    pw_context_destroy(context_);
}

std::string SoundServer::findSocket() {
    const auto variable = [](const char* name) {
        const char* const value = std::getenv(name);
        return std::string(value == nullptr ? "" : value);
    };
    std::string name = variable("PIPEWIRE_REMOTE");
    name = name.empty() ? "pipewire-0" : name;
    if (name.front() == '/') {
        return name;
    }
    std::string ofSystem = "/run/pipewire/" + name;
    for (const char* const place : {"PIPEWIRE_RUNTIME_DIR", "XDG_RUNTIME_DIR", "USERPROFILE"}) {
        if (const std::string directory = variable(place); !directory.empty()) {
            std::string own = formatted("{}/{}", directory, name);
            const bool isThere = ::access(own.c_str(), F_OK) == 0;
            return isThere || ::access(ofSystem.c_str(), F_OK) != 0 ? own : ofSystem;
        }
    }
    return ofSystem;
}

bool SoundServer::connect() {
    core_ =
        pw_context_connect(context_, pw_properties_new(PW_KEY_REMOTE_NAME, socketPath_.c_str(), nullptr), 0);
    if (core_ == nullptr) {
        return false;
    }
    hasGone_ = false;
    roundTrips_ = 0;
    pw_core_add_listener(core_, &coreHook_, &kCoreEvents, this);
    registry_ = static_cast<pw_registry*>(pw_core_get_registry(core_, PW_VERSION_REGISTRY, 0));
    pw_registry_add_listener(registry_, &registryHook_, &kRegistryEvents, this);
    pw_core_sync(core_, PW_ID_CORE, 0);
    return true;
}

void SoundServer::disconnect() {
    if (core_ == nullptr) {
        return;
    }
    bound_.clear();
    defaults_ = kNoObject;
    spa_hook_remove(&registryHook_);
    pw_proxy_destroy(reinterpret_cast<pw_proxy*>(std::exchange(registry_, nullptr)));
    spa_hook_remove(&coreHook_);
    pw_core_disconnect(std::exchange(core_, nullptr));
    hasGone_ = false;
    graph_.clear();
}

void SoundServer::coreTold(void* data, const pw_core_info* info) {
    static_cast<SoundServer*>(data)->graph_.changeServer([info](Server& server) {
        server.version = cleanText(info->version == nullptr ? "?" : info->version);
    });
}

void SoundServer::coreDone(void* data, std::uint32_t id, int) {
    auto& self = *static_cast<SoundServer*>(data);
    if (id == PW_ID_CORE && !self.isComplete() && ++self.roundTrips_ < kRoundTrips) {
        pw_core_sync(self.core_, PW_ID_CORE, 0);
    }
}

/// Of an object that has gone meanwhile the server says so, which is no fault.
void SoundServer::coreFailed(void* data, std::uint32_t id, int, int result, const char*) {
    if (id == PW_ID_CORE && result == -EPIPE) {
        static_cast<SoundServer*>(data)->hasGone_ = true;
    }
}

void SoundServer::appeared(void* data, std::uint32_t id, std::uint32_t, const char* type, std::uint32_t,
                           const spa_dict* properties) {
    static_cast<SoundServer*>(data)->add(id, type, properties);
}

void SoundServer::add(ObjectID id, std::string_view type, const spa_dict* properties) {
    if (type == PW_TYPE_INTERFACE_Client) {
        graph_.changeClient(id, [properties](Client& client) {
            forEachEntry(properties,
                         [&client](const char* key, const char* value) { takeProperty(client, key, value); });
        });
    } else if (type == PW_TYPE_INTERFACE_Node) {
        addNode(id, properties);
    } else if (type == PW_TYPE_INTERFACE_Device) {
        if (textOf(properties, PW_KEY_MEDIA_CLASS) == "Audio/Device" &&
            graph_.changeDevice(id, [](Device&) {})) {
            keep(id, bindDevice(registry_, id, graph_));
        }
    } else if (type == PW_TYPE_INTERFACE_Link) {
        Link link;
        forEachEntry(properties,
                     [&link](const char* key, const char* value) { takeProperty(link, key, value); });
        graph_.addLink(id, link);
    } else if (type == PW_TYPE_INTERFACE_Metadata) {
        addMetadata(id, properties);
    }
}

/// The client before the node: what its streams are called is known by then.
void SoundServer::addNode(ObjectID id, const spa_dict* properties) {
    const bool isAdded = graph_.changeNode(id, [properties](Node& node) {
        forEachEntry(properties,
                     [&node](const char* key, const char* value) { takeProperty(node, key, value); });
    });
    const Node* const node = isAdded ? graph_.node(id) : nullptr;
    if (node == nullptr || node->mediaClass == MediaClass::other) {
        return;
    }
    if (graph_.client(node->client) != nullptr && !bound_.contains(node->client)) {
        keep(node->client, bindClient(registry_, node->client, graph_));
    }
    keep(id, bindNode(registry_, id, graph_));
}

void SoundServer::addMetadata(ObjectID id, const spa_dict* properties) {
    const std::string_view name = textOf(properties, PW_KEY_METADATA_NAME);
    if (name == "default") {
        defaults_ = id;
    }
    if (name == "default" || name == "settings") {
        keep(id, bindMetadata(registry_, id, graph_));
    }
}

void SoundServer::keep(ObjectID id, std::unique_ptr<BoundObject> object) {
    if (object && bound_.size() < kMostBound) {
        bound_[id] = std::move(object);
    }
}

void SoundServer::vanished(void* data, std::uint32_t id) {
    auto& self = *static_cast<SoundServer*>(data);
    self.bound_.erase(id);
    self.graph_.remove(id);
    if (self.defaults_ == id) {
        self.defaults_ = kNoObject;
        self.graph_.changeServer([](Server& server) {
            server.defaultSink = kNoName;
            server.defaultSource = kNoName;
        });
    }
}

} // namespace tamblo::pipewire
