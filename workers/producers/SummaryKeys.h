#pragma once

#include "base/Dictionary.h"
#include "base/KeySet.h"
#include "session/MessageIntake.h"

#include <algorithm>
#include <array>
#include <cstddef>
#include <cstdint>
#include <string_view>
#include <utility>

namespace tamblo {

/// The keys of one kind of summary, which a session may derive tens of thousands of: sorted once, so that
/// each summary is made of its values alone. Immutable, so any thread.
template <std::size_t Count> class SummaryKeys {
public:
    using Entries = std::array<Dictionary::Entry, Count>;

    /// The keys of these entries, in any order, each once.
    explicit SummaryKeys(const Entries& entries);

    /// A payload of entries with the same keys in the same order; their values are moved from. It has room
    /// for what the session adds.
    [[nodiscard]] Dictionary payload(Entries& entries) const {
        Dictionary::Unfilled unfilled = Dictionary::fromKeySet(keys_, intake::kMostKeysAdded);
        for (std::size_t i = 0; i < Count; ++i) {
            unfilled.values[places_[i]] = std::move(entries[i].second);
        }
        return std::move(unfilled.dictionary);
    }

private:
    KeySetRef keys_;
    std::array<std::uint32_t, Count> places_{}; ///< of each entry among the sorted ones
};

template <std::size_t Count> SummaryKeys<Count>::SummaryKeys(const Entries& entries) {
    std::array<std::string_view, Count> sorted;
    std::transform(entries.begin(), entries.end(), sorted.begin(),
                   [](const Dictionary::Entry& entry) { return entry.first; });
    std::sort(sorted.begin(), sorted.end());
    keys_ = KeySet::make(sorted);
    for (std::size_t i = 0; i < Count; ++i) {
        places_[i] = static_cast<std::uint32_t>(keys_->find(entries[i].first));
    }
}

} // namespace tamblo
