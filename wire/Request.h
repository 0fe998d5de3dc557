#pragma once

#include "base/Cbor.h"
#include "base/Dictionary.h"
#include "base/TextBuffer.h"
#include "wire/Protocol.h"

#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <vector>

namespace tamblo::wire {

/// A request of any method; of the parameters, those that its method has.
struct Request {
    Method method{};
    /// Absent: the client asks for no reply.
    std::optional<std::uint64_t> id;
    std::int64_t reporterID = 0;
    std::uint16_t serviceType = 0;
    Dictionary dictionary; ///< the configuration, or a message's payload
    std::uint32_t category = 0;
    std::uint16_t type = 0;
    std::vector<std::int64_t> reporterIDs;
};

/// Why a frame is not carried out.
struct Refusal {
    std::uint64_t id = 0; ///< the request's; 0 where none could be read
    bool endsConnection = false;
    Error error;
};

/// Reads the CBOR item of one frame. The request may be one that was used before: its memory is reused. On a
/// refusal the request is left in an unspecified state. Keys of payloads are shared through the cache.
[[nodiscard]] std::optional<Refusal> decodeRequest(std::span<const std::uint8_t> item, KeySetCache& keySets,
                                                   Request& request);

/// Appends a whole frame, length included. False, and nothing appended, when it would be longer than allowed.
[[nodiscard]] bool appendRequestFrame(TextBuffer& out, const Request& request);

} // namespace tamblo::wire
