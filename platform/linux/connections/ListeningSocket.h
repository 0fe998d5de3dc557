#pragma once

#include "os/FileDescriptor.h"

#include <optional>
#include <string>

#include <sys/stat.h>

namespace tamblo {

/// A local stream socket that listens: one that the process was started with, or one that it makes at a path,
/// in place of what a service that was killed has left there. The file goes with it, if it is still its own.
class ListeningSocket {
public:
    ListeningSocket() = default;
    ~ListeningSocket() { removeFile(); }
    ListeningSocket(const ListeningSocket&) = delete;
    ListeningSocket& operator=(const ListeningSocket&) = delete;

    /// How many sockets the service manager has passed on, from descriptor 3 on: 0 when they are not meant
    /// for this process.
    [[nodiscard]] static int passedOn();
    /// What was passed on is taken.
    static void forgetPassedOn();

    // A text says what is in the way.
    [[nodiscard]] std::optional<std::string> adopt(int descriptor);
    /// What to do where a process answers at the path.
    enum class IfAnswered { fail, replace };
    [[nodiscard]] std::optional<std::string> bind(const std::string& path,
                                                  IfAnswered ifAnswered = IfAnswered::fail);

    [[nodiscard]] int get() const noexcept { return socket_.get(); }
    [[nodiscard]] bool isOpen() const noexcept { return socket_.isOpen(); }
    void removeFile();
    void close() {
        removeFile();
        socket_.reset();
    }

private:
    FileDescriptor socket_;
    std::string path_; ///< empty with one that was passed on
    struct stat file_ {};
};

} // namespace tamblo
