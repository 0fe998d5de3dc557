#pragma once

#include "wire/Reply.h"
#include "wire/Request.h"

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace tamblo::test {

using wire::Method;

[[nodiscard]] wire::Request request(Method method, std::int64_t reporterID = 0);
/// Of playback's start, for reporter 7, unless others are given.
[[nodiscard]] wire::Request message(Dictionary payload, std::vector<std::int64_t> reporterIDs = {7},
                                    std::uint32_t category = 4, std::uint16_t type = 1);
/// As many frames of the request, with IDs that begin with this one.
[[nodiscard]] std::string framesOf(wire::Request request, std::uint64_t firstID = 1, std::size_t count = 1);

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
    bool send(std::string_view bytes) const;
    /// The next reply, waiting at most some seconds; nothing at the end of the connection.
    [[nodiscard]] std::optional<wire::Reply> receive();
    /// The number of replies with IDs of at least this, to the end of the connection.
    std::size_t receiveAll(std::uint64_t leastID = 0);
    /// Sends and takes the next reply.
    std::optional<wire::Reply> call(wire::Request request);
    std::optional<wire::Reply> call(Method method, std::int64_t reporterID = 0);
    /// Whether no reply arrives within a short while.
    [[nodiscard]] bool staysSilent() const;
    /// Whether the service has closed the connection; takes what still arrives before that.
    [[nodiscard]] bool isClosedByService();

private:
    int socket_ = -1;
    std::uint64_t nextID_ = 1;
    std::vector<std::uint8_t> received_;
};

/// One that has created and started a session, whose start reply stays held.
class Session : public RawClient {
public:
    explicit Session(const std::string& socketPath, std::int64_t reporterID = 7,
                     std::uint16_t serviceType = 2);
    /// For another session of the same client.
    void start(std::int64_t reporterID, std::uint16_t serviceType = 2);
    /// True when the stop and the held start have been answered.
    bool stop(std::int64_t reporterID = 7);
};

} // namespace tamblo::test
