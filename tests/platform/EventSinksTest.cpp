#include "platform/linux/sinks/LinuxAnalyticsEventService.h"
#include "platform/linux/sinks/LinuxCallQualityService.h"
#include "platform/linux/sinks/PayloadTexts.h"
#include "tests/fakes/FakeWorkQueues.h"
#include "tests/platform/LinuxServiceSupport.h"

#include <array>
#include <future>
#include <random>
#include <sstream>
#include <thread>

namespace tamblo {
namespace {

using namespace std::chrono_literals;
using namespace testing;

TEST(PayloadTextsTest, AreWhatEachPayloadsTextIsWithOrWithoutAKey) {
    PayloadTexts texts;
    FakeClock clock;
    std::mt19937 random(5);
    const auto below = [&](unsigned end) { return static_cast<int>(random() % end); };
    const std::vector<std::string> keySets[] = {
        {"a"}, {"a", "b", "c"}, {"a", "c", "d", "long key of a payload, longer than others"}, {}};
    for (int i = 0; i < 4000; ++i) {
        Dictionary payload;
        for (const std::string& key : keySets[below(20) / 6]) {
            const Value values[] = {below(3), 0.25, "short", "a text that lies in a block",
                                    Array{"x", below(2)}};
            payload.set(key, values[below(5)]);
        }
        for (int lines = below(4); lines > 0; --lines) {
            const std::string leftOut = below(2) == 0 ? "" : std::string(1, "abcz"[below(4)]);
            Dictionary left = payload;
            left.remove(leftOut);
            TextBuffer line;
            texts.appendLine(line, clock, payload, leftOut, [](TextBuffer& out) { out.append(",\"n\":1"); });
            ASSERT_EQ(line.view(), R"({"time":)" + jsonText(clock.seconds()) + R"(,"n":1,"payload":)" +
                                       jsonText(left) + "}");
        }
        if (below(4) == 0) {
            texts.endBatch();
            clock.advance(1s);
        }
    }
}

TEST(PayloadTextsTest, AreRightForTextsOfEveryLengthAndForSeveralThreads) {
    PayloadTexts texts;
    FakeClock clock;
    const auto writeAll = [&](const char* other) {
        for (const std::size_t length : {10U, 100'000U, 20U, 3'000'000U, 3'000'001U, 30U}) {
            Dictionary payload{{"a", 1}, {"other", other}, {"text", std::string(length, 'x')}};
            for (const char* leftOut : {"", "a", "text"}) {
                Dictionary left = payload;
                left.remove(leftOut);
                TextBuffer line;
                texts.appendLine(line, clock, payload, leftOut, [](TextBuffer&) {});
                ASSERT_TRUE(line.view().ends_with(R"(,"payload":)" + jsonText(left) + "}"));
                texts.endBatch();
            }
        }
    };
    const std::jthread thread(writeAll, "of one");
    writeAll("of the other");
}

class LinuxAnalyticsEventServiceTest : public Test {
protected:
    void useEvents(const Value& patterns) {
        preferences_.setPreferenceValue("events_in_use", "com.vandra.tamblo.analytics", patterns);
    }

    TemporaryDirectory directory_;
    FakeLog log_;
    LinuxPreferences preferences_{directory_.path(), log_};
    FakeClock clock_;
    SinkFiles sinks_{directory_.path(), log_};
    LinuxAnalyticsEventService events_{sinks_, clock_, preferences_, log_};
};

TEST_F(LinuxAnalyticsEventServiceTest, AnswersWhichEventsAreInUse) {
    const struct {
        Value patterns;
        const char *inUse, *notInUse;
    } cases[] = {
        {Array{"a.b", "c.*"}, "a.b c. c.d", "a.bc a c cd"},
        {Array{"*"}, "a x", ""},
        {Array{}, "", "a.b c.d"},
        {Array{"a*", "a.b*c", "*d"}, "a a.b", "d xd"},
        {Array{"b.c*", "b*", "ab*", "b.*", "b.a", "z"}, "b b.c b.z ab abc bz z", "a c aa zz"},
        {"a", "a zz", ""},
        {Array{1, "1x"}, "1x", "1 a"},
    };
    EXPECT_TRUE(events_.isEventInUse("a.b"));
    for (const auto& [patterns, inUse, notInUse] : cases) {
        useEvents(patterns);
        for (const auto& [names, isInUse] : {std::pair(inUse, true), {notInUse, false}}) {
            std::istringstream words(names);
            for (std::string name; words >> name;) {
                EXPECT_EQ(events_.isEventInUse(name), isInUse) << inUse << ": " << name;
            }
        }
    }
    preferences_.setPreferenceValue("k", "d", 1); // no news of these
    EXPECT_TRUE(events_.isEventInUse("1x"));
    EXPECT_THAT(log_.take(), ElementsAre(HasSubstr("analytics.json: events_in_use is no array"),
                                         HasSubstr("analytics.json: events_in_use holds what is no name")));
}

TEST_F(LinuxAnalyticsEventServiceTest, WritesTheEventsThatAreInUse) {
    useEvents(Array{"e1", "e\"2"});
    Dictionary payload{{"k", 1}, {"t", "x\ny"}};
    const auto provider = [&] { // called for events in use only, or the times below are others
        clock_.advance(std::chrono::milliseconds(250));
        return payload;
    };
    clock_.set({});
    for (const char* name : {"e1", "e3", "e\"2"}) {
        events_.sendEventLazy(name, provider);
    }
    payload.set("k", 2); // the same dictionary, another payload
    events_.sendEventLazy("e1", provider);
    sinks_.flush();
    events_.sendEventLazy("e1", provider); // another message, though with the payload of the last
    sinks_.flush();
    EXPECT_THAT(test::linesOf(directory_.path("analytics-events.jsonl")),
                ElementsAre(R"({"time":0.25,"event":"e1","payload":{"k":1,"t":"x\ny"}})",
                            R"({"time":0.25,"event":"e\"2","payload":{"k":1,"t":"x\ny"}})",
                            R"({"time":0.75,"event":"e1","payload":{"k":2,"t":"x\ny"}})",
                            R"({"time":1.0,"event":"e1","payload":{"k":2,"t":"x\ny"}})"));
}

TEST_F(LinuxAnalyticsEventServiceTest, SeveralEventsShareOneCallForTheirPayload) {
    int calls = 0;
    const auto provider = [&] { return Dictionary{{"k", ++calls}}; };
    const std::array<std::string_view, 2> both{"first", "second"};
    clock_.set({});
    events_.sendEventsLazy(both, provider);
    sinks_.flush();
    useEvents(Array{"second"});
    events_.sendEventsLazy(both, provider);
    sinks_.flush();
    EXPECT_THAT(test::linesOf(directory_.path("analytics-events.jsonl")),
                ElementsAre(R"({"time":0.0,"event":"first","payload":{"k":1}})",
                            R"({"time":0.0,"event":"second","payload":{"k":1}})",
                            R"({"time":0.0,"event":"second","payload":{"k":2}})"));
}

class LinuxCallQualityServiceTest : public Test {
protected:
    CallQualityService::SessionRef open(bool isBatched) {
        auto session = service_.CreateLinkmeterSession({{"BatchEvent", isBatched}}, {});
        (void)service_.endRun();
        return session;
    }
    bool trySend(const CallQualityService::SessionRef& session, std::size_t bytes = 1) {
        return service_.trySendLinkmeterMessage(session, 1, 2, {{"text", std::string(bytes, 'x')}}, {});
    }
    std::size_t written() const { return test::linesOf(directory_.path("call-quality.jsonl")).size(); }

