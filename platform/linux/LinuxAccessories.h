#pragma once

#include "platform/Accessories.h"
#include "platform/StructuredLog.h"

#include <string>

namespace tamblo {

/// Accessories that the Bluetooth daemon has stored records of.
class LinuxAccessories final : public Accessories {
public:
    /// The log must outlive this object.
    explicit LinuxAccessories(StructuredLog& log, std::string storage = "/var/lib/bluetooth")
        : log_(log), storage_(std::move(storage)) {}

    [[nodiscard]] std::vector<Accessory> connectedEarbuds() override;

private:
    StructuredLog& log_;
    const std::string storage_;
};

} // namespace tamblo
