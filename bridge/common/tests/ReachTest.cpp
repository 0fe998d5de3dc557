#include "bridge/common/Endpoint.h"
#include "bridge/common/ServiceReporter.h"
#include "bridge/common/tests/KeptReports.h"
#include "tests/Files.h"
#include "tests/Sockets.h"

#include <gtest/gtest.h>

namespace tamblo::bridge {
namespace {

using namespace std::chrono_literals;

TEST(BridgeEndpoint, isTriedWhenItAppearsAndThenWithGrowingWaits) {
    const TemporaryDirectory directory;
    test::HandClock clock;
    Endpoint place(directory.path("socket"), clock);
    EXPECT_EQ(place.due(), clock.now().steady) << "at the start";
    place.failed();
    EXPECT_EQ(place.due(), std::nullopt) << "there is no file";
    directory.write("other", "");
    place.read();
    EXPECT_EQ(place.due(), std::nullopt);

    const FileDescriptor socket(tamblo::test::boundSocket(SOCK_STREAM, directory.path("socket")));
    place.read();
    EXPECT_EQ(place.due(), clock.now().steady);
    std::chrono::milliseconds waited{0};
    unsigned attempts = 0;
    for (place.failed(); place.due(); place.failed()) {
        const auto wait =
            std::chrono::duration_cast<std::chrono::milliseconds>(*place.due() - clock.now().steady);
        EXPECT_LE(wait, Endpoint::kLongestDelay);
        waited += wait;
        clock.advance(wait);
        ++attempts;
    }
    EXPECT_EQ(attempts, Endpoint::kMostAttempts) << "then it is left alone";
    EXPECT_GT(waited, 15s);
    directory.write("socket.new", "");
    std::filesystem::rename(directory.path("socket.new"), directory.path("socket"));
    place.read();
    EXPECT_EQ(place.due(), clock.now().steady);

    place.connected();
    EXPECT_EQ(place.due(), std::nullopt);
    EXPECT_EQ(place.descriptor(), -1) << "nothing wakes it meanwhile";
    place.lost();
    EXPECT_EQ(place.due(), clock.now().steady + Endpoint::kFirstDelay);
}

class ToldOfIt final : public ReporterListener {
public:
    void reporterCame() override { ++came; }
    void reporterWent() override { ++went; }

    int came = 0;
    int went = 0;
};

TEST(BridgeReporter, givesAServiceUpThatTakesNothing) {
    const TemporaryDirectory directory;
    ServiceReporter reporter(directory.path("socket"));
    ToldOfIt listener;
    reporter.addListener(listener);
    EXPECT_FALSE(reporter.connect());
    EXPECT_EQ(reporter.begin(ServiceType::generic, "player"), kNoSession);

    const FileDescriptor socket(tamblo::test::boundSocket(SOCK_STREAM, directory.path("socket")));
    ASSERT_TRUE(reporter.connect());
    EXPECT_EQ(listener.came, 1);
    const SessionID session = reporter.begin(ServiceType::generic, "player");
    reporter.send(session, client::category(EventKind::volume), EventType::generic,
                  {{"text", std::string(2U << 20U, 'x')}}, WallTime());
    EXPECT_TRUE(reporter.pump()) << "what is longer than the service accepts is left out";
    EXPECT_FALSE(reporter.wantsWriting());
    bool isThere = true;
    std::size_t sent = 0;
    for (; isThere && sent < 100'000; ++sent) {
        reporter.send(session, client::category(EventKind::volume), EventType::generic,
                      {{"text", std::string(200, 'x')}, {"number", sent}}, WallTime());
        isThere = reporter.pump();
        EXPECT_TRUE(!isThere || sent < 1000 || reporter.wantsWriting());
    }
    EXPECT_GT(sent, ServiceReporter::kMostWaiting);
    EXPECT_LT(sent, 2 * ServiceReporter::kMostWaiting);
    EXPECT_EQ(listener.went, 1);
    EXPECT_EQ(reporter.descriptor(), -1);
    ASSERT_TRUE(reporter.connect());
    EXPECT_EQ(listener.came, 2);
    EXPECT_NE(reporter.begin(ServiceType::generic, "player"), session);
}

} // namespace
} // namespace tamblo::bridge
