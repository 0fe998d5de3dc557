#include "platform/linux/LinuxProcessSampling.h"

namespace tamblo {

std::optional<ProcessSample> LinuxProcessSampling::sample(pid_t) const {
    return std::nullopt;
}

} // namespace tamblo
