#pragma once

#include "base/TextBuffer.h"
#include "client/Vocabulary.h"
#include "os/FileDescriptor.h"
#include "wire/Reply.h"
#include "wire/Request.h"

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <utility>

namespace tamblo::bench {

/// A client reduced to its socket, for scenarios in which only the service's work counts and thousands of
/// clients must cost next to nothing themselves. Blocking; every reply is looked at, and a refusal or a lost
/// connection throws.
class FrameChannel {
public:
    explicit FrameChannel(const std::string& socketPath);
    /// Over a socket that is connected.
    explicit FrameChannel(FileDescriptor socket) noexcept : socket_(std::move(socket)) {}

    /// From now on, what takes longer throws.
    void limitWaits(std::chrono::seconds longest) const;

    /// Requests are gathered until `flush`.
    void queue(wire::Request& request);
    void queueWithoutReply(wire::Request& request);
    void flush();
    /// Waits for at least one reply and takes all that have come.
    void receive();
    /// Whether `receive` would not have to wait.
    [[nodiscard]] bool hasReply() const noexcept;
    /// Sends what is queued and waits for all replies.
    void finish();
    /// Sends one request and waits for its reply, with nothing else outstanding.
    wire::Reply call(wire::Request& request);
    [[nodiscard]] std::size_t outstanding() const noexcept { return outstanding_; }

    /// Makes sessions with a service type and a configuration.
    void createSession(std::int64_t reporterID,
                       client::ServiceType serviceType = client::ServiceType::nonLongFormAudio);
    /// Without asking for the reply, which is held until the stop.
    void startSession(std::int64_t reporterID);
    /// Both, one after the other.
    void beginSession(std::int64_t reporterID,
                      client::ServiceType serviceType = client::ServiceType::nonLongFormAudio);
    void stopSession(std::int64_t reporterID);

private:
    void append(const wire::Request& request);

    FileDescriptor socket_;
    TextBuffer outgoing_;
    TextBuffer incoming_;
    std::optional<wire::Reply> last_;
    std::uint64_t lastId_ = 0;
    std::size_t outstanding_ = 0;
};

[[nodiscard]] wire::Request reporterRequest(wire::Method method, std::int64_t reporterID);

} // namespace tamblo::bench
