// Key tests: keys pressed on the simulated phone's input devices reach the capture file as
// letters; the virtual keys and the side keys answer byte for byte.
#include <atomic>
#include <chrono>
#include <array>
#include <filesystem>
#include <functional>
#include <set>
#include <thread>

#include "core/input_events.h"
#include "platform/sim/chardev.h"
#include "tests/support/checks.h"
#include "tests/support/in_process.h"
#include "tests/support/test_name.h"

namespace {

namespace fs = std::filesystem;

const char *kBacklight = "/sys/class/leds/button-backlight/brightness";
const char *kCapacitance = "/sys/touchscreen/virtual_key/key_capacitance_test";
const char *kCsTemp = "/sys/cs_press/cs_press/temperature";
const char *kBatteryTemp = "/sys/class/power_supply/battery/temp";
const char *kTrigger = "/sys/class/leds/vibrator/at_trigger_state";

class Keys : public InProcess {
protected:
    void SetUp() override {
        InProcess::SetUp();
        is_sp = 0;
    }
    void TearDown() override {
        exit_input_threads();
        set_volume_up_hook(nullptr);
        is_sp = 0;
        InProcess::TearDown();
    }
    void expect_answer(const std::string &line, const std::string &body, const std::string &word) {
        const std::string want = frame(line, body, word);
        EXPECT_EQ(serve(line, SRC_TCP, want.size()), want);
    }
    void station(const std::string &line) { ASSERT_TRUE(sim::station_send(box.root, line)) << line; }
    bool captured(const std::string &text) {
        return wait_until([&] { return box.read(kKeyCaptureFile) == text; });
    }
};

// Released keys as letters and properties (presses, unknown keys and a stopped test add nothing),
// then every key of the table, released once, in table order (one at a time: several devices).
TEST_F(Keys, ReleasedKeysAreCapturedAsLettersAndProperties) {
    box.reply("key_test 1", "ok");
    expect_answer("AT+QXKEY=1", "", "OK");
    station("input key 114 press");  // a press alone records nothing
    station("input key 114 release");
    station("input key 116 click");
    station("input key 999 click");  // unknown keys are only logged
    station("input key 311 click");  // sets a property, saves no letter
    station("input key 752 click");
    std::string want = "-PU";
    ASSERT_TRUE(captured(want)) << box.read(kKeyCaptureFile);
    for (auto [key, value] :
         {std::pair{"volumedown", "1"}, {"power", "1"}, {"left", "1"}, {"volumeup", ""}, {"right", ""}})
        EXPECT_EQ(box.prop(std::string("sys.key.") + key), value) << key;
    const std::string letters = "H-+PMWRCTCA  AUD";
    const std::array codes{102, 114, 115, 116, 139, 143, 158, 164, 172, 226, 308, 311, 312, 600, 752, 753};
    for (size_t i = 0; i < letters.size(); ++i) {
        station("input key " + std::to_string(codes[i]) + " click");
        if (letters[i] != ' ') want += letters[i];
        ASSERT_TRUE(captured(want)) << codes[i] << ": " << box.read(kKeyCaptureFile);
    }
    EXPECT_EQ(box.prop("sys.key.right"), "1");
    expect_answer("AT+QXKEY=0", "\r\n\"" + want + "\"\r\n", "OK");
    EXPECT_NE(box.events().find("shell /system/bin/sh -c \"chmod 0666 /data/engineermode/keycodeTest\""), std::string::npos);
    station("input key 116 click");  // stopped: not captured
    std::this_thread::sleep_for(std::chrono::milliseconds(300));
    EXPECT_EQ(box.read(kKeyCaptureFile), want);
}

std::atomic<int> g_hook_calls{0};
void count_hook(int code) { g_hook_calls += code == KEY_VOLUMEUP ? 1 : 100; }

// A second start keeps the capture, a fresh one deletes it, no devices fail it; the volume-up
// hook runs once instead of the press.
TEST_F(Keys, StartsAndTheVolumeUpHook) {
    g_hook_calls = 0;
    set_volume_up_hook(count_hook);
    ASSERT_EQ(create_input_threads(), 0);
    station("input key 115 press");    // the hook takes it
    station("input key 115 release");  // recorded as usual
    station("input key 115 click");
    ASSERT_TRUE(captured("++"));
    EXPECT_EQ(g_hook_calls, 1);
    ASSERT_EQ(create_input_threads(), 0);
    station("input key 139 click");
    EXPECT_TRUE(captured("++M")) << box.read(kKeyCaptureFile);
    exit_input_threads();
    ASSERT_EQ(create_input_threads(), 0);
    EXPECT_FALSE(box.exists(kKeyCaptureFile));
    exit_input_threads();
    fs::remove_all(box.path("/dev/input"));  // no devices fail the start but not the answer: it is the app's
    EXPECT_EQ(create_input_threads(), -1);
    box.reply("key_test 1", "ok");
    expect_answer("AT+QXKEY=1", "", "OK");
}

// Only devices that report keys are watched: the switches of a lid that also has a key.
TEST_F(Keys, SwitchesAndTouchAreTracked) {
    box.write("/dev/input/event5", "name=lid\nkey=143\nsw=0,1,20\n");
    ASSERT_EQ(create_input_threads(), 0);
    for (const char *e : {"sw 1 1 event5", "sw 0 1 event5", "sw 0 0 event5", "sw 20 1 event5", "touch 120 340",
                          "key 143 click event5"})  // switch 20 is beyond the mask; one device's events come in order
        station(std::string("input ") + e);
    ASSERT_TRUE(captured("W"));
    EXPECT_EQ(input_switch_mask(), 0x2u);
    int32_t x = 0, y = 0;
    EXPECT_TRUE(wait_until([&] { return input_touch_position(x, y), x == 120; }));  // the touch screen is another device
    EXPECT_EQ(y, 340);
    exit_input_threads();
    ASSERT_EQ(create_input_threads(), 0);
    EXPECT_EQ(input_switch_mask(), 0u);  // cleared at every start
}

std::set<int> g_fds;  // the devices that delivered an event
int count_device(int fd, uint32_t events, void *) {
    struct input_event ev {};
    if (ev_get_input(fd, events, &ev) == 0) g_fds.insert(fd);
    return 0;
}

TEST_F(Keys, AtMostSixteenKeyDevicesAreWatched) {
    fs::remove_all(box.path("/dev/input"));
    for (int i = 0; i < 18; ++i) box.write("/dev/input/event" + std::to_string(i), "name=k\nkey=116\n");
    box.write("/dev/input/event18", "name=lid\nsw=0\n");
    box.write("/dev/input/mice", "");
    g_fds.clear();
    ASSERT_EQ(ev_init(count_device, nullptr), 0);
    for (int i = 0; i < 18; ++i) station("input key 116 press event" + std::to_string(i));
    for (int quiet = 0; quiet < 5;) quiet = ev_wait(200) == 0 ? (ev_dispatch(), 0) : quiet + 1;
    EXPECT_EQ(g_fds.size(), 16u);
    ev_exit();
}

using Setup = std::function<void(const Sandbox &)>;
Setup reply(const std::string &message, const std::string &text) { return [=](const Sandbox &b) { b.reply(message, text); }; }
Setup gone(const char *path) { return [=](const Sandbox &b) { fs::remove(b.path(path)); }; }
Setup both(Setup a, Setup b) { return [=](const Sandbox &s) { a(s), b(s); }; }
const Setup kAtMode = [](const Sandbox &) { is_sp = 1; };
const Setup kForceCali = [](const Sandbox &b) { b.write("/system/app/ForceCaliTest/ForceCaliTest.apk", ""); };
// A pressure-key project: the right key's calibration first copies the battery temperature.
const Setup kPressure = [](const Sandbox &b) {
    b.write("/.sim/config", "project=RX6105\n" + b.read("/.sim/config"));
    b.write(kBatteryTemp, "315\n");
    b.write(kCsTemp, "0");
};

struct Case {
    const char *tag;
    std::string line;
    Setup setup;
    std::string body;
    const char *word;
    std::vector<std::string> events = {};  // recorded in this order
    const char *absent = nullptr;          // never recorded
    std::vector<std::pair<const char *, const char *>> nodes = {};  // node, text
};
void PrintTo(const Case &c, std::ostream *os) { *os << c.line.substr(0, 40) << " " << c.tag; }
class KeyLine : public Keys, public ::testing::WithParamInterface<Case> {};

TEST_P(KeyLine, Answers) {
    const Case &c = GetParam();
    if (c.setup) c.setup(box);
    box.write("/.sim/events.log", "");
    expect_answer(c.line, c.body, c.word);
    // The side-key controller's wake command reaches the model on its own thread.
    if (c.line == "AT+QX_KEY_CHK=0" && std::string(c.word) == "ATOK") {
        EXPECT_TRUE(wait_until([&] { return box.events().find("sidekey write 0a\n") != std::string::npos; }));
    }
    const std::string log = box.events();
    expect_in_order(log, c.events);
    if (c.absent) {
        EXPECT_EQ(log.find(c.absent), std::string::npos) << log;
    }
    for (auto [node, text] : c.nodes) EXPECT_EQ(box.read(node), text) << node;
}

const std::string kLcm = "activity com.pyxa.engineermode/.ATLcmTest android.factorytest.ATLCM ";
const std::vector<std::string> kVersionReads = {"sidekey read reg=10", "sidekey read reg=04", "sidekey read reg=4e"};
const auto by_tag = named_by([](const Case &c) { return c.line.substr(0, 24) + "," + c.tag; });

// clang-format off
// The key test's read-back without captured keys, and the virtual keys.
INSTANTIATE_TEST_SUITE_P(KeyTest, KeyLine, ::testing::Values(
    Case{"AppKeys", "AT+QXKEY=0", reply("key_test 0", "+-P"), "\r\n\"+-P\"\r\n", "OK"},
    Case{"AppEmpty", "AT+QXKEY=0", reply("key_test 0", ""), "", "ERROR"},
    Case{"AppSilent", "AT+QXKEY=0", [](const Sandbox &b) { b.fault("testapp-silent"); }, "", "ERROR"},
    Case{"AppRefuses", "AT+QXKEY=1", reply("key_test 1", "busy"), "", "ERROR"},
    Case{"Unknown", "AT+QXKEY=2", nullptr, "", "ERROR"},
    Case{"Capacitance", "AT+QXVIRKEY=1", nullptr, "\r\n\"120,131,118\n\"\r\n", "OK", {}, "activity"},
    Case{"OneLineNoBody", "AT+QXVIRKEY=1", [](const Sandbox &b) { b.write(kCapacitance, "menu,home,back\n"); }, "", "OK"},
    Case{"CapacitanceMissing", "AT+QXVIRKEY=1", gone(kCapacitance), "", "ERROR"},
    Case{"LightOn", "AT+QXVIRKEY=2", nullptr, "", "OK", {kLcm + "-e lcm_color 0\n"}, nullptr, {{kBacklight, "255"}}},
    Case{"LightOnAtMode", "AT+QXVIRKEY=2", kAtMode, "", "OK", {}, "activity", {{kBacklight, "255"}}},
    Case{"LightOff", "AT+QXVIRKEY=0", nullptr, "", "OK", {kLcm + "\n"}, nullptr, {{kBacklight, "0"}}},
    Case{"LightNodeMissing", "AT+QXVIRKEY=0", gone(kBacklight), "", "ERROR", {}, "activity"},
    Case{"Unknown", "AT+QXVIRKEY=3", nullptr, "", "ERROR", {}, "activity"}), by_tag);

// Side keys: the test app's reply decides, by the rule of each form.
INSTANTIATE_TEST_SUITE_P(SideKeys, KeyLine, ::testing::Values(
    Case{"CalLeftCaseKept", "AT+QX_KEY_CAL=0,2A", nullptr, "", "ATOK", {"message sidekey:cali_left_start2A ->"}},
    Case{"Refused", "AT+QX_KEY_CAL=0,25", reply("sidekey:cali_left_start25", "busy"), "\"busy\"", "ATNG"},
    Case{"NoArgument", "AT+QX_KEY_CAL=0", nullptr, "\"Param error\"", "ATNG", {}, "message"},
    Case{"CalRight", "AT+QX_KEY_CAL=1,7", nullptr, "", "ATOK", {"message sidekey:cali_right_start7 ->"}},
    Case{"TestLeft", "AT+QX_KEY_TEST=0,3", nullptr, "", "ATOK", {"message sidekey:test_left_start3 ->"}},
    Case{"LongArgumentCut", "AT+QX_KEY_TEST=1," + std::string(200, '9'), nullptr, "", "ATOK",
         {"message sidekey:test_right_start" + std::string(95, '9') + " ->"}},
    Case{"Stop", "AT+QX_KEY_CAL=2", nullptr, "", "ATOK", {"message sidekey:stop_app ->"}},
    Case{"StopRefused", "AT+QX_KEY_TEST=2", reply("sidekey:stop_app", "no"), "\"no\"", "ATNG", {"message sidekey:stop_app ->"}},
    Case{"TwoPasses", "AT+QX_KEY_QUEY=0", reply("sidekey:cali_left_check", "2"), "\"2\"", "ATOK"},
    Case{"ThreeFails", "AT+QX_KEY_QUEY=3", reply("sidekey:test_right_check", "3"), "\"3\"", "ATNG"},
    Case{"OnePasses", "AT+QX_KEY_READ=1", reply("sidekey:cali_right_read", "1,455"), "\"1,455\"", "ATOK"},
    Case{"TwoFails", "AT+QX_KEY_READ=2", reply("sidekey:test_left_read", "2"), "\"2\"", "ATNG"},
    Case{"ZeroFails", "AT+QX_KEY_CHK=1", reply("sidekey:check_self", "0"), "\"0\"", "ATNG"},
    Case{"Passes", "AT+QX_KEY_CHK=1", reply("sidekey:check_self", "1"), "\"1\"", "ATOK"},
    Case{"Background", "AT+QX_KEY_CHK=2", nullptr, "\"ok\"", "ATOK", {"message sidekey:check_self_backgroud ->"}},
    Case{"BackgroundRefused", "AT+QX_KEY_CHK=2", reply("sidekey:check_self_backgroud", "err"), "\"err\"", "ATNG"},
    Case{"Result", "AT+QX_KEY_CHK=3", reply("sidekey:check_self_result", "1"), "\"1\"", "ATOK"},
    Case{"ResultZero", "AT+QX_KEY_CHK=3", reply("sidekey:check_self_result", "0x"), "\"0x\"", "ATNG"},
    Case{"NoApp", "AT+QX_KEY_CHK=4", nullptr, "", "ATERROR", {}, "message"},
    Case{"App", "AT+QX_KEY_CHK=4", kForceCali, "\"0\"", "ATOK"},
    Case{"RawDataNoApp", "AT+QXPKEY_CALI=1", nullptr, "", "ATERROR", {}, "message"},
    Case{"RawData", "AT+QXPKEY_CALI=1", both(kForceCali, reply("sidekey:write_raw_data", "0")), "\"support:0\"", "ATOK"},
    Case{"RawDataFails", "AT+QXPKEY_CALI=1", both(kForceCali, reply("sidekey:write_raw_data", "1")), "\"support:1\"", "ATNG"},
    Case{"TrailingTextIsNotAForm", "AT+QX_KEY_CHK=0x", nullptr, "", "ATERROR", {}, "message"},
    Case{"Temperature", "AT+QX_KEY_CAL=1,9", kPressure, "", "ATOK", {}, nullptr, {{kCsTemp, "315\n"}}},
    Case{"NoPressureNode", "AT+QX_KEY_CAL=1,9", both(kPressure, gone(kCsTemp)), "write cs_press temp not exsit !", "ATNG"},
    Case{"NoBatteryTemp", "AT+QX_KEY_CAL=1,9", both(kPressure, gone(kBatteryTemp)),
         "\r\n\"read battery temp failed\"\r\n", "ATNG", {}, nullptr, {{kCsTemp, "0"}}},
    Case{"Unsupported", "AT+QX_KEY_VBR=1", nullptr, "\r\n\"This device does not support !\"\r\n", "ATERROR", {}, "shell"}),
    by_tag);

// The side-key controller's version: 0x0A wakes it, register 0x10 gives four bytes.
INSTANTIATE_TEST_SUITE_P(SideKeyVersion, KeyLine, ::testing::Values(
    Case{"HighNibblesIgnored", "AT+QX_KEY_CHK=0", [](const Sandbox &b) { b.write("/.sim/sidekey", "version=f1 e2 d3 ff\n"); },
         "\"74751\"", "ATOK", kVersionReads},
    Case{"WrongCount", "AT+QX_KEY_CHK=0",
         [](const Sandbox &b) { b.write("/.sim/sidekey", "version=01 02 03 2d\nversion_count=4\n"); }, "\"-1\"", "ATNG"},
    Case{"NoDevice", "AT+QX_KEY_CHK=0", gone("/dev/ndt"), "\"-1\"", "ATNG"}), by_tag);
// clang-format on

// Each pressure key in turn must fire the vibrator's trigger.
TEST_F(Keys, PressureKeysAgainstTheVibratorTrigger) {
    for (const char *node : {"/sys/cs_press/cs_press/factory_mode", "/sys/cs_press/cs_press/cmd", kTrigger})
        box.write(node, "0\n");
    box.write("/.sim/events.log", "");
    expect_answer("AT+QX_KEY_VBR=1", "\r\n\"Volume up Key,Volume Down key,Power Key check OK !\"\r\n", "ATOK");
    std::vector<std::string> seq;
    for (const char *cmd : {"82", "81", "80"})
        seq.insert(seq.end(), {"echo 1 > " + std::string(kTrigger), "echo 1 > /sys/cs_press/cs_press/factory_mode",
                               "echo " + std::string(cmd) + " > /sys/cs_press/cs_press/cmd",
                               "echo 0 > /sys/cs_press/cs_press/factory_mode", "cat " + std::string(kTrigger)});
    expect_in_order(box.events(), seq);
    // The trigger never fires for the power key.
    box.write("/.sim/shell.replies", "cat " + std::string(kTrigger) + " => 0\n");
    box.sequence("shell:cat " + std::string(kTrigger), {"1", "0"});
    expect_answer("AT+QX_KEY_VBR=1", "\r\n\"Power Key Test Failed\"\r\n", "ATNG");
}

}  // namespace
