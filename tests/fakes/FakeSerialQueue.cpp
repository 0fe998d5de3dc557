#include "tests/fakes/FakeSerialQueue.h"

namespace tamblo {

void FakeStrand::post(Work work, Pace pace) {
    const std::lock_guard held(mutex_);
    pieces_.push_back(std::move(work));
    paces_.push_back(pace);
}

bool FakeStrand::runOne() {
    Work piece;
    {
        const std::lock_guard held(mutex_);
        if (isSuspended_ || pieces_.empty()) {
            return false;
        }
        piece = std::move(pieces_.front());
        pieces_.pop_front();
    }
    const bool wasRunning = std::exchange(isRunning_, true);
    piece();
    piece.reset();
    isRunning_ = wasRunning;
    return true;
}

std::size_t FakeStrand::runAll() {
    if (isRunning_) {
        return 0;
    }
    std::size_t count = 0;
    while (runOne()) {
        ++count;
    }
    if (count != 0 && batchEnd_) {
        batchEnd_();
    }
    return count;
}

void FakeStrand::setSuspended(bool isSuspended) {
    const std::lock_guard held(mutex_);
    isSuspended_ = isSuspended;
}

std::vector<Pace> FakeStrand::takePaces() {
    const std::lock_guard held(mutex_);
    return std::exchange(paces_, {});
}

} // namespace tamblo
