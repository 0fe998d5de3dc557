#include "tests/fakes/FakeLog.h"

namespace tamblo {

void FakeLog::write(LogLevel level, std::string_view categoryCode, std::string_view line) noexcept {
    // "%25s:%-5d ": the text begins after the blank that follows the number and its padding.
    const std::size_t colon = line.find(':');
    std::size_t text = line.find(' ', colon);
    text = text < colon + 6 ? colon + 7 : text + 1;
    const std::lock_guard held(mutex_);
    lines_.push_back({level, std::string(categoryCode), std::string(line.substr(0, text)),
                      std::string(line.substr(text))});
}

std::vector<FakeLog::Line> FakeLog::lines() const {
    const std::lock_guard held(mutex_);
    return lines_;
}

std::vector<std::string> FakeLog::texts(std::string_view beginning) const {
    const std::lock_guard held(mutex_);
    std::vector<std::string> found;
    for (const Line& line : lines_) {
        if (line.text.starts_with(beginning)) {
            found.push_back(line.text);
        }
    }
    return found;
}

void FakeLog::clear() {
    const std::lock_guard held(mutex_);
    lines_.clear();
}

} // namespace tamblo
