#include "tests/service/ServiceProcess.h"

#include <chrono>
#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <fstream>
#include <sstream>
#include <stdexcept>
#include <thread>

#include <fcntl.h>
#include <poll.h>
#include <sys/socket.h>
#include <sys/wait.h>
#include <unistd.h>

namespace tamblo::test {

namespace {

constexpr std::chrono::seconds kPatience{20};
constexpr std::chrono::milliseconds kPause{2};

/// A socket on which the service says that it is ready, as it would to a service manager.
class ReadySocket {
public:
    explicit ReadySocket(const std::filesystem::path& path) {
        std::filesystem::remove(path);
        socket_ = boundSocket(SOCK_DGRAM, path);
    }
    ~ReadySocket() { ::close(socket_); }
    ReadySocket(const ReadySocket&) = delete;
    ReadySocket& operator=(const ReadySocket&) = delete;

    [[nodiscard]] bool await() const {
        pollfd descriptor{.fd = socket_, .events = POLLIN, .revents = 0};
        return ::poll(&descriptor, 1, static_cast<int>(std::chrono::milliseconds(kPatience).count())) == 1;
    }

private:
    int socket_ = -1;
};

} // namespace

CommandResult run(const std::string& command) {
    CommandResult done{};
    std::FILE* pipe = ::popen(command.c_str(), "r");
    for (int byte = std::fgetc(pipe); byte != EOF; byte = std::fgetc(pipe)) {
        done.output += static_cast<char>(byte);
    }
    done.status = WEXITSTATUS(::pclose(pipe));
    return done;
}

sockaddr_un addressOf(const std::string& socketPath) {
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    socketPath.copy(address.sun_path, sizeof address.sun_path - 1);
    return address;
}

int boundSocket(int type, const std::string& path) {
    const sockaddr_un address = addressOf(path);
    const int socket = ::socket(AF_UNIX, type | SOCK_CLOEXEC, 0);
    if (::bind(socket, reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0) {
        throw std::runtime_error("cannot bind " + path);
    }
    return socket;
}

std::string readFile(const std::filesystem::path& path) {
    std::ifstream file(path, std::ios::binary);
    std::ostringstream text;
    text << file.rdbuf();
    return text.str();
}

void writeFile(const std::filesystem::path& path, std::string_view text) {
    std::filesystem::create_directories(path.parent_path());
    std::ofstream(path, std::ios::binary) << text;
}

bool eventually(const std::function<bool()>& condition) {
    const auto end = std::chrono::steady_clock::now() + kPatience;
    while (!condition()) {
        if (std::chrono::steady_clock::now() > end) {
            return false;
        }
        std::this_thread::sleep_for(kPause);
    }
    return true;
}

ServiceProcess::ServiceProcess() : ServiceProcess(Options()) {}

ServiceProcess::ServiceProcess(Options options) : options_(std::move(options)) {
    std::string name = (std::filesystem::temp_directory_path() / "tamblo-XXXXXX").string();
    if (::mkdtemp(name.data()) == nullptr) {
        throw std::runtime_error("no temporary directory");
    }
    directory_ = name;
    start();
}

ServiceProcess::~ServiceProcess() {
    if (pid_ > 0) {
        signal(SIGKILL);
        (void)awaitEnd();
    }
    std::error_code ignored;
    std::filesystem::permissions(logs(), std::filesystem::perms::owner_all, ignored);
    std::filesystem::remove_all(directory_, ignored);
}

void ServiceProcess::start() {
    const std::string errors = (directory_ / "stderr").string();
    const ReadySocket ready(directory_ / "ready");
    pid_ = ::fork();
    if (pid_ == 0) {
        ::setenv("RUNTIME_DIRECTORY", (directory_ / "run").c_str(), 1);
        ::setenv("CONFIGURATION_DIRECTORY", (directory_ / "config").c_str(), 1);
        ::setenv("LOGS_DIRECTORY", logs().c_str(), 1);
        ::setenv("NOTIFY_SOCKET", (directory_ / "ready").c_str(), 1);
        ::unsetenv("TAMBLO_LOG");
        for (const auto& [name, value] : options_.environment) {
            ::setenv(name.c_str(), value.c_str(), 1);
        }
        ::dup2(::open(errors.c_str(), O_WRONLY | O_CREAT | O_APPEND, 0600), STDERR_FILENO);
        if (options_.beforeExec) {
            options_.beforeExec();
        }
        ::execl(TAMBLOD_PATH, "tamblod", nullptr);
        ::_exit(127);
    }
    if (options_.awaitsReady && !ready.await()) {
        throw std::runtime_error("tamblod does not get ready: " + errorOutput());
    }
}

void ServiceProcess::signal(int number) const {
    ::kill(pid_, number);
}

std::optional<int> ServiceProcess::awaitEnd() {
    int status = 0;
    if (!eventually([this, &status] { return ::waitpid(pid_, &status, WNOHANG) == pid_; })) {
        return std::nullopt;
    }
    pid_ = -1;
    return WIFEXITED(status) ? WEXITSTATUS(status) : -WTERMSIG(status);
}

std::optional<int> ServiceProcess::stop() {
    signal(SIGTERM);
    return awaitEnd();
}

std::string ServiceProcess::socketPath() const {
    return (directory_ / "run" / "com.vandra.tamblo.reporting").string();
}

std::filesystem::path ServiceProcess::preferenceFile(std::string_view domain) const {
    return directory_ / "config" / "preferences" / (std::string(domain) + ".json");
}

std::string ServiceProcess::errorOutput() const {
    return readFile(directory_ / "stderr");
}

bool ServiceProcess::awaitErrorOutput(std::string_view text) const {
    return eventually([this, text] { return errorOutput().find(text) != std::string::npos; });
}

std::vector<std::string> ServiceProcess::events() const {
    std::vector<std::string> lines;
    for (const char* const suffix : {".4", ".3", ".2", ".1", ""}) {
        std::istringstream text(readFile(logs() / (std::string("analytics-events.jsonl") + suffix)));
        for (std::string line; std::getline(text, line);) {
            lines.push_back(line);
        }
    }
    return lines;
}

std::size_t ServiceProcess::countEvents(std::string_view text) const {
    std::size_t count = 0;
    for (const std::string& line : events()) {
        count += line.find(text) != std::string::npos ? 1U : 0U;
    }
    return count;
}

} // namespace tamblo::test
