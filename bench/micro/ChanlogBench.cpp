#include "../TemporaryDirectory.h"

#include "platform/linux/drivers/LinuxChanlogFacility.h"
#include "session/ZRReportingSession.h"
#include "system/ZRReportingDriverUtility.h"
#include "tests/fakes/FakePlatform.h"

#include <benchmark/benchmark.h>

#include <array>
#include <chrono>
#include <memory>
#include <string>
#include <thread>

// What driver statistics cost a session's start and stop: ten drivers with twenty channels each, of all
// formats, spread over the nine groups that are sampled.

namespace tamblo::bench {

namespace {

constexpr int kDrivers = 10;
constexpr int kChannelsOfDriver = 20;
/// Long enough for the kept content of a file to be certain.
constexpr std::chrono::milliseconds kUntilCertain = 3 * FileState::kCertainAge;

constexpr std::array<const char*, 9> kGroups{
    R"("group": "VandraAE2MCA")", R"("group": "Speaker")",
    R"("subgroup": "MCA")",       R"("group": "Haptics", "subgroup": "Stats")",
    R"("group": "pdm")",          R"("group": "StateTransitionTimes_ms")",
    R"("group": "Rx")",           R"("group": "Tx")",
    R"("subgroup": "VXA2")"};

/// Figures that have moved further on with every round.
std::string driverChannels(int driver, int round) {
    std::string channels;
    for (int i = 0; i < kChannelsOfDriver; ++i) {
        const std::string count = std::to_string(12345 + round);
        const std::string group = kGroups[static_cast<std::size_t>(driver + i) % kGroups.size()];
        channels += (i == 0 ? "[{\"driver\": \"AudioDriver<" : ",\n {\"driver\": \"AudioDriver<") +
                    std::to_string(driver) + ">\", " + group + ", \"name\": \"channel " +
                    std::to_string(driver * kChannelsOfDriver + i) + "\", \"unit\": \"ms\", ";
        if (i % 3 == 0) {
            channels += R"("format": "simple", "value": )" + count + "}";
        } else if (i % 3 == 1) {
            channels += R"("format": "state", "states": [{"name": "idle", "transitions": )" + count +
                        R"(, "residency": )" + count + R"(}, {"name": "running", "transitions": )" + count +
                        R"(, "residency": )" + count + "}]}";
        } else {
            channels += R"("format": "histogram", "buckets": [{"lower": 0, "upper": 100, "hits": )" + count +
                        R"(}, {"lower": 100, "upper": 200, "hits": )" + count +
                        R"(}, {"lower": 200, "upper": 400, "hits": 0}], "min": 3, "max": 177})";
        }
    }
    return channels + "]\n";
}

class NoEvents final : public AnalyticsEventService {
public:
    [[nodiscard]] bool isEventInUse(std::string_view) override { return false; }
    [[nodiscard]] std::uint64_t inUseGeneration() const noexcept override { return 1; }
    void sendEventsLazy(std::span<const std::string_view>, const std::function<Dictionary()>&) override {}
};

/// A device whose channels come from files.
class ChannelDevice {
public:
    explicit ChannelDevice(int drivers) {
        directory_.makeDirectory("chanlog");
        for (int driver = 0; driver < drivers; ++driver) {
            publish(driver, 0);
        }
        device_.services().analyticsEvents = std::make_unique<NoEvents>();
        std::this_thread::sleep_for(kUntilCertain);
        utility_ = std::make_unique<ZRReportingDriverUtility>(facility_);
        snapShot_ = utility_->getSnapShot();
    }

    void publish(int driver, int round) const {
        directory_.write("chanlog/driver" + std::to_string(driver) + ".json", driverChannels(driver, round));
    }
    [[nodiscard]] std::shared_ptr<ZRReportingSession> makeSession() { return device_.makeSession(7, {1}); }
    [[nodiscard]] const ZRReportingDriverUtility& utility() const { return *utility_; }
    [[nodiscard]] const ZRReportingDriverUtility::DriverSnapShot& snapShot() const { return snapShot_; }

private:
    TemporaryDirectory directory_;
    FakePlatform device_{LogLevel::standard};
    LinuxChanlogFacility facility_{directory_.path() + "/chanlog", device_.log};
    std::unique_ptr<ZRReportingDriverUtility> utility_;
    ZRReportingDriverUtility::DriverSnapShot snapShot_;
};

/// What a session's start does.
void driverSnapshot(benchmark::State& state) {
    const ChannelDevice device(static_cast<int>(state.range(0)));
    for (auto _ : state) {
        benchmark::DoNotOptimize(device.utility().getSnapShot());
    }
}
BENCHMARK(driverSnapshot)->ArgName("files")->Arg(0)->Arg(kDrivers)->Unit(benchmark::kMicrosecond);

void driverSnapshotWithChangedFiles(benchmark::State& state) {
    const ChannelDevice device(kDrivers);
    int round = 0;
    for (auto _ : state) {
        state.PauseTiming();
        ++round;
        for (int driver = 0; driver < state.range(0); ++driver) {
            device.publish(driver, round);
        }
        state.ResumeTiming();
        benchmark::DoNotOptimize(device.utility().getSnapShot());
    }
}
BENCHMARK(driverSnapshotWithChangedFiles)
    ->ArgName("changed")
    ->Arg(1)
    ->Arg(kDrivers)
    ->Unit(benchmark::kMicrosecond);

/// What a session's stop does: the sample, the difference and the messages, which a session without consumers
/// records. All files changed during the session, as many as the argument says just before it stops.
void driverMessages(benchmark::State& state) {
    ChannelDevice device(static_cast<int>(state.range(0)));
    const auto session = device.makeSession();
    int round = 1;
    const auto publish = [&](std::int64_t drivers) {
        for (int driver = 0; driver < drivers; ++driver) {
            device.publish(driver, round);
        }
    };
    publish(state.range(0));
    std::this_thread::sleep_for(kUntilCertain);
    benchmark::DoNotOptimize(device.utility().getSnapShot());
    for (auto _ : state) {
        if (state.range(1) != 0) {
            state.PauseTiming();
            ++round;
            publish(state.range(1));
            state.ResumeTiming();
        }
        device.utility().sendDriverLogsForSession(session, &device.snapShot());
    }
}
BENCHMARK(driverMessages)
    ->ArgNames({"files", "changed"})
    ->Args({0, 0})
    ->Args({kDrivers, 0})
    ->Args({kDrivers, 1})
    ->Args({kDrivers, kDrivers})
    ->Unit(benchmark::kMicrosecond);

} // namespace

} // namespace tamblo::bench
