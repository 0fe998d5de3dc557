#pragma once

#include "platform/DeviceProperties.h"
#include "platform/StructuredLog.h"
#include "platform/linux/settings/JsonFile.h"

#include <mutex>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include <sys/stat.h>

namespace tamblo {

/// Device properties from a file that holds one JSON object.
///
/// The file is looked at whenever a property is asked for, which is rarely, and read again when it has
/// changed. Any thread.
class LinuxDeviceProperties final : public DeviceProperties {
public:
    /// The log must outlive the properties.
    LinuxDeviceProperties(std::string path, StructuredLog& log);

    [[nodiscard]] std::optional<bool> booleanProperty(std::string_view name) const override;

private:
    void report(std::string_view name) const;

    StructuredLog& log_;
    mutable std::mutex mutex_; ///< guards what follows
    mutable JsonFile file_;
    mutable bool isCurrent_ = false;
    mutable struct stat status_ {};
    mutable std::optional<Dictionary> properties_;
    mutable std::vector<std::string> reported_; ///< properties of this state of the file that are no booleans
};

} // namespace tamblo
