#pragma once

#include "tools/StatusConnection.h"

#include <string>
#include <vector>

namespace tamblo::tools {

// The documents of the status socket as lines for people.

/// `clients` is their document, by which the screen names the most frequent programs; empty where it is not
/// known.
[[nodiscard]] std::vector<std::string> statusLines(const StatusDocument& document,
                                                   const StatusDocument& clients);
[[nodiscard]] std::vector<std::string> clientLines(const StatusDocument& document);
[[nodiscard]] std::vector<std::string> sessionLines(const StatusDocument& document);
[[nodiscard]] std::vector<std::string> sessionDetailLines(const StatusDocument& document);

/// A member as text: a number, or a text.
[[nodiscard]] std::string textOf(const Value& object, std::string_view name);

} // namespace tamblo::tools
