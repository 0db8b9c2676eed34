// Battery and charging commands: exact frames, the control records the charger
// controller receives, node writes, properties, test-app messages and the fast-charge
// result report.
#include <sys/socket.h>

#include <chrono>
#include <filesystem>
#include <thread>

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
const std::string kStatus = "/sys/class/power_supply/battery/status";
const std::string kFast = "/cache/recovery/last_ChargeResult_fastCharge";
const std::string kNormal = "/cache/recovery/last_ChargeResult_normalCharge";
const std::string kFinish = "persist.sys.fast_charge.test_finish";
const std::string kPullDown = "/sys/class/power_supply/usb/usb_con_vbus_pull_down";

std::string nv_pattern() { return nv_fill(0x21, 181); }  // every byte non-zero, so a stray write shows

std::string bytes(std::initializer_list<int> b) {
    std::string s;
    for (int v : b) s += static_cast<char>(v);
    return s;
}

using Setup = void (*)(const Sandbox &);
using Files = std::vector<std::pair<std::string, std::string>>;

struct Case {
    std::string line, tag = "";
    Files given = {};           // device files written before the line ("" value: removed)
    Setup setup = nullptr;
    int sp = 0;
    std::string body, word;
    std::string events = "";    // the whole events.log afterwards
    Files after = {};           // device files and their whole contents afterwards
};

void PrintTo(const Case &c, std::ostream *os) { *os << c.line << " " << c.tag; }

class PowerBase : public InProcess {
protected:
    void SetUp() override {
        InProcess::SetUp();
        box.write("/.sim/nv.bin", nv_pattern());
    }
    void TearDown() override {
        is_sp = 0;
        InProcess::TearDown();
    }
};
class PowerFamily : public PowerBase, public ::testing::WithParamInterface<Case> {};

TEST_P(PowerFamily, Answers) {
    const Case &c = GetParam();
    is_sp = c.sp;
    for (const auto &[path, text] : c.given) {
        if (text.empty()) fs::remove_all(box.path(path));
        else box.write(path, text);
    }
    if (c.setup) c.setup(box);
    const std::string want = frame(c.line, c.body, c.word);
    EXPECT_EQ(serve(c.line, SRC_TCP, want.size()), want);
    EXPECT_EQ(answer(1, 0), "");
    EXPECT_EQ(box.events(), c.events);
    for (const auto &[path, text] : c.after) EXPECT_EQ(box.read(path), text) << path;
    EXPECT_EQ(box.read("/.sim/nv.bin"), nv_pattern());
}

std::string name_of(const ::testing::TestParamInfo<Case> &info) {
    return test_name(info.param.line) + (info.param.tag.empty() ? "" : "_" + info.param.tag);
}

void refuse(const Sandbox &b) { b.fault("testapp-refuse"); }
void silent(const Sandbox &b) { b.fault("testapp-silent"); }
void no_mcu(const Sandbox &b) { fs::remove_all(b.path(kMcu)); }

const Files kMcuUntouched = {{kBurn, ""}, {kMcu + "chg_enable", "1\n"}};

