#include "client/Client.h"
#include "tests/service/ServiceProcess.h"

#include <gtest/gtest.h>

#include <atomic>
#include <csignal>

// The client library through the death of a real service and its return.

namespace tamblo::test {
namespace {

using client::Client;
using client::ConnectionState;

TEST(ClientRestart, SessionsAreMadeAnewAndWhatWaitedArrives) {
    ServiceProcess service;
    std::atomic<int> connections{0};
    std::atomic<int> losses{0};
    std::atomic<Client*> reporter{nullptr};
    Client client({.socketPath = service.socketPath(), .onState = [&](ConnectionState state) {
                       losses += state == ConnectionState::lost ? 1 : 0;
                       if (state != ConnectionState::connected) {
                           return;
                       }
                       ++connections;
                       while (reporter == nullptr) { // the constructor has yet to return
                       }
                       (*reporter).createReportingSession(7, nullptr);
                       (*reporter).setServiceType(client::ServiceType::telephony, 7, nullptr);
                       (*reporter).startReportingSessionForID(7, nullptr);
                   }});
    reporter = &client;
    const auto report = [&client](int number) {
        return client.sendMessage({{"number", number}}, client::category(client::EventKind::playback),
                                  client::EventType::generic, std::vector<std::int64_t>{7});
    };
    EXPECT_TRUE(report(1).get().ok());

    service.signal(SIGKILL);
    EXPECT_EQ(service.awaitEnd(), -SIGKILL);
    EXPECT_TRUE(eventually([&losses] { return losses == 1; }));
    auto waiting = report(2);
    service.start();
    EXPECT_TRUE(waiting.get().ok());
    EXPECT_EQ(connections, 2);
    EXPECT_EQ(service.countEvents("com.vandra.telephony.Playback.Generic"), 2U);
    EXPECT_TRUE(client.stopReportingSessionForID(7).get().ok());
}

} // namespace
} // namespace tamblo::test
