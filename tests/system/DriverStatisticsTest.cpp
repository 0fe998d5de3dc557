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

using Name = std::optional<std::string>;

ChanlogChannel channelOf(ChanlogFormat format, Name group, Name subGroup = {}, Name name = "n") {
    ChanlogChannel channel;
    channel.format = format;
    channel.groupName = std::move(group);
    channel.subGroupName = std::move(subGroup);
    channel.channelName = std::move(name);
    return channel;
}
ChanlogChannel simple(std::int64_t value, Name group, Name subGroup = {}, Name name = "n") {
    ChanlogChannel channel =
        channelOf(ChanlogFormat::simple, std::move(group), std::move(subGroup), std::move(name));
    channel.value = value;
    return channel;
}

/// Sessions with their real workers on a device whose channels a test sets.
class DriverStatisticsTest : public testing::Test {
protected:
    std::shared_ptr<ZRReportingSession> startedSession() {
        auto session = device.makeSession();
        session->start();
        return session;
    }
    /// What sessions were sent of the drivers, oldest first, without what every message has.
    std::vector<std::string> sent() {
        std::vector<std::string> found;
        for (const auto& event : device.analyticsEvents.events()) {
            Dictionary payload = event.payload;
            for (const char* key :
                 {"HostApplicationDisplayID", "audiotag", "invalid_timestamp", "zrreporting_timestamp"}) {
                payload.remove(key);
            }
            if (event.name.starts_with("com.vandra.tamblo.Chanlog.")) {
                found.push_back(event.name.substr(26) + jsonText(payload));
            }
        }
        return found;
    }

    FakePlatform device;
};

TEST_F(DriverStatisticsTest, TheFirstStartSubscribesToTheGroupsThatThereAre) {
    device.chanlog.channels = {simple(1, "Speaker"), simple(1, "x", "MCA"), simple(1, "Haptics"),
                               simple(1, "Haptics", "Stats")};
    const auto session = startedSession();
    EXPECT_EQ(device.chanlog.calls, "|VandraAE2MCA- Speaker- -MCA Haptics-Stats StateTransitionTimes_ms- Rx- "
                                    "Tx- -VXA2 pdm- |sss");
    device.chanlog.channels.push_back(simple(1, "pdm"));
    device.chanlog.calls.clear();
    const auto later = startedSession();
    EXPECT_EQ(device.chanlog.calls, "|sss") << "a group that comes later is not asked for";
}

TEST_F(DriverStatisticsTest, ADriverThatFailsIsAbsent) {
    device.chanlog.channels = {simple(5, "Speaker")};
    device.chanlog.channelsError = 13;
    EXPECT_THAT(Utility(device.chanlog).ioChannelSubscriptions(), IsEmpty());
    EXPECT_EQ(device.log.count("error 13 getting channels for driver Speaker-(null)"), 1U);
    device.chanlog.channelsError.reset();
    device.chanlog.subscribeError = 14;
    EXPECT_THAT(Utility(device.chanlog).ioChannelSubscriptions(), IsEmpty());
    EXPECT_EQ(device.log.count("error 14 creating subscription for Speaker-(null)"), 1U);

    device.chanlog.subscribeError.reset();
    const Utility utility(device.chanlog);
    ASSERT_EQ(utility.ioChannelSubscriptions().size(), 1U);
    const auto session = device.makeSession();
    const Utility::DriverSnapShot empty;
    for (const int code : {0, 15}) {
        device.chanlog.sampleError = code;
        EXPECT_THAT(utility.getSnapShot(), IsEmpty());
        utility.sendDriverLogsForSession(session, &empty);
        EXPECT_EQ(device.log.count("ChanlogCreateSamples error"), code == 0 ? 0U : 2U);
    }
    device.chanlog.sampleError.reset();
    utility.sendDriverLogsForSession(session, &empty);
    EXPECT_EQ(device.log.count("ChanlogCreateSamples error 2"), 1U) << "no sample to compare with";
    utility.sendDriverLogsForSession(session, nullptr);
    EXPECT_TRUE(device.chanlog.calls.ends_with("|s")) << "no snapshot, no difference";
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
                               channelOf(ChanlogFormat::invalid, "Speaker"),
                               channelOf(ChanlogFormat::simpleArray, "Speaker", "s"),
                               channelOf(static_cast<ChanlogFormat>(200), "Speaker")};
    const auto session = startedSession();
    EXPECT_THAT(sent(), IsEmpty());
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

    device.analyticsEvents.clear();
    device.chanlog.channels = {simple(0, "Speaker"), simple(-4, "Speaker", {}, "m")};
    session->start();
    session->stop();
    EXPECT_THAT(sent(), IsEmpty()) << "nothing moved, nothing is sent";
}

TEST_F(DriverStatisticsTest, KeysAreMadeOfTheCleanedNames) {
    const auto key = [](Name driver, Name group, Name subGroup, Name name) {
        ChanlogChannel channel = simple(1, std::move(group), std::move(subGroup), std::move(name));
        channel.driverName = std::move(driver);
        return Utility::getDriverStatsKey(channel, "Simple");
    };
    EXPECT_EQ(key("A_1 x<2><3>", "G<1>", "s_ s", "n_<m>"), "A1x_G<1>_ss_Simple_n<m>");
    EXPECT_EQ(key({}, {}, {}, {}), "Simple_");
    EXPECT_EQ(key("<1>", {}, "s", "n"), "_s_Simple_n") << "a driver's name, though nothing is left of it";
}

TEST_F(DriverStatisticsTest, HistogramsAndStatesAsText) {
    // The one text that comes of a channel; empty for none.
    const auto textOf = [](const ChanlogChannel& channel) {
        Stats stats;
        channel.format == ChanlogFormat::state ? Utility::processStateData(channel, stats)
                                               : Utility::processHistogramData(channel, stats);
        return stats.empty() ? "" : std::string(stats.begin()->second.stringValue());
    };
    const std::pair<std::vector<ChanlogBucket>, const char*> histograms[] = {
        {{}, ""},
        {{{0, 5, 0, 0}, {5, 9, 0, 0}}, ""},
        {{{5, 9, 0, 1}, {9, 12, 0, -1}}, "count=2,lower=0,upper=12,min=0,max=-1,unit=(null)::5-9:1;9-12:-1"},
        {{{-9, -5, 77, 2}}, "count=1,lower=-9,upper=0,min=0,max=-1,unit=(null)::-9--5:2"},
    };
    for (const auto& [buckets, text] : histograms) {
        ChanlogChannel channel = channelOf(ChanlogFormat::histogram, "g");
        channel.buckets = buckets;
        channel.maximum = -1;
        EXPECT_EQ(textOf(channel), text);
    }
    ChanlogChannel channel = channelOf(ChanlogFormat::state, "g");
    EXPECT_EQ(textOf(channel), "");
    channel.states = {{"a", 3, 1, 1.0 / 3}, {"b", 9, 0, 0}, {"c", 0, UINT64_MAX, 2.0 / 3}};
    EXPECT_EQ(textOf(channel), "name:a,transition:3,residency:1,duty_cycle:0.333333;"
                               "name:c,transition:0,residency:18446744073709551615,duty_cycle:0.666667;");
}

} // namespace
} // namespace tamblo
