// What a service may answer, to the client library: every request's callback is called at most once while the
// connection lives, exactly once when the client is gone, and with its kind of result or an error.

#include "Demand.h"
#include "client/Client.h"
#include "wire/FrameSplitter.h"
#include "wire/Request.h"

#include <array>
#include <cstdint>
#include <optional>
#include <span>
#include <vector>

#include <sys/socket.h>
#include <sys/un.h>

namespace tamblo {
namespace {

using fuzz::demand;

/// The service's end of connections.
class Listener {
public:
    Listener() : socket_(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0)) {
        sockaddr_un address{};
        address.sun_family = AF_UNIX;
        path().copy(address.sun_path, sizeof address.sun_path - 1);
        demand(::bind(socket_, reinterpret_cast<const sockaddr*>(&address), sizeof address) == 0 &&
               ::listen(socket_, 4) == 0);
    }
    [[nodiscard]] std::string path() const { return directory_.path("socket"); }
    [[nodiscard]] int accept() const { return ::accept(socket_, nullptr, nullptr); }

private:
    fuzz::ScratchDirectory directory_;
    int socket_;
};

constexpr std::size_t kRequests = 8;

class Conversation {
public:
    explicit Conversation(const Listener& listener)
        : client_({.socketPath = listener.path(),
                   .threading = client::Client::Threading::caller,
                   .queueCapacity = 16,
                   .reconnect = false,
                   .linger = std::chrono::milliseconds(0)}) {
        ask();
        demand(client_.flush(std::chrono::seconds(5)));
        service_ = listener.accept();
        readIds();
    }
    ~Conversation() { ::close(service_); }

    /// Sends the bytes, as they are or as the error and result of replies, and has the client read them.
    void answer(std::span<const std::uint8_t> bytes, bool asTheyAre) {
        TextBuffer out;
        const std::string_view text(reinterpret_cast<const char*>(bytes.data()), bytes.size());
        if (asTheyAre) {
            out.append(text);
        } else {
            for (std::size_t i = 0; i < ids_.size(); ++i) {
                const std::size_t start = wire::beginFrame(out);
                CborWriter writer(out);
                writer.arrayHead(4);
                writer.unsignedInteger(1);
                writer.unsignedInteger(ids_[(i + text.size()) % ids_.size()]);
                out.append(text);
                (void)wire::finishFrame(out, start);
            }
        }
        (void)!::send(service_, out.data(), out.size(), MSG_NOSIGNAL);
        ::shutdown(service_, SHUT_WR);
        for (int i = 0; i < 100 && client_.isConnected(); ++i) {
            client_.run(std::chrono::milliseconds(10));
        }
        demand(!client_.isConnected());
        for (const int count : counts_) {
            demand(count == 1);
        }
    }

private:
    template <typename T> auto counter(std::size_t request) {
        return [this, request](client::Result<T>&&) { ++counts_[request]; };
    }
    void ask() {
        bool isQueued = client_.createReportingSession(7, counter<bool>(0));
        isQueued = client_.setServiceType(client::ServiceType::test, 7, counter<bool>(1)) && isQueued;
        isQueued = client_.getServiceNameForReporterID(7, counter<client::ServiceType>(2)) && isQueued;
        isQueued = client_.setConfiguration({{"a", 1}}, 7, counter<bool>(3)) && isQueued;
        isQueued = client_.reporterID(7, counter<Dictionary>(4)) && isQueued;
        isQueued = client_.getAllReporters(counter<std::vector<std::int64_t>>(5)) && isQueued;
        isQueued = client_.stopReportingSessionForID(7, counter<bool>(6)) && isQueued;
        isQueued = client_.destroyReportingSession(7, counter<bool>(7)) && isQueued;
        demand(isQueued);
    }
    void readIds() {
        std::vector<std::uint8_t> received(4096);
        std::size_t size = 0;
        KeySetCache keySets;
        while (ids_.size() < kRequests) {
            const ssize_t count = ::recv(service_, received.data() + size, received.size() - size, 0);
            demand(count > 0);
            size += static_cast<std::size_t>(count);
            ids_.clear();
            wire::FrameSplitter frames({received.data(), size});
            wire::Request request;
            while (const auto item = frames.next()) {
                demand(!wire::decodeRequest(*item, keySets, request) && request.id.has_value());
                ids_.push_back(*request.id);
            }
        }
    }

    std::array<int, kRequests> counts_{};
    client::Client client_;
    int service_ = -1;
    std::vector<std::uint64_t> ids_;
};

} // namespace
} // namespace tamblo

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* bytes, std::size_t size) {
    static const tamblo::Listener listener;
    if (size != 0) {
        tamblo::Conversation(listener).answer({bytes + 1, size - 1}, bytes[0] % 4 == 0);
    }
    return 0;
}
