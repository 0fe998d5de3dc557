#include "os/DirectoryWatcher.h"
#include "os/PreferenceFile.h"
#include "os/SmallFile.h"
#include "tests/platform/LinuxServiceSupport.h"

#include <gmock/gmock.h>

#include <cerrno>
#include <csignal>
#include <thread>

#include <fcntl.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

namespace tamblo {
namespace {

namespace fs = std::filesystem;
using testing::Contains;
using testing::ElementsAre;
using testing::HasSubstr;

TEST(SmallFile, IsReadUpToItsLimitAndOnlyWhenItIsRegular) {
    const TemporaryDirectory directory;
    for (const std::size_t size : {1U, 4095U, 4096U, 4097U, 10'000U}) {
        const std::string text(size, 'x');
        directory.write("f", text);
        const SmallFile whole = SmallFile::read(directory.path("f"), size);
        EXPECT_EQ(whole.text, text);
        EXPECT_EQ(whole.state.size, static_cast<std::int64_t>(size));
        EXPECT_EQ(SmallFile::read(directory.path("f"), size - 1).error, EFBIG);
    }
    EXPECT_THAT(SmallFile::read("/proc/self/status", 65536).text, HasSubstr("Pid:")) << "has no size";
    EXPECT_EQ(SmallFile::read("/proc/self/status", 10).error, EFBIG);

    ASSERT_EQ(::mkfifo(directory.path("pipe").c_str(), 0600), 0);
    fs::create_symlink("f", directory.path("link"));
    EXPECT_EQ(SmallFile::read(directory.path("pipe"), 10).error, EINVAL);
    EXPECT_EQ(SmallFile::read(directory.path(), 10).error, EISDIR);
    EXPECT_TRUE(SmallFile::read(directory.path("none"), 10).isMissing());
    EXPECT_EQ(SmallFile::read(directory.path("link"), 10'000).text.size(), 10'000U);
    EXPECT_EQ(SmallFile::read(directory.path("link"), 10'000, SmallFile::Links::refused).error, ELOOP);
    EXPECT_EQ((SmallFile{.text = " a b\r\n"}).trimmed(), "a b");
}

class DirectoryWatcherTest : public testing::Test {
protected:
    /// What a change, which must have come, was told as: names, and `*` for any file.
    std::vector<std::string> changes() {
        std::vector<std::string> names;
        while (isReadable(watcher_.fileDescriptor(), names.empty() ? 2000 : 0)) {
            watcher_.read(
                [&names](std::optional<std::string_view> name) { names.emplace_back(name.value_or("*")); });
        }
        return names;
    }

    TemporaryDirectory directory_;
    const std::string path_ = directory_.path("a/b/watched");
    DirectoryWatcher watcher_{path_};
};

TEST_F(DirectoryWatcherTest, TellsOfFilesThatAreFinishedOrGo) {
    for (const char* step : {"a", "a/b", "a/b/watched"}) { // watched from before they are there
        fs::create_directory(directory_.path(step));
        EXPECT_THAT(changes(), Contains("*")) << step;
    }
    directory_.write("a/b/watched/f", "1");
    EXPECT_THAT(changes(), ElementsAre("f"));
    directory_.write("new", "2");
    fs::rename(directory_.path("new"), path_ + "/f");
    EXPECT_THAT(changes(), ElementsAre("f"));
    fs::rename(path_ + "/f", directory_.path("old"));
    EXPECT_THAT(changes(), ElementsAre("f"));
    directory_.write("a/b/watched/f", "3");
    fs::remove(path_ + "/f");
    EXPECT_THAT(changes(), ElementsAre("f", "f"));
    fs::create_directory(path_ + "/inner");
    const FileDescriptor unfinished(::open((path_ + "/g").c_str(), O_WRONLY | O_CREAT, 0600));
    EXPECT_FALSE(isReadable(watcher_.fileDescriptor(), 0));
}

TEST_F(DirectoryWatcherTest, FollowsTheDirectoryThroughItsEndsAndReturns) {
    fs::create_directories(path_);
    (void)changes();
    fs::rename(path_, directory_.path("away"));
    EXPECT_THAT(changes(), ElementsAre("*"));
    directory_.write("away/f", "elsewhere");
    fs::rename(directory_.path("away"), path_);
    EXPECT_THAT(changes(), ElementsAre("*"));
    directory_.write("a/b/watched/f", "back");
    EXPECT_THAT(changes(), ElementsAre("f"));
    // Even while somebody stays in it, which holds back the kernel's word that it is gone.
    const FileDescriptor user(::open(path_.c_str(), O_RDONLY | O_DIRECTORY));
    fs::remove_all(directory_.path("a"));
    fs::create_directories(path_);
    EXPECT_THAT(changes(), Contains("*"));
    directory_.write("a/b/watched/f", "new");
    EXPECT_THAT(changes(), ElementsAre("f"));
}

/// In memory where that can be had: these tests wait for the disk thousands of times.
class PreferenceFileTest : public testing::Test {
protected:
    /// Sets one key a time; 0 or the number of those that could not be stored.
    static int setKeys(const PreferenceFile& file, const std::string& prefix, int count) {
        int failures = 0;
        for (int i = 0; i < count; ++i) {
            const auto fault = file.edit([&](Dictionary& values) {
                values.set(prefix + std::to_string(i), i);
                return true;
            });
            failures += fault ? 1 : 0;
        }
        return failures;
    }
    [[nodiscard]] std::size_t keys() const { return std::get<Dictionary>(file_.read()).size(); }
    [[nodiscard]] struct stat status() const {
        struct stat status {};
        EXPECT_EQ(::stat(file_.path().c_str(), &status), 0);
        return status;
    }

    const TemporaryDirectory directory_{fs::is_directory("/dev/shm") ? "/dev/shm"
                                                                     : fs::temp_directory_path()};
    const PreferenceFile file_ = PreferenceFile::of(directory_.path(), "d").value();
};

TEST_F(PreferenceFileTest, TwoProcessesThatEachSetAThousandKeysLoseNone) {
    const pid_t child = ::fork();
    if (child == 0) {
        ::_exit(setKeys(file_, "child ", 1000) == 0 ? 0 : 1);
    }
    EXPECT_EQ(setKeys(file_, "parent ", 1000), 0);
    int status = -1;
    ASSERT_EQ(::waitpid(child, &status, 0), child);
    EXPECT_EQ(status, 0);
    EXPECT_EQ(keys(), 2000U);
    EXPECT_EQ(test::entriesOf(directory_.path()), 1) << "nothing is left beside the file";
}

TEST_F(PreferenceFileTest, ModeAndOwnerSurvive) {
    ASSERT_EQ(setKeys(file_, "k", 1), 0);
    EXPECT_EQ(status().st_mode & 07777U, 0600U) << "a new file is its owner's alone";
    for (const mode_t mode : {0644U, 0440U}) {
        ASSERT_EQ(::chmod(file_.path().c_str(), mode), 0);
        const bool isGivenAway = ::chown(file_.path().c_str(), 12345, 54321) == 0;
        const auto inode = status().st_ino;
        ASSERT_EQ(setKeys(file_, "k", 1), 0);
        EXPECT_EQ(status().st_mode & 07777U, mode);
        EXPECT_EQ(status().st_uid, isGivenAway ? 12345 : ::geteuid());
        EXPECT_EQ(status().st_gid, isGivenAway ? 54321 : ::getegid());
        EXPECT_NE(status().st_ino, inode) << "replaced, not written into";
    }
}

TEST_F(PreferenceFileTest, AKillLeavesTheOldOrTheNewAndNoLock) {
    ASSERT_EQ(setKeys(file_, "k", 50), 0);
    for (int round = 0; round < 20; ++round) {
        const pid_t child = ::fork();
        if (child == 0) {
            ::_exit(setKeys(file_, "long key number ", 1'000'000));
        }
        std::this_thread::sleep_for(std::chrono::microseconds(500 + 137 * round));
        ::kill(child, SIGKILL);
        ASSERT_EQ(::waitpid(child, nullptr, 0), child);
        EXPECT_GE(keys(), 50U) << round;
        EXPECT_EQ(setKeys(file_, "k", 1), 0) << round;
    }
}

TEST_F(PreferenceFileTest, WhatCannotBeWrittenOrReadAgainLeavesTheOldFileAndNothingElse) {
    ASSERT_EQ(setKeys(file_, "k", 1), 0);
    const std::string before = directory_.read("d.json");
    Value deep = 1;
    for (int i = 0; i < 40; ++i) {
        deep = Array{deep};
    }
    rlimit limit{};
    ::getrlimit(RLIMIT_FSIZE, &limit);
    const rlimit small{4096, limit.rlim_max};
    const auto handler = std::signal(SIGXFSZ, SIG_IGN);
    ::setrlimit(RLIMIT_FSIZE, &small);
    for (const Value& value : {Value(std::string(10'000, 'x')), deep}) {
        const auto fault = file_.edit([&value](Dictionary& values) {
            values.set("much", value);
            return true;
        });
        EXPECT_THAT(fault.value_or(""), HasSubstr(value.isString() ? "File too large" : "nested"));
    }
    ::setrlimit(RLIMIT_FSIZE, &limit);
    std::signal(SIGXFSZ, handler);
    EXPECT_EQ(directory_.read("d.json"), before);
    EXPECT_EQ(test::entriesOf(directory_.path()), 1);
}

TEST_F(PreferenceFileTest, WhatIsNoObjectIsLeftAsItIs) {
    const std::pair<std::string, const char*> cases[] = {
        {"{\"k\": 1,\n oops}", "d.json: line 2, column 2: "},
        {std::string(PreferenceFile::kMaximumSize + 1, ' '), "d.json: File too large"},
        {R"({"a": 1})", ""}, // not to be changed, says the edit
    };
    const auto edit = [](Dictionary& values) { return !values.contains("a"); };
    for (const auto& [content, fault] : cases) {
        directory_.write("d.json", content);
        EXPECT_THAT(file_.edit(edit).value_or(""), HasSubstr(fault));
        EXPECT_EQ(directory_.read("d.json"), content);
    }
    const PreferenceFile gone = PreferenceFile::of(directory_.path("gone"), "d").value();
    EXPECT_THAT(gone.edit(edit).value_or(""), HasSubstr("gone: No such file"));
}

TEST_F(PreferenceFileTest, ADomainIsTheNameOfAFileOfItsOwn) {
    for (const char* domain : {"../outside", ".hidden", "", "/etc/x"}) {
        EXPECT_FALSE(PreferenceFile::of(directory_.path(), domain)) << domain;
    }
    EXPECT_FALSE(PreferenceFile::of(directory_.path(), {"d\0x", 3}));
    EXPECT_TRUE(PreferenceFile::of(directory_.path(), std::string(200, 'x')));
    EXPECT_FALSE(PreferenceFile::of(directory_.path(), std::string(201, 'x')));
    EXPECT_EQ(PreferenceFile::of("/p", "com.vandra.x")->path(), "/p/com.vandra.x.json");
}

} // namespace
} // namespace tamblo
