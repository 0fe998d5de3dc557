#include "bridge/alsa/Bridge.h"

#include <array>
#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <exception>
#include <span>
#include <string>
#include <string_view>
#include <utility>
#include <variant>

namespace {

constexpr int kWrongUse = 2;

constexpr const char* kHelp =
    "usage: tamblo-alsa [--dry-run] [--once] [--proc DIR] [--dev DIR] [--help | --version]\n"
    "\n"
    "Reports to tamblod what the kernel knows of sound, on a machine that has ALSA and no sound server: a\n"
    "session for each process that plays or records, with when it ran, on which device, how loud, in which\n"
    "format, and its xruns. It runs until SIGTERM or SIGINT, whether or not there is a service or a card.\n"
    "\n"
    "  --dry-run   print what would be reported, and report nothing\n"
    "  --once      report what there is now, and end\n"
    "  --proc DIR  where the kernel tells of processes and, in asound, of sound (/proc)\n"
    "  --dev DIR   where the devices' nodes are (/dev/snd)\n"
    "\n"
    "  RUNTIME_DIRECTORY        where the service's socket is\n"
    "  CONFIGURATION_DIRECTORY  preferences; com.vandra.tamblo.alsa has which application is which service\n"
    "                           type\n"
    "\n"
    "Exit status: 0 after a signal, 1 when it cannot start or, with --once, has nobody to ask or to tell, 2\n"
    "with other arguments.\n";

/// What the arguments ask for, or the exit status where that is all.
std::variant<tamblo::alsa::Bridge::Options, int> parse(std::span<const char* const> arguments) {
    tamblo::alsa::Bridge::Options options;
    for (std::size_t i = 0; i < arguments.size(); ++i) {
        const std::string_view argument = arguments[i];
        if (argument == "--help") {
            std::fputs(kHelp, stdout);
            return EXIT_SUCCESS;
        }
        if (argument == "--version") {
            std::puts("tamblo-alsa " TAMBLO_VERSION);
            return EXIT_SUCCESS;
        }
        if (argument == "--dry-run") {
            options.isDry = true;
        } else if (argument == "--once") {
            options.once = true;
        } else if ((argument == "--proc" || argument == "--dev") && i + 1 < arguments.size()) {
            (argument == "--proc" ? options.processes : options.devices) = arguments[++i];
        } else {
            std::fprintf(stderr, "tamblo-alsa: unknown argument \"%.*s\"; --help lists them\n",
                         static_cast<int>(argument.size()), argument.data());
            return kWrongUse;
        }
    }
    return options;
}

void blockSignals() {
    sigset_t signals;
    sigemptyset(&signals);
    sigaddset(&signals, SIGTERM);
    sigaddset(&signals, SIGINT);
    pthread_sigmask(SIG_BLOCK, &signals, nullptr);
}

} // namespace

int main(int argc, char* argv[]) {
    const std::span<const char* const> words(argv, static_cast<std::size_t>(argc));
    const auto parsed = parse(words.subspan(argc > 0 ? 1 : 0));
    if (const int* const status = std::get_if<int>(&parsed)) {
        return *status;
    }
    const auto directories = tamblo::wire::Directories::ofThisProcess();
    if (directories.runtime.empty() || directories.configuration.empty()) {
        std::fputs("tamblo-alsa: set RUNTIME_DIRECTORY and CONFIGURATION_DIRECTORY\n", stderr);
        return EXIT_FAILURE;
    }
    blockSignals();
    try {
        return tamblo::alsa::Bridge(std::get<tamblo::alsa::Bridge::Options>(parsed), directories).run();
    } catch (const std::exception& problem) {
        std::fprintf(stderr, "tamblo-alsa: %s\n", problem.what());
        return EXIT_FAILURE;
    }
}
