#pragma once

#include "base/Format.h"
#include "base/Mutex.h"
#include "platform/DeviceProperties.h"
#include "platform/StructuredLog.h"
#include "platform/linux/settings/JsonFile.h"

#include <map>
#include <optional>
#include <string>
#include <string_view>
#include <utility>

namespace tamblo {

/// Device properties from a file that holds one JSON object.
///
/// The file is looked at whenever a property is asked for, which is rarely, and read again when it may have
/// changed. What was known of one that cannot be read stays. Any thread.
class LinuxDeviceProperties final : public DeviceProperties {
public:
    /// The log must outlive the properties.
    LinuxDeviceProperties(std::string path, StructuredLog& log) : log_(log), file_(std::move(path)) {}

    [[nodiscard]] std::optional<bool> booleanProperty(std::string_view name) const override {
        const MutexLock lock(mutex_);
        if (!file_.isCurrent()) {
            auto properties = file_.read(log_);
            if (!file_.isUnreadable()) {
                properties_ = std::move(properties);
            }
        }
        const Value* const value = properties_ ? properties_->find(name) : nullptr;
        if (value == nullptr) {
            return std::nullopt;
        }
        if (value->kind() != Value::Kind::boolean) {
            if (told_[std::string(name)].isNews("is no boolean", file_.state())) {
                log_.report(LogLevel::error, "zrrs",
                            formatted("{}: {} is no boolean; it is not used", file_.path(), name));
            }
            return std::nullopt;
        }
        return value->boolValue();
    }

private:
    StructuredLog& log_;
    mutable Mutex mutex_;
    mutable JsonFile file_ TAMBLO_GUARDED_BY(mutex_);
    mutable std::optional<Dictionary> properties_ TAMBLO_GUARDED_BY(mutex_);
    mutable std::map<std::string, ToldOnce, std::less<>> told_ TAMBLO_GUARDED_BY(mutex_); ///< by property
};

} // namespace tamblo
