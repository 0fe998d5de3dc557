#include "base/KeyPlaces.h"

namespace tamblo {

void KeyPlaces::find(const KeySet& keySet, Known& known) const {
    known.keySet = KeySetRef(&keySet);
    for (std::size_t i = 0; i < keys_.size(); ++i) {
        const std::size_t place = keySet.find(keys_[i]);
        known.places[i] = place != KeySet::kNotFound ? static_cast<std::uint32_t>(place) : kAbsent;
    }
}

} // namespace tamblo
