#include "client/Client.h"
#include "tests/service/ServiceProcess.h"

#include <gmock/gmock.h>
#include <nlohmann/json.hpp>

#include <chrono>
#include <cstdio>
#include <memory>
#include <string>
#include <vector>

// What a real service derives from a session, and what tambloctl shows of it.

namespace tamblo::test {
namespace {

using Json = nlohmann::json;
using testing::ElementsAre;
using testing::HasSubstr;

/// The values of some keys of each event of this name, in the order of the keys.
std::vector<std::string> shown(const ServiceProcess& service, const std::string& name,
                               const std::vector<std::string>& keys) {
    std::vector<std::string> found;
    for (const std::string& line : service.events()) {
        const Json event = Json::parse(line);
        if (event["event"] != name) {
            continue;
        }
        std::string& text = found.emplace_back();
        for (const std::string& key : keys) {
            text += (text.empty() ? "" : " ") + event["payload"].value(key, Json("-")).dump();
        }
    }
    return found;
}

double secondsSince1970() {
    return std::chrono::duration<double>(std::chrono::system_clock::now().time_since_epoch()).count();
}

TEST(Summaries, OfASessionWithTimesOfItsOwn) {
    ServiceProcess service;
    client::Client client({.socketPath = service.socketPath()});
    const double start = secondsSince1970() - 600;
    const auto send = [&](double time, Dictionary payload) {
        payload.set("zrreporting_timestamp", start + time);
        EXPECT_TRUE(client.post(payload, client::category(client::EventKind::playback),
                                client::EventType::generic, {7}));
    };
    client.createReportingSession(7, nullptr);
    client.setServiceType(client::ServiceType::telephony, 7, nullptr);
    client.setConfiguration({{"HostApplicationDisplayID", "phone"}}, 7, nullptr);
    client.startReportingSessionForID(7, nullptr);
    // The second message is sent late; its time counts.
    send(0, {{"session_output_running", true},
             {"session_input_running", true},
             {"active_devices", "Receiver"},
             {"QVSessionVolume", 0.4},
             {"ringerstate", false},
             {"spatial-audio-accessory-feature", false},
             {"spatializationEnabled", false},
             {"kaleen_session", 1},
             {"vp_config_primary_vocoder", "EVS"},
             {"vp_config_primary_vocoderFs", "32000"}});
    send(100, {{"spatial-audio-accessory-feature", true}});
    send(30, {{"active_devices", "Headset"},
              {"vp_config_primary_vocoder", "none"},
              {"vp_config_primary_vocoderFs", "0.0"}});
    send(104, {{"spatializationEnabled", true}});
    send(104.25, {{"QVSessionVolume", 0.6}, {"issue_type", "overload"}});
    for (int i = 0; i < 4; ++i) {
        send(105 + i, {{"QVSessionVolume", 0.6}, {"issue_type", "overload"}});
    }
    send(120.5, {{"session_output_running", false}, {"session_duration", 120.0}});
    ASSERT_TRUE(client.stopReportingSessionForID(7).get().ok());

    EXPECT_THAT(shown(service, "com.vandra.tamblo.Volume.Summary",
                      {"play_seconds", "play_secondsBucketed", "QVSessionVolume", "QVSessionVolumeBucketed",
                       "active_devices", "spatializationEnabled", "msgidx", "msgcnt"}),
                ElementsAre(R"(30.0 "30" 0.4 "0.375" "Receiver" false 1 3)",
                            R"(74.0 "60" 0.4 "0.375" "Headset" false 2 3)",
                            R"(16.25 "15" 0.6 "0.625" "Headset" true 3 3)"));
    EXPECT_THAT(shown(service, "com.vandra.telephony.Kaleen.Summary", {"play_seconds", "active_devices"}),
                ElementsAre(R"(30.0 "Receiver")", R"(90.5 "Headset")"));
    EXPECT_THAT(shown(service, "com.vandra.tamblo.Input.Summary",
                      {"inputrunning_seconds", "active_devices", "vocoders", "HostApplicationDisplayID"}),
                ElementsAre(R"(30.0 "Receiver" "EVS:32000" "phone")", R"(90.5 "Headset" "-" "phone")"));
    const std::vector<std::string> counts{
        "num_messages",      "num_unique_messages", "num_redundant_messages", "active_count",
        "total_active_time", "overload_count",      "summaryServiceName"};
    EXPECT_THAT(shown(service, "com.vandra.tamblo.Session_Generic.Summary", counts),
                ElementsAre(R"(15 11 4 1 120.0 1 "telephony")"))
        << "ten of the client's, five summaries";

    // The next run counts its own messages, and all activity.
    client.startReportingSessionForID(7, nullptr);
    for (const int n : {1, 1, 2, 3, 3, 3, 4, 4, 5, 6}) {
        send(200, {{"n", n}});
    }
    ASSERT_TRUE(client.stopReportingSessionForID(7).get().ok());
    EXPECT_EQ(shown(service, "com.vandra.tamblo.Session_Generic.Summary", counts).back(),
              R"(10 6 4 1 120.0 1 "telephony")");
    EXPECT_EQ(service.countEvents("com.vandra.tamblo.Volume.Summary"), 3U);
}

/// A run of tambloctl that has begun.
class Tambloctl {
public:
    Tambloctl(const ServiceProcess& service, const std::string& logs, const std::string& arguments)
        : output_(::popen(("RUNTIME_DIRECTORY=" + (service.directory() / "run").string() +
                           " LOGS_DIRECTORY=" + logs + " " TAMBLOCTL_PATH " " + arguments)
                              .c_str(),
                          "r")) {}
    ~Tambloctl() { ::pclose(output_); }
    Tambloctl(const Tambloctl&) = delete;
    Tambloctl& operator=(const Tambloctl&) = delete;

