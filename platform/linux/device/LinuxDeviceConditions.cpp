#include "platform/linux/device/LinuxDeviceConditions.h"

#include "os/SmallFile.h"

#include <algorithm>
#include <charconv>
#include <cstdint>
#include <filesystem>
#include <optional>
#include <string_view>
#include <system_error>
#include <utility>

namespace tamblo {

namespace {

/// A page: no file of this kind is longer.
constexpr std::size_t kMaximumFile = 4096;

constexpr struct {
    std::string_view type;
    int state;
} kTripPoints[] = {{"active", 1}, {"passive", 2}, {"hot", 3}, {"critical", 3}};

std::optional<std::int64_t> readNumber(const std::string& path) {
    const SmallFile file = SmallFile::read(path, kMaximumFile);
    const std::string_view text = file.trimmed();
    std::int64_t number = 0;
    const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), number);
    const bool isNumber = error == std::errc() && end == text.data() + text.size();
    return isNumber ? std::optional(number) : std::nullopt;
}

bool holds(const std::string& path, std::string_view word) {
    return SmallFile::read(path, kMaximumFile).trimmed() == word;
}

/// Calls the visitor with the name of each entry; a directory that cannot be read has none.
template <typename Visitor> void forEachEntry(const std::string& directory, const Visitor& visitor) {
    std::error_code error;
    for (std::filesystem::directory_iterator entry(directory, error), end; !error && entry != end;
         entry.increment(error)) {
        visitor(entry->path().filename().string());
    }
}

int stateOfTripPoint(const std::string& type) {
    const SmallFile file = SmallFile::read(type, kMaximumFile);
    const auto* const found =
        std::ranges::find(kTripPoints, file.trimmed(), [](const auto& row) { return row.type; });
    return found != std::end(kTripPoints) ? found->state : 0;
}

int stateOfZone(const std::string& zone) {
    constexpr std::string_view kTypeSuffix = "_type";
    if (holds(zone + "/mode", "disabled")) {
        return 0;
    }
    const auto temperature = readNumber(zone + "/temp");
    if (!temperature) {
        return 0;
    }
    int state = 0;
    forEachEntry(zone, [&](std::string name) {
        if (!name.starts_with("trip_point_") || !name.ends_with(kTypeSuffix)) {
            return;
        }
        const int reachedState = stateOfTripPoint(zone + '/' + name);
        name.replace(name.size() - kTypeSuffix.size(), kTypeSuffix.size(), "_temp");
        // Drivers give 0 or less for a trip point that is not in use.
        const auto threshold = reachedState > state ? readNumber(zone + '/' + name) : std::nullopt;
        if (threshold && *threshold > 0 && *temperature >= *threshold) {
            state = reachedState;
        }
    });
    return state;
}

} // namespace

LinuxDeviceConditions::LinuxDeviceConditions(std::string root, SteadyNow now)
    : root_(std::move(root)), thermalState_(kValidity, now), lowPower_(kValidity, std::move(now)) {}

int LinuxDeviceConditions::thermalState() const {
    return thermalState_.get([this] {
        const std::string zones = root_ + "/class/thermal";
        int state = 0;
        forEachEntry(zones, [&](const std::string& name) {
            if (name.starts_with("thermal_zone")) {
                state = std::max(state, stateOfZone(zones + '/' + name));
            }
        });
        return state;
    });
}

bool LinuxDeviceConditions::isLowPowerModeEnabled() const {
    return lowPower_.get([this] { return holds(root_ + "/firmware/acpi/platform_profile", "low-power"); });
}

} // namespace tamblo
