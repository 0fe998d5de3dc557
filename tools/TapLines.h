#pragma once

#include "base/UniqueFunction.h"
#include "os/FileDescriptor.h"

#include <cstdio>
#include <string_view>

namespace tamblo::tools {

/// Whether to go on.
using TapLineFunction = UniqueFunction<bool(std::string_view line)>;

/// Hands over the lines of a tap, and flushes what was made of them, until the tap ends, SIGINT or SIGTERM
/// comes, the output cannot be written, nobody reads it any more, or no further line is wanted.
void readTap(const FileDescriptor& tap, std::FILE* output, TapLineFunction& take);

} // namespace tamblo::tools
