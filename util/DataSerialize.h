#pragma once

#include "base/Value.h"

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

namespace tamblo {

/// Property lists as XML, version 1.0. Each operation gives nothing for a value that has no such form: a text
/// with a control character that XML cannot carry, a date without a calendar text.
class DataSerialize {
public:
    [[nodiscard]] static std::optional<std::vector<std::uint8_t>> getPlistBlob(const Value& propertyList);
    /// The blob as text; nothing when a byte of it is not ASCII.
    [[nodiscard]] static std::optional<std::string> getXMLInfo(const Value& propertyList);
    /// The blob as UTF-8 text.
    [[nodiscard]] static std::optional<std::string> getDataXMLInfo(const Value& propertyList);
    /// The blob in Base64, on one line.
    [[nodiscard]] static std::optional<std::string> getBase64XMLBlob(const Value& propertyList);
};

} // namespace tamblo
