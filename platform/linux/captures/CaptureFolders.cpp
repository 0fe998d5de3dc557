#include "platform/linux/captures/CaptureFolders.h"

#include "base/Format.h"
#include "base/Rfc3339.h"
#include "os/Directory.h"
#include "os/ReplaceFile.h"
#include "platform/Counters.h"

#include <algorithm>
#include <cerrno>
#include <cstddef>
#include <functional>
#include <system_error>
#include <tuple>
#include <utility>
#include <vector>

#include <fcntl.h>
#include <sys/stat.h>

namespace tamblo {

namespace {

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

bool isFolder(int directory, const std::string& name) noexcept {
    struct stat status {};
    return ::fstatat(directory, name.c_str(), &status, AT_SYMLINK_NOFOLLOW) == 0 && S_ISDIR(status.st_mode);
}

} // namespace

std::string CaptureFolders::identifier(WallTime time, std::uint64_t number) {
    return formatted("{}-{}", timeText(time), hexadecimal(number, 8));
}

CaptureFolders::CaptureFolders(const std::string& directory, StructuredLog& log, FileModes modes,
                               Limits limits)
    : directory_(directory.substr(0, directory.rfind('/')), directory.substr(directory.rfind('/') + 1),
                 modes.directory),
      log_(log),
      modes_(modes),
      limits_(limits) {}

void CaptureFolders::store(std::string_view identifier, std::span<const CaptureFile> files, WallTime now) {
    const HeldDirectory::Ref directory = directory_.open();
    std::string problem = directory == nullptr ? failure("make", "it", errno) : "";
    if (directory != nullptr) {
        // Before, for a disk that is full of old ones; after, as the new one counts too.
        removeOld(directory->get(), now, identifier);
        problem = write(directory->get(), std::string(identifier), files);
        removeOld(directory->get(), now, identifier);
    }
    counters::add(problem.empty() ? counters::Counter::bugCaptures : counters::Counter::bugCapturesOutage);
    tell(isWritingOut_, problem, "captures have no folders until it can be written again");
    // Where there is no folder either, one line says it all.
    if (problem.empty()) {
        tell(isKeepingOut_, keepingProblem_, "the service will know nothing of it when it is started again");
    }
}

void CaptureFolders::keep(std::string_view name, std::string_view text) {
    // A directory that there is not is told with the folder.
    const HeldDirectory::Ref directory = directory_.open();
    const int error = directory == nullptr ? 0
                                           : replaceFileAtomically(directory->get(), std::string(name), text,
                                                                   Durability::process, modes_.file);
    keepingProblem_ = error != 0 ? failure("write", name, error) : "";
}

SmallFile CaptureFolders::kept(std::string_view name) {
    constexpr std::size_t kLongest = 4096;
    struct stat status {};
    if (::lstat(path().c_str(), &status) != 0) {
        return {.error = errno};
    }
    const HeldDirectory::Ref directory = directory_.open();
    const FileDescriptor file(directory == nullptr
                                  ? -1
                                  : ::openat(directory->get(), std::string(name).c_str(),
                                             O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_NOCTTY | O_CLOEXEC));
    return file.isOpen() ? SmallFile::read(file.get(), kLongest) : SmallFile{.error = errno};
}

std::string CaptureFolders::write(int directory, const std::string& identifier,
                                  std::span<const CaptureFile> files) const {
    const std::string name = formatted("{}{}", kUnfinished, identifier);
    if (::mkdirat(directory, name.c_str(), modes_.directory) != 0) {
        return failure("make", name, errno);
    }
    std::string problem = writeFiles(directory, name, files);
    if (problem.empty() && ::renameat(directory, name.c_str(), directory, identifier.c_str()) != 0) {
        problem = failure("rename", name, errno);
    }
    if (!problem.empty()) {
        (void)removeTree(directory, name);
    }
    return problem;
}

std::string CaptureFolders::writeFiles(int directory, const std::string& folder,
                                       std::span<const CaptureFile> files) const {
    const FileDescriptor opened(
        ::openat(directory, folder.c_str(), O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));
    if (!opened.isOpen() || ::fchmod(opened.get(), modes_.directory) != 0) {
        return failure("open", folder, errno);
    }
    for (const CaptureFile& file : files) {
        if (const int error =
                replaceFileAtomically(opened.get(), file.name, file.text, Durability::process, modes_.file)) {
            return failure("write", file.name, error);
        }
    }
    return {};
}

void CaptureFolders::removeOld(int directory, WallTime now, std::string_view latest) {
    std::vector<std::string> removed;
    std::vector<std::string> folders;
    for (std::string& name : DirectoryEntries::read(directory, kMaximumEntries).names) {
        const bool isUnfinished =
            name.starts_with(kUnfinished) && isIdentifier(std::string_view(name).substr(kUnfinished.size()));
        if ((isUnfinished || isIdentifier(name)) && isFolder(directory, name)) {
            (isUnfinished ? removed : folders).push_back(std::move(name));
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
        std::size_t entries = kMaximumEntries;
        total += total > limits_.totalSize ? 0 : sizeOfTree(directory, name, entries);
        if (name != latest && (total > limits_.totalSize || name < oldest)) {
            removed.push_back(name);
        }
    }
    std::string problem;
    for (const std::string& name : removed) {
        const int error = removeTree(directory, name);
        counters::add(counters::Counter::captureFoldersRemoved, error == 0 ? 1 : 0);
        if (error != 0 && problem.empty()) {
            problem = failure("remove", name, error);
        }
    }
    tell(isRemovingOut_, problem, "it takes room until it can be removed");
}

void CaptureFolders::tell(std::atomic<bool>& isOut, std::string_view problem, std::string_view consequence) {
    const bool wasOut = isOut.exchange(!problem.empty());
    if (!problem.empty() && !wasOut) {
        log_.report(LogLevel::error, "zrrb",
                    formatted("{}: {}; {}", directory_.path(), problem, consequence));
    }
}

} // namespace tamblo
