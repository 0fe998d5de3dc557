#include "platform/linux/device/LinuxAccessories.h"

#include "base/Format.h"
#include "os/Directory.h"
#include "os/HeldFile.h"
#include "os/SmallFile.h"
#include "platform/Counters.h"
#include "platform/linux/device/BluetoothRecord.h"
#include "wire/ConnectedAccessories.h"

#include <algorithm>
#include <cerrno>
#include <cstddef>
#include <set>
#include <system_error>

namespace tamblo {

namespace {

/// Machines have one adapter or two, and people some ten devices: what is beyond is rubbish.
constexpr std::size_t kMostAdapters = 8;
constexpr std::size_t kMostDevices = 256;
/// Entries of one directory that are looked at, whatever they are.
constexpr std::size_t kMostEntries = 4096;
/// A record of a device with many services has some ten kibibytes.
constexpr std::size_t kLongestRecord = 256U << 10U;

/// Whether it is an address as the daemon names directories: "00:1B:66:AA:BB:CC".
bool isAddress(std::string_view name) noexcept {
    return std::ranges::equal(name, std::string_view("00:00:00:00:00:00"), [](char c, char pattern) {
        const bool isDigit = (c >= '0' && c <= '9') || (c >= 'A' && c <= 'F');
        return pattern == '0' ? isDigit : c == pattern;
    });
}

/// By what its maker calls it; whether it is one for each ear, nothing but a record tells.
bool isWornOnTheHead(const wire::ConnectedAccessory& accessory) noexcept {
    return accessory.formFactor == "headset" || accessory.formFactor == "headphone";
}

} // namespace

std::vector<Accessory> LinuxAccessories::connectedEarbuds() {
    const auto text = HeldFile::read(connected_ + "/" + std::string(wire::kConnectedAccessoriesFile),
                                     wire::kMostConnectedAccessoriesBytes);
    const auto connected = text ? wire::parseConnectedAccessories(*text) : std::nullopt;
    std::vector<Accessory> earbuds;
    if (!connected) {
        for (Paired& device : paired()) {
            if (device.isEarbud) {
                earbuds.push_back({std::move(device.identifier), std::move(device.model)});
            }
        }
        return earbuds;
    }
    const std::vector<Paired> known = connected->empty() ? std::vector<Paired>() : paired();
    for (const wire::ConnectedAccessory& accessory : *connected) {
        const auto record = std::find_if(known.begin(), known.end(), [&accessory](const Paired& device) {
            return device.identifier == accessory.identifier;
        });
        const bool hasRecord = record != known.end();
        if (hasRecord ? record->isEarbud : isWornOnTheHead(accessory)) {
            const bool statesModel = hasRecord && !record->model.empty();
            earbuds.push_back({accessory.identifier, statesModel ? record->model : accessory.model});
        }
    }
    return earbuds;
}

std::vector<LinuxAccessories::Paired> LinuxAccessories::paired() {
    std::vector<Paired> all;
    std::set<std::string> seen;
    std::size_t devices = 0;
    const MachineKey key = MachineKey::read(machineIdentifierFile_);
    for (const std::string& adapter : addressesIn(storage_, kMostAdapters)) {
        const std::string directory = storage_ + "/" + adapter;
        for (const std::string& device : addressesIn(directory, kMostDevices - devices)) {
            ++devices;
            const SmallFile file =
                SmallFile::read(formatted("{}/{}/info", directory, device), kLongestRecord);
            const BluetoothRecord record = BluetoothRecord::parse(file.text);
            // A device that is paired with two adapters is still one.
            if (record.isPaired && seen.insert(device).second) {
                all.push_back({key.identifierOf(device), record.model(), record.isEarbud()});
            }
        }
    }
    return all;
}

std::vector<std::string> LinuxAccessories::addressesIn(const std::string& directory, std::size_t most) {
    auto [error, isCut, addresses] = DirectoryEntries::read(directory, kMostEntries);
    std::erase_if(addresses, [](const std::string& name) { return !isAddress(name); });
    if (error == EACCES && !isRefusalTold_.exchange(true)) {
        log_.report(LogLevel::info, "zrrz",
                    formatted("{}: {}; accessories are not known", directory,
                              std::generic_category().message(error)));
    }
    std::sort(addresses.begin(), addresses.end());
    if (addresses.size() > most) {
        counters::add(counters::Counter::accessories, addresses.size() - most);
        addresses.resize(most);
    }
    return addresses;
}

} // namespace tamblo
