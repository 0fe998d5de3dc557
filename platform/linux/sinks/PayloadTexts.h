#pragma once

#include "base/Dictionary.h"
#include "base/Json.h"
#include "base/TextBuffer.h"
#include "platform/Clock.h"

#include <atomic>
#include <cstddef>
#include <cstdint>
#include <string_view>
#include <vector>

namespace tamblo {

/// The text of the payload that was written last. A message goes to several sinks, one after the other, and
/// the text of its payload is most of what a line costs: the first makes it, the others copy it, and the time
/// that stands in their lines with it, until the end of the batch. The next payload of the same keys has its
/// text made only where it differs. Any thread; one that comes while another is at it makes its own text.
class PayloadTexts {
public:
    /// Appends `{"time":…`, what `appendRest` is to append, `,"payload":{…}}`. The entry of the key
    /// `leftOut`, if any, does not stand in the payload.
    template <typename AppendRest>
    void appendLine(TextBuffer& line, const Clock& clock, const Dictionary& payload, std::string_view leftOut,
                    AppendRest&& appendRest) {
        const Turn turn(isTaken_);
        const bool isKnown = turn.isMine() && isKept_ && payload.sharesStorageWith(last_.dictionary);
        if (!turn.isMine()) {
            appendTime(line, clock.now());
        } else {
            const std::uint64_t batch = batch_.load(std::memory_order_relaxed);
            if (!isKnown || batch != batchOfTime_) {
                time_.clear();
                appendTime(time_, clock.now());
                batchOfTime_ = batch;
            }
            line.append(time_.view());
        }
        appendRest(line);
        line.append(",\"payload\":");
        if (isKnown) {
            appendLast(line, leftOut);
        } else if (turn.isMine()) {
            appendNext(line, payload, leftOut);
        } else {
            JsonObjectText own;
            appendWhole(line, payload, leftOut, own, nullptr);
        }
        line.append('}');
    }
    /// What is made from here on has a time of its own.
    void endBatch() noexcept;

private:
    /// Of who works with what is kept, if nobody else does.
    class Turn {
    public:
        explicit Turn(std::atomic_flag& isTaken) noexcept
            : isTaken_(isTaken), isMine_(!isTaken.test_and_set(std::memory_order_acquire)) {}
        ~Turn() {
            if (isMine_) {
                isTaken_.clear(std::memory_order_release);
            }
        }
        Turn(const Turn&) = delete;
        Turn& operator=(const Turn&) = delete;
        [[nodiscard]] bool isMine() const noexcept { return isMine_; }

    private:
        std::atomic_flag& isTaken_;
        const bool isMine_;
    };

    static void appendTime(TextBuffer& line, WallTime now);
    /// Leaves in `whole` what it has written, and a copy of its text in `kept`, if there is any and the text
    /// is not too long.
    static void appendWhole(TextBuffer& line, const Dictionary& payload, std::string_view leftOut,
                            JsonObjectText& whole, TextBuffer* kept);
    // In one's turn.
    void appendLast(TextBuffer& line, std::string_view leftOut) const;
    void appendNext(TextBuffer& line, const Dictionary& payload, std::string_view leftOut);

    std::atomic<std::uint64_t> batch_{1};
    std::atomic_flag isTaken_;
    std::uint64_t batchOfTime_ = 0;
    TextBuffer time_; ///< a line's beginning
    bool isKept_ = false;
    /// The payload is held, so that no other comes to stand in its place.
    JsonObjectText last_;
    TextBuffer text_; ///< of the last payload
    // For their memory, which the next text takes.
    TextBuffer nextText_;
    std::vector<std::size_t> nextMembers_;
};

} // namespace tamblo
