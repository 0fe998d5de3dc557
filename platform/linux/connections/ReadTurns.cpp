#include "platform/linux/connections/ReadTurns.h"
#include "os/ThreadTime.h"

#include "platform/linux/connections/LinuxConnection.h"

#include <chrono>
#include <utility>

namespace tamblo {

namespace {

/// Reading and decoding go on for so long before what was read is carried out.
constexpr std::chrono::milliseconds kReadingTime{2};

} // namespace

void ReadTurns::add(const std::shared_ptr<LinuxConnection>& connection,
                    const std::shared_ptr<ClientUser>& user) {
    if (user->readable.empty()) {
        users_.push_back(user);
    }
    user->readable.push_back(connection);
}

bool ReadTurns::readSome() {
    if (users_.empty()) {
        return false;
    }
    if (!processorShare_.wantsSample()) {
        readForSomeTime();
    } else {
        const std::chrono::nanoseconds processor = threadTime();
        const auto began = std::chrono::steady_clock::now();
        readForSomeTime();
        processorShare_.addSample(threadTime() - processor, std::chrono::steady_clock::now() - began);
    }
    return !users_.empty();
}

void ReadTurns::readForSomeTime() {
    auto now = std::chrono::steady_clock::now();
    const auto ends = now + kReadingTime;
    do {
        const std::shared_ptr<ClientUser> user = std::move(users_.front());
        users_.pop_front();
        const std::shared_ptr<LinuxConnection> connection = std::move(user->readable.front());
        user->readable.pop_front();
        if (!user->readable.empty()) {
            users_.push_back(user);
        }
        connection->read(now);
        const auto began = std::exchange(now, std::chrono::steady_clock::now());
        connection->noteReading(processorShare_.of(now - began));
    } while (!users_.empty() && now < ends);
}

} // namespace tamblo
