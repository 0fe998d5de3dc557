#include "platform/linux/drivers/ChanlogPcmStreams.h"

#include "base/Format.h"
#include "base/SplitText.h"
#include "os/SmallFile.h"
#include "platform/Counters.h"

#include <cerrno>
#include <cstdint>
#include <memory>
#include <optional>
#include <system_error>

namespace tamblo {

namespace {

constexpr std::string_view kLogCategory = "zrrd";
constexpr std::string_view kClosed = "closed";

/// Nothing when the status does not have it.
std::optional<std::int64_t> numberIn(std::string_view status, std::string_view name) {
    if (status == kClosed) {
        return 0;
    }
    std::string_view value = fieldOf(status, name).value_or("");
    return takeNumber<std::int64_t>(value);
}

std::optional<std::int64_t> isOverrun(std::string_view status) {
    if (status == kClosed) {
        return 0;
    }
    const std::string_view state = fieldOf(status, "state").value_or("");
    return state.empty() ? std::nullopt : std::optional<std::int64_t>(state == "XRUN" ? 1 : 0);
}

/// How many streams of a kind (" : playback ") a line of the list tells of. The line ends with these, behind
/// names that may be anything.
std::int64_t countIn(std::string_view line, std::string_view kind) {
    const std::size_t at = line.rfind(kind);
    if (at == std::string_view::npos) {
        return 0;
    }
    std::string_view rest = line.substr(at + kind.size());
    const auto count = takeNumber<std::int64_t>(rest);
    return count && (rest.empty() || rest.starts_with(" : capture ")) ? *count : 0;
}

} // namespace

bool ChanlogPcmStreams::read(StructuredLog& log) {
    const bool hadStreams = !streams_.empty();
    const std::string listedBefore = listed_;
    list(log);
    bool isChanged = listed_ != listedBefore && (hadStreams || !streams_.empty());
    for (Stream& stream : streams_) {
        isChanged = stream.read() || isChanged;
    }
    return isChanged;
}

void ChanlogPcmStreams::list(StructuredLog& log) {
    SmallFile devices = SmallFile::read(soundDirectory_ + "/pcm", kMaximumListSize);
    if (devices.error == ENOENT || devices.error == ENOTDIR) {
        devices.error = 0; // a machine without sound
    } else if (devices.error != 0 && devices.error != listError_) {
        log.report(LogLevel::error, kLogCategory,
                   formatted("{}/pcm: {}; PCM streams have no statistics", soundDirectory_,
                             std::generic_category().message(devices.error)));
    }
    listError_ = devices.error;
    if (devices.text == listed_) {
        return;
    }
    streams_.clear();
    for (std::string_view rest = devices.text; !rest.empty();) {
        addStreams(takeUpTo('\n', rest));
    }
    if (streams_.size() > kMaximumStreams) {
        counters::add(counters::Counter::driverStreams, streams_.size() - kMaximumStreams);
        log.report(LogLevel::error, kLogCategory,
                   formatted("{}/pcm: more than {} streams; the others are left out", soundDirectory_,
                             kMaximumStreams));
        streams_.resize(kMaximumStreams);
    }
    listed_ = std::move(devices.text);
}

/// "00-03: name : description : playback 1 : capture 1", of card 0, device 3.
void ChanlogPcmStreams::addStreams(std::string_view line) {
    std::string_view rest = line;
    const auto card = takeNumber<unsigned>(rest);
    const bool isDash = takeUpTo('-', rest).empty();
    const auto device = takeNumber<unsigned>(rest);
    if (!card || !isDash || !device || !rest.starts_with(':')) {
        return;
    }
    const std::string directory = formatted("{}/card{}", soundDirectory_, *card);
    const SmallFile id = SmallFile::read(directory + "/id", kMaximumStatusSize);
    const std::string driver = id.trimmed().empty() ? formatted("card{}", *card) : std::string(id.trimmed());
    const struct {
        std::int64_t count;
        std::string_view group;
        std::string_view suffix;
    } kinds[] = {{countIn(line, " : playback "), "Tx", "p"}, {countIn(line, " : capture "), "Rx", "c"}};
    for (const auto& kind : kinds) {
        const std::string pcm = formatted("pcm{}{}", *device, kind.suffix);
        for (std::int64_t sub = 0; sub < kind.count && streams_.size() <= kMaximumStreams; ++sub) {
            streams_.push_back({.statusFile = formatted("{}/{}/sub{}/status", directory, pcm, sub),
                                .driver = driver,
                                .group = std::string(kind.group),
                                .subGroup = sub == 0 ? pcm : formatted("{} sub{}", pcm, sub)});
        }
    }
}

bool ChanlogPcmStreams::Stream::read() {
    const SmallFile file = SmallFile::read(statusFile, kMaximumStatusSize);
    const std::string_view latest = file.trimmed();
    if (latest == status) {
        return false;
    }
    status = latest;
    channels.clear();
    if (status.empty()) {
        return true;
    }
    const auto add = [this](const char* name, std::optional<std::int64_t> value) {
        if (value) {
            auto channel = std::make_shared<ChanlogChannel>();
            channel->driverName = driver;
            channel->groupName = group;
            channel->subGroupName = subGroup;
            channel->channelName = name;
            channel->unitLabel = "frames";
            channel->format = ChanlogFormat::simple;
            channel->value = *value;
            channels.push_back(std::move(channel));
        }
    };
    add("frames", numberIn(status, "hw_ptr"));
    add("overruns", isOverrun(status));
    add("available", numberIn(status, "avail"));
    add("delay", numberIn(status, "delay"));
    return true;
}

void ChanlogPcmStreams::appendTo(std::vector<ChanlogChannelRef>& channels) const {
    for (const Stream& stream : streams_) {
        channels.insert(channels.end(), stream.channels.begin(), stream.channels.end());
    }
}

} // namespace tamblo
