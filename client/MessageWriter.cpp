#include "client/MessageWriter.h"

#include "wire/Request.h"

namespace tamblo::client {

namespace {

/// The head of a map in a form that takes any number of entries below 65,536, filled in at the end.
constexpr std::string_view kMapHead("\xB9\0\0", 3);
constexpr std::size_t kMaximumEntries = 0xFFFF;

} // namespace

MessageWriter::MessageWriter(Engine& engine) : engine_(engine), frame_(engine) {
    if (frame_) {
        (void)wire::beginRequest(frame_->frame, wire::Method::sendMessage, std::nullopt);
        mapOffset_ = frame_->frame.size();
        frame_->frame.append(kMapHead);
    }
}

bool MessageWriter::send(EventCategory category, EventType type, std::span<const std::int64_t> reporterIDs) {
    if (!frame_ || entries_ > kMaximumEntries) {
        engine_.countRefused();
        return false;
    }
    TextBuffer& out = frame_->frame;
    char* const map = out.data() + mapOffset_;
    map[1] = static_cast<char>(entries_ >> 8);
    map[2] = static_cast<char>(entries_);
    CborWriter writer(out);
    wire::writeParameters(writer, wire::parametersOf(wire::Method::sendMessage).subspan(1),
                          wire::RequestView{.category = static_cast<std::uint32_t>(category),
                                            .type = static_cast<std::uint16_t>(type),
                                            .reporterIDs = reporterIDs});
    if (!wire::finishFrame(out, 0)) {
        engine_.countRefused();
        return false;
    }
    frame_.publish();
    return true;
}

} // namespace tamblo::client
