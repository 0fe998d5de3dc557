#pragma once

#include <string_view>

namespace tamblo {

// The domains of the preferences that the service reads; `tambloctl list preferences` has their keys.

inline constexpr std::string_view kReportingDomain = "com.vandra.tamblo";
inline constexpr std::string_view kAnalyticsDomain = "com.vandra.tamblo.analytics";
inline constexpr std::string_view kCallQualityDomain = "com.vandra.tamblo.callquality";
inline constexpr std::string_view kSinksDomain = "com.vandra.tamblo.sinks";
/// In which a device's maker changes limits: numbers by name.
inline constexpr std::string_view kLimitsDomain = "com.vandra.tamblo.limits";
/// By which a developer has an internal build capture or draft something.
inline constexpr std::string_view kCapturesDomain = "com.vandra.tamblo.zrreporting";
/// That of `tambloctl export`.
inline constexpr std::string_view kExportDomain = "com.vandra.tamblo.export";
/// That of tamblo-pipewire.
inline constexpr std::string_view kPipeWireDomain = "com.vandra.tamblo.pipewire";
inline constexpr std::string_view kAccessoriesDomain = "com.vandra.tamblo.accessories";
/// Another part of the device's, whose settings are reported.
inline constexpr std::string_view ZRReportingMessageKeySpatialAudioAccessoryFeatureDomain =
    "com.vandra.dashlo";

} // namespace tamblo
