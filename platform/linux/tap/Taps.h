#pragma once

#include "base/Mutex.h"
#include "base/TextBuffer.h"
#include "os/FileDescriptor.h"
#include "platform/MessageTap.h"
#include "platform/linux/loop/EventLoop.h"

#include <cstddef>
#include <memory>
#include <string_view>
#include <vector>

namespace tamblo {

/// Readers to whom messages are shown as they are recorded: a line of JSON each, in a buffer of the reader's
/// own, which the event loop sends as the reader takes it.
///
/// Nobody waits for a reader. What its buffer has no room for is counted and not even made into text, and the
/// reader is told how many messages that were (`{"left_out":N}`), where they would have stood. A large
/// payload is not shown. So what a reader costs others is bounded by its filter and by what it reads.
///
/// A recording is to miss nothing: one tap at a time, of named reporters, has a buffer for some hundred
/// thousand messages, and is shown payloads of any size.
class Taps final : public MessageTap {
public:
    static constexpr std::size_t kMostTaps = 8;
    static constexpr std::size_t kMostWaiting = 1U << 20U;
    static constexpr std::size_t kMostWaitingOfRecording = 32U << 20U;
    /// As the values lie in memory.
    static constexpr std::size_t kLargestPayload = 64U << 10U;

    /// The loop outlives the taps.
    explicit Taps(EventLoop& loop) : loop_(loop) {}
    /// Sends what readers take at once of what waits for them.
    ~Taps() override;
    Taps(const Taps&) = delete;
    Taps& operator=(const Taps&) = delete;

    /// Takes over the connection to a reader, which does not block. The reader is told what is wrong with its
    /// filter. Any thread.
    void add(FileDescriptor reader, std::string_view filter) TAMBLO_EXCLUDES(mutex_);
    void offer(const TappedMessage& message) override TAMBLO_EXCLUDES(mutex_);

private:
    class Tap;

    /// On the loop's thread.
    void remove(const Tap& tap) TAMBLO_EXCLUDES(mutex_);

    EventLoop& loop_;
    TextBuffer line_;  ///< the server queue's
    TextBuffer whole_; ///< likewise, of a message with a payload of any size

    Mutex mutex_;
    std::vector<std::shared_ptr<Tap>> taps_ TAMBLO_GUARDED_BY(mutex_);
};

} // namespace tamblo
