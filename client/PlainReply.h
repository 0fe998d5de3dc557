#pragma once

#include "client/Reply.h"

#include <cstddef>
#include <cstdint>
#include <optional>
#include <span>

namespace tamblo::client {

/// A reply with nothing but null or a boolean, which is nearly every one: read without building a value.
struct PlainReply {
    std::uint64_t id;
    ReplyView view;
};

[[nodiscard]] inline std::optional<PlainReply> readPlainReply(std::span<const std::uint8_t> item) noexcept {
    // [1, id, null, …]: 84 01 (id) F6 (F6 | F5 | F4)
    if (item.size() < 5 || item[0] != 0x84 || item[1] != 0x01) {
        return std::nullopt;
    }
    std::uint64_t id = item[2];
    std::size_t idBytes = 0;
    if (id >= 24) {
        if (id > 27) {
            return std::nullopt;
        }
        idBytes = std::size_t{1} << (id - 24);
        if (item.size() != idBytes + 5) {
            return std::nullopt;
        }
        id = 0;
        for (std::size_t i = 0; i < idBytes; ++i) {
            id = id << 8 | item[3 + i];
        }
    }
    const std::uint8_t* const rest = item.data() + 3 + idBytes;
    if (item.size() != idBytes + 5 || rest[0] != 0xF6 || rest[1] < 0xF4 || rest[1] > 0xF6) {
        return std::nullopt;
    }
    if (rest[1] == 0xF6) {
        return PlainReply{id, {.kind = ReplyView::Kind::null}};
    }
    return PlainReply{id, {.kind = ReplyView::Kind::boolean, .boolean = rest[1] == 0xF5}};
}

} // namespace tamblo::client
