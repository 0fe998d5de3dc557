#include "tests/fakes/FakeSerialQueue.h"

#include <utility>

namespace tamblo {

void FakeSerialQueue::post(Work work, Pace pace) {
    const std::lock_guard held(mutex_);
    pieces_.push_back(std::move(work));
    paces_.push_back(pace);
}

bool FakeSerialQueue::runOne() {
    Work piece;
    {
        const std::lock_guard held(mutex_);
        if (pieces_.empty()) {
            return false;
        }
        piece = std::move(pieces_.front());
        pieces_.pop_front();
    }
    piece();
    return true;
}

std::size_t FakeSerialQueue::runAll() {
    std::size_t count = 0;
    while (runOne()) {
        ++count;
    }
    if (count != 0 && batchEnd_) {
        batchEnd_();
    }
    return count;
}

std::vector<Pace> FakeSerialQueue::takePaces() {
    const std::lock_guard held(mutex_);
    return std::exchange(paces_, {});
}

} // namespace tamblo
