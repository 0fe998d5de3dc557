#include "FleetModel.h"

#include <algorithm>
#include <cmath>
#include <cstdio>

namespace tamblo::bench::fleet {

namespace {

constexpr AudioServiceType kLongForm = 7;
constexpr AudioServiceType kNonLongForm = 8;
constexpr double kDay = 86'400;
constexpr double kBetweenUses = 30;
/// The device's own session begins before the first use of a day and ends after the last.
constexpr double kFirstSecond = 120;
constexpr double kLastSecond = kDay - 120;
constexpr std::size_t kGame = 3;
constexpr std::size_t kVideo = 2;

constexpr std::array<Application, kApplicationCount> kApplications{{
    {"com.example.music", kLongForm, 40, 6, 23},
    {"com.example.podcasts", kLongForm, 30, 6, 22},
    {"com.example.video", kLongForm, 50, 11, 23},
    {"com.example.game", kNonLongForm, 20, 14, 23},
    {"com.example.phone", AudioServiceTypeTelephony, 8, 8, 21, true},
    {"com.example.alarm", AudioServiceTypeAlarms, 0.7, 5, 9},
    {"com.example.assistant", kNonLongForm, 0.4, 7, 22},
}};

constexpr std::array<Route, kRouteCount> kRoutes{{
    {"Speaker", 0.55},
    {"Headphones", 0.45},
    {"Wireless Earbuds", 0.5},
    {"HDMI", 0.6},
    {"Car", 0.7},
    {"Receiver", 0.6},
}};

constexpr std::array<Kind, 4> kKinds{{
    {"phone", "codec-a", 0.5, {1.8, 0.7, 0.6, 0.6, 1.4, 0.7, 0.5}, {0.3, 0.25, 0.35, 0, 0.1, 0}, 0.02},
    {"tablet", "codec-b", 0.2, {0.5, 0.3, 1.2, 0.9, 0.2, 0.1, 0.2}, {0.6, 0.25, 0.15, 0, 0, 0}, 0.02},
    {"speaker", "dac-c", 0.2, {2.4, 0.6, 0, 0, 0, 0.8, 2}, {1, 0, 0, 0, 0, 0}, 0},
    {"tv", "hdmi-d", 0.1, {0.3, 0, 2.2, 0.4, 0, 0, 0.4}, {0.3, 0, 0, 0.7, 0, 0}, 0.1},
}};

constexpr std::array<Release, 3> kReleases{{{"4.1", "2.0", 0}, {"4.2", "2.1", 0.3}, {"4.3", "2.2", 0.7}}};

double clampedVolume(double volume) {
    constexpr double kSteps = 16;
    return std::clamp(std::round(volume * kSteps), 1.0, kSteps) / kSteps;
}

std::size_t drawRoute(const Device& device, const Application& application, int day, Random& random) {
    constexpr std::array<double, kRouteCount> kOfCalls{0.1, 0.1, 0.2, 0, 0, 0.6};
    std::array<double, kRouteCount> weights = application.isCall ? kOfCalls : device.kind->routes;
    if (!device.hasAccessoryOn(day)) {
        weights[kEarbuds] = 0;
    }
    return random.pick(weights);
}

} // namespace

const std::array<Route, kRouteCount>& routes() noexcept {
    return kRoutes;
}

const Release& Device::releaseOn(int day) const noexcept {
    std::size_t latest = 0;
    for (std::size_t i = 0; i != kReleases.size(); ++i) {
        latest = releaseDays[i] <= day ? i : latest;
    }
    return kReleases[latest];
}

bool Device::hasAccessoryOn(int day) const noexcept {
    return accessory && day >= accessory->firstDay && day < accessory->endDay;
}

double Device::overloadsOfHourOn(int day, const Faults& faults) const noexcept {
    if (degradedFrom && day >= *degradedFrom) {
        return faults.degradedOverloadsOfHour;
    }
    const bool isBad = kind->name == faults.badKind && releaseOn(day).name == faults.badRelease;
    return isBad ? faults.badOverloadsOfHour : faults.overloadsOfHour;
}

Device makeDevice(std::size_t number, int days, const Faults& faults, Random& random) {
    constexpr double kMeanDaysToRelease = 1.5;
    constexpr double kAccessoryShare = 0.7;
    Device device;
    std::array<char, 32> name{};
    static_cast<void>(std::snprintf(name.data(), name.size(), "fleet-%06zu", number));
    device.name = name.data();
    std::array<double, kKinds.size()> shares{};
    std::ranges::transform(kKinds, shares.begin(), &Kind::share);
    device.kind = &kKinds[random.pick(shares)];
    for (std::size_t i = 1; i != kReleases.size(); ++i) {
        device.releaseDays[i] =
            static_cast<int>(kReleases[i].begins * days + random.waitOf(kMeanDaysToRelease));
    }
    device.volumeHabit = random.normal(0, 0.08);
    if (device.kind->routes[kEarbuds] > 0 && random.happens(kAccessoryShare)) {
        const auto model = static_cast<std::size_t>(random.happens(0.4));
        const int first = static_cast<int>(random.fraction() * days / 2);
        const double used = random.waitOf(1 / faults.accessoryLossOfDay[model]);
        device.accessory = Accessory{model, first, first + 1 + static_cast<int>(used)};
    }
    if (random.happens(faults.degradedShare)) {
        device.degradedFrom = static_cast<int>(faults.degradedFrom * days);
    } else if (random.happens(faults.silentShare)) {
        device.silentFrom = static_cast<int>(faults.silentFrom * days);
    }
    return device;
}

double drawVolume(const Device& device, std::size_t route, int day, const Faults& faults, Random& random) {
    const bool isLouder = route == kHeadphones && device.kind->name == "phone" &&
                          device.releaseOn(day).name == faults.loudRelease;
    return clampedVolume(random.normal(kRoutes[route].meanVolume, 0.1) + device.volumeHabit +
                         (isLouder ? faults.louderBy : 0));
}

std::vector<Use> usesOf(const Device& device, int day, const Faults& faults, Random& random) {
    constexpr double kGroupShare = 0.1;
    constexpr double kHapticsShare = 0.02;
    std::vector<Use> uses;
    for (std::size_t i = 0; i != kApplications.size(); ++i) {
        const Application& application = kApplications[i];
        for (int left = random.count(device.kind->usesOfDay[i]); left != 0; --left) {
            Use use{.application = &application, .route = drawRoute(device, application, day, random)};
            use.start = random.between(application.firstHour, application.lastHour) * 3600;
            use.seconds = 3 + random.waitOf(application.meanMinutes * 60);
            use.volume = drawVolume(device, use.route, day, faults, random);
            use.overloadsOfHour = device.overloadsOfHourOn(day, faults);
            if (i == kGame) {
                const bool isStuck = device.releaseOn(day).name == faults.hapticsRelease;
                use.hapticsSeconds = use.seconds * kHapticsShare * (isStuck ? faults.hapticsFactor : 1);
            }
            use.repetitions = application.name == faults.chattyApplication ? faults.repetitions : 0;
            use.isGroup = i == kVideo && random.happens(kGroupShare);
            use.isHot = random.happens(device.kind->thermalShare);
            uses.push_back(use);
        }
    }
    std::ranges::sort(uses, {}, &Use::start);
    double free = kFirstSecond;
    for (Use& use : uses) {
        use.start = std::max(use.start, free);
        use.seconds = std::min(use.seconds, kLastSecond - use.start);
        free = use.start + std::max(use.seconds, 0.0) + kBetweenUses;
    }
    std::erase_if(uses, [](const Use& use) { return use.seconds < 2; });
    return uses;
}

} // namespace tamblo::bench::fleet
