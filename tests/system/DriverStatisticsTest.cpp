#include "base/Json.h"
#include "session/ZRReportingSession.h"
#include "system/ZRReportingSessionDriverSnapshotWorker.h"
#include "tests/fakes/FakePlatform.h"

#include <gmock/gmock.h>

#include <map>
#include <memory>
#include <string>
#include <vector>

namespace tamblo {
namespace {

using testing::ElementsAre;
using testing::IsEmpty;
using Utility = ZRReportingDriverUtility;
using Stats = Utility::DriverStats;

constexpr auto kUnknownFormat = static_cast<ChanlogFormat>(200);

ChanlogChannel channelOf(ChanlogFormat format, std::optional<std::string> group,
                         std::optional<std::string> subGroup, std::optional<std::string> name = "n") {
    ChanlogChannel channel;
    channel.format = format;
    channel.groupName = std::move(group);
    channel.subGroupName = std::move(subGroup);
    channel.channelName = std::move(name);
    return channel;
}
ChanlogChannel simple(std::int64_t value, std::optional<std::string> group,
                      std::optional<std::string> subGroup = {}, std::string name = "n") {
    ChanlogChannel channel =
        channelOf(ChanlogFormat::simple, std::move(group), std::move(subGroup), std::move(name));
    channel.value = value;
    return channel;
}

/// The one text that comes of a channel; empty for none.
std::string textOf(const ChanlogChannel& channel,
                   void (*process)(const ChanlogChannel& channel, Stats& driverStats)) {
    Stats stats;
    process(channel, stats);
    return stats.empty() ? "" : std::string(stats.begin()->second.stringValue());
}

/// Sessions with their real workers on a device whose channels a test sets.
class DriverStatisticsTest : public testing::Test {
protected:
    std::shared_ptr<ZRReportingSession> startedSession() {
        auto session = device.makeSession(7, {100});
        session->start();
        return session;
    }
    /// What sessions were sent of the drivers, oldest first, without what every message has.
    std::vector<std::string> sent() {
        std::vector<std::string> found;
        for (const std::string type : {"Simple", "Histogram", "State"}) {
            for (Dictionary payload : device.analyticsEvents.payloads("com.vandra.tamblo.Chanlog." + type)) {
                for (const char* key :
                     {"HostApplicationDisplayID", "audiotag", "invalid_timestamp", "zrreporting_timestamp"}) {
                    payload.remove(key);
                }
                found.push_back(type + jsonText(payload));
            }
        }
        return found;
    }
    /// Of the utility's category, with the level as a digit.
    std::vector<std::string> lines() {
        std::vector<std::string> found;
        for (const FakeLog::Line& line : device.log.lines()) {
            if (line.category == "zrrd") {
                found.push_back(std::to_string(static_cast<int>(line.level)) + " " + line.text);
            }
        }
        device.log.clear();
        return found;
    }

