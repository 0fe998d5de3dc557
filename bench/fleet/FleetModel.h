#pragma once

#include "Random.h"

#include "util/AudioEvents.h"

#include <array>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

/// How a made fleet is used, and what is wrong with it.
namespace tamblo::bench::fleet {

inline constexpr std::size_t kApplicationCount = 7;
inline constexpr std::size_t kRouteCount = 6;

struct Application {
    std::string_view name;
    AudioServiceType service;
    double meanMinutes; ///< of a use
    int firstHour;      ///< of the day in which it is used
    int lastHour;
    bool isCall = false;
};

struct Route {
    std::string_view name;
    double meanVolume;
};

struct Kind {
    std::string_view name;
    std::string_view driver;
    double share; ///< of the fleet
    std::array<double, kApplicationCount> usesOfDay;
    std::array<double, kRouteCount> routes; ///< weights, of all but calls
    double thermalShare;                    ///< of sessions on a hot device
};

struct Release {
    std::string_view name;
    std::string_view driverVersion;
    double begins; ///< as a share of the days
};

[[nodiscard]] const std::array<Route, kRouteCount>& routes() noexcept;

inline constexpr std::size_t kHeadphones = 1; ///< among the routes
inline constexpr std::size_t kEarbuds = 2;

/// What is planted, for questions to find.
struct Faults {
    double overloadsOfHour = 0.2; ///< where nothing is wrong
    std::string_view badKind = "tablet";
    std::string_view badRelease = "4.2";
    double badOverloadsOfHour = 3.0; ///< with that release, on that kind
    double degradedShare = 0.03;     ///< of the devices
    double degradedFrom = 0.6;       ///< as a share of the days; likewise below
    double degradedOverloadsOfHour = 4.0;
    double silentShare = 0.03; ///< of the devices; nothing is heard of them any more
    double silentFrom = 0.7;
    std::string_view loudRelease = "4.3";
    double louderBy = 0.25; ///< what headphones of phones are with that release
    std::string_view hapticsRelease = "4.3";
    double hapticsFactor = 4.0; ///< by which the haptic engine runs longer with that release
    std::string_view chattyApplication = "com.example.assistant"; ///< says everything again and again
    int repetitions = 12;
    std::array<double, 2> accessoryLossOfDay{0.01, 0.08}; ///< by model
};

inline constexpr std::array<std::string_view, 2> kAccessoryModels{"bluetooth:00aa:0001:0100",
                                                                  "bluetooth:00bb:0002:0100"};

struct Accessory {
    std::size_t model = 0;
    int firstDay = 0;
    int endDay = 0; ///< not used from this day on
};

/// One device: what it is, and what happens to it.
struct Device {
    std::string name;
    const Kind* kind = nullptr;
    std::array<int, 3> releaseDays{}; ///< when it takes each release
    double volumeHabit = 0;           ///< louder than the average by
    std::optional<Accessory> accessory;
    std::optional<int> degradedFrom;
    std::optional<int> silentFrom;

    [[nodiscard]] const Release& releaseOn(int day) const noexcept;
    [[nodiscard]] bool hasAccessoryOn(int day) const noexcept;
    [[nodiscard]] double overloadsOfHourOn(int day, const Faults& faults) const noexcept;
};

/// One use of an application.
struct Use {
    const Application* application = nullptr;
    std::size_t route = 0;
    double start = 0; ///< seconds from midnight (UTC)
    double seconds = 0;
    double volume = 0;
    double overloadsOfHour = 0;
    double hapticsSeconds = 0; ///< for which the haptic engine runs
    int repetitions = 0;
    bool isGroup = false;
    bool isHot = false;
};

[[nodiscard]] Device makeDevice(std::size_t number, int days, const Faults& faults, Random& random);
/// In order, none of which overlaps another, all within the day.
[[nodiscard]] std::vector<Use> usesOf(const Device& device, int day, const Faults& faults, Random& random);

/// The next volume of a route, in the sixteenths that buttons have.
[[nodiscard]] double drawVolume(const Device& device, std::size_t route, int day, const Faults& faults,
                                Random& random);

} // namespace tamblo::bench::fleet
