#include "platform/linux/settings/LinuxPreferences.h"

#include "base/Format.h"

#include <utility>

namespace tamblo {

namespace {

/// An edit takes milliseconds: who has the lock for longer is not waited for.
constexpr std::chrono::milliseconds kLockPatience{1000};
/// How long a file that cannot be read is left alone.
constexpr std::chrono::seconds kRetryInterval{1};

} // namespace

LinuxPreferences::LinuxPreferences(std::string directory, StructuredLog& log, SteadyNow now)
    : log_(log), now_(std::move(now)), watcher_(std::move(directory)) {
    reportUnwatched();
}

void LinuxPreferences::reportUnwatched() {
    const std::string fault = watcher_.fault();
    isWatched_.store(fault.empty(), std::memory_order_relaxed);
    if (unwatched_.isNews(fault)) {
        log_.report(LogLevel::error, "zrrs",
                    formatted("{}; changes of the preferences there are not noticed", fault));
    }
}

std::string LinuxPreferences::path(std::string_view domain) const {
    return formatted("{}/{}{}", watcher_.directory(), domain, PreferenceFile::kSuffix);
}

LinuxPreferences::Domain* LinuxPreferences::domainNamed(std::string_view name) const {
    if (const auto found = domains_.find(name); found != domains_.end()) {
        return &found->second;
    }
    auto file = PreferenceFile::of(watcher_.directory(), name);
    if (!file) {
        return nullptr;
    }
    JsonFile json(file->path(), PreferenceFile::kMaximumSize);
    return &domains_.emplace(name, Domain{std::move(*file), std::move(json)}).first->second;
}

std::optional<Value> LinuxPreferences::copyPreferenceValue(std::string_view key,
                                                           std::string_view domain) const {
    const MutexLock lock(mutex_);
    Domain* const entry = domainNamed(domain);
    if (entry == nullptr) {
        return std::nullopt;
    }
    if (const Value* value = entry->unstored.find(key)) {
        return *value;
    }
    if (!entry->isCurrent) {
        read(*entry);
    } else if (entry->file.isUnreadable()) {
        readAgain();
    }
    const Value* value = entry->values ? entry->values->find(key) : nullptr;
    return value != nullptr ? std::optional<Value>(*value) : std::nullopt;
}

void LinuxPreferences::read(Domain& domain) const {
    auto values = domain.file.read(log_);
    if (domain.file.isUnreadable()) {
        isAnyUnreadable_.store(true, std::memory_order_relaxed);
        triedAt_ = now_();
        domain.isCurrent = true; // as far as can be known
        return;
    }
    domain.values = std::move(values);
    domain.isCurrent = isWatched_.load(std::memory_order_relaxed);
}

void LinuxPreferences::readAgain() const {
    if (now_() - triedAt_ < kRetryInterval) {
        return;
    }
    bool isAnyLeft = false;
    for (auto& [name, domain] : domains_) {
        if (domain.file.isUnreadable()) {
            read(domain);
            isAnyLeft = isAnyLeft || domain.file.isUnreadable();
            generation_.fetch_add(domain.file.isUnreadable() ? 0 : 1, std::memory_order_release);
        }
    }
    isAnyUnreadable_.store(isAnyLeft, std::memory_order_relaxed);
}

void LinuxPreferences::setPreferenceValue(std::string_view key, std::string_view domain, const Value& value) {
    MutexLock lock(mutex_);
    Domain* const entry = domainNamed(domain);
    if (entry == nullptr) {
        log_.report(LogLevel::error, "zrrs", formatted("\"{}\" is no preferences domain", domain));
        return;
    }
    entry->unstored.set(key, value);
    generation_.fetch_add(1, std::memory_order_release);
    // Editing waits for others, asking does not.
    lock.unlock();
    const auto set = [key, &value](Dictionary& values) {
        values.set(key, value);
        return true;
    };
    const std::optional<std::string> fault = entry->editable.edit(set, kLockPatience);
    lock.lock();
    if (!fault) {
        entry->forgetFile();
    }
    if (entry->told.isNews(fault.value_or(""))) {
        log_.report(LogLevel::error, "zrrs",
                    formatted("{}; what was set is forgotten when the service ends", *fault));
    }
    generation_.fetch_add(1, std::memory_order_release);
}

void LinuxPreferences::readChanges() {
    bool changed = false;
    watcher_.read([this, &changed](std::optional<std::string_view> fileName) {
        if (fileName && !fileName->ends_with(PreferenceFile::kSuffix)) {
            return;
        }
        changed = true;
        const MutexLock lock(mutex_);
        if (!fileName) {
            for (auto& [name, domain] : domains_) {
                domain.forgetFile();
            }
            return;
        }
        fileName->remove_suffix(PreferenceFile::kSuffix.size());
        const auto found = domains_.find(*fileName);
        if (found != domains_.end()) {
            found->second.forgetFile();
        }
    });
    reportUnwatched();
    if (changed) {
        generation_.fetch_add(1, std::memory_order_release);
    }
}

} // namespace tamblo
