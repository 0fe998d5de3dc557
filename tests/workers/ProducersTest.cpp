#include "tests/workers/WorkerTest.h"
#include "workers/ZRReportingSessionWorkerUtility.h"
#include "workers/producers/ZRReportingSessionInputMessagesWorker.h"
#include "workers/producers/ZRReportingSessionKaleenMessagesWorker.h"
#include "workers/producers/ZRReportingSessionVolumeMessagesWorker.h"

#include <algorithm>
#include <array>
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
    {"port", "vp_config_input_port"}};

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

    session = makeSession();
    const Messages messages = messagesOf("0 out in volume=0.5 group=1; 10 length=75");
    EXPECT_THAT(volume(messages, {}, nullptr), IsEmpty());
    EXPECT_THAT(input(messages, {}, nullptr), IsEmpty());
    EXPECT_EQ(shown(input(messages, {}, &process)[0]->payload(), {"vp_config_operation_mode"}),
              "\"unknown\"");
    EXPECT_EQ(volume(messages, {}, &process)[0]->payload().find("play_seconds")->kind(),
              Value::Kind::singleFloat);
    EXPECT_EQ(group(messages, {})[0]->destinationWorkers(),
              (DestinationWorkers{workerClassNamed("ZRReportingSessionEventryWorker"),
                                  workerClassNamed("ZRReportingSessionSummaryJsonFileWorker")}));
    setInternalBuild(true);
    EXPECT_EQ(group(messages, {})[0]->destinationWorkers(), DestinationWorkers{});
}

/// Every key that a producer reads, with every value that does not belong there, in a stretch that is open:
/// whatever it is, the summaries are few and numbered.
TEST_F(ProducersTest, ValuesOfTheWrongKind) {
    const Array wrongValues{
        "text",    "12.5 apples", "",   Dictionary{{"a", 1}}, Array{1, "b"},  -1e300, NAN, INFINITY,
        INT64_MIN, UINT64_MAX,    true, Value::date(1e9),     Value::data({})};
    for (const auto& [name, key] : kKeys) {
        for (const Value& wrong : wrongValues) {
            auto messages = messagesOf(std::string(kAllRunning) +
                                       " channels=1 formatID=1 format=1 spatial=1 ringer=1 feature=1 "
                                       "vocoder=1 rate=1; 10; 20; 30 length=1");
            for (std::size_t i = 1; i < messages.size(); ++i) {
                messages[i]->editPayload([&](Dictionary& payload) { payload.set(key, wrong); });
            }
            for (const auto& derived :
                 {volume(messages, {}, &wrong), input(messages, {}, &process), group(messages, {})}) {
                EXPECT_LE(derived.size(), 3U) << name << " " << jsonText(wrong);
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
             "0 out=1 volume=nan; 10 volume=nan; 20 volume=7; 30 out=", "20.0 null 1.0 15; 10.0 7 1.0 10"},
            {"a timestamp that is no number ends a segment of no length; the next begins there, at 0",
             "0 out volume=0.5; soon ringer; 7 out=false", "7.0 0.5 0.5 5"},
            {"a day that never ends, and a length beyond single precision",
             "0 out volume=0.5; 1e300 out=false", "null 0.5 0.5 86400"},
            {"one that is not a number makes no summary", "0 out volume=0.5; nan out=false", ""},
        });
}

constexpr std::array<std::string_view, 3> kLetters{"s", "e", "r"};

/// `e3s1@1.5` for the keys with the values 3 and 1, and this time.
std::string textOf(const Dictionary& payload) {
    std::string text;
    for (const char* key : {"s", "e", "r", "x"}) {
        text += payload.contains(key) ? key + shown(payload, {key}) : "";
    }
    return text + "@" + shown(payload, {"zrreporting_timestamp"});
}

