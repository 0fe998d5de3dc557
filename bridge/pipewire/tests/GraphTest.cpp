#include "bridge/pipewire/graph/Namespace.h"
#include "bridge/pipewire/graph/Routes.h"
#include "bridge/pipewire/tests/World.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace tamblo::pipewire {
namespace {

using test::World;
using testing::ElementsAre;
using testing::IsEmpty;

TEST(PipeWireProperties, letIdentifiersInAndTitlesNot) {
    World world;
    world.stream(1, {{"media.name", "A secret song"},
                     {"media.title", "A secret song"},
                     {"media.filename", "/home/anna/secret.flac"},
                     {"node.description", "A secret song"},
                     {"node.nick", "A secret song"},
                     {"window.title", "A secret page"},
                     {"application.process.user", "anna"},
                     {"application.process.binary", "player"},
                     {"client.id", "77"},
                     {"media.role", "Music"}});
    Node expected;
    expected.mediaClass = MediaClass::playbackStream;
    expected.isKnown = true;
    expected.state = NodeState::running;
    expected.application.binary = "player";
    expected.client = 77;
    expected.role = "Music";
    EXPECT_EQ(*world.graph.node(1), expected);

    // The class may come last.
    world.node(2, {{"node.description", "A secret song"}, {"media.class", "Stream/Input/Audio"}});
    EXPECT_EQ(world.graph.node(2)->description, "");

    world.node(3, {{"client.id", "-1"}, {"device.id", ""}, {"card.profile.device", "99999999999"}});
    EXPECT_EQ(world.graph.node(3)->client, kNoObject);
    EXPECT_EQ(world.graph.node(3)->device, kNoObject);
    EXPECT_EQ(world.graph.node(3)->endOfDevice, std::nullopt);

    Server server;
    takeMetadata(server, "default.audio.sink", R"({"name":"sink-A"})");
    takeMetadata(server, "clock.quantum", "1024");
    EXPECT_EQ(server.defaultSink, hashOf("sink-A"));
    EXPECT_EQ(server.quantumInForce(), 1024U);
    takeMetadata(server, "clock.force-quantum", "256");
    EXPECT_EQ(server.quantumInForce(), 256U);
    takeMetadata(server, "clock.force-quantum", "0");
    EXPECT_EQ(server.quantumInForce(), 1024U);
    for (const std::string& hostile : {std::string("{"), std::string("[1]"), std::string(65536, '{')}) {
        takeMetadata(server, "default.audio.sink", hostile);
        EXPECT_EQ(server.defaultSink, kNoName);
    }
}

TEST(PipeWireGraph, isBoundedAndForgetsWhatHasGone) {
    World world;
    for (ObjectID id = 1; id <= Graph::kMostNodes + 10; ++id) {
        world.node(id, {{"node.link-group", "group"}});
    }
    EXPECT_EQ(world.graph.nodes().size(), Graph::kMostNodes);
    EXPECT_GE(world.graph.leftOut(), 10U);
    world.link(1, 2);
    world.link(1, 2); // announced twice
    EXPECT_THAT(world.graph.takersFrom(1), ElementsAre(2));
    world.graph.remove(1);
    world.unlink(1, 2);
    EXPECT_THAT(world.graph.giversTo(2), IsEmpty());
    EXPECT_EQ(world.graph.groupOf(*world.graph.node(2)).size(), Graph::kMostNodes - 1);
    world.graph.clear();
    EXPECT_TRUE(world.graph.nodes().empty());
}

TEST(PipeWireRoutes, leadThroughFiltersToDevices) {
    World world;
    world.stream(1);
    world.sink(2, "Speaker");
    world.sink(3, "Headphones");
    EXPECT_FALSE(devicesReachedFrom(world.graph, 1).isLinked);
    world.link(1, 2);
    world.link(1, 3);
    EXPECT_THAT(devicesReachedFrom(world.graph, 1).devices, ElementsAre(2, 3));

    // Two sides of one filter: the one's sound comes out at the other; a sink's monitor leads nowhere.
    world.stream(10);
    world.node(11, {{"media.class", "Audio/Sink"}, {"node.name", "equaliser"}, {"node.link-group", "eq"}});
    world.node(12, {{"media.class", "Stream/Output/Audio"}, {"node.link-group", "eq"}});
    world.link(10, 11);
    EXPECT_THAT(devicesReachedFrom(world.graph, 10).devices, IsEmpty()) << "the filter leads nowhere yet";
    world.link(12, 2);
    world.node(13, {{"media.class", "Stream/Input/Audio"}});
    world.link(2, 13);
    EXPECT_EQ(devicesReachedFrom(world.graph, 10), (Reached{{2}, {11}, true}));

    // A virtual sink leads on over its monitor and through filters without a class; alone it is a device.
    world.stream(20);
    world.node(21, {{"media.class", "Audio/Sink"}, {"factory.name", "support.null-audio-sink"}});
    world.link(20, 21);
    EXPECT_THAT(devicesReachedFrom(world.graph, 20).devices, ElementsAre(21));
    world.node(22, {{"node.name", "compressor"}});
    world.link(21, 22);
    world.link(22, 3);
    EXPECT_EQ(devicesReachedFrom(world.graph, 20), (Reached{{3}, {21, 22}, true}));

    // Recording, through an echo canceller whose sink is linked, too.
    world.node(30, {{"media.class", "Stream/Input/Audio"}});
    world.node(
        31,
        {{"media.class", "Audio/Source"}, {"node.name", "echo-cancel-source"}, {"node.link-group", "ec"}});
    world.node(32, {{"media.class", "Stream/Input/Audio"}, {"node.link-group", "ec"}});
    world.node(33, {{"media.class", "Stream/Output/Audio"}, {"node.link-group", "ec"}});
    world.node(34, {{"media.class", "Audio/Source"}, {"node.description", "Microphone"}});
    world.link(31, 30);
    world.link(34, 32);
    world.link(33, 2);
    EXPECT_EQ(devicesReachedFrom(world.graph, 30), (Reached{{34}, {31}, true}));
}

TEST(PipeWireRoutes, endInCirclesAndLongWays) {
    World world;
    world.stream(1);
    world.link(1, 2);
    for (ObjectID id = 2; id < 10; ++id) {
        world.node(id, {});
        world.link(id, id + 1 < 10 ? id + 1 : 2);
    }
    EXPECT_THAT(devicesReachedFrom(world.graph, 1).devices, IsEmpty());

    world.stream(2000);
    for (ObjectID id = 2000; id < 2999; ++id) {
        world.graph.addLink(id * 10, {.output = id, .input = id + 1});
        world.node(id + 1, {});
    }
    EXPECT_LE(devicesReachedFrom(world.graph, 2000).filters.size(), kMostSteps);
}

TEST(PipeWireRoutes, nameDevicesAsPeopleDo) {
    World world;
    world.graph.changeDevice(50, [](Device& device) {
        takeProperty(device, "device.description", "Built-in Audio");
        takeProperty(device, "device.form-factor", "internal");
        takeProperty(device, "device.serial", "SERIAL123");
        device.routes = {{true, 4, "Headphones", "headphones"}, {false, 5, "Microphone", "mic"}};
    });
    world.node(1, {{"media.class", "Audio/Sink"},
                   {"node.description", "Built-in Audio Analog Stereo"},
                   {"device.id", "50"},
                   {"card.profile.device", "4"}});
    const DeviceFacts facts = factsOf(world.graph, 1);
    EXPECT_EQ(facts.name, "Headphones - Built-in Audio");
    EXPECT_EQ(facts.portType, "headphones");
    EXPECT_EQ(facts.formFactor, "internal");

    Node remapped;
    remapped.name = "alsa_output.usb-Maker_Thing_0123-00.analog-stereo.remapped";
    EXPECT_EQ(filterName(remapped), "alsa_output.usb-.analog-stereo.remapped") << "without the serial number";

    // A headset that has no name is called by its address.
    world.node(2, {{"media.class", "Audio/Sink"},
                   {"node.description", "01:23:45:67:89:AB"},
                   {"api.bluez5.profile", "a2dp-sink"},
                   {"api.bluez5.codec", "aac"}});
    EXPECT_EQ(factsOf(world.graph, 2).name, "Unnamed sink");
    EXPECT_EQ(factsOf(world.graph, 2).bluetoothCodec, "aac");
    EXPECT_EQ(factsOf(world.graph, 1, true).name, "Monitor of Headphones - Built-in Audio");
}

} // namespace
} // namespace tamblo::pipewire
