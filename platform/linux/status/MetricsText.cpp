#include "platform/linux/status/MetricsText.h"

#include "base/Format.h"
#include "base/Json.h"
#include "platform/Counters.h"

#include <string>

namespace tamblo {

namespace {

using counters::Family;
using counters::Row;

double secondsOf(std::uint64_t nanoseconds) noexcept {
    return static_cast<double>(nanoseconds) / 1e9;
}

class Writer {
public:
    Writer(TextBuffer& out, std::uint64_t began, MetricsForm form)
        : out_(out), began_(secondsOf(began)), isPlain_(form == MetricsForm::plain) {}

    void gauge(const Gauge& gauge) {
        head(gauge.name, "", "gauge", gauge.help);
        sample(gauge.name, "", gauge.labels);
        appendJsonNumber(out_, gauge.value);
        out_.append('\n');
    }
    void counters(const Family& family) {
        head(family.name, isPlain_ ? "_total" : "", "counter", family.help);
        for (const Row& row : family.rows) {
            sample(family.name, "_total", row.labels);
            number(counters::valueOf(row.slot));
            created(family.name, row.labels);
        }
    }
    void histogram(const Family& family) {
        head(family.name, "", "histogram", family.help);
        const std::size_t first = family.rows.front().slot;
        std::uint64_t count = 0;
        for (std::size_t i = 0; i <= counters::kBounds; ++i) {
            count += counters::valueOf(first + i);
            sample(family.name, "_bucket", boundLabel(i));
            number(count);
        }
        sample(family.name, "_count", "");
        number(count);
        sample(family.name, "_sum", "");
        appendJsonNumber(out_, secondsOf(counters::valueOf(first + counters::kBounds + 1)));
        out_.append('\n');
        created(family.name, "");
    }

private:
    static std::string boundLabel(std::size_t bucket) {
        if (bucket == counters::kBounds) {
            return "le=\"+Inf\"";
        }
        TextBuffer text;
        text.append("le=\"");
        appendJsonNumber(text, secondsOf(static_cast<std::uint64_t>(counters::boundOf(bucket).count())));
        text.append('"');
        return std::string(text.view());
    }
    void head(std::string_view name, std::string_view ending, std::string_view type, std::string_view help) {
        out_.append(formatted("# HELP tamblo_{}{} {}\n# TYPE tamblo_{}{} {}\n", name, ending, help, name,
                              ending, type));
    }
    void sample(std::string_view name, std::string_view ending, std::string_view labels) {
        out_.append("tamblo_");
        out_.append(name);
        out_.append(ending);
        if (!labels.empty()) {
            out_.append('{');
            out_.append(labels);
            out_.append('}');
        }
        out_.append(' ');
    }
    void number(std::uint64_t value) { out_.append(formatted("{}\n", value)); }
    /// When it began to be counted; the plain form has no place for that.
    void created(std::string_view name, std::string_view labels) {
        if (!isPlain_) {
            sample(name, "_created", labels);
            out_.append(formatted("{}\n", fixed(began_, 3)));
        }
    }

    TextBuffer& out_;
    const double began_;
    const bool isPlain_;
};

} // namespace

void appendMetrics(TextBuffer& out, std::span<const Gauge> gauges, std::uint64_t countersBegan,
                   MetricsForm form) {
    Writer writer(out, countersBegan, form);
    for (const Gauge& gauge : gauges) {
        writer.gauge(gauge);
    }
    for (const Family& family : counters::families()) {
        family.isHistogram ? writer.histogram(family) : writer.counters(family);
    }
    if (form == MetricsForm::openMetrics) {
        out.append("# EOF\n");
    }
}

} // namespace tamblo
