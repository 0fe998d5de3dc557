#pragma once

#include "FrameChannel.h"
#include "Payloads.h"

#include <cstddef>
#include <cstdint>
#include <vector>

namespace tamblo::bench {

/// Sends many distinct messages over a channel, 64 in flight, and waits until all are answered.
class Batches {
public:
    explicit Batches(FrameChannel& channel);
    void send(std::size_t count, std::int64_t reporterID);

private:
    static constexpr std::size_t kInFlight = 64;

    FrameChannel& channel_;
    std::vector<wire::Request> requests_;
    std::size_t next_ = 0;
};

} // namespace tamblo::bench
