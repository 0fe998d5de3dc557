#include "platform/RequestTurns.h"

#include "base/Mutex.h"
#include "platform/Counters.h"
#include "platform/LogOrigin.h"
#include "platform/ProcessorShare.h"

#include <algorithm>
#include <atomic>
#include <chrono>
#include <cstddef>
#include <deque>
#include <map>
#include <new>
#include <utility>
#include <vector>

namespace tamblo {

namespace {

using Time = std::chrono::steady_clock::time_point;

/// A client's turn ends with the first piece of work that makes it this long.
constexpr std::chrono::milliseconds kSlice{1};
/// Turns make one piece of the server queue until they have taken this long together: replies wait for no
/// longer than that, and whoever lends its thread to the queue has it back.
constexpr std::chrono::milliseconds kPieceOfTurns{3};
/// A queue keeps room for so many pieces while it has none.
constexpr std::size_t kKeptItems = 64;

} // namespace

/// Shared with the queues, which may outlive the turns.
struct RequestTurns::State : std::enable_shared_from_this<State> {
    using QueueRef = std::shared_ptr<Queue>;

    State(SerialQueue& queue, const Clock& steadyClock) : serverQueue(queue), clock(steadyClock) {}

    /// Puts a queue with work among those that wait, and sees to it that turns are taken.
    void enlist(Queue& queue, Pace pace) TAMBLO_REQUIRES(mutex);
    void callForTurns(Pace pace) TAMBLO_REQUIRES(mutex);
    /// The queue whose turn it is; null when none waits.
    [[nodiscard]] QueueRef begin() TAMBLO_EXCLUDES(mutex);
    /// Puts it behind the others, if it has more to run, or before them, if it could not begin.
    void end(const QueueRef& queue, bool isStillItsTurn) TAMBLO_EXCLUDES(mutex);
    /// Runs a queue for a slice. Answers whether its next piece may block, which must not happen here.
    [[nodiscard]] bool takeTurn(Queue& queue, bool mayBlock);
    [[nodiscard]] bool takeMeasuredTurn(Queue& queue, bool mayBlock);
    /// The piece of the server queue.
    void takeTurns(bool mayBlock) TAMBLO_EXCLUDES(mutex);

    SerialQueue& serverQueue;
    const Clock& clock;
    std::atomic<bool> endsSoon{false};

    Mutex mutex;
    /// Of each user who waits, the queues that do, in the order of their turns.
    std::map<uid_t, std::deque<QueueRef>> waiting TAMBLO_GUARDED_BY(mutex);
    std::deque<uid_t> users TAMBLO_GUARDED_BY(mutex); ///< in the order of their turns
    bool isCalled TAMBLO_GUARDED_BY(mutex) = false;
};

/// A client's queue. The fields are guarded by the mutex of the state; but while it is its turn, the batch
/// and the rest of a request are touched by the turn alone, without it.
class RequestTurns::Queue final : public RequestQueue, public std::enable_shared_from_this<Queue> {
public:
    struct Item {
        Work work;
        Pace pace = Pace::quick;
        RequestTally::Stamp arrival = 0; ///< of a request
    };

    Queue(std::shared_ptr<State> state, const ClientIdentity& identity, UniqueFunction<void()> onNoMemory)
        : client(identity), outOfMemory(std::move(onNoMemory)), state_(std::move(state)) {}

    void post(Work work, Pace pace) override {
        const MutexLock lock(state_->mutex);
        pending.emplace_back(std::move(work), pace, tally().arrival());
        state_->enlist(*this, pace);
    }
    void postNext(Work work, Pace pace) override {
        const MutexLock lock(state_->mutex);
        rest = {std::move(work), pace, 0};
        state_->enlist(*this, pace);
    }
    void suspend() override {
        const MutexLock lock(state_->mutex);
        if (!isAbandoned) {
            ++suspensions;
        }
    }
    void resume() override {
        const MutexLock lock(state_->mutex);
        if (!isAbandoned && --suspensions == 0) {
            state_->enlist(*this, Pace::quick);
        }
    }
    void abandon() override {
        std::vector<Item> dropped[2];
        Item droppedRest;
        const MutexLock lock(state_->mutex);
        dropped[0].swap(pending);
        dropped[1].swap(batch);
        std::swap(droppedRest, rest);
        const auto isLost = [](const Item& item) { return item.work && item.arrival != 0; };
        counters::add(counters::Counter::requestsLostShutdown,
                      static_cast<std::uint64_t>(std::ranges::count_if(dropped[0], isLost) +
                                                 std::ranges::count_if(dropped[1], isLost)));
        next = 0;
        isAbandoned = true;
        suspensions = 0;
    }

    [[nodiscard]] bool mayRun() const noexcept {
        return rest.work || (suspensions == 0 && (next != batch.size() || !pending.empty()));
    }
    void fillBatch() {
        if (next == batch.size()) {
            batch.clear();
            next = 0;
            batch.swap(pending);
        }
    }
    /// Once nothing is left to run: thousands of clients that have all had much to run keep no room for it.
    void giveRoomBack() noexcept {
        if (next == batch.size() && pending.empty() && batch.capacity() + pending.capacity() > kKeptItems) {
            std::vector<Item>().swap(batch);
            std::vector<Item>().swap(pending);
            next = 0;
        }
    }
    /// The next piece of the turn, or null.
    [[nodiscard]] Item* front() noexcept {
        if (rest.work) {
            return &rest;
        }
        return suspensions == 0 && next != batch.size() ? &batch[next] : nullptr;
    }
    /// Before a piece begins: notes how long its request has waited.
    void noteBegin(Time began) noexcept {
        if (rest.work) {
            return;
        }
        const RequestTally::Stamp arrival = batch[next].arrival;
        isRequest = arrival != 0;
        took = {};
        if (isRequest) {
            counters::noteAlone(counters::Histogram::waited,
                                RequestTally::between(arrival, RequestTally::stampOf(began)));
        }
    }
    /// After it: what it took, and the request with all of its pieces.
    void noteEnd(std::chrono::nanoseconds time) noexcept {
        charge(processorShare.of(time));
        took += time;
        if (isRequest && !rest.work) {
            counters::noteAlone(counters::Histogram::took, took);
        }
    }
    void runFront() {
        if (rest.work) {
            Work work = std::exchange(rest.work, Work());
            work();
            return;
        }
        // What the work holds is let go before the next runs, as if it had never been queued.
        Work& work = batch[next].work;
        ++next;
        work();
        work.reset();
    }

