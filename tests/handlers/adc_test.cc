// ADC, voltage and temperature sampling: one-shot readings, the PMIC register read, the
// streamed EADC and BATADC lines (their figures, periods, stop forms and what they leave
// behind), the VBUS sampling worker and its stored result, and the thermal-zone filter.
#include <chrono>
#include <cstring>
#include <filesystem>

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
    // A device or sandbox file ("" removes it), or a property (a key without "/").
    void give(const std::string &key, const std::string &value) {
        if (key.find('/') == std::string::npos) box.set_prop(key, value);
        else if (value.empty()) fs::remove_all(box.path(key));
        else box.write(key, value);
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
    std::string line, tag;
    Files given;  // before the line (see give)
    std::string body, word;
    Files after = {};
};

void PrintTo(const Case &c, std::ostream *os) { *os << c.line << " " << c.tag; }

class AdcLine : public AdcBase, public ::testing::WithParamInterface<Case> {};

// One answer, no streamed line after it, no worker left, no event and the NV record untouched.
TEST_P(AdcLine, Answers) {
    const Case &c = GetParam();
    for (const auto &[key, value] : c.given) give(key, value);
    expect(c.line, c.body, c.word);
    EXPECT_EQ(answer(1, 0), "");
    EXPECT_EQ(sampling_workers_alive(), 0);
    for (const auto &[path, text] : c.after) EXPECT_EQ(box.read(path), text) << path;
    EXPECT_EQ(box.events(), "");
    EXPECT_EQ(box.read("/.sim/nv.bin"), nv_pattern());
}

std::string name_of(const ::testing::TestParamInfo<Case> &info) {
    return test_name(info.param.line) + (info.param.tag.empty() ? "" : "_" + info.param.tag);
}

const std::string kAcAvg = "/sys/class/power_supply/cms/current_ac_avg_now";
const std::string kLastCurrent = "/cache/recovery/last_ChargeCurrent";
const std::string kNotSupported = "\r\n\"current not supported_adapter: ";
const std::string kNoCount = "\"write /d/regmap/spmi0-00/count error:No such file or directory\"";

// clang-format off
INSTANTIATE_TEST_SUITE_P(OneShot, AdcLine, ::testing::Values(
    Case{"AT+EADC=0", "NotRunning", {}, "", "OK"},
    Case{"AT+EADC=2", "", {}, "\"1.48\"", "OK"},
    Case{"AT+EADC=2", "Negative", {{kAcAvg, "-1235\n"}}, "\"-1.24\"", "OK"},
    Case{"AT+EADC=2", "NoNode", {{kAcAvg, ""}}, "", "ERROR"},
    Case{"AT+EADC=3", "", {{kLastCurrent, "1500mA\n"}}, "\r\n\"1500mA\n\"\r\n", "OK"},
    Case{"AT+EADC=3", "Cut", {{kLastCurrent, std::string(40, '7')}}, "\r\n\"" + std::string(30, '7') + "\"\r\n", "OK"},
    Case{"AT+EADC=3", "OneCharacter", {{kLastCurrent, "7"}}, "\"not Test!\"", "ERROR"},
    Case{"AT+EADC=3", "NotTested", {}, "\"not Test!\"", "ERROR"},
    Case{"AT+EADC=4", "", {}, "", "OK"},
    Case{"AT+EADC=6", "", {}, "\r\n\"707472429\"\r\n", "OK"},
    Case{"AT+EADC=6", "NvReadFails", {{"/.sim/faults", "nv-read\n"}}, "", "ERROR"},
    Case{"AT+EADC=7", "", {}, "", "ERROR"},
    Case{"AT+BATADC=1", "NoFastAdapter", {{kAdapter, "0\n"}}, kNotSupported + "0\"\r\n", "ERROR"},
    Case{"AT+BATADC=0", "NoFastAdapter", {{kAdapter, "3\n"}}, kNotSupported + "-22\"\r\n", "ERROR"},
    Case{"AT+BATADC=1", "NoAdapterNode", {{kAdapter, ""}}, kNotSupported + "-22\"\r\n", "ERROR"},
    Case{"AT+BATADC=0", "OldProject", {{kAdapter, "0\n"}, {"/.sim/config", "project=RX2101\n"}}, "", "OK"},
    Case{"AT+BATADC=0", "Adapter2", {{kAdapter, "2"}}, "", "OK"},
    Case{"AT+BATADC=2", "", {}, "", "ERROR"},
    Case{"AT+QX_ADC_REG=1", "", {}, "\r\n\"305e: 80\n\"\r\n", "ATOK",
         {{kRegmap + "count", "1"}, {kRegmap + "address", "0x305e"}}},
    Case{"AT+QX_ADC_REG=1", "NoCount", {{kRegmap + "count", ""}}, kNoCount, "ATNG"},
    Case{"AT+QX_ADC_REG=1", "DataUnreadable", {{kRegmap + "data", ""}, {kRegmap + "data/x", "x"}}, "", "ATNG"},
    Case{"AT+QX_ADC_REG=1", "TableEdited", {{"/.sim/pmic_registers", "0x305e=0x3c\n"}}, "\r\n\"305e: 3c\n\"\r\n",
         "ATOK"},
    Case{"AT+QX_ADC_REG=0", "", {}, "", "ATERROR", {{kRegmap + "address", "0x305e\n"}}}),
    name_of);

