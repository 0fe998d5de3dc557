#include "workers/accessories/ZRReportingSessionAudioRegistrationWorker.h"

#include "workers/accessories/AccessoryLookup.h"

namespace tamblo {

std::optional<bool> ZRReportingSessionAudioRegistrationWorker::start() {
    lookUpAccessories();
    return true;
}

} // namespace tamblo
