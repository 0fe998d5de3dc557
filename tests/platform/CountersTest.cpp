#include "platform/Counters.h"
#include "platform/RequestTally.h"
#include "platform/linux/status/StatusRequest.h"
#include "tests/Files.h"

#include <gtest/gtest.h>

#include <chrono>
#include <map>
#include <regex>
#include <set>
#include <sstream>
#include <string>
#include <variant>
#include <vector>

namespace tamblo::test {

namespace {

using namespace std::chrono_literals;

/// The bucket that a time is counted in.
std::size_t bucketOf(std::chrono::nanoseconds time) {
    const auto valueOf = [](std::size_t bucket) {
        return counters::valueOf(counters::kFirstHistogram + bucket);
    };
    std::vector<std::uint64_t> before;
    for (std::size_t i = 0; i <= counters::kBounds; ++i) {
        before.push_back(valueOf(i));
    }
    counters::noteAlone(counters::Histogram::waited, time);
    std::size_t bucket = 0;
    while (bucket < counters::kBounds && valueOf(bucket) == before[bucket]) {
        ++bucket;
    }
    return bucket;
}

} // namespace

TEST(Counters, TimesAreInTheBucketWhoseBoundTheyDoNotPass) {
    EXPECT_EQ(bucketOf(0ns), 0U);
    EXPECT_EQ(bucketOf(-5ns), 0U); // a clock of another thread
    for (std::size_t bucket = 0; bucket != counters::kBounds; ++bucket) {
        const auto bound = counters::boundOf(bucket);
        EXPECT_EQ(bucketOf(bound - 1ns), bucket);
        EXPECT_EQ(bucketOf(bound), bucket);
        EXPECT_EQ(bucketOf(bound + 1ns), bucket + 1);
    }
    EXPECT_EQ(bucketOf(24h), counters::kBounds);
}

TEST(Counters, EachSlotHasOneName) {
    std::set<std::string> names;
    std::set<std::size_t> slots;
    std::size_t rows = 0;
    for (const counters::Family& family : counters::families()) {
        for (const counters::Row& row : family.rows) {
            names.insert(std::string(family.name) + "{" + row.labels + "}");
            slots.insert(row.slot);
            ++rows;
        }
    }
    EXPECT_EQ(names.size(), rows);
    EXPECT_EQ(slots.size(), rows);
    // All slots but those of a histogram that stand behind its first.
    EXPECT_EQ(rows, counters::kFirstHistogram + static_cast<std::size_t>(counters::Histogram::count));
}

TEST(Counters, EachHasItsRowInTheDocuments) {
    // The first column of the table says `family`, `family{label}` or `family{label="value"}`, a row may have
    // several; values that are not there stand in the second one.
    std::istringstream page(contentOf(EXAMPLES_DIR "/../docs/status.md"));
    std::map<std::string, std::string> rows;
    const std::regex name(R"re(`([a-z_]+)(\{[^}]*\})?`)re");
    for (std::string line; std::getline(page, line) && line != "## What is now";) {
        const std::string first = line.starts_with("| `") ? line.substr(0, line.find(" | ")) : "";
        for (std::sregex_iterator match(first.begin(), first.end(), name), end; match != end; ++match) {
            rows[(*match)[1]] += line;
        }
    }
    const std::set<std::string> listedElsewhere{"method", "sink", "limit", "in_use"};
    const std::regex label(R"re(([a-z_]+)="([^"]*)")re");
    for (const counters::Family& family : counters::families()) {
        if (family.isHistogram) {
            continue;
        }
        const std::string text = rows[std::string(family.name)];
        EXPECT_FALSE(text.empty()) << family.name;
        for (const counters::Row& row : family.rows) {
            for (std::sregex_iterator match(row.labels.begin(), row.labels.end(), label), end; match != end;
                 ++match) {
                const std::string value = (*match)[2];
                const bool isNamed =
                    text.find("`" + value + "`") != text.npos || text.find("\"" + value + "\"") != text.npos;
                EXPECT_TRUE(isNamed || listedElsewhere.contains((*match)[1])) << family.name << ' ' << value;
            }
        }
        rows.erase(std::string(family.name));
    }
    for (const auto& [left, text] : rows) {
        ADD_FAILURE() << left << " is in the table, and is no counter";
    }
}

TEST(Counters, WaitsAreToldWhereTheClockOfTheStampsBeginsAnew) {
    using Stamp = RequestTally::Stamp;
    EXPECT_EQ(RequestTally::between(0xFFFFFFFFU, 9), 10us);
    EXPECT_EQ(RequestTally::between(20, 10), 0us);
    EXPECT_NE(RequestTally::stampOf(RequestTally::Time()), Stamp{0});
}

TEST(StatusQuestions, AreLinesOrWhatMonitoringSystemsSend) {
    EXPECT_FALSE(StatusQuestion::isWhole("metri"));
    EXPECT_TRUE(StatusQuestion::isWhole("metrics\n"));
    EXPECT_FALSE(StatusQuestion::isWhole("GET /metrics HTTP/1.1\r\nAccept: */*\r\n"));
    EXPECT_TRUE(StatusQuestion::isWhole("GET /metrics HTTP/1.1\r\nAccept: */*\r\n\r\n"));
    const struct {
        std::string received;
        std::string line;
    } cases[] = {
        {" session  -7 \r\n", "session  -7"},
        {"GET /metrics HTTP/1.1\r\n\r\n", "metrics plain"},
        {"GET /metrics?x=1 HTTP/1.1\r\nAccept: application/openmetrics-text\r\n\r\n", "metrics"},
        {"GET /session/5 HTTP/1.0\n\n", "session 5"},
        {"GET ", ""},
    };
    for (const auto& [received, line] : cases) {
        EXPECT_EQ(StatusQuestion::of(received).line, line) << received;
    }
    const auto parsed = StatusRequest::parse("session  -7");
    ASSERT_TRUE(std::holds_alternative<StatusRequest>(parsed));
    EXPECT_EQ(std::get<StatusRequest>(parsed).reporterID, -7);
    for (const auto* wrong : {"session", "session 1 2", "metricsplain", "tap"}) {
        EXPECT_TRUE(std::holds_alternative<std::string>(StatusRequest::parse(wrong))) << wrong;
    }
}

} // namespace tamblo::test
