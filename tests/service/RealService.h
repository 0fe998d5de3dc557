#pragma once

#include "os/FileDescriptor.h"
#include "tests/Files.h"
#include "tests/Sockets.h"
#include "wire/FrameSplitter.h"
#include "wire/Reply.h"
#include "wire/Request.h"

#include <algorithm>
#include <array>
#include <chrono>
#include <csignal>
#include <cstdio>
#include <functional>
#include <optional>
#include <thread>
#include <utility>

#include <fcntl.h>
#include <poll.h>
#include <sys/prctl.h>
#include <sys/resource.h>
#include <sys/socket.h>
#include <sys/wait.h>
#include <unistd.h>

// The real programs, and clients of them.

namespace tamblo::test {

inline constexpr std::chrono::duration<int, std::milli> kPatience{20'000};

/// What a command of the shell wrote, its complaints too, and its exit status.
struct CommandResult {
    std::string output;
    int status;
};
[[nodiscard]] inline CommandResult run(const std::string& command) {
    CommandResult done{};
    std::FILE* pipe = ::popen((command + " 2>&1").c_str(), "r");
    for (int byte = std::fgetc(pipe); byte != EOF; byte = std::fgetc(pipe)) {
        done.output += static_cast<char>(byte);
    }
    done.status = WEXITSTATUS(::pclose(pipe));
    return done;
}

/// Until the condition holds, at most some seconds.
template <typename Condition> [[nodiscard]] bool eventually(const Condition& condition) {
    const auto end = std::chrono::steady_clock::now() + kPatience;
    while (!condition()) {
        if (std::chrono::steady_clock::now() > end) {
            return false;
        }
        std::this_thread::sleep_for(std::chrono::milliseconds(2));
    }
    return true;
}

[[nodiscard]] inline std::size_t countOf(std::string_view part, std::string_view text) {
    std::size_t count = 0;
    for (std::size_t at = text.find(part); at != std::string_view::npos; at = text.find(part, at + 1)) {
        ++count;
    }
    return count;
}

/// The domain of the preferences by which an internal build captures and drafts.
inline constexpr const char* kCaptures = "com.vandra.tamblo.zrreporting";

/// A real `tamblod` in directories of its own, which are removed with it. Its standard error goes to a file
/// there.
class ServiceProcess {
public:
    struct Options {
        bool isInternalBuild = false;
        /// JSON objects by domain.
        std::vector<std::pair<std::string, std::string>> preferences{};
        /// Added to the environment, the directories' variables among them if they are to differ.
        std::vector<std::pair<std::string, std::string>> environment{};
        /// Called in the child between fork and exec.
        std::function<void()> beforeExec{};
        /// Without it, the constructor returns before the service is ready.
        bool awaitsReady = true;
    };

    ServiceProcess() : ServiceProcess(Options()) {}
    explicit ServiceProcess(Options options) : options_(std::move(options)) {
        if (options_.isInternalBuild) {
            directory_.write("config/device-properties.json", R"({"InternalBuild": true})");
        }
        for (const auto& [domain, values] : options_.preferences) {
            writeFile(preferenceFile(domain), values);
        }
        start();
    }
    ~ServiceProcess() {
        signal(SIGKILL);
        (void)awaitEnd();
    }
    ServiceProcess(const ServiceProcess&) = delete;
    ServiceProcess& operator=(const ServiceProcess&) = delete;

    /// Starts it (again), in the same directories.
    void start() {
        // On which the service says how it is, as it would to a service manager.
        std::filesystem::remove(directory_.path("manager"));
        manager_ = FileDescriptor(boundSocket(SOCK_DGRAM, directory_.path("manager")));
        pid_ = ::fork();
        if (pid_ == 0) {
            prepareChild();
            ::execl(TAMBLOD_PATH, "tamblod", nullptr);
            ::_exit(127);
        }
        if (options_.awaitsReady && told() != "READY=1") {
            throw std::runtime_error("tamblod does not get ready: " + errorOutput());
        }
    }
    /// The next of what it says to its service manager, waiting at most some seconds.
    [[nodiscard]] std::string told() const {
        pollfd ready{.fd = manager_.get(), .events = POLLIN, .revents = 0};
        char text[256] = {};
        return ::poll(&ready, 1, kPatience.count()) == 1 &&
                       ::recv(manager_.get(), text, sizeof text - 1, 0) > 0
                   ? text
                   : "";
    }
    /// Nothing to a service that has ended.
    void signal(int number) const {
        if (pid_ > 0) {
            ::kill(pid_, number);
        }
    }
    /// Waits for its end, at most some seconds; the exit status, or minus the signal, or nothing when it runs
    /// on or had ended before.
    [[nodiscard]] std::optional<int> awaitEnd() {
        int status = 0;
        if (pid_ <= 0 || !eventually([this, &status] { return ::waitpid(pid_, &status, WNOHANG) == pid_; })) {
            return std::nullopt;
        }
        pid_ = -1;
        return WIFEXITED(status) ? WEXITSTATUS(status) : -WTERMSIG(status);
    }
    /// SIGTERM, and the exit status.
    std::optional<int> stop() {
        signal(SIGTERM);
        return awaitEnd();
    }
    /// From now on.
    void limit(__rlimit_resource resource, rlim_t most) const {
        rlimit limits{};
        ::prlimit(pid_, resource, nullptr, &limits);
        limits.rlim_cur = most;
        ::prlimit(pid_, resource, &limits, nullptr);
    }

    [[nodiscard]] pid_t pid() const noexcept { return pid_; }
    [[nodiscard]] std::filesystem::path logs() const { return directory_.path("logs"); }
    [[nodiscard]] std::string runtimeDirectory() const { return directory_.path("run"); }
    [[nodiscard]] std::string socketPath() const {
        return runtimeDirectory() + "/com.vandra.tamblo.reporting";
    }
    [[nodiscard]] std::filesystem::path preferenceFile(const std::string& domain) const {
        return directory_.path("config/preferences/" + domain + ".json");
    }
    /// What it wrote to standard error.
    [[nodiscard]] std::string errorOutput() const { return directory_.read("stderr"); }
    /// How many lines of the analytics sink have the text.
    [[nodiscard]] std::size_t countEvents(std::string_view text) const {
        const auto lines = linesOf(logs() / "analytics-events.jsonl");
        return static_cast<std::size_t>(std::ranges::count_if(
            lines, [text](const std::string& line) { return line.find(text) != line.npos; }));
    }

    /// A command that runs `tambloctl` with the service's directories.
    [[nodiscard]] std::string tambloctlCommand(const std::string& arguments) const {
        return "RUNTIME_DIRECTORY=" + runtimeDirectory() +
               " CONFIGURATION_DIRECTORY=" + directory_.path("config") +
               " LOGS_DIRECTORY=" + logs().string() + " timeout 20 " TAMBLOCTL_PATH " " + arguments;
    }
    [[nodiscard]] CommandResult tambloctl(const std::string& arguments) const {
        return run(tambloctlCommand(arguments));
    }

private:
    void prepareChild() const {
        ::prctl(PR_SET_PDEATHSIG, SIGKILL);
        ::setenv("RUNTIME_DIRECTORY", runtimeDirectory().c_str(), 1);
        ::setenv("CONFIGURATION_DIRECTORY", directory_.path("config").c_str(), 1);
        ::setenv("LOGS_DIRECTORY", logs().c_str(), 1);
        ::setenv("NOTIFY_SOCKET", directory_.path("manager").c_str(), 1);
        ::unsetenv("TAMBLO_LOG");
        for (const auto& [name, value] : options_.environment) {
            ::setenv(name.c_str(), value.c_str(), 1);
        }
        ::dup2(::open(directory_.path("stderr").c_str(), O_WRONLY | O_CREAT | O_APPEND, 0600), STDERR_FILENO);
        if (options_.beforeExec) {
            options_.beforeExec();
        }
    }

    const TemporaryDirectory directory_;
    const Options options_;
    FileDescriptor manager_;
    pid_t pid_ = -1;
};

/// A connection to the status socket.
class StatusReader {
public:
    explicit StatusReader(const ServiceProcess& service)
        : socket_(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0)) {
        const sockaddr_un address = addressOf(service.runtimeDirectory() + "/com.vandra.tamblo.status");
        isConnected_ =
            ::connect(socket_.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) == 0;
    }
    [[nodiscard]] bool isConnected() const noexcept { return isConnected_; }
    void send(std::string_view text) const {
        (void)::send(socket_.get(), text.data(), text.size(), MSG_NOSIGNAL);
    }
    void endSending() const { ::shutdown(socket_.get(), SHUT_WR); }
    /// Everything up to the end, or what came within some seconds.
    [[nodiscard]] std::string rest() const {
        std::string text;
        std::array<char, 65536> bytes;
        for (;;) {
            pollfd readable{.fd = socket_.get(), .events = POLLIN, .revents = 0};
            const ssize_t count = ::poll(&readable, 1, kPatience.count()) == 1
                                      ? ::recv(socket_.get(), bytes.data(), bytes.size(), 0)
                                      : -1;
            if (count <= 0) {
                return text;
            }
            text.append(bytes.data(), static_cast<std::size_t>(count));
        }
    }

private:
    FileDescriptor socket_;
    bool isConnected_ = false;
};

[[nodiscard]] inline std::string statusText(const ServiceProcess& service, const std::string& line) {
    const StatusReader reader(service);
    reader.send(line + "\n");
    return reader.rest();
}

using wire::Method;

[[nodiscard]] inline wire::Request request(Method method, std::int64_t reporterID = 0) {
    return {.method = method, .reporterID = reporterID};
}

/// Of playback's start, for reporter 7, unless others are given.
[[nodiscard]] inline wire::Request message(Dictionary payload, std::vector<std::int64_t> reporterIDs = {7},
                                           std::uint32_t category = 4, std::uint16_t type = 1) {
    return {.method = Method::sendMessage,
            .dictionary = std::move(payload),
            .category = category,
            .type = type,
            .reporterIDs = std::move(reporterIDs)};
}

/// As many frames of the request, with IDs that begin with this one.
[[nodiscard]] inline std::string framesOf(wire::Request request, std::uint64_t firstID = 1,
                                          std::size_t count = 1) {
    TextBuffer frames;
    for (std::size_t i = 0; i < count; ++i) {
        request.id = firstID + i;
        (void)wire::appendRequestFrame(frames, request);
    }
    return std::string(frames.view());
}

/// A client without manners: a blocking socket that sends whatever bytes a test wants and reads replies one
/// by one.
class RawClient {
public:
    /// What fails here fails again with the first bytes that are sent.
    explicit RawClient(const std::string& socketPath)
        : socket_(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0)) {
        const sockaddr_un address = addressOf(socketPath);
        (void)::connect(socket_, reinterpret_cast<const sockaddr*>(&address), sizeof address);
    }
    ~RawClient() { ::close(socket_); }
    RawClient(const RawClient&) = delete;
    RawClient& operator=(const RawClient&) = delete;

