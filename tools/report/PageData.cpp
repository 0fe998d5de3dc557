#include "tools/report/PageData.h"

#include "base/Hash.h"
#include "base/JsonObject.h"
#include "tools/report/Timeline.h"

#include <algorithm>
#include <bit>
#include <cmath>
#include <deque>
#include <string>
#include <string_view>
#include <unordered_map>

namespace tamblo::report {

namespace {

constexpr double kMillisecondsInSecond = 1000;
constexpr std::size_t kPieceBytes = std::size_t{64} << 10U;

/// Bits of a session's flags, which page.js knows, too.
enum Flag : unsigned {
    hasStart = 1,
    hasStop = 2,
    isClockSetBack = 4,
    isOfEvents = 8,
};

/// Writes values with the texts that repeat as their numbers in a table, which is written last.
class DataWriter {
public:
    DataWriter(PageWriter& page, const PageData& data) : page_(page), data_(data) {
        for (const Session* session : data.sessions) {
            base_ = std::min(base_, std::floor(session->began));
        }
        if (data.sessions.empty()) {
            base_ = std::floor(data.made);
        }
    }

    void write() {
        piece_.append("{\"version\":1,\"base\":");
        appendJsonNumber(piece_, base_);
        writeHead();
        piece_.append(",\"sessions\":[");
        bool isFirst = true;
        for (const Session* session : data_.sessions) {
            piece_.append(isFirst ? "\n" : ",\n");
            isFirst = false;
            writeSession(*session);
            flush();
        }
        piece_.append("],\"device\":[");
        isFirst = true;
        for (const DeviceEvent& event : data_.device) {
            piece_.append(isFirst ? "\n" : ",\n");
            isFirst = false;
            writeDeviceEvent(event);
        }
        flush();
        piece_.append("],\"texts\":");
        appendTexts(texts_);
        piece_.append("}");
        flush();
    }

private:
    void writeHead() {
        piece_.append(",\"made\":");
        appendJsonNumber(piece_, data_.made);
        piece_.append(",\"selection\":");
        appendJsonString(piece_, data_.selection);
        piece_.append(",\"captureFolder\":");
        appendJsonString(piece_, data_.captureFolder);
        piece_.append(",\"read\":");
        JsonObject(piece_)
            .number("files", data_.read.files)
            .number("bytes", data_.read.bytes)
            .number("lines", data_.read.lines);
        piece_.append(",\"leftOut\":");
        appendTexts(data_.leftOut);
        piece_.append(",\"keys\":");
        appendTexts(data_.keys);
        piece_.append(",\"columns\":{");
        for (const SummaryRow& row : kSummaryRows) {
            piece_.append(row.name == kSummaryRows[0].name ? "" : ",");
            appendJsonString(piece_, row.name);
            piece_.append(':');
            appendTexts(row.keys);
        }
        piece_.append('}');
    }

