#pragma once

#include "bridge/alsa/kernel/Mixer.h"

#include <string>

namespace tamblo::alsa {

/// The kernel's mixers, by the cards' control devices, which are only read.
class ControlDevices final : public Mixers {
public:
    explicit ControlDevices(std::string directory) : directory_(std::move(directory)) {}

    [[nodiscard]] std::unique_ptr<Mixer> open(unsigned card) override;

private:
    const std::string directory_;
};

} // namespace tamblo::alsa
