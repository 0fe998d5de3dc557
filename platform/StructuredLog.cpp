#include "platform/StructuredLog.h"

#include <cstddef>

namespace tamblo {

namespace {

constexpr std::size_t kUnitWidth = 25;
constexpr std::size_t kLineNumberWidth = 5;

std::string_view unitName(std::string_view path) {
    const std::size_t folder = path.rfind('/');
    if (folder != std::string_view::npos) {
        path.remove_prefix(folder + 1);
    }
    return path.substr(0, path.rfind('.'));
}

} // namespace

void appendLinePrefix(std::string& line, const std::source_location& place) {
    const std::string_view unit = unitName(place.file_name());
    if (unit.size() < kUnitWidth) {
        line.append(kUnitWidth - unit.size(), ' ');
    }
    line += unit;
    line += ':';
    const std::size_t numberAt = line.size();
    appendText(line, static_cast<std::uint64_t>(place.line()));
    while (line.size() - numberAt < kLineNumberWidth) {
        line += ' ';
    }
    line += ' ';
}

void StructuredLog::report(LogLevel level, std::string_view categoryCode, std::string_view text,
                           const std::source_location& place) {
    if (level < threshold(categoryCode)) {
        return;
    }
    std::string line;
    appendLinePrefix(line, place);
    line += text;
    write(level, categoryCode, line);
}

} // namespace tamblo
