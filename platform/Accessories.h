#pragma once

#include <string>
#include <vector>

namespace tamblo {

/// A wireless accessory that the device knows.
struct Accessory {
    /// Tells one accessory from another on this device, and from nothing else: neither an address nor a name.
    std::string identifier;
    /// The maker's and the model's numbers, as the accessory states them; empty when it does not.
    std::string model;
};

/// The accessories of the device.
class Accessories {
public:
    virtual ~Accessories() = default;
    /// The wireless earbuds that are connected, each once; where nobody tells what is, those that the device
    /// is paired with. Any thread; may read a disk.
    [[nodiscard]] virtual std::vector<Accessory> connectedEarbuds() = 0;
};

} // namespace tamblo