// clang-format off
INSTANTIATE_TEST_SUITE_P(ChargerController, PowerFamily, ::testing::Values(
    Case{.line = "AT+QXCHARGE=0", .tag = "Charging", .word = "OK"},
    Case{.line = "AT+QXCHARGE=0", .tag = "Discharging", .given = {{kStatus, "Discharging\n"}}, .word = "ERROR"},
    Case{.line = "AT+QXCHARGE=0", .tag = "NoStatus", .given = {{kStatus, ""}}, .word = "ERROR"},
    Case{.line = "AT+QXCHARGE=1,5", .tag = "OneParameter", .word = "ERROR", .after = kMcuUntouched},
    Case{.line = "AT+QXCHARGE=1,5", .tag = "Discharged", .given = {{kMcu + "chg_enable", "0\n"}},
         .body = "\r\n\"state:discharge\"\r\n", .word = "ERROR", .after = {{kBurn, ""}}},
    Case{.line = "AT+QXCHARGE=1,5,7", .tag = "StateUnknown", .given = {{kMcu + "chg_enable", "on\n"}},
         .body = "\r\n\"state:exception\"\r\n", .word = "ERROR", .after = {{kBurn, ""}}},
    Case{.line = "AT+QXCHARGE=1,5,-7", .word = "OK", .events = "charger param_a 5\ncharger param_b -7\n",
         .after = {{"/.sim/charger", "param_a=5\nparam_b=-7\n"}}},
    Case{.line = "AT+QXCHARGE=2,1", .given = {{kMcu + "chg_enable", "0\n"}}, .word = "OK", .events = "charger switch on\n",
         .after = {{kMcu + "chg_enable", "1\n"}, {kMcu + "dchg_state", "dchg_running\n"}}},
    Case{.line = "AT+QXCHARGE=2,0", .word = "OK", .events = "charger switch off\n",
         .after = {{kMcu + "chg_enable", "0\n"}, {kMcu + "dchg_state", "dchg_stop\n"}}},
    Case{.line = "AT+QXCHARGE=2,1", .tag = "NoController", .setup = no_mcu, .word = "ERROR"},
    Case{.line = "AT+QXCHARGE=2,2", .body = "\"1,dchg_running\n\"", .word = "ATOK", .after = kMcuUntouched},
    Case{.line = "AT+QXCHARGE=2,2", .tag = "NoStateNode", .given = {{kMcu + "chg_enable", ""}}, .word = "ATNG"},
    Case{.line = "AT+QXCHARGE=2,2", .tag = "NoDchgNode", .given = {{kMcu + "dchg_state", ""}}, .word = "ATNG"},
    Case{.line = "AT+QXCHARGE=2,3", .word = "ERROR", .after = kMcuUntouched},
    Case{.line = "AT+QXCHARGE=3,1", .given = {{kMcu + "in_version", "2\n"}}, .body = "\"2\"", .word = "OK"},
    Case{.line = "AT+QXCHARGE=3,0", .body = "\"7\"", .word = "OK"},
    Case{.line = "AT+QXCHARGE=3,0", .tag = "Unsuitable", .given = {{kMcu + "out_version", "2\n"}},
         .body = "\"MCU out version 2 is not suitable\"", .word = "ERROR"},
    Case{.line = "AT+QXCHARGE=3,0", .tag = "Twelve", .given = {{kMcu + "out_version", "12\n\n"}}, .body = "\"12\n\"", .word = "OK"},
    Case{.line = "AT+QXCHARGE=3,0", .tag = "Empty", .given = {{kMcu + "out_version", "x"}},
         .setup = [](const Sandbox &b) { b.write(kMcu + "out_version", ""); }, .word = "ERROR"},
    Case{.line = "AT+QXCHARGE=3,2", .word = "ERROR"},
    Case{.line = "AT+QXCHARGE=4,-1", .word = "OK", .events = "charger param_c -1\n"},
    Case{.line = "AT+QXCHARGE=4", .tag = "NoValue", .word = "ERROR", .after = {{kBurn, ""}}},
    Case{.line = "AT+QXCHARGE=4,x", .tag = "NotANumberIsZero", .word = "OK", .events = "charger param_c 0\n"},
    Case{.line = "AT+QXCHARGE=4,2147483648", .tag = "BeyondInt32", .word = "ERROR", .after = {{kBurn, ""}}},
    Case{.line = "AT+QXCHARGE=1,5,-99999999999", .tag = "BeyondInt32", .word = "ERROR", .after = {{kBurn, ""}}},
    Case{.line = "AT+QXCHARGE=5", .word = "ERROR"}),
    name_of);

const std::string kVbatDiff = "/sys/class/power_supply/battery/chg_est_vbat_diff";
const std::string kVolt = "/sys/class/power_supply/battery/voltage_now";
const std::string kCapacity = "/sys/class/power_supply/battery/capacity";
const std::string kAvdd = "/sys/lcm/avdd_i2c_w_ret";
const std::string kSaver = "service-start com.zdr.SuperPowerSave/.SuperPowerSaveService "
                           "intent.action.SUPER_POWER_SAVE_SERVICE --es service_action ";

