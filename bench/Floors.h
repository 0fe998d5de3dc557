#pragma once

#include <cstddef>
#include <memory>
#include <vector>

#include <sys/types.h>

namespace tamblo::bench {

/// What no service can do better than on this machine: the frames of the ingest scenarios through a bare
/// socket, sent 64 at a time, read in large pieces and dropped.
struct SocketFloor {
    double messagesPerSecond = 0;
    double readerMicroseconds = 0; ///< of processor time for each message
    double writerMicroseconds = 0;
};

[[nodiscard]] SocketFloor measureSocketFloor(int writerProcessor, int readerProcessor, bool quick);

/// A process that sends every frame back, one at a time, to hold a round trip against.
class Echo {
public:
    Echo(int callerProcessor, int echoProcessor);
    ~Echo();
    Echo(const Echo&) = delete;
    Echo& operator=(const Echo&) = delete;

    [[nodiscard]] pid_t pid() const noexcept;
    /// The time of each of so many round trips, in microseconds.
    [[nodiscard]] std::vector<double> roundTrips(std::size_t count);

private:
    struct Ends;
    std::unique_ptr<Ends> ends_;
};

} // namespace tamblo::bench
