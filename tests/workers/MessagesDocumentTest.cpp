#include "system/ZRReportingSystemMonitor.h"
#include "tests/fakes/FakePlatform.h"
#include "tests/fakes/Messages.h"
#include "tools/SessionFile.h"
#include "util/SummaryBuckets.h"
#include "workers/producers/ZRReportingSessionInputMessagesWorker.h"
#include "workers/producers/ZRReportingSessionKaleenMessagesWorker.h"
#include "workers/producers/ZRReportingSessionVolumeMessagesWorker.h"

#include <gmock/gmock.h>

#include <chrono>
#include <fstream>
#include <map>
#include <sstream>
#include <string>
#include <string_view>
#include <vector>

// Holds docs/messages.md against what the workers do.

namespace tamblo {
namespace {

using Row = std::vector<std::string>; ///< the cells of a table's row, without code marks

struct Section {
    std::vector<Row> rows;
    std::vector<std::string> json; ///< the lines of its code blocks
    std::string text;
};

Row cellsOf(std::string_view line) {
    Row cells;
    for (line.remove_prefix(1); !line.empty();) {
        const std::size_t end = line.find('|');
        std::string cell(line.substr(1, end - (end > 1 ? 2 : 1)));
        if (cell.starts_with('`') && cell.ends_with('`')) {
            cell = cell.substr(1, cell.size() - 2);
        }
        cells.push_back(cell);
        line.remove_prefix(end + 1);
    }
    return cells;
}

std::map<std::string, Section> sectionsOfThePage() {
    std::ifstream page(EXAMPLES_DIR "/../docs/messages.md");
    EXPECT_TRUE(page);
    std::map<std::string, Section> sections;
    Section* section = &sections[""];
    bool isBehindHead = false;
    for (std::string line; std::getline(page, line);) {
        if (line.starts_with("##")) {
            section = &sections[line.substr(line.find(' ') + 1)];
        } else if (line.starts_with("{")) {
            section->json.push_back(line);
        } else if (line.starts_with("|") && isBehindHead) {
            section->rows.push_back(cellsOf(line));
        }
        isBehindHead = line.starts_with("|---") || (line.starts_with("|") && isBehindHead);
        section->text += line + " ";
    }
    return sections;
}

Dictionary objectFrom(const std::string& json) {
    const auto value = readJson(json);
    EXPECT_TRUE(std::holds_alternative<Value>(value)) << json;
    return std::get<Value>(value).dictionaryValue();
}

class MessagesDocumentTest : public testing::Test {
protected:
    ~MessagesDocumentTest() override { ZRReportingSystemMonitor::reset(); }

