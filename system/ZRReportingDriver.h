#pragma once

#include <optional>
#include <string>
#include <utility>

namespace tamblo {

/// Names the channels of an audio driver: their group, their subgroup or both. Immutable, so any thread.
class ZRReportingDriver {
public:
    using Name = std::optional<std::string>;

    [[nodiscard]] static ZRReportingDriver driverWithGroupName(Name groupName, Name subGroupName) {
        return {std::move(groupName), std::move(subGroupName)};
    }

    [[nodiscard]] const Name& groupName() const noexcept { return groupName_; }
    [[nodiscard]] const Name& subGroupName() const noexcept { return subGroupName_; }
    /// "group-subgroup", with "(null)" for a name that is missing. The driver's key in a snapshot.
    [[nodiscard]] std::string description() const {
        return groupName_.value_or("(null)") + "-" + subGroupName_.value_or("(null)");
    }

private:
    ZRReportingDriver(Name groupName, Name subGroupName)
        : groupName_(std::move(groupName)), subGroupName_(std::move(subGroupName)) {}

    Name groupName_;
    Name subGroupName_;
};

inline void appendText(std::string& out, const ZRReportingDriver& driver) {
    out += driver.description();
}

} // namespace tamblo
