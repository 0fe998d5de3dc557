#pragma once

#include <chrono>
#include <cstddef>
#include <memory>
#include <string>
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

/// What a bare program takes for the service's job: it receives the frames of the ingest scenarios, 64 in
/// flight, decodes them, compares each payload with the one before it, writes it as a line of JSON and
/// replies.
class BareJob {
public:
    struct Cost {
        double messagesPerSecond = 0;
        double jobMicroseconds = 0; ///< of processor time for each message
        double clientMicroseconds = 0;
    };

    /// The lines are written to a file in that directory.
    BareJob(int clientProcessor, int jobProcessor, const std::string& directory);
    ~BareJob();
    BareJob(const BareJob&) = delete;
    BareJob& operator=(const BareJob&) = delete;

    /// Sends so many messages.
    [[nodiscard]] Cost run(std::size_t messages);

private:
    struct Ends;
    std::unique_ptr<Ends> ends_;
};

/// A process that sends every frame back, one at a time, to hold a round trip against.
class Echo {
public:
    Echo(int callerProcessor, int echoProcessor);
    ~Echo();
    Echo(const Echo&) = delete;
    Echo& operator=(const Echo&) = delete;

    [[nodiscard]] pid_t pid() const noexcept;
    /// So many round trips, one for each interval; the processor time that the echo takes for one, in
    /// microseconds.
    [[nodiscard]] double pacedCost(std::size_t count, std::chrono::nanoseconds interval);
    /// The time of each of so many round trips, in microseconds.
    [[nodiscard]] std::vector<double> roundTrips(std::size_t count);

private:
    struct Ends;
    std::unique_ptr<Ends> ends_;
};

} // namespace tamblo::bench
