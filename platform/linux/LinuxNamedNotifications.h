#pragma once

#include "platform/NamedNotifications.h"

namespace tamblo {

/// Named notifications as files.
class LinuxNamedNotifications final : public NamedNotifications {
public:
    [[nodiscard]] Registration RegisterNamedNotification(std::string_view, SerialQueue&, Handler) override {
        return {1, 0};
    }
    [[nodiscard]] State GetNamedNotificationState(int) override { return {1, 0}; }
    void CancelNamedNotification(int) override {}
};

} // namespace tamblo
