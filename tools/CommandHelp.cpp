#include "base/Format.h"
#include "tools/Command.h"

#include <string>
#include <string_view>

namespace tamblo::tools {

namespace {

constexpr const Command* kCommands[] = {
    &kCommandSend,     &kCommandSession, &kCommandRecord,     &kCommandReporters, &kCommandValidate,
    &kCommandTail,     &kCommandTap,     &kCommandDecode,     &kCommandReport,    &kCommandExport,
    &kCommandList,     &kCommandNotify,  &kCommandPreference, &kCommandStatus,    &kCommandClients,
    &kCommandSessions, &kCommandTop,     &kCommandKill,
};

constexpr std::size_t kNameColumn = 12;
constexpr std::size_t kOptionColumn = 30;

void appendRow(std::string& text, std::string_view left, std::size_t width, std::string_view right) {
    text.append("  ").append(left);
    text.append(left.size() < width ? width - left.size() : 1, ' ');
    text.append(right).append("\n");
}

void appendOption(std::string& text, const Option& option) {
    std::string left =
        option.letter == 0 ? std::string("    ") : formatted("-{}, ", std::string_view(&option.letter, 1));
    left.append(option.name);
    if (!option.value.empty()) {
        left.append(" ").append(option.value);
    }
    appendRow(text, left, kOptionColumn, option.help);
}

} // namespace

std::span<const Command* const> allCommands() noexcept {
    return kCommands;
}

std::string helpForAll() {
    std::string text =
        "usage: tambloctl COMMAND [ARGUMENTS]\n\n"
        "Talks to tamblod, the audio reporting service, and to the files that it reads and writes.\n\n";
    for (const Command* const command : kCommands) {
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
    text.append(command.name).append(command.arguments.empty() ? "" : " ");
    text.append(command.arguments).append("\n\n");
    text.append(command.summary).append("\n\n");
    if (!command.details.empty()) {
        text.append(command.details).append("\n\n");
    }
    for (const Option& option : command.options) {
        appendOption(text, option);
    }
    appendOption(text, kHelpOption);
    appendOption(text, kVersionOption);
    return text;
}

} // namespace tamblo::tools
