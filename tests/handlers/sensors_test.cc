// Motion-sensor tests: exact frames with C's rounding of the values, the NV record, the
// calibration files, the progress properties, the workers and the z-axis stream.
#include <chrono>
#include <filesystem>
#include <functional>
#include <map>
#include <thread>

#include <sys/socket.h>

#include "tests/support/checks.h"
#include "tests/support/daemon.h"
#include "tests/support/in_process.h"
#include "tests/support/test_name.h"

namespace {

using Clock = std::chrono::steady_clock;

const char *kAccelFile = "/data/vendor/engineermode/accelerometer_calibration";
const char *kGyroFile = "/data/vendor/engineermode/gyroscope_calibration";
const char *kGsCal = "persist.sys.gs_cal_flag";
const char *kGsCheck = "sys.gsensor.check";
const char *kGyroCal = "persist.sys.gyroscope_cal_flag";
const char *kGyroCheck = "sys.gyroscope.check";

// Every outcome is scripted here, so a change of the default phone cannot move a case.
const std::string kScript =
    "48=1,12.9,-7.9,25\n49=1,0.12,-0.08,9.79\n51=1\n96=1,12,-7,25\n"
    "80=1,3.7,-2.2,1\n81=1,1000,-10,0.4\n83=1\n97=1,3,-2,1\n98=1,0.5,1.5,-0.4\n99=1,2.5,-2.5,3.5\n"
    "101=1,-1.5,1e3,0.49\n102=1,7,8,9\n64=1,-21.5,13.2,-40.8\n65=1,-21.5,13.2,-40.8\n66=1\n519=1,0,-1.9,2.9\n";

std::string nv_pattern() { return nv_fill(0x11, 199); }  // every byte non-zero, so a stray write shows
std::string le32(int32_t v) { return std::string(reinterpret_cast<const char *>(&v), 4); }

using Nv = std::vector<std::pair<size_t, int32_t>>;  // fields written; the rest untouched
const Nv kAccelNv = {{76, 12}, {80, -7}, {84, 25}, {0, 1}}, kGyroNv = {{124, 3}, {128, -2}, {132, 1}, {120, 1}};
void expect_nv(const Sandbox &b, const Nv &fields) {
    std::string nv = nv_pattern();
    for (auto [off, v] : fields) nv.replace(off, 4, le32(v));
    EXPECT_EQ(b.read("/.sim/nv.bin"), nv);
}

using Setup = std::function<void(const Sandbox &)>;
// Lines that override the script (the first line of a key wins).
Setup script(const std::string &lines) { return [=](const Sandbox &b) { b.write("/.sim/sensor", lines + "\n" + kScript); }; }
Setup fault(const char *name) { return [=](const Sandbox &b) { b.fault(name); }; }

struct Case {
    std::string tag, line;
    Setup setup = nullptr;
    std::string body, word;
    Nv nv = {};
    std::map<std::string, std::string> props = {};  // the other sensor ones stay unset
    std::vector<std::string> events = {};                            // recorded in this order
    const char *file = nullptr, *file_text = nullptr;                // a calibration file written
    int uart = 0;
};
void PrintTo(const Case &c, std::ostream *os) { *os << c.line.substr(0, 40) << " " << c.tag; }

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
    void expect_answer(const std::string &line, const std::string &body, const std::string &word) {
        const std::string want = frame(line, body, word);
        EXPECT_EQ(serve(line, SRC_TCP, want.size()), want);
    }
};
class SensorLine : public SensorsTest, public ::testing::WithParamInterface<Case> {};

TEST_P(SensorLine, Answers) {
    const Case &c = GetParam();
    is_uart_flag = c.uart;
    if (c.setup) c.setup(box);
    expect_answer(c.line, c.body, c.word);
    EXPECT_EQ(answer(1, 0), "");
    expect_nv(box, c.nv);
    for (const char *name : {kGsCal, kGsCheck, kGyroCal, kGyroCheck})
        EXPECT_EQ(box.prop(name), c.props.count(name) ? c.props.at(name) : "") << name;
    for (const char *f : {kAccelFile, kGyroFile}) {
        if (c.file && std::string(f) == c.file) EXPECT_EQ(box.read(f), c.file_text);
        else EXPECT_FALSE(box.exists(f)) << f;
    }
    expect_in_order(box.events(), c.events);
}

