#pragma once

#include "bridge/alsa/kernel/Pcm.h"

#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace tamblo::alsa {

/// Who has a PCM open.
struct Owner {
    pid_t process = 0;
    std::string application;
};

/// Reads what the kernel's `asound` directory says of PCMs, and of the processes that have them open who they
/// are. Each call reads anew; files that vanish, are torn, endless or of any bytes are cut or not there.
class SoundFiles {
public:
    /// Entries of one directory that are looked at.
    static constexpr std::size_t kMostEntries = 1024;

    /// Where the kernel's process directory is mounted.
    explicit SoundFiles(std::string processes) : processes_(std::move(processes)) {}

    [[nodiscard]] bool isThere() const;
    /// Every PCM of every card.
    [[nodiscard]] std::vector<PcmName> all() const;
    /// The substreams of a device.
    [[nodiscard]] std::vector<PcmName> ofDevice(const PcmName& device) const;

    [[nodiscard]] bool exists(const PcmName& pcm) const;
    /// Nothing when it cannot be read or understood at this moment.
    [[nodiscard]] std::optional<PcmStatus> status(const PcmName& pcm) const;
    [[nodiscard]] std::optional<PcmFormat> format(const PcmName& pcm) const;
    /// The device and its card as people know them: "ALC257 Analog - HDA Intel PCH".
    [[nodiscard]] std::string nameOf(const PcmName& pcm) const;
    /// The process of a thread. The application is the base name of what it executes or, of somebody else's
    /// process, which keeps that to itself, the name that it goes by.
    [[nodiscard]] Owner ownerOf(pid_t thread) const;

private:
    [[nodiscard]] std::string pathOf(const PcmName& pcm, std::string_view file) const;
    [[nodiscard]] std::string deviceDirectory(const PcmName& pcm) const;
    [[nodiscard]] std::string cardNameOf(unsigned card) const;

    const std::string processes_;
};

} // namespace tamblo::alsa
