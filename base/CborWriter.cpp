#include "base/Cbor.h"

#include <bit>
#include <cstring>

namespace tamblo {

namespace {

/// Stores the low `count` bytes, most significant first.
char* storeBigEndian(char* to, std::uint64_t value, unsigned count) noexcept {
    for (unsigned i = count; i-- > 0;) {
        *to++ = static_cast<char>(value >> (8 * i));
    }
    return to;
}

} // namespace

void CborWriter::head(unsigned major, std::uint64_t argument) {
    char* const start = out_.room(9);
    char* end = start + 1;
    unsigned info = static_cast<unsigned>(argument);
    if (argument >= 24) {
        const unsigned power = argument <= 0xFF ? 0 : argument <= 0xFFFF ? 1 : argument <= 0xFFFFFFFF ? 2 : 3;
        info = 24 + power;
        end = storeBigEndian(end, argument, 1U << power);
    }
    *start = static_cast<char>(major << 5 | info);
    out_.commit(static_cast<std::size_t>(end - start));
}

void CborWriter::integer(std::int64_t value) {
    if (value >= 0) {
        head(0, static_cast<std::uint64_t>(value));
    } else {
        head(1, ~static_cast<std::uint64_t>(value));
    }
}

void CborWriter::text(std::string_view text) {
    head(3, text.size());
    out_.append(text);
}

void CborWriter::value(const Value& value) {
    switch (value.kind()) {
    case Value::Kind::boolean:
        boolean(value.rawInteger() != 0);
        break;
    case Value::Kind::integer:
        integer(value.rawInteger());
        break;
    case Value::Kind::unsignedInteger:
        unsignedInteger(value.rawUnsigned());
        break;
    case Value::Kind::singleFloat: {
        char* const bytes = out_.room(5);
        bytes[0] = '\xFA';
        storeBigEndian(bytes + 1, std::bit_cast<std::uint32_t>(value.rawSingle()), 4);
        out_.commit(5);
        break;
    }
    case Value::Kind::date:
        head(6, 1);
        [[fallthrough]];
    case Value::Kind::doubleFloat: {
        const double number = value.kind() == Value::Kind::date ? value.dateSeconds() : value.rawDouble();
        char* const bytes = out_.room(9);
        bytes[0] = '\xFB';
        storeBigEndian(bytes + 1, std::bit_cast<std::uint64_t>(number), 8);
        out_.commit(9);
        break;
    }
    case Value::Kind::string:
        text(value.stringValue());
        break;
    case Value::Kind::data: {
        const std::span<const std::uint8_t> bytes = value.dataValue();
        head(2, bytes.size());
        out_.append({reinterpret_cast<const char*>(bytes.data()), bytes.size()});
        break;
    }
    case Value::Kind::array:
        arrayHead(value.arrayValue().size());
        for (const Value& element : value.arrayValue()) {
            this->value(element);
        }
        break;
    case Value::Kind::dictionary:
        dictionary(value.dictionaryValue());
        break;
    }
}

void CborWriter::dictionary(const Dictionary& dictionary) {
    mapHead(dictionary.size());
    for (std::size_t i = 0; i < dictionary.size(); ++i) {
        text(dictionary.keyAt(i));
        value(dictionary.valueAt(i));
    }
}

} // namespace tamblo
