#include "tools/Manual.h"

#include "base/Format.h"
#include "tools/Command.h"

#include <algorithm>
#include <cctype>

namespace tamblo::tools {

namespace {

/// Text as man prints it: a dash is a dash, and no line is taken for a request.
std::string escaped(std::string_view text) {
    std::string result;
    bool isLineStart = true;
    for (const char character : text) {
        if (isLineStart && (character == '.' || character == '\'')) {
            result.append("\\&");
        }
        if (character == '-' || character == '\\') {
            result.append(character == '-' ? "\\-" : "\\e");
        } else {
            result.push_back(character);
        }
        isLineStart = character == '\n';
    }
    return result;
}

void appendHead(std::string& page, std::string_view name, std::string_view summary,
                std::string_view version) {
    std::string title;
    for (const char character : name) {
        title.push_back(static_cast<char>(std::toupper(static_cast<unsigned char>(character))));
    }
    page.append(formatted(".TH {} 1 \"\" \"tamblo {}\" \"Audio reporting service\"\n.SH NAME\n{} \\- {}\n",
                          escaped(title), version, escaped(name), escaped(summary)));
}

/// Text of the help: paragraphs are filled, as man sees fit; lines that begin with a space, which are laid
/// out in columns, stand as they are.
void appendText(std::string& page, std::string_view text) {
    bool isLaidOut = false;
    while (!text.empty()) {
        const std::size_t end = std::min(text.find('\n'), text.size());
        const std::string_view line = text.substr(0, end);
        text.remove_prefix(std::min(end + 1, text.size()));
        if (line.starts_with(' ') != isLaidOut) {
            isLaidOut = !isLaidOut;
            page.append(isLaidOut ? ".nf\n" : ".fi\n");
        }
        page.append(line.empty() ? ".PP" : escaped(line)).append("\n");
    }
    page.append(isLaidOut ? ".fi\n" : "");
}

void appendOption(std::string& page, const Option& option) {
    page.append(".TP\n");
    if (option.letter != 0) {
        page.append(formatted("\\fB\\-{}\\fR, ", std::string_view(&option.letter, 1)));
    }
    page.append(formatted("\\fB{}\\fR", escaped(option.name)));
    if (!option.value.empty()) {
        page.append(formatted(" \\fI{}\\fR", escaped(option.value)));
    }
    page.append("\n").append(escaped(option.help)).append("\n");
}

} // namespace

std::string manualPage(std::string_view version) {
    std::string page;
    appendHead(page, "tambloctl", "talk to the audio reporting service", version);
    const std::string help = helpForAll();
    const std::string_view text(help);
    // Its usage line, its table of commands and what it says behind them, each where a reader of pages looks
    // for it.
    const std::size_t table = text.find("\n  ") + 1;
    const std::size_t rest = text.find("\n\n", table) + 2;
    const std::size_t usage = text.find('\n');
    page.append(".SH SYNOPSIS\n")
        .append(escaped(text.substr(text.find(' ') + 1, usage - text.find(' ') - 1)));
    page.append("\n.SH DESCRIPTION\n").append(escaped(text.substr(usage + 2, table - usage - 4)));
    page.append("\n.SH COMMANDS\n");
    for (const Command* const command : allCommands()) {
        page.append(formatted(".TP\n\\fBtambloctl\\-{}\\fR(1)\n{}\n", escaped(command->name),
                              escaped(command->summary)));
    }
    page.append(".SH NOTES\n");
    appendText(page, text.substr(rest));
    return page.append(
        ".SH SEE ALSO\ntamblod(8), tamblo\\-status(7), tamblo\\-protocol(7), tamblo\\-sinks(5)\n");
}

std::string manualPageOf(const Command& command, std::string_view version) {
    std::string page;
    const std::string name = formatted("tambloctl-{}", command.name);
    appendHead(page, name, command.summary, version);
    page.append(
        formatted(".SH SYNOPSIS\ntambloctl {} {}\n", escaped(command.name), escaped(command.arguments)));
    if (!command.details.empty()) {
        page.append(".SH DESCRIPTION\n");
        appendText(page, command.details);
    }
    page.append(".SH OPTIONS\n");
    for (const Option& option : command.options) {
        appendOption(page, option);
    }
    appendOption(page, kHelpOption);
    appendOption(page, kVersionOption);
    return page.append(".SH SEE ALSO\ntambloctl(1), tamblod(8)\n");
}

} // namespace tamblo::tools
