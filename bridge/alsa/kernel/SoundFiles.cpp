#include "bridge/alsa/kernel/SoundFiles.h"

#include "base/Format.h"
#include "base/SplitText.h"
#include "bridge/common/CleanText.h"
#include "os/Directory.h"
#include "os/SmallFile.h"

#include <algorithm>
#include <array>
#include <climits>

#include <unistd.h>

namespace tamblo::alsa {

namespace {

/// The kernel's own are below a kilobyte each, and the list of cards has two lines of each card.
constexpr std::size_t kMostBytes = 16384;

std::string textOf(const std::string& path) {
    return SmallFile::read(path, kMostBytes).text;
}

/// The number of an entry such as "card0", between `prefix` and `suffix`.
std::optional<unsigned> numberIn(std::string_view entry, std::string_view prefix, std::string_view suffix) {
    if (!entry.starts_with(prefix)) {
        return std::nullopt;
    }
    entry.remove_prefix(prefix.size());
    const auto number = takeNumber<unsigned>(entry);
    return entry == suffix ? number : std::nullopt;
}

std::vector<std::string> entriesOf(const std::string& directory) {
    return DirectoryEntries::read(directory, SoundFiles::kMostEntries).names;
}

std::string withoutDirectory(std::string path) {
    constexpr std::string_view replaced = " (deleted)";
    if (path.ends_with(replaced)) {
        path.resize(path.size() - replaced.size());
    }
    return path.substr(path.find_last_of('/') + 1);
}

} // namespace

bool SoundFiles::isThere() const {
    return ::access((processes_ + "/asound").c_str(), F_OK) == 0;
}

std::string SoundFiles::deviceDirectory(const PcmName& pcm) const {
    return formatted("{}/asound/card{}/pcm{}{}", processes_, pcm.card, pcm.device, pcm.isInput ? "c" : "p");
}

std::string SoundFiles::pathOf(const PcmName& pcm, std::string_view file) const {
    return formatted("{}/sub{}/{}", deviceDirectory(pcm), pcm.substream, file);
}

std::vector<PcmName> SoundFiles::all() const {
    std::vector<PcmName> found;
    const std::string directory = processes_ + "/asound";
    for (const std::string& entry : entriesOf(directory)) {
        const auto card = numberIn(entry, "card", "");
        if (!card) {
            continue;
        }
        for (const std::string& inner : entriesOf(formatted("{}/{}", directory, entry))) {
            const bool isInput = inner.ends_with('c');
            if (const auto device = numberIn(inner, "pcm", isInput ? "c" : "p")) {
                const auto substreams = ofDevice({.card = *card, .device = *device, .isInput = isInput});
                found.insert(found.end(), substreams.begin(), substreams.end());
            }
        }
    }
    std::ranges::sort(found);
    return found;
}

std::vector<PcmName> SoundFiles::ofDevice(const PcmName& device) const {
    std::vector<PcmName> found;
    for (const std::string& entry : entriesOf(deviceDirectory(device))) {
        if (const auto substream = numberIn(entry, "sub", "")) {
            found.push_back(device);
            found.back().substream = *substream;
        }
    }
    return found;
}

bool SoundFiles::exists(const PcmName& pcm) const {
    return ::access(pathOf(pcm, "status").c_str(), F_OK) == 0;
}

std::optional<PcmStatus> SoundFiles::status(const PcmName& pcm) const {
    return parseStatus(textOf(pathOf(pcm, "status")));
}

std::optional<PcmFormat> SoundFiles::format(const PcmName& pcm) const {
    return parseFormat(textOf(pathOf(pcm, "hw_params")));
}

std::string SoundFiles::nameOf(const PcmName& pcm) const {
    const std::string info = textOf(pathOf(pcm, "info"));
    std::string device = bridge::cleanText(fieldOf(info, "name").value_or(""));
    if (device.empty()) {
        device = bridge::cleanText(fieldOf(info, "id").value_or(""));
    }
    if (device.empty()) {
        device = formatted("Device {}", pcm.device);
    }
    return device + " - " + cardNameOf(pcm.card);
}

/// Of the list of cards: " 0 [PCH            ]: HDA-Intel - HDA Intel PCH", and a line that tells where on
/// which bus it is, which concerns nobody.
std::string SoundFiles::cardNameOf(unsigned card) const {
    const std::string list = textOf(processes_ + "/asound/cards");
    for (std::string_view rest = list; !rest.empty();) {
        std::string_view line = trimmed(takeUpTo('\n', rest));
        if (takeNumber<unsigned>(line) != card || !trimmed(line).starts_with('[')) {
            continue;
        }
        constexpr std::string_view separator = " - ";
        const std::size_t at = line.find(separator, line.find("]:"));
        const std::string name = at == line.npos ? "" : bridge::cleanText(line.substr(at + separator.size()));
        if (!name.empty()) {
            return name;
        }
    }
    const std::string id = bridge::cleanText(textOf(formatted("{}/asound/card{}/id", processes_, card)));
    return id.empty() ? formatted("Card {}", card) : id;
}

Owner SoundFiles::ownerOf(pid_t thread) const {
    const auto directoryOf = [this](pid_t id) { return formatted("{}/{}/", processes_, id); };
    Owner owner{.process = thread, .application = "Unknown"};
    if (thread == 0) {
        return owner;
    }
    const std::string status = textOf(directoryOf(thread) + "status");
    std::string_view group = fieldOf(status, "Tgid").value_or("");
    owner.process = takeNumber<pid_t>(group).value_or(thread);

    std::array<char, PATH_MAX> path{};
    const ssize_t length = ::readlink((directoryOf(owner.process) + "exe").c_str(), path.data(), path.size());
    std::string name = length > 0
                           ? withoutDirectory(std::string(path.data(), static_cast<std::size_t>(length)))
                           : textOf(directoryOf(owner.process) + "comm");
    name = bridge::cleanText(name);
    if (!name.empty()) {
        owner.application = std::move(name);
    }
    return owner;
}

} // namespace tamblo::alsa
