#include "tests/fakes/Messages.h"
#include "workers/ZRReportingSessionWorkerUtility.h"

#include <gtest/gtest.h>

#include <array>
#include <cmath>

namespace tamblo {
namespace {

constexpr std::array<std::string_view, 3> kKeys{"spatial-audio-accessory-feature", "spatializationEnabled",
                                                "ringerstate"};

std::string_view keyOf(char letter) {
    return letter == 's' ? kKeys[0] : letter == 'e' ? kKeys[1] : letter == 'r' ? kKeys[2] : "other";
}

/// `s1e3@1.5` for the keys of the letters with the values 1 and 3, and this time.
std::string textOf(const ZRReportingSessionMessage& message) {
    std::string text;
    for (const char letter : {'s', 'e', 'r', 'x'}) {
        if (const Value* value = message.payload().find(keyOf(letter))) {
            text += letter + jsonText(*value);
        }
    }
    const Value* time = message.payload().find("zrreporting_timestamp");
    return text + (time != nullptr ? "@" + jsonText(*time) : "");
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
        {"at the pause; the old anchor stays, and a repeat of the late one's key begins anew",
         {{"e", 0.0}, {"s", 2.0}, {"r", 3.0}, {"s", 3.5}, {"e", 4.0}},
         2,
         "1:e1@0.0 2:s2@2.0 3:r3@3.0 4:s4e5@4.0 "},
        {"the old anchor takes in one that is earlier than itself",
         {{"e", 0.0}, {"s", 2.0}, {"r", -3.0}},
         2,
         "1:e1r3@-3.0 2:s2@2.0 "},
        {"no time is 0, and a pause that is no number is long",
         {{"e", "none"}, {"s", NAN}, {"s", 1.0}, {"e", "none"}},
         2,
         "1:e1 2:s2@null 3:s3e4@1.0 "},
    };
    for (const auto& row : cases) {
        std::vector<MessageRef> messages;
        for (const auto& [keys, time] : row.sent) {
            Dictionary payload;
            for (const char letter : std::string_view(keys)) {
                payload.set(keyOf(letter), messages.size() + 1);
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
            left += std::to_string(place - messages.begin() + 1) + ":" + textOf(*message) + " ";
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
