#include "os/HeldFile.h"
#include "platform/linux/device/BluetoothRecord.h"
#include "platform/linux/device/LinuxAccessories.h"
#include "platform/linux/device/LinuxDeviceConditions.h"
#include "platform/linux/device/LinuxProcessInformation.h"
#include "tests/platform/LinuxServiceSupport.h"
#include "wire/ConnectedAccessories.h"

#include <set>

#include <unistd.h>

// What is known of the device, from files such as the kernel and other daemons have them.

namespace tamblo {
namespace {

using namespace std::chrono_literals;
using namespace testing;

const std::string kKey = "\n[LinkKey]\nKey=00112233445566778899AABBCCDDEEFF\nType=4\n";
const std::string kIdentity = "[DeviceID]\nSource=1\nVendor=65535\nProduct=257\nVersion=515\n";
const std::string kEarbud = "[General]\nName=Class=1\nAppearance=0x0941\n" + kIdentity + kKey;

TEST(BluetoothRecordTest, TellsEarbudsAndTheirModel) {
    for (const std::string general :
         {"Class=0x240404", "Class=2360344\r", "Appearance=0x0941\nClass=0x000100",
          "Appearance=0x0000\nClass=0x240418"}) {
        EXPECT_TRUE(BluetoothRecord::parse("[General]\n" + general).isEarbud()) << general;
    }
    for (const std::string general : {"Class=0x24041c", "Class=0x240518", "Class=0x1240418", "Class=0x24041g",
                                      "Appearance=0x0942\nClass=0x240418", "[Other]\nClass=0x240418"}) {
        EXPECT_FALSE(BluetoothRecord::parse("[General]\n" + general).isEarbud()) << general;
    }
    const std::pair<std::string, std::string> models[] = {
        {kIdentity, "bluetooth:ffff:0101:0203"},
        {"[DeviceID]\nVersion=x\nProduct=0xFFFF\nVendor=1\nSource=2", "usb:0001:ffff:0000"},
        {"[DeviceID]\nSource=9\nVendor=65536\nProduct=1", "unknown:0000:0001:0000"},
        {"Vendor=7\n[DeviceID\nVendor=7\n=\n[]\n[", ""},
    };
    for (const auto& [text, model] : models) {
        EXPECT_EQ(BluetoothRecord::parse(text).model(), model) << text;
    }
    for (const std::string section : {"LinkKey", "LongTermKey", "PeripheralLongTermKey", "Other"}) {
        EXPECT_EQ(BluetoothRecord::parse("[" + section + "]\nKey=1").isPaired, section != "Other");
    }
}

class LinuxAccessoriesTest : public Test {
protected:
    LinuxAccessoriesTest() { directory.write("machine-id", "00112233445566778899aabbccddeeff\n"); }
    void addDevice(const std::string& adapter, const std::string& device,
                   const std::string& record = kEarbud) {
        directory.write("bt/" + adapter + "/" + device + "/info", record);
    }
    static std::string address(int number) { return "00:1B:66:AA:00:0" + std::to_string(number); }
    std::vector<Accessory> earbuds(const std::string& machine = "machine-id") {
        return LinuxAccessories(log, directory.path("accessories"), directory.path("bt"),
                                directory.path(machine))
            .connectedEarbuds();
    }

