#pragma once

#include "base/TextBuffer.h"
#include "platform/ReportFiles.h"
#include "session/ZRReportingSessionWorkerProtocol.h"

#include <cstddef>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

namespace tamblo {

/// Writes every message of a session that is not redundant into a JSON file of the session's own when it
/// stops: for sessions of the service type "test", and on internal builds for all.
///
/// Neither consumer nor producer, it stops behind all workers that are, so that the file holds what they have
/// derived. The lines are gathered and written some hundred kibibytes at a time. A file has 64 MiB at most;
/// one error line tells of the messages that are not in it for that. What cannot be written is lost: one
/// error line tells of it until something can be written again, and the session goes on.
class ZRReportingSessionSummaryJsonFileWorker final : public ZRReportingSessionWorkerProtocol {
public:
    using ZRReportingSessionWorkerProtocol::ZRReportingSessionWorkerProtocol;

    /// Null for a session that gets no file. The worker is started.
    [[nodiscard]] static std::shared_ptr<ZRReportingSessionWorkerProtocol>
    initWithSession(Context& context, const std::shared_ptr<ZRReportingSession>& session);

    /// Leaves its mark in the session's records: each payload gets the key that says whether the message was
    /// sent while the session was started.
    [[nodiscard]] bool stopSome() override;

private:
    class MessageNames;

    void add(const ZRReportingSession& session, ZRReportingSessionMessage& message);
    void writeMessage(ZRReportingSessionMessage& message, std::string_view name);
    void openFile(const ZRReportingSession& session);
    /// Without an open file, what waits is dropped.
    void writeOut();
    void closeFile();

    std::optional<std::string> reportPath_; ///< once the file was tried to be opened
    std::unique_ptr<ReportFile> reportFileHandle_;
    TextBuffer lines_; ///< not written yet
    bool isOut_ = false;
    bool isLost_ = false;                 ///< the file, or some of it
    std::shared_ptr<MessageNames> names_; ///< while the file is made
    std::size_t looked_ = 0;              ///< messages of the session
    std::size_t bytes_ = 0;               ///< of the file, without the lines that wait
    std::uint64_t leftOut_ = 0;
};

} // namespace tamblo
