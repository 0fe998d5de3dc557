#include "service/ServiceStatus.h"
#include "tests/service_core/ServiceTestBase.h"

#include <optional>

namespace tamblo {
namespace {

using namespace std::chrono_literals;

class ServiceStatusTest : public ServiceTestBase {
protected:
    std::vector<SessionRow> sessions() {
        std::vector<SessionRow> shown;
        status.sessions([&shown](std::vector<SessionRow> rows) { shown = std::move(rows); });
        (void)run();
        return shown;
    }

    ServiceStatus status{device.context(), *service};
};

TEST_F(ServiceStatusTest, LengthsAreTheClocksEvenWhereItWasSetBack) {
    const Connection client = connect(10);
    client->object().createReportingSession(7, {});
    (void)run();
    EXPECT_EQ(sessions().at(0).length, std::nullopt);
    client->object().startReportingSessionForID(7, {});
    (void)run();
    const WallTime start = device.clock.now();
    device.clock.advance(90s);
    EXPECT_EQ(sessions().at(0).length, std::chrono::nanoseconds(90s));
    device.clock.set(start - 1h);
    EXPECT_EQ(sessions().at(0).start, start);
    EXPECT_EQ(sessions().at(0).length, std::chrono::nanoseconds(-1h));
    client->object().stopReportingSessionForID(7, {});
    (void)run();
    device.clock.advance(1min);
    EXPECT_EQ(sessions().at(0).length, std::chrono::nanoseconds(-1h)) << "up to the stop";
}

} // namespace
} // namespace tamblo
