#include "platform/RequestTurns.h"
#include "platform/LogOrigin.h"
#include "tests/fakes/FakeDevice.h"
#include "tests/fakes/FakeWorkQueues.h"

#include <gmock/gmock.h>

#include <new>
#include <string>

namespace tamblo {
namespace {

using std::chrono::milliseconds;
using testing::ElementsAre;

class RequestTurnsTest : public testing::Test {
protected:
    using Queue = std::shared_ptr<RequestQueue>;

    Queue queueOf(uid_t user) {
        return turns.makeQueue({user, static_cast<pid_t>(user) + 1}, [this] { seen += '!'; });
    }
    /// Work that takes its time, and notes the name.
    auto work(char name, milliseconds time = milliseconds(1)) {
        return [this, name, time] {
            seen += name;
            clock.advance(time);
        };
    }
    std::string run() {
        (void)serverQueue.runAll();
        return std::exchange(seen, "");
    }

    FakeClock clock;
    FakeSerialQueue serverQueue{"server"};
    RequestTurns turns{serverQueue, clock};
    std::string seen;
};

TEST_F(RequestTurnsTest, UsersShareTheTimeHoweverManyConnectionsTheyHave) {
    const Queue queues[] = {queueOf(1), queueOf(1), queueOf(1), queueOf(2)};
    for (const char* const names : {"abcd", "ABCD", "0123"}) {
        for (std::size_t i = 0; i != std::size(queues); ++i) {
            queues[i]->post(work(names[i]));
        }
    }
    EXPECT_EQ(run(), "adbDc3"
                     "ABC012");
    // Quick ones fill a turn together.
    for (int i = 0; i != 4; ++i) {
        queues[0]->post(work('q', milliseconds(0)));
        queues[3]->post(work('x'));
    }
    EXPECT_EQ(run(), "qqqqxxxx");
}

TEST_F(RequestTurnsTest, APieceOfTheServerQueueEndsInTimeAndWhenItIsToldTo) {
    const Queue queue = queueOf(1);
    for (const char name : std::string("abcde")) {
        queue->post(work(name));
    }
    queue->post([this] { turns.endPiece(); });
    queue->post(work('g'));
    std::vector<std::string> pieces;
    while (serverQueue.runOne()) {
        pieces.push_back(std::exchange(seen, ""));
    }
    EXPECT_THAT(pieces, ElementsAre("abc", "de", "g"));
}

TEST_F(RequestTurnsTest, WorkThatMayBlockRunsInAPieceThatMay) {
    const Queue first = queueOf(1), second = queueOf(2);
    first->post(work('a'));
    first->post(work('B'), Pace::mayBlock);
    second->post(work('c'));
    EXPECT_TRUE(serverQueue.runOne());
    EXPECT_EQ(seen, "ac");
    EXPECT_THAT(serverQueue.takePaces(), ElementsAre(Pace::quick, Pace::mayBlock));
    EXPECT_EQ(run(), "acB");
}

TEST_F(RequestTurnsTest, TheRestOfARequestComesBeforeTheNextAndOthersInBetween) {
    const Queue first = queueOf(1), second = queueOf(2);
    first->post([this, &first] {
        work('a')();
        first->postNext(work('b'));
    });
    first->post(work('c'));
    second->post(work('x'));
    second->post(work('y'));
    EXPECT_EQ(run(), "axbyc");

    first->post([this, &first] {
        work('a')();
        first->suspend();
        first->suspend();
        first->postNext(work('b'));
    });
    first->post(work('c'));
    EXPECT_EQ(run(), "ab") << "what has begun ends";
    first->resume();
    EXPECT_EQ(run(), "");
    first->postNext(work('d'));
    first->resume();
    EXPECT_EQ(run(), "dc");

    first->suspend();
    first->post(work('a'));
    EXPECT_EQ(run(), "");
    first->abandon();
    first->resume();
    first->post(work('b'));
    EXPECT_EQ(run(), "b") << "neither what waited nor the suspension is left, whose end comes late";
}

TEST_F(RequestTurnsTest, WithoutMemoryThePieceIsLostAndTheClientIsTold) {
    const Queue queue = queueOf(1);
    queue->post([] { throw std::bad_alloc(); });
    queue->post([this] { seen += std::to_string(LogOrigin::client().value_or(ClientIdentity{}).process); });
    EXPECT_EQ(run(), "!2");
}

} // namespace
} // namespace tamblo
