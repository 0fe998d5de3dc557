#include "tests/fakes/FakeWorkQueues.h"

#include <algorithm>
#include <utility>

namespace tamblo {

std::unique_ptr<SerialQueue> FakeWorkQueues::makeSerialQueue(std::string_view label) {
    auto strand = std::make_shared<FakeStrand>();
    const std::lock_guard held(mutex_);
    queues_.push_back({std::string(label), strand});
    return std::make_unique<FakeSerialQueue>(label, std::move(strand));
}

std::vector<FakeWorkQueues::Queue> FakeWorkQueues::queues() const {
    const std::lock_guard held(mutex_);
    return queues_;
}

std::size_t FakeWorkQueues::run(std::string_view label) {
    std::size_t pieces = 0;
    std::size_t ran = 0;
    do {
        ran = 0;
        for (const Queue& queue : queues()) {
            ran += queue.label == label ? queue.strand->runAll() : 0;
        }
        pieces += ran;
    } while (ran != 0);
    return pieces;
}

std::size_t FakeWorkQueues::made(std::string_view label) const {
    const auto all = queues();
    return static_cast<std::size_t>(
        std::count_if(all.begin(), all.end(), [label](const Queue& queue) { return queue.label == label; }));
}

void FakeWorkQueues::workOff() {
    bool isBusy = true;
    while (isBusy) {
        isBusy = delayedCalls() != 0;
        elapse(std::chrono::hours(24));
        for (const Queue& queue : queues()) {
            isBusy = queue.strand->runAll() != 0 || isBusy;
        }
    }
}

std::unique_ptr<DelayedCall> FakeWorkQueues::callAfter(std::chrono::milliseconds delay,
                                                       UniqueFunction<void()> call) {
    const std::lock_guard held(mutex_);
    auto entry = std::make_shared<Delayed>(elapsed_ + delay, std::move(call));
    delayed_.push_back(entry);
    return std::make_unique<FakeDelayedCall>(std::move(entry));
}

void FakeWorkQueues::elapse(std::chrono::milliseconds time) {
    std::vector<std::shared_ptr<Delayed>> due;
    {
        const std::lock_guard held(mutex_);
        elapsed_ += time;
        const auto later = std::stable_partition(
            delayed_.begin(), delayed_.end(), [this](const auto& entry) { return entry->due <= elapsed_; });
        due.assign(delayed_.begin(), later);
        delayed_.erase(delayed_.begin(), later);
    }
    for (const auto& entry : due) {
        if (auto call = std::exchange(entry->call, {})) {
            call();
        }
    }
}

std::size_t FakeWorkQueues::delayedCalls() const {
    const std::lock_guard held(mutex_);
    return static_cast<std::size_t>(
        std::count_if(delayed_.begin(), delayed_.end(), [](const auto& entry) { return bool(entry->call); }));
}

} // namespace tamblo
