#pragma once

#include "base/BoundedCache.h"
#include "base/Dictionary.h"
#include "base/KeySet.h"
#include "platform/Clock.h"
#include "util/AudioEvents.h"

#include <cstddef>

/// What a session does to each payload before anyone sees it, as changes of a dictionary. None can fail. On
/// whatever thread does the session's work.
namespace tamblo::intake {

/// The timestamp, the mark of one that is replaced, the audio tag and the application's name: who makes a
/// payload leaves room for so many.
inline constexpr std::size_t kMostKeysAdded = 4;

/// Sees to it that there is a timestamp: one that is missing or older than 365 days is replaced by now, and
/// what stood there is kept under "invalid_timestamp". One in the future is left alone.
void addMissingDates(Dictionary& payload, WallTime now);

/// Replaces every space in keys by "_"; other white space stays. The value of a key with a space wins over
/// one that already has the underscore.
void removeWhiteSpaceFromKeys(Dictionary& payload);

/// The tags that messages had of late, which are few: the category's name followed by the type's. One for all
/// sessions, on the reporting server queue.
class AudioTags {
public:
    [[nodiscard]] const Value& of(AudioEventCategory category, AudioEventType type);

private:
    BoundedCache<Value> tags_;
};

/// Sets "audiotag".
void addAudioMessageTag(Dictionary& payload, const Value& tag);

/// Sets the application's name where there is none, or "Unknown".
void addAppName(Dictionary& payload, const Value& appName);

/// All of these at once for the payloads of key sets met of late. One for all sessions, on the reporting
/// server queue.
class Normaliser {
public:
    void normalise(Dictionary& payload, const Value& tag, const Value& appName, const Clock& clock);

private:
    /// Where the payloads of a key set get what they lack.
    struct Plan {
        KeySetRef arrived;  ///< held, so that no other can come to stand at its address
        KeySetRef complete; ///< with the keys that are added; null where a step does more than that
        std::size_t timestamp = 0;
        std::size_t tag = 0;
        std::size_t appName = 0; ///< where it is, or is added
        bool addsAppName = false;
    };
    [[nodiscard]] static Plan makePlan(const KeySet& keys);
    [[nodiscard]] static bool follow(const Plan& plan, Dictionary& payload, const Value& tag,
                                     const Value& appName, WallTime now);

    BoundedCache<Plan, 16> plans_;
};

/// Whether both payloads say the same, times aside.
[[nodiscard]] bool isRepetition(const Dictionary& earlier, const Dictionary& payload) noexcept;

/// The timestamp, or 0 when there is none.
[[nodiscard]] double epochTime(const Dictionary& payload) noexcept;

} // namespace tamblo::intake
