#pragma once

#include <initializer_list>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <variant>

namespace tamblo::bridge {

/// An argument that the program knows, and what it sets: a switch, or the text that follows it.
struct Option {
    std::string_view name;
    std::variant<bool*, std::string*> target;
};

/// How a program is called.
struct CommandLine {
    const char* program;
    const char* version;
    const char* help;
};

/// Sets what the arguments ask for; the exit status where that is all: after `--help`, `--version` and what
/// is not known.
[[nodiscard]] std::optional<int> parseArguments(const CommandLine& commandLine,
                                                std::span<const char* const> arguments,
                                                std::initializer_list<Option> options);

/// SIGTERM and SIGINT, which the loop is to be told of instead. To be called before there is a thread, which
/// takes over what is blocked.
void blockEndingSignals();

} // namespace tamblo::bridge