    TemporaryDirectory directory;
    FakeLog log;
};

TEST_F(LinuxAccessoriesTest, FindsPairedEarbudsEachOnce) {
    EXPECT_THAT(earbuds(), IsEmpty());
    addDevice(address(1), address(2));
    addDevice(address(1), address(3), "[General]\nClass=0x240418\n" + kKey);
    addDevice(address(1), address(4), "[General]\nAppearance=0x0941\n"); // was seen, never paired
    addDevice(address(1), address(5), kEarbud + std::string(300'000, '\n'));
    addDevice(address(9), address(2));
    addDevice(address(9), "cache");
    const std::vector<Accessory> found = earbuds();
    ASSERT_THAT(found, SizeIs(2));
    EXPECT_EQ(found[0].model, "bluetooth:ffff:0101:0203");
    EXPECT_EQ(found[1].model, "");
    // SipHash-2-4 of the address: the same at every start, another on another machine, and on none.
    EXPECT_EQ(found[0].identifier, "6880d6789892f418");
    directory.write("other", "10112233445566778899aabbccddeeff");
    EXPECT_THAT((std::set{found[0].identifier, found[1].identifier, earbuds("other")[0].identifier,
                          earbuds("none")[0].identifier}),
                SizeIs(4));
    EXPECT_THAT(log.take(), IsEmpty());
}

TEST_F(LinuxAccessoriesTest, CountsWhatIsConnectedAsLongAsSomebodyKnows) {
    addDevice(address(1), address(2));
    addDevice(address(1), address(3), "[General]\nClass=0x240414\n" + kKey); // a loudspeaker
    const std::string drawer = earbuds().at(0).identifier;
    const std::string speaker = MachineKey::read(directory.path("machine-id")).identifierOf(address(3));
    directory.write("accessories/none", "");
    HeldFile file(directory.path("accessories/connected.json"));
    const auto connect = [&file](const std::vector<wire::ConnectedAccessory>& accessories) {
        EXPECT_EQ(file.write(wire::connectedAccessoriesText(accessories)), 0);
    };
    connect({});
    EXPECT_THAT(earbuds(), IsEmpty()) << "paired ones that lie in a drawer are not connected";
    connect({{speaker, "x", "headset"}, {"new", "bluetooth:054c:0d58", "headphone"}, {"box", "", "speaker"}});
    ASSERT_THAT(earbuds(), SizeIs(1)) << "the record knows better what it is";
    EXPECT_EQ(earbuds()[0].identifier, "new");
    EXPECT_EQ(earbuds()[0].model, "bluetooth:054c:0d58");
    connect({{drawer, "x", ""}});
    ASSERT_THAT(earbuds(), SizeIs(1));
    EXPECT_EQ(earbuds()[0].model, "bluetooth:ffff:0101:0203");
    EXPECT_EQ(file.write("rubbish"), 0);
    EXPECT_THAT(earbuds(), SizeIs(1)) << "as if nobody knew";
    connect({});
    file.remove();
    EXPECT_THAT(earbuds(), SizeIs(1));
    // Left by one that was killed.
    directory.write("accessories/connected.json", "[]");
    EXPECT_THAT(earbuds(), SizeIs(1));
}

/// Thermal zones in a directory in place of `/sys`. Words: `/NAME` begins a zone, `FILE=TEXT` is a file of
/// it, `N=TYPE@TEMPERATURE` its trip point of that number.
void makeZones(const TemporaryDirectory& root, const std::string& description) {
    std::istringstream words(description);
    std::string zone;
    for (std::string word; words >> word;) {
        const std::size_t equals = word.find('='), at = word.find('@');
        const std::string name = word.substr(0, equals);
        if (word.front() == '/') {
            zone = "class/thermal" + word + "/";
        } else if (at == word.npos) {
            root.write(zone + name, word.substr(equals + 1) + "\n");
        } else {
            root.write(zone + "trip_point_" + name + "_type", word.substr(equals + 1, at - equals - 1));
            root.write(zone + "trip_point_" + name + "_temp", word.substr(at + 1) + "\n");
        }
    }
}

TEST(LinuxDeviceConditionsTest, TheWorstTripPointReachedIsTheThermalState) {
    const std::pair<const char*, int> cases[] = {
        {"/thermal_zone0 temp=59999 0=active@60000", 0},
        {"/thermal_zone0 temp=60000 0=active@60000", 1},
        {"/thermal_zone0 temp=60000 0=passive@60000", 2},
        {"/thermal_zone0 temp=60000 0=hot@60000", 3},
        {"/thermal_zone0 temp=80000 0=critical@105000 13=passive@80000 2=active@50000 3=other@1", 2},
        {"/thermal_zone0 temp=80000 0=active@50000 1=critical@80000", 3},
        {"/thermal_zone0 temp=50 0=active@50 /thermal_zone1 temp=60 0=passive@60 /thermal_zone2 temp=1", 2},
        {"/thermal_zone0 mode=disabled temp=60000 0=hot@60000", 0},
        {"/thermal_zone0 temp=60000 0=hot@0 1=critical@-274000 2=passive@ 3=hot@5x 4=active@1", 1},
        {"/thermal_zone0 0=hot@1 /thermal_zone1 temp= 0=hot@1 /thermal_zone2 temp=9x 0=hot@1", 0},
        {"/cooling_device0 temp=60000 0=hot@60000", 0},
    };
    for (const auto& [zones, expected] : cases) {
        const TemporaryDirectory root;
        makeZones(root, zones);
        EXPECT_EQ(LinuxDeviceConditions(root.path()).thermalState(), expected) << zones;
    }
}

TEST(LinuxDeviceConditionsTest, OnlyTheSavingProfileIsLowPowerAndAReadingStandsForASecond) {
    const TemporaryDirectory root;
    std::chrono::steady_clock::time_point now{};
    makeZones(root, "/thermal_zone0 temp=10 0=passive@50");
    const LinuxDeviceConditions conditions(root.path(), [&now] { return now; });
    EXPECT_EQ(conditions.thermalState(), 0);
    EXPECT_FALSE(conditions.isLowPowerModeEnabled());
    bool isLow = false;
    makeZones(root, "/thermal_zone0 temp=50");
    for (const std::string profile : {"low-power\n", "balanced\n", "low-power", "low-power-max\n"}) {
        root.write("firmware/acpi/platform_profile", profile);
        now += 999ms;
        EXPECT_EQ(conditions.isLowPowerModeEnabled(), isLow) << profile;
        EXPECT_EQ(conditions.thermalState(), profile == "low-power\n" ? 0 : 2);
        now += 1ms;
        isLow = profile == "low-power\n" || profile == "low-power";
        EXPECT_EQ(conditions.isLowPowerModeEnabled(), isLow) << profile;
    }
}

TEST(LinuxProcessInformationTest, TheFootprintIsWhatFilesCannotGiveBack) {
    const std::pair<const char*, std::int64_t> cases[] = {
        {"Name:\tx\nVmRSS:\t 99 kB\nRssAnon:\t   5 kB\nRssFile:\t 70 kB\nRssShmem:\t 2 kB\nVmSwap:\t 3 kB\n",
         10 * 1024},
        {"Name:\tx\nVmRSS:\t8388608 kB\nRssAnon:\t8388608 kB\n", 8LL << 30},
        {"Name:\tRssAnon: 5 kB\nVmRSS:\t99 kB\n", -ENODATA},
        {"Name:\tx\nVmRSS:\t99 kB\nRssAnon:", -ENODATA},
    };
    const TemporaryDirectory root;
    for (const auto& [status, expected] : cases) {
        root.write("self/status", status);
        const auto found = LinuxProcessInformation(root.path()).physicalFootprint();
        if (const auto* const error = std::get_if<ProcessInformation::QueryError>(&found)) {
            EXPECT_EQ(-error->code, expected) << status;
        } else {
            EXPECT_EQ(std::get<std::uint64_t>(found), static_cast<std::uint64_t>(expected)) << status;
        }
    }
}

class ProcessFilesTest : public Test {
protected:
    TemporaryDirectory root;
    const ProcessFiles files{root.path()};
};

/// Fields 3 to 24, each with its number in place of a value.
const std::string kFields = "S 4 5 6 7 -8 9 10 11 12 13 140 15 16 17 18 19 20 21 22 23 24";

TEST_F(ProcessFilesTest, UseIsReadBehindWhateverTheProcessCallsItself) {
    const auto page = static_cast<std::uint64_t>(::sysconf(_SC_PAGESIZE));
    const auto tick = std::chrono::microseconds(1'000'000 / ::sysconf(_SC_CLK_TCK));
    root.write("7/task/7/status", "Name:\ta\nvoluntary_ctxt_switches:\t3\nnonvoluntary_ctxt_switches:\t5\n");
    root.write("7/task/8/status", "Name:\tb\nvoluntary_ctxt_switches:\t30\nnonvoluntary_ctxt_switches:\t50");
    root.write("7/task/9/status", "Name:\tc");
    for (const std::string& stat : {"7 (a) " + kFields + " 25\n", "7 (a b) S 1 (c)\n(d) " + kFields}) {
        root.write("7/stat", stat);
        const auto sample = files.sample(7);
        ASSERT_TRUE(sample) << stat;
        EXPECT_EQ(sample->userTime, 140 * tick);
        EXPECT_EQ(sample->systemTime, 15 * tick);
        EXPECT_THAT(
            (std::vector{sample->minorFaults, sample->majorFaults, sample->threads, sample->residentBytes,
                         sample->voluntarySwitches, sample->involuntarySwitches}),
            ElementsAre(10U, 12U, 20U, 24 * page, 33U, 55U));
    }
    for (const std::string& stat :
         {"7 (a) " + kFields.substr(0, kFields.size() - 3), "7 " + kFields, std::string(") ")}) {
        root.write("7/stat", stat);
        EXPECT_FALSE(files.sample(7)) << stat;
    }
    EXPECT_FALSE(files.sample(6) || files.sample(0) || files.sample(-1));
    EXPECT_TRUE(LinuxProcessSampling().sample(::getpid())) << "the kernel's own file is as those above";
}

TEST_F(ProcessFilesTest, NamesAreUtf8AndThreadsNumbersUpToTheLimit) {
    for (const char* name : {"7", "12", "13", "self", "-3", "99999999999"}) {
        root.write(std::string("7/task/") + name + "/comm", std::string("t") + name + "\n");
    }
    EXPECT_THAT(files.threads(7), UnorderedElementsAre(7, 12, 13));
    EXPECT_THAT(files.threads(7, 2), SizeIs(2));
    EXPECT_THAT(files.threads(8), IsEmpty());
    EXPECT_EQ(files.threadName(7, 12), "t12");
    EXPECT_EQ(files.threadName(7, 14), std::nullopt);
    for (const auto& [comm, name] : {std::pair("0123456789abc\xE2\x82\n", "0123456789abc"),
                                     {"a\xFF\x62\xC3\n", "a?b?"},
                                     {"caf\xC3\xA9", "caf\xC3\xA9"}}) {
        root.write("7/comm", comm);
        EXPECT_EQ(files.name(7), name) << "cut within its last character, or no text at all";
    }
    EXPECT_FALSE(files.name(0) || files.name(8));
}

} // namespace
} // namespace tamblo
