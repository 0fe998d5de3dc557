#pragma once

#include "base/JsonReader.h"
#include "tools/report/Session.h"
#include "tools/report/Texts.h"

#include <cstddef>
#include <cstdint>
#include <deque>

namespace tamblo::report {

/// Collects what the sinks of an internal build say: captures, stack captures and drafts. Keeps the newest.
class DeviceEvents {
public:
    static constexpr std::size_t kMost = 10'000;

    // Whether the line is one that is understood.
    [[nodiscard]] bool takeCapture(const JsonItem& line);
    [[nodiscard]] bool takeStackCapture(const JsonItem& line);
    [[nodiscard]] bool takeDraft(const JsonItem& line);

    [[nodiscard]] const std::deque<DeviceEvent>& events() const noexcept { return events_; }
    [[nodiscard]] std::uint64_t leftOut() const noexcept { return leftOut_; }

private:
    bool add(const JsonItem& line, DeviceEvent::Kind kind, std::string_view text,
             std::string_view capture = {});

    SharedTexts texts_;
    std::deque<DeviceEvent> events_;
    std::uint64_t leftOut_ = 0;
};

} // namespace tamblo::report
