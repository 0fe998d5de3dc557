#include "../Batches.h"
#include "../Bench.h"
#include "../Meter.h"
#include "Attacks.h"
#include "Bystander.h"
#include "SinkKeeper.h"
#include "Users.h"

#include <algorithm>
#include <filesystem>
#include <fstream>
#include <optional>
#include <system_error>
#include <thread>

#include <sys/resource.h>

namespace tamblo::bench {

namespace {

using Clock = std::chrono::steady_clock;

constexpr std::chrono::milliseconds kPoll{5};
constexpr std::chrono::milliseconds kCalm{500};
constexpr std::chrono::seconds kEndLimit{12};
constexpr std::int64_t kThirdReporterID = 4'711'000'002;
constexpr std::size_t kMeasuredMessages = 2'000;
constexpr rlim_t kFewDescriptors = 64;

// What the service keeps on a build that is not internal: eight sinks, each of five files of 64 MiB, one
// more that is moved away, and the summary files.
constexpr double kMostSummaryFiles = 256;
constexpr double kMostSinkFiles = 8 * 5 + 1;
constexpr double kMostKeptMebibytes = kMostSinkFiles * 64 + 256;

void limit(pid_t process, __rlimit_resource resource, rlim_t most) {
    const rlimit limits{.rlim_cur = most, .rlim_max = most};
    ::prlimit(process, resource, &limits, nullptr);
}

ServiceProcess::Settings settingsFor(const Bench& bench, const Attack& attack) {
    ServiceProcess::Settings settings = bench.place(Placement::free);
    settings.isForOtherUsers = mayChangeUser();
    if (attack.shortage == Shortage::threads && mayChangeUser()) {
        // The limit on threads is none for root.
        settings.beforeExec = [](const std::string& directory) {
            for (const auto& entry : std::filesystem::recursive_directory_iterator(directory)) {
                (void)!::lchown(entry.path().c_str(), kServiceUser, kServiceUser);
            }
            (void)!::lchown(directory.c_str(), kServiceUser, kServiceUser);
            becomeUser(kServiceUser);
            const rlimit none{.rlim_cur = 1, .rlim_max = 1};
            ::setrlimit(RLIMIT_NPROC, &none);
        };
    }
    return settings;
}

std::size_t countLinesOf(const std::string& file) {
    std::ifstream lines(file, std::ios::binary);
    return static_cast<std::size_t>(
        std::count(std::istreambuf_iterator<char>(lines), std::istreambuf_iterator<char>(), '\n'));
}

/// What lies in a directory and below it.
struct Kept {
    std::uint64_t files = 0;
    std::uint64_t bytes = 0;
};

Kept keptIn(const std::string& directory) {
    Kept kept;
    std::error_code ignored;
    for (const auto& entry : std::filesystem::recursive_directory_iterator(directory, ignored)) {
        if (entry.is_regular_file(ignored)) {
            ++kept.files;
            kept.bytes += entry.file_size(ignored);
        }
    }
    return kept;
}

/// One attack against a service of its own, and what is measured beside it.
class Trial {
public:
    Trial(const Bench& bench, const Attack& attack)
        : attack_(attack),
          time_(bench.quick() ? std::chrono::seconds(2) : std::chrono::seconds(5)),
          service_(settingsFor(bench, attack)),
          keeper_(service_.logsDirectory(), keptDirectory()),
          bystander_(service_.socketPath()) {}

    ResultRow run() {
        ResultRow row("hostile");
        row.set("attack", attack_.name);
        row.set("users", mayChangeUser() ? "two" : "one");
        bystander_.send(Bystander::Phase::before);
        const Meter meter(service_.pid());
        calmly(kCalm);
        calmShare_ = secondsOf(meter.service()) / secondsOf(meter.wall());
        bystander_.rest();
        row.set("before_p50_ms", quantile(bystander_.milliseconds(Bystander::Phase::before), 0.5));
        messageCostBefore_ = messageCost();
        row.set("message_cpu_us_before", messageCostBefore_);
        attack(row);
        if (service_.isAlive()) {
            quiet(row);
        }
        end(row);
        judge(row);
        return row;
    }

private:
    [[nodiscard]] std::string keptDirectory() const {
        std::string kept = service_.logsDirectory() + "/../kept";
        std::filesystem::create_directory(kept);
        return kept;
    }

    /// Waits, with the sink's files kept.
    void calmly(Clock::duration time) const {
        for (const auto over = Clock::now() + time; Clock::now() < over;) {
            keeper_.keep();
            std::this_thread::sleep_for(kPoll);
        }
    }

