#include "base/Json.h"
#include "base/Sha256.h"
#include "tests/Files.h"
#include "tools/export/DeviceIdentity.h"
#include "tools/export/RecordFormat.h"
#include "tools/export/RecordIdentifiers.h"
#include "tools/export/Redaction.h"
#include "tools/records/Payload.h"

#include <gmock/gmock.h>
#include <nlohmann/json.hpp>

#include <cstdlib>
#include <set>

// What a record looks like, and what of it does not leave the device.

namespace tamblo::tools {
namespace {

using nlohmann::json;
using testing::HasSubstr;

TEST(Sha256, AgreesWithTheStandardsExamples) {
    EXPECT_EQ(sha256(""), "e3b0c44298fc1c149afbf4c8996fb92427ae41e4649b934ca495991b7852b855");
    EXPECT_EQ(sha256("abc"), "ba7816bf8f01cfea414140de5dae2223b00361a396177a9cb410ff61f20015ad");
    EXPECT_EQ(sha256("abcdbcdecdefdefgefghfghighijhijkijkljklmklmnlmnomnopnopq"),
              "248d6a61d20638b8e5c026930c3e6039a33ce45964ff2167f6ecedd419db06c1");
    EXPECT_EQ(sha256(std::string(1'000'000, 'a')),
              "cdc76e5c9914fb9281a1c7e284d73e67f1809a48a497200e046d39ccc7112cd0");
}

constexpr std::string_view kLine =
    R"({"time":1795271169.763265,"event":"com.vandra.telephony.Volume.Generic","payload":{)"
    R"("HostApplicationDisplayID":"com.example.\"call\"\t\\","big":18446744073709551615,"far":1e300,)"
    R"("gain":-5,"list":[1,[],{"a":null}],"muted":false,"text":"Ger\u00e4t\n\u0000","volume":0.25},"new":{}})";

std::string exported(std::string_view format, std::string_view line) {
    const auto row = std::ranges::find(recordFormats(), format, &FormatRow::name);
    const auto made = row->make({.name = "de/vice", .version = "1.2"});
    const auto fields = parseJsonObject(line, {.mostLevels = kMostLevelsOfRecord});
    TextBuffer out;
    made->begin(out);
    made->add(out, {"id/1", "analytics-events", std::get<Dictionary>(fields)});
    made->end(out);
    return std::string(out.view());
}

TEST(RecordFormat, TypesValuesAsTheLogsOfOpenTelemetryAre) {
    const json request = json::parse(exported("otlp", kLine));
    const json& logs = request.at("resourceLogs").at(0);
    EXPECT_EQ(logs.at("resource").at("attributes"), json::parse(R"([
        {"key":"service.name","value":{"stringValue":"tamblod"}},
        {"key":"service.version","value":{"stringValue":"1.2"}},
        {"key":"device.id","value":{"stringValue":"de/vice"}}])"));
    const json& record = logs.at("scopeLogs").at(0).at("logRecords").at(0);
    EXPECT_EQ(record.at("timeUnixNano"), "1795271169763265000");
    EXPECT_EQ(record.at("eventName"), "com.vandra.telephony.Volume.Generic");
    EXPECT_EQ(record.at("attributes"), json::parse(R"([
        {"key":"log.record.uid","value":{"stringValue":"id/1"}},
        {"key":"tamblo.sink","value":{"stringValue":"analytics-events"}},
        {"key":"tamblo.application","value":{"stringValue":"com.example.\"call\"\t\\"}},
        {"key":"tamblo.service","value":{"stringValue":"telephony"}}])"));
    EXPECT_EQ(record.at("body"), json::parse(R"({"kvlistValue":{"values":[
        {"key":"event","value":{"stringValue":"com.vandra.telephony.Volume.Generic"}},
        {"key":"new","value":{"kvlistValue":{"values":[]}}},
        {"key":"payload","value":{"kvlistValue":{"values":[
            {"key":"HostApplicationDisplayID","value":{"stringValue":"com.example.\"call\"\t\\"}},
            {"key":"big","value":{"stringValue":"18446744073709551615"}},
            {"key":"far","value":{"doubleValue":1e300}},
            {"key":"gain","value":{"intValue":"-5"}},
            {"key":"list","value":{"arrayValue":{"values":[{"intValue":"1"},{"arrayValue":{"values":[]}},
                {"kvlistValue":{"values":[]}}]}}},
            {"key":"muted","value":{"boolValue":false}},
            {"key":"text","value":{"stringValue":"Ger\u00e4t\n\u0000"}},
            {"key":"volume","value":{"doubleValue":0.25}}]}}},
        {"key":"time","value":{"doubleValue":1795271169.763265}}]}})"));
}

