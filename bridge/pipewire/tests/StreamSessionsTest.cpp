#include "bridge/pipewire/report/StreamSessions.h"
#include "bridge/pipewire/report/Application.h"
#include "bridge/pipewire/tests/World.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace tamblo::pipewire {
namespace {

using namespace std::chrono_literals;
using test::KeptReports;

class PipeWireSessions : public testing::Test {
protected:
    PipeWireSessions() {
        world_.graph.addObserver(sessions_);
        world_.graph.changeServer([](Server& server) { server.version = "1.0"; });
        world_.sink(100, "Speaker");
        world_.sink(101, "Headphones");
    }

    void play(ObjectID id, test::Properties properties = {{"application.id", "org.example.player"}}) {
        world_.stream(id, properties);
        world_.graph.changeNode(id, [](Node& node) { node.format = {{"lpcm", 44100, 2}}; });
        world_.link(id, 100);
    }
    void remove(ObjectID id) {
        world_.unlink(id, 100);
        world_.graph.remove(id);
    }
    /// As the loop does.
    void pass(std::chrono::milliseconds time) {
        const SteadyTime end = clock_.now().steady + time;
        while (sessions_.due() && *sessions_.due() <= end) {
            clock_.advance(
                std::chrono::ceil<std::chrono::milliseconds>(*sessions_.due() - clock_.now().steady));
            sessions_.run();
        }
        clock_.advance(std::chrono::duration_cast<std::chrono::milliseconds>(end - clock_.now().steady));
    }
    [[nodiscard]] const KeptReports::Message& last() const { return reports_.messages.back(); }
    [[nodiscard]] Value lastOf(std::string_view key) const {
        const Value* const value = last().payload.find(key);
        return value == nullptr ? Value("absent") : *value;
    }

