#include "tests/service_core/ServiceTestBase.h"

#include <numeric>

namespace tamblo {
namespace {

using testing::ElementsAre;
using testing::IsEmpty;
using testing::SizeIs;

class LeavingClientsTest : public ServiceTestBase {
protected:
    LeavingClientsTest() {
        script.atStop["Producer"] = [this](ZRReportingSession& owner) {
            stopped.push_back(owner.reporterID());
            owner.sendMessage(messageOf({{"summary", 1}}, 1, 11));
        };
    }
    /// Started sessions of these IDs.
    void openFrom(const Connection& client, ReporterID first, ReporterID last) {
        for (ReporterID id = first; id <= last; ++id) {
            open(client, id);
        }
    }
    bool runOne() { return device.serverQueue().runOne(); }
    /// Runs all that is queued; what each piece of it stopped.
    std::vector<std::vector<ReporterID>> pieces() {
        std::vector<std::vector<ReporterID>> pieces;
        while (runOne()) {
            pieces.push_back(std::exchange(stopped, {}));
        }
        return pieces;
    }
    std::size_t removals(pid_t pid) {
        return device.log.count("removing " + std::to_string(pid) + " from the server client list");
    }
    static std::vector<ReporterID> fromTo(ReporterID first, ReporterID last) {
        std::vector<ReporterID> ids(static_cast<std::size_t>(last - first + 1));
        std::iota(ids.begin(), ids.end(), first);
        return ids;
    }

    std::vector<ReporterID> stopped;
};

TEST_F(LeavingClientsTest, OthersAreServedBetweenTheStopsAndWhatComesBehindTheEndReachesNobody) {
    Connection leaving = connect(10);
    const Connection other = connect(11);
    openFrom(leaving, 1, 70);
    open(other, 1);
    const std::weak_ptr<ZRReportingSession> theFirst = find(1), theLast = find(70);
    (void)device.serverQueue().takePaces();
    leaving->interrupt();
    leaving->object().createReportingSession(71, note<bool>("create"));
    leaving->object().startReportingSessionForID(71, note<bool>("start"));
    leaving->object().startReportingSessionForID(70, note<bool>("earlier"));
    other->object().sendMessage({{"to", "all"}}, 14, 11, {}, note<>("send"));
    other->object().getAllReporters(note<std::vector<ReporterID>>("all"));
    ASSERT_TRUE(runOne());
    EXPECT_EQ(stopped, fromTo(1, 32));
    EXPECT_TRUE(theFirst.expired() && !theLast.expired()) << "nothing stopped is kept";
    EXPECT_EQ(find(1)->processIdentifiers().front(), 11);
    EXPECT_EQ(find(70), nullptr);

    ASSERT_TRUE(runOne() && runOne() && runOne() && runOne() && runOne());
    EXPECT_THAT(takeReplies(), ElementsAre("create true", "earlier true", "send", "all { 1 }"));
    EXPECT_EQ(service->getAllActiveReportingSessions(), std::vector{find(1)});
    EXPECT_EQ(script.count("message Init 14/11"), 1U) << "no session of the leaving client";
    EXPECT_EQ(stopped.size(), 32U);

    leaving->invalidate(); // ends it a second time
    leaving.reset();
    (void)run();
    EXPECT_EQ(stopped, fromTo(1, 70)) << "each once";
    EXPECT_EQ(script.count("message Init 1/11"), 70U) << "summaries reach the sinks to the last";
    EXPECT_EQ(removals(10), 1U);
    EXPECT_EQ(device.log.count("deallocing this session 71") + device.log.count("dealloc 10 from"), 2U);
    EXPECT_EQ(device.analyticsEvents.payloads(kUptimeEvent).size(), 1U);
    const std::vector<Pace> paces = device.serverQueue().takePaces();
    EXPECT_EQ(std::count(paces.begin(), paces.end(), Pace::mayBlock), 6)
        << "two ends, two starts and two further pieces";
}

TEST_F(LeavingClientsTest, APieceStopsSoManyMessages) {
    const Connection leaving = connect(10);
    // One message of each session is its own record of its start.
    const std::vector<int> counts{2'499, 2'499, 0, 20'000, 0, 2'499, 2'500, 1};
    for (std::size_t i = 0; i < counts.size(); ++i) {
        const auto id = static_cast<ReporterID>(i + 1);
        open(leaving, id);
        for (int message = 0; message < counts[i]; ++message) {
            find(id)->sendMessage(messageOf({{"n", message}}));
        }
        device.log.clear();
    }
    leaving->interrupt();
    EXPECT_THAT(pieces(), ElementsAre(ElementsAre(1, 2), ElementsAre(3), ElementsAre(4), ElementsAre(5, 6),
                                      ElementsAre(7, 8)));
}

TEST_F(LeavingClientsTest, ClientsThatLeaveTogetherShareOnePieceAtATime) {
    const Connection first = connect(10), second = connect(11), third = connect(12);
    openFrom(first, 1, 70);
    openFrom(second, 101, 140);
    open(third, 200);
    first->interrupt();
    second->interrupt();
    third->interrupt();
    EXPECT_THAT(pieces(), ElementsAre(SizeIs(32), SizeIs(32), SizeIs(1), SizeIs(32), SizeIs(6), SizeIs(8)))
        << "a client with few sessions ends at once";
    EXPECT_EQ(removals(10) + removals(11) + removals(12), 3U);
}

TEST_F(LeavingClientsTest, ShuttingDownWorksOffWhatIsQueuedThenStopsEverything) {
    const Connection leaving = connect(10), other = connect(11);
    send(leaving, {});
    const SessionRef single = service->singleMessageSession();
    openFrom(leaving, 1, 100);
    openFrom(other, 101, 150);
    leaving->interrupt();
    leaving->invalidate();
    other->object().sendMessage({{"last", 1}}, 14, 11, {150}, note<>("last"));
    service->shutDown([&] {
        note<>("completed")(nullptr);
        EXPECT_EQ(stopped, fromTo(1, 150));
        EXPECT_THAT(service->getAllClients(), IsEmpty());
        EXPECT_FALSE(single->started());
    });
    ASSERT_TRUE(runOne());
    EXPECT_EQ(stopped.size(), 32U);
    (void)run();
    other->invalidate();
    EXPECT_THAT(answers(), ElementsAre("send", "last", "completed"));
    EXPECT_EQ(script.count("message Init 14/11"), 2U);
    EXPECT_EQ(script.count("message Init 1/11"), 150U);
    EXPECT_EQ(removals(10) + removals(11), 2U);
    EXPECT_EQ(device.analyticsEvents.payloads(kUptimeEvent).size(), 2U);
    EXPECT_EQ(service->singleMessageSession(), nullptr);
    EXPECT_EQ(device.workQueues.delayedCalls(), 0U);
}

} // namespace
} // namespace tamblo