INSTANTIATE_TEST_SUITE_P(Battery, PowerFamily, ::testing::Values(
    Case{.line = "AT+QXDLJ=1", .given = {{kVolt, "3850000\n"}, {kCapacity, "57\n"}}, .body = "\"3.85,57%\"\r\n", .word = "OK"},
    Case{.line = "AT+QXDLJ=1", .tag = "SinglePrecision", .given = {{kVolt, "3855000\n"}}, .body = "\"3.86,87%\"\r\n", .word = "OK"},
    Case{.line = "AT+QXDLJ=1", .tag = "DiffState", .given = {{kVbatDiff, "1\n"}},
         .body = "\r\n\"chg_est_vbat_diff state error:1\"\r\n", .word = "ERROR"},
    Case{.line = "AT+QXDLJ=1", .tag = "NoDiffNode", .given = {{kVbatDiff, ""}}, .body = "\r\n\"read chg_est_vbat_diff failed:2\"\r\n",
         .word = "ERROR"},
    Case{.line = "AT+QXDLJ=1", .tag = "NoCapacity", .given = {{kCapacity, ""}}, .word = "ERROR"},
    Case{.line = "AT+QXDLJ=0", .body = "\"1\"", .word = "OK"},
    Case{.line = "AT+QXDLJ=0", .tag = "NoNode", .given = {{kAvdd, ""}}, .word = "ERROR"},
    Case{.line = "AT+QXDLJ=2", .word = "ERROR"},
    Case{.line = "AT+QX_BAT_MODE=1,1", .body = "\"Pass\"", .word = "OK", .events = "message battery_mode set 1 -> ok\n"},
    Case{.line = "AT+QX_BAT_MODE=1,0,display_id:4096", .tag = "Refused", .setup = refuse, .body = "\"Fail\"", .word = "OK",
         .events = "message battery_mode set 0,display_id:4096 -> error\n"},
    Case{.line = "AT+QX_BAT_MODE=1," + std::string(60, 'x'), .tag = "LongCut", .body = "\"Pass\"", .word = "OK",
         .events = "message battery_mode set " + std::string(32, 'x') + " -> ok\n"},
    Case{.line = "AT+QX_BAT_MODE=1", .tag = "NoComma", .setup = silent, .body = "\"Fail\"", .word = "OK",
         .events = "message battery_mode set  -> (silent)\n"},
    Case{.line = "AT+QX_BAT_MODE=0", .setup = [](const Sandbox &b) { b.reply("battery_mode get", "super_save"); },
         .body = "\"super_save\"", .word = "OK", .events = "message battery_mode get -> super_save\n"},
    Case{.line = "AT+QX_BAT_MODE=0", .tag = "Refused", .setup = refuse, .word = "ERROR",
         .events = "message battery_mode get -> error\n"},
    Case{.line = "AT+QX_BAT_MODE=2,1", .word = "ATOK", .events = kSaver + "start\n"},
    Case{.line = "AT+QX_BAT_MODE=2,0", .word = "ATOK", .events = kSaver + "stop\n"},
    Case{.line = "AT+QX_BAT_MODE=3", .word = "ERROR"}),
    name_of);

const std::string kCharge = "sys/bus/platform/devices/pm8921-charger/charge";
const std::string kPresent = "/sys/class/power_supply/cms/present";
const std::string kTempSet = "/sys/devices/platform/battery/Charging_TemputerSet";
const std::string kCmsDebug = "/sys/kernel/debug/cms/debug";

INSTANTIATE_TEST_SUITE_P(NodeWrites, PowerFamily, ::testing::Values(
    Case{.line = "AT+QXCHARG=0", .word = "OK", .after = {{kCharge, "0"}}},
    Case{.line = "AT+QXCHARG=1", .tag = "NoCharger", .given = {{"/sys/bus/platform/devices/pm8921-charger", ""}}, .word = "ERROR"},
    Case{.line = "AT+QXCHARG=2", .word = "ERROR", .after = {{kCharge, "1\n"}}},
    Case{.line = "AT+RMCHARGEP=0", .word = "OK", .after = {{kPresent, "0"}}},
    Case{.line = "AT+RMCHARGEP=0", .tag = "NoNode", .given = {{"/sys/class/power_supply/cms", ""}}, .word = "ERROR"},
    Case{.line = "AT+RMCHARGEP=1", .word = "ERROR", .after = {{kPresent, "1\n"}}},
    Case{.line = "AT+QXQXGWBH=1,0", .given = {{kTempSet, "1\n"}}, .word = "OK", .after = {{kTempSet, "0"}}},
    Case{.line = "AT+QXQXGWBH=1", .word = "ERROR", .after = {{kTempSet, "0\n"}}},
    Case{.line = "AT+QXDISRECHARGE=0", .word = "OK", .after = {{kCmsDebug, "chg-cutoff"}}},
    Case{.line = "AT+QXDISRECHARGE=1", .given = {{kCmsDebug, "chg-cutoff"}}, .word = "OK", .after = {{kCmsDebug, "chg-open"}}},
    Case{.line = "AT+QXDISRECHARGE=1", .tag = "NoNode", .given = {{"/sys/kernel/debug/cms", ""}}, .word = "ERROR"}),
    name_of);

