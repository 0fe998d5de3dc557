#pragma once

#include "base/Value.h"
#include "platform/Clock.h"

#include <chrono>
#include <cstdint>
#include <string>
#include <string_view>

namespace tamblo {

/// The name of a file about one session: when it is written, in local time, and whose session it is. The
/// application's name comes from a client: a slash or an ASCII control character in it becomes `_`, and one
/// that is too long for a file name is cut at the end of a character. Any other name stands as it is. By how
/// such names begin, and by their suffix, `ReportFiles` knows its files among others.
[[nodiscard]] std::string reportFileName(WallTime time, std::chrono::seconds utcOffset,
                                         std::int64_t reporterID, const Value& applicationName,
                                         std::string_view serviceName);

} // namespace tamblo
