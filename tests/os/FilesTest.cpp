#include "os/DirectoryWatcher.h"
#include "os/LocalAddress.h"
#include "os/SmallFile.h"
#include "tests/platform/LinuxServiceSupport.h"

#include <gmock/gmock.h>

#include <cerrno>

#include <fcntl.h>
#include <sys/stat.h>

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

TEST(LocalAddress, HoldsWhatTheSystemTakes) {
    EXPECT_FALSE(LocalAddress::of(""));
    EXPECT_TRUE(LocalAddress::of(std::string(107, 'x')));
    EXPECT_FALSE(LocalAddress::of(std::string(108, 'x')));
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

TEST_F(DirectoryWatcherTest, WhatTheKernelCouldNotRememberMayBeAnyFile) {
    int limit = 0;
    std::ifstream("/proc/sys/fs/inotify/max_queued_events") >> limit;
    if (limit <= 0 || limit > 100'000) {
        GTEST_SKIP() << "the kernel remembers " << limit;
    }
    fs::create_directories(path_);
    (void)changes();
    const FileDescriptor place(::open(path_.c_str(), O_RDONLY | O_DIRECTORY));
    for (int i = 0; i <= limit; ++i) { // taking turns, since a repetition of the last event is left out
        const FileDescriptor written(::openat(place.get(), i % 2 == 0 ? "f" : "g", O_WRONLY | O_CREAT, 0600));
    }
    EXPECT_THAT(changes(), Contains("*"));
}

} // namespace
} // namespace tamblo