const auto by_tag = named_by([](const Case &c) { return c.line.substr(0, 24) + "," + c.tag; });
const std::string kMismatch = "\"material mismatch\"";
const std::pair<const char *, const char *> kGsCalRunning{kGsCal, "2"}, kGsCalFailed{kGsCal, "0"};

// clang-format off
// Accelerometer: calibration (record, file, cut and saturated values), self-check, readings.
INSTANTIATE_TEST_SUITE_P(Accelerometer, SensorLine, ::testing::Values(
    Case{"OnTheUart", "AT+QXZLJC=0,5", nullptr, "", "OK", kAccelNv, {{kGsCal, "1"}},
         {"setprop persist.sys.gs_cal_flag=2", "sensor test 48 -> 0 success=1", "nv write",
          "shell chmod 0666 /data/vendor/engineermode/accelerometer_calibration",
          "setprop persist.sys.gs_cal_flag=1", "calibrate gsensor_calibration=1 uart=1"}, kAccelFile, "12 -7 25 0  ov", 1},
    Case{"TextCutAt29", "AT+QXZLJC=0,5", script("48=1,-2147483648,-2147483648,-2147483648"), "", "OK",
         {{76, INT32_MIN}, {80, INT32_MIN}, {84, INT32_MIN}, {0, 1}}, {{kGsCal, "1"}}, {},
         kAccelFile, "-2147483648 -2147483648 -2147"},
    Case{"TruncatedAndSaturated", "AT+QXZLJC=0,5", script("48=1,-0.9,1e10,nan"), "", "OK",
         {{76, 0}, {80, INT32_MAX}, {84, 0}, {0, 1}}, {{kGsCal, "1"}}, {}, kAccelFile, "0 2147483647 0 0  ov"},
    Case{"NoFileStillPasses", "AT+QXZLJC=0,5",
         [](const Sandbox &b) { std::filesystem::remove_all(b.path("/data/vendor/engineermode")); }, "", "OK",
         kAccelNv, {{kGsCal, "1"}}, {"nv write", "setprop persist.sys.gs_cal_flag=1"}},
    Case{"Absent", "AT+QXZLJC=0,5", script("48=absent"), kMismatch, "ERROR", {}, {kGsCalFailed}},
    Case{"Fails", "AT+QXZLJC=0,5", script("48=0,1,2,3"), "", "ERROR", {}, {kGsCalFailed}},
    Case{"NvReadFails", "AT+QXZLJC=0,5", fault("nv-read"), "", "ERROR", {}, {kGsCalFailed}},
    Case{"Passes", "AT+QXZLJC=0,6", nullptr, "", "OK", {}, {{kGsCheck, "1"}},
         {"setprop sys.gsensor.check=2", "sensor test 51 -> 0 success=1", "setprop sys.gsensor.check=1"}},
    Case{"Fails", "AT+QXZLJC=0,6", script("51=2"), "", "ERROR", {}, {{kGsCheck, "0"}}},
    Case{"Absent", "AT+QXZLJC=0,6", script("51=absent"), kMismatch, "ERROR", {}, {{kGsCheck, "0"}}},
    Case{"Flag", "AT+QXZLJC=0,2", nullptr, "\"" + std::to_string(0x14131211) + "\"\r\n", "OK"},
    Case{"NvReadFails", "AT+QXZLJC=0,2", fault("nv-read"), "", "ERROR"},
    Case{"HalfEven", "AT+QXZLJC=0,3", script("49=1,0.125,-0.004,0.375"), "\"0.12,-0.00,0.38\"\r\n", "OK", {}, {},
         {"sensor test 49 -> 0"}},
    Case{"Fails", "AT+QXZLJC=0,3", script("49=0"), "", "ERROR", {}, {kGsCalRunning}},
    Case{"Absent", "AT+QXZLJC=0,3", script("49=absent"), kMismatch, "ERROR"},
    Case{"Report", "AT+QXZLJC=0,7", script("49=1,2.5,-0.5,1024\n96=1,0.5,1.5,-2.5"),
         "+orig:\"2,-0,1024\"\r\n+switch:\"2,-0,1000\"\r\n+cal:\"0,2,-2\"\r\n", "OK", {}, {},
         {"sensor test 49 -> 0", "sensor test 96 -> 0"}},
    Case{"CalValuesAbsent", "AT+QXZLJC=0,7", script("49=1,1000,-1000,1.5\n96=absent"),
         "+orig:\"1000,-1000,2\"\r\n+switch:\"976,-976,1\"\r\n+cal:\"0,0,0\"\r\n", "OK"},
    Case{"DataFails", "AT+QXZLJC=0,7", script("49=0"), "", "ERROR", {}, {kGsCalRunning}},
    Case{"BothAbsent", "AT+QXZLJC=0,7", script("49=absent\n96=absent"), kMismatch, "ERROR"},
    Case{"Whole", "AT+QXZLJC=0,8", nullptr, "\"0,2,-0\"\r\n", "OK", {}, {}, {"sensor test 98 -> 0"}},
    Case{"FailsUnmarked", "AT+QXZLJC=0,8", script("98=0"), "", "ERROR"},
    Case{"Whole", "AT+QXZLJC=0,9", nullptr, "\"-2,1000,0\"\r\n", "OK", {}, {}, {"sensor test 101 -> 0"}},
    Case{"UpperCaseArgument", "AT+QXZLJC=0,A", nullptr, "\"7,8,9\"\r\n", "OK", {}, {}, {"sensor test 102 -> 0"}},
    Case{"Unknown", "AT+QXZLJC=0,4", nullptr, "", "ERROR"},
    Case{"NeverCalibrated", "AT+QX_SNS_GRA=0,1", nullptr, "\"-1\"", "ATOK"}), by_tag);

