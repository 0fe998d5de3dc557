#pragma once

#include "base/Dictionary.h"
#include "platform/ZRReportingServiceProtocol.h"

#include <cstdint>
#include <string_view>

namespace tamblo {

// Small functions for workers. Those named `ZRReportingUtility…` are vocabulary that every worker may count
// on, whether or not one of this tree calls them. Any thread.

/// Whether both values are there and differ.
[[nodiscard]] inline bool isPresentAndHasChanged(const Value* before, const Value* after) noexcept {
    return before != nullptr && after != nullptr && !(*before == *after);
}
/// Whether both dictionaries are there, both hold the key, and the values differ.
[[nodiscard]] bool ZRReportingUtilityKeyIsPresentAndHasChanged(std::string_view key, const Dictionary* first,
                                                               const Dictionary* second) noexcept;
/// Rounds half away from zero to decimal places; negative places are tens, hundreds and so on.
[[nodiscard]] double ZRReportingUtilityRoundWithPlaces(double value, int places) noexcept;
/// To the nearest whole number, as payloads carry uptimes; kept within the range.
[[nodiscard]] int roundedTo32Bits(double number) noexcept;
/// The dictionary with the time of day, the system's uptime and the process's processor time set to now. What
/// is stored as "processuptime_ms" is consumed processor time, whatever the name says. Asks the context of
/// the process, which has to be there.
[[nodiscard]] Dictionary ZRReportingUtilityAddDates(const Dictionary& message);

[[nodiscard]] constexpr bool ZRReportingUtilityShouldSendMessage() noexcept {
    return true;
}
/// A session is identified by its reporter's ID.
[[nodiscard]] constexpr std::int64_t
ZRReportingUtilityExtractSessionIDFromReporterID(ReporterID reporterID) noexcept {
    return reporterID;
}

} // namespace tamblo
