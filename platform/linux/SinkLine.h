#pragma once

#include "base/Json.h"
#include "platform/Clock.h"

#include <cstdint>
#include <string_view>

namespace tamblo {

/// One line of a sink as it is appended to the file's buffer: an object that begins with "time", the seconds
/// since 1970, and goes on with the fields in the order in which they are added. It ends with this object.
class SinkLine {
public:
    SinkLine(TextBuffer& line, WallTime time) : line_(line) {
        line_.append("{\"time\":");
        appendJsonNumber(line_, secondsSince1970(time));
    }
    ~SinkLine() { line_.append('}'); }
    SinkLine(const SinkLine&) = delete;
    SinkLine& operator=(const SinkLine&) = delete;

    SinkLine& text(std::string_view name, std::string_view value) {
        begin(name);
        appendJsonString(line_, value);
        return *this;
    }
    SinkLine& number(std::string_view name, std::uint64_t value) {
        begin(name);
        appendJson(line_, Value(value));
        return *this;
    }
    SinkLine& dictionary(std::string_view name, const Dictionary& value) {
        begin(name);
        appendJson(line_, value);
        return *this;
    }

private:
    /// Names need no escaping.
    void begin(std::string_view name) {
        line_.append(",\"");
        line_.append(name);
        line_.append("\":");
    }

    TextBuffer& line_;
};

} // namespace tamblo
