#pragma once

#include "client/Client.h"
#include "tools/Command.h"

#include <chrono>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

namespace tamblo::tools {

/// The options of every command that talks to the service.
inline constexpr Option kSocketOption{
    .name = "--socket", .value = "PATH", .help = "the service's socket, when it is not in its usual place"};
inline constexpr Option kTimeoutOption{
    .name = "--timeout", .value = "SECONDS", .help = "how long to wait for an answer (10)"};
inline constexpr Option kJsonOption{
    .name = "--json", .value = "", .help = "print JSON, for scripts", .letter = 'j'};

/// Why a socket of the service cannot be reached, for people, and what a command then exits with.
struct Unreachable {
    ExitStatus status;
    std::string text;
};
/// `fault` is the `errno` of the attempt; `ENAMETOOLONG` for a path that no socket can have.
[[nodiscard]] Unreachable describeUnreachable(const std::string& path, int fault);

/// A command's connection to the service, without a thread and without a second attempt.
class ServiceConnection {
public:
    explicit ServiceConnection(const Arguments& arguments);

    /// Connects; else complains, of a wrong option too, and answers the status to exit with.
    [[nodiscard]] std::optional<ExitStatus> connect();
    [[nodiscard]] client::Client& client() noexcept { return client_; }
    /// How long to wait for an answer; asked for only when the option is right, as `connect` finds.
    [[nodiscard]] std::chrono::milliseconds timeout() const noexcept { return *timeout_; }

    /// Waits for the answer; without a good one, complains and answers the status to exit with.
    template <typename T>
    [[nodiscard]] std::optional<ExitStatus> await(std::future<client::Result<T>> future, T* value = nullptr) {
        if (!client_.wait(future, timeout())) {
            return complain(ExitStatus::failed, "the service did not answer in time");
        }
        client::Result<T> result = future.get();
        if (result.error) {
            return complainAbout(*result.error);
        }
        if (value != nullptr) {
            *value = std::move(result.value);
        }
        return std::nullopt;
    }
    [[nodiscard]] static ExitStatus complainAbout(const client::Error& error);

private:
    const std::optional<std::chrono::milliseconds> timeout_; ///< nothing: the option is wrong
    client::Client client_;
};

[[nodiscard]] std::string notAReporterID(std::string_view text);
/// The reporter ID that the text is; else complains.
[[nodiscard]] std::optional<std::int64_t> parseReporterID(std::string_view text);

} // namespace tamblo::tools
