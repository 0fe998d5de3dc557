#include "Batches.h"

namespace tamblo::bench {

Batches::Batches(FrameChannel& channel) : channel_(channel), requests_(sendRequests(1024, 0)) {}

void Batches::send(std::size_t count, std::int64_t reporterID) {
    while (count > 0) {
        for (; count > 0 && channel_.outstanding() < kInFlight; --count) {
            wire::Request& request = requests_[next_++ % requests_.size()];
            request.reporterIDs[0] = reporterID;
            channel_.queue(request);
        }
        channel_.flush();
        channel_.receive();
    }
    channel_.finish();
}

} // namespace tamblo::bench
