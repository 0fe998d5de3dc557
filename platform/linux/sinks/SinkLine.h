#pragma once

#include "base/Json.h"
#include "platform/Clock.h"

#include <concepts>
#include <span>
#include <string>
#include <string_view>

namespace tamblo {

/// One object of a sink's line as it is appended to the file's buffer, with the fields in the order in which
/// they are added. It ends with this object. Names need no escaping.
class SinkObject {
public:
    explicit SinkObject(TextBuffer& line) : line_(line) { line_.append('{'); }
    ~SinkObject() { line_.append('}'); }
    SinkObject(const SinkObject&) = delete;
    SinkObject& operator=(const SinkObject&) = delete;

    SinkObject& text(std::string_view name, std::string_view value) {
        begin(name);
        appendJsonString(line_, value);
        return *this;
    }
    template <std::integral Number> SinkObject& number(std::string_view name, Number value) {
        begin(name);
        appendJson(line_, Value(value));
        return *this;
    }
    SinkObject& number(std::string_view name, double value) {
        begin(name);
        appendJsonNumber(line_, value);
        return *this;
    }
    SinkObject& dictionary(std::string_view name, const Dictionary& value) {
        begin(name);
        appendJson(line_, value);
        return *this;
    }
    SinkObject& texts(std::string_view name, std::span<const std::string> values) {
        return array(name, values,
                     [](TextBuffer& line, std::string_view value) { appendJsonString(line, value); });
    }
    /// An object within this one; `fill` is given it as a `SinkObject&` and adds its fields.
    template <typename Fill> SinkObject& object(std::string_view name, Fill&& fill) {
        begin(name);
        SinkObject inner(line_);
        fill(inner);
        return *this;
    }
    /// An array; `append` is given the line and each of the elements, and appends it as JSON: with a
    /// `SinkObject` of its own, or by the functions of `base/Json.h`.
    template <typename Elements, typename Append>
    SinkObject& array(std::string_view name, const Elements& elements, Append&& append) {
        begin(name);
        line_.append('[');
        bool isFirst = true;
        for (const auto& element : elements) {
            if (!isFirst) {
                line_.append(',');
            }
            isFirst = false;
            append(line_, element);
        }
        line_.append(']');
        return *this;
    }

private:
    void begin(std::string_view name) {
        if (!isEmpty_) {
            line_.append(',');
        }
        isEmpty_ = false;
        line_.append('"');
        line_.append(name);
        line_.append("\":");
    }

    TextBuffer& line_;
    bool isEmpty_ = true;
};

/// One line of a sink: an object that begins with "time", the seconds since 1970.
class SinkLine : public SinkObject {
public:
    SinkLine(TextBuffer& line, WallTime time) : SinkObject(line) { number("time", secondsSince1970(time)); }
};

} // namespace tamblo
