#pragma once

#include <optional>
#include <string_view>

namespace tamblo {

/// Fixed facts about the device, by name. Any thread; may read a file.
class DeviceProperties {
public:
    virtual ~DeviceProperties() = default;
    /// Nothing when the property is absent or not a boolean.
    [[nodiscard]] virtual std::optional<bool> booleanProperty(std::string_view name) const = 0;
};

} // namespace tamblo
