#pragma once

#include "platform/linux/loop/EventLoop.h"

#include <chrono>
#include <list>

namespace tamblo {

class LinuxConnection;

/// The connections that have sent the beginning of a frame, the one whose last progress is longest ago first;
/// one that makes none for the time allowed is ended. While there are none, no timer runs. On the I/O thread.
class UnfinishedFrames {
public:
    using Time = std::chrono::steady_clock::time_point;
    struct Entry {
        LinuxConnection* connection;
        Time progress;
    };
    /// A connection's place here; the end of the list while it has none.
    using Place = std::list<Entry>::iterator;

    UnfinishedFrames(EventLoop& loop, std::chrono::seconds patience) : loop_(loop), patience_(patience) {}

    [[nodiscard]] Place none() noexcept { return entries_.end(); }
    /// Notes that a frame has begun, or has got further.
    void note(LinuxConnection& connection, Place& place);
    void forget(Place& place);

private:
    void endOverdue();
    void startTimer();

    EventLoop& loop_;
    const std::chrono::seconds patience_;
    std::list<Entry> entries_;
    bool isTimerRunning_ = false;
};

} // namespace tamblo
