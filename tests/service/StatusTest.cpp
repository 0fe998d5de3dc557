#include "tests/service/RealService.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <nlohmann/json.hpp>

#include <atomic>
#include <map>
#include <regex>
#include <sstream>
#include <string>
#include <thread>
#include <vector>

namespace tamblo::test {

namespace {

using nlohmann::json;

json statusJson(const ServiceProcess& service, const std::string& line) {
    return json::parse(statusText(service, line));
}

/// The samples of a metrics text by their names and labels.
std::map<std::string, double> samplesOf(const std::string& metrics) {
    std::map<std::string, double> samples;
    std::istringstream lines(metrics);
    for (std::string line; std::getline(lines, line);) {
        const std::size_t space = line.rfind(' ');
        if (!line.starts_with('#') && space != line.npos) {
            samples[line.substr(0, space)] = std::stod(line.substr(space + 1));
        }
    }
    return samples;
}

std::map<std::string, double> metricsOf(const ServiceProcess& service) {
    return samplesOf(statusText(service, "metrics"));
}

/// Sends a message of two keys, and has its answer.
void tell(RawClient& client, std::int64_t reporterID, int value) {
    ASSERT_TRUE(client.call(message({{"volume", value}, {"route", "speaker"}}, {reporterID})));
}

} // namespace

TEST(Status, CountersSayWhatBecameOfMessagesAndSurviveAKill) {
    ServiceProcess service;
    {
        Session session(service.socketPath(), 7);
        tell(session, 7, 1);
        tell(session, 7, 1);
        tell(session, 7, 2);
        tell(session, 99, 3);
        wire::Request beyond = request(Method::sendMessage);
        beyond.reporterIDs.assign(129, 7);
        ASSERT_TRUE(session.call(std::move(beyond)));
        auto now = metricsOf(service);
        EXPECT_EQ(now["tamblo_messages_received_total"], 5);
        EXPECT_EQ(now["tamblo_messages_recorded_total"], 2);
        EXPECT_EQ(now["tamblo_messages_redundant_total"], 1);
        EXPECT_EQ(now[R"(tamblo_messages_lost_total{stage="session",reason="no_session"})"], 1);
        EXPECT_EQ(now[R"(tamblo_messages_refused_total{stage="decode",reason="limit"})"], 1);
        EXPECT_EQ(now[R"(tamblo_limits_hit_total{limit="reporters_of_message"})"], 1);
        EXPECT_EQ(now[R"(tamblo_requests_total{method="sendMessage"})"], 4);
        EXPECT_EQ(now[R"(tamblo_request_errors_total{method="sendMessage",error="limit"})"], 1);
        EXPECT_EQ(now["tamblo_sessions"], 1);
        EXPECT_GT(now["tamblo_retained_bytes"], 0);
        EXPECT_EQ(now["tamblo_request_duration_seconds_count"], now["tamblo_request_wait_seconds_count"]);
        EXPECT_GE(now["tamblo_request_duration_seconds_count"], 7);
        const auto lines = linesOf(service.logs() / "analytics-events.jsonl").size();
        EXPECT_EQ(now[R"(tamblo_sink_lines_total{sink="analytics-events"})"], static_cast<double>(lines));
        EXPECT_EQ(now[R"(tamblo_sink_bytes_total{sink="analytics-events"})"],
                  static_cast<double>(std::filesystem::file_size(service.logs() / "analytics-events.jsonl")));
    }
    service.signal(SIGKILL);
    ASSERT_TRUE(service.awaitEnd());
    service.start();
    auto after = metricsOf(service);
    EXPECT_EQ(after["tamblo_starts_total"], 2);
    EXPECT_EQ(after["tamblo_messages_received_total"], 5);
    EXPECT_EQ(after["tamblo_sessions"], 0);

    // Another boot's, or what is no such file, begins anew.
    service.stop();
    std::string bytes = contentOf(service.runtimeDirectory() + "/counters");
    bytes[30] ^= 1;
    writeFile(service.runtimeDirectory() + "/counters", bytes);
    service.start();
    EXPECT_EQ(metricsOf(service)["tamblo_starts_total"], 1);
}

TEST(Status, IsServedOnTheSecondSocketThatTheServiceManagerPassesOn) {
    const TemporaryDirectory directory;
    const int clients = boundSocket(SOCK_STREAM, directory.path("clients"));
    const int readers = boundSocket(SOCK_STREAM, directory.path("readers"));
    {
        const ServiceProcess service({.beforeExec = [clients, readers] {
            // Whatever numbers they have now.
            const int second = ::fcntl(readers, F_DUPFD, 64);
            ::dup2(::fcntl(clients, F_DUPFD, 64), 3);
            ::dup2(second, 4);
            ::setenv("LISTEN_PID", std::to_string(::getpid()).c_str(), 1);
            ::setenv("LISTEN_FDS", "2", 1);
        }});
        EXPECT_FALSE(std::filesystem::exists(service.runtimeDirectory() + "/com.vandra.tamblo.status"));
        EXPECT_TRUE(RawClient(directory.path("clients")).call(Method::getAllReporters));
        const CommandResult status = service.tambloctl("status --socket " + directory.path("readers"));
        EXPECT_EQ(status.status, 0) << status.output;
    }
    ::close(clients);
    ::close(readers);
}

TEST(Status, MetricsHaveTheirForm) {
    const ServiceProcess service;
    const std::string open = statusText(service, "metrics");
    EXPECT_TRUE(open.ends_with("# EOF\n"));
    const std::regex sample(R"re(tamblo_[a-z_]+(\{([a-z_]+="[^"\\]*",?)+\})? [0-9.e+-]+)re");
    std::istringstream lines(open);
    std::string family;
    for (std::string line; std::getline(lines, line);) {
        if (line.starts_with("# HELP ")) {
            family = line.substr(7, line.find(' ', 7) - 7);
        } else if (!line.starts_with("#")) {
            EXPECT_TRUE(std::regex_match(line, sample)) << line;
            EXPECT_TRUE(line.starts_with(family)) << line;
        }
    }
    EXPECT_EQ(samplesOf(statusText(service, "metrics plain")).count("tamblo_starts_created"), 0U);

    // As a monitoring system asks.
    const StatusReader scraper(service);
    scraper.send(
        "GET /metrics HTTP/1.1\r\nHost: tamblo\r\nAccept: application/openmetrics-text;q=0.9\r\n\r\n");
    const std::string answer = scraper.rest();
    const std::size_t body = answer.find("\r\n\r\n") + 4;
    EXPECT_TRUE(answer.starts_with("HTTP/1.1 200 OK\r\n")) << answer.substr(0, body);
    EXPECT_NE(answer.find("Content-Type: application/openmetrics-text"), answer.npos);
    EXPECT_NE(answer.find("Content-Length: " + std::to_string(answer.size() - body) + "\r\n"), answer.npos);
}

