// Power-off, reboot and debug-port commands: exact frames, the NV record, properties and
// the device effects that the simulated phone records.
#include <chrono>
#include <cstring>
#include <filesystem>
#include <functional>
#include <thread>

#include "tests/support/checks.h"
#include "tests/support/in_process.h"
#include "tests/support/test_name.h"

namespace {

const char *kSoc = "/sys/class/power_supply/battery/keep_chg_soc";
const char *kUsb = "sys.usb.config";
const char *kZdrem = "persist.sys.zdrem";
const std::string kCharging = "setprop sys.usb.config=charging";
const std::string kPn = "activity com.pyxa.engineermode/.PnActivity  --ei time ";
const std::string kExit = "service-stop com.pyxa.engineermode/.DpdtService  ";
const std::string kFastStop = "broadcast  com.android.phone.fastSearchNet.FastSearchNetService --es status 0";
const std::string kLong(130, 'x');

std::string nv_pattern() {  // every byte non-zero, so a cleared or a stray field shows
    return nv_fill(0x11, 199);
}
bool close_clears(size_t i) {
    for (size_t off : {12, 100, 104, 396, 488, 496, 688})
        if (i >= off && i < off + 4) return true;
    return false;
}

using Setup = std::function<void(const Sandbox &)>;
Setup fault(const char *name) { return [=](const Sandbox &b) { b.fault(name); }; }
Setup rep(const char *message, const char *reply) { return [=](const Sandbox &b) { b.reply(message, reply); }; }
Setup usb(const char *config) { return [=](const Sandbox &b) { b.set_prop(kUsb, config); }; }
const Setup nv_read = fault("nv-read"), nv_write = fault("nv-write"), no_cert = fault("clear-certificate");
void no_data(const Sandbox &b) { std::filesystem::remove_all(b.path("/data/vendor/engineermode")); }
void rt_flag(const Sandbox &b) { b.write("/.sim/nv.bin", nv_pattern().replace(8, 4, "\x2e\xfb\xff\xff", 4)); }

// Same: record untouched and no close; Written: the close stopped after its NV write;
// Closed: the whole close ran; Any: the record is checked elsewhere.
enum class Nv { Same, Written, Closed, Any };
struct Case {
    std::string line;
    Setup setup;
    const char *body, *word;
    Nv nv;
    std::vector<std::string> events = {};  // recorded in this order; the last one awaited
    const char *absent = nullptr;
    std::vector<std::pair<const char *, const char *>> props = {};
};

class PowerTest : public InProcess {
protected:
    void SetUp() override {
        InProcess::SetUp();
        box.write("/.sim/nv.bin", nv_pattern());
        box.write("/.sim/services", "com.pyxa.engineermode.DpdtService\ncom.android.phone.fastSearchNet.FastSearchNetService\n");
    }
    bool wait_event(const std::string &text, int ms = 8000) {  // workers sleep 1-2 s first
        return wait_until([&] { return box.events().find(text) != std::string::npos; }, ms);
    }
};
class PowerLine : public PowerTest, public ::testing::WithParamInterface<Case> {};

TEST_P(PowerLine, Answers) {
    const Case &c = GetParam();
    if (c.setup) c.setup(box);
    const std::string want = frame(c.line, c.body, c.word);
    EXPECT_EQ(serve(c.line, SRC_TCP, want.size()), want);
    ASSERT_TRUE(c.events.empty() || wait_event(c.events.back())) << box.events();
    const std::string log = box.events(), nv = box.read("/.sim/nv.bin"), orig = nv_pattern();
    const bool done = c.nv == Nv::Closed;
    if (c.nv != Nv::Any) {
        for (size_t i = 0; i < orig.size(); ++i)
            ASSERT_EQ(nv[i], c.nv != Nv::Same && close_clears(i) ? '\0' : orig[i]) << "NV byte " << i;
        EXPECT_EQ(box.prop("persist.sys.dloadmode"), done ? "0" : "");
        EXPECT_EQ(box.prop("persist.sys.factory.mode"), done ? "no" : "");
        EXPECT_EQ(box.read(kSoc), done ? "100" : "0\n");
        if (c.nv != Nv::Same) {
            EXPECT_EQ(box.prop("sys.dpdt.floating"), "0");
        }
    }
    EXPECT_FALSE(box.exists("/data/vendor/engineermode/at_test"));
    for (auto [name, value] : c.props) EXPECT_EQ(box.prop(name), value) << name;
    if (c.absent) {
        EXPECT_EQ(log.find(c.absent), std::string::npos) << log;
    }
    std::vector<std::string> seq;  // a whole close, in order, then the case's own effects
    if (done)
        seq = {kFastStop, kExit, "setprop sys.dpdt.floating=0", "nv write", "certificate clear", "sync ",
               "message restoreSystemSettings -> ", "shell /system/bin/sh -c \"rm -r /storage/sdcard0/ram_dump\"",
               "setprop persist.sys.dloadmode=0", "setprop persist.sys.factory.mode=no"};
    seq.insert(seq.end(), c.events.begin(), c.events.end());
    expect_in_order(log, seq);
}

const auto by_line = named_by([](const Case &c) { return c.line; });

INSTANTIATE_TEST_SUITE_P(Power, PowerLine, ::testing::Values(
    Case{"AT+QXADB=0,0", nullptr, "", "OK", Nv::Closed, {}, "message shutdown"},
    Case{"AT+QXADB=0,1", nullptr, "", "OK", Nv::Closed, {"message shutdown immediately -> ok"}},
    Case{"AT+QXACM=0", nullptr, "", "OK", Nv::Closed, {"message shutdown immediately -> ok"}},
    Case{"AT+QXADB=0,2", nullptr, "", "OK", Nv::Closed, {"message shutdown autoreboot -> ok"}},
    Case{"AT+QXADB=0,3", nullptr, "", "OK", Nv::Closed, {"message shutdown delay -> ok", kCharging}},
    Case{"AT+QXACM=3", nullptr, "", "OK", Nv::Closed, {"message shutdown delay -> ok", kCharging}},
    Case{"AT+QXACM=4", nullptr, "", "ERROR", Nv::Closed, {}, "message shutdown"},
    Case{"AT+QXADB=0,1", rep("shutdown immediately", "busy"), "", "ERROR", Nv::Closed},
    // A service that never stops holds the close only for a bounded time.
    Case{"AT+QXADB=0,1", fault("service-stuck"), "", "OK", Nv::Closed, {"message shutdown immediately -> ok"}},
    Case{"AT+QXADB=0,3", rep("shutdown delay", "no"), "", "ERROR", Nv::Closed},
    Case{"AT+QXADB=0,0", rep("restoreSystemSettings", "done ok"), "", "OK", Nv::Closed},
    Case{"AT+QX_SHD_TIME=1,36", nullptr, "", "ATOK", Nv::Closed,
         {kPn + "36", "service-start com.pyxa.engineermode/.PnService  --ei time 36", kExit, kFastStop, kCharging}, "ShutDown"},
    Case{"AT+QX_SHD_TIME=1,1200", nullptr, "", "ATOK", Nv::Closed, {kPn + "1200", kExit, kCharging}},
    Case{"AT+QX_SHD_TIME=1,35", nullptr, "", "ATOK", Nv::Closed,
         {"service-start com.pyxa.engineermode/.socketcommand.ShutDownService  \n", kExit, kCharging}, "PnActivity"},
    // A close that fails before, at or after its NV write.
    Case{"AT+QXADB=0,0", nv_read, "\"close_adb failed\"", "ERROR", Nv::Same, {}, "nv write"},
    Case{"AT+QXADB=0,1", nv_write, "\"close_adb failed\"", "ERROR", Nv::Same, {}, "certificate"},
    Case{"AT+QXADB=0,3", nv_write, "", "ERROR", Nv::Same, {}, "message"},
    Case{"AT+QXACM=4", nv_read, "", "ERROR", Nv::Same},
    Case{"AT+QXADB=0,2", no_cert, "\"close_adb failed\"", "ERROR", Nv::Written, {"nv write", "certificate clear"}, "message"},
    Case{"AT+QXADB=0,0", rep("restoreSystemSettings", "error"), "\"close_adb failed\"", "ERROR", Nv::Written,
         {"message restoreSystemSettings -> error"}, "shell"},
    Case{"AT+QXADB=0,0", fault("testapp-silent"), "\"close_adb failed\"", "ERROR", Nv::Written},
    Case{"AT+QXADB=0,0", no_data, "\"close_adb failed\"", "ERROR", Nv::Written, {"certificate clear"}, "message"},
    Case{"AT+QX_SHD_TIME=1,40", no_cert, "\"close debug port fail\"", "ATNG", Nv::Written, {}, "activity"},
    // Forms that do not close the port.
    Case{"AT+QXADB=1", usb("mtp"), "", "OK", Nv::Any, {}, nullptr,
         {{kUsb, "diag,serial_cdev,serial_tty,rmnet_ipa,mass_storage,adb"}, {kZdrem, "1"}}},
    Case{"AT+QXACM=1", usb("diag,adb"), "", "OK", Nv::Any, {}, "setprop sys.usb", {{kZdrem, "1"}}},
    Case{"AT+QXADB=1", nv_read, "\"get nv failed\"", "ERROR", Nv::Same, {}, kZdrem},
    Case{"AT+QXADB=1", nv_write, "", "ERROR", Nv::Same, {}, kZdrem},
    Case{"AT+QXACM=2", nv_read, "\"get NV failed\"", "ERROR", Nv::Same},
    Case{"AT+QXADB=0", nullptr, "", "ERROR", Nv::Same},
    Case{"AT+QXRT=0", rt_flag, "\r\n\"-1234\"\r\n", "OK", Nv::Any},
    Case{"AT+QXRT=0", nv_read, "", "ERROR", Nv::Same},
    Case{"AT+QXRT=1", nullptr, "\"not support\"", "ERROR", Nv::Same},
    Case{"AT+QXCOM=1,DIAG", nullptr, "", "OK", Nv::Same, {}, nullptr, {{kUsb, "diag,adb"}}},
    Case{"AT+QXCOM=1,adb", nullptr, "", "OK", Nv::Same, {}, nullptr, {{kUsb, "adb"}}},
    Case{"AT+QXCOM=1,NMEA", nullptr, "", "OK", Nv::Same, {}, nullptr, {{kUsb, "serial_smd,serial_tty"}}},
    Case{"AT+QXCOM=1,MTP", nullptr, "", "ERROR", Nv::Same, {}, "setprop"},
    Case{"AT+QXGJ=0", nullptr, "", "OK", Nv::Same, {"sync ", "poweroff cmd=0xDEAD0002 flags=0 reason=ATcommand\n"}},
    Case{"AT+QXGJ=1", nullptr, "", "ERROR", Nv::Same},
    Case{"AT+QXREBOOT=1", nullptr, "", "OK", Nv::Same, {"reboot cmd=0xDEAD0001 flags=0 reason=ATcommand\n"}, "sync"},
    Case{"AT+QX_LCM_DISP=1,PN-5012-0042", nullptr, "", "ATOK", Nv::Same,
         {"activity com.pyxa.engineermode/.PnActivity  --es pn PN-5012-0042\n"}},
    Case{"AT+QX_LCM_DISP=2,10,20", nullptr, "", "ATOK", Nv::Same, {"/.PnActivity  --es point 10,20\n"}},
    Case{"AT+QX_LCM_DISP=1," + kLong, nullptr, "", "ATOK", Nv::Same, {"--es pn " + kLong.substr(0, 120) + "\n"}},
    Case{"AT+QX_LCM_DISP=3,x", nullptr, "\"invalid command\"", "ATERROR", Nv::Same},
    Case{"AT+QX_SHD_TIME=1,3a", nullptr, "\"invalid paramter\"", "ATNG", Nv::Same},
    Case{"AT+QX_SHD_TIME=1,1201", nullptr, "", "ATNG", Nv::Same},
    // Values that wrap a 32-bit or 64-bit count back into the accepted range.
    Case{"AT+QX_SHD_TIME=1,4294967332", nullptr, "", "ATNG", Nv::Same, {}, "activity"},
    Case{"AT+QX_SHD_TIME=1,18446744073709551652", nullptr, "", "ATNG", Nv::Same, {}, "service"}), by_line);

// A close does not create a charge node the phone lacks, and AT+QXACM=4 never charges.
TEST_F(PowerTest, Acm4NeverChargesAndAMissingChargeNodeStaysMissing) {
    std::filesystem::remove(box.path(kSoc));
    EXPECT_EQ(serve("AT+QXACM=4"), frame("AT+QXACM=4", "", "ERROR"));
    EXPECT_FALSE(box.exists(kSoc));
    EXPECT_EQ(box.prop("persist.sys.factory.mode"), "no");
    EXPECT_FALSE(wait_event(kCharging, 1500));
}

// The debug-port field written by an open and a close reads back through both query forms.
TEST_F(PowerTest, AdbFlagReadsBackAfterOpenAndClose) {
    EXPECT_EQ(serve("AT+QXADB=1"), frame("AT+QXADB=1", "", "OK"));
    EXPECT_EQ(box.read("/.sim/nv.bin").substr(12, 4), std::string("\1\0\0\0", 4));
    EXPECT_EQ(serve("AT+QXADB=2"), frame("AT+QXADB=2", "\r\n\"1\"\r\n", "OK"));
    EXPECT_EQ(serve("AT+QXADB=0,0"), frame("AT+QXADB=0,0", "", "OK"));
    EXPECT_EQ(serve("AT+QXACM=2"), frame("AT+QXACM=2", "\r\n\"0\"\r\n", "OK"));
}

}  // namespace