const std::string kPca = kMcu + "pca9468_rst";
const std::string kCout = kMcu + "ffc_cout_pin_state";
const std::string kFg = "/sys/class/power_supply/bq_bms/ex_fg_state";
const std::string kBurnResult = kMcu + "mcu_fw_inside_burn_result";
void burn_result_unreadable(const Sandbox &b) {
    fs::remove(b.path(kBurnResult));
    fs::create_directories(b.path(kBurnResult));
}

INSTANTIATE_TEST_SUITE_P(Queries, PowerFamily, ::testing::Values(
    Case{.line = "AT+QX_PWR_RESET=1", .word = "ATOK"},
    Case{.line = "AT+QX_PWR_RESET=1", .tag = "Failed", .given = {{kPca, "0"}}, .body = "Reset Test Fail", .word = "ATNG"},
    Case{.line = "AT+QX_PWR_RESET=1", .tag = "Other", .given = {{kPca, "busy\n"}}, .body = "busy\n", .word = "ATNG"},
    Case{.line = "AT+QX_PWR_RESET=1", .tag = "NoNode", .given = {{kPca, ""}}, .word = "ATERROR"},
    Case{.line = "AT+QX_PWR_RESET=1", .tag = "Unreadable",
         .setup = [](const Sandbox &b) { fs::remove(b.path(kPca)); fs::create_directories(b.path(kPca)); },
         .body = "Is a directory", .word = "ATNG"},
    Case{.line = "AT+QX_PWR_RESET=0", .body = "\r\n\"cmdline error!!\"\r\n", .word = "ATERROR"},
    Case{.line = "at+qx_pwr_reset=1", .tag = "LowerCase", .body = "\"AT not support\"", .word = "ERROR"},
    Case{.line = "AT+QX_PWR_COUT=0", .word = "ATOK"},
    Case{.line = "AT+QX_PWR_COUT=0", .tag = "Low", .given = {{kCout, "0\n"}}, .body = "\"error state : 0 \"", .word = "ATNG"},
    Case{.line = "AT+QX_PWR_COUT=0", .tag = "NoNode", .given = {{kCout, ""}}, .word = "ATERROR"},
    Case{.line = "AT+QX_PWR_COUT=1", .body = "\"invalid command\"", .word = "ATERROR"},
    Case{.line = "AT+QX_PWR_FG=0", .word = "ATOK"},
    Case{.line = "AT+QX_PWR_FG=0", .tag = "BusDown", .given = {{kFg, "0\n"}}, .word = "ATNG"},
    Case{.line = "AT+QX_PWR_FG=1", .body = "\"invalid command\"", .word = "ATERROR"},
    Case{.line = "AT+QXDCID=1", .word = "OK"},
    Case{.line = "AT+QXDCID=1", .tag = "Hex", .given = {{"/sys/class/power_supply/cms/power_avg", "0x1f\n"}}, .word = "ERROR"},
    Case{.line = "AT+QXDCID=0", .word = "ERROR"},
    Case{.line = "AT+QX_CHG_UPD=1", .body = "\r\n\"0\"\r\n", .word = "ATOK"},
    Case{.line = "AT+QX_CHG_UPD=1", .tag = "Burning", .given = {{kBurnResult, "1\n"}}, .body = "\r\n\"1\"\r\n", .word = "ATOK"},
    Case{.line = "AT+QX_CHG_UPD=1", .tag = "BothZeroFirst", .given = {{kBurnResult, "1,0\n"}}, .body = "\r\n\"0\"\r\n",
         .word = "ATOK"},
    Case{.line = "AT+QX_CHG_UPD=1", .tag = "Other", .given = {{kBurnResult, "busy\n"}}, .body = "\r\n\"busy\n\"\r\n", .word = "ATNG"},
    Case{.line = "AT+QX_CHG_UPD=1", .tag = "NoNode", .given = {{kBurnResult, ""}}, .body = "\"1\"", .word = "ATOK"},
    Case{.line = "AT+QX_CHG_UPD=1", .tag = "Unreadable", .setup = burn_result_unreadable,
         .body = "\"read /sys/kernel/debug/stm32l011/mcu_fw_inside_burn_result fail!\"", .word = "ATNG"},
    Case{.line = "AT+QX_CHG_UPD=2", .word = "ATERROR"},
    Case{.line = "AT+QX_CHG_IC=1", .body = "\"PCA9468\"", .word = "ATOK"},
    Case{.line = "AT+QX_CHG_IC=1", .tag = "Empty", .setup = [](const Sandbox &b) { b.write(kMcu + "dchg_ic_vendor", ""); },
         .body = "\"read error:Success\"", .word = "ATNG"},
    Case{.line = "AT+QX_CHG_IC=1", .tag = "NoNode", .given = {{kMcu + "dchg_ic_vendor", ""}}, .word = "ERROR"},
    Case{.line = "AT+QX_CHG_IC=2", .word = "ATERROR"}),
    name_of);

