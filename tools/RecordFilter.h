#pragma once

#include "base/Dictionary.h"

#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace tamblo::tools {

/// Which records of a sink are wanted: of one of the events named, and with all of the keys.
class RecordFilter {
public:
    /// Event names are exact or end with `*`.
    void wantEvent(std::string_view pattern) { events_.emplace_back(pattern); }
    /// `KEY`, or `KEY=VALUE` with the value as in a typed payload. Keys are those of the payload, or of the
    /// record.
    void wantKey(std::string_view text);

    [[nodiscard]] bool isEmpty() const noexcept { return events_.empty() && keys_.empty(); }
    [[nodiscard]] bool accepts(const Dictionary& record) const;

private:
    struct Key {
        std::string name;
        std::optional<std::string> value;
    };
    std::vector<std::string> events_;
    std::vector<Key> keys_;
};

} // namespace tamblo::tools
