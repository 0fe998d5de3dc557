#include "bridge/alsa/kernel/ControlDevices.h"
#include "os/FileDescriptor.h"
#include "tests/Files.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <cerrno>
#include <cstdarg>
#include <cstring>
#include <string>
#include <vector>

#include <fcntl.h>
#include <sys/ioctl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <sound/asound.h>
#include <sound/tlv.h>

namespace {

struct MadeUpControl {
    std::string name;
    long value;
    std::vector<unsigned> decibels{}; ///< with type and length
};

/// What the card has that answers this process's requests; nothing is listed of a card that fails.
std::vector<MadeUpControl> madeUpControls;
bool listingFails = false;

int answerLikeACard(unsigned long request, void* argument) {
    if (request == SNDRV_CTL_IOCTL_ELEM_LIST && !listingFails) {
        auto& list = *static_cast<snd_ctl_elem_list*>(argument);
        list.count = static_cast<unsigned>(madeUpControls.size());
        for (list.used = 0; list.used < std::min(list.space, list.count); ++list.used) {
            snd_ctl_elem_id& id = list.pids[list.used];
            id = {};
            id.numid = list.used + 1;
            id.iface = SNDRV_CTL_ELEM_IFACE_MIXER;
            std::memcpy(id.name, madeUpControls[list.used].name.data(),
                        madeUpControls[list.used].name.size());
        }
        return 0;
    }
    if (request == SNDRV_CTL_IOCTL_ELEM_INFO) {
        auto& info = *static_cast<snd_ctl_elem_info*>(argument);
        const bool hasDecibels = !madeUpControls.at(info.id.numid - 1).decibels.empty();
        info.type = SNDRV_CTL_ELEM_TYPE_INTEGER;
        info.access = SNDRV_CTL_ELEM_ACCESS_READ | (hasDecibels ? SNDRV_CTL_ELEM_ACCESS_TLV_READ : 0U);
        info.count = 1;
        info.value.integer.max = 100;
        return 0;
    }
    if (request == SNDRV_CTL_IOCTL_ELEM_READ) {
        auto& value = *static_cast<snd_ctl_elem_value*>(argument);
        value.value.integer.value[0] = madeUpControls.at(value.id.numid - 1).value;
        return 0;
    }
    if (request == SNDRV_CTL_IOCTL_TLV_READ) {
        auto* const words = static_cast<unsigned*>(argument);
        const auto& decibels = madeUpControls.at(words[0] - 1).decibels;
        std::memcpy(words + 2, decibels.data(), decibels.size() * sizeof(unsigned));
        return 0;
    }
    errno = ENOTTY;
    return request == SNDRV_CTL_IOCTL_SUBSCRIBE_EVENTS ? 0 : -1;
}

} // namespace

/// Stands in the way of the C library's.
extern "C" int ioctl(int, unsigned long request, ...) noexcept {
    std::va_list arguments;
    va_start(arguments, request);
    void* const argument = va_arg(arguments, void*);
    va_end(arguments);
    return answerLikeACard(request, argument);
}

namespace tamblo::alsa {
namespace {

TEST(AlsaControlDevices, areListedReadAndListedAnewWhenTheyAreOthers) {
    const TemporaryDirectory directory;
    ControlDevices devices(directory.path(""));
    EXPECT_EQ(devices.open(0), nullptr);
    ::mkfifo(directory.path("controlC0").c_str(), 0600);
    FileDescriptor card(::open(directory.path("controlC0").c_str(), O_RDWR));
    const std::unique_ptr<Mixer> mixer = devices.open(0);
    ASSERT_NE(mixer, nullptr);
    EXPECT_GE(mixer->descriptor(), 0);
    const auto tell = [&](unsigned mask) {
        snd_ctl_event event{};
        event.data.elem.mask = mask;
        EXPECT_EQ(::write(card.get(), &event, sizeof event), static_cast<ssize_t>(sizeof event));
        mixer->read();
    };

    madeUpControls = {
        {"Master Playback Volume", 100, {SNDRV_CTL_TLVT_DB_SCALE, 8, static_cast<unsigned>(-4000), 40}},
        {"PCM Playback Volume", 50},
        {"Headphone Jack", 1}};
    EXPECT_EQ(mixer->volume(false), MixerVolume{.linear = 0.125});
    EXPECT_EQ(mixer->volume(true), std::nullopt) << "it may have another name";
    madeUpControls[0].value = 50;
    tell(SNDRV_CTL_EVENT_MASK_VALUE);
    EXPECT_NEAR(mixer->volume(false)->linear, 0.0125, 1e-9);
    madeUpControls = {{"Headphone Jack", 1}};
    tell(SNDRV_CTL_EVENT_MASK_REMOVE);
    EXPECT_EQ(mixer->volume(false), MixerVolume{}) << "nothing changes the signal";
    listingFails = true;
    tell(SNDRV_CTL_EVENT_MASK_ADD);
    EXPECT_EQ(mixer->volume(false), std::nullopt);
    card.reset();
    mixer->read();
    EXPECT_EQ(mixer->descriptor(), -1) << "the card has gone";
}

} // namespace
} // namespace tamblo::alsa
