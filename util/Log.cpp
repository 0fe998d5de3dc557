#include "util/Log.h"

#include "base/Json.h"
#include "util/Context.h"

namespace tamblo {

void log::detail::write(const LogCategory& category, LogLevel level, std::string_view line) noexcept {
    Context::current().platform().log->write(level, category.code(), line);
}

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
    std::string_view separator;
    for (const std::int64_t number : list.numbers) {
        out += separator;
        separator = ", ";
        appendText(out, number);
    }
    out += ']';
}

} // namespace tamblo
