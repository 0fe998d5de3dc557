#include "platform/linux/connections/LinuxConnectionService.h"
#include "platform/linux/loop/LinuxWorkQueues.h"
#include "tests/Sockets.h"
#include "tests/platform/LinuxServiceSupport.h"
#include "wire/Protocol.h"

#include <atomic>
#include <thread>

#include <sys/epoll.h>
#include <sys/socket.h>

namespace tamblo {
namespace {

using namespace testing;

std::atomic<int> additionsToRefuse{0};

/// The kernel, but for additions that it refuses as if the user had no watches left.
int refusingControl(int epoll, int operation, int descriptor, epoll_event* event) {
    if (operation == EPOLL_CTL_ADD && additionsToRefuse > 0) {
        --additionsToRefuse;
        errno = ENOSPC;
        return -1;
    }
    return ::epoll_ctl(epoll, operation, descriptor, event);
}

/// Accepts everybody and notes what becomes of them, on the loop's thread.
class Delegate final : public ListenerDelegate {
public:
    bool shouldAcceptNewConnection(ClientConnection& connection) override {
        connection.setInterruptionHandler([this] { trace += "interrupted "; });
        connection.setInvalidationHandler([this] { trace += "invalidated "; });
        connection.resume();
        return true;
    }
    std::string trace;
};

FileDescriptor connectTo(const std::string& path) {
    const sockaddr_un address = test::addressOf(path);
    FileDescriptor client(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
    EXPECT_EQ(::connect(client.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address), 0);
    return client;
}

TEST(ConnectionService, EndsAClientWhoseSocketCannotBeWatchedAndServesTheOthers) {
    const TemporaryDirectory directory;
    const std::string path = wire::socketPath(directory.path());
    FakeLog log;
    EventLoop loop(refusingControl);
    LinuxConnectionService service(loop, log);
    LinuxWorkQueues queues;
    const auto requests = queues.makeSerialQueue("requests");
    Delegate delegate;
    service.setRequestQueue(*requests, queues);
    service.setDelegate(delegate);
    ASSERT_EQ(service.open(directory.path()), std::nullopt);

    // Nor can the listener's own socket, for a moment.
    additionsToRefuse = 1;
    service.resume();
    std::thread thread([&] { loop.run(queues); });
    const FileDescriptor early = connectTo(path);
    for (int i = 0; i < 2000 && service.clientProcesses().empty(); ++i) {
        std::this_thread::sleep_for(std::chrono::milliseconds(10));
    }
    additionsToRefuse = 1;
    const FileDescriptor unwatched = connectTo(path);
    EXPECT_TRUE(isReadable(unwatched.get(), 20'000)) << "that it has ended";
    const FileDescriptor late = connectTo(path);
    EXPECT_FALSE(isReadable(late.get(), 20));
    EXPECT_FALSE(isReadable(early.get(), 0));
    EXPECT_THAT(service.clientProcesses(), ElementsAre(::getpid()));

    loop.post([&] {
        service.stop();
        loop.stop();
    });
    thread.join();
    EXPECT_EQ(delegate.trace, "interrupted invalidated ");
    EXPECT_THAT(log.take(), ElementsAre("3 zrrs accepting connections rests: No space left on device",
                                        "3 zrrs accepting connections again",
                                        HasSubstr("since its socket cannot be watched: No space left on")));
}

} // namespace
} // namespace tamblo
