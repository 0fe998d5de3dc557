#include "metrics/ProtoTextFormatter.h"

#include "base/Format.h"
#include "base/Utf8.h"

namespace tamblo {

namespace {

void appendOctal(std::string& out, unsigned char byte) {
    out += '\\';
    for (const unsigned shift : {6U, 3U, 0U}) {
        out += static_cast<char>('0' + ((byte >> shift) & 7U));
    }
}

void appendEscaped(std::string& out, char character, bool keepsNonAscii) {
    constexpr std::string_view plain = "\n\r\t\"'\\";
    constexpr std::string_view letters = "nrt\"'\\";
    const auto byte = static_cast<unsigned char>(character);
    if (const std::size_t known = plain.find(character); known != std::string_view::npos) {
        out += '\\';
        out += letters[known];
    } else if (byte < 0x20 || byte == 0x7F || (byte >= 0x80 && !keepsNonAscii)) {
        appendOctal(out, byte);
    } else {
        out += character;
    }
}

} // namespace

void ProtoTextFormatter::beginObject(std::string_view name) {
    beginLine(name);
    out_ += " {\n";
    ++depth_;
}

void ProtoTextFormatter::endObject() {
    --depth_;
    beginLine("}");
    out_ += '\n';
}

void ProtoTextFormatter::signed32(std::string_view name, std::int32_t value) {
    beginLine(name);
    appendFormatted(out_, ": {}\n", value);
}

void ProtoTextFormatter::unsigned64(std::string_view name, std::uint64_t value) {
    beginLine(name);
    appendFormatted(out_, ": {}\n", value);
}

void ProtoTextFormatter::string(std::string_view name, std::string_view bytes) {
    beginLine(name);
    out_ += ": \"";
    const bool keepsNonAscii = isUtf8(bytes);
    for (const char character : bytes) {
        appendEscaped(out_, character, keepsNonAscii);
    }
    out_ += "\"\n";
}

void ProtoTextFormatter::beginLine(std::string_view name) {
    out_.append(2 * depth_, ' ');
    out_ += name;
}

} // namespace tamblo
