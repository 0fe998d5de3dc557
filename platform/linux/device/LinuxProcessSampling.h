#pragma once

#include "platform/ProcessSampling.h"
#include "platform/linux/device/ProcessFiles.h"

#include <string>
#include <utility>

namespace tamblo {

/// Process figures from `/proc`.
class LinuxProcessSampling final : public ProcessSampling {
public:
    explicit LinuxProcessSampling(std::string root = "/proc") : files_(std::move(root)) {}

    [[nodiscard]] std::optional<ProcessSample> sample(pid_t pid) const override { return files_.sample(pid); }

private:
    const ProcessFiles files_;
};

} // namespace tamblo
