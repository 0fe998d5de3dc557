#include "tests/service_core/ServiceTestBase.h"

#include <numeric>

namespace tamblo {
namespace {

using std::chrono::milliseconds;
using testing::ElementsAre;
using testing::IsEmpty;

std::vector<ReporterID> fromTo(ReporterID first, ReporterID last) {
    std::vector<ReporterID> ids(static_cast<std::size_t>(last - first + 1));
    std::iota(ids.begin(), ids.end(), first);
    return ids;
}

/// Clients whose sessions take a slice of time each to be stopped.
class TurnsTest : public ServiceTestBase {
protected:
    TurnsTest() {
        script.atStop["Producer"] = [this](ZRReportingSession& owner) {
            device.clock.advance(stopTime);
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
    /// Has the session retain so much that its stop is carried out in parts.
    void fill(ReporterID id) {
        for (int n = 0; n < 200; ++n) {
            find(id)->sendMessage(messageOf({{"text", std::string(1'000, 'x') + std::to_string(n)}}));
        }
        (void)script.take();
    }
    std::size_t removals(pid_t pid) {
        return device.log.count("removing " + std::to_string(pid) + " from the server client list");
    }

    std::vector<ReporterID> stopped;
    milliseconds stopTime{1};
};

TEST_F(TurnsTest, OthersAreServedBetweenTheStopsAndWhatComesBehindTheEndReachesNobody) {
    Connection leaving = connect(10);
    const Connection other = connect(11);
    openFrom(leaving, 1, 70);
    open(other, 1);
    const std::weak_ptr<ZRReportingSession> theFirst = find(1);
    leaving->interrupt();
    leaving->object().createReportingSession(71, note<bool>("create"));
    leaving->object().startReportingSessionForID(71, note<bool>("start"));
    other->object().sendMessage({{"to", "all"}}, 14, 11, {}, note<>("send"));
    other->object().getAllReporters(note<std::vector<ReporterID>>("all"));
    while (replies.empty() && device.serverQueue().runOne()) {
    }
    EXPECT_LT(stopped.size(), 8U);
    (void)device.serverQueue().runOne();
    EXPECT_THAT(takeReplies(), ElementsAre("send", "all { 1 }"));
    EXPECT_EQ(find(1)->processIdentifiers().front(), 11);
    EXPECT_EQ(find(70), nullptr);
    EXPECT_TRUE(theFirst.expired()) << "nothing stopped is kept";
    EXPECT_EQ(script.count("message Init 14/11"), 1U) << "no session of the leaving client";

    leaving->invalidate(); // ends it a second time
    leaving.reset();
    (void)run();
    EXPECT_EQ(stopped, fromTo(1, 70)) << "each once";
    EXPECT_EQ(script.count("message Init 1/11"), 70U) << "summaries reach the sinks to the last";
    EXPECT_EQ(removals(10), 1U);
    EXPECT_EQ(device.log.count("deallocing this session 71") + device.log.count("dealloc 10 from"), 2U);
    EXPECT_EQ(device.analyticsEvents.payloads(kUptimeEvent).size(), 1U);
}

TEST_F(TurnsTest, ShuttingDownCarriesOutWhatWasReadThenStopsEverything) {
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
        EXPECT_EQ(stopped.size(), 150U);
        EXPECT_THAT(service->getAllClients(), IsEmpty());
        EXPECT_FALSE(single->started());
    });
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

TEST_F(TurnsTest, AShutdownDropsWhatWaitsForTooLong) {
    const Connection client = connect(10);
    openFrom(client, 1, 2);
    fill(1);
    stopTime = milliseconds(10);
    client->object().stopReportingSessionForID(1, note<bool>("stop"));
    client->object().sendMessage({{"late", 1}}, 14, 11, {2}, note<>("late"));
    service->shutDown([&] { note<>("completed")(nullptr); });
    (void)device.serverQueue().runOne(); // the stop has begun
    EXPECT_THAT(stopped, ElementsAre(1));
    device.clock.advance(std::chrono::seconds(5));
    (void)device.serverQueue().runOne(); // the shutdown begins
    device.workQueues.elapse(std::chrono::seconds(5));
    EXPECT_THAT(answers(), ElementsAre("completed")) << "neither the stop's rest nor the message";
    EXPECT_THAT(stopped, ElementsAre(1, 2));
}

TEST_F(TurnsTest, AMessageToASessionThatIsBeingStoppedWaitsAndSoDoWhatTheClientAsksNext) {
    const Connection owner = connect(10), sender = connect(11);
    open(owner, 7);
    openFrom(sender, 101, 140);
    fill(7);
    stopTime = milliseconds(10);
    owner->object().stopReportingSessionForID(7, note<bool>("stop"));
    (void)device.serverQueue().runOne();
    ASSERT_TRUE(find(7)->isStopping());
    sender->object().sendMessage({{"n", 1}}, 14, 11, {101, 7, 102}, note<>("send"));
    sender->object().reporterID(7, note<Dictionary>("next"));
    sender->object().sendMessage({{"n", 2}}, 14, 11, {}, note<>("to all"));
    (void)run();
    EXPECT_THAT(takeReplies(),
                ElementsAre("stop true", "send", R"(next {"reporterID":7,"serviceType":65535})", "to all"));
    EXPECT_EQ(find(7)->messages().size(), 1U) << "to the stopped session, behind its stop";
    EXPECT_EQ(script.count("message Init 14/11"), 2U + 40U) << "the one to all is for started ones";
}

TEST_F(TurnsTest, AnEndInPartsIsTheEndFromTheFirstPartOn) {
    stopTime = milliseconds(10);
    for (const ReporterID id : {7, 8}) {
        const Connection owner = connect(10), next = connect(11), sender = connect(12);
        open(owner, id);
        next->object().createReportingSession(id, {});
        fill(id);
        if (id == 7) {
            owner->object().destroyReportingSession(id, note<bool>("destroy"));
        } else {
            owner->interrupt();
        }
        for (stopped.clear(); stopped.empty() && device.serverQueue().runOne();) {
        }
        ASSERT_NE(find(id), nullptr);
        EXPECT_EQ(find(id)->processIdentifiers().front(), 11) << "the next holder's";
        sender->object().sendMessage({{"n", id}}, 14, 11, {id}, note<>("to the ID"));
        sender->object().sendMessage({{"n", id}}, 14, 11, {}, note<>("to all"));
        EXPECT_THAT(answers(), testing::IsSupersetOf({"to the ID", "to all"}));
        EXPECT_EQ(find(id)->messages().size(), 1U);
        EXPECT_EQ(service->singleMessageSession()->acceptedMessageCount(), std::size_t(id - 6));
    }
}

TEST_F(TurnsTest, WhatHasBegunEndsThoughItsClientIsHeldUp) {
    const Connection owner = connect(10), sender = connect(11);
    open(owner, 7);
    fill(7);
    stopTime = milliseconds(10);
    owner->object().stopReportingSessionForID(7, note<bool>("stop"));
    (void)device.serverQueue().runOne();
    owner->requestQueue()->suspend();
    sender->object().sendMessage({{"n", 1}}, 14, 11, {7}, note<>("send"));
    EXPECT_THAT(answers(), ElementsAre("stop true", "send"));
}

TEST_F(TurnsTest, LimitsOfAUserAreNobodyElses) {
    device.services().limits.sessionsOfUser = 2;
    device.services().limits.configurationBytesOfUser = 1'800;
    Connection first = connect(10, 500);
    const Connection second = connect(11, 500), stranger = connect(12, 501);
    const auto areDone = [&](const Connection& client, ReporterID from, ReporterID to) {
        for (const ReporterID id : fromTo(from, to)) {
            client->object().createReportingSession(id, note<bool>("create"));
            client->object().setConfiguration({{"a", std::string(1'000, 'x')}}, id, note<bool>("set"));
        }
        return answers();
    };
    const std::string refused = " com.vandra.tamblo.protocol -32000 false";
    EXPECT_THAT(areDone(first, 1, 1), ElementsAre("create true", "set true"));
    for (int i = 0; i < 40; ++i) { // counted once
        first->object().setConfiguration({{"b", 1}, {"QVHostApplicationDisplayID", "a.b"}}, 1, {});
    }
    EXPECT_THAT(areDone(second, 1, 2),
                ElementsAre("create true", "set" + refused, "create" + refused, "set true"));
    EXPECT_THAT(areDone(stranger, 1, 1), ElementsAre("create true", "set true"));
    second->object().destroyReportingSession(1, {});
    EXPECT_THAT(areDone(first, 2, 2), ElementsAre("create true", "set" + refused));
    first->invalidate();
    first.reset();
    EXPECT_THAT(areDone(second, 1, 2), ElementsAre("create true", "set true", "create true", "set" + refused))
        << "what has left gives back";
    EXPECT_EQ(device.services().activity->sessions, 3U);
}

} // namespace
} // namespace tamblo
