#include "platform/linux/settings/LinuxPreferences.h"

#include "base/Format.h"
#include "base/Json.h"
#include "os/ReplaceFile.h"
#include "os/SmallFile.h"

#include <cerrno>
#include <system_error>
#include <utility>
#include <variant>

namespace tamblo {

namespace {

constexpr std::string_view kSuffix = ".json";
/// Bytes of a domain's name: with the suffix, it has to be a file system's file name.
constexpr std::size_t kLongestDomainName = 200;

/// Whether a domain's name is the name of a file in the directory and of nothing else.
bool isDomainName(std::string_view domain) noexcept {
    return !domain.empty() && domain.size() <= kLongestDomainName && domain.front() != '.' &&
           domain.find_first_of(std::string_view("/\0", 2)) == std::string_view::npos;
}

/// What a file holds now, nothing if it is missing; or why that cannot be known.
std::variant<Dictionary, std::string> contentOf(const std::string& path) {
    const SmallFile file = SmallFile::read(path, JsonFile::kMaximumSize);
    if (file.error != 0) {
        return file.error == ENOENT ? std::variant<Dictionary, std::string>(Dictionary())
                                    : std::generic_category().message(file.error);
    }
    const auto read = readJson(file.text);
    if (const auto* error = std::get_if<JsonError>(&read)) {
        return formatted("line {}, column {}: {}; it is left as it is", error->line, error->column,
                         error->message);
    }
    const Value& value = std::get<Value>(read);
    if (!value.isDictionary()) {
        return std::string("not an object; it is left as it is");
    }
    return value.dictionaryValue();
}

/// Nothing, or what went wrong.
std::optional<std::string> store(const std::string& path, std::string_view key, const Value& value) {
    auto content = contentOf(path);
    if (auto* fault = std::get_if<std::string>(&content)) {
        return formatted("{}: {}", path, *fault);
    }
    Dictionary& values = std::get<Dictionary>(content);
    values.set(key, value);
    const int failure = replaceFileAtomically(path, jsonText(values) + "\n");
    return failure != 0 ? std::optional(formatted("{}: {}", path, std::generic_category().message(failure)))
                        : std::nullopt;
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
    const MutexLock lock(mutex_);
    Domain& entry = domainNamed(domain);
    if (const Value* value = entry.unstored.find(key)) {
        return *value;
    }
    if (!entry.isCurrent) {
        entry.values = entry.file.read(log_);
        entry.isCurrent = isWatched_.load(std::memory_order_relaxed);
    }
    const Value* value = entry.values ? entry.values->find(key) : nullptr;
    return value != nullptr ? std::optional<Value>(*value) : std::nullopt;
}

/// With the lock held.
LinuxPreferences::Domain& LinuxPreferences::domainNamed(std::string_view name) const {
    const auto found = domains_.find(name);
    return found != domains_.end() ? found->second
                                   : domains_.emplace(name, Domain{JsonFile(path(name))}).first->second;
}

std::optional<std::string> LinuxPreferences::setPreferenceValue(std::string_view key, std::string_view domain,
                                                                const Value& value) {
    if (!isDomainName(domain)) {
        return formatted("\"{}\" is no preferences domain", domain);
    }
    std::optional<std::string> failure;
    {
        // From before the file is read, so that no value stored meanwhile is lost.
        const MutexLock lock(mutex_);
        failure = store(path(domain), key, value);
        Domain& entry = domainNamed(domain);
        if (failure) {
            entry.unstored.set(key, value);
        } else {
            entry.forgetFile();
        }
    }
    generation_.fetch_add(1, std::memory_order_release);
    return failure;
}

void LinuxPreferences::readChanges() {
    bool changed = false;
    watcher_.read([this, &changed](std::optional<std::string_view> fileName) {
        if (fileName && !fileName->ends_with(kSuffix)) {
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
        fileName->remove_suffix(kSuffix.size());
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