    TemporaryDirectory directory_;
    FakeLog log_;
    FakeClock clock_;
    FaultyOperations operations_;
    LinuxPreferences preferences_{directory_.path(), log_};
    FakeWorkQueues workQueues_;
    SinkFiles sinks_{directory_.path(), log_, operations_};
    LinuxCallQualityService service_{sinks_, clock_, preferences_, workQueues_, log_};
};

TEST_F(LinuxCallQualityServiceTest, LinesAreHeldBackOnlyForSessionsWhoseEventsAreBatched) {
    const auto batched = open(true);
    const auto other = open(false);
    ASSERT_EQ(written(), 2U);
    EXPECT_TRUE(trySend(batched));
    EXPECT_EQ(service_.endRun(), 250ms);
    EXPECT_TRUE(trySend(batched));
    EXPECT_EQ(service_.endRun(), std::nullopt) << "there is a time for it";
    EXPECT_EQ(written(), 2U);
    service_.writeHeldBack();
    EXPECT_EQ(written(), 4U);
    EXPECT_TRUE(trySend(batched, 70'000));
    EXPECT_EQ(service_.endRun(), std::nullopt);
    EXPECT_EQ(written(), 5U) << "so much does not wait";
    EXPECT_TRUE(trySend(batched) && trySend(other));
    EXPECT_EQ(service_.endRun(), std::nullopt);
    EXPECT_EQ(written(), 7U);
}

TEST_F(LinuxCallQualityServiceTest, NobodyWaitsForTheDiskWhoOnlyTries) {
    const auto session = open(false);
    bool isRefused = false;
    operations_.beforeWrite = [&] {
        isRefused = !std::async(std::launch::async, [&] { return trySend(session); }).get();
    };
    EXPECT_TRUE(trySend(session));
    (void)service_.endRun();
    EXPECT_TRUE(isRefused) << "the file is being written";
    operations_.beforeWrite = [] {};
    EXPECT_TRUE(trySend(session, 1'100'000));
    const int writes = operations_.writes;
    EXPECT_FALSE(trySend(session)) << "more would not wait in memory";
    EXPECT_EQ(operations_.writes, writes);
    (void)service_.endRun();
    EXPECT_TRUE(trySend(session));
}

} // namespace
} // namespace tamblo