TEST(Status, ReadersAreSentOneDocumentAndTheEnd) {
    const ServiceProcess service({.preferences = {{"com.vandra.tamblo.limits", R"({"key_bytes": 99})"}}});
    const StatusReader silent(service);
    const json status = json::parse(silent.rest());
    EXPECT_EQ(status["pid"], service.pid());
    EXPECT_EQ(status["sinks"].size(), 8U);
    EXPECT_EQ(status["is_complete"], true);
    for (const json& limit : status["limits"]) {
        const bool isChanged = limit["name"] == "key_bytes";
        EXPECT_EQ(limit["source"] != "default", isChanged) << limit;
        EXPECT_EQ(limit["value"] == 99, isChanged) << limit;
    }
    // What is written meanwhile is not in force.
    writeFile(service.preferenceFile("com.vandra.tamblo.sinks"), R"({"file_mode": "0666"})");
    const json later = statusJson(service, "status");
    for (const json& setting : later["settings"]) {
        if (setting["name"] == "file_mode") {
            EXPECT_EQ(setting["value"], "0600");
            EXPECT_EQ(setting["source"], "default");
        }
    }
    const StatusReader ended(service);
    ended.send("clients");
    ended.endSending();
    EXPECT_EQ(json::parse(ended.rest())["clients"].size(), 0U);
    EXPECT_TRUE(statusJson(service, "tea").contains("error"));
    EXPECT_TRUE(statusJson(service, "session x").contains("error"));
}

