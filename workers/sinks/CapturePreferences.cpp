#include "workers/sinks/CapturePreferences.h"

#include "base/Format.h"
#include "base/Mutex.h"
#include "platform/PreferenceDomains.h"
#include "util/Log.h"

#include <algorithm>
#include <map>
#include <string>
#include <utility>

namespace tamblo {

namespace {

/// The values of a wrong kind that the log knows of, by key.
class Reported {
public:
    /// Whether there is such a value now, and another than was reported last; it then is the one.
    [[nodiscard]] bool isNews(std::string_view key, const std::optional<Value>& wrong) {
        const MutexLock lock(mutex_);
        return std::exchange(values_[std::string(key)], wrong) != wrong && wrong;
    }

private:
    Mutex mutex_;
    std::map<std::string, std::optional<Value>> values_ TAMBLO_GUARDED_BY(mutex_);
};

bool beginsWithNumber(std::string_view text) noexcept {
    text.remove_prefix(std::min(text.find_first_not_of(" \t\n\v\f\r"), text.size()));
    if (text.starts_with('-') || text.starts_with('+')) {
        text.remove_prefix(1);
    }
    if (text.starts_with('.')) {
        text.remove_prefix(1);
    }
    return !text.empty() && text.front() >= '0' && text.front() <= '9';
}

bool isNumberOrItsText(const Value& value) noexcept {
    return value.isNumber() || (value.isString() && beginsWithNumber(value.stringValue()));
}

bool isFlagOrItsText(const Value& value) noexcept {
    const std::string_view text = value.stringValue();
    return isNumberOrItsText(value) || value.boolValue() || text == "NO" || text == "no" || text == "FALSE" ||
           text == "false";
}

std::string_view kindOf(const Value& value) noexcept {
    switch (value.kind()) {
    case Value::Kind::string:
        return "a text";
    case Value::Kind::array:
        return "an array";
    case Value::Kind::dictionary:
        return "a dictionary";
    default:
        return "another value";
    }
}

std::optional<Value> checked(Context& context, std::string_view key, const LogCategory& category,
                             bool (&isRight)(const Value&) noexcept, std::string_view wanted) {
    std::optional<Value> value = capturePreferences(context).value(key);
    const std::optional<Value> wrong = value && !isRight(*value) ? value : std::nullopt;
    if (context.shared<Reported>().isNews(key, wrong)) {
        log::ownError(category, "preference {} {}: {} in place of {}; it is read as 0", kCapturesDomain, key,
                      kindOf(*value), wanted);
    }
    return value;
}

} // namespace

PreferencesSuite capturePreferences(const Context& context) {
    return PreferencesSuite(*context.platform().preferences, std::string(kCapturesDomain));
}

std::optional<Value> numberPreference(Context& context, std::string_view key, const LogCategory& category) {
    return checked(context, key, category, isNumberOrItsText, "a number");
}

std::optional<Value> flagPreference(Context& context, std::string_view key, const LogCategory& category) {
    return checked(context, key, category, isFlagOrItsText, "true or false");
}

} // namespace tamblo
