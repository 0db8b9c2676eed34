// Battery and charging commands: exact frames, the control records the charger
// controller receives, node writes, properties, test-app messages and the fast-charge
// result report.
#include <sys/socket.h>

#include <chrono>
#include <filesystem>
#include <optional>
#include <ranges>

#include "platform/charger_control.h"
#include "platform/factory.h"
#include "platform/sim/power_models.h"
#include "tests/support/checks.h"
#include "tests/support/in_process.h"
#include "tests/support/test_name.h"

namespace {

namespace fs = std::filesystem;

const std::string kMcu = "/sys/kernel/debug/stm32l011/";
const std::string kBurn = kMcu + "burn_ctl";
const std::string kEnable = kMcu + "chg_enable";
const std::string kDchg = kMcu + "dchg_state";
const std::string kOutVersion = kMcu + "out_version";
const std::string kStatus = "/sys/class/power_supply/battery/status";
const std::string kFinish = "persist.sys.fast_charge.test_finish";
const std::string kPullDown = "/sys/class/power_supply/usb/usb_con_vbus_pull_down";
const std::string kAcAvg = "/sys/class/power_supply/cms/current_ac_avg_now";
const std::string kGone = "<gone>", kDir = "<dir>";  // given: the node removed, a directory in its place

std::string nv_pattern() { return nv_fill(0x21, 181); }  // every byte non-zero, so a stray write shows

using Setup = void (*)(const Sandbox &);
using Files = std::vector<std::pair<std::string, std::string>>;

struct Case {
    std::string line, tag;
    Files given;  // before the line: a path ("a|b": one value per read) or a property (no "/")
    std::string body, word;
    std::string events = "";  // the whole events.log afterwards
    Files after = {};         // device files and their whole contents afterwards
    Setup setup = nullptr;
    long min_ms = 0, max_ms = 0;  // the forms that sample block the daemon this long
};

std::vector<std::string> split(const std::string &text, char sep) {
    std::vector<std::string> out;
    for (auto part : std::views::split(text, sep)) out.emplace_back(part.begin(), part.end());
    return out;
}

void PrintTo(const Case &c, std::ostream *os) { *os << c.line << " " << c.tag; }

class PowerFamily : public InProcess, public ::testing::WithParamInterface<Case> {
protected:
    void SetUp() override {
        InProcess::SetUp();
        box.write("/.sim/nv.bin", nv_pattern());
    }
    void TearDown() override {
        is_sp = 0;
        InProcess::TearDown();
    }
    void give(const std::string &key, const std::string &value) {
        if (key.find('/') == std::string::npos) {
            box.set_prop(key, value);
        } else if (value == kGone || value == kDir) {
            fs::remove_all(box.path(key));
            if (value == kDir) fs::create_directories(box.path(key));
        } else if (value.find('|') != std::string::npos) {
            box.sequence(key, split(value, '|'));
        } else {
            box.write(key, value);
        }
    }
};

TEST_P(PowerFamily, Answers) {
    const Case &c = GetParam();
    for (const auto &[key, value] : c.given) give(key, value);
    if (c.setup) c.setup(box);
    const std::string want = frame(c.line, c.body, c.word);
    const auto t0 = std::chrono::steady_clock::now();
    EXPECT_EQ(serve(c.line, SRC_TCP, want.size()), want);
    const auto took = std::chrono::steady_clock::now() - t0;
    EXPECT_EQ(answer(1, 0), "");
    EXPECT_EQ(box.events(), c.events);
    for (const auto &[path, text] : c.after) EXPECT_EQ(box.read(path), text) << path;
    EXPECT_EQ(box.read("/.sim/nv.bin"), nv_pattern());
    if (c.max_ms) {
        EXPECT_GE(took, std::chrono::milliseconds(c.min_ms));
        EXPECT_LT(took, std::chrono::milliseconds(c.max_ms));
    }
}

std::string name_of(const ::testing::TestParamInfo<Case> &info) {
    return test_name(info.param.line) + (info.param.tag.empty() ? "" : "_" + info.param.tag);
}

const std::pair<std::string, std::string> kRefuse{"/.sim/faults", "testapp-refuse\n"},
    kSilent{"/.sim/faults", "testapp-silent\n"};
void at_mode(const Sandbox &) { is_sp = 1; }

const Files kMcuUntouched = {{kBurn, ""}, {kEnable, "1\n"}};
const Files kNoRecord = {{kBurn, ""}};

// clang-format off
INSTANTIATE_TEST_SUITE_P(ChargerController, PowerFamily, ::testing::Values(
    Case{"AT+QXCHARGE=0", "Charging", {}, "", "OK"},
    Case{"AT+QXCHARGE=0", "Discharging", {{kStatus, "Discharging\n"}}, "", "ERROR"},
    Case{"AT+QXCHARGE=0", "NoStatus", {{kStatus, kGone}}, "", "ERROR"},
    Case{"AT+QXCHARGE=1,5", "OneParameter", {}, "", "ERROR", "", kMcuUntouched},
    Case{"AT+QXCHARGE=1,5", "Discharged", {{kEnable, "0\n"}}, "\r\n\"state:discharge\"\r\n", "ERROR", "", kNoRecord},
    Case{"AT+QXCHARGE=1,5,7", "Unknown", {{kEnable, "on\n"}}, "\r\n\"state:exception\"\r\n", "ERROR", "", kNoRecord},
    Case{"AT+QXCHARGE=1,5,-7", "", {}, "", "OK", "charger param_a 5\ncharger param_b -7\n",
         {{"/.sim/charger", "param_a=5\nparam_b=-7\n"}}},
    Case{"AT+QXCHARGE=2,1", "", {{kEnable, "0\n"}}, "", "OK", "charger switch on\n",
         {{kEnable, "1\n"}, {kDchg, "dchg_running\n"}}},
    Case{"AT+QXCHARGE=2,0", "", {}, "", "OK", "charger switch off\n", {{kEnable, "0\n"}, {kDchg, "dchg_stop\n"}}},
    Case{"AT+QXCHARGE=2,1", "NoController", {{"/sys/kernel/debug/stm32l011", kGone}}, "", "ERROR"},
    Case{"AT+QXCHARGE=2,2", "", {}, "\"1,dchg_running\n\"", "ATOK", "", kMcuUntouched},
    Case{"AT+QXCHARGE=2,2", "NoStateNode", {{kEnable, kGone}}, "", "ATNG"},
    Case{"AT+QXCHARGE=2,2", "NoDchgNode", {{kDchg, kGone}}, "", "ATNG"},
    Case{"AT+QXCHARGE=2,3", "", {}, "", "ERROR", "", kMcuUntouched},
    Case{"AT+QXCHARGE=3,1", "", {{kMcu + "in_version", "2\n"}}, "\"2\"", "OK"},
    Case{"AT+QXCHARGE=3,0", "", {}, "\"7\"", "OK"},
    Case{"AT+QXCHARGE=3,0", "Unsuitable", {{kOutVersion, "2\n"}}, "\"MCU out version 2 is not suitable\"", "ERROR"},
    Case{"AT+QXCHARGE=3,0", "Twelve", {{kOutVersion, "12\n\n"}}, "\"12\n\"", "OK"},
    Case{"AT+QXCHARGE=3,0", "Empty", {{kOutVersion, ""}}, "", "ERROR"},
    Case{"AT+QXCHARGE=3,2", "", {}, "", "ERROR"},
    Case{"AT+QXCHARGE=4,-1", "", {}, "", "OK", "charger param_c -1\n"},
    Case{"AT+QXCHARGE=4", "NoValue", {}, "", "ERROR", "", kNoRecord},
    Case{"AT+QXCHARGE=4,x", "NotANumberIsZero", {}, "", "OK", "charger param_c 0\n"},
    Case{"AT+QXCHARGE=4,2147483648", "BeyondInt32", {}, "", "ERROR", "", kNoRecord},
    Case{"AT+QXCHARGE=1,5,-99999999999", "BeyondInt32", {}, "", "ERROR", "", kNoRecord},
    Case{"AT+QXCHARGE=5", "", {}, "", "ERROR"}),
    name_of);

const std::string kVbatDiff = "/sys/class/power_supply/battery/chg_est_vbat_diff";
const std::string kVolt = "/sys/class/power_supply/battery/voltage_now";
const std::string kSaver = "service-start com.zdr.SuperPowerSave/.SuperPowerSaveService "
                           "intent.action.SUPER_POWER_SAVE_SERVICE --es service_action ";
const std::string kSet = "message battery_mode set ", kGet = "message battery_mode get -> ";
void super_save(const Sandbox &b) { b.reply("battery_mode get", "super_save"); }

INSTANTIATE_TEST_SUITE_P(Battery, PowerFamily, ::testing::Values(
    Case{"AT+QXDLJ=1", "SinglePrecision", {{kVolt, "3855000\n"}}, "\"3.86,87%\"\r\n", "OK"},
    Case{"AT+QXDLJ=1", "DiffState", {{kVbatDiff, "1\n"}}, "\r\n\"chg_est_vbat_diff state error:1\"\r\n", "ERROR"},
    Case{"AT+QXDLJ=1", "NoDiffNode", {{kVbatDiff, kGone}}, "\r\n\"read chg_est_vbat_diff failed:2\"\r\n", "ERROR"},
    Case{"AT+QXDLJ=1", "NoCapacity", {{"/sys/class/power_supply/battery/capacity", kGone}}, "", "ERROR"},
    Case{"AT+QXDLJ=0", "", {}, "\"1\"", "OK"},
    Case{"AT+QXDLJ=0", "NoNode", {{"/sys/lcm/avdd_i2c_w_ret", kGone}}, "", "ERROR"},
    Case{"AT+QXDLJ=2", "", {}, "", "ERROR"},
    Case{"AT+QX_BAT_MODE=1,1", "", {}, "\"Pass\"", "OK", kSet + "1 -> ok\n"},
    Case{"AT+QX_BAT_MODE=1,0,display_id:4096", "Refused", {kRefuse}, "\"Fail\"", "OK",
         kSet + "0,display_id:4096 -> error\n"},
    Case{"AT+QX_BAT_MODE=1," + std::string(60, 'x'), "LongCut", {}, "\"Pass\"", "OK",
         kSet + std::string(32, 'x') + " -> ok\n"},
    Case{"AT+QX_BAT_MODE=1", "NoComma", {kSilent}, "\"Fail\"", "OK", kSet + " -> (silent)\n"},
    Case{"AT+QX_BAT_MODE=0", "", {}, "\"super_save\"", "OK", kGet + "super_save\n", {}, super_save},
    Case{"AT+QX_BAT_MODE=0", "Refused", {kRefuse}, "", "ERROR", kGet + "error\n"},
    Case{"AT+QX_BAT_MODE=2,1", "", {}, "", "ATOK", kSaver + "start\n"},
    Case{"AT+QX_BAT_MODE=2,0", "", {}, "", "ATOK", kSaver + "stop\n"},
    Case{"AT+QX_BAT_MODE=3", "", {}, "", "ERROR"}),
    name_of);

const std::string kCharge = "sys/bus/platform/devices/pm8921-charger/charge";
const std::string kTempSet = "/sys/devices/platform/battery/Charging_TemputerSet";
const std::string kCmsDebug = "/sys/kernel/debug/cms/debug";

INSTANTIATE_TEST_SUITE_P(NodeWrites, PowerFamily, ::testing::Values(
    Case{"AT+QXCHARG=0", "", {}, "", "OK", "", {{kCharge, "0"}}},
    Case{"AT+QXCHARG=1", "NoCharger", {{"/sys/bus/platform/devices/pm8921-charger", kGone}}, "", "ERROR"},
    Case{"AT+QXCHARG=2", "", {}, "", "ERROR", "", {{kCharge, "1\n"}}},
    Case{"AT+RMCHARGEP=0", "", {}, "", "OK", "", {{"/sys/class/power_supply/cms/present", "0"}}},
    Case{"AT+RMCHARGEP=1", "", {}, "", "ERROR", "", {{"/sys/class/power_supply/cms/present", "1\n"}}},
    Case{"AT+QXQXGWBH=1,0", "", {{kTempSet, "1\n"}}, "", "OK", "", {{kTempSet, "0"}}},
    Case{"AT+QXQXGWBH=1", "", {}, "", "ERROR", "", {{kTempSet, "0\n"}}},
    Case{"AT+QXDISRECHARGE=0", "", {}, "", "OK", "", {{kCmsDebug, "chg-cutoff"}}},
    Case{"AT+QXDISRECHARGE=1", "", {{kCmsDebug, "chg-cutoff"}}, "", "OK", "", {{kCmsDebug, "chg-open"}}},
    Case{"AT+QXDISRECHARGE=1", "NoNode", {{"/sys/kernel/debug/cms", kGone}}, "", "ERROR"}),
    name_of);

const std::string kPca = kMcu + "pca9468_rst";
const std::string kCout = kMcu + "ffc_cout_pin_state";
const std::string kBurnResult = kMcu + "mcu_fw_inside_burn_result";
const std::string kVendor = kMcu + "dchg_ic_vendor";

INSTANTIATE_TEST_SUITE_P(Queries, PowerFamily, ::testing::Values(
    Case{"AT+QX_PWR_RESET=1", "", {}, "", "ATOK"},
    Case{"AT+QX_PWR_RESET=1", "Failed", {{kPca, "0"}}, "Reset Test Fail", "ATNG"},
    Case{"AT+QX_PWR_RESET=1", "Other", {{kPca, "busy\n"}}, "busy\n", "ATNG"},
    Case{"AT+QX_PWR_RESET=1", "NoNode", {{kPca, kGone}}, "", "ATERROR"},
    Case{"AT+QX_PWR_RESET=1", "Unreadable", {{kPca, kDir}}, "Is a directory", "ATNG"},
    Case{"AT+QX_PWR_RESET=0", "", {}, "\r\n\"cmdline error!!\"\r\n", "ATERROR"},
    Case{"AT+QX_PWR_COUT=0", "", {}, "", "ATOK"},
    Case{"AT+QX_PWR_COUT=0", "Low", {{kCout, "0\n"}}, "\"error state : 0 \"", "ATNG"},
    Case{"AT+QX_PWR_COUT=0", "NoNode", {{kCout, kGone}}, "", "ATERROR"},
    Case{"AT+QX_PWR_COUT=1", "", {}, "\"invalid command\"", "ATERROR"},
    Case{"AT+QX_PWR_FG=0", "", {}, "", "ATOK"},
    Case{"AT+QX_PWR_FG=0", "BusDown", {{"/sys/class/power_supply/bq_bms/ex_fg_state", "0\n"}}, "", "ATNG"},
    Case{"AT+QX_PWR_FG=1", "", {}, "\"invalid command\"", "ATERROR"},
    Case{"AT+QXDCID=1", "", {}, "", "OK"},
    Case{"AT+QXDCID=1", "Hex", {{"/sys/class/power_supply/cms/power_avg", "0x1f\n"}}, "", "ERROR"},
    Case{"AT+QXDCID=0", "", {}, "", "ERROR"},
    Case{"AT+QX_CHG_UPD=1", "Burning", {{kBurnResult, "1\n"}}, "\r\n\"1\"\r\n", "ATOK"},
    Case{"AT+QX_CHG_UPD=1", "BothZeroFirst", {{kBurnResult, "1,0\n"}}, "\r\n\"0\"\r\n", "ATOK"},
    Case{"AT+QX_CHG_UPD=1", "Other", {{kBurnResult, "busy\n"}}, "\r\n\"busy\n\"\r\n", "ATNG"},
    Case{"AT+QX_CHG_UPD=1", "NoNode", {{kBurnResult, kGone}}, "\"1\"", "ATOK"},
    Case{"AT+QX_CHG_UPD=1", "Unreadable", {{kBurnResult, kDir}}, "\"read " + kBurnResult + " fail!\"", "ATNG"},
    Case{"AT+QX_CHG_UPD=2", "", {}, "", "ATERROR"},
    Case{"AT+QX_CHG_IC=1", "", {}, "\"PCA9468\"", "ATOK"},
    Case{"AT+QX_CHG_IC=1", "Empty", {{kVendor, ""}}, "\"read error:Success\"", "ATNG"},
    Case{"AT+QX_CHG_IC=1", "NoNode", {{kVendor, kGone}}, "", "ERROR"},
    Case{"AT+QX_CHG_IC=2", "", {}, "", "ATERROR"}),
    name_of);

const std::string kNotFinished = "\r\n\"current test not finish!\"\r\n";
const std::string kParamError = "\r\n\"parameter error\"\r\n";
const std::string kParamsProp = "persist.sys.fast_charge", kParams = "setprop " + kParamsProp + "=0,0\n";
const std::string kStarted = kParams + "setprop " + kFinish + "=0\nmessage fast_charge 9 2 -> ";
const std::string kFactoryState = "/sys/class/power_supply/cms/factory_mode_state";
const std::string kFactoryMode = "shell /system/bin/sh -c \"echo 1 > " + kFactoryState + "\"\n";
const std::string kPulled = "shell chmod 0666 " + kPullDown + "\nshell echo 1 >  " + kPullDown + "\n";
const std::string kReleased = kPulled + "shell echo 0 >  " + kPullDown + "\n";
const std::string kDischarging = "\r\n\"Discharging\"\r\n";
// The status node read by read: the initial reading, then one per 100 ms poll.
std::string statuses(int charging, const std::string &then) {
    std::string v;
    for (int i = 0; i < charging; ++i) v += "Charging|";
    return v + then;
}

INSTANTIATE_TEST_SUITE_P(FastCharge, PowerFamily, ::testing::Values(
    Case{"AT+QX_PWR_CHG=0,9,2", "", {}, "", "ATOK", kStarted + "ok\n"},
    Case{"AT+QX_PWR_CHG=0,9,2", "Refused", {kRefuse}, "", "ATERROR", kStarted + "error\n"},
    Case{"AT+QX_PWR_CHG=0,9,2", "AtMode", {}, "\r\n\"not support AT mode\"\r\n", "ATERROR", kParams, {}, at_mode},
    Case{"AT+QX_PWR_CHG=0,9,2", "Running", {{kFinish, "0"}}, kNotFinished, "ATERROR"},
    Case{"AT+QX_PWR_CHG=0,9", "", {}, kParamError, "ATERROR"},
    Case{"AT+QX_PWR_CHG=1", "", {}, "\r\n\"0,0\"\r\n", "ATOK"},
    Case{"AT+QX_PWR_CHG=1", "Finished", {{kFinish, "1"}, {kParamsProp, "9,2"}}, "\r\n\"9,2\"\r\n", "ATOK"},
    Case{"AT+QX_PWR_CHG=1", "Running", {{kFinish, "0"}}, kNotFinished, "ATERROR"},
    Case{"AT+QX_PWR_CHG=2,05", "", {}, kParamError, "ATERROR"},
    Case{"AT+QX_PWR_CHG=2", "NoCount", {}, kParamError, "ATERROR"},
    Case{"AT+QX_PWR_CHG=2,601", "OverAMinute", {}, kParamError, "ATERROR"},
    Case{"AT+QX_PWR_CHG=2,2", "NoNode", {{kAcAvg, kGone}}, "", "ATERROR", kFactoryMode},
    // Three samples 100 ms apart, summed in single precision.
    Case{"AT+QX_PWR_CHG=2,3", "", {{kAcAvg, "1000.005\n"}}, "\r\n\"1000.01\"\r\n", "ATOK", kFactoryMode,
         {{kFactoryState, "1\n"}}, nullptr, 300, 3000},
    // A replug: charging must stop within nine polls (else the pull-down stays on), then resume within two seconds.
    Case{"AT+QX_PWR_CHG=3", "Resumes", {{kStatus, statuses(2, "Discharging|Discharging|Discharging|Charging")}}, "",
         "ATOK", kReleased, {{kPullDown, "0\n"}}, nullptr, 400, 3000},
    Case{"AT+QX_PWR_CHG=3", "StopsAtPoll8", {{kStatus, statuses(8, "Discharging|Charging")}}, "", "ATOK", kReleased,
         {}, nullptr, 800, 3000},
    Case{"AT+QX_PWR_CHG=3", "StopsAtPoll9", {{kStatus, statuses(9, "Discharging|Charging")}}, kDischarging, "ATNG",
         kPulled, {{kPullDown, "1\n"}}, nullptr, 900, 3000},
    Case{"AT+QX_PWR_CHG=3", "NeverResumes", {{kStatus, "Discharging\n"}}, kDischarging, "ATNG", kReleased,
         {{kPullDown, "0\n"}}, nullptr, 2000, 6000},
    Case{"AT+QX_PWR_CHG=4", "", {}, "\r\n\"invalid command\"\r\n", "ATERROR"}),
    name_of);

const std::string kFast = "/cache/recovery/last_ChargeResult_fastCharge";
const std::string kNormal = "/cache/recovery/last_ChargeResult_normalCharge";
const std::string kFastText = "charge_type:9.0V/2.0A\nbattery_volt:4.35[V]\ncableR:120[mOhm]\ncharge_current:2000[mA]\n";
const std::string kNormalText = "charge_type:5V/2A\nbattery_volt:4.30\ncableR:150\ncharge_current:1500[mA]\n";
const std::string kPass = "+RESULT:\"1\"\r\n";
const std::string kChg1 = "\r\n+CHG1:\"1500\"\r\n", kNoVr = kPass + "+VR:\",\"" + kChg1;
Files done_with(const std::string &fast) { return {{kFinish, "1"}, {kFast, fast}, {kNormal, kNormalText}}; }

INSTANTIATE_TEST_SUITE_P(FastChargeResults, PowerFamily, ::testing::Values(
    Case{"AT+QX_CHG_CHARGE=1", "", done_with(kFastText), kPass + "+VR:\"4.35,120\"" + kChg1 + "+CHG2:\"2000\"\r\n",
         "ATOK"},
    Case{"AT+QX_CHG_CHARGE=1", "Type11V5A", done_with("charge_type:11.0V/5.0A[PPS]\ncharge_current:5000\n"),
         kNoVr + "+CHG5:\"5000\"\r\n", "ATOK"},
    Case{"AT+QX_CHG_CHARGE=1", "TypeLonger", done_with("charge_type:9.0V/2.0AX\ncharge_current:1\n"), kNoVr, "ATOK"},
    Case{"AT+QX_CHG_CHARGE=1", "NormalOnly", done_with(kGone), kPass + "+VR:\"4.30,150\"" + kChg1, "ATOK"},
    Case{"AT+QX_CHG_CHARGE=1", "NoNormal", {{kFinish, "1"}, {kFast, kFastText}}, "access normal test result failed!",
         "ATNG"},
    Case{"AT+QX_CHG_CHARGE=1", "FastUnreadable", done_with(kDir), "\"save fast charge result failed!\"", "ATNG"},
    Case{"AT+QX_CHG_CHARGE=1", "NormalUnreadable", {{kFinish, "1"}, {kNormal, kDir}},
         "\"save normal charge result failed!\"", "ATNG"},
    Case{"AT+QX_CHG_CHARGE=1", "NotFinished", {{kFast, kFastText}, {kNormal, kNormalText}},
         "+RESULT:\"0\"\r\n  test result failed!", "ATNG"},
    Case{"AT+QX_CHG_CHARGE=0", "", {}, "\"AT not support\"", "ATERROR"}),
    name_of);
// clang-format on

// On the real daemon: the averaging form holds the dispatch lock for its whole run, so a
// command from another channel is answered only after it.
TEST(PowerDaemon, AveragingBlocksEveryOtherChannel) {
    Sandbox box;
    Daemon d(box);
    int tcp = d.connect_tcp();
    ASSERT_GE(tcp, 0);
    ASSERT_TRUE(d.wait_prop("sys.qrcode.view", "0"));
    const auto t0 = std::chrono::steady_clock::now();
    send(tcp, "AT+QX_PWR_CHG=2,10", 18, MSG_NOSIGNAL);  // a TCP station sends bare lines
    ASSERT_TRUE(d.wait_log("recv line:AT+QX_PWR_CHG=2,10"));  // the TCP line is being served
    int local = d.connect_local();
    ASSERT_GE(local, 0);
    send(local, "AT+QXDLJ=0", 10, MSG_NOSIGNAL);
    EXPECT_EQ(read_some(local, 4096, 3000), "AT+QXDLJ=0\r\n\"1\"\r\nOK\r\n");
    const auto ms = std::chrono::duration_cast<std::chrono::milliseconds>(std::chrono::steady_clock::now() - t0).count();
    EXPECT_GE(ms, 10 * 100);
    const std::string frame = "AT+QX_PWR_CHG=2,10\r\n\r\n\"1480.00\"\r\n\r\nATOK\r\n";
    EXPECT_EQ(read_some(tcp, frame.size()), frame);
    close(local);
    close(tcp);
}

// The control records the charger controller receives, and the ones it refuses.
struct RecordCase {
    std::string name;
    std::optional<charger::Record> record;  // none: a record the encoder never makes
    std::string bytes;
    bool taken;
    std::string event, enable;  // its events.log line; chg_enable afterwards
};
class ChargerRecord : public ::testing::TestWithParam<RecordCase> {};

TEST_P(ChargerRecord, EncodesAndTheControllerDecodes) {
    const RecordCase &c = GetParam();
    Sandbox box;
    box.activate();
    if (c.record) {
        charger::Bytes out;
        const size_t n = charger::encode(*c.record, out);
        EXPECT_EQ(std::string(reinterpret_cast<const char *>(out.data()), n), c.bytes);
    }
    EXPECT_EQ(sim::charger_mcu_write(reinterpret_cast<const uint8_t *>(c.bytes.data()), c.bytes.size()), c.taken);
    EXPECT_EQ(box.events(), "charger " + c.event + "\n");
    EXPECT_EQ(box.read(kEnable), c.enable);
}

using charger::Op;
// clang-format off
INSTANTIATE_TEST_SUITE_P(Records, ChargerRecord, ::testing::Values(
    RecordCase{"SwitchOn", charger::Record{Op::Switch, 1}, {'\xC0', 1}, true, "switch on", "1\n"},
    RecordCase{"ParamA", charger::Record{Op::ParamA, 5}, {'\xC1', 5, 0, 0, 0}, true, "param_a 5", "1\n"},
    RecordCase{"ParamBNegative", charger::Record{Op::ParamB, -7}, "\xC2\xF9\xFF\xFF\xFF", true, "param_b -7", "1\n"},
    RecordCase{"ParamCLargest", charger::Record{Op::ParamC, 2147483647}, "\xC3\xFF\xFF\xFF\x7F", true,
               "param_c 2147483647", "1\n"},
    RecordCase{"BadOp", {}, "\xC4\x01", false, "bad-record C4 01", "1\n"},
    RecordCase{"ShortParam", {}, {'\xC1', 1, 2}, false, "bad-record C1 01 02", "1\n"},
    RecordCase{"BadSwitch", {}, "\xC0\x02", false, "bad-record C0 02", "1\n"}),
    [](const ::testing::TestParamInfo<RecordCase> &i) { return i.param.name; });
// clang-format on

}  // namespace