// Gyroscope: the same calibration on its own record fields, file and property; its report.
INSTANTIATE_TEST_SUITE_P(Gyroscope, SensorLine, ::testing::Values(
    Case{"Calibrates", "AT+QXTLY=0", nullptr, "", "OK", kGyroNv, {{kGyroCal, "1"}},
         {"setprop persist.sys.gyroscope_cal_flag=2", "sensor test 80 -> 0 success=1", "nv write",
          "shell chmod 0666 /data/vendor/engineermode/gyroscope_calibration",
          "setprop persist.sys.gyroscope_cal_flag=1", "calibrate gyroscope_calibration=1 uart=0"}, kGyroFile, "3 -2 1 0  ov"},
    Case{"NvWriteFails", "AT+QXTLY=0", fault("nv-write"), "", "ERROR", {}, {{kGyroCal, "0"}}},
    Case{"Passes", "AT+QXTLY=2", nullptr, "", "OK", {}, {{kGyroCheck, "1"}},
         {"setprop sys.gyroscope.check=2", "sensor test 83 -> 0 success=1", "setprop sys.gyroscope.check=1"}},
    Case{"Report", "AT+QXTLY=3", nullptr, "+orig:\"1000,-10,0\"\r\n+switch:\"70,-0,0\"\r\n+cal:\"0.21,-0.14,0.07\"\r\n",
         "OK", {}, {}, {"sensor test 81 -> 0", "sensor show success=0 0,0,0", "sensor test 97 -> 0"}},
    Case{"OnlyCalValuesPass", "AT+QXTLY=3", script("81=0,5,5,5"),
         "+orig:\"5,5,5\"\r\n+switch:\"0,0,0\"\r\n+cal:\"0.21,-0.14,0.07\"\r\n", "OK"},
    Case{"OnlyDataPasses", "AT+QXTLY=3", script("97=0,100,100,100"),
         "+orig:\"1000,-10,0\"\r\n+switch:\"70,-0,0\"\r\n+cal:\"7.00,7.00,7.00\"\r\n", "OK"},
    Case{"NeitherPasses", "AT+QXTLY=3", script("81=0\n97=0"), "", "ERROR"},
    Case{"BothAbsent", "AT+QXTLY=3", script("81=absent\n97=absent"), kMismatch, "ERROR"},
    Case{"Whole", "AT+QXTLY=8", nullptr, "\"2,-2,4\"\r\n", "OK", {}, {}, {"sensor test 99 -> 0"}},
    Case{"Unknown", "AT+QXTLY=1", nullptr, "", "ERROR"}), by_tag);

