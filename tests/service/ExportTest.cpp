#include "tests/service/RealService.h"

#include <gmock/gmock.h>
#include <nlohmann/json.hpp>

#include <map>
#include <random>
#include <set>

// `tambloctl export` as the program that it is: with readers that take, refuse, stop and go, and killed at
// any moment.

namespace tamblo::test {
namespace {

using testing::HasSubstr;

#if defined(__SANITIZE_ADDRESS__) || defined(__SANITIZE_THREAD__)
constexpr bool kMemoryIsThatOfTheExport = false; ///< but the sanitizer's
#else
constexpr bool kMemoryIsThatOfTheExport = true;
#endif

constexpr double kFirstTime = 1'795'271'169;

/// A device without a service, whose sinks the test writes.
class Device {
public:
    Device() { directory_.write("config/device-properties.json", R"({"FleetIdentifier":"unit"})"); }

    [[nodiscard]] std::string path(const std::string& name = {}) const { return directory_.path(name); }
    [[nodiscard]] std::string sink(int file = 0) const {
        return path("logs/power-events.jsonl" + (file == 0 ? "" : "." + std::to_string(file)));
    }
    /// So many records more, each with its number.
    void write(int count) {
        std::string text;
        for (const int end = written_ + count; written_ != end; ++written_) {
            text += nlohmann::json{{"time", kFirstTime + written_}, {"event", "e"}, {"n", written_}}.dump() +
                    "\n";
        }
        writeFile(sink(), text, std::ios::app);
    }
    void rotate() const {
        for (int file = 4; file > 0; --file) {
            if (std::filesystem::exists(sink(file - 1))) {
                std::filesystem::rename(sink(file - 1), sink(file));
            }
        }
    }
    [[nodiscard]] int written() const noexcept { return written_; }
    [[nodiscard]] std::string cursor() const { return directory_.read("cursor"); }
    /// Of bash, in which `take` is an export with a cursor.
    [[nodiscard]] CommandResult bash(const std::string& command) const {
        directory_.write("command", "export LOGS_DIRECTORY=logs CONFIGURATION_DIRECTORY=config\n"
                                    "take() { timeout 60 " TAMBLOCTL_PATH " export -c cursor \"$@\"; }\n" +
                                        command);
        return run("cd " + directory_.path() + " && bash command");
    }
    void replaceInCursor(const std::string& text, const std::string& by) const {
        std::string cursor = this->cursor();
        directory_.write("cursor", cursor.replace(cursor.find(text), text.size(), by));
    }

private:
    TemporaryDirectory directory_;
    int written_ = 0;
};

/// How often each number stands in the output of an export.
std::map<int, int> numbersIn(std::string_view output) {
    std::map<int, int> numbers;
    for (std::size_t at = output.find("\"n\":"); at != output.npos; at = output.find("\"n\":", at + 1)) {
        ++numbers[std::atoi(output.data() + at + 4)];
    }
    return numbers;
}

/// An export with a reader that acknowledges each batch.
class RunningExport {
public:
    /// In a directory that has those of the device in it, as `Device` has.
    RunningExport(const std::string& directory, std::vector<std::string> arguments) {
        int toExport[2] = {};
        int fromExport[2] = {};
        EXPECT_EQ(::pipe2(toExport, O_CLOEXEC), 0);
        EXPECT_EQ(::pipe2(fromExport, O_CLOEXEC), 0);
        arguments.insert(arguments.begin(), {"tambloctl", "export", "-c", directory + "/cursor"});
        std::vector<char*> words;
        words.reserve(arguments.size() + 1);
        for (std::string& argument : arguments) {
            words.push_back(argument.data());
        }
        words.push_back(nullptr);
        pid_ = ::fork();
        if (pid_ == 0) {
            ::prctl(PR_SET_PDEATHSIG, SIGKILL);
            ::setenv("LOGS_DIRECTORY", (directory + "/logs").c_str(), 1);
            ::setenv("CONFIGURATION_DIRECTORY", (directory + "/config").c_str(), 1);
            ::dup2(toExport[0], STDIN_FILENO);
            ::dup2(fromExport[1], STDOUT_FILENO);
            ::dup2(::open((directory + "/said").c_str(), O_WRONLY | O_CREAT | O_APPEND, 0600), STDERR_FILENO);
            ::execv(TAMBLOCTL_PATH, words.data());
            ::_exit(127);
        }
        ::close(toExport[0]);
        ::close(fromExport[1]);
        acknowledgements_ = FileDescriptor(toExport[1]);
        output_ = FileDescriptor(fromExport[0]);
    }
    ~RunningExport() {
        if (pid_ > 0) {
            (void)end(SIGKILL);
        }
    }
    RunningExport(const RunningExport&) = delete;
    RunningExport& operator=(const RunningExport&) = delete;