TEST(RecordFormat, SeparatesColumnsByTabsAndNothingElse) {
    const std::string row = exported("columns", kLine);
    EXPECT_THAT(row, testing::StartsWith(
                         "id/1\tde/vice\t1.2\tanalytics-events\t1795271169763265000\t"
                         "com.vandra.telephony.Volume.Generic\t\tcom.example.\"call\"\\t\\\\\ttelephony\t{"));
    EXPECT_EQ(std::ranges::count(row, '\t'), 9);
    EXPECT_EQ(std::ranges::count(row, '\n'), 1);
    EXPECT_THAT(row, HasSubstr(R"("text":"Gerät\\n\\u0000")"));
    EXPECT_THAT(
        exported("columns", R"({"op":"open","session":"s.1","userInfo":{"ServiceName":"x_session"}})"),
        HasSubstr("\t0\topen\ts.1\t\tx_session\t"));
}

/// What the Protocol Buffers compiler makes of the input by the published description.
std::string compiledRecord(const std::string& act, const std::string& input) {
    const TemporaryDirectory directory;
    directory.write("in", input);
    const std::string command = "cd " + directory.path() + " && protoc --" + act +
                                "=tamblo.ExportedRecord -I'" EXAMPLES_DIR
                                "/../packaging' exported_record.proto <in >out";
    EXPECT_EQ(std::system(command.c_str()), 0) << command;
    return directory.read("out");
}

TEST(RecordFormat, WritesMessagesThatAnIndependentImplementationReadsAndWrites) {
    if (std::system("command -v protoc >/dev/null") != 0) {
        GTEST_SKIP() << "protoc is not installed (Debian: protobuf-compiler)";
    }
    std::string deepest = "{}";
    for (int level = 1; level != kMostLevelsOfRecord; ++level) {
        deepest = "{\"a\":" + deepest + "}";
    }
    for (const std::string_view line :
         {kLine, std::string_view("{}"), std::string_view(deepest),
          std::string_view(R"({"":"","time":0,"n":{"a":[[0.0,""],[true]]}})")}) {
        std::string message = exported("protobuf", line);
        std::size_t length = 0;
        std::size_t prefix = 0;
        for (unsigned shift = 0;; shift += 7) {
            const auto byte = static_cast<unsigned char>(message.at(prefix++));
            length |= std::size_t{byte & 0x7FU} << shift;
            if (byte < 0x80) {
                break;
            }
        }
        message.erase(0, prefix);
        EXPECT_EQ(message.size(), length);
        const std::string text = compiledRecord("decode", message);
        EXPECT_EQ(compiledRecord("encode", text), message) << text;
        EXPECT_THAT(text, HasSubstr("id: \"id/1\"\ndevice: \"de/vice\"\nversion: \"1.2\"\n"));
        if (line == kLine) {
            EXPECT_THAT(text, HasSubstr("time: 1795271169763265000\n"));
            EXPECT_THAT(text, HasSubstr("unsigned_integer: 18446744073709551615\n"));
        }
    }
}

