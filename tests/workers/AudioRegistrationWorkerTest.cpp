#include "tests/workers/WorkerTest.h"
#include "workers/accessories/AccessoryRegistry.h"
#include "workers/accessories/ZRReportingSessionAudioRegistrationWorker.h"

namespace tamblo {
namespace {

const WallTime kNow{1'772'366'400s}; ///< of the fake clock: 2026-03-01, 12:00
const std::string kEntry = R"("first_seen":"2025-12-31","last_seen":"2026-02-28","last_reported":)";

TEST(AccessoryRegistryTest, ReportsEachAccessoryOnceInADay) {
    const std::string day = R"("last_seen_day":"2026-03-01","model":"m"})";
    const std::string known = R"({"first_seen_day":"2025-12-31",)" + day;
    const std::string isNew = R"({"first_seen_day":"2026-03-01",)" + day;
    const auto reportedAgo = [](std::chrono::seconds time) {
        return "{" + kEntry + std::to_string((kNow - time).time_since_epoch() / 1s) + "}";
    };
    const struct {
        std::string kept; ///< of the accessory that is seen
        std::string report;
        bool hadRubbish = false;
    } cases[] = {
        {reportedAgo(24h - 1s), ""},
        {reportedAgo(24h), known},
        // A clock that was set back, a little or by years.
        {reportedAgo(-24h + 1s), ""},
        {reportedAgo(-24h), known},
        {R"({"first_seen":"2031-01-01","last_seen":"2031-01-01","last_reported":1.5})", isNew},
        // What is no entry.
        {"7", isNew, true},
        {R"({"first_seen":"2026-02-28","last_seen":"yesterday","last_reported":1})", isNew, true},
        {R"({"first_seen":5,"last_seen":"2026-02-28","last_reported":1})", isNew, true},
        {R"({"first_seen":"2026-02-28","last_seen":"2026-02-28","last_reported":"1"})", isNew, true},
    };
    const Accessory seen[] = {{"a", "m"}};
    for (const auto& c : cases) {
        const Value kept = std::get<Value>(readJson("{\"a\":" + c.kept + ",\"b\":{" + kEntry + "1.0}}"));
        const AccessoryRegistry::Update update = AccessoryRegistry::update(kept, seen, kNow);
        EXPECT_EQ(update.reports.empty() ? "" : jsonText(update.reports[0]), c.report) << c.kept;
        EXPECT_EQ(update.hadRubbish, c.hadRubbish) << c.kept;
        const Dictionary& entry = update.registered.find("a")->dictionaryValue();
        EXPECT_EQ(*entry.find("last_seen"), Value("2026-03-01"));
        EXPECT_EQ(entry.find("last_reported")->doubleValue() == secondsSince1970(kNow), !c.report.empty());
        EXPECT_EQ(*update.registered.find("b"), *kept.dictionaryValue().find("b")) << "of another one";
    }
}

TEST(AccessoryRegistryTest, ForgetsThoseUnseenForTheLongestTime) {
    Dictionary kept;
    for (int i = 0; i < 65; ++i) {
        const std::string day = i == 40 ? "2019-01-01" : i == 50 ? "2031-01-01" : "2026-02-28";
        kept.set("k" + std::to_string(i),
                 Dictionary{{"first_seen", day}, {"last_seen", day}, {"last_reported", 1}});
    }
    const Accessory seen[] = {{"new", ""}};
    AccessoryRegistry::Update update = AccessoryRegistry::update(Value(kept), {}, kNow);
    EXPECT_THAT(update.registered, SizeIs(64));
    EXPECT_FALSE(update.registered.contains("k50")) << "of a clock that was wrong";
    update = AccessoryRegistry::update(Value(kept), seen, kNow);
    EXPECT_THAT(update.registered, SizeIs(64));
    EXPECT_FALSE(update.registered.contains("k40"));
    EXPECT_EQ(*update.reports.at(0).find("model"), Value("unknown"));

    std::vector<Accessory> many;
    for (int i = 0; i < 70; ++i) {
        many.push_back({std::to_string(i), "m"});
    }
    update = AccessoryRegistry::update(std::nullopt, many, kNow);
    EXPECT_THAT(update.reports, SizeIs(64));
    EXPECT_THAT(AccessoryRegistry::update(Value(update.registered), many, kNow).reports, IsEmpty());
}

class AudioRegistrationWorkerTest : public WorkerTest {
protected:
    AudioRegistrationWorkerTest() : WorkerTest(LogLevel::info) {}
    /// Starts a session, some time after the one before, and has what it posted run; the number of reports
    /// that there are then.
    std::size_t startSession(std::chrono::seconds later = 1min) {
        device.clock.advance(later);
        (void)startedSession();
        (void)device.serverQueue().runAll();
        return reports();
    }
    [[nodiscard]] std::size_t reports() const {
        return device.analyticsEvents.payloads("com.vandra.tamblo.accessoryregistration").size();
    }
    [[nodiscard]] std::string kept() const {
        const auto value = device.preferences.copyPreferenceValue("registered", kDomain);
        return value ? jsonText(*value) : "";
    }
    static constexpr const char* kDomain = "com.vandra.tamblo.accessories";
};

TEST_F(AudioRegistrationWorkerTest, LooksAtMostOnceAMinuteAndKeepsWhatItSaw) {
    device.accessories.earbuds = {{"a", "m"}};
    device.analyticsEvents.setEventsInUse({{"other"}});
    startSession(0s);
    EXPECT_EQ(device.accessories.lookups, 0) << "nobody wants the event";
    device.analyticsEvents.setEventsInUse(std::nullopt);
    (void)startedSession();
    EXPECT_EQ(reports(), 0U) << "sent on the server queue";
    EXPECT_EQ(startSession(0s), 1U);
    EXPECT_EQ(kept(),
              R"({"a":{"first_seen":"2026-03-01","last_reported":1772366400.0,"last_seen":"2026-03-01"}})");
    const struct {
        std::chrono::seconds step;
        int lookups;
        std::size_t events;
    } cases[] = {{59s, 1, 1}, {1s, 2, 1}, {-3600s, 3, 1}, {59s, 3, 1}, {90'000s, 4, 2}, {-600'000s, 5, 3}};
    for (const auto& c : cases) {
        EXPECT_EQ(startSession(c.step), c.events);
        EXPECT_EQ(device.accessories.lookups, c.lookups);
    }
}

TEST_F(AudioRegistrationWorkerTest, RubbishIsOneLineAndReplaced) {
    startSession();
    EXPECT_EQ(kept(), "") << "nothing to keep";
    device.preferences.set("registered", kDomain, Array{1});
    startSession();
    EXPECT_EQ(kept(), "{}");
    EXPECT_EQ(loggedLevels(ZRReportingAudioRegistrationCategory()), "e");
    device.accessories.earbuds = {{"a", "m"}};
    startSession();
    EXPECT_EQ(startSession(), 1U);
    EXPECT_EQ(loggedLevels(ZRReportingAudioRegistrationCategory()), "");
}

} // namespace
} // namespace tamblo
