#pragma once

#include "platform/WorkQueue.h"

#include <deque>
#include <mutex>
#include <string>
#include <string_view>
#include <vector>

namespace tamblo {

/// Keeps what is posted until a test runs it, on the test's thread.
class FakeSerialQueue final : public SerialQueue {
public:
    explicit FakeSerialQueue(std::string_view label) : label_(label) {}
    ~FakeSerialQueue() override { runAll(); }

    void post(Work work, Pace pace) override;
    void setBatchEnd(Work batchEnd) override { batchEnd_ = std::move(batchEnd); }
    [[nodiscard]] std::string_view label() const noexcept override { return label_; }

    /// Runs what is posted, and what that posts, then the batch's end; the number of pieces.
    std::size_t runAll();
    /// Runs one piece, without the batch's end; false when there is none.
    bool runOne();
    /// The pace of each piece that was posted since the last call.
    [[nodiscard]] std::vector<Pace> takePaces();

private:
    const std::string label_;
    Work batchEnd_;
    std::mutex mutex_;
    std::deque<Work> pieces_;
    std::vector<Pace> paces_;
};

} // namespace tamblo
