#include "tests/fakes/FakePlatform.h"
#include "tests/fakes/Messages.h"
#include "util/InternalBuild.h"
#include "util/LogCategories.h"
#include "workers/producers/ZRReportingSessionInputMessagesWorker.h"
#include "workers/producers/ZRReportingSessionKaleenMessagesWorker.h"
#include "workers/producers/ZRReportingSessionVolumeMessagesWorker.h"

#include <gmock/gmock.h>

#include <algorithm>
#include <cmath>
#include <limits>
#include <string>
#include <utility>
#include <vector>

namespace tamblo {
namespace {

using testing::ElementsAre;
using testing::IsEmpty;
using Payloads = std::vector<Dictionary>;
using Lines = std::vector<std::string>;

constexpr std::chrono::duration<double> kMinimum{5};

Dictionary at(const Value& time, Dictionary payload) {
    payload.set("zrreporting_timestamp", time);
    return payload;
}
Dictionary at(double time, Dictionary payload) {
    return at(Value(time), std::move(payload));
}

struct Case {
    const char* what;
    Payloads messages;
    Lines expected;
    Dictionary previous = {};
};

class ProducersTest : public testing::Test {
protected:
    std::shared_ptr<ZRReportingSession> sessionWith(const Dictionary& previous) {
        auto session = ZRReportingSession::initWithID(5, {1});
        session->addPreviousValues(previous);
        return session;
    }
    /// What a worker derives of each row's messages; `derive` has it do so.
    template <typename Derive>
    void expectSegments(const std::vector<Case>& cases, std::initializer_list<std::string_view> keys,
                        const Derive& derive) {
        for (const Case& row : cases) {
            Lines found;
            for (const MessageRef& message : derive(sessionWith(row.previous), messagesOf(row.messages))) {
                found.push_back(shown(message->payload(), keys));
            }
            EXPECT_EQ(found, row.expected) << row.what;
        }
    }

