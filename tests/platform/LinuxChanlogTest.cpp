#include "base/Format.h"
#include "platform/linux/drivers/ChanlogChannelJson.h"
#include "platform/linux/drivers/LinuxChanlogFacility.h"
#include "tests/platform/LinuxServiceSupport.h"

#include <gmock/gmock.h>

#include <chrono>
#include <filesystem>
#include <fstream>
#include <sstream>
#include <string>
#include <thread>
#include <variant>
#include <vector>

namespace tamblo {
namespace {

using testing::AllOf;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;

std::string textOf(const ChanlogChannels& channels) {
    std::string text;
    for (const ChanlogChannelRef& channel : *channels) {
        appendFormatted(text, "{}{}", text.empty() ? "" : " ", channel->channelName.value_or("-"));
        if (channel->format == ChanlogFormat::simple) {
            appendFormatted(text, "={}", channel->value);
        }
        for (const ChanlogState& state : channel->states) {
            appendFormatted(text, ",{}:{}:{}:{}", state.name, state.transitions, state.residency,
                            fixed(state.dutyCycle, 2));
        }
        for (const ChanlogBucket& bucket : channel->buckets) {
            appendFormatted(text, ",{}-{}:{}", bucket.lower, bucket.upper, bucket.hits);
        }
        if (channel->format == ChanlogFormat::histogram) {
            appendFormatted(text, ",{}..{}", channel->minimum, channel->maximum);
        }
    }
    return text;
}

/// A simple channel of the group "g".
std::string simple(const std::string& name, const std::string& value, const std::string& more = {}) {
    return R"({"group": "g", "name": ")" + name + R"(", "format": "simple", "value": )" + value + more + "}";
}

class LinuxChanlogTest : public testing::Test {
protected:
    ChanlogChannels sample(const ChanlogSelection& selection = {}) {
        const auto moment = facility.beginSampling();
        return std::get<ChanlogChannels>(moment->channelsOf(selection));
    }
    void publish(const std::string& name, const std::string& text) const {
        root.write("chanlog/" + name, text);
    }
    /// Of everything that there is.
    std::string now() { return textOf(sample()); }
    std::string difference(const ChanlogChannels& earlier, const ChanlogChannels& later) {
        return textOf(std::get<ChanlogChannels>(facility.difference(earlier, later)));
    }

