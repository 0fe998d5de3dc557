#include "session/LastMessageIndex.h"
#include "tests/fakes/FakePlatform.h"
#include "tests/fakes/Messages.h"
#include "tests/session/ScriptedWorkers.h"

#include <gmock/gmock.h>

#include <cmath>
#include <limits>
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
        Dictionary payload;
        Dictionary repaired;
    } cases[] = {
        {"missing", {{"a", 1}}, {{"a", 1}, {"zrreporting_timestamp", now}, {"invalid_timestamp", "nil"}}},
        {"just 365 days", {{"zrreporting_timestamp", now - kYear}}, {{"zrreporting_timestamp", now - kYear}}},
        {"a second older",
         {{"zrreporting_timestamp", now - kYear - 1}},
         {{"zrreporting_timestamp", now}, {"invalid_timestamp", now - kYear - 1}}},
        {"the future", {{"zrreporting_timestamp", now + kYear}}, {{"zrreporting_timestamp", now + kYear}}},
        {"no number",
         {{"zrreporting_timestamp", "soon"}, {"invalid_timestamp", 5}},
         {{"zrreporting_timestamp", now}, {"invalid_timestamp", "soon"}}},
        {"a number as text",
         {{"zrreporting_timestamp", "99999999999"}},
         {{"zrreporting_timestamp", "99999999999"}}},
    };
    for (const auto& c : cases) {
        const auto message = messageOf(c.payload);
        ZRReportingSession::addMissingDates(*message, device.clock.now());
        EXPECT_EQ(message->payload(), c.repaired) << c.what;
        const Value kept = *message->payload().find("zrreporting_timestamp");
        EXPECT_EQ(ZRReportingSession::getEpochTimeFromZRReportingStateMessage(*message), kept.doubleValue());
    }
    EXPECT_EQ(ZRReportingSession::getEpochTimeFromZRReportingStateMessage(*messageOf({})), 0.0);
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
    for (int round = 0; round < 2; ++round) {
        for (AudioEventCategory kind = 0; kind < 2000; ++kind) {
            const auto message =
                messageOf({{"audiotag", "mine"}}, AudioEventSubsystemHAL | kind, AudioEventTypeState);
            ZRReportingSession::addAudioMessageTag(*message, device.context().shared<intake::AudioTags>());
            ASSERT_EQ(message->payload().find("audiotag")->stringValue(),
                      ZRReportingUtilityCategoryString(message->category()) + "State");
        }
    }
}

TEST_F(IntakeTest, TheConfiguredApplicationReplacesAnUnknownOne) {
    const auto session = device.makeSession();
    session->updateConfigurationWithContentsOfConfiguration({{"HostApplicationDisplayID", "com.configured"}});
    const std::pair<Value, Value> names[] = {
        {"com.mine", "com.mine"}, {"Unknown", "com.configured"}, {"unknown", "unknown"}, {"", ""}, {7, 7}};
    for (const auto& [sent, kept] : names) {
        const auto named = messageOf({{"HostApplicationDisplayID", sent}});
        session->addAppName(*named);
        EXPECT_EQ(*named->payload().find("HostApplicationDisplayID"), kept);
    }
}