TEST(Status, ClientsAndSessionsAreShownWithWhatTheyHave) {
    const ServiceProcess service;
    Session session(service.socketPath(), 7);
    Session other(service.socketPath(), -3, 5);
    tell(session, 7, 1);
    tell(session, 7, 2);
    const json clients = statusJson(service, "clients")["clients"];
    ASSERT_EQ(clients.size(), 2U);
    EXPECT_EQ(clients[0]["pid"], ::getpid());
    EXPECT_EQ(clients[0]["messages"], 2);
    EXPECT_EQ(clients[1]["messages"], 0);
    EXPECT_GT(clients[0]["bytes"], clients[1]["bytes"]);
    EXPECT_GT(clients[0]["seconds"], 0);
    EXPECT_EQ(clients[0]["started_sessions"], 1);
    const json sessions = statusJson(service, "sessions")["sessions"];
    ASSERT_EQ(sessions.size(), 2U);
    EXPECT_EQ(sessions[0]["reporter"], 7);
    EXPECT_EQ(sessions[0]["recorded"], 2);
    EXPECT_EQ(sessions[1]["reporter"], -3);
    EXPECT_EQ(sessions[0]["retained_bytes"], clients[0]["retained_bytes"]);
    EXPECT_GT(sessions[0]["seconds"], 0);
    EXPECT_LT(sessions[0]["seconds"], clients[0]["seconds"]); // which have been read and decoded, too
    const json shown = statusJson(service, "session 7")["sessions"];
    ASSERT_EQ(shown.size(), 1U);
    EXPECT_EQ(shown[0]["previous_values"]["volume"], 2);
    EXPECT_FALSE(shown[0]["workers"].empty());
    EXPECT_TRUE(statusJson(service, "session 8")["sessions"].empty());

    EXPECT_EQ(json::parse(service.tambloctl("sessions --json").output)["sessions"].size(), 2U);
    EXPECT_NE(service.tambloctl("session show 7").output.find("\"speaker\""), std::string::npos);
    EXPECT_EQ(service.tambloctl("session show 8").status, 1);
    EXPECT_EQ(service.tambloctl("session show 8 --json").status, 1);
    const CommandResult status = service.tambloctl("status");
    // Both are connections of this process.
    const std::string program = clients[0]["process"];
    EXPECT_NE(status.output.find("2 clients: " + program + " (2)\n2 sessions"), std::string::npos)
        << status.output;
    EXPECT_EQ(status.status, 0);
    // No terminal: one picture below the other, and no key is waited for.
    const CommandResult top = service.tambloctl("top --count 2 --interval 0.1 --sessions --sort retained");
    EXPECT_EQ(countOf("2 sessions by retained", top.output), 2U) << top.output;
    EXPECT_EQ(service.tambloctl("top --sort tea").status, 2);
}