    /// Plays the page's session, on a device that reports about itself.
    void playTheSessionOfThePage() {
        device.preferences.set("device_name", "com.vandra.tamblo", "Kitchen");
        device.preferences.set("spatial-audio-accessory-feature", "com.vandra.dashlo", true);
        ZRReportingSystemMonitor::initializeWithQueue(device.serverQueue());
        device.namedNotifications.post("com.vandra.dashlo.ringerstate", 1);
        (void)device.serverQueue().runAll();
        const auto session = ZRReportingSession::initWithID(7, {1});
        session->setServiceType(AudioServiceTypeTelephony);
        session->setClientProcessName("phone");
        session->updateConfigurationWithContentsOfConfiguration(
            {{"HostApplicationDisplayID", "com.example.phone"}});
        session->start();
        const double start = device.clock.seconds();
        for (const std::string& text : page["What to send"].json) {
            auto parsed = tools::parseSessionLine(text);
            auto& line = std::get<tools::SessionLine>(parsed);
            line.payload.set("zrreporting_timestamp", start + *line.offset);
            session->sendMessage(messageOf(line.payload, static_cast<AudioEventCategory>(line.category),
                                           static_cast<AudioEventType>(line.type)));
        }
        device.clock.advance(std::chrono::minutes(2));
        session->stop();
    }
    FakePlatform device{LogLevel::error};
    std::map<std::string, Section> page = sectionsOfThePage();
};

constexpr const char* kEvents[] = {
    "com.vandra.tamblo.Volume.Summary", "com.vandra.tamblo.Kaleen.Summary", "com.vandra.tamblo.Input.Summary",
    "com.vandra.tamblo.Session_Generic.Summary", "com.vandra.tamblo.Setup.Setup"};

TEST_F(MessagesDocumentTest, ExamplesAreWhatComesOfItsSession) {
    playTheSessionOfThePage();
    for (const std::string event : kEvents) {
        const std::vector<Dictionary> payloads = device.analyticsEvents.payloads(event);
        ASSERT_EQ(page[event].json.size(), payloads.size()) << event;
        for (std::size_t i = 0; i < payloads.size(); ++i) {
            const Dictionary line = objectFrom(page[event].json[i]);
            EXPECT_EQ(*line.find("event"), Value(event));
            Dictionary shown = line.find("payload")->dictionaryValue();
            // What a run measures stands for itself, lengths up to a hundredth of a second.
            for (const std::string_view measured :
                 {"zrreporting_timestamp", "last_updated", "vmInfo_phys_footprint_MiB", "load_avg_1_min",
                  "load_avg_5_min", "load_avg_15_min", "play_seconds", "inputrunning_seconds"}) {
                const Value* derived = payloads[i].find(measured);
                if (derived == nullptr || !shown.contains(measured)) {
                    continue;
                }
                if (measured.ends_with("_seconds")) {
                    EXPECT_NEAR(shown.find(measured)->doubleValue(), derived->doubleValue(), 0.01);
                }
                shown.set(measured, *derived);
            }
            EXPECT_EQ(jsonText(shown), jsonText(payloads[i]));
        }
    }
}

/// Every cell that says what a change of a key does, tried: all keys at first, one changed, then the end.
TEST_F(MessagesDocumentTest, KeysDoWhatTheirTableSays) {
    const std::vector<Row>& rows = page["What to send"].rows;
    const auto valueOf = [](const Row& row, bool isChanged) -> Value {
        if (row[1] == "string") {
            return isChanged ? "b" : "a";
        }
        return row[1] == "boolean" ? Value(row[0].ends_with("_running") != isChanged)
                                   : Value(isChanged ? 0.0 : 1.0);
    };
    Dictionary first{{"zrreporting_timestamp", 1000}};
    for (const Row& row : rows) {
        if (row[0] != "zrreporting_timestamp" && row[0] != "session_duration") {
            first.set(row[0], valueOf(row, false));
        }
    }
    const auto session = ZRReportingSession::initWithID(5, {1});
    const ZRReportingSessionVolumeMessagesWorker output(session);
    const ZRReportingSessionInputMessagesWorker input(session);
    const ZRReportingSessionKaleenMessagesWorker group(session);
    const Value process("player");
    const std::map<std::string, std::string> lengths{
        {"opens", "10.0 "}, {"ends", "10.0 10.0 "}, {"carried", "20.0 "}, {"-", "20.0 "}};
    int tried = 0;
    for (const Row& row : rows) {
        if (!first.contains(row[0])) {
            continue;
        }
        const Dictionary change{{"zrreporting_timestamp", 1010}, {row[0], valueOf(row, true)}};
        const Dictionary end{{"zrreporting_timestamp", 1020}, {"session_duration", 20}};
        const auto messages = messagesOf({first, change, end});
        const std::pair<std::vector<MessageRef>, std::string> summaries[] = {
            {output.createVolumeMessages(messages, &process, {}), row[3]},
            {input.createInputMessages(messages, &process, {}), row[4]},
            {group.createKaleenMessages(messages, {}), row[5]}};
        for (const auto& [derived, cell] : summaries) {
            std::string found;
            for (const MessageRef& message : derived) {
                const Value* seconds = message->payload().find("play_seconds");
                found += jsonText(seconds != nullptr ? *seconds
                                                     : *message->payload().find("inputrunning_seconds")) +
                         " ";
                if (cell == "ends" || cell == "carried" || cell == "-") {
                    EXPECT_EQ(message->payload().contains(row[0]), cell != "-") << row[0];
                }
            }
            if (lengths.contains(cell)) {
                EXPECT_EQ(found, lengths.at(cell)) << row[0] << ": " << cell;
                ++tried;
            }
        }
    }
    EXPECT_GT(tried, 40);
}

TEST_F(MessagesDocumentTest, ClassesAreListed) {
    const auto listed = [this](std::string_view head) {
        const std::string& text = page["Classes"].text;
        const std::size_t start = text.find(head);
        EXPECT_NE(start, std::string::npos);
        std::istringstream numbers(text.substr(start + head.size()));
        std::vector<double> found;
        for (double number = 0; numbers >> number; numbers.ignore(1)) {
            found.push_back(number);
        }
        return found;
    };
    EXPECT_THAT(listed("- Time, in seconds: "), testing::ElementsAreArray(kTimeBuckets));
    EXPECT_THAT(listed("- Volume: "), testing::ElementsAreArray(kVolumeBuckets));
}

} // namespace
} // namespace tamblo