    /// The lines of a batch up to the empty line; empty when nothing comes any more.
    std::string batch() {
        for (std::size_t end = received_.find("\n\n"); end == received_.npos; end = received_.find("\n\n")) {
            pollfd ready{.fd = output_.get(), .events = POLLIN, .revents = 0};
            std::array<char, 65536> bytes;
            const ssize_t count = ::poll(&ready, 1, kPatience.count()) == 1
                                      ? ::read(output_.get(), bytes.data(), bytes.size())
                                      : 0;
            if (count <= 0) {
                return {};
            }
            received_.append(bytes.data(), static_cast<std::size_t>(count));
        }
        const std::size_t end = received_.find("\n\n") + 2;
        std::string batch = received_.substr(0, end);
        received_.erase(0, end);
        return batch;
    }
    void acknowledge() const { (void)!::write(acknowledgements_.get(), "ok\n", 3); }
    /// The most memory that it has had, in KiB.
    [[nodiscard]] long peak() const {
        const std::string status = contentOf("/proc/" + std::to_string(pid_) + "/status");
        return std::atol(status.c_str() + status.find("VmHWM:") + 6);
    }
    /// Its exit status, or minus the signal.
    [[nodiscard]] int end(int signal) {
        ::kill(pid_, signal);
        int status = 0;
        ::waitpid(pid_, &status, 0);
        pid_ = -1;
        return WIFEXITED(status) ? WEXITSTATUS(status) : -WTERMSIG(status);
    }

private:
    pid_t pid_ = -1;
    FileDescriptor acknowledgements_;
    FileDescriptor output_;
    std::string received_;
};

TEST(Export, LosesNothingAndRepeatsABatchAtMostWhenItIsKilled) {
    constexpr int kBatch = 50;
    constexpr int kKills = 40;
    std::mt19937 random(7);
    Device device;
    std::map<int, int> taken;
    std::map<std::string, int> identifiers;
    const auto note = [&](const std::string& batch) {
        std::istringstream lines(batch);
        for (std::string line; std::getline(lines, line) && !line.empty();) {
            const auto record = nlohmann::json::parse(line);
            const int number = record["record"]["n"];
            ++taken[number];
            const auto [known, isNew] = identifiers.emplace(record["id"], number);
            EXPECT_TRUE(isNew || known->second == number) << record["id"];
        }
    };
    ::signal(SIGPIPE, SIG_IGN);
    for (int kill = 0; kill != kKills; ++kill) {
        device.write(200);
        if (kill % 11 == 10) {
            device.rotate();
            device.write(100);
        }
        RunningExport running(device.path(),
                              {"--batch=50", kill % 2 == 0 ? "--newest-first" : "--format=json"});
        const auto batches = random() % 5;
        for (unsigned i = 0; i != batches; ++i) {
            const std::string batch = running.batch();
            EXPECT_LE(countOf("\n", batch), kBatch + 1U);
            note(batch);
            if (i + 1 != batches) {
                running.acknowledge();
            }
        }
        // Somewhere between the last acknowledgement, the cursor's move, and the next batch.
        if (random() % 2 == 0 && batches != 0) {
            running.acknowledge();
            std::this_thread::sleep_for(std::chrono::microseconds(random() % 3000));
        }
        EXPECT_EQ(running.end(SIGKILL), -SIGKILL);
    }
    RunningExport last(device.path(), {"--batch=50", "--newest-first"});
    for (std::string batch = last.batch(); !batch.empty(); batch = last.batch()) {
        note(batch);
        last.acknowledge();
    }
    EXPECT_EQ(last.end(0), 0);
    EXPECT_EQ(taken.size(), static_cast<std::size_t>(device.written()));
    EXPECT_EQ(identifiers.size(), taken.size()) << "the same whenever it is exported";
    int repeats = 0;
    for (const auto& [number, times] : taken) {
        repeats += times - 1;
    }
    EXPECT_LE(repeats, kKills * kBatch);
    EXPECT_GT(repeats, 0) << "nothing was tried";
}

TEST(Export, MovesTheCursorOnlyWhenTheReaderHasTakenTheRecords) {
    Device device;
    device.write(20'000);
    const struct {
        const char* command;
        const char* said;
    } cases[] = {
        {"take | head -n 5 >out; exit ${PIPESTATUS[0]}", "Broken pipe"},
        {"mkdir few; head -n 3 logs/power-events.jsonl >few/power-events.jsonl; "
         "LOGS_DIRECTORY=few take | sleep 2; exit ${PIPESTATUS[0]}",
         "ended before it had read all"},
        {"take --follow | head -n 20000 >out; exit ${PIPESTATUS[0]}", "nobody reads"},
        {"take >/dev/full", "No space left"},
        {TAMBLOCTL_PATH " export --cursor ''", "has no name"},
        {"take --batch 10 </dev/null", "closed standard input"},
        {"take --batch 10 < <(sleep 0.3)", "it acknowledge"},
        {"take --batch 10 < <(yes)", "what it has not been given"},
        {"exec 9>cursor.lock; flock 9; take", "another export"},
        {TAMBLOCTL_PATH " export -c cursor > >(sleep 6 >/dev/null 2>&1) & sleep 1; kill $!; wait $!",
         "ended before all was written"},
    };
    for (const auto& [command, said] : cases) {
        const CommandResult result = device.bash(command);
        EXPECT_EQ(result.status, 1) << command;
        EXPECT_THAT(result.output, HasSubstr(said)) << command;
        EXPECT_EQ(device.cursor(), "") << command;
    }
    EXPECT_THAT(device.bash("take >out").output, HasSubstr("20000 records\n"));
    EXPECT_EQ(numbersIn(contentOf(device.path("out"))).size(), 20'000U);
    device.rotate();
    device.write(3);
    EXPECT_THAT(device.bash("take | cat").output, AllOf(HasSubstr("\"n\":20002,"), HasSubstr("3 records\n")));
    // A file that is gone, by a device that has another identity by now.
    std::filesystem::remove(device.sink());
    writeFile(device.path("config/device-properties.json"), R"({"FleetIdentifier":"other"})");
    const CommandResult gone = device.bash("take");
    EXPECT_EQ(gone.status, 0);
    EXPECT_THAT(gone.output,
                AllOf(HasSubstr("another device's"), HasSubstr("power-events: 0 lines that were"),
                      HasSubstr("may be missing"), HasSubstr("\n0 records\n")));
    EXPECT_EQ(device.bash("take").output, "0 records\n") << "said once";
}

TEST(Export, TakesHostileFilesInLittleMemory) {
    Device device;
    device.write(10);
    const std::string head = R"({"time":1,"a":)";
    std::string ones = "[1";
    for (int i = 0; i != 30'000; ++i) {
        ones += ",1";
    }
    const std::string tooLarge[] = {"\"" + std::string(24U << 20U, 'x') + "\"}",
                                    ones + ones.substr(2) + "]}"};
    const std::string unreadable[] = {std::string(1U << 19U, '\0'), std::string(1'000, '['), "\"\xFF\"}",
                                      "\"\t\"}"};
    std::string deep = "[1";
    for (int i = 0; i != 1'000; ++i) {
        deep += "," + std::string(30, '[') + std::string(30, ']');
    }
    const std::string readable[] = {ones + "]}", "\"" + std::string(1'000'000, '\\') + "\"}",
                                    deep + R"(],"b":")" + std::string(900'000, 'x') + "\"}"};
    for (const std::span<const std::string> lines :
         {std::span<const std::string>(tooLarge), {unreadable}, {readable}}) {
        for (const std::string& line : lines) {
            writeFile(device.sink(), head + line + "\n", std::ios::app);
        }
    }
    device.write(1);
    writeFile(device.sink(), head + std::string(24U << 20U, 'x'), std::ios::app);
    for (const char* const format : {"json", "otlp", "columns"}) {
        RunningExport running(device.path(), {"--follow", "--batch=4", "--drop=zz", "--format", format});
        std::string all;
        for (bool goesOn = true; goesOn && countOf("unit/power-events/", all) != 14;) {
            const std::string batch = running.batch();
            all += batch;
            running.acknowledge();
            goesOn = !batch.empty();
        }
        if (kMemoryIsThatOfTheExport) {
            EXPECT_LE(running.peak(), 16 * 1024) << format;
        }
        EXPECT_EQ(running.end(SIGTERM), 0);
        EXPECT_THAT(contentOf(device.path("said")),
                    HasSubstr("14 records, without 4 lines that are no records, without 2 lines that are too "
                              "large\n"))
            << format;
        std::filesystem::remove(device.path("cursor"));
        std::filesystem::remove(device.path("said"));
    }
}

TEST(Export, KeepsToTheRateAndToTheDaysBytes) {
    Device device;
    device.write(300);
    const auto began = std::chrono::steady_clock::now();
    EXPECT_EQ(numbersIn(device.bash("take --rate 64K | cat; rm cursor").output).size(), 300U);
    const auto seconds = std::chrono::duration<double>(std::chrono::steady_clock::now() - began).count();
    EXPECT_GT(seconds, 0.5) << "some 40 kilobytes";
    std::map<int, int> all;
    for (int day = 1; all.size() != 300; ++day) {
        ASSERT_LT(day, 20);
        const std::string output = device.bash("take --daily 10K --newest-first 2>said >out; cat out").output;
        EXPECT_LE(output.size(), 10U << 10U);
        EXPECT_EQ(device.bash("take --daily 10K 2>said").output.size() > 200U, false) << "the same day";
        for (const auto& [number, times] : numbersIn(output)) {
            all[number] += times;
            EXPECT_EQ(all[number], 1);
        }
        EXPECT_TRUE(all.contains(299)) << "the newest";
        device.replaceInCursor("\"day\":", "\"day\":1");
    }
    device.write(1);
    EXPECT_THAT(device.bash("take --daily 10").output, HasSubstr("1 records")) << "or nothing would ever go";
    for (const char* const wrong :
         {"--daily 0", "--rate x", "--format xml", "--since never", "nothing", "./a/x.jsonl ./b/x.jsonl"}) {
        EXPECT_EQ(device.bash(std::string("take ") + wrong).status, 2) << wrong;
    }
    EXPECT_EQ(device.bash(TAMBLOCTL_PATH " export --daily 5").status, 2) << "nowhere to count";
}

TEST(Export, IsShippedInBatchesUntilTheyArrive) {
    Device device;
    device.write(2'500);
    const CommandResult result = device.bash(
        "export PATH=$(dirname " TAMBLOCTL_PATH "):$PATH\n"
        "unpack() { if command -v zstd >/dev/null; then zstd -dqc; else zcat; fi; }\n"
        "" EXAMPLES_DIR "/shipping/ship cursor 'cat >batch; if [ -e failed ]; then cat batch >>arrived; "
        "else touch failed; false; fi' &\n"
        "for ((i = 0; i != 600; ++i)); do\n"
        "  sleep 0.05; ! grep -q '\"lines_taken\":2500' cursor 2>/dev/null || break\n"
        "done\n"
        "kill $!; wait $! || exit; unpack <arrived; take");
    EXPECT_EQ(result.status, 0);
    const auto numbers = numbersIn(result.output);
    EXPECT_EQ(numbers.size(), 2'500U);
    EXPECT_TRUE(std::ranges::all_of(numbers, [](const auto& number) { return number.second == 1; }));
    EXPECT_THAT(result.output, HasSubstr("\n0 records\n"));
}

TEST(Export, FollowsWhatTheServiceWrites) {
    ServiceProcess service;
    Session client(service.socketPath());
    const std::string directory = service.logs().parent_path();
    RunningExport running(directory, {"analytics-events", "--follow", "--batch=100", "--only",
                                      "com.vandra.tamblo.Playback.Start", "--drop", "audiotag"});
    std::string all;
    for (int number = 1; number != 4; ++number) {
        EXPECT_TRUE(client.call(message({{"n", number}})));
        const std::string text = "\"n\":" + std::to_string(number) + ",";
        for (std::string batch = running.batch(); !batch.empty(); batch = running.batch()) {
            all += batch;
            running.acknowledge();
            if (countOf(text, all) == 1) {
                break;
            }
        }
        EXPECT_EQ(countOf(text, all), 1U) << all;
    }
    EXPECT_EQ(running.end(SIGTERM), 0);
    EXPECT_EQ(countOf("audiotag", all), 0U);
    EXPECT_THAT(service
                    .tambloctl("export analytics-events -e 'com.vandra.tamblo.Playback.Start' -c " +
                               directory + "/cursor")
                    .output,
                HasSubstr("0 records"));
}

TEST(Export, KnowsFromTheServiceHowManyLinesWereInFilesThatItNeverSaw) {
    for (const int seen : {0, 3}) {
        ServiceProcess service;
        Session client(service.socketPath());
        const std::string command = "export analytics-events -c " + service.runtimeDirectory() + "/cursor";
        int number = 0;
        const auto send = [&](int count) {
            for (const int end = number + count; number != end; ++number) {
                EXPECT_TRUE(client.call(message({{"n", number}})));
            }
        };
        send(seen);
        EXPECT_EQ(service.tambloctl(command).status, 0);
        send(57);
        const auto file = service.logs() / "analytics-events.jsonl";
        EXPECT_EQ(linesOf(file).size(), 2U * 57 + 2U * static_cast<unsigned>(seen)) << "under both names";
        std::filesystem::remove(file);
        // The service looks for its file ten times a second.
        EXPECT_TRUE(eventually([&] {
            std::this_thread::sleep_for(std::chrono::milliseconds(120));
            send(1);
            return std::filesystem::exists(file);
        }));
        const std::string said = service.tambloctl(command + " -e none").output;
        EXPECT_THAT(said, HasSubstr("analytics-events: 114 lines that were not exported"));
        EXPECT_THAT(said, testing::Not(HasSubstr("may be missing")));
    }
}

} // namespace
} // namespace tamblo::test
