#include "bridge/alsa/kernel/Controls.h"
#include "bridge/alsa/report/Xruns.h"

#include <gtest/gtest.h>

#include <cmath>

#include <sound/tlv.h>

namespace tamblo::alsa {
namespace {

using namespace std::chrono_literals;

constexpr std::uint32_t word(int number) noexcept {
    return static_cast<std::uint32_t>(number);
}

TEST(AlsaControls, areFactorsByWhatTheDriverSaysOfDecibels) {
    const std::vector<std::uint32_t> scale{SNDRV_CTL_TLVT_DB_SCALE, 8, word(-6000), 100};
    const std::vector<std::uint32_t> muteScale{SNDRV_CTL_TLVT_DB_SCALE, 8, word(-6000), 100 | 0x10000};
    const std::vector<std::uint32_t> minMax{SNDRV_CTL_TLVT_DB_MINMAX, 8, word(-6000), 0};
    const std::vector<std::uint32_t> muteMinMax{SNDRV_CTL_TLVT_DB_MINMAX_MUTE, 8, word(-6000), 2000};
    const std::vector<std::uint32_t> linear{SNDRV_CTL_TLVT_DB_LINEAR, 8, word(-9999999), 0};
    // From 0 to 20 in steps of 2 dB up to -20 dB, then of 1 dB.
    const std::vector<std::uint32_t> range{
        SNDRV_CTL_TLVT_DB_RANGE, 48, 0,           20, SNDRV_CTL_TLVT_DB_SCALE, 8, word(-6000), 200, 21, 40,
        SNDRV_CTL_TLVT_DB_SCALE, 8,  word(-1900), 100};
    const std::vector<std::uint32_t> container{
        SNDRV_CTL_TLVT_CONTAINER, 16, SNDRV_CTL_TLVT_DB_MINMAX, 8, word(-6000), 0};
    const std::vector<std::uint32_t> torn{SNDRV_CTL_TLVT_DB_RANGE,  0xFFFFFFFF, 0, 5,
                                          SNDRV_CTL_TLVT_CONTAINER, 0xFFFFFFFF};
    const std::vector<std::uint32_t> channelMap{0x101, 8, 3, 4};
    struct Row {
        const std::vector<std::uint32_t>& decibels;
        std::int64_t maximum;
        std::int64_t value;
        double factor;
    };
    for (const Row& row : {Row{scale, 60, 60, 1}, Row{scale, 60, 40, 0.1}, Row{scale, 60, 0, 0.001},
                           Row{muteScale, 60, 0, 0}, Row{muteScale, 60, 20, 0.01}, Row{minMax, 100, 100, 1},
                           Row{minMax, 60, 20, 0.01}, Row{muteMinMax, 80, 0, 0}, Row{muteMinMax, 80, 80, 10},
                           Row{linear, 10, 5, 0.5}, Row{linear, 10, 0, 0}, Row{range, 40, 10, 0.01},
                           Row{range, 40, 40, 1}, Row{container, 60, 40, 0.1}, Row{{}, 64, 32, 0.125},
                           Row{channelMap, 64, 32, 0.125}, Row{torn, 64, 32, 0.125}, Row{{}, 0, 0, 1}}) {
        const Control control{.name = "", .maximum = row.maximum, .decibels = row.decibels};
        EXPECT_NEAR(linearFactor(control, row.value), row.factor, 1e-9)
            << (row.decibels.empty() ? 99U : row.decibels[0]) << " " << row.value;
    }
    const std::vector<std::uint32_t> mad{SNDRV_CTL_TLVT_DB_SCALE, 8, 0x7FFFFFFF, 0xFFFF};
    EXPECT_TRUE(std::isfinite(linearFactor({.name = "", .maximum = INT64_MAX, .decibels = mad}, INT64_MAX)));
}

TEST(AlsaControls, areTakenTogetherByTheirNames) {
    std::vector<Control> controls{{.name = "Master Playback Volume", .maximum = 10, .values = {0, 10}},
                                  {.name = "Headphone Playback Volume", .maximum = 10, .values = {0}},
                                  {.name = "PCM Playback Volume", .maximum = 10, .values = {5, 5}},
                                  {.name = "Master Playback Switch", .values = {0, 1}},
                                  {.name = "Mic Capture Volume", .maximum = 10, .values = {10}},
                                  {.name = "Mic Capture Switch", .values = {0}}};
    EXPECT_EQ(volumeOf(controls, false), (MixerVolume{.linear = 0.125})) << "of each the loudest channel";
    EXPECT_EQ(volumeOf(controls, true), (MixerVolume{.linear = 1, .isMuted = true}));
    controls.at(3).values = {0, 0};
    EXPECT_TRUE(volumeOf(controls, false)->isMuted);
    EXPECT_EQ(volumeOf(std::span(controls).subspan(1, 1), false), MixerVolume{.linear = 0});
    EXPECT_EQ(volumeOf(std::span(controls).subspan(0, 4), true), std::nullopt);
    EXPECT_FALSE(concernsVolume("Master Playback VolumeX") || concernsVolume("Beep Playback Volume"));
}

TEST(AlsaXruns, areToldBetweenTwoLooks) {
    const PcmFormat format{
        .sample = "S16_LE", .channels = 2, .rate = 48000, .periodFrames = 1024, .bufferFrames = 4096};
    const auto at = [](PcmState state, std::chrono::nanoseconds trigger, std::chrono::nanoseconds written,
                       std::uint64_t position = 0, std::uint64_t mostAvailable = 100) {
        return PcmStatus{.state = state,
                         .owner = 1,
                         .trigger = trigger,
                         .written = written,
                         .mostAvailable = mostAvailable,
                         .position = position};
    };
    using enum PcmState;
    const PcmStatus runs = at(running, 10s, 20s, 480'000);
    struct Row {
        const char* what;
        PcmStatus before;
        PcmStatus now;
        std::uint32_t xruns;
        std::uint32_t restarts;
    };
    for (const Row& row : {
             Row{"it runs on", runs, at(running, 10s, 21s, 528'000), 0, 0},
             Row{"it stands dry", runs, at(xrun, 20500ms, 0s), 1, 0},
             Row{"it still does", at(xrun, 20500ms, 0s), at(xrun, 20500ms, 0s), 0, 0},
             Row{"and once more", at(xrun, 20500ms, 0s), at(xrun, 21500ms, 0s), 1, 0},
             Row{"it has recovered", at(xrun, 20500ms, 0s), at(running, 21s, 22s, 48'000), 0, 0},
             Row{"it did in between", runs, at(running, 20500ms, 21s, 24'000), 0, 1},
             Row{"it was paused", runs, at(running, 20500ms, 21s, 500'000), 0, 0},
             Row{"it ran on dry", runs, at(running, 10s, 21s, 528'000, 4096), 1, 0},
             Row{"it drains", runs, at(draining, 10s, 21s, 528'000, 4096), 0, 0},
             Row{"it was started", at(idle, 0s, 0s), at(running, 20s, 21s, 48'000, 4096), 0, 0},
         }) {
        const XrunCount count = xrunsBetween(row.before, row.now, format);
        EXPECT_EQ(count.xruns, row.xruns) << row.what;
        EXPECT_EQ(count.restarts, row.restarts) << row.what;
    }
}

} // namespace
} // namespace tamblo::alsa
