#include "service/SingleMessageSessionKeeper.h"

#include "base/WhileAlive.h"
#include "session/ZRReportingSession.h"
#include "util/AudioEvents.h"
#include "util/Log.h"
#include "util/MessageKeys.h"

#include <utility>

namespace tamblo {

namespace {

constexpr std::chrono::milliseconds kReaperInterval{500};
constexpr std::chrono::duration<double> kTimeout{5.0};
constexpr ReporterID kSingleMessageReporterID = 1;

} // namespace

SessionRef SingleMessageSessionKeeper::create() {
    log::standard(ZRReportingServiceDelegateCategory(), "Creating singleMessageSession");
    SessionRef session = ZRReportingSession::initWithID(
        context_, kSingleMessageReporterID, {context_.platform().processInformation->ownProcessIdentifier()});
    session->setIsSingleMessageSession(true);
    session->setServiceType(AudioServiceTypeStandalone);
    session->updateConfigurationWithContentsOfConfiguration({{ZRReportingApplicationName, "Unknown"}});
    session->start();
    return session;
}

const SessionRef& SingleMessageSessionKeeper::retrieve() {
    if (singleMessageSession_ == nullptr) {
        singleMessageSession_ = create();
        tickLater();
    }
    singleMessageSessionLastRetrieved_ = context_.platform().clock->steadyNow();
    return singleMessageSession_;
}

void SingleMessageSessionKeeper::tickLater() {
    singleMessageSessionReaper_ = context_.platform().workQueues->callAfter(
        kReaperInterval, [&queue = context_.serverQueue(), keeper = weak_from_this()] {
            queue.post(whileAlive(keeper, [](auto& alive) { alive.reapSingleMessageSession(); }),
                       Pace::mayBlock);
        });
}

void SingleMessageSessionKeeper::reapSingleMessageSession() {
    if (singleMessageSession_ == nullptr) {
        return;
    }
    // By the steady clock: a time of day that is set back does not keep the session.
    const std::chrono::duration<double> elapsed =
        context_.platform().clock->steadyNow() - singleMessageSessionLastRetrieved_;
    if (!(kTimeout < elapsed)) {
        log::debug(ZRReportingServiceDelegateCategory(),
                   "Not stopping singleMessageSession. elapsed={} timeout={}", elapsed.count(),
                   kTimeout.count());
        tickLater();
        return;
    }
    log::info(ZRReportingServiceDelegateCategory(), "Stopping singleMessageSession after timeout={}",
              kTimeout.count());
    stopSome(std::exchange(singleMessageSession_, nullptr));
}

void SingleMessageSessionKeeper::stopSome(SessionRef session) {
    if (!session->stopSome()) {
        const auto rest = [session = std::move(session)](auto& keeper) { keeper.stopSome(session); };
        context_.serverQueue().post(whileAlive(weak_from_this(), rest), Pace::mayBlock);
    }
}

void SingleMessageSessionKeeper::stop() {
    singleMessageSessionReaper_.reset();
    if (const SessionRef session = std::exchange(singleMessageSession_, nullptr)) {
        session->stop();
    }
}

} // namespace tamblo