    /// [name, application, service, process, reporter, began, ended, flags, messages, stretches, marks,
    /// summaries, keys]
    void writeSession(const Session& session) {
        piece_.append('[');
        for (const Value* text : {&session.name, &session.application, &session.service, &session.process}) {
            appendText(*text);
            piece_.append(',');
        }
        if (session.reporter) {
            appendJson(piece_, Value(*session.reporter));
        } else {
            piece_.append("null");
        }
        piece_.append(',');
        appendTime(session.began);
        piece_.append(',');
        appendTime(session.ended);
        const unsigned flags = (session.hasStart ? Flag::hasStart : 0U) |
                               (session.hasStop ? Flag::hasStop : 0U) |
                               (session.isClockSetBack ? Flag::isClockSetBack : 0U) |
                               (session.name.stringValue().empty() ? Flag::isOfEvents : 0U);
        appendNumbers({flags, session.messages});
        const Timeline timeline = timelineOf(session);
        piece_.append(",[");
        for (const Stretch& stretch : timeline.stretches) {
            piece_.append(&stretch == timeline.stretches.data() ? "[" : ",[");
            appendTime(stretch.begin);
            piece_.append(',');
            appendTime(stretch.end);
            appendNumbers(
                {stretch.isOutput ? 1U : 0U, (stretch.isOpen ? 1U : 0U) | (stretch.isEstimated ? 2U : 0U)});
            piece_.append(']');
        }
        piece_.append("],[");
        for (const Mark& mark : timeline.marks) {
            piece_.append(&mark == timeline.marks.data() ? "[" : ",[");
            appendTime(mark.at);
            appendNumbers(
                {static_cast<std::uint64_t>(mark.kind) - static_cast<std::uint64_t>(FactKind::volume)});
            piece_.append(',');
            appendText(*mark.value);
            piece_.append(']');
        }
        piece_.append("],[");
        for (const Summary& summary : session.summaries) {
            piece_.append(&summary == session.summaries.data() ? "[" : ",[");
            appendJson(piece_, Value(static_cast<std::uint64_t>(summary.kind)));
            for (const auto& value : summary.values) {
                piece_.append(',');
                if (value) {
                    appendJson(piece_, *value);
                } else {
                    piece_.append("null");
                }
            }
            piece_.append(']');
        }
        piece_.append("],[");
        bool isFirst = true;
        for (std::size_t word = 0; word < session.keys.size(); ++word) {
            for (std::uint64_t bits = session.keys[word]; bits != 0; bits &= bits - 1) {
                piece_.append(isFirst ? "" : ",");
                isFirst = false;
                appendJson(piece_, Value(word * 64 + static_cast<std::size_t>(std::countr_zero(bits))));
            }
        }
        piece_.append("]]");
    }

    /// [time, kind, text, capture, whether its folder is there]
    void writeDeviceEvent(const DeviceEvent& event) {
        piece_.append('[');
        appendTime(event.time);
        appendNumbers({static_cast<std::uint64_t>(event.kind)});
        piece_.append(',');
        appendText(event.text);
        piece_.append(',');
        appendJsonString(piece_, event.capture.stringValue());
        const bool hasFolder = std::ranges::binary_search(data_.folders, event.capture.stringValue());
        appendNumbers({hasFolder ? 1U : 0U});
        piece_.append(']');
    }

    void appendTime(double seconds) {
        appendJson(piece_, Value(std::llround((seconds - base_) * kMillisecondsInSecond)));
    }
    void appendNumbers(std::initializer_list<std::uint64_t> numbers) {
        for (const std::uint64_t number : numbers) {
            piece_.append(',');
            appendJson(piece_, Value(number));
        }
    }
    /// A number stands as a text, too: the page shows it, and counts with none of these but volumes.
    void appendText(const Value& value) {
        if (value.isString()) {
            appendNumberOf(value.stringValue());
            return;
        }
        const std::string text = jsonText(value);
        const auto known = numbers_.find(text);
        appendNumberOf(known != numbers_.end() ? known->first : std::string_view(made_.emplace_back(text)));
    }
    /// The text has to stay where it is.
    void appendNumberOf(std::string_view text) {
        const auto [place, isNew] = numbers_.try_emplace(text, texts_.size());
        if (isNew) {
            texts_.push_back(text);
        }
        appendJson(piece_, Value(place->second));
    }
    template <typename Texts> void appendTexts(const Texts& texts) {
        piece_.append('[');
        for (std::size_t i = 0; i < texts.size(); ++i) {
            piece_.append(i == 0 ? "" : ",");
            appendJsonString(piece_, texts[i]);
            if (piece_.size() > kPieceBytes) {
                flush();
            }
        }
        piece_.append(']');
    }
    void flush() {
        page_.scriptData(piece_);
        piece_.clear();
    }

    PageWriter& page_;
    const PageData& data_;
    TextBuffer piece_;
    double base_ = INFINITY;
    // Texts lie in the sessions, and those that are made here in a list.
    std::unordered_map<std::string_view, std::size_t, SeededTextHash> numbers_;
    std::deque<std::string_view> texts_;
    std::deque<std::string> made_;
};

} // namespace

void writePageData(PageWriter& out, const PageData& data) {
    DataWriter(out, data).write();
}

} // namespace tamblo::report
