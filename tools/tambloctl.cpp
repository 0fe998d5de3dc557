#include "base/Format.h"
#include "tools/Command.h"
#include "tools/Completion.h"
#include "tools/Manual.h"

#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <cstring>
#include <span>
#include <string>
#include <string_view>
#include <variant>
#include <vector>

namespace {

using namespace tamblo::tools;

const Command* commandNamed(std::string_view name) {
    const auto commands = allCommands();
    const auto found =
        std::find_if(commands.begin(), commands.end(), [name](const Command* c) { return c->name == name; });
    return found == commands.end() ? nullptr : *found;
}

ExitStatus print(std::string_view text) {
    printLine(text.substr(0, text.find_last_not_of('\n') + 1));
    return ExitStatus::done;
}

ExitStatus printVersion() {
    return print("tambloctl " TAMBLO_VERSION);
}

ExitStatus runCommand(const Command& command, std::span<const std::string_view> words) {
    const auto parsed = Arguments::parse(command.options, words);
    if (const auto* wrong = std::get_if<std::string>(&parsed)) {
        return complain(ExitStatus::usage, tamblo::formatted("{}: {}; \"tambloctl {} --help\" lists them",
                                                             command.name, *wrong, command.name));
    }
    const auto& arguments = std::get<Arguments>(parsed);
    if (arguments.has(kHelpOption.name)) {
        return print(helpFor(command));
    }
    return arguments.has(kVersionOption.name) ? printVersion() : command.run(arguments);
}

/// For packaging/manual, and in no help: what an installation has besides the program.
ExitStatus generate(std::span<const std::string_view> words) {
    const std::string_view what = words.empty() ? "" : words[0];
    const Command* const command = words.size() > 1 ? commandNamed(words[1]) : nullptr;
    if (what == "manual" && (command != nullptr || words.size() == 1)) {
        return print(command == nullptr ? manualPage(TAMBLO_VERSION)
                                        : manualPageOf(*command, TAMBLO_VERSION));
    }
    if (what == "bash" || what == "zsh") {
        return print(what == "bash" ? bashCompletion() : zshCompletion());
    }
    if (what != "names") {
        return complain(ExitStatus::usage, "generate: manual [COMMAND], bash, zsh or names");
    }
    for (const Command* const known : allCommands()) {
        printLine(known->name);
    }
    return ExitStatus::done;
}

ExitStatus run(const std::vector<std::string_view>& words) {
    if (words.empty()) {
        std::fputs(helpForAll().c_str(), stderr);
        return ExitStatus::usage;
    }
    const bool asksForVersion = words[0] == "--version" || words[0] == "-V";
    const bool asksForHelp = words[0] == "help" || words[0] == "--help" || words[0] == "-h";
    if (words.size() > (asksForHelp ? 2U : 1U) && (asksForVersion || asksForHelp)) {
        return complain(ExitStatus::usage,
                        tamblo::formatted("\"{}\" has no place behind {}", words.back(), words[0]));
    }
    if (asksForVersion) {
        return printVersion();
    }
    if (asksForHelp && words.size() == 1) {
        return print(helpForAll());
    }
    if (words[0] == "generate") {
        return generate(std::span(words).subspan(1));
    }
    const std::string_view name = asksForHelp ? words[1] : words[0];
    const Command* const command = commandNamed(name);
    if (command == nullptr) {
        return complain(ExitStatus::usage,
                        tamblo::formatted("unknown command \"{}\"; \"tambloctl help\" lists them", name));
    }
    return asksForHelp ? print(helpFor(*command)) : runCommand(*command, std::span(words).subspan(1));
}

} // namespace

int main(int argc, char** argv) {
    const ExitStatus status = run({argv + 1, argv + argc});
    // What could not be written, to a full disk say, must not pass for done.
    const bool isWritten = std::fflush(stdout) == 0 && std::ferror(stdout) == 0;
    return static_cast<int>(
        isWritten || status != ExitStatus::done
            ? status
            : complain(ExitStatus::failed,
                       tamblo::formatted("cannot write to standard output: {}", std::strerror(errno))));
}
