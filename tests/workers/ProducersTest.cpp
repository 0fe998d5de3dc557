#include "tests/workers/WorkerTest.h"
#include "workers/producers/ZRReportingSessionInputMessagesWorker.h"
#include "workers/producers/ZRReportingSessionKaleenMessagesWorker.h"
#include "workers/producers/ZRReportingSessionVolumeMessagesWorker.h"

#include <cmath>
#include <map>
#include <sstream>

namespace tamblo {
namespace {

using testing::IsEmpty;

const std::map<std::string, std::string_view, std::less<>> kKeys{
    {"time", "zrreporting_timestamp"},
    {"out", "session_output_running"},
    {"in", "session_input_running"},
    {"group", "kaleen_session"},
    {"length", "session_duration"},
    {"volume", "QVSessionVolume"},
    {"devices", "active_devices"},
    {"format", "session_selected_format"},
    {"formatID", "mFormatID"},
    {"channels", "mChannelsPerFrame"},
    {"ringer", "ringerstate"},
    {"spatial", "spatializationEnabled"},
    {"feature", "spatial-audio-accessory-feature"},
    {"vocoder", "vp_config_primary_vocoder"},
    {"rate", "vp_config_primary_vocoderFs"},
    {"port", "vp_config_input_port"},
};

/// "10 out volume=0.5": a timestamp after the start, "-" for none, and keys by the names above, each with its
/// value in JSON, or a word; without one it is true.
Dictionary payloadOf(const std::string& text, double start = 0) {
    const auto valueOf = [](const std::string& word) {
        auto read = readJson(word);
        return word == "nan"                         ? Value(NAN)
               : std::holds_alternative<Value>(read) ? std::get<Value>(read)
                                                     : word;
    };
    Dictionary payload;
    std::istringstream words(text);
    std::string word;
    words >> word;
    if (const Value time = valueOf(word); word != "-") {
        payload.set("zrreporting_timestamp", time.isNumber() ? Value(start + time.doubleValue()) : time);
    }
    while (words >> word) {
        const std::size_t end = word.find('=');
        payload.set(kKeys.at(word.substr(0, end)),
                    end == std::string::npos ? Value(true) : valueOf(word.substr(end + 1)));
    }
    return payload;
}

/// Several of them, with semicolons between.
std::vector<MessageRef> messagesOf(const std::string& texts) {
    std::vector<MessageRef> messages;
    std::istringstream payloads(texts);
    for (std::string text; std::getline(payloads, text, ';');) {
        messages.push_back(messageOf(payloadOf(text)));
    }
    return messages;
}

struct Case {
    const char* what;
    const char* messages;
    const char* expected; ///< the values of some keys of each summary
    const char* previous = "-";
};

/// What opens a segment in every walk.
constexpr const char* kAllRunning = "0 out in group=1 volume=0.5 devices=A";

class ProducersTest : public WorkerTest {
public:
    using Messages = std::vector<MessageRef>;
    using Seconds = std::chrono::duration<double>;

