#include "base/Format.h"
#include "platform/linux/drivers/LinuxChanlogFacility.h"
#include "tests/platform/LinuxServiceSupport.h"

namespace tamblo {
namespace {

using namespace testing;

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

/// A file of simple channels of the group "g".
std::string simples(const std::vector<std::pair<std::string, int>>& channels) {
    std::string text;
    for (const auto& [name, value] : channels) {
        appendFormatted(text, R"({}{"group":"g","name":"{}","format":"simple","value":{}})",
                        text.empty() ? "[" : ",\n", name, value);
    }
    return text + "]";
}

class LinuxChanlogTest : public Test {
protected:
    void publish(const std::string& name, const std::string& text) const {
        root.write("chanlog/" + name, text);
    }
    ChanlogChannels sample(const ChanlogSelection& selection = {}) {
        return std::get<ChanlogChannels>(facility.beginSampling()->channelsOf(selection));
    }
    /// Of everything that there is.
    std::string now() { return textOf(sample()); }
    std::string difference(const ChanlogChannels& earlier, const ChanlogChannels& later) {
        return textOf(std::get<ChanlogChannels>(facility.difference(earlier, later)));
    }

    TemporaryDirectory root;
    FakeLog log;
    LinuxChanlogFacility facility{root.path("chanlog"), log, root.path("asound")};
};

TEST_F(LinuxChanlogTest, ChannelsAreReadAndSelected) {
    EXPECT_EQ(now(), "");
    EXPECT_EQ(std::get<int>(facility.difference(nullptr, sample())), ENOENT);
    publish("b.json", R"([{"group":"g","name":"b1","format":"simple","value":-5},)"
                      R"({"group":"g","subgroup":"s","name":"a2","format":"simple","value":1}])");
    publish("a.json",
            R"([{"driver":"d","subgroup":"s","name":"a1","unit":"ms","format":"simple","value":1,"x":{}},)"
            R"({"name":"array","format":"simple_array"},{"format":"simple","value":1}])");
    publish(".hidden.json", simples({{"no", 1}}));
    publish("a.json.new", simples({{"no", 1}}));
    EXPECT_EQ(now(), "a1=1 array -=1 b1=-5 a2=1");
    publish("c.json", R"([{"name":"c","format":"histogram","min":-3.0,"max":1e3,"buckets":[)"
                      R"({"lower":0.0,"upper":5,"hits":2.0}]},{"name":"s","format":"state","states":[)"
                      R"({"name":"on","transitions":4.0,"residency":18446744073709549568.0}]}])");
    EXPECT_THAT(now(), HasSubstr(" c,0-5:2,-3..1000 s,on:4:18446744073709549568:0.00"));
    publish("c.json", "[]");
    EXPECT_EQ(textOf(sample({"g", {}})), "b1=-5 a2=1");
    EXPECT_EQ(textOf(sample({{}, "s"})), "a1=1 a2=1");
    EXPECT_EQ(textOf(sample({"g", "s"})), "a2=1");
    EXPECT_EQ(sample()->front()->unitLabel, "ms");
    EXPECT_EQ(sample()->front()->driverName, "d");
    EXPECT_THAT(log.take(), IsEmpty());
}

TEST_F(LinuxChanlogTest, TheFileOnThePageIsGood) {
    const std::string text = test::contentOf(EXAMPLES_DIR "/../docs/driver-statistics.md");
    const std::size_t start = text.find("\n[{");
    publish("a.json", text.substr(start, text.find("```", start) - start));
    EXPECT_EQ(now(), "buffers_played=47 engine state,idle:1:180:0.00,running:1:70:0.00 "
                     "wake up time,0-100:9,100-400:1,12..381");
    EXPECT_THAT(log.take(), IsEmpty());
}

TEST_F(LinuxChanlogTest, ASampleIsOneReadingAndSeesEveryChange) {
    publish("a.json", simples({{"a", 0}}));
    auto subscription =
        std::get<std::unique_ptr<ChanlogSubscription>>(facility.subscribe({"g", {}}, sample()));
    for (int i = 1; i < 10; ++i) {
        // Written in place within one tick of the kernel's clock, and of the same size.
        publish("a.json", simples({{"a", i}}));
        const auto moment = facility.beginSampling();
        EXPECT_EQ(textOf(std::get<ChanlogChannels>(moment->sample(*subscription))), formatted("a={}", i));
        publish("a.json", simples({{"a", 0}}));
        EXPECT_EQ(textOf(std::get<ChanlogChannels>(moment->sample(*subscription))), formatted("a={}", i));
    }
    EXPECT_EQ(textOf(subscription->subscribedChannels()), "a=0");
    publish("b.json", simples({{"b", 1}}));
    EXPECT_EQ(now(), "a=0 b=1");
    std::filesystem::remove(root.path("chanlog/a.json"));
    EXPECT_EQ(now(), "b=1");
}

TEST_F(LinuxChanlogTest, RubbishCostsItsOwnFileOrChannelAloneAndIsToldOnce) {
    const std::string state = R"({"format":"state","states":[)";
    const std::string histogram = R"({"format":"histogram","min":1,"buckets":[)";
    const std::pair<std::string, std::string> cases[] = {
        {"7", "it is no object"},
        {R"({"format":"other"})", "format \"other\" is not known"},
        {R"({"format":"simple","value":3.5})", "value is no signed 64-bit integer"},
        {R"({"format":"simple","value":1,"name":")" + std::string(257, 'n') + R"("})",
         "name is longer than 256 bytes"},
        {state + "5]}", "states 0: it is no object"},
        {state + R"({"name":"a","transitions":1,"residency":-1}]})",
         "states 0: residency is no unsigned 64-bit integer"},
        {histogram + R"({"lower":1,"upper":2,"hits":-1}]})", "buckets 0: hits is negative"},
        {histogram + "]}", "max is missing"},
    };
    publish("good.json", simples({{"good", 1}}));
    for (const auto& [channel, reason] : cases) {
        publish("a.json", "[]");
        EXPECT_EQ(now(), "good=1");
        for (const std::string value : {"1", "2"}) {
            publish("a.json", R"([{"name":"a","format":"simple","value":)" + value + "}," + channel +
                                  R"(,{"name":"b","format":"simple","value":1}])");
            EXPECT_EQ(now(), formatted("a={} b=1 good=1", value)) << channel;
        }
        EXPECT_THAT(log.take(), ElementsAre(HasSubstr("/a.json: channel 1: " + reason + "; it is left out")));
    }
    for (const auto& [text, reason] :
         {std::pair<std::string, const char*>("[{}, {\"gro", "line 1, column "),
          {std::string(ChanlogFiles::kMaximumFileSize + 1, ' '), "File too large"}}) {
        publish("a.json", text);
        EXPECT_EQ(now(), "good=1");
        EXPECT_EQ(now(), "good=1");
        EXPECT_THAT(log.take(), ElementsAre(AllOf(HasSubstr("/a.json: "), HasSubstr(reason))));
    }
}

TEST_F(LinuxChanlogTest, LimitsHoldAndAreToldOnce) {
    std::vector<std::pair<std::string, int>> most;
    for (std::size_t i = 0; i < LinuxChanlogFacility::kMaximumChannels; ++i) {
        most.emplace_back("c" + std::to_string(i), 1);
    }
    publish("a.json", simples(most));
    EXPECT_EQ(sample()->size(), LinuxChanlogFacility::kMaximumChannels);
    EXPECT_THAT(log.take(), IsEmpty());
    publish("b.json", simples({{"more", 1}}));
    EXPECT_EQ(sample()->size(), LinuxChanlogFacility::kMaximumChannels);
    EXPECT_THAT(log.take(), ElementsAre(HasSubstr("4097 driver statistics channels; those beyond 4096")));

    publish("a.json", simples({{"first", 1}, {"first", 2}}));
    publish("b.json", R"([{"group":"g","name":"first","format":"simple","value":3},)"
                      R"({"group":"g","name":"first","format":"simple","value":4,"driver":""}])");
    EXPECT_EQ(now(), "first=1 first=4") << "one that comes again does not count";

    for (std::size_t i = 2; i <= ChanlogFiles::kMaximumFiles; ++i) {
        publish(formatted("c{}.json", 1000 + i), i < ChanlogFiles::kMaximumFiles ? "[]" : "rubbish");
    }
    EXPECT_EQ(now(), "first=1 first=4");
    EXPECT_THAT(log.take(), ElementsAre(HasSubstr("/c1256.json: more than 256 files")));
}

TEST_F(LinuxChanlogTest, WhatCannotBeReadCountsAsItWas) {
    publish("a.json", simples({{"a", 1}}));
    EXPECT_EQ(now(), "a=1");
    const std::string path = root.path("chanlog/a.json");
    std::filesystem::remove(path);
    std::filesystem::create_symlink("a.json", path);
    std::filesystem::rename(root.path("chanlog"), root.path("away"));
    std::filesystem::create_symlink("chanlog", root.path("chanlog"));
    EXPECT_EQ(now(), "a=1");
    EXPECT_EQ(now(), "a=1");
    EXPECT_THAT(log.take(), ElementsAre(HasSubstr("symbolic links; what was read there before counts")));
}

/// A histogram where there are buckets, else a simple channel, which may have states, too.
std::shared_ptr<ChanlogChannel> channelOf(const char* name, std::int64_t value,
                                          std::vector<ChanlogState> states = {},
                                          std::vector<ChanlogBucket> buckets = {}) {
    auto channel = std::make_shared<ChanlogChannel>();
    channel->channelName = name;
    channel->format = buckets.empty() ? ChanlogFormat::simple : ChanlogFormat::histogram;
    channel->value = channel->minimum = channel->maximum = value;
    channel->states = std::move(states);
    channel->buckets = std::move(buckets);
    return channel;
}

TEST_F(LinuxChanlogTest, DifferencesAreGains) {
    const auto a = channelOf("a", 5), elsewhere = channelOf("a", 9), least = channelOf("a", INT64_MIN);
    elsewhere->subGroupName = "s";
    const auto on = channelOf("s", 0, {{"on", 1, 10}}), hit = channelOf("h", 1, {}, {{0, 5, 0, 2}});
    const struct {
        std::vector<ChanlogChannelRef> earlier, later;
        const char *gained, *trouble = "";
    } cases[] = {
        {{a, channelOf("b", 1), channelOf("c", 1)}, {channelOf("new", 9), channelOf("c", -1), a}, "c=-2 a=0"},
        {{a}, {elsewhere}, ""},
        {{least}, {channelOf("a", -1)}, "a=9223372036854775807"},
        {{least, on}, {channelOf("a", 0), on}, "s=0,on:0:0:0.00", "the value has moved by more"},
        {{channelOf("s", 0, {{"on", 1, 10}, {"off", 1, 10}, {"gone", 1, 10}})},
         {channelOf("s", 0, {{"off", 3, 13}, {"new", 1, 70}, {"on", 1, 11}})},
         "s=0,off:2:3:0.75,on:0:1:0.25"},
        {{channelOf("s", 0, {{"on", 0, 0}})},
         {channelOf("s", 0, {{"on", 0, UINT64_MAX}})},
         "s=0,on:0:18446744073709551615:1.00"},
        {{on}, {channelOf("s", 0, {{"on", 0, 11}})}, "s=0", "a counter has run backwards"},
        {{channelOf("s", 0, {{"on", 1, 10}, {"off", 1, 10}})},
         {channelOf("s", 0, {{"on", 1, 9}, {"off", 2, 14}})},
         "s=0,off:1:4:1.00",
         "a counter has run backwards"},
        {{channelOf("h", 1, {}, {{0, 5, 0, 2}, {5, 9, 0, 7}})},
         {channelOf("h", 3, {}, {{5, 9, 0, 8}, {0, 9, 0, 9}})},
         "h,5-9:1,3..3"},
        {{hit}, {channelOf("h", 1, {}, {{0, 5, 0, 1}})}, "h,1..1", "run backwards"},
    };
    for (const auto& [earlierList, laterList, gained, trouble] : cases) {
        const auto earlier = std::make_shared<const std::vector<ChanlogChannelRef>>(earlierList);
        const auto later = std::make_shared<const std::vector<ChanlogChannelRef>>(laterList);
        EXPECT_EQ(difference(earlier, later), gained);
        EXPECT_EQ(difference(earlier, later), gained);
        EXPECT_THAT(log.take(), AllOf(SizeIs(*trouble != '\0' ? 1 : 0), Each(HasSubstr(trouble))))
            << "once for as long as it lasts";
        (void)difference(later, later);
    }
}

TEST_F(LinuxChanlogTest, PcmStreamsAreChannels) {
    for (const std::string stream : {"pcm0p/sub0", "pcm0p/sub1", "pcm0c/sub0", "pcm7p/sub0"}) {
        root.write("asound/card1/" + stream + "/status", "closed\n");
    }
    root.write("asound/card1/id", "PCH\n");
    root.write("asound/pcm",
               "01-00: ALC : playback 3 : x : playback 2 : capture 1\n"
               "01-07: HDMI 0 : HDMI 0 : playback 1\n01-09: gone : gone : capture 1\nrubbish\n");
    const std::string closed = "frames=0 overruns=0 available=0 delay=0";
    EXPECT_EQ(textOf(sample({"Rx", {}})), closed);
    EXPECT_EQ(textOf(sample({"Tx", {}})), closed + " " + closed + " " + closed);
    EXPECT_EQ(textOf(sample({"Tx", "pcm0p sub1"})), closed);
    EXPECT_EQ(sample()->front()->driverName, "PCH");
    EXPECT_EQ(facility.readAll(), facility.readAll()) << "nothing has changed";
    const std::pair<std::string, std::string> cases[] = {
        {"state: RUNNING\nowner_pid   : 10\ntstamp      : 0.0\ndelay       : -3\navail       : 512\n"
         "avail_max   : 4096\n-----\nhw_ptr      : 48000\nappl_ptr    : 49000\n",
         "frames=48000 overruns=0 available=512 delay=-3"},
        {"state: XRUN\nhw_ptr      : 7\n", "frames=7 overruns=1"},
        {"error -19\nhw_ptr: x\n", ""},
        {"closed\n", closed},
    };
    for (const auto& [status, expected] : cases) {
        root.write("asound/card1/pcm7p/sub0/status", status);
        EXPECT_EQ(textOf(sample({"Tx", "pcm7p"})), expected) << status;
    }
    std::filesystem::remove(root.path("asound/pcm"));
    EXPECT_EQ(now(), "");
    EXPECT_THAT(log.take(), IsEmpty());
}

} // namespace
} // namespace tamblo
