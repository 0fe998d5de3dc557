#include "bridge/pipewire/report/DeviceSession.h"
#include "bridge/pipewire/report/ConnectedAccessories.h"
#include "bridge/pipewire/tests/World.h"
#include "tests/Files.h"
#include "wire/ConnectedAccessories.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace tamblo::pipewire {
namespace {

using namespace std::chrono_literals;

constexpr ObjectID kCard = 50;
constexpr ObjectID kSpeaker = 100;
constexpr ObjectID kHeadset = 101;

class PipeWireDevice : public testing::Test {
protected:
    PipeWireDevice() {
        world_.graph.addObserver(session_);
        world_.graph.addObserver(accessories_);
    }

    void startServer() {
        world_.graph.changeServer([](Server& server) { server.version = "1.0"; });
        world_.node(kSpeaker, {{"media.class", "Audio/Sink"}, {"node.name", "a"}, {"node.nick", "Speaker"}});
        world_.graph.changeServer([](Server& server) {
            server.rate = 48000;
            server.defaultSink = hashOf("a");
        });
        pass(1s);
    }
    void connectHeadset() {
        world_.graph.changeDevice(kCard, [](Device& device) {
            device.isKnown = true;
            device.description = "Headset";
            device.identifier = "1234";
            device.formFactor = "headset";
            device.vendor = "bluetooth:054c";
            device.product = "0x0d58";
            device.profile = "a2dp-sink";
        });
        world_.node(kHeadset, {{"media.class", "Audio/Sink"},
                               {"node.name", "b"},
                               {"device.id", "50"},
                               {"api.bluez5.profile", "a2dp-sink"}});
    }
    void pass(std::chrono::milliseconds time) {
        const SteadyTime end = clock_.now().steady + time;
        const auto earliest = [this] {
            const auto a = session_.due();
            const auto b = accessories_.due();
            return a && b ? std::min(a, b) : a ? a : b;
        };
        for (auto due = earliest(); due && *due <= end; due = earliest()) {
            clock_.advance(
                std::max(0ms, std::chrono::ceil<std::chrono::milliseconds>(*due - clock_.now().steady)));
            for (Timed* const timed : {static_cast<Timed*>(&session_), static_cast<Timed*>(&accessories_)}) {
                if (timed->due() && *timed->due() <= clock_.now().steady) {
                    timed->run();
                }
            }
        }
        clock_.advance(std::chrono::duration_cast<std::chrono::milliseconds>(end - clock_.now().steady));
    }
    std::string take() {
        std::string story = reports_.story();
        last_ = reports_.messages.empty() ? Dictionary() : reports_.messages.back().payload;
        reports_.messages.clear();
        return story;
    }
    [[nodiscard]] std::string lastOf(std::string_view key) const {
        const Value* const value = last_.find(key);
        return value == nullptr    ? "absent"
               : value->isString() ? std::string(value->stringValue())
                                   : std::to_string(value->integerValue());
    }
    [[nodiscard]] std::optional<std::vector<wire::ConnectedAccessory>> connected() const {
        const auto text = HeldFile::read(directory_.path("connected.json"), 4096);
        return text ? wire::parseConnectedAccessories(*text) : std::nullopt;
    }

