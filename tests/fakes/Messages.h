#pragma once

#include "base/Json.h"
#include "session/ZRReportingSession.h"

#include <initializer_list>
#include <memory>
#include <string>
#include <string_view>
#include <utility>

namespace tamblo {

/// A message as a client sends it; of playback, and of the generic type, unless another is given.
inline MessageRef messageOf(Dictionary payload, AudioEventCategory category = AudioEventKindPlayback,
                            AudioEventType type = AudioEventTypeGeneric) {
    return std::make_shared<ZRReportingSessionMessage>(std::move(payload), category, type);
}

/// The values of some keys as JSON, with blanks between; a key that is absent is left out.
inline std::string shown(const Dictionary& payload, std::initializer_list<std::string_view> keys) {
    std::string text;
    for (const std::string_view key : keys) {
        if (const Value* value = payload.find(key)) {
            text += (text.empty() ? "" : " ") + jsonText(*value);
        }
    }
    return text;
}

} // namespace tamblo
