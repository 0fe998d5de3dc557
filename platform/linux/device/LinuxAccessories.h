#pragma once

#include "os/MachineKey.h"
#include "platform/Accessories.h"
#include "platform/StructuredLog.h"

#include <atomic>
#include <string>
#include <utility>
#include <vector>

namespace tamblo {

/// The accessories that are connected, as the sound server's bridge tells (`wire/ConnectedAccessories.h`),
/// or, while nobody tells, those that the Bluetooth daemon has stored records of:
/// `<storage>/<adapter's address>/<device's address>/info`.
///
/// The records do not say what is connected at this moment. Without better knowledge, known to be connected
/// is what is paired: it was connected, and connects by itself when it is near. Of a connected one its
/// record, where there is one, tells whether it is an earbud, and its model.
///
/// An accessory's identifier is a hash of its address with the machine's secret identifier as the key, so
/// that it is the same at every start and tells nobody the address.
///
/// Without a Bluetooth daemon, and where the service may not look, there are no records; the latter is one
/// line in the log. Any thread; reads the disk.
class LinuxAccessories final : public Accessories {
public:
    /// The log must outlive this object.
    explicit LinuxAccessories(StructuredLog& log, std::string connected,
                              std::string storage = "/var/lib/bluetooth",
                              std::string machineIdentifierFile = MachineKey::kFile)
        : log_(log),
          connected_(std::move(connected)),
          storage_(std::move(storage)),
          machineIdentifierFile_(std::move(machineIdentifierFile)) {}

    [[nodiscard]] std::vector<Accessory> connectedEarbuds() override;

private:
    /// A device that the daemon has a record of.
    struct Paired {
        std::string identifier;
        std::string model;
        bool isEarbud = false;
    };

    [[nodiscard]] std::vector<Paired> paired();
    [[nodiscard]] std::vector<std::string> addressesIn(const std::string& directory, std::size_t most);

    StructuredLog& log_;
    const std::string connected_;
    const std::string storage_;
    const std::string machineIdentifierFile_;
    std::atomic<bool> isRefusalTold_{false};
};

} // namespace tamblo
