#include "tools/report/PageWriter.h"

#include "base/Format.h"
#include "os/FileOperations.h"
#include "os/RandomNumber.h"

#include <array>
#include <cerrno>
#include <cstdio>
#include <filesystem>
#include <utility>

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

namespace tamblo::report {

namespace {

constexpr std::size_t kPieceBytes = std::size_t{256} << 10U;
constexpr mode_t kPageMode = 0600;

/// UTF-8 of the first and what stands for it in JSON.
constexpr std::array<std::pair<std::string_view, std::string_view>, 5> kEscapes{{
    {"<", "\\u003c"},
    {">", "\\u003e"},
    {"&", "\\u0026"},
    {"\xE2\x80\xA8", "\\u2028"},
    {"\xE2\x80\xA9", "\\u2029"},
}};

std::string temporaryFor(const std::string& path) {
    const std::size_t name = path.find_last_of('/') + 1;
    return path.substr(0, name) + formatted(".tamblo-{}", hexadecimal(randomNumber(), 16));
}

/// Where a link leads.
std::string followed(const std::string& path) {
    std::error_code error;
    const std::filesystem::path place = std::filesystem::canonical(path, error);
    return error ? path : place.string();
}

/// Whether something stands there that a file may not take the place of.
bool isNoFile(const std::string& path) {
    struct stat status {};
    return ::stat(path.c_str(), &status) == 0 && !S_ISREG(status.st_mode);
}

} // namespace

PageWriter::PageWriter(const std::string& path) : path_(followed(path)) {
    open();
    error_ = file_.isOpen() ? 0 : errno;
}

void PageWriter::open() {
    if (path_ == "-") {
        file_ = FileDescriptor(::fcntl(STDOUT_FILENO, F_DUPFD_CLOEXEC, 0));
    } else if (isNoFile(path_)) {
        file_ = FileDescriptor(::open(path_.c_str(), O_WRONLY | O_CLOEXEC));
    } else {
        temporary_ = temporaryFor(path_);
        // What clients named stands in the page: like the sinks, it is its owner's alone.
        constexpr int kNew = O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC;
        file_ = FileDescriptor(::open(temporary_.c_str(), kNew, kPageMode));
    }
}

PageWriter::~PageWriter() {
    if (!isDone_ && file_.isOpen() && !temporary_.empty()) {
        ::unlink(temporary_.c_str());
    }
}

void PageWriter::text(std::string_view text) {
    held_.append(text);
    if (held_.size() >= kPieceBytes) {
        write();
    }
}

void PageWriter::scriptData(const TextBuffer& json) {
    constexpr std::string_view kFirstBytes = "<>&\xE2";
    std::string_view rest = json.view();
    for (std::size_t at = rest.find_first_of(kFirstBytes); at != std::string_view::npos;
         at = rest.find_first_of(kFirstBytes)) {
        held_.append(rest.substr(0, at));
        rest.remove_prefix(at);
        std::string_view character = rest.substr(0, 1);
        std::string_view written = character;
        for (const auto& [plain, escaped] : kEscapes) {
            if (rest.starts_with(plain)) {
                character = plain;
                written = escaped;
            }
        }
        held_.append(written);
        rest.remove_prefix(character.size());
    }
    text(rest);
}

int PageWriter::finish() {
    write();
    if (error_ == 0 && !temporary_.empty() && std::rename(temporary_.c_str(), path_.c_str()) != 0) {
        error_ = errno;
    }
    isDone_ = error_ == 0;
    return error_;
}

void PageWriter::write() {
    std::string_view left = held_.view();
    if (error_ == 0 && !FileOperations::system().writeAll(file_.get(), left)) {
        error_ = errno;
    }
    held_.clear();
}

} // namespace tamblo::report
