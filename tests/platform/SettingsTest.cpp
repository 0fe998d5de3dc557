#include "platform/linux/settings/LinuxDeviceProperties.h"
#include "platform/linux/settings/LinuxPreferences.h"
#include "tests/fakes/FakeWorkQueues.h"
#include "tests/platform/LinuxServiceSupport.h"

#include <gmock/gmock.h>

#include <sys/stat.h>

namespace tamblo {
namespace {

namespace fs = std::filesystem;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::SizeIs;

TEST(JsonFileTest, WhatIsWrongIsAbsentAndToldOncePerState) {
    const TemporaryDirectory directory;
    RecordingLog log;
    JsonFile file(directory.path("f.json"), 100);
    EXPECT_EQ(file.read(log), std::nullopt);
    EXPECT_THAT(log.take(), IsEmpty()) << "a missing file is no fault";
    const std::pair<std::string, const char*> cases[] = {
        {"{\n  \"k\": 1,\n  oops}", "f.json: line 3, column 3: "},
        {"{\n  \"k\": 10,\n  oops}", "f.json: line 3, column 3: "}, // another state
        {"[1]", "not an object"},
        {std::string(101, ' '), "File too large"},
    };
    for (const auto& [content, fault] : cases) {
        directory.write("f.json", content);
        EXPECT_EQ(file.read(log), std::nullopt);
        EXPECT_EQ(file.read(log), std::nullopt);
        EXPECT_THAT(log.take(), ElementsAre(HasSubstr(fault)));
    }
    directory.write("f.json", R"({"k": 6, "none": null})");
    EXPECT_EQ(file.read(log), (Dictionary{{"k", 6}}));
    directory.write("f.json", "[1, null, {}]");
    EXPECT_EQ(file.read(log), std::nullopt);
    EXPECT_THAT(log.take(), SizeIs(1)) << "told anew after it was well";
    int elements = 0;
    EXPECT_TRUE(file.readArray([&elements](const JsonItem&) { ++elements; }, log));
    EXPECT_EQ(elements, 2);
    fs::remove(directory.path("f.json"));
    ASSERT_EQ(::mkfifo(directory.path("f.json").c_str(), 0600), 0);
    EXPECT_EQ(file.read(log), std::nullopt) << "a pipe, which nobody waits for";
    EXPECT_THAT(log.take(), ElementsAre(HasSubstr("not a regular file")));
}

class LinuxPreferencesTest : public testing::Test {
protected:
    LinuxPreferencesTest() { fs::create_directory(path_); }

    void write(const std::string& content) const { directory_.write("preferences/d.json", content); }
    [[nodiscard]] std::string content() const { return directory_.read("preferences/d.json"); }
    void takeInChange() {
        const std::uint64_t before = preferences_.generation();
        while (isReadable(preferences_.fileDescriptor(), preferences_.generation() == before ? 2000 : 0)) {
            preferences_.readChanges();
        }
        EXPECT_NE(preferences_.generation(), before);
    }
    /// What is in force, or -1.
    [[nodiscard]] std::int64_t value(std::string_view key = "k", std::string_view domain = "d") const {
        const std::optional<Value> value = preferences_.copyPreferenceValue(key, domain);
        return value ? value->integerValue() : -1;
    }
    std::int64_t valueAfterChange() {
        takeInChange();
        return value();
    }
    void set(std::string_view key, int value, Work afterwards = {}) {
        preferences_.setPreferenceValue(key, "d", value, std::move(afterwards));
    }
    std::size_t store() { return queues_.run("com.vandra.tamblo.preferences"); }

