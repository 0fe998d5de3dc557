#include "system/ZRReportingSessionDriverSnapshotWorker.h"

namespace tamblo {

std::optional<bool> ZRReportingSessionDriverSnapshotWorker::start() {
    driverSnapShot_ = utility().getSnapShot();
    return true;
}

void ZRReportingSessionDriverSnapshotWorker::stop() {
    utility().sendDriverLogsForSession(session(), driverSnapShot_ ? &*driverSnapShot_ : nullptr);
    driverSnapShot_.reset();
}

const ZRReportingDriverUtility& ZRReportingSessionDriverSnapshotWorker::utility() const {
    return context().shared<ZRReportingDriverUtility>(*platform().chanlog);
}

} // namespace tamblo
