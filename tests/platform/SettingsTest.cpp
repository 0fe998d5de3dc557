#include "os/FileDescriptor.h"
#include "platform/linux/settings/LinuxDeviceProperties.h"
#include "platform/linux/settings/LinuxPreferences.h"
#include "tests/platform/LinuxServiceSupport.h"

#include <gmock/gmock.h>

#include <utility>

#include <fcntl.h>

namespace tamblo {
namespace {

using namespace std::string_view_literals;
using testing::AllOf;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;

class LinuxPreferencesTest : public testing::Test {
protected:
    LinuxPreferencesTest() { std::filesystem::create_directory(path_); }

    /// The integer that is stored now, or -1; first takes in the changes that must have come.
    std::int64_t valueAfterChange(const std::string& key = "k") {
        const std::uint64_t before = preferences_.generation();
        while (isReadable(preferences_.fileDescriptor(), preferences_.generation() == before ? 2000 : 0)) {
            preferences_.readChanges();
        }
        EXPECT_NE(preferences_.generation(), before);
        return value(key);
    }
    [[nodiscard]] std::int64_t value(std::string_view key = "k", std::string_view domain = "d") const {
        const std::optional<Value> value = preferences_.copyPreferenceValue(key, domain);
        return value ? value->integerValue() : -1;
    }

