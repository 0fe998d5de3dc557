#include "platform/linux/LinuxPlatform.h"
#include "service/ZRReportingService.h"
#include "util/Context.h"

#include <cstdio>
#include <cstdlib>
#include <memory>
#include <string>
#include <utility>
#include <variant>

/// Makes the platform, the context and the service, makes the service the delegate of the process's listener,
/// and runs until a signal ends it.
int main() {
    using namespace tamblo;

    auto opened = LinuxPlatform::open();
    if (const auto* problem = std::get_if<std::string>(&opened)) {
        std::fprintf(stderr, "tamblod: %s\n", problem->c_str());
        return EXIT_FAILURE;
    }
    LinuxPlatform& linuxPlatform = *std::get<std::unique_ptr<LinuxPlatform>>(opened);
    Context context(linuxPlatform.services());
    ZRReportingService service(context);
    ConnectionListener& listener =
        context.platform().connections->listenerForServiceName("com.vandra.tamblo.reporting");
    listener.setDelegate(service);
    listener.resume();
    linuxPlatform.run(context.serverQueue(),
                      [&service](auto completion) { service.shutDown(std::move(completion)); });
    return EXIT_SUCCESS;
}
