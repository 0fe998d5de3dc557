#include "util/DataSerialize.h"

#include "base/Base64.h"
#include "base/Dictionary.h"
#include "base/Format.h"
#include "base/Rfc3339.h"

#include <algorithm>
#include <array>
#include <charconv>
#include <cmath>
#include <cstddef>
#include <span>
#include <string_view>

namespace tamblo {

namespace {

constexpr std::string_view kHead = "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n"
                                   "<!DOCTYPE plist>\n"
                                   "<plist version=\"1.0\">\n";
constexpr std::string_view kFoot = "</plist>\n";

/// What XML 1.0 leaves out of its characters below U+0020, and what it must not see as markup. A carriage
/// return is written as a reference: a reader would make a line feed of it.
[[nodiscard]] bool appendEscaped(std::string& out, std::string_view text) {
    for (const char character : text) {
        switch (character) {
        case '&':
            out += "&amp;";
            break;
        case '<':
            out += "&lt;";
            break;
        case '>':
            out += "&gt;";
            break;
        case '\r':
            out += "&#13;";
            break;
        default:
            if (static_cast<unsigned char>(character) < 0x20 && character != '\t' && character != '\n') {
                return false;
            }
            out += character;
        }
    }
    return true;
}

template <typename Number> std::string realText(Number number) {
    if (std::isnan(number)) {
        return "nan";
    }
    if (std::isinf(number)) {
        return number < 0 ? "-infinity" : "+infinity";
    }
    std::array<char, 32> text{};
    const auto end = std::to_chars(text.data(), text.data() + text.size(), number).ptr;
    return {text.data(), end};
}

/// Writes one value as an XML property list, version 1.0, indented with tabs. Used once, for one value.
class PropertyListWriter {
public:
    /// The document, or nothing when the value holds what XML cannot carry.
    [[nodiscard]] static std::optional<std::string> write(const Value& value) {
        PropertyListWriter writer;
        writer.out_ = kHead;
        if (!writer.element(value)) {
            return std::nullopt;
        }
        writer.out_ += kFoot;
        return std::move(writer.out_);
    }

private:
    // Each answers whether XML can carry the value.
    [[nodiscard]] bool element(const Value& value);
    [[nodiscard]] bool array(std::span<const Value> elements);
    [[nodiscard]] bool dictionary(const Dictionary& dictionary);
    [[nodiscard]] bool text(std::string_view name, std::string_view text);
    [[nodiscard]] bool date(double secondsSince1970);
    bool simple(std::string_view name, std::string_view content);
    bool line(std::string_view markup);

    std::string out_;
    std::size_t depth_ = 0;
};

bool PropertyListWriter::element(const Value& value) {
    switch (value.kind()) {
    case Value::Kind::boolean:
        return line(value.boolValue() ? "<true/>" : "<false/>");
    case Value::Kind::integer:
        return simple("integer", formatted("{}", value.rawInteger()));
    case Value::Kind::unsignedInteger:
        return simple("integer", formatted("{}", value.rawUnsigned()));
    case Value::Kind::singleFloat:
        return simple("real", realText(value.rawSingle()));
    case Value::Kind::doubleFloat:
        return simple("real", realText(value.rawDouble()));
    case Value::Kind::string:
        return text("string", value.stringValue());
    case Value::Kind::date:
        return date(value.dateSeconds());
    case Value::Kind::data:
        return simple("data", encodeBase64(value.dataValue()));
    case Value::Kind::array:
        return array(value.arrayValue());
    case Value::Kind::dictionary:
        return dictionary(value.dictionaryValue());
    }
    return false;
}

bool PropertyListWriter::array(std::span<const Value> elements) {
    if (elements.empty()) {
        return line("<array/>");
    }
    line("<array>");
    ++depth_;
    if (!std::ranges::all_of(elements, [this](const Value& member) { return element(member); })) {
        return false;
    }
    --depth_;
    return line("</array>");
}

bool PropertyListWriter::dictionary(const Dictionary& dictionary) {
    if (dictionary.empty()) {
        return line("<dict/>");
    }
    line("<dict>");
    ++depth_;
    for (std::size_t i = 0; i < dictionary.size(); ++i) {
        if (!text("key", dictionary.keyAt(i)) || !element(dictionary.valueAt(i))) {
            return false;
        }
    }
    --depth_;
    return line("</dict>");
}

bool PropertyListWriter::text(std::string_view name, std::string_view text) {
    std::string content;
    return appendEscaped(content, text) && simple(name, content);
}

/// Dates of a property list are whole seconds.
bool PropertyListWriter::date(double secondsSince1970) {
    const std::optional<std::string> text = formatRfc3339(std::floor(secondsSince1970));
    return text && simple("date", text->substr(0, text->find('.')) + 'Z');
}

bool PropertyListWriter::simple(std::string_view name, std::string_view content) {
    return line(formatted("<{}>{}</{}>", name, content, name));
}

bool PropertyListWriter::line(std::string_view markup) {
    out_.append(depth_, '\t').append(markup) += '\n';
    return true;
}

} // namespace

std::optional<std::vector<std::uint8_t>> DataSerialize::getPlistBlob(const Value& propertyList) {
    const std::optional<std::string> text = PropertyListWriter::write(propertyList);
    if (!text) {
        return std::nullopt;
    }
    return std::vector<std::uint8_t>(text->begin(), text->end());
}

std::optional<std::string> DataSerialize::getXMLInfo(const Value& propertyList) {
    std::optional<std::string> text = PropertyListWriter::write(propertyList);
    const auto isNotAscii = [](char character) { return static_cast<unsigned char>(character) >= 0x80; };
    if (text && std::any_of(text->begin(), text->end(), isNotAscii)) {
        return std::nullopt;
    }
    return text;
}

std::optional<std::string> DataSerialize::getDataXMLInfo(const Value& propertyList) {
    return PropertyListWriter::write(propertyList);
}

std::optional<std::string> DataSerialize::getBase64XMLBlob(const Value& propertyList) {
    const std::optional<std::vector<std::uint8_t>> blob = getPlistBlob(propertyList);
    if (!blob) {
        return std::nullopt;
    }
    return encodeBase64(*blob);
}

} // namespace tamblo
