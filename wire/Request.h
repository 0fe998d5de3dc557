#pragma once

#include "base/Cbor.h"
#include "base/Dictionary.h"
#include "base/TextBuffer.h"
#include "wire/Protocol.h"
#include "wire/Vocabulary.h"

#include <cstddef>
#include <cstdint>
#include <optional>
#include <span>
#include <string_view>
#include <vector>

namespace tamblo::wire {

inline const Dictionary kNoEntries;

/// A request of any method; of the parameters, those that its method has.
template <typename Entries, typename Numbers> struct BasicRequest {
    Method method{};
    /// Absent: the client asks for no reply.
    std::optional<std::uint64_t> id{};
    std::int64_t reporterID = 0;
    std::uint16_t serviceType = 0;
    Entries dictionary = kNoEntries; ///< the configuration, or a message's payload
    std::uint32_t category = 0;
    std::uint16_t type = 0;
    Numbers reporterIDs{};
    /// What the values take, about (`CborReader::decodedBytes`).
    std::size_t decodedBytes = 0;
};
/// As the service reads it, and as the client writes it, which copies nothing.
using Request = BasicRequest<Dictionary, std::vector<std::int64_t>>;
using RequestView = BasicRequest<const Dictionary&, std::span<const std::int64_t>>;

/// What one request may ask for at most; by the names of the preferences that change them.
struct RequestLimits {
    CborLimits values;                                             ///< entries_of_dictionary, key_bytes, ...
    std::size_t reportersOfMessage = static_cast<std::size_t>(-1); ///< reporters_of_message
    std::size_t deliveredBytesOfMessage = static_cast<std::size_t>(-1); ///< its values, for each reporter
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
                                                   Request& request, const RequestLimits& limits = {});

/// Begins a request's frame: everything before its first parameter. What is answered belongs to
/// `finishFrame`. An id is written in its longest form, so that `replaceId` can put another one in its place.
[[nodiscard]] std::size_t beginRequest(TextBuffer& out, Method method, std::optional<std::uint64_t> id);
/// For a frame that begins its buffer.
void replaceId(TextBuffer& frame, std::uint64_t id) noexcept;

template <typename AnyRequest>
void writeParameters(CborWriter& writer, std::span<const Parameter> parameters, const AnyRequest& request) {
    for (const Parameter parameter : parameters) {
        switch (parameter) {
        case Parameter::none:
            break;
        case Parameter::payload:
        case Parameter::configuration:
            writer.dictionary(request.dictionary);
            break;
        case Parameter::category:
            writer.unsignedInteger(request.category);
            break;
        case Parameter::type:
            writer.unsignedInteger(request.type);
            break;
        case Parameter::serviceType:
            writer.unsignedInteger(request.serviceType);
            break;
        case Parameter::reporterID:
            writer.integer(request.reporterID);
            break;
        case Parameter::reporterIDs:
            writer.arrayHead(request.reporterIDs.size());
            for (const std::int64_t reporterID : request.reporterIDs) {
                writer.integer(reporterID);
            }
            break;
        }
    }
}

/// Appends a whole frame, length included. False, and nothing appended, when it would be longer than allowed.
template <typename AnyRequest>
[[nodiscard]] bool appendRequestFrame(TextBuffer& out, const AnyRequest& request) {
    const std::size_t start = beginRequest(out, request.method, request.id);
    CborWriter writer(out);
    writeParameters(writer, parametersOf(request.method), request);
    return finishFrame(out, start);
}

} // namespace tamblo::wire
