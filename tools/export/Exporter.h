#pragma once

#include "os/FileDescriptor.h"
#include "tools/export/Cursor.h"
#include "tools/export/ExportOutput.h"
#include "tools/export/RecordFormat.h"
#include "tools/export/Redaction.h"
#include "tools/export/SinkBacklog.h"
#include "tools/export/WrittenLines.h"
#include "tools/records/RecordFilter.h"

#include <cstdint>
#include <memory>
#include <optional>
#include <set>
#include <string>
#include <vector>

namespace tamblo::tools {

/// What an export is asked for.
struct ExportPlan {
    struct Sink {
        std::string name;
        std::string path;
        bool isOfService = false; ///< and not a copy of its files elsewhere
    };

    std::vector<Sink> sinks; ///< no two of one name
    std::string runtimeDirectory;
    ExportedDevice device;
    std::string secret; ///< with which identifiers are made
    std::unique_ptr<RecordFormat> format;
    RecordFilter filter;
    Redaction redaction;
    Order order = Order::oldestFirst;
    bool follows = false;
    std::uint64_t batch = 0;       ///< records that the reader acknowledges together; 0: it acknowledges none
    std::uint64_t bytesPerDay = 0; ///< 0: as many as there are
};

/// Writes what the sinks have and the cursor has not, and moves the cursor behind what was taken.
class Exporter {
public:
    struct Counts {
        std::uint64_t records = 0;
        std::uint64_t unreadable = 0; ///< lines that are no records
        std::uint64_t tooLarge = 0;   ///< lines that would take too much memory
        std::uint64_t missed = 0;     ///< lines in no file any more that were counted and not exported
        std::uint64_t left = 0;       ///< lines for which the day had no bytes left
    };

    Exporter(ExportPlan plan, Cursor cursor, ExportOutput& output);

    /// Until all is exported, or, where new lines are followed, until the end. What went wrong, or nothing.
    [[nodiscard]] std::optional<std::string> run();
    [[nodiscard]] const Counts& counts() const noexcept { return counts_; }

private:
    struct Sink {
        std::string name;
        SinkBacklog backlog;
        bool isOfService;
    };

    /// Which files all sinks have now; says what is missing, and what cannot be read.
    void look();
    [[nodiscard]] MissedLines lookAt(Sink& sink);
    void sayOnce(const std::string& text);
    void sayMissed(const Sink& sink, const MissedLines& missed);
    /// Exports what there is at a look. False when nothing more is to be exported.
    [[nodiscard]] bool exportBacklog();
    /// The sink whose turn it is and which has something left, or null; and the piece.
    [[nodiscard]] Sink* next(Piece& piece, std::uint64_t mostLines);
    enum class Outcome { taken, noBudget, failed };
    [[nodiscard]] Outcome exportPiece(Sink& sink, const Piece& piece);
    /// What the piece's lines come to, in `out_`.
    [[nodiscard]] Counts format(const Sink& sink, const Piece& piece);
    void startDay();
    /// Whether what the piece comes to, in `out_`, may still go today.
    [[nodiscard]] bool fitsBudget(const Piece& piece) const;
    /// Notes whether something was written; only where new lines are followed.
    void readEvents();
    void lookAtNews();
    /// Until there may be more to export. False at the end.
    [[nodiscard]] bool awaitMore();
    [[nodiscard]] bool watch();
    [[nodiscard]] bool store();

    ExportPlan plan_;
    Cursor cursor_;
    ExportOutput& output_;
    const ServiceCount serviceCount_;
    std::vector<Sink> sinks_;
    std::set<std::string> directories_;
    std::size_t turn_ = 0;
    bool isBudgetSpent_ = false;
    bool hasNews_ = false; ///< since the last look
    FileDescriptor watch_;
    TextBuffer out_;
    Counts counts_;
    std::set<std::string> said_;
    std::string problem_;
};

} // namespace tamblo::tools