TEST(WorkerUtilityTest, CombinesBurstsInPlace) {
    /// The letters of a message's keys, each with the number of the message as its value; and its time.
    using Sent = std::pair<const char*, Value>;
    const struct {
        const char* what;
        std::vector<Sent> sent;
        double pause;
        const char* left; ///< `NUMBER:TEXT` of the messages that are left, as they are in the end
    } cases[] = {
        {"another message between", {{"s", 0.0}, {"x", 0.5}, {"e", 1.0}}, 5, "1:s1e3@1.0 2:x2@0.5 "},
        {"a repeat begins anew", {{"s", 0.0}, {"s", 1.0}, {"e", 1.5}}, 5, "1:s1@0.0 2:s2e3@1.5 "},
        {"one with both keys counts under the first", {{"se", 0.0}, {"e", 1.0}}, 5, "1:s1e2@1.0 "},
        {"just below the pause", {{"e", 0.0}, {"s", 1.999}}, 2, "1:s2e1@1.999 "},
        {"the pause since the message before", {{"e", 0.0}, {"r", 1.5}, {"s", 3.0}}, 2, "1:s3e1r2@3.0 "},
        // At the pause; the old anchor stays, and a repeat of the late one's key begins anew.
        {"pause", {{"e", 0.}, {"s", 2.}, {"r", 3.}, {"s", 3.}}, 2, "1:e1@0.0 2:s2@2.0 3:r3@3.0 4:s4@3.0 "},
        {"one earlier than the anchor", {{"e", 0.0}, {"s", 2.0}, {"r", -3.0}}, 2, "1:e1r3@-3.0 2:s2@2.0 "},
        // No time is 0, and a pause that is no number is long.
        {"no times", {{"e", ""}, {"s", NAN}, {"s", 1.0}, {"e", ""}}, 2, "1:e1@ 2:s2@null 3:s3e4@1.0 "},
    };
    for (const auto& row : cases) {
        std::vector<MessageRef> messages;
        for (const auto& [keys, time] : row.sent) {
            Dictionary payload;
            for (const char key : std::string_view(keys)) {
                payload.set(std::string(1, key), messages.size() + 1);
            }
            if (time.isNumber()) {
                payload.set("zrreporting_timestamp", time);
            }
            messages.push_back(messageOf(payload));
        }
        std::string left;
        for (const ZRReportingSessionMessage* message : ZRReportingSessionWorkerUtility::combineRapidMessages(
                 messages, kLetters, std::chrono::duration<double>(row.pause))) {
            const auto place = std::find_if(messages.begin(), messages.end(),
                                            [message](const auto& sent) { return sent.get() == message; });
            left += std::to_string(place - messages.begin() + 1) + ":" + textOf(message->payload()) + " ";
        }
        EXPECT_EQ(left, row.left) << row.what;
    }
}

class SummaryWorkerTest : public WorkerTest {
protected:
    void sendIO(Dictionary payload, AudioEventType type = AudioEventTypeGeneric) {
        send(std::move(payload), AudioEventKindIO, type);
    }
    /// Stops the session; these values of its summary.
    std::string summary(std::initializer_list<std::string_view> keys) {
        device.analyticsEvents.clear();
        session->stop();
        const auto payloads = device.analyticsEvents.payloads("com.vandra.tamblo.Session_Generic.Summary");
        EXPECT_EQ(payloads.size(), 1U);
        return payloads.empty() ? "" : shown(payloads[0], keys);
    }
};

TEST_F(SummaryWorkerTest, CountsMessagesAndActivity) {
    const auto counts = [this] {
        return summary({"num_messages", "num_unique_messages", "num_redundant_messages", "active_count",
                        "total_active_time", "average_active_time", "overload_count"});
    };
    // Without a message, the session's own start and stop records are none; a stop that stops nothing leaves
    // one more of them in the list.
    session->stop();
    session->start();
    EXPECT_EQ(counts(), "0 0 0 0 0.0 0.0 0");

    // What a session is sent before its start counts to the run that follows.
    sendIO({{"n", 0}});
    session->start();
    session->start();
    for (const int n : {1, 2, 2, 2, 3}) {
        sendIO({{"n", n}});
    }
    sendIO({{"session_duration", 2.5}, {"issue_type", "overload"}});
    sendIO({{"session_duration", "4 seconds"}});
    sendIO({{"issue_type", "overload"}});
    sendIO({{"issue_type", "overload"}});
    EXPECT_EQ(counts(), "10 7 3 2 6.5 3.25 1");

    // Messages are counted by the run, activity over all of them.
    session->start();
    sendIO({{"issue_type", "underrun"}});
    sendIO({{"issue_type", "overload"}}, AudioEventTypeError);
    sendIO({{"issue_type", "overload"}}, AudioEventTypeError);
    EXPECT_EQ(counts(), "3 3 0 2 6.5 3.25 3");
}

TEST_F(SummaryWorkerTest, TellsHowTheDeviceIs) {
    device.processInformation.footprint = (std::uint64_t{4} << 30U) + (std::uint64_t{3} << 20U) + 5;
    const std::pair<int, const char*> states[] = {{0, "Nominal"},  {1, "Fair"},    {2, "Serious"},
                                                  {3, "Critical"}, {4, "Unknown"}, {-1, "Unknown"}};
    for (const auto& [state, name] : states) {
        device.deviceConditions.thermal = state;
        device.deviceConditions.lowPower = state == 1;
        session->start();
        EXPECT_EQ(summary({"thermal_state", "low_power_enabled", "vmInfo_phys_footprint_MiB",
                           "load_avg_1_min", "load_avg_5_min", "load_avg_15_min"}),
                  std::string("\"") + name + (state == 1 ? "\" 1" : "\" 0") + " 3 0.5 0.25 0.125");
    }
    session->setClientProcessName(std::nullopt);
    device.processInformation.footprint = ProcessInformation::QueryError{2, "no such file"};
    (void)loggedLevels(ZRReportingSummaryLogCategory());
    session->start();
    EXPECT_EQ(summary({"vmInfo_phys_footprint_MiB", "clientProcessName"}), "");
    EXPECT_EQ(loggedLevels(ZRReportingSummaryLogCategory()), "e");
}

} // namespace
} // namespace tamblo
