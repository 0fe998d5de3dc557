#include "platform/linux/status/StatusRequest.h"

#include "base/Format.h"
#include "base/NumberText.h"
#include "base/SplitText.h"

#include <algorithm>
#include <array>
#include <utility>

namespace tamblo {

namespace {

constexpr std::array kRequests = std::to_array<std::pair<std::string_view, StatusRequest::Kind>>({
    {"", StatusRequest::Kind::status},
    {"status", StatusRequest::Kind::status},
    {"clients", StatusRequest::Kind::clients},
    {"sessions", StatusRequest::Kind::sessions},
    {"metrics", StatusRequest::Kind::metrics},
    {"metrics plain", StatusRequest::Kind::plainMetrics},
});
constexpr std::string_view kSession = "session ";
constexpr std::string_view kHttpMethod = "GET ";
constexpr std::string_view kOpenMetricsType = "application/openmetrics-text";

std::string_view firstLine(std::string_view text) noexcept {
    return text.substr(0, text.find('\n'));
}

std::string_view typeOf(const StatusRequest* request) noexcept {
    if (request == nullptr || !request->isMetrics()) {
        return "application/json";
    }
    return request->kind == StatusRequest::Kind::metrics
               ? "application/openmetrics-text; version=1.0.0; charset=utf-8"
               : "text/plain; version=0.0.4; charset=utf-8";
}

} // namespace

std::variant<StatusRequest, std::string> StatusRequest::parse(std::string_view line) {
    const std::string_view words = trimmed(line);
    const auto* const found = std::ranges::find(kRequests, words, [](const auto& row) { return row.first; });
    if (found != kRequests.end()) {
        return StatusRequest{.kind = found->second};
    }
    if (words.starts_with(kSession)) {
        const auto reporterID = parseNumber<ReporterID>(trimmed(words.substr(kSession.size())));
        if (reporterID) {
            return StatusRequest{.kind = Kind::session, .reporterID = *reporterID};
        }
        return "session: wanted a reporter ID";
    }
    return "unknown request: there are status, clients, sessions, session ID, metrics, metrics plain, "
           "tap FILTER";
}

bool StatusQuestion::isWhole(std::string_view received) noexcept {
    if (!received.starts_with(kHttpMethod)) {
        return received.find('\n') != received.npos;
    }
    return received.find("\r\n\r\n") != received.npos || received.find("\n\n") != received.npos;
}

StatusQuestion StatusQuestion::of(std::string_view received) {
    StatusQuestion question{.line = std::string(trimmed(firstLine(received)))};
    if (!received.starts_with(kHttpMethod)) {
        return question;
    }
    question.isHttp = true;
    question.takesOpenMetrics = received.find(kOpenMetricsType) != received.npos;
    std::string path(trimmed(firstLine(received).substr(kHttpMethod.size())));
    path.resize(std::min(path.find_first_of(" ?"), path.size()));
    std::ranges::replace(path, '/', ' ');
    question.line = trimmed(path);
    if (question.line == "metrics" && !question.takesOpenMetrics) {
        question.line = "metrics plain";
    }
    return question;
}

std::string StatusQuestion::headOf(std::size_t bytes, const StatusRequest* request) const {
    if (!isHttp) {
        return {};
    }
    return formatted("HTTP/1.1 {}\r\nContent-Type: {}\r\nContent-Length: {}\r\nConnection: close\r\n\r\n",
                     request != nullptr ? "200 OK" : "404 Not Found", typeOf(request), bytes);
}

} // namespace tamblo
