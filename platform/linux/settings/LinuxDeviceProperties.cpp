#include "platform/linux/settings/LinuxDeviceProperties.h"

#include "base/Format.h"

namespace tamblo {

std::optional<bool> LinuxDeviceProperties::booleanProperty(std::string_view name) const {
    const MutexLock lock(mutex_);
    if (!file_.isCurrent()) {
        properties_ = file_.read(log_);
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

} // namespace tamblo
