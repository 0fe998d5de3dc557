#include "bridge/common/Settings.h"

#include "base/Format.h"

#include <algorithm>
#include <cctype>
#include <cmath>

namespace tamblo::bridge {

namespace {

constexpr std::size_t kMostListBytes = 512;

std::string channelsText(std::uint32_t channels) {
    switch (channels) {
    case 1:
        return "mono";
    case 2:
        return "stereo";
    case 6:
        return "5.1";
    case 8:
        return "7.1";
    default:
        return formatted("{} channels", channels);
    }
}

} // namespace

double perceivedVolume(double linear) noexcept {
    return std::isfinite(linear) ? std::clamp(std::cbrt(linear), 0.0, 1.0) : 0.0;
}

double rounded(double value) noexcept {
    constexpr double digits = 1e6;
    return std::round(value * digits) / digits;
}

void addToList(std::string& list, std::string_view text) {
    if (!text.empty() && list.size() + text.size() <= kMostListBytes) {
        list += list.empty() ? "" : ", ";
        list += text;
    }
}

std::string joined(const std::set<std::string>& texts) {
    std::string list;
    for (const std::string& text : texts) {
        addToList(list, text);
    }
    return list;
}

std::string upperCase(std::string_view text) {
    std::string upper(text);
    std::transform(upper.begin(), upper.end(), upper.begin(),
                   [](unsigned char byte) { return static_cast<char>(std::toupper(byte)); });
    return upper;
}

void setFormat(Dictionary& settings, const std::string& codec, std::uint32_t rate, std::uint32_t channels) {
    settings.set("session_selected_format",
                 formatted("{} {} Hz {}", upperCase(codec), rate, channelsText(channels)));
    settings.set("mFormatID", codec);
    settings.set("mChannelsPerFrame", channels);
    settings.set("sample_rate", rate);
}

Dictionary changesBetween(const Dictionary& before, const Dictionary& now) {
    Dictionary changes;
    for (std::size_t i = 0; i < now.size(); ++i) {
        const Value* const old = before.find(now.keyAt(i));
        if (old == nullptr || !(*old == now.valueAt(i))) {
            changes.set(now.keyAt(i), now.valueAt(i));
        }
    }
    return changes;
}

} // namespace tamblo::bridge
