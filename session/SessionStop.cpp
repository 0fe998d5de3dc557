#include "session/SessionStop.h"

#include "platform/Counters.h"
#include "session/ZRReportingSession.h"
#include "util/Log.h"
#include "util/TraceEvents.h"

#include <algorithm>
#include <cstddef>
#include <memory>
#include <utility>
#include <vector>

namespace tamblo {

namespace {

/// A session that retains less is stopped in one part.
constexpr std::size_t kBytesOfShortStop = 128U << 10U;
/// Messages that are entered into the index, or let go, in one part.
constexpr std::size_t kMessagesOfPart = 5'000;
/// A message that a worker has derived and is still to send, about.
constexpr std::size_t kBytesOfDerivedMessage = 512;

} // namespace

void ZRReportingSession::stop() {
    while (!stopSome()) {
    }
}

bool ZRReportingSession::stopSome() {
    if (stop_ == nullptr) {
        recordOwnMessage(AudioEventTypeStop, "stop");
        log::debug(ZRReportingSessionCategory(), "stop called. reporterID={}", reporterID_);
        if (!started_) {
            return true;
        }
        log::debug(ZRReportingSessionCategory(), "ending session. reporterID={}", reporterID_);
        emitTracePoint(context_, TraceEvent::sessionStopped);
        stopTime_ = context_.platform().clock->now();
        stop_ = std::make_unique<SessionStop>(messages_, blocks_.bytes() < kBytesOfShortStop);
    }
    do {
        stopNextPart();
    } while (stop_->isShort && stop_->step != SessionStop::Step::done);
    if (stop_->step != SessionStop::Step::done) {
        return false;
    }
    endStop();
    return true;
}

void ZRReportingSession::giveUpStop() {
    if (stop_ != nullptr) {
        if (messages_.empty()) {
            messages_.swap(stop_->past);
        }
        endStop();
    }
}

void ZRReportingSession::endStop() {
    const std::unique_ptr<SessionStop> past = std::move(stop_);
    for (UniqueFunction<void()>& call : past->waiting) {
        call();
    }
}

void ZRReportingSession::stopNextPart() {
    switch (stop_->step) {
    case SessionStop::Step::sort:
        if (stop_->sort->sortSome()) {
            stop_->step = stop_->sort->hasChanged() ? SessionStop::Step::index : SessionStop::Step::workers;
            stop_->keySets = stop_->sort->takeKeySets();
            stop_->sort.reset();
            stop_->kinds = lastMessages_.size();
            orderWorkersToStop();
        }
        break;
    case SessionStop::Step::index:
        indexSomeAgain();
        break;
    case SessionStop::Step::workers:
        stopSomeOfWorkers();
        break;
    case SessionStop::Step::letGo:
        letGoOfPast();
        break;
    case SessionStop::Step::done:
        break;
    }
}

void ZRReportingSession::indexSomeAgain() {
    if (stop_->indexed == 0) {
        lastMessages_.clear();
    }
    // From the end on: as a rule, all kinds of messages are met soon.
    const std::size_t end = std::min(messages_.size(), stop_->indexed + kMessagesOfPart);
    while (stop_->indexed < end && lastMessages_.size() < stop_->kinds) {
        ++stop_->indexed;
        lastMessages_.addOlder(*messages_[messages_.size() - stop_->indexed]);
    }
    if (stop_->indexed == messages_.size() || lastMessages_.size() == stop_->kinds) {
        stop_->step = SessionStop::Step::workers;
    }
}

std::span<const KeySet*> ZRReportingSession::keySetsAtStop() noexcept {
    return stop_ != nullptr ? std::span(stop_->keySets) : std::span<const KeySet*>();
}

void ZRReportingSession::orderWorkersToStop() {
    forEachWorker(&WorkerRole::producer, &WorkerRole::consumer, [this](const Worker& worker) {
        stop_->workers.push_back(static_cast<std::size_t>(&worker - messageWorkers_.data()));
    });
    std::reverse(stop_->workers.begin(), stop_->workers.end());
}

void ZRReportingSession::stopSomeOfWorkers() {
    std::vector<std::size_t>& workers = stop_->workers;
    while (!workers.empty() && !messageWorkers_[workers.back()].instance->started()) {
        workers.pop_back();
    }
    if (workers.empty()) {
        stop_->step = SessionStop::Step::letGo;
        stop_->past.swap(messages_);
        std::vector<const KeySet*>().swap(stop_->keySets);
        lastMessages_.clear();
        return;
    }
    const Worker& worker = messageWorkers_[workers.back()];
    if (!worker.workerClass->role.producer && !stop_->keySets.empty()) {
        // The others, which come last, may change messages without saying so.
        std::vector<const KeySet*>().swap(stop_->keySets);
    }
    if (worker.instance->stopSome()) {
        worker.instance->setStarted(false);
        log::debug(ZRReportingSessionCategory(),
                   "ZRReportingSessionWorker action=stop worker={} reporterID={}", *worker.workerClass,
                   reporterID_);
        workers.pop_back();
    }
}

bool ZRReportingSession::holdsDerived(std::size_t messages) {
    if (stop_ == nullptr) {
        return true; // a worker that is stopped by itself
    }
    const std::size_t bytes = messages * kBytesOfDerivedMessage;
    retained_.removeDerived(std::exchange(stop_->heldBytes, bytes));
    retained_.addDerived(bytes);
    const bool hasRoom = retained_.hasRoomForDerived();
    if (!hasRoom && !std::exchange(stop_->isFullTold, true)) {
        counters::addAlone(counters::Counter::stopsCut);
        log::error(ZRReportingSessionCategory(),
                   "too much is derived of a session at its stop, and more is left out. reporterID={} pid={}",
                   reporterID_, processIdentifiers_.empty() ? 0 : processIdentifiers_.front());
    }
    return hasRoom;
}

bool ZRReportingSession::letGoSome() {
    isLeaving_ = true;
    lastMessages_.clear();
    return letGoSomeOf(messages_);
}

bool ZRReportingSession::letGoSomeOf(std::vector<MessageRef>& messages) {
    const std::size_t left = messages.size() - std::min(messages.size(), kMessagesOfPart);
    while (messages.size() > left) {
        __builtin_prefetch(
            messages[messages.size() - std::min(messages.size(), MessageSort::kLookAhead)].get());
        messages.pop_back();
    }
    if (!messages.empty()) {
        return false;
    }
    std::vector<MessageRef>().swap(messages);
    const std::size_t derived = std::exchange(derivedBytes_, 0);
    retained_.removeDerived(derived);
    retained_.removeFreed(blocks_.bytes() - derived);
    blocks_.clear();
    return true;
}

void ZRReportingSession::letGoOfPast() {
    if (!letGoSomeOf(stop_->past)) {
        return;
    }
    totalMessageCount_ = 0;
    ownRecordCount_ = 0;
    droppedMessageCount_ = 0;
    started_ = false;
    counters::addAlone(counters::Counter::sessionsStopped);
    stop_->step = SessionStop::Step::done;
}

void ZRReportingSession::whenStopped(UniqueFunction<void()> call) {
    stop_->waiting.push_back(std::move(call));
}

} // namespace tamblo
