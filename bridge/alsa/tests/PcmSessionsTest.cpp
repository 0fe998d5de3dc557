#include "bridge/alsa/report/PcmSessions.h"
#include "bridge/alsa/tests/KernelTree.h"
#include "bridge/common/tests/KeptReports.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace tamblo::alsa {
namespace {

using namespace std::chrono_literals;
using bridge::test::KeptReports;
using test::KernelTree;
using test::Status;

/// A card's mixer that a test turns.
class HandMixers final : public Mixers {
public:
    [[nodiscard]] std::unique_ptr<Mixer> open(unsigned) override {
        ++opened;
        return std::make_unique<One>(*this);
    }

    MixerVolume volume{.linear = 0.125};
    int opened = 0;

private:
    class One final : public Mixer {
    public:
        explicit One(const HandMixers& all) : all_(all) {}
        [[nodiscard]] int descriptor() const override { return 7; }
        void read() override {}
        [[nodiscard]] std::optional<MixerVolume> volume(bool) override { return all_.volume; }

    private:
        const HandMixers& all_;
    };
};

class AlsaSessions : public testing::Test {
protected:
    AlsaSessions() {
        tree_.pcm(kSpeaker);
        tree_.pcm(kMicrophone);
    }

    void touch(const PcmName& name) { sessions_.nodeTouched(KernelTree::node(name)); }
    /// Time passes, with all looks that fall into it.
    void pass(std::chrono::milliseconds time) {
        const auto end = clock_.now().steady + time;
        for (auto due = sessions_.due(); due && *due <= end; due = sessions_.due()) {
            clock_.advance(std::chrono::duration_cast<std::chrono::milliseconds>(*due - clock_.now().steady));
            sessions_.run();
            ++wakes_;
        }
        clock_.advance(std::chrono::duration_cast<std::chrono::milliseconds>(end - clock_.now().steady));
    }
    void open(const PcmName& name, int owner = 100) {
        tree_.status(name, {.state = "OPEN", .owner = owner});
        touch(name);
    }
    /// It runs for so long already, by the kernel.
    void run(const PcmName& name, double seconds, int owner = 100) {
        tree_.format(name);
        started_ += 1000;
        tree_.status(name, {.owner = owner, .trigger = started_, .written = started_ + seconds});
    }
    void close(const PcmName& name) {
        tree_.close(name);
        touch(name);
    }
    [[nodiscard]] double lengthOf(std::size_t message) const {
        const Value* const length = reports_.messages.at(message).payload.find("session_duration");
        return length == nullptr ? -1 : length->doubleValue();
    }
    [[nodiscard]] std::string textOf(std::size_t message, std::string_view key) const {
        const Value* const text = reports_.messages.at(message).payload.find(key);
        return text == nullptr ? "" : std::string(text->stringValue());
    }
    [[nodiscard]] double numberOf(std::size_t message, std::string_view key) const {
        const Value* const number = reports_.messages.at(message).payload.find(key);
        return number == nullptr ? -1 : number->doubleValue();
    }

    static constexpr PcmName kSpeaker{};
    static constexpr PcmName kMicrophone{.isInput = true};

