#pragma once

#include "base/Mutex.h"
#include "base/TextBuffer.h"
#include "os/FileDescriptor.h"
#include "platform/MessageTap.h"
#include "platform/linux/loop/EventLoop.h"

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <string_view>
#include <vector>

#include <sys/types.h>

namespace tamblo {

/// Readers to whom messages are shown as they are recorded: a line of JSON each, in a buffer of the reader's
/// own, which the event loop sends as the reader takes it.
///
/// Nobody waits for a reader. What its buffer has no room for is counted and not even made into text, and the
/// reader is told how many messages that were (`{"left_out":N}`), where they would have stood. A large
/// payload is not shown. All readers together get a quarter of the time, once they have used up what they
/// were granted in advance: messages for which there is none are not looked at, and count as left out for
/// all. So readers slow others down by no more than that, whatever their filters cost.
///
/// A recording is to miss nothing: one tap at a time, of named reporters, has a buffer for some hundred
/// thousand messages, is shown payloads of any size, and is outside that share of the time.
///
/// Where all places are taken, a reader of the user who has most of them makes room for a user who has fewer.
class Taps final : public MessageTap {
public:
    static constexpr std::size_t kMostTaps = 8;
    static constexpr std::size_t kMostWaiting = 1U << 20U;
    static constexpr std::size_t kMostWaitingOfRecording = 32U << 20U;
    /// As the values lie in memory.
    static constexpr std::size_t kLargestPayload = 64U << 10U;

    /// Of time.
    static constexpr int kShare = 4;
    /// What may be taken at once; as much as a quarter of it has to be there again to go on.
    static constexpr std::chrono::nanoseconds kMostCredit = std::chrono::milliseconds(200);

    using SteadyNow = std::chrono::steady_clock::time_point (*)();

    /// The loop outlives the taps.
    explicit Taps(EventLoop& loop, SteadyNow now = std::chrono::steady_clock::now) : loop_(loop), now_(now) {}
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

    /// To those taps that are recordings, or to the others.
    void offerTo(bool areRecordings, const TappedMessage& message, TextBuffer& line) TAMBLO_REQUIRES(mutex_);
    /// On the loop's thread.
    void remove(const Tap& tap) TAMBLO_EXCLUDES(mutex_);
    [[nodiscard]] std::size_t openTapsOf(uid_t user) const TAMBLO_REQUIRES(mutex_);
    /// Whether there is a place for one more of the user's taps, maybe another user's.
    [[nodiscard]] bool makeRoomFor(uid_t user) TAMBLO_REQUIRES(mutex_);
    /// Whether there is time to look at a message; it is counted as left out if not.
    [[nodiscard]] bool hasTime(std::chrono::steady_clock::time_point now) TAMBLO_REQUIRES(mutex_);
    void tellWhatIsLeftOut() TAMBLO_REQUIRES(mutex_);

    EventLoop& loop_;
    const SteadyNow now_;
    TextBuffer line_;  ///< the server queue's
    TextBuffer whole_; ///< likewise, of a message with a payload of any size

    Mutex mutex_;
    std::vector<std::shared_ptr<Tap>> taps_ TAMBLO_GUARDED_BY(mutex_);
    std::chrono::nanoseconds credit_ TAMBLO_GUARDED_BY(mutex_) = kMostCredit;
    std::chrono::steady_clock::time_point creditOf_ TAMBLO_GUARDED_BY(mutex_){};
    bool isOutOfTime_ TAMBLO_GUARDED_BY(mutex_) = false;
    std::uint64_t leftOut_ TAMBLO_GUARDED_BY(mutex_) = 0; ///< for want of time, and not told yet
};

} // namespace tamblo
