#pragma once

#include "base/Dictionary.h"
#include "base/KeyPlaces.h"

#include <array>
#include <cstddef>
#include <cstdint>
#include <span>
#include <string_view>

namespace tamblo {

/// What one payload holds under the keys of a walk: one value for each `Field`, an enumeration from 0 that
/// ends with `count`, and null for an absent one. The values are the payload's own, so it is used where the
/// payload is: on the reporting server queue.
template <typename Field> class PayloadFields {
public:
    static constexpr std::size_t kCount = static_cast<std::size_t>(Field::count);
    static_assert(kCount <= KeyPlaces::kMostKeys);
    using Keys = std::array<std::string_view, kCount>;

    PayloadFields() = default;
    PayloadFields(const Dictionary& payload, KeyPlaces& places) {
        const KeyPlaces::Places& found = places.in(payload.keys());
        const std::span<const Value> values = payload.values();
        for (std::size_t i = 0; i < kCount; ++i) {
            values_[i] = found[i] != KeyPlaces::kAbsent ? &values[found[i]] : nullptr;
        }
    }

    /// Whether any field but the first is among these keys. The first is the timestamp, which tells nothing
    /// of what a message is about.
    [[nodiscard]] static bool anyIn(const KeySet& keys, KeyPlaces& places) {
        const KeyPlaces::Places& found = places.in(keys);
        std::uint32_t all = KeyPlaces::kAbsent;
        for (std::size_t i = 1; i < kCount; ++i) {
            all &= found[i]; // which has all bits only if each of them has
        }
        return all != KeyPlaces::kAbsent;
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
