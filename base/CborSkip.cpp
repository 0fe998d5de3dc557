#include "base/Cbor.h"

#include <cstdint>
#include <string_view>
#include <vector>

namespace tamblo {

bool CborReader::skip() {
    // What is still open, innermost last: how many items are to come, or, for indefinite lengths, how many
    // have.
    struct Open {
        std::uint64_t items;
        bool isIndefinite;
        bool isMap;
    };
    std::vector<Open> open;
    do {
        if (!open.empty() && open.back().isIndefinite && atBreak()) {
            if (open.back().isMap && open.back().items % 2 != 0) {
                return fail(CborError::malformed);
            }
            open.pop_back();
        } else {
            if (!open.empty()) {
                Open& container = open.back();
                container.items += container.isIndefinite ? 1 : static_cast<std::uint64_t>(-1);
            }
            Head head{};
            if (!readHead(head)) {
                return false;
            }
            const bool isIndefinite = head.info == kIndefinite;
            std::string_view bytes;
            switch (head.major) {
            case Type::bytes:
            case Type::text:
                if (isIndefinite ? !skipChunks(head.major) : !takeBytes(head, bytes)) {
                    return false;
                }
                break;
            case Type::array:
                open.push_back({head.argument, isIndefinite, false});
                break;
            case Type::map:
                // Every item takes a byte, so a count that overflows when doubled cannot be there in full.
                if (head.argument > static_cast<std::uint64_t>(end_ - position_)) {
                    return fail(CborError::truncated);
                }
                open.push_back({head.argument * 2, isIndefinite, true});
                break;
            case Type::tag:
                open.push_back({1, false, false});
                break;
            default:
                break;
            }
        }
        while (!open.empty() && !open.back().isIndefinite && open.back().items == 0) {
            open.pop_back();
        }
    } while (!open.empty());
    return true;
}

bool CborReader::skipChunks(Type major) noexcept {
    while (!atBreak()) {
        std::string_view chunk;
        if (!takeChunk(major, chunk)) {
            return false;
        }
    }
    return true;
}

} // namespace tamblo
