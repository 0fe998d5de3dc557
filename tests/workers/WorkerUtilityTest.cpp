#include "base/Json.h"
#include "workers/ZRReportingSessionWorkerUtility.h"

#include <gtest/gtest.h>

#include <array>
#include <cmath>
#include <string>
#include <vector>

namespace tamblo {
namespace {

constexpr std::array<std::string_view, 3> kKeys{"spatial-audio-accessory-feature", "spatializationEnabled",
                                                "ringerstate"};

/// A message of the burst keys it names: 's', 'e' and 'r' for theirs; anything else is another key.
MessageRef message(const char* keys, const Value& time, int value) {
    Dictionary payload;
    for (const char* key = keys; *key != 0; ++key) {
        payload.set(*key == 's'   ? kKeys[0]
                    : *key == 'e' ? kKeys[1]
                    : *key == 'r' ? kKeys[2]
                                  : "other",
                    value);
    }
    if (time.isNumber()) {
        payload.set("zrreporting_timestamp", time);
    }
    return std::make_shared<ZRReportingSessionMessage>(payload, 1, 1);
}

TEST(WorkerUtilityTest, CombinesBurstsInPlace) {
    struct Sent {
        const char* keys;
        Value time;
    };
    const struct {
        const char* what;
        std::vector<Sent> sent;
        double pause;
        std::vector<std::pair<int, const char*>> left; ///< which message, with what in the end
    } cases[] = {
        {"nothing", {}, 5, {}},
        {"two settings, another message between",
         {{"s", 0.0}, {"x", 0.5}, {"e", 1.0}},
         5,
         {{1,
           R"({"spatial-audio-accessory-feature":1,"spatializationEnabled":3,"zrreporting_timestamp":1.0})"},
          {2, R"({"other":2,"zrreporting_timestamp":0.5})"}}},
        {"a key that repeats begins a new burst",
         {{"s", 0.0}, {"s", 1.0}, {"e", 1.5}},
         5,
         {{1, R"({"spatial-audio-accessory-feature":1,"zrreporting_timestamp":0.0})"},
          {2,
           R"({"spatial-audio-accessory-feature":2,"spatializationEnabled":3,"zrreporting_timestamp":1.5})"}}},
        {"one with both keys counts under the first",
         {{"se", 0.0}, {"e", 1.0}},
         5,
         {{1,
           R"({"spatial-audio-accessory-feature":1,"spatializationEnabled":2,"zrreporting_timestamp":1.0})"}}},
        {"just below the pause",
         {{"e", 0.0}, {"s", 1.999}},
         2,
         {{1,
           R"({"spatial-audio-accessory-feature":2,"spatializationEnabled":1,"zrreporting_timestamp":1.999})"}}},
        {"the pause is that since the message before",
         {{"e", 0.0}, {"r", 1.5}, {"s", 3.0}},
         2,
         {{1,
           R"({"ringerstate":2,"spatial-audio-accessory-feature":3,"spatializationEnabled":1,"zrreporting_timestamp":3.0})"}}},
        {"at the pause; the old anchor stays, and a repeat of the late one's key begins anew",
         {{"e", 0.0}, {"s", 2.0}, {"r", 3.0}, {"s", 3.5}, {"e", 4.0}},
         2,
         {{1, R"({"spatializationEnabled":1,"zrreporting_timestamp":0.0})"},
          {2, R"({"spatial-audio-accessory-feature":2,"zrreporting_timestamp":2.0})"},
          {3, R"({"ringerstate":3,"zrreporting_timestamp":3.0})"},
          {4,
           R"({"spatial-audio-accessory-feature":4,"spatializationEnabled":5,"zrreporting_timestamp":4.0})"}}},
        {"the old anchor takes in one that is earlier than itself",
         {{"e", 0.0}, {"s", 2.0}, {"r", -3.0}},
         2,
         {{1, R"({"ringerstate":3,"spatializationEnabled":1,"zrreporting_timestamp":-3.0})"},
          {2, R"({"spatial-audio-accessory-feature":2,"zrreporting_timestamp":2.0})"}}},
        {"no time is 0, and a pause that is no number is long",
         {{"e", "none"}, {"s", NAN}, {"s", 1.0}, {"e", "none"}},
         2,
         {{1, R"({"spatializationEnabled":1})"},
          {2, R"({"spatial-audio-accessory-feature":2,"zrreporting_timestamp":null})"},
          {3,
           R"({"spatial-audio-accessory-feature":3,"spatializationEnabled":4,"zrreporting_timestamp":1.0})"}}},
    };
    for (const auto& row : cases) {
        SCOPED_TRACE(row.what);
        std::vector<MessageRef> messages;
        for (const Sent& sent : row.sent) {
            messages.push_back(message(sent.keys, sent.time, static_cast<int>(messages.size()) + 1));
        }
        const auto combined = ZRReportingSessionWorkerUtility::combineRapidMessages(
            messages, kKeys, std::chrono::duration<double>(row.pause));
        ASSERT_EQ(combined.size(), row.left.size());
        for (std::size_t i = 0; i < combined.size(); ++i) {
            EXPECT_EQ(combined[i], messages[static_cast<std::size_t>(row.left[i].first) - 1].get());
            EXPECT_EQ(jsonText(combined[i]->payload()), row.left[i].second);
        }
    }
}

TEST(WorkerUtilityTest, KnowsAVideoCallsErrorByItsKey) {
    const std::pair<Dictionary, bool> cases[] = {
        {{}, false},
        {{{"a", 1}, {"tvac_invalid_x", 1}}, true},
        {{{"tvac_invalid_", 1}}, true},
        {{{"TVAC_invalid_x", 1}, {"x_tvac_invalid_", 1}, {"tvac_invalid", 1}}, false},
    };
    for (const auto& [payload, isError] : cases) {
        EXPECT_EQ(
            ZRReportingSessionWorkerUtility::isTalvixXYerrorMessage(ZRReportingSessionMessage(payload, 1, 1)),
            isError)
            << jsonText(payload);
    }
}

} // namespace
} // namespace tamblo
