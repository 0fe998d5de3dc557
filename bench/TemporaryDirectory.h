#pragma once

#include <string>

namespace tamblo::bench {

/// A directory of its own below another: TMPDIR, or the build tree without it, where none is named. Removed
/// with all that it holds when it is destroyed.
class TemporaryDirectory {
public:
    explicit TemporaryDirectory(const std::string& parent = {});
    ~TemporaryDirectory();
    TemporaryDirectory(const TemporaryDirectory&) = delete;
    TemporaryDirectory& operator=(const TemporaryDirectory&) = delete;

    [[nodiscard]] const std::string& path() const noexcept { return path_; }
    /// Makes a directory in it, and those on the way there.
    void makeDirectory(const std::string& name) const;
    void write(const std::string& name, const std::string& content) const;

private:
    std::string path_;
};

} // namespace tamblo::bench
