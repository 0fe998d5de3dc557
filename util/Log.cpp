#include "util/Log.h"

#include "base/Json.h"
#include "util/Context.h"

#include <algorithm>

namespace tamblo {

bool log::detail::admits(const LogKind& kind) noexcept {
    return Context::current().platform().log->admits(kind);
}

void log::detail::write(const LogKind& kind, std::string_view line) noexcept {
    Context::current().platform().log->write(kind.level, kind.categoryCode, line);
}

void appendText(std::string& out, const Dictionary& dictionary) {
    out += jsonText(dictionary);
}

void appendText(std::string& out, const Value& value) {
    if (value.isString()) {
        out += log::detail::cut(value.stringValue());
    } else {
        out += jsonText(value);
    }
}

void appendText(std::string& out, const NumberList& list) {
    out += '[';
    std::string_view separator;
    for (const std::int64_t number : list.numbers.first(std::min(list.numbers.size(), NumberList::kMost))) {
        out += separator;
        separator = ", ";
        appendText(out, number);
    }
    if (list.numbers.size() > NumberList::kMost) {
        appendFormatted(out, " and {} more", list.numbers.size() - NumberList::kMost);
    }
    out += ']';
}

} // namespace tamblo