    const TemporaryDirectory directory_;
    test::World world_;
    test::HandClock clock_;
    test::KeptReports reports_;
    DeviceSession session_{world_.graph, reports_, clock_};
    ConnectedAccessories accessories_{world_.graph, clock_, directory_.path()};
    Dictionary last_;
};

TEST_F(PipeWireDevice, saysWhatIsThereThenWhatChanges) {
    startServer();
    EXPECT_EQ(take(), "1 HAL_Generic Start, 1 HAL_Setup Activate");
    EXPECT_EQ(reports_.sessions[0].serviceType, ServiceType::audioDeviceUsage);
    connectHeadset();
    pass(1s);
    EXPECT_EQ(take(), "1 HAL_Setup Activate, 1 HAL_Setup Activate") << "the card, and its sink";
    world_.graph.changeServer([](Server& server) { server.defaultSink = hashOf("b"); });
    pass(1s);
    EXPECT_EQ(take(), "1 Routing_RouteChange Generic");
    EXPECT_EQ(lastOf("default_output"), "Headset");
    EXPECT_EQ(lastOf("previous_default_output"), "Speaker");
    EXPECT_EQ(lastOf("default_output_bluetooth_profile"), "a2dp-sink");
    EXPECT_EQ(lastOf("message_number"), "5") << "the service would leave it out if it came again";
    world_.graph.changeDevice(kCard, [](Device& device) { device.profile = "headset-head-unit"; });
    pass(1s);
    EXPECT_EQ(take(), "1 HAL_Setup Generic");
    EXPECT_EQ(lastOf("profile"), "headset-head-unit");
    EXPECT_EQ(lastOf("previous_profile"), "a2dp-sink");
    world_.graph.changeServer([](Server& server) { server.rate = 44100; });
    pass(1s);
    EXPECT_EQ(take(), "1 HAL_Setup Generic");
    EXPECT_EQ(lastOf("sample_rate"), "44100");
    // What plays there, and how loud, is not the device's.
    world_.stream(1);
    world_.link(1, kSpeaker);
    world_.graph.changeNode(kSpeaker, [](Node& node) { node.volume = Volume{0.5}; });
    world_.graph.remove(kHeadset);
    world_.graph.remove(kCard);
    pass(1s);
    EXPECT_EQ(take(), "1 Routing_RouteChange Generic, 1 HAL_Setup Deactivate, 1 HAL_Setup Deactivate");
    EXPECT_FALSE(session_.due().value() < clock_.now().steady + 23h) << "nothing wakes it but the day";
}

TEST_F(PipeWireDevice, tellsTwoHeadsetsApartWhoseNamesAreAddresses) {
    startServer();
    const std::string mine = "bluez_output.01_23_45_67_89_AB.1";
    const std::string yours = "bluez_output.01_23_45_67_89_AC.1";
    world_.node(7, {{"media.class", "Audio/Sink"}, {"node.name", mine}, {"node.nick", "Mine"}});
    world_.node(8, {{"media.class", "Audio/Sink"}, {"node.name", yours}, {"node.nick", "Yours"}});
    pass(1s);
    for (const auto& [name, nick] : {std::pair(mine, "Mine"), std::pair(yours, "Yours")}) {
        take();
        world_.graph.changeServer([chosen = name](Server& server) {
            takeMetadata(server, "default.audio.sink", R"({"name":")" + chosen + "\"}");
        });
        pass(1s);
        EXPECT_EQ(take(), "1 Routing_RouteChange Generic");
        EXPECT_EQ(lastOf("default_output"), nick);
    }
}

TEST_F(PipeWireDevice, isBegunAnewOnceADayAndWithTheServiceAndCountsRestartsOfTheServer) {
    startServer();
    take();
    for (int restart = 1; restart <= 2; ++restart) {
        world_.graph.clear();
        pass(1s);
        EXPECT_EQ(take(), "1 HAL_Generic Stop") << "that all devices went with it is not said";
        startServer();
        EXPECT_EQ(take(), "1 HAL_Generic Start, 1 HAL_Setup Activate");
        EXPECT_EQ(reports_.sessions.size(), 1U);
    }
    pass(24h);
    EXPECT_TRUE(reports_.sessions.at(0).hasEnded);
    EXPECT_EQ(take(), "2 HAL_Generic Start, 2 HAL_Setup Activate");

    reports_.isThere = false;
    session_.reporterWent();
    world_.sink(7, "New");
    pass(25h);
    EXPECT_EQ(session_.due(), std::nullopt);
    reports_.isThere = true;
    session_.reporterCame();
    pass(1s);
    EXPECT_EQ(take(), "3 HAL_Generic Start, 3 HAL_Setup Activate, 3 HAL_Setup Activate");
    session_.end();
    EXPECT_TRUE(reports_.sessions.at(2).hasEnded);
}

TEST_F(PipeWireDevice, manyDevicesAreSaidInTurns) {
    startServer();
    take();
    for (ObjectID id = 1000; id < 1200; ++id) {
        world_.sink(id, "Sink");
    }
    pass(150ms);
    EXPECT_EQ(reports_.messages.size(), DeviceSession::kMostMessages);
    pass(1s);
    EXPECT_EQ(reports_.messages.size(), 200U);
}

TEST_F(PipeWireDevice, accessoriesAreConnectedAsLongAsTheServerKnowsThem) {
    EXPECT_EQ(connected(), std::nullopt);
    startServer();
    EXPECT_EQ(connected().value().size(), 0U);
    connectHeadset();
    pass(1s);
    EXPECT_THAT(connected().value(),
                testing::ElementsAre(wire::ConnectedAccessory{"1234", "bluetooth:054c:0d58", "headset"}));
    world_.graph.remove(kCard);
    pass(1s);
    EXPECT_EQ(connected().value().size(), 0U);
    world_.graph.clear();
    pass(1s);
    EXPECT_EQ(connected(), std::nullopt) << "nobody knows";
}

} // namespace
} // namespace tamblo::pipewire