const std::string kRange = "\"range error\"";

INSTANTIATE_TEST_SUITE_P(VbusForms, AdcLine, ::testing::Values(
    Case{"AT+QX_VBUS_VOLT=0,1,2", "TwoFields", {}, "\"parameter error\"", "ATNG"},
    Case{"AT+QX_VBUS_VOLT=0,1,x,3", "", {}, "\"digitValue error\"", "ATNG"},
    Case{"AT+QX_VBUS_VOLT=0,10001,0,1", "", {}, kRange, "ATNG"},
    Case{"AT+QX_VBUS_VOLT=0,0,0,0", "", {}, kRange, "ATNG"},
    Case{"AT+QX_VBUS_VOLT=0,0,0,101", "", {}, kRange, "ATNG"},
    Case{"AT+QX_VBUS_VOLT=0,0,0,99999999999999999999", "Absurd", {}, kRange, "ATNG"},
    Case{"AT+QX_VBUS_VOLT=1", "NeverRun", {}, "\"\"", "ATNG"},
    Case{"AT+QX_VBUS_VOLT=1", "Stored", {{kTestInfo, "usb_voltage=5012,4990,5001\n"}}, "\"5012,4990,5001\"", "ATOK"},
    Case{"AT+QX_VBUS_VOLT=2", "", {}, "", "ATERROR"}),
    name_of);
// clang-format on

// ---- streams: the first line after the answer, then one per period until the stop form

struct Stream {
    std::string name, start;
    int sp;
    Files given;        // before the start (see give)
    std::string first;  // the first streamed line, whole
    int lines = 1, period_ms = 0;
    // The charge level and the cores (min and max of the big, then max and min of the little
    // ones) while it streams and after the stop; with them, nothing may follow the stop.
    std::string during = "", after = "";
};
class Streams : public AdcBase, public ::testing::WithParamInterface<Stream> {};

TEST_P(Streams, EveryPeriodUntilStopped) {
    const Stream &c = GetParam();
    is_sp = c.sp;
    for (const auto &[key, value] : c.given) give(key, value);
    const std::string prefix = c.first.substr(0, c.first.find(':') + 1);
    std::vector<Clock::time_point> seen;
    const auto t0 = Clock::now();
    send(c.start);
    const std::string got = until(prefix, c.lines, 8000, &seen), answered = c.start + "\r\n\r\nOK\r\n" + c.first;
    ASSERT_EQ(seen.size(), static_cast<size_t>(c.lines)) << got;
    EXPECT_EQ(got.substr(0, answered.size()), answered);
    EXPECT_GE(ms_between(t0, seen.back()), (c.lines - 1) * c.period_ms - 20);  // late on a busy machine, never early
    EXPECT_EQ(sampling_workers_alive(), 1);
    if (c.after.empty()) return;
    EXPECT_EQ(box.read(kSoc) + "|" + cores(), c.during);
    const std::string stop = c.start.substr(0, c.start.size() - 1) + "0", stopped = frame(stop, "", "OK");
    send(stop);
    EXPECT_NE(until(stopped).find(stopped), std::string::npos);
    ASSERT_TRUE(wait_workers_gone(3000));
    EXPECT_EQ(box.read(kSoc) + "|" + cores(), c.after);
    read_some(station, 4096, 100);                    // a line the worker was writing as it stopped
    EXPECT_EQ(until(prefix, 1, 700), "") << c.name;  // and nothing after it ended
}

const std::string kVolt = kBattery + "voltage_now", kTemp = kBattery + "temp", kCurrent = kBattery + "current_now";
const std::string kRest = ",30.10,0.58,-412.00,4.50\"\r\n", kLine = "+EADC: \"4.12" + kRest;
const std::string kFigures = "+EADC: \"4.12,25.30,0.58,", kFactory = "persist.sys.factory.mode";
const std::string kUntouched = "0\n|2\n,4\n,4\n,1\n";

