#include "tools/report/DeviceEvents.h"

#include "tools/report/Lines.h"

#include <string>

namespace tamblo::report {

bool DeviceEvents::takeCapture(const JsonItem& line) {
    const std::string_view op = textIn(line, "op");
    const std::string_view capture = textIn(line, "session");
    const JsonItem* const signature = line.find("signature");
    if (capture.empty() || signature == nullptr || signature->kind != JsonItem::Kind::object) {
        return false;
    }
    std::string text(textIn(*signature, "type"));
    text.append(" ").append(textIn(*signature, "subType"));
    if (op == "snapshot" || op == "end") {
        return add(line, DeviceEvent::Kind::capture, text, capture);
    }
    if (op == "cancel") {
        return add(line, DeviceEvent::Kind::cancelledCapture, text);
    }
    return op == "start"; // its end, or that it was called off, has a line of its own
}

bool DeviceEvents::takeStackCapture(const JsonItem& line) {
    return !textIn(line, "captureType").empty() &&
           add(line, DeviceEvent::Kind::stackCapture, textIn(line, "reason"));
}

bool DeviceEvents::takeDraft(const JsonItem& line) {
    const std::string_view reason = textIn(line, "reason");
    return !reason.empty() && add(line, DeviceEvent::Kind::draft, reason);
}

bool DeviceEvents::add(const JsonItem& line, DeviceEvent::Kind kind, std::string_view text,
                       std::string_view capture) {
    const std::optional<double> time = timeOf(line);
    if (!time) {
        return false;
    }
    if (events_.size() == kMost) {
        events_.pop_front();
        ++leftOut_;
    }
    events_.push_back({*time, kind, texts_.of(text), texts_.of(capture)});
    return true;
}

} // namespace tamblo::report
