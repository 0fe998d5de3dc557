#pragma once

#include "util/LogCategory.h"

namespace tamblo {

namespace log_categories {
extern const LogCategory client, serviceDelegate, session, sessionLinkmeter, driverUtility, trace, joulery,
    qmx, zeph, summary, dp, audioRegistration;
}

/// The twelve log categories.
inline const LogCategory& ZRReportingClientCategory() noexcept {
    return log_categories::client;
}
inline const LogCategory& ZRReportingServiceDelegateCategory() noexcept {
    return log_categories::serviceDelegate;
}
inline const LogCategory& ZRReportingSessionCategory() noexcept {
    return log_categories::session;
}
inline const LogCategory& ZRReportingSessionLinkmeterCategory() noexcept {
    return log_categories::sessionLinkmeter;
}
inline const LogCategory& ZRReportingDriverUtilityCategory() noexcept {
    return log_categories::driverUtility;
}
inline const LogCategory& ZRReportingTraceCategory() noexcept {
    return log_categories::trace;
}
inline const LogCategory& ZRReportingJouleryCategory() noexcept {
    return log_categories::joulery;
}
inline const LogCategory& ZRReportingQMXLogCategory() noexcept {
    return log_categories::qmx;
}
inline const LogCategory& ZRReportingZephLogCategory() noexcept {
    return log_categories::zeph;
}
inline const LogCategory& ZRReportingSummaryLogCategory() noexcept {
    return log_categories::summary;
}
inline const LogCategory& ZRReportingDPLogCategory() noexcept {
    return log_categories::dp;
}
inline const LogCategory& ZRReportingAudioRegistrationCategory() noexcept {
    return log_categories::audioRegistration;
}

/// Makes every category ask for its threshold again: after another platform was installed.
void forgetLogThresholds() noexcept;

} // namespace tamblo
