#include "client/MessageWriter.h"

#include "client/RequestFrame.h"

namespace tamblo::client {

MessageWriter::MessageWriter(Engine& engine, OutgoingFrame* frame) noexcept : engine_(engine), frame_(frame) {
    if (frame_ != nullptr) {
        request_frame::beginMessage(frame_->frame, false);
    }
}

MessageWriter::~MessageWriter() {
    if (frame_ != nullptr) {
        engine_.abandon(*frame_);
    }
}

bool MessageWriter::send(EventCategory category, EventType type, std::span<const std::int64_t> reporterIDs) {
    OutgoingFrame* const frame = std::exchange(frame_, nullptr);
    if (frame == nullptr) {
        return false;
    }
    if (!request_frame::finishMessage(frame->frame, false, entries_, category, type, reporterIDs)) {
        engine_.countRefused();
        engine_.abandon(*frame);
        return false;
    }
    engine_.publish(*frame);
    return true;
}

} // namespace tamblo::client