    TemporaryDirectory root;
    RecordingLog log;
    LinuxChanlogFacility facility{root.path("chanlog"), log, root.path("asound")};
};

TEST_F(LinuxChanlogTest, WithoutAnythingToReadThereAreNoChannels) {
    EXPECT_EQ(now(), "");
    EXPECT_EQ(std::get<int>(facility.difference(nullptr, sample())), ENOENT);
    root.write("chanlog", "not a directory");
    EXPECT_EQ(now(), "");
    EXPECT_THAT(log.take(), IsEmpty());
}

TEST_F(LinuxChanlogTest, ChannelsAreReadAndSelected) {
    publish("b.json", "[" + simple("b1", "-5") +
                          R"(, {"group": "g", "subgroup": "s", "name": "st",)"
                          R"("format": "state", "states": [{"name": "on", "transitions": 1,)"
                          R"( "residency": 18446744073709551615}]}])");
    publish("a.json", R"([{"driver": "d", "subgroup": "s", "name": "h", "unit": "ms", "format": "histogram",)"
                      R"("buckets": [{"lower": -1, "upper": 2, "hits": 3}], "min": -4, "max": 5, "x": {}},)"
                      R"({"name": "array", "format": "simple_array"}, {"format": "simple", "value": 1}])");
    publish(".hidden.json", "[" + simple("no", "1") + "]");
    publish("a.json.new", "[" + simple("no", "1") + "]");
    EXPECT_EQ(now(), "h,-1-2:3,-4..5 array -=1 b1=-5 st,on:1:18446744073709551615:0.00");
    EXPECT_EQ(textOf(sample({"g", {}})), "b1=-5 st,on:1:18446744073709551615:0.00");
    EXPECT_EQ(textOf(sample({{}, "s"})), "h,-1-2:3,-4..5 st,on:1:18446744073709551615:0.00");
    EXPECT_EQ(textOf(sample({"g", "s"})), "st,on:1:18446744073709551615:0.00");
    EXPECT_EQ(sample()->front()->unitLabel, "ms");
    EXPECT_EQ(sample()->front()->driverName, "d");
    EXPECT_THAT(log.take(), IsEmpty());
}

TEST_F(LinuxChanlogTest, TheFileOnThePageIsGood) {
    std::ostringstream page;
    page << std::ifstream(EXAMPLES_DIR "/../docs/driver-statistics.md").rdbuf();
    const std::string text = page.str();
    const std::size_t start = text.find("\n[{");
    publish("a.json", text.substr(start, text.find("```", start) - start));
    EXPECT_EQ(now(), "buffers_played=47 engine state,idle:1:180:0.00,running:1:70:0.00 "
                     "wake up time,0-100:9,100-400:1,12..381");
    EXPECT_THAT(log.take(), IsEmpty());
}

TEST_F(LinuxChanlogTest, ASampleIsOneReadingAndSeesEveryChange) {
    publish("a.json", "[" + simple("a", "0") + "]");
    auto subscription =
        std::get<std::unique_ptr<ChanlogSubscription>>(facility.subscribe({"g", {}}, sample()));
    for (int i = 1; i < 10; ++i) {
        // Written in place within one tick of the kernel's clock, and of the same size.
        publish("a.json", "[" + simple("a", std::to_string(i)) + "]");
        const auto moment = facility.beginSampling();
        EXPECT_EQ(textOf(std::get<ChanlogChannels>(moment->sample(*subscription))), formatted("a={}", i));
        publish("a.json", "[" + simple("a", "0") + "]");
        EXPECT_EQ(textOf(std::get<ChanlogChannels>(moment->sample(*subscription))), formatted("a={}", i));
    }
    EXPECT_EQ(textOf(subscription->subscribedChannels()), "a=0");

    std::this_thread::sleep_for(2 * ChanlogFiles::kCertainAge);
    (void)sample();
    const ChanlogChannels old = facility.readAll();
    EXPECT_EQ(facility.readAll(), old) << "a file that is certainly the same is not read again";
    publish("b.json", "[" + simple("b", "1") + "]");
    EXPECT_EQ(now(), "a=0 b=1");
    std::filesystem::remove(root.path("chanlog/a.json"));
    EXPECT_EQ(now(), "b=1");
    EXPECT_THAT(log.take(), IsEmpty());
}

TEST_F(LinuxChanlogTest, RubbishCostsItsOwnFileAloneAndIsToldOnce) {
    publish("good.json", "[" + simple("good", "1") + "]");
    const std::pair<std::string, const char*> cases[] = {
        {"[" + simple("a", "1") + ", {\"gro", "line 1, column "},
        {"{}", "line 1, column 1: not an array"},
        {std::string(ChanlogFiles::kMaximumFileSize + 1, ' '), "File too large"},
    };
    for (const auto& [text, fault] : cases) {
        publish("bad.json", text);
        EXPECT_EQ(now(), "good=1");
        EXPECT_EQ(now(), "good=1");
        EXPECT_THAT(log.take(), ElementsAre(AllOf(HasSubstr("/bad.json: "), HasSubstr(fault))));
    }
    publish("bad.json", "[" + simple("well", "1") + "]");
    EXPECT_EQ(now(), "well=1 good=1");
}

TEST_F(LinuxChanlogTest, ABadChannelIsLeftOutAlone) {
    const std::string state = R"({"format": "state", "states": [)";
    const std::string histogram = R"({"format": "histogram", "min": 1, "buckets": [)";
    std::string many = R"({"name": "on", "transitions": 0, "residency": 0})";
    for (std::size_t i = 0; i < kMaximumChanlogElements; ++i) {
        many += R"(, {"name": "on", "transitions": 0, "residency": 0})";
    }
    const std::pair<std::string, const char*> cases[] = {
        {"7", "it is no object"},
        {"{}", "format is missing"},
        {R"({"format": "other"})", "format \"other\" is not known"},
        {R"({"format": "simple"})", "value is missing"},
        {simple("v", "1.0"), "value is no signed 64-bit integer"},
        {simple("v", "9223372036854775808"), "value is no signed 64-bit integer"},
        {simple("v", "1", R"(, "driver": 5)"), "driver is no text"},
        {simple(std::string(kMaximumChanlogNameLength + 1, 'n'), "1"), "name is longer than 256 bytes"},
        {R"({"format": "state", "states": {}})", "states is no array"},
        {state + "5]}", "states 0: it is no object"},
        {state + R"({"name": "a", "transitions": 1, "residency": -1}]})",
         "states 0: residency is no unsigned 64-bit integer"},
        {state + many + "]}", "states has more than 256 elements"},
        {histogram + R"({"lower": 1, "upper": 2, "hits": -1}]})", "buckets 0: hits is negative"},
        {histogram + "]}", "max is missing"},
    };
    for (const auto& [channel, fault] : cases) {
        publish("a.json", "[]");
        EXPECT_EQ(now(), "");
        for (const char* value : {"1", "2"}) {
            publish("a.json",
                    "[" + simple("good", value) + ", " + channel + ", " + simple("last", "1") + "]");
            EXPECT_EQ(now(), formatted("good={} last=1", value)) << channel;
        }
        EXPECT_THAT(log.take(),
                    ElementsAre(HasSubstr(formatted("/a.json: channel 1: {}; it is left out", fault))))
            << "a publisher that goes on so is told of once";
    }
}

TEST_F(LinuxChanlogTest, LimitsHoldAndAreToldOnce) {
    std::string channels = simple("c0", "1");
    for (std::size_t i = 1; i < LinuxChanlogFacility::kMaximumChannels; ++i) {
        channels += "," + simple("c" + std::to_string(i), "1");
    }
    constexpr std::size_t kMost = LinuxChanlogFacility::kMaximumChannels;
    publish("a.json", "[" + channels + "]");
    EXPECT_EQ(sample()->size(), kMost);
    EXPECT_THAT(log.take(), IsEmpty());
    publish("b.json", "[" + simple("one more", "1") + "]");
    EXPECT_EQ(sample()->size(), kMost);
    EXPECT_EQ(sample()->size(), kMost);
    EXPECT_THAT(log.take(), ElementsAre(HasSubstr("4097 driver statistics channels; those beyond 4096")));

    publish("a.json", "[" + simple("first", "1") + ", " + simple("first", "2") + "]");
    publish("b.json", "[" + simple("first", "3") + ", " + simple("first", "4", R"(, "driver": "")") + "]");
    EXPECT_EQ(now(), "first=1 first=4") << "one that comes again does not count";

    for (std::size_t i = 2; i <= ChanlogFiles::kMaximumFiles; ++i) {
        publish(formatted("c{}.json", 1000 + i), i < ChanlogFiles::kMaximumFiles ? "[]" : "rubbish");
    }
    EXPECT_EQ(now(), "first=1 first=4");
    EXPECT_EQ(now(), "first=1 first=4");
    EXPECT_THAT(log.take(), ElementsAre(HasSubstr("/c1256.json: more than 256 files")));
    for (int i = 2; i < 6; ++i) {
        publish(formatted("c{}.json", 1000 + i), "[]" + std::string(ChanlogFiles::kMaximumFileSize - 2, ' '));
    }
    EXPECT_EQ(now(), "first=1 first=4");
    EXPECT_THAT(log.take(),
                ElementsAre(HasSubstr("/c1005.json: more than 256 files or 4194304 bytes in all")));
}

TEST_F(LinuxChanlogTest, ADirectoryThatIsFullOfOtherThingsIsToldOf) {
    publish("a.json", "[" + simple("a", "1") + "]");
    for (std::size_t i = 3; i < ChanlogFiles::kMaximumEntries; ++i) { // besides ".", ".." and the file
        publish(formatted("other{}", i), "");
    }
    EXPECT_EQ(now(), "a=1");
    publish("one more", "");
    EXPECT_EQ(now(), "");
    EXPECT_EQ(now(), "");
    EXPECT_THAT(log.take(), ElementsAre(HasSubstr("/chanlog: more than 4096 entries; no driver statistics")));
}

TEST_F(LinuxChanlogTest, DifferencesAreGains) {
    const auto states = [](const std::string& list) {
        return R"([{"name": "s", "format": "state", "states": [)" + list + "]}]";
    };
    const auto state = [](const char* name, const char* transitions, const char* residency) {
        return formatted(R"({"name": "{}", "transitions": {}, "residency": {}})", name, transitions,
                         residency);
    };
    const auto histogram = [](const std::string& buckets, int minimum = 1) {
        return formatted(R"([{"name": "h", "format": "histogram", "min": {}, "max": 9, "buckets": [{}]}])",
                         minimum, buckets);
    };
    const auto bucket = [](int lower, int upper, int hits) {
        return formatted(R"({"lower": {}, "upper": {}, "hits": {}})", lower, upper, hits);
    };
    const struct {
        std::string earlier, later, gained;
        const char* trouble = nullptr;
    } cases[] = {
        {"[" + simple("a", "5") + "," + simple("b", "1") + "," + simple("c", "1") + "]",
         "[" + simple("new", "9") + "," + simple("c", "-1") + "," + simple("a", "5") + "]", "c=-2 a=0"},
        {"[" + simple("a", "5") + "]", "[" + simple("a", "9", R"(, "subgroup": "s")") + "]", ""},
        {"[" + simple("a", "-9223372036854775808") + "]", "[" + simple("a", "-1") + "]",
         "a=9223372036854775807"},
        {"[" + simple("a", "-9223372036854775808") + "," + simple("b", "1") + "]",
         "[" + simple("a", "0") + "," + simple("b", "3") + "]", "b=2", "the value has moved by more"},
        {states(state("on", "1", "10") + "," + state("off", "1", "10") + "," + state("gone", "1", "10")),
         states(state("off", "3", "13") + "," + state("new", "1", "70") + "," + state("on", "1", "11")),
         "s,off:2:3:0.75,on:0:1:0.25"},
        {states(state("on", "1", "10")), states(state("on", "1", "10")), "s,on:0:0:0.00"},
        {states(state("on", "0", "0")), states(state("on", "0", "18446744073709551615")),
         "s,on:0:18446744073709551615:1.00"},
        {states(state("on", "2", "10")), states(state("on", "1", "11")), "", "a counter has run backwards"},
        {states(state("on", "1", "10")), states(state("on", "1", "9")), "", "a counter has run backwards"},
        {histogram(bucket(0, 5, 2) + "," + bucket(5, 9, 7)),
         histogram(bucket(5, 9, 7) + "," + bucket(0, 9, 9), 3), "h,5-9:0,3..9"},
        {histogram(bucket(0, 5, 2)), histogram(bucket(0, 5, 6)), "h,0-5:4,1..9"},
        {histogram(bucket(0, 5, 2)), histogram(bucket(0, 5, 1)), "", "run backwards"},
    };
    for (const auto& [earlierText, laterText, gained, trouble] : cases) {
        publish("a.json", earlierText);
        const ChanlogChannels earlier = sample();
        publish("a.json", laterText);
        const ChanlogChannels later = sample();
        EXPECT_EQ(difference(earlier, later), gained) << laterText;
        if (trouble == nullptr) {
            EXPECT_THAT(log.take(), IsEmpty());
            continue;
        }
        EXPECT_EQ(difference(earlier, later), gained);
        EXPECT_THAT(log.take(), ElementsAre(HasSubstr(trouble))) << "once for as long as it lasts";
        (void)difference(later, later);
        (void)difference(earlier, later);
        EXPECT_EQ(log.take().size(), 1U) << "and again after it was well";
        (void)difference(later, later);
    }
}

TEST_F(LinuxChanlogTest, PcmStreamsAreChannels) {
    constexpr const char* kRunning =
        "state: RUNNING\nowner_pid   : 10\ntrigger_time: 9.1\ntstamp      : 0.0\n"
        "delay       : -3\navail       : 512\navail_max   : 4096\n-----\n"
        "hw_ptr      : 48000\nappl_ptr    : 49000\n";
    for (const std::string stream : {"pcm0p/sub0", "pcm0p/sub1", "pcm0c/sub0", "pcm7p/sub0"}) {
        root.write("asound/card1/" + stream + "/status", "closed\n");
    }
    root.write("asound/card1/id", "PCH\n");
    root.write("asound/pcm",
               "01-00: ALC : playback 3 : x : playback 2 : capture 1\n"
               "01-07: HDMI 0 : HDMI 0 : playback 1\n01-09: gone : gone : capture 1\nrubbish\n");
    constexpr const char* kClosed = "frames=0 overruns=0 available=0 delay=0";
    EXPECT_EQ(textOf(sample({"Rx", {}})), kClosed);
    const ChanlogChannels closed = sample({"Tx", {}});
    EXPECT_EQ(textOf(closed), formatted("{} {} {}", kClosed, kClosed, kClosed));
    EXPECT_EQ(closed->at(4)->driverName, "PCH");
    EXPECT_EQ(closed->at(4)->subGroupName, "pcm0p sub1");
    EXPECT_EQ(closed->at(8)->subGroupName, "pcm7p");
    EXPECT_EQ(facility.readAll(), facility.readAll()) << "nothing has changed";

    const std::string status = "asound/card1/pcm7p/sub0/status";
    const auto stream = [this] { return sample({"Tx", "pcm7p"}); };
    root.write(status, kRunning);
    const ChanlogChannels running = stream();
    EXPECT_EQ(textOf(running), "frames=48000 overruns=0 available=512 delay=-3");
    EXPECT_EQ(difference(sample({"Tx", "pcm7p"}), closed), "frames=-48000 overruns=0 available=-512 delay=3");
    for (const auto& [text, expected] : std::vector<std::pair<std::string, std::string>>{
             {"state: XRUN\nhw_ptr      : 7\n", "frames=7 overruns=1"},
             {"state: OPEN\nhw_ptr: x\ndelay: \n", "overruns=0"},
             {"error -19\n", ""},
             {"closed\n", kClosed}}) {
        root.write(status, text);
        EXPECT_EQ(textOf(stream()), expected) << text;
    }
    std::filesystem::remove(root.path("asound/pcm"));
    EXPECT_EQ(now(), "");
    EXPECT_THAT(log.take(), IsEmpty());
    std::filesystem::create_directory(root.path("asound/pcm"));
    EXPECT_EQ(now(), "");
    EXPECT_EQ(now(), "");
    EXPECT_THAT(log.take(), ElementsAre(HasSubstr("/asound/pcm: Is a directory")));
}

} // namespace
} // namespace tamblo
