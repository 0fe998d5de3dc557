#include "tests/fakes/Messages.h"
#include "workers/ZRReportingSessionWorkerUtility.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <array>
#include <cmath>

namespace tamblo {
namespace {

constexpr std::array<std::string_view, 3> kKeys{"s", "e", "r"};

/// `e3s1@1.5` for the keys with the values 3 and 1, and this time.
std::string textOf(const Dictionary& payload) {
    std::string text;
    for (const char* key : {"s", "e", "r", "x"}) {
        text += payload.contains(key) ? key + shown(payload, {key}) : "";
    }
    return text + "@" + shown(payload, {"zrreporting_timestamp"});
}

TEST(WorkerUtilityTest, CombinesBurstsInPlace) {
    struct Sent {
        const char* keys; ///< the letters of its keys, each with the number of the message as its value
        Value time;
    };
    const struct {
        const char* what;
        std::vector<Sent> sent;
        double pause;
        const char* left; ///< `NUMBER:TEXT` of the messages that are left, as they are in the end
    } cases[] = {
        {"nothing", {}, 5, ""},
        {"another message between", {{"s", 0.0}, {"x", 0.5}, {"e", 1.0}}, 5, "1:s1e3@1.0 2:x2@0.5 "},
        {"a repeat begins anew", {{"s", 0.0}, {"s", 1.0}, {"e", 1.5}}, 5, "1:s1@0.0 2:s2e3@1.5 "},
        {"one with both keys counts under the first", {{"se", 0.0}, {"e", 1.0}}, 5, "1:s1e2@1.0 "},
        {"just below the pause", {{"e", 0.0}, {"s", 1.999}}, 2, "1:s2e1@1.999 "},
        {"the pause since the message before", {{"e", 0.0}, {"r", 1.5}, {"s", 3.0}}, 2, "1:s3e1r2@3.0 "},
        // At the pause; the old anchor stays, and a repeat of the late one's key begins anew.
        {"pause",
         {{"e", 0.0}, {"s", 2.0}, {"r", 3.0}, {"s", 3.5}},
         2,
         "1:e1@0.0 2:s2@2.0 3:r3@3.0 4:s4@3.5 "},
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
                 messages, kKeys, std::chrono::duration<double>(row.pause))) {
            const auto place = std::find_if(messages.begin(), messages.end(),
                                            [message](const auto& sent) { return sent.get() == message; });
            left += std::to_string(place - messages.begin() + 1) + ":" + textOf(message->payload()) + " ";
        }
        EXPECT_EQ(left, row.left) << row.what;
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
        EXPECT_EQ(ZRReportingSessionWorkerUtility::isTalvixXYerrorMessage(*messageOf(payload)), isError);
    }
}

} // namespace
} // namespace tamblo
