#include "client/RequestFrame.h"

#include "base/Cbor.h"
#include "wire/FrameScope.h"

#include <string_view>

namespace tamblo::client::request_frame {

namespace {

/// Behind the length, the array's head, the kind and the head of a 64-bit number.
constexpr std::size_t kIdOffset = wire::kLengthBytes + 3;
constexpr std::size_t kIdBytes = 8;
constexpr std::string_view kHeadWithId("\x84\x00\x1B\0\0\0\0\0\0\0\0", 3 + kIdBytes);
constexpr std::string_view kHeadWithoutId("\x83\x02", 2);

/// The head of a map in a form that takes any number of entries below 65,536, filled in at the end.
constexpr std::string_view kMapHead("\xB9\0\0", 3);
constexpr std::size_t kMaximumEntries = 0xFFFF;

void writeHead(TextBuffer& out, bool wantsReply, wire::Method method, std::uint64_t parameters) {
    out.append(wantsReply ? kHeadWithId : kHeadWithoutId);
    CborWriter writer(out);
    writer.text(wire::methodName(method));
    writer.arrayHead(parameters);
}

void writeMessageTail(CborWriter& writer, EventCategory category, EventType type,
                      std::span<const std::int64_t> reporterIDs) {
    writer.unsignedInteger(static_cast<std::uint32_t>(category));
    writer.unsignedInteger(static_cast<std::uint16_t>(type));
    writer.arrayHead(reporterIDs.size());
    for (const std::int64_t reporterID : reporterIDs) {
        writer.integer(reporterID);
    }
}

/// Where the payload's map begins, behind the heads, the method and the head of the parameters.
constexpr std::size_t mapOffset(bool wantsReply) noexcept {
    constexpr std::size_t methodBytes = 1 + wire::methodName(wire::Method::sendMessage).size();
    return wire::kLengthBytes + (wantsReply ? kHeadWithId : kHeadWithoutId).size() + methodBytes + 1;
}

} // namespace

bool writeSimple(TextBuffer& out, bool wantsReply, wire::Method method) {
    wire::FrameScope frame(out);
    writeHead(out, wantsReply, method, 0);
    return frame.finish();
}

bool writeForReporter(TextBuffer& out, bool wantsReply, wire::Method method, std::int64_t reporterID) {
    wire::FrameScope frame(out);
    writeHead(out, wantsReply, method, 1);
    CborWriter(out).integer(reporterID);
    return frame.finish();
}

bool writeSetServiceType(TextBuffer& out, bool wantsReply, ServiceType type, std::int64_t reporterID) {
    wire::FrameScope frame(out);
    writeHead(out, wantsReply, wire::Method::setServiceType, 2);
    CborWriter writer(out);
    writer.unsignedInteger(static_cast<std::uint16_t>(type));
    writer.integer(reporterID);
    return frame.finish();
}

bool writeSetConfiguration(TextBuffer& out, bool wantsReply, const Dictionary& configuration,
                           std::int64_t reporterID) {
    wire::FrameScope frame(out);
    writeHead(out, wantsReply, wire::Method::setConfiguration, 2);
    CborWriter writer(out);
    writer.dictionary(configuration);
    writer.integer(reporterID);
    return frame.finish();
}

bool writeMessage(TextBuffer& out, bool wantsReply, const Dictionary& payload, EventCategory category,
                  EventType type, std::span<const std::int64_t> reporterIDs) {
    wire::FrameScope frame(out);
    writeHead(out, wantsReply, wire::Method::sendMessage, 4);
    CborWriter writer(out);
    writer.dictionary(payload);
    writeMessageTail(writer, category, type, reporterIDs);
    return frame.finish();
}

void beginMessage(TextBuffer& out, bool wantsReply) {
    (void)out.room(wire::kLengthBytes);
    out.commit(wire::kLengthBytes);
    writeHead(out, wantsReply, wire::Method::sendMessage, 4);
    out.append(kMapHead);
}

bool finishMessage(TextBuffer& out, bool wantsReply, std::size_t entries, EventCategory category,
                   EventType type, std::span<const std::int64_t> reporterIDs) {
    CborWriter writer(out);
    writeMessageTail(writer, category, type, reporterIDs);
    const std::size_t length = out.size() - wire::kLengthBytes;
    if (length > wire::kMaximumFrameBytes || entries > kMaximumEntries) {
        out.clear();
        return false;
    }
    wire::storeLength(out.data(), length);
    char* const map = out.data() + mapOffset(wantsReply);
    map[1] = static_cast<char>(entries >> 8);
    map[2] = static_cast<char>(entries);
    return true;
}

void fillInId(TextBuffer& frame, std::uint64_t id) noexcept {
    char* const to = frame.data() + kIdOffset;
    for (std::size_t i = 0; i < kIdBytes; ++i) {
        to[i] = static_cast<char>(id >> (8 * (kIdBytes - 1 - i)));
    }
}

} // namespace tamblo::client::request_frame
