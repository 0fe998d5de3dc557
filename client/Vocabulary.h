#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

/// The categories, types and service types that messages and reporters carry, for clients. A value that has
/// no name here may be sent all the same, by a cast.
namespace tamblo::client {

/// The high half of a category: the part of the audio stack that reports.
enum class Subsystem : std::uint32_t {
    none = 0,
    midi = 0x04000000,
    session = 0x08000000,
    dsp = 0x10000000,
    hal = 0x20000000,
    routing = 0x40000000,
    toolbox = 0x80000000,
};

/// The low half of a category: what is reported on.
enum class EventKind : std::uint32_t {
    generic = 1,
    record,
    input,
    playback,
    output,
    playbackAndRecord,
    io,
    setup,
    clientRequest,
    routeChange,
    error,
    chanlog,
    performance,
    volume,
    kaleen,
    hearingHealth,
    wirrels,
};

enum class EventCategory : std::uint32_t { unknown = 0xFFFFFFFF };

[[nodiscard]] constexpr EventCategory category(Subsystem subsystem, EventKind kind) noexcept {
    return static_cast<EventCategory>(static_cast<std::uint32_t>(subsystem) |
                                      static_cast<std::uint32_t>(kind));
}
[[nodiscard]] constexpr EventCategory category(EventKind kind) noexcept {
    return category(Subsystem::none, kind);
}

enum class EventType : std::uint16_t {
    generic,
    start,
    stop,
    activate,
    deactivate,
    setup,
    error,
    issueDetector,
    joulery,
    audioUnitUsage,
    midiDriver,
    summary,
    headphoneAudioExposure,
    audioExposure,
    listeningEnhancement,
    pulsedeck,
    simple,
    histogram,
    state,
    memoryLog,
    unknown = 65535,
};

enum class ServiceType : std::uint16_t {
    generic,
    velka,
    telephony,
    haptics,
    alarms,
    standalone,
    soundAutoConfig,
    longFormAudio,
    nonLongFormAudio,
    audioDeviceUsage,
    alerts,
    test,
    apiUsage,
    systemSounds,
    unknown = 65535,
};

/// By name, exact as the service writes it ("Volume", "Session_Playback", "Start", "longformaudio"), or by
/// number, decimal or with 0x.
[[nodiscard]] std::optional<EventCategory> parseCategory(std::string_view text);
[[nodiscard]] std::optional<EventType> parseType(std::string_view text);
[[nodiscard]] std::optional<ServiceType> parseServiceType(std::string_view text);

/// As above; empty for a number without a name.
[[nodiscard]] std::string categoryName(EventCategory category);
[[nodiscard]] std::string_view typeName(EventType type) noexcept;
/// "unknown" for a number without a name.
[[nodiscard]] std::string_view serviceTypeName(ServiceType type) noexcept;

} // namespace tamblo::client
