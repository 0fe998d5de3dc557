#pragma once

#include "bridge/common/Time.h"
#include "os/DirectoryWatcher.h"

#include <chrono>
#include <optional>
#include <string>

namespace tamblo::bridge {

/// When to try to reach somebody whose socket may not be there yet: at the start, when its file appears, and
/// a few times more, with growing waits, while the file is there and nobody answers, as a server has its file
/// before it listens. Then only when the file changes: to wait costs nothing. While there is a connection,
/// nothing is watched either, as such a directory may be a busy one.
class Endpoint {
public:
    static constexpr std::chrono::milliseconds kFirstDelay{50};
    static constexpr std::chrono::milliseconds kLongestDelay{5000};
    static constexpr unsigned kMostAttempts = 12;

    Endpoint(const std::string& socketPath, const Clock& clock);

    /// Readable when `read` has something to do; -1 while nothing is watched. Another one after each
    /// connection.
    [[nodiscard]] int descriptor() const noexcept { return watcher_ ? watcher_->fileDescriptor() : -1; }
    void read();

    /// When the next attempt is due; nothing while connected, and while there is nothing to wait for.
    [[nodiscard]] std::optional<SteadyTime> due() const noexcept { return due_; }
    /// How the attempt went; and that a connection has ended.
    void connected();
    void failed();
    void lost();

private:
    void watch();
    void retry();

    const std::string path_;
    const std::string fileName_;
    const Clock& clock_;
    std::optional<DirectoryWatcher> watcher_; ///< without a connection
    std::optional<SteadyTime> due_;
    unsigned attempts_ = 0; ///< since there was reason to hope
};

} // namespace tamblo::bridge
