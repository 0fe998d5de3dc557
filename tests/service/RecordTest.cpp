#include "tests/service/RealService.h"

#include <algorithm>
#include <cmath>

#include <gmock/gmock.h>
#include <nlohmann/json.hpp>

// A session that was played, is recorded, and is played again: the bench sees what the field saw.

namespace tamblo::test {
namespace {

using nlohmann::json;
using testing::HasSubstr;

/// The summaries that a played session's report has, without what differs by the time, the device's state and
/// repeats, which no sink has.
json figuresOf(const std::string& report) {
    json figures = json::array();
    const json parsed = json::parse(report);
    for (const json& summary : parsed["summaries"]) {
        json kept = json::object();
        for (const auto& [key, value] : summary["payload"].items()) {
            const bool isOfTheMoment = key.starts_with("load_avg") || key.starts_with("num_") ||
                                       key.find("memory") != key.npos || key.find("footprint") != key.npos ||
                                       key == "zrreporting_timestamp" || key == "clientProcessName";
            if (!isOfTheMoment) {
                kept[key] = value;
            }
        }
        figures.push_back({{"event", summary["event"]}, {"payload", kept}});
    }
    return figures;
}

/// Whether both say the same; numbers as far as times allow that were taken twice.
bool agree(const json& one, const json& other) {
    if (one.is_number() && other.is_number()) {
        return std::abs(one.get<double>() - other.get<double>()) <= 0.02;
    }
    if (!one.is_structured() || one.type() != other.type() || one.size() != other.size()) {
        return one == other;
    }
    const auto& items = one.items();
    return std::all_of(items.begin(), items.end(), [&other](const auto& item) {
        return other.is_array() ? agree(item.value(), other[std::stoul(item.key())])
                                : other.contains(item.key()) && agree(item.value(), other[item.key()]);
    });
}

TEST(Record, WhatIsPlayedFromARecordingDerivesTheSameSummaries) {
    const std::string playing = "session --json --fast --reporter ";
    ServiceProcess service({.isInternalBuild = true});
    const std::string recording = service.logs().string() + "/recording";
    for (const auto& [file, type] : {std::pair("music", "longformaudio"), {"call", "telephony"}}) {
        const CommandResult original =
            service.tambloctl(playing + "101 --service-type " + type +
                              R"( --configuration '{"HostApplicationDisplayID":"app"}')" +
                              " --play " EXAMPLES_DIR "/" + file + ".jsonl");
        ASSERT_EQ(original.status, 0) << original.output;
        ASSERT_TRUE(eventually([&service] {
            const auto lines = linesOf(service.logs() / "call-quality.jsonl");
            return !lines.empty() && lines.back().find(R"("op":"flush")") != std::string::npos;
        }));
        const CommandResult recorded = service.tambloctl("record --app app -o " + recording);
        EXPECT_EQ(recorded.status, 0) << recorded.output;
        EXPECT_THAT(recorded.output, HasSubstr(std::string(" of reporter 101, ") + type));
        EXPECT_THAT(recorded.output, HasSubstr("left out as playing makes them anew (summaries)"));
        const CommandResult again = service.tambloctl(playing + "102 --play " + recording);
        ASSERT_EQ(again.status, 0) << again.output;
        EXPECT_FALSE(figuresOf(original.output).empty());
        EXPECT_PRED2(agree, figuresOf(original.output), figuresOf(again.output)) << file;
    }
    EXPECT_EQ(service.tambloctl("record --reporter 9").status, 1);
    EXPECT_EQ(service.tambloctl("record -o /dev/full").status, 1);
}

} // namespace
} // namespace tamblo::test