    FakePlatform device{LogLevel::debug};
};

TEST_F(DriverStatisticsTest, TheFirstStartSubscribesToTheGroupsThatThereAre) {
    device.chanlog.channels = {simple(1, "Speaker"), simple(1, "x", "MCA"), simple(1, "Haptics"),
                               simple(1, "Haptics", "Stats")};
    const auto session = startedSession();
    EXPECT_EQ(device.chanlog.calls, "|VandraAE2MCA- Speaker- -MCA Haptics-Stats StateTransitionTimes_ms- Rx- "
                                    "Tx- -VXA2 pdm- |sss");
    EXPECT_EQ(device.context()
                  .shared<Utility>(device.chanlog)
                  .ioChannelSubscriptions()[1]
                  .subscribedChannels()
                  ->size(),
              1U);

    device.chanlog.channels.push_back(simple(1, "pdm"));
    device.chanlog.calls.clear();
    const auto later = startedSession();
    EXPECT_EQ(device.chanlog.calls, "|sss") << "a group that comes later is not asked for";
}

TEST_F(DriverStatisticsTest, ADriverThatFailsIsAbsent) {
    device.chanlog.channels = {simple(5, "Speaker")};
    device.chanlog.channelsError = 13;
    EXPECT_THAT(Utility(device.chanlog).ioChannelSubscriptions(), IsEmpty());
    EXPECT_EQ(lines()[2], "3 error 13 getting channels for driver Speaker-(null)");
    device.chanlog.channelsError.reset();
    device.chanlog.subscribeError = 14;
    EXPECT_THAT(Utility(device.chanlog).ioChannelSubscriptions(), IsEmpty());
    EXPECT_EQ(lines()[2], "3 error 14 creating subscription for Speaker-(null)");

    device.chanlog.subscribeError.reset();
    const Utility utility(device.chanlog);
    const auto session = device.makeSession(7, {100});
    (void)lines();
    for (const auto& [code, line] : {std::pair(0, ""), std::pair(15, "3 ChanlogCreateSamples error 15")}) {
        device.chanlog.sampleError = code;
        EXPECT_THAT(utility.getSnapShot(), IsEmpty());
        const Utility::DriverSnapShot empty;
        utility.sendDriverLogsForSession(session, &empty);
        const std::vector<std::string> seen = lines();
        EXPECT_EQ(std::count(seen.begin(), seen.end(), line), code == 0 ? 0 : 2);
    }
    device.chanlog.sampleError.reset();
    const Utility::DriverSnapShot empty;
    utility.sendDriverLogsForSession(session, &empty);
    EXPECT_THAT(lines(), ElementsAre("1 getting latest samples", "1 done getting latest samples",
                                     "3 ChanlogCreateSamples error 2"));
    utility.sendDriverLogsForSession(session, nullptr);
    EXPECT_EQ(lines().size(), 2U) << "no snapshot, no difference";
    EXPECT_TRUE(device.chanlog.calls.ends_with("|s"));
    EXPECT_EQ(session->totalMessageCount(), 0);
}

TEST_F(DriverStatisticsTest, AStopSendsWhatWasGainedKindByKind) {
    ChanlogChannel histogram = channelOf(ChanlogFormat::histogram, "Speaker", "Thermal Zone_1", "coil temp");
    histogram.driverName = "Speaker_Amp<2>";
    histogram.unitLabel = "C";
    histogram.buckets = {{.lower = 0, .upper = 10, .hits = 3}, {.lower = 10, .upper = 20, .hits = 0}};
    histogram.minimum = 1;
    histogram.maximum = 9;
    ChanlogChannel state = channelOf(ChanlogFormat::state, "Speaker", {}, "power");
    state.states = {{.name = "off", .transitions = 2, .residency = 0, .dutyCycle = 0},
                    {.name = "on", .transitions = 1, .residency = 75, .dutyCycle = 1}};
    device.chanlog.channels = {state,
                               histogram,
                               simple(4, "Speaker", "MCA", "a_b c"),
                               simple(0, "Speaker", {}, "idle"),
                               channelOf(ChanlogFormat::invalid, "Speaker", {}),
                               channelOf(ChanlogFormat::simpleArray, "Speaker", "s"),
                               channelOf(kUnknownFormat, "Speaker", {})};
    const auto session = startedSession();
    EXPECT_THAT(sent(), IsEmpty());
    (void)lines();
    device.chanlog.calls.clear();
    session->stop();
    EXPECT_EQ(device.chanlog.calls, "|sdsd") << "one pass";
    EXPECT_THAT(
        sent(),
        ElementsAre(
            R"(Simple{"Speaker_MCA_Simple_abc":4})",
            R"(Histogram{"SpeakerAmp_Speaker_ThermalZone1_Histogram_coiltemp":)"
            R"("count=2,lower=0,upper=20,min=1,max=9,unit=C::0-10:3"})",
            R"(State{"Speaker_State_power":"name:on,transition:1,residency:75,duty_cycle:1.000000;"})"));
    EXPECT_THAT(lines(), testing::IsSupersetOf(
                             {"1 Dropping sample of type : 4 for group : Speaker subgroup : s",
                              "1 The ChanlogFormat 200 is not supported group : Speaker subgroup : (null)"}));

    device.analyticsEvents.clear();
    device.chanlog.channels = {simple(0, "Speaker"), simple(-4, "Speaker", {}, "m")};
    session->start();
    session->stop();
    EXPECT_THAT(sent(), IsEmpty()) << "nothing moved, nothing is sent";
}

TEST_F(DriverStatisticsTest, KeysAreMadeOfTheCleanedNames) {
    const auto key = [](std::optional<std::string> driver, std::optional<std::string> group,
                        std::optional<std::string> subGroup, std::optional<std::string> name) {
        ChanlogChannel channel =
            channelOf(ChanlogFormat::simple, std::move(group), std::move(subGroup), std::move(name));
        channel.driverName = std::move(driver);
        return Utility::getDriverStatsKey(channel, "Simple");
    };
    EXPECT_EQ(key("A_1 x<2><3>", "G<1>", "s_ s", "n_<m>"), "A1x_G<1>_ss_Simple_n<m>");
    EXPECT_EQ(key({}, {}, {}, {}), "Simple_");
    EXPECT_EQ(key("<1>", {}, "s", "n"), "_s_Simple_n") << "a driver's name, though nothing is left of it";
}

TEST_F(DriverStatisticsTest, HistogramsAndStatesAsText) {
    const auto histogram = [](std::vector<ChanlogBucket> buckets) {
        ChanlogChannel channel = channelOf(ChanlogFormat::histogram, "g", {});
        channel.buckets = std::move(buckets);
        channel.maximum = -1;
        return textOf(channel, Utility::processHistogramData);
    };
    EXPECT_EQ(histogram({}), "");
    EXPECT_EQ(histogram({{0, 5, 0, 0}, {5, 9, 0, 0}}), "");
    EXPECT_EQ(histogram({{5, 9, 0, 1}, {9, 12, 0, -1}}), "count=2,lower=0,upper=12,min=0,max=-1,unit=(null)::"
                                                         "5-9:1;9-12:-1");
    EXPECT_EQ(histogram({{-9, -5, 77, 2}}), "count=1,lower=-9,upper=0,min=0,max=-1,unit=(null)::-9--5:2");
    EXPECT_THAT(lines(), ElementsAre("1 Error in getting the bucket bounds : 77"));

    ChanlogChannel channel = channelOf(ChanlogFormat::state, "g", {});
    EXPECT_EQ(textOf(channel, Utility::processStateData), "");
    channel.states = {{"a", 3, 1, 1.0 / 3}, {"b", 9, 0, 0}, {"c", 0, UINT64_MAX, 2.0 / 3}};
    EXPECT_EQ(textOf(channel, Utility::processStateData),
              "name:a,transition:3,residency:1,duty_cycle:0.333333;"
              "name:c,transition:0,residency:18446744073709551615,duty_cycle:0.666667;");
}

} // namespace
} // namespace tamblo
