#include "workers/ReportFileName.h"

#include "base/Format.h"
#include "base/Utf8.h"
#include "util/Log.h"

#include <algorithm>
#include <array>
#include <chrono>
#include <ctime>

namespace tamblo {

namespace {

/// What a file system takes as a name, in bytes.
constexpr std::size_t kLongestFileName = 255;

/// "yyyyMMdd-HHmmss" and the offset as hours and minutes.
std::string timeInFileName(WallTime time, std::chrono::seconds utcOffset) {
    const auto local = std::chrono::floor<std::chrono::seconds>(time + utcOffset);
    const std::time_t seconds = std::chrono::system_clock::to_time_t(local);
    std::tm fields{};
    gmtime_r(&seconds, &fields);
    fields.tm_gmtoff = utcOffset.count();
    std::array<char, 40> text{};
    std::strftime(text.data(), text.size(), "%Y%m%d-%H%M%S%z", &fields);
    return text.data();
}

/// What a client names so stays one part of one file name.
std::string asPartOfFileName(std::string name, std::size_t longest) {
    name.resize(cutUtf8(name, longest).size());
    std::replace_if(
        name.begin(), name.end(),
        [](char character) {
            return character == '/' || static_cast<unsigned char>(character) < 0x20 || character == 0x7F;
        },
        '_');
    return name;
}

} // namespace

std::string reportFileName(WallTime time, std::chrono::seconds utcOffset, std::int64_t reporterID,
                           const Value& applicationName, std::string_view serviceName) {
    const std::string before = formatted("{}-{}-", timeInFileName(time, utcOffset), reporterID);
    const std::string behind = formatted("-{}.json", serviceName);
    return before +
           asPartOfFileName(formatted("{}", applicationName),
                            kLongestFileName - before.size() - behind.size()) +
           behind;
}

} // namespace tamblo
