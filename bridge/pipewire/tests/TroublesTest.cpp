#include "bridge/pipewire/report/Troubles.h"
#include "bridge/pipewire/report/Overloads.h"
#include "bridge/pipewire/tests/World.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace tamblo::pipewire {
namespace {

using namespace std::chrono_literals;
using Outcome = NodeCycle::Outcome;

constexpr ObjectID kSink = 100;
constexpr ObjectID kStream = 1;
constexpr SessionID kOfStream = 11;
constexpr SessionID kOfDevice = 22;

class PipeWireTroubles : public testing::Test {
protected:
    PipeWireTroubles() {
        world_.graph.addObserver(overloads_);
        world_.graph.addObserver(troubles_);
        world_.graph.changeServer([](Server& server) { server.version = "1.0"; });
        world_.sink(kSink, "Speaker");
        world_.stream(kStream, {{"application.id", "org.example.player"}});
        world_.link(kStream, kSink);
        pass(1s);
    }

    void pass(std::chrono::milliseconds time) {
        const SteadyTime end = clock_.now().steady + time;
        while (clock_.now().steady < end) {
            clock_.advance(10ms);
            for (Timed* const timed : {static_cast<Timed*>(&overloads_), static_cast<Timed*>(&troubles_)}) {
                if (timed->due() && *timed->due() <= clock_.now().steady) {
                    timed->run();
                }
            }
        }
    }
    /// A cycle of the sink's, in which the stream did so.
    void cycle(Outcome outcome, double share = 0.5, std::uint32_t xruns = 0) {
        ++number_;
        cycleAgain(outcome, share, xruns);
    }
    void cycleAgain(Outcome outcome, double share = 0.5, std::uint32_t xruns = 0) {
        const std::int64_t turn = number_ * 20'000'000;
        overloads_.cycleEnded(
            {.number = number_,
             .frames = 1024,
             .seconds = 0.02,
             .xruns = xruns,
             .nodes = {{.node = kSink, .turn = turn, .share = 0.1},
                       {.node = kStream, .turn = turn, .outcome = outcome, .share = share}}});
    }
    [[nodiscard]] double lastOf(std::string_view key) const {
        const Value* const value = reports_.messages.back().payload.find(key);
        return value == nullptr ? -1 : value->doubleValue();
    }
    [[nodiscard]] std::string lastText(std::string_view key) const {
        const Value* const value = reports_.messages.back().payload.find(key);
        return value == nullptr ? "absent" : std::string(value->stringValue());
    }
    [[nodiscard]] SessionID sessionOf(ObjectID node) const { return node == kStream ? ofStream_ : kOfDevice; }

