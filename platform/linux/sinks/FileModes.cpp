#include "platform/linux/sinks/FileModes.h"

#include "base/Format.h"
#include "platform/PreferenceDomains.h"

#include <charconv>
#include <optional>
#include <string_view>

namespace tamblo {

namespace {

constexpr unsigned kMostPermissions = 0777;

mode_t readMode(const Preferences& preferences, StructuredLog& log, std::string_view key, mode_t least) {
    const std::optional<Value> value = preferences.copyPreferenceValue(key, kSinksDomain);
    if (!value) {
        return least;
    }
    const std::string_view text = value->stringValue();
    unsigned mode = 0;
    const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), mode, 8);
    if (text.empty() || error != std::errc() || end != text.data() + text.size() || mode > kMostPermissions) {
        log.report(
            LogLevel::error, "zrrs",
            formatted("{}: {} is no octal text from \"0\" to \"0777\"; it is not used", kSinksDomain, key));
        return least;
    }
    return mode | least;
}

} // namespace

FileModes FileModes::read(const Preferences& preferences, StructuredLog& log) {
    const FileModes least;
    return {.file = readMode(preferences, log, "file_mode", least.file),
            .directory = readMode(preferences, log, "directory_mode", least.directory)};
}

} // namespace tamblo
