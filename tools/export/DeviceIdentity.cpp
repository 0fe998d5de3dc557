#include "tools/export/DeviceIdentity.h"

#include "base/Format.h"
#include "base/Json.h"
#include "base/Sha256.h"
#include "os/PreferenceFile.h"
#include "os/SmallFile.h"
#include "platform/PreferenceDomains.h"
#include "tools/records/Payload.h"

#include <cstddef>
#include <optional>
#include <utility>

namespace tamblo::tools {

namespace {

constexpr std::size_t kMostBytes = 64U << 10U;
constexpr std::size_t kDigits = 32;
/// It is in each record twice.
constexpr std::size_t kLongestName = 128;

/// A device that cannot be told from others would mix with them unnoticed.
constexpr std::string_view kNoIdentity =
    "this device has no identity: set the device property FleetIdentifier, or make /etc/machine-id";

std::variant<Dictionary, std::string> readProperties(const std::string& path) {
    const SmallFile file = SmallFile::read(path, kMostBytes);
    if (file.isMissing()) {
        return Dictionary();
    }
    if (file.error != 0) {
        return formatted("cannot read {}: {}", path, file.reason());
    }
    auto read = parseJsonObject(file.text);
    if (const auto* const wrong = std::get_if<std::string>(&read)) {
        return formatted("{} is {}", path, *wrong);
    }
    return read;
}

std::variant<std::string, std::string> fail(std::string text) {
    return std::variant<std::string, std::string>(std::in_place_index<1>, std::move(text));
}

std::string textOf(const Value& value) {
    return value.isString() ? std::string(value.stringValue()) : jsonText(value);
}

/// The salt, or what is wrong.
std::variant<std::string, std::string> readSalt(const wire::Directories& directories) {
    const auto file = PreferenceFile::of(directories.preferences(), kExportDomain);
    const auto read = file ? file->read() : std::variant<Dictionary, std::string>();
    if (const auto* const wrong = std::get_if<std::string>(&read)) {
        return fail(*wrong);
    }
    const Value* const salt = std::get<Dictionary>(read).find("device_salt");
    return std::variant<std::string, std::string>(std::in_place_index<0>,
                                                  salt == nullptr ? std::string() : textOf(*salt));
}

} // namespace

std::variant<DeviceIdentity, std::string> DeviceIdentity::read(const wire::Directories& directories,
                                                               const std::string& machineFile) {
    const auto properties = readProperties(directories.deviceProperties());
    if (const auto* const wrong = std::get_if<std::string>(&properties)) {
        return *wrong;
    }
    const auto salt = readSalt(directories);
    if (salt.index() == 1) {
        return std::get<1>(salt);
    }
    const SmallFile machineIdentifier = SmallFile::read(machineFile, kMostBytes);
    if (machineIdentifier.error != 0 && !machineIdentifier.isMissing()) {
        return formatted("cannot read {}: {}", machineFile, machineIdentifier.reason());
    }
    // systemd's word for a device that has not started yet.
    const std::string machine(machineIdentifier.trimmed() == "uninitialized" ? ""
                                                                             : machineIdentifier.trimmed());
    DeviceIdentity identity{.name = {},
                            .secret = machine + ":" + std::get<0>(salt),
                            .hasSecret = !machine.empty() || !std::get<0>(salt).empty()};
    if (const Value* const name = std::get<Dictionary>(properties).find("FleetIdentifier")) {
        identity.name = textOf(*name);
        if (identity.name.size() > kLongestName) {
            return formatted("the device property FleetIdentifier has more than {} bytes", kLongestName);
        }
        return identity;
    }
    if (machine.empty()) {
        return std::string(kNoIdentity);
    }
    // So that the hash is no other program's of the same machine.
    identity.name = sha256("tamblo device " + identity.secret).substr(0, kDigits);
    return identity;
}

} // namespace tamblo::tools
