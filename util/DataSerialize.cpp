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

std::optional<std::string> PropertyListWriter::write(const Value& value) {
    PropertyListWriter writer;
    writer.out_ = kHead;
    if (!writer.element(value)) {
        return std::nullopt;
    }
    writer.out_ += kFoot;
    return std::move(writer.out_);
}

bool PropertyListWriter::element(const Value& value) {
    switch (value.kind()) {
    case Value::Kind::boolean:
        line(value.boolValue() ? "<true/>" : "<false/>");
        return true;
    case Value::Kind::integer:
        simple("integer", formatted("{}", value.rawInteger()));
        return true;
    case Value::Kind::unsignedInteger:
        simple("integer", formatted("{}", value.rawUnsigned()));
        return true;
    case Value::Kind::singleFloat:
    case Value::Kind::doubleFloat:
        real(value);
        return true;
    case Value::Kind::string:
        return text("string", value.stringValue());
    case Value::Kind::date:
        return date(value.dateSeconds());
    case Value::Kind::data:
        simple("data", encodeBase64(value.dataValue()));
        return true;
    case Value::Kind::array:
        return array(value);
    case Value::Kind::dictionary:
        return dictionary(value.dictionaryValue());
    }
    return false;
}

bool PropertyListWriter::array(const Value& value) {
    if (value.arrayValue().empty()) {
        line("<array/>");
        return true;
    }
    line("<array>");
    ++depth_;
    for (const Value& member : value.arrayValue()) {
        if (!element(member)) {
            return false;
        }
    }
    --depth_;
    line("</array>");
    return true;
}

bool PropertyListWriter::dictionary(const Dictionary& dictionary) {
    if (dictionary.empty()) {
        line("<dict/>");
        return true;
    }
    line("<dict>");
    ++depth_;
    for (std::size_t i = 0; i < dictionary.size(); ++i) {
        if (!text("key", dictionary.keyAt(i)) || !element(dictionary.valueAt(i))) {
            return false;
        }
    }
    --depth_;
    line("</dict>");
    return true;
}

bool PropertyListWriter::text(std::string_view name, std::string_view text) {
    std::string content;
    if (!appendEscaped(content, text)) {
        return false;
    }
    simple(name, content);
    return true;
}

/// Dates of a property list are whole seconds.
bool PropertyListWriter::date(double secondsSince1970) {
    std::optional<std::string> text = formatRfc3339(std::floor(secondsSince1970));
    if (!text) {
        return false;
    }
    if (const std::size_t fraction = text->find('.'); fraction != std::string::npos) {
        text->replace(fraction, std::string::npos, "Z");
    }
    simple("date", *text);
    return true;
}

void PropertyListWriter::real(const Value& value) {
    simple("real", value.kind() == Value::Kind::singleFloat ? realText(value.rawSingle())
                                                            : realText(value.rawDouble()));
}

void PropertyListWriter::simple(std::string_view name, std::string_view content) {
    indent();
    appendFormatted(out_, "<{}>{}</{}>\n", name, content, name);
}

void PropertyListWriter::line(std::string_view markup) {
    indent();
    out_ += markup;
    out_ += '\n';
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
