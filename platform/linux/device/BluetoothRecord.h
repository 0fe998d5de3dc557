#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

namespace tamblo {

/// A record's section `DeviceID`.
struct BluetoothDeviceID {
    std::uint32_t source = 0; ///< who gave out the vendor's number: 1 the Bluetooth SIG, 2 the USB forum
    std::uint32_t vendor = 0;
    std::uint32_t product = 0;
    std::uint32_t version = 0;
};

/// What the Bluetooth daemon's record of a device (a key file, `info`) says of what kind it is. The device's
/// name, its address and its keys are not taken from it.
struct BluetoothRecord {
    std::optional<std::uint32_t> deviceClass; ///< class of device, 24 bits
    std::optional<std::uint32_t> appearance;  ///< 16 bits; none when the device gives it as unknown (0)
    std::optional<BluetoothDeviceID> identity;
    bool isPaired = false; ///< a key of the device is kept

    /// Reads any text; a line that is none of a key file, or whose number is none, is passed over.
    [[nodiscard]] static BluetoothRecord parse(std::string_view text);

    /// An earbud by its appearance (Bluetooth Assigned Numbers, 2.6: wearable audio device, earbud). A device
    /// without one is taken for an earbud by its class (2.8: audio, wearable headset or headphones): classes
    /// know nothing nearer.
    [[nodiscard]] bool isEarbud() const noexcept;
    /// "bluetooth:ffff:0101:0203": who gave out the vendor's number, vendor, product and version in
    /// hexadecimal digits; empty when the device does not state them.
    [[nodiscard]] std::string model() const;
};

} // namespace tamblo
