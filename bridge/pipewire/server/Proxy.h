#pragma once

#include "bridge/pipewire/graph/Objects.h"

#include <cstdint>

#include <pipewire/pipewire.h>

namespace tamblo::pipewire {

/// Owns this program's end of an object of the server, and the hook that listens to it.
template <typename Interface> class Proxy {
public:
    Proxy(pw_registry* registry, ObjectID id, const char* type, std::uint32_t version)
        : proxy_(static_cast<Interface*>(pw_registry_bind(registry, id, type, version, 0))) {
        spa_zero(hook_);
    }
    ~Proxy() {
        if (proxy_ != nullptr) {
            spa_hook_remove(&hook_);
            pw_proxy_destroy(reinterpret_cast<pw_proxy*>(proxy_));
        }
    }
    Proxy(const Proxy&) = delete;
    Proxy& operator=(const Proxy&) = delete;

    [[nodiscard]] Interface* get() const noexcept { return proxy_; }
    [[nodiscard]] spa_hook* hook() noexcept { return &hook_; }

private:
    Interface* proxy_;
    spa_hook hook_;
};

/// Hands each entry of a server's dictionary that has a value to `take(key, value)`.
template <typename Function> void forEachEntry(const spa_dict* entries, Function&& take) {
    if (entries == nullptr) {
        return;
    }
    const spa_dict_item* item = nullptr;
    spa_dict_for_each(item, entries) {
        if (item->key != nullptr && item->value != nullptr) {
            take(item->key, item->value);
        }
    }
}

} // namespace tamblo::pipewire