    TemporaryDirectory directory_;
    const std::string path_ = directory_.path("preferences");
    RecordingLog log_;
    FakeWorkQueues queues_;
    LinuxPreferences preferences_{path_, queues_, log_};
};

TEST_F(LinuxPreferencesTest, FollowTheFiles) {
    directory_.write("outside.json", R"({"k": 1})");
    EXPECT_EQ(value("k", "../outside"), -1) << "a domain is no path";
    EXPECT_EQ(value(), -1);
    write(R"({"k": 1})");
    EXPECT_EQ(valueAfterChange(), 1);
    EXPECT_EQ(value("other"), -1);
    write(R"({"k": 2})");
    EXPECT_EQ(value(), 1) << "read once, until a change is told";
    EXPECT_EQ(valueAfterChange(), 2);
    fs::rename(path_, directory_.path("away"));
    EXPECT_EQ(valueAfterChange(), -1);
    EXPECT_THAT(log_.take(), IsEmpty());
    fs::rename(directory_.path("away"), path_);
    EXPECT_EQ(valueAfterChange(), 2);
    const std::uint64_t before = preferences_.generation();
    directory_.write("preferences/notes.txt", "x");
    ASSERT_TRUE(isReadable(preferences_.fileDescriptor()));
    preferences_.readChanges();
    EXPECT_EQ(preferences_.generation(), before) << "no preference";
}

TEST_F(LinuxPreferencesTest, AValueIsInForceAtOnceAndStoredBesideTheOthers) {
    write(R"({"a":[1], "k":1})");
    EXPECT_EQ(valueAfterChange(), 1);
    const std::uint64_t before = preferences_.generation();
    std::string storedThen;
    set("k", 2, [&] { storedThen = content(); });
    set("l", 3);
    EXPECT_EQ(value(), 2);
    EXPECT_NE(preferences_.generation(), before);
    EXPECT_EQ(content(), R"({"a":[1], "k":1})") << "nobody has waited for the disk";
    write(R"({"a":[1], "k":9, "m":4})");
    EXPECT_EQ(valueAfterChange(), 2) << "is still to be stored";
    EXPECT_EQ(store(), 2U) << "both values with one piece, and what was to come afterwards";
    EXPECT_EQ(content(), "{\"a\":[1],\"k\":2,\"l\":3,\"m\":4}\n");
    EXPECT_EQ(storedThen, content());
    EXPECT_EQ(value(), 2);
    EXPECT_EQ(value("m"), 4);
    write(R"({"k": 5})");
    EXPECT_EQ(valueAfterChange(), 5);
}

TEST_F(LinuxPreferencesTest, WhatCannotBeStoredIsToldOnceAndInForceUntilTheFileChanges) {
    for (const char* const content : {"{oops}", "[1]"}) {
        write(content);
        takeInChange();
        for (const int number : {7, 8}) {
            set("k", number);
            store();
            EXPECT_EQ(value(), number);
        }
        EXPECT_EQ(this->content(), content);
        EXPECT_THAT(log_.take(),
                    ElementsAre(testing::AllOf(HasSubstr("d.json: "),
                                               HasSubstr("is forgotten when the service ends"))));
        write(R"({"k": 1})");
        EXPECT_EQ(valueAfterChange(), 1);
        set("k", 2);
        store();
        EXPECT_EQ(valueAfterChange(), 2);
        EXPECT_THAT(log_.take(), IsEmpty());
    }
}

TEST(LinuxDevicePropertiesTest, AreReadAgainWhenTheFileChanges) {
    const TemporaryDirectory directory;
    RecordingLog log;
    const LinuxDeviceProperties properties(directory.path("p.json"), log);
    const auto isInternal = [&properties] { return properties.booleanProperty("InternalBuild"); };
    EXPECT_EQ(isInternal(), std::nullopt);
    const std::pair<const char*, std::optional<bool>> cases[] = {
        {R"({"InternalBuild":true })", true}, {R"({"InternalBuild":false})", false},
        {R"({"InternalBuild":1})", {}},       {R"({"InternalBuild":true)", {}},
        {R"({"InternalBuild":true})", true},
    };
    for (const auto& [text, expected] : cases) {
        directory.write("p.json", text);
        EXPECT_EQ(isInternal(), expected) << text;
        EXPECT_EQ(isInternal(), expected) << text;
    }
    EXPECT_THAT(log.take(), ElementsAre(HasSubstr("p.json: InternalBuild is no boolean"),
                                        HasSubstr("p.json: line 1, column")));
    fs::remove(directory.path("p.json"));
    EXPECT_EQ(isInternal(), std::nullopt);
}

} // namespace
} // namespace tamblo
