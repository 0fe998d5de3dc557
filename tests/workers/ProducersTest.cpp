#include "system/ZRReportingSystemMonitor.h"
#include "tests/workers/WorkerTest.h"
#include "tools/SessionPlayer.h"
#include "workers/ZRReportingSessionWorkerUtility.h"
#include "workers/producers/ZRReportingSessionInputMessagesWorker.h"
#include "workers/producers/ZRReportingSessionKaleenMessagesWorker.h"
#include "workers/producers/ZRReportingSessionVolumeMessagesWorker.h"

#include <fstream>

// Holds docs/messages.md against what the workers do, and tries what does not stand there.

namespace tamblo {
namespace {

using Messages = std::vector<MessageRef>;
using Seconds = std::chrono::duration<double>;

class ProducersTest : public WorkerTest {
public:
    Messages volume(const Messages& messages, Seconds minimum, const Value* player) {
        return make<ZRReportingSessionVolumeMessagesWorker>()->createVolumeMessages(messages, player,
                                                                                    minimum);
    }
    Messages input(const Messages& messages, Seconds minimum, const Value* player) {
        return make<ZRReportingSessionInputMessagesWorker>()->createInputMessages(messages, player, minimum);
    }
    Messages group(const Messages& messages, Seconds minimum, const Value*) {
        return make<ZRReportingSessionKaleenMessagesWorker>()->createKaleenMessages(messages, minimum);
    }
    /// Holds the values of the keys that are derived of each row's messages, segments of more than five
    /// seconds, against it. Before a bar stand the values that were before.
    void expectSegments(Messages (ProducersTest::*derive)(const Messages&, Seconds, const Value*),
                        std::initializer_list<std::string_view> keys, const std::vector<Played>& cases) {
        for (const Played& row : cases) {
            session = makeSession();
            const std::string script = row.script;
            const std::size_t bar = script.find('|');
            session->addPreviousValues(payloadOf(bar == script.npos ? "-" : script.substr(0, bar)));
            std::string found;
            for (const MessageRef& message :
                 (this->*derive)(messagesOf(script.substr(bar + 1)), 5s, &process)) {
                found += (found.empty() ? "" : "; ") + shown(message->payload(), keys);
            }
            std::erase(found, '"');
            EXPECT_EQ(found, row.expected) << row.what;
        }
    }
    /// Starts and stops the session, and sends it messages of input and output; these values of the summary
    /// of its last stop.
    std::string summary(const std::string& script, std::initializer_list<std::string_view> keys) {
        const auto sendIO = [this](const std::string& words, AudioEventType type = AudioEventTypeGeneric) {
            send(payloadOf("- " + words), AudioEventKindIO, type);
        };
        playWords(script,
                  {{"start", [this] { session->start(); }},
                   {"stop", [this] { session->stop(); }},
                   {"both", [&] { sendIO("length=2.5 issue_type=overload"); }},
                   {"error", [&] { sendIO("issue_type=overload", AudioEventTypeError); }}},
                  sendIO);
        const auto payloads = device.analyticsEvents.payloads("com.vandra.tamblo.Session_Generic.Summary");
        return payloads.empty() ? "" : shown(payloads.back(), keys);
    }
    const Value process = "com.example.player";
};

TEST_F(ProducersTest, VolumeSegments) {
    expectSegments(
        &ProducersTest::volume,
        {"play_seconds", "QVSessionVolume", "active_devices", "ringerstate", "msgidx", "msgcnt"},
        {
            {"exactly the minimum is too short, a little more is not",
             "10 out volume=0.5; 20 volume=0.8; 25 volume=0.9; 30.5 out=false",
             "10.0 0.5 unknown false 1 2; 5.5 0.9 unknown false 2 2"},
            {"the session's length ends playing, unless output is still said to run",
             "0 out volume=0.5; 6 length=6; 20 volume=1; 30 out=0; 40 out; 50 length=10 out; 70 out=0",
             "6.0 0.5 unknown false 1 3; 10.0 1 unknown false 2 3; 20.0 1 unknown false 3 3"},
            {"what is said again ends nothing",
             "0 out volume=0.5; 10 ringer=0 spatial=0 format=unknown; 20 ringer devices=D; 30 out=0",
             "20.0 0.5 unknown 0 1 2; 10.0 0.5 D true 2 2"},
            {"two spatial settings less than five seconds apart are one change, at the time of the second",
             "0 out volume=0.5; 10 spatial; 14.5 feature; 30 spatial=false; 35 feature=false; 50 out=false",
             "14.5 0.5 unknown false 1 3; 15.5 0.5 unknown false 2 3; 20.0 0.5 unknown false 3 3"},
            {"no volume is known; the first one that is ends nothing",
             "0 out; 10 out=false; 20 out; 30 volume=1; 40 out=false", "20.0 1 unknown false 1 1"},
            {"an end or a start without a timestamp", "- out volume=0.5; 20 out=false; -20 out; - out=false",
             ""},
            {"a session that begins already playing ends nothing until output is said to run anew",
             "1 out volume=0.5 devices=Speaker | 10 volume=0.9; 20 out; 30 length=20",
             "10.0 0.9 Speaker false 1 1"},
        });
}

TEST_F(ProducersTest, InputSegments) {
    expectSegments(
        &ProducersTest::input, {"inputrunning_seconds", "active_devices", "vocoders", "msgidx", "msgcnt"},
        {
            {"vocoders: sorted, of those that run while input does, each segment its own, its last too",
             "-5 vocoder=x rate=\"1\"; 0 in devices=A; 1 vocoder=b rate=\"1\"; 2 vocoder=a rate=\"2\";"
             "3 vocoder=none rate=\"0.0\"; 4 vocoder=n rate=16000; 10 devices=B vocoder=e rate=\"0\";"
             "20 in=false vocoder=y",
             "10.0 A a:2,b:1,e:0,n:16000 1 2; 10.0 B 2 2"},
            {"the vocoders of a stretch that is too short go to the next",
             "0 in devices=A; 1 vocoder=v; 2 devices=B; 20 in=false", "18.0 B v:(null) 1 1"},
            {"input that ran before opens no segment, nor when it is said again; the next change does",
             "0 in devices=A | 10 devices=B; 16 in; 30 devices=C; 40 length=12", "10.0 C 1 1"},
            {"a length with input still said to run ends one segment and begins another; alone it ends input",
             "0 in devices=A; 10 length=10 in; 30 in=false; 50 in; 60 length=10; 70 devices=B; 80 in=false",
             "10.0 A 1 3; 20.0 A 2 3; 10.0 A 3 3"},
            {"spatial settings less than two seconds apart are one message, at the time of the second",
             "0 in devices=A; 10 spatial devices=B; 11.5 feature; 20 spatial=false devices=C;"
             "22 feature=false; 40 in=false",
             "11.5 A 1 3; 8.5 B 2 3; 20.0 C 3 3"},
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
            {"a number beside a text, and another number, are changes; the same written otherwise is none",
             "0 out group=1 formatID=aac; 10 formatID=2; 20 formatID=\"2\"; 30 formatID=2; 40 formatID=1;"
             "50 formatID=1.0 devices=1; 60 devices=\"1\"; 70 devices=2; 80 out=false",
             "10.0 aac -1 unknown 1 4; 30.0 2 -1 unknown 2 4; 30.0 1.0 -1 unknown 3 4; 10.0 1.0 -1 unknown 4 "
             "4"},
            {"joining and leaving while output runs, as it did before; exactly the minimum is too short",
             "-50 out | 0 out; 10 group=1; 20 group=0; 30 group=1; 35 group=0; 60 length=1",
             "10.0 unknown -1 unknown 1 1"},
            {"a pause is left out; after the session's length both playing and the group are to be said anew",
             "0 out group=1 formatID=F1; 10 out=false; 100 out; 110 length=1 out; 120 out; 130 formatID=F2;"
             "140 group=1; 150 length=1",
             "10.0 F1 -1 unknown 1 3; 10.0 F1 -1 unknown 2 3; 10.0 F2 -1 unknown 3 3"},
        });
}

TEST_F(ProducersTest, SummariesAreSentAtTheStopAndSomeToSomeWorkersOnly) {
    session->start();
    for (const char* payload : {"0 out volume=0.5", "3 devices=B", "3.5 devices=minimum", "9 length=9"}) {
        send(payloadOf(payload, device.clock.seconds()));
    }
    session->stop();
    EXPECT_THAT(device.analyticsEvents.payloads("com.vandra.tamblo.Volume.Summary"), SizeIs(2));

    // A message that is nothing to a worker by itself is, once it has taken in another one.
    session->start();
    for (const char* payload : {"0 devices=A", "1 feature", "1.5 devices=B", "1.7 other",
                                "2 spatial group=1 out", "3 other", "20 length=9 out=false group=0"}) {
        send(payloadOf(payload, device.clock.seconds()));
    }
    session->stop();
    const auto groups = device.analyticsEvents.payloads("com.vandra.tamblo.Kaleen.Summary");
    ASSERT_THAT(groups, SizeIs(1));
    EXPECT_EQ(shown(groups[0], {"play_seconds"}), "18.5");

    session = makeSession();
    const Messages messages = messagesOf("0 out in volume=0.5 group=1; 10 length=75");
    EXPECT_THAT(volume(messages, 0s, nullptr), IsEmpty());
    EXPECT_THAT(input(messages, 0s, nullptr), IsEmpty());
    EXPECT_EQ(group(messages, 0s, nullptr)[0]->destinationWorkers(),
              (DestinationWorkers{workerClassNamed("ZRReportingSessionEventryWorker"),
                                  workerClassNamed("ZRReportingSessionSummaryJsonFileWorker")}));
    setInternalBuild(true);
    EXPECT_EQ(group(messages, 0s, nullptr)[0]->destinationWorkers(), DestinationWorkers{});
}

TEST_F(ProducersTest, WrongKindsFollowTheReadingRules) {
    expectSegments(
        &ProducersTest::volume,
        {"play_seconds", "QVSessionVolume", "QVSessionVolumeBucketed", "play_secondsBucketed"},
        {
            {"texts that read as numbers and booleans",
             "0 out=YES volume=\"0.5\"; 10 volume=0.5; 20 volume=0.75loud; 30 out=no",
             "20.0 0.5 0.5 15; 10.0 0.75loud 0.75 10"},
            {"a volume that is no number repeats as itself; the classes at both ends have all beyond them",
             "0 out=1 volume=nan; 10 volume=nan; 20 volume=7; 30 out=", "20.0 null 1.0 15; 10.0 7 1.0 10"},
            {"a timestamp that is no number ends a segment of no length; the next begins there, at 0",
             "0 out volume=0.5; soon ringer; 7 out=false", "7.0 0.5 0.5 5"},
            {"a day that never ends, and a length beyond single precision",
             "0 out volume=0.5; 1e300 out=false", "null 0.5 0.5 86400"},
        });
}

TEST(WorkerUtilityTest, CombinesBurstsInPlace) {
    constexpr std::string_view keys[] = {"s", "e", "r"};
    const struct {
        const char* what;
        const char* messages;
        double pause;
        const char* left; ///< each one's number, then its values of s, e, r and x, and its time
    } cases[] = {
        {"another message between", "0 s=1; 0.5 x=2; 1 e=3", 5, "1:1 3 1.0; 2:2 0.5; "},
        {"one with both keys counts under the first", "0 s=1 e=1; 1 e=2", 5, "1:1 2 1.0; "},
        {"the pause since the message before", "0 e=1; 1.5 r=2; 3 s=3", 2, "1:3 1 2 3.0; "},
        {"at the pause; the old anchor stays, and a repeat of the late one's key begins anew",
         "0 e=1; 2 s=2; 3 r=3; 3 s=4", 2, "1:1 0.0; 2:2 2.0; 3:3 3.0; 4:4 3.0; "},
        {"one earlier than the anchor", "0 e=1; 2 s=2; -3 r=3", 2, "1:1 3 -3.0; 2:2 2.0; "},
        {"no time is 0, and a pause that is no number is long", "- e=1; nan s=2; 1 s=3; - e=4", 2,
         "1:1; 2:2 null; 3:3 4 1.0; "},
    };
    for (const auto& row : cases) {
        const Messages messages = messagesOf(row.messages);
        std::string left;
        for (const ZRReportingSessionMessage* message :
             ZRReportingSessionWorkerUtility::combineRapidMessages(messages, keys, Seconds(row.pause))) {
            left += std::to_string(message->category()) + ":" +
                    shown(message->payload(), {"s", "e", "r", "x", "zrreporting_timestamp"}) + "; ";
        }
        EXPECT_EQ(left, row.left) << row.what;
    }
}

TEST_F(ProducersTest, SessionSummariesCountMessagesOfTheRunAndActivityOverAllRuns) {
    const Played cases[] = {
        {"its own records of starts and stops are no messages", "stop start stop", "0 0 0 0 0.0 0.0 0"},
        {"what comes before the start counts to the run that follows, repeats among it",
         "n=0 start start n=1 n=2 n=2 n=2 n=3 both length=4s issue_type=overload issue_type=overload stop",
         "10 7 3 2 6.5 3.25 1"},
        {"the next run", "start issue_type=underrun error error stop", "3 3 0 2 6.5 3.25 3"},
    };
    for (const auto& row : cases) {
        EXPECT_EQ(summary(row.script,
                          {"num_messages", "num_unique_messages", "num_redundant_messages", "active_count",
                           "total_active_time", "average_active_time", "overload_count"}),
                  row.expected)
            << row.what;
    }
}

TEST_F(ProducersTest, SessionSummariesTellHowTheDeviceIs) {
    device.processInformation.footprint = (std::uint64_t{4} << 30U) + (std::uint64_t{3} << 20U) + 5;
    for (const auto& [state, name] : {std::pair(0, "Nominal"), {3, "Critical"}, {4, "Unknown"}}) {
        device.deviceConditions.thermal = state;
        device.deviceConditions.lowPower = state == 3;
        EXPECT_EQ(summary("start stop", {"thermal_state", "low_power_enabled", "vmInfo_phys_footprint_MiB",
                                         "load_avg_1_min", "load_avg_5_min", "load_avg_15_min"}),
                  "\"" + std::string(name) + (state == 3 ? "\" 1" : "\" 0") + " 3 0.5 0.25 0.125");
    }
    session->setClientProcessName(std::nullopt);
    device.processInformation.footprint = ProcessInformation::QueryError{2, "no such file"};
    device.log.clear();
    EXPECT_EQ(summary("start stop", {"vmInfo_phys_footprint_MiB", "clientProcessName"}), "");
    EXPECT_EQ(loggedLevels(ZRReportingSummaryLogCategory()), "e");
}

using Row = std::vector<std::string>; ///< the cells of a table's row, without code marks

Row cellsOf(const std::string& line) {
    Row cells;
    std::istringstream text(line.substr(1));
    for (std::string cell; std::getline(text, cell, '|');) {
        const std::size_t begin = cell.find_first_not_of(" `");
        cells.push_back(begin == cell.npos ? ""
                                           : cell.substr(begin, cell.find_last_not_of(" `") - begin + 1));
    }
    return cells;
}

class MessagesDocumentTest : public ProducersTest {
protected:
    MessagesDocumentTest() {
        std::ifstream page(EXAMPLES_DIR "/../docs/messages.md");
        std::string heading;
        for (std::string line; std::getline(page, line);) {
            if (line.starts_with("##")) {
                heading = line.substr(line.find(' ') + 1);
            } else if (line.starts_with("{")) {
                examples[heading].push_back(line);
            } else if (line.starts_with("| ") && !line.starts_with("| key")) {
                tables[heading].push_back(cellsOf(line));
            }
        }
    }
    std::map<std::string, std::vector<std::string>> examples; ///< by heading, the lines of JSON
    std::map<std::string, std::vector<Row>> tables;
};

TEST_F(MessagesDocumentTest, ExamplesAreWhatComesOfItsSession) {
    // On a device that reports about itself.
    device.preferences.setPreferenceValue("device_name", "com.vandra.tamblo", "Kitchen");
    device.preferences.setPreferenceValue("spatial-audio-accessory-feature", "com.vandra.dashlo", true);
    ZRReportingSystemMonitor::initializeWithQueue(device.context(), device.serverQueue());
    device.namedNotifications.post("com.vandra.dashlo.ringerstate", 1);
    (void)device.serverQueue().runAll();
    session = makeSession(AudioServiceTypeTelephony, {{"HostApplicationDisplayID", "com.example.phone"}});
    session->setClientProcessName("phone");
    session->start();
    const double start = device.clock.seconds();
    for (const std::string& text : examples["What to send"]) {
        auto parsed = tools::parseSessionLine(text);
        auto& line = std::get<tools::SessionLine>(parsed);
        line.payload.set("zrreporting_timestamp", start + *line.offset);
        send(line.payload, static_cast<AudioEventCategory>(line.category),
             static_cast<AudioEventType>(line.type));
    }
    device.clock.advance(2min);
    session->stop();
    for (const std::string event :
         {"Volume.Summary", "Kaleen.Summary", "Input.Summary", "Session_Generic.Summary", "Setup.Setup"}) {
        const std::string name = "com.vandra.tamblo." + event;
        const std::vector<Dictionary> payloads = device.analyticsEvents.payloads(name);
        ASSERT_EQ(examples[name].size(), payloads.size()) << name;
        for (std::size_t i = 0; i < payloads.size(); ++i) {
            Dictionary line = std::get<Value>(readJson(examples[name][i])).dictionaryValue();
            EXPECT_EQ(*line.find("event"), Value(name));
            line = Dictionary(line.find("payload")->dictionaryValue());
            // What a run measures stands for itself, lengths up to a hundredth of a second.
            for (const std::string_view measured :
                 {"zrreporting_timestamp", "last_updated", "vmInfo_phys_footprint_MiB", "load_avg_1_min",
                  "load_avg_5_min", "load_avg_15_min", "play_seconds", "inputrunning_seconds"}) {
                const Value* written = line.find(measured);
                const Value* derived = payloads[i].find(measured);
                if (written != nullptr && derived != nullptr &&
                    (!measured.ends_with("_seconds") ||
                     std::abs(written->doubleValue() - derived->doubleValue()) < 0.01)) {
                    line.set(measured, *derived);
                }
            }
            EXPECT_EQ(jsonText(line), jsonText(payloads[i]));
        }
    }
}

/// Every cell that says what a change of a key does, tried: all keys at first, one changed, then the end.
TEST_F(MessagesDocumentTest, KeysDoWhatTheirTableSays) {
    const auto valueOf = [](const Row& row, bool isChanged) {
        return row[1] == "string"    ? Value(isChanged ? "b" : "a")
               : row[1] == "boolean" ? Value(row[0].ends_with("_running") != isChanged)
                                     : Value(isChanged ? 0.0 : 1.0);
    };
    std::vector<Row> rows = tables["What to send"];
    std::erase_if(rows, [](const Row& row) {
        return row[0] == "zrreporting_timestamp" || row[0] == "session_duration";
    });
    Dictionary first{{"zrreporting_timestamp", 1000}};
    for (const Row& row : rows) {
        first.set(row[0], valueOf(row, false));
    }
    const std::map<std::string, std::string> lengths{
        {"opens", "10.0 "}, {"ends", "10.0 10.0 "}, {"carried", "20.0 "}, {"-", "20.0 "}};
    int tried = 0;
    for (const Row& row : rows) {
        const Messages messages{messageOf(first),
                                messageOf({{"zrreporting_timestamp", 1010}, {row[0], valueOf(row, true)}}),
                                messageOf({{"zrreporting_timestamp", 1020}, {"session_duration", 20}})};
        const std::pair<Messages, std::string> summaries[] = {{volume(messages, 0s, &process), row[3]},
                                                              {input(messages, 0s, &process), row[4]},
                                                              {group(messages, 0s, nullptr), row[5]}};
        for (const auto& [derived, cell] : summaries) {
            if (!lengths.contains(cell)) {
                continue;
            }
            std::string found;
            for (const MessageRef& message : derived) {
                found += shown(message->payload(), {"play_seconds", "inputrunning_seconds"}) + " ";
                EXPECT_TRUE(cell == "opens" || message->payload().contains(row[0]) == (cell != "-"))
                    << row[0];
            }
            EXPECT_EQ(found, lengths.at(cell)) << row[0] << ": " << cell;
            ++tried;
        }
    }
    EXPECT_GT(tried, 40);
}

} // namespace
} // namespace tamblo
