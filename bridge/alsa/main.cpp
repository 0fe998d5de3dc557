#include "bridge/alsa/Bridge.h"
#include "bridge/common/CommandLine.h"

#include <cstdio>
#include <cstdlib>
#include <exception>
#include <span>

namespace {

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

} // namespace

int main(int argc, char* argv[]) {
    const std::span<const char* const> words(argv, static_cast<std::size_t>(argc));
    tamblo::alsa::Bridge::Options options;
    if (const auto status = tamblo::bridge::parseArguments({"tamblo-alsa", TAMBLO_VERSION, kHelp},
                                                           words.subspan(argc > 0 ? 1 : 0),
                                                           {{"--dry-run", &options.isDry},
                                                            {"--once", &options.once},
                                                            {"--proc", &options.processes},
                                                            {"--dev", &options.devices}})) {
        return *status;
    }
    const auto directories = tamblo::wire::Directories::ofThisProcess();
    if (directories.runtime.empty() || directories.configuration.empty()) {
        std::fputs("tamblo-alsa: set RUNTIME_DIRECTORY and CONFIGURATION_DIRECTORY\n", stderr);
        return EXIT_FAILURE;
    }
    tamblo::bridge::blockEndingSignals();
    try {
        return tamblo::alsa::Bridge(options, directories).run();
    } catch (const std::exception& problem) {
        std::fprintf(stderr, "tamblo-alsa: %s\n", problem.what());
        return EXIT_FAILURE;
    }
}