    FakePlatform device{LogLevel::standard};
    const Value process = "com.example.player";
    const Dictionary playing{{"session_output_running", true}, {"QVSessionVolume", 0.5}};
    /// What opens a segment in every walk.
    const Dictionary allRunning{{"session_output_running", true},
                                {"session_input_running", true},
                                {"kaleen_session", 1},
                                {"QVSessionVolume", 0.5},
                                {"active_devices", "A"}};
};

TEST_F(ProducersTest, VolumeSegments) {
    const std::vector<Case> cases{
        {"a volume change and the end; exactly the minimum is too short",
         {at(10, playing), at(20, {{"QVSessionVolume", 0.8}}), at(25, {{"session_output_running", false}})},
         {"10.0 0.5 \"unknown\" false 1 1"}},
        {"just above the minimum, after a stretch that is too short",
         {at(10, playing), at(13, {{"QVSessionVolume", 0.8}}), at(18.5, {{"session_output_running", false}})},
         {"5.5 0.8 \"unknown\" false 1 1"}},
        {"the session's length ends a segment, and playing with it",
         {at(0, playing), at(6, {{"session_duration", 6.0}}), at(20, {{"QVSessionVolume", 1}}),
          at(30, {{"session_output_running", false}})},
         {"6.0 0.5 \"unknown\" false 1 1"}},
        {"a length with output still said to run ends one segment and begins another",
         {at(0, playing), at(10, {{"session_duration", 10}, {"session_output_running", true}}),
          at(30, {{"session_output_running", false}})},
         {"10.0 0.5 \"unknown\" false 1 2", "20.0 0.5 \"unknown\" false 2 2"}},
        {"a format change while nothing plays",
         {at(0, {{"session_selected_format", "A"}, {"QVSessionVolume", 1}}),
          at(9, {{"session_selected_format", "B"}}), at(20, {{"session_duration", 20}})},
         {}},
        {"each watched setting ends one; carried settings alone do not, nor what is said again",
         {at(0, playing), at(10, {{"mFormatID", "x"}, {"mChannelsPerFrame", 2}}),
          at(15, {{"ringerstate", 0}, {"spatializationEnabled", 0}, {"session_selected_format", "unknown"}}),
          at(20, {{"ringerstate", true}}), at(30, {{"spatializationEnabled", true}}),
          at(40, {{"active_devices", "D"}}), at(50, {{"active_devices", "E"}}),
          at(60, {{"spatial-audio-accessory-feature", true}}), at(70, {{"session_selected_format", "S"}}),
          at(76, {{"session_output_running", false}})},
         {"20.0 0.5 \"unknown\" 0 1 6", "10.0 0.5 \"unknown\" true 2 6", "10.0 0.5 \"unknown\" true 3 6",
          "10.0 0.5 \"D\" true 4 6", "20.0 0.5 \"E\" true 5 6", "6.0 0.5 \"E\" true 6 6"}},
        {"two spatial settings less than five seconds apart are one change, at the time of the second",
         {at(0, playing), at(10, {{"spatializationEnabled", true}}),
          at(14.5, {{"spatial-audio-accessory-feature", true}}), at(30, {{"spatializationEnabled", false}}),
          at(35, {{"spatial-audio-accessory-feature", false}}), at(50, {{"session_output_running", false}})},
         {"14.5 0.5 \"unknown\" false 1 3", "15.5 0.5 \"unknown\" false 2 3",
          "20.0 0.5 \"unknown\" false 3 3"}},
        {"no volume is known; the first one that is ends nothing",
         {at(0, {{"session_output_running", true}}), at(10, {{"session_output_running", false}}),
          at(20, {{"session_output_running", true}}), at(30, {{"QVSessionVolume", 1}}),
          at(40, {{"session_output_running", false}})},
         {"20.0 1 \"unknown\" false 1 1"}},
        {"an end or a start without a timestamp",
         {playing,
          at(20, {{"session_output_running", false}}),
          at(-20, {{"session_output_running", true}}),
          {{"session_output_running", false}}},
         {}},
        {"a session that begins already playing ends nothing until output is said to run anew",
         {at(10, {{"QVSessionVolume", 0.9}}), at(20, {{"session_duration", 20}})},
         {},
         at(1, playing)},
        {"then the segment begins where it was said",
         {at(10, {{"QVSessionVolume", 0.9}}), at(20, {{"session_output_running", true}}),
          at(30, {{"session_duration", 20}})},
         {"10.0 0.9 \"Speaker\" false 1 1"},
         at(1, {{"session_output_running", true}, {"QVSessionVolume", 0.5}, {"active_devices", "Speaker"}})},
        {"output that is said twice to run goes on; timestamps that run backwards make nothing",
         {at(50, playing), at(60, {{"session_output_running", true}}),
          at(70, {{"session_output_running", false}}), at(80, {{"session_output_running", true}}),
          at(40, {{"session_output_running", false}})},
         {"20.0 0.5 \"unknown\" false 1 1"}},
    };
    expectSegments(cases,
                   {"play_seconds", "QVSessionVolume", "active_devices", "ringerstate", "msgidx", "msgcnt"},
                   [this](const auto& session, const auto& messages) {
                       const ZRReportingSessionVolumeMessagesWorker worker(session);
                       EXPECT_THAT(worker.createVolumeMessages(messages, nullptr, {}), IsEmpty());
                       return worker.createVolumeMessages(messages, &process, kMinimum);
                   });
}

TEST_F(ProducersTest, AVolumeSummaryHasExactlyTheseKeys) {
    const auto derived =
        ZRReportingSessionVolumeMessagesWorker(sessionWith({}))
            .createVolumeMessages(
                messagesOf({at(0, playing), at(10, {{"session_duration", 75}, {"other", 1}})}), &process, {});
    ASSERT_EQ(derived.size(), 1U);
    const Dictionary expected{{"session_selected_format", "unknown"},
                              {"mFormatID", "unknown"},
                              {"active_devices", "unknown"},
                              {"HostApplicationDisplayID", "com.example.player"},
                              {"QVSessionVolume", 0.5},
                              {"QVSessionVolumeBucketed", "0.5"},
                              {"play_seconds", 10.0F},
                              {"spatial-audio-accessory-feature", false},
                              {"spatializationEnabled", false},
                              {"ringerstate", false},
                              {"mChannelsPerFrame", -1},
                              {"play_secondsBucketed", "10"},
                              {"msgidx", 1},
                              {"msgcnt", 1}};
    EXPECT_EQ(derived[0]->payload(), expected);
    EXPECT_EQ(derived[0]->payload().find("play_seconds")->kind(), Value::Kind::singleFloat);
    EXPECT_EQ(derived[0]->category(), AudioEventKindVolume);
    EXPECT_EQ(derived[0]->type(), AudioEventTypeSummary);
}

TEST_F(ProducersTest, LogsHowItCutsTheTime) {
    const Payloads payloads{
        at(10, allRunning), at(20.5, {{"active_devices", "B"}}), {{"session_duration", 1}}};
    const auto session = sessionWith({});
    device.log.setThreshold(LogLevel::debug);
    forgetLogThresholds();
    (void)ZRReportingSessionVolumeMessagesWorker(session).createVolumeMessages(messagesOf(payloads), &process,
                                                                               {});
    (void)ZRReportingSessionInputMessagesWorker(session).createInputMessages(messagesOf(payloads), &process,
                                                                             {});
    (void)ZRReportingSessionKaleenMessagesWorker(session).createKaleenMessages(messagesOf(payloads), {});
    Lines texts = device.log.texts();
    ASSERT_GT(texts.size(), 3U);
    EXPECT_EQ(texts[3], "playingTime { func=createVolumeMessages, playingTime=-20.500000, "
                        "zrTimestamp=(null), zrTimestamp_double=0.000000, startZrTimestamp=20.5, "
                        "startZrTimestamp_double=20.500000 }");
    for (std::string& text : texts) {
        text.resize(std::min(text.size(), text.find(", zrTimestamp=")));
    }
    EXPECT_THAT(
        texts,
        ElementsAre("entering createVolumeMessages createVolumeMessages",
                    "playingTime { func=createVolumeMessages, playingTime=10.500000",
                    "added volume message { func=createVolumeMessages, action=add, count=1 }",
                    "playingTime { func=createVolumeMessages, playingTime=-20.500000",
                    "skipped volume message, too short { func=createVolumeMessages, action=skip, count=1 }",
                    "entering createInputMessages createInputMessages",
                    "runningTime { func=createInputMessages, runningTime=10.500000",
                    "added input message { func=createInputMessages, action=add, count=1 }",
                    "runningTime { func=createInputMessages, runningTime=-20.500000",
                    "skipped input message, too short { func=createInputMessages, action=skip, count=1 }",
                    "returning input messages { func=createInputMessages, action=return, count=1 }",
                    "entering createKaleenMessages createKaleenMessages",
                    "playingTime { func=createKaleenMessages, playingTime=10.500000",
                    "added kaleen message { func=createKaleenMessages, action=add, count=1 }",
                    "playingTime { func=createKaleenMessages, playingTime=-20.500000",
                    "skipped kaleen message, too short or not actually an kaleen session { "
                    "func=createKaleenMessages, action=skip, count=1 }"));
}

TEST_F(ProducersTest, InputSegments) {
    const Dictionary running{{"session_input_running", true}, {"active_devices", "A"}};
    const std::vector<Case> cases{
        {"a device change and the end; exactly the minimum is too short",
         {at(0, running), at(10, {{"active_devices", "B"}}), at(15, {{"session_duration", 15}})},
         {"10.0 \"A\" 1 1"}},
        {"vocoders: sorted, of those that run while input does, each segment its own, its last too",
         {at(-5, {{"vp_config_primary_vocoder", "x"}, {"vp_config_primary_vocoderFs", "1"}}), at(0, running),
          at(1, {{"vp_config_primary_vocoder", "b"}, {"vp_config_primary_vocoderFs", "1"}}),
          at(2, {{"vp_config_primary_vocoder", "a"}, {"vp_config_primary_vocoderFs", "2"}}),
          at(3, {{"vp_config_primary_vocoder", "none"}, {"vp_config_primary_vocoderFs", "0.0"}}),
          at(4, {{"vp_config_primary_vocoder", "n"}, {"vp_config_primary_vocoderFs", 16000}}),
          at(10, {{"active_devices", "B"},
                  {"vp_config_primary_vocoder", "e"},
                  {"vp_config_primary_vocoderFs", "0"}}),
          at(20, {{"session_input_running", false}, {"vp_config_primary_vocoder", "y"}})},
         {"10.0 \"A\" \"a:2,b:1,e:0,n:16000\" 1 2", "10.0 \"B\" 2 2"}},
        {"the vocoders of a stretch that is too short go to the next",
         {at(0, running), at(1, {{"vp_config_primary_vocoder", "v"}}), at(2, {{"active_devices", "B"}}),
          at(20, {{"session_input_running", false}})},
         {"18.0 \"B\" \"v:(null)\" 1 1"}},
        {"input that was running before opens no segment, nor when it is said again; the next change does",
         {at(10, {{"active_devices", "B"}}), at(16, {{"session_input_running", true}}),
          at(30, {{"active_devices", "C"}}), at(40, {{"session_duration", 12}})},
         {"10.0 \"C\" 1 1"},
         at(0, running)},
        {"a length with input still said to run ends one segment and begins another; alone it ends input",
         {at(0, running), at(10, {{"session_duration", 10}, {"session_input_running", true}}),
          at(30, {{"session_input_running", false}}), at(50, {{"session_input_running", true}}),
          at(60, {{"session_duration", 10}}), at(70, {{"active_devices", "B"}}),
          at(80, {{"session_input_running", false}})},
         {"10.0 \"A\" 1 3", "20.0 \"A\" 2 3", "10.0 \"A\" 3 3"}},
        {"spatial settings less than two seconds apart are one message, at the time of the second",
         {at(0, running), at(10, {{"spatializationEnabled", true}, {"active_devices", "B"}}),
          at(11.5, {{"spatial-audio-accessory-feature", true}}),
          at(20, {{"spatializationEnabled", false}, {"active_devices", "C"}}),
          at(22, {{"spatial-audio-accessory-feature", false}}), at(40, {{"session_input_running", false}})},
         {"11.5 \"A\" 1 3", "8.5 \"B\" 2 3", "20.0 \"C\" 3 3"}},
        {"a start without a timestamp", {running, at(20, {{"session_input_running", false}})}, {}},
    };
    expectSegments(cases, {"inputrunning_seconds", "active_devices", "vocoders", "msgidx", "msgcnt"},
                   [this](const auto& owner, const auto& messages) {
                       const ZRReportingSessionInputMessagesWorker worker(owner);
                       EXPECT_THAT(worker.createInputMessages(messages, nullptr, {}), IsEmpty());
                       return worker.createInputMessages(messages, &process, kMinimum);
                   });
    const auto session = sessionWith({{"vp_config_input_port", "Mic"}});
    const ZRReportingSessionInputMessagesWorker worker(session);
    const auto derived = worker.createInputMessages(
        messagesOf({at(0, running), at(7, {{"session_input_running", false}})}), &process, {});
    ASSERT_EQ(derived.size(), 1U);
    EXPECT_EQ(derived[0]->category(), AudioEventKindInput);
    EXPECT_EQ(derived[0]->payload(), (Dictionary{{"HostApplicationDisplayID", process},
                                                 {"inputrunning_seconds", 7.0F},
                                                 {"inputrunning_secondsBucketed", "5"},
                                                 {"msgidx", 1},
                                                 {"vp_config_operation_mode", "unknown"},
                                                 {"vp_config_input_port", "Mic"},
                                                 {"active_devices", "A"},
                                                 {"msgcnt", 1}}));
}

TEST_F(ProducersTest, GroupSessionSegments) {
    const Dictionary inGroup{{"session_output_running", true}, {"kaleen_session", 1}, {"mFormatID", "F1"}};
    const std::vector<Case> cases{
        {"a format change and the end",
         {at(0, inGroup), at(30, {{"mFormatID", "F2"}}), at(40, {{"session_duration", 40}})},
         {"30.0 \"F1\" -1 \"unknown\" 1 2", "10.0 \"F2\" -1 \"unknown\" 2 2"}},
        {"never in a group, or in none that counts",
         {at(0, {{"session_output_running", true}, {"kaleen_session", 0}}), at(10, {{"kaleen_session", 2}}),
          at(40, {{"session_duration", 40}})},
         {}},
        {"the selected format is reported and not watched; a key that only one has is no change",
         {at(0, inGroup), at(10, {{"session_selected_format", "S"}}), at(20, {{"mChannelsPerFrame", 2}}),
          at(30, {{"mChannelsPerFrame", 6}}), at(40, {{"session_output_running", false}})},
         {"30.0 \"F1\" 2 \"S\" 1 2", "10.0 \"F1\" 6 \"S\" 2 2"}},
        {"joining and leaving while output runs, as it did before; exactly the minimum is too short",
         {at(0, {{"session_output_running", true}}), at(10, {{"kaleen_session", 1}}),
          at(20, {{"kaleen_session", 0}}), at(30, {{"kaleen_session", 1}}), at(35, {{"kaleen_session", 0}}),
          at(60, {{"session_duration", 1}})},
         {"10.0 \"unknown\" -1 \"unknown\" 1 1"},
         at(-50, {{"session_output_running", true}})},
        {"a pause is left out; after the session's length both playing and the group are to be said anew",
         {at(0, inGroup), at(10, {{"session_output_running", false}}),
          at(100, {{"session_output_running", true}}),
          at(110, {{"session_duration", 1}, {"session_output_running", true}}),
          at(120, {{"session_output_running", true}}), at(130, {{"mFormatID", "F2"}}),
          at(140, {{"kaleen_session", 1}}), at(150, {{"session_duration", 1}})},
         {"10.0 \"F1\" -1 \"unknown\" 1 3", "10.0 \"F1\" -1 \"unknown\" 2 3",
          "10.0 \"F2\" -1 \"unknown\" 3 3"}},
        {"what was before counts from its own time",
         {at(10, {{"mFormatID", "F2"}}), at(17, {{"session_duration", 1}})},
         {"8.0 \"F1\" -1 \"unknown\" 1 2", "7.0 \"F2\" -1 \"unknown\" 2 2"},
         at(2, inGroup)},
    };
    expectSegments(
        cases,
        {"play_seconds", "mFormatID", "mChannelsPerFrame", "session_selected_format", "msgidx", "msgcnt"},
        [](const auto& session, const auto& messages) {
            return ZRReportingSessionKaleenMessagesWorker(session).createKaleenMessages(messages, kMinimum);
        });
}

TEST_F(ProducersTest, SummariesGoThroughTheSessionInOrderAndAreCounted) {
    for (const bool isInternalBuild : {false, true}) {
        SCOPED_TRACE(isInternalBuild);
        device.deviceProperties.set("InternalBuild", isInternalBuild);
        forgetInternalBuild();
        device.analyticsEvents.clear();
        device.log.clear();
        const auto session = ZRReportingSession::initWithID(7, {1});
        session->updateConfigurationWithContentsOfConfiguration({{"HostApplicationDisplayID", "player"}});
        session->start();
        const double now = secondsSince1970(device.clock.now());
        const auto send = [&](double time, Dictionary payload) {
            session->sendMessage(messageOf(at(now + time, std::move(payload))));
        };
        send(0, allRunning);
        send(3, {{"active_devices", "B"}});
        send(3.5, {{"active_devices", "exactly the minimum of every service type"}});
        send(9, {{"session_duration", 9.0}});
        session->stop();

        Lines names;
        for (const auto& event : device.analyticsEvents.events()) {
            if (event.name.starts_with("com.vandra.tamblo.") && event.name.ends_with(".Summary")) {
                names.push_back(
                    event.name.substr(18) + " " +
                    jsonText(event.payload.contains("msgidx") ? *event.payload.find("msgidx") : Value("-")));
            }
        }
        EXPECT_THAT(names, ElementsAre("Volume.Summary 1", "Volume.Summary 2", "Kaleen.Summary 1",
                                       "Kaleen.Summary 2", "Session_Generic.Summary \"-\"", "Input.Summary 1",
                                       "Input.Summary 2"));
        EXPECT_THAT(device.log.texts("sending"),
                    ElementsAre("sending volume event for reporter 7", "sending kaleen event for reporter 7",
                                "sending input summary event for reporter 7"));
        const auto summary = device.analyticsEvents.payloads("com.vandra.tamblo.Session_Generic.Summary");
        ASSERT_EQ(summary.size(), 1U);
        EXPECT_EQ(*summary[0].find("num_messages"), Value(8)) << "four of the client's, four summaries";

        const auto fresh = sessionWith({});
        const auto derived = ZRReportingSessionKaleenMessagesWorker(fresh).createKaleenMessages(
            messagesOf({at(0, {{"session_output_running", true}, {"kaleen_session", 1}}),
                        at(9, {{"session_duration", 9}})}),
            {});
        ASSERT_EQ(derived.size(), 1U);
        EXPECT_EQ(jsonText(derived[0]->payload()),
                  R"({"active_devices":"unknown","mChannelsPerFrame":-1,"mFormatID":"unknown","msgcnt":1,)"
                  R"("msgidx":1,"play_seconds":9.0,"play_secondsBucketed":"10",)"
                  R"("session_selected_format":"unknown"})");
        EXPECT_EQ(derived[0]->destinationWorkers(),
                  isInternalBuild
                      ? DestinationWorkers{}
                      : (DestinationWorkers{workerClassNamed("ZRReportingSessionEventryWorker"),
                                            workerClassNamed("ZRReportingSessionSummaryJsonFileWorker")}));
    }
}

TEST_F(ProducersTest, ASessionWithoutMessagesSendsNothing) {
    const auto session = sessionWith({});
    ZRReportingSessionVolumeMessagesWorker(session).stop();
    ZRReportingSessionKaleenMessagesWorker(session).stop();
    ZRReportingSessionInputMessagesWorker(session).stop();
    ZRReportingSessionVolumeMessagesWorker(std::weak_ptr<ZRReportingSession>()).stop();
    EXPECT_THAT(device.analyticsEvents.events(), IsEmpty());
    EXPECT_THAT(device.log.texts("sending"), IsEmpty());
}

/// Every key that a producer reads, with every value that does not belong there, in a stretch that is open:
/// the values are read by the rules for values of other kinds, and nothing breaks.
TEST_F(ProducersTest, ValuesOfTheWrongKind) {
    constexpr double kInfinity = std::numeric_limits<double>::infinity();
    const Value dictionary = Dictionary{{"a", 1}};
    const Value array = Array{1, "b"};
    const Value wrongValues[] = {"text",    "12.5 apples", "",   dictionary,       array,
                                 1e300,     -1e300,        NAN,  kInfinity,        -kInfinity,
                                 INT64_MIN, UINT64_MAX,    true, Value::date(1e9), Value::data({})};
    Dictionary start = allRunning;
    for (const std::string_view key :
         {"mChannelsPerFrame", "mFormatID", "session_selected_format", "spatializationEnabled", "ringerstate",
          "spatial-audio-accessory-feature", "vp_config_primary_vocoder", "vp_config_primary_vocoderFs"}) {
        start.set(key, "1");
    }
    Dictionary keys = at(0, start);
    keys.set("session_duration", 1);
    const auto session = sessionWith({});
    const ZRReportingSessionVolumeMessagesWorker volume(session);
    const ZRReportingSessionInputMessagesWorker input(session);
    const ZRReportingSessionKaleenMessagesWorker group(session);
    for (std::size_t i = 0; i < keys.size(); ++i) {
        for (const Value& wrong : wrongValues) {
            SCOPED_TRACE(std::string(keys.keyAt(i)) + " " + jsonText(wrong));
            Dictionary odd = at(10, {});
            odd.set(keys.keyAt(i), wrong);
            const auto messages =
                messagesOf({at(0, start), odd, at(20, odd), at(30, {{"session_duration", wrong}})});
            for (const auto& derived : {volume.createVolumeMessages(messages, &wrong, {}),
                                        input.createInputMessages(messages, &process, {}),
                                        group.createKaleenMessages(messages, {})}) {
                EXPECT_LE(derived.size(), 3U);
                for (const MessageRef& message : derived) {
                    EXPECT_EQ(*message->payload().find("msgcnt"), Value(derived.size()));
                    EXPECT_FALSE(jsonText(message->payload()).empty());
                }
            }
        }
    }
}

TEST_F(ProducersTest, WrongKindsFollowTheReadingRules) {
    const std::vector<Case> cases{
        {"texts that read as numbers and booleans",
         {at(0, {{"session_output_running", "YES"}, {"QVSessionVolume", "0.5"}}),
          at(10, {{"QVSessionVolume", 0.5}}), at(20, {{"QVSessionVolume", "0.75 loud"}}),
          at(30, {{"session_output_running", "no"}})},
         {"20.0 0.5 \"0.5\" \"15\"", "10.0 \"0.75 loud\" \"0.75\" \"10\""}},
        {"a volume that is no number repeats as itself, and beyond the table falls into the nearest class",
         {at(0, {{"session_output_running", 1}, {"QVSessionVolume", NAN}}),
          at(10, {{"QVSessionVolume", NAN}}), at(20, {{"QVSessionVolume", 7}}),
          at(30, {{"session_output_running", Dictionary{}}})},
         {"20.0 null \"1.0\" \"15\"", "10.0 7 \"1.0\" \"10\""}},
        {"a timestamp that is no number ends a segment of no length; the next begins there, at 0",
         {at(0, playing), at("soon", {{"ringerstate", true}}), at(3, {{"session_output_running", false}})},
         {"3.0 0.5 \"0.5\" \"2\""}},
        {"a day that never ends, and a length beyond single precision",
         {at(0, playing), at(1e300, {{"session_output_running", false}})},
         {"null 0.5 \"0.5\" \"86400\""}},
        {"one that is not a number makes no summary",
         {at(0, playing), at(NAN, {{"session_output_running", false}})},
         {}},
    };
    expectSegments(cases,
                   {"play_seconds", "QVSessionVolume", "QVSessionVolumeBucketed", "play_secondsBucketed"},
                   [this](const auto& session, const auto& messages) {
                       return ZRReportingSessionVolumeMessagesWorker(session).createVolumeMessages(
                           messages, &process, std::chrono::duration<double>(1));
                   });
}

} // namespace
} // namespace tamblo
