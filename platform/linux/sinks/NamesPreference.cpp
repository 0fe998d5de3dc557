#include "platform/linux/sinks/NamesPreference.h"

#include "base/Format.h"

namespace tamblo {

std::vector<std::string> NamesPreference::read() {
    std::optional<Value> value = preferences_.copyPreferenceValue(setting_.key, setting_.domain);
    if (!value) {
        reported_.reset();
        return setting_.whenAbsent;
    }
    std::vector<std::string> names = value->isArray() ? std::vector<std::string>() : setting_.whenNoArray;
    bool isMalformed = !value->isArray();
    for (const Value& element : value->arrayValue()) {
        if (element.stringValue().empty()) {
            isMalformed = true;
        } else {
            names.emplace_back(element.stringValue());
        }
    }
    if (isMalformed && reported_ != value) {
        log_.report(LogLevel::error, setting_.categoryCode,
                    formatted("{}: {} {}", preferences_.path(setting_.domain), setting_.key,
                              value->isArray() ? "holds what is no name; that is ignored"
                                               : formatted("is no array; {}", setting_.noArrayMeans)));
    }
    reported_ = isMalformed ? std::move(value) : std::nullopt;
    return names;
}

} // namespace tamblo
