#pragma once

#include "platform/BugReportDraftingService.h"
#include "platform/DiagnosticCaptureService.h"
#include "platform/DiagnosticsMetricsService.h"
#include "platform/MemoryLog.h"
#include "platform/PowerEventLog.h"
#include "platform/ReportFiles.h"

#include <cstddef>
#include <cstdint>
#include <map>
#include <memory>
#include <optional>
#include <set>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

/// Where reports go: each keeps what it is given.
namespace tamblo {

/// Keeps what is submitted: the metric's number and the bytes of the record.
class FakeDiagnosticsMetricsService final : public DiagnosticsMetricsService {
public:
    void SubmitMetricRecord(std::uint32_t metric, std::span<const std::uint8_t> record) override {
        records.emplace_back(metric, std::vector<std::uint8_t>(record.begin(), record.end()));
    }

    std::vector<std::pair<std::uint32_t, std::vector<std::uint8_t>>> records;
};

/// Keeps what is posted.
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

/// Keeps the drafts; a test calls their completions.
class FakeBugReportDraftingService final : public BugReportDraftingService {
public:
    struct Request {
        BugReportDraft draft;
        std::string processName;
        std::string displayReason;
        Completion completion;
    };
    void createDraft(const BugReportDraft& draft, const std::string& processName,
                     const std::string& displayReason, Completion completion) override {
        requests.push_back({draft, processName, displayReason, std::move(completion)});
    }

    std::vector<Request> requests;
};

/// Keeps the requests.
class FakeDiagnosticCaptureService final : public DiagnosticCaptureService {
public:
    void captureStacks(StackCaptureRequest request) override { requests.push_back(std::move(request)); }

    std::vector<StackCaptureRequest> requests;
};

/// Keeps the requests.
class FakeMemoryLog final : public MemoryLog {
public:
    struct Request {
        std::int64_t reporterID;
        std::vector<pid_t> processes;
    };
    void logMemory(std::int64_t reporterID, std::vector<pid_t> processes) override {
        requests.push_back({reporterID, std::move(processes)});
    }

    std::vector<Request> requests;
};

/// Report files in memory. Each step can be made to fail, with the text that a test sets for it.
class FakeReportFiles final : public ReportFiles {
public:
    [[nodiscard]] std::string reportingLogsDirectory() const override { return "/reports"; }
    [[nodiscard]] std::string performanceLogsDirectory() const override { return "/performance"; }
    [[nodiscard]] std::optional<std::string> createDirectory(const std::string& path) override {
        createdDirectories.push_back(path);
        return directoryFailure;
    }
    [[nodiscard]] std::variant<std::unique_ptr<ReportFile>, std::string>
    createFile(const std::string& path) override {
        if (openFailure) {
            return *openFailure;
        }
        files[path].clear();
        return std::make_unique<File>(*this, files[path]);
    }

    std::map<std::string, std::string> files; ///< the contents by path
    std::vector<std::string> createdDirectories;
    std::optional<std::string> directoryFailure, openFailure, writeFailure, closeFailure;
    std::set<std::size_t> failingWrites; ///< those that the write failure is for, from 1; without any, all
    std::vector<std::size_t> writes;     ///< the length of each

private:
    class File final : public ReportFile {
    public:
        File(FakeReportFiles& owner, std::string& content) : owner_(owner), content_(content) {}
        [[nodiscard]] std::optional<std::string> write(std::string_view text) override {
            owner_.writes.push_back(text.size());
            const bool isMeant =
                owner_.failingWrites.empty() || owner_.failingWrites.contains(owner_.writes.size());
            if (owner_.writeFailure && isMeant) {
                return owner_.writeFailure;
            }
            content_ += text;
            return std::nullopt;
        }
        [[nodiscard]] std::optional<std::string> close() override { return owner_.closeFailure; }

    private:
        FakeReportFiles& owner_;
        std::string& content_;
    };
};

} // namespace tamblo
