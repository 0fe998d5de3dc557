#include "bridge/common/CommandLine.h"

#include <algorithm>
#include <csignal>
#include <cstdio>
#include <cstdlib>

namespace tamblo::bridge {

namespace {

constexpr int kWrongUse = 2;

} // namespace

std::optional<int> parseArguments(const CommandLine& commandLine, std::span<const char* const> arguments,
                                  std::initializer_list<Option> options) {
    for (std::size_t i = 0; i < arguments.size(); ++i) {
        const std::string_view argument = arguments[i];
        if (argument == "--help") {
            std::fputs(commandLine.help, stdout);
            return EXIT_SUCCESS;
        }
        if (argument == "--version") {
            std::printf("%s %s\n", commandLine.program, commandLine.version);
            return EXIT_SUCCESS;
        }
        const auto* const option = std::ranges::find(options, argument, &Option::name);
        const bool isKnown = option != options.end();
        if (isKnown && std::holds_alternative<bool*>(option->target)) {
            *std::get<bool*>(option->target) = true;
        } else if (isKnown && i + 1 < arguments.size()) {
            *std::get<std::string*>(option->target) = arguments[++i];
        } else {
            std::fprintf(stderr, "%s: %s \"%s\"; --help lists them\n", commandLine.program,
                         isKnown ? "nothing follows the argument" : "unknown argument", arguments[i]);
            return kWrongUse;
        }
    }
    return std::nullopt;
}

void blockEndingSignals() {
    sigset_t signals;
    sigemptyset(&signals);
    sigaddset(&signals, SIGTERM);
    sigaddset(&signals, SIGINT);
    pthread_sigmask(SIG_BLOCK, &signals, nullptr);
}

} // namespace tamblo::bridge
