#pragma once

#include "platform/WorkQueue.h"
#include "platform/linux/loop/ThreadPool.h"

#include <atomic>
#include <chrono>
#include <cstddef>
#include <memory>
#include <mutex>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

namespace tamblo {

class Strand;

/// Lets the thread that holds it run, itself, the quick work that it posts: waking another thread costs more
/// than a message does. Work is posted as ever, collected, and run in one batch at `drain`, so that a batch
/// of requests shares one write of the sinks and one send of the replies. Work that may block goes to the
/// pool, and so does everything behind it. One per thread at a time.
class InlineDrain {
public:
    InlineDrain();
    ~InlineDrain();
    InlineDrain(const InlineDrain&) = delete;
    InlineDrain& operator=(const InlineDrain&) = delete;

    /// Counts posted work towards a batch; answers how much there is since the last drain.
    std::size_t add(std::size_t posted) noexcept { return posted_ += posted; }
    void drain();
    /// The calling thread's, or null.
    [[nodiscard]] static InlineDrain* current() noexcept;

private:
    friend class Strand;
    std::vector<std::shared_ptr<Strand>> strands_;
    std::size_t posted_ = 0;
};

/// What a serial queue is made of: no thread of its own; whoever drains it, the pool or an `InlineDrain`, is
/// the only one to do so at that time, and keeps it until it is empty.
class Strand final : public std::enable_shared_from_this<Strand> {
public:
    explicit Strand(ThreadPool& pool) : pool_(pool) {}

    void post(Work work, Pace pace);
    void setBatchEnd(Work batchEnd) { batchEnd_ = std::move(batchEnd); }
    void setMayBlock(bool mayBlock) noexcept { mayBlock_ = mayBlock; }
    void suspend() noexcept { isSuspended_ = true; }
    void resume();

private:
    friend class InlineDrain;

    struct Item {
        Work work;
        Pace pace;
    };
    using Time = std::chrono::steady_clock::time_point;

    void drainOnPool();
    void drainInline();
    /// Whether there is something to run: the rest of a batch, or a new one. Otherwise the draining is over.
    bool hasBatch();
    void runBatch(bool stopAtBlocking);
    void schedule();
    void handToPool();

    ThreadPool& pool_;
    Work batchEnd_;

    // Touched only by whoever drains.
    std::vector<Item> batch_;
    std::size_t next_ = 0;
    Time inlineAllowedFrom_{};
    bool mayBlock_ = false;

    std::atomic<bool> isSuspended_{false};
    std::mutex mutex_; ///< guards what follows
    std::vector<Item> pending_;
    bool isScheduled_ = false; ///< somebody drains, or is about to
};

/// A serial queue: its user's hold on a strand, which lives on until it has run what was posted.
class LinuxSerialQueue final : public SerialQueue {
public:
    LinuxSerialQueue(ThreadPool& pool, std::string_view label)
        : label_(label), strand_(std::make_shared<Strand>(pool)) {}
    ~LinuxSerialQueue() override { strand_->resume(); }
    LinuxSerialQueue(const LinuxSerialQueue&) = delete;
    LinuxSerialQueue& operator=(const LinuxSerialQueue&) = delete;

    void post(Work work, Pace pace) override { strand_->post(std::move(work), pace); }
    void setBatchEnd(Work batchEnd) override { strand_->setBatchEnd(std::move(batchEnd)); }
    void setMayBlock(bool mayBlock) override { strand_->setMayBlock(mayBlock); }
    void suspend() override { strand_->suspend(); }
    void resume() override { strand_->resume(); }
    [[nodiscard]] std::string_view label() const noexcept override { return label_; }

private:
    const std::string label_;
    const std::shared_ptr<Strand> strand_;
};

} // namespace tamblo
