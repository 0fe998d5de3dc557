#include "platform/linux/tap/TapFilter.h"

#include "base/Dictionary.h"
#include "base/Format.h"
#include "base/Json.h"
#include "base/NamePattern.h"
#include "wire/EventNames.h"

#include <algorithm>
#include <limits>
#include <optional>
#include <span>
#include <type_traits>

namespace tamblo {

namespace {

/// A single value counts as a list of it.
std::span<const Value> listOf(const Value& value) noexcept {
    return value.isArray() ? value.arrayValue() : std::span(&value, 1);
}

template <typename Number> std::optional<Number> wholeNumber(const Value& value) noexcept {
    if (value.kind() != Value::Kind::integer && value.kind() != Value::Kind::unsignedInteger) {
        return std::nullopt;
    }
    constexpr Value::Kind kBig = Value::Kind::unsignedInteger;
    const bool fits = value.kind() == kBig ? value.unsignedValue() <= std::numeric_limits<Number>::max()
                                           : std::in_range<Number>(value.integerValue());
    if (!fits) {
        return std::nullopt;
    }
    return static_cast<Number>(std::is_signed_v<Number> ? static_cast<Number>(value.integerValue())
                                                        : static_cast<Number>(value.unsignedValue()));
}

template <typename Number> bool takeNumbers(const Value& value, std::vector<Number>& numbers) {
    return std::ranges::all_of(listOf(value), [&numbers](const Value& element) {
        const auto number = wholeNumber<Number>(element);
        if (number) {
            numbers.push_back(*number);
        }
        return number.has_value();
    });
}

bool takeTexts(const Value& value, std::vector<std::string>& texts) {
    return std::ranges::all_of(listOf(value), [&texts](const Value& element) {
        texts.emplace_back(element.stringValue());
        return element.isString();
    });
}

bool takeValues(const Value& value, std::vector<std::pair<std::string, std::vector<Value>>>& values) {
    if (!value.isDictionary()) {
        return false;
    }
    const Dictionary& entries = value.dictionaryValue();
    for (std::size_t i = 0; i < entries.size(); ++i) {
        const auto list = listOf(entries.valueAt(i));
        values.emplace_back(entries.keyAt(i), std::vector<Value>(list.begin(), list.end()));
    }
    return true;
}

bool takeCount(const Value& value, std::uint64_t& count) {
    const auto number = wholeNumber<std::uint64_t>(value);
    count = number.value_or(0);
    return count != 0;
}

/// Whether the member is one of a filter's, and of its kind.
bool take(TapFilter& filter, std::string_view name, const Value& value) {
    if (name == "reporter") {
        return takeNumbers(value, filter.reporters);
    }
    if (name == "category") {
        return takeNumbers(value, filter.categories);
    }
    if (name == "type") {
        return takeNumbers(value, filter.types);
    }
    if (name == "event") {
        return takeTexts(value, filter.events);
    }
    if (name == "has") {
        return takeTexts(value, filter.keys);
    }
    if (name == "keys") {
        return takeValues(value, filter.values);
    }
    if (name == "recording") {
        filter.isRecording = value.kind() == Value::Kind::boolean && value.boolValue();
        return filter.isRecording;
    }
    return (name == "limit" && takeCount(value, filter.limit)) ||
           (name == "sample" && takeCount(value, filter.sample));
}

template <typename Element> bool isAmong(const std::vector<Element>& wanted, const Element& element) {
    return wanted.empty() || std::ranges::find(wanted, element) != wanted.end();
}

} // namespace

std::variant<TapFilter, std::string> TapFilter::parse(std::string_view json) {
    TapFilter filter;
    if (json.empty()) {
        return filter;
    }
    const auto read = readJson(json, {.refuseNull = true});
    const auto* const value = std::get_if<Value>(&read);
    if (value == nullptr || !value->isDictionary()) {
        return std::string("tap: the filter is no JSON object");
    }
    const Dictionary& members = value->dictionaryValue();
    for (std::size_t i = 0; i < members.size(); ++i) {
        if (!take(filter, members.keyAt(i), members.valueAt(i))) {
            return formatted("tap: {} is no member of a filter, or of another kind",
                             jsonText(Value(members.keyAt(i))));
        }
    }
    // A recording gets the time that it needs, which must not be much.
    const std::size_t others = members.size() - (filter.limit != 0 ? 1 : 0) - 2;
    if (filter.isRecording && (filter.reporters.size() != 1 || others != 0)) {
        return std::string("tap: a recording needs one reporter, and takes nothing else but a limit");
    }
    return filter;
}

bool TapFilter::accepts(const TappedMessage& message) const {
    if (!isAmong(reporters, message.reporterID) || !isAmong(categories, message.category) ||
        !isAmong(types, message.type)) {
        return false;
    }
    const auto holds = [&message](const auto& entry) {
        const Value* const found = message.payload.find(entry.first);
        return found != nullptr && std::ranges::find(entry.second, *found) != entry.second.end();
    };
    if (!std::ranges::all_of(keys, [&message](const auto& key) { return message.payload.contains(key); }) ||
        !std::ranges::all_of(values, holds)) {
        return false;
    }
    if (events.empty()) {
        return true;
    }
    const std::string general = wire::eventName(wire::kAllServices, message.category, message.type);
    const std::string ofService = wire::eventName(message.serviceName, message.category, message.type);
    return std::ranges::any_of(events, [&](const std::string& pattern) {
        return matchesPattern(general, pattern) || matchesPattern(ofService, pattern);
    });
}

} // namespace tamblo
