#include "workers/sinks/ZRReportingSessionSummaryJsonFileWorker.h"

#include "base/BoundedCache.h"
#include "base/Format.h"
#include "base/Json.h"
#include "platform/Counters.h"
#include "session/ZRReportingSession.h"
#include "util/AudioEvents.h"
#include "util/Log.h"
#include "workers/ReportFileName.h"

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <map>
#include <utility>
#include <variant>
#include <vector>

namespace tamblo {

namespace {

constexpr std::string_view kIsSessionStarted = "isSessionStarted";
/// Lines are written once this many bytes of them wait.
constexpr std::size_t kBytesPerWrite = 256U << 10U;
constexpr std::size_t kMostBytes = 64U << 20U;
/// One part of a stop ends with these.
constexpr std::size_t kMessagesOfPart = 5'000;
constexpr std::size_t kBytesOfPart = 2U << 20U;

} // namespace

/// The names of one file's messages: the category's and the type's, and the number among those of that name.
class ZRReportingSessionSummaryJsonFileWorker::MessageNames {
public:
    /// Holds until the next call.
    [[nodiscard]] std::string_view next(const ZRReportingSessionMessage& message) {
        // Several categories and types may have one name, and are then counted together.
        const std::uint64_t key =
            std::uint64_t{1} << 48U | std::uint64_t{message.category()} << 16U | message.type();
        Count* const count = recent_.get(key, [&] {
            return &*counts_
                         .try_emplace(formatted("{}_{}_",
                                                ZRReportingUtilityCategoryString(message.category()),
                                                ZRReportingUtilityTypeString(message.type())))
                         .first;
        });
        name_.assign(count->first);
        appendText(name_, ++count->second);
        return name_;
    }

private:
    using Counts = std::map<std::string, std::uint64_t>;
    using Count = Counts::value_type;