TEST(Redaction, ReachesKeysWhereverTheyStand) {
    Redaction redaction;
    redaction.drop("a");
    redaction.hash("b");
    redaction.setSecret("one");
    const auto of = [](const Redaction& by, std::string_view line) {
        return jsonText(Value(by.of(std::get<Dictionary>(parseJsonObject(line)))));
    };
    EXPECT_EQ(of(redaction, R"({"a":{"x":1},"c":[{"a":1,"d":2}],"e":{"f":{"a":null,"g":"a"}}})"),
              R"({"c":[{"d":2}],"e":{"f":{"g":"a"}}})");
    const std::string hashed = of(redaction, R"({"b":"secret","c":{"b":"secret"}})");
    EXPECT_THAT(hashed, testing::MatchesRegex(R"(\{"b":"[0-9a-f]{16}","c":\{"b":"[0-9a-f]{16}"\}\})"));
    EXPECT_EQ(hashed.substr(6, 16), hashed.substr(hashed.rfind(":\"") + 2, 16));
    redaction.setSecret("two");
    EXPECT_NE(of(redaction, R"({"b":"secret","c":{"b":"secret"}})"), hashed);
}

TEST(RecordIdentifiers, TellDevicesFilesPlacesAndLinesApart) {
    std::set<std::string> all;
    std::size_t made = 0;
    for (const char* const device : {"d", "e"}) {
        for (const char* const file : {"f", "g"}) {
            for (const char* const secret : {"s", "t"}) {
                const RecordIdentifiers identifiers(device, "sink", file, secret);
                for (const char* const line : {R"({"time":1.5,"a":1})", R"({"time":1.6,"a":1})"}) {
                    all.insert(identifiers.of(0, line));
                    all.insert(identifiers.of(7, line));
                    made += 2;
                }
            }
        }
    }
    EXPECT_EQ(all.size(), made);
    EXPECT_THAT(*all.begin(), testing::MatchesRegex("d/sink/[0-9a-f]{16}/0-[0-9a-f]{8}"));
}

TEST(DeviceIdentity, IsThePropertyOrAHashThatASaltChanges) {
    const TemporaryDirectory directory;
    const wire::Directories directories{.runtime = {}, .configuration = directory.path("config"), .logs = {}};
    const std::string machine = directory.path("machine");
    const auto identity = [&] { return DeviceIdentity::read(directories, machine); };
    EXPECT_THAT(std::get<std::string>(identity()), HasSubstr("has no identity"));
    directory.write("machine", "0123456789abcdef0123456789abcdef\n");
    const auto hashed = std::get<DeviceIdentity>(identity());
    EXPECT_THAT(hashed.name, testing::MatchesRegex("[0-9a-f]{32}"));
    EXPECT_THAT(hashed.name, testing::Not(HasSubstr("0123456789abcdef")));
    directory.write("config/preferences/com.vandra.tamblo.export.json", R"({"device_salt":"grain"})");
    const auto salted = std::get<DeviceIdentity>(identity());
    EXPECT_NE(salted.name, hashed.name);
    EXPECT_NE(salted.secret, hashed.secret);
    directory.write("config/preferences/com.vandra.tamblo.export.json", R"({"device_salt":7})");
    EXPECT_NE(std::get<DeviceIdentity>(identity()).name, hashed.name) << "also a number";
    EXPECT_NE(std::get<DeviceIdentity>(identity()).name, salted.name);
    directory.write("config/preferences/com.vandra.tamblo.export.json", R"({"device_salt":"grain"})");
    for (const char* const name : {"", "unit 7"}) {
        directory.write("config/device-properties.json", json{{"FleetIdentifier", name}}.dump());
        EXPECT_EQ(std::get<DeviceIdentity>(identity()).name, name);
        EXPECT_EQ(std::get<DeviceIdentity>(identity()).secret, salted.secret);
    }
    EXPECT_THAT(std::get<std::string>(DeviceIdentity::read(directories, directory.path("config"))),
                HasSubstr("Is a directory"))
        << "another secret would make other identifiers";
    directory.write("config/device-properties.json", "{");
    EXPECT_THAT(std::get<std::string>(identity()), HasSubstr("device-properties.json"));
}

} // namespace
} // namespace tamblo::tools
