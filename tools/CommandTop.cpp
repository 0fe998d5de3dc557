#include "base/Format.h"
#include "base/NumberText.h"
#include "tools/Command.h"
#include "tools/StatusConnection.h"
#include "tools/StatusScreen.h"
#include "tools/Table.h"
#include "tools/Terminal.h"

#include <algorithm>
#include <array>
#include <chrono>
#include <cstdio>
#include <map>
#include <string>
#include <tuple>
#include <utility>
#include <vector>

namespace tamblo::tools {

namespace {

using Align = Table::Align;

constexpr Option kOptions[] = {
    {"--sessions", "", "show sessions, not clients; the key s changes between them"},
    {"--sort", "messages|bytes|time|retained",
     "by processor time, say, or retained memory; the keys m, b, t, r change it"},
    {"--interval", "SECONDS", "between two pictures (2)"},
    {"--count", "N", "end after so many pictures"},
    kStatusSocketOption,
};

enum class SortKey : std::uint8_t { messages, bytes, time, retained };
struct SortRow {
    SortKey key;
    char letter;
    std::string_view name;
    std::string_view member; ///< of the documents
};
constexpr std::array kSortRows = std::to_array<SortRow>({
    {SortKey::messages, 'm', "messages", "messages"},
    {SortKey::bytes, 'b', "bytes", "bytes"},
    {SortKey::time, 't', "time", "seconds"},
    {SortKey::retained, 'r', "retained", "retained_bytes"},
});

struct View {
    bool showsSessions = false;
    SortRow sort = kSortRows[0];
    std::chrono::milliseconds interval{2000};
    std::uint64_t pictures = 0; ///< until the end; 0: no end
};

/// What the rows were in the picture before, for what has changed since.
class Before {
public:
    using Time = std::chrono::steady_clock::time_point;
    /// A client, or a client's session.
    using Key = std::pair<std::uint64_t, std::int64_t>;

