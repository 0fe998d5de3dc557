#pragma once

#include "base/Mutex.h"

#include <memory>
#include <vector>

namespace tamblo {

class LinuxConnection;

/// The connections that keep replies back until the sinks are written. A reply says that what its request
/// recorded is in the kernel's hands, and one write of the sinks serves all requests of a batch; so no reply
/// leaves by itself. A connection keeps the frames of its replies and is noted here with the first of them;
/// at the batch's end, once the sinks are flushed, `release` has every noted connection send what it keeps.
/// Replies that come while a release runs wait for the next: their sinks may not have been written yet.
class HeldReplies {
public:
    // From any thread.
    void add(std::shared_ptr<LinuxConnection> connection) TAMBLO_EXCLUDES(mutex_);
    void release() TAMBLO_EXCLUDES(mutex_);

private:
    Mutex mutex_;
    std::vector<std::shared_ptr<LinuxConnection>> connections_ TAMBLO_GUARDED_BY(mutex_);
};

} // namespace tamblo
