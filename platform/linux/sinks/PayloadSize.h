#pragma once

#include "base/Dictionary.h"

#include <cstddef>

namespace tamblo {

/// The bytes of all keys, texts and byte strings in a payload: less than its JSON text takes.
[[nodiscard]] std::size_t payloadSize(const Dictionary& payload);

} // namespace tamblo