// Magnetometer readings (both mark the accelerometer when they fail) and the infrared poll.
INSTANTIATE_TEST_SUITE_P(MagnetometerAndInfrared, SensorLine, ::testing::Values(
    Case{"Nothing", "AT+QXDZLP=1", nullptr, "", "OK"},
    Case{"Nothing", "AT+QXDZLP=0", nullptr, "", "OK"},
    Case{"Hundredths", "AT+QXDZLP=2", nullptr, "\"-21.50,13.20,-40.80\"\r\n", "OK", {}, {}, {"sensor test 65 -> 0"}},
    Case{"FailsMarksAccelerometer", "AT+QXDZLP=2", script("65=0"), "", "ERROR", {}, {kGsCalRunning}},
    Case{"AnyTail", "AT+QXDZLP=30,x", nullptr, "\"-22,13,-41\"\r\n", "OK", {}, {}, {"sensor test 64 -> 0"}},
    Case{"FailsMarksAccelerometer", "AT+QXDZLP=3", script("64=0"), "", "ERROR", {}, {kGsCalRunning}},
    Case{"Passes", "AT+QXDZLP=4", nullptr, "", "OK", {}, {}, {"sensor test 66 -> 0 success=1"}},
    Case{"Fails", "AT+QXDZLP=4", script("66=0"), "", "ERROR"},
    Case{"Absent", "AT+QXDZLP=4", script("66=absent"), kMismatch, "ERROR"},
    Case{"Unknown", "AT+QXDZLP=5", nullptr, "", "ERROR"},
    Case{"Truncated", "AT+QX_IR_POLL_STATUS=0", nullptr, "\"-1,2\"", "OK", {}, {}, {"sensor test 519 -> 0"}},
    Case{"Fails", "AT+QX_IR_POLL_STATUS=0", script("519=0,0,1,1"), "", "ERROR"},
    Case{"Absent", "AT+QX_IR_POLL_STATUS=0", fault("sensor"), kMismatch, "ERROR"},
    Case{"Unknown", "AT+QX_IR_POLL_STATUS=1", nullptr, "", "ERROR"}), by_tag);
// clang-format on

// The workers answer at once, report only through their property, and "2" lasts the
// whole scripted second of the test.
struct WorkerCase {
    std::string tag, start, read;
    const char *prop;
    Setup setup;
    const char *result;
    Nv nv = {};
    const char *file = nullptr, *file_text = nullptr;
};
void PrintTo(const WorkerCase &c, std::ostream *os) { *os << c.start << " " << c.tag; }
class SensorWorker : public SensorsTest, public ::testing::WithParamInterface<WorkerCase> {};

TEST_P(SensorWorker, ReportsThroughItsProperty) {
    const WorkerCase &c = GetParam();
    if (c.setup) c.setup(box);
    box.write("/.sim/sensor", "48.ms=1000\n51.ms=1000\n80.ms=1000\n83.ms=1000\n" + box.read("/.sim/sensor"));
    expect_answer(c.start, "", "ATOK");
    ASSERT_TRUE(wait_until([&] { return box.prop(c.prop) == "2"; }, 5000));
    expect_answer(c.read, "\"2\"", "ATOK");
    ASSERT_TRUE(wait_until([&] { return box.prop(c.prop) == c.result; }, 5000)) << box.prop(c.prop);
    expect_answer(c.read, std::string("\"") + c.result + "\"", "ATOK");
    EXPECT_EQ(answer(1, 0), "");
    expect_nv(box, c.nv);
    if (c.file) {
        EXPECT_EQ(box.read(c.file), c.file_text);
    }
    const std::string running = std::string(c.prop) + "=2", done = std::string(c.prop) + "=" + c.result;
    expect_in_order(box.events(), {"setprop " + running, "sensor test", "setprop " + done});
    long long began = -1, done_at = -1;
    for (const Event &e : box.event_list()) {
        if (e.kind == "setprop" && e.detail == running) began = e.ms;
        if (e.kind == "setprop" && e.detail == done) done_at = e.ms;
    }
    EXPECT_GE(done_at - began, 1000);
}

