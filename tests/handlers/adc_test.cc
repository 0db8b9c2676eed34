// ADC, voltage and temperature sampling: one-shot readings, the PMIC register read, the
// streamed EADC and BATADC lines (their figures, periods, stop forms and what they leave
// behind), the VBUS sampling worker and its stored result, and the thermal-zone filter.
#include <chrono>
#include <cstring>
#include <filesystem>
#include <thread>

#include "core/nv.h"
#include "handlers/adc.h"
#include "platform/sim/power_models.h"
#include "platform/sim/sim.h"
#include "tests/support/checks.h"
#include "tests/support/in_process.h"
#include "tests/support/test_name.h"

namespace {

namespace fs = std::filesystem;
using Clock = std::chrono::steady_clock;

const std::string kBattery = "/sys/class/power_supply/battery/";
const std::string kCpu4 = "/sys/devices/system/cpu/cpu4/core_ctl/";
const std::string kCpu0 = "/sys/devices/system/cpu/cpu0/core_ctl/";
const std::string kSoc = kBattery + "keep_chg_soc";
const std::string kAdapter = kBattery + "supported_adapter";
const std::string kBatTemp = "/sys/kernel/debug/stm32l011/bat_temp_mv";
const std::string kTestInfo = "/cache/recovery/last_test_info";
const std::string kOnline = "/sys/class/power_supply/usb/online";
const std::string kRegmap = "/d/regmap/spmi0-00/";

std::string nv_pattern() {  // every byte non-zero, with a known EADC word
    std::string nv = nv_fill(0x31, 173);
    const int eadc_word = 0x2a2b2c2d;
    memcpy(nv.data() + nv::kEadcWord, &eadc_word, 4);
    return nv;
}

using Files = std::vector<std::pair<std::string, std::string>>;

class AdcBase : public InProcess {
protected:
    void SetUp() override {
        InProcess::SetUp();
        box.write("/.sim/nv.bin", nv_pattern());
    }
    // Every worker is stopped and gone before the sandbox and the channel go away.
    void TearDown() override {
        box.write(kAdapter, "1\n");
        for (const char *stop : {"AT+EADC=0", "AT+BATADC=0", "AT+QX_VBUS_VOLT=1"}) send(stop);
        EXPECT_TRUE(wait_workers_gone()) << "a sampling worker outlived its test";
        is_sp = 0;
        InProcess::TearDown();
    }
    // Dispatches a line on the open TCP channel, keeping it for the worker's lines.
    void send(const std::string &line) {
        char buf[kLineSize] = {0};
        line.copy(buf, kLineSize - 1);
        dispatch_command(buf, static_cast<int>(line.size()), SRC_TCP);
    }
    bool wait_workers_gone(int ms = 15000) {
        return wait_until([] { return sampling_workers_alive() == 0; }, ms);
    }
    // Reads the channel until text has arrived n times (bounded); what arrived, and when
    // each arrival was seen.
    std::string until(const std::string &text, int n = 1, int ms = 8000, std::vector<Clock::time_point> *seen = nullptr) {
        std::string got;
        int count = 0;
        for (auto end = Clock::now() + std::chrono::milliseconds(ms); Clock::now() < end && count < n;) {
            std::string more = read_some(station, 4096, 50);
            if (more.empty()) continue;
            got += more;
            int now = 0;
            for (size_t at = got.find(text); at != std::string::npos; at = got.find(text, at + 1)) ++now;
            for (; count < now; ++count)
                if (seen) seen->push_back(Clock::now());
        }
        return got;
    }
    static long ms_between(Clock::time_point a, Clock::time_point b) {
        return std::chrono::duration_cast<std::chrono::milliseconds>(b - a).count();
    }
    // The answer to line is body and word, read without waiting past it.
    void expect(const std::string &line, const std::string &body, const std::string &word) {
        const std::string want = frame(line, body, word);
        EXPECT_EQ(serve(line, SRC_TCP, want.size()), want);
    }
    // min and max of the big cores, then max and min of the little ones.
    std::string cores() const {
        return box.read(kCpu4 + "min_cpus") + "," + box.read(kCpu4 + "max_cpus") + "," + box.read(kCpu0 + "max_cpus") + "," +
               box.read(kCpu0 + "min_cpus");
    }
};

struct Case {
    std::string line, tag = "";
    Files given = {};  // device files written before the line ("" value: removed)
    const char *fault = nullptr;
    std::string project = "";
    std::string body, word;
    Files after = {};
    std::string events = "";
};

void PrintTo(const Case &c, std::ostream *os) { *os << c.line << " " << c.tag; }

class AdcLine : public AdcBase, public ::testing::WithParamInterface<Case> {};

TEST_P(AdcLine, Answers) {
    const Case &c = GetParam();
    for (const auto &[path, text] : c.given) {
        if (text.empty()) fs::remove_all(box.path(path));
        else box.write(path, text);
    }
    if (c.fault) box.fault(c.fault);
    if (!c.project.empty()) box.write("/.sim/config", "project=" + c.project + "\n");
    expect(c.line, c.body, c.word);
    EXPECT_EQ(answer(1, 0), "");
    EXPECT_EQ(sampling_workers_alive(), 0);
    for (const auto &[path, text] : c.after) EXPECT_EQ(box.read(path), text) << path;
    EXPECT_EQ(box.events(), c.events);
    EXPECT_EQ(box.read("/.sim/nv.bin"), nv_pattern());
}

std::string name_of(const ::testing::TestParamInfo<Case> &info) {
    return test_name(info.param.line) + (info.param.tag.empty() ? "" : "_" + info.param.tag);
}

const std::string kAcAvg = "/sys/class/power_supply/cms/current_ac_avg_now";
const std::string kLastCurrent = "/cache/recovery/last_ChargeCurrent";
const std::string kNotSupported = "\r\n\"current not supported_adapter: ";

// clang-format off
INSTANTIATE_TEST_SUITE_P(OneShot, AdcLine, ::testing::Values(
    Case{.line = "AT+EADC=0", .tag = "NotRunning", .word = "OK"},
    Case{.line = "AT+EADC=2", .body = "\"1.48\"", .word = "OK"},
    Case{.line = "AT+EADC=2", .tag = "Negative", .given = {{kAcAvg, "-1235\n"}}, .body = "\"-1.24\"", .word = "OK"},
    Case{.line = "AT+EADC=2", .tag = "NoNode", .given = {{kAcAvg, ""}}, .word = "ERROR"},
    Case{.line = "AT+EADC=3", .given = {{kLastCurrent, "1500mA\n"}}, .body = "\r\n\"1500mA\n\"\r\n", .word = "OK"},
    Case{.line = "AT+EADC=3", .tag = "Cut", .given = {{kLastCurrent, std::string(40, '7')}},
         .body = "\r\n\"" + std::string(30, '7') + "\"\r\n", .word = "OK"},
    Case{.line = "AT+EADC=3", .tag = "OneCharacter", .given = {{kLastCurrent, "7"}}, .body = "\"not Test!\"", .word = "ERROR"},
    Case{.line = "AT+EADC=3", .tag = "NotTested", .body = "\"not Test!\"", .word = "ERROR"},
    Case{.line = "AT+EADC=4", .word = "OK"},
    Case{.line = "AT+EADC=6", .body = "\r\n\"707472429\"\r\n", .word = "OK"},
    Case{.line = "AT+EADC=6", .tag = "NvReadFails", .fault = "nv-read", .word = "ERROR"},
    Case{.line = "AT+EADC=7", .word = "ERROR"},
    Case{.line = "AT+BATADC=1", .tag = "NoFastAdapter", .given = {{kAdapter, "0\n"}}, .body = kNotSupported + "0\"\r\n",
         .word = "ERROR"},
    Case{.line = "AT+BATADC=0", .tag = "NoFastAdapter", .given = {{kAdapter, "3\n"}}, .body = kNotSupported + "-22\"\r\n",
         .word = "ERROR"},
    Case{.line = "AT+BATADC=1", .tag = "NoAdapterNode", .given = {{kAdapter, ""}}, .body = kNotSupported + "-22\"\r\n",
         .word = "ERROR"},
    Case{.line = "AT+BATADC=0", .tag = "OldProject", .given = {{kAdapter, "0\n"}}, .project = "RX2101", .word = "OK"},
    Case{.line = "AT+BATADC=0", .tag = "Adapter2", .given = {{kAdapter, "2"}}, .word = "OK"},
    Case{.line = "AT+BATADC=2", .word = "ERROR"},
    Case{.line = "AT+QX_ADC_REG=1", .body = "\r\n\"305e: 80\n\"\r\n", .word = "ATOK",
         .after = {{kRegmap + "count", "1"}, {kRegmap + "address", "0x305e"}}},
    Case{.line = "AT+QX_ADC_REG=1", .tag = "NoCount", .given = {{kRegmap + "count", ""}},
         .body = "\"write /d/regmap/spmi0-00/count error:No such file or directory\"", .word = "ATNG"},
    Case{.line = "AT+QX_ADC_REG=1", .tag = "DataUnreadable", .given = {{kRegmap + "data", ""}, {kRegmap + "data/x", "x"}},
         .word = "ATNG"},
    Case{.line = "AT+QX_ADC_REG=1", .tag = "TableEdited", .given = {{"/.sim/pmic_registers", "0x305e=0x3c\n"}},
         .body = "\r\n\"305e: 3c\n\"\r\n", .word = "ATOK"},
    Case{.line = "AT+QX_ADC_REG=0", .word = "ATERROR", .after = {{kRegmap + "address", "0x305e\n"}}}),
    name_of);

INSTANTIATE_TEST_SUITE_P(VbusForms, AdcLine, ::testing::Values(
    Case{.line = "AT+QX_VBUS_VOLT=0,1,2", .tag = "TwoFields", .body = "\"parameter error\"", .word = "ATNG"},
    Case{.line = "AT+QX_VBUS_VOLT=0,1,x,3", .body = "\"digitValue error\"", .word = "ATNG"},
    Case{.line = "AT+QX_VBUS_VOLT=0,10001,0,1", .body = "\"range error\"", .word = "ATNG"},
    Case{.line = "AT+QX_VBUS_VOLT=0,0,0,0", .body = "\"range error\"", .word = "ATNG"},
    Case{.line = "AT+QX_VBUS_VOLT=0,0,0,101", .body = "\"range error\"", .word = "ATNG"},
    Case{.line = "AT+QX_VBUS_VOLT=0,0,0,99999999999999999999", .tag = "Absurd", .body = "\"range error\"", .word = "ATNG"},
    Case{.line = "AT+QX_VBUS_VOLT=1", .tag = "NeverRun", .body = "\"\"", .word = "ATNG"},
    Case{.line = "AT+QX_VBUS_VOLT=1", .tag = "Stored", .given = {{kTestInfo, "usb_voltage=5012,4990,5001\n"}},
         .body = "\"5012,4990,5001\"", .word = "ATOK"},
    Case{.line = "AT+QX_VBUS_VOLT=2", .word = "ATERROR"}),
    name_of);
// clang-format on

// ---- EADC stream

struct EadcCase {
    std::string name;
    int sp;
    std::string volt, temp, current, line;
};

class EadcFigures : public AdcBase, public ::testing::WithParamInterface<EadcCase> {};

TEST_P(EadcFigures, FirstLineAfterTheAnswer) {
    const EadcCase &c = GetParam();
    is_sp = c.sp;
    box.write(kBattery + "voltage_now", c.volt + "\n");
    if (!c.temp.empty()) box.write(kBattery + "temp", c.temp + "\n");
    if (!c.current.empty()) box.write(kBattery + "current_now", c.current + "\n");
    send("AT+EADC=1");
    const std::string answer = "AT+EADC=1\r\n\r\nOK\r\n";
    std::string got = until(c.line);
    ASSERT_EQ(got.substr(0, answer.size() + c.line.size()), answer + c.line);
}

// clang-format off
INSTANTIATE_TEST_SUITE_P(Eadc, EadcFigures, ::testing::Values(
    EadcCase{"TemperatureTenths", 0, "4123000", "253", "1500", "+EADC: \"4.12,25.30,0.58,1.50,4.50\"\r\n"},
    EadcCase{"SinglePrecisionVolts", 0, "3835000", "", "", "+EADC: \"3.84,30.10,0.58,-412.00,4.50\"\r\n"},
    EadcCase{"LowVoltsShownInPlainMode", 0, "3600000", "", "", "+EADC: \"3.60,30.10,0.58,-412.00,4.50\"\r\n"},
    EadcCase{"AtModeLowVoltsRaised", 1, "3600000", "", "", "+EADC: \"3.83,30.10,0.58,-412.00,4.50\"\r\n"},
    EadcCase{"AtModeJustBelowFull", 1, "3790000", "", "", "+EADC: \"3.82,30.10,0.58,-412.00,4.50\"\r\n"},
    EadcCase{"AtModeAtFullUnchanged", 1, "3800000", "", "", "+EADC: \"3.80,30.10,0.58,-412.00,4.50\"\r\n"},
    EadcCase{"AtModeJustAboveLowEdge", 1, "3500001", "", "", "+EADC: \"3.78,30.10,0.58,-412.00,4.50\"\r\n"},
    EadcCase{"LongLineCutAt49", 0, "4123000", "2000000000", "-2000000000",
             "+EADC: \"4.12,200000000.00,0.58,-2000000.00,4.50\"\r"}),
    [](const ::testing::TestParamInfo<EadcCase> &i) { return i.param.name; });
// clang-format on

class Eadc : public AdcBase {};

TEST_F(Eadc, StreamsEvery300msWithCoresLimitedAndRestoresOnStop) {
    box.set_prop("persist.sys.factory.mode", "yes");
    std::vector<Clock::time_point> seen;
    const auto t0 = Clock::now();
    send("AT+EADC=1");
    std::string got = until("+EADC:", 5, 8000, &seen);
    ASSERT_EQ(seen.size(), 5u) << got;
    // Lines can arrive late on a busy machine, never early: the fifth is 4 periods out.
    EXPECT_GE(ms_between(t0, seen[4]), 4 * 300 - 20);
    EXPECT_EQ(box.read(kSoc), "100");
    EXPECT_EQ(cores(), "0,0,1,1");
    EXPECT_EQ(sampling_workers_alive(), 1);

    send("AT+EADC=0");
    EXPECT_NE(until("AT+EADC=0\r\n\r\nOK\r\n").find("AT+EADC=0\r\n\r\nOK\r\n"), std::string::npos);
    ASSERT_TRUE(wait_workers_gone(3000));
    EXPECT_EQ(box.read(kSoc), "70");
    EXPECT_EQ(cores(), "2,4,4,1");
    read_some(station, 4096, 100);           // a line the worker was writing as it stopped
    EXPECT_EQ(until("+EADC:", 1, 700), "");  // and nothing after it ended
}

TEST_F(Eadc, AtModeLeavesCoresAndChargeLevelAlone) {
    is_sp = 1;
    send("AT+EADC=1");
    until("+EADC:");
    send("AT+EADC=0");
    ASSERT_TRUE(wait_workers_gone(3000));
    EXPECT_EQ(box.read(kSoc), "0\n");  // not in factory mode
    EXPECT_EQ(cores(), "2\n,4\n,4\n,1\n");  // never written
}

TEST_F(Eadc, SecondStartAddsNoWorkerButARestartWithinAPeriodDoes) {
    send("AT+EADC=1");
    until("+EADC:");
    send("AT+EADC=1");
    EXPECT_NE(until("AT+EADC=1\r\n\r\nOK\r\n").find("AT+EADC=1\r\n\r\nOK\r\n"), std::string::npos);
    EXPECT_EQ(sampling_workers_alive(), 1);
    send("AT+EADC=0");
    send("AT+EADC=1");  // the first worker is asleep and never sees the flag cleared
    EXPECT_EQ(sampling_workers_alive(), 2);
    send("AT+EADC=0");  // one stop ends both
    ASSERT_TRUE(wait_workers_gone(3000));
    EXPECT_EQ(box.read(kCpu4 + "max_cpus"), "4");
}

TEST_F(Eadc, UnreadableNodeEndsTheStreamAndClearsTheFlag) {
    fs::remove(box.path(kBattery + "current_now"));
    send("AT+EADC=1");
    ASSERT_TRUE(wait_workers_gone(3000));
    EXPECT_EQ(until("+EADC:", 1, 500), "AT+EADC=1\r\n\r\nOK\r\n");
    EXPECT_EQ(box.read(kCpu4 + "max_cpus"), "4");  // restored on the way out
    box.write(kBattery + "current_now", "-1000\n");
    send("AT+EADC=1");  // the flag was cleared, so this starts a new stream
    EXPECT_NE(until("+EADC:").find("+EADC: \"4.12,30.10,0.58,-1.00,4.50\"\r\n"), std::string::npos);
}

// ---- BATADC stream

class Batadc : public AdcBase {};

TEST_F(Batadc, StreamsEvery200msUntilStopped) {
    std::vector<Clock::time_point> seen;
    const auto t0 = Clock::now();
    send("AT+BATADC=1");
    std::string got = until("+BATADC:", 6, 8000, &seen);
    ASSERT_EQ(seen.size(), 6u) << got;
    const std::string first = "AT+BATADC=1\r\n\r\nOK\r\n+BATADC: \"612\"\r\n";
    EXPECT_EQ(got.substr(0, first.size()), first);
    EXPECT_GE(ms_between(t0, seen[5]), 5 * 200 - 20);
    send("AT+BATADC=0");
    ASSERT_TRUE(wait_workers_gone(3000));
}

TEST_F(Batadc, MissingNodeEndsTheWorkerButKeepsItMarkedRunning) {
    fs::remove(box.path(kBatTemp));
    send("AT+BATADC=1");
    ASSERT_TRUE(wait_workers_gone(3000));
    box.write(kBatTemp, "640\n");
    send("AT+BATADC=1");  // "already start": no worker, no line
    EXPECT_EQ(until("+BATADC:", 1, 600), "AT+BATADC=1\r\n\r\nOK\r\nAT+BATADC=1\r\n\r\nOK\r\n");
    EXPECT_EQ(sampling_workers_alive(), 0);
    send("AT+BATADC=0");
    send("AT+BATADC=1");
    EXPECT_NE(until("+BATADC: \"640\"\r\n").find("+BATADC: \"640\"\r\n"), std::string::npos);
}

// ---- VBUS worker

class Vbus : public AdcBase {
protected:
    std::string stored() {
        std::string v;
        sim::read_kv(box.path(kTestInfo), "usb_voltage", v);
        return v;
    }
};

TEST_F(Vbus, CableOutSamplesAfterTheDelayAndStoresMaxMinAverage) {
    box.write(kOnline, "0\n");
    box.write("/sys/class/power_supply/usb/voltage_now", "5012999\n");
    const auto t0 = Clock::now();
    expect("AT+QX_VBUS_VOLT=0,300,50,3", "", "ATOK");
    EXPECT_EQ(stored(), "null");
    expect("AT+QX_VBUS_VOLT=0,0,0,1", "\"vbus_reading\"", "ATNG");
    ASSERT_TRUE(wait_workers_gone(5000));
    EXPECT_GE(ms_between(t0, Clock::now()), 300 + 3 * 50);
    EXPECT_EQ(stored(), "5012,5012,5012");
    expect("AT+QX_VBUS_VOLT=1", "\"5012,5012,5012\"", "ATOK");
    EXPECT_EQ(box.events(), "shell /system/bin/sh -c \"chmod 664 /sys/class/power_supply/usb/online\"\n");
}

TEST_F(Vbus, StopDuringTheRunStoresNothing) {
    box.write(kOnline, "0\n");
    expect("AT+QX_VBUS_VOLT=0,10,1500,5", "", "ATOK");
    expect("AT+QX_VBUS_VOLT=1", "\"null\"", "ATNG");
    ASSERT_TRUE(wait_workers_gone(5000));
    EXPECT_EQ(stored(), "null");
}

struct SeriesCase {
    std::string name;
    std::vector<std::string> microvolts;
    std::string stored;
};

class VbusSeries : public Vbus, public ::testing::WithParamInterface<SeriesCase> {};

TEST_P(VbusSeries, StoresMaxMinAverageInMillivolts) {
    const SeriesCase &c = GetParam();
    box.write(kOnline, "0\n");
    box.sequence("/sys/class/power_supply/usb/voltage_now", c.microvolts);
    const std::string line = "AT+QX_VBUS_VOLT=0,0,10," + std::to_string(c.microvolts.size());
    expect(line, "", "ATOK");
    ASSERT_TRUE(wait_workers_gone(5000));
    EXPECT_EQ(stored(), c.stored);
    expect("AT+QX_VBUS_VOLT=1", "\"" + c.stored + "\"", "ATOK");
}

// clang-format off
INSTANTIATE_TEST_SUITE_P(Vbus, VbusSeries, ::testing::Values(
    SeriesCase{"Replug", {"5000999", "5100000", "4899999", "-1500"}, "5100,-1,3749"},
    SeriesCase{"TruncatedTowardZero", {"4999", "-999"}, "4,0,2"},
    SeriesCase{"MaximumNeverBelowZero", {"-2500", "-1999"}, "0,-2,-1"},
    SeriesCase{"OneSample", {"5012000"}, "5012,5012,5012"}),
    [](const ::testing::TestParamInfo<SeriesCase> &i) { return i.param.name; });
// clang-format on

TEST_F(Vbus, UnplugEndsTheStartWaitEarly) {
    box.sequence(kOnline, {"1", "1", "0"});
    const auto t0 = Clock::now();
    expect("AT+QX_VBUS_VOLT=0,5000,0,1", "", "ATOK");
    ASSERT_TRUE(wait_workers_gone(8000));
    const long ms = ms_between(t0, Clock::now());
    EXPECT_GE(ms, 2000);  // two whole-second checks, the second seeing the cable out
    EXPECT_LT(ms, 4500);  // well before the 5 s start delay
    EXPECT_EQ(stored(), "5012,5012,5012");
}

// ---- thermal-zone filter and register table

struct NtcCase {
    std::string name, before, raw, format;
    bool kept;
    std::string after;
};

class NtcFilter : public ::testing::TestWithParam<NtcCase> {};

TEST_P(NtcFilter, AppendsOrSkips) {
    const NtcCase &c = GetParam();
    char line[40] = {0};
    c.before.copy(line, sizeof line - 1);
    EXPECT_EQ(append_ntc_value(line, sizeof line, c.raw.c_str(), c.format.c_str()), c.kept);
    EXPECT_EQ(std::string(line), c.after);
}

// clang-format off
INSTANTIATE_TEST_SUITE_P(Zones, NtcFilter, ::testing::Values(
    NtcCase{"Appends", "MSM_THERM:31.2,", "29800", "PA_THERM:%.1f,", true, "MSM_THERM:31.2,PA_THERM:29.8,"},
    NtcCase{"SinglePrecision", "", "20450", "SDM_THERM:%.1f,", true, "SDM_THERM:20.5,"},
    NtcCase{"RawMinus40Skipped", "X,", "-40", "MSM_THERM:%.1f,", false, "X,"},
    NtcCase{"Minus40DegreesSkipped", "X,", "-40000", "WIFI_SKIN_THERM:%.1f,", false, "X,"},
    NtcCase{"JustAboveMinus40Kept", "", "-39999", "PA_THERM:%.1f,", true, "PA_THERM:-40.0,"},
    NtcCase{"CutAtFormatPlus3", "", "123456789", "MSM_THERM:%.1f,", true, "MSM_THERM:123456.8"},
    NtcCase{"LineFull", std::string(36, 'L'), "31200", "MSM_THERM:%.1f,", true, std::string(36, 'L') + "MSM"}),
    [](const ::testing::TestParamInfo<NtcCase> &i) { return i.param.name; });
// clang-format on

TEST(PmicRegisterTable, DataFollowsCountAndAddress) {
    Sandbox box;
    box.activate();
    EXPECT_EQ(sim::pmic_regmap_data("1\n", "0x305e\n"), "305e: 80\n");
    box.write("/.sim/pmic_registers", "0x305e=0x80\n0x305f=0x1c4\n");
    EXPECT_EQ(sim::pmic_regmap_data("3", "0x305d"), "305d: 00\n305e: 80\n305f: c4\n");
    EXPECT_EQ(sim::pmic_regmap_data("x", "0x305e"), "");
    EXPECT_EQ(sim::pmic_regmap_data("1", ""), "");
}

}  // namespace
