#pragma once

#include "bridge/common/Time.h"
#include "bridge/pipewire/graph/Namespace.h"

#include <chrono>
#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <vector>

struct pw_loop;
struct spa_source;

namespace tamblo::pipewire {

/// The program's one thread: waits for descriptors and for times, and does nothing else.
class Loop {
public:
    /// Something that is watched until this is destroyed.
    class Watch {
    public:
        Watch(Loop& loop, spa_source* source) : loop_(loop), source_(source) {}
        ~Watch();
        Watch(const Watch&) = delete;
        Watch& operator=(const Watch&) = delete;

        void watchWriting(bool isWanted);

    private:
        friend class Loop;

        Loop& loop_;
        spa_source* source_;
        std::uint32_t mask_ = 0;
        std::function<void()> onReady_;
    };

    explicit Loop(const Clock& clock);
    ~Loop();
    Loop(const Loop&) = delete;
    Loop& operator=(const Loop&) = delete;

    [[nodiscard]] pw_loop* get() const noexcept { return loop_; }

    /// A descriptor for reading. Nothing for one that cannot be watched.
    [[nodiscard]] std::unique_ptr<Watch> watch(int descriptor, std::function<void()> onReady);
    /// A signal, which has to be blocked in all threads.
    [[nodiscard]] std::unique_ptr<Watch> watchSignal(int number, std::function<void()> onSignal);
    void addTimed(Timed& timed) { timed_.push_back(&timed); }

    /// Until `stop`. `beforeSleep` is called each time before the thread sleeps: what was reported since
    /// leaves together then. It answers when it wants to be called again at the latest.
    void run(const std::function<std::optional<SteadyTime>()>& beforeSleep);
    void stop() noexcept { isStopped_ = true; }

private:
    void runDue();

    const Clock& clock_;
    pw_loop* loop_;
    std::vector<Timed*> timed_;
    bool isStopped_ = false;
};

} // namespace tamblo::pipewire