    std::string output() {
        std::string text;
        char piece[4096];
        for (std::size_t count = 1; count > 0;) {
            count = std::fread(piece, 1, sizeof piece, output_);
            text.append(piece, count);
        }
        return text;
    }

private:
    std::FILE* output_;
};

TEST(Summaries, AreShownByTambloctl) {
    ServiceProcess service;
    const std::string logs = service.logs();
    // All stop at about the same time.
    std::vector<std::unique_ptr<Tambloctl>> runs;
    for (const char* number : {"1", "2", "3", "4"}) {
        const std::string application = std::string("application") + number;
        runs.push_back(std::make_unique<Tambloctl>(
            service, logs,
            "session --json --fast --recorded-spacing --service-type telephony --play " EXAMPLES_DIR
            "/call.jsonl --reporter " +
                std::string(number) + R"( --configuration '{"HostApplicationDisplayID":")" + application +
                R"("}')"));
    }
    for (std::size_t i = 0; i < runs.size(); ++i) {
        const Json report = Json::parse(runs[i]->output());
        std::string kinds;
        for (const Json& summary : report["summaries"]) {
            kinds += summary["event"].get<std::string>().substr(18, 1);
            EXPECT_EQ(summary["payload"]["HostApplicationDisplayID"], "application" + std::to_string(i + 1));
        }
        EXPECT_EQ(kinds, "VVVVSII");
        EXPECT_FALSE(report.contains("summaries_missing"));
    }
    EXPECT_THAT(Tambloctl(service, logs, "session --reporter 5").output(),
                HasSubstr("\nsession  (com.vandra."));
    EXPECT_EQ(Tambloctl(service, logs, "session --reporter 6 --quiet").output(), "");
    EXPECT_THAT(Tambloctl(service, logs + "/nowhere", "session --reporter 7").output(),
                HasSubstr("no summaries: cannot read " + logs + "/nowhere/analytics-events.jsonl: No such"));
    writeFile(service.preferenceFile("com.vandra.tamblo.analytics"), R"({"events_in_use": []})");
    EXPECT_THAT(Tambloctl(service, logs, "session --reporter 8").output(),
                HasSubstr("no summaries: none came to "));
}

} // namespace
} // namespace tamblo::test