INSTANTIATE_TEST_SUITE_P(Workers, SensorWorker, ::testing::Values(
    WorkerCase{"Calibrates", "AT+QX_SNS_GRA=0,0", "AT+QX_SNS_GRA=0,1", kGsCal, nullptr, "1", kAccelNv, kAccelFile,
               "12 -7 25 0  ov"},
    WorkerCase{"Fails", "AT+QX_SNS_GRAV=1,0", "AT+QX_SNS_GRAV=1,1", kGsCheck, script("51=0"), "0"},
    WorkerCase{"Calibrates", "AT+QX_SNS_GYR=0,0", "AT+QX_SNS_GYR=0,1", kGyroCal, nullptr, "1", kGyroNv, kGyroFile,
               "3 -2 1 0  ov"},
    WorkerCase{"Absent", "AT+QX_SNS_GYR=1,0", "AT+QX_SNS_GYR=1,1", kGyroCheck, script("83=absent"), "0"}),
    named_by([](const WorkerCase &c) { return c.start + "," + c.tag; }));

// The z-axis stream: texts "\r\n<z>" written to the current source every 200 ms.
class StreamTest : public SensorsTest {
protected:
    std::string got;  // everything the station received
    const std::string kStart = frame("AT+QXZLJC=0,1", "", "OK"), kStop = frame("AT+QXZLJC=0,0", "", "OK");
    void TearDown() override {
        stop();
        SensorsTest::TearDown();
    }
    // Dispatches a line on the open station connection, which the stream keeps writing to.
    void send_line(const std::string &line) {
        char buf[kLineSize] = {0};
        line.copy(buf, kLineSize - 1);
        dispatch_command(buf, static_cast<int>(line.size()) + 1, SRC_TCP);
    }
    void collect(size_t bytes, int ms) {  // until got holds bytes or ms passed
        wait_until([&] { return (got += answer(4096, 20)).size() >= bytes; }, ms);
    }
    std::vector<long long> readings() const {  // when each reading ended
        std::vector<long long> at;
        for (const Event &e : box.event_list())
            if (e.kind == "sensor" && e.detail.rfind("test 49 ", 0) == 0) at.push_back(e.ms);
        return at;
    }
    // Stops the stream and waits until no reading has come for three periods.
    void stop() {
        send_line("AT+QXZLJC=0,0");
        size_t seen = readings().size();
        for (auto quiet = Clock::now(), end = quiet + std::chrono::seconds(10); Clock::now() < end;) {
            got += answer(4096, 50);
            if (readings().size() != seen) seen = readings().size(), quiet = Clock::now();
            else if (Clock::now() - quiet > std::chrono::milliseconds(600)) break;
        }
        got += answer(4096, 0);
    }
    // Takes the first copy of a frame out of got; where it stood, or npos.
    size_t take(const std::string &f) {
        size_t at = got.find(f);
        if (at != std::string::npos) got.erase(at, f.size());
        return at;
    }
};

TEST_F(StreamTest, SendsZEveryPeriodUntilStopped) {
    send_line("AT+QXZLJC=0,1");
    send_line("AT+QXZLJC=0,1");  // a second start starts nothing
    collect(2 * kStart.size() + 6 * 4, 5000);
    stop();
    EXPECT_EQ(take(kStart), 0u) << "the answer comes before any reading";
    EXPECT_NE(take(kStart), std::string::npos);
    size_t stopped = take(kStop);
    ASSERT_NE(stopped, std::string::npos) << got;
    EXPECT_LE(got.size() - stopped, 2 * 4u);  // one reading may be under way when the stop is served
    std::vector<long long> at = readings();
    ASSERT_GE(at.size(), 6u);
    std::string z;
    for (size_t i = 0; i < at.size(); ++i) z += "\r\n10";
    EXPECT_EQ(got, z);
    // One reading per period, each after a full 200 ms: a second stream would halve the gaps.
    for (size_t i = 1; i < at.size(); ++i) EXPECT_GE(at[i] - at[i - 1], 200) << "reading " << i;
    EXPECT_LE((at.back() - at.front()) / static_cast<long long>(at.size() - 1), 300);
}