    /// Of the service's processor time, for a message of a client that does nothing else; 0 when it is not
    /// served.
    [[nodiscard]] double messageCost() const {
        try {
            FrameChannel channel(service_.socketPath());
            channel.limitWaits(Bystander::kLongestWait);
            channel.beginSession(kThirdReporterID);
            Batches batches(channel);
            batches.send(kMeasuredMessages / 4, kThirdReporterID);
            const Meter meter(service_.pid());
            batches.send(kMeasuredMessages, kThirdReporterID);
            return microseconds(meter.service()) / kMeasuredMessages;
        } catch (const std::exception&) {
            return 0;
        }
    }

    [[nodiscard]] ChildProcess attacker(Clock::duration time) const {
        return ChildProcess(kAnyProcessor, [this, time] {
            raiseDescriptorLimit();
            becomeUser(kAttackingUser);
            attack_.run(Assault(service_.socketPath(), service_.pid(), time, *marks_));
            marks_->isOver = true;
            for (;;) {
                std::this_thread::sleep_for(std::chrono::hours(1));
            }
        });
    }

    void takeAway() const {
        if (attack_.shortage == Shortage::descriptors) {
            limit(service_.pid(), RLIMIT_NOFILE, kFewDescriptors);
        }
    }

    void attack(ResultRow& row) {
        takeAway();
        double seconds = 0;
        const Meter meter(service_.pid());
        bystander_.send(Bystander::Phase::during);
        {
            const ChildProcess attacking = attacker(time_);
            calmly(time_ / 2);
            if (attack_.shortage == Shortage::descriptors) {
                const std::string sink = service_.logsDirectory() + "/analytics-events.jsonl";
                (void)std::rename(sink.c_str(), (sink + ".moved").c_str());
            }
            calmly(time_ - time_ / 2);
            for (const auto over = Clock::now() + std::chrono::seconds(2);
                 !marks_->isOver && Clock::now() < over;) {
                calmly(kPoll);
            }
            bystander_.rest();
            if (service_.isAlive()) {
                seconds = secondsOf(meter.service());
                row.set("service_cpu_s", seconds);
            }
            keeper_.keep();
        }
        const std::vector<double> waits = bystander_.milliseconds(Bystander::Phase::during);
        const double longest = std::chrono::duration<double, std::milli>(Bystander::kLongestWait).count();
        row.set("answered", static_cast<std::uint64_t>(std::count_if(
                                waits.begin(), waits.end(), [=](double wait) { return wait < longest; })));
        row.set("p50_ms", quantile(waits, 0.5));
        row.set("p99_ms", quantile(waits, 0.99));
        row.set("worst_ms", quantile(waits, 1));
        row.set("sent_mib", mebibytes(marks_->sentBytes));
        row.set("refusals", marks_->refusals.load());
        row.set("ended_connections", marks_->endedConnections.load());
        // An attack that only connects has nothing but the work that it makes.
        isFelt_ = marks_->sentBytes + marks_->refusals + marks_->endedConnections > 0 ||
                  seconds > 2 * calmShare_ * secondsOf(time_);
        isAlive_ = service_.isAlive();
    }

    /// Until what the attack has left to do is done, so that it counts as nobody else's.
    void awaitRest() const {
        constexpr std::chrono::milliseconds kLook{100};
        constexpr std::chrono::seconds kMost{30};
        for (const auto over = Clock::now() + kMost; Clock::now() < over;) {
            const Meter meter(service_.pid());
            calmly(kLook);
            if (meter.service() < kLook / 10) {
                return;
            }
        }
    }

    /// What the service does, and holds, when nobody asks anything of it any more.
    void quiet(ResultRow& row) {
        const Meter meter(service_.pid());
        calmly(attack_.quiet);
        row.set("cpu_after_s", secondsOf(meter.service()));
        peak_ = static_cast<double>(peakResidentBytesOf(service_.pid()));
        row.set("peak_mib", peak_ / (1U << 20U));
        row.set("resident_after_mib", mebibytes(residentBytesOf(service_.pid())));
        if (marks_->residentBytes != 0) {
            row.set("retained_mib", mebibytes(marks_->residentBytes));
        }
        if (!bystander_.hasGivenUp()) {
            awaitRest();
            messageCostAfter_ = messageCost();
            row.set("message_cpu_us_after", *messageCostAfter_);
            bystander_.send(Bystander::Phase::after);
            calmly(kCalm);
            bystander_.rest();
            row.set("after_p50_ms", quantile(bystander_.milliseconds(Bystander::Phase::after), 0.5));
        }
        isAlive_ = service_.isAlive();
    }

