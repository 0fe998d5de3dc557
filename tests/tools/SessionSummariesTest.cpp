#include "tools/SessionSummaries.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <span>
#include <sstream>
#include <string>
#include <vector>

namespace tamblo::tools {
namespace {

constexpr std::pair<char, std::string_view> kEvents[] = {{'V', "com.vandra.tamblo.Volume.Summary"},
                                                         {'K', "com.vandra.tamblo.Kaleen.Summary"},
                                                         {'S', "com.vandra.tamblo.Session_Generic.Summary"},
                                                         {'I', "com.vandra.tamblo.Input.Summary"}};

/// "V2" is the second output stretch, "Smusic:9" the summary of a session of that application with 9
/// messages.
SessionSummary summaryFrom(const std::string& word) {
    const auto kind = std::ranges::find(kEvents, word[0], &std::pair<char, std::string_view>::first);
    SessionSummary summary{std::string(kind->second), {}};
    if (const std::size_t colon = word.find(':'); colon != word.npos) {
        summary.payload = {{"HostApplicationDisplayID", word.substr(1, colon - 1)},
                           {"summaryServiceName", "haptics"},
                           {"num_messages", std::stoi(word.substr(colon + 1))}};
    } else {
        summary.payload = {{"msgidx", std::stoi(word.substr(1))}};
    }
    return summary;
}

TEST(SessionSummaries, ThoseOfOneStopAreTakenOut) {
    const struct {
        const char* written;
        std::size_t first, count;
    } cases[] = {
        {"V1 V2 K1 Sa:9 I1", 0, 5},
        {"Sb:9 V1 Sa:9 Sb:9", 1, 2},             // stops without stretches
        {"V1 Sa:9 I1 I2 V1 V2 Sb:9", 0, 4},      // input comes behind the session
        {"V1 V2 Sb:9 I1 I1 Sb:9 K1 Sa:9", 6, 2}, // one that has no session of its own in between
        {"V1 Sa:9 V1 Sa:10", 2, 2},              // alike: the last
        {"V1 Sa:4 I1 V1 Sb:9", 3, 2},            // none: too few messages, another application
        {"V1 V2 V1", 2, 1},                      // the session's own is not in use
        {"", 0, 0},
    };
    for (const auto& row : cases) {
        SCOPED_TRACE(row.written);
        std::istringstream words(row.written);
        std::vector<SessionSummary> written;
        for (std::string word; words >> word;) {
            written.push_back(summaryFrom(word));
        }
        const auto found = summariesOf({"a", "haptics", 5}, written);
        EXPECT_TRUE(std::ranges::equal(
            found, std::span(written).subspan(row.first, row.count),
            [](const auto& a, const auto& b) { return a.event == b.event && a.payload == b.payload; }));
    }
    EXPECT_EQ(
        summariesOf({"a", "alarms", 5}, std::vector{summaryFrom("Sa:9"), summaryFrom("Sb:9")})[0].payload,
        summaryFrom("Sb:9").payload);
}

TEST(SessionSummaries, TablesHoldWhatFits) {
    const SessionSummary summaries[] = {
        {"com.vandra.tamblo.Input.Summary",
         {{"msgidx", 1},
          {"msgcnt", 2},
          {"inputrunning_seconds", 7.9599},
          {"inputrunning_secondsBucketed", "10"},
          {"active_devices", "Übertrager \x1b[31m und nöch mehr davon"},
          {"vocoders", "EVS:32000"}}},
        {"com.vandra.tamblo.Input.Summary",
         {{"msgidx", 2}, {"msgcnt", 2}, {"inputrunning_seconds", "odd"}, {"active_devices", 5}}},
        {"com.vandra.tamblo.Session_Generic.Summary",
         {{"total_active_time", 18.759}, {"active_count", 1}, {"low_power_enabled", 1}}},
    };
    EXPECT_EQ(summaryTables(summaries),
              "\nsession  (com.vandra.tamblo.Session_Generic.Summary)\n"
              "  reported  by -  process -  as -  single-message -\n"
              "  messages  all -  unique -  redundant -\n"
              "  activity  seconds 18.76  periods 1  average -  overloads -\n"
              "  device    thermal state -  low power yes\n"
              "  service   memory MiB -\n"
              "  load      1 min -  5 min -  15 min -\n"
              "\ninput  (com.vandra.tamblo.Input.Summary)\n"
              "    #  seconds  class  devices                        mode  port  vocoders\n"
              "  1/2     7.96     10  Übertrager \\u001b[31m und nö…  -     -     EVS:32000\n"
              "  2/2      odd      -  5                              -     -     -");
}

} // namespace
} // namespace tamblo::tools
