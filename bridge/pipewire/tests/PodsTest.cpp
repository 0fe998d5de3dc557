#include "bridge/pipewire/server/Pods.h"
#include "bridge/pipewire/graph/Namespace.h"

#include <gtest/gtest.h>

#include <array>
#include <cstddef>
#include <string>

#include <spa/param/audio/format-utils.h>
#include <spa/param/props.h>
#include <spa/param/route.h>
#include <spa/pod/builder.h>
#include <spa/pod/iter.h>

namespace tamblo::pipewire {
namespace {

/// A parameter as another process sends it, which may have any shape.
class Parameter {
public:
    Parameter(std::uint32_t type, std::uint32_t id) {
        spa_pod_builder_init(&builder_, memory_.data(), static_cast<std::uint32_t>(memory_.size()));
        spa_pod_builder_push_object(&builder_, &frame_, type, id);
    }
    spa_pod_builder* with(std::uint32_t key) {
        spa_pod_builder_prop(&builder_, key, 0);
        return &builder_;
    }
    /// The value of a property, to be bent: its claims about itself are not looked at by who builds it.
    spa_pod* bend(std::uint32_t key) {
        auto* const whole = reinterpret_cast<spa_pod*>(memory_.data());
        return &const_cast<spa_pod_prop*>(spa_pod_find_prop(whole, nullptr, key))->value;
    }
    const spa_pod* finish() { return static_cast<const spa_pod*>(spa_pod_builder_pop(&builder_, &frame_)); }

private:
    alignas(8) std::array<std::byte, 4096> memory_{};
    spa_pod_builder builder_{};
    spa_pod_frame frame_{};
};

TEST(PipeWirePods, giveTheLoudestChannelsVolume) {
    Parameter properties(SPA_TYPE_OBJECT_Props, SPA_PARAM_Props);
    const std::array<float, 2> channels{0.25F, 0.5F};
    spa_pod_builder_array(properties.with(SPA_PROP_channelVolumes), sizeof(float), SPA_TYPE_Float, 2,
                          channels.data());
    spa_pod_builder_float(properties.with(SPA_PROP_volume), 0.5F);
    spa_pod_builder_bool(properties.with(SPA_PROP_mute), true);
    EXPECT_EQ(volumeOf(properties.finish()), (Volume{0.25, true}));
    EXPECT_EQ(volumeOf(nullptr), std::nullopt);
}

TEST(PipeWirePods, thatLieOfTheSizeOfTheirValuesAreNotCopied) {
    for (const std::uint32_t size : {0U, 1U, 8U, 1024U, 0xFFFFFFFFU}) {
        Parameter properties(SPA_TYPE_OBJECT_Props, SPA_PARAM_Props);
        const std::array<float, 512> channels{0.5F};
        spa_pod_builder_array(properties.with(SPA_PROP_channelVolumes), sizeof(float), SPA_TYPE_Float,
                              static_cast<std::uint32_t>(channels.size()), channels.data());
        const spa_pod* const whole = properties.finish();
        reinterpret_cast<spa_pod_array*>(properties.bend(SPA_PROP_channelVolumes))->body.child.size = size;
        EXPECT_EQ(volumeOf(whole), Volume{}) << size;
    }
    Parameter format(SPA_TYPE_OBJECT_Format, SPA_PARAM_Format);
    spa_pod_builder_id(format.with(SPA_FORMAT_mediaType), SPA_MEDIA_TYPE_audio);
    spa_pod_builder_id(format.with(SPA_FORMAT_mediaSubtype), SPA_MEDIA_SUBTYPE_raw);
    spa_pod_frame choice{};
    spa_pod_builder* const builder = format.with(SPA_FORMAT_AUDIO_rate);
    spa_pod_builder_push_choice(builder, &choice, SPA_CHOICE_Enum, 0);
    spa_pod_builder_int(builder, 48000);
    spa_pod_builder_pop(builder, &choice);
    const spa_pod* const whole = format.finish();
    EXPECT_EQ(formatOf(whole), (Format{"lpcm", 48000, 0}));
    format.bend(SPA_FORMAT_AUDIO_rate)->size = sizeof(spa_pod_choice_body);
    EXPECT_EQ(formatOf(whole), (Format{"lpcm", 0, 0})) << "a choice of nothing";
}

TEST(PipeWirePods, textsThatDoNotEndAreNone) {
    Parameter route(SPA_TYPE_OBJECT_ParamRoute, SPA_PARAM_Route);
    spa_pod_builder_id(route.with(SPA_PARAM_ROUTE_direction), SPA_DIRECTION_INPUT);
    spa_pod_builder_int(route.with(SPA_PARAM_ROUTE_device), 3);
    spa_pod_builder_string(route.with(SPA_PARAM_ROUTE_description), "Headset");
    spa_pod_frame information{};
    spa_pod_builder* const builder = route.with(SPA_PARAM_ROUTE_info);
    spa_pod_builder_push_struct(builder, &information);
    spa_pod_builder_int(builder, 1);
    spa_pod_builder_string(builder, "port.type");
    spa_pod_builder_string(builder, "headset");
    spa_pod_builder_pop(builder, &information);
    const spa_pod* const whole = route.finish();
    const auto read = routeOf(whole);
    ASSERT_TRUE(read);
    EXPECT_EQ(*read, (Route{false, 3, "Headset", "headset"}));
    // The byte that ends it is another: what follows is not its own.
    static_cast<char*>(SPA_POD_BODY(route.bend(SPA_PARAM_ROUTE_description)))[7] = '!';
    EXPECT_EQ(routeOf(whole)->description, "");
}

} // namespace
} // namespace tamblo::pipewire
