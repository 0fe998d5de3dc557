#include "client/MessageWriter.h"

#include "client/RequestFrame.h"

namespace tamblo::client {

MessageWriter::MessageWriter(Engine& engine) : engine_(engine), frame_(engine) {
    if (frame_) {
        request_frame::beginMessage(frame_->frame, false);
    }
}

bool MessageWriter::send(EventCategory category, EventType type, std::span<const std::int64_t> reporterIDs) {
    if (!frame_ ||
        !request_frame::finishMessage(frame_->frame, false, entries_, category, type, reporterIDs)) {
        engine_.countRefused();
        return false;
    }
    frame_.publish();
    return true;
}

} // namespace tamblo::client
