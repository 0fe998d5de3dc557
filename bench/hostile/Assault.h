#pragma once

#include "base/Cbor.h"
#include "base/TextBuffer.h"
#include "os/FileDescriptor.h"
#include "wire/Request.h"

#include <atomic>
#include <chrono>
#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>

#include <sys/types.h>

namespace tamblo::bench {

/// What an attacking process lets the watching one know.
struct AssaultMarks {
    std::atomic<std::uint64_t> sentBytes;
    std::atomic<std::uint64_t> replies;
    std::atomic<std::uint64_t> refusals;         ///< replies with an error
    std::atomic<std::uint64_t> endedConnections; ///< by the service
    std::atomic<std::uint64_t> residentBytes;    ///< of the service when the attack noted it
    std::atomic<bool> isOver;
};

/// One attack under way: whom it is against, and until when.
class Assault {
public:
    using Clock = std::chrono::steady_clock;

    Assault(std::string socketPath, pid_t service, Clock::duration time, AssaultMarks& marks)
        : socketPath_(std::move(socketPath)), service_(service), end_(Clock::now() + time), marks_(marks) {}

    [[nodiscard]] const std::string& socketPath() const noexcept { return socketPath_; }
    [[nodiscard]] bool isOver() const { return Clock::now() >= end_; }
    [[nodiscard]] AssaultMarks& marks() const noexcept { return marks_; }
    /// Notes what of the service is resident.
    void noteResidentBytes() const;
    void sleepUntilOver() const;

private:
    std::string socketPath_;
    pid_t service_;
    Clock::time_point end_;
    AssaultMarks& marks_;
};

/// A client that means harm: what it is refused or loses, it takes note of and goes on. Nothing it does lasts
/// longer than the assault.
class HostileClient {
public:
    /// Whether it takes the replies off the socket, which it looks at only to count them.
    enum class Replies { read, left };

    explicit HostileClient(const Assault& assault, Replies replies = Replies::read);

    [[nodiscard]] bool isOpen() const noexcept { return socket_.isOpen(); }
    /// Ends the connection, and makes a new one.
    void reconnect();
    void close() noexcept { socket_.reset(); }

    // What is added waits for `send`; what asks for no reply gets none.
    void add(const wire::Request& request);
    void addCall(wire::Request request);
    template <typename Write> void addRaw(wire::Method method, Write&& write) {
        const std::size_t start = wire::beginRequest(outgoing_, method, std::nullopt);
        CborWriter writer(outgoing_);
        write(writer);
        (void)wire::finishFrame(outgoing_, start);
    }
    void addBytes(std::string_view bytes) { outgoing_.append(bytes); }
    [[nodiscard]] std::size_t waitingBytes() const noexcept { return outgoing_.size(); }

    /// Sends what waits. False when the time is over or the connection is lost.
    bool send();
    /// Sends as much as the socket takes at once, and whole frames later what it has begun.
    void sendWhatFits();
    /// Sends, and returns when all that was sent has been carried out.
    bool settle();

private:
    /// Sends or reads what can be, waiting for it for so many milliseconds.
    void turn(std::string_view& rest, int patience);
    void receive();
    void countReply(std::span<const std::uint8_t> item);

    const Assault& assault_;
    Replies replies_;
    FileDescriptor socket_;
    TextBuffer outgoing_;
    TextBuffer incoming_;
    std::uint64_t lastId_ = 0;
    std::uint64_t lastAnswered_ = 0;
};

// Requests as the attacks send them.

[[nodiscard]] wire::Request messageFor(std::int64_t reporterID, Dictionary payload);
/// Makes a session, started.
void addSession(HostileClient& client, std::int64_t reporterID, std::uint16_t serviceType = 2);

} // namespace tamblo::bench
