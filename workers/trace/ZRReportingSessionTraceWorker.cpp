#include "workers/trace/ZRReportingSessionTraceWorker.h"

#include "session/ZRReportingSession.h"
#include "util/Log.h"
#include "workers/ReportFileName.h"
#include "workers/trace/ChromeTrace.h"

#include <string>
#include <utility>
#include <variant>
#include <vector>

namespace tamblo {

namespace {

/// Writes a whole file; answers what went wrong, or nothing.
std::optional<std::string> writeFile(ReportFiles& files, const std::string& path, std::string_view text) {
    auto opened = files.createFile(path);
    if (auto* failure = std::get_if<std::string>(&opened)) {
        return std::move(*failure);
    }
    ReportFile& file = *std::get<std::unique_ptr<ReportFile>>(opened);
    auto failure = file.write(text);
    const auto closeFailure = file.close();
    return failure ? failure : closeFailure;
}

/// Makes the file of a trace that is complete but for the service's name, at the time of its end.
void deliver(const Platform& device, SessionTrace& trace, WallTime stoppedAt) {
    const pid_t service = device.processInformation->ownProcessIdentifier();
    for (std::size_t i = 0; i < trace.recorded.processes.size(); ++i) {
        if (trace.recorded.processes[i].pid == service) {
            trace.processNames[i] = device.processInformation->ProcessNameForPid(service).value_or("");
        }
    }
    const std::string directory = device.reportFiles->performanceLogsDirectory();
    const std::string path = directory + "/" +
                             reportFileName(stoppedAt, device.clock->utcOffset(stoppedAt), trace.reporterID,
                                            trace.applicationName, trace.serviceName);
    std::optional<std::string> failure = device.reportFiles->createDirectory(directory);
    if (!failure) {
        failure = writeFile(*device.reportFiles, path, chromeTraceText(trace).view());
    }
    if (failure) {
        log::error(ZRReportingTraceCategory(), "TraceWorker failed to write file. file={} error=\"{}\"", path,
                   *failure);
    } else {
        log::info(ZRReportingTraceCategory(), "TraceWorker wrote file. file={}", path);
    }
}

} // namespace

std::shared_ptr<ZRReportingSessionWorkerProtocol>
ZRReportingSessionTraceWorker::initWithSession(Context& context,
                                               const std::shared_ptr<ZRReportingSession>& session) {
    return context.isInternalBuild() ? std::make_shared<ZRReportingSessionTraceWorker>(context, session)
                                     : nullptr;
}

std::optional<bool> ZRReportingSessionTraceWorker::start() {
    const std::shared_ptr<ZRReportingSession> owner = session();
    if (owner == nullptr) {
        return false;
    }
    std::vector<pid_t> processes{platform().processInformation->ownProcessIdentifier()};
    // The client's comes first, unless the service is its own client.
    const std::vector<pid_t>& clients = owner->processIdentifiers();
    if (!clients.empty() && clients.front() != processes.front()) {
        processes.insert(processes.begin(), clients.front());
    }
    recording_ = context().shared<ProcessSampler>(platform()).record(processes);
    return recording_ != nullptr;
}

void ZRReportingSessionTraceWorker::stop() {
    const std::shared_ptr<ZRReportingSession> owner = session();
    const std::unique_ptr<ProcessSampler::Recording> recording = std::move(recording_);
    if (owner == nullptr || recording == nullptr) {
        return;
    }
    const WallTime now = platform().clock->now();
    auto trace = std::make_unique<SessionTrace>();
    trace->reporterID = owner->reporterID();
    trace->serviceName = owner->serviceName();
    trace->applicationName = ZRReportingUtilityRetrieveAppName(owner->configuration());
    trace->recorded = recording->take(now);
    trace->processNames = {owner->clientProcessName().value_or("")};
    trace->processNames.resize(trace->recorded.processes.size());
    addMarks(*trace, owner->messages());
    recording->runLater(
        [&device = platform(), trace = std::move(trace), now] { deliver(device, *trace, now); });
}

} // namespace tamblo
