#pragma once

#include <string>

namespace tamblo::tools {

/// What completes command lines of tambloctl in bash and in zsh: a script each, for the directories where
/// these shells look for such, made of the commands' option tables and of the vocabulary.
[[nodiscard]] std::string bashCompletion();
[[nodiscard]] std::string zshCompletion();

} // namespace tamblo::tools
