#pragma once

#include "base/JsonReader.h"
#include "platform/ChanlogFacility.h"

#include <cstddef>
#include <string>
#include <variant>

namespace tamblo {

/// What a publisher may put into one channel: more is a mistake, and would make a session's message large.
inline constexpr std::size_t kMaximumChanlogElements = 256;   ///< states or buckets
inline constexpr std::size_t kMaximumChanlogNameLength = 256; ///< bytes of a name or unit

/// A channel from its JSON object, or what is wrong with it, for people. Members that are not known are
/// ignored.
///
///     {"driver", "group", "subgroup", "name", "unit", "format", ...}
///
/// The texts before the format may be absent. Further members are, by the format, integers all but the names:
/// "simple": "value"; "state": "states", an array of {"name", "transitions", "residency"}; "histogram":
/// "buckets", an array of {"lower", "upper", "hits"}, "min" and "max"; "simple_array": none that are read.
[[nodiscard]] std::variant<ChanlogChannelRef, std::string> readChanlogChannel(const JsonItem& json);

} // namespace tamblo
