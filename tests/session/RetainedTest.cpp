#include "base/Format.h"
#include "session/PreviousValues.h"
#include "session/RetainedMessages.h"
#include "tests/fakes/FakePlatform.h"
#include "tests/fakes/Messages.h"
#include "tests/session/ScriptedWorkers.h"

#include <gtest/gtest.h>

#include <array>
#include <map>
#include <random>
#include <string>
#include <vector>

namespace tamblo {
namespace {

class RetainedTest : public testing::Test {
protected:
    static constexpr std::size_t kLimitOfUser = 400'000;

    RetainedTest() {
        WorkerScript::current().reset();
        device.services().limits.retainedBytesOfUser = kLimitOfUser;
        device.services().limits.retainedBytes = 2 * kLimitOfUser;
    }
    std::shared_ptr<ZRReportingSession> sessionOf(uid_t user) {
        auto session = device.makeSession();
        session->setUser(user);
        return session;
    }
    static void send(ZRReportingSession& session, int count, std::size_t bytes, AudioEventType type = 11) {
        for (int i = 0; i < count; ++i) {
            session.sendMessage(messageOf({{"n", i}, {"text", std::string(bytes, 'x')}}, 14, type));
        }
    }

    RetainedMessages& all() { return device.context().shared<RetainedMessages>(device.context()); }

