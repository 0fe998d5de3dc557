#include "system/ZRReportingSessionDriverSnapshotWorker.h"
#include "tests/workers/WorkerTest.h"

namespace tamblo {
namespace {

using Utility = ZRReportingDriverUtility;
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
    auto channel = channelOf(ChanlogFormat::simple, std::move(group), std::move(subGroup), std::move(name));
    channel.value = value;
    return channel;
}

class DriverStatisticsTest : public WorkerTest {
protected:
    /// What sessions were sent of the drivers, without what every message has.
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
};

TEST_F(DriverStatisticsTest, TheFirstStartSubscribesToTheGroupsThatThereAre) {
    device.chanlog.channels = {simple(1, "Speaker"), simple(1, "x", "MCA"), simple(1, "Haptics"),
                               simple(1, "Haptics", "Stats")};
    const auto first = startedSession();
    EXPECT_EQ(device.chanlog.calls, "|VandraAE2MCA- Speaker- -MCA Haptics-Stats StateTransitionTimes_ms- Rx- "
                                    "Tx- -VXA2 pdm- |sss");
    device.chanlog.channels.push_back(simple(1, "pdm"));
    device.chanlog.calls.clear();
    const auto later = startedSession();
    EXPECT_EQ(device.chanlog.calls, "|sss") << "a group that comes later is not asked for";
}

TEST_F(DriverStatisticsTest, ADriverThatFailsIsAbsent) {
    FakeChanlogFacility& chanlog = device.chanlog;
    chanlog.channels = {simple(5, "Speaker")};
    chanlog.channelsError = 13;
    EXPECT_THAT(Utility(chanlog).ioChannelSubscriptions(), IsEmpty());
    EXPECT_EQ(device.log.count("error 13 getting channels for driver Speaker-(null)"), 1U);
    chanlog.channelsError.reset();
    chanlog.subscribeError = 14;
    EXPECT_THAT(Utility(chanlog).ioChannelSubscriptions(), IsEmpty());
    EXPECT_EQ(device.log.count("error 14 creating subscription for Speaker-(null)"), 1U);

    chanlog.subscribeError.reset();
    const Utility utility(chanlog);
    EXPECT_THAT(utility.ioChannelSubscriptions(), SizeIs(1));
    const Utility::DriverSnapShot empty;
    for (const int code : {0, 15}) {
        chanlog.sampleError = code;
        EXPECT_THAT(utility.getSnapShot(), IsEmpty());
        utility.sendDriverLogsForSession(session, &empty);
        EXPECT_EQ(device.log.count("ChanlogCreateSamples error"), code == 0 ? 0U : 2U);
    }
    chanlog.sampleError.reset();
    utility.sendDriverLogsForSession(session, &empty);
    EXPECT_EQ(device.log.count("ChanlogCreateSamples error 2"), 1U) << "no sample to compare with";
    utility.sendDriverLogsForSession(session, nullptr);
    EXPECT_TRUE(chanlog.calls.ends_with("|s")) << "no snapshot, no difference";
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
                    {.name = "on", .transitions = 1, .residency = UINT64_MAX, .dutyCycle = 1.0 / 3},
                    {.name = "low", .transitions = 0, .residency = 1, .dutyCycle = 2.0 / 3}};
    device.chanlog.channels = {state,
                               histogram,
                               simple(4, "Speaker", "MCA", "a_b c"),
                               simple(0, "Speaker", {}, "idle"),
                               channelOf(ChanlogFormat::invalid, "Speaker"),
                               channelOf(ChanlogFormat::simpleArray, "Speaker", "s"),
                               channelOf(static_cast<ChanlogFormat>(200), "Speaker")};
    session->start();
    EXPECT_THAT(sent(), IsEmpty());
    device.chanlog.calls.clear();
    session->stop();
    EXPECT_EQ(device.chanlog.calls, "|sdsd") << "one pass";
    EXPECT_THAT(sent(), ElementsAre(R"(Simple{"Speaker_MCA_Simple_abc":4})",
                                    R"(Histogram{"SpeakerAmp_Speaker_ThermalZone1_Histogram_coiltemp":)"
                                    R"("count=2,lower=0,upper=20,min=1,max=9,unit=C::0-10:3"})",
                                    R"(State{"Speaker_State_power":"name:on,transition:1,)"
                                    R"(residency:18446744073709551615,duty_cycle:0.333333;)"
                                    R"(name:low,transition:0,residency:1,duty_cycle:0.666667;"})"));

    device.analyticsEvents.clear();
    state.states.resize(1);
    device.chanlog.channels = {simple(0, "Speaker"), simple(-4, "Speaker", {}, "m"), state};
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

TEST_F(DriverStatisticsTest, HistogramsAsText) {
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
        Utility::DriverStats stats;
        Utility::processHistogramData(channel, stats);
        EXPECT_EQ(stats.empty() ? "" : stats.begin()->second.stringValue(), text);
    }
}

} // namespace
} // namespace tamblo
