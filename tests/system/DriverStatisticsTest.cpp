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
    chanlog.channelsError.reset();
    chanlog.subscribeError = 14;
    EXPECT_THAT(Utility(chanlog).ioChannelSubscriptions(), IsEmpty());
    EXPECT_EQ(device.log.count("error 13 getting channels for driver Speaker-(null)"), 1U);
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
    histogram.driverName = "Speaker_Amp<2><3>";
    histogram.unitLabel = "C";
    histogram.buckets = {{.lower = 0, .upper = 10, .hits = 3}, {.lower = 10, .upper = 20, .hits = 0}};
    histogram.minimum = 1;
    histogram.maximum = 9;
    ChanlogChannel below = channelOf(ChanlogFormat::histogram, "Speaker", {}, "below");
    below.buckets = {{-9, -5, 77, 2}, {-5, -4, 0, -1}};
    below.maximum = -1;
    ChanlogChannel state = channelOf(ChanlogFormat::state, "Speaker", {}, "power");
    state.states = {{.name = "off", .transitions = 2, .residency = 0, .dutyCycle = 0},
                    {.name = "on", .transitions = 1, .residency = UINT64_MAX, .dutyCycle = 1.0 / 3},
                    {.name = "low", .transitions = 0, .residency = 1, .dutyCycle = 2.0 / 3}};
    device.chanlog.channels = {state,
                               histogram,
                               below,
                               simple(4, "Speaker<1>", "MCA", "a_b <c>"),
                               simple(7, {}, "MCA", {}),
                               simple(0, "Speaker", {}, "idle"),
                               channelOf(ChanlogFormat::invalid, "Speaker"),
                               channelOf(ChanlogFormat::simpleArray, "Speaker", "s"),
                               channelOf(static_cast<ChanlogFormat>(200), "Speaker")};
    session->start();
    device.chanlog.calls.clear();
    session->stop();
    EXPECT_EQ(device.chanlog.calls, "|sdsd") << "one pass";
    EXPECT_THAT(sent(),
                ElementsAre(R"(Simple{"MCA_Simple_":7,"Speaker<1>_MCA_Simple_ab<c>":4})",
                            R"(Histogram{"SpeakerAmp_Speaker_ThermalZone1_Histogram_coiltemp":)"
                            R"("count=2,lower=0,upper=20,min=1,max=9,unit=C::0-10:3",)"
                            R"("Speaker_Histogram_below":)"
                            R"("count=2,lower=-9,upper=0,min=0,max=-1,unit=(null)::-9--5:2;-5--4:-1"})",
                            R"(State{"Speaker_State_power":"name:on,transition:1,)"
                            R"(residency:18446744073709551615,duty_cycle:0.333333;)"
                            R"(name:low,transition:0,residency:1,duty_cycle:0.666667;"})"));

    device.analyticsEvents.clear();
    state.states.resize(1);
    histogram.buckets[0].hits = 0;
    device.chanlog.channels = {simple(0, "Speaker"), simple(-4, "Speaker", {}, "m"), state, histogram};
    session->start();
    session->stop();
    EXPECT_THAT(sent(), IsEmpty()) << "nothing moved, nothing is sent";
}

} // namespace
} // namespace tamblo
