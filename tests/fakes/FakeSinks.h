#pragma once

#include "platform/Platform.h"

#include <map>
#include <optional>
#include <set>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

/// Where reports go: each keeps what it is given.
namespace tamblo {

/// Records every event that it is sent: those who send are to ask first which ones are in use. All are,
/// unless a test names some.
class FakeAnalyticsEventService final : public AnalyticsEventService {
public:
    struct Event {
        std::string name;
        Dictionary payload;
    };

    bool isEventInUse(std::string_view eventName) override { return !inUse_ || inUse_->contains(eventName); }
    std::uint64_t inUseGeneration() const noexcept override { return generation_; }
    void sendEventsLazy(std::span<const std::string_view> eventNames,
                        const std::function<Dictionary()>& payload) override {
        for (const std::string_view eventName : eventNames) {
            events.push_back({std::string(eventName), payload()});
        }
    }

    void setEventsInUse(std::optional<std::set<std::string, std::less<>>> names) {
        inUse_ = std::move(names);
        ++generation_;
    }
    /// The payloads of the events of this name.
    [[nodiscard]] std::vector<Dictionary> payloads(std::string_view eventName) const {
        std::vector<Dictionary> found;
        for (const Event& event : events) {
            if (event.name == eventName) {
                found.push_back(event.payload);
            }
        }
        return found;
    }

    std::vector<Event> events;

private:
    std::uint64_t generation_ = 1;
    std::optional<std::set<std::string, std::less<>>> inUse_;
};

/// Keeps what its reporters ask for; accepts as a test says, and answers when it does.
class FakeBugCaptureService final : public BugCaptureService {
public:
    struct Request {
        std::string operation; ///< "snapshot", "start" or "cancel"
        std::vector<pid_t> processes;
        BugCaptureSignature signature;
        std::chrono::duration<double> duration{0};
        Dictionary payload;
        std::string session; ///< of a "cancel"
    };

    std::unique_ptr<GlarnReporter> makeReporter(std::span<const pid_t> processes) override {
        return std::make_unique<Reporter>(*this, std::vector(processes.begin(), processes.end()));
    }
    /// Answers the oldest request that waits.
    void answer(const Dictionary& response) {
        GlarnReporter::Reply reply = std::move(replies.front());
        replies.erase(replies.begin());
        reply(response);
    }

    bool accepts = true;
    std::vector<Request> requests;
    std::vector<GlarnReporter::Reply> replies;

private:
    class Reporter final : public GlarnReporter {
    public:
        Reporter(FakeBugCaptureService& owner, std::vector<pid_t> processes)
            : owner_(owner), processes_(std::move(processes)) {}
        bool snapshot(const BugCaptureSignature& signature, std::chrono::duration<double> duration,
                      const Dictionary& payload, Reply reply) override {
            return owner_.take({"snapshot", processes_, signature, duration, payload, {}}, std::move(reply));
        }
        bool startSession(const BugCaptureSignature& signature, std::chrono::duration<double> duration,
                          Reply reply) override {
            return owner_.take({"start", processes_, signature, duration, {}, {}}, std::move(reply));
        }
        void cancelSession(std::string_view sessionIdentifier) override {
            owner_.requests.push_back({"cancel", processes_, {}, {}, {}, std::string(sessionIdentifier)});
        }

    private:
        FakeBugCaptureService& owner_;
        const std::vector<pid_t> processes_;
    };

    bool take(Request request, GlarnReporter::Reply reply) {
        requests.push_back(std::move(request));
        if (accepts) {
            replies.push_back(std::move(reply));
        }
        return accepts;
    }
};

/// Keeps what its sessions are given; finds back ends when a test says so.
class FakeCallQualityService final : public CallQualityService {
public:
    struct Message {
        std::uint16_t category;
        std::uint16_t type;
        Dictionary payload;
    };
    struct FakeSession final : Session {
        std::string description() const override { return "fake session"; }

        Dictionary sessionInfo, userInfo;
        std::vector<Message> messages;
        int flushes = 0;
    };

