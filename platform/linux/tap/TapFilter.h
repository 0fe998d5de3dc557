#pragma once

#include "base/Value.h"
#include "platform/MessageTap.h"

#include <cstdint>
#include <string>
#include <string_view>
#include <utility>
#include <variant>
#include <vector>

namespace tamblo {

/// Which messages a tap shows: those that have one of the values of each list that is not empty, and all of
/// the keys.
struct TapFilter {
    std::vector<ReporterID> reporters;
    std::vector<std::uint32_t> categories;
    std::vector<std::uint16_t> types;
    std::vector<std::string> events; ///< exact, or with a `*` at the end
    std::vector<std::string> keys;   ///< that the payload has
    /// Keys that the payload has with one of the values.
    std::vector<std::pair<std::string, std::vector<Value>>> values;
    std::uint64_t limit = 0;  ///< so many messages, then the tap ends; 0: no limit
    std::uint64_t sample = 1; ///< the first of each so many that match
    bool isRecording = false; ///< the tap is to miss nothing, see `Taps`; needs reporters

    /// From a JSON object; an empty text is one without members. A text says what is wrong with it.
    [[nodiscard]] static std::variant<TapFilter, std::string> parse(std::string_view json);
    [[nodiscard]] bool accepts(const TappedMessage& message) const;
};

} // namespace tamblo
