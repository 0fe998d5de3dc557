#pragma once

#include "platform/DeviceProperties.h"

#include <map>
#include <optional>
#include <string>
#include <string_view>

namespace tamblo {

/// The properties that a test has set.
class FakeDeviceProperties final : public DeviceProperties {
public:
    [[nodiscard]] std::optional<bool> booleanProperty(std::string_view name) const override {
        const auto found = properties_.find(name);
        return found != properties_.end() ? std::optional(found->second) : std::nullopt;
    }
    void set(const std::string& name, bool value) { properties_[name] = value; }

private:
    std::map<std::string, bool, std::less<>> properties_;
};

} // namespace tamblo
