#include "base/Format.h"
#include "tools/Command.h"

#include <algorithm>
#include <cstdio>
#include <span>
#include <string>
#include <string_view>
#include <variant>
#include <vector>

namespace {

using namespace tamblo::tools;

constexpr const Command* kCommands[] = {
    &kCommandSend,     &kCommandSession, &kCommandReporters,  &kCommandValidate, &kCommandTail,
    &kCommandDecode,   &kCommandNotify,  &kCommandPreference, &kCommandStatus,   &kCommandClients,
    &kCommandSessions, &kCommandTop,     &kCommandKill,
};

constexpr std::size_t kNameColumn = 12;
constexpr std::size_t kOptionColumn = 26;

void appendRow(std::string& text, std::string_view left, std::size_t width, std::string_view right) {
    text.append("  ").append(left);
    text.append(left.size() < width ? width - left.size() : 1, ' ');
    text.append(right).append("\n");
}

std::string help() {
    std::string text =
        "usage: tambloctl COMMAND [ARGUMENTS]\n\n"
        "Talks to tamblod, the audio reporting service, and to the files that it reads and writes.\n\n";
    for (const Command* command : kCommands) {
        appendRow(text, command->name, kNameColumn, command->summary);
    }
    return text +
           "\n\"tambloctl COMMAND --help\" says more about each.\n\n"
           "Exit status:\n"
           "  0  done\n"
           "  1  the service refused or failed, or what was asked for does not exist\n"
           "  2  the command line or the input is wrong\n"
           "  3  no service answers\n\n"
           "Directories: RUNTIME_DIRECTORY, CONFIGURATION_DIRECTORY and LOGS_DIRECTORY as the service has\n"
           "them; unset, /run, /etc and /var/log/tamblo as root, the user's own as a user.\n";
}

std::string helpFor(const Command& command) {
    std::string text = "usage: tambloctl ";
    text.append(command.name).append(" ").append(command.arguments).append("\n\n");
    text.append(command.summary).append("\n\n");
    if (!command.details.empty()) {
        text.append(command.details).append("\n\n");
    }
    for (const Option& option : command.options) {
        std::string left(option.name);
        if (!option.value.empty()) {
            left.append(" ").append(option.value);
        }
        appendRow(text, left, kOptionColumn, option.help);
    }
    appendRow(text, "--help", kOptionColumn, "this text");
    return text;
}

const Command* commandNamed(std::string_view name) {
    const auto* const found = std::find_if(std::begin(kCommands), std::end(kCommands),
                                           [name](const Command* c) { return c->name == name; });
    return found == std::end(kCommands) ? nullptr : *found;
}

ExitStatus run(const std::vector<std::string_view>& words) {
    if (words.empty()) {
        std::fputs(help().c_str(), stderr);
        return ExitStatus::usage;
    }
    const bool asksForHelp = words[0] == "help" || words[0] == "--help" || words[0] == "-h";
    if (asksForHelp && words.size() == 1) {
        std::fputs(help().c_str(), stdout);
        return ExitStatus::done;
    }
    const std::string_view name = asksForHelp ? words[1] : words[0];
    const Command* const command = commandNamed(name);
    if (command == nullptr) {
        return complain(ExitStatus::usage,
                        tamblo::formatted("unknown command \"{}\"; \"tambloctl help\" lists them", name));
    }
    const auto end = std::find(words.begin() + 1, words.end(), "--");
    if (asksForHelp || std::find(words.begin() + 1, end, "--help") != end) {
        std::fputs(helpFor(*command).c_str(), stdout);
        return ExitStatus::done;
    }
    const auto arguments = Arguments::parse(command->options, std::span(words).subspan(1));
    if (const auto* wrong = std::get_if<std::string>(&arguments)) {
        return complain(ExitStatus::usage,
                        tamblo::formatted("{}: {}; \"tambloctl {} --help\" lists them", name, *wrong, name));
    }
    return command->run(std::get<Arguments>(arguments));
}

} // namespace

int main(int argc, char** argv) {
    return static_cast<int>(run({argv + 1, argv + argc}));
}
