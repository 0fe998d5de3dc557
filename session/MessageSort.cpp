#include "session/MessageSort.h"

#include "util/MessageKeys.h"

#include <algorithm>
#include <array>
#include <cmath>
#include <string_view>
#include <utility>

namespace tamblo {

namespace {

constexpr std::array<std::string_view, 1> kKeys{ZRReportingInternalEventEpochTime};

constexpr auto isEarlier = [](const auto& a, const auto& b) { return a.time < b.time; };

} // namespace

MessageSort::MessageSort(std::vector<MessageRef>& messages) : messages_(messages), keyPlaces_(kKeys) {
    places_.reserve(messages.size());
    keySets_.reserve(messages.size());
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
        mergeSome();
    } else {
        reorderSome();
    }
    return hasChanged_;
}

void MessageSort::readTimes() {
    const std::size_t end = std::min(messages_.size(), places_.size() + kMessagesRead);
    for (std::size_t i = places_.size(); i < end; ++i) {
        __builtin_prefetch(messages_[std::min(i + kLookAhead, end - 1)].get());
        const Dictionary& payload = messages_[i]->payload();
        const std::uint32_t place = keyPlaces_.in(payload.keys())[0];
        const double read = place != KeyPlaces::kAbsent ? payload.valueAt(place).doubleValue() : 0.0;
        const double time = std::isnan(read) ? 0.0 : read;
        isSorted_ = isSorted_ && (i == 0 || !(time < places_.back().time));
        places_.push_back({time, static_cast<std::uint32_t>(i)});
        keySets_.push_back(&payload.keys());
    }
}

void MessageSort::sortRun() {
    const auto begin = places_.begin() + static_cast<std::ptrdiff_t>(sorted_);
    sorted_ = std::min(places_.size(), sorted_ + length_);
    const auto end = places_.begin() + static_cast<std::ptrdiff_t>(sorted_);
    // As a rule few messages are out of their order, and the runs without one stay as they are.
    if (!std::is_sorted(begin, end, isEarlier)) {
        std::stable_sort(begin, end, isEarlier);
    }
}

void MessageSort::mergeSome() {
    const std::size_t count = places_.size();
    merged_.reserve(count);
    const std::size_t end = std::min(count, merged_.size() + kPlacesOfPart);
    while (merged_.size() < end) {
        const std::size_t pair = merged_.size() - merged_.size() % (2 * length_);
        const std::size_t middle = std::min(count, pair + length_);
        const std::size_t last = std::min(count, middle + length_);
        if (merged_.size() == pair) {
            left_ = pair;
            right_ = middle;
        }
        for (const std::size_t until = std::min(end, last); merged_.size() < until;) {
            const bool isRightNext =
                left_ == middle || (right_ != last && isEarlier(places_[right_], places_[left_]));
            merged_.push_back(places_[isRightNext ? right_++ : left_++]);
        }
    }
    if (merged_.size() == count) {
        places_.swap(merged_);
        merged_.clear();
        length_ *= 2;
    }
}

void MessageSort::reorderSome() {
    ordered_.reserve(messages_.capacity());
    orderedKeySets_.reserve(messages_.size());
    for (const std::size_t end = std::min(places_.size(), ordered_.size() + kPlacesOfPart);
         ordered_.size() < end;) {
        const std::uint32_t place = places_[ordered_.size()].index;
        ordered_.push_back(std::move(messages_[place]));
        orderedKeySets_.push_back(keySets_[place]);
    }
    if (ordered_.size() == places_.size()) {
        messages_ = std::move(ordered_);
        keySets_ = std::move(orderedKeySets_);
        hasChanged_ = true;
    }
}

} // namespace tamblo
