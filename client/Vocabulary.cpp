#include "client/Vocabulary.h"

#include "client/NumberText.h"

#include <algorithm>
#include <array>
#include <limits>

namespace tamblo::client {

namespace {

struct Name {
    std::string_view text;
    std::uint32_t value;
};

constexpr std::array kSubsystems{
    Name{"MIDI", 0x04000000}, Name{"Session", 0x08000000}, Name{"DSP", 0x10000000},
    Name{"HAL", 0x20000000},  Name{"Routing", 0x40000000}, Name{"Toolbox", 0x80000000},
};

constexpr std::array kKinds{
    Name{"Generic", 1},
    Name{"Record", 2},
    Name{"Input", 3},
    Name{"Playback", 4},
    Name{"Output", 5},
    Name{"PlaybackAndRecord", 6},
    Name{"IO", 7},
    Name{"Setup", 8},
    Name{"ClientRequest", 9},
    Name{"RouteChange", 10},
    Name{"Error", 11},
    Name{"Chanlog", 12},
    Name{"Performance", 13},
    Name{"Volume", 14},
    Name{"Kaleen", 15},
    Name{"HearingHealth", 16},
    Name{"Wirrels", 17},
};

constexpr std::array kTypes{
    Name{"Generic", 0},
    Name{"Start", 1},
    Name{"Stop", 2},
    Name{"Activate", 3},
    Name{"Deactivate", 4},
    Name{"Setup", 5},
    Name{"Error", 6},
    Name{"IssueDetector", 7},
    Name{"Joulery", 8},
    Name{"AudioUnitUsage", 9},
    Name{"MIDIDriver", 10},
    Name{"Summary", 11},
    Name{"HeadphoneAudioExposure", 12},
    Name{"AudioExposure", 13},
    Name{"Listeningenhancement", 14},
    Name{"Pulsedeck", 15},
    Name{"Simple", 16},
    Name{"Histogram", 17},
    Name{"State", 18},
    Name{"MemoryLog", 19},
    Name{"Unknown", 65535},
};

constexpr std::array kServiceTypes{
    Name{"generic", 0},          Name{"velka", 1},         Name{"telephony", 2},
    Name{"haptics", 3},          Name{"alarms", 4},        Name{"standalone", 5},
    Name{"soundautoconfig", 6},  Name{"longformaudio", 7}, Name{"nonlongformaudio", 8},
    Name{"audiodeviceusage", 9}, Name{"alerts", 10},       Name{"test", 11},
    Name{"apiusage", 12},        Name{"systemsounds", 13}, Name{"unknown", 65535},
};

std::optional<std::uint32_t> valueNamed(const auto& names, std::string_view text) {
    const auto found =
        std::find_if(names.begin(), names.end(), [text](const Name& name) { return name.text == text; });
    return found == names.end() ? std::nullopt : std::optional(found->value);
}

std::string_view nameOf(const auto& names, std::uint32_t value) noexcept {
    const auto found =
        std::find_if(names.begin(), names.end(), [value](const Name& name) { return name.value == value; });
    return found == names.end() ? std::string_view() : found->text;
}

template <typename T> std::optional<T> parse(const auto& names, std::string_view text) {
    std::optional<std::uint64_t> value = valueNamed(names, text);
    if (!value) {
        value = parseUnsigned(text);
    }
    if (!value || *value > std::numeric_limits<std::underlying_type_t<T>>::max()) {
        return std::nullopt;
    }
    return static_cast<T>(*value);
}

} // namespace

std::optional<EventCategory> parseCategory(std::string_view text) {
    if (text == "Unknown") {
        return EventCategory::unknown;
    }
    const std::size_t separator = text.find('_');
    if (separator == std::string_view::npos) {
        return parse<EventCategory>(kKinds, text);
    }
    const auto subsystem = valueNamed(kSubsystems, text.substr(0, separator));
    const auto kind = valueNamed(kKinds, text.substr(separator + 1));
    if (!subsystem || !kind) {
        return std::nullopt;
    }
    return static_cast<EventCategory>(*subsystem | *kind);
}

std::optional<EventType> parseType(std::string_view text) {
    return parse<EventType>(kTypes, text);
}

std::optional<ServiceType> parseServiceType(std::string_view text) {
    return parse<ServiceType>(kServiceTypes, text);
}

std::string categoryName(EventCategory category) {
    if (category == EventCategory::unknown) {
        return "Unknown";
    }
    constexpr std::uint32_t kindBits = 0xFFFF;
    const auto value = static_cast<std::uint32_t>(category);
    std::string kind(nameOf(kKinds, value & kindBits));
    if ((value & ~kindBits) == 0 || kind.empty()) {
        return kind;
    }
    const std::string_view subsystem = nameOf(kSubsystems, value & ~kindBits);
    return subsystem.empty() ? std::string() : std::string(subsystem) + "_" + kind;
}

std::string_view typeName(EventType type) noexcept {
    return nameOf(kTypes, static_cast<std::uint32_t>(type));
}

std::string_view serviceTypeName(ServiceType type) noexcept {
    const auto index = static_cast<std::size_t>(type);
    return index < kServiceTypes.size() - 1 ? kServiceTypes[index].text : kServiceTypes.back().text;
}

} // namespace tamblo::client