// clang-format off
INSTANTIATE_TEST_SUITE_P(Adc, Streams, ::testing::Values(
    Stream{"EadcInFactory", "AT+EADC=1", 0, {{kFactory, "yes"}}, kLine, 5, 300, "100|0,0,1,1", "70|2,4,4,1"},
    Stream{"EadcInAtMode", "AT+EADC=1", 1, {}, kLine, 2, 300, kUntouched, kUntouched},
    Stream{"Batadc", "AT+BATADC=1", 0, {}, "+BATADC: \"612\"\r\n", 6, 200, kUntouched, kUntouched},
    Stream{"TemperatureTenths", "AT+EADC=1", 0, {{kTemp, "253\n"}, {kCurrent, "1500\n"}}, kFigures + "1.50,4.50\"\r\n"},
    Stream{"SinglePrecisionVolts", "AT+EADC=1", 0, {{kVolt, "3835000\n"}}, "+EADC: \"3.84" + kRest},
    Stream{"LowVoltsShownInPlainMode", "AT+EADC=1", 0, {{kVolt, "3600000\n"}}, "+EADC: \"3.60" + kRest},
    Stream{"AtModeLowVoltsRaised", "AT+EADC=1", 1, {{kVolt, "3600000\n"}}, "+EADC: \"3.83" + kRest},
    Stream{"AtModeJustBelowFull", "AT+EADC=1", 1, {{kVolt, "3790000\n"}}, "+EADC: \"3.82" + kRest},
    Stream{"AtModeAtFullUnchanged", "AT+EADC=1", 1, {{kVolt, "3800000\n"}}, "+EADC: \"3.80" + kRest},
    Stream{"AtModeJustAboveLowEdge", "AT+EADC=1", 1, {{kVolt, "3500001\n"}}, "+EADC: \"3.78" + kRest},
    Stream{"LongLineCutAt49", "AT+EADC=1", 0, {{kTemp, "2000000000\n"}, {kCurrent, "-2000000000\n"}},
           "+EADC: \"4.12,200000000.00,0.58,-2000000.00,4.50\"\r"}),
    [](const ::testing::TestParamInfo<Stream> &i) { return i.param.name; });
// clang-format on

class Eadc : public AdcBase {};

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

// ---- VBUS worker: the start wait (cut short by an unplug), the samples, the stored max,min,average

struct VbusRun {
    std::string name, line;
    std::vector<std::string> online, microvolts;  // one value per read (none: the node as it is)
    std::string during, body, word;               // a line served while the worker runs
    long min_ms, max_ms;                          // how long the worker ran (0: no bound)
    std::string stored;
};
class Vbus : public AdcBase, public ::testing::WithParamInterface<VbusRun> {};

TEST_P(Vbus, SamplesAndStores) {
    const VbusRun &c = GetParam();
    box.sequence(kOnline, c.online);
    box.sequence("/sys/class/power_supply/usb/voltage_now", c.microvolts);
    const auto t0 = Clock::now();
    expect(c.line, "", "ATOK");
    if (!c.during.empty()) expect(c.during, c.body, c.word);
    ASSERT_TRUE(wait_workers_gone(8000));
    const long ms = ms_between(t0, Clock::now());
    EXPECT_GE(ms, c.min_ms);
    if (c.max_ms) {
        EXPECT_LT(ms, c.max_ms);
    }
    std::string stored;
    sim::read_kv(box.path(kTestInfo), "usb_voltage", stored);
    EXPECT_EQ(stored, c.stored);  // "null" from the start until a whole run stores its figures
    EXPECT_EQ(box.events(), "shell /system/bin/sh -c \"chmod 664 /sys/class/power_supply/usb/online\"\n");
}

const std::string kBusy = "AT+QX_VBUS_VOLT=0,0,0,1";

// clang-format off
INSTANTIATE_TEST_SUITE_P(Runs, Vbus, ::testing::Values(
    VbusRun{"CableOut", "AT+QX_VBUS_VOLT=0,300,50,3", {"0"}, {"5012999"}, kBusy, "\"vbus_reading\"", "ATNG", 450, 0,
            "5012,5012,5012"},
    VbusRun{"ReadStops", "AT+QX_VBUS_VOLT=0,10,1500,5", {"0"}, {}, "AT+QX_VBUS_VOLT=1", "\"null\"", "ATNG", 0, 0,
            "null"},
    // Two whole-second checks, the second seeing the cable out, well before the 5 s start delay.
    VbusRun{"UnplugEndsStartWait", "AT+QX_VBUS_VOLT=0,5000,0,1", {"1", "1", "0"}, {}, "", "", "", 2000, 4500,
            "5012,5012,5012"},
    VbusRun{"Replug", "AT+QX_VBUS_VOLT=0,0,10,4", {"0"}, {"5000999", "5100000", "4899999", "-1500"}, "", "", "", 0, 0,
            "5100,-1,3749"},
    VbusRun{"TruncatedTowardZero", "AT+QX_VBUS_VOLT=0,0,10,2", {"0"}, {"4999", "-999"}, "", "", "", 0, 0, "4,0,2"},
    VbusRun{"MaximumNeverBelowZero", "AT+QX_VBUS_VOLT=0,0,10,2", {"0"}, {"-2500", "-1999"}, "", "", "", 0, 0,
            "0,-2,-1"}),
    [](const ::testing::TestParamInfo<VbusRun> &i) { return i.param.name; });
// clang-format on

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
