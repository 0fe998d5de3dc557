#include "base/BoundedCache.h"
#include "tests/fakes/FakePlatform.h"
#include "util/ConditionWait.h"
#include "util/DataSerialize.h"
#include "util/LogCategories.h"
#include "util/NumberBuckets.h"
#include "util/ReportingUtilities.h"

#include <gmock/gmock.h>

#include <limits>
#include <thread>
#include <vector>

namespace tamblo {
namespace {

TEST(NumberBucketsTest, NearestBucket) {
    const struct {
        double value;
        std::vector<double> buckets;
        unsigned digits;
        const char* text;
    } cases[] = {
        {3, {1, 2, 4, 8}, 0, "4"},
        {2.9, {1, 2, 4, 8}, 0, "2"},
        {-5, {10, 20}, 0, "10"},
        {3, {3}, 2, "3.0"},
        {3, {3.256}, 2, "3.26"},
        {1, {5, 9, 1}, 0, "5"},
        {0, {-2.25}, 1, "-2.2"},
        {0, {1e6}, 1, "1000000.0"},
        {std::numeric_limits<double>::infinity(), {1, 2}, 0, "2"},
    };
    for (const auto& c : cases) {
        EXPECT_EQ(ZRReportingUtilityBucketNumberToString(c.value, c.buckets, c.digits), c.text) << c.value;
    }
    EXPECT_EQ(ZRReportingUtilityBucketNumberToString(1, {}, 0), std::nullopt);
}

TEST(ReportingUtilitiesTest, ChangesAndRounding) {
    const Dictionary first{{"same", 1}, {"changed", 1}, {"gone", 1}};
    const Dictionary second{{"same", 1.0}, {"changed", "1"}};
    EXPECT_FALSE(ZRReportingUtilityKeyIsPresentAndHasChanged("same", &first, &second));
    EXPECT_TRUE(ZRReportingUtilityKeyIsPresentAndHasChanged("changed", &first, &second));
    EXPECT_FALSE(ZRReportingUtilityKeyIsPresentAndHasChanged("gone", &first, &second));
    EXPECT_FALSE(ZRReportingUtilityKeyIsPresentAndHasChanged("changed", nullptr, &second));
    EXPECT_FALSE(ZRReportingUtilityKeyIsPresentAndHasChanged("changed", &first, nullptr));

    EXPECT_EQ(ZRReportingUtilityRoundWithPlaces(2.5, 0), 3);
    EXPECT_EQ(ZRReportingUtilityRoundWithPlaces(-2.5, 0), -3);
    EXPECT_EQ(ZRReportingUtilityRoundWithPlaces(1234, -2), 1200);
    EXPECT_EQ(ZRReportingUtilityRoundWithPlaces(0.126, 2), 0.13);
    EXPECT_TRUE(ZRReportingUtilityShouldSendMessage());
    EXPECT_EQ(ZRReportingUtilityExtractSessionIDFromReporterID(-7), -7);
}

TEST(ReportingUtilitiesTest, AddDates) {
    FakePlatform device;
    device.processInformation.uptime = std::chrono::duration<double>(1234.5);
    device.processInformation.consumed = std::chrono::microseconds(123'456'789'012);
    const Dictionary sent{{"a", 1}, {"systemuptime_sec", "old"}};
    const Dictionary expected{{"a", 1},
                              {"zrreporting_timestamp", device.clock.seconds()},
                              {"systemuptime_sec", 1235},
                              {"processuptime_ms", 123'456'792}}; // in single precision
    EXPECT_EQ(ZRReportingUtilityAddDates(sent), expected);
    EXPECT_EQ(sent.size(), 2U);
    device.processInformation.uptime = std::chrono::duration<double>(1e12);
    EXPECT_EQ(ZRReportingUtilityAddDates({}).find("systemuptime_sec")->integerValue(), 2147483647);
}

TEST(BoundedCacheTest, KeysThatDifferInAnyBitsAreRememberedTogether) {
    for (unsigned shift = 0; shift <= 56; shift += 4) {
        BoundedCache<std::uint64_t> cache;
        int built = 0;
        for (int round = 0; round < 2; ++round) {
            for (std::uint64_t key = 1; key <= 16; ++key) {
                EXPECT_EQ(cache.get(key << shift, [&] { return ++built, key; }), key);
            }
        }
        EXPECT_EQ(built, 16) << "shifted by " << shift;
    }
}

TEST(ConditionWaitTest, SignalledAndTimedOut) {
    FakePlatform device;
    const LogCategory& category = ZRReportingSessionLinkmeterCategory();
    ConditionLock lock;
    bool flag = false;
    EXPECT_FALSE(ZRReportingUtilityWait(lock, std::chrono::seconds(0), flag, "waiting", "timeout", category));
    EXPECT_THAT(device.log.texts(), testing::ElementsAre("waiting", "timeout"));
    EXPECT_EQ(device.log.lines().front().level, LogLevel::info);
    EXPECT_EQ(device.log.lines().back().level, LogLevel::error);
    EXPECT_EQ(device.log.lines().back().category, "zrri");
    device.log.clear();

    std::thread signaller([&] {
        const auto awaitWait = [&](std::size_t number) {
            while (device.log.count("waiting") < number) {
                std::this_thread::yield();
            }
            const std::lock_guard held(lock.mutex); // free once the waiter sleeps
        };
        awaitWait(1);
        lock.condition.notify_one();
        awaitWait(2);
        ZRReportingUtilitySignal(lock, flag);
    });
    EXPECT_TRUE(
        ZRReportingUtilityWait(lock, std::chrono::hours(1'000'000), flag, "waiting", "timeout", category));
    signaller.join();
    EXPECT_THAT(device.log.texts(), testing::ElementsAre("waiting", "continuing", "waiting", "continuing"))
        << "woken by something else first";
    EXPECT_TRUE(ZRReportingUtilityWait(lock, std::chrono::seconds(0), flag, "waiting", "timeout", category));
    EXPECT_EQ(device.log.lines().size(), 4U) << "nothing is written when the flag is set already";
}

TEST(DataSerializeTest, EveryKindOfValue) {
    const std::uint8_t bytes[] = {0, 1, 255};
    const Dictionary list{
        {"array", Array{true, false, Array{}, Dictionary{}}},
        {"data", Value::data(bytes)},
        {"date", Value::date(1772366400.75)},
        {"double", 0.1},
        {"infinite", -std::numeric_limits<double>::infinity()},
        {"int", -5},
        {"k<&>", "a\r\n\"b\" é"},
        {"single", 0.1F},
        {"unsigned", std::numeric_limits<std::uint64_t>::max()},
    };
    const std::string expected = "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n<!DOCTYPE plist>\n"
                                 "<plist version=\"1.0\">\n<dict>\n"
                                 "\t<key>array</key>\n\t<array>\n\t\t<true/>\n\t\t<false/>\n\t\t<array/>\n"
                                 "\t\t<dict/>\n\t</array>\n"
                                 "\t<key>data</key>\n\t<data>AAH/</data>\n"
                                 "\t<key>date</key>\n\t<date>2026-03-01T12:00:00Z</date>\n"
                                 "\t<key>double</key>\n\t<real>0.1</real>\n"
                                 "\t<key>infinite</key>\n\t<real>-infinity</real>\n"
                                 "\t<key>int</key>\n\t<integer>-5</integer>\n"
                                 "\t<key>k&lt;&amp;&gt;</key>\n\t<string>a&#13;\n\"b\" é</string>\n"
                                 "\t<key>single</key>\n\t<real>0.1</real>\n"
                                 "\t<key>unsigned</key>\n\t<integer>18446744073709551615</integer>\n"
                                 "</dict>\n</plist>\n";
    EXPECT_EQ(DataSerialize::getDataXMLInfo(list), expected);
    EXPECT_EQ(DataSerialize::getXMLInfo(list), std::nullopt) << "not ASCII";
    EXPECT_EQ(DataSerialize::getXMLInfo("x"), DataSerialize::getDataXMLInfo("x"));
    EXPECT_THAT(*DataSerialize::getPlistBlob(list), testing::ElementsAreArray(expected));
    EXPECT_EQ(
        DataSerialize::getBase64XMLBlob(true),
        "PD94bWwgdmVyc2lvbj0iMS4wIiBlbmNvZGluZz0iVVRGLTgiPz4KPCFET0NUWVBFIHBsaXN0Pgo8cGxpc3QgdmVyc2lvbj0i"
        "MS4wIj4KPHRydWUvPgo8L3BsaXN0Pgo=");
    const Array unwritable{Dictionary{{"a", "\x01"}}};
    EXPECT_EQ(DataSerialize::getPlistBlob(unwritable), std::nullopt);
    EXPECT_EQ(DataSerialize::getBase64XMLBlob(unwritable), std::nullopt);
}

} // namespace
} // namespace tamblo
