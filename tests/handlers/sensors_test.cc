// Motion-sensor tests: exact frames with C's rounding of the values, the NV record, the
// calibration files, the progress properties, the workers and the z-axis stream.
#include <chrono>
#include <filesystem>
#include <functional>
#include <thread>

#include <sys/socket.h>

#include "core/nv.h"
#include "tests/support/checks.h"
#include "tests/support/daemon.h"
#include "tests/support/in_process.h"

namespace {

using Clock = std::chrono::steady_clock;

const char *kAccelFile = "/data/vendor/engineermode/accelerometer_calibration";
const char *kGyroFile = "/data/vendor/engineermode/gyroscope_calibration";
const char *kGsCal = "persist.sys.gs_cal_flag";
const char *kGsCheck = "sys.gsensor.check";
const char *kGyroCal = "persist.sys.gyroscope_cal_flag";
const char *kGyroCheck = "sys.gyroscope.check";

// Every test's outcome is given here, so a change of the default phone cannot move a case.
const std::string kScript =
    "48=1,12.9,-7.9,25\n49=1,0.12,-0.08,9.79\n51=1\n96=1,12,-7,25\n"
    "80=1,3.7,-2.2,1\n81=1,1000,-10,0.4\n83=1\n97=1,3,-2,1\n98=1,0.5,1.5,-0.4\n99=1,2.5,-2.5,3.5\n"
    "101=1,-1.5,1e3,0.49\n102=1,7,8,9\n64=1,-21.5,13.2,-40.8\n65=1,-21.5,13.2,-40.8\n66=1\n519=1,0,-1.9,2.9\n";

std::string nv_pattern() {  // every byte non-zero, so a stray write shows
    std::string nv(PYXA_NV_SIZE, '\0');
    for (size_t i = 0; i < nv.size(); ++i) nv[i] = static_cast<char>(0x11 + i % 199);
    return nv;
}
std::string le32(int32_t v) { return std::string(reinterpret_cast<const char *>(&v), 4); }

size_t count(const std::string &text, const std::string &what) {
    size_t n = 0;
    for (size_t at = text.find(what); at != std::string::npos; at = text.find(what, at + 1)) ++n;
    return n;
}

using Setup = std::function<void(const Sandbox &)>;
// Lines that override the script (the first line of a key wins).
Setup script(const std::string &lines) {
    return [=](const Sandbox &b) { b.write("/.sim/sensor", lines + "\n" + kScript); };
}
Setup fault(const char *name) {
    return [=](const Sandbox &b) { b.fault(name); };
}

struct Case {
    std::string name, line;
    Setup setup = nullptr;
    std::string body, word;
    std::vector<std::pair<size_t, int32_t>> nv = {};           // fields written; the rest untouched
    std::vector<std::pair<const char *, const char *>> props = {};  // the other sensor ones stay unset
    std::vector<std::string> events = {};                       // recorded in this order
    const char *file = nullptr, *file_text = nullptr;           // a calibration file written
    int uart = 0;
};

void PrintTo(const Case &c, std::ostream *os) { *os << c.line.substr(0, 40) << " " << c.name; }

class SensorsTest : public InProcess {
protected:
    int saved_uart = is_uart_flag, saved_sp = is_sp;
    void SetUp() override {
        InProcess::SetUp();
        is_uart_flag = is_sp = 0;
        box.write("/.sim/nv.bin", nv_pattern());
        box.write("/.sim/sensor", kScript);
    }
    void TearDown() override {
        is_uart_flag = saved_uart, is_sp = saved_sp;
        InProcess::TearDown();
    }
    std::string frame(const std::string &line, const std::string &body, const std::string &word) {
        return line + "\r\n" + body + "\r\n" + word + "\r\n";
    }
    bool wait_prop(const char *name, const std::string &value, int ms = 5000) {
        for (auto end = Clock::now() + std::chrono::milliseconds(ms); Clock::now() < end;) {
            if (box.prop(name) == value) return true;
            std::this_thread::sleep_for(std::chrono::milliseconds(10));
        }
        return false;
    }
};
class SensorLine : public SensorsTest, public ::testing::WithParamInterface<Case> {};

TEST_P(SensorLine, Answers) {
    const Case &c = GetParam();
    is_uart_flag = c.uart;
    if (c.setup) c.setup(box);
    const std::string want = frame(c.line, c.body, c.word);
    EXPECT_EQ(serve(c.line, SRC_TCP, want.size()), want);
    EXPECT_EQ(answer(1, 0), "");

    std::string nv = nv_pattern();
    for (auto [off, v] : c.nv) nv.replace(off, 4, le32(v));
    EXPECT_EQ(box.read("/.sim/nv.bin"), nv);
    for (const char *name : {kGsCal, kGsCheck, kGyroCal, kGyroCheck}) {
        std::string v;
        for (auto [n, value] : c.props)
            if (std::string(n) == name) v = value;
        EXPECT_EQ(box.prop(name), v) << name;
    }
    for (const char *f : {kAccelFile, kGyroFile}) {
        if (c.file && std::string(f) == c.file) EXPECT_EQ(box.read(f), c.file_text);
        else EXPECT_FALSE(box.exists(f)) << f;
    }
    expect_in_order(box.events(), c.events);
}

std::string case_name(const ::testing::TestParamInfo<Case> &info) {
    std::string n = info.param.line.substr(0, 24) + "_" + info.param.name;
    for (char &ch : n)
        if (!isalnum(static_cast<unsigned char>(ch))) ch = '_';
    return n;
}

const std::string kMismatch = "\"material mismatch\"";
const std::pair<const char *, const char *> kGsCalRunning{kGsCal, "2"};

// clang-format off
INSTANTIATE_TEST_SUITE_P(Accelerometer, SensorLine, ::testing::Values(
    Case{"Calibrates", "AT+QXZLJC=0,5", nullptr, "", "OK",
         {{76, 12}, {80, -7}, {84, 25}, {0, 1}}, {{kGsCal, "1"}},
         {"setprop persist.sys.gs_cal_flag=2", "sensor test 48 -> 0 success=1", "nv write",
          "shell chmod 0666 /data/vendor/engineermode/accelerometer_calibration",
          "setprop persist.sys.gs_cal_flag=1", "calibrate gsensor_calibration=1 uart=0"},
         kAccelFile, "12 -7 25 0  ov"},
    Case{"OnTheUart", "AT+QXZLJC=0,5", nullptr, "", "OK", {{76, 12}, {80, -7}, {84, 25}, {0, 1}}, {{kGsCal, "1"}},
         {"calibrate gsensor_calibration=1 uart=1"}, kAccelFile, "12 -7 25 0  ov", 1},
    Case{"TextCutAt29", "AT+QXZLJC=0,5", script("48=1,-2147483648,-2147483648,-2147483648"), "", "OK",
         {{76, INT32_MIN}, {80, INT32_MIN}, {84, INT32_MIN}, {0, 1}}, {{kGsCal, "1"}}, {},
         kAccelFile, "-2147483648 -2147483648 -2147"},
    Case{"TruncatedAndSaturated", "AT+QXZLJC=0,5", script("48=1,-0.9,1e10,nan"), "", "OK",
         {{76, 0}, {80, INT32_MAX}, {84, 0}, {0, 1}}, {{kGsCal, "1"}}, {}, kAccelFile, "0 2147483647 0 0  ov"},
    Case{"NoFileStillPasses", "AT+QXZLJC=0,5",
         [](const Sandbox &b) { std::filesystem::remove_all(b.path("/data/vendor/engineermode")); }, "", "OK",
         {{76, 12}, {80, -7}, {84, 25}, {0, 1}}, {{kGsCal, "1"}}, {"nv write", "setprop persist.sys.gs_cal_flag=1"}},
    Case{"Absent", "AT+QXZLJC=0,5", script("48=absent"), kMismatch, "ERROR", {}, {{kGsCal, "0"}}},
    Case{"Fails", "AT+QXZLJC=0,5", script("48=0,1,2,3"), "", "ERROR", {}, {{kGsCal, "0"}}},
    Case{"NvReadFails", "AT+QXZLJC=0,5", fault("nv-read"), "", "ERROR", {}, {{kGsCal, "0"}}},
    Case{"NvWriteFails", "AT+QXZLJC=0,5", fault("nv-write"), "", "ERROR", {}, {{kGsCal, "0"}}},
    Case{"BlankAfterComma", "AT+QXZLJC=0, 5", nullptr, "", "ERROR"},
    Case{"Passes", "AT+QXZLJC=0,6", nullptr, "", "OK", {}, {{kGsCheck, "1"}},
         {"setprop sys.gsensor.check=2", "sensor test 51 -> 0 success=1", "setprop sys.gsensor.check=1"}},
    Case{"Fails", "AT+QXZLJC=0,6", script("51=2"), "", "ERROR", {}, {{kGsCheck, "0"}}},
    Case{"Absent", "AT+QXZLJC=0,6", script("51=absent"), kMismatch, "ERROR", {}, {{kGsCheck, "0"}}},
    Case{"Stop", "AT+QXZLJC=0,0", nullptr, "", "OK"},
    Case{"Flag", "AT+QXZLJC=0,2", nullptr, "\"" + std::to_string(0x14131211) + "\"\r\n", "OK"},
    Case{"NvReadFails", "AT+QXZLJC=0,2", fault("nv-read"), "", "ERROR"},
    Case{"Hundredths", "AT+QXZLJC=0,3", nullptr, "\"0.12,-0.08,9.79\"\r\n", "OK"},
    Case{"HalfEven", "AT+QXZLJC=0,3", script("49=1,0.125,-0.004,0.375"), "\"0.12,-0.00,0.38\"\r\n", "OK"},
    Case{"Fails", "AT+QXZLJC=0,3", script("49=0"), "", "ERROR", {}, {kGsCalRunning}},
    Case{"Absent", "AT+QXZLJC=0,3", script("49=absent"), kMismatch, "ERROR"},
    Case{"Report", "AT+QXZLJC=0,7", script("49=1,2.5,-0.5,1024\n96=1,0.5,1.5,-2.5"),
         "+orig:\"2,-0,1024\"\r\n+switch:\"2,-0,1000\"\r\n+cal:\"0,2,-2\"\r\n", "OK", {}, {},
         {"sensor test 49 -> 0", "sensor test 96 -> 0"}},
    Case{"CalValuesAbsent", "AT+QXZLJC=0,7", script("49=1,1000,-1000,1.5\n96=absent"),
         "+orig:\"1000,-1000,2\"\r\n+switch:\"976,-976,1\"\r\n+cal:\"0,0,0\"\r\n", "OK"},
    Case{"DataFails", "AT+QXZLJC=0,7", script("49=0"), "", "ERROR", {}, {kGsCalRunning}},
    Case{"DataAbsent", "AT+QXZLJC=0,7", script("49=absent"), "", "ERROR", {}, {kGsCalRunning}},
    Case{"BothAbsent", "AT+QXZLJC=0,7", script("49=absent\n96=absent"), kMismatch, "ERROR"},
    Case{"Whole", "AT+QXZLJC=0,8", nullptr, "\"0,2,-0\"\r\n", "OK", {}, {}, {"sensor test 98 -> 0"}},
    Case{"Fails", "AT+QXZLJC=0,8", script("98=0"), "", "ERROR"},
    Case{"Whole", "AT+QXZLJC=0,9", nullptr, "\"-2,1000,0\"\r\n", "OK", {}, {}, {"sensor test 101 -> 0"}},
    Case{"Whole", "AT+QXZLJC=0,a", nullptr, "\"7,8,9\"\r\n", "OK", {}, {}, {"sensor test 102 -> 0"}},
    Case{"UpperCaseArgument", "AT+QXZLJC=0,A", nullptr, "\"7,8,9\"\r\n", "OK"},
    Case{"Unknown", "AT+QXZLJC=0,4", nullptr, "", "ERROR"},
    Case{"NeverCalibrated", "AT+QX_SNS_GRA=0,1", nullptr, "\"-1\"", "ATOK"},
    Case{"Persisted", "AT+QX_SNS_GRA=0,1", [](const Sandbox &b) { b.set_prop(kGsCal, "0"); }, "\"0\"", "ATOK", {},
         {{kGsCal, "0"}}},
    Case{"NeverChecked", "AT+QX_SNS_GRAV=1,1", nullptr, "\"-1\"", "ATOK"}), case_name);

INSTANTIATE_TEST_SUITE_P(Gyroscope, SensorLine, ::testing::Values(
    Case{"Calibrates", "AT+QXTLY=0", nullptr, "", "OK", {{124, 3}, {128, -2}, {132, 1}, {120, 1}}, {{kGyroCal, "1"}},
         {"setprop persist.sys.gyroscope_cal_flag=2", "sensor test 80 -> 0 success=1", "nv write",
          "shell chmod 0666 /data/vendor/engineermode/gyroscope_calibration",
          "setprop persist.sys.gyroscope_cal_flag=1", "calibrate gyroscope_calibration=1 uart=0"},
         kGyroFile, "3 -2 1 0  ov"},
    Case{"Absent", "AT+QXTLY=0", script("80=absent"), kMismatch, "ERROR", {}, {{kGyroCal, "0"}}},
    Case{"NvWriteFails", "AT+QXTLY=0", fault("nv-write"), "", "ERROR", {}, {{kGyroCal, "0"}}},
    Case{"Passes", "AT+QXTLY=2", nullptr, "", "OK", {}, {{kGyroCheck, "1"}},
         {"setprop sys.gyroscope.check=2", "sensor test 83 -> 0 success=1", "setprop sys.gyroscope.check=1"}},
    Case{"Fails", "AT+QXTLY=2", script("83=0"), "", "ERROR", {}, {{kGyroCheck, "0"}}},
    Case{"Absent", "AT+QXTLY=2", script("83=absent"), kMismatch, "ERROR", {}, {{kGyroCheck, "0"}}},
    Case{"Report", "AT+QXTLY=3", nullptr, "+orig:\"1000,-10,0\"\r\n+switch:\"70,-0,0\"\r\n+cal:\"0.21,-0.14,0.07\"\r\n",
         "OK", {}, {}, {"sensor test 81 -> 0", "sensor show success=0 0,0,0", "sensor test 97 -> 0"}},
    Case{"OnlyCalValuesPass", "AT+QXTLY=3", script("81=0,5,5,5"),
         "+orig:\"5,5,5\"\r\n+switch:\"0,0,0\"\r\n+cal:\"0.21,-0.14,0.07\"\r\n", "OK"},
    Case{"DataAbsent", "AT+QXTLY=3", script("81=absent"),
         "+orig:\"0,0,0\"\r\n+switch:\"0,0,0\"\r\n+cal:\"0.21,-0.14,0.07\"\r\n", "OK"},
    Case{"OnlyDataPasses", "AT+QXTLY=3", script("97=0,100,100,100"),
         "+orig:\"1000,-10,0\"\r\n+switch:\"70,-0,0\"\r\n+cal:\"7.00,7.00,7.00\"\r\n", "OK"},
    Case{"NeitherPasses", "AT+QXTLY=3", script("81=0\n97=0"), "", "ERROR"},
    Case{"BothAbsent", "AT+QXTLY=3", script("81=absent\n97=absent"), kMismatch, "ERROR"},
    Case{"Whole", "AT+QXTLY=8", nullptr, "\"2,-2,4\"\r\n", "OK", {}, {}, {"sensor test 99 -> 0"}},
    Case{"Fails", "AT+QXTLY=8", script("99=0"), "", "ERROR"},
    Case{"NeverCalibrated", "AT+QX_SNS_GYR=0,1", nullptr, "\"-1\"", "ATOK"},
    Case{"Checked", "AT+QX_SNS_GYR=1,1", [](const Sandbox &b) { b.set_prop(kGyroCheck, "1"); }, "\"1\"", "ATOK", {},
         {{kGyroCheck, "1"}}},
    Case{"Unknown", "AT+QXTLY=1", nullptr, "", "ERROR"}), case_name);

INSTANTIATE_TEST_SUITE_P(MagnetometerAndInfrared, SensorLine, ::testing::Values(
    Case{"Nothing", "AT+QXDZLP=1", nullptr, "", "OK"},
    Case{"Nothing", "AT+QXDZLP=0", nullptr, "", "OK"},
    Case{"Hundredths", "AT+QXDZLP=2", nullptr, "\"-21.50,13.20,-40.80\"\r\n", "OK", {}, {}, {"sensor test 65 -> 0"}},
    Case{"FailsMarksAccelerometer", "AT+QXDZLP=2", script("65=0"), "", "ERROR", {}, {kGsCalRunning}},
    Case{"Absent", "AT+QXDZLP=2", script("65=absent"), kMismatch, "ERROR"},
    Case{"HalfEven", "AT+QXDZLP=3", nullptr, "\"-22,13,-41\"\r\n", "OK", {}, {}, {"sensor test 64 -> 0"}},
    Case{"AnyTail", "AT+QXDZLP=30,x", nullptr, "\"-22,13,-41\"\r\n", "OK", {}, {}, {"sensor test 64 -> 0"}},
    Case{"LongTail", "AT+QXDZLP=3" + std::string(2000, '9'), nullptr, "\"-22,13,-41\"\r\n", "OK"},
    Case{"LongLine", "AT+QXDZLP=" + std::string(2010, '2'), nullptr, "", "ERROR"},
    Case{"Query", "AT+QXDZLP?", nullptr, "", "ERROR"},
    Case{"FailsMarksAccelerometer", "AT+QXDZLP=3", script("64=0"), "", "ERROR", {}, {kGsCalRunning}},
    Case{"Passes", "AT+QXDZLP=4", nullptr, "", "OK", {}, {}, {"sensor test 66 -> 0 success=1"}},
    Case{"Fails", "AT+QXDZLP=4", script("66=0"), "", "ERROR"},
    Case{"Absent", "AT+QXDZLP=4", script("66=absent"), kMismatch, "ERROR"},
    Case{"Unknown", "AT+QXDZLP=5", nullptr, "", "ERROR"},
    Case{"Truncated", "AT+QX_IR_POLL_STATUS=0", nullptr, "\"-1,2\"", "OK", {}, {}, {"sensor test 519 -> 0"}},
    Case{"Fails", "AT+QX_IR_POLL_STATUS=0", script("519=0,0,1,1"), "", "ERROR"},
    Case{"Absent", "AT+QX_IR_POLL_STATUS=0", fault("sensor"), kMismatch, "ERROR"},
    Case{"Unknown", "AT+QX_IR_POLL_STATUS=1", nullptr, "", "ERROR"}), case_name);
// clang-format on

// The workers answer at once and report only through their property.
struct WorkerCase {
    std::string name, start, read;
    const char *prop;
    Setup setup;
    const char *result;
    std::vector<std::pair<size_t, int32_t>> nv = {};
    const char *file = nullptr, *file_text = nullptr;
};

void PrintTo(const WorkerCase &c, std::ostream *os) { *os << c.start << " " << c.name; }

class SensorWorker : public SensorsTest, public ::testing::WithParamInterface<WorkerCase> {};

TEST_P(SensorWorker, ReportsThroughItsProperty) {
    const WorkerCase &c = GetParam();
    // Every test takes a second, so the running state can be read back.
    if (c.setup) c.setup(box);
    box.write("/.sim/sensor", "48.ms=1000\n51.ms=1000\n80.ms=1000\n83.ms=1000\n" + box.read("/.sim/sensor"));
    const std::string started = frame(c.start, "", "ATOK");
    EXPECT_EQ(serve(c.start, SRC_TCP, started.size()), started);
    ASSERT_TRUE(wait_prop(c.prop, "2"));
    const std::string running = frame(c.read, "\"2\"", "ATOK");
    EXPECT_EQ(serve(c.read, SRC_TCP, running.size()), running);
    ASSERT_TRUE(wait_prop(c.prop, c.result)) << box.prop(c.prop);
    const std::string done = frame(c.read, std::string("\"") + c.result + "\"", "ATOK");
    EXPECT_EQ(serve(c.read, SRC_TCP, done.size()), done);
    EXPECT_EQ(answer(1, 0), "");

    std::string nv = nv_pattern();
    for (auto [off, v] : c.nv) nv.replace(off, 4, le32(v));
    EXPECT_EQ(box.read("/.sim/nv.bin"), nv);
    if (c.file) {
        EXPECT_EQ(box.read(c.file), c.file_text);
    }
    std::string p = std::string("setprop ") + c.prop + "=";
    expect_in_order(box.events(), {p + "2", "sensor test", p + c.result});
    // "2" stood for the whole scripted second of the test.
    long long began = -1, done_at = -1;
    for (const Event &e : box.event_list()) {
        if (e.kind == "setprop" && e.detail == std::string(c.prop) + "=2") began = e.ms;
        if (e.kind == "setprop" && e.detail == std::string(c.prop) + "=" + c.result) done_at = e.ms;
    }
    EXPECT_GE(done_at - began, 1000);
}

std::string worker_name(const ::testing::TestParamInfo<WorkerCase> &info) {
    std::string n = info.param.start + "_" + info.param.name;
    for (char &ch : n)
        if (!isalnum(static_cast<unsigned char>(ch))) ch = '_';
    return n;
}

// clang-format off
INSTANTIATE_TEST_SUITE_P(Workers, SensorWorker, ::testing::Values(
    WorkerCase{"Calibrates", "AT+QX_SNS_GRA=0,0", "AT+QX_SNS_GRA=0,1", kGsCal, nullptr, "1",
               {{76, 12}, {80, -7}, {84, 25}, {0, 1}}, kAccelFile, "12 -7 25 0  ov"},
    WorkerCase{"Absent", "AT+QX_SNS_GRA=0,0", "AT+QX_SNS_GRA=0,1", kGsCal, script("48=absent"), "0"},
    WorkerCase{"Passes", "AT+QX_SNS_GRAV=1,0", "AT+QX_SNS_GRAV=1,1", kGsCheck, nullptr, "1"},
    WorkerCase{"Fails", "AT+QX_SNS_GRAV=1,0", "AT+QX_SNS_GRAV=1,1", kGsCheck, script("51=0"), "0"},
    WorkerCase{"Calibrates", "AT+QX_SNS_GYR=0,0", "AT+QX_SNS_GYR=0,1", kGyroCal, nullptr, "1",
               {{124, 3}, {128, -2}, {132, 1}, {120, 1}}, kGyroFile, "3 -2 1 0  ov"},
    WorkerCase{"Absent", "AT+QX_SNS_GYR=1,0", "AT+QX_SNS_GYR=1,1", kGyroCheck, script("83=absent"), "0"}),
    worker_name);
// clang-format on

// The z-axis stream: texts "\r\n<z>" written to the current source every 200 ms.
class StreamTest : public SensorsTest {
protected:
    void TearDown() override {
        stop();
        SensorsTest::TearDown();
    }
    // Splits what arrived into stream texts, each "\r\n" and a value (each is written whole).
    static void split(const std::string &data, std::vector<std::string> &out) {
        for (size_t from = 0, next; from < data.size(); from = next) {
            next = data.find("\r\n", from + 2);
            if (next == std::string::npos) next = data.size();
            out.push_back(data.substr(from, next - from));
        }
    }
    // Stream texts until n arrived or ms passed.
    std::vector<std::string> texts(size_t n, int ms) {
        std::vector<std::string> out;
        split(carry, out);
        carry.clear();
        auto end = Clock::now() + std::chrono::milliseconds(ms);
        do split(answer(64, 20), out);
        while (out.size() < n && Clock::now() < end);
        return out;
    }
    // Serves a line on the same station while a stream may write: the frame comes whole,
    // around it only stream texts, which are returned.
    std::vector<std::string> serve_amid(const std::string &line) {
        char buf[kLineSize] = {0};
        line.copy(buf, kLineSize - 1);
        dispatch_command(buf, static_cast<int>(line.size()) + 1, SRC_TCP);
        std::string data = carry + answer(4096);
        carry.clear();
        const std::string want = frame(line, "", "OK");
        size_t at = data.find(want);
        EXPECT_NE(at, std::string::npos) << data;
        if (at != std::string::npos) data.erase(at, want.size());
        std::vector<std::string> out;
        split(data, out);
        return out;
    }
    // When each reading ended, from the record of device effects.
    std::vector<long long> readings() const {
        std::vector<long long> at;
        for (const Event &e : box.event_list())
            if (e.kind == "sensor" && e.detail.rfind("test 49 ", 0) == 0) at.push_back(e.ms);
        return at;
    }
    // Stops the stream and waits until no reading has come for three periods.
    std::vector<std::string> stop() {
        std::vector<std::string> late = serve_amid("AT+QXZLJC=0,0");
        size_t seen = readings().size();
        for (auto quiet = Clock::now(), end = quiet + std::chrono::seconds(10); Clock::now() < end;) {
            std::this_thread::sleep_for(std::chrono::milliseconds(50));
            if (readings().size() != seen) seen = readings().size(), quiet = Clock::now();
            else if (Clock::now() - quiet > std::chrono::milliseconds(600)) break;
        }
        for (const std::string &t : texts(100, 0)) late.push_back(t);
        return late;
    }
    // The start's frame; a reading that came in the same read is kept for texts().
    std::string start() {
        const size_t n = frame("AT+QXZLJC=0,1", "", "OK").size();
        std::string got = serve("AT+QXZLJC=0,1", SRC_TCP, n);
        carry = got.size() > n ? got.substr(n) : "";
        return got.substr(0, n);
    }
    std::string carry;
};

TEST_F(StreamTest, SendsZEveryPeriodUntilStopped) {
    ASSERT_EQ(start(), frame("AT+QXZLJC=0,1", "", "OK"));  // the answer comes before any reading
    std::vector<std::string> got = serve_amid("AT+QXZLJC=0,1");  // a second start starts nothing
    for (const std::string &t : texts(6, 5000)) got.push_back(t);
    ASSERT_GE(got.size(), 6u);
    for (const std::string &t : got) EXPECT_EQ(t, "\r\n10");
    std::vector<std::string> late = stop();
    EXPECT_LE(late.size(), 2u);  // one reading may be under way when the stop is served
    EXPECT_EQ(answer(1, 300), "");
    // One reading per period, each after a full 200 ms: a second stream would halve the gaps.
    std::vector<long long> at = readings();
    ASSERT_EQ(at.size(), got.size() + late.size());
    for (size_t i = 1; i < at.size(); ++i) EXPECT_GE(at[i] - at[i - 1], 200) << "reading " << i;
    EXPECT_LE((at.back() - at.front()) / static_cast<long long>(at.size() - 1), 300);
}

TEST_F(StreamTest, ValuesChangeUntilAFailedReadingEndsTheStream) {
    box.sequence("sensor:49", {"1,0,0,0.5", "1,0,0,1.5", "1,0,0,-0.4", "1,9,9,2.5", "1,0,0,-12345678", "0,0,0,7"});
    ASSERT_EQ(start(), frame("AT+QXZLJC=0,1", "", "OK"));
    EXPECT_EQ(texts(6, 3000), (std::vector<std::string>{"\r\n0", "\r\n2", "\r\n-0", "\r\n2", "\r\n-123456"}));
    // The flag stays set: a new start answers OK and starts nothing until the stop.
    ASSERT_EQ(start(), frame("AT+QXZLJC=0,1", "", "OK"));
    EXPECT_EQ(answer(1, 600), "");
    EXPECT_EQ(readings().size(), 6u);
    EXPECT_TRUE(stop().empty());
    box.sequence("sensor:49", {"1,0,0,-3.5"});
    ASSERT_EQ(start(), frame("AT+QXZLJC=0,1", "", "OK"));
    EXPECT_EQ(texts(1, 3000), std::vector<std::string>{"\r\n-4"});
}

TEST_F(StreamTest, AbsentPartSendsNothing) {
    script("49=absent")(box);
    ASSERT_EQ(start(), frame("AT+QXZLJC=0,1", "", "OK"));
    EXPECT_EQ(answer(1, 600), "");
    EXPECT_EQ(readings().size(), 1u);
}

// A calibration's results replace the last ones in the record and the file.
TEST_F(SensorsTest, SecondCalibrationReplacesTheFirst) {
    box.sequence("sensor:80", {"1,100,200,300", "1,-4,5.5,-6.5"});
    for (int i = 0; i < 2; ++i) EXPECT_EQ(serve("AT+QXTLY=0"), frame("AT+QXTLY=0", "", "OK"));
    EXPECT_EQ(box.read(kGyroFile), "-4 5 -6 0  ov");
    EXPECT_EQ(box.read("/.sim/nv.bin").substr(120, 16), le32(1) + le32(-4) + le32(5) + le32(-6));
}

// The daemon as a process: the stream over TCP, and AT mode's memory of a passed check.
// A TCP station's line end would stay in the line, so the lines go without one.
std::string exchange(int fd, const std::string &line, size_t want, int idle_ms = 3000) {
    send(fd, line.data(), line.size(), MSG_NOSIGNAL);
    return read_some(fd, want, idle_ms);
}

TEST(SensorsDaemon, ZStreamOverTcp) {
    Sandbox box;
    Daemon d(box);
    int s = d.connect_tcp();
    ASSERT_GE(s, 0);
    ASSERT_TRUE(d.wait_prop("sys.qrcode.view", "0"));
    const std::string ok = "AT+QXZLJC=0,1\r\n\r\nOK\r\n", z = "\r\n10";
    auto t0 = Clock::now();
    const std::string six = ok + z + z + z + z + z + z;
    EXPECT_EQ(exchange(s, "AT+QXZLJC=0,1", six.size()).substr(0, six.size()), six);  // a seventh may follow
    // The answer first, a reading at once, then one each period: five periods in all.
    auto ms = std::chrono::duration_cast<std::chrono::milliseconds>(Clock::now() - t0).count();
    EXPECT_GE(ms, 1000);
    EXPECT_LE(ms, 2500);
    std::string rest = exchange(s, "AT+QXZLJC=0,0", 4096, 500);
    size_t at = rest.find("AT+QXZLJC=0,0\r\n\r\nOK\r\n");
    ASSERT_NE(at, std::string::npos) << rest;
    EXPECT_LE(rest.size(), at + 22 + 2 * z.size());
    EXPECT_EQ(read_some(s, 1, 600), "");
    close(s);
}

TEST(SensorsDaemon, AtModeChecksTheGyroscopeUntilItPassesOnce) {
    Sandbox box;
    box.write("/.sim/sensor", "83=0\n");
    Daemon d(box, "console-at=sendAT");
    int s = d.connect_tcp();
    ASSERT_GE(s, 0);
    const std::string failed = "AT+QXTLY=2\r\n\r\nERROR\r\n", ok = "AT+QXTLY=2\r\n\r\nOK\r\n",
                      skipped = "AT+QXTLY=2\r\n\r\nATOK\r\n";
    EXPECT_EQ(exchange(s, "AT+QXTLY=2", failed.size()), failed);
    EXPECT_EQ(exchange(s, "AT+QXTLY=2", failed.size()), failed);
    box.write("/.sim/sensor", "83=1\n");
    EXPECT_EQ(exchange(s, "AT+QXTLY=2", ok.size()), ok);
    box.write("/.sim/sensor", "83=0\n");
    EXPECT_EQ(exchange(s, "AT+QXTLY=2", skipped.size()), skipped);
    EXPECT_EQ(count(box.events(), "sensor test 83 "), 3u);
    EXPECT_EQ(box.prop(kGyroCheck), "1");
    close(s);
}

}  // namespace