    KernelTree tree_;
    bridge::test::HandClock clock_;
    KeptReports reports_;
    HandMixers mixers_;
    bridge::ServiceTypes types_;
    SoundFiles files_{tree_.processes()};
    PcmSessions sessions_{files_, mixers_, reports_, clock_, types_};
    double started_ = 0;
    int wakes_ = 0;
};

TEST_F(AlsaSessions, sayWhatRanHowLongAndGoOnWithTheNextSong) {
    open(kSpeaker);
    EXPECT_EQ(reports_.story(), "1 Session_Setup Setup");
    EXPECT_EQ(reports_.sessions.at(0).application, "player");
    run(kSpeaker, 0.04);
    pass(100ms);
    ASSERT_EQ(reports_.story(), "1 Session_Setup Setup, 1 Session_Playback Start");
    EXPECT_EQ(reports_.messages.at(1).at, clock_.now().wall - 40ms) << "as the kernel has it";
    EXPECT_EQ(textOf(1, "active_devices"), "ALC257 Analog - HDA Intel PCH");
    EXPECT_EQ(textOf(1, "session_selected_format"), "LPCM 48000 Hz stereo");
    EXPECT_EQ(textOf(1, "sample_format"), "S16_LE");
    EXPECT_EQ(numberOf(1, "io_buffer_size"), 1024);
    EXPECT_EQ(numberOf(1, "QVSessionVolume"), 0.5);
    pass(3s);
    close(kSpeaker);
    EXPECT_EQ(reports_.messages.size(), 4U);
    EXPECT_NEAR(lengthOf(3), 3.04, 1e-9);

    // The next song is another process's of the same name; it is stopped between two looks.
    tree_.process(200, "player", 200);
    pass(3s);
    open(kSpeaker, 200);
    run(kSpeaker, 0, 200);
    pass(1100ms);
    const double stopped = std::chrono::duration<double>(clock_.now().wall.time_since_epoch()).count() + 0.25;
    tree_.status(kSpeaker, {.state = "SETUP", .owner = 200, .trigger = stopped});
    pass(1s);
    EXPECT_NEAR(lengthOf(6), 1.25, 1e-5) << reports_.story();
    close(kSpeaker);
    EXPECT_EQ(reports_.sessions.size(), 1U);
    EXPECT_FALSE(reports_.sessions.at(0).hasEnded);
    pass(4s);
    EXPECT_TRUE(reports_.sessions.at(0).hasEnded);
    EXPECT_EQ(sessions_.due(), std::nullopt) << "nothing wakes it while nothing is open";
}

TEST_F(AlsaSessions, areOnesOfAProcessAndDirection) {
    const PcmName loopback{.card = 1, .substream = 3};
    tree_.pcm(loopback, "Loopback PCM");
    tree_.process(101, "unused", 100); // a thread of the player
    tree_.put("300/status", "Tgid:\t300\n");
    tree_.put("300/comm", "recorder\n"); // who executes what is its own affair
    open(kSpeaker);
    open(loopback, 101);
    open(kMicrophone, 300);
    run(kSpeaker, 0);
    run(loopback, 0, 101);
    run(kMicrophone, 0, 300);
    pass(100ms);
    ASSERT_EQ(reports_.sessions.size(), 2U);
    EXPECT_EQ(reports_.sessions.at(1).application, "recorder");
    EXPECT_EQ(reports_.story(), "1 Session_Setup Setup, 2 Session_Setup Setup, 1 Session_Playback Start, "
                                "2 Session_Record Start, 1 Routing_RouteChange Generic");
    EXPECT_EQ(textOf(3, "vp_config_input_port"), "ALC257 Analog - HDA Intel PCH");
    EXPECT_EQ(textOf(4, "active_devices"), "ALC257 Analog - HDA Intel PCH, Loopback PCM - Loopback");
    close(kSpeaker);
    EXPECT_EQ(reports_.messages.size(), 6U) << "the other one runs on";
    // Opened again by another process before anybody looked.
    tree_.process(400, "other", 400);
    tree_.status(loopback, {.state = "OPEN", .owner = 400});
    touch(loopback);
    EXPECT_EQ(reports_.sessions.size(), 3U);
    EXPECT_EQ(reports_.story().substr(reports_.story().find("Routing_RouteChange Generic, 1 Rout")),
              "Routing_RouteChange Generic, 1 Routing_RouteChange Generic, 1 Session_Playback Stop, "
              "1 Session_Generic Stop, 3 Session_Setup Setup");
}

TEST_F(AlsaSessions, endSoonWhereTheKernelTellsOfACloseBeforeItIsCarriedOut) {
    open(kSpeaker);
    run(kSpeaker, 0);
    pass(1500ms);
    touch(kSpeaker);
    tree_.close(kSpeaker);
    pass(100ms);
    EXPECT_EQ(sessions_.openNumber(), 0U);
    EXPECT_NEAR(lengthOf(3), 1.5, 1e-9);
}

TEST_F(AlsaSessions, lookOnceASecondAndSeldomAtWhatDoesNotRun) {
    open(kSpeaker);
    run(kSpeaker, 0);
    pass(100ms);
    wakes_ = 0;
    pass(20s);
    EXPECT_EQ(wakes_, 20);
    tree_.status(kSpeaker, {.state = "PAUSED", .trigger = 1});
    pass(20s);
    wakes_ = 0;
    pass(20s);
    EXPECT_LE(wakes_, 4);
}

TEST_F(AlsaSessions, countXrunsAndSayThemAtMostOnceASecond) {
    open(kSpeaker);
    run(kSpeaker, 0);
    pass(100ms);
    // Its owner has it run on when it is dry; and is woken by others many times a second.
    Status dry{.trigger = started_, .written = started_ + 1, .mostAvailable = 4096, .position = 48000};
    for (int i = 0; i < 40; ++i) {
        tree_.status(kSpeaker, dry);
        touch(kSpeaker);
        pass(100ms);
    }
    std::size_t issues = 0;
    std::size_t errors = 0;
    double counted = 0;
    for (std::size_t i = 0; i < reports_.messages.size(); ++i) {
        if (textOf(i, "issue_type") == "overload") {
            ++issues;
            counted += numberOf(i, "xrun_number");
            EXPECT_EQ(textOf(i, "node"), "ALC257 Analog - HDA Intel PCH");
            EXPECT_EQ(textOf(i, "rtaid_client"), "player");
            EXPECT_EQ(numberOf(i, "smallest_buffer_frame_size"), 1024);
        }
        errors += reports_.messages.at(i).type == "Error" ? 1U : 0U;
    }
    EXPECT_THAT(issues, testing::AllOf(testing::Ge(4U), testing::Le(5U))) << reports_.story();
    EXPECT_EQ(errors, 1U);
    EXPECT_GE(counted, 40);
}

TEST_F(AlsaSessions, sayThatACardWasTakenAwayWhileItRan) {
    open(kSpeaker);
    run(kSpeaker, 0);
    pass(2100ms);
    tree_.remove(kSpeaker);
    touch(kSpeaker);
    ASSERT_THAT(
        reports_.story(),
        testing::EndsWith("1 Session_Playback Stop, 1 Session_Generic Stop, 1 Routing_Error IssueDetector"));
    EXPECT_EQ(textOf(4, "issue_type"), "device_vanished");
    EXPECT_EQ(sessions_.openNumber(), 0U);
    pass(4s);
    EXPECT_TRUE(reports_.sessions.at(0).hasEnded);

    // Everything at once, with the devices' directory.
    tree_.pcm(kSpeaker);
    open(kSpeaker);
    open(kMicrophone);
    tree_.remove(kSpeaker);
    tree_.remove(kMicrophone);
    sessions_.nodeTouched(std::nullopt);
    EXPECT_EQ(sessions_.openNumber(), 0U);
}

TEST_F(AlsaSessions, sayTheVolumeOnceASliderRests) {
    open(kSpeaker);
    run(kSpeaker, 0);
    pass(100ms);
    std::vector<int> descriptors;
    sessions_.addDescriptors(descriptors);
    EXPECT_EQ(descriptors, std::vector<int>{7});
    for (double linear : {0.2, 0.3, 1.0}) {
        mixers_.volume.linear = linear;
        sessions_.readMixers();
    }
    descriptors.clear();
    sessions_.addDescriptors(descriptors);
    EXPECT_TRUE(descriptors.empty()) << "it does not wake meanwhile";
    pass(60ms);
    mixers_.volume.isMuted = true;
    sessions_.readMixers();
    pass(60ms);
    ASSERT_THAT(reports_.story(), testing::EndsWith("1 Volume Generic, 1 Volume Generic"));
    EXPECT_EQ(numberOf(2, "QVSessionVolume"), 1);
    EXPECT_EQ(numberOf(3, "linear_volume"), 0);
    close(kSpeaker);
    EXPECT_EQ(mixers_.opened, 1);
    descriptors.clear();
    sessions_.addDescriptors(descriptors);
    EXPECT_TRUE(descriptors.empty()) << "nothing is held open";
}

TEST_F(AlsaSessions, beginAnewWhenTheServiceIsBackAndEndWithTheProgram) {
    reports_.isThere = false;
    open(kSpeaker);
    run(kSpeaker, 0);
    pass(5s);
    EXPECT_TRUE(reports_.messages.empty());
    for (std::size_t times = 1; times <= 2; ++times) {
        reports_.isThere = true;
        sessions_.reporterCame();
        EXPECT_EQ(reports_.sessions.size(), times);
        EXPECT_EQ(reports_.messages.size(), times);
        pass(2s);
        if (times == 1) {
            reports_.isThere = false;
            sessions_.reporterWent();
        }
    }
    sessions_.endAll();
    EXPECT_NEAR(lengthOf(3), 2, 1e-9);
    EXPECT_TRUE(reports_.sessions.at(1).hasEnded);
}

TEST_F(AlsaSessions, surviveTornEmptyAndHostileFiles) {
    open(kSpeaker);
    run(kSpeaker, 0);
    pass(100ms);
    const std::string place = KernelTree::place(kSpeaker, "status");
    const std::string whole = tamblo::test::contentOf(tree_.processes() + "/" + place);
    for (std::size_t size = 0; size < whole.size() - 12; ++size) {
        tree_.put(place, whole.substr(0, size));
        touch(kSpeaker);
    }
    for (const std::string& content :
         {std::string("error -77\n"), std::string(65536, 'x'),
          std::string("state: RUNNING\nowner_pid   : -1\nappl_ptr: 1\n"),
          std::string("state: \xff\xfe\nowner_pid   : 99999999999999999999\nappl_ptr: 1\n")}) {
        tree_.put(place, content);
        touch(kSpeaker);
    }
    EXPECT_EQ(reports_.messages.size(), 2U) << reports_.story();
    EXPECT_EQ(sessions_.openNumber(), 1U) << "what cannot be read has not ended";

    // What is read is cut, well-formed, and has numbers that can be.
    const PcmName wild{.card = 4000000000U, .device = 4294967295U, .substream = 7};
    tree_.pcm(wild, "Evil \xff\x1b[2J " + std::string(3000, 'y'));
    tree_.put(KernelTree::place(wild, "hw_params"),
              "format: S16_LE\nchannels: 4294967295\nrate: 48000\nperiod_size: 99999999999\n");
    tree_.process(500, std::string(200, '\xe9'), 500);
    tree_.status(wild, {.owner = 500, .trigger = -5, .written = 1e300, .mostAvailable = -1, .position = -1});
    tree_.put("asound/card99999999999999/pcm0p/sub0/status", "closed\n");
    tree_.put("asound/cards", std::string(65536, '['));
    sessions_.nodeTouched(std::nullopt);
    ASSERT_EQ(sessions_.openNumber(), 2U);
    EXPECT_LE(reports_.sessions.at(1).application.size(), 128U);
    EXPECT_THAT(reports_.messages.back().payload.find("active_devices")->stringValue(),
                testing::StartsWith("Evil ? [2J y"));
    EXPECT_EQ(reports_.messages.back().payload.find("sample_rate"), nullptr);
    for (const std::string_view node : {"", "pcmC", "pcmC0D0", "pcmC0D0pp", "pcmC99999999999D0p", "seq"}) {
        sessions_.nodeTouched(node);
    }
}

TEST_F(AlsaSessions, areReportedOf200PcmsWithOneWakeASecond) {
    for (unsigned i = 0; i < 200; ++i) {
        const PcmName name{.card = 2 + i / 32, .substream = i % 32};
        tree_.process(static_cast<int>(1000 + i), formatted("player{}", i), static_cast<int>(1000 + i));
        tree_.pcm(name);
        run(name, 0, static_cast<int>(1000 + i));
    }
    sessions_.nodeTouched(std::nullopt);
    EXPECT_EQ(reports_.sessions.size(), 200U);
    wakes_ = 0;
    pass(10s);
    EXPECT_LE(wakes_, 11);
    EXPECT_EQ(reports_.messages.size(), 200U) << "all ran from the start";
    sessions_.endAll();
    EXPECT_EQ(reports_.messages.size(), 600U);
}

} // namespace
} // namespace tamblo::alsa
