#pragma once

#include "os/MachineKey.h"
#include "wire/Directories.h"

#include <string>
#include <variant>

namespace tamblo::tools {

/// By what a fleet's engine tells this device from others, and with what values are hashed here.
struct DeviceIdentity {
    /// The device property `FleetIdentifier`, where there is one, also an empty text; else a hash of the
    /// machine's identifier and the salt, 32 hexadecimal digits.
    std::string name;
    /// The machine's identifier and the salt: without them nobody finds a hashed value by trying.
    std::string secret;
    bool hasSecret = false; ///< there is a machine's identifier, or a salt

    /// The salt is the preference `device_salt` of the domain `com.vandra.tamblo.export`, or none. Or what is
    /// wrong with one of the files.
    [[nodiscard]] static std::variant<DeviceIdentity, std::string>
    read(const wire::Directories& directories, const std::string& machineFile = MachineKey::kFile);
};

} // namespace tamblo::tools
