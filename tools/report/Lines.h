#pragma once

#include "base/JsonReader.h"

#include <optional>
#include <string_view>

namespace tamblo::report {

/// A member of an object by its name, as what it has to be; nothing, or an empty text, when it is not there
/// or something else.
[[nodiscard]] inline std::string_view textIn(const JsonItem& object, std::string_view name) {
    const JsonItem* const item = object.find(name);
    return item != nullptr && item->kind == JsonItem::Kind::text ? item->text : std::string_view();
}
[[nodiscard]] inline std::optional<double> numberIn(const JsonItem& object, std::string_view name) {
    const JsonItem* const item = object.find(name);
    return item != nullptr && item->kind == JsonItem::Kind::scalar ? std::optional(item->scalar.doubleValue())
                                                                   : std::nullopt;
}
/// When a line was written; nothing for what is no time that a date can be made of.
[[nodiscard]] inline std::optional<double> timeOf(const JsonItem& line) {
    constexpr double kEndOfYear9999 = 253402300799;
    const std::optional<double> time = numberIn(line, "time");
    return time && *time >= 0 && *time <= kEndOfYear9999 ? time : std::nullopt;
}

} // namespace tamblo::report
