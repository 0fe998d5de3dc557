#pragma once

#include "wire/Reply.h"
#include "wire/Request.h"

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace tamblo::test {

/// A client without manners: a blocking socket that sends whatever bytes a test wants and reads replies one
/// by one.
class RawClient {
public:
    explicit RawClient(const std::string& socketPath);
    ~RawClient();
    RawClient(const RawClient&) = delete;
    RawClient& operator=(const RawClient&) = delete;

    [[nodiscard]] int descriptor() const noexcept { return socket_; }
    /// False when the service has gone.
    bool sendBytes(std::string_view bytes) const;
    /// An item as one frame.
    bool sendItem(std::string_view item) const;
    bool send(const wire::Request& request) const;
    /// The next reply, waiting at most some seconds; nothing at the end of the connection.
    [[nodiscard]] std::optional<wire::Reply> receive();
    /// Sends and takes the next reply.
    std::optional<wire::Reply> call(wire::Request request);
    /// Whether no reply arrives within a short while.
    [[nodiscard]] bool staysSilent() const;
    /// Whether the service has closed the connection; takes what still arrives before that.
    [[nodiscard]] bool isClosedByService();
    void close();

private:
    int socket_ = -1;
    std::uint64_t nextID_ = 1;
    std::vector<std::uint8_t> received_;
};

[[nodiscard]] wire::Request request(wire::Method method, std::int64_t reporterID = 0);
[[nodiscard]] wire::Request message(Dictionary payload, std::vector<std::int64_t> reporterIDs,
                                    std::uint32_t category = 4, std::uint16_t type = 1);
/// Creates and starts a session, whose start reply stays held.
void startSession(RawClient& client, std::int64_t reporterID, std::uint16_t serviceType = 2);

} // namespace tamblo::test
