#include "platform/linux/loop/EventLoop.h"

#include "platform/linux/loop/LinuxWorkQueues.h"

#include <algorithm>
#include <array>
#include <cassert>
#include <span>
#include <utility>

#include <sys/epoll.h>
#include <sys/eventfd.h>

namespace tamblo {

namespace {

/// How many descriptors one wake-up serves at most.
constexpr int kEventsPerWakeUp = 512;

} // namespace

EventLoop::EventLoop() : EventLoop(::epoll_ctl) {}

EventLoop::EventLoop(Control calls)
    : control_(calls),
      epoll_(::epoll_create1(EPOLL_CLOEXEC)),
      wakeUp_(::eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK)) {
    isOpen_ = control(EPOLL_CTL_ADD, wakeUp_.get(), EPOLLIN, nullptr);
}

bool EventLoop::control(int operation, int descriptor, std::uint32_t events, EventSource* source) {
    epoll_event event{};
    event.events = events;
    event.data.ptr = source;
    return control_(epoll_.get(), operation, descriptor, &event) == 0;
}

bool EventLoop::add(int descriptor, std::uint32_t events, EventSource& source) {
    return control(EPOLL_CTL_ADD, descriptor, events, &source);
}

void EventLoop::modify(int descriptor, std::uint32_t events, EventSource& source) {
    [[maybe_unused]] const bool isModified = control(EPOLL_CTL_MOD, descriptor, events, &source);
    assert(isModified);
}

void EventLoop::remove(int descriptor) {
    [[maybe_unused]] const bool isRemoved = control(EPOLL_CTL_DEL, descriptor, 0, nullptr);
    assert(isRemoved);
}

void EventLoop::post(Task task) {
    {
        const MutexLock lock(mutex_);
        tasks_.push_back(std::move(task));
    }
    const std::uint64_t one = 1;
    [[maybe_unused]] const ssize_t written = ::write(wakeUp_.get(), &one, sizeof one);
}

void EventLoop::callAfter(std::chrono::milliseconds delay, Task task) {
    delayed_.emplace(std::chrono::steady_clock::now() + delay, std::move(task));
}

int EventLoop::timeout() const noexcept {
    if (delayed_.empty()) {
        return -1;
    }
    const auto left = std::chrono::ceil<std::chrono::milliseconds>(delayed_.begin()->first -
                                                                   std::chrono::steady_clock::now());
    return static_cast<int>(std::clamp<std::chrono::milliseconds::rep>(left.count(), 0, 60'000));
}

void EventLoop::runTasks() {
    std::vector<Task> tasks;
    {
        const MutexLock lock(mutex_);
        tasks.swap(tasks_);
    }
    for (Task& task : tasks) {
        task();
    }
}

void EventLoop::dropTasks() {
    delayed_.clear();
    std::vector<Task> tasks;
    const MutexLock lock(mutex_);
    tasks.swap(tasks_);
}

void EventLoop::runDelayed() {
    const Deadline now = delayed_.empty() ? Deadline() : std::chrono::steady_clock::now();
    while (!delayed_.empty() && delayed_.begin()->first <= now) {
        Task task = std::move(delayed_.begin()->second);
        delayed_.erase(delayed_.begin());
        task();
    }
}

void EventLoop::serve(std::span<const epoll_event> events) {
    for (const bool first : {true, false}) {
        for (const epoll_event& event : events) {
            auto* source = static_cast<EventSource*>(event.data.ptr);
            if (source != nullptr && source->comesFirst() == first) {
                source->ready(event.events);
            }
        }
    }
}

void EventLoop::run(LinuxWorkQueues& strands) {
    std::array<epoll_event, kEventsPerWakeUp> events;
    bool goesOn = false;
    while (!isStopped_) {
        const int count = ::epoll_wait(epoll_.get(), events.data(), kEventsPerWakeUp, goesOn ? 0 : timeout());
        const auto up = std::span(events).first(static_cast<std::size_t>(std::max(count, 0)));
        const bool hasTasks = std::any_of(up.begin(), up.end(),
                                          [](const epoll_event& event) { return event.data.ptr == nullptr; });
        strands.beginWakeUp();
        serve(up);
        goesOn = turns_ && turns_();
        goesOn = strands.endWakeUp() || goesOn;
        if (hasTasks) {
            std::uint64_t ignored;
            [[maybe_unused]] const ssize_t bytes = ::read(wakeUp_.get(), &ignored, sizeof ignored);
        }
        runTasks();
        runDelayed();
    }
}

} // namespace tamblo