    std::optional<std::string> NewHierarchyToken(std::string_view) override { return token; }
    SessionRef CreateLinkmeterSession(const Dictionary& sessionInfo, const Dictionary& userInfo) override {
        auto session = std::make_shared<FakeSession>();
        session->sessionInfo = sessionInfo;
        session->userInfo = userInfo;
        sessions.push_back(session);
        return session;
    }
    void StartConfiguration(const SessionRef&, Completion completion) override {
        completions.push_back(std::move(completion));
    }
    std::optional<std::string> SendLinkmeterMessage(const SessionRef& session, std::uint16_t category,
                                                    std::uint16_t type, const Dictionary& payload,
                                                    std::string_view leftOut) override {
        if (sendFailure || session == nullptr) {
            return sendFailure;
        }
        Dictionary sent = payload;
        if (!leftOut.empty()) {
            sent.remove(leftOut);
        }
        static_cast<FakeSession&>(*session).messages.push_back({category, type, std::move(sent)});
        return std::nullopt;
    }
    bool trySendLinkmeterMessage(const SessionRef& session, std::uint16_t category, std::uint16_t type,
                                 const Dictionary& payload, std::string_view leftOut) override {
        return !sendFailure && !SendLinkmeterMessage(session, category, type, payload, leftOut);
    }
    void FlushMessages(const SessionRef& session) override { ++static_cast<FakeSession&>(*session).flushes; }

    /// Answers the oldest configuration that waits.
    void findBackends(const std::optional<std::vector<std::string>>& backends) {
        Completion completion = std::move(completions.front());
        completions.erase(completions.begin());
        completion(backends);
    }

    std::optional<std::string> token = "token";
    std::optional<std::string> sendFailure;
    std::vector<std::shared_ptr<FakeSession>> sessions;
    std::vector<Completion> completions;
};

class FakeDiagnosticsMetricsService final : public DiagnosticsMetricsService {
public:
    void SubmitMetricRecord(std::uint32_t metric, std::span<const std::uint8_t> record) override {
        records.emplace_back(metric, std::vector<std::uint8_t>(record.begin(), record.end()));
    }

    std::vector<std::pair<std::uint32_t, std::vector<std::uint8_t>>> records; ///< metric and bytes
};

class FakePowerEventLog final : public PowerEventLog {
public:
    struct Event {
        std::uint32_t subsystem;
        std::string name;
        Dictionary payload;
    };
    void postRegisteredPowerEvent(std::uint32_t subsystem, std::string_view eventName,
                                  const Dictionary& payload) override {
        events.push_back({subsystem, std::string(eventName), payload});
    }

    std::vector<Event> events;
};

/// Keeps for whom there were drafts; a test calls their completions.
class FakeBugReportDraftingService final : public BugReportDraftingService {
public:
    struct Request {
        std::string processName;
        Completion completion;
    };
    void createDraft(const BugReportDraft&, const std::string& processName, const std::string&,
                     Completion completion) override {
        requests.push_back({processName, std::move(completion)});
    }

    std::vector<Request> requests;
};

class FakeDiagnosticCaptureService final : public DiagnosticCaptureService {
public:
    void captureStacks(StackCaptureRequest request) override { requests.push_back(std::move(request)); }

    std::vector<StackCaptureRequest> requests;
};

class FakeMemoryLog final : public MemoryLog {
public:
    void logMemory(std::int64_t reporterID, std::vector<pid_t> processes) override {
        requests.emplace_back(reporterID, std::move(processes));
    }

    std::vector<std::pair<std::int64_t, std::vector<pid_t>>> requests; ///< reporter and processes
};

/// Report files in memory. Each step can be made to fail, with the text that a test sets for it.
class FakeReportFiles final : public ReportFiles {
public:
    std::string reportingLogsDirectory() const override { return "/reports"; }
    std::string performanceLogsDirectory() const override { return "/performance"; }
    std::optional<std::string> createDirectory(const std::string&) override { return directoryFailure; }
    std::variant<std::unique_ptr<ReportFile>, std::string> createFile(const std::string& path) override {
        if (openFailure) {
            return *openFailure;
        }
        files[path].clear();
        return std::make_unique<File>(*this, files[path]);
    }

    std::map<std::string, std::string> files; ///< the contents by path
    std::optional<std::string> directoryFailure, openFailure, writeFailure, closeFailure;
    std::vector<std::size_t> writes; ///< the length of each

private:
    class File final : public ReportFile {
    public:
        File(FakeReportFiles& owner, std::string& content) : owner_(owner), content_(content) {}
        std::optional<std::string> write(std::string_view text) override {
            owner_.writes.push_back(text.size());
            if (!owner_.writeFailure) {
                content_ += text;
            }
            return owner_.writeFailure;
        }
        std::optional<std::string> close() override { return owner_.closeFailure; }

    private:
        FakeReportFiles& owner_;
        std::string& content_;
    };
};

} // namespace tamblo
