#include "tools/TapLines.h"

#include <array>
#include <csignal>
#include <cstddef>
#include <string>

#include <poll.h>
#include <sys/signalfd.h>
#include <sys/socket.h>

namespace tamblo::tools {

namespace {

FileDescriptor endingSignals() {
    sigset_t signals;
    sigemptyset(&signals);
    sigaddset(&signals, SIGINT);
    sigaddset(&signals, SIGTERM);
    ::sigprocmask(SIG_BLOCK, &signals, nullptr);
    return FileDescriptor(::signalfd(-1, &signals, SFD_CLOEXEC));
}

} // namespace

void readTap(const FileDescriptor& tap, std::FILE* output, TapLineFunction& take) {
    const FileDescriptor signals = endingSignals();
    std::string held;
    std::array<char, 65536> bytes;
    while (std::fflush(output) == 0 && std::ferror(output) == 0) {
        std::array<pollfd, 3> watched{{{.fd = tap.get(), .events = POLLIN, .revents = 0},
                                       {.fd = signals.get(), .events = POLLIN, .revents = 0},
                                       {.fd = ::fileno(output), .events = 0, .revents = 0}}};
        if (::poll(watched.data(), watched.size(), -1) < 0) {
            continue;
        }
        if (watched[1].revents != 0 || watched[2].revents != 0) {
            return;
        }
        const ssize_t count = ::recv(tap.get(), bytes.data(), bytes.size(), 0);
        if (count <= 0) {
            return;
        }
        const std::size_t before = held.size();
        held.append(bytes.data(), static_cast<std::size_t>(count));
        std::size_t start = 0;
        for (std::size_t end = held.find('\n', before); end != std::string::npos;
             end = held.find('\n', start)) {
            if (!take(std::string_view(held).substr(start, end - start))) {
                return;
            }
            start = end + 1;
        }
        held.erase(0, start);
    }
}

} // namespace tamblo::tools
