#pragma once

#include "base/Value.h"

#include <optional>
#include <string_view>

namespace tamblo {

/// The preferences store: values by domain and key. Any thread; may read a file.
class Preferences {
public:
    virtual ~Preferences() = default;
    /// The value that is stored now, or nothing.
    [[nodiscard]] virtual std::optional<Value> copyPreferenceValue(std::string_view key,
                                                                   std::string_view domain) const = 0;
};

} // namespace tamblo
