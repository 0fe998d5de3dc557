#include "os/PreferenceFile.h"

#include "tests/platform/LinuxServiceSupport.h"

#include <gmock/gmock.h>

#include <csignal>
#include <thread>

#include <sys/resource.h>
#include <sys/wait.h>
#include <unistd.h>

namespace tamblo {
namespace {

using namespace std::string_view_literals;
namespace fs = std::filesystem;
using testing::HasSubstr;

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
        {"[1]", "d.json: not an object"},
        {"{}" + std::string(PreferenceFile::kMaximumSize, ' '), "d.json: File too large"},
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
    for (const std::string_view domain : {"../outside"sv, ".hidden"sv, ""sv, "d\0x"sv, "/etc/x"sv}) {
        EXPECT_FALSE(PreferenceFile::of(directory_.path(), domain)) << domain;
    }
    EXPECT_TRUE(PreferenceFile::of(directory_.path(), std::string(200, 'x')));
    EXPECT_FALSE(PreferenceFile::of(directory_.path(), std::string(201, 'x')));
    EXPECT_EQ(PreferenceFile::of("/p", "com.vandra.x")->path(), "/p/com.vandra.x.json");
}

} // namespace
} // namespace tamblo
