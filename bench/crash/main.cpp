// Kills the service at random points while clients write and files rotate, and looks after each restart
// whether every record that was answered is in its file, once, in its order, and every line whole.

#include "../ResultRow.h"
#include "CrashClient.h"
#include "CrashedService.h"
#include "Ledger.h"
#include "SinkReader.h"
#include "os/FileDescriptor.h"

#include <algorithm>
#include <array>
#include <charconv>
#include <chrono>
#include <cstdio>
#include <exception>
#include <list>
#include <random>
#include <string>
#include <string_view>
#include <thread>

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

namespace {

using namespace tamblo;
using namespace tamblo::bench;
using std::chrono::microseconds;
using std::chrono::milliseconds;

/// At which the service begins a new file.
constexpr off_t kFileSize = 64 << 20;

struct Options {
    unsigned kills = 1'000;
    unsigned seed = 1;
    bool fullDisk = false;
    bool movingClock = false;
    std::string tamblod = TAMBLOD_PATH;
};

class Driver {
public:
    explicit Driver(const Options& options)
        : options_(options),
          random_(options.seed),
          service_(options.tamblod, options.movingClock ? SHIFTED_CLOCK_PATH : ""),
          readers_{SinkReader(service_.logsDirectory(), Sink::analyticsEvents),
                   SinkReader(service_.logsDirectory(), Sink::powerEvents)} {}

    /// Whether nothing was wrong.
    bool run() {
        service_.start();
        require(service_.awaitReady(), "the service does not start");
        for (unsigned round = 1; round <= options_.kills && isGood_; ++round) {
            live();
            restart();
            if (round % 100 == 0) {
                std::fprintf(stderr, "%u kills, %llu records\n", round,
                             static_cast<unsigned long long>(verdict_.records));
            }
        }
        print();
        return isGood_;
    }

private:
    [[nodiscard]] std::uint64_t below(std::uint64_t limit) { return random_() % limit; }
    void sleepFor(std::uint64_t mostMicroseconds) {
        std::this_thread::sleep_for(microseconds(below(mostMicroseconds)));
    }

    void require(bool holds, const char* otherwise) {
        if (!holds) {
            std::fprintf(stderr, "tamblo_crash: %s\n", otherwise);
            isGood_ = false;
        }
    }

