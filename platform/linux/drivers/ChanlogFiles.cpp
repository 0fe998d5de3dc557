#include "platform/linux/drivers/ChanlogFiles.h"

#include "base/Format.h"
#include "os/Directory.h"
#include "platform/Counters.h"
#include "platform/linux/drivers/ChanlogChannelJson.h"

#include <algorithm>
#include <cerrno>
#include <system_error>
#include <utility>
#include <variant>

#include <sys/stat.h>

namespace tamblo {

namespace {

constexpr std::string_view kLogCategory = "zrrd";
/// "." and "..".
constexpr std::size_t kOwnEntries = 2;

/// Publishers that replace a file write the new one under a name of another kind, or a hidden one.
bool isChannelFile(std::string_view name) noexcept {
    return name.ends_with(".json") && !name.starts_with('.');
}

} // namespace

bool ChanlogFiles::read(StructuredLog& log) {
    DirectoryEntries entries = DirectoryEntries::read(directory_, kMaximumEntries - kOwnEntries);
    if (entries.error == 0 && !entries.isCut) {
        std::erase_if(entries.names, [](const std::string& name) { return !isChannelFile(name); });
        std::sort(entries.names.begin(), entries.names.end());
        return readFiles(entries.names, log);
    }
    const bool isMissing = entries.error == ENOENT || entries.error == ENOTDIR;
    if (entries.error != 0 && !isMissing) {
        report(log, formatted("{}: {}; what was read there before counts until it can be read", directory_,
                              std::generic_category().message(entries.error)));
        return false;
    }
    report(log, isMissing ? std::string()
                          : formatted("{}: more than {} entries; no driver statistics are had from there",
                                      directory_, kMaximumEntries));
    return !std::exchange(files_, {}).empty();
}

bool ChanlogFiles::readFiles(const std::vector<std::string>& names, StructuredLog& log) {
    bool isChanged = false;
    Files earlier = std::exchange(files_, {});
    std::string fault;
    std::size_t room = kMaximumTotalSize;
    for (const std::string& name : names) {
        const std::string path = formatted("{}/{}", directory_, name);
        struct stat status {};
        if (::stat(path.c_str(), &status) != 0) {
            continue; // it went meanwhile
        }
        const auto size = std::min(static_cast<std::size_t>(status.st_size), kMaximumFileSize);
        if (files_.size() == kMaximumFiles || size > room) {
            counters::add(counters::Counter::driverFiles);
            fault = formatted("{}: more than {} files or {} bytes in all; it and those behind it in the "
                              "order of names are left out",
                              path, kMaximumFiles, kMaximumTotalSize);
            break;
        }
        room -= size;
        auto known = earlier.extract(name);
        File& file = known.empty()
                         ? files_.emplace(name, File{JsonFile(path, kMaximumFileSize)}).first->second
                         : files_.insert(std::move(known)).position->second;
        isChanged = readFile(file, FileState::of(status), log) || isChanged;
    }
    report(log, fault);
    return isChanged || !earlier.empty();
}

bool ChanlogFiles::readFile(File& file, const FileState& state, StructuredLog& log) {
    if (file.json.isCurrent(state)) {
        return false;
    }
    auto earlier = std::exchange(file.channels, {});
    readChannels(file, log);
    if (file.json.isUnreadable()) {
        file.channels = std::move(earlier);
        return false;
    }
    return !earlier.empty() || !file.channels.empty();
}

void ChanlogFiles::readChannels(File& file, StructuredLog& log) {
    std::vector<std::string> faults;
    std::size_t count = 0;
    std::size_t untold = 0;
    const auto take = [&](const JsonItem& element) {
        auto read = readChanlogChannel(element);
        if (auto* channel = std::get_if<ChanlogChannelRef>(&read)) {
            file.channels.push_back(std::move(*channel));
        } else {
            counters::add(counters::Counter::driverChannels);
            if (faults.size() < kMaximumFaultsTold) {
                faults.push_back(formatted("{}: channel {}: {}; it is left out", file.json.path(), count,
                                           std::get<std::string>(read)));
            } else {
                ++untold;
            }
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

void ChanlogFiles::report(StructuredLog& log, std::string_view fault) {
    if (told_.isNews(fault)) {
        log.report(LogLevel::error, kLogCategory, fault);
    }
}

} // namespace tamblo