    test::World world_;
    test::HandClock clock_;
    test::KeptReports reports_;
    Overloads overloads_{world_.graph, reports_, clock_, [this](ObjectID node) { return sessionOf(node); }};
    Troubles troubles_{world_.graph, reports_, clock_, [this](ObjectID node) { return sessionOf(node); }};
    SessionID ofStream_ = kOfStream;
    std::int64_t number_ = 0;
};

TEST_F(PipeWireTroubles, lateNodesAreOverloadsAtMostOnceASecondWithTheNumberInBetween) {
    cycle(Outcome::finished, 0.2);
    cycle(Outcome::waited);
    overloads_.cyclesRead();
    EXPECT_EQ(reports_.story(), "");

    // Five cycles missed in one go, of which the first is told of twice; then it goes on.
    cycle(Outcome::late);
    cycleAgain(Outcome::late);
    for (int i = 0; i < 4; ++i) {
        cycle(Outcome::late);
    }
    cycle(Outcome::finished, 0.4);
    overloads_.cyclesRead();
    EXPECT_EQ(reports_.story(), "11 IO Error, 11 IO IssueDetector");
    EXPECT_EQ(lastText("issue_type"), "overload");
    EXPECT_EQ(lastText("node"), "org.example.player");
    EXPECT_EQ(lastText("rtaid_client"), "org.example.player");
    EXPECT_EQ(lastOf("overload_number"), 5);
    EXPECT_EQ(lastOf("cycle_share"), 5) << "it took five cycles' time, and some";
    EXPECT_EQ(lastOf("io_buffer_size"), 1024);
    EXPECT_EQ(lastOf("io_cycle"), 7);
    EXPECT_NEAR(lastOf("any_channel_silence_seconds"), 0.1, 1e-9);
    EXPECT_FALSE(reports_.messages.front().payload.contains("issue_type")) << "it would be counted twice";

    for (int i = 0; i < 3; ++i) {
        cycle(Outcome::late);
        overloads_.cyclesRead();
        pass(100ms);
    }
    EXPECT_EQ(reports_.messages.size(), 2U);
    pass(1s);
    ASSERT_EQ(reports_.messages.size(), 3U) << "due by itself, when nothing plays any more";
    EXPECT_EQ(lastOf("overload_number"), 3);
    pass(Overloads::kCalm);
    cycle(Outcome::late);
    overloads_.cyclesRead();
    EXPECT_EQ(reports_.messages.size(), 5U) << "after a calm, it is an error again";
}

TEST_F(PipeWireTroubles, cyclesAtTheBeginningAndTheEndOfAStreamDoNotCountUnlessItHangs) {
    cycle(Outcome::late);
    cycle(Outcome::late);
    cycle(Outcome::finished);
    cycle(Outcome::late);
    overloads_.cyclesRead();
    world_.node(kStream, {}, NodeState::idle);
    overloads_.cyclesRead();
    number_ += 20;
    cycle(Outcome::late);
    world_.node(kStream, {});
    overloads_.cyclesRead();
    cycle(Outcome::finished);
    overloads_.cyclesRead();
    EXPECT_EQ(reports_.story(), "");

    // Another stream comes: the driver begins its next cycle early, and this one's is mixed up with it.
    const auto told = [this](std::int64_t driversTurn, std::int64_t turn, Outcome outcome) {
        overloads_.cycleEnded({.frames = 1024,
                               .seconds = 0.02,
                               .nodes = {{.node = kSink, .turn = driversTurn},
                                         {.node = kStream, .turn = turn, .outcome = outcome}}});
    };
    const std::int64_t last = number_ * 20'000'000;
    told(last, last + 8'000'000, Outcome::late);
    told(last + 8'000'000, last + 8'000'000, Outcome::late);
    told(last + 28'000'000, last + 28'000'000, Outcome::finished);
    overloads_.cyclesRead();
    EXPECT_EQ(reports_.story(), "");

    number_ += 20;
    for (int reading = 0; reading < 3; ++reading) {
        for (int i = 0; i < 50; ++i) {
            cycle(Outcome::late);
        }
        overloads_.cyclesRead();
        pass(1s);
    }
    EXPECT_EQ(reports_.story(), "11 IO Error, 11 IO IssueDetector, 11 IO IssueDetector");
    EXPECT_EQ(lastOf("late_number"), 50);
    EXPECT_EQ(lastOf("cycle_share"), 150);
}

TEST_F(PipeWireTroubles, xrunsAreTheDriversAndThoseFromBeforeDoNotCount) {
    for (const std::uint32_t xruns : {7U, 7U, 9U, 10U, 2U}) {
        cycle(Outcome::finished, 0.2, xruns);
    }
    overloads_.cyclesRead();
    ASSERT_EQ(reports_.story(), "22 IO Error, 22 IO IssueDetector");
    EXPECT_EQ(lastText("node"), "Speaker");
    EXPECT_EQ(lastOf("xrun_number"), 3);
    EXPECT_EQ(lastOf("late_number"), 0);
}

TEST_F(PipeWireTroubles, aNodeThatHasGoneIsReportedAlsoWhenAnotherHasItsNumber) {
    cycle(Outcome::finished);
    cycle(Outcome::late);
    cycle(Outcome::finished);
    overloads_.cyclesRead();
    EXPECT_EQ(reports_.story(), "11 IO Error, 11 IO IssueDetector");

    // Its last cycles are told of when the next node runs, and that one's first ones with them.
    pass(2s);
    world_.graph.remove(kStream);
    ofStream_ = kOfDevice;
    pass(10ms);
    world_.stream(kStream, {{"application.id", "another"}});
    cycle(Outcome::late);
    cycle(Outcome::late);
    cycle(Outcome::finished);
    number_ = std::chrono::nanoseconds(clock_.now().steady.time_since_epoch()).count() / 20'000'000;
    cycle(Outcome::late);
    cycle(Outcome::finished);
    overloads_.cyclesRead();
    EXPECT_EQ(reports_.story(), "11 IO Error, 11 IO IssueDetector, 11 IO IssueDetector");
    EXPECT_EQ(lastText("node"), "org.example.player");
    EXPECT_EQ(lastOf("late_number"), 2);

    cycle(Outcome::late);
    cycle(Outcome::finished);
    overloads_.cyclesRead();
    EXPECT_EQ(lastText("node"), "another");
    EXPECT_EQ(lastOf("late_number"), 1);
}

TEST_F(PipeWireTroubles, aDeviceThatVanishesUnderARunningStreamIsOne) {
    world_.sink(101, "Headphones");
    // Moved by somebody: no device has vanished, though the other one goes much later.
    world_.unlink(kStream, kSink);
    world_.link(kStream, 101);
    pass(3s);
    world_.graph.remove(kSink);
    pass(3s);
    EXPECT_EQ(reports_.story(), "");

    // The links go first, and another is found at once.
    world_.unlink(kStream, 101);
    pass(400ms);
    world_.sink(kSink, "Speaker");
    world_.link(kStream, kSink);
    world_.graph.remove(101);
    pass(1s);
    ASSERT_EQ(reports_.story(), "11 Routing_Error IssueDetector");
    EXPECT_EQ(lastText("issue_type"), "device_vanished");
    EXPECT_EQ(lastText("node"), "Headphones");
    EXPECT_EQ(lastOf("has_other_device"), 1);

    world_.unlink(kStream, kSink);
    world_.graph.remove(kSink);
    pass(1s);
    ASSERT_EQ(reports_.messages.size(), 2U);
    EXPECT_EQ(lastOf("has_other_device"), 0);
    pass(Troubles::kPatience);
    ASSERT_EQ(reports_.messages.size(), 3U);
    EXPECT_EQ(lastText("issue_type"), "no_device");
    EXPECT_NEAR(lastOf("any_channel_silence_seconds"), 5, 0.1);
    pass(1min);
    EXPECT_EQ(reports_.messages.size(), 3U) << "said once";
    EXPECT_EQ(troubles_.due(), std::nullopt) << "nothing wakes for it";
}

TEST_F(PipeWireTroubles, theEndOfTheServerOrOfAStreamIsNone) {
    world_.stream(2, {{"application.id", "org.example.unlinked"}});
    pass(1s);
    world_.graph.remove(2);
    pass(10s);
    world_.unlink(kStream, kSink);
    world_.graph.remove(kStream);
    world_.graph.remove(kSink);
    pass(10s);
    EXPECT_EQ(reports_.story(), "");
    world_.sink(kSink, "Speaker");
    world_.stream(kStream);
    world_.link(kStream, kSink);
    pass(1s);
    world_.graph.clear();
    pass(10s);
    EXPECT_EQ(reports_.story(), "");
}

TEST_F(PipeWireTroubles, errorsOfNodesAreCountedAndAStreamsTextIsNotSaid) {
    const auto fail = [this](ObjectID node) {
        world_.graph.changeNode(node, [](Node& changed) {
            ++changed.errors;
            changed.error = "cannot play file:///secret.ogg";
        });
    };
    fail(kStream);
    fail(kStream);
    pass(500ms);
    ASSERT_EQ(reports_.story(), "11 Error IssueDetector");
    EXPECT_EQ(lastOf("error_number"), 2);
    EXPECT_EQ(lastText("error"), "absent");
    for (int i = 0; i < 20; ++i) {
        fail(kStream);
        pass(100ms);
    }
    pass(2s);
    EXPECT_THAT(reports_.messages.size(), testing::AllOf(testing::Ge(3U), testing::Le(4U)));
    double all = 0;
    for (const auto& message : reports_.messages) {
        all += message.payload.find("error_number")->doubleValue();
    }
    EXPECT_EQ(all, 22);
    fail(kSink);
    world_.graph.remove(kSink);
    pass(2s);
    EXPECT_EQ(lastText("node"), "Speaker");
    EXPECT_NE(lastText("error"), "absent");
}

} // namespace
} // namespace tamblo::pipewire
