#pragma once

#include "base/Mutex.h"
#include "platform/DeviceProperties.h"
#include "platform/StructuredLog.h"
#include "platform/linux/settings/JsonFile.h"

#include <map>
#include <optional>
#include <string>
#include <string_view>

namespace tamblo {

/// Device properties from a file that holds one JSON object.
///
/// The file is looked at whenever a property is asked for, which is rarely, and read again when it may have
/// changed. Any thread.
class LinuxDeviceProperties final : public DeviceProperties {
public:
    /// The log must outlive the properties.
    LinuxDeviceProperties(std::string path, StructuredLog& log) : log_(log), file_(std::move(path)) {}

    [[nodiscard]] std::optional<bool> booleanProperty(std::string_view name) const override;

private:
    StructuredLog& log_;
    mutable Mutex mutex_;
    mutable JsonFile file_ TAMBLO_GUARDED_BY(mutex_);
    mutable std::optional<Dictionary> properties_ TAMBLO_GUARDED_BY(mutex_);
    mutable std::map<std::string, ToldOnce, std::less<>> told_ TAMBLO_GUARDED_BY(mutex_); ///< by property
};

} // namespace tamblo
