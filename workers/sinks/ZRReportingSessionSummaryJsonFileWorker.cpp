#include "workers/sinks/ZRReportingSessionSummaryJsonFileWorker.h"

#include "base/BoundedCache.h"
#include "base/Format.h"
#include "base/Json.h"
#include "session/ZRReportingSession.h"
#include "util/AudioEvents.h"
#include "util/Log.h"
#include "workers/ReportFileName.h"

#include <map>
#include <utility>
#include <variant>

namespace tamblo {

namespace {

constexpr std::string_view kIsSessionStarted = "isSessionStarted";
/// Lines are written once this many bytes of them wait.
constexpr std::size_t kBytesPerWrite = 256U << 10U;

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

void ZRReportingSessionSummaryJsonFileWorker::stop() {
    const std::shared_ptr<ZRReportingSession> owner = session();
    if (owner == nullptr || owner->messages().empty()) {
        return;
    }
    MessageNames names;
    for (const MessageRef& message : owner->messages()) {
        if (message->isRedundant) {
            continue;
        }
        if (reportPath_) {
            writeLine(",");
        } else {
            openFile(*owner);
        }
        writeMessage(*message, names.next(*message));
    }
    closeFile();
    lines_.reset();
    reportPath_.reset();
}

void ZRReportingSessionSummaryJsonFileWorker::writeMessage(ZRReportingSessionMessage& message,
                                                           std::string_view name) {
    message.editPayload([&message](Dictionary& payload) {
        payload.set(kIsSessionStarted, yesOrNo(message.isSessionStarted));
    });
    const std::optional<std::string> failure = appendPrettyJson(lines_, name, message.payload());
    if (failure) {
        // The separator before it stays, and the file is then no valid JSON.
        log::error(ZRReportingSessionCategory(), "dataWithJSONObject: {}", *failure);
        return;
    }
    writeLine("");
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
        return;
    }
    reportFileHandle_ = std::get<std::unique_ptr<ReportFile>>(std::move(file));
    log::info(ZRReportingSessionCategory(), "SummaryJsonFileWorker opened file. action=open file={}",
              *reportPath_);
    isOut_ = false;
    writeLine("[");
}

void ZRReportingSessionSummaryJsonFileWorker::writeLine(std::string_view line) {
    lines_.append(line);
    lines_.append('\n');
    if (reportFileHandle_ == nullptr) {
        lines_.clear();
    } else if (lines_.size() >= kBytesPerWrite) {
        writeOut();
    }
}

void ZRReportingSessionSummaryJsonFileWorker::writeOut() {
    const std::optional<std::string> failure = reportFileHandle_->write(lines_.view());
    lines_.clear();
    if (failure && !isOut_) {
        log::error(ZRReportingSessionCategory(),
                   "SummaryJsonFileWorker failed to write line. action=writeline file={} error=\"{}\"",
                   *reportPath_, *failure);
    }
    isOut_ = failure.has_value();
}

void ZRReportingSessionSummaryJsonFileWorker::closeFile() {
    writeLine("]");
    if (reportFileHandle_ == nullptr) {
        return;
    }
    writeOut();
    if (const auto failure = reportFileHandle_->close()) {
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
