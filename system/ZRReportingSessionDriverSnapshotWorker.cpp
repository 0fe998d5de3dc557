#include "system/ZRReportingSessionDriverSnapshotWorker.h"

namespace tamblo {

std::optional<bool> ZRReportingSessionDriverSnapshotWorker::start() {
    driverSnapShot_ = ZRReportingDriverUtility::shared().getSnapShot();
    return true;
}

void ZRReportingSessionDriverSnapshotWorker::stop() {
    ZRReportingDriverUtility::shared().sendDriverLogsForSession(session(), driverSnapShot_ ? &*driverSnapShot_
                                                                                           : nullptr);
    driverSnapShot_.reset();
}

} // namespace tamblo