    Messages volume(const Messages& messages, Seconds minimum, const Value* player) {
        return make<ZRReportingSessionVolumeMessagesWorker>()->createVolumeMessages(messages, player,
                                                                                    minimum);
    }
    Messages input(const Messages& messages, Seconds minimum, const Value* player) {
        return make<ZRReportingSessionInputMessagesWorker>()->createInputMessages(messages, player, minimum);
    }
    Messages group(const Messages& messages, Seconds minimum, const Value* = nullptr) {
        return make<ZRReportingSessionKaleenMessagesWorker>()->createKaleenMessages(messages, minimum);
    }
    /// Holds what is derived of each row's messages, segments of more than five seconds, against it.
    void expectSegments(Messages (ProducersTest::*derive)(const Messages&, Seconds, const Value*),
                        std::initializer_list<std::string_view> keys, const std::vector<Case>& cases) {
        for (const Case& row : cases) {
            session = makeSession();
            session->addPreviousValues(payloadOf(row.previous));
            std::string found;
            for (const MessageRef& message :
                 (this->*derive)(messagesOf(row.messages), Seconds(5), &process)) {
                found += (found.empty() ? "" : "; ") + shown(message->payload(), keys);
            }
            std::erase(found, '"');
            EXPECT_EQ(found, row.expected) << row.what;
        }
    }
    const Value process = "com.example.player";
};

TEST_F(ProducersTest, VolumeSegments) {
    expectSegments(
        &ProducersTest::volume,
        {"play_seconds", "QVSessionVolume", "active_devices", "ringerstate", "msgidx", "msgcnt"},
        {
            {"a volume change and the end; exactly the minimum is too short",
             "10 out volume=0.5; 20 volume=0.8; 25 out=false", "10.0 0.5 unknown false 1 1"},
            {"just above the minimum, after a stretch that is too short",
             "10 out volume=0.5; 13 volume=0.8; 18.5 out=false", "5.5 0.8 unknown false 1 1"},
            {"the session's length ends a segment, and playing with it",
             "0 out volume=0.5; 6 length=6; 20 volume=1; 30 out=false", "6.0 0.5 unknown false 1 1"},
            {"a length with output still said to run ends one segment and begins another",
             "0 out volume=0.5; 10 length=10 out; 30 out=false",
             "10.0 0.5 unknown false 1 2; 20.0 0.5 unknown false 2 2"},
            {"a format change while nothing plays", "0 format=A volume=1; 9 format=B; 20 length=20", ""},
            {"each watched setting ends one; carried settings alone do not, nor what is said again",
             "0 out volume=0.5; 10 formatID=x channels=2; 15 ringer=0 spatial=0 format=unknown; 20 ringer;"
             "30 spatial; 40 devices=D; 50 devices=E; 60 feature; 70 format=S; 76 out=false",
             "20.0 0.5 unknown 0 1 6; 10.0 0.5 unknown true 2 6; 10.0 0.5 unknown true 3 6; "
             "10.0 0.5 D true 4 6; 20.0 0.5 E true 5 6; 6.0 0.5 E true 6 6"},
            {"two spatial settings less than five seconds apart are one change, at the time of the second",
             "0 out volume=0.5; 10 spatial; 14.5 feature; 30 spatial=false; 35 feature=false; 50 out=false",
             "14.5 0.5 unknown false 1 3; 15.5 0.5 unknown false 2 3; 20.0 0.5 unknown false 3 3"},
            {"no volume is known; the first one that is ends nothing",
             "0 out; 10 out=false; 20 out; 30 volume=1; 40 out=false", "20.0 1 unknown false 1 1"},
            {"an end or a start without a timestamp", "- out volume=0.5; 20 out=false; -20 out; - out=false",
             ""},
            {"a session that begins already playing ends nothing until output is said to run anew",
             "10 volume=0.9; 20 length=20", "", "1 out volume=0.5"},
            {"then the segment begins where it was said", "10 volume=0.9; 20 out; 30 length=20",
             "10.0 0.9 Speaker false 1 1", "1 out volume=0.5 devices=Speaker"},
            {"output that is said twice to run goes on; timestamps that run backwards make nothing",
             "50 out volume=0.5; 60 out; 70 out=false; 80 out; 40 out=false", "20.0 0.5 unknown false 1 1"},
        });
}

TEST_F(ProducersTest, InputSegments) {
    expectSegments(
        &ProducersTest::input, {"inputrunning_seconds", "active_devices", "vocoders", "msgidx", "msgcnt"},
        {
            {"a device change and the end; exactly the minimum is too short",
             "0 in devices=A; 10 devices=B; 15 length=15", "10.0 A 1 1"},
            {"vocoders: sorted, of those that run while input does, each segment its own, its last too",
             "-5 vocoder=x rate=\"1\"; 0 in devices=A; 1 vocoder=b rate=\"1\"; 2 vocoder=a rate=\"2\";"
             "3 vocoder=none rate=\"0.0\"; 4 vocoder=n rate=16000; 10 devices=B vocoder=e rate=\"0\";"
             "20 in=false vocoder=y",
             "10.0 A a:2,b:1,e:0,n:16000 1 2; 10.0 B 2 2"},
            {"the vocoders of a stretch that is too short go to the next",
             "0 in devices=A; 1 vocoder=v; 2 devices=B; 20 in=false", "18.0 B v:(null) 1 1"},
            {"input that was running before opens no segment, nor when it is said again; the next change "
             "does",
             "10 devices=B; 16 in; 30 devices=C; 40 length=12", "10.0 C 1 1", "0 in devices=A"},
            {"a length with input still said to run ends one segment and begins another; alone it ends input",
             "0 in devices=A; 10 length=10 in; 30 in=false; 50 in; 60 length=10; 70 devices=B; 80 in=false",
             "10.0 A 1 3; 20.0 A 2 3; 10.0 A 3 3"},
            {"spatial settings less than two seconds apart are one message, at the time of the second",
             "0 in devices=A; 10 spatial devices=B; 11.5 feature; 20 spatial=false devices=C; 22 "
             "feature=false;"
             "40 in=false",
             "11.5 A 1 3; 8.5 B 2 3; 20.0 C 3 3"},
            {"a start without a timestamp", "- in devices=A; 20 in=false", ""},
        });
}

TEST_F(ProducersTest, GroupSessionSegments) {
    expectSegments(
        &ProducersTest::group,
        {"play_seconds", "mFormatID", "mChannelsPerFrame", "session_selected_format", "msgidx", "msgcnt"},
        {
            {"a format change and the end", "0 out group=1 formatID=F1; 30 formatID=F2; 40 length=40",
             "30.0 F1 -1 unknown 1 2; 10.0 F2 -1 unknown 2 2"},
            {"never in a group, or in none that counts", "0 out group=0; 10 group=2; 40 length=40", ""},
            {"the selected format is reported and not watched; a key that only one has is no change",
             "0 out group=1 formatID=F1; 10 format=S; 20 channels=2; 30 channels=6; 40 out=false",
             "30.0 F1 2 S 1 2; 10.0 F1 6 S 2 2"},
            {"joining and leaving while output runs, as it did before; exactly the minimum is too short",
             "0 out; 10 group=1; 20 group=0; 30 group=1; 35 group=0; 60 length=1",
             "10.0 unknown -1 unknown 1 1", "-50 out"},
            {"a pause is left out; after the session's length both playing and the group are to be said anew",
             "0 out group=1 formatID=F1; 10 out=false; 100 out; 110 length=1 out; 120 out; 130 formatID=F2;"
             "140 group=1; 150 length=1",
             "10.0 F1 -1 unknown 1 3; 10.0 F1 -1 unknown 2 3; 10.0 F2 -1 unknown 3 3"},
            {"what was before counts from its own time", "10 formatID=F2; 17 length=1",
             "8.0 F1 -1 unknown 1 2; 7.0 F2 -1 unknown 2 2", "2 out group=1 formatID=F1"},
        });
}

TEST_F(ProducersTest, SummariesHaveExactlyTheseKeys) {
    session->addPreviousValues({{"vp_config_input_port", "Mic"}});
    const Messages messages = messagesOf("0 out in volume=0.5 group=1; 10 length=75");
    EXPECT_THAT(volume(messages, {}, nullptr), IsEmpty());
    EXPECT_THAT(input(messages, {}, nullptr), IsEmpty());
    std::string text;
    for (const Messages& derived :
         {volume(messages, {}, &process), input(messages, {}, &process), group(messages, {})}) {
        ASSERT_EQ(derived.size(), 1U);
        EXPECT_EQ(derived[0]->type(), AudioEventTypeSummary);
        text += std::to_string(derived[0]->category()) + " " + jsonText(derived[0]->payload()) + "\n";
    }
    EXPECT_EQ(
        text,
        R"(14 {"HostApplicationDisplayID":"com.example.player","QVSessionVolume":0.5,"QVSessionVolumeBucketed":"0.5","active_devices":"unknown","mChannelsPerFrame":-1,"mFormatID":"unknown","msgcnt":1,"msgidx":1,"play_seconds":10.0,"play_secondsBucketed":"10","ringerstate":false,"session_selected_format":"unknown","spatial-audio-accessory-feature":false,"spatializationEnabled":false}
3 {"HostApplicationDisplayID":"com.example.player","active_devices":"unknown","inputrunning_seconds":10.0,"inputrunning_secondsBucketed":"10","msgcnt":1,"msgidx":1,"vp_config_input_port":"Mic","vp_config_operation_mode":"unknown"}
15 {"active_devices":"unknown","mChannelsPerFrame":-1,"mFormatID":"unknown","msgcnt":1,"msgidx":1,"play_seconds":10.0,"play_secondsBucketed":"10","session_selected_format":"unknown"}
)");
    EXPECT_EQ(volume(messages, {}, &process)[0]->payload().find("play_seconds")->kind(),
              Value::Kind::singleFloat);
    EXPECT_EQ(group(messages, {})[0]->destinationWorkers(),
              (DestinationWorkers{workerClassNamed("ZRReportingSessionEventryWorker"),
                                  workerClassNamed("ZRReportingSessionSummaryJsonFileWorker")}));
    setInternalBuild(true);
    EXPECT_EQ(group(messages, {})[0]->destinationWorkers(), DestinationWorkers{});
}

TEST_F(ProducersTest, SummariesGoThroughTheSessionInOrderAndAreCounted) {
    make<ZRReportingSessionVolumeMessagesWorker>()->stop();
    EXPECT_THAT(device.analyticsEvents.events(), IsEmpty()) << "of a session without messages";
    session->start();
    for (const char* payload : {kAllRunning, "3 devices=B", "3.5 devices=minimum", "9 length=9"}) {
        send(payloadOf(payload, device.clock.seconds()));
    }
    session->stop();
    std::string names;
    for (const auto& [name, payload] : device.analyticsEvents.events()) {
        if (name.starts_with("com.vandra.tamblo.") && name.ends_with(".Summary")) {
            names += name.substr(18) + " " + shown(payload, {"msgidx", "num_messages"}) + " ";
        }
    }
    EXPECT_EQ(names, "Volume.Summary 1 Volume.Summary 2 Kaleen.Summary 1 Kaleen.Summary 2 "
                     "Session_Generic.Summary 8 Input.Summary 1 Input.Summary 2 ")
        << "four messages of the client's and four summaries are eight";
}

/// Every key that a producer reads, with every value that does not belong there, in a stretch that is open:
/// whatever it is, the summaries are few and numbered.
TEST_F(ProducersTest, ValuesOfTheWrongKind) {
    const Value wrongValues[] = {"text",
                                 "12.5 apples",
                                 "",
                                 Dictionary{{"a", 1}},
                                 Array{1, "b"},
                                 1e300,
                                 -1e300,
                                 NAN,
                                 INFINITY,
                                 -INFINITY,
                                 INT64_MIN,
                                 UINT64_MAX,
                                 true,
                                 Value::date(1e9),
                                 Value::data({})};
    for (const auto& [name, key] : kKeys) {
        for (const Value& wrong : wrongValues) {
            SCOPED_TRACE(name + " " + jsonText(wrong));
            auto messages = messagesOf(std::string(kAllRunning) +
                                       " channels=1 formatID=1 format=1 spatial=1 ringer=1 feature=1 "
                                       "vocoder=1 rate=1; 10; 20; 30 length=1");
            for (std::size_t i = 1; i < messages.size(); ++i) {
                messages[i]->editPayload([&](Dictionary& payload) { payload.set(key, wrong); });
            }
            for (const auto& derived :
                 {volume(messages, {}, &wrong), input(messages, {}, &process), group(messages, {})}) {
                EXPECT_LE(derived.size(), 3U);
                for (const MessageRef& message : derived) {
                    EXPECT_EQ(*message->payload().find("msgcnt"), Value(derived.size()));
                }
            }
        }
    }
}

TEST_F(ProducersTest, WrongKindsFollowTheReadingRules) {
    expectSegments(
        &ProducersTest::volume,
        {"play_seconds", "QVSessionVolume", "QVSessionVolumeBucketed", "play_secondsBucketed"},
        {
            {"texts that read as numbers and booleans",
             "0 out=YES volume=\"0.5\"; 10 volume=0.5; 20 volume=0.75loud; 30 out=no",
             "20.0 0.5 0.5 15; 10.0 0.75loud 0.75 10"},
            {"a volume that is no number repeats as itself, and beyond the table falls into the nearest "
             "class",
             "0 out=1 volume=nan; 10 volume=nan; 20 volume=7; 30 out="
             "",
             "20.0 null 1.0 15; 10.0 7 1.0 10"},
            {"a timestamp that is no number ends a segment of no length; the next begins there, at 0",
             "0 out volume=0.5; soon ringer; 7 out=false", "7.0 0.5 0.5 5"},
            {"a day that never ends, and a length beyond single precision",
             "0 out volume=0.5; 1e300 out=false", "null 0.5 0.5 86400"},
            {"one that is not a number makes no summary", "0 out volume=0.5; nan out=false", ""},
        });
}

} // namespace
} // namespace tamblo