// A failed (or absent) reading ends the stream, but the flag stays set until the stop.
TEST_F(StreamTest, ValuesChangeUntilAFailedReadingEndsTheStream) {
    box.sequence("sensor:49", {"1,0,0,0.5", "1,0,0,1.5", "1,0,0,-0.4", "1,9,9,2.5", "1,0,0,-12345678", "0,0,0,7"});
    const std::string want = kStart + "\r\n0\r\n2\r\n-0\r\n2\r\n-123456";
    send_line("AT+QXZLJC=0,1");
    collect(want.size(), 3000);
    send_line("AT+QXZLJC=0,1");
    collect(want.size() + kStart.size() + 1, 600);
    EXPECT_EQ(got, want + kStart);
    EXPECT_EQ(readings().size(), 6u);
    got.clear();
    stop();
    EXPECT_EQ(got, kStop);
    got.clear();
    box.sequence("sensor:49", {"1,0,0,-3.5"});
    send_line("AT+QXZLJC=0,1");
    collect(kStart.size() + 4, 3000);
    EXPECT_EQ(got.substr(0, kStart.size() + 4), kStart + "\r\n-4");
}

// A stop and a start within one period: the old stream ends instead of waking beside the
// new one, so the new stream's readings stay a full period apart.
TEST_F(StreamTest, QuickRestartKeepsOneStream) {
    send_line("AT+QXZLJC=0,1");
    collect(kStart.size() + 4, 3000);
    send_line("AT+QXZLJC=0,0");
    send_line("AT+QXZLJC=0,1");
    collect(3 * kStart.size() + 6 * 4, 3000);
    stop();
    std::vector<long long> at = readings();
    ASSERT_GE(at.size(), 6u);
    for (size_t i = 2; i < at.size(); ++i) EXPECT_GE(at[i] - at[i - 1], 200) << "reading " << i;
}

TEST_F(SensorsTest, SecondCalibrationReplacesTheFirst) {
    box.sequence("sensor:80", {"1,100,200,300", "1,-4,5.5,-6.5"});
    for (int i = 0; i < 2; ++i) expect_answer("AT+QXTLY=0", "", "OK");
    EXPECT_EQ(box.read(kGyroFile), "-4 5 -6 0  ov");
    EXPECT_EQ(box.read("/.sim/nv.bin").substr(120, 16), le32(1) + le32(-4) + le32(5) + le32(-6));
}

// In AT mode a gyroscope check that passed once is not run again.
TEST(SensorsDaemon, AtModeChecksTheGyroscopeUntilItPassesOnce) {
    Sandbox box;
    box.write("/.sim/sensor", "83=0\n");
    Daemon d(box, "console-at=sendAT");
    int s = d.connect_tcp();
    ASSERT_GE(s, 0);
    for (auto [script, word] : {std::pair{"83=0\n", "ERROR"}, {"83=0\n", "ERROR"}, {"83=1\n", "OK"}, {"83=0\n", "ATOK"}}) {
        box.write("/.sim/sensor", script);
        const std::string want = frame("AT+QXTLY=2", "", word);  // a TCP line goes bare: its end would stay in it
        send(s, "AT+QXTLY=2", 10, MSG_NOSIGNAL);
        EXPECT_EQ(read_some(s, want.size()), want);
    }
    size_t runs = 0;
    for (const Event &e : box.event_list()) runs += e.kind == "sensor" && e.detail.rfind("test 83 ", 0) == 0;
    EXPECT_EQ(runs, 3u);
    EXPECT_EQ(box.prop(kGyroCheck), "1");
    close(s);
}

}  // namespace