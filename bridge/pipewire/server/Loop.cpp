#include "bridge/pipewire/server/Loop.h"

#include <algorithm>
#include <limits>
#include <new>
#include <utility>

#include <pipewire/loop.h>

namespace tamblo::pipewire {

Loop::Watch::~Watch() {
    pw_loop_destroy_source(loop_.get(), source_);
}

void Loop::Watch::watchWriting(bool isWanted) {
    const std::uint32_t mask = SPA_IO_IN | (isWanted ? SPA_IO_OUT : 0U);
    if (mask != mask_) {
        mask_ = mask;
        pw_loop_update_io(loop_.get(), source_, mask);
    }
}

Loop::Loop(const Clock& clock) : clock_(clock), loop_(pw_loop_new(nullptr)) {
    if (loop_ == nullptr) {
        throw std::bad_alloc();
    }
}

Loop::~Loop() {
    pw_loop_destroy(loop_);
}

std::unique_ptr<Loop::Watch> Loop::watch(int descriptor, std::function<void()> onReady) {
    auto watch = std::make_unique<Watch>(*this, nullptr);
    watch->onReady_ = std::move(onReady);
    watch->mask_ = SPA_IO_IN;
    watch->source_ =
        descriptor < 0
            ? nullptr
            : pw_loop_add_io(
                  loop_, descriptor, watch->mask_, false,
                  [](void* data, int, std::uint32_t) { static_cast<Watch*>(data)->onReady_(); }, watch.get());
    return watch->source_ == nullptr ? nullptr : std::move(watch);
}

std::unique_ptr<Loop::Watch> Loop::watchSignal(int number, std::function<void()> onSignal) {
    auto watch = std::make_unique<Watch>(*this, nullptr);
    watch->onReady_ = std::move(onSignal);
    watch->source_ = pw_loop_add_signal(
        loop_, number, [](void* data, int) { static_cast<Watch*>(data)->onReady_(); }, watch.get());
    return watch->source_ == nullptr ? nullptr : std::move(watch);
}

void Loop::runDue() {
    const SteadyTime now = clock_.now().steady;
    for (Timed* const timed : timed_) {
        const auto due = timed->due();
        if (due && *due <= now) {
            timed->run();
        }
    }
}

void Loop::run(const std::function<std::optional<SteadyTime>()>& beforeSleep) {
    pw_loop_enter(loop_);
    while (!isStopped_) {
        runDue();
        std::optional<SteadyTime> wake = beforeSleep();
        if (isStopped_) {
            break;
        }
        for (const Timed* const timed : timed_) {
            bringForward(wake, timed->due());
        }
        int timeout = -1;
        if (wake) {
            const auto left = std::chrono::ceil<std::chrono::milliseconds>(*wake - clock_.now().steady);
            timeout =
                static_cast<int>(std::clamp<std::int64_t>(left.count(), 0, std::numeric_limits<int>::max()));
        }
        pw_loop_iterate(loop_, timeout);
    }
    pw_loop_leave(loop_);
}

} // namespace tamblo::pipewire
