#pragma once

#include "base/BoundedCache.h"
#include "base/Dictionary.h"
#include "platform/Clock.h"
#include "util/AudioEvents.h"

/// What a session does to each payload before anyone sees it, as changes of a dictionary. None can fail. On
/// whatever thread does the session's work.
namespace tamblo::intake {

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

/// Whether both payloads say the same, times aside.
[[nodiscard]] bool isRepetition(const Dictionary& earlier, const Dictionary& payload) noexcept;

/// The timestamp, or 0 when there is none.
[[nodiscard]] double epochTime(const Dictionary& payload) noexcept;

} // namespace tamblo::intake
