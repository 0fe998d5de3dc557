#include "util/LogCategory.h"

#include "platform/Platform.h"

namespace tamblo {

bool LogCategory::ask(LogLevel level) const noexcept {
    const std::uint8_t least = place(platform().log.threshold(code_));
    least_.store(least, std::memory_order_relaxed);
    return place(level) >= least;
}

} // namespace tamblo
