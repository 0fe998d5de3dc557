#pragma once

#include <cstddef>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace tamblo::wire {

/// A wireless accessory that is connected now, as who knows of connections tells the service: in a file of
/// the directory `Directories::accessories`, which counts while its writer holds it (`os/HeldFile.h`), a JSON
/// array of objects with these three texts. Neither address nor name is among them.
struct ConnectedAccessory {
    std::string identifier; ///< of the address (`os/MachineKey.h`)
    std::string model;      ///< "bluetooth:054c:0d58": maker and product; may be empty
    std::string formFactor; ///< "headset", "headphone", "speaker"; may be empty

    bool operator==(const ConnectedAccessory&) const = default;
};

/// The one file, that of the sound server's bridge.
inline constexpr std::string_view kConnectedAccessoriesFile = "connected.json";
inline constexpr std::size_t kMostConnectedAccessories = 64;
inline constexpr std::size_t kMostConnectedAccessoriesBytes = 64U << 10U;

[[nodiscard]] std::string connectedAccessoriesText(const std::vector<ConnectedAccessory>& accessories);
/// Nothing for a text of another shape; an entry without an identifier is passed over.
[[nodiscard]] std::optional<std::vector<ConnectedAccessory>> parseConnectedAccessories(std::string_view text);

} // namespace tamblo::wire
