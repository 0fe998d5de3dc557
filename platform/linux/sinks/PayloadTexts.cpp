#include "platform/linux/sinks/PayloadTexts.h"

#include <cstring>
#include <utility>

namespace tamblo {

namespace {

/// A longer text, which only the summary of a session has, is not kept.
constexpr std::size_t kLongestKept = 2U << 20U;
/// A longer one is kept for its batch only.
constexpr std::size_t kLongestForNext = 64U << 10U;

/// A text without the member of that key: each but the last goes with the comma behind it, the last with the
/// one before it. What is left of the text, before and behind.
std::pair<std::string_view, std::string_view> without(const JsonObjectText& object, std::string_view key) {
    const std::size_t index = key.empty() ? KeySet::kNotFound : object.dictionary.keys().find(key);
    if (index == KeySet::kNotFound) {
        return {object.text, {}};
    }
    const bool isLast = index + 1 == object.members.size();
    const std::size_t begin = object.members[index] - (isLast && index != 0 ? 1 : 0);
    const std::size_t end = isLast ? object.text.size() - 1 : object.members[index + 1];
    return {object.text.substr(0, begin), object.text.substr(end)};
}

} // namespace

void PayloadTexts::endBatch() noexcept {
    batch_.fetch_add(1, std::memory_order_relaxed);
    const Turn turn(isTaken_);
    if (turn.isMine() && text_.capacity() > 2 * kLongestForNext) {
        isKept_ = false;
        last_ = {};
        text_.reset();
    }
}

void PayloadTexts::appendTime(TextBuffer& line, WallTime now) {
    line.append("{\"time\":");
    appendJsonNumber(line, secondsSince1970(now));
}

void PayloadTexts::appendLast(TextBuffer& line, std::string_view leftOut) const {
    const auto [before, behind] = without(last_, leftOut);
    line.append(before);
    line.append(behind);
}

void PayloadTexts::appendNext(TextBuffer& line, const Dictionary& payload, std::string_view leftOut) {
    const bool isLikeLast =
        isKept_ && &payload.keys() == &last_.dictionary.keys() && last_.text.size() <= kLongestForNext;
    isKept_ = false;
    if (isLikeLast) {
        nextText_.clear();
        appendJsonObject(nextText_, payload, nextMembers_, last_);
        std::swap(text_, nextText_);
        std::swap(last_.members, nextMembers_);
        last_.text = text_.view();
        last_.dictionary = payload;
        appendLast(line, leftOut);
        nextText_.clearAndKeep(kLongestForNext);
    } else {
        appendWhole(line, payload, leftOut, last_, &text_);
    }
    isKept_ = last_.text.size() <= kLongestKept;
    if (isKept_) {
        last_.text = text_.view();
    } else {
        last_ = {};
        text_.reset();
    }
}

/// The text may be too long to be in memory twice.
void PayloadTexts::appendWhole(TextBuffer& line, const Dictionary& payload, std::string_view leftOut,
                               JsonObjectText& whole, TextBuffer* kept) {
    const std::size_t begin = line.size();
    appendJsonObject(line, payload, whole.members);
    whole.dictionary = payload;
    whole.text = line.view().substr(begin);
    if (kept != nullptr && whole.text.size() <= kLongestKept) {
        kept->clear();
        kept->append(whole.text);
    }
    const auto [before, behind] = without(whole, leftOut);
    if (!behind.empty()) {
        std::memmove(line.data() + begin + before.size(), behind.data(), behind.size());
        line.truncate(begin + before.size() + behind.size());
    }
}

} // namespace tamblo
