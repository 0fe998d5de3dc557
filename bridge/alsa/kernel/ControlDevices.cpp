#include "bridge/alsa/kernel/ControlDevices.h"

#include "base/Format.h"
#include "bridge/alsa/kernel/Controls.h"
#include "os/FileDescriptor.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstddef>
#include <cstring>
#include <string_view>
#include <utility>
#include <vector>

#include <fcntl.h>
#include <sys/ioctl.h>
#include <unistd.h>

#include <sound/asound.h>

namespace tamblo::alsa {

namespace {

/// Controls of a card that are looked through.
constexpr std::uint32_t kMostControls = 4096;
constexpr std::size_t kMostDecibelWords = 256;

/// A text of the kernel's, which may fill its place without an end.
template <std::size_t Size> std::string textOf(const unsigned char (&bytes)[Size]) {
    const char* const text = reinterpret_cast<const char*>(bytes);
    return {text, ::strnlen(text, Size)};
}

class ControlDevice final : public Mixer {
public:
    explicit ControlDevice(FileDescriptor device) : device_(std::move(device)) {
        int subscribes = 1;
        isTold_ = ::ioctl(device_.get(), SNDRV_CTL_IOCTL_SUBSCRIBE_EVENTS, &subscribes) == 0;
    }

    [[nodiscard]] int descriptor() const override { return isTold_ ? device_.get() : -1; }
    void read() override;
    [[nodiscard]] std::optional<MixerVolume> volume(bool isInput) override;

private:
    struct Known {
        snd_ctl_elem_id id;
        Control control;
        snd_ctl_elem_type_t type;
        unsigned channels;
    };

    void list();
    void describe(const snd_ctl_elem_id& id);
    [[nodiscard]] std::vector<std::uint32_t> decibelsOf(unsigned number) const;
    void readValues(Known& known) const;

    const FileDescriptor device_;
    std::vector<Known> controls_;
    bool isTold_ = false;
    bool isListed_ = false;
    bool hasNoVolume_ = false; ///< of any name
};

/// Which control has changed does not matter: who asks for the volume reads them all.
void ControlDevice::read() {
    std::array<snd_ctl_event, 32> events{};
    ssize_t bytes = 0;
    do {
        bytes = ::read(device_.get(), events.data(), sizeof events);
        for (std::size_t i = 0; bytes > 0 && i < static_cast<std::size_t>(bytes) / sizeof(snd_ctl_event);
             ++i) {
            constexpr unsigned values = SNDRV_CTL_EVENT_MASK_VALUE;
            isListed_ = isListed_ && (events.at(i).data.elem.mask & ~values) == 0;
        }
    } while (bytes == static_cast<ssize_t>(sizeof events));
    // The card has gone.
    isTold_ = isTold_ && (bytes > 0 || (bytes < 0 && (errno == EAGAIN || errno == EINTR)));
}

std::optional<MixerVolume> ControlDevice::volume(bool isInput) {
    if (!isListed_) {
        list();
    }
    std::vector<Control> controls;
    for (Known& known : controls_) {
        readValues(known);
        controls.push_back(known.control);
    }
    const std::optional<MixerVolume> volume = volumeOf(controls, isInput);
    return !volume && hasNoVolume_ ? MixerVolume{} : volume;
}

void ControlDevice::list() {
    isListed_ = true;
    hasNoVolume_ = false;
    controls_.clear();
    snd_ctl_elem_list list{};
    if (::ioctl(device_.get(), SNDRV_CTL_IOCTL_ELEM_LIST, &list) != 0) {
        return;
    }
    std::vector<snd_ctl_elem_id> ids(std::min(list.count, kMostControls));
    list.space = static_cast<unsigned>(ids.size());
    list.pids = ids.data();
    if (!ids.empty() && ::ioctl(device_.get(), SNDRV_CTL_IOCTL_ELEM_LIST, &list) != 0) {
        return;
    }
    ids.resize(std::min<std::size_t>(list.used, ids.size()));
    hasNoVolume_ = std::ranges::none_of(
        ids, [](const snd_ctl_elem_id& id) { return textOf(id.name).find("Volume") != std::string::npos; });
    for (const snd_ctl_elem_id& id : ids) {
        if (id.iface == SNDRV_CTL_ELEM_IFACE_MIXER && id.index == 0 && concernsVolume(textOf(id.name))) {
            describe(id);
        }
    }
}

void ControlDevice::describe(const snd_ctl_elem_id& id) {
    snd_ctl_elem_info info{};
    info.id = id;
    const bool isKnown = ::ioctl(device_.get(), SNDRV_CTL_IOCTL_ELEM_INFO, &info) == 0;
    const bool isNumber = info.type == SNDRV_CTL_ELEM_TYPE_BOOLEAN ||
                          info.type == SNDRV_CTL_ELEM_TYPE_INTEGER ||
                          info.type == SNDRV_CTL_ELEM_TYPE_INTEGER64;
    if (!isKnown || !isNumber || (info.access & SNDRV_CTL_ELEM_ACCESS_READ) == 0) {
        return;
    }
    Known known{
        .id = info.id, .control = {.name = textOf(id.name)}, .type = info.type, .channels = info.count};
    if (info.type == SNDRV_CTL_ELEM_TYPE_INTEGER) {
        known.control.minimum = info.value.integer.min;
        known.control.maximum = info.value.integer.max;
    } else if (info.type == SNDRV_CTL_ELEM_TYPE_INTEGER64) {
        known.control.minimum = info.value.integer64.min;
        known.control.maximum = info.value.integer64.max;
    }
    if ((info.access & SNDRV_CTL_ELEM_ACCESS_TLV_READ) != 0) {
        known.control.decibels = decibelsOf(info.id.numid);
    }
    controls_.push_back(std::move(known));
}

std::vector<std::uint32_t> ControlDevice::decibelsOf(unsigned number) const {
    // The request's head, and behind it what the driver says: type, length in bytes and content.
    std::vector<std::uint32_t> words(2 + kMostDecibelWords);
    words[0] = number;
    words[1] = kMostDecibelWords * sizeof(std::uint32_t);
    if (::ioctl(device_.get(), SNDRV_CTL_IOCTL_TLV_READ, words.data()) != 0) {
        return {};
    }
    words.erase(words.begin(), words.begin() + 2);
    return words;
}

void ControlDevice::readValues(Known& known) const {
    snd_ctl_elem_value value{};
    value.id = known.id;
    known.control.values.clear();
    if (::ioctl(device_.get(), SNDRV_CTL_IOCTL_ELEM_READ, &value) != 0) {
        return;
    }
    const bool isLong = known.type == SNDRV_CTL_ELEM_TYPE_INTEGER64;
    const std::size_t most =
        isLong ? std::size(value.value.integer64.value) : std::size(value.value.integer.value);
    for (std::size_t i = 0; i < std::min<std::size_t>(known.channels, most); ++i) {
        known.control.values.push_back(isLong ? value.value.integer64.value[i]
                                              : value.value.integer.value[i]);
    }
}

} // namespace

std::unique_ptr<Mixer> ControlDevices::open(unsigned card) {
    const std::string path = formatted("{}/controlC{}", directory_, card);
    FileDescriptor device(::open(path.c_str(), O_RDONLY | O_NONBLOCK | O_CLOEXEC));
    return device.isOpen() ? std::make_unique<ControlDevice>(std::move(device)) : nullptr;
}

} // namespace tamblo::alsa
