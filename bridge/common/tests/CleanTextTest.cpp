#include "bridge/common/CleanText.h"

#include "base/Utf8.h"

#include <gtest/gtest.h>

#include <string>
#include <string_view>

namespace tamblo::bridge {
namespace {

TEST(BridgeText, isCutAndCleaned) {
    EXPECT_EQ(cleanText("Built-in Audio"), "Built-in Audio");
    EXPECT_EQ(cleanText("caf\xC3\xA9", 4), "caf") << "no part of a character is kept";
    EXPECT_EQ(cleanText("a\xFF\xC3 \x1B[31m"), "a??  [31m");
    EXPECT_EQ(cleanText("bluez_output.01_23_45_67_89_AB.1"), "bluez_output..1");
    EXPECT_EQ(cleanText("01:23:45:67:89:ab"), "");
    EXPECT_EQ(cleanText("Headset 01-23-45-67-89-AB"), "Headset");
    EXPECT_EQ(cleanText("01:23:45_67:89:AB"), "01:23:45_67:89:AB") << "no address";
    EXPECT_EQ(cleanText("Tunnel for anna@192.168.7.9"), "Tunnel for");
    EXPECT_EQ(cleanText("Speaker (anna@attic) 1"), "Speaker  1");
    EXPECT_EQ(cleanText("Sink on [fe80::1%eth0] and 10.0.0.7:4713"), "Sink on  and");
    EXPECT_EQ(cleanText("Mix @ 48:1 of 7.1"), "Mix @ 48:1 of 7.1") << "names nobody";
    for (const std::string_view bytes : {"x", "\xC3\xA9", "\xFF", "\x01"}) {
        std::string text;
        while (text.size() < 65536) {
            text += bytes;
        }
        const std::string clean = cleanText(text);
        EXPECT_LE(clean.size(), kMostTextBytes);
        EXPECT_TRUE(isUtf8(clean));
    }
}

} // namespace
} // namespace tamblo::bridge
