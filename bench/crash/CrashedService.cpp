#include "CrashedService.h"

#include "os/FileDescriptor.h"
#include "os/LocalAddress.h"
#include "wire/Protocol.h"

#include <cerrno>
#include <charconv>
#include <csignal>
#include <filesystem>
#include <fstream>
#include <stdexcept>
#include <string_view>
#include <system_error>
#include <thread>
#include <vector>

#include <fcntl.h>
#include <sys/prctl.h>
#include <sys/resource.h>
#include <sys/socket.h>
#include <sys/wait.h>
#include <unistd.h>

namespace tamblo::bench {

namespace {

constexpr std::chrono::seconds kPatience{20};

} // namespace

CrashedService::CrashedService(std::string program, std::string clockLibrary)
    : program_(std::move(program)), clockLibrary_(std::move(clockLibrary)) {
    directory_.makeDirectory("runtime");
    directory_.makeDirectory("logs");
    directory_.makeDirectory("configuration/preferences");
    // One line for each message, and none of the service's own making.
    directory_.write("configuration/preferences/com.vandra.tamblo.analytics.json",
                     R"({"events_in_use": ["com.vandra.tamblo.Output.Joulery"]})");
    // Call quality stands apart from what is promised with an answer.
    directory_.write("configuration/preferences/com.vandra.tamblo.callquality.json", R"({"backends": []})");
    socketPath_ = wire::socketPath(directory_.path() + "/runtime");
    shiftClock(std::chrono::seconds(0));
}

CrashedService::~CrashedService() {
    kill();
}

void CrashedService::start() {
    std::vector<std::string> variables{
        "RUNTIME_DIRECTORY=" + directory_.path() + "/runtime",
        "CONFIGURATION_DIRECTORY=" + directory_.path() + "/configuration",
        "LOGS_DIRECTORY=" + directory_.path() + "/logs",
        "TAMBLO_LOG=error",
    };
    if (!clockLibrary_.empty()) {
        variables.push_back("LD_PRELOAD=" + clockLibrary_);
        variables.push_back("SHIFTED_CLOCK_FILE=" + directory_.path() + "/clock-shift");
    }
    std::vector<char*> environment;
    for (std::string& variable : variables) {
        environment.push_back(variable.data());
    }
    environment.push_back(nullptr);
    char* const arguments[] = {program_.data(), nullptr};
    const FileDescriptor log(::open((directory_.path() + "/log").c_str(),
                                    O_WRONLY | O_CREAT | O_APPEND | O_CLOEXEC, S_IRUSR | S_IWUSR));
    const pid_t parent = ::getpid();
    pid_ = ::fork();
    if (pid_ < 0) {
        throw std::system_error(errno, std::generic_category(), "fork");
    }
    if (pid_ == 0) {
        ::prctl(PR_SET_PDEATHSIG, SIGKILL);
        if (::getppid() == parent && ::dup2(log.get(), STDERR_FILENO) >= 0) {
            ::execve(program_.c_str(), arguments, environment.data());
        }
        ::_exit(127);
    }
}

bool CrashedService::awaitReady() const {
    const auto address = LocalAddress::of(socketPath_);
    if (!address) {
        throw std::runtime_error("the socket's path is too long; set TMPDIR");
    }
    for (const auto end = std::chrono::steady_clock::now() + kPatience;
         std::chrono::steady_clock::now() < end;) {
        const FileDescriptor socket(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
        if (::connect(socket.get(), address->get(), address->size()) == 0) {
            return true;
        }
        siginfo_t ended{};
        if (::waitid(P_PID, static_cast<id_t>(pid_), &ended, WEXITED | WNOHANG | WNOWAIT) != 0 ||
            ended.si_pid == pid_) {
            return false;
        }
        std::this_thread::sleep_for(std::chrono::microseconds(500));
    }
    return false;
}

void CrashedService::kill() {
    if (pid_ > 0) {
        ::kill(pid_, SIGKILL);
        ::waitpid(pid_, nullptr, 0);
        pid_ = -1;
    }
}

bool CrashedService::stop() {
    if (pid_ <= 0) {
        return false;
    }
    ::kill(pid_, SIGTERM);
    int status = 0;
    for (const auto end = std::chrono::steady_clock::now() + kPatience;
         ::waitpid(pid_, &status, WNOHANG) != pid_;) {
        if (std::chrono::steady_clock::now() > end) {
            kill();
            return false;
        }
        std::this_thread::sleep_for(std::chrono::milliseconds(1));
    }
    pid_ = -1;
    return WIFEXITED(status) && WEXITSTATUS(status) == 0;
}

std::uint64_t CrashedService::toldLosses() const {
    constexpr std::string_view kBehind = " records were lost";
    std::uint64_t told = 0;
    std::ifstream log(directory_.path() + "/log");
    for (std::string line; std::getline(log, line);) {
        if (const std::size_t end = line.find(kBehind); end != line.npos) {
            const std::size_t begin = line.rfind(' ', end - 1) + 1;
            std::uint64_t count = 0;
            std::from_chars(line.data() + begin, line.data() + end, count);
            told += count;
        }
    }
    return told;
}

std::uint64_t CrashedService::bytesLogged() const {
    std::error_code ignored;
    const auto size = std::filesystem::file_size(directory_.path() + "/log", ignored);
    return ignored ? 0 : size;
}

void CrashedService::limitFiles(std::uint64_t bytes) const {
    const rlimit limits{.rlim_cur = bytes, .rlim_max = RLIM_INFINITY};
    ::prlimit(pid_, RLIMIT_FSIZE, &limits, nullptr);
}

void CrashedService::liftLimit() const {
    limitFiles(RLIM_INFINITY);
}

void CrashedService::shiftClock(std::chrono::seconds shift) const {
    const std::int64_t seconds = shift.count();
    const FileDescriptor file(::open((directory_.path() + "/clock-shift").c_str(),
                                     O_WRONLY | O_CREAT | O_CLOEXEC, S_IRUSR | S_IWUSR));
    if (::pwrite(file.get(), &seconds, sizeof seconds, 0) != sizeof seconds) {
        throw std::system_error(errno, std::generic_category(), "the clock's shift");
    }
}

} // namespace tamblo::bench
