#include "util/LogText.h"

#include "base/Format.h"
#include "base/Json.h"

namespace tamblo {

void appendText(std::string& out, const Dictionary& dictionary) {
    out += jsonText(dictionary);
}

void appendText(std::string& out, const Value& value) {
    if (value.isString()) {
        out += value.stringValue();
    } else {
        out += jsonText(value);
    }
}

void appendText(std::string& out, const NumberList& list) {
    out += '[';
    bool first = true;
    for (const std::int64_t number : list.numbers) {
        if (!first) {
            out += ", ";
        }
        first = false;
        appendText(out, number);
    }
    out += ']';
}

} // namespace tamblo
