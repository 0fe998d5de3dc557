#include "system/ZRReportingSystemMonitor.h"
#include "tests/workers/WorkerTest.h"
#include "tools/SessionPlayer.h"
#include "workers/producers/ZRReportingSessionInputMessagesWorker.h"
#include "workers/producers/ZRReportingSessionKaleenMessagesWorker.h"
#include "workers/producers/ZRReportingSessionVolumeMessagesWorker.h"

#include <cmath>
#include <fstream>
#include <map>
#include <sstream>

// Holds docs/messages.md against what the workers do.

namespace tamblo {
namespace {

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

class MessagesDocumentTest : public WorkerTest {
protected:
    MessagesDocumentTest() : WorkerTest(LogLevel::error) {
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
    device.preferences.set("device_name", "com.vandra.tamblo", "Kitchen");
    device.preferences.set("spatial-audio-accessory-feature", "com.vandra.dashlo", true);
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
    const auto output = make<ZRReportingSessionVolumeMessagesWorker>();
    const auto input = make<ZRReportingSessionInputMessagesWorker>();
    const auto group = make<ZRReportingSessionKaleenMessagesWorker>();
    const Value process("player");
    const std::map<std::string, std::string> lengths{
        {"opens", "10.0 "}, {"ends", "10.0 10.0 "}, {"carried", "20.0 "}, {"-", "20.0 "}};
    int tried = 0;
    for (const Row& row : rows) {
        const auto messages = messagesOf({first,
                                          {{"zrreporting_timestamp", 1010}, {row[0], valueOf(row, true)}},
                                          {{"zrreporting_timestamp", 1020}, {"session_duration", 20}}});
        const std::pair<std::vector<MessageRef>, std::string> summaries[] = {
            {output->createVolumeMessages(messages, &process, {}), row[3]},
            {input->createInputMessages(messages, &process, {}), row[4]},
            {group->createKaleenMessages(messages, {}), row[5]}};
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
