#pragma once

#include "platform/WorkQueue.h"

#include <deque>
#include <memory>
#include <mutex>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

namespace tamblo {

/// What is posted to a fake queue, until a test runs it on the test's thread. Outlives the queue for as long
/// as somebody runs it.
class FakeStrand {
public:
    void post(Work work, Pace pace) {
        const std::lock_guard held(mutex_);
        pieces_.push_back(std::move(work));
        paces_.push_back(pace);
    }
    void setBatchEnd(Work batchEnd) { batchEnd_ = std::move(batchEnd); }
    /// Runs what is posted, and what that posts, then the batch's end; the number of pieces. Does nothing
    /// inside a piece of its own.
    std::size_t runAll() {
        std::size_t count = 0;
        while (!isRunning_ && runOne()) {
            ++count;
        }
        if (count != 0 && batchEnd_) {
            batchEnd_();
        }
        return count;
    }
    /// Runs one piece, without the batch's end; false when there is none, or the queue is suspended.
    bool runOne() {
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
    [[nodiscard]] std::vector<Pace> takePaces() {
        const std::lock_guard held(mutex_);
        return std::exchange(paces_, {});
    }
    void setSuspended(bool isSuspended) {
        const std::lock_guard held(mutex_);
        isSuspended_ = isSuspended;
    }

private:
    Work batchEnd_;
    bool isRunning_ = false;
    std::mutex mutex_;
    bool isSuspended_ = false;
    std::deque<Work> pieces_;
    std::vector<Pace> paces_;
};

/// Keeps what is posted until a test runs it, or it is destroyed.
class FakeSerialQueue final : public SerialQueue {
public:
    explicit FakeSerialQueue(std::string_view label,
                             std::shared_ptr<FakeStrand> strand = std::make_shared<FakeStrand>())
        : label_(label), strand_(std::move(strand)) {}
    ~FakeSerialQueue() override {
        strand_->setSuspended(false);
        strand_->runAll();
    }

    void post(Work work, Pace pace) override { strand_->post(std::move(work), pace); }
    void setBatchEnd(Work batchEnd) override { strand_->setBatchEnd(std::move(batchEnd)); }
    void setMayBlock(bool mayBlockNow) override { mayBlock = mayBlockNow; }
    void suspend() override { strand_->setSuspended(true); }
    void resume() override { strand_->setSuspended(false); }
    [[nodiscard]] std::string_view label() const noexcept override { return label_; }

    std::size_t runAll() { return strand_->runAll(); }
    bool runOne() { return strand_->runOne(); }
    /// The pace of each piece that was posted since the last call.
    [[nodiscard]] std::vector<Pace> takePaces() { return strand_->takePaces(); }

    bool mayBlock = false;

private:
    const std::string label_;
    const std::shared_ptr<FakeStrand> strand_;
};

} // namespace tamblo
