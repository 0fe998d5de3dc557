#include "platform/linux/LinuxPreferences.h"

#include "base/Format.h"

#include <system_error>
#include <utility>

namespace tamblo {

namespace {

constexpr std::string_view kSuffix = ".json";

/// Whether a domain's name is the name of a file in the directory and of nothing else.
bool isDomainName(std::string_view domain) noexcept {
    return !domain.empty() && domain.size() <= 200 && domain.front() != '.' &&
           domain.find_first_of(std::string_view("/\0", 2)) == std::string_view::npos;
}

} // namespace

LinuxPreferences::LinuxPreferences(std::string directory, StructuredLog& log)
    : log_(log), watcher_(std::move(directory)) {
    reportUnwatched();
}

void LinuxPreferences::reportUnwatched() {
    const int error = watcher_.error();
    isWatched_.store(error == 0, std::memory_order_relaxed);
    if (error != std::exchange(reportedError_, error) && error != 0) {
        log_.report(LogLevel::error, "zrrs",
                    formatted("{}: {}; changes of the preferences there are not noticed",
                              watcher_.directory(), std::generic_category().message(error)));
    }
}

std::string LinuxPreferences::path(std::string_view domain) const {
    return formatted("{}/{}{}", watcher_.directory(), domain, kSuffix);
}

std::optional<Value> LinuxPreferences::copyPreferenceValue(std::string_view key,
                                                           std::string_view domain) const {
    if (!isDomainName(domain)) {
        return std::nullopt;
    }
    const std::lock_guard lock(mutex_);
    auto found = domains_.find(domain);
    if (found == domains_.end()) {
        found = domains_.emplace(domain, Domain{JsonFile(path(domain))}).first;
    }
    Domain& entry = found->second;
    if (!entry.isCurrent) {
        entry.values = entry.file.read(log_);
        entry.isCurrent = isWatched_.load(std::memory_order_relaxed);
    }
    const Value* value = entry.values ? entry.values->find(key) : nullptr;
    return value != nullptr ? std::optional<Value>(*value) : std::nullopt;
}

std::optional<std::string> LinuxPreferences::setPreferenceValue(std::string_view, std::string_view,
                                                                const Value&) {
    return "preferences cannot be stored";
}

void LinuxPreferences::readChanges() {
    bool changed = false;
    watcher_.read([this, &changed](std::optional<std::string_view> fileName) {
        if (fileName && !fileName->ends_with(kSuffix)) {
            return;
        }
        changed = true;
        const std::lock_guard lock(mutex_);
        if (!fileName) {
            for (auto& [name, domain] : domains_) {
                domain.isCurrent = false;
            }
            return;
        }
        fileName->remove_suffix(kSuffix.size());
        const auto found = domains_.find(*fileName);
        if (found != domains_.end()) {
            found->second.isCurrent = false;
        }
    });
    reportUnwatched();
    if (changed) {
        generation_.fetch_add(1, std::memory_order_release);
    }
}

} // namespace tamblo