    Counts counts_;
    BoundedCache<Count*> recent_;
    std::string name_;
};

std::shared_ptr<ZRReportingSessionWorkerProtocol>
ZRReportingSessionSummaryJsonFileWorker::initWithSession(Context& context,
                                                         const std::shared_ptr<ZRReportingSession>& session) {
    if (session->serviceType() != AudioServiceTypeTest && !context.isInternalBuild()) {
        return nullptr;
    }
    return std::make_shared<ZRReportingSessionSummaryJsonFileWorker>(context, session);
}

bool ZRReportingSessionSummaryJsonFileWorker::stopSome() {
    const std::shared_ptr<ZRReportingSession> owner = session();
    if (owner == nullptr || owner->messages().empty()) {
        return true;
    }
    if (names_ == nullptr) {
        names_ = std::make_shared<MessageNames>();
    }
    const std::vector<MessageRef>& messages = owner->messages();
    const std::size_t end = std::min(messages.size(), looked_ + kMessagesOfPart);
    const std::size_t endOfBytes = bytes_ + lines_.size() + kBytesOfPart;
    for (; looked_ < end && bytes_ + lines_.size() < endOfBytes; ++looked_) {
        add(*owner, *messages[looked_]);
    }
    if (looked_ < messages.size()) {
        return false;
    }
    closeFile();
    lines_.reset();
    reportPath_.reset();
    names_.reset();
    looked_ = 0;
    return true;
}

void ZRReportingSessionSummaryJsonFileWorker::add(const ZRReportingSession& session,
                                                  ZRReportingSessionMessage& message) {
    if (message.isRedundant) {
        return;
    }
    if (leftOut_ != 0) {
        counters::add(counters::Counter::summaryFileMessages);
        ++leftOut_;
        return;
    }
    const bool isFirst = !reportPath_;
    if (isFirst) {
        openFile(session);
    }
    const std::size_t before = lines_.size();
    lines_.append(isFirst ? "" : ",\n");
    writeMessage(message, names_->next(message));
    if (bytes_ + lines_.size() > kMostBytes) {
        lines_.truncate(before);
        counters::add(counters::Counter::summaryFileMessages);
        leftOut_ = 1;
    } else if (lines_.size() >= kBytesPerWrite) {
        writeOut();
    }
}

void ZRReportingSessionSummaryJsonFileWorker::writeMessage(ZRReportingSessionMessage& message,
                                                           std::string_view name) {
    message.editPayload([&message](Dictionary& payload) {
        payload.set(kIsSessionStarted, yesOrNo(message.isSessionStarted));
    });
    const std::optional<std::string> failure = appendPrettyJson(lines_, name, message.payload());
    if (failure) {
        // The separator before it stays, and the file is then no valid JSON.
        counters::add(counters::Counter::summaryFileMessages);
        log::error(ZRReportingSessionCategory(), "dataWithJSONObject: {}", *failure);
        return;
    }
    lines_.append('\n');
}

void ZRReportingSessionSummaryJsonFileWorker::openFile(const ZRReportingSession& session) {
    const Platform& device = platform();
    const std::string directory = device.reportFiles->reportingLogsDirectory();
    if (const auto failure = device.reportFiles->createDirectory(directory)) {
        log::error(ZRReportingSessionCategory(), "can't create logging directory at {}: {}", directory,
                   *failure);
    }
    const WallTime now = device.clock->now();
    reportPath_ =
        directory + "/" +
        reportFileName(now, device.clock->utcOffset(now), session.reporterID(),
                       ZRReportingUtilityRetrieveAppName(session.configuration()), session.serviceName());
    auto file = device.reportFiles->createFile(*reportPath_);
    if (const auto* failure = std::get_if<std::string>(&file)) {
        log::error(ZRReportingSessionCategory(),
                   "SummaryJsonFileWorker failed to open file. action=open file={} error=\"{}\"",
                   *reportPath_, *failure);
        isLost_ = true;
        return;
    }
    reportFileHandle_ = std::get<std::unique_ptr<ReportFile>>(std::move(file));
    log::info(ZRReportingSessionCategory(), "SummaryJsonFileWorker opened file. action=open file={}",
              *reportPath_);
    isOut_ = false;
    lines_.append("[\n");
}

void ZRReportingSessionSummaryJsonFileWorker::writeOut() {
    bytes_ += lines_.size();
    if (reportFileHandle_ == nullptr) {
        lines_.clear();
        return;
    }
    const std::optional<std::string> failure = reportFileHandle_->write(lines_.view());
    lines_.clear();
    if (failure && !isOut_) {
        log::error(ZRReportingSessionCategory(),
                   "SummaryJsonFileWorker failed to write line. action=writeline file={} error=\"{}\"",
                   *reportPath_, *failure);
    }
    isOut_ = failure.has_value();
    isLost_ = isLost_ || isOut_;
}

void ZRReportingSessionSummaryJsonFileWorker::closeFile() {
    if (reportPath_) {
        lines_.append("]\n");
    }
    writeOut();
    bytes_ = 0;
    if (const std::uint64_t leftOut = std::exchange(leftOut_, 0)) {
        log::error(ZRReportingSessionCategory(),
                   "SummaryJsonFileWorker left out messages, as the file is full. file={} messages={}",
                   *reportPath_, leftOut);
    }
    const std::optional<std::string> failure =
        reportFileHandle_ != nullptr ? reportFileHandle_->close() : std::nullopt;
    counters::add(counters::Counter::summaryFilesLost, std::exchange(isLost_, false) || failure ? 1 : 0);
    if (reportFileHandle_ == nullptr) {
        return;
    }
    if (failure) {
        log::error(ZRReportingSessionCategory(),
                   "SummaryJsonFileWorker failed to closed file. action=close file={} error=\"{}\"",
                   *reportPath_, *failure);
    } else {
        log::info(ZRReportingSessionCategory(), "SummaryJsonFileWorker closed file. action=close file={}",
                  *reportPath_);
    }
    reportFileHandle_.reset();
}

} // namespace tamblo
