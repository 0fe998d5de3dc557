#include "platform/linux/device/LinuxAccessories.h"
#include "platform/linux/device/BluetoothRecord.h"
#include "tests/platform/LinuxServiceSupport.h"

#include <gmock/gmock.h>

#include <filesystem>
#include <set>
#include <string>
#include <vector>

#include <sys/fsuid.h>
#include <sys/stat.h>

namespace tamblo {
namespace {

using testing::ElementsAre;
using testing::IsEmpty;
using testing::SizeIs;

const std::string kKey = "\n[LinkKey]\nKey=00112233445566778899AABBCCDDEEFF\nType=4\n";
const std::string kIdentity = "[DeviceID]\nSource=1\nVendor=65535\nProduct=257\nVersion=515\n";
const std::string kEarbud = "[General]\nName=Class=1\nAppearance=0x0941\n" + kIdentity + kKey;

TEST(BluetoothRecordTest, TellsEarbudsAndTheirModel) {
    for (const std::string general : {"Class=0x240404", "Class=0x240418", "Class=2360344",
                                      "Appearance=0x0941", "Appearance=0x0941\nClass=0x000100",
                                      "Appearance=0x0000\nClass=0x240418", "Appearance=-1\nClass=0x240418"}) {
        EXPECT_TRUE(BluetoothRecord::parse("[General]\n" + general).isEarbud()) << general;
    }
    for (const std::string general :
         {"Class=0x24041c\r", "Class=0x240518", "Class=0x1240418", "Class=0x24041g",
          "Appearance=0x0942\nClass=0x240418", "[Other]\nClass=0x240418"}) {
        EXPECT_FALSE(BluetoothRecord::parse("[General]\n" + general).isEarbud()) << general;
    }
    const std::pair<std::string, std::string> models[] = {
        {kIdentity, "bluetooth:ffff:0101:0203"},
        {"[DeviceID]\nVersion=x\nProduct=0xFFFF\nVendor=1\nSource=2", "usb:0001:ffff:0000"},
        {"[DeviceID]\nSource=9\nVendor=65536\nProduct=1", "unknown:0000:0001:0000"},
        {"[DeviceID]\nSource=1\nVendor=0\nProduct=0", ""},
        {"Vendor=7\n[DeviceID\nVendor=7\n=\n[]\n[", ""},
    };
    for (const auto& [text, model] : models) {
        EXPECT_EQ(BluetoothRecord::parse(text).model(), model) << text;
    }
    for (const std::string section : {"LinkKey", "LongTermKey", "PeripheralLongTermKey", "Other"}) {
        EXPECT_EQ(BluetoothRecord::parse("[" + section + "]\nKey=1").isPaired, section != "Other");
    }
}

class LinuxAccessoriesTest : public testing::Test {
protected:
    LinuxAccessoriesTest() { directory.write("machine-id", "00112233445566778899aabbccddeeff\n"); }
    void addDevice(const std::string& adapter, const std::string& device, const std::string& record) {
        std::filesystem::create_directories(directory.path("bt/" + adapter + "/" + device));
        directory.write("bt/" + adapter + "/" + device + "/info", record);
    }
    static std::string address(int number) {
        char text[18];
        std::snprintf(text, sizeof text, "00:1B:66:AA:%02X:%02X", number / 256, number % 256);
        return text;
    }
    [[nodiscard]] LinuxAccessories accessories(const std::string& machine = "machine-id") {
        return LinuxAccessories(log, directory.path("bt"), directory.path(machine));
    }

    TemporaryDirectory directory;
    RecordingLog log;
};

TEST_F(LinuxAccessoriesTest, FindsPairedEarbudsEachOnce) {
    EXPECT_THAT(accessories().connectedEarbuds(), IsEmpty());
    addDevice(address(1), address(2), kEarbud);
    addDevice(address(1), address(3), "[General]\nClass=0x240418\n" + kKey);
    addDevice(address(1), address(4), "[General]\nAppearance=0x0941\n"); // was seen, never paired
    addDevice(address(1), address(5), kEarbud + std::string(300'000, '\n'));
    addDevice(address(9), address(2), kEarbud);
    addDevice("cache", address(6), kEarbud);
    addDevice(address(9), "cache", kEarbud);
    directory.write("bt/" + address(8), "no directory");
    const std::vector<Accessory> found = accessories().connectedEarbuds();
    ASSERT_THAT(found, SizeIs(2));
    EXPECT_EQ(found[0].model, "bluetooth:ffff:0101:0203");
    EXPECT_EQ(found[1].model, "");
    // SipHash-2-4 of the address: the same at every start, another on another machine, and on none.
    EXPECT_EQ(found[0].identifier, "6880d6789892f418");
    directory.write("other", "10112233445566778899aabbccddeeff");
    const std::set<std::string> different{found[0].identifier, found[1].identifier,
                                          accessories("other").connectedEarbuds()[0].identifier,
                                          accessories("none").connectedEarbuds()[0].identifier};
    EXPECT_THAT(different, SizeIs(4));
    EXPECT_THAT(log.take(), IsEmpty());
}

TEST_F(LinuxAccessoriesTest, LooksAtSoManyAdaptersAndDevices) {
    for (int i = 0; i < 260; ++i) {
        addDevice(address(1), address(i), kEarbud);
    }
    EXPECT_THAT(accessories().connectedEarbuds(), SizeIs(256));
    std::filesystem::remove_all(directory.path("bt"));
    for (int i = 0; i < 10; ++i) {
        addDevice(address(i), address(100 + i), kEarbud);
    }
    EXPECT_THAT(accessories().connectedEarbuds(), SizeIs(8));
}

TEST_F(LinuxAccessoriesTest, AClosedDirectoryIsToldOnce) {
    addDevice(address(1), address(2), kEarbud);
    ::chmod(directory.path("bt").c_str(), 0);
    LinuxAccessories closed = accessories();
    // The superuser, who may look everywhere, looks as nobody.
    const int user = ::setfsuid(65534);
    EXPECT_THAT(closed.connectedEarbuds(), IsEmpty());
    EXPECT_THAT(closed.connectedEarbuds(), IsEmpty());
    ::setfsuid(static_cast<uid_t>(user));
    EXPECT_THAT(log.take(), ElementsAre("1 zrrz " + directory.path("bt") +
                                        ": Permission denied; accessories are not known"));
    ::chmod(directory.path("bt").c_str(), 0700);
}

} // namespace
} // namespace tamblo
