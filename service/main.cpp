#include "platform/linux/LinuxPlatform.h"
#include "service/ServiceStatus.h"
#include "service/ZRReportingService.h"
#include "util/Context.h"
#include "wire/Protocol.h"

#include <cstdio>
#include <cstdlib>
#include <memory>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <utility>
#include <variant>

namespace {

constexpr int kWrongUse = 2;

constexpr const char* kHelp =
    "usage: tamblod [--help | --version]\n"
    "\n"
    "The background reporting service of the audio stack. It runs until SIGTERM or SIGINT; a second one ends "
    "it\n"
    "at once. It finds its places in the environment:\n"
    "\n"
    "  RUNTIME_DIRECTORY        its socket, notifications and driver statistics\n"
    "  CONFIGURATION_DIRECTORY  preferences and device properties\n"
    "  LOGS_DIRECTORY           what it reports\n"
    "  TAMBLO_LOG               the least level of the log on standard error, such as \"error,zrrs=debug\"\n"
    "\n"
    "Exit status: 0 after a signal, 1 when it cannot start, 2 after killService or with other arguments.\n";

/// The exit status, where the arguments ask for anything but the service.
std::optional<int> answerToArguments(std::span<const char* const> arguments) {
    if (arguments.empty()) {
        return std::nullopt;
    }
    const std::string_view first = arguments.front();
    if (arguments.size() == 1 && (first == "--help" || first == "-h")) {
        std::fputs(kHelp, stdout);
        return EXIT_SUCCESS;
    }
    if (arguments.size() == 1 && (first == "--version" || first == "-V")) {
        std::puts("tamblod " TAMBLO_VERSION);
        return EXIT_SUCCESS;
    }
    std::fputs("tamblod: no arguments are taken but --help and --version\n", stderr);
    return kWrongUse;
}

} // namespace

/// Makes the platform, the context and the service, makes the service the delegate of the process's listener,
/// and runs until a signal ends it.
int main(int argc, char* argv[]) {
    using namespace tamblo;

    const std::span<const char* const> words(argv, static_cast<std::size_t>(argc));
    if (const auto status = answerToArguments(words.subspan(argc > 0 ? 1 : 0))) {
        return *status;
    }
    auto opened = LinuxPlatform::open();
    if (const auto* problem = std::get_if<std::string>(&opened)) {
        std::fprintf(stderr, "tamblod: %s\n", problem->c_str());
        return EXIT_FAILURE;
    }
    LinuxPlatform& linuxPlatform = *std::get<std::unique_ptr<LinuxPlatform>>(opened);
    Context context(linuxPlatform.services());
    ZRReportingService service(context);
    ConnectionListener& listener = context.platform().connections->listenerForServiceName(wire::kServiceName);
    listener.setDelegate(service);
    listener.resume();
    ServiceStatus status(context, service);
    linuxPlatform.showStatus(status, TAMBLO_VERSION);
    linuxPlatform.run(context.serverQueue(),
                      [&service](auto completion) { service.shutDown(std::move(completion)); });
    return EXIT_SUCCESS;
}
