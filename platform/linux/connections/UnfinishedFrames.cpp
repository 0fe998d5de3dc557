#include "platform/linux/connections/UnfinishedFrames.h"

#include "platform/linux/connections/LinuxConnection.h"

namespace tamblo {

void UnfinishedFrames::note(LinuxConnection& connection, Place& place) {
    const Time now = std::chrono::steady_clock::now();
    if (place == none()) {
        place = entries_.insert(entries_.end(), {&connection, now});
    } else {
        place->progress = now;
        entries_.splice(entries_.end(), entries_, place);
    }
    startTimer();
}

void UnfinishedFrames::forget(Place& place) {
    if (place != none()) {
        entries_.erase(place);
        place = none();
    }
}

void UnfinishedFrames::startTimer() {
    if (isTimerRunning_ || entries_.empty()) {
        return;
    }
    isTimerRunning_ = true;
    const auto left = entries_.front().progress + patience_ - std::chrono::steady_clock::now();
    loop_.callAfter(std::chrono::ceil<std::chrono::milliseconds>(left), [this] {
        isTimerRunning_ = false;
        endOverdue();
        startTimer();
    });
}

void UnfinishedFrames::endOverdue() {
    const Time latest = std::chrono::steady_clock::now() - patience_;
    while (!entries_.empty() && entries_.front().progress <= latest) {
        // Forgets itself.
        entries_.front().connection->endUnfinished();
    }
}

} // namespace tamblo
