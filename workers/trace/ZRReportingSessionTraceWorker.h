#pragma once

#include "session/ZRReportingSessionWorkerProtocol.h"
#include "workers/trace/ProcessSampler.h"
#include "workers/trace/SessionTrace.h"

#include <cstddef>
#include <memory>
#include <optional>

namespace tamblo {

/// Traces a session's performance on internal builds: samples of the client's process and of the service's
/// from start to stop, and at the stop a file of them with the session's stretches and issues, which trace
/// viewers open.
///
/// Neither consumer nor producer, it stops behind all workers that are. The file is made and written later,
/// on another thread, and the session's stop does not wait for it; what cannot be written is lost, which one
/// error line tells. A session beyond the most that are traced at a time is not; its next start tries again.
class ZRReportingSessionTraceWorker final : public ZRReportingSessionWorkerProtocol {
public:
    using ZRReportingSessionWorkerProtocol::ZRReportingSessionWorkerProtocol;

    /// Null on any other build.
    [[nodiscard]] static std::shared_ptr<ZRReportingSessionWorkerProtocol>
    initWithSession(Context& context, const std::shared_ptr<ZRReportingSession>& session);

    std::optional<bool> start() override;
    [[nodiscard]] bool stopSome() override;

private:
    /// What there is of the file while the stop is under way.
    struct Ending {
        SessionTrace trace;
        WallTime stoppedAt;
        MarkSearch search{trace};
        std::size_t looked = 0; ///< messages of the session
    };

    [[nodiscard]] std::unique_ptr<Ending> end(const ZRReportingSession& session);

    std::unique_ptr<Ending> ending_;
    std::unique_ptr<ProcessSampler::Recording> recording_;
};

} // namespace tamblo
