#include "tools/SessionPlayer.h"

#include "base/Format.h"
#include "base/Json.h"
#include "tools/SessionFile.h"
#include "tools/TimeText.h"
#include "tools/records/Payload.h"

#include <algorithm>
#include <cstdio>
#include <utility>

namespace tamblo::tools {

using namespace std::chrono_literals;
using std::chrono::milliseconds;

namespace {

/// Messages that wait for their replies before no more are sent.
constexpr std::uint64_t kMostUnderWay = 512;
constexpr milliseconds kProgressInterval{100};
constexpr double kLongestOffset = 1e8;

/// A name or a number as text, so that both are read alike.
std::string wordOf(const Value* value, std::string_view usual) {
    if (value == nullptr) {
        return std::string(usual);
    }
    return value->isString() ? std::string(value->stringValue()) : jsonText(*value);
}

bool takeLine(std::optional<std::string>& first, std::istream& lines, std::string& text) {
    if (first) {
        text = *std::exchange(first, std::nullopt);
        return true;
    }
    return static_cast<bool>(std::getline(lines, text));
}

bool isHeader(std::string_view text) {
    const auto header = parseSessionHeader(text);
    const auto* const found = std::get_if<std::optional<SessionHeader>>(&header);
    return found != nullptr && found->has_value();
}

} // namespace

std::variant<SessionLine, std::string> parseSessionLine(std::string_view text) {
    auto object = parseJsonObject(text, kForService);
    if (auto* wrong = std::get_if<std::string>(&object)) {
        return std::move(*wrong);
    }
    const auto& fields = std::get<Dictionary>(object);
    SessionLine line;
    const auto category = client::parseCategory(wordOf(fields.find("category"), ""));
    if (!category) {
        return std::string("\"category\" is missing, or neither a category's name nor a number");
    }
    line.category = *category;
    const auto type = client::parseType(wordOf(fields.find("type"), "Generic"));
    if (!type) {
        return std::string("\"type\" is neither a type's name nor a number");
    }
    line.type = *type;
    if (const Value* offset = fields.find("offset_s")) {
        if (!offset->isNumber() || offset->doubleValue() < 0) {
            return std::string("\"offset_s\" is not a number of seconds");
        }
        line.offset = offset->doubleValue();
    }
    if (const Value* payload = fields.find("payload")) {
        if (!payload->isDictionary()) {
            return std::string("\"payload\" is not an object");
        }
        line.payload = payload->dictionaryValue();
    }
    return line;
}

double SessionSpacing::due(const SessionLine& line) {
    const Value* const timestamp = line.payload.find(kTimestampKey);
    if (timestamp != nullptr && !timestampOfStart_) {
        timestampOfStart_ = timestamp->doubleValue() - line.offset.value_or(last_);
    }
    if (line.offset) {
        last_ = *line.offset;
    } else if (timestamp != nullptr) {
        last_ = std::max(last_, timestamp->doubleValue() - *timestampOfStart_);
    }
    return last_;
}

std::optional<std::string> SessionPlayer::play(std::istream& lines, const std::string& name) {
    start_ = Clock::now();
    startTimestamp_ = presentTime();
    SessionSpacing spacing;
    std::optional<std::string> wrong;
    std::string text;
    std::optional<std::string> first = options_.firstLine;
    for (std::size_t number = 1; !isLost() && takeLine(first, lines, text); ++number) {
        if (text.find_first_not_of(" \t\r") == std::string::npos || (number == 1 && isHeader(text))) {
            continue;
        }
        auto parsed = parseSessionLine(text);
        if (const auto* problem = std::get_if<std::string>(&parsed)) {
            wrong = formatted("{}:{}: {}", name, number, *problem);
            break;
        }
        auto& line = std::get<SessionLine>(parsed);
        const double due = spacing.due(line);
        if (options_.speed) {
            const std::chrono::duration<double> delay(std::min(due, kLongestOffset) / *options_.speed);
            waitUntil(start_ + std::chrono::duration_cast<Clock::duration>(delay));
        }
        send(line, due);
        showProgress(false);
    }
    waitForReplies();
    report_->seconds = std::chrono::duration<double>(Clock::now() - start_).count();
    showProgress(true);
    return wrong;
}

void SessionPlayer::waitUntil(Clock::time_point time) {
    while (!isLost()) {
        const auto left = std::chrono::ceil<milliseconds>(time - Clock::now());
        client_.run(std::clamp<milliseconds>(left, 0ms, kProgressInterval));
        if (left <= 0ms) {
            return;
        }
        showProgress(false);
    }
}

double SessionPlayer::timestampFor(double due) const {
    if (!options_.recordedLength) {
        return presentTime();
    }
    const double playingTime = options_.speed ? *options_.recordedLength / *options_.speed : 0;
    return startTimestamp_ + playingTime - (*options_.recordedLength - due);
}

void SessionPlayer::send(SessionLine& line, double due) {
    if (options_.restamp || !line.payload.contains(kTimestampKey)) {
        line.payload.set(kTimestampKey, timestampFor(due));
    }
    while (report_->sent - report_->answered >= kMostUnderWay && !isLost()) {
        client_.run(kProgressInterval);
    }
    const std::int64_t reporters[] = {options_.reporterID};
    const bool isQueued = client_.sendMessage(line.payload, line.category, line.type, reporters,
                                              [report = report_](client::Result<client::Nothing>&& result) {
                                                  ++report->answered;
                                                  if (result.error) {
                                                      report->noteRefusal(*std::move(result.error));
                                                  }
                                              });
    ++report_->sent;
    if (!isQueued) {
        ++report_->answered;
        report_->noteRefusal(client::makeError(client::ErrorCode::refused));
    }
    if (options_.speed) {
        client_.run(0ms);
    }
}

void SessionPlayer::waitForReplies() {
    const auto deadline = Clock::now() + options_.timeout;
    while (report_->answered < report_->sent && !isLost() && Clock::now() < deadline) {
        client_.run(kProgressInterval);
    }
}

void SessionPlayer::showProgress(bool isLast) {
    const auto now = Clock::now();
    if (!options_.showsProgress || (!isLast && now - lastShown_ < kProgressInterval)) {
        return;
    }
    lastShown_ = now;
    const double seconds = std::chrono::duration<double>(now - start_).count();
    std::fprintf(stderr, "\r%llu sent, %llu answered, %.1f s%s",
                 static_cast<unsigned long long>(report_->sent),
                 static_cast<unsigned long long>(report_->answered), seconds, isLast ? "\n" : "");
    std::fflush(stderr);
}

std::optional<double> recordedLength(std::istream& lines) {
    double length = 0;
    SessionSpacing spacing;
    for (std::string text; std::getline(lines, text);) {
        const auto parsed = parseSessionLine(text);
        if (const auto* line = std::get_if<SessionLine>(&parsed)) {
            length = std::max(length, spacing.due(*line));
        }
    }
    lines.clear();
    return lines.seekg(0) ? std::optional(length) : std::nullopt;
}

} // namespace tamblo::tools
