#include "platform/linux/device/LinuxDeviceConditions.h"

#include "base/Format.h"
#include "base/NumberText.h"
#include "os/Directory.h"
#include "os/SmallFile.h"

#include <algorithm>
#include <cstdint>
#include <optional>
#include <string_view>
#include <utility>

namespace tamblo {

namespace {

/// A page: no file of this kind is longer.
constexpr std::size_t kMaximumFile = 4096;
/// Of one of the directories: a zone has some ten files, and a few for each trip point.
constexpr std::size_t kMaximumEntries = 4096;

constexpr struct {
    std::string_view type;
    int state;
} kTripPoints[] = {{"active", 1}, {"passive", 2}, {"hot", 3}, {"critical", 3}};

std::optional<std::int64_t> readNumber(const std::string& path) {
    return parseNumber<std::int64_t>(SmallFile::read(path, kMaximumFile).trimmed());
}

bool holds(const std::string& path, std::string_view word) {
    return SmallFile::read(path, kMaximumFile).trimmed() == word;
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
    for (std::string& name : DirectoryEntries::read(zone, kMaximumEntries).names) {
        if (!name.starts_with("trip_point_") || !name.ends_with(kTypeSuffix)) {
            continue;
        }
        const int reachedState = stateOfTripPoint(formatted("{}/{}", zone, name));
        name.replace(name.size() - kTypeSuffix.size(), kTypeSuffix.size(), "_temp");
        // Drivers give 0 or less for a trip point that is not in use.
        const auto threshold =
            reachedState > state ? readNumber(formatted("{}/{}", zone, name)) : std::nullopt;
        if (threshold && *threshold > 0 && *temperature >= *threshold) {
            state = reachedState;
        }
    }
    return state;
}

} // namespace

LinuxDeviceConditions::LinuxDeviceConditions(std::string root, SteadyNow now)
    : root_(std::move(root)), thermalState_(kValidity, now), lowPower_(kValidity, std::move(now)) {}

int LinuxDeviceConditions::thermalState() const {
    return thermalState_.get([this] {
        const std::string zones = root_ + "/class/thermal";
        int state = 0;
        for (const std::string& name : DirectoryEntries::read(zones, kMaximumEntries).names) {
            if (name.starts_with("thermal_zone")) {
                state = std::max(state, stateOfZone(formatted("{}/{}", zones, name)));
            }
        }
        return state;
    });
}

bool LinuxDeviceConditions::isLowPowerModeEnabled() const {
    return lowPower_.get([this] { return holds(root_ + "/firmware/acpi/platform_profile", "low-power"); });
}

} // namespace tamblo
