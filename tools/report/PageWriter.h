#pragma once

#include "base/TextBuffer.h"
#include "os/FileDescriptor.h"

#include <string>
#include <string_view>

namespace tamblo::report {

/// Writes a file piece by piece beside the place that it is meant for, and puts it there when it is whole.
/// Without that it leaves nothing behind. A link stays, and leads to the new file then. What is no file, such
/// as a pipe or a device, is written into as it is; `-` stands for standard output.
class PageWriter {
public:
    /// `error` says whether it could be opened.
    explicit PageWriter(const std::string& path);
    ~PageWriter();
    PageWriter(const PageWriter&) = delete;
    PageWriter& operator=(const PageWriter&) = delete;

    void text(std::string_view text);
    /// JSON that stands between a script's tags: what could end it, or begin a comment there, and the two
    /// line ends that scripts have of their own, are escaped.
    void scriptData(const TextBuffer& json);
    /// 0, or the `errno` of the first failure.
    [[nodiscard]] int error() const noexcept { return error_; }
    /// The same.
    [[nodiscard]] int finish();

private:
    void open();
    void write();

    const std::string path_;
    std::string temporary_; ///< empty when what is written into stands there already
    FileDescriptor file_;
    TextBuffer held_;
    int error_ = 0;
    bool isDone_ = false;
};

} // namespace tamblo::report
