#include "platform/linux/settings/LinuxDeviceProperties.h"

#include "base/Format.h"

#include <algorithm>
#include <ctime>
#include <utility>

namespace tamblo {

namespace {

/// File times advance in steps; a file that is younger than this may change once more and look the same.
constexpr std::int64_t kSettledAfterNanoseconds = 50'000'000;

bool isSameState(const struct stat& one, const struct stat& other) noexcept {
    return one.st_ino == other.st_ino && one.st_dev == other.st_dev && one.st_size == other.st_size &&
           one.st_mode == other.st_mode && one.st_ctim.tv_sec == other.st_ctim.tv_sec &&
           one.st_ctim.tv_nsec == other.st_ctim.tv_nsec;
}

bool isSettled(const struct stat& status) noexcept {
    timespec now{};
    ::clock_gettime(CLOCK_REALTIME, &now);
    const std::int64_t age =
        (now.tv_sec - status.st_ctim.tv_sec) * 1'000'000'000 + (now.tv_nsec - status.st_ctim.tv_nsec);
    return age > kSettledAfterNanoseconds;
}

} // namespace

LinuxDeviceProperties::LinuxDeviceProperties(std::string path, StructuredLog& log)
    : log_(log), file_(std::move(path)) {}

std::optional<bool> LinuxDeviceProperties::booleanProperty(std::string_view name) const {
    const MutexLock lock(mutex_);
    struct stat status {};
    const bool exists = ::stat(file_.path().c_str(), &status) == 0;
    if (!exists || !isCurrent_ || !isSameState(status, status_)) {
        properties_ = file_.read(log_);
        if (!isSameState(status, status_)) {
            reported_.clear();
        }
        isCurrent_ = exists && isSettled(status);
        status_ = status;
    }
    const Value* value = properties_ ? properties_->find(name) : nullptr;
    if (value == nullptr) {
        return std::nullopt;
    }
    if (value->kind() != Value::Kind::boolean) {
        report(name);
        return std::nullopt;
    }
    return value->boolValue();
}

void LinuxDeviceProperties::report(std::string_view name) const {
    if (std::find(reported_.begin(), reported_.end(), name) == reported_.end()) {
        reported_.emplace_back(name);
        log_.report(LogLevel::error, "zrrs",
                    formatted("{}: {} is no boolean; it is not used", file_.path(), name));
    }
}

} // namespace tamblo
