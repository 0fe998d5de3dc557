#pragma once

#include "base/Dictionary.h"
#include "base/Hash.h"

#include <cstddef>
#include <functional>
#include <span>
#include <string>
#include <string_view>
#include <unordered_map>
#include <vector>

namespace tamblo {

/// The latest value of each key that a session's messages held.
///
/// Messages are of few kinds: of each of the key sets met of late the last payload is kept, as a reference,
/// so that one more message of a known kind costs a search among few pointers, whatever was met before. The
/// payload of a key set that falls out is taken apart into a table of values by key. On the reporting server
/// queue.
class PreviousValues {
public:
    /// Key sets whose last payload is kept.
    static constexpr std::size_t kMostKeySets = 32;

    /// Of at most so many keys; those first met beyond them are not remembered.
    explicit PreviousValues(std::size_t mostKeys) noexcept : mostKeys_(mostKeys) {}
    PreviousValues(const PreviousValues&) = delete;
    PreviousValues& operator=(const PreviousValues&) = delete;

    /// Takes in what a message holds. Its values win over those of the messages before. `bytes` is what
    /// `heldBytes` counts for the payload's values; whether the message is recorded as well tells who holds
    /// its keys later.
    void take(const Dictionary& payload, std::size_t bytes, bool isRecorded);
    /// Nothing is remembered any more.
    void clear();

    /// All of them, made into a dictionary.
    [[nodiscard]] Dictionary values() const;
    /// Those of some keys alone, which costs as much as there are of these.
    [[nodiscard]] Dictionary valuesOf(std::span<const std::string_view> keys) const;
    /// Bytes of memory.
    [[nodiscard]] std::size_t heldBytes() const noexcept { return bytes_; }
    /// The bytes of the keys of the key set that the latest payload has pushed out, which recorded messages
    /// go on to share; 0 when it has pushed none out, or none that they have.
    [[nodiscard]] std::size_t bytesOfKeysLeft() const noexcept { return bytesOfKeysLeft_; }
    /// Whether keys were left out.
    [[nodiscard]] bool isFull() const noexcept { return isFull_; }

private:
    struct Latest {
        Dictionary payload;
        std::size_t bytes; ///< its keys included
        bool isRecorded;   ///< it, or one before it of the same keys
    };
    using Table = std::unordered_map<std::string, Value, SeededTextHash, std::equal_to<>>;

    void takeApart(const Latest& latest);
    [[nodiscard]] const Value* find(std::string_view key) const;
    [[nodiscard]] static std::size_t bytesOf(std::string_view key, const Value& value) noexcept;

    const std::size_t mostKeys_;
    bool isFull_ = false;
    std::vector<Latest> latest_; ///< one for each key set, the latest at the end
    Table older_;                ///< older than those
    std::size_t bytes_ = 0;
    std::size_t bytesOfKeysLeft_ = 0;
};

} // namespace tamblo
