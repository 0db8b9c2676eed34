// Storage commands: exact frames (bare CR and LF included), test-app messages, shell commands, files, OTG worker.
#include <filesystem>
#include <functional>

#include "core/port_state.h"
#include "handlers/storage.h"
#include "tests/support/checks.h"
#include "tests/support/in_process.h"
#include "tests/support/test_name.h"

namespace {

namespace fs = std::filesystem;

const char *kLifeA = "/sys/class/block/mmcblk0/device/dev_left_time_a";
const char *kLifeB = "/sys/class/block/mmcblk0/device/dev_left_time_b";
const char *kFw = "/sys/block/mmcblk0/device/firmware_version";
const char *kRev = "/sys/block/sda/device/rev";
const char *kBkops = "/sys/kernel/debug/mmc0/bkops_status";
const char *kDdrLog = "/data/vendor/last_ddr.txt";
const char *kCardFile = "/storage/sdcard1/sdcard_rw_test";
const std::string kStress = "shell /vendor/bin/stressapptest -s 60 -M 2831 -W > /data/vendor/last_ddr.txt&\n";
const std::string kMounts = "/dev/root / ext4 ro,seclabel,relatime 0 0\n/dev/block/dm-5 /data f2fs rw,lazytime 0 0\n";
const std::string kRoom1536k = "\r\n\"110.00,1.500\"\r\n";

std::string nv_pattern() { return nv_fill(0x21, 197); }  // every byte non-zero: no storage command may touch the record

using Setup = std::function<void(const Sandbox &)>;
Setup put(const char *path, const std::string &text) { return [=](const Sandbox &b) { b.write(path, text); }; }
Setup gone(const char *path) { return [=](const Sandbox &b) { fs::remove_all(b.path(path)); }; }
Setup reply(const char *message, const char *text) { return [=](const Sandbox &b) { b.reply(message, text); }; }
Setup both(Setup a, Setup b) { return [=](const Sandbox &s) { a(s), b(s); }; }
Setup fault(const char *name) { return [=](const Sandbox &b) { b.fault(name); }; }
const Setup kSilent = fault("testapp-silent"), kRefuse = fault("testapp-refuse");
const Setup kUart = [](const Sandbox &) { is_uart_flag = 1; };
// du counts whole kilobytes under /sdcard: with the small files already there, 1536 KB.
const Setup kShared1536k = put("/sdcard/DCIM/a.jpg", std::string(1535 * 1024, 'j'));
const Setup kUfs = put("sys/ufs/ufsid", "0x1ad\n");
Setup life(const char *a, const char *b) {  // nullptr: the node is missing
    return both(a ? put(kLifeA, a) : gone(kLifeA), b ? put(kLifeB, b) : gone(kLifeB));
}

struct Case {
    std::string name, line;  // name: the test's name after the line
    Setup setup;
    std::string body;
    const char *word;
    std::vector<std::string> events = {};  // recorded in this order
    const char *absent = nullptr;          // never recorded
    std::vector<std::pair<const char *, const char *>> files = {};  // path, content ("" = gone)
};
void PrintTo(const Case &c, std::ostream *os) { *os << c.line.substr(0, 40) << " " << c.name; }

class StorageTest : public InProcess {
protected:
    void SetUp() override {
        InProcess::SetUp();
        is_uart_flag = 0;
        box.write("/.sim/nv.bin", nv_pattern());
    }
    void TearDown() override {
        wait_workers(10000);  // the OTG workers cannot be stopped: they end before the sandbox goes
        is_uart_flag = 0;
        InProcess::TearDown();
    }
    bool wait_workers(int ms) { return wait_until([] { return otg_checks_running() == 0; }, ms); }
};
class StorageLine : public StorageTest, public ::testing::WithParamInterface<Case> {};

TEST_P(StorageLine, Answers) {
    const Case &c = GetParam();
    if (c.setup) c.setup(box);
    const std::string want = frame(c.line, c.body, c.word);
    EXPECT_EQ(serve(c.line, SRC_TCP, want.size()), want);
    const std::string log = box.events();
    expect_in_order(log, c.events);
    if (c.absent) {
        EXPECT_EQ(log.find(c.absent), std::string::npos) << log;
    }
    for (auto [path, content] : c.files) {
        if (*content) EXPECT_EQ(box.read(path), content) << path;
        else EXPECT_FALSE(box.exists(path)) << path;
    }
    EXPECT_EQ(box.read("/.sim/nv.bin"), nv_pattern());
}

const auto by_tag = named_by([](const Case &c) { return c.line.substr(0, 24) + "," + c.name; });

// clang-format off
// The card, the shared storage and the mass-storage switch.
INSTANTIATE_TEST_SUITE_P(Card, StorageLine, ::testing::Values(
    Case{"", "AT+QXSD=0", nullptr, "", "OK"},
    Case{"OldStyleMount", "AT+QXSD=0", put("/proc/mounts", kMounts + "sdcardfs /mnt/shell/emulated sdcardfs rw 0 0\n"), "", "OK"},
    Case{"NotMounted", "AT+QXSD=0", put("/proc/mounts", kMounts), "", "ERROR"},
    Case{"MountBeyond4096Bytes", "AT+QXSD=0",
         put("/proc/mounts", std::string(4090, '#') + "\n/dev/fuse /storage/emulated fuse rw 0 0\n"), "", "ERROR"},
    Case{"NoMountsNode", "AT+QXSD=0", gone("/proc/mounts"), "", "ERROR"},
    Case{"", "AT+QXTFWR=0", nullptr, "", "OK", {}, nullptr, {{kCardFile, ""}}},
    Case{"NoCard", "AT+QXTFWR=0", gone("/storage/sdcard1"), "\"create /storage/sdcard1/sdcard_rw_test fail\"", "ERROR"},
    // The shared-storage test leaves its own file and removes the card's.
    Case{"", "AT+QXUDWR=0", put(kCardFile, "old"), "", "OK", {}, nullptr,
         {{"/sdcard/sdcard_rw_test", "nihao"}, {"/data/media/0/sdcard_rw_test", "nihao"}, {kCardFile, ""}}},
    Case{"NoSharedStorage", "AT+QXUDWR=0", gone("/data/media/0"), "\"error:No such file or directory\"", "ERROR"},
    Case{"", "AT+QXSDCALI?", nullptr, "\"Not support!\"", "ERROR"},
    Case{"", "AT+OMENU=1,1", nullptr, "", "OK", {"message change_usb_mass 1 -> ok"}},
    Case{"Refused", "AT+OMENU=1,1", kRefuse, "", "ERROR", {"message change_usb_mass 1 -> error"}},
    Case{"EmptyShared", "AT+OMENU=1,1",
         [](const Sandbox &b) { fs::remove_all(b.path("/data/media/0")), fs::create_directory(b.path("/data/media/0")); },
         "", "ERROR", {}, "message"},
    Case{"", "AT+OMENU=0,1", nullptr, "", "OK", {"message change_usb_mass 0 -> ok"}},
    Case{"", "AT+OMENU=1,0", nullptr, "", "ERROR", {}, "message"}), by_tag);

// The data partition's size and the used space: the test app's figure, else du's.
INSTANTIATE_TEST_SUITE_P(Room, StorageLine, ::testing::Values(
    Case{"", "AT+QXUDROOM=0", nullptr, "\r\n\"110.00,500.000\"\r\n", "OK",
         {"message SystemCommand:fileSize:/sdcard/ -> ok524288000"}, "shell"},
    Case{"Fraction", "AT+QXUDROOM=0",
         both(reply("SystemCommand:fileSize:/sdcard/", "ok1572865"), put("/.sim/config", "statfs./data=3,1,1073741824\n")),
         "\r\n\"3.00,1.500\"\r\n", "OK"},
    Case{"Silent", "AT+QXUDROOM=0", both(kSilent, kShared1536k), kRoom1536k, "OK",
         {"message SystemCommand:fileSize:/sdcard/ -> (silent)", "shell du -sk /sdcard/"}},
    Case{"Refused", "AT+QXUDROOM=0", both(kRefuse, kShared1536k), kRoom1536k, "OK", {"shell du -sk /sdcard/"}},
    Case{"UartMode", "AT+QXUDROOM=0", both(kUart, kShared1536k), kRoom1536k, "OK", {"shell du -sk /sdcard/"}, "message"},
    Case{"NoShellOutput", "AT+QXUDROOM=0", both(kUart, fault("ext-system")),
         "\r\n\" sdcard mount failed \"\r\n", "ERROR"},
    Case{"NoSharedStorage", "AT+QXUDROOM=0", both(kUart, gone("/data/media/0")), "\r\n\" sdcard mount failed \"\r\n", "ERROR"},
    Case{"NoDataPartition", "AT+QXUDROOM=0", gone("/data"), "\r\n\" statfs data failed \"\r\n", "ERROR", {}, "message"},
    Case{"", "AT+QXUDROOM=1", put("/storage/sdcard1/TestData/cam/a.bin", std::string(3 << 20, 'd')),
         "\r\n\"110.00,3.000\"\r\n", "OK", {}, "message"},
    Case{"NoTestData", "AT+QXUDROOM=1", gone("/storage/sdcard1/TestData"), "\r\n\"110.00,0.000\"\r\n", "OK"},
    Case{"NoDataPartition", "AT+QXUDROOM=1", gone("/data"), "\r\n\"0.00,0.000\"\r\n", "OK"}), by_tag);

// The flash chip: remaining life (the worse estimate, "04" the last passing), firmware, BOM.
INSTANTIATE_TEST_SUITE_P(Flash, StorageLine, ::testing::Values(
    Case{"AWorn", "AT+EMMCLEFT=0", life("0x05\n", "0x03\n"), "0x00000005\r\rNot Enough", "ERROR"},
    Case{"BWorn", "AT+EMMCLEFT=0", life("0x02\n", "0x04\n"), "0x00000004\r\rPass", "OK"},
    Case{"OnlyB", "AT+EMMCLEFT=0", life(nullptr, "0x0B\n"), "0x0000000B\r\rNot Enough", "ERROR"},
    Case{"OnlyA", "AT+EMMCLEFT=0", life("0x03", nullptr), "0x00000003\r\rPass", "OK"},
    Case{"NoNodes", "AT+EMMCLEFT=0", life(nullptr, nullptr), "", "ERROR"},
    Case{"EmptyNodes", "AT+EMMCLEFT=0", life("", ""), "0x000000\r\rNot Enough", "ERROR"},
    Case{"Ufs", "AT+EMMCLEFT=0", both(both(kUfs, put("/sys/ufs/DeviceLifeTimeEstA", "0x02\n")),
         both(put("/sys/ufs/life_time_a", "0x09\n"), put("/sys/ufs/life_time_b", "0x03\n"))), "0x00000003\r\rPass", "OK"},
    Case{"UfsNoNodes", "AT+EMMCLEFT=0", kUfs, "", "ERROR"},
    Case{"", "AT+EMMCFW=0", nullptr, "", "OK"},
    Case{"OldFirmware", "AT+EMMCFW=0", put(kFw, "0x0000001100000000\n"), "", "ERROR"},
    Case{"NoFirmwareNode", "AT+EMMCFW=0", gone(kFw), "", "ERROR"},
    Case{"OtherMaker", "AT+EMMCFW=0", both(put("/sys/block/mmcblk0/device/cid", "90014a4842...\n"), gone(kFw)), "", "OK"},
    Case{"", "AT+EMMCFW=1", nullptr, "\"0300\n\"\n", "OK"},
    Case{"Emmc", "AT+EMMCFW=1", gone(kRev), "\"0x0000001200000000\n\"\n", "OK"},
    Case{"NoNodes", "AT+EMMCFW=1", both(gone(kRev), gone(kFw)), "", "ERROR"},
    Case{"", "AT+QX_EMMC_TLC=1", put(kBkops, "2\n"), "\"2\"\n", "ATOK"},
    Case{"NoNode", "AT+QX_EMMC_TLC=1", gone(kBkops), "\"open bkops_status error : No such file or directory\"", "ATNG"},
    Case{"", "AT+QX_EMMC_BOM=1", nullptr, "\"MANUFACTURER:SAMSUNG,BOM:KLUDG4UHDB-B2D1\"\n", "ATOK"},
    Case{"Unreadable", "AT+QX_EMMC_BOM=1", fault("emmc-bom"), "\"MANUFACTURER:,BOM:\"\n", "ATNG"}),
    by_tag);

// The DDR stress run (seconds digits only, half the memory), its log and the boot check.
INSTANTIATE_TEST_SUITE_P(Ddr, StorageLine, ::testing::Values(
    Case{"", "AT+QXDDR=1,60,1", nullptr, "", "OK", {"shell ps|grep stressapptest", kStress, "sync"}},
    Case{"Running", "AT+QXDDR=1,60,1", put("/.sim/processes", "stressapptest\n"), "", "OK", {"shell ps|grep stressapptest"},
         "stressapptest -s"},
    Case{"Memory8G", "AT+QXDDR=1,3600,0", put("/proc/meminfo", "MemTotal:        8388608 kB\n"), "", "OK",
         {"shell /vendor/bin/stressapptest -s 3600 -M 4096 -W > /data/vendor/last_ddr.txt&\n"}},
    Case{"NoX", "AT+QXDDR=1,60", nullptr, "parameter error", "ERROR", {}, "shell"},
    Case{"ShellText", "AT+QXDDR=1,60;reboot,1", nullptr, "parameter error", "ERROR", {}, "shell"},
    Case{"HugeSeconds", "AT+QXDDR=1,1234567890,1", nullptr, "parameter error", "ERROR", {}, "shell"},
    Case{"", "AT+QXDDR=0", nullptr, "\"1\"", "OK"},
    Case{"Passed", "AT+QXDDR=0", put(kDdrLog, "Log: Duration 60s\nStatus: PASS - please verify\n"), "\"1\"", "OK"},
    Case{"HardwareError", "AT+QXDDR=0",
         put(kDdrLog, "Log: start\nReport Error: miscompare : Hardware Error: DIMM 0\nStatus: FAIL\n"), "\"0\"", "OK"},
    Case{"", "AT+QXDDR=2", put("/proc/cmdline", "console=ttyMSM0 DDR_CHECK=OK rootwait\n"), "", "OK"},
    Case{"Failed", "AT+QXDDR=2", put("/proc/cmdline", "console=ttyMSM0 DDR_CHECK=FAIL_RANK1_BYTE3 androidboot.x=y\n"),
         "DDR_CHECK=FAIL_RANK1_BYTE3 and", "ERROR"},
    Case{"NoCheck", "AT+QXDDR=2", nullptr, "", "ERROR"},
    Case{"NoCmdline", "AT+QXDDR=2", gone("/proc/cmdline"), "", "ERROR"},
    Case{"", "AT+QXDDR=3", nullptr, "", "ERROR"}), by_tag);

// The USB host port: the test app's switch, the device check's start and result, a stick's speed.
INSTANTIATE_TEST_SUITE_P(Otg, StorageLine, ::testing::Values(
    Case{"", "AT+QXOTG=1,5", nullptr, "", "OK", {"message otg_test 1 5 -> ok"}},
    Case{"NoX", "AT+QXOTG=1", nullptr, "", "ERROR", {}, "message"},
    Case{"LongX", "AT+QXOTG=1," + std::string(200, '7'), nullptr, "", "OK",
         {"message otg_test 1 " + std::string(200, '7') + " -> ok"}},
    Case{"", "AT+QXOTG=0", nullptr, "\r\n\"otg:1\"\r\n", "OK", {"message otg_test 0 -> ok"}},
    Case{"NoHost", "AT+QXOTG=0", reply("otg_test 0", "fail"), "\r\n\"otg:0\"\r\n", "OK"},
    Case{"EmptyReply", "AT+QXOTG=0", reply("otg_test 0", ""), "", "ERROR"},
    Case{"Silent", "AT+QXOTG=0", kSilent, "", "ERROR"},
    Case{"Zero", "AT+QX_OTG_DEV=1,0", nullptr, "\"para error\"", "ATNG", {}, "message"},
    Case{"TooLong", "AT+QX_OTG_DEV=1,601", nullptr, "\"para error\"", "ATNG", {}, "message"},
    Case{"NotANumber", "AT+QX_OTG_DEV=1,x", nullptr, "\"para error\"", "ATNG", {}, "message"},
    // Over TCP the station's line end stays in the line; it does not spoil the seconds.
    Case{"TcpLineEnd", "AT+QX_OTG_DEV=1,1\r\n", nullptr, "", "ATOK", {"message otg_test enable -> ok"}},
    Case{"Huge", "AT+QX_OTG_DEV=1,4294967297", nullptr, "\"para error\"", "ATNG", {}, "message"},
    Case{"Refused", "AT+QX_OTG_DEV=1,600", kRefuse, "\"open otg error\"", "ATNG", {"message otg_test enable -> error"},
         "setprop"},
    Case{"Unset", "AT+QX_OTG_DEV=0", nullptr, "\"-1\"", "ATNG"},
    Case{"", "AT+QX_OTG_DEV=0", [](const Sandbox &b) { b.set_prop("sys.otg.dev", "1"); }, "", "ATOK"},
    Case{"NoDevice", "AT+QX_OTG_DEV=0", [](const Sandbox &b) { b.set_prop("sys.otg.dev", "0"); }, "\"0\"", "ATNG"},
    Case{"", "AT+QX_OTG_UDRW=1", reply("otg_udrw_test 1", "ok,12.5MB/s"), "\r\n\"ok,12.5MB/s\"\r\n", "ATOK",
         {"message otg_udrw_test 1 -> ok,12.5MB/s"}},
    Case{"WriteError", "AT+QX_OTG_UDRW=1", reply("otg_udrw_test 1", "write error"), "", "ATERROR"},
    Case{"Silent", "AT+QX_OTG_UDRW=1", kSilent, "", "ATERROR"},
    Case{"Refused", "AT+QX_OTG_UDRW=0", kRefuse, "", "ATOK", {"message otg_udrw_test 0 -> error"}},
    Case{"", "AT+QX_OTG_UDRW=2", nullptr, "", "ATERROR", {}, "message"}), by_tag);
// clang-format on

// The worker tries once a second, as often as it was told (a later device is not seen); times from the property's.
const std::string kHub = "T:  Bus=01 Lev=00 Prnt=00 Port=00 Cnt=00 Dev#=  1 Spd=480  MxCh= 1\n"
                         "I:* If#= 0 Alt= 0 #EPs= 1 Cls=09(hub  ) Sub=00 Prot=00 Driver=hub";
const std::string kStick = kHub + "\nI:* If#= 0 Alt= 0 #EPs= 2 Cls=08(stor.) Sub=06 Prot=50 Driver=usb-storage";
const std::string kKeyboard = kHub + "\nI:* If#= 0 Alt= 0 #EPs= 1 Cls=03(HID  ) Sub=01 Prot=01 Driver=usbhid";

struct OtgRun {
    const char *name;
    int tries;
    std::vector<std::string> reads;  // the devices node at each read, the last repeating; none: no node
    bool found;
};
class OtgWorker : public StorageTest, public ::testing::WithParamInterface<OtgRun> {};

TEST_P(OtgWorker, ReportsThroughItsProperty) {
    const OtgRun &r = GetParam();
    if (r.reads.empty()) fs::remove(box.path("/sys/kernel/debug/usb/devices"));
    else box.sequence("/sys/kernel/debug/usb/devices", r.reads);
    box.set_prop("sys.otg.dev", "-1");
    const std::string line = "AT+QX_OTG_DEV=1," + std::to_string(r.tries);
    EXPECT_EQ(serve(line), frame(line, "", "ATOK"));
    ASSERT_TRUE(wait_workers(std::min(r.tries, 5) * 1000 + 3000));
    EXPECT_EQ(serve("AT+QX_OTG_DEV=0"), frame("AT+QX_OTG_DEV=0", r.found ? "" : "\"0\"", r.found ? "ATOK" : "ATNG"));
    long long cleared = -1, set = -1;
    for (const Event &e : box.event_list()) {
        if (e.kind == "setprop" && e.detail == "sys.otg.dev=0") cleared = e.ms;
        if (e.kind == "setprop" && e.detail == "sys.otg.dev=1") set = e.ms;
    }
    ASSERT_GE(cleared, 0) << box.events();
    ASSERT_EQ(set >= 0, r.found) << box.events();
    if (!r.found) return;
    const long long n = static_cast<long long>(r.reads.size());  // found on read n: n one-second waits
    EXPECT_GE(set - cleared, n * 1000 - 5);
    EXPECT_LT(set - cleared, n * 1000 + 900);
}

INSTANTIATE_TEST_SUITE_P(Storage, OtgWorker, ::testing::Values(
    OtgRun{"StickOnThirdTry", 3, {kHub, kHub, kStick}, true},
    OtgRun{"KeyboardOnSecondTry", 10, {kHub, kKeyboard}, true},
    OtgRun{"StickAfterTheLastTry", 2, {kHub, kHub, kStick}, false},
    OtgRun{"NoUsbNode", 600, {}, false}),  // ends at its first try, not after 600
    [](const ::testing::TestParamInfo<OtgRun> &info) { return std::string(info.param.name); });

// A second start within the stress run's seconds finds it in the process list; one after them starts it again.
TEST_F(StorageTest, DdrStressStartsAgainOnlyAfterItsSeconds) {
    const std::string line = "AT+QXDDR=1,1,0", ok = frame(line, "", "OK");
    EXPECT_EQ(serve(line), ok);
    EXPECT_EQ(serve(line), ok);
    auto starts = [&] {
        std::vector<long long> at;
        for (const Event &e : box.event_list())
            if (e.kind == "shell" && e.detail.find("stressapptest -s 1 ") != std::string::npos) at.push_back(e.ms);
        return at;
    };
    ASSERT_EQ(starts().size(), 1u) << box.events();
    wait_until([&] {  // the line again and again until it starts the program once more
        EXPECT_EQ(serve(line), ok);
        return starts().size() >= 2;
    }, 5000);
    std::vector<long long> at = starts();
    ASSERT_EQ(at.size(), 2u) << box.events();
    EXPECT_GE(at[1] - at[0], 1000);
}

}  // namespace
