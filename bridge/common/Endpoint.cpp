#include "bridge/common/Endpoint.h"

#include <algorithm>

#include <unistd.h>

namespace tamblo::bridge {

namespace {

std::string directoryOf(const std::string& path) {
    const std::size_t slash = path.find_last_of('/');
    return slash == std::string::npos ? "." : path.substr(0, std::max<std::size_t>(slash, 1));
}

} // namespace

Endpoint::Endpoint(const std::string& socketPath, const Clock& clock)
    : path_(socketPath),
      fileName_(socketPath.substr(socketPath.find_last_of('/') + 1)),
      clock_(clock),
      due_(clock.now().steady) {
    watch();
}

void Endpoint::watch() {
    watcher_.emplace(directoryOf(path_), DirectoryWatcher::Watch::creationsAndRemovals);
}

void Endpoint::read() {
    if (!watcher_) {
        return;
    }
    bool mayBeThere = false;
    watcher_->read([&](std::optional<std::string_view> fileName) {
        mayBeThere = mayBeThere || !fileName || *fileName == fileName_;
    });
    if (mayBeThere) {
        attempts_ = 0;
        due_ = clock_.now().steady;
    }
}

void Endpoint::connected() {
    watcher_.reset();
    attempts_ = 0;
    due_.reset();
}

void Endpoint::failed() {
    retry();
}

void Endpoint::lost() {
    watch();
    attempts_ = 0;
    retry();
}

void Endpoint::retry() {
    due_.reset();
    if (attempts_ >= kMostAttempts || ::access(path_.c_str(), F_OK) != 0) {
        return;
    }
    const auto delay = kFirstDelay * (1U << std::min(attempts_, 10U));
    due_ = clock_.now().steady + std::min<std::chrono::milliseconds>(delay, kLongestDelay);
    ++attempts_;
}

} // namespace tamblo::bridge
