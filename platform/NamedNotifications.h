#pragma once

#include "platform/WorkQueue.h"

#include <cstdint>
#include <functional>
#include <string_view>

namespace tamblo {

/// System-wide named notifications: anybody may post one by its name, with a state word that stands until the
/// next post. Any thread; nothing here blocks for long.
class NamedNotifications {
public:
    /// 0 stands for success, as it does below; anything else is the platform's own number for a failure.
    struct Registration {
        int status = 0;
        int token = 0; ///< never 0 after a success
    };
    struct State {
        int status = 0;
        std::uint64_t word = 0;
    };
    /// Given the registration's token.
    using Handler = std::function<void(int token)>;

    virtual ~NamedNotifications() = default;
    /// From now on each post of the name calls the handler on the queue; posts in quick succession may be one
    /// call, which comes after the last of them. A name may be registered many times, each with a token of
    /// its own. The queue must outlive the registration.
    [[nodiscard]] virtual Registration RegisterNamedNotification(std::string_view name, SerialQueue& queue,
                                                                 Handler handler) = 0;
    /// The word that was posted last, for the registration's name.
    [[nodiscard]] virtual State GetNamedNotificationState(int token) = 0;
    /// Posts the name to everybody who is registered for it, with the state word that it has, 0 for a new
    /// one. Answers 0, or the number of the failure.
    [[nodiscard]] virtual int PostNamedNotification(std::string_view name) = 0;
    /// Ends a registration; called on its queue, or when that is at rest, no call of the handler follows. A
    /// token that is not registered is ignored.
    virtual void CancelNamedNotification(int token) = 0;
};

} // namespace tamblo
