#include "system/ZRReportingSessionDriverSnapshotWorker.h"

namespace tamblo {

std::optional<bool> ZRReportingSessionDriverSnapshotWorker::start() {
    driverSnapShot_ = utility().getSnapShot();
    return true;
}

bool ZRReportingSessionDriverSnapshotWorker::stopSome() {
    utility().sendDriverLogsForSession(session(), driverSnapShot_ ? &*driverSnapShot_ : nullptr);
    driverSnapShot_.reset();
    return true;
}

const ZRReportingDriverUtility& ZRReportingSessionDriverSnapshotWorker::utility() const {
    return context().shared<ZRReportingDriverUtility>(*platform().chanlog);
}

} // namespace tamblo