TEST(Status, AReaderThatNeverReadsIsLetGoAndTenThousandSessionsAreListed) {
    const ServiceProcess service;
    RawClient client(service.socketPath());
    for (std::int64_t i = 1; i <= 10'000; ++i) {
        ASSERT_TRUE(client.send(framesOf(request(Method::createReportingSession, i))));
    }
    ASSERT_TRUE(client.call(Method::reporterID, 1));
    const StatusReader stuck(service);
    stuck.send("sessions\n");
    const json all = statusJson(service, "sessions");
    ASSERT_EQ(all["sessions"].size(), 10'000U);
    EXPECT_EQ(all["sessions"][9'999]["reporter"], 10'000);
    EXPECT_TRUE(eventually([&] {
        return metricsOf(service)[R"(tamblo_status_readers_let_go_total{reason="does_not_read"})"] == 1;
    }));
    EXPECT_LT(stuck.rest().size(), 2'000'000U);
}

TEST(Status, TooLongALineIsToldAsOneAndTheConnectionEndsInOrder) {
    const ServiceProcess service;
    const std::string filter = "tap {\"event\":\"" + std::string(8192, 'x') + "\"}\n";
    for (const std::string& line :
         {std::string(150'000, 'x') + "\n", filter, "tap tea\n" + std::string(20'000, 'x')}) {
        const StatusReader reader(service);
        reader.send(line);
        errno = 0;
        const std::string text = reader.rest();
        EXPECT_EQ(errno, 0) << line.substr(0, 20);
        EXPECT_EQ(text.find("8192") != text.npos, !line.starts_with("tap tea")) << text;
        EXPECT_TRUE(json::parse(text).contains("error"));
    }
}

TEST(Status, AUserWithManyReadersKeepsNobodyOut) {
    const ServiceProcess service;
    if (::geteuid() != 0) {
        GTEST_SKIP() << "nobody else can be had";
    }
    ::chmod((service.runtimeDirectory() + "/com.vandra.tamblo.status").c_str(), 0666);
    ::chmod(service.runtimeDirectory().c_str(), 0711);
    ::chmod(std::filesystem::path(service.runtimeDirectory()).parent_path().c_str(), 0711);
    ASSERT_EQ(::seteuid(65'534), 0);
    std::vector<StatusReader> held;
    for (int i = 0; i != 16; ++i) {
        held.emplace_back(service);
        held.back().send("sta");
    }
    EXPECT_TRUE(
        eventually([&] { return statusText(service, "status").find("16 readers") != std::string::npos; }));
    ASSERT_EQ(::seteuid(0), 0);
    EXPECT_EQ(statusJson(service, "status")["pid"], service.pid());
    EXPECT_EQ(metricsOf(service)[R"(tamblo_status_readers_let_go_total{reason="too_many_of_user"})"], 1);
    EXPECT_EQ(held[0].rest(), "");
}

TEST(Status, SixteenReadersAreServedAndOthersAreTold) {
    const ServiceProcess service;
    std::vector<StatusReader> held;
    for (int i = 0; i != 16; ++i) {
        held.emplace_back(service);
        held.back().send("sta");
    }
    EXPECT_TRUE(
        eventually([&] { return statusText(service, "status").find("16 readers") != std::string::npos; }));
    for (const StatusReader& reader : held) {
        reader.send("tus\n");
    }
    for (const StatusReader& reader : held) {
        EXPECT_TRUE(json::parse(reader.rest()).contains("version"));
    }
    // A thousand at once: each is served, or told that it is not.
    std::atomic<int> served = 0;
    std::atomic<int> told = 0;
    std::vector<std::thread> threads;
    for (int thread = 0; thread != 8; ++thread) {
        threads.emplace_back([&] {
            std::vector<StatusReader> readers;
            for (int i = 0; i != 125; ++i) {
                readers.emplace_back(service);
                readers.back().send("status\n");
            }
            for (const StatusReader& reader : readers) {
                const json answer = json::parse(reader.rest(), nullptr, false);
                served += answer.contains("version") ? 1 : 0;
                told += answer.contains("error") ? 1 : 0;
            }
        });
    }
    for (std::thread& thread : threads) {
        thread.join();
    }
    EXPECT_EQ(served + told, 1000);
    EXPECT_GE(served, 16);
    EXPECT_EQ(statusJson(service, "status")["pid"], service.pid());
}

} // namespace tamblo::test
