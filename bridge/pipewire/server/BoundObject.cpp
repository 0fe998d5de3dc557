#include "bridge/pipewire/server/BoundObject.h"
#include "bridge/pipewire/graph/Namespace.h"

#include "bridge/common/CleanText.h"
#include "bridge/pipewire/graph/Properties.h"
#include "bridge/pipewire/server/Pods.h"
#include "bridge/pipewire/server/Proxy.h"
#include "os/MachineKey.h"

#include <algorithm>
#include <array>
#include <cstring>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <utility>

#include <pipewire/extensions/metadata.h>
#include <spa/utils/keys.h>

namespace tamblo::pipewire {

namespace {

/// Which of an object's parameters have changed since they were last asked for. The server tells that they
/// have with their flags, and does not send them by itself.
template <std::size_t kCount> class WantedParameters {
public:
    explicit constexpr WantedParameters(const std::array<std::uint32_t, kCount>& ids) : ids_(ids) {}

    template <typename Function> void forEachChanged(std::span<const spa_param_info> told, Function&& ask) {
        for (const spa_param_info& parameter : told) {
            const auto known = std::find(ids_.begin(), ids_.end(), parameter.id);
            if (known == ids_.end()) {
                continue;
            }
            // One that cannot be read for a while, as the format of what is suspended, comes back as another.
            auto& seen = seen_[static_cast<std::size_t>(known - ids_.begin())];
            const bool isChanged = seen != parameter.flags;
            seen = parameter.flags;
            if (isChanged && (parameter.flags & SPA_PARAM_INFO_READ) != 0) {
                ask(parameter.id);
            }
        }
    }

private:
    std::array<std::uint32_t, kCount> ids_;
    std::array<std::optional<std::uint32_t>, kCount> seen_{};
};

class BoundClient final : public BoundObject {
public:
    BoundClient(pw_registry* registry, ObjectID id, Graph& graph)
        : proxy_(registry, id, PW_TYPE_INTERFACE_Client, PW_VERSION_CLIENT), id_(id), graph_(graph) {
        if (proxy_.get() != nullptr) {
            pw_client_add_listener(proxy_.get(), proxy_.hook(), &kEvents, this);
        }
    }
    [[nodiscard]] bool isBound() const noexcept { return proxy_.get() != nullptr; }

private:
    static void told(void* data, const pw_client_info* info) {
        auto& self = *static_cast<BoundClient*>(data);
        self.graph_.changeClient(self.id_, [info](Client& client) {
            forEachEntry(info->props,
                         [&client](const char* key, const char* value) { takeProperty(client, key, value); });
        });
    }
    static constexpr pw_client_events kEvents{
        .version = PW_VERSION_CLIENT_EVENTS, .info = told, .permissions = nullptr};

    Proxy<pw_client> proxy_;
    const ObjectID id_;
    Graph& graph_;
};

class BoundNode final : public BoundObject {
public:
    BoundNode(pw_registry* registry, ObjectID id, Graph& graph)
        : proxy_(registry, id, PW_TYPE_INTERFACE_Node, PW_VERSION_NODE), id_(id), graph_(graph) {
        if (proxy_.get() != nullptr) {
            pw_node_add_listener(proxy_.get(), proxy_.hook(), &kEvents, this);
        }
    }
    [[nodiscard]] bool isBound() const noexcept { return proxy_.get() != nullptr; }

private:
    static NodeState stateOf(pw_node_state state) noexcept {
        switch (state) {
        case PW_NODE_STATE_ERROR:
            return NodeState::error;
        case PW_NODE_STATE_SUSPENDED:
            return NodeState::suspended;
        case PW_NODE_STATE_IDLE:
            return NodeState::idle;
        case PW_NODE_STATE_RUNNING:
            return NodeState::running;
        default:
            return NodeState::creating;
        }
    }

    static void told(void* data, const pw_node_info* info) {
        auto& self = *static_cast<BoundNode*>(data);
        self.graph_.changeNode(self.id_, [info](Node& node) {
            node.isKnown = true;
            if ((info->change_mask & PW_NODE_CHANGE_MASK_STATE) != 0) {
                const NodeState state = stateOf(info->state);
                if (state == NodeState::error && node.state != NodeState::error) {
                    ++node.errors;
                    node.error = cleanText(info->error == nullptr ? "" : info->error);
                }
                node.state = state;
            }
            if ((info->change_mask & PW_NODE_CHANGE_MASK_PROPS) != 0) {
                forEachEntry(info->props,
                             [&node](const char* key, const char* value) { takeProperty(node, key, value); });
            }
        });
        if ((info->change_mask & PW_NODE_CHANGE_MASK_PARAMS) != 0) {
            self.wanted_.forEachChanged({info->params, info->n_params}, [&self](std::uint32_t id) {
                pw_node_enum_params(self.proxy_.get(), 0, id, 0, 1, nullptr);
            });
        }
    }

    static void gave(void* data, int, std::uint32_t id, std::uint32_t, std::uint32_t,
                     const spa_pod* parameter) {
        auto& self = *static_cast<BoundNode*>(data);
        self.graph_.changeNode(self.id_, [id, parameter](Node& node) {
            if (id == SPA_PARAM_Format) {
                if (auto format = formatOf(parameter)) {
                    node.format = std::move(format);
                }
            } else if (const auto volume = volumeOf(parameter)) {
                node.volume = volume;
            }
        });
    }
    static constexpr pw_node_events kEvents{.version = PW_VERSION_NODE_EVENTS, .info = told, .param = gave};