const std::string kNotFinished = "\r\n\"current test not finish!\"\r\n";
const std::string kParamError = "\r\n\"parameter error\"\r\n";
const std::string kStarted = "setprop persist.sys.fast_charge=0,0\nsetprop persist.sys.fast_charge.test_finish=0\n";
void running(const Sandbox &b) { b.set_prop(kFinish, "0"); }

INSTANTIATE_TEST_SUITE_P(FastCharge, PowerFamily, ::testing::Values(
    Case{.line = "AT+QX_PWR_CHG=0,9,2", .word = "ATOK", .events = kStarted + "message fast_charge 9 2 -> ok\n"},
    Case{.line = "AT+QX_PWR_CHG=0,9,2", .tag = "Refused", .setup = refuse, .word = "ATERROR",
         .events = kStarted + "message fast_charge 9 2 -> error\n"},
    Case{.line = "AT+QX_PWR_CHG=0,9,2", .tag = "AtMode", .sp = 1, .body = "\r\n\"not support AT mode\"\r\n", .word = "ATERROR",
         .events = "setprop persist.sys.fast_charge=0,0\n"},
    Case{.line = "AT+QX_PWR_CHG=0,9,2", .tag = "Running", .setup = running, .body = kNotFinished, .word = "ATERROR"},
    Case{.line = "AT+QX_PWR_CHG=0,9", .body = kParamError, .word = "ATERROR"},
    Case{.line = "AT+QX_PWR_CHG=1", .body = "\r\n\"0,0\"\r\n", .word = "ATOK"},
    Case{.line = "AT+QX_PWR_CHG=1", .tag = "Finished",
         .setup = [](const Sandbox &b) { b.set_prop(kFinish, "1"); b.set_prop("persist.sys.fast_charge", "9,2"); },
         .body = "\r\n\"9,2\"\r\n", .word = "ATOK"},
    Case{.line = "AT+QX_PWR_CHG=1", .tag = "Running", .setup = running, .body = kNotFinished, .word = "ATERROR"},
    Case{.line = "AT+QX_PWR_CHG=2,05", .body = kParamError, .word = "ATERROR"},
    Case{.line = "AT+QX_PWR_CHG=2", .tag = "NoCount", .body = kParamError, .word = "ATERROR"},
    Case{.line = "AT+QX_PWR_CHG=2,601", .tag = "OverAMinute", .body = kParamError, .word = "ATERROR"},
    Case{.line = "AT+QX_PWR_CHG=2,99999999999999999999", .tag = "Absurd", .body = kParamError, .word = "ATERROR"},
    Case{.line = "AT+QX_PWR_CHG=2,2", .tag = "NoNode", .given = {{"/sys/class/power_supply/cms/current_ac_avg_now", ""}},
         .word = "ATERROR", .events = "shell /system/bin/sh -c \"echo 1 > /sys/class/power_supply/cms/factory_mode_state\"\n"},
    Case{.line = "AT+QX_PWR_CHG=4", .body = "\r\n\"invalid command\"\r\n", .word = "ATERROR"}),
    name_of);

const std::string kFastText = "charge_type:9.0V/2.0A\nbattery_volt:4.35[V]\ncableR:120[mOhm]\ncharge_current:2000[mA]\n";
const std::string kNormalText = "charge_type:5V/2A\nbattery_volt:4.30\ncableR:150\ncharge_current:1500[mA]\n";
const std::string kPass = "+RESULT:\"1\"\r\n";
Files with_fast(const std::string &fast) { return {{kFast, fast}, {kNormal, kNormalText}}; }
const Files kBoth = with_fast(kFastText);
void finished(const Sandbox &b) { b.set_prop(kFinish, "1"); }

