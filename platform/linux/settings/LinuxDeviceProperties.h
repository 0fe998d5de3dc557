#pragma once

#include "base/Mutex.h"
#include "platform/DeviceProperties.h"
#include "platform/StructuredLog.h"
#include "platform/linux/settings/JsonFile.h"

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
    void report(std::string_view name) const TAMBLO_REQUIRES(mutex_);

    StructuredLog& log_;
    mutable Mutex mutex_;
    mutable JsonFile file_ TAMBLO_GUARDED_BY(mutex_);
    mutable bool isCurrent_ TAMBLO_GUARDED_BY(mutex_) = false;
    mutable struct stat status_ TAMBLO_GUARDED_BY(mutex_) {};
    mutable std::optional<Dictionary> properties_ TAMBLO_GUARDED_BY(mutex_);
    /// Properties of this state of the file that are no booleans.
    mutable std::vector<std::string> reported_ TAMBLO_GUARDED_BY(mutex_);
};

} // namespace tamblo
