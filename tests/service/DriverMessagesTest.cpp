#include "tests/service/RawClient.h"
#include "tests/service/ServiceProcess.h"

#include <gmock/gmock.h>
#include <nlohmann/json.hpp>

#include <filesystem>
#include <functional>
#include <string>
#include <string_view>
#include <vector>

// What drivers publish during a session, from their files to the messages of a real service.

namespace tamblo::test {
namespace {

using Json = nlohmann::json;
using wire::Method;

/// What the session was told of the drivers, each by its kind.
Json driverEvents(const ServiceProcess& service) {
    constexpr std::string_view kEvent = "com.vandra.tamblo.Chanlog.";
    Json found = Json::object();
    for (const std::string& line : service.events()) {
        const Json event = Json::parse(line);
        const auto name = event["event"].get<std::string>();
        if (name.starts_with(kEvent)) {
            for (const auto& [key, value] : event["payload"].items()) {
                if (key.starts_with("HapticEngine")) {
                    found[name.substr(kEvent.size())][key] = value;
                }
            }
        }
    }
    return found;
}

TEST(DriverMessages, ASessionIsToldWhatItsTimeHasAdded) {
    ServiceProcess service;
    const auto directory = service.directory() / "run/chanlog";
    std::filesystem::create_directories(directory);
    const auto publish = [&directory](int count) {
        const std::string n = std::to_string(count);
        const std::string names =
            R"("driver": "Haptic_Engine<0>", "group": "Haptics", "subgroup": "Stats", )";
        writeFile(directory / "haptics.json.new",
                  "[{" + names + R"("name": "buffers played", "format": "simple", "value": )" + n + "}, {" +
                      names + R"("name": "state", "format": "state", "states": [)" +
                      R"({"name": "idle", "transitions": 1, "residency": )" + n + R"(},)" +
                      R"({"name": "running", "transitions": 1, "residency": 7}]}, {)" + names +
                      R"("name": "wake_up", "unit": "us", "format": "histogram", "min": 12, "max": 381,)" +
                      R"("buckets": [{"lower": 0, "upper": 100, "hits": )" + n + "}]}]");
        std::filesystem::rename(directory / "haptics.json.new", directory / "haptics.json");
    };
    publish(10);
    writeFile(directory / "broken.json", R"([{"driver": "HapticEngine", "gro)");
    const auto duringASession = [&service](const std::function<void()>& act) {
        RawClient client(service.socketPath());
        startSession(client, 7);
        act();
        EXPECT_TRUE(client.call(request(Method::stopReportingSessionForID, 7)));
    };
    duringASession([] {});
    EXPECT_EQ(driverEvents(service), Json::object());
    duringASession([&publish] { publish(15); });
    EXPECT_EQ(driverEvents(service), Json::parse(R"({
        "Simple": {"HapticEngine_Haptics_Stats_Simple_buffersplayed": 5},
        "Histogram": {"HapticEngine_Haptics_Stats_Histogram_wakeup":
                      "count=1,lower=0,upper=100,min=12,max=381,unit=us::0-100:5"},
        "State": {"HapticEngine_Haptics_Stats_State_state":
                  "name:idle,transition:0,residency:5,duty_cycle:1.000000;"}})"));

    const std::size_t count = service.events().size();
    duringASession([&publish] { publish(2); }); // a driver that begins anew
    duringASession([&directory] { std::filesystem::remove(directory / "haptics.json"); });
    const std::vector<std::string> events = service.events();
    EXPECT_GT(events.size(), count);
    for (std::size_t i = count; i < events.size(); ++i) {
        EXPECT_THAT(events[i], testing::Not(testing::HasSubstr("HapticEngine")));
    }
    const std::string log = service.errorOutput();
    for (const char* line :
         {"broken.json: line 1, column ", "Haptic_Engine<0>/Haptics/Stats/state: a counter has run backwards",
          "Haptic_Engine<0>/Haptics/Stats/wake_up: a counter has run backwards"}) {
        const std::size_t first = log.find(line);
        EXPECT_NE(first, std::string::npos) << line;
        EXPECT_EQ(log.find(line, first + 1), std::string::npos) << line;
    }
}

} // namespace
} // namespace tamblo::test
