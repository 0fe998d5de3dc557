#include "platform/linux/captures/CaptureFolders.h"

#include "base/Format.h"
#include "base/Rfc3339.h"
#include "os/Directory.h"
#include "os/ReplaceFile.h"

#include <algorithm>
#include <cerrno>
#include <cstddef>
#include <filesystem>
#include <functional>
#include <system_error>
#include <tuple>
#include <utility>
#include <vector>

#include <sys/stat.h>

namespace tamblo {

namespace {

namespace fs = std::filesystem;

constexpr std::string_view kUnfinished = ".new-";
/// An identifier with every digit as 0; those behind the time are hexadecimal.
constexpr std::string_view kPattern = "00000000T000000.000Z-00000000";

/// How many entries are looked at, of the directory and of a folder. Thirty days bring 600 folders of less
/// than 100 files.
constexpr std::size_t kMaximumEntries = 4096;

bool isIdentifier(std::string_view name) noexcept {
    const auto matches = [](char character, char pattern) {
        const bool isDigit = character >= '0' && character <= '9';
        return pattern == '0' ? isDigit || (character >= 'a' && character <= 'f') : character == pattern;
    };
    return std::ranges::equal(name, kPattern, matches);
}

std::string failure(std::string_view action, std::string_view name, int error) {
    return formatted("cannot {} {}: {}", action, name, std::generic_category().message(error));
}

std::string timeText(WallTime time) {
    std::string text = formatRfc3339(secondsSince1970(time)).value_or("");
    std::erase_if(text, [](char character) { return character == '-' || character == ':'; });
    return text;
}

std::uint64_t sizeOf(const std::string& folder) {
    std::uint64_t size = 0;
    std::size_t seen = 0;
    std::error_code error;
    for (fs::recursive_directory_iterator entry(folder, error), end;
         !error && entry != end && seen < kMaximumEntries; ++seen, entry.increment(error)) {
        std::error_code ignored;
        if (entry->symlink_status(ignored).type() == fs::file_type::regular) {
            const std::uintmax_t length = entry->file_size(ignored);
            size += ignored ? 0 : length;
        }
    }
    return size;
}

} // namespace

std::string CaptureFolders::identifier(WallTime time, std::uint64_t number) {
    return formatted("{}-{}", timeText(time), hexadecimal(number, 8));
}

void CaptureFolders::store(std::string_view identifier, std::span<const CaptureFile> files, WallTime now) {
    // Before, for a disk that is full of old ones; after, as the new one counts too.
    removeOld(now, identifier);
    const int error = makeDirectory(directory_);
    const std::string problem = error != 0 ? failure("make", "it", error) : write(identifier, files);
    tell(isWritingOut_, problem, "captures have no folders until it can be written again");
    // Where there is no folder either, one line says it all.
    if (problem.empty()) {
        tell(isKeepingOut_, keepingProblem_, "the service will know nothing of it when it is started again");
    }
    removeOld(now, identifier);
}

void CaptureFolders::keep(std::string_view name, std::string_view text) {
    // A directory that there is not is told with the folder.
    const bool isThere = makeDirectory(directory_) == 0;
    const int error = isThere ? replaceFileAtomically(formatted("{}/{}", directory_, name), text) : 0;
    keepingProblem_ = error != 0 ? failure("write", name, error) : "";
}

std::string CaptureFolders::write(std::string_view identifier, std::span<const CaptureFile> files) const {
    const std::string name = formatted("{}{}", kUnfinished, identifier);
    const std::string folder = formatted("{}/{}", directory_, name);
    std::string problem;
    if (::mkdir(folder.c_str(), S_IRWXU) != 0) {
        return failure("make", name, errno);
    }
    for (const CaptureFile& file : files) {
        const int error = replaceFileAtomically(formatted("{}/{}", folder, file.name), file.text);
        if (error != 0) {
            problem = failure("write", file.name, error);
            break;
        }
    }
    std::error_code error;
    if (problem.empty()) {
        fs::rename(folder, formatted("{}/{}", directory_, identifier), error);
        problem = error ? failure("rename", name, error.value()) : "";
    }
    if (!problem.empty()) {
        fs::remove_all(folder, error);
    }
    return problem;
}

void CaptureFolders::removeOld(WallTime now, std::string_view latest) {
    std::vector<std::string> removed;
    std::vector<std::string> folders;
    for (std::string& name : DirectoryEntries::read(directory_, kMaximumEntries).names) {
        std::error_code error;
        const fs::file_status status = fs::symlink_status(formatted("{}/{}", directory_, name), error);
        if (status.type() != fs::file_type::directory) {
            continue;
        }
        if (name.starts_with(kUnfinished) &&
            isIdentifier(std::string_view(name).substr(kUnfinished.size()))) {
            removed.push_back(std::move(name));
        } else if (isIdentifier(name)) {
            folders.push_back(std::move(name));
        }
    }
    const std::string oldest = timeText(now - kMaximumAge);
    const std::string present = timeText(now);
    const auto rank = [&](const std::string& name) {
        return std::tuple(name == latest, name.substr(0, present.size()) <= present, name);
    };
    std::ranges::sort(folders, std::greater(), rank);
    std::uint64_t total = 0;
    for (const std::string& name : folders) {
        // Once there is no more room, there is none for those that are older.
        total += total > limits_.totalSize ? 0 : sizeOf(formatted("{}/{}", directory_, name));
        if (name != latest && (total > limits_.totalSize || name < oldest)) {
            removed.push_back(name);
        }
    }
    std::string problem;
    for (const std::string& name : removed) {
        std::error_code error;
        fs::remove_all(formatted("{}/{}", directory_, name), error);
        if (error && problem.empty()) {
            problem = failure("remove", name, error.value());
        }
    }
    tell(isRemovingOut_, problem, "it takes room until it can be removed");
}

void CaptureFolders::tell(bool& isOut, std::string_view problem, std::string_view consequence) {
    const bool wasOut = std::exchange(isOut, !problem.empty());
    if (isOut && !wasOut) {
        log_.report(LogLevel::error, "zrrb", formatted("{}: {}; {}", directory_, problem, consequence));
    }
}

} // namespace tamblo
