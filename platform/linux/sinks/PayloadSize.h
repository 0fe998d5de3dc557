#pragma once

#include "base/Dictionary.h"

#include <cstddef>

namespace tamblo {

/// The bytes of all keys, texts and byte strings in a payload, and so many for each of its values. With none
/// for each: less than its JSON text takes.
[[nodiscard]] std::size_t payloadSize(const Dictionary& payload, std::size_t ofEachValue = 0);

} // namespace tamblo
