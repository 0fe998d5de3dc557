#include "tests/fakes/FakePlatform.h"
#include "tests/fakes/Messages.h"
#include "tests/session/ScriptedWorkers.h"

#include <gmock/gmock.h>

#include <algorithm>
#include <cmath>
#include <random>

namespace tamblo {
namespace {

struct IntakeTest : testing::Test {
    FakePlatform device;
};

TEST_F(IntakeTest, TimestampsAreRepaired) {
    const double now = device.clock.seconds();
    constexpr double kYear = 31'536'000;
    const struct {
        const char* what;
        Value sent;
        bool isKept;
    } cases[] = {
        {"just 365 days", now - kYear, true}, {"a second older", now - kYear - 1, false},
        {"the future", now + kYear, true},    {"a number as text", "99999999999", true},
        {"no number", "soon", false},
    };
    for (const auto& [what, sent, isKept] : cases) {
        const auto message = messageOf({{"zrreporting_timestamp", sent}, {"invalid_timestamp", 5}});
        ZRReportingSession::addMissingDates(*message, device.clock.now());
        const Value kept = isKept ? sent : Value(now);
        EXPECT_EQ(message->payload(), (Dictionary{{"zrreporting_timestamp", kept},
                                                  {"invalid_timestamp", isKept ? Value(5) : sent}}))
            << what;
        EXPECT_EQ(ZRReportingSession::getEpochTimeFromZRReportingStateMessage(*message), kept.doubleValue());
    }
    const auto without = messageOf({});
    EXPECT_EQ(ZRReportingSession::getEpochTimeFromZRReportingStateMessage(*without), 0.0);
    ZRReportingSession::addMissingDates(*without, device.clock.now());
    EXPECT_EQ(without->payload(), (Dictionary{{"zrreporting_timestamp", now}, {"invalid_timestamp", "nil"}}));
}

TEST_F(IntakeTest, SpacesInKeysBecomeUnderscores) {
    const auto message = messageOf(
        {{"a b", 1}, {"a_b", 2}, {" c ", 3}, {"d\te", 4}, {"plain", 5}, {"x y_z", 6}, {"x_y z", 7}});
    const Dictionary before = message->message();
    ZRReportingSession::removeWhiteSpaceFromKeys(*message);
    EXPECT_EQ(message->payload(),
              (Dictionary{{"a_b", 1}, {"_c_", 3}, {"d\te", 4}, {"plain", 5}, {"x_y_z", 7}}));
    EXPECT_EQ(before.size(), 7U) << "a copy taken before does not change";
}

TEST_F(IntakeTest, ATagReplacesTheClientsHoweverManyThereAre) {
    for (AudioEventCategory i = 0; i < 4000; ++i) {
        const auto message =
            messageOf({{"audiotag", "mine"}}, AudioEventSubsystemHAL | i % 2000, AudioEventTypeState);
        ZRReportingSession::addAudioMessageTag(*message, device.context().shared<intake::AudioTags>());
        ASSERT_EQ(message->payload().find("audiotag")->stringValue(),
                  ZRReportingUtilityCategoryString(message->category()) + "State");
    }
}

TEST_F(IntakeTest, WhatIsRedundant) {
    const Dictionary one{{"a", 1}};
    const Dictionary two{{"a", 1}, {"b", 1}};
    const Dictionary timed{{"a", 1}, {"systemuptime_sec", 2}, {"processuptime_ms", 2}};
    const struct {
        AudioEventType type;
        Dictionary first;
        Dictionary second;
        bool isRedundant;
    } cases[] = {
        {11, one, {{"a", 1.0}, {"zrreporting_timestamp", 1e12}, {"invalid_timestamp", "nil"}}, true},
        {11, one, timed, true},
        {11, timed, one, true},
        {11, one, two, false},
        {11, two, one, false},
        {11, {{"_throttle_seconds", 1}}, {{"_throttle_seconds", 2}}, false},
        {AudioEventTypeError, one, one, false},
    };
    for (const auto& [type, first, second, isRedundant] : cases) {
        const auto session = device.makeSession();
        const auto message = messageOf(second, AudioEventKindVolume, type);
        session->sendMessage(messageOf(first, AudioEventKindVolume, type));
        session->sendMessage(message);
        EXPECT_EQ(message->isRedundant, isRedundant) << type << " " << message->description();
        EXPECT_EQ(session->messages().size(), isRedundant ? 1U : 2U);
    }
}

/// What a walk over the session's list from its end says.
bool walkSaysRedundant(const std::vector<MessageRef>& accepted, const ZRReportingSessionMessage& message) {
    const auto earlier = std::find_if(accepted.rbegin(), accepted.rend(), [&](const MessageRef& other) {
        return other->type() == message.type() && other->category() == message.category();
    });
    const std::string_view times[] = {"systemuptime_sec", "zrreporting_timestamp"};
    return earlier != accepted.rend() && message.category() != AudioEventKindError &&
           (*earlier)->payload().equalsIgnoring(message.payload(), times);
}

TEST_F(IntakeTest, TheIndexSaysWhatAWalkOverTheListWouldAlsoAfterTheSort) {
    std::mt19937 random(7);
    const auto upTo = [&](int most) { return static_cast<int>(random() % static_cast<unsigned>(most + 1)); };
    const auto session = device.makeSession();
    int redundant = 0;
    const auto sendRandom = [&](int count) {
        constexpr AudioEventCategory kCategories[] = {8, 11, 14, 0x2000000B, 0x08000004};
        for (; count > 0; --count) {
            Dictionary payload{{"value", upTo(2)}, {"systemuptime_sec", upTo(9)}};
            if (upTo(3) != 0) {
                payload.set("zrreporting_timestamp", device.clock.seconds() + upTo(40) - 20);
            }
            const auto message =
                messageOf(payload, kCategories[upTo(4)], static_cast<AudioEventType>(upTo(2) + 1));
            const std::vector<MessageRef> accepted = session->messages();
            session->sendMessage(message);
            redundant += message->isRedundant ? 1 : 0;
            ASSERT_EQ(message->isRedundant, walkSaysRedundant(accepted, *message));
        }
    };
    for (int round = 0; round < 20; ++round) {
        session->start();
        sendRandom(200);
        WorkerScript::current().atStop["Producer"] = [&](ZRReportingSession&) { sendRandom(50); };
        session->stop();
        WorkerScript::current().reset();
    }
    EXPECT_GT(redundant, 100);
}

TEST_F(IntakeTest, SortingKeepsTheOrderOfEqualTimesAndTakesNoNumberForZero) {
    std::vector<MessageRef> messages;
    for (const Value& time :
         {Value(3.0), Value(1.0), Value(std::nan("")), Value(3.0), Value(-1.0), Value("soon")}) {
        messages.push_back(messageOf({{"n", messages.size() + 1}, {"zrreporting_timestamp", time}}));
    }
    EXPECT_TRUE(ZRReportingSessionMessage::sortMessages(messages));
    std::string order;
    for (const MessageRef& message : messages) {
        order += shown(message->payload(), {"n"});
    }
    EXPECT_EQ(order, "536214");
    EXPECT_FALSE(ZRReportingSessionMessage::sortMessages(messages));
}

} // namespace
} // namespace tamblo
