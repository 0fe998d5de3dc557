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
using testing::AllOf;
using testing::HasSubstr;

/// In memory where that can be had: these tests wait for the disk thousands of times.
class PreferenceFileTest : public testing::Test {
protected:
    [[nodiscard]] static PreferenceFile open(const std::string& directory, std::string_view domain = "d") {
        return PreferenceFile::of(directory, domain).value();
    }
    /// Sets one key a time; 0 or the number of those that could not be stored.
    static int setKeys(const PreferenceFile& file, const std::string& prefix, int count) {
        int failures = 0;
        for (int i = 0; i < count; ++i) {
            const auto set = [&](Dictionary& values) {
                values.set(prefix + std::to_string(i), i);
                return true;
            };
            failures += file.edit(set) ? 1 : 0;
        }
        return failures;
    }
    [[nodiscard]] static std::size_t keysIn(const PreferenceFile& file) {
        const auto content = file.read();
        return std::holds_alternative<Dictionary>(content) ? std::get<Dictionary>(content).size() : 0;
    }
    [[nodiscard]] struct stat status() const {
        struct stat status {};
        EXPECT_EQ(::stat(file_.path().c_str(), &status), 0);
        return status;
    }

    const TemporaryDirectory directory_{fs::is_directory("/dev/shm") ? "/dev/shm"
                                                                     : fs::temp_directory_path()};
    const PreferenceFile file_ = open(directory_.path());
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
    EXPECT_EQ(keysIn(file_), 2000U);
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
        EXPECT_GE(keysIn(file_), 50U) << round;
        EXPECT_EQ(setKeys(file_, "k", 1), 0) << round;
    }
}

TEST_F(PreferenceFileTest, AFullDiskLeavesTheOldFileAndNothingElse) {
    ASSERT_EQ(setKeys(file_, "k", 1), 0);
    const std::string before = directory_.read("d.json");
    rlimit limit{};
    ASSERT_EQ(::getrlimit(RLIMIT_FSIZE, &limit), 0);
    const rlimit small{4096, limit.rlim_max};
    const auto handler = std::signal(SIGXFSZ, SIG_IGN);
    ASSERT_EQ(::setrlimit(RLIMIT_FSIZE, &small), 0);
    const auto fault = file_.edit([](Dictionary& values) {
        values.set("much", std::string(10'000, 'x'));
        return true;
    });
    ASSERT_EQ(::setrlimit(RLIMIT_FSIZE, &limit), 0);
    std::signal(SIGXFSZ, handler);
    EXPECT_THAT(fault.value_or(""), AllOf(HasSubstr(file_.path()), HasSubstr("File too large")));
    EXPECT_EQ(directory_.read("d.json"), before);
    EXPECT_EQ(test::entriesOf(directory_.path()), 1);
}

TEST_F(PreferenceFileTest, WhatIsNoObjectIsLeftAsItIs) {
    const std::pair<std::string, const char*> cases[] = {
        {"{\"k\": 1,\n oops}", "d.json: line 2, column 2: "},
        {"[1]", "d.json: not an object"},
        {"", "d.json: line 1, column 1: "},
        {"{}" + std::string(PreferenceFile::kMaximumSize, ' '), "d.json: File too large"},
    };
    for (const auto& [content, fault] : cases) {
        directory_.write("d.json", content);
        const auto inode = status().st_ino;
        const auto told = file_.edit([](Dictionary&) -> bool {
            ADD_FAILURE() << "called";
            return true;
        });
        EXPECT_THAT(told.value_or(""), HasSubstr(fault));
        EXPECT_EQ(directory_.read("d.json"), content);
        EXPECT_EQ(status().st_ino, inode);
    }
    directory_.write("d.json", R"({"a": 1})");
    EXPECT_EQ(file_.edit([](Dictionary& values) { return !values.contains("a"); }), std::nullopt);
    EXPECT_EQ(directory_.read("d.json"), R"({"a": 1})") << "nothing was to be changed";
    const auto nothing = [](Dictionary&) { return true; };
    EXPECT_THAT(open(directory_.path("gone")).edit(nothing).value_or(""), HasSubstr("gone: No such file"));
}

TEST_F(PreferenceFileTest, ADomainIsTheNameOfAFileOfItsOwn) {
    for (const std::string_view domain : {"../outside"sv, ".hidden"sv, ""sv, "d\0x"sv, "/etc/x"sv}) {
        EXPECT_FALSE(PreferenceFile::of(directory_.path(), domain)) << domain;
    }
    EXPECT_TRUE(PreferenceFile::of(directory_.path(), std::string(200, 'x')));
    EXPECT_FALSE(PreferenceFile::of(directory_.path(), std::string(201, 'x')));
    EXPECT_EQ(open("/p", "com.vandra.x").path(), "/p/com.vandra.x.json");
}

} // namespace
} // namespace tamblo
