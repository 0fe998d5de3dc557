#pragma once

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <string>
#include <vector>

namespace tamblo::tools {

/// Bytes of a file, from `begin` up to, but not with, `end`.
struct Range {
    std::uint64_t begin = 0;
    std::uint64_t end = 0;
};

/// How far one file of a sink has been exported.
struct FileProgress {
    /// What tells the file from others of its sink, whatever it is called; 16 hexadecimal digits.
    std::string identity;
    std::uint64_t counted = 0; ///< bytes whose lines are counted
    std::string tail;          ///< a hash of the last of these bytes, by which they are known again
    std::int64_t written = 0;  ///< when the file was last written to, in seconds since 1970
    std::uint64_t lines = 0;   ///< in the bytes that are counted
    std::uint64_t takenLines = 0;
    std::vector<Range> taken; ///< whole lines; in order, with something between each two

    /// With so many ranges, gaps between them are filled before another is begun: a reader that is always
    /// behind does not make the cursor grow without end.
    static constexpr std::size_t kMostRanges = 64;

    void take(Range range, std::uint64_t linesOfRange);
    /// The last, or the first, that is not taken of the bytes that are counted; empty when there is none.
    [[nodiscard]] Range lastLeft() const;
    [[nodiscard]] Range firstLeft() const;
    [[nodiscard]] std::uint64_t leftLines() const { return lines - std::min(lines, takenLines); }
};

/// How far a sink has been exported, by file; the oldest first.
using SinkProgress = std::vector<FileProgress>;

inline void FileProgress::take(Range range, std::uint64_t linesOfRange) {
    takenLines += linesOfRange;
    const auto next = std::ranges::upper_bound(taken, range.begin, {}, &Range::begin);
    const bool joinsBefore = next != taken.begin() && (next - 1)->end == range.begin;
    const bool joinsNext = next != taken.end() && next->begin == range.end;
    if (joinsBefore && joinsNext) {
        (next - 1)->end = next->end;
        taken.erase(next);
    } else if (joinsBefore) {
        (next - 1)->end = range.end;
    } else if (joinsNext) {
        next->begin = range.begin;
    } else {
        taken.insert(next, range);
    }
}

inline Range FileProgress::lastLeft() const {
    if (taken.empty()) {
        return {0, counted};
    }
    if (taken.back().end < counted && taken.size() < kMostRanges) {
        return {taken.back().end, counted};
    }
    const Range left{taken.size() == 1 ? 0 : taken[taken.size() - 2].end, taken.back().begin};
    return left.begin < left.end ? left : Range{taken.back().end, counted};
}

inline Range FileProgress::firstLeft() const {
    if (taken.empty()) {
        return {0, counted};
    }
    if (taken.front().begin != 0) {
        return {0, taken.front().begin};
    }
    return {taken.front().end, taken.size() == 1 ? counted : taken[1].begin};
}

} // namespace tamblo::tools
