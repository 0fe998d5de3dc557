#pragma once

#include "Ledger.h"

#include <atomic>
#include <cstddef>
#include <random>
#include <string>
#include <thread>

namespace tamblo::bench {

/// What the driver tells all clients.
struct CrashControl {
    std::atomic<bool> isOver{false};
    /// Counted up when a sink begins to have no room, and when it has again.
    std::atomic<std::uint64_t> roomChanges{0};
    [[nodiscard]] static bool hasRoom(std::uint64_t changes) noexcept { return changes % 2 == 0; }
};

/// A client that writes records as long as there is a service, with some of them under way at a time, and
/// keeps books of them. A thread of its own from the start to the end of one life of the service.
class CrashClient {
public:
    CrashClient(std::size_t client, std::string socketPath, Ledger& ledger, const CrashControl& control,
                unsigned seed);
    ~CrashClient() { thread_.join(); }
    CrashClient(const CrashClient&) = delete;
    CrashClient& operator=(const CrashClient&) = delete;

private:
    void run();
    void write(int socket);

    const std::size_t client_;
    const std::string socketPath_;
    Ledger& ledger_;
    const CrashControl& control_;
    std::mt19937 random_;
    std::thread thread_;
};

} // namespace tamblo::bench
