#include "platform/linux/captures/LinuxBugCaptureService.h"

#include "base/Format.h"
#include "os/RandomNumber.h"
#include "platform/Counters.h"
#include "platform/ProcessList.h"

#include <span>
#include <utility>
#include <vector>

namespace tamblo {

namespace {

/// Beside the folders.
constexpr std::string_view kAllowanceFile = "allowance.json";

} // namespace

class LinuxBugCaptureService::Reporter final : public GlarnReporter {
public:
    Reporter(LinuxBugCaptureService& service, std::vector<pid_t> processes)
        : service_(service), processes_(std::move(processes)) {}

    [[nodiscard]] bool snapshot(const BugCaptureSignature& signature, std::chrono::duration<double> duration,
                                const Dictionary& payload, Reply reply) override {
        return service_.request({"snapshot", signature, duration, payload, processes_}, reply);
    }
    [[nodiscard]] bool startSession(const BugCaptureSignature& signature,
                                    std::chrono::duration<double> duration, Reply reply) override {
        return service_.request({"start", signature, duration, {}, processes_}, reply);
    }
    void cancelSession(std::string_view sessionIdentifier) override {
        service_.cancel(std::string(sessionIdentifier));
    }

private:
    LinuxBugCaptureService& service_;
    const std::vector<pid_t> processes_;
};

LinuxBugCaptureService::LinuxBugCaptureService(SinkFiles& sinks, const std::string& directory,
                                               const Clock& clock, WorkQueues& workQueues,
                                               LinuxStructuredLog& log, FileModes modes,
                                               const CaptureContent& content)
    : content_(content),
      clock_(clock),
      workQueues_(workQueues),
      log_(log),
      file_(sinks, "bug-captures.jsonl", "zrrb"),
      folders_(directory, log, modes),
      allowance_(folders_.kept(kAllowanceFile), formatted("{}/{}", folders_.path(), kAllowanceFile), log),
      lastNumber_(randomNumber()),
      queue_(workQueues, "com.vandra.tamblo.bugcaptures",
             {.waiting = kMaximumWaiting,
              .ofUser = kMaximumWaiting,
              .what = "pieces of bug captures",
              .categoryCode = "zrrb",
              .counted = counters::Counter::bugCapturesWaiting},
             log) {}

std::unique_ptr<GlarnReporter> LinuxBugCaptureService::makeReporter(std::span<const pid_t> processes) {
    ProcessList eachOnce;
    eachOnce.add(processes);
    counters::add(counters::Counter::processes, eachOnce.leftOut());
    return std::make_unique<Reporter>(*this, std::move(eachOnce).take());
}

bool LinuxBugCaptureService::request(CaptureRequest request, const GlarnReporter::Reply& reply) {
    // Written so that what is no number is refused.
    if (!(request.duration.count() >= 0 && request.duration <= kMaximumDuration)) {
        counters::add(counters::Counter::bugCapturesInvalid);
        return false;
    }
    request.time = clock_.now();
    const GlarnError refusal = admit(request.time);
    if (refusal != kGlarnErrorNone) {
        counters::add(refusal == kGlarnErrorDailyLimitExceeded ? counters::Counter::bugCapturesRefusedToday
                                                               : counters::Counter::bugCapturesShutdown);
        reply({{glarn::kReplySuccess, false}, {glarn::kReplyReason, static_cast<std::int32_t>(refusal)}});
        return true;
    }
    request.identifier = CaptureFolders::identifier(request.time, ++lastNumber_);
    const auto kept = std::make_shared<const CaptureRequest>(std::move(request));
    queue_.post([this] { folders_.keep(kAllowanceFile, allowance_.text()); });
    if (kept->duration.count() == 0) {
        gatherLater(kept);
    } else {
        appendRequest(*kept);
        run(kept);
    }
    reply({{glarn::kReplySuccess, true}, {glarn::kReplySessionID, kept->identifier}});
    return true;
}

GlarnError LinuxBugCaptureService::admit(WallTime time) {
    {
        const MutexLock lock(mutex_);
        if (isEnded_) {
            return kGlarnErrorServiceUnavailable;
        }
    }
    return allowance_.take(time) ? kGlarnErrorNone : kGlarnErrorDailyLimitExceeded;
}

void LinuxBugCaptureService::run(const RequestRef& request) {
    const auto delay = std::chrono::ceil<std::chrono::milliseconds>(request->duration);
    {
        // A call that comes at once waits here until it can be found.
        const MutexLock lock(mutex_);
        if (!isEnded_) {
            running_.try_emplace(
                request->identifier,
                Running{request, workQueues_.callAfter(delay, [this, identifier = request->identifier] {
                            finish(identifier);
                        })});
            return;
        }
    }
    counters::add(counters::Counter::bugCapturesShutdown);
    append("cancel", request->identifier);
}

LinuxBugCaptureService::RequestRef LinuxBugCaptureService::takeRunning(const std::string& identifier) {
    Running taken;
    const MutexLock lock(mutex_);
    const auto found = running_.find(identifier);
    if (found == running_.end()) {
        return nullptr;
    }
    taken = std::move(found->second);
    running_.erase(found);
    return taken.request;
}

void LinuxBugCaptureService::cancel(const std::string& identifier) {
    if (takeRunning(identifier) != nullptr) {
        counters::add(counters::Counter::bugCapturesCancelled);
        append("cancel", identifier);
    }
}

void LinuxBugCaptureService::finish(const std::string& identifier) {
    if (const RequestRef request = takeRunning(identifier)) {
        gatherLater(request);
    }
}

void LinuxBugCaptureService::endSessions() {
    std::map<std::string, Running, std::less<>> running;
    {
        const MutexLock lock(mutex_);
        isEnded_ = true;
        running.swap(running_);
    }
    counters::add(counters::Counter::bugCapturesShutdown, running.size());
    for (const auto& [identifier, capture] : running) {
        append("cancel", identifier);
    }
}

void LinuxBugCaptureService::gatherLater(const RequestRef& request) {
    queue_.post([this, request] { gather(*request); });
}

void LinuxBugCaptureService::gather(const CaptureRequest& request) {
    const WallTime now = clock_.now();
    std::vector<CaptureFile> files = content_.gather(request, now);
    files.push_back({"log.txt", log_.lastLines()});
    folders_.store(request.identifier, files, now);
    if (request.duration.count() == 0) {
        appendRequest(request);
    } else {
        append("end", request.identifier);
    }
    file_.flush();
}

void LinuxBugCaptureService::appendRequest(const CaptureRequest& request) {
    file_.append([&](TextBuffer& line) {
        SinkLine fields(line, request.time);
        addRequest(fields, request);
    });
}

void LinuxBugCaptureService::append(std::string_view operation, std::string_view identifier) {
    file_.append([&](TextBuffer& line) {
        SinkLine(line, clock_.now()).text("op", operation).text("session", identifier);
    });
}

} // namespace tamblo