INSTANTIATE_TEST_SUITE_P(FastChargeResults, PowerFamily, ::testing::Values(
    Case{.line = "AT+QX_CHG_CHARGE=1", .given = kBoth, .setup = finished,
         .body = kPass + "+VR:\"4.35,120\"\r\n+CHG1:\"1500\"\r\n+CHG2:\"2000\"\r\n", .word = "ATOK"},
    Case{.line = "AT+QX_CHG_CHARGE=1", .tag = "Type10V", .given = with_fast("charge_type:10.0V/2.25A\ncharge_current:2250\n"),
         .setup = finished, .body = kPass + "+VR:\",\"\r\n+CHG1:\"1500\"\r\n+CHG4:\"2250\"\r\n", .word = "ATOK"},
    Case{.line = "AT+QX_CHG_CHARGE=1", .tag = "Type11V5A", .given = with_fast("charge_type:11.0V/5.0A[PPS]\ncharge_current:5000\n"),
         .setup = finished, .body = kPass + "+VR:\",\"\r\n+CHG1:\"1500\"\r\n+CHG5:\"5000\"\r\n", .word = "ATOK"},
    Case{.line = "AT+QX_CHG_CHARGE=1", .tag = "TypeLonger", .given = with_fast("charge_type:9.0V/2.0AX\ncharge_current:1\n"),
         .setup = finished, .body = kPass + "+VR:\",\"\r\n+CHG1:\"1500\"\r\n", .word = "ATOK"},
    Case{.line = "AT+QX_CHG_CHARGE=1", .tag = "NormalOnly", .given = {{kNormal, kNormalText}}, .setup = finished,
         .body = kPass + "+VR:\"4.30,150\"\r\n+CHG1:\"1500\"\r\n", .word = "ATOK"},
    Case{.line = "AT+QX_CHG_CHARGE=1", .tag = "NoNormal", .given = {{kFast, kFastText}}, .setup = finished,
         .body = "access normal test result failed!", .word = "ATNG"},
    Case{.line = "AT+QX_CHG_CHARGE=1", .tag = "FastUnreadable", .given = {{kNormal, kNormalText}},
         .setup = [](const Sandbox &b) { finished(b); fs::create_directories(b.path(kFast)); },
         .body = "\"save fast charge result failed!\"", .word = "ATNG"},
    Case{.line = "AT+QX_CHG_CHARGE=1", .tag = "NormalUnreadable",
         .setup = [](const Sandbox &b) { finished(b); fs::create_directories(b.path(kNormal)); },
         .body = "\"save normal charge result failed!\"", .word = "ATNG"},
    Case{.line = "AT+QX_CHG_CHARGE=1", .tag = "NotFinished", .given = kBoth, .body = "+RESULT:\"0\"\r\n  test result failed!",
         .word = "ATNG"},
    Case{.line = "AT+QX_CHG_CHARGE=0", .body = "\"AT not support\"", .word = "ATERROR"}),
    name_of);
// clang-format on

// The averaging and replug forms block the daemon for as long as they sample.
class PowerTiming : public PowerBase {
protected:
    // Serves line, checks its whole frame, and gives how long the answer took.
    long timed(const std::string &line, const std::string &body, const std::string &word) {
        const std::string want = frame(line, body, word);
        auto t0 = std::chrono::steady_clock::now();
        EXPECT_EQ(serve(line, SRC_TCP, want.size()), want);
        return std::chrono::duration_cast<std::chrono::milliseconds>(std::chrono::steady_clock::now() - t0).count();
    }
};

TEST_F(PowerTiming, AverageOfThreeSamplesInSinglePrecisionTakesThreePeriods) {
    box.write("/sys/class/power_supply/cms/current_ac_avg_now", "1000.005\n");
    long ms = timed("AT+QX_PWR_CHG=2,3", "\r\n\"1000.01\"\r\n", "ATOK");
    EXPECT_GE(ms, 300);
    EXPECT_LT(ms, 3000);
    EXPECT_EQ(box.read("/sys/class/power_supply/cms/factory_mode_state"), "1\n");
}

TEST_F(PowerTiming, ReplugThatNeverChargesAgainWaitsTwoSeconds) {
    box.write(kStatus, "Discharging\n");
    long ms = timed("AT+QX_PWR_CHG=3", "\r\n\"Discharging\"\r\n", "ATNG");
    EXPECT_GE(ms, 2000);
    EXPECT_LT(ms, 6000);
    EXPECT_EQ(box.read(kPullDown), "0\n");
}

