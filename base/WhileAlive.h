#pragma once

#include <memory>
#include <utility>

namespace tamblo {

/// Work that is to do nothing once its owner is gone: for queues, timers and handlers, which may call later
/// than their user lives. The owner is held during the call, so that it does not go half-way, and is given to
/// the work as first argument. One whose pointer owns nothing is not held: it has to go when its queue is at
/// rest. Work that is to outlive its owner captures what it needs instead.
template <typename Owner, typename Function>
[[nodiscard]] auto whileAlive(std::weak_ptr<Owner> owner, Function work) {
    return [owner = std::move(owner), work = std::move(work)](auto&&... arguments) mutable {
        if (const std::shared_ptr<Owner> held = owner.lock()) {
            work(*held, std::forward<decltype(arguments)>(arguments)...);
        }
    };
}

} // namespace tamblo
