#include "IngestDriver.h"

#include <stdexcept>

namespace tamblo::bench {

namespace {

client::Client::Options callerMode(const std::string& socketPath) {
    client::Client::Options options;
    options.socketPath = socketPath;
    options.threading = client::Client::Threading::caller;
    options.reconnect = false;
    return options;
}

} // namespace

template <typename T> client::Callback<T> IngestDriver::answer() {
    ++outstanding_;
    return [this](client::Result<T>&& result) {
        --outstanding_;
        if (!result.ok()) {
            error_ = result.error->domain + " " + std::to_string(result.error->code);
        }
    };
}

IngestDriver::IngestDriver(const std::string& socketPath, const std::vector<Message>& messages,
                           std::size_t inFlight)
    : messages_(messages), inFlight_(inFlight), client_(callerMode(socketPath)) {
    client_.createReportingSession(kReporterID, answer<bool>());
    client_.setServiceType(client::ServiceType::nonLongFormAudio, kReporterID, answer<bool>());
    client_.setConfiguration(sessionConfiguration(), kReporterID, answer<bool>());
    waitUntilOutstanding(0);
}

void IngestDriver::start() {
    client_.startReportingSessionForID(kReporterID, nullptr);
}

void IngestDriver::stop() {
    client_.stopReportingSessionForID(kReporterID, answer<bool>());
    waitUntilOutstanding(0);
}

void IngestDriver::send(std::size_t count) {
    while (count > 0) {
        for (; count > 0 && outstanding_ < inFlight_; --count) {
            const Message& message = messages_[next_++ % messages_.size()];
            if (!client_.sendMessage(message.payload, message.category, message.type, reporterIDs_,
                                     answer<client::Nothing>())) {
                throw std::runtime_error("the client library refuses a message");
            }
        }
        waitUntilOutstanding(inFlight_ - 1);
    }
    waitUntilOutstanding(0);
}

void IngestDriver::waitUntilOutstanding(std::size_t atMost) {
    int pauses = 0;
    while (outstanding_ > atMost) {
        // A connection that has just been made ends the first run early.
        if (client_.run(kLimit) == 0 && ++pauses > 2) {
            throw std::runtime_error("the service does not answer");
        }
        if (!error_.empty()) {
            throw std::runtime_error("the service refuses: " + error_);
        }
    }
}

} // namespace tamblo::bench
