#include "platform/Limits.h"

#include "platform/PreferenceDomains.h"
#include "platform/Preferences.h"

namespace tamblo {

std::optional<std::size_t> Limits::preferenceOf(const Preferences& preferences, std::string_view name) {
    const std::optional<Value> value = preferences.copyPreferenceValue(name, kLimitsDomain);
    return value && value->isNumber() && value->integerValue() > 0
               ? std::optional(static_cast<std::size_t>(value->integerValue()))
               : std::nullopt;
}

Limits Limits::read(const Preferences& preferences) {
    Limits limits;
    for (const LimitRow& row : kLimitRows) {
        limits.*row.member = preferenceOf(preferences, row.name).value_or(limits.*row.member);
    }
    return limits;
}

} // namespace tamblo
