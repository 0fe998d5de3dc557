#include "platform/Preferences.h"

#include "base/Json.h"

namespace tamblo {

std::string PreferencesSuite::stringValue(std::string_view key) const {
    const std::optional<Value> value = store_.copyPreferenceValue(key, domain_);
    if (!value || value->isString()) {
        return value ? std::string(value->stringValue()) : std::string();
    }
    return value->isNumber() ? jsonText(*value) : std::string();
}

} // namespace tamblo