TEST_F(IntakeTest, WhatIsRedundant) {
    const Dictionary one{{"a", 1}};
    const Dictionary two{{"a", 1}, {"b", 1}};
    const struct {
        AudioEventCategory category;
        AudioEventType type;
        Dictionary first;
        Dictionary second;
        bool isRedundant;
    } cases[] = {
        {14,
         11,
         one,
         {{"a", 1}, {"systemuptime_sec", 2}, {"zrreporting_timestamp", 1e12}, {"invalid_timestamp", "nil"}},
         true},
        {14, 11, {{"a", 1}, {"systemuptime_sec", 1}, {"processuptime_ms", 1}}, one, true},
        {14, 11, one, {{"a", 1.0}}, true},
        {14, 11, one, {{"a", 2}}, false},
        {14, 11, one, two, false},
        {14, 11, two, one, false},
        {14, 11, {{"_throttle_seconds", 1}}, {{"_throttle_seconds", 2}}, false},
        {14, AudioEventTypeError, one, one, false},
        {AudioEventKindError, 11, one, one, false},
        {AudioEventSubsystemHAL | AudioEventKindError, 11, one, one, true},
    };
    for (const auto& c : cases) {
        const auto session = device.makeSession();
        const auto second = messageOf(c.second, c.category, c.type);
        session->sendMessage(messageOf(c.first, c.category, c.type));
        session->sendMessage(second);
        EXPECT_EQ(second->isRedundant, c.isRedundant)
            << c.category << " " << c.type << " " << second->description();
        EXPECT_EQ(session->messages().size(), c.isRedundant ? 1U : 2U);
    }
}

/// What a walk over the session's list from its end says.
bool walkSaysRedundant(const std::vector<MessageRef>& accepted, const ZRReportingSessionMessage& message) {
    if (message.type() == AudioEventTypeError || message.category() == AudioEventKindError) {
        return false;
    }
    const auto withoutTimes = [](Dictionary payload) {
        for (const char* key : {"processuptime_ms", "systemuptime_sec", "zrreporting_timestamp"}) {
            payload.remove(key);
        }
        return payload;
    };
    for (auto earlier = accepted.rbegin(); earlier != accepted.rend(); ++earlier) {
        if ((*earlier)->type() == message.type() && (*earlier)->category() == message.category()) {
            return withoutTimes((*earlier)->message()) == withoutTimes(message.message());
        }
    }
    return false;
}

TEST_F(IntakeTest, TheIndexSaysWhatAWalkOverTheListWouldAlsoAfterTheSort) {
    std::mt19937 random(7);
    const auto upTo = [&](int most) { return static_cast<int>(random() % static_cast<unsigned>(most + 1)); };
    const auto session = device.makeSession();
    int redundant = 0;
    const auto sendRandom = [&] {
        constexpr AudioEventCategory kCategories[] = {8, 11, 14, 0x2000000B, 0x08000004};
        Dictionary payload{{"value", upTo(2)}, {"systemuptime_sec", upTo(9)}};
        if (upTo(3) != 0) {
            payload.set("zrreporting_timestamp", device.clock.seconds() + upTo(40) - 20);
        }
        const auto message =
            messageOf(payload, kCategories[upTo(4)], static_cast<AudioEventType>(upTo(2) + 1));
        const std::vector<MessageRef> accepted = session->messages();
        session->sendMessage(message);
        redundant += message->isRedundant ? 1 : 0;
        return walkSaysRedundant(accepted, *message) == message->isRedundant;
    };
    for (int round = 0; round < 20; ++round) {
        session->start();
        for (int i = 0; i < 200; ++i) {
            ASSERT_TRUE(sendRandom());
        }
        int wrongAfterSort = 0;
        WorkerScript::current().atStop["Producer"] = [&](ZRReportingSession&) {
            for (int i = 0; i < 50; ++i) {
                wrongAfterSort += sendRandom() ? 0 : 1;
            }
        };
        session->stop();
        WorkerScript::current().reset();
        EXPECT_EQ(wrongAfterSort, 0);
    }
    EXPECT_GT(redundant, 100);
}

TEST_F(IntakeTest, SortingKeepsTheOrderOfEqualTimesAndTakesNoNumberForZero) {
    const double kNaN = std::numeric_limits<double>::quiet_NaN();
    std::vector<MessageRef> messages;
    int number = 0;
    for (const Value& time : {Value(3.0), Value(1.0), Value(kNaN), Value(3.0), Value(-1.0), Value("soon")}) {
        messages.push_back(messageOf({{"n", ++number}, {"zrreporting_timestamp", time}}));
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
