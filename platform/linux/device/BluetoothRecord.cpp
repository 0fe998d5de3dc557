#include "platform/linux/device/BluetoothRecord.h"

#include "base/Format.h"
#include "base/NumberText.h"
#include "base/SplitText.h"

#include <array>
#include <utility>

namespace tamblo {

namespace {

constexpr std::uint32_t kAppearanceEarbud = 0x0941;
constexpr std::uint32_t kMajorAudio = 0x04;
constexpr std::uint32_t kMinorWearableHeadset = 0x01;
constexpr std::uint32_t kMinorHeadphones = 0x06;

/// A decimal number, or a hexadecimal one behind "0x", up to `most`.
std::optional<std::uint32_t> numberFrom(std::string_view text, std::uint32_t most) noexcept {
    const auto number = parseDecimalOrHex<std::uint32_t>(text);
    return number <= most ? number : std::nullopt;
}

/// The sections that hold a key of a paired device: of classic Bluetooth, and of Low Energy in either role.
bool isKeySection(std::string_view section) noexcept {
    return section == "LinkKey" || section.ends_with("LongTermKey");
}

void setIdentity(BluetoothDeviceID& identity, std::string_view key, std::string_view value) noexcept {
    const std::array<std::pair<std::string_view, std::uint32_t*>, 4> members{
        {{"Source", &identity.source},
         {"Vendor", &identity.vendor},
         {"Product", &identity.product},
         {"Version", &identity.version}}};
    for (const auto& [name, member] : members) {
        if (key == name) {
            *member = numberFrom(value, 0xFFFF).value_or(0);
        }
    }
}

} // namespace

BluetoothRecord BluetoothRecord::parse(std::string_view text) {
    BluetoothRecord record;
    std::string_view section;
    while (!text.empty()) {
        std::string_view line = takeUpTo('\n', text);
        line.remove_suffix(line.ends_with('\r') ? 1 : 0);
        if (line.starts_with('[') && line.ends_with(']')) {
            section = line.substr(1, line.size() - 2);
            record.isPaired = record.isPaired || isKeySection(section);
            continue;
        }
        const std::size_t equals = line.find('=');
        if (equals == std::string_view::npos) {
            continue;
        }
        const std::string_view key = line.substr(0, equals);
        const std::string_view value = line.substr(equals + 1);
        if (section == "General" && key == "Class") {
            record.deviceClass = numberFrom(value, 0xFFFFFF);
        } else if (section == "General" && key == "Appearance") {
            record.appearance = numberFrom(value, 0xFFFF);
        } else if (section == "DeviceID") {
            setIdentity(record.identity ? *record.identity : record.identity.emplace(), key, value);
        }
    }
    if (record.appearance == 0U) {
        record.appearance.reset();
    }
    if (record.identity && record.identity->vendor == 0 && record.identity->product == 0) {
        record.identity.reset();
    }
    return record;
}

bool BluetoothRecord::isEarbud() const noexcept {
    if (appearance) {
        return *appearance == kAppearanceEarbud;
    }
    const std::uint32_t major = deviceClass.value_or(0) >> 8U & 0x1FU;
    const std::uint32_t minor = deviceClass.value_or(0) >> 2U & 0x3FU;
    return major == kMajorAudio && (minor == kMinorWearableHeadset || minor == kMinorHeadphones);
}

std::string BluetoothRecord::model() const {
    if (!identity) {
        return {};
    }
    const char* source = identity->source == 1 ? "bluetooth" : identity->source == 2 ? "usb" : "unknown";
    return formatted("{}:{}:{}:{}", source, hexadecimal(identity->vendor, 4),
                     hexadecimal(identity->product, 4), hexadecimal(identity->version, 4));
}

} // namespace tamblo
