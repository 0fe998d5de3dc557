#include "ResultRow.h"

#include "base/Json.h"

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

} // namespace

void ResultRow::key(std::string_view key) {
    if (!fields_.empty()) {
        fields_.append(", ");
    }
    appendJsonString(fields_, key);
    fields_.append(": ");
}

void ResultRow::set(std::string_view name, double figure) {
    key(name);
    appendJsonNumber(fields_, rounded(figure));
    figures_.emplace_back(name, figure);
}

void ResultRow::set(std::string_view name, std::uint64_t figure) {
    key(name);
    fields_.append(std::to_string(figure));
    figures_.emplace_back(name, static_cast<double>(figure));
}

void ResultRow::set(std::string_view name, std::string_view text) {
    key(name);
    appendJsonString(fields_, text);
}

double ResultRow::figure(std::string_view name) const {
    for (const auto& [known, value] : figures_) {
        if (known == name) {
            return value;
        }
    }
    throw std::logic_error("no figure " + std::string(name));
}

void ResultRow::compare(std::string_view name, std::string_view relation, double limit, bool holds) {
    TextBuffer statement;
    statement.append(name);
    statement.append(relation);
    appendJsonNumber(statement, limit);
    require(statement.view(), holds);
}

void ResultRow::atMost(std::string_view name, double limit) {
    compare(name, " <= ", limit, figure(name) <= limit);
}

void ResultRow::atLeast(std::string_view name, double limit) {
    compare(name, " >= ", limit, figure(name) >= limit);
}

void ResultRow::require(std::string_view statement, bool holds) {
    if (!targets_.empty()) {
        targets_ += ", ";
    }
    targets_ += statement;
    met_ = met_ && holds;
}

std::string ResultRow::text() const {
    TextBuffer line;
    line.append('{');
    line.append(fields_.view());
    if (!targets_.empty()) {
        line.append(", \"target\": ");
        appendJsonString(line, targets_);
        line.append(met_ ? ", \"met\": true" : ", \"met\": false");
    }
    line.append('}');
    return std::string(line.view());
}

} // namespace tamblo::bench
