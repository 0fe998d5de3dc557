#include "platform/linux/device/LinuxAccessories.h"

#include "base/Format.h"
#include "os/Directory.h"
#include "os/SmallFile.h"
#include "platform/Counters.h"
#include "platform/linux/device/BluetoothRecord.h"

#include <algorithm>
#include <array>
#include <bit>
#include <cerrno>
#include <charconv>
#include <cstddef>
#include <cstdint>
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
/// The file has 33 bytes.
constexpr std::size_t kLongestMachineIdentifier = 64;

/// Whether it is an address as the daemon names directories: "00:1B:66:AA:BB:CC".
bool isAddress(std::string_view name) noexcept {
    return std::ranges::equal(name, std::string_view("00:00:00:00:00:00"), [](char c, char pattern) {
        const bool isDigit = (c >= '0' && c <= '9') || (c >= 'A' && c <= 'F');
        return pattern == '0' ? isDigit : c == pattern;
    });
}

/// A secret of 128 bits.
using HashKey = std::array<std::uint64_t, 2>;

/// SipHash-2-4 (Aumasson and Bernstein, 2012): whoever does not have the key can neither tell the text from
/// its hash nor find it by trying all texts that there are.
std::uint64_t keyedHash(const HashKey& key, std::string_view text) noexcept {
    std::array<std::uint64_t, 4> v{key[0] ^ 0x736F6D6570736575U, key[1] ^ 0x646F72616E646F6DU,
                                   key[0] ^ 0x6C7967656E657261U, key[1] ^ 0x7465646279746573U};
    const auto rounds = [&v](int count) {
        for (int i = 0; i < count; ++i) {
            v[0] += v[1];
            v[1] = std::rotl(v[1], 13) ^ v[0];
            v[0] = std::rotl(v[0], 32);
            v[2] += v[3];
            v[3] = std::rotl(v[3], 16) ^ v[2];
            v[0] += v[3];
            v[3] = std::rotl(v[3], 21) ^ v[0];
            v[2] += v[1];
            v[1] = std::rotl(v[1], 17) ^ v[2];
            v[2] = std::rotl(v[2], 32);
        }
    };
    const auto take = [&v, &rounds](std::uint64_t word) {
        v[3] ^= word;
        rounds(2);
        v[0] ^= word;
    };
    // Words of eight bytes, the lowest first; the last one has the length in its highest byte.
    std::uint64_t word = 0;
    for (std::size_t i = 0; i < text.size(); ++i) {
        word |= std::uint64_t{static_cast<unsigned char>(text[i])} << 8U * (i % 8);
        if (i % 8 == 7) {
            take(word);
            word = 0;
        }
    }
    take(word | std::uint64_t{text.size()} << 56U);
    v[2] ^= 0xFFU;
    rounds(4);
    return v[0] ^ v[1] ^ v[2] ^ v[3];
}

/// The machine's identifier, 32 hexadecimal digits; zero without one.
HashKey machineKey(const std::string& path) {
    const SmallFile file = SmallFile::read(path, kLongestMachineIdentifier);
    const std::string_view digits = file.trimmed();
    HashKey key{};
    for (std::size_t i = 0; i < key.size() && digits.size() == 32; ++i) {
        const char* begin = digits.data() + 16 * i;
        std::from_chars(begin, begin + 16, key[i], 16);
    }
    return key;
}

} // namespace

std::vector<Accessory> LinuxAccessories::connectedEarbuds() {
    std::vector<Accessory> earbuds;
    std::set<std::string> seen;
    std::size_t devices = 0;
    const HashKey key = machineKey(machineIdentifierFile_);
    for (const std::string& adapter : addressesIn(storage_, kMostAdapters)) {
        const std::string directory = storage_ + "/" + adapter;
        for (const std::string& device : addressesIn(directory, kMostDevices - devices)) {
            ++devices;
            const SmallFile file =
                SmallFile::read(formatted("{}/{}/info", directory, device), kLongestRecord);
            const BluetoothRecord record = BluetoothRecord::parse(file.text);
            // A device that is paired with two adapters is still one.
            if (record.isPaired && record.isEarbud() && seen.insert(device).second) {
                earbuds.push_back({formatted("{}", hexadecimal(keyedHash(key, device), 16)), record.model()});
            }
        }
    }
    return earbuds;
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
