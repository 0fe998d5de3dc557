#include "bridge/common/CommandLine.h"
#include "bridge/pipewire/Bridge.h"

#include <cstdio>
#include <cstdlib>
#include <exception>
#include <span>

#include <pipewire/pipewire.h>

namespace {

constexpr const char* kHelp =
    "usage: tamblo-pipewire [--dry-run] [--once] [--help | --version]\n"
    "\n"
    "Reports to tamblod what the sound server PipeWire knows: a session for each application's stream, with\n"
    "when it ran, where to, how loud, in which format, and what went wrong with it; and one for the device.\n"
    "It runs until SIGTERM or SIGINT, whether or not the two are there.\n"
    "\n"
    "  --dry-run  print what would be reported, and report nothing\n"
    "  --once     report the streams and devices that there are now, and end\n"
    "\n"
    "  RUNTIME_DIRECTORY        where the service's socket is\n"
    "  CONFIGURATION_DIRECTORY  preferences; com.vandra.tamblo.pipewire: which role is which service type\n"
    "  PIPEWIRE_REMOTE, PIPEWIRE_RUNTIME_DIR, XDG_RUNTIME_DIR\n"
    "                           where the sound server's socket is, as for its other clients\n"
    "\n"
    "Exit status: 0 after a signal, 1 when it cannot start or, with --once, has nobody to ask or to tell, 2\n"
    "with other arguments.\n";

} // namespace

int main(int argc, char* argv[]) {
    const std::span<const char* const> words(argv, static_cast<std::size_t>(argc));
    tamblo::pipewire::Bridge::Options options;
    if (const auto status = tamblo::bridge::parseArguments(
            {"tamblo-pipewire", TAMBLO_VERSION, kHelp}, words.subspan(argc > 0 ? 1 : 0),
            {{"--dry-run", &options.isDry}, {"--once", &options.once}})) {
        return *status;
    }
    const auto directories = tamblo::wire::Directories::ofThisProcess();
    if (directories.runtime.empty() || directories.configuration.empty()) {
        std::fputs("tamblo-pipewire: set RUNTIME_DIRECTORY and CONFIGURATION_DIRECTORY\n", stderr);
        return EXIT_FAILURE;
    }
    tamblo::bridge::blockEndingSignals();
    pw_init(nullptr, nullptr);
    if (std::getenv("PIPEWIRE_DEBUG") == nullptr) {
        // Its warnings are about being set up without a configuration file, which is meant.
        pw_log_set_level(SPA_LOG_LEVEL_ERROR);
    }
    int status = EXIT_FAILURE;
    try {
        tamblo::pipewire::Bridge bridge(options, directories);
        status = bridge.run();
    } catch (const std::exception& problem) {
        std::fprintf(stderr, "tamblo-pipewire: %s\n", problem.what());
    }
    pw_deinit();
    return status;
}
