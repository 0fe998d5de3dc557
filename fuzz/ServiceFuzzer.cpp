// Any bytes as the stream of one client, against the whole service on an in-memory device: nothing may crash,
// what is refused is refused once, what is answered is a well-formed reply, and what asks for a reply gets
// one unless its method may hold it back.

#include "platform/linux/connections/RequestDispatch.h"
#include "service/ZRReportingService.h"
#include "tests/fakes/FakePlatform.h"
#include "wire/FrameSplitter.h"

#include <cstdint>
#include <cstdlib>
#include <memory>
#include <span>
#include <unordered_map>

namespace tamblo {
namespace {

void demand(bool condition) {
    if (!condition) {
        std::abort();
    }
}

/// Takes replies as a connection would and counts them by request.
class Receiver : public std::enable_shared_from_this<Receiver> {
public:
    template <typename AppendFrame> void reply(const AppendFrame& appendFrame) {
        TextBuffer out;
        appendFrame(out);
        wire::FrameSplitter frames(out.bytes());
        const auto item = frames.next();
        demand(item.has_value() && frames.rest().empty());
        const auto reply = wire::decodeReply(*item);
        demand(reply.has_value());
        ++counts_[reply->id];
    }
    static void noteLimit(std::string_view limit) { demand(!limit.empty()); }
    [[nodiscard]] int count(std::uint64_t id) const {
        const auto found = counts_.find(id);
        return found == counts_.end() ? 0 : found->second;
    }

private:
    std::unordered_map<std::uint64_t, int> counts_;
};

void feed(FakePlatform& device, FakeClientConnection& connection, std::span<const std::uint8_t> stream) {
    const auto receiver = std::make_shared<Receiver>();
    KeySetCache keySets;
    wire::Request request;
    wire::FrameSplitter frames(stream);
    while (const auto item = frames.next()) {
        if (const auto refusal = wire::decodeRequest(*item, keySets, request)) {
            demand(!refusal->error.message.empty());
            if (refusal->endsConnection) {
                return;
            }
            continue;
        }
        const auto id = request.id;
        const wire::Method method = request.method;
        const int before = id ? receiver->count(*id) : 0;
        dispatchRequest(connection.object(), request, *receiver);
        device.serverQueue().runAll();
        const bool mayBeHeld =
            method == wire::Method::startReportingSessionForID || method == wire::Method::killService;
        demand(!id || mayBeHeld || receiver->count(*id) > before);
    }
}

} // namespace
} // namespace tamblo

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* bytes, std::size_t size) {
    using namespace tamblo;
    FakePlatform device(LogLevel::error, size % 2 == 0);
    ZRReportingService service(device.context(), [](int) {});
    ConnectionListener& listener = device.connections.listenerForServiceName("fuzzed");
    listener.setDelegate(service);
    listener.resume();
    RequestTurns turns(device.serverQueue(), device.clock);
    const auto connection = device.connections.connect({1000, 42}, turns);
    device.serverQueue().runAll();
    feed(device, *connection, {bytes, size});
    if (size % 3 == 0) {
        connection->interrupt();
    }
    connection->invalidate();
    device.serverQueue().runAll();
    demand(service.getAllClients().empty());
    return 0;
}