    test::World world_;
    test::HandClock clock_;
    KeptReports reports_;
    ServiceTypes types_;
    StreamSessions sessions_{world_.graph, reports_, clock_, types_};
};

TEST_F(PipeWireSessions, sayEverythingAtTheStartThenWhatChangesAndHowLongItWas) {
    const WallTime begin = clock_.now().wall;
    play(1,
         {{"application.id", "org.example.player"}, {"media.role", "Music"}, {"node.latency", "4800/48000"}});
    pass(1s);
    ASSERT_EQ(reports_.story(), "1 Session_Playback Start");
    EXPECT_EQ(reports_.sessions[0].serviceType, ServiceType::longFormAudio);
    EXPECT_EQ(reports_.sessions[0].application, "org.example.player");
    EXPECT_EQ(last().at, begin);
    EXPECT_EQ(lastOf("session_output_running"), true);
    EXPECT_EQ(lastOf("session_selected_format"), "LPCM 44100 Hz stereo");
    EXPECT_EQ(lastOf("mFormatID"), "lpcm");
    EXPECT_EQ(lastOf("mChannelsPerFrame"), 2);
    EXPECT_EQ(lastOf("active_devices"), "Speaker");
    EXPECT_EQ(lastOf("QVSessionVolume"), 1.0);
    EXPECT_EQ(lastOf("spatializationEnabled"), false);
    EXPECT_EQ(lastOf("requested_latency"), 0.1);
    EXPECT_EQ(lastOf("bluetooth_codec"), "absent");

    // The stream's volume and the sink's are one; muted is 0.
    world_.graph.changeNode(1, [](Node& node) { node.volume = {{0.125, false}}; });
    world_.graph.changeNode(100, [](Node& node) { node.volume = {{0.512, false}}; });
    pass(1s);
    EXPECT_EQ(reports_.story(), "1 Session_Playback Start, 1 Volume Generic");
    EXPECT_EQ(lastOf("QVSessionVolume"), 0.4);
    EXPECT_EQ(lastOf("linear_volume"), 0.064);
    world_.graph.changeNode(100, [](Node& node) { node.volume = {{0.512, true}}; });
    pass(1s);
    EXPECT_EQ(lastOf("QVSessionVolume"), 0.0);
    world_.graph.changeNode(1, [](Node& node) { node.volume = {{0.216, false}}; });
    pass(1s);
    EXPECT_EQ(last().category, "Volume") << "though it is not heard";

    world_.link(1, 101);
    world_.unlink(1, 100);
    pass(1s);
    EXPECT_EQ(last().category, "Routing_RouteChange");
    EXPECT_EQ(lastOf("active_devices"), "Headphones");
    EXPECT_EQ(lastOf("previous_devices"), "Speaker");

    reports_.messages.clear();
    remove(1);
    EXPECT_EQ(reports_.story(), "1 Session_Playback Stop, 1 Session_Generic Stop") << "at once";
    EXPECT_EQ(lastOf("session_duration"), 5.0);
    pass(10s);
    EXPECT_TRUE(reports_.sessions[0].hasEnded);
    EXPECT_EQ(sessions_.count(), 0U);
    EXPECT_FALSE(sessions_.due()) << "nothing wakes an idle program";
}

TEST_F(PipeWireSessions, sayWhatFiltersAndHeadsetsDo) {
    world_.node(110,
                {{"media.class", "Audio/Sink"}, {"node.name", "spatializer"}, {"node.link-group", "filter"}});
    world_.graph.changeNode(110, [](Node& node) { node.volume = {{0.125, false}}; });
    world_.node(111, {{"media.class", "Stream/Output/Audio"}, {"node.link-group", "filter"}});
    world_.stream(1, {{"application.id", "org.example.player"}});
    world_.link(1, 110);
    world_.link(111, 101);
    pass(1s);
    EXPECT_EQ(lastOf("active_devices"), "Headphones");
    EXPECT_EQ(lastOf("filters"), "spatializer");
    EXPECT_EQ(lastOf("spatializationEnabled"), true);
    EXPECT_EQ(lastOf("QVSessionVolume"), 0.5);

    world_.node(120, {{"media.class", "Audio/Source"},
                      {"node.description", "Headset"},
                      {"api.bluez5.profile", "headset-head-unit"},
                      {"api.bluez5.codec", "msbc"}});
    world_.node(
        121,
        {{"media.class", "Audio/Source"}, {"node.name", "echo-cancel-source"}, {"node.link-group", "ec"}});
    world_.node(122, {{"media.class", "Stream/Input/Audio"}, {"node.link-group", "ec"}});
    world_.node(
        2, {{"media.class", "Stream/Input/Audio"}, {"application.id", "phone"}, {"media.role", "phone"}});
    world_.link(121, 2);
    world_.link(120, 122);
    pass(1s);
    EXPECT_EQ(last().category, "Session_Record");
    EXPECT_EQ(lastOf("session_input_running"), true);
    EXPECT_EQ(lastOf("vp_config_operation_mode"), "echo-cancel-source");
    EXPECT_EQ(lastOf("vp_config_input_port"), "Headset");
    EXPECT_EQ(lastOf("vp_config_primary_vocoder"), "mSBC");
    EXPECT_EQ(lastOf("vp_config_primary_vocoderFs"), "16000");
    EXPECT_EQ(lastOf("bluetooth_profile"), "headset-head-unit");
    EXPECT_EQ(reports_.sessions[1].serviceType, ServiceType::telephony);
    world_.graph.remove(2);
    EXPECT_EQ(reports_.messages[reports_.messages.size() - 2]
                  .payload.find("vp_config_primary_vocoder")
                  ->stringValue(),
              "none");
}

TEST_F(PipeWireSessions, goOnWithTheApplicationsNextStreamOfTheSameKind) {
    play(1);
    pass(3s);
    remove(1);
    pass(2s);
    play(2);
    pass(3s);
    remove(2);
    pass(2s);
    play(3, {{"application.id", "org.example.player"}, {"media.role", "Notification"}});
    pass(10s);
    EXPECT_EQ(reports_.sessions.size(), 2U);
    EXPECT_TRUE(reports_.sessions[0].hasEnded);
    EXPECT_EQ(reports_.sessions[1].serviceType, ServiceType::systemSounds);
    std::vector<double> lengths;
    for (const auto& message : reports_.messages) {
        if (const Value* const length = message.payload.find("session_duration")) {
            lengths.push_back(length->doubleValue());
        }
    }
    EXPECT_THAT(lengths, testing::ElementsAre(3.0, 3.0));
}

TEST_F(PipeWireSessions, leaveOutFiltersAndMetersAndEndTheUnseen) {
    play(1, {{"node.link-group", "filter"}});
    play(2, {{"stream.monitor", "true"}});
    pass(1s);
    EXPECT_EQ(reports_.story(), "");
    // Shorter than the settling time.
    play(3, {{"application.name", "short"}});
    clock_.advance(20ms);
    remove(3);
    pass(10s);
    ASSERT_EQ(reports_.sessions.size(), 1U);
    EXPECT_TRUE(reports_.sessions[0].hasEnded);
    EXPECT_EQ(reports_.sessions[0].application, "short");
}

TEST_F(PipeWireSessions, sayOfAPausedStreamOnlyThatItStopped) {
    play(1);
    pass(1s);
    world_.node(1, {}, NodeState::idle);
    pass(2s);
    world_.graph.changeNode(1, [](Node& node) { node.volume = {{0.5, false}}; });
    pass(1s);
    world_.node(1, {}, NodeState::running);
    pass(1s);
    EXPECT_EQ(reports_.story(), "1 Session_Playback Start, 1 Session_Playback Stop, 1 Session_Generic Stop, "
                                "1 Session_Playback Start");
    EXPECT_EQ(lastOf("linear_volume"), 0.5);
}

TEST_F(PipeWireSessions, reportAStreamThatIsMovedAllTheTimeAndItsEnd) {
    play(1);
    pass(1s);
    for (int i = 0; i < 1000; ++i) {
        const auto [from, to] = i % 2 == 0 ? std::pair(100U, 101U) : std::pair(101U, 100U);
        world_.unlink(1, from);
        pass(20ms);
        world_.link(1, to);
        pass(80ms);
    }
    EXPECT_LE(reports_.messages.size(), 1001U);
    EXPECT_GE(reports_.messages.size(), 900U);
    remove(1);
    pass(10s);
    EXPECT_NEAR(lastOf("session_duration").doubleValue(), 101, 0.1) << "one period of activity";
    EXPECT_TRUE(reports_.sessions[0].hasEnded);
}

TEST_F(PipeWireSessions, beginAnewWhenTheServiceIsBackAndEndWithTheServer) {
    reports_.isThere = false;
    play(1);
    pass(1s);
    EXPECT_TRUE(reports_.sessions.empty());
    reports_.isThere = true;
    sessions_.reporterCame();
    pass(1s);
    EXPECT_EQ(reports_.story(), "1 Session_Playback Start");

    reports_.isThere = false;
    sessions_.reporterWent();
    pass(1s);
    reports_.isThere = true;
    sessions_.reporterCame();
    pass(1s);
    EXPECT_EQ(reports_.story(), "1 Session_Playback Start, 2 Session_Playback Start") << "once";
    EXPECT_EQ(lastOf("active_devices"), "Speaker");

    world_.graph.clear();
    EXPECT_TRUE(reports_.sessions[1].hasEnded) << "without a grace time";
    EXPECT_EQ(lastOf("session_duration"), 1.0);
    EXPECT_EQ(sessions_.count(), 0U);
    pass(10s);
    EXPECT_FALSE(sessions_.due());
}

TEST_F(PipeWireSessions, areLimitedInNumber) {
    for (ObjectID id = 1000; id < 1000 + StreamSessions::kMostSessions + 50; ++id) {
        world_.stream(id, {{"application.id", "org.example.many"}});
    }
    pass(1s);
    EXPECT_EQ(reports_.sessions.size(), StreamSessions::kMostSessions);
    EXPECT_EQ(sessions_.leftOut(), 50U);
    world_.graph.clear();
    for (const auto& session : reports_.sessions) {
        EXPECT_TRUE(session.hasEnded);
    }
}

TEST(PipeWireApplications, areKnownByIdentifierThenBinaryThenName) {
    Node stream;
    Client client;
    EXPECT_EQ(applicationOf(stream, nullptr), "Unknown");
    client.application.name = "Player";
    EXPECT_EQ(applicationOf(stream, &client), "Player");
    stream.application.name = "A Player";
    EXPECT_EQ(applicationOf(stream, &client), "A Player");
    client.application.binary = "player";
    EXPECT_EQ(applicationOf(stream, &client), "player");
    stream.application.identifier = "org.example.player";
    EXPECT_EQ(applicationOf(stream, &client), "org.example.player");
    client.application.portal = "org.example.Sandboxed";
    EXPECT_EQ(applicationOf(stream, &client), "org.example.Sandboxed") << "what cannot be made up";
}

} // namespace
} // namespace tamblo::pipewire
