#pragma once

#include "base/Dictionary.h"
#include "base/TextBuffer.h"
#include "platform/AnalyticsEventService.h"
#include "platform/Clock.h"
#include "platform/StructuredLog.h"
#include "platform/linux/settings/LinuxPreferences.h"
#include "platform/linux/sinks/AppendOnlyFile.h"
#include "platform/linux/sinks/EventsInUse.h"

#include <functional>
#include <mutex>
#include <string>
#include <string_view>

namespace tamblo {

/// The analytics-event service as a file of JSON lines, `analytics-events.jsonl`:
///
///     {"time":1772366400.25,"event":"com.vandra.tamblo.Session_Generic.Summary","payload":{…}}
///
/// Most messages are sent as two events with one payload. Its text is made once: the payload of the last
/// event is kept until the next flush, and an event whose payload is that very one is given a copy of the
/// text and the time.
class LinuxAnalyticsEventService final : public AnalyticsEventService {
public:
    /// What is referred to must outlive the service.
    LinuxAnalyticsEventService(const std::string& logsDirectory, const Clock& clock,
                               const LinuxPreferences& preferences, StructuredLog& log,
                               FileOperations& operations = FileOperations::system());

    [[nodiscard]] bool isEventInUse(std::string_view eventName) override;
    void sendEventLazy(std::string_view eventName, const std::function<Dictionary()>& payload) override;

    /// Writes out the events recorded so far. To be called after each batch of the server queue's work,
    /// before its replies go.
    void flush();

private:
    void formatPayload(const Dictionary& payload);

    const Clock& clock_;
    EventsInUse eventsInUse_;
    AppendOnlyFile file_;

    std::mutex mutex_; ///< guards what follows
    Dictionary lastPayload_;
    bool hasLastPayload_ = false;
    TextBuffer lastText_; ///< what stands before the event's name in the line, then what stands after it
    std::size_t lastTextBeforeName_ = 0;
};

} // namespace tamblo
