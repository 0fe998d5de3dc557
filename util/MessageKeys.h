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

/// What clients report and summaries are made of.
inline constexpr std::string_view ZRReportingMessageKeySessionDuration = "session_duration";
inline constexpr std::string_view ZRReportingMessageKeySpatialAudioAccessoryFeature =
    "spatial-audio-accessory-feature";
inline constexpr std::string_view kSpatializationEnabledKey = "spatializationEnabled";
inline constexpr std::string_view kRingerStateKey = "ringerstate";
inline constexpr std::string_view kOutputRunningKey = "session_output_running";
inline constexpr std::string_view kInputRunningKey = "session_input_running";
inline constexpr std::string_view kSelectedFormatKey = "session_selected_format";
inline constexpr std::string_view kActiveDevicesKey = "active_devices";
inline constexpr std::string_view kVolumeKey = "QVSessionVolume";
inline constexpr std::string_view kFormatIDKey = "mFormatID";
inline constexpr std::string_view kChannelsPerFrameKey = "mChannelsPerFrame";
inline constexpr std::string_view kGroupSessionKey = "kaleen_session";
inline constexpr std::string_view kOperationModeKey = "vp_config_operation_mode";
inline constexpr std::string_view kInputPortKey = "vp_config_input_port";
inline constexpr std::string_view kVocoderKey = "vp_config_primary_vocoder";
inline constexpr std::string_view kVocoderRateKey = "vp_config_primary_vocoderFs";
inline constexpr std::string_view kIssueTypeKey = "issue_type";

/// Published with the others, and read by nothing here: a payload that carries them is like any other.
inline constexpr std::string_view ZRReportingSessionBlacklistFieldsKey = "_comparison_field_blacklist";
inline constexpr std::string_view ZRReportingSessionThrottleSecondsKey = "_throttle_seconds";

/// A configuration's other name for the application.
inline constexpr std::string_view ZRReportingMessageQVHostApplicationDisplayID = "QVHostApplicationDisplayID";

} // namespace tamblo
