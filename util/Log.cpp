#include "util/Log.h"

#include "platform/Platform.h"

#include <cstddef>

namespace tamblo::log::detail {

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

void appendPrefix(std::string& line, const std::source_location& place) {
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

void write(const LogCategory& category, LogLevel level, std::string_view line) noexcept {
    platform().log.write(level, category.code(), line);
}

} // namespace tamblo::log::detail
