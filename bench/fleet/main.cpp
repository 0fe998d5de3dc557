// Makes the sinks of a fleet: for each device a directory with what its service would have written in some
// days.

#include "FleetModel.h"
#include "Player.h"
#include "ServiceOnDisk.h"
#include "base/Format.h"
#include "base/Json.h"
#include "base/NumberText.h"

#include <chrono>
#include <cstdint>
#include <cstdio>
#include <exception>
#include <filesystem>
#include <fstream>
#include <stdexcept>
#include <string>
#include <string_view>

namespace {

using namespace tamblo;
using namespace tamblo::bench;
using namespace tamblo::bench::fleet;

using Days = std::chrono::sys_days;

struct Options {
    std::string directory;
    std::uint64_t devices = 60;
    std::uint64_t first = 1; ///< number of the first device
    std::uint64_t days = 14;
    std::uint64_t seed = 1;

    [[nodiscard]] bool parse(int count, char** arguments);
};

bool Options::parse(int count, char** arguments) {
    for (int i = 1; i < count; ++i) {
        const std::string_view argument(arguments[i]);
        std::uint64_t* const number = argument == "--devices" ? &devices
                                      : argument == "--first" ? &first
                                      : argument == "--days"  ? &days
                                      : argument == "--seed"  ? &seed
                                                              : nullptr;
        if (number == nullptr) {
            if (argument.starts_with("--") || !directory.empty()) {
                return false;
            }
            directory = argument;
            continue;
        }
        const auto read = ++i < count ? parseNumber<std::uint64_t>(arguments[i]) : std::nullopt;
        if (!read || *read == 0) {
            return false;
        }
        *number = *read;
    }
    return !directory.empty();
}

void writeFile(const std::filesystem::path& path, std::string_view text) {
    std::ofstream file(path);
    if (!(file << text << std::flush)) {
        throw std::runtime_error("cannot write " + path.string());
    }
}

/// What a program that holds answers against the truth has to know of a device.
Dictionary truthOf(const Device& device) {
    Dictionary truth{{"device", device.name}, {"kind", device.kind->name}};
    if (device.degradedFrom) {
        truth.set("degraded_from", *device.degradedFrom);
    }
    if (device.silentFrom) {
        truth.set("silent_from", *device.silentFrom);
    }
    return truth;
}

void makeSinks(const Device& device, const Options& options, const Faults& faults, Days first,
               Random& random) {
    const std::filesystem::path place = std::filesystem::path(options.directory) / device.name;
    if (std::filesystem::exists(place / "logs")) {
        throw std::runtime_error(place.string() + " has sinks already");
    }
    for (const char* const directory : {"config", "logs", "run"}) {
        std::filesystem::create_directories(place / directory);
    }
    writeFile(place / "config/device-properties.json",
              jsonText(Value(Dictionary{{"FleetIdentifier", device.name}})));
    ServiceOnDisk service(place / "config", place / "logs", WallTime(first));
    Player player(device, faults, service, random);
    for (int day = 0; day != static_cast<int>(options.days); ++day) {
        player.playDay(day, WallTime(first + std::chrono::days(day)));
    }
    if (const std::uint64_t lost = service.end(); lost != 0) {
        throw std::runtime_error(formatted("{} lines could not be written below {}", lost, place.string()));
    }
}

/// The last day is yesterday.
void makeFleet(const Options& options) {
    const Faults faults;
    const Days first = std::chrono::floor<std::chrono::days>(std::chrono::system_clock::now()) -
                       std::chrono::days(options.days);
    std::filesystem::create_directories(options.directory);
    std::string truth;
    for (std::uint64_t number = options.first; number != options.first + options.devices; ++number) {
        Random random(options.seed, number);
        const Device device = makeDevice(number, static_cast<int>(options.days), faults, random);
        makeSinks(device, options, faults, first, random);
        truth += jsonText(Value(truthOf(device))) + "\n";
    }
    const std::string range = std::to_string(options.first);
    writeFile(std::filesystem::path(options.directory) / ("devices-" + range + ".jsonl"), truth);
    writeFile(
        std::filesystem::path(options.directory) / "faults.json",
        jsonText(Value(Dictionary{{"overloads_of_hour", faults.overloadsOfHour},
                                  {"bad_kind", faults.badKind},
                                  {"bad_release", faults.badRelease},
                                  {"bad_overloads_of_hour", faults.badOverloadsOfHour},
                                  {"degraded_overloads_of_hour", faults.degradedOverloadsOfHour},
                                  {"loud_release", faults.loudRelease},
                                  {"louder_by", faults.louderBy},
                                  {"haptics_release", faults.hapticsRelease},
                                  {"haptics_factor", faults.hapticsFactor},
                                  {"chatty_application", faults.chattyApplication},
                                  {"accessory_loss_of_day", Value(Array{faults.accessoryLossOfDay[0],
                                                                        faults.accessoryLossOfDay[1]})}})));
}

} // namespace

int main(int count, char** arguments) {
    Options options;
    if (!options.parse(count, arguments)) {
        std::fputs(
            "usage: tamblo_fleet [--devices N] [--first NUMBER] [--days N] [--seed N] DIRECTORY\n\n"
            "Makes DIRECTORY/DEVICE/logs, the sinks of a fleet over the last days, and tells in\n"
            "DIRECTORY/*.json* what is wrong with which device. Several may run at a time, with --first.\n",
            stderr);
        return 2;
    }
    try {
        makeFleet(options);
        return 0;
    } catch (const std::exception& error) {
        std::fprintf(stderr, "tamblo_fleet: %s\n", error.what());
        return 1;
    }
}
