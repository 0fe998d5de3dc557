#include "util/Log.h"

#include "platform/Platform.h"

namespace tamblo::log::detail {

void write(const LogCategory& category, LogLevel level, std::string_view line) noexcept {
    platform().log.write(level, category.code(), line);
}

} // namespace tamblo::log::detail
