#pragma once

#include "platform/Activity.h"
#include "platform/Limits.h"
#include "platform/StatusSource.h"
#include "platform/WorkQueue.h"
#include "platform/linux/connections/LinuxConnectionService.h"
#include "platform/linux/log/LinuxStructuredLog.h"
#include "platform/linux/loop/EventLoop.h"
#include "platform/linux/settings/LinuxPreferences.h"
#include "platform/linux/sinks/AppendOnlyFile.h"
#include "platform/linux/sinks/ReportDirectory.h"
#include "platform/linux/status/CounterFile.h"
#include "platform/linux/status/StatusSocket.h"
#include "wire/Directories.h"

#include <chrono>
#include <functional>
#include <optional>
#include <string>
#include <vector>

namespace tamblo {

/// What the documents are made of; outlives them.
struct StatusParts {
    EventLoop& loop;
    WorkQueues& workQueues;
    const LinuxStructuredLog& log;
    const wire::Directories& directories;
    const LinuxPreferences& preferences;
    const Limits& limits;
    const FileModes& fileModes;
    const SinkFiles& sinks;
    const Activity& activity;
    LinuxConnectionService& connections;
    /// Further places of `<logs>` that could not be written when that was last tried.
    std::function<std::vector<std::string>()> furtherOut;
    /// Nothing where the device does not say.
    std::function<std::optional<bool>()> isInternalBuild;
};

/// Makes what the status socket sends: JSON documents, and metrics. The service is asked for what it alone
/// knows; everything else is read where it stands, without waiting. A status that the service does not add to
/// within a second goes without, and says so.
class StatusDocuments final : public StatusAnswers {
public:
    explicit StatusDocuments(StatusParts parts)
        : parts_(std::move(parts)), reports_(ReportLimits::read(parts_.preferences)) {}

    /// Before the first question; both outlive the documents.
    void setSource(StatusSource& source, const CounterFile& counterFile, std::string version) {
        source_ = &source;
        counterFile_ = &counterFile;
        version_ = std::move(version);
    }
    void answer(const StatusRequest& request, Reply reply) override;

private:
    /// What the limits are filled with.
    struct Use {
        ConnectionUse connections;
        std::vector<UserRow> users;
    };
    struct PendingStatus;

    void answerStatus(Reply reply);
    [[nodiscard]] std::string metrics(bool isPlain) const;
    [[nodiscard]] std::string status(const std::optional<Use>& use) const;
    void appendService(JsonObject& document) const;
    void appendSettings(JsonObject& document) const;
    void appendLimits(JsonObject& document, const std::optional<Use>& use) const;
    void appendSinks(JsonObject& document) const;
    [[nodiscard]] std::optional<std::size_t> usedOf(std::string_view limit,
                                                    const std::optional<Use>& use) const;

    const StatusParts parts_;
    const ReportLimits reports_;
    StatusSource* source_ = nullptr;
    const CounterFile* counterFile_ = nullptr;
    std::string version_;
    const WallTime started_ = std::chrono::system_clock::now();
    const std::chrono::steady_clock::time_point startedSteady_ = std::chrono::steady_clock::now();
};

} // namespace tamblo
