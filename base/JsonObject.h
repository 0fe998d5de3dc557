#pragma once

#include "base/Json.h"
#include "base/TextBuffer.h"

#include <concepts>
#include <span>
#include <string>
#include <string_view>

namespace tamblo {

/// A JSON object that is appended to a text member by member, in the order in which they are added. It ends
/// with this object. Names need no escaping.
class JsonObject {
public:
    explicit JsonObject(TextBuffer& out) : out_(out) { out_.append('{'); }
    ~JsonObject() { out_.append('}'); }
    JsonObject(const JsonObject&) = delete;
    JsonObject& operator=(const JsonObject&) = delete;

    JsonObject& text(std::string_view name, std::string_view value) {
        begin(name);
        appendJsonString(out_, value);
        return *this;
    }
    template <std::integral Number> JsonObject& number(std::string_view name, Number value) {
        begin(name);
        appendJson(out_, Value(value));
        return *this;
    }
    JsonObject& number(std::string_view name, double value) {
        begin(name);
        appendJsonNumber(out_, value);
        return *this;
    }
    JsonObject& value(std::string_view name, const Value& value) {
        begin(name);
        appendJson(out_, value);
        return *this;
    }
    JsonObject& null(std::string_view name) {
        begin(name);
        out_.append("null");
        return *this;
    }
    JsonObject& texts(std::string_view name, std::span<const std::string> values) {
        return array(name, values,
                     [](TextBuffer& out, std::string_view value) { appendJsonString(out, value); });
    }
    /// An object within this one; `fill` is given it as a `JsonObject&` and adds its fields.
    template <typename Fill> JsonObject& object(std::string_view name, Fill&& fill) {
        begin(name);
        JsonObject inner(out_);
        fill(inner);
        return *this;
    }
    /// An array; `append` is given the text and each of the elements, and appends it as JSON: with a
    /// `JsonObject` of its own, or by the functions of `base/Json.h`.
    template <typename Elements, typename Append>
    JsonObject& array(std::string_view name, const Elements& elements, Append&& append) {
        begin(name);
        out_.append('[');
        bool isFirst = true;
        for (const auto& element : elements) {
            if (!isFirst) {
                out_.append(',');
            }
            isFirst = false;
            append(out_, element);
        }
        out_.append(']');
        return *this;
    }

private:
    void begin(std::string_view name) {
        if (!isEmpty_) {
            out_.append(',');
        }
        isEmpty_ = false;
        out_.append('"');
        out_.append(name);
        out_.append("\":");
    }

    TextBuffer& out_;
    bool isEmpty_ = true;
};

} // namespace tamblo
