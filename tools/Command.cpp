#include "tools/Command.h"

#include <cstdio>

namespace tamblo::tools {

ExitStatus complain(ExitStatus status, std::string_view text) {
    std::fprintf(stderr, "tambloctl: %.*s\n", static_cast<int>(text.size()), text.data());
    return status;
}

void printLine(std::string_view text) {
    std::fwrite(text.data(), 1, text.size(), stdout);
    std::fputc('\n', stdout);
}

} // namespace tamblo::tools
