#include "tools/Table.h"

#include "base/Format.h"
#include "base/Utf8.h"

#include <algorithm>
#include <array>
#include <cmath>
#include <utility>

namespace tamblo::tools {

namespace {

constexpr std::size_t kGap = 2;

std::size_t charactersOf(std::string_view text) noexcept {
    return text.size() - static_cast<std::size_t>(std::ranges::count_if(text, isUtf8Continuation));
}

std::string_view cutCharacters(std::string_view text, std::size_t most) noexcept {
    std::size_t at = 0;
    for (std::size_t left = most; at < text.size(); ++at) {
        if (!isUtf8Continuation(text[at]) && left-- == 0) {
            break;
        }
    }
    return text.substr(0, at);
}

} // namespace

void Table::add(std::vector<std::string> cells) {
    for (std::size_t i = 0; i != cells.size(); ++i) {
        cells[i] = harmless(cells[i], columns_[i].most);
    }
    rows_.push_back(std::move(cells));
}

std::vector<std::string> Table::lines(std::size_t width) const {
    std::vector<std::size_t> widths;
    for (std::size_t i = 0; i != columns_.size(); ++i) {
        std::size_t widest = columns_[i].name.size();
        for (const auto& row : rows_) {
            widest = std::max(widest, charactersOf(row[i]));
        }
        widths.push_back(widest);
    }
    const auto lineOf = [&](auto cellOf) {
        std::string line;
        for (std::size_t i = 0; i != columns_.size(); ++i) {
            const std::string_view cell = cellOf(i);
            const std::string padding(widths[i] - charactersOf(cell), ' ');
            const bool isRight = columns_[i].align == Align::right;
            line.append(i == 0 ? 0 : kGap, ' ').append(isRight ? padding : "").append(cell);
            line.append(isRight || i + 1 == columns_.size() ? "" : padding);
        }
        return width != 0 ? std::string(cutCharacters(line, width)) : line;
    };
    std::vector<std::string> all{lineOf([this](std::size_t i) { return columns_[i].name; })};
    for (const auto& row : rows_) {
        all.push_back(lineOf([&row](std::size_t i) { return std::string_view(row[i]); }));
    }
    return all;
}

std::string harmless(std::string_view text, std::size_t most) {
    std::string out;
    for (std::size_t at = 0; at < text.size();) {
        const std::size_t length = controlLength(text, at);
        if (length == 0) {
            out += text[at++];
            continue;
        }
        out += "\\x";
        appendText(out, hexadecimal(static_cast<unsigned char>(text[at + length - 1]), 2));
        at += length;
    }
    return charactersOf(out) <= most ? out : std::string(cutCharacters(out, most - 1)) + "…";
}

std::string bytesText(double bytes) {
    constexpr std::array<std::string_view, 5> kUnits{"B", "KiB", "MiB", "GiB", "TiB"};
    std::size_t unit = 0;
    while (bytes >= 1024 && unit + 1 < kUnits.size()) {
        bytes /= 1024;
        ++unit;
    }
    return formatted("{} {}", fixed(bytes, unit == 0 ? 0 : 1), kUnits[unit]);
}

std::string durationText(double seconds) {
    constexpr double kLongestTold = 1e12;
    if (seconds < 0) {
        return "-" + durationText(-seconds);
    }
    const auto whole = static_cast<std::int64_t>(std::min(std::floor(seconds), kLongestTold));
    if (whole < 60) {
        return formatted("{} s", whole);
    }
    if (whole < 3600) {
        return formatted("{} min {} s", whole / 60, whole % 60);
    }
    if (whole < 86'400) {
        return formatted("{} h {} min", whole / 3600, whole / 60 % 60);
    }
    return formatted("{} d {} h", whole / 86'400, whole / 3600 % 24);
}

} // namespace tamblo::tools