    Proxy<pw_node> proxy_;
    const ObjectID id_;
    Graph& graph_;
    WantedParameters<2> wanted_{{SPA_PARAM_Format, SPA_PARAM_Props}};
};

/// As the service has it of the Bluetooth daemon's records, whose addresses are in capital letters.
std::string identifierOf(std::string_view address) {
    static const MachineKey key = MachineKey::read();
    std::string text(address);
    std::transform(text.begin(), text.end(), text.begin(), [](char byte) {
        return byte >= 'a' && byte <= 'f' ? static_cast<char>(byte - 'a' + 'A') : byte;
    });
    return key.identifierOf(text);
}

class BoundDevice final : public BoundObject {
public:
    BoundDevice(pw_registry* registry, ObjectID id, Graph& graph)
        : proxy_(registry, id, PW_TYPE_INTERFACE_Device, PW_VERSION_DEVICE), id_(id), graph_(graph) {
        if (proxy_.get() != nullptr) {
            pw_device_add_listener(proxy_.get(), proxy_.hook(), &kEvents, this);
        }
    }
    [[nodiscard]] bool isBound() const noexcept { return proxy_.get() != nullptr; }

private:
    static constexpr std::uint32_t kMostRoutes = 64;

    static void told(void* data, const pw_device_info* info) {
        auto& self = *static_cast<BoundDevice*>(data);
        self.graph_.changeDevice(self.id_, [info](Device& device) {
            device.isKnown = true;
            forEachEntry(info->props, [&device](const char* key, const char* value) {
                takeProperty(device, key, value);
                if (std::strcmp(key, SPA_KEY_API_BLUEZ5_ADDRESS) == 0) {
                    device.identifier = identifierOf(value);
                }
            });
        });
        if ((info->change_mask & PW_DEVICE_CHANGE_MASK_PARAMS) != 0) {
            self.wanted_.forEachChanged({info->params, info->n_params}, [&self](std::uint32_t id) {
                const int asked = pw_device_enum_params(self.proxy_.get(), 0, id, 0, kMostRoutes, nullptr);
                if (id == SPA_PARAM_Route) {
                    self.askedForRoutes_ = asked;
                    self.hasRoutes_ = false;
                }
            });
        }
    }

    static void gave(void* data, int number, std::uint32_t id, std::uint32_t, std::uint32_t,
                     const spa_pod* parameter) {
        auto& self = *static_cast<BoundDevice*>(data);
        if (id == SPA_PARAM_Route) {
            self.takeRoute(number, parameter);
        } else if (const auto profile = profileOf(parameter)) {
            self.graph_.changeDevice(self.id_, [&profile](Device& device) {
                device.profile = profile->name;
                device.profileDescription = profile->description;
                if (profile->isOff) {
                    device.routes.clear();
                }
            });
        }
    }

    /// The first of those that were asked for last replaces all that were there before.
    void takeRoute(int number, const spa_pod* parameter) {
        auto route = pipewire::routeOf(parameter);
        if (!route || number != askedForRoutes_) {
            return;
        }
        graph_.changeDevice(id_, [this, &route](Device& device) {
            if (!std::exchange(hasRoutes_, true)) {
                device.routes.clear();
            }
            if (device.routes.size() < kMostRoutes) {
                device.routes.push_back(std::move(*route));
            }
        });
    }
    static constexpr pw_device_events kEvents{
        .version = PW_VERSION_DEVICE_EVENTS, .info = told, .param = gave};

    Proxy<pw_device> proxy_;
    const ObjectID id_;
    Graph& graph_;
    WantedParameters<2> wanted_{{SPA_PARAM_Route, SPA_PARAM_Profile}};
    int askedForRoutes_ = -1;
    bool hasRoutes_ = false;
};

class BoundMetadata final : public BoundObject {
public:
    BoundMetadata(pw_registry* registry, ObjectID id, Graph& graph)
        : proxy_(registry, id, PW_TYPE_INTERFACE_Metadata, PW_VERSION_METADATA), graph_(graph) {
        if (proxy_.get() != nullptr) {
            pw_metadata_add_listener(proxy_.get(), proxy_.hook(), &kEvents, this);
        }
    }
    [[nodiscard]] bool isBound() const noexcept { return proxy_.get() != nullptr; }

private:
    static int told(void* data, std::uint32_t subject, const char* key, const char*, const char* value) {
        if (subject == PW_ID_CORE && key != nullptr) {
            static_cast<BoundMetadata*>(data)->graph_.changeServer(
                [key, value](Server& server) { takeMetadata(server, key, value == nullptr ? "" : value); });
        }
        return 0;
    }
    static constexpr pw_metadata_events kEvents{.version = PW_VERSION_METADATA_EVENTS, .property = told};

    Proxy<pw_metadata> proxy_;
    Graph& graph_;
};

template <typename Bound>
std::unique_ptr<BoundObject> bound(pw_registry* registry, ObjectID id, Graph& graph) {
    auto object = std::make_unique<Bound>(registry, id, graph);
    return object->isBound() ? std::move(object) : nullptr;
}

} // namespace

std::unique_ptr<BoundObject> bindClient(pw_registry* registry, ObjectID id, Graph& graph) {
    return bound<BoundClient>(registry, id, graph);
}

std::unique_ptr<BoundObject> bindDevice(pw_registry* registry, ObjectID id, Graph& graph) {
    return bound<BoundDevice>(registry, id, graph);
}

std::unique_ptr<BoundObject> bindNode(pw_registry* registry, ObjectID id, Graph& graph) {
    return bound<BoundNode>(registry, id, graph);
}

std::unique_ptr<BoundObject> bindMetadata(pw_registry* registry, ObjectID id, Graph& graph) {
    return bound<BoundMetadata>(registry, id, graph);
}

} // namespace tamblo::pipewire