    FakePlatform device;
};

TEST_F(RetainedTest, TheOldestOfTheLargestGoesAndNothingElse) {
    const auto small = sessionOf(1);
    const auto large = sessionOf(1);
    const auto others = sessionOf(2);
    large->start();
    send(*small, 50, 100);
    send(*others, 300, 1000);
    send(*large, 1, 10, 12);
    send(*large, 2000, 1000);
    EXPECT_EQ(small->messages().size(), 50U);
    EXPECT_EQ(others->messages().size(), 300U);
    EXPECT_EQ(large->droppedMessageCount(), device.services().activity->droppedRecords);
    EXPECT_EQ(large->messages().size() + large->droppedMessageCount(), 2002U);
    EXPECT_EQ(large->acceptedMessageCount(), 2001U);
    EXPECT_LE(all().bytes(), 2 * kLimitOfUser);
    const auto again = messageOf({{"n", 0}, {"text", std::string(10, 'x')}}, 14, 12);
    large->sendMessage(again);
    EXPECT_FALSE(again->isRedundant) << "what it repeats is not there any more";
    large->stop();
    EXPECT_EQ(large->droppedMessageCount(), 0U);
    send(*large, 10, 1000);
    EXPECT_EQ(large->droppedMessageCount(), 0U) << "a stop gives back what was charged";
}

TEST_F(RetainedTest, BeyondTheLimitOfAllTheUserWhoHasMostLosesAndNoSessionThatStops) {
    std::vector<std::shared_ptr<ZRReportingSession>> sessions;
    for (const uid_t user : {1U, 2U, 3U}) {
        sessions.push_back(sessionOf(user));
        sessions.back()->start();
        send(*sessions.back(), user == 1 ? 150 : 350, 1000);
    }
    EXPECT_EQ(sessions[0]->droppedMessageCount(), 0U);
    EXPECT_GT(sessions[1]->droppedMessageCount() + sessions[2]->droppedMessageCount(), 20U);
    EXPECT_LE(all().bytes(), 2 * kLimitOfUser);

    ASSERT_FALSE(sessions[2]->stopSome());
    const std::size_t retained = sessions[2]->messages().size();
    send(*sessions[1], 1000, 1000);
    EXPECT_EQ(sessions[2]->messages().size(), retained);
    sessions.clear();
    EXPECT_EQ(all().bytes(), 0U);
}

TEST_F(RetainedTest, NothingIsTakenFromASessionWhoseMessagesAllGo) {
    device.services().limits.retainedBytesOfUser = 4U << 20U;
    device.services().limits.retainedBytes = 8U << 20U;
    const auto leaving = sessionOf(1);
    const auto next = sessionOf(1);
    next->start();
    send(*leaving, 6000, 10);
    ASSERT_FALSE(leaving->letGoSome());
    send(*next, 6000, 1000);
    EXPECT_EQ(leaving->messages().size(), 1000U);
    EXPECT_GT(next->droppedMessageCount(), 0U);
    EXPECT_TRUE(leaving->letGoSome());
    next->stop();
    EXPECT_LT(all().bytes(), 10'000U);
}

TEST_F(RetainedTest, RepetitionsCostTheBudgetNothingWhateverTheirKeys) {
    const auto session = sessionOf(1);
    const auto repeat = [&](int rounds) {
        for (int i = 0; i < 40 * rounds; ++i) {
            Dictionary payload{{formatted("kind{}", i % 40), "the same"}, {"common", 1}};
            session->sendMessage(messageOf(std::move(payload), 14, AudioEventType(100 + i % 40)));
        }
    };
    repeat(3);
    const std::size_t before = all().bytes();
    repeat(200);
    EXPECT_LE(all().bytes(), before);
    EXPECT_EQ(session->messages().size(), 40U);
}

TEST_F(RetainedTest, MemoryIsGivenBackOnceMuchOfItIsFree) {
    device.services().limits.retainedBytesOfUser = device.services().limits.retainedBytes = 100U << 20U;
    for (const int sessionsOfMebibytes : {4, 20}) {
        for (int i = 0; i < sessionsOfMebibytes; ++i) {
            const auto session = sessionOf(1);
            session->start();
            send(*session, 100, 10'000);
            session->stop();
        }
        device.workQueues.elapse(std::chrono::seconds(3));
        device.workQueues.run("com.vandra.tamblo.reporting.blocking");
        EXPECT_EQ(device.processInformation.timesGivenBack, sessionsOfMebibytes == 4 ? 0 : 1);
    }
}

TEST_F(RetainedTest, PreviousValuesGoWithTheLastMessages) {
    const auto session = sessionOf(1);
    for (int i = 0; i < 3000; ++i) {
        session->sendMessage(messageOf({{formatted("key{}", i), std::string(1000, 'x')}}));
    }
    EXPECT_LE(all().bytes(), kLimitOfUser + 10'000);
    EXPECT_LT(session->previousValues().size(), 1000U);
}

/// Payloads of few and of many key sets, against a plain map.
TEST(PreviousValues, AreTheLatestOfEachKey) {
    std::mt19937 random(5);
    const auto below = [&](unsigned most) { return static_cast<unsigned>(random() % most); };
    for (const unsigned kinds : {3U, 31U, 33U, 400U}) {
        std::vector<Dictionary> payloads(kinds);
        for (Dictionary& payload : payloads) {
            for (unsigned count = below(12); count > 0; --count) {
                payload.set(formatted("k{}", below(200)), 0);
            }
        }
        PreviousValues values(1000);
        std::map<std::string, Value, std::less<>> model;
        for (int i = 0; i < 4000; ++i) {
            Dictionary payload = payloads[below(kinds)];
            for (std::size_t k = 0; k < payload.size(); ++k) {
                payload.setValueAt(k, below(3) == 0 ? Value(std::string(below(90), 'v')) : Value(i));
                model.insert_or_assign(std::string(payload.keyAt(k)), payload.valueAt(k));
            }
            values.take(payload, payload.bytesOfValues(Dictionary::Shared::inFull), false);
            if (i % 97 == 0) {
                ASSERT_EQ(values.values(), Dictionary::fromMap(model));
                const std::string_view one = i % 2 == 0 ? "k7" : "k150";
                const auto found = model.find(one);
                ASSERT_EQ(values.valuesOf(std::array{one, std::string_view("none")}),
                          (found != model.end() ? Dictionary{{one, found->second}} : Dictionary()));
            }
        }
        values.clear();
        EXPECT_EQ(values.heldBytes(), 0U);
    }
}

TEST(PreviousValues, RememberSoManyKeysAndNoMore) {
    PreviousValues values(100);
    for (int i = 0; i < 500; ++i) {
        values.take({{formatted("k{}", i), i}, {"common", i}}, 100, false);
    }
    const Dictionary remembered = values.values();
    EXPECT_EQ(remembered.size(), 100U);
    EXPECT_EQ(*remembered.find("common"), Value(499));
    EXPECT_EQ(*remembered.find("k0"), Value(0));
    EXPECT_EQ(values.valuesOf(std::array<std::string_view, 3>{"k499", "common", "k0"}),
              (Dictionary{{"common", 499}, {"k0", 0}}));
    EXPECT_TRUE(values.isFull());
}

} // namespace
} // namespace tamblo