    void beginPicture(Time now) {
        seconds_ = std::chrono::duration<double>(now - taken_).count();
        taken_ = now;
        before_ = std::exchange(now_, {});
    }
    /// By how much a number grows in a second; nothing for a row that is new, or has begun anew.
    [[nodiscard]] std::string rate(const Key& key, std::string_view what, double value, int digits) {
        now_[{key, what}] = value;
        const auto found = before_.find({key, what});
        return found == before_.end() || value < found->second
                   ? ""
                   : formatted("{}", fixed((value - found->second) / seconds_, digits));
    }

private:
    using Values = std::map<std::pair<Key, std::string_view>, double>;
    Values before_;
    Values now_;
    Time taken_{};
    double seconds_ = 1;
};

double numberOf(const Value& row, std::string_view name) {
    return StatusDocument::member(row, name).doubleValue();
}

Before::Key keyOf(const Value& row) {
    return {StatusDocument::member(row, "client").unsignedValue(),
            StatusDocument::member(row, "reporter").integerValue()};
}

std::vector<Value> sortedRows(const StatusDocument& document, const View& view) {
    const auto rows = document[view.showsSessions ? "sessions" : "clients"].arrayValue();
    std::vector<Value> sorted(rows.begin(), rows.end());
    // Those that have the same stay where they are.
    std::ranges::sort(sorted, [&view](const Value& a, const Value& b) {
        const double first = numberOf(a, view.sort.member);
        const double second = numberOf(b, view.sort.member);
        return first != second ? first > second : keyOf(a) < keyOf(b);
    });
    return sorted;
}

Table clientsTable(const std::vector<Value>& rows, Before& before) {
    Table table({{"PID", Align::right},
                 {"UID", Align::right},
                 {"PROCESS", Align::left, 16},
                 {"SESS", Align::right},
                 {"MSG/S", Align::right},
                 {"MESSAGES", Align::right},
                 {"BYTES", Align::right},
                 {"CPU%", Align::right},
                 {"TIME", Align::right},
                 {"RETAINED", Align::right}});
    for (const Value& row : rows) {
        const auto key = keyOf(row);
        const double seconds = numberOf(row, "seconds");
        table.add({textOf(row, "pid"), textOf(row, "uid"), textOf(row, "process"), textOf(row, "sessions"),
                   before.rate(key, "messages", numberOf(row, "messages"), 0), textOf(row, "messages"),
                   bytesText(numberOf(row, "bytes")), before.rate(key, "seconds", seconds * 100, 1),
                   formatted("{}", fixed(seconds, 2)), bytesText(numberOf(row, "retained_bytes"))});
    }
    return table;
}

Table sessionsTable(const std::vector<Value>& rows, Before& before) {
    Table table({{"REPORTER", Align::right},
                 {"PID", Align::right},
                 {"PROCESS", Align::left, 10},
                 {"APPLICATION", Align::left, 11},
                 {"MSG/S", Align::right},
                 {"MESSAGES", Align::right},
                 {"BYTES", Align::right},
                 {"CPU%", Align::right},
                 {"TIME", Align::right},
                 {"RETAINED", Align::right}});
    for (const Value& row : rows) {
        const auto key = keyOf(row);
        const double seconds = numberOf(row, "seconds");
        table.add({textOf(row, "reporter"), textOf(row, "pid"), textOf(row, "process"),
                   textOf(row, "application"), before.rate(key, "messages", numberOf(row, "messages"), 0),
                   textOf(row, "messages"), bytesText(numberOf(row, "bytes")),
                   before.rate(key, "seconds", seconds * 100, 1), formatted("{}", fixed(seconds, 2)),
                   bytesText(numberOf(row, "retained_bytes"))});
    }
    return table;
}

std::string headOf(const View& view, std::size_t rows) {
    return formatted("{} {} by {}  (m b t r: sort, s: {}, q: quit)", rows,
                     view.showsSessions ? "sessions" : "clients", view.sort.name,
                     view.showsSessions ? "clients" : "sessions");
}

/// The lines of a picture; of the rows, as many as the terminal has room for.
std::vector<std::string> pictureOf(const StatusDocument& document, const View& view, Before& before,
                                   Terminal::Size size) {
    std::vector<Value> rows = sortedRows(document, view);
    std::vector<std::string> lines{headOf(view, rows.size())};
    before.beginPicture(std::chrono::steady_clock::now());
    if (size.lines > 2 && rows.size() > size.lines - 2) {
        rows.resize(size.lines - 2);
    }
    const Table table = view.showsSessions ? sessionsTable(rows, before) : clientsTable(rows, before);
    for (std::string& line : table.lines(size.columns)) {
        lines.push_back(std::move(line));
    }
    return lines;
}

/// Whether the key was one to go on with.
bool follow(char key, View& view) {
    const auto* const sort = std::ranges::find(kSortRows, key, &SortRow::letter);
    if (sort != kSortRows.end()) {
        view.sort = *sort;
    } else if (key == 's') {
        view.showsSessions = !view.showsSessions;
    }
    return key != 'q' && key != 'Q';
}

std::variant<View, std::string> viewFrom(const Arguments& arguments) {
    View view{.showsSessions = arguments.has("--sessions")};
    if (!arguments.rest().empty()) {
        return formatted("top takes no \"{}\"", arguments.rest()[0]);
    }
    if (const auto name = arguments.last("--sort")) {
        const auto* const found = std::ranges::find(kSortRows, *name, &SortRow::name);
        if (found == kSortRows.end()) {
            return std::string("--sort needs messages, bytes, time or retained");
        }
        view.sort = *found;
    }
    if (const auto text = arguments.last("--interval")) {
        const auto seconds = parseNumber<double>(*text);
        if (!seconds || !(*seconds >= 0.1 && *seconds <= 3600)) {
            return std::string("--interval needs a number of seconds from 0.1 to 3600");
        }
        view.interval = std::chrono::milliseconds(static_cast<std::int64_t>(*seconds * 1000));
    }
    if (const auto text = arguments.last("--count")) {
        const auto pictures = parseNumber<std::uint64_t>(*text);
        if (!pictures || *pictures == 0) {
            return std::string("--count needs a number above 0");
        }
        view.pictures = *pictures;
    }
    return view;
}

ExitStatus run(const Arguments& arguments) {
    auto made = viewFrom(arguments);
    if (const auto* const wrong = std::get_if<std::string>(&made)) {
        return complain(ExitStatus::usage, *wrong);
    }
    View view = std::get<View>(made);
    const StatusConnection connection(arguments);
    const auto ask = [&] { return connection.ask(view.showsSessions ? "sessions" : "clients"); };
    auto answer = ask();
    if (const auto* const failure = std::get_if<Unreachable>(&answer)) {
        return complain(failure->status, failure->text);
    }
    Terminal terminal;
    Before before;
    for (std::uint64_t pictures = 1;; ++pictures) {
        // A service that is started again is shown again.
        const auto* const failure = std::get_if<Unreachable>(&answer);
        terminal.show(failure != nullptr
                          ? std::vector<std::string>{failure->text}
                          : pictureOf(std::get<StatusDocument>(answer), view, before, terminal.size()));
        if (pictures == view.pictures) {
            return ExitStatus::done;
        }
        const auto key = terminal.waitForKey(view.interval);
        if (terminal.isEnded() || (key && !follow(*key, view))) {
            return ExitStatus::done;
        }
        answer = ask();
    }
}

} // namespace

constexpr Command kCommandTop{
    "top",
    "clients or sessions, those with most first, again and again",
    "[--sessions] [--sort messages|bytes|time|retained] [--interval SECONDS] [--count N]",
    "TIME is the processor time of a client's requests, or of those for a session, in seconds, CPU% what it "
    "was of the last\n"
    "interval; MSG/S is for the last interval, too. Ends with q or Ctrl-C. Where standard output is no "
    "terminal, the\n"
    "pictures follow one another.",
    kOptions,
    run,
};

} // namespace tamblo::tools
