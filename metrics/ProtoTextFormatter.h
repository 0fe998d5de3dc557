#pragma once

#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>

namespace tamblo {

/// Appends a message in the Protocol Buffers text format, one field a line, indented by its objects. Texts
/// that are UTF-8 keep their characters; in others, every byte that is not ASCII is escaped.
class ProtoTextFormatter {
public:
    explicit ProtoTextFormatter(std::string& out) noexcept : out_(out) {}

    /// What is appended up to the matching end belongs to the object.
    void beginObject(std::string_view name);
    void endObject();
    void signed32(std::string_view name, std::int32_t value);
    void unsigned64(std::string_view name, std::uint64_t value);
    void string(std::string_view name, std::string_view bytes);

private:
    void beginLine(std::string_view name);

    std::string& out_;
    std::size_t depth_ = 0;
};

} // namespace tamblo
