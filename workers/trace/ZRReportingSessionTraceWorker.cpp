#include "workers/trace/ZRReportingSessionTraceWorker.h"

#include "platform/Counters.h"
#include "session/ZRReportingSession.h"
#include "util/Log.h"
#include "workers/ReportFileName.h"
#include "workers/trace/ChromeTrace.h"

#include <algorithm>
#include <cstddef>
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
        counters::add(counters::Counter::performanceFilesLost);
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

std::unique_ptr<ZRReportingSessionTraceWorker::Ending>
ZRReportingSessionTraceWorker::end(const ZRReportingSession& session) {
    auto ending = std::make_unique<Ending>();
    ending->stoppedAt = platform().clock->now();
    SessionTrace& trace = ending->trace;
    trace.reporterID = session.reporterID();
    trace.serviceName = session.serviceName();
    trace.applicationName = ZRReportingUtilityRetrieveAppName(session.configuration());
    trace.recorded = recording_->take(ending->stoppedAt);
    trace.processNames = {session.clientProcessName().value_or("")};
    trace.processNames.resize(trace.recorded.processes.size());
    return ending;
}

bool ZRReportingSessionTraceWorker::stopSome() {
    constexpr std::size_t kMessagesOfPart = 20'000;
    const std::shared_ptr<ZRReportingSession> owner = session();
    if (owner == nullptr || recording_ == nullptr) {
        recording_.reset();
        return true;
    }
    if (ending_ == nullptr) {
        ending_ = end(*owner);
    }
    const std::vector<MessageRef>& messages = owner->messages();
    const std::size_t last = std::min(messages.size(), ending_->looked + kMessagesOfPart);
    for (; ending_->looked < last; ++ending_->looked) {
        ending_->search.take(*messages[ending_->looked]);
    }
    if (ending_->looked < messages.size()) {
        return false;
    }
    ending_->search.finish();
    recording_->runLater([&device = platform(), ending = std::move(ending_)] {
        deliver(device, ending->trace, ending->stoppedAt);
    });
    recording_.reset();
    return true;
}

} // namespace tamblo
