#pragma once

#include "Payloads.h"
#include "client/Client.h"

#include <array>
#include <chrono>
#include <cstddef>
#include <cstdint>
#include <string>
#include <vector>

namespace tamblo::bench {

/// A client that reports as fast as it is let: the client library in caller mode, one session, so many
/// messages in flight, an answer asked for each. It sends as
/// many as were answered, at once. An answer that is an error, or none for ten seconds, throws.
class IngestDriver {
public:
    IngestDriver(const std::string& socketPath, const std::vector<Message>& messages, std::size_t inFlight);

    void start();
    void send(std::size_t count);
    void stop();

private:
    static constexpr std::int64_t kReporterID = 7;
    static constexpr std::chrono::seconds kLimit{10};

    void waitUntilOutstanding(std::size_t atMost);
    template <typename T> client::Callback<T> answer();

    const std::vector<Message>& messages_;
    const std::size_t inFlight_;
    const std::array<std::int64_t, 1> reporterIDs_{kReporterID};
    client::Client client_;
    std::size_t next_ = 0;
    std::size_t outstanding_ = 0;
    std::string error_;
};

} // namespace tamblo::bench