    TemporaryDirectory directory_;
    const std::string path_ = directory_.path("preferences");
    RecordingLog log_;
    LinuxPreferences preferences_{path_, log_};
};

TEST_F(LinuxPreferencesTest, FollowTheFilesThroughEveryKindOfChange) {
    EXPECT_EQ(value(), -1);
    directory_.write("preferences/d.json", R"({"k": 1})");
    EXPECT_EQ(valueAfterChange(), 1);
    EXPECT_EQ(value("other"), -1);
    directory_.write("new", R"({"k": 2})");
    std::filesystem::rename(directory_.path("new"), path_ + "/d.json");
    EXPECT_EQ(valueAfterChange(), 2);
    std::filesystem::rename(path_ + "/d.json", directory_.path("old"));
    EXPECT_EQ(valueAfterChange(), -1);
    std::filesystem::rename(directory_.path("old"), path_ + "/d.json");
    EXPECT_EQ(valueAfterChange(), 2);
    std::filesystem::remove(path_ + "/d.json");
    EXPECT_EQ(valueAfterChange(), -1);
    EXPECT_THAT(log_.take(), IsEmpty());
    const std::uint64_t before = preferences_.generation();
    directory_.write("preferences/notes.txt", "x");
    ASSERT_TRUE(isReadable(preferences_.fileDescriptor()));
    preferences_.readChanges();
    EXPECT_EQ(preferences_.generation(), before) << "no preference";
}

TEST_F(LinuxPreferencesTest, SurviveTheDirectoryVanishingAndComingBack) {
    directory_.write("preferences/d.json", R"({"k": 1})");
    EXPECT_EQ(valueAfterChange(), 1);
    std::filesystem::rename(path_, directory_.path("away"));
    EXPECT_EQ(valueAfterChange(), -1);
    directory_.write("away/d.json", R"({"k": 2})");
    std::filesystem::rename(directory_.path("away"), path_);
    EXPECT_EQ(valueAfterChange(), 2);
    directory_.write("preferences/d.json", R"({"k": 3})");
    EXPECT_EQ(valueAfterChange(), 3);
    // Even while somebody stays in it, which holds back the kernel's word that it is gone.
    const FileDescriptor user(::open(path_.c_str(), O_RDONLY | O_DIRECTORY));
    std::filesystem::remove_all(path_);
    std::filesystem::create_directory(path_);
    EXPECT_EQ(valueAfterChange(), -1);
    directory_.write("preferences/d.json", R"({"k": 4})");
    EXPECT_EQ(valueAfterChange(), 4);
}

TEST_F(LinuxPreferencesTest, ADirectoryBelowMissingParentsIsNoticed) {
    LinuxPreferences preferences(directory_.path("a/b/c"), log_);
    for (const char* step : {"a", "a/b", "a/b/c"}) {
        std::filesystem::create_directory(directory_.path(step));
        ASSERT_TRUE(isReadable(preferences.fileDescriptor())) << step;
        preferences.readChanges();
    }
    directory_.write("a/b/c/d.json", R"({"k": 5})");
    ASSERT_TRUE(isReadable(preferences.fileDescriptor()));
    preferences.readChanges();
    EXPECT_EQ(preferences.copyPreferenceValue("k", "d"), Value(5));
}

TEST_F(LinuxPreferencesTest, AMalformedFileIsAbsentAndToldOncePerState) {
    directory_.write("preferences/d.json", "{\n  \"k\": 1,\n  oops}");
    EXPECT_EQ(valueAfterChange(), -1);
    EXPECT_EQ(value(), -1);
    EXPECT_THAT(log_.take(), ElementsAre(AllOf(HasSubstr("3 zrrs " + path_ + "/d.json: line 3, column 3"))));
    std::filesystem::rename(path_, directory_.path("away"));
    std::filesystem::rename(directory_.path("away"), path_); // "anything may have changed", but it has not
    EXPECT_EQ(valueAfterChange(), -1);
    EXPECT_THAT(log_.take(), IsEmpty());
    directory_.write("preferences/d.json", "[1]");
    EXPECT_EQ(valueAfterChange(), -1);
    EXPECT_THAT(log_.take(), ElementsAre(HasSubstr("not an object")));
    directory_.write("preferences/d.json", R"({"k": 6})");
    EXPECT_EQ(valueAfterChange(), 6);
}

TEST_F(LinuxPreferencesTest, AValueIsStoredAtOnceBesideTheOthers) {
    namespace fs = std::filesystem;
    directory_.write("preferences/d.json", R"({"a":[1], "k":1})");
    fs::permissions(path_ + "/d.json", fs::perms(0640));
    EXPECT_EQ(valueAfterChange(), 1);
    EXPECT_EQ(preferences_.setPreferenceValue("k", "d", 2), std::nullopt);
    EXPECT_EQ(value(), 2) << "before the kernel has told of it";
    EXPECT_EQ(directory_.read("preferences/d.json"), "{\"a\":[1],\"k\":2}\n");
    EXPECT_EQ(valueAfterChange(), 2);
    EXPECT_EQ(preferences_.setPreferenceValue("k", "new", 1772366400.25), std::nullopt);
    EXPECT_EQ(directory_.read("preferences/new.json"), "{\"k\":1772366400.25}\n");
    EXPECT_EQ(fs::status(path_ + "/d.json").permissions(), fs::perms(0640));
    EXPECT_EQ(fs::status(path_ + "/new.json").permissions(), fs::perms(0600));
    EXPECT_EQ(std::distance(fs::directory_iterator(path_), fs::directory_iterator()), 2) << "nothing else";
}

TEST_F(LinuxPreferencesTest, WhatCannotBeStoredIsReadUntilTheFileChanges) {
    for (const auto& [content, fault] :
         {std::pair("{\"k\": 1,\n oops}", "line 2, column 2"), {"[1]", "no"}}) {
        directory_.write("preferences/d.json", content);
        EXPECT_EQ(valueAfterChange(), -1);
        EXPECT_THAT(preferences_.setPreferenceValue("k", "d", 7).value_or(""),
                    AllOf(HasSubstr(path_ + "/d.json: "), HasSubstr(fault)));
        EXPECT_EQ(directory_.read("preferences/d.json"), content);
        EXPECT_EQ(value(), 7);
        directory_.write("preferences/d.json", R"({"k": 1})");
        EXPECT_EQ(valueAfterChange(), 1);
    }
    std::filesystem::remove_all(path_);
    EXPECT_EQ(valueAfterChange(), -1);
    EXPECT_THAT(preferences_.setPreferenceValue("k", "d", 7).value_or(""), HasSubstr("No such file"));
    EXPECT_EQ(value(), 7);
    EXPECT_THAT(preferences_.setPreferenceValue("k", "../d", 7).value_or(""),
                HasSubstr("no preferences domain"));
}

TEST_F(LinuxPreferencesTest, ADomainNameIsNoPath) {
    directory_.write("outside.json", R"({"k": 1})");
    directory_.write("preferences/.hidden.json", R"({"k": 1})");
    for (const std::string_view domain : {"../outside"sv, ".hidden"sv, ""sv, "d\0x"sv, "/etc/x"sv}) {
        EXPECT_EQ(value("k", domain), -1) << domain;
    }
    EXPECT_THAT(log_.take(), IsEmpty());
}

TEST(LinuxDevicePropertiesTest, AreReadAgainWhenTheFileChanges) {
    const TemporaryDirectory directory;
    RecordingLog log;
    const LinuxDeviceProperties properties(directory.path("p.json"), log);
    EXPECT_EQ(properties.booleanProperty("InternalBuild"), std::nullopt);
    const std::pair<const char*, std::optional<bool>> cases[] = {
        {R"({"InternalBuild":true })", true}, {R"({"InternalBuild":false})", false},
        {R"({"InternalBuild":1})", {}},       {R"({"InternalBuild":true)", {}},
        {R"({"InternalBuild":true})", true},
    };
    for (const auto& [text, expected] : cases) {
        directory.write("p.json", text);
        EXPECT_EQ(properties.booleanProperty("InternalBuild"), expected) << text;
        EXPECT_EQ(properties.booleanProperty("InternalBuild"), expected) << text;
    }
    EXPECT_THAT(log.take(), ElementsAre(HasSubstr("p.json: InternalBuild is no boolean"),
                                        HasSubstr("p.json: line 1, column")));
    std::filesystem::remove(directory.path("p.json"));
    EXPECT_EQ(properties.booleanProperty("InternalBuild"), std::nullopt);
}

} // namespace
} // namespace tamblo
