#pragma once

#include "tools/Arguments.h"

#include <span>
#include <string_view>

namespace tamblo::tools {

/// What every command exits with.
enum class ExitStatus : int {
    done = 0,
    failed = 1,      ///< the service refused or failed, or what was asked for does not exist
    usage = 2,       ///< the command line, or the input, is wrong
    unreachable = 3, ///< no service answers
};

/// One of tambloctl's commands: a row of its table.
struct Command {
    std::string_view name;
    std::string_view summary;   ///< one line
    std::string_view arguments; ///< behind the name in the usage line
    std::string_view details;   ///< for its help
    std::span<const Option> options;
    ExitStatus (*run)(const Arguments& arguments);
};

extern const Command kCommandSend;
extern const Command kCommandSession;
extern const Command kCommandReporters;
extern const Command kCommandValidate;
extern const Command kCommandTail;
extern const Command kCommandNotify;
extern const Command kCommandPreference;
extern const Command kCommandDecode;
extern const Command kCommandKill;

/// Writes `tambloctl: TEXT` to standard error and answers the status, so that a command can return it.
ExitStatus complain(ExitStatus status, std::string_view text);
/// Writes a line to standard output.
void printLine(std::string_view text);

} // namespace tamblo::tools
