#include "platform/linux/drivers/ChanlogFiles.h"

#include "base/Format.h"
#include "os/FileDescriptor.h"
#include "platform/linux/drivers/ChanlogChannelJson.h"

#include <algorithm>
#include <cerrno>
#include <cstdint>
#include <ctime>
#include <memory>
#include <optional>
#include <system_error>
#include <utility>
#include <variant>

#include <dirent.h>
#include <fcntl.h>
#include <sys/stat.h>

namespace tamblo {

namespace {

constexpr std::string_view kLogCategory = "zrrd";

/// Publishers that replace a file write the new one under a name of another kind, or a hidden one.
bool isChannelFile(std::string_view name) noexcept {
    return name.ends_with(".json") && !name.starts_with('.');
}

/// Sorted. Nothing when the directory has too many entries to look through.
std::optional<std::vector<std::string>> channelFilesIn(DIR* directory) {
    std::vector<std::string> names;
    std::size_t count = 0;
    while (const dirent* entry = ::readdir(directory)) {
        if (++count > ChanlogFiles::kMaximumEntries) {
            return std::nullopt;
        }
        if (isChannelFile(entry->d_name)) {
            names.emplace_back(entry->d_name);
        }
    }
    std::sort(names.begin(), names.end());
    return names;
}

timespec coarseNow() noexcept {
    timespec now{};
    ::clock_gettime(CLOCK_REALTIME_COARSE, &now);
    return now;
}

/// Whether a state was so old that no change from that moment on can bear the same times.
bool wasOld(const FileState& state, const timespec& moment) noexcept {
    const std::int64_t seconds = moment.tv_sec - state.changedSeconds;
    if (seconds < 0 || seconds > 1) {
        return seconds > 0;
    }
    const std::chrono::nanoseconds age =
        std::chrono::seconds(seconds) + std::chrono::nanoseconds(moment.tv_nsec - state.changedNanoseconds);
    return age >= ChanlogFiles::kCertainAge;
}

} // namespace

bool ChanlogFiles::read(StructuredLog& log) {
    const std::unique_ptr<DIR, int (*)(DIR*)> directory(::opendir(directory_.c_str()), ::closedir);
    const int failure = directory == nullptr ? errno : 0;
    const auto names = directory != nullptr ? channelFilesIn(directory.get()) : std::nullopt;
    if (names) {
        return readFiles(::dirfd(directory.get()), *names, log);
    }
    const bool isMissing = failure == ENOENT || failure == ENOTDIR;
    const std::string fault = failure != 0 ? std::generic_category().message(failure)
                                           : formatted("more than {} entries", kMaximumEntries);
    report(log, isMissing ? std::string()
                          : formatted("{}: {}; no driver statistics are had from there", directory_, fault));
    return !std::exchange(files_, {}).empty();
}

bool ChanlogFiles::readFiles(int directory, const std::vector<std::string>& names, StructuredLog& log) {
    bool isChanged = false;
    Files earlier = std::exchange(files_, {});
    std::string fault;
    std::size_t room = kMaximumTotalSize;
    for (const std::string& name : names) {
        struct stat status {};
        if (::fstatat(directory, name.c_str(), &status, 0) != 0) {
            continue; // it went meanwhile
        }
        const auto size = std::min(static_cast<std::size_t>(status.st_size), kMaximumFileSize);
        if (files_.size() == kMaximumFiles || size > room) {
            fault = formatted("{}/{}: more than {} files or {} bytes in all; it and those behind it in the "
                              "order of names are left out",
                              directory_, name, kMaximumFiles, kMaximumTotalSize);
            break;
        }
        room -= size;
        auto known = earlier.extract(name);
        if (known.empty()) {
            const auto made =
                files_.emplace(name, File{JsonFile(directory_ + "/" + name, kMaximumFileSize)}).first;
            isChanged = readFile(made->second, FileState::of(status), log) || isChanged;
        } else {
            isChanged = readFile(known.mapped(), FileState::of(status), log) || isChanged;
            files_.insert(std::move(known));
        }
    }
    report(log, std::move(fault));
    return isChanged || !earlier.empty();
}

bool ChanlogFiles::readFile(File& file, const FileState& state, StructuredLog& log) {
    if (file.isCertain && state == file.json.state()) {
        return false;
    }
    const bool hadChannels = !file.channels.empty();
    file.channels.clear();
    const timespec beforeReading = coarseNow();
    readChannels(file, log);
    file.isCertain = wasOld(file.json.state(), beforeReading);
    return hadChannels || !file.channels.empty();
}

void ChanlogFiles::readChannels(File& file, StructuredLog& log) {
    std::vector<std::string> faults;
    std::size_t count = 0;
    std::size_t untold = 0;
    const auto take = [&](const JsonItem& element) {
        auto read = readChanlogChannel(element);
        if (auto* channel = std::get_if<ChanlogChannelRef>(&read)) {
            file.channels.push_back(std::move(*channel));
        } else if (faults.size() < kMaximumFaultsTold) {
            faults.push_back(formatted("{}: channel {}: {}; it is left out", file.json.path(), count,
                                       std::get<std::string>(read)));
        } else {
            ++untold;
        }
        ++count;
    };
    if (!file.json.readArray(take, log)) {
        file.channels.clear();
        return;
    }
    if (untold > 0) {
        faults.push_back(formatted("{}: {} more channels are left out", file.json.path(), untold));
    }
    if (faults != file.reportedFaults) {
        for (const std::string& fault : faults) {
            log.report(LogLevel::error, kLogCategory, fault);
        }
        file.reportedFaults = std::move(faults);
    }
}

void ChanlogFiles::appendTo(std::vector<ChanlogChannelRef>& channels) const {
    for (const auto& [name, file] : files_) {
        channels.insert(channels.end(), file.channels.begin(), file.channels.end());
    }
}

void ChanlogFiles::report(StructuredLog& log, std::string fault) {
    if (!fault.empty() && fault != reported_) {
        log.report(LogLevel::error, kLogCategory, fault);
    }
    reported_ = std::move(fault);
}

} // namespace tamblo
