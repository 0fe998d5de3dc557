#pragma once

#include "platform/Accessories.h"
#include "platform/StructuredLog.h"

#include <atomic>
#include <string>
#include <utility>
#include <vector>

namespace tamblo {

/// The accessories that the Bluetooth daemon has stored records of:
/// `<storage>/<adapter's address>/<device's address>/info`.
///
/// The records do not say what is connected at this moment. Known to be connected is, here, what is paired:
/// it was connected, and connects by itself when it is near.
///
/// An accessory's identifier is a hash of its address with the machine's secret identifier as the key, so
/// that it is the same at every start and tells nobody the address. On a machine that has no identifier the
/// hash has no secret, and does not hide the address from whoever tries all that there are.
///
/// Without a Bluetooth daemon, and where the service may not look, there are no accessories; the latter is
/// one line in the log. Any thread; reads the disk.
class LinuxAccessories final : public Accessories {
public:
    /// The log must outlive this object.
    explicit LinuxAccessories(StructuredLog& log, std::string storage = "/var/lib/bluetooth",
                              std::string machineIdentifierFile = "/etc/machine-id")
        : log_(log), storage_(std::move(storage)), machineIdentifierFile_(std::move(machineIdentifierFile)) {}

    [[nodiscard]] std::vector<Accessory> connectedEarbuds() override;

private:
    [[nodiscard]] std::vector<std::string> addressesIn(const std::string& directory, std::size_t most);

    StructuredLog& log_;
    const std::string storage_;
    const std::string machineIdentifierFile_;
    std::atomic<bool> isRefusalTold_{false};
};

} // namespace tamblo
