#pragma once

#include "base/KeySetCache.h"
#include "platform/Limits.h"
#include "platform/WorkQueue.h"
#include "platform/linux/loop/LinuxWorkQueues.h"
#include "wire/Request.h"

#include <cstddef>
#include <cstdint>
#include <memory>
#include <optional>
#include <span>

namespace tamblo {

/// What one read takes at most: some hundred messages, so that a batch costs few system calls and no
/// connection holds up the others for long.
inline constexpr std::size_t kBytesPerRead = 128 * 1024;
/// An unfinished frame up to this size is put in front of the next read; a longer one is collected where it
/// is.
inline constexpr std::size_t kSmallRest = 16 * 1024;
/// Requests read in one wake-up are carried out in batches of about this many.
inline constexpr std::size_t kRequestsPerBatch = 256;

/// What the connections of a service share to take requests in, one at a time, on the I/O thread: the buffer
/// that they receive into, the decoder with the key sets that it has met, and the way to the server queue.
class RequestIntake {
public:
    explicit RequestIntake(const Limits& limits)
        : buffer_(new std::uint8_t[kSmallRest + kBytesPerRead]),
          limits_{.values = {.entries = limits.entriesOfDictionary,
                             .keyBytes = limits.keyBytes,
                             .bytesOfKeys = limits.bytesOfKeys,
                             .decodedBytes = limits.decodedBytesOfFrame},
                  .reportersOfMessage = limits.reportersOfMessage,
                  .deliveredBytesOfMessage = limits.deliveredBytesOfMessage} {}

    /// The queue that carries requests out, and the threads that it runs on. Before the first read.
    void setServerQueue(SerialQueue& queue, LinuxWorkQueues& threads) noexcept {
        serverQueue_ = &queue;
        threads_ = &threads;
    }
    [[nodiscard]] SerialQueue& serverQueue() noexcept { return *serverQueue_; }

    /// Room for a small rest and a read.
    [[nodiscard]] std::uint8_t* buffer() noexcept { return buffer_.get(); }
    /// Reads a frame's item into `request`, whose parts the next one replaces.
    [[nodiscard]] std::optional<wire::Refusal> decode(std::span<const std::uint8_t> item) {
        return wire::decodeRequest(item, keySets_, request_, limits_);
    }
    [[nodiscard]] wire::Request& request() noexcept { return request_; }
    /// Ends a read of so many requests.
    void endRead(std::size_t requests) {
        if (threads_->count(requests) >= kRequestsPerBatch) {
            threads_->drain();
        }
    }

private:
    const std::unique_ptr<std::uint8_t[]> buffer_;
    const wire::RequestLimits limits_;
    KeySetCache keySets_;
    wire::Request request_;
    SerialQueue* serverQueue_ = nullptr;
    LinuxWorkQueues* threads_ = nullptr;
};

} // namespace tamblo
