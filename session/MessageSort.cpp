#include "session/MessageSort.h"

#include "util/MessageKeys.h"

#include <algorithm>
#include <array>
#include <cmath>
#include <iterator>
#include <string_view>
#include <utility>

namespace tamblo {

namespace {

constexpr std::array<std::string_view, 1> kKeys{ZRReportingInternalEventEpochTime};

constexpr auto isEarlier = [](const auto& a, const auto& b) { return a.time < b.time; };

} // namespace

MessageSort::MessageSort(std::vector<MessageRef>& messages) : messages_(messages), keyPlaces_(kKeys) {
    places_.reserve(messages.size());
}

bool MessageSort::sortSome() {
    if (places_.size() < messages_.size()) {
        readTimes();
        return places_.size() == messages_.size() && isSorted_;
    }
    if (isSorted_) {
        return true;
    }
    if (sorted_ < places_.size()) {
        sortRun();
    } else if (length_ < places_.size()) {
        mergeRuns();
    } else {
        reorder();
    }
    return hasChanged_;
}

void MessageSort::readTimes() {
    const std::size_t end = std::min(messages_.size(), places_.size() + kMessagesOfPart);
    for (std::size_t i = places_.size(); i < end; ++i) {
        const Dictionary& payload = messages_[i]->payload();
        const std::uint32_t place = keyPlaces_.in(payload.keys())[0];
        const double read = place != KeyPlaces::kAbsent ? payload.valueAt(place).doubleValue() : 0.0;
        const double time = std::isnan(read) ? 0.0 : read;
        isSorted_ = isSorted_ && (i == 0 || !(time < places_.back().time));
        places_.push_back({time, static_cast<std::uint32_t>(i)});
    }
}

void MessageSort::sortRun() {
    const std::size_t end = std::min(places_.size(), sorted_ + length_);
    const auto at = [this](std::size_t index) {
        return places_.begin() + static_cast<std::ptrdiff_t>(index);
    };
    std::stable_sort(at(sorted_), at(end), isEarlier);
    sorted_ = end;
}

void MessageSort::mergeRuns() {
    std::vector<Place> merged;
    merged.reserve(places_.size());
    const auto at = [this](std::size_t index) {
        return places_.begin() + static_cast<std::ptrdiff_t>(std::min(index, places_.size()));
    };
    for (std::size_t run = 0; run < places_.size(); run += 2 * length_) {
        std::merge(at(run), at(run + length_), at(run + length_), at(run + 2 * length_),
                   std::back_inserter(merged), isEarlier);
    }
    places_ = std::move(merged);
    length_ *= 2;
}

void MessageSort::reorder() {
    std::vector<MessageRef> ordered;
    ordered.reserve(messages_.capacity());
    for (const Place& place : places_) {
        ordered.push_back(std::move(messages_[place.index]));
    }
    messages_ = std::move(ordered);
    hasChanged_ = true;
}

} // namespace tamblo
