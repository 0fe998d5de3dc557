#pragma once

#include "base/Dictionary.h"
#include "base/KeySet.h"

#include <array>
#include <cstddef>
#include <cstdint>
#include <span>
#include <string_view>

namespace tamblo {

/// The places of a few fixed keys in one payload after another.
///
/// A session's messages are of a few kinds, and all of one kind share their key set: where the keys stand in
/// it is found once and remembered, so that reading a payload searches nothing. Made for one walk over a
/// session's messages.
class FieldPlaces {
public:
    static constexpr std::size_t kMostFields = 16;
    static constexpr std::uint32_t kAbsent = UINT32_MAX;
    using Places = std::array<std::uint32_t, kMostFields>;

    /// At most `kMostFields` keys, which must outlive the places.
    explicit FieldPlaces(std::span<const std::string_view> keys) noexcept : keys_(keys) {}

    /// The index of each key in the key set, `kAbsent` for those that it does not hold. Lives until the next
    /// call.
    [[nodiscard]] const Places& in(const KeySet& keySet) {
        Known& known = known_[slotOf(keySet)];
        if (known.keySet.get() != &keySet) [[unlikely]] {
            find(keySet, known);
        }
        return known.places;
    }

private:
    static constexpr std::size_t kSlots = 32;

    struct Known {
        KeySetRef keySet; ///< held, so that no other can come to stand at its address
        Places places;
    };

    static std::size_t slotOf(const KeySet& keySet) noexcept {
        return (reinterpret_cast<std::uintptr_t>(&keySet) >> 6U) % kSlots;
    }
    void find(const KeySet& keySet, Known& known) const;

    const std::span<const std::string_view> keys_;
    std::array<Known, kSlots> known_;
};

/// What one payload holds under the keys of a walk: one value for each `Field`, an enumeration from 0 that
/// ends with `count`, and null for an absent one. The values are the payload's own.
template <typename Field> class PayloadFields {
public:
    static constexpr std::size_t kCount = static_cast<std::size_t>(Field::count);
    static_assert(kCount <= FieldPlaces::kMostFields);
    using Keys = std::array<std::string_view, kCount>;

    PayloadFields() = default;
    PayloadFields(const Dictionary& payload, FieldPlaces& places) {
        const FieldPlaces::Places& found = places.in(payload.keys());
        const std::span<const Value> values = payload.values();
        for (std::size_t i = 0; i < kCount; ++i) {
            values_[i] = found[i] != FieldPlaces::kAbsent ? &values[found[i]] : nullptr;
        }
    }

    [[nodiscard]] const Value* operator[](Field field) const noexcept {
        return values_[static_cast<std::size_t>(field)];
    }
    [[nodiscard]] bool holds(Field field) const noexcept { return (*this)[field] != nullptr; }
    /// False when absent.
    [[nodiscard]] bool isTrue(Field field) const noexcept {
        return holds(field) && (*this)[field]->boolValue();
    }
    void set(Field field, const Value* value) noexcept { values_[static_cast<std::size_t>(field)] = value; }
    /// Takes over what the other holds.
    void merge(const PayloadFields& other) noexcept {
        for (std::size_t i = 0; i < kCount; ++i) {
            values_[i] = other.values_[i] != nullptr ? other.values_[i] : values_[i];
        }
    }

private:
    std::array<const Value*, kCount> values_{};
};

} // namespace tamblo
