#include "platform/linux/device/LinuxDeviceConditions.h"
#include "platform/linux/device/LinuxProcessInformation.h"
#include "tests/platform/LinuxServiceSupport.h"

#include <gmock/gmock.h>

#include <array>
#include <cerrno>
#include <chrono>
#include <cstdint>
#include <cstring>
#include <ctime>
#include <filesystem>
#include <fstream>
#include <sstream>
#include <string>
#include <string_view>
#include <variant>

namespace tamblo {
namespace {

using namespace std::chrono_literals;

/// Thermal zones in a directory in place of `/sys`. Words: `/NAME` begins a zone, `FILE=TEXT` is a file of
/// it, `N:TYPE@TEMPERATURE` its trip point of that number.
void makeZones(const TemporaryDirectory& root, const std::string& description) {
    std::istringstream words(description);
    std::string zone;
    for (std::string word; words >> word;) {
        if (word.front() == '/') {
            zone = "class/thermal" + word + "/";
            std::filesystem::create_directories(root.path(zone));
        } else if (const std::size_t at = word.find('@'); at != std::string::npos) {
            const std::size_t colon = word.find(':');
            const std::string trip = zone + "trip_point_" + word.substr(0, colon);
            root.write(trip + "_type", word.substr(colon + 1, at - colon - 1) + "\n");
            root.write(trip + "_temp", word.substr(at + 1) + "\n");
        } else {
            const std::size_t equals = word.find('=');
            root.write(zone + word.substr(0, equals), word.substr(equals + 1) + "\n");
        }
    }
}

TEST(LinuxDeviceConditionsTest, TheWorstTripPointReachedIsTheThermalState) {
    const std::pair<const char*, int> cases[] = {
        {"", 0},
        {"/thermal_zone0 temp=59999 0:active@60000", 0},
        {"/thermal_zone0 temp=60000 0:active@60000", 1},
        {"/thermal_zone0 temp=60000 0:passive@60000", 2},
        {"/thermal_zone0 temp=60000 0:hot@60000", 3},
        {"/thermal_zone0 temp=60000 0:critical@60000", 3},
        {"/thermal_zone0 temp=60000 0:other@50000", 0},
        {"/thermal_zone0 temp=80000 0:critical@105000 1:passive@80000 2:active@50000", 2},
        {"/thermal_zone0 temp=80000 0:active@50000 13:hot@80000", 3},
        {"/thermal_zone0 temp=50 0:active@50 /thermal_zone1 temp=60 0:passive@60 /thermal_zone2 temp=1", 2},
        {"/thermal_zone0 mode=disabled temp=60000 0:hot@60000", 0},
        {"/thermal_zone0 temp=60000 0:hot@0 1:critical@-274000 2:passive@ 3:hot@5x 4:active@1", 1},
        {"/thermal_zone0 0:hot@1 /thermal_zone1 temp= 0:hot@1 /thermal_zone2 temp=9x 0:hot@1", 0},
        {"/cooling_device0 temp=60000 0:hot@60000", 0},
    };
    for (const auto& [zones, expected] : cases) {
        const TemporaryDirectory root;
        makeZones(root, zones);
        EXPECT_EQ(LinuxDeviceConditions(root.path()).thermalState(), expected) << zones;
    }
}

TEST(LinuxDeviceConditionsTest, OnlyTheSavingProfileIsLowPower) {
    const TemporaryDirectory root;
    std::filesystem::create_directories(root.path("firmware/acpi"));
    EXPECT_FALSE(LinuxDeviceConditions(root.path()).isLowPowerModeEnabled());
    for (const std::string profile : {"low-power\n", "low-power", "balanced\n", "quiet\n", "cool\n",
                                      "low-power-max\n", "performance low-power\n", ""}) {
        root.write("firmware/acpi/platform_profile", profile);
        EXPECT_EQ(LinuxDeviceConditions(root.path()).isLowPowerModeEnabled(),
                  profile == "low-power\n" || profile == "low-power")
            << profile;
    }
}

TEST(LinuxDeviceConditionsTest, AReadingStandsForASecond) {
    const TemporaryDirectory root;
    std::chrono::steady_clock::time_point now{};
    makeZones(root, "/thermal_zone0 temp=10 0:passive@50");
    std::filesystem::create_directories(root.path("firmware/acpi"));
    const LinuxDeviceConditions conditions(root.path(), [&now] { return now; });
    EXPECT_EQ(conditions.thermalState(), 0);
    EXPECT_FALSE(conditions.isLowPowerModeEnabled());
    root.write("class/thermal/thermal_zone0/temp", "50");
    root.write("firmware/acpi/platform_profile", "low-power");
    now += 999ms;
    EXPECT_EQ(conditions.thermalState(), 0);
    EXPECT_FALSE(conditions.isLowPowerModeEnabled());
    now += 1ms;
    EXPECT_EQ(conditions.thermalState(), 2);
    EXPECT_TRUE(conditions.isLowPowerModeEnabled());
}

/// The footprint, or minus the error's code.
std::int64_t footprint(const LinuxProcessInformation& information) {
    const auto result = information.physicalFootprint();
    const auto* bytes = std::get_if<std::uint64_t>(&result);
    if (bytes != nullptr) {
        return static_cast<std::int64_t>(*bytes);
    }
    const auto& error = std::get<ProcessInformation::QueryError>(result);
    EXPECT_EQ(error.text, std::strerror(error.code));
    return -error.code;
}

TEST(LinuxProcessInformationTest, TheFootprintIsWhatFilesCannotGiveBack) {
    const std::pair<const char*, std::int64_t> cases[] = {
        {"Name:\tx\nVmRSS:\t 99 kB\nRssAnon:\t   5 kB\nRssFile:\t 70 kB\nRssShmem:\t 2 kB\nVmSwap:\t 3 kB\n",
         10 * 1024},
        {"Name:\tx\nVmRSS:\t8388608 kB\nRssAnon:\t8388608 kB\n", 8LL << 30},
        {"Name:\tRssAnon: 5 kB\nVmRSS:\t99 kB\n", -ENODATA},
        {"Name:\tx\nVmRSS:\t99 kB\nRssAnon:", -ENODATA},
        {"", -ENODATA},
    };
    const TemporaryDirectory root;
    std::chrono::steady_clock::time_point now{};
    const LinuxProcessInformation information(root.path(), [&now] { return now; });
    EXPECT_EQ(footprint(information), -ENOENT);
    std::filesystem::create_directory(root.path("self"));
    for (const auto& [status, expected] : cases) {
        root.write("self/status", status);
        const std::int64_t before = footprint(information);
        now += 99ms;
        EXPECT_EQ(footprint(information), before) << status;
        now += 1ms;
        EXPECT_EQ(footprint(information), expected) << status;
    }
    std::filesystem::remove(root.path("self/status"));
    std::filesystem::create_directory(root.path("self/status"));
    EXPECT_EQ(footprint(LinuxProcessInformation(root.path())), -EISDIR);
}

TEST(LinuxProcessInformationTest, TimesAreTheKernels) {
    const LinuxProcessInformation information;
    double before = 0, after = 0;
    std::ifstream("/proc/uptime") >> before;
    const double uptime = information.systemUptime().count();
    std::ifstream("/proc/uptime") >> after;
    EXPECT_GE(uptime, before);
    EXPECT_LE(uptime, after + 0.01) << "the kernel shows hundredths";

    const std::chrono::microseconds usedBefore(std::clock());
    const std::chrono::microseconds used = information.processorTime();
    EXPECT_GE(used, usedBefore);
    EXPECT_LE(used, std::chrono::microseconds(std::clock()));
}

TEST(LinuxProcessInformationTest, LoadAveragesAreTheKernels) {
    std::array<double, 3> before{}, loads{}, after{};
    const auto read = [](std::array<double, 3>& out) {
        std::ifstream("/proc/loadavg") >> out[0] >> out[1] >> out[2];
    };
    do { // the kernel renews them every five seconds
        read(before);
        loads = LinuxProcessInformation().loadAverages();
        read(after);
    } while (before != after);
    constexpr double kRounding = 0.0101;
    EXPECT_THAT(loads, testing::Pointwise(testing::DoubleNear(kRounding), before));
}

} // namespace
} // namespace tamblo
