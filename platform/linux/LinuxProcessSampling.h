#pragma once

#include "platform/ProcessSampling.h"

#include <string>

namespace tamblo {

/// Process figures from `/proc`.
class LinuxProcessSampling final : public ProcessSampling {
public:
    explicit LinuxProcessSampling(std::string root = "/proc") : root_(std::move(root)) {}

    [[nodiscard]] std::optional<ProcessSample> sample(pid_t pid) const override;

private:
    const std::string root_;
};

} // namespace tamblo
