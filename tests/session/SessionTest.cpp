#include "session/MessageIntake.h"
#include "session/MessageSort.h"
#include "tests/fakes/FakePlatform.h"
#include "tests/fakes/Messages.h"
#include "tests/session/ScriptedWorkers.h"
#include "util/Log.h"

#include <gmock/gmock.h>

#include <algorithm>
#include <cmath>
#include <optional>
#include <random>
#include <utility>

namespace tamblo {
namespace {

using testing::ElementsAre;
using testing::IsEmpty;

class SessionTest : public testing::Test {
protected:
    SessionTest() { script.reset(); }
    ~SessionTest() override { script.reset(); }

    MessageRef send(ZRReportingSession& to, Dictionary payload,
                    AudioEventCategory category = AudioEventKindVolume,
                    AudioEventType type = AudioEventTypeSummary) {
        MessageRef message = messageOf(std::move(payload), category, type);
        to.sendMessage(message);
        return message;
    }

    FakePlatform device;
    WorkerScript& script = WorkerScript::current();
};

TEST_F(SessionTest, WorkersStartAndStopInOrder) {
    const auto session = device.makeSession();
    EXPECT_THAT(script.take(), ElementsAre("start Init"));
    session->start();
    EXPECT_THAT(script.take(), ElementsAre("start Both", "start Late", "start Producer"));
    session->stop();
    EXPECT_THAT(script.take(), ElementsAre("stop Producer", "stop Both", "stop Init", "stop Redundant",
                                           "stop Late", "stop Only"));
    session->start();
    EXPECT_EQ(session->workerInstanceCount(), 6U) << "stopped workers are used again";
    EXPECT_THAT(script.take(), ElementsAre("start Init", "start Both", "start Late", "start Producer"));
}

TEST_F(SessionTest, AWorkerThatRefusesIsTriedAgainAndOneThatDoesNotStartGetsNothing) {
    script.refusing = {"Late"};
    script.notStarting = {"Both"};
    const auto session = device.makeSession();
    session->start();
    send(*session, {{"a", 1}});
    session->stop();
    EXPECT_THAT(script.take(), ElementsAre("start Init", "start Both", "start Producer", "message Init 14/11",
                                           "message Redundant 14/11", "stop Producer", "stop Init",
                                           "stop Redundant", "stop Only"));
    script.reset();
    session->start();
    (void)script.take();
    send(*session, {{"a", 1}});
    EXPECT_THAT(script.take(), ElementsAre("message Init 14/11", "message Redundant 14/11",
                                           "message Both 14/11", "message Late 14/11"));
}

TEST_F(SessionTest, ASingleMessageSessionLeavesOutTheWorkersThatAreNotForIt) {
    const auto session = device.makeSession();
    session->setIsSingleMessageSession(true);
    session->start();
    EXPECT_THAT(script.take(), ElementsAre("start Init", "start Late"));
    EXPECT_EQ(session->workerInstanceCount(), 3U) << "Redundant was made before the session was such a one";
}

TEST_F(SessionTest, MessagesReachTheConsumersThatMaySeeThem) {
    const auto session = device.makeSession();
    (void)script.take();
    EXPECT_FALSE(send(*session, {{"a", 0}})->isSessionStarted);
    EXPECT_THAT(script.take(), ElementsAre("message Init 14/11", "message Redundant 14/11"));
    session->start();
    EXPECT_TRUE(send(*session, {{"a", 1}})->isSessionStarted);
    (void)script.take();
    EXPECT_TRUE(send(*session, {{"a", 1}})->isRedundant);
    EXPECT_THAT(script.take(), ElementsAre("message Redundant 14/11"));

    const MessageRef message = messageOf({{"a", 2}}, 5, 6);
    message->setDestinationWorkers({workerClassNamed("Late"), workerClassNamed("Producer")});
    bool isAnswered = false;
    session->sendMessage(message, [&](const ReplyError* error) { isAnswered = error == nullptr; });
    EXPECT_THAT(script.take(), ElementsAre("message Late 5/6"));
    EXPECT_TRUE(isAnswered);
    const auto copy = message->copyWithZone();
    EXPECT_TRUE(copy->isSessionStarted && copy->destinationWorkers().empty());
}

TEST_F(SessionTest, CountsAndPreviousValuesFollowEveryMessageTheListOnlyTheAccepted) {
    const auto session = device.makeSession();
    session->start();
    send(*session, {{"a", 1}, {"b", 1}});
    send(*session, {{"a", 1}, {"b", 1}, {"systemuptime_sec", 9}});
    send(*session, {{"a", 2}});
    EXPECT_EQ(session->totalMessageCount(), 3);
    EXPECT_EQ(session->messages().size(), 3U) << "the start's own, the first and the last";
    EXPECT_EQ(shown(session->previousValues(), {"a", "b", "systemuptime_sec"}), "2 1 9");
    session->stop();
    EXPECT_EQ(session->totalMessageCount(), 0);
    EXPECT_TRUE(session->previousValues().contains("b"));
}

TEST_F(SessionTest, OwnRecordsOfStartAndStop) {
    const auto session = device.makeSession(77);
    session->stop();
    ASSERT_EQ(session->messages().size(), 1U) << "a stop without a start stays until the next real one";
    session->start();
    session->start();
    ASSERT_EQ(session->messages().size(), 3U);
    const char* const rows[] = {R"("stop" 0 0 77 "NO" "nil" "SetupStop")",
                                R"("start" 1 1 77 "NO" "nil" "SetupStart")",
                                R"("start" 2 2 77 "YES" "nil" "SetupStart")"};
    for (std::size_t i = 0; i < 3; ++i) {
        const Dictionary& payload = session->messages()[i]->payload();
        const std::string suffix = i == 0 ? "_at_stop" : "_at_start";
        EXPECT_EQ(shown(payload, {"method", "messages" + suffix, "unique_messages" + suffix, "reporterid",
                                  "running" + suffix, "invalid_timestamp", "audiotag"}),
                  rows[i]);
        EXPECT_EQ(*payload.find("zrreporting_timestamp"), Value(device.clock.seconds()));
    }
}

TEST_F(SessionTest, ProducersSendWhileConsumersStillRun) {
    auto session = device.makeSession();
    std::string seen;
    script.atStop["Producer"] = [&](ZRReportingSession& owner) {
        for (const MessageRef& message : owner.messages()) {
            seen += shown(message->payload(), {"n", "method"}) + ' ';
        }
        EXPECT_TRUE(send(owner, {{"sum", 1}}, 1, 11)->isSessionStarted);
    };
    script.atStop["Late"] = [this](ZRReportingSession& owner) { send(owner, {{"late", 1}}, 2, 11); };
    session->start();
    const double now = device.clock.seconds();
    send(*session, {{"n", 2}, {"zrreporting_timestamp", now + 2}});
    send(*session, {{"n", 1}, {"zrreporting_timestamp", now + 1}});
    (void)script.take();
    session->stop();
    EXPECT_EQ(seen, R"("start" "stop" 1 2 )") << "by time";
    EXPECT_THAT(script.take(), ElementsAre("stop Producer", "message Init 1/11", "message Redundant 1/11",
                                           "message Both 1/11", "message Late 1/11", "stop Both", "stop Init",
                                           "stop Redundant", "stop Late", "message Late 2/11", "stop Only"));
    EXPECT_THAT(session->messages(), IsEmpty());
    session.reset();
    EXPECT_THAT(device.tracePoints.codes, ElementsAre(0x21044828, 0x2104482C, 0x21044838, 0x21044838,
                                                      0x21044830, 0x21044838, 0x21044838, 0x21044834));
}

TEST_F(SessionTest, AStopInPartsIsTheStopAndWhatComesMeanwhileFollowsIt) {
    constexpr int kLate = 40;
    const auto run = [this](bool inParts) {
        std::mt19937 random(11);
        const auto session = device.makeSession();
        session->start();
        script.atStop["Producer"] = [this](ZRReportingSession& owner) { send(owner, {{"sum", 1}}, 1, 11); };
        for (int i = 0; i < 3000; ++i) {
            send(*session, {{"n", i}, {"zrreporting_timestamp", 2e9 + static_cast<double>(random() % 900)}});
        }
        (void)script.take();
        std::string seen;
        script.atStop["Late"] = [&](ZRReportingSession& owner) {
            for (const MessageRef& message : owner.messages()) {
                seen += shown(message->payload(), {"n", "sum", "zrreporting_timestamp"}) + ' ';
            }
        };
        int parts = 0, waiting = 0, sent = 0;
        const auto sendLate = [&] {
            const int number = sent++;
            session->sendMessage(messageOf({{"late", number}, {"zrreporting_timestamp", 2e9}}, 3, 11),
                                 [&seen, number](const ReplyError* error) {
                                     EXPECT_EQ(error, nullptr);
                                     seen += formatted("reply {} ", number);
                                 });
        };
        if (inParts) {
            while (!session->stopSome()) {
                EXPECT_TRUE(session->isStopping());
                ++parts;
                if (waiting < kLate) {
                    ++waiting;
                    session->whenStopped(sendLate);
                }
            }
            EXPECT_GT(parts, 5);
        } else {
            session->stop();
        }
        EXPECT_FALSE(session->isStopping());
        while (sent < kLate) {
            sendLate();
        }
        for (const std::string& event : script.take()) {
            seen += event + ' ';
        }
        for (const MessageRef& message : session->messages()) {
            EXPECT_FALSE(message->isSessionStarted);
            seen += shown(message->payload(), {"late"}) + ' ';
        }
        script.reset();
        return seen + session->description();
    };
    EXPECT_EQ(run(true), run(false));
}

TEST_F(SessionTest, ConfigurationIsAddedToAndNamesTheApplication) {
    const auto session = device.makeSession();
    const std::string key = "HostApplicationDisplayID";
    const struct {
        Dictionary configuration;
        Dictionary sent;
        Value name;
    } cases[] = {
        {{}, {}, "Unknown"},
        {{{"QVHostApplicationDisplayID", "com.qv"}, {"k", 1}}, {}, "com.qv"},
        {{{"QVHostApplicationDisplayID", "com.qv2"}, {key, "com.host"}}, {}, "com.host"},
        {{}, {{key, "Unknown"}}, "com.host"},
        {{}, {{key, "unknown"}}, "unknown"},
        {{}, {{key, 7}}, 7},
    };
    for (const auto& [configuration, sent, name] : cases) {
        session->updateConfigurationWithContentsOfConfiguration(configuration);
        EXPECT_EQ(*send(*session, sent)->payload().find(key), name);
    }
    EXPECT_TRUE(session->configuration().contains("k"));
}

TEST_F(SessionTest, TimestampsAreRepaired) {
    const double now = device.clock.seconds();
    constexpr double kYear = 31'536'000;
    const std::pair<Value, bool> cases[] = {{now - kYear, true},
                                            {now - kYear - 1, false},
                                            {now + kYear, true},
                                            {"99999999999", true},
                                            {"soon", false}};
    for (const auto& [sent, isKept] : cases) {
        const auto message = messageOf({{"zrreporting_timestamp", sent}, {"invalid_timestamp", 5}});
        ZRReportingSession::addMissingDates(*message, device.clock.now());
        const Value kept = isKept ? sent : Value(now);
        EXPECT_EQ(message->payload(), (Dictionary{{"zrreporting_timestamp", kept},
                                                  {"invalid_timestamp", isKept ? Value(5) : sent}}));
        EXPECT_EQ(ZRReportingSession::getEpochTimeFromZRReportingStateMessage(*message), kept.doubleValue());
    }
    const auto without = messageOf({});
    EXPECT_EQ(ZRReportingSession::getEpochTimeFromZRReportingStateMessage(*without), 0.0);
    ZRReportingSession::addMissingDates(*without, device.clock.now());
    EXPECT_EQ(without->payload(), (Dictionary{{"zrreporting_timestamp", now}, {"invalid_timestamp", "nil"}}));
}

TEST_F(SessionTest, SpacesInKeysBecomeUnderscores) {
    const auto message = messageOf(
        {{"a b", 1}, {"a_b", 2}, {" c ", 3}, {"d\te", 4}, {"plain", 5}, {"x y_z", 6}, {"x_y z", 7}});
    ZRReportingSession::removeWhiteSpaceFromKeys(*message);
    EXPECT_EQ(message->payload(),
              (Dictionary{{"a_b", 1}, {"_c_", 3}, {"d\te", 4}, {"plain", 5}, {"x_y_z", 7}}));
}

TEST_F(SessionTest, ATagReplacesTheClientsHoweverManyThereAre) {
    for (AudioEventCategory i = 0; i < 4000; ++i) {
        const auto message =
            messageOf({{"audiotag", "mine"}}, AudioEventSubsystemHAL | i % 2000, AudioEventTypeState);
        ZRReportingSession::addAudioMessageTag(*message, device.context().shared<intake::AudioTags>());
        ASSERT_EQ(message->payload().find("audiotag")->stringValue(),
                  ZRReportingUtilityCategoryString(message->category()) + "State");
    }
}

TEST_F(SessionTest, WhatIsDoneAtOnceIsWhatIsDoneStepByStep) {
    intake::Normaliser normaliser;
    const double now = device.clock.seconds();
    constexpr double kYear = 31'536'000;
    const std::optional<Value> timestamps[] = {
        std::nullopt, now, now - 4e7, "soon", NAN, now - kYear, now - kYear - 1e-3, now - kYear + 0.015};
    const std::optional<Value> names[] = {std::nullopt, "mine", "Unknown", 5,
                                          "a name that is somewhat longer"};
    const std::optional<Value> tags[] = {std::nullopt, "mine"};
    for (const char* other : {"", "Z", "audio", "b c", "zz"}) {
        for (int i = 0; i < 80; ++i) {
            const std::pair<const char*, std::optional<Value>> entries[] = {
                {"zrreporting_timestamp", timestamps[i % 8]},
                {"HostApplicationDisplayID", names[i / 8 % 5]},
                {"audiotag", tags[i / 40]}};
            Dictionary sent{{other, "a text that lies in a block"}};
            for (const auto& [key, value] : entries) {
                if (value) {
                    sent.set(key, *value);
                }
            }
            Dictionary expected = sent;
            intake::addMissingDates(expected, device.clock.now());
            intake::removeWhiteSpaceFromKeys(expected);
            intake::addAudioMessageTag(expected, "the tag");
            intake::addAppName(expected, "an application");
            for (int round = 0; round < 2; ++round) {
                Dictionary payload = sent;
                normaliser.normalise(payload, "the tag", "an application", device.clock);
                EXPECT_EQ(payload, expected);
            }
        }
    }
}

TEST_F(SessionTest, TheSortInPartsIsStable) {
    std::vector<MessageRef> messages;
    std::mt19937 random(3);
    for (int i = 0; i < 70'000; ++i) {
        Dictionary payload{{"zrreporting_timestamp", static_cast<double>(random() % 50)}};
        payload.set(i % 3 == 0 ? "a" : "b", i);
        messages.push_back(messageOf(std::move(payload)));
    }
    std::vector<MessageRef> expected = messages;
    std::stable_sort(expected.begin(), expected.end(), [](const MessageRef& one, const MessageRef& other) {
        return intake::epochTime(one->payload()) < intake::epochTime(other->payload());
    });
    MessageSort sort(messages);
    while (!sort.sortSome()) {
    }
    EXPECT_TRUE(sort.hasChanged());
    EXPECT_TRUE(messages == expected);
    const std::vector<const KeySet*> keySets = sort.takeKeySets();
    EXPECT_TRUE(std::equal(
        keySets.begin(), keySets.end(), messages.begin(), messages.end(),
        [](const KeySet* keys, const MessageRef& message) { return keys == &message->payload().keys(); }));
}

/// What a walk over the session's list from its end says.
bool walkSaysRedundant(const std::vector<MessageRef>& accepted, const ZRReportingSessionMessage& message) {
    const auto earlier = std::find_if(accepted.rbegin(), accepted.rend(), [&](const MessageRef& other) {
        return other->type() == message.type() && other->category() == message.category();
    });
    const std::string_view times[] = {"systemuptime_sec", "processuptime_ms", "zrreporting_timestamp"};
    return earlier != accepted.rend() && message.category() != AudioEventKindError &&
           message.type() != AudioEventTypeError &&
           (*earlier)->payload().equalsIgnoring(message.payload(), times);
}

TEST_F(SessionTest, TheIndexSaysWhatAWalkOverTheListWouldAlsoAfterTheSort) {
    std::mt19937 random(7);
    const auto upTo = [&](int most) { return static_cast<int>(random() % static_cast<unsigned>(most + 1)); };
    const auto session = device.makeSession();
    int redundant = 0;
    const auto sendRandom = [&](int count) {
        constexpr AudioEventCategory kCategories[] = {8, 11, 14, 0x2000000B, 0x08000004};
        constexpr AudioEventType kTypes[] = {1, 2, AudioEventTypeError};
        for (; count > 0; --count) {
            Dictionary payload{{"_throttle_seconds", upTo(2)}, {"systemuptime_sec", upTo(9)}};
            if (upTo(3) != 0) {
                payload.set("zrreporting_timestamp", device.clock.seconds() + upTo(40) - 20);
            }
            if (upTo(1) != 0) {
                payload.set("processuptime_ms", upTo(9));
            }
            const std::vector<MessageRef> accepted = session->messages();
            const auto message = send(*session, payload, kCategories[upTo(4)], kTypes[upTo(2)]);
            redundant += message->isRedundant ? 1 : 0;
            ASSERT_EQ(message->isRedundant, walkSaysRedundant(accepted, *message));
        }
    };
    for (int round = 0; round < 20; ++round) {
        session->start();
        sendRandom(200);
        script.atStop["Producer"] = [&](ZRReportingSession&) { sendRandom(50); };
        session->stop();
        script.reset();
    }
    EXPECT_GT(redundant, 100);
}

TEST_F(SessionTest, SortingKeepsTheOrderOfEqualTimesAndTakesNoNumberForZero) {
    std::vector<MessageRef> messages;
    for (const Value& time :
         {Value(3.0), Value(1.0), Value(std::nan("")), Value(3.0), Value(-1.0), Value("soon")}) {
        messages.push_back(messageOf({{"n", messages.size() + 1}, {"zrreporting_timestamp", time}}));
    }
    messages.push_back(messageOf({{"n", 7}}));
    EXPECT_TRUE(ZRReportingSessionMessage::sortMessages(messages));
    std::string order;
    for (const MessageRef& message : messages) {
        order += shown(message->payload(), {"n"});
    }
    EXPECT_EQ(order, "5367214");
    EXPECT_FALSE(ZRReportingSessionMessage::sortMessages(messages));
}

} // namespace
} // namespace tamblo
