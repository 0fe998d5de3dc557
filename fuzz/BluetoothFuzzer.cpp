// Any bytes as the Bluetooth daemon's record of a device.

#include "Demand.h"
#include "platform/linux/device/BluetoothRecord.h"

#include <algorithm>
#include <cstdint>

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* bytes, std::size_t size) {
    using namespace tamblo;
    const std::string_view text(reinterpret_cast<const char*>(bytes), size);
    const BluetoothRecord record = BluetoothRecord::parse(text);
    const std::string model = record.model();
    fuzz::demand(model.empty() != record.identity.has_value());
    fuzz::demand(std::ranges::count(model, ':') == (model.empty() ? 0 : 3));
    fuzz::demand(record.deviceClass || record.appearance || !record.isEarbud());
    // What is said once counts as often as it is said.
    const BluetoothRecord again = BluetoothRecord::parse(std::string(text) + "\n[General]\nIgnored=1\n");
    fuzz::demand(again.model() == model && again.isPaired == record.isPaired);
    return 0;
}
