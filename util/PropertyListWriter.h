#pragma once

#include "base/Dictionary.h"
#include "base/Value.h"

#include <cstddef>
#include <optional>
#include <string>
#include <string_view>

namespace tamblo {

/// Writes one value as an XML property list, version 1.0, indented with tabs. Used once, for one value.
class PropertyListWriter {
public:
    /// The document, or nothing when the value holds what XML cannot carry.
    [[nodiscard]] static std::optional<std::string> write(const Value& value);

private:
    [[nodiscard]] bool element(const Value& value);
    [[nodiscard]] bool array(const Value& value);
    [[nodiscard]] bool dictionary(const Dictionary& dictionary);
    [[nodiscard]] bool text(std::string_view name, std::string_view text);
    [[nodiscard]] bool date(double secondsSince1970);
    void real(const Value& value);
    void simple(std::string_view name, std::string_view content);
    void line(std::string_view markup);
    void indent() { out_.append(depth_, '\t'); }

    std::string out_;
    std::size_t depth_ = 0;
};

} // namespace tamblo
