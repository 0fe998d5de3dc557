#include "base/Cbor.h"

#include <cstdint>
#include <string_view>
#include <vector>

namespace tamblo {

bool CborReader::skip() {
    // What is still open, innermost last, the item itself at the bottom: how many items are to come, or, for
    // indefinite lengths, how many have.
    struct Open {
        std::uint64_t items;
        bool isIndefinite;
        bool isMap;
    };
    std::vector<Open> open{{.items = 1, .isIndefinite = false, .isMap = false}};
    while (!open.empty()) {
        Open& container = open.back();
        if (container.isIndefinite ? atBreak() : container.items == 0) {
            if (container.isIndefinite && container.isMap && container.items % 2 != 0) {
                return fail(CborError::malformed);
            }
            open.pop_back();
            continue;
        }
        container.items += container.isIndefinite ? 1 : static_cast<std::uint64_t>(-1);
        Head head{};
        if (!readHead(head)) {
            return false;
        }
        const bool isIndefinite = head.info == kIndefinite;
        std::string_view bytes;
        switch (head.major) {
        case Type::bytes:
        case Type::text:
            if (isIndefinite ? !takeChunks(head.major, nullptr) : !takeBytes(head, bytes)) {
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
    return true;
}

} // namespace tamblo