    /// The order to end comes amid the same attack.
    void end(ResultRow& row) {
        lines_ = countLinesOf(service_.logPath());
        seconds_ = secondsOf(service_.age());
        const SinkKeeper::Files files = keeper_.files();
        row.set("files", files.count);
        row.set("written_mib", mebibytes(files.bytes));
        row.set("largest_file_mib", mebibytes(files.largest));
        row.set("log_lines", std::uint64_t{lines_});
        if (isAlive_) {
            const ChildProcess attacking = attacker(std::chrono::minutes(1));
            calmly(std::chrono::seconds(1));
            keeper_.keep();
            // One that kills itself on demand has no end to be timed.
            const auto took = service_.isAlive() ? service_.terminate(kEndLimit) : std::nullopt;
            row.set("end_s", took ? secondsOf(*took) : secondsOf(kEndLimit));
        }
        keeper_.keep();
    }

    void judge(ResultRow& row) const {
        const std::uint64_t answered = bystander_.answered();
        const auto counts = keeper_.countNumbers("com.vandra.tamblo.Playback.Start",
                                                 std::string(Bystander::kKey), answered + 1);
        const auto missing = std::count(counts.begin() + 1, counts.begin() + 1 + std::ptrdiff_t(answered), 0);
        const auto twice = std::count_if(counts.begin(), counts.end(), [](auto count) { return count > 1; });
        row.set("missing_records", static_cast<std::uint64_t>(missing));
        row.set("double_records", static_cast<std::uint64_t>(twice));
        const std::string logs = service_.logsDirectory();
        const Kept all = keptIn(logs);
        row.set("summary_files", keptIn(logs + "/DiagnosticLogs/Audio/Reporting").files);
        row.set("kept_files", all.files);
        row.set("kept_mib", mebibytes(all.bytes));
        row.atMost("p99_ms", 50);
        row.atMost("worst_ms", 250);
        row.atMost("missing_records", 0);
        row.atMost("double_records", 0);
        row.atMost("largest_file_mib", 64);
        row.atMost("summary_files", kMostSummaryFiles);
        row.atMost("kept_files", kMostSinkFiles + kMostSummaryFiles);
        row.atMost("kept_mib", kMostKeptMebibytes);
        row.require("the attack is felt", isFelt_);
        if (messageCostAfter_) {
            row.require("0 < message_cpu_us_after <= 2 * message_cpu_us_before + 3",
                        *messageCostAfter_ > 0 && *messageCostAfter_ <= 2 * messageCostBefore_ + 3);
        }
        row.require("the service lives", isAlive_ && !bystander_.hasGivenUp());
        row.require("log_lines <= 50 a second", static_cast<double>(lines_) <= 50 * seconds_);
        if (peak_ > 0) {
            row.atMost("peak_mib", 256);
        }
        if (isAlive_) {
            row.atMost("end_s", 10);
        }
        if (marks_->residentBytes != 0 && peak_ > 0) {
            row.atMost("resident_after_mib", 20);
            row.require("peak_mib <= 1.3 * retained_mib",
                        peak_ <= 1.3 * static_cast<double>(marks_->residentBytes));
        }
    }

    const Attack& attack_;
    const Clock::duration time_;
    ServiceProcess service_;
    const SinkKeeper keeper_;
    SharedMemory<AssaultMarks> marks_;
    Bystander bystander_;
    double calmShare_ = 0; ///< of a processor, that the service takes for the other user's client alone
    double messageCostBefore_ = 0;
    std::optional<double> messageCostAfter_;
    double peak_ = 0;
    bool isFelt_ = false;
    bool isAlive_ = true;
    std::size_t lines_ = 0;
    double seconds_ = 0;
};

} // namespace

void hostile(Bench& bench) {
    raiseDescriptorLimit();
    for (const auto attacks : {attacksByMessage(), attacksBySession(), attacksByConnection()}) {
        for (const Attack& attack : attacks) {
            if (!bench.isWanted(attack.name)) {
                continue;
            }
            try {
                bench.print(Trial(bench, attack).run());
            } catch (const std::exception& error) {
                ResultRow row("hostile");
                row.set("attack", attack.name);
                row.set("error", error.what());
                bench.print(row);
            }
        }
    }
}

void printAttacks() {
    for (const auto attacks : {attacksByMessage(), attacksBySession(), attacksByConnection()}) {
        for (const Attack& attack : attacks) {
            std::fprintf(stderr, "  hostile:%-24s%s\n", attack.name.data(), attack.what.data());
        }
    }
}

} // namespace tamblo::bench
