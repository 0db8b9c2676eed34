// Key tests: keys pressed on the simulated phone's input devices reach the capture file as
// letters; the virtual keys and the side keys answer byte for byte.
#include <atomic>
#include <chrono>
#include <array>
#include <filesystem>
#include <set>
#include <thread>

#include "core/input_events.h"
#include "platform/sim/chardev.h"
#include "tests/support/checks.h"
#include "tests/support/daemon.h"
#include "tests/support/in_process.h"

namespace {


class Keys : public InProcess {
protected:
    void SetUp() override {
        InProcess::SetUp();
        is_sp = 0;
    }
    void TearDown() override {
        exit_input_threads();
        set_volume_up_hook(nullptr);
        InProcess::TearDown();
    }
    std::string answer_of(const std::string &line, const std::string &body, const std::string &word) {
        const std::string want = frame(line, body, word);
        return serve(line, SRC_TCP, want.size());
    }
    void station(const std::string &line) { ASSERT_TRUE(sim::station_send(box.root, line)) << line; }
    // Waits (bounded) until the capture file holds text.
    bool captured(const std::string &text, int ms = 3000) {
        for (int waited = 0; waited < ms; waited += 20) {
            if (box.read(kKeyCaptureFile) == text) return true;
            std::this_thread::sleep_for(std::chrono::milliseconds(20));
        }
        return false;
    }
};

TEST_F(Keys, ReleasedKeysAreCapturedAsLettersAndProperties) {
    box.reply("key_test 1", "ok");
    EXPECT_EQ(answer_of("AT+QXKEY=1", "", "OK"), frame("AT+QXKEY=1", "", "OK"));
    station("input key 114 press");  // a press alone records nothing
    station("input key 114 release");
    station("input key 116 click");
    station("input key 999 click");  // unknown keys are only logged
    station("input key 311 click");  // sets a property, saves no letter
    station("input key 752 click");
    ASSERT_TRUE(captured("-PU")) << box.read(kKeyCaptureFile);
    EXPECT_EQ(box.prop("sys.key.volumedown"), "1");
    EXPECT_EQ(box.prop("sys.key.power"), "1");
    EXPECT_EQ(box.prop("sys.key.left"), "1");
    EXPECT_EQ(box.prop("sys.key.volumeup"), "");
    EXPECT_EQ(answer_of("AT+QXKEY=0", "\r\n\"-PU\"\r\n", "OK"), frame("AT+QXKEY=0", "\r\n\"-PU\"\r\n", "OK"));
    EXPECT_NE(box.events().find("shell /system/bin/sh -c \"chmod 0666 /data/engineermode/keycodeTest\""), std::string::npos);
    // Stopped: a key pressed now is not captured.
    station("input key 116 click");
    std::this_thread::sleep_for(std::chrono::milliseconds(300));
    EXPECT_EQ(box.read(kKeyCaptureFile), "-PU");
}

// Every key of the table, released once, in table order.
TEST_F(Keys, EveryTableKeySavesItsLetter) {
    ASSERT_EQ(create_input_threads(), 0);
    const std::string letters = "H-+PMWRCTCA  AUD";
    std::string want;
    for (size_t i = 0; i < letters.size(); ++i) {
        int code = std::array{102, 114, 115, 116, 139, 143, 158, 164, 172, 226, 308, 311, 312, 600, 752, 753}[i];
        station("input key " + std::to_string(code) + " click");
        if (letters[i] != ' ') want += letters[i];
        ASSERT_TRUE(captured(want)) << code << ": " << box.read(kKeyCaptureFile);  // keys of several devices: one at a time
    }
    EXPECT_EQ(box.prop("sys.key.right"), "1");
}

TEST_F(Keys, SecondStartKeepsTheCapture) {
    ASSERT_EQ(create_input_threads(), 0);
    station("input key 102 click");
    ASSERT_TRUE(captured("H"));
    ASSERT_EQ(create_input_threads(), 0);  // only logs that it runs
    station("input key 139 click");
    EXPECT_TRUE(captured("HM")) << box.read(kKeyCaptureFile);
    exit_input_threads();
    ASSERT_EQ(create_input_threads(), 0);  // a fresh start deletes the capture
    EXPECT_FALSE(box.exists(kKeyCaptureFile));
}

TEST_F(Keys, NoKeysAsksTheTestApp) {
    box.reply("key_test 0", "+-P");
    EXPECT_EQ(answer_of("AT+QXKEY=0", "\r\n\"+-P\"\r\n", "OK"), frame("AT+QXKEY=0", "\r\n\"+-P\"\r\n", "OK"));
    box.reply("key_test 0", "");
    EXPECT_EQ(answer_of("AT+QXKEY=0", "", "ERROR"), frame("AT+QXKEY=0", "", "ERROR"));
    box.fault("testapp-silent");
    EXPECT_EQ(answer_of("AT+QXKEY=0", "", "ERROR"), frame("AT+QXKEY=0", "", "ERROR"));
    box.write("/.sim/faults", "");
    box.reply("key_test 1", "busy");
    EXPECT_EQ(answer_of("AT+QXKEY=1", "", "ERROR"), frame("AT+QXKEY=1", "", "ERROR"));
    EXPECT_EQ(answer_of("AT+QXKEY=2", "", "ERROR"), frame("AT+QXKEY=2", "", "ERROR"));
}

// Only devices that report keys are watched: the switches of a lid that also has a key.
TEST_F(Keys, SwitchesAndTouchAreTracked) {
    box.write("/dev/input/event5", "name=lid\nkey=143\nsw=0,1,20\n");
    ASSERT_EQ(create_input_threads(), 0);
    station("input sw 1 1 event5");
    station("input sw 0 1 event5");
    station("input sw 0 0 event5");
    station("input sw 20 1 event5");  // beyond the mask: logged as an error only
    station("input touch 120 340");
    station("input key 143 click event5");  // one device's events are handled in order
    ASSERT_TRUE(captured("W"));
    EXPECT_EQ(input_switch_mask(), 0x2u);
    int32_t x = 0, y = 0;
    for (int waited = 0; waited < 3000 && x != 120; waited += 20) {  // the touch screen is another device
        std::this_thread::sleep_for(std::chrono::milliseconds(20));
        input_touch_position(x, y);
    }
    EXPECT_EQ(x, 120);
    EXPECT_EQ(y, 340);
    exit_input_threads();
    ASSERT_EQ(create_input_threads(), 0);
    EXPECT_EQ(input_switch_mask(), 0u);  // cleared at every start
}

std::atomic<int> g_hook_calls{0};
void count_hook(int code) { g_hook_calls += code == KEY_VOLUMEUP ? 1 : 100; }

TEST_F(Keys, VolumeUpHookRunsOnceInsteadOfThePress) {
    g_hook_calls = 0;
    set_volume_up_hook(count_hook);
    ASSERT_EQ(create_input_threads(), 0);
    station("input key 115 press");    // the hook takes it
    station("input key 115 release");  // recorded as usual
    station("input key 115 click");
    ASSERT_TRUE(captured("++"));
    EXPECT_EQ(g_hook_calls, 1);
}

// The devices registered: key-capable ones only, at most sixteen.
std::set<int> g_fds;
int count_device(int fd, uint32_t events, void *) {
    struct input_event ev {};
    if (ev_get_input(fd, events, &ev) == 0) g_fds.insert(fd);
    return 0;
}

TEST_F(Keys, AtMostSixteenKeyDevicesAreWatched) {
    std::filesystem::remove_all(box.path("/dev/input"));
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

TEST_F(Keys, NoInputDirectoryFailsTheStart) {
    std::filesystem::remove_all(box.path("/dev/input"));
    EXPECT_EQ(create_input_threads(), -1);
    box.reply("key_test 1", "ok");
    EXPECT_EQ(answer_of("AT+QXKEY=1", "", "OK"), frame("AT+QXKEY=1", "", "OK"));  // the answer is the app's
}

struct VirtualCase {
    const char *name;
    std::string line;
    int at_mode;
    bool no_node;
    std::string body;
    const char *word;
    const char *brightness;  // expected node text; nullptr: untouched
    const char *activity;    // recorded activity, nullptr: none
};
class VirtualKeys : public Keys, public ::testing::WithParamInterface<VirtualCase> {};

TEST_P(VirtualKeys, Answer) {
    const VirtualCase &c = GetParam();
    is_sp = c.at_mode;
    const char *node = c.line == "AT+QXVIRKEY=1" ? "/sys/touchscreen/virtual_key/key_capacitance_test"
                                                 : "/sys/class/leds/button-backlight/brightness";
    if (c.no_node) std::filesystem::remove(box.path(node));
    box.write("/.sim/events.log", "");
    EXPECT_EQ(answer_of(c.line, c.body, c.word), frame(c.line, c.body, c.word));
    if (c.brightness) {
        EXPECT_EQ(box.read(node), c.brightness);
    }
    const std::string log = box.events();
    if (c.activity) {
        EXPECT_NE(log.find(c.activity), std::string::npos) << log;
    } else {
        EXPECT_EQ(log.find("activity"), std::string::npos) << log;
    }
}

INSTANTIATE_TEST_SUITE_P(Keys, VirtualKeys, ::testing::Values(
    VirtualCase{"Capacitance", "AT+QXVIRKEY=1", 0, false, "\r\n\"120,131,118\"\r\n", "OK", nullptr, nullptr},
    VirtualCase{"CapacitanceMissing", "AT+QXVIRKEY=1", 0, true, "", "ERROR", nullptr, nullptr},
    VirtualCase{"LightOn", "AT+QXVIRKEY=2", 0, false, "", "OK", "255",
                "activity com.pyxa.engineermode/.ATLcmTest android.factorytest.ATLCM -e lcm_color 0\n"},
    VirtualCase{"LightOnAtMode", "AT+QXVIRKEY=2", 1, false, "", "OK", "255", nullptr},
    VirtualCase{"LightOff", "AT+QXVIRKEY=0", 0, false, "", "OK", "0",
                "activity com.pyxa.engineermode/.ATLcmTest android.factorytest.ATLCM \n"},
    VirtualCase{"LightNodeMissing", "AT+QXVIRKEY=0", 0, true, "", "ERROR", nullptr, nullptr},
    VirtualCase{"Unknown", "AT+QXVIRKEY=3", 0, false, "", "ERROR", nullptr, nullptr}),
    [](const auto &i) { return std::string(i.param.name); });

TEST_F(Keys, CapacitanceWithOneLineHasNoBody) {
    box.write("/sys/touchscreen/virtual_key/key_capacitance_test", "menu,home,back\n");
    EXPECT_EQ(answer_of("AT+QXVIRKEY=1", "", "OK"), frame("AT+QXVIRKEY=1", "", "OK"));
}

// Side keys: the test app's reply decides, by the rule of each form.
struct SideCase {
    const char *name;
    std::string line;
    std::string reply;  // scripted for the message; "" leaves the default "ok"
    std::string message;
    std::string body;
    const char *word;
};
class SideKeys : public Keys, public ::testing::WithParamInterface<SideCase> {};

TEST_P(SideKeys, Answer) {
    const SideCase &c = GetParam();
    if (!c.reply.empty()) box.reply(c.message, c.reply);
    box.write("/.sim/events.log", "");
    EXPECT_EQ(answer_of(c.line, c.body, c.word), frame(c.line, c.body, c.word));
    const std::string log = box.events();
    if (c.message.empty()) {
        EXPECT_EQ(log.find("message"), std::string::npos) << log;
    } else {
        EXPECT_NE(log.find("message " + c.message + " ->"), std::string::npos) << log;
    }
}

INSTANTIATE_TEST_SUITE_P(Keys, SideKeys, ::testing::Values(
    SideCase{"CalLeft", "AT+QX_KEY_CAL=0,25", "", "sidekey:cali_left_start25", "", "ATOK"},
    SideCase{"CalLeftRefused", "AT+QX_KEY_CAL=0,25", "busy", "sidekey:cali_left_start25", "\"busy\"", "ATNG"},
    SideCase{"CalLeftNoArgument", "AT+QX_KEY_CAL=0", "", "", "\"Param error\"", "ATNG"},
    SideCase{"CalRight", "AT+QX_KEY_CAL=1,7", "", "sidekey:cali_right_start7", "", "ATOK"},
    SideCase{"TestLeft", "AT+QX_KEY_TEST=0,3", "", "sidekey:test_left_start3", "", "ATOK"},
    SideCase{"TestRightLongArgumentCut", "AT+QX_KEY_TEST=1," + std::string(200, '9'), "",
             "sidekey:test_right_start" + std::string(95, '9'), "", "ATOK"},
    SideCase{"Stop", "AT+QX_KEY_CAL=2", "", "sidekey:stop_app", "", "ATOK"},
    SideCase{"StopRefused", "AT+QX_KEY_TEST=2", "no", "sidekey:stop_app", "\"no\"", "ATNG"},
    SideCase{"QueryTwoPasses", "AT+QX_KEY_QUEY=0", "2", "sidekey:cali_left_check", "\"2\"", "ATOK"},
    SideCase{"QueryThreeFails", "AT+QX_KEY_QUEY=3", "3", "sidekey:test_right_check", "\"3\"", "ATNG"},
    SideCase{"ReadOne", "AT+QX_KEY_READ=1", "1,455", "sidekey:cali_right_read", "\"1,455\"", "ATOK"},
    SideCase{"ReadTwoFails", "AT+QX_KEY_READ=2", "2", "sidekey:test_left_read", "\"2\"", "ATNG"},
    SideCase{"SelfCheckZeroFails", "AT+QX_KEY_CHK=1", "0", "sidekey:check_self", "\"0\"", "ATNG"},
    SideCase{"SelfCheckPasses", "AT+QX_KEY_CHK=1", "1", "sidekey:check_self", "\"1\"", "ATOK"},
    SideCase{"Background", "AT+QX_KEY_CHK=2", "", "sidekey:check_self_backgroud", "\"ok\"", "ATOK"},
    SideCase{"BackgroundRefused", "AT+QX_KEY_CHK=2", "err", "sidekey:check_self_backgroud", "\"err\"", "ATNG"},
    SideCase{"Result", "AT+QX_KEY_CHK=3", "1", "sidekey:check_self_result", "\"1\"", "ATOK"},
    SideCase{"ResultZero", "AT+QX_KEY_CHK=3", "0x", "sidekey:check_self_result", "\"0x\"", "ATNG"},
    SideCase{"NoApp", "AT+QX_KEY_CHK=4", "", "", "", "ATERROR"},
    SideCase{"RawDataNoApp", "AT+QXPKEY_CALI=1", "", "", "", "ATERROR"},
    SideCase{"TrailingTextIsNotAForm", "AT+QX_KEY_CHK=0x", "", "", "", "ATERROR"},
    SideCase{"CaseMatters", "AT+QX_KEY_CAL=0,A", "", "sidekey:cali_left_startA", "", "ATOK"}),
    [](const auto &i) { return std::string(i.param.name); });

TEST_F(Keys, ForceCaliAppForms) {
    box.write("/system/app/ForceCaliTest/ForceCaliTest.apk", "");
    EXPECT_EQ(answer_of("AT+QX_KEY_CHK=4", "\"0\"", "ATOK"), frame("AT+QX_KEY_CHK=4", "\"0\"", "ATOK"));
    box.reply("sidekey:write_raw_data", "0");
    EXPECT_EQ(answer_of("AT+QXPKEY_CALI=1", "\"support:0\"", "ATOK"), frame("AT+QXPKEY_CALI=1", "\"support:0\"", "ATOK"));
    box.reply("sidekey:write_raw_data", "1");
    EXPECT_EQ(answer_of("AT+QXPKEY_CALI=1", "\"support:1\"", "ATNG"), frame("AT+QXPKEY_CALI=1", "\"support:1\"", "ATNG"));
}

TEST_F(Keys, RightCalibrationPassesTheBatteryTemperatureOnPressureKeyProjects) {
    box.write("/.sim/config", "project=RX6105\n" + box.read("/.sim/config"));
    box.write("/sys/class/power_supply/battery/temp", "315\n");
    box.write("/sys/cs_press/cs_press/temperature", "0");
    EXPECT_EQ(answer_of("AT+QX_KEY_CAL=1,9", "", "ATOK"), frame("AT+QX_KEY_CAL=1,9", "", "ATOK"));
    EXPECT_EQ(box.read("/sys/cs_press/cs_press/temperature"), "315\n");
    std::filesystem::remove(box.path("/sys/cs_press/cs_press/temperature"));
    EXPECT_EQ(answer_of("AT+QX_KEY_CAL=1,9", "write cs_press temp not exsit !", "ATNG"),
              frame("AT+QX_KEY_CAL=1,9", "write cs_press temp not exsit !", "ATNG"));
    std::filesystem::remove(box.path("/sys/class/power_supply/battery/temp"));
    EXPECT_EQ(answer_of("AT+QX_KEY_CAL=1,9", "\r\n\"read battery temp failed\"\r\n", "ATNG"),
              frame("AT+QX_KEY_CAL=1,9", "\r\n\"read battery temp failed\"\r\n", "ATNG"));
}

TEST_F(Keys, PressureKeysAgainstTheVibratorTrigger) {
    const std::string unsupported = "\r\n\"This device does not support !\"\r\n";
    EXPECT_EQ(answer_of("AT+QX_KEY_VBR=1", unsupported, "ATERROR"), frame("AT+QX_KEY_VBR=1", unsupported, "ATERROR"));
    for (const char *node : {"/sys/cs_press/cs_press/factory_mode", "/sys/cs_press/cs_press/cmd",
                             "/sys/class/leds/vibrator/at_trigger_state"})
        box.write(node, "0\n");
    box.write("/.sim/events.log", "");
    const std::string ok = "\r\n\"Volume up Key,Volume Down key,Power Key check OK !\"\r\n";
    EXPECT_EQ(answer_of("AT+QX_KEY_VBR=1", ok, "ATOK"), frame("AT+QX_KEY_VBR=1", ok, "ATOK"));
    const std::string log = box.events();
    size_t at = 0;
    for (const char *cmd : {"82", "81", "80"}) {
        for (std::string text : {std::string("echo 1 > /sys/class/leds/vibrator/at_trigger_state"),
                                 std::string("echo 1 > /sys/cs_press/cs_press/factory_mode"),
                                 "echo " + std::string(cmd) + " > /sys/cs_press/cs_press/cmd",
                                 std::string("echo 0 > /sys/cs_press/cs_press/factory_mode"),
                                 std::string("cat /sys/class/leds/vibrator/at_trigger_state")}) {
            at = log.find(text, at);
            ASSERT_NE(at, std::string::npos) << text << "\n" << log;
        }
    }
    // The trigger never fires for the power key.
    box.write("/.sim/shell.replies", "cat /sys/class/leds/vibrator/at_trigger_state => 0\n");
    box.sequence("shell:cat /sys/class/leds/vibrator/at_trigger_state", {"1", "0"});
    const std::string power = "\r\n\"Power Key Test Failed\"\r\n";
    EXPECT_EQ(answer_of("AT+QX_KEY_VBR=1", power, "ATNG"), frame("AT+QX_KEY_VBR=1", power, "ATNG"));
}

}  // namespace

namespace {

// The side-key controller's version: 0x0A wakes it, register 0x10 gives four bytes.
struct VersionCase {
    const char *name;
    std::string script;  // .sim/sidekey
    const char *fault;
    bool no_device;
    std::string body;
    const char *word;
};
class SideKeyVersion : public Keys, public ::testing::WithParamInterface<VersionCase> {};

TEST_P(SideKeyVersion, Answer) {
    const VersionCase &c = GetParam();
    box.write("/.sim/sidekey", c.script);
    if (c.fault) box.fault(c.fault);
    if (c.no_device) std::filesystem::remove(box.path("/dev/ndt"));
    box.write("/.sim/events.log", "");
    EXPECT_EQ(answer_of("AT+QX_KEY_CHK=0", c.body, c.word), frame("AT+QX_KEY_CHK=0", c.body, c.word));
    if (std::string(c.word) == "ATOK") {
        const std::string log = box.events();
        size_t at = 0;
        // The wake command reaches the model on its own thread: only the reads are in order.
        for (int waited = 0; waited < 2000 && box.events().find("sidekey write 0a\n") == std::string::npos; waited += 20)
            std::this_thread::sleep_for(std::chrono::milliseconds(20));
        EXPECT_NE(box.events().find("sidekey write 0a\n"), std::string::npos);
        for (const char *t : {"sidekey read reg=10", "sidekey read reg=04", "sidekey read reg=4e"}) {
            at = log.find(t, at);
            ASSERT_NE(at, std::string::npos) << t << "\n" << log;
        }
    }
}

INSTANTIATE_TEST_SUITE_P(Keys, SideKeyVersion, ::testing::Values(
    VersionCase{"Default", "version=01 02 03 2d\n", nullptr, false, "\"74541\"", "ATOK"},
    VersionCase{"HighNibblesIgnored", "version=f1 e2 d3 ff\n", nullptr, false, "\"74751\"", "ATOK"},
    VersionCase{"WrongCount", "version=01 02 03 2d\nversion_count=4\n", nullptr, false, "\"-1\"", "ATNG"},
    VersionCase{"ReadFails", "", "sidekey", false, "\"-1\"", "ATNG"},
    VersionCase{"NoDevice", "", nullptr, true, "\"-1\"", "ATNG"}),
    [](const auto &i) { return std::string(i.param.name); });

}  // namespace

// A station presses keys on a running phone and reads them back over TCP.
TEST(KeysDaemon, KeysPressedOnTheRunningPhoneAreAnswered) {
    Sandbox box;
    Daemon d(box);
    int s = d.connect_tcp();
    ASSERT_GE(s, 0);
    auto exchange = [&](const std::string &line, const std::string &want) {
        send(s, line.data(), line.size(), MSG_NOSIGNAL);
        return read_some(s, want.size());
    };
    const std::string started = frame("AT+QXKEY=1", "", "OK");
    ASSERT_EQ(exchange("AT+QXKEY=1", started), started);
    std::string want;
    for (auto [code, letter] : {std::pair{114, '-'}, {116, 'P'}, {115, '+'}}) {
        // The daemon opened the devices before it answered: the station's FIFO is there.
        ASSERT_TRUE(sim::station_send(box.root, "input key " + std::to_string(code) + " click")) << strerror(errno);
        want += letter;
        for (int waited = 0; waited < 3000 && box.read(kKeyCaptureFile) != want; waited += 20)
            std::this_thread::sleep_for(std::chrono::milliseconds(20));
    }
    const std::string keys = frame("AT+QXKEY=0", "\r\n\"-P+\"\r\n", "OK");
    EXPECT_EQ(exchange("AT+QXKEY=0", keys), keys);
    close(s);
}
