#include "service/Answers.h"
#include "service/ZRReportingClientServerInstance.h"
#include "session/ZRReportingSession.h"
#include "util/Log.h"
#include "util/TraceEvents.h"

#include <algorithm>
#include <new>
#include <utility>

// How sessions of a client are stopped: by a request, and with the client's end.

namespace tamblo {

namespace {

/// How many sessions of a client that leaves are let go in one piece of work; of started ones, one.
constexpr std::size_t kSessionsLeftAtOnce = 16;

} // namespace

void ZRReportingClientServerInstance::stopReportingSessionForID(ReporterID reporterID, BooleanReply reply) {
    onServerQueue(Pace::mayBlock, [reporterID, reply = std::move(reply)](auto& client) mutable {
        client.performStop(reporterID, std::move(reply));
    });
}

void ZRReportingClientServerInstance::performStop(ReporterID reporterID, BooleanReply reply) {
    log::debug(ZRReportingServiceDelegateCategory(), "stopping session for reporter {}", reporterID);
    emitTracePoint(context_, TraceEvent::stopReportingSession);
    if (reporterID == 0) {
        answer(reply, true);
        return;
    }
    const SessionRef session = findReportingSessionForID(reporterID, false);
    if (session != nullptr && session->started()) {
        stopThen(session, [reporterID, session, reply = std::move(reply)](auto& client) mutable {
            client.finishStop(reporterID, session, std::move(reply));
        });
        if (session->isStopping()) {
            sessionChanged(reporterID, session);
        }
        return;
    }
    log::debug(ZRReportingServiceDelegateCategory(),
               "Stop called, but session==nil or session.started==false. reporterID={} session={} "
               "session.started={}",
               reporterID, session, session != nullptr && session->started());
    log::standard(ZRReportingServiceDelegateCategory(), "stopping {}", reporterID);
    answer(reply, true);
}

void ZRReportingClientServerInstance::finishStop(ReporterID reporterID, const SessionRef& session,
                                                 BooleanReply reply) {
    sessionChanged(reporterID, session);
    BooleanReply held = session->takeTransactionCompleteBlock();
    answer(held, true);
    logReportingSessions();
    log::standard(ZRReportingServiceDelegateCategory(), "stopping {}", reporterID);
    answer(reply, true);
}

template <typename Finish>
void ZRReportingClientServerInstance::stopThen(const SessionRef& session, Finish finish) {
    requests_->chargeTo(session->processorTime());
    if (session->stopSome()) {
        finish(*this);
        return;
    }
    afterTurnsOfOthers(Pace::mayBlock, [session, finish = std::move(finish)](auto& client) mutable {
        client.stopThen(session, std::move(finish));
    });
}

void ZRReportingClientServerInstance::destroyReportingSession(ReporterID reporterID, BooleanReply reply) {
    onServerQueue(Pace::mayBlock, [reporterID, reply = std::move(reply)](auto& client) mutable {
        client.performDestroy(reporterID, std::move(reply));
    });
}

void ZRReportingClientServerInstance::performDestroy(ReporterID reporterID, BooleanReply reply) {
    log::debug(ZRReportingServiceDelegateCategory(), "destroying session for reporter {}", reporterID);
    emitTracePoint(context_, TraceEvent::destroyReportingSession);
    if (reporterID == 0) {
        answer(reply, true);
        return;
    }
    const SessionRef session = findReportingSessionForID(reporterID, false);
    if (session == nullptr || !session->started()) {
        finishDestroy(reporterID, std::move(reply));
        return;
    }
    // From the first part on, the ID is its next holder's.
    sessionChanged(reporterID, nullptr);
    stopThen(session, [reporterID, reply = std::move(reply)](auto& client) mutable {
        client.finishDestroy(reporterID, std::move(reply));
    });
}

void ZRReportingClientServerInstance::finishDestroy(ReporterID reporterID, BooleanReply reply) {
    const auto entry = clientReportingSessionMap_.find(reporterID);
    if (entry != clientReportingSessionMap_.end()) {
        sessionChanged(reporterID, nullptr);
        letGoOf(entry);
    }
    log::standard(ZRReportingServiceDelegateCategory(), "destroying {}", reporterID);
    logReportingSessions();
    answer(reply, true);
}

void ZRReportingClientServerInstance::handleConnectionError() {
    onServerQueue(Pace::mayBlock, [](auto& client) { client.endConnection(); });
}

std::size_t ZRReportingClientServerInstance::abandon() {
    requests_->abandon();
    const auto isStarted = [](const auto& entry) { return entry.second->started(); };
    return static_cast<std::size_t>(std::ranges::count_if(clientReportingSessionMap_, isStarted));
}

void ZRReportingClientServerInstance::endAtOnce() {
    requests_->abandon();
    handleConnectionError();
}

/// Leaves the service, then stops the started sessions. No held start reply is answered.
void ZRReportingClientServerInstance::endConnection() {
    const Delegate delegate = delegate_.lock();
    if (delegate != nullptr && delegate->removeClient(*this)) {
        hasLeft_ = true;
        leaveSome();
    }
}

void ZRReportingClientServerInstance::leaveSome() {
    bool hasStopped = false;
    for (std::size_t i = 0; i != kSessionsLeftAtOnce && !hasStopped && !clientReportingSessionMap_.empty();
         ++i) {
        // Let go as soon as it is stopped, so that what it holds is not freed all at once in the end.
        const auto entry = clientReportingSessionMap_.begin();
        const SessionRef session = entry->second;
        hasStopped = session->started();
        bool isOver = !hasStopped;
        try {
            isOver = isOver || session->stopSome();
        } catch (const std::bad_alloc&) {
            log::ownError(ZRReportingServiceDelegateCategory(),
                          "no memory to stop the session of reporter {}", entry->first);
            session->giveUpStop();
            isOver = true;
        }
        if (isOver) {
            letGoOf(entry);
        }
    }
    if (!clientReportingSessionMap_.empty()) {
        afterTurnsOfOthers(Pace::mayBlock, [](auto& client) { client.leaveSome(); });
        return;
    }
    log::standard(ZRReportingServiceDelegateCategory(), "removing {} from the server client list",
                  processIdentifier());
    if (const Delegate delegate = delegate_.lock()) {
        delegate->clientHasLeft(shared_from_this());
    }
}

} // namespace tamblo
