#include "workers/sinks/zeph/LeakSnapshot.h"

#include "session/ZRReportingSession.h"
#include "util/Log.h"
#include "workers/sinks/ZRReportingSessionZephWorker.h"

namespace tamblo {

namespace {

/// The reporters of leaks are clients of many kinds: the capture is not about the one that tells of it.
constexpr std::string_view kUnknownProcess = "Unknown";

Dictionary powerLogOf(const ZRReportingSession& session) {
    Array processes;
    for (const pid_t process : session.processIdentifiers()) {
        processes.emplace_back(process);
    }
    const Dictionary filter{{"processIDs", std::move(processes)}};
    return {{glarn::kDiagnosticExtensionParameters, Dictionary{{glarn::kPowerLogFilterProcess, filter}}}};
}

} // namespace

void requestLeakSnapshot(const ZRReportingSessionZephWorkerInstance& detector,
                         const ZRReportingSessionMessage& message, AudioServiceType serviceType,
                         std::string_view whatLeaks) {
    const std::shared_ptr<ZRReportingSession> owner = detector.session();
    const std::shared_ptr<WorkerInstanceState>& state = detector.workerState();
    if (owner == nullptr || state->symptomReporter == nullptr) {
        return;
    }
    const auto reply = [weakState = std::weak_ptr(state), whatLeaks](const Dictionary& response) {
        const std::string identifier =
            ZRReportingSessionZephWorker::getSessionIdentifierFromResponse(response);
        if (const auto stillThere = weakState.lock()) {
            stillThere->setCurrentZephSessionIdentifier(identifier);
        }
        log::info(ZRReportingZephLogCategory(), "Started Zeph session for {} leaks. sessionId={} response={}",
                  whatLeaks, identifier, response);
    };
    const BugCaptureSignature signature =
        ZRReportingSessionZephWorker::signatureFromMessage(message, serviceType, kUnknownProcess);
    if (state->symptomReporter->snapshot(signature, std::chrono::duration<double>(0), powerLogOf(*owner),
                                         reply)) {
        log::info(ZRReportingZephLogCategory(), "Parameters to Zeph session accepted.");
    } else {
        log::error(ZRReportingZephLogCategory(), "Parameters to Zeph session not accepted!");
    }
}

} // namespace tamblo
