#pragma once

#include <string_view>

namespace tamblo {

/// Payload keys that the service itself reads or writes.
inline constexpr std::string_view ZRReportingInternalEventEpochTime = "zrreporting_timestamp";
inline constexpr std::string_view ZRReportingInternalEventSystemUptimeSec = "systemuptime_sec";
inline constexpr std::string_view ZRReportingInternalEventProcessUptimeMS = "processuptime_ms";
inline constexpr std::string_view ZRReportingApplicationName = "HostApplicationDisplayID";
inline constexpr std::string_view kInvalidTimestampKey = "invalid_timestamp";
inline constexpr std::string_view kAudioTagKey = "audiotag";

/// What clients report and the derived summaries read.
inline constexpr std::string_view ZRReportingMessageKeySessionDuration = "session_duration";
inline constexpr std::string_view ZRReportingMessageKeySpatialAudioAccessoryFeature =
    "spatial-audio-accessory-feature";
inline constexpr std::string_view kSpatializationEnabledKey = "spatializationEnabled";
inline constexpr std::string_view kRingerStateKey = "ringerstate";

/// Published with the others; a payload that carries them is treated like any other.
inline constexpr std::string_view ZRReportingSessionBlacklistFieldsKey = "_comparison_field_blacklist";
inline constexpr std::string_view ZRReportingSessionThrottleSecondsKey = "_throttle_seconds";

/// A configuration's other name for the application.
inline constexpr std::string_view ZRReportingMessageQVHostApplicationDisplayID = "QVHostApplicationDisplayID";

} // namespace tamblo
