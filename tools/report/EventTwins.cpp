#include "tools/report/EventTwins.h"

namespace tamblo::report {

namespace {

constexpr std::string_view kPrefix = "com.vandra.";
constexpr std::string_view kGeneral = "tamblo";

/// A line as the service writes it, taken apart without being read.
struct Parts {
    std::string_view time;
    std::string_view service; ///< "tamblo" in a general name
    std::string_view rest;    ///< of the name
    std::string_view payload;
};

/// The part up to the mark, which is taken off the text with it; empty where there is none.
std::string_view takeUpTo(std::string_view& text, std::string_view mark) {
    const std::size_t at = text.find(mark);
    if (at == std::string_view::npos) {
        return {};
    }
    const std::string_view part = text.substr(0, at);
    text.remove_prefix(at + mark.size());
    return part;
}

Parts partsOf(std::string_view line) {
    Parts parts;
    parts.time = takeUpTo(line, ",\"event\":\"");
    if (line.starts_with(kPrefix)) {
        line.remove_prefix(kPrefix.size());
        parts.service = takeUpTo(line, ".");
    }
    parts.rest = takeUpTo(line, "\",\"payload\":");
    parts.payload = line;
    return parts;
}

} // namespace

void EventTwins::add(std::string_view line) {
    const Parts parts = partsOf(line);
    const Parts before = partsOf(held_);
    const bool isTwin = !parts.payload.empty() && parts.time == before.time && parts.rest == before.rest &&
                        parts.service != before.service && parts.payload == before.payload;
    if (isTwin) {
        if (parts.service != kGeneral) {
            service_ = parts.service;
        }
        finish();
        return;
    }
    finish();
    held_ = line;
    service_ = parts.service == kGeneral ? std::string_view() : parts.service;
}

void EventTwins::finish() {
    if (!held_.empty()) {
        take_(held_, service_);
    }
    held_.clear();
    service_.clear();
}

} // namespace tamblo::report
