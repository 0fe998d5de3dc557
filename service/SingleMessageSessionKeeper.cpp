#include "service/SingleMessageSessionKeeper.h"

#include "session/ZRReportingSession.h"
#include "util/AudioEvents.h"
#include "util/Log.h"
#include "util/MessageKeys.h"

#include <utility>

namespace tamblo {

namespace {

constexpr ReporterID kSingleMessageReporterID = 1;

} // namespace

SingleMessageSessionKeeper::~SingleMessageSessionKeeper() {
    std::unique_ptr<RepeatingTimer> reaper;
    {
        const std::lock_guard held(mutex_);
        reaper = std::move(singleMessageSessionReaper_);
    }
    // Waits for a tick that has not taken the session; a tick that has is waited for below.
    reaper.reset();
    std::unique_lock held(mutex_);
    reapEnded_.wait(held, [this] { return runningReaps_ == 0; });
}

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

SessionRef SingleMessageSessionKeeper::retrieve() {
    const std::lock_guard held(mutex_);
    if (singleMessageSession_ == nullptr) {
        singleMessageSession_ = create();
    }
    if (singleMessageSessionReaper_ == nullptr) {
        singleMessageSessionReaper_ = context_.platform().workQueues->makeRepeatingTimer(
            kReaperInterval, [this] { reapSingleMessageSession(); });
        singleMessageSessionReaper_->start();
    }
    singleMessageSessionLastRetrieved_ = context_.platform().clock->now();
    return singleMessageSession_;
}

void SingleMessageSessionKeeper::reapSingleMessageSession() {
    // The reaper ends with this tick, from within, when it has done its work.
    std::unique_ptr<RepeatingTimer> reaper;
    const SessionRef session = takeIdleSession(reaper);
    if (session == nullptr) {
        return;
    }
    session->stop();
    const std::lock_guard held(mutex_);
    --runningReaps_;
    reapEnded_.notify_all();
}

SessionRef SingleMessageSessionKeeper::takeIdleSession(std::unique_ptr<RepeatingTimer>& reaper) {
    const std::lock_guard held(mutex_);
    if (singleMessageSession_ == nullptr || !singleMessageSessionLastRetrieved_) {
        return nullptr;
    }
    const std::chrono::duration<double> elapsed =
        context_.platform().clock->now() - *singleMessageSessionLastRetrieved_;
    if (!(kTimeout < elapsed)) {
        log::debug(ZRReportingServiceDelegateCategory(),
                   "Not stopping singleMessageSession. elapsed={} timeout={}", elapsed.count(),
                   kTimeout.count());
        return nullptr;
    }
    log::info(ZRReportingServiceDelegateCategory(), "Stopping singleMessageSession after timeout={}",
              kTimeout.count());
    if (singleMessageSessionReaper_ != nullptr) {
        singleMessageSessionReaper_->invalidate();
    }
    reaper = std::move(singleMessageSessionReaper_);
    ++runningReaps_;
    return std::exchange(singleMessageSession_, nullptr);
}

void SingleMessageSessionKeeper::stop() {
    SessionRef session;
    std::unique_ptr<RepeatingTimer> reaper;
    {
        std::unique_lock held(mutex_);
        session = std::exchange(singleMessageSession_, nullptr);
        reaper = std::move(singleMessageSessionReaper_);
        reapEnded_.wait(held, [this] { return runningReaps_ == 0; });
    }
    reaper.reset();
    if (session != nullptr) {
        session->stop();
    }
}

SessionRef SingleMessageSessionKeeper::singleMessageSession() const {
    const std::lock_guard held(mutex_);
    return singleMessageSession_;
}

} // namespace tamblo
