#pragma once

#include <algorithm>
#include <array>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <string_view>

/// The words of the client protocol, each said once for both ends: the requests, and the categories, types
/// and service types that they carry. The service's decoder, the client's encoder and `tambloctl decode`
/// follow the rows below. What a new request takes besides its row is in `docs/adding-a-request.md`.
namespace tamblo::wire {

/// A parameter: what it means and, with that, how it travels.
enum class Parameter : std::uint8_t {
    none, ///< stands behind a request's last parameter
    payload,
    configuration,
    category,
    type,
    serviceType,
    reporterID,
    reporterIDs,
};

/// What a parameter is called, and what it has to be, in refusals.
struct ParameterRow {
    std::string_view name;
    std::string_view wanted;
};

inline constexpr std::array<ParameterRow, 8> kParameters{{
    {},
    {"payload", "a map or null"},
    {"configuration", "a map"},
    {"category", "an unsigned 32-bit integer"},
    {"type", "an unsigned 16-bit integer"},
    {"type", "an unsigned 16-bit integer"},
    {"reporter ID", "a signed 64-bit integer"},
    {"reporter IDs", "an array of signed 64-bit integers, or null"},
}};

/// The kinds of results, and the request that is never answered.
enum class ResultKind : std::uint8_t { never, null, boolean, serviceType, dictionary, reporterIDs };

/// The requests, in the order of their rows.
enum class Method : std::uint8_t {
    createReportingSession,
    setServiceType,
    getServiceNameForReporterID,
    setConfiguration,
    startReportingSessionForID,
    sendMessage,
    stopReportingSessionForID,
    destroyReportingSession,
    reporterID,
    getAllReporters,
    killService,
};

/// A request: what it is called, what it takes, and what answers it.
struct MethodRow {
    std::string_view name;
    ResultKind result;
    std::array<Parameter, 4> parameters; ///< in order; `none` behind the last
};

inline constexpr std::array<MethodRow, 11> kMethods{{
    {"createReportingSession", ResultKind::boolean, {Parameter::reporterID}},
    {"setServiceType", ResultKind::boolean, {Parameter::serviceType, Parameter::reporterID}},
    {"getServiceNameForReporterID", ResultKind::serviceType, {Parameter::reporterID}},
    {"setConfiguration", ResultKind::boolean, {Parameter::configuration, Parameter::reporterID}},
    {"startReportingSessionForID", ResultKind::boolean, {Parameter::reporterID}},
    {"sendMessage",
     ResultKind::null,
     {Parameter::payload, Parameter::category, Parameter::type, Parameter::reporterIDs}},
    {"stopReportingSessionForID", ResultKind::boolean, {Parameter::reporterID}},
    {"destroyReportingSession", ResultKind::boolean, {Parameter::reporterID}},
    {"reporterID", ResultKind::dictionary, {Parameter::reporterID}},
    {"getAllReporters", ResultKind::reporterIDs, {}},
    {"killService", ResultKind::never, {}},
}};

[[nodiscard]] constexpr const MethodRow& rowOf(Method method) noexcept {
    return kMethods[static_cast<std::size_t>(method)];
}

[[nodiscard]] constexpr std::span<const Parameter> parametersOf(Method method) noexcept {
    const auto& all = rowOf(method).parameters;
    return {all.begin(), std::find(all.begin(), all.end(), Parameter::none)};
}

[[nodiscard]] constexpr std::optional<Method> methodNamed(std::string_view name) noexcept {
    for (std::size_t i = 0; i < kMethods.size(); ++i) {
        if (kMethods[i].name == name) {
            return static_cast<Method>(i);
        }
    }
    return std::nullopt;
}
static_assert(methodNamed("sendMessage") == Method::sendMessage &&
              methodNamed("killService") == Method::killService);

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

inline constexpr std::array<std::pair<Subsystem, std::string_view>, 6> kSubsystemNames{{
    {Subsystem::midi, "MIDI"},
    {Subsystem::session, "Session"},
    {Subsystem::dsp, "DSP"},
    {Subsystem::hal, "HAL"},
    {Subsystem::routing, "Routing"},
    {Subsystem::toolbox, "Toolbox"},
}};

/// The low half of a category: what is reported on. Its names, and those of the following, lie at their
/// numbers.
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

inline constexpr std::array<std::string_view, 18> kKindNames{
    "Undefined",         "Generic",     "Record", "Input",         "Playback",      "Output",
    "PlaybackAndRecord", "IO",          "Setup",  "ClientRequest", "RouteChange",   "Error",
    "Chanlog",           "Performance", "Volume", "Kaleen",        "HearingHealth", "Wirrels"};

enum class EventCategory : std::uint32_t { unknown = 0xFFFFFFFF };

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

inline constexpr std::array<std::string_view, 20> kTypeNames{"Generic",
                                                             "Start",
                                                             "Stop",
                                                             "Activate",
                                                             "Deactivate",
                                                             "Setup",
                                                             "Error",
                                                             "IssueDetector",
                                                             "Joulery",
                                                             "AudioUnitUsage",
                                                             "MIDIDriver",
                                                             "Summary",
                                                             "HeadphoneAudioExposure",
                                                             "AudioExposure",
                                                             "Listeningenhancement",
                                                             "Pulsedeck",
                                                             "Simple",
                                                             "Histogram",
                                                             "State",
                                                             "MemoryLog"};

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

inline constexpr std::array<std::string_view, 14> kServiceNames{
    "generic",         "velka",         "telephony",        "haptics",          "alarms", "standalone",
    "soundautoconfig", "longformaudio", "nonlongformaudio", "audiodeviceusage", "alerts", "test",
    "apiusage",        "systemsounds"};

/// The names of `EventCategory::unknown` and `EventType::unknown`, and of a service type without a name.
inline constexpr std::string_view kUnknownName = "Unknown";
inline constexpr std::string_view kUnknownServiceName = "unknown";

/// The number of a name in one of the tables; nothing when it stands in none of the first `count`.
template <std::size_t kSize>
[[nodiscard]] constexpr std::optional<std::uint32_t>
numberNamed(const std::array<std::string_view, kSize>& names, std::string_view name,
            std::size_t count = kSize) noexcept {
    const auto end = names.begin() + count;
    const auto found = std::find(names.begin(), end, name);
    return found == end ? std::nullopt : std::optional(static_cast<std::uint32_t>(found - names.begin()));
}

/// The subsystem's name; empty when the high half is none.
[[nodiscard]] constexpr std::string_view subsystemName(std::uint32_t category) noexcept {
    for (const auto& [subsystem, name] : kSubsystemNames) {
        if ((category & 0xFFFF0000) == static_cast<std::uint32_t>(subsystem)) {
            return name;
        }
    }
    return {};
}

/// The category's name in events: the subsystem's, "_" and the kind's. A high half that is no subsystem still
/// yields the separator; the unknown category has none.
[[nodiscard]] inline std::string eventCategoryName(std::uint32_t category) {
    std::string name;
    if (category > 0xFFFF && category != static_cast<std::uint32_t>(EventCategory::unknown)) {
        name.append(subsystemName(category)).append("_");
    }
    const std::uint32_t kind = category & 0xFFFF;
    return name.append(kKindNames[kind < kKindNames.size() ? kind : 0]);
}

/// The type's name in events; a value without a name is "Generic".
[[nodiscard]] constexpr std::string_view eventTypeName(std::uint16_t type) noexcept {
    if (type == static_cast<std::uint16_t>(EventType::unknown)) {
        return kUnknownName;
    }
    return kTypeNames[type < kTypeNames.size() ? type : 0];
}

} // namespace tamblo::wire