    const ClientIdentity client;
    UniqueFunction<void()> outOfMemory;
    std::vector<Item> pending;
    std::vector<Item> batch;
    std::size_t next = 0;
    Item rest;                        ///< of the request at hand
    std::chrono::nanoseconds took{0}; ///< until now
    ProcessorShare processorShare;
    bool isRequest = false;
    bool isListed = false; ///< among those that wait, or at its turn
    bool isAbandoned = false;
    /// Of an abandoned queue none count, nor their ends, which may come late.
    std::atomic<std::size_t> suspensions{0};

private:
    const std::shared_ptr<State> state_;
};

void RequestTurns::State::enlist(Queue& queue, Pace pace) {
    if (queue.isListed || !queue.mayRun()) {
        return;
    }
    std::deque<QueueRef>& ofUser = waiting[queue.client.user];
    ofUser.push_back(queue.shared_from_this());
    if (ofUser.size() == 1) {
        users.push_back(queue.client.user);
    }
    queue.isListed = true;
    callForTurns(pace);
}

void RequestTurns::State::callForTurns(Pace pace) {
    if (!isCalled) {
        const auto turns = [self = shared_from_this(), mayBlock = pace == Pace::mayBlock] {
            self->takeTurns(mayBlock);
        };
        serverQueue.post(turns, pace);
        isCalled = true;
    }
}

RequestTurns::State::QueueRef RequestTurns::State::begin() {
    const MutexLock lock(mutex);
    if (users.empty()) {
        isCalled = false;
        return nullptr;
    }
    const auto ofUser = waiting.find(users.front());
    users.pop_front();
    QueueRef queue = std::move(ofUser->second.front());
    ofUser->second.pop_front();
    if (ofUser->second.empty()) {
        waiting.erase(ofUser);
    } else {
        users.push_back(queue->client.user);
    }
    queue->fillBatch();
    return queue;
}

void RequestTurns::State::end(const QueueRef& queue, bool isStillItsTurn) {
    const MutexLock lock(mutex);
    queue->isListed = queue->mayRun();
    if (!queue->isListed) {
        queue->giveRoomBack();
        return;
    }
    std::deque<QueueRef>& ofUser = waiting[queue->client.user];
    const bool isUserListed = !ofUser.empty();
    if (!isStillItsTurn) {
        ofUser.push_back(queue);
    } else {
        ofUser.push_front(queue);
    }
    if (!isUserListed) {
        users.push_back(queue->client.user);
    }
}

bool RequestTurns::State::takeTurn(Queue& queue, bool mayBlock) {
    const LogOrigin origin(queue.client);
    Time now = clock.steadyNow();
    const Time ends = now + kSlice;
    do {
        const Queue::Item* const item = queue.front();
        if (item == nullptr) {
            return false;
        }
        if (item->pace == Pace::mayBlock && !mayBlock) {
            return true;
        }
        queue.noteBegin(now);
        try {
            queue.runFront();
        } catch (const std::bad_alloc&) {
            counters::add(counters::Counter::requestsLostMemory);
            queue.outOfMemory();
        }
        const Time began = std::exchange(now, clock.steadyNow());
        queue.noteEnd(now - began);
    } while (!endsSoon && now < ends);
    return false;
}

bool RequestTurns::State::takeMeasuredTurn(Queue& queue, bool mayBlock) {
    const std::chrono::nanoseconds processor = clock.threadTime();
    const Time began = clock.steadyNow();
    const bool mustBlock = takeTurn(queue, mayBlock);
    queue.processorShare.addSample(clock.threadTime() - processor, clock.steadyNow() - began);
    return mustBlock;
}

void RequestTurns::State::takeTurns(bool mayBlock) {
    const Time ends = clock.steadyNow() + kPieceOfTurns;
    while (const QueueRef queue = begin()) {
        const bool mustBlock = queue->processorShare.wantsSample() ? takeMeasuredTurn(*queue, mayBlock)
                                                                   : takeTurn(*queue, mayBlock);
        end(queue, mustBlock);
        if (mustBlock || endsSoon.exchange(false) || clock.steadyNow() >= ends) {
            const MutexLock lock(mutex);
            isCalled = false;
            if (!users.empty()) {
                callForTurns(mustBlock ? Pace::mayBlock : Pace::quick);
            }
            return;
        }
    }
}

RequestTurns::RequestTurns(SerialQueue& serverQueue, const Clock& clock)
    : state_(std::make_shared<State>(serverQueue, clock)) {}

RequestTurns::~RequestTurns() = default;

std::shared_ptr<RequestQueue> RequestTurns::makeQueue(const ClientIdentity& client,
                                                      UniqueFunction<void()> outOfMemory) {
    return std::make_shared<Queue>(state_, client, std::move(outOfMemory));
}

void RequestTurns::endPiece() noexcept {
    state_->endsSoon = true;
}

} // namespace tamblo