    /// One life of the service, with all that may happen in it.
    void live() {
        CrashControl control;
        std::list<CrashClient> clients;
        for (std::size_t client = 0; client < kClients; ++client) {
            clients.emplace_back(client, service_.socketPath(), ledger_, control,
                                 static_cast<unsigned>(random_()));
        }
        sleepFor(30'000);
        for (std::uint64_t events = below(3); events > 0; --events) {
            if (options_.movingClock) {
                moveClock();
            }
            if (options_.fullDisk && below(2) == 0) {
                fillDisk(control);
            } else {
                rotate(readers_[below(readers_.size())]);
            }
        }
        sleepFor(20'000);
        endInOrder_ = below(10) == 0;
        if (endInOrder_) {
            control.isOver = true;
            require(service_.stop(), "the service does not end in order");
        } else {
            service_.kill();
            ++kills_;
        }
        control.isOver = true;
    }

    /// Makes a file as long as one that is nearly full, and waits until it has been put aside, or not so
    /// long.
    void rotate(const SinkReader& reader) {
        const FileDescriptor file(::open(reader.path().c_str(), O_RDWR | O_CLOEXEC));
        struct stat before {};
        if (!file.isOpen() || ::fstat(file.get(), &before) != 0 || before.st_size > kFileSize / 2 ||
            ::ftruncate(file.get(), kFileSize - static_cast<off_t>(below(200'000))) != 0) {
            return;
        }
        const auto end = std::chrono::steady_clock::now() + microseconds(below(250'000));
        while (std::chrono::steady_clock::now() < end) {
            struct stat now {};
            if (::stat(reader.path().c_str(), &now) != 0 || now.st_ino != before.st_ino) {
                sleepFor(1'000);
                return;
            }
        }
    }

    void fillDisk(CrashControl& control) {
        struct stat status {};
        const std::string& path = readers_[below(readers_.size())].path();
        if (::stat(path.c_str(), &status) == 0) {
            control.roomChanges += CrashControl::hasRoom(control.roomChanges) ? 1U : 0U;
            ++outages_;
            // The log, too, is a file, and shall tell.
            constexpr std::uint64_t kRoomOfLog = 64U << 10U;
            service_.limitFiles(
                std::max(static_cast<std::uint64_t>(status.st_size), service_.bytesLogged() + kRoomOfLog) +
                below(100'000));
            sleepFor(20'000);
            if (below(3) != 0) { // else it is killed while the disk is full
                service_.liftLimit();
                ++control.roomChanges;
            }
        }
    }

    void moveClock() {
        constexpr std::int64_t kHour = 3'600, kYear = 365 * 24 * kHour;
        const std::int64_t range = below(2) == 0 ? kHour : kYear;
        service_.shiftClock(std::chrono::seconds(
            static_cast<std::int64_t>(below(2 * static_cast<std::uint64_t>(range))) - range));
        ++clockChanges_;
    }

    /// Starts the service again, now and then only to kill it before it is ready, and looks at the files.
    void restart() {
        for (const SinkReader& reader : readers_) {
            tornFiles_ += reader.isTorn() ? 1U : 0U;
        }
        while (below(5) == 0) {
            service_.start();
            sleepFor(15'000);
            service_.kill();
            ++kills_;
        }
        service_.start();
        if (!service_.awaitReady()) {
            require(false, "the service does not start again");
            return;
        }
        for (std::size_t i = 0; i < readers_.size(); ++i) {
            readers_[i].read([&](const SinkRecord& record) { ledger_.found(static_cast<Sink>(i), record); });
        }
        verdict_ = ledger_.judge();
        const std::uint64_t broken = readers_[0].brokenLines() + readers_[1].brokenLines();
        require(verdict_.missing == 0, "answered records are missing");
        require(verdict_.strange == 0, "records stand twice or out of order");
        require(broken == 0, "lines are broken");
        // What is lost without a word is lost with the process that would have told.
        const std::uint64_t told = service_.toldLosses();
        require(!endInOrder_ || verdict_.excused - excusedBefore_ <= told - toldBefore_,
                "records are lost of which nothing was told");
        excusedBefore_ = verdict_.excused;
        toldBefore_ = told;
    }

    void print() const {
        ResultRow row("crash");
        row.set("seed", std::uint64_t{options_.seed});
        row.set("kills", kills_);
        row.set("answered", verdict_.answered);
        row.set("records", verdict_.records);
        row.set("rotations", readers_[0].rotations() + readers_[1].rotations());
        row.set("torn_files", tornFiles_);
        row.set("outages", outages_);
        row.set("lost_in_outages", verdict_.excused);
        row.set("told_losses", toldBefore_);
        row.set("clock_changes", clockChanges_);
        row.set("missing", verdict_.missing);
        row.set("twice_or_out_of_order", verdict_.strange);
        row.set("broken_lines", readers_[0].brokenLines() + readers_[1].brokenLines());
        row.require("all is well", isGood_);
        std::puts(row.text().c_str());
    }

    const Options options_;
    std::mt19937_64 random_;
    CrashedService service_;
    std::array<SinkReader, 2> readers_;
    Ledger ledger_;
    Ledger::Verdict verdict_;
    std::uint64_t kills_ = 0, tornFiles_ = 0, outages_ = 0, clockChanges_ = 0;
    std::uint64_t excusedBefore_ = 0, toldBefore_ = 0;
    bool endInOrder_ = false;
    bool isGood_ = true;
};

template <typename Number> bool read(std::string_view text, Number& number) {
    const auto result = std::from_chars(text.data(), text.data() + text.size(), number);
    return result.ec == std::errc() && result.ptr == text.data() + text.size();
}

bool parse(int count, char** arguments, Options& options) {
    for (int i = 1; i < count; ++i) {
        const std::string_view argument = arguments[i];
        const bool hasNext = i + 1 < count;
        if (argument == "--full-disk") {
            options.fullDisk = true;
        } else if (argument == "--moving-clock") {
            options.movingClock = true;
        } else if (argument == "--tamblod" && hasNext) {
            options.tamblod = arguments[++i];
        } else if (argument == "--seed" && hasNext) {
            if (!read(arguments[++i], options.seed)) {
                return false;
            }
        } else if (!read(argument, options.kills)) {
            return false;
        }
    }
    return true;
}

} // namespace

int main(int count, char** arguments) {
    Options options;
    if (!parse(count, arguments, options)) {
        std::fputs(
            "usage: tamblo_crash [--seed N] [--full-disk] [--moving-clock] [--tamblod PATH] [LIVES]\n\n"
            "Exit status: 0 when nothing was lost, 1 when something was, 2 for a wrong command line.\n",
            stderr);
        return 2;
    }
    try {
        return Driver(options).run() ? 0 : 1;
    } catch (const std::exception& error) {
        std::fprintf(stderr, "tamblo_crash: %s\n", error.what());
        return 1;
    }
}