// The status node read by read: the initial reading, then one per 100 ms poll.
std::vector<std::string> statuses(int charging, std::vector<std::string> then) {
    std::vector<std::string> v(charging, "Charging");
    v.insert(v.end(), then.begin(), then.end());
    return v;
}

TEST_F(PowerTiming, ReplugSeesChargingStopAndResume) {
    box.sequence(kStatus, statuses(2, {"Discharging", "Discharging", "Discharging", "Charging"}));
    EXPECT_GE(timed("AT+QX_PWR_CHG=3", "", "ATOK"), 400);
    EXPECT_EQ(box.read(kPullDown), "0\n");
    std::vector<Event> ev = box.event_list();
    ASSERT_EQ(ev.size(), 3u) << box.events();
    EXPECT_EQ(ev[1].detail, "echo 1 >  " + kPullDown);
    EXPECT_EQ(ev[2].detail, "echo 0 >  " + kPullDown);
    EXPECT_GE(ev[2].ms - ev[1].ms, 200 - 5);  // two polls while it still charged
}

TEST_F(PowerTiming, ChargingMustStopWithinNinePolls) {
    box.sequence(kStatus, statuses(8, {"Discharging", "Charging"}));
    timed("AT+QX_PWR_CHG=3", "", "ATOK");
    box.sequence(kStatus, statuses(9, {"Discharging", "Charging"}));
    timed("AT+QX_PWR_CHG=3", "\r\n\"Discharging\"\r\n", "ATNG");
    EXPECT_EQ(box.read(kPullDown), "1\n");
}

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

struct RecordCase {
    std::string name;
    charger::Record record;
    std::string bytes, event;
};

class ChargerRecord : public ::testing::TestWithParam<RecordCase> {
protected:
    Sandbox box;
    void SetUp() override { box.activate(); }
};

TEST_P(ChargerRecord, EncodesAndTheControllerDecodes) {
    const RecordCase &c = GetParam();
    charger::Bytes out;
    size_t n = charger::encode(c.record, out);
    ASSERT_EQ(std::string(reinterpret_cast<const char *>(out.data()), n), c.bytes);
    EXPECT_TRUE(sim::charger_mcu_write(out.data(), n));
    EXPECT_EQ(box.events(), "charger " + c.event + "\n");
}

// clang-format off
INSTANTIATE_TEST_SUITE_P(Records, ChargerRecord, ::testing::Values(
    RecordCase{"SwitchOn", {charger::Op::Switch, 1}, bytes({0xC0, 1}), "switch on"},
    RecordCase{"ParamA", {charger::Op::ParamA, 5}, bytes({0xC1, 5, 0, 0, 0}), "param_a 5"},
    RecordCase{"ParamBNegative", {charger::Op::ParamB, -7}, bytes({0xC2, 0xF9, 0xFF, 0xFF, 0xFF}), "param_b -7"},
    RecordCase{"ParamCLargest", {charger::Op::ParamC, 2147483647}, bytes({0xC3, 0xFF, 0xFF, 0xFF, 0x7F}),
               "param_c 2147483647"}),
    [](const ::testing::TestParamInfo<RecordCase> &i) { return i.param.name; });
// clang-format on

TEST_F(ChargerRecord, BadRecordsChangeNothing) {
    const uint8_t off[] = {0xC0, 0}, bad_op[] = {0xC4, 1}, short_param[] = {0xC1, 1, 2}, bad_switch[] = {0xC0, 2};
    EXPECT_TRUE(sim::charger_mcu_write(off, sizeof off));
    EXPECT_EQ(box.read(kMcu + "chg_enable"), "0\n");
    EXPECT_EQ(box.read(kMcu + "dchg_state"), "dchg_stop\n");
    EXPECT_FALSE(sim::charger_mcu_write(bad_op, sizeof bad_op));
    EXPECT_FALSE(sim::charger_mcu_write(short_param, sizeof short_param));
    EXPECT_FALSE(sim::charger_mcu_write(bad_switch, sizeof bad_switch));
    EXPECT_EQ(box.read(kMcu + "chg_enable"), "0\n");
    EXPECT_EQ(box.events(), "charger switch off\ncharger bad-record C4 01\ncharger bad-record C1 01 02\ncharger bad-record C0 02\n");
}

}  // namespace
