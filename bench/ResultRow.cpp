#include "ResultRow.h"

#include "Statistics.h"
#include "base/Json.h"
#include "base/TextBuffer.h"

#include <algorithm>
#include <cmath>
#include <stdexcept>

namespace tamblo::bench {

namespace {

/// Figures are good for four digits at most.
double rounded(double figure) {
    if (figure == 0.0 || !std::isfinite(figure)) {
        return figure;
    }
    const double scale = std::pow(10.0, 3.0 - std::floor(std::log10(std::fabs(figure))));
    return scale >= 1.0 ? std::round(figure * scale) / scale : std::round(figure);
}

void appendMember(TextBuffer& line, std::string_view key) {
    line.append(line.empty() ? "{" : ", ");
    appendJsonString(line, key);
    line.append(": ");
}

} // namespace

std::string figureText(double figure) {
    TextBuffer text;
    appendJsonNumber(text, rounded(figure));
    if (text.view().ends_with(".0")) {
        text.truncate(text.size() - 2);
    }
    return std::string(text.view());
}

std::optional<double> ResultRow::Field::figure() const noexcept {
    if (const auto* count = std::get_if<std::uint64_t>(&content)) {
        return static_cast<double>(*count);
    }
    const auto* number = std::get_if<double>(&content);
    return number != nullptr ? std::optional(*number) : std::nullopt;
}

void ResultRow::set(std::string_view key, double figure) {
    fields_.push_back({std::string(key), figure});
}

void ResultRow::set(std::string_view key, std::uint64_t figure) {
    fields_.push_back({std::string(key), figure});
}

void ResultRow::set(std::string_view key, std::string_view text) {
    fields_.push_back({std::string(key), std::string(text)});
}

std::optional<double> ResultRow::figure(std::string_view key) const noexcept {
    const auto found = std::find_if(fields_.begin(), fields_.end(), [&](const Field& field) {
        return field.name == key && field.content.index() != 2;
    });
    return found == fields_.end() ? std::nullopt : found->figure();
}

std::string_view ResultRow::textOf(std::string_view key) const noexcept {
    for (const Field& field : fields_) {
        if (const auto* text = std::get_if<std::string>(&field.content);
            text != nullptr && field.name == key) {
            return *text;
        }
    }
    return {};
}

void ResultRow::holdAgainst(std::string_view figure, std::string_view floor, std::string_view ratio) {
    set(ratio, this->figure(figure).value_or(0) / this->figure(floor).value_or(0));
    floors_.push_back({std::string(figure), std::string(floor), std::string(ratio)});
}

std::string ResultRow::Target::text() const {
    return figure.empty() ? statement : (isLeast ? ">= " : "<= ") + figureText(limit);
}

void ResultRow::compare(std::string_view key, bool isLeast, double limit) {
    if (!figure(key)) {
        throw std::logic_error("no figure " + std::string(key));
    }
    targets_.push_back({.figure = std::string(key), .statement = "", .limit = limit, .isLeast = isLeast});
    judge();
}

void ResultRow::atMost(std::string_view key, double limit) {
    compare(key, false, limit);
}

void ResultRow::atLeast(std::string_view key, double limit) {
    compare(key, true, limit);
}

void ResultRow::require(std::string_view statement, bool holds) {
    targets_.push_back({.figure = "", .statement = std::string(statement), .holds = holds});
}

void ResultRow::judge() {
    for (Target& target : targets_) {
        if (const auto value = figure(target.figure)) {
            target.holds = target.isLeast ? *value >= target.limit : *value <= target.limit;
        }
    }
}

bool ResultRow::met() const noexcept {
    return std::all_of(targets_.begin(), targets_.end(), [](const Target& target) { return target.holds; });
}

std::string ResultRow::text() const {
    TextBuffer line;
    for (const Field& field : fields_) {
        appendMember(line, field.name);
        if (const auto* text = std::get_if<std::string>(&field.content)) {
            appendJsonString(line, *text);
        } else if (const auto* count = std::get_if<std::uint64_t>(&field.content)) {
            line.append(std::to_string(*count));
        } else {
            appendJsonNumber(line, rounded(*field.figure()));
        }
    }
    if (!targets_.empty()) {
        std::string all;
        for (const Target& target : targets_) {
            all += all.empty() ? "" : ", ";
            all += target.figure + (target.figure.empty() ? "" : " ") + target.text();
        }
        appendMember(line, "target");
        appendJsonString(line, all);
        appendMember(line, "met");
        line.append(met() ? "true" : "false");
    }
    line.append('}');
    return std::string(line.view());
}

ResultRow ResultRow::medianOf(const std::vector<ResultRow>& runs) {
    ResultRow row = runs.front();
    for (Field& field : row.fields_) {
        std::vector<double> figures;
        for (const ResultRow& run : runs) {
            if (const auto figure = run.figure(field.name)) {
                figures.push_back(*figure);
            }
        }
        if (figures.size() != runs.size()) {
            continue;
        }
        if (auto* count = std::get_if<std::uint64_t>(&field.content)) {
            *count = static_cast<std::uint64_t>(median(figures));
        } else if (auto* number = std::get_if<double>(&field.content)) {
            *number = median(figures);
        }
    }
    row.judge();
    for (std::size_t i = 0; i < row.targets_.size(); ++i) {
        Target& target = row.targets_[i];
        for (const ResultRow& run : runs) {
            target.holds = target.holds && (!target.figure.empty() || run.targets_.at(i).holds);
        }
    }
    return row;
}

} // namespace tamblo::bench
