#include "platform/linux/loop/EventLoop.h"

#include <algorithm>
#include <array>
#include <span>
#include <utility>

#include <sys/epoll.h>
#include <sys/eventfd.h>

namespace tamblo {

namespace {

/// How many descriptors one wake-up serves at most.
constexpr int kEventsPerWakeUp = 64;

} // namespace

EventLoop::EventLoop()
    : epoll_(::epoll_create1(EPOLL_CLOEXEC)), wakeUp_(::eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK)) {
    epoll_event event{};
    event.events = EPOLLIN;
    event.data.ptr = nullptr;
    ::epoll_ctl(epoll_.get(), EPOLL_CTL_ADD, wakeUp_.get(), &event);
}

EventLoop::~EventLoop() = default;

void EventLoop::add(int descriptor, std::uint32_t events, EventSource& source) {
    epoll_event event{};
    event.events = events;
    event.data.ptr = &source;
    ::epoll_ctl(epoll_.get(), EPOLL_CTL_ADD, descriptor, &event);
}

void EventLoop::modify(int descriptor, std::uint32_t events, EventSource& source) {
    epoll_event event{};
    event.events = events;
    event.data.ptr = &source;
    ::epoll_ctl(epoll_.get(), EPOLL_CTL_MOD, descriptor, &event);
}

void EventLoop::remove(int descriptor) {
    ::epoll_ctl(epoll_.get(), EPOLL_CTL_DEL, descriptor, nullptr);
}

void EventLoop::post(Task task) {
    {
        const std::lock_guard lock(mutex_);
        tasks_.push_back(std::move(task));
    }
    wake();
}

void EventLoop::wake() noexcept {
    const std::uint64_t one = 1;
    [[maybe_unused]] const ssize_t written = ::write(wakeUp_.get(), &one, sizeof one);
}

void EventLoop::callAfter(std::chrono::milliseconds delay, Task task) {
    deadline_ = std::chrono::steady_clock::now() + delay;
    delayed_ = std::move(task);
}

void EventLoop::setBrackets(Task before, Task after) {
    before_ = std::move(before);
    after_ = std::move(after);
}

int EventLoop::timeout() const noexcept {
    if (!deadline_) {
        return -1;
    }
    const auto left =
        std::chrono::ceil<std::chrono::milliseconds>(*deadline_ - std::chrono::steady_clock::now());
    return static_cast<int>(std::clamp<std::chrono::milliseconds::rep>(left.count(), 0, 60'000));
}

void EventLoop::runTasks() {
    std::vector<Task> tasks;
    {
        const std::lock_guard lock(mutex_);
        tasks.swap(tasks_);
    }
    for (Task& task : tasks) {
        task();
    }
}

void EventLoop::runDelayed() {
    if (deadline_ && std::chrono::steady_clock::now() >= *deadline_) {
        deadline_.reset();
        Task task = std::exchange(delayed_, Task());
        task();
    }
}

void EventLoop::run() {
    std::array<epoll_event, kEventsPerWakeUp> events;
    while (!isStopped_) {
        const int count = ::epoll_wait(epoll_.get(), events.data(), kEventsPerWakeUp, timeout());
        const auto up = std::span(events).first(static_cast<std::size_t>(std::max(count, 0)));
        bool hasTasks = false;
        if (before_) {
            before_();
        }
        for (const bool first : {true, false}) {
            for (const epoll_event& event : up) {
                auto* source = static_cast<EventSource*>(event.data.ptr);
                if (source != nullptr && source->comesFirst() == first) {
                    source->ready(event.events);
                }
                hasTasks = hasTasks || source == nullptr;
            }
        }
        if (after_) {
            after_();
        }
        if (hasTasks) {
            std::uint64_t ignored;
            [[maybe_unused]] const ssize_t bytes = ::read(wakeUp_.get(), &ignored, sizeof ignored);
        }
        runTasks();
        runDelayed();
    }
}

} // namespace tamblo
