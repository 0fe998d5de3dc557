#include "session/SessionStop.h"

#include "session/BlockingWork.h"
#include "session/ZRReportingSession.h"
#include "util/Log.h"
#include "util/TraceEvents.h"

#include <algorithm>
#include <cstddef>
#include <utility>
#include <vector>

namespace tamblo {

namespace {

/// A session that retains less is stopped in one part.
constexpr std::size_t kBytesOfShortStop = 128U << 10U;
/// Messages that are entered into the index, or let go, in one part.
constexpr std::size_t kMessagesOfPart = 20'000;
/// Messages that came meanwhile and are sent in one part.
constexpr std::size_t kMessagesSentInPart = 500;

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
        stop_ = std::make_unique<SessionStop>(messages_, blocks_.bytes() < kBytesOfShortStop);
    }
    do {
        stopNextPart();
    } while (stop_->isShort && stop_->step != SessionStop::Step::done);
    if (stop_->step != SessionStop::Step::done) {
        return false;
    }
    stop_.reset();
    return true;
}

void ZRReportingSession::stopNextPart() {
    switch (stop_->step) {
    case SessionStop::Step::sort:
        if (stop_->sort->sortSome()) {
            stop_->step = stop_->sort->hasChanged() ? SessionStop::Step::index : SessionStop::Step::workers;
            stop_->sort.reset();
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
        letGoOfSome();
        break;
    case SessionStop::Step::waiting:
        sendSomeWaiting();
        break;
    case SessionStop::Step::done:
        break;
    }
}

void ZRReportingSession::indexSomeAgain() {
    const std::size_t end = std::min(messages_.size(), stop_->indexed + kMessagesOfPart);
    for (; stop_->indexed < end; ++stop_->indexed) {
        lastMessages_.add(*messages_[stop_->indexed]);
    }
    if (end == messages_.size()) {
        stop_->step = SessionStop::Step::workers;
    }
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
        stop_->isLarge = stop_->past.size() > kManyMessages;
        lastMessages_.clear();
        return;
    }
    const Worker& worker = messageWorkers_[workers.back()];
    stop_->isSending = true;
    const bool isStopped = worker.instance->stopSome();
    stop_->isSending = false;
    if (isStopped) {
        worker.instance->setStarted(false);
        log::debug(ZRReportingSessionCategory(),
                   "ZRReportingSessionWorker action=stop worker={} reporterID={}", *worker.workerClass,
                   reporterID_);
        workers.pop_back();
    }
}

void ZRReportingSession::letGoOfSome() {
    std::vector<MessageRef>& past = stop_->past;
    past.resize(past.size() - std::min(past.size(), kMessagesOfPart));
    if (!past.empty()) {
        return;
    }
    std::vector<MessageRef>().swap(past);
    retained_.remove(blocks_.bytes());
    blocks_.clear();
    totalMessageCount_ = 0;
    ownRecordCount_ = 0;
    droppedMessageCount_ = 0;
    started_ = false;
    stop_->step = SessionStop::Step::waiting;
    if (stop_->isLarge) {
        context_.shared<BlockingWork>(context_.platform()).giveBackMemorySoon();
    }
}

bool ZRReportingSession::hasToWait() const noexcept {
    return stop_ != nullptr && !stop_->isSending;
}

void ZRReportingSession::keepWaiting(const MessageRef& message, ErrorReply reply) {
    addMissingDates(*message, context_.platform().clock->now());
    const std::size_t bytes = kBytesOfMessage + heldBytes(message->payload());
    if (retained_.addWaiting(bytes)) {
        stop_->waiting.push_back({message, std::move(reply), bytes});
        return;
    }
    if (!std::exchange(stop_->hasRefused, true)) {
        log::error(ZRReportingSessionCategory(),
                   "too many messages wait for the end of a stop, and more are refused. reporterID={}",
                   reporterID_);
    }
    if (reply) {
        const ReplyError error = limitReached("waiting_messages", RetainedMessages::kMostWaitingBytesOfUser);
        reply(&error);
    }
}

void ZRReportingSession::sendSomeWaiting() {
    stop_->isSending = true;
    for (std::size_t i = 0; i < kMessagesSentInPart && !stop_->waiting.empty(); ++i) {
        SessionStop::Waiting next = std::move(stop_->waiting.front());
        stop_->waiting.pop_front();
        retained_.removeWaiting(next.bytes);
        sendMessage(next.message, std::move(next.reply));
    }
    stop_->isSending = false;
    if (stop_->waiting.empty()) {
        stop_->step = SessionStop::Step::done;
    }
}

} // namespace tamblo