    [[nodiscard]] int descriptor() const noexcept { return socket_; }

    /// False when the service has gone.
    bool send(std::string_view bytes) const {
        while (!bytes.empty()) {
            const ssize_t count = ::send(socket_, bytes.data(), bytes.size(), MSG_NOSIGNAL);
            if (count <= 0) {
                return false;
            }
            bytes.remove_prefix(static_cast<std::size_t>(count));
        }
        return true;
    }

    [[nodiscard]] bool isReadable(int milliseconds) const {
        pollfd descriptor{.fd = socket_, .events = POLLIN, .revents = 0};
        return ::poll(&descriptor, 1, milliseconds) == 1;
    }
    /// The next frame, waiting at most some seconds; empty at the end of the connection.
    std::vector<std::uint8_t> receiveFrame() {
        for (;;) {
            wire::FrameSplitter frames(received_);
            if (frames.next()) {
                const auto end = received_.end() - static_cast<std::ptrdiff_t>(frames.rest().size());
                std::vector<std::uint8_t> frame(received_.begin(), end);
                received_.erase(received_.begin(), end);
                return frame;
            }
            std::array<std::uint8_t, 65536> bytes;
            const ssize_t count = isReadable(20'000) ? ::recv(socket_, bytes.data(), bytes.size(), 0) : 0;
            if (count <= 0) {
                return {};
            }
            received_.insert(received_.end(), bytes.begin(), bytes.begin() + count);
        }
    }
    /// What it says; nothing at the end of the connection.
    std::optional<wire::Reply> receive() {
        const std::vector<std::uint8_t> frame = receiveFrame();
        return frame.empty() ? std::nullopt : wire::decodeReply(std::span(frame).subspan(wire::kLengthBytes));
    }
    /// The number of replies to the end of the connection.
    std::size_t receiveAll() {
        std::size_t count = 0;
        while (receive()) {
            ++count;
        }
        return count;
    }

    /// Sends and takes the next reply.
    std::optional<wire::Reply> call(wire::Request request) {
        return send(framesOf(std::move(request), nextID_++)) ? receive() : std::nullopt;
    }
    std::optional<wire::Reply> call(Method method, std::int64_t reporterID = 0) {
        return call(request(method, reporterID));
    }

    /// Whether the service has closed the connection; takes what still arrives before that.
    [[nodiscard]] bool isClosedByService() {
        receiveAll();
        return isReadable(0); // the end
    }
    /// Whether that is so by now, without reading what was sent before the end.
    [[nodiscard]] bool isHungUp() const {
        pollfd entry{.fd = socket_, .events = POLLRDHUP, .revents = 0};
        return ::poll(&entry, 1, 0) == 1 && (entry.revents & (POLLHUP | POLLRDHUP)) != 0;
    }

private:
    int socket_ = -1;
    std::uint64_t nextID_ = 1;
    std::vector<std::uint8_t> received_;
};

/// One that has created and started a session, whose start reply stays held.
class Session : public RawClient {
public:
    explicit Session(const std::string& socketPath, std::int64_t reporterID = 7,
                     std::uint16_t serviceType = 2)
        : RawClient(socketPath) {
        start(reporterID, serviceType);
    }
    /// For another session of the same client.
    void start(std::int64_t reporterID, std::uint16_t serviceType = 2) {
        call(Method::createReportingSession, reporterID);
        call({.method = Method::setServiceType, .reporterID = reporterID, .serviceType = serviceType});
        send(framesOf(request(Method::startReportingSessionForID, reporterID),
                      kStartID + static_cast<std::uint64_t>(reporterID)));
        // The start itself is not answered yet: what comes behind it shows that it has been carried out.
        call(Method::reporterID, reporterID);
    }
    /// True when the stop and the held start have been answered.
    bool stop(std::int64_t reporterID = 7) {
        const auto start = call(Method::stopReportingSessionForID, reporterID);
        return start && start->id >= kStartID && receive();
    }

private:
    /// Above those that `call` gives.
    static constexpr std::uint64_t kStartID = 1'000'000;
};

} // namespace tamblo::test
