// Display, touch and backlight commands: exact frames, the NV record, properties, panel
// nodes and the test-app messages and activities, on phones with one panel and with two.
#include <cstring>
#include <filesystem>

#include "core/command_tables/handlers.h"
#include "core/nv.h"
#include "platform/device.h"
#include "platform/sim/sim.h"
#include "tests/support/checks.h"
#include "tests/support/in_process.h"
#include "tests/support/test_name.h"

namespace {

using Pairs = std::vector<std::pair<std::string, std::string>>;
using Fields = std::vector<std::pair<size_t, uint32_t>>;

const std::string kLcm = "activity com.pyxa.engineermode/.ATLcmTest android.factorytest.ATLCM ";
const std::string kChoose = "activity com.pyxa.engineermode/.verifytest.lcm.LcmChooseTest  ";
const std::string kFloating = "service-start com.pyxa.engineermode/.FloatingService  \n";
const std::string kLost = "0x00 0x00 0x00\n";
const std::string kWake = "wakelock acquire 1 ftcmd\n";
const std::string kLongArg(60, '7');
const char *kMainCali = "/sys/lcm/mainpanel_calidata", *kSubCali = "/sys/lcm/subpanel_calidata";
const char *kBadScreen = "bad_screen:null:null:null:null:null";

std::string msg(const std::string &text, const std::string &reply = "ok") { return "message " + text + " -> " + reply + "\n"; }
std::string q(const std::string &text) { return "\r\n\"" + text + "\"\r\n"; }  // a quoted body line

// Every byte non-zero, so a stray write shows; fields given are set over the pattern.
std::string nv_record(const Fields &fields) {
    std::string rec = nv_fill(0x11, 199);
    for (auto [off, value] : fields) memcpy(rec.data() + off, &value, sizeof value);
    return rec;
}

struct Case {
    std::string line;
    std::string tag = "";
    int sp = 0;
    bool back = false;  // the phone has a back panel
    const char *fault = nullptr;
    Pairs replies = {};  // test-app script lines of this case
    Pairs files = {};    // node texts before the line
    std::vector<std::string> remove = {};
    Pairs config = {};  // simulated hardware settings
    Fields nv = {};     // NV fields before the line
    std::string body = "";
    std::string word = "OK";
    std::string events = "";  // the whole record of device effects, in order
    std::string panel = "";   // what the panel model records, taken apart (it runs on its own thread)
    Fields nv_after = {};     // NV fields the line changes
    Pairs nodes = {};         // node texts after the line
};

void PrintTo(const Case &c, std::ostream *os) { *os << c.line << (c.tag.empty() ? "" : " (" + c.tag + ")"); }

std::string case_name(const ::testing::TestParamInfo<Case> &info) {
    return test_name(info.param.line) + (info.param.tag.empty() ? "" : "_" + info.param.tag);
}

class DisplayTest : public InProcess {
protected:
    int saved_sp = is_sp;
    void TearDown() override {
        is_sp = saved_sp;
        InProcess::TearDown();
    }
    // The record of device effects without the panel model's line, once that has come
    // (bounded): the model takes a write on its own thread, so its line has no fixed place.
    std::string without_panel(const std::string &detail) const {
        if (detail.empty()) return box.events();
        const std::string line = "panel " + detail + "\n";
        wait_until([&] { return box.events().find(line) != std::string::npos; }, 2000);
        std::string log = box.events();
        size_t at = log.find(line);
        EXPECT_NE(at, std::string::npos) << log;
        return at == std::string::npos ? log : log.erase(at, line.size());
    }
    void two_panels() const {
        std::string items = "\"double_lcm_support\"";
        sim::write_kv(box.path("/.sim/config"), "calibrate_items", &items);
    }
};
class DisplayLine : public DisplayTest, public ::testing::WithParamInterface<Case> {};

TEST_P(DisplayLine, Answers) {
    const Case &c = GetParam();
    is_sp = c.sp;
    if (c.back) two_panels();
    box.write("/.sim/nv.bin", nv_record(c.nv));
    for (const auto &[path, text] : c.files) box.write(path, text);
    for (const auto &path : c.remove) std::filesystem::remove_all(box.path(path));
    for (const auto &[key, value] : c.config) sim::write_kv(box.path("/.sim/config"), key, &value);
    if (c.fault) box.fault(c.fault);
    for (const auto &[message, reply] : c.replies) box.reply(message, reply);

    const std::string want = frame(c.line, c.body, c.word);
    EXPECT_EQ(serve(c.line, SRC_TCP, want.size()), want);
    EXPECT_EQ(answer(1, 0), "");
    EXPECT_EQ(without_panel(c.panel), c.events);
    Fields after = c.nv;
    after.insert(after.end(), c.nv_after.begin(), c.nv_after.end());
    EXPECT_EQ(box.read("/.sim/nv.bin"), nv_record(after));
    for (const auto &[path, text] : c.nodes) EXPECT_EQ(box.read(path), text) << path;
}

const std::string kShowW = kLcm + "-e lcm_color W\n", kNotMain = q("main lcm not calibrate");
const std::string kRegs = "/sys/class/leds/lm3697-backlight/registers", kBright = "/sys/lcm/lcm_brightness";
const char *kAcl = "/sys/lcm/oled_acl", *kInfo = "/cache/recovery/last_test_info";

// clang-format off
// Colours and panel choice; a lost calibration restored from NV only for colours in [0xD7D7D8, 0xFFFFFF).
INSTANTIATE_TEST_SUITE_P(Colours, DisplayLine, ::testing::Values(
    Case{.line = "AT+LCMT=1,R,G", .events = kLcm + "-e lcm_color R\n"},
    Case{.line = "AT+LCMT=1,,R", .tag = "EmptyFieldSkipped", .events = kLcm + "-e lcm_color R\n"},
    Case{.line = "AT+LCMT=1," + kLongArg + kLongArg, .tag = "Long", .events = kLcm + "-e lcm_color " + (kLongArg + kLongArg).substr(0, 86) + "\n"},
    Case{.line = "AT+LCMT=1", .word = "ERROR"},
    Case{.line = "AT+LCMT=1,W", .tag = "Calibrated", .back = true, .events = kShowW,
         .nodes = {{kMainCali, "0xD7 0xD7 0xD8\n"}}},
    Case{.line = "AT+LCMT=1,W", .tag = "LowestColourRestored", .back = true, .files = {{kMainCali, kLost}},
         .nv = {{nv::kMainPanelColour, 0xD7D7D8}}, .events = "setprop ro.sys.mainlcm.cali=14145496\n" + kShowW,
         .panel = "main calibrate 1490540504", .nodes = {{kMainCali, "0xD7 0xD7 0xD8\n"}}},
    Case{.line = "AT+LCMT=1,W", .tag = "HighestColourRestored", .back = true, .files = {{kMainCali, kLost}},
         .nv = {{nv::kMainPanelColour, 0xFFFFFE}}, .events = "setprop ro.sys.mainlcm.cali=16777214\n" + kShowW,
         .panel = "main calibrate 1493172222", .nodes = {{kMainCali, "0xFF 0xFF 0xFE\n"}}},
    Case{.line = "AT+LCMT=1,W", .tag = "WhiteRefused", .back = true, .files = {{kMainCali, kLost}},
         .nv = {{nv::kMainPanelColour, 0xFFFFFF}}, .body = kNotMain, .word = "ATNG", .nodes = {{kMainCali, kLost}}},
    Case{.line = "AT+LCMT=1,W", .tag = "TooDarkRefused", .back = true, .files = {{kMainCali, kLost}},
         .nv = {{nv::kMainPanelColour, 0xD7D7D7}}, .body = kNotMain, .word = "ATNG"},
    Case{.line = "AT+LCMT=1,W", .tag = "NvReadFails", .back = true, .fault = "nv-read", .files = {{kMainCali, kLost}},
         .nv = {{nv::kMainPanelColour, 0xD7D7D8}}, .body = kNotMain, .word = "ATNG"},
    Case{.line = "AT+LCMT=1,W", .tag = "NodeMissing", .back = true, .remove = {kMainCali},
         .body = q("get main lcm calibrate state failed"), .word = "ATNG"},
    Case{.line = "AT+LCMT_BACK=1,B", .tag = "Restored", .back = true, .files = {{kSubCali, kLost}},
         .nv = {{nv::kMainPanelColour, 0xD7D7D8}, {nv::kBackPanelColour, 0xE0E0E0}},
         .events = "setprop ro.sys.sublcm.cali=14737632\n" + kLcm + "-e lcm_color B --ei display_id 4096\n",
         .panel = "sub calibrate 1491132640", .nodes = {{kSubCali, "0xE0 0xE0 0xE0\n"}, {kMainCali, "0xD7 0xD7 0xD8\n"}}},
    Case{.line = "AT+LCMT_BACK=1,B", .tag = "NotRestorable", .back = true, .files = {{kSubCali, kLost}},
         .nv = {{nv::kMainPanelColour, 0xD7D7D8}}, .body = q("sub lcm not calibrate"), .word = "ATNG"},
    Case{.line = "AT+LCMT_BACK=1,B", .tag = "NodeMissing", .back = true, .remove = {kSubCali},
         .body = q("get sub lcm calibrate state failed"), .word = "ATNG"},
    Case{.line = "AT+LCMT_BACK=1,B", .tag = "OnePanel", .files = {{kSubCali, kLost}}, .nodes = {{kSubCali, kLost}}},
    Case{.line = "AT+LCMT=0", .events = kLcm + "\n"},
    Case{.line = "AT+LCMT_BACK=0", .back = true, .events = kLcm + "\n"},
    Case{.line = "AT+LCMT=2,1", .events = "setprop persist.sys.em.lcm_choose=1\n" + kFloating + kChoose + "-e enter 1\n"},
    Case{.line = "AT+LCMT=2,0", .events = "setprop persist.sys.em.lcm_choose=0\n" + kFloating + kChoose + "-e exit 1\n"},
    Case{.line = "AT+LCMT_BACK=2,1", .back = true,
         .events = "setprop persist.sys.em.lcm_choose=1\n" + kFloating + kChoose + "-e enter 1 --ei display_id 4096\n"},
    // The backlight driver's registers, and the panel's brightness and VDDI flags.
    Case{.line = "AT+QX_LCM_IC=0", .word = "ATOK"},
    Case{.line = "AT+QX_LCM_IC=0", .tag = "WrongDriver", .files = {{kRegs, "BRT: 1\n"}},
         .body = "BRT: 1\n", .word = "ATNG"},
    Case{.line = "AT+QX_LCM_IC=0", .tag = "Empty", .files = {{kRegs, ""}}, .word = "ATNG"},
    Case{.line = "AT+QX_LCM_IC=0", .tag = "Missing", .remove = {"/sys/class/leds/lm3697-backlight"}, .word = "ATNG"},
    Case{.line = "AT+QX_LCM_IC=2", .body = q("a"), .word = "ATOK"},
    Case{.line = "AT+QX_LCM_IC=2", .tag = "Set", .files = {{kBright, "01"}}, .body = q("b"), .word = "ATOK"},
    Case{.line = "AT+QX_LCM_IC=2", .tag = "LineEnd", .files = {{kBright, "01\n"}}, .body = q("a"), .word = "ATOK"},
    Case{.line = "AT+QX_LCM_IC=3", .body = q("1"), .word = "ATOK"},
    Case{.line = "AT+QX_LCM_IC=3", .tag = "Missing", .remove = {"/sys/lcm/lcm_vddi_high"}, .body = q("0"),
         .word = "ATOK"},
    Case{.line = "AT+LCMT=3", .word = "ERROR"}), case_name);

// Keeping the screen awake: wake lock, the OLED ACL node, test-app messages, the item file in AT mode.
INSTANTIATE_TEST_SUITE_P(KeepAwake, DisplayLine, ::testing::Values(
    Case{.line = "AT+QXSP=0", .events = kWake + msg("keep_screen_on 1,display_id:0"), .nodes = {{kAcl, "0"}}},
    Case{.line = "AT+QXSP=0", .tag = "Refused", .fault = "testapp-refuse", .word = "ERROR",
         .events = kWake + msg("keep_screen_on 1,display_id:0", "error")},
    Case{.line = "AT+QXSP=1", .events = "wakelock release ftcmd\n" + msg("keep_screen_on 0,display_id:0")},
    Case{.line = "AT+QXSP_BACK=0", .tag = "OnePanel", .nodes = {{kAcl, "1\n"}}},
    Case{.line = "AT+QXSP_BACK=0", .back = true, .events = kWake + msg("keep_screen_on 1,display_id:4096"),
         .nodes = {{kAcl, "0"}}},
    Case{.line = "AT+QXSP_BACK=1", .tag = "Silent", .back = true, .fault = "testapp-silent", .word = "ATERROR",
         .events = "wakelock release ftcmd\n" + msg("keep_screen_on 0,display_id:4096", "(silent)")},
    Case{.line = "AT+QXSP=3", .events = msg("keep_screen_on 5")},
    Case{.line = "AT+QXSP=3", .tag = "Refused", .replies = {{"keep_screen_on 5", "busy"}}, .word = "ERROR",
         .events = msg("keep_screen_on 5", "busy")},
    Case{.line = "AT+QXSP=2", .word = "ERROR"},
    Case{.line = "AT+QXBS=1", .events = "setprop persist.sys.keep.screenon=1\n" + msg("keep_screen_on 3,display_id:0"),
         .nodes = {{kAcl, "0"}}},
    Case{.line = "AT+QXBS=1", .tag = "AtMode", .sp = 1, .nodes = {{kInfo, "keepscreen=yes\n"}, {kAcl, "1\n"}}},
    Case{.line = "AT+QXBS=1", .tag = "AtModeNoItemFile", .sp = 1, .remove = {"/cache/recovery"}, .word = "ERROR"},
    Case{.line = "AT+QXBS=0", .files = {{kInfo, "a=1\nkeepscreen=yes\n"}},
         .events = "setprop persist.sys.keep.screenon=0\n" + msg("keep_screen_on 4,display_id:0"),
         .nodes = {{kInfo, "a=1\n"}}},
    Case{.line = "AT+QXBS=0", .tag = "AtModeNoItem", .sp = 1},
    Case{.line = "AT+QXBS=0", .tag = "Refused", .fault = "testapp-refuse", .word = "ERROR",
         .events = "setprop persist.sys.keep.screenon=0\n" + msg("keep_screen_on 4,display_id:0", "error")},
    Case{.line = "AT+QXBS_BACK=1", .tag = "OnePanel", .sp = 1},
    Case{.line = "AT+QXBS_BACK=1", .tag = "AtMode", .sp = 1, .back = true, .body = "\r\nAT mode not support\r\n",
         .word = "ATERROR"},
    Case{.line = "AT+QXBS_BACK=1", .back = true, .events = msg("keep_screen_on 3,display_id:4096")},
    Case{.line = "AT+QXBS_BACK=0", .tag = "Refused", .back = true, .fault = "testapp-refuse", .word = "ATERROR",
         .events = msg("keep_screen_on 4,display_id:4096", "error")},
    Case{.line = "AT+QXBS=2", .word = "ERROR"}), case_name);

// Backlight steps and percentages (0..100, read as unsigned), and wake-up with its result query.
INSTANTIATE_TEST_SUITE_P(BacklightAndWake, DisplayLine, ::testing::Values(
    Case{.line = "AT+QXSCB=1,0", .events = msg("backlight 1 display_id:0")},
    Case{.line = "AT+QXSCB=1,2", .tag = "Refused", .fault = "testapp-refuse", .word = "ERROR",
         .events = msg("backlight 3 display_id:0", "error")},
    Case{.line = "AT+QXSCB=0", .events = msg("backlight 0 display_id:0")},
    Case{.line = "AT+QXSCB=2,100", .events = msg("backlight percentage 100 display_id:0")},
    Case{.line = "AT+QXSCB=2,0", .events = msg("backlight percentage 0 display_id:0")},
    Case{.line = "AT+QXSCB=2,7x", .events = msg("backlight percentage 7 display_id:0")},
    Case{.line = "AT+QXSCB=2,50", .tag = "Refused", .replies = {{"backlight percentage 50 display_id:0", "fail"}},
         .word = "ATNG", .events = msg("backlight percentage 50 display_id:0", "fail")},
    Case{.line = "AT+QXSCB=2,101", .word = "ATNG"},
    Case{.line = "AT+QXSCB=2,-1", .word = "ATNG"},
    Case{.line = "AT+QXSCB=2,x", .word = "ATNG"},
    Case{.line = "AT+QXSCB=2,4294967346", .word = "ATNG"},
    Case{.line = "AT+QXSCB=3", .word = "ERROR"},
    Case{.line = "AT+QXSCB_BACK=1,2", .back = true, .events = msg("backlight 3 display_id:4096")},
    Case{.line = "AT+QXSCB_BACK=2,100", .back = true, .events = msg("backlight percentage 100 display_id:4096")},
    Case{.line = "AT+QXSCB_BACK=2,101", .tag = "OnePanel"},
    Case{.line = "AT+QXWAKE=1", .events = msg("wakeup 1 display_id:0")},
    Case{.line = "AT+QXWAKE=2", .tag = "Silent", .fault = "testapp-silent", .word = "ERROR",
         .events = msg("wakeup 2 display_id:0", "(silent)")},
    Case{.line = "AT+QXWAKE=0", .body = q("wake:1"), .events = msg("wakeup 0 display_id:0")},
    Case{.line = "AT+QXWAKE=0", .tag = "Failed", .fault = "testapp-refuse", .body = q("wake:0"),
         .events = msg("wakeup 0 display_id:0", "error")},
    Case{.line = "AT+QXWAKE=0", .tag = "Other", .replies = {{"wakeup 0 display_id:0", "ok?"}}, .word = "ERROR",
         .events = msg("wakeup 0 display_id:0", "ok?")},
    Case{.line = "AT+QXWAKE_BACK=0", .back = true, .replies = {{"wakeup 0 display_id:4096", "testing"}},
         .body = q("wake:2"), .events = msg("wakeup 0 display_id:4096", "testing")},
    Case{.line = "AT+QXWAKE=3", .word = "ERROR"}), case_name);

const std::string kTestFile = "/data/engineermode/tp_at_sensor_test";
const std::string kCaliFile = "/data/engineermode/tp_at_sensor_cali";
const std::string kKeyFile = "/sys/touchscreen/factory_key", kSupport = "/sys/touchscreen/cali_support";
const std::string kSelfCheck0 = "touchscreen_selfcheck 0,display_id:0";

// The touch panel: the test app's verdicts, or on a panel fitted without a screen the library and verdict files.
INSTANTIATE_TEST_SUITE_P(Touch, DisplayLine, ::testing::Values(
    Case{.line = "AT+QXTOUCH=0", .body = q("touchscreen:1"), .events = msg(kSelfCheck0)},
    Case{.line = "AT+QXTOUCH=0", .tag = "Testing", .replies = {{kSelfCheck0, "testing"}}, .body = q("touchscreen:2"),
         .events = msg(kSelfCheck0, "testing")},
    Case{.line = "AT+QXTOUCH=0", .tag = "Failed", .fault = "testapp-refuse", .body = q("touchscreen:0"),
         .events = msg(kSelfCheck0, "error")},
    Case{.line = "AT+QXTOUCH=0", .tag = "Silent", .fault = "testapp-silent", .word = "ERROR",
         .events = msg(kSelfCheck0, "(silent)")},
    Case{.line = "AT+QXTOUCH=0", .tag = "Screenless", .files = {{kKeyFile, kBadScreen}, {kTestFile, "Pass\n"}},
         .body = q("touchscreen:1")},
    Case{.line = "AT+QXTOUCH=0", .tag = "ScreenlessTesting", .files = {{kKeyFile, kBadScreen}, {kTestFile, "testing"}},
         .body = q("touchscreen:2")},
    Case{.line = "AT+QXTOUCH=0", .tag = "ScreenlessNoVerdict", .files = {{kKeyFile, kBadScreen}}, .word = "ERROR"},
    Case{.line = "AT+QXTOUCH_BACK=0", .tag = "Screenless", .back = true,
         .files = {{kKeyFile, "bad_screen_sec:null:null:null:null:null"}, {kTestFile + "_back", "Fail"}},
         .body = q("touchscreen:0")},
    Case{.line = "AT+QXTOUCH_BACK=0", .tag = "MainScreenless", .back = true, .files = {{kKeyFile, kBadScreen}},
         .body = q("touchscreen:1"), .events = msg("touchscreen_selfcheck 0,display_id:4096")},
    Case{.line = "AT+QXTOUCH=1,3", .events = msg("touchscreen_selfcheck 1 3,display_id:0")},
    Case{.line = "AT+QXTOUCH=1," + kLongArg, .tag = "Long", .events = msg("touchscreen_selfcheck 1 " + kLongArg.substr(0, 25))},
    Case{.line = "AT+QXTOUCH=1", .word = "ERROR"},
    Case{.line = "AT+QXTOUCH=1,3", .tag = "Screenless", .files = {{kKeyFile, kBadScreen}},
         .events = "touchpanel sensor_test count=3 item=166 -> 0\n", .nodes = {{kTestFile, "Pass\n"}}},
    Case{.line = "AT+QXTOUCH=1,3", .tag = "ScreenlessFails", .fault = "touchpanel", .files = {{kKeyFile, kBadScreen}},
         .word = "ERROR", .events = "touchpanel sensor_test count=3 item=166 -> -1\n"},
    Case{.line = "AT+QXTOUCH=1,x", .tag = "Screenless", .files = {{kKeyFile, kBadScreen}}, .word = "ERROR"},
    Case{.line = "AT+QXTOUCH_BACK=1,2", .back = true, .files = {{kKeyFile, "bad_screen_back:null:null:null:null:null"}},
         .events = "touchpanel sensor_test count=2 item=168 -> 0\n"},
    Case{.line = "AT+QXTOUCH=2", .files = {{"/sys/kernel/debug/touchscreen/key_i2c_test", "Fail"}}, .word = "ERROR"},
    Case{.line = "AT+QXTOUCH=2", .tag = "Pass"},
    Case{.line = "AT+QXTOUCH=2", .tag = "Missing", .remove = {"/sys/kernel/debug/touchscreen"}, .word = "ERROR"},
    Case{.line = "AT+QXTOUCH=3", .files = {{kCaliFile, "Pass\n"}}},
    Case{.line = "AT+QXTOUCH=3", .tag = "Failed", .files = {{kCaliFile, "Fail\n"}}, .word = "ERROR"},
    Case{.line = "AT+QXTOUCH=3", .tag = "NoVerdict", .word = "ERROR"},
    Case{.line = "AT+QXTOUCH_BACK=3", .back = true, .files = {{kCaliFile + "_back", "Pass"}}},
    Case{.line = "AT+QXTOUCH=3,5", .events = "touchpanel sensor_test count=5 item=165 -> 0\n", .nodes = {{kCaliFile, "Pass\n"}}},
    Case{.line = "AT+QXTOUCH=3,5", .tag = "ItemFails", .config = {{"touchpanel_test.165", "2"}}, .word = "ERROR",
         .events = "touchpanel sensor_test count=5 item=165 -> 2\n", .nodes = {{kCaliFile, "Fail\n"}}},
    Case{.line = "AT+QXTOUCH_BACK=3,5", .back = true, .events = "touchpanel sensor_test count=5 item=167 -> 0\n"},
    Case{.line = "AT+QXTOUCH=WE,0", .body = "\"1\""},
    Case{.line = "AT+QXTOUCH=WE,0", .tag = "Edge", .files = {{"/sys/touch/wafer_edge", "255\n"}}, .body = "\"0\""},
    Case{.line = "AT+QXTOUCH=WE,0", .tag = "Missing", .remove = {"/sys/touch"}, .body = "\"0\""},
    Case{.line = "AT+QXTOUCH=WE,1", .files = {{"/sys/touch/wafer_edge", "7ab"}}, .body = "\"7\""},
    Case{.line = "AT+QX_TPL_CAL=0", .files = {{kSupport, "3\n"}}, .body = "\"1\"", .word = "ATOK"},
    Case{.line = "AT+QX_TPL_CAL=0", .tag = "BackOnly", .files = {{kSupport, "2\n"}}, .body = "\"0\"", .word = "ATOK"},
    Case{.line = "AT+QX_TPL_CAL_BACK=0", .back = true, .files = {{kSupport, "2\n"}}, .body = "\"1\"", .word = "ATOK"},
    Case{.line = "AT+QX_TPL_CAL=0", .tag = "Missing", .remove = {kSupport},
         .body = "\"read cali_support error:No such file or directory\"", .word = "ATNG"},
    Case{.line = "AT+QXTOUCH=9", .word = "ERROR"},
    Case{.line = "AT+MMITW=1", .events = "activity com.pyxa.engineermode/.FingerTouchActivity  \n"},
    Case{.line = "AT+MMITW=0", .events = "activity com.pyxa.engineermode/.FingerTouchActivity  --ez finish true\n"},
    Case{.line = "AT+MMITW=2", .word = "ERROR"}), case_name);

// Panel identifiers and colour, the second-screen switch and the wallpaper in the NV record.
INSTANTIATE_TEST_SUITE_P(PanelData, DisplayLine, ::testing::Values(
    Case{.line = "AT+QXLCMID=0", .body = q("PX5012-BOE-NT37701")},
    Case{.line = "AT+QXLCMID=0", .tag = "CrLf", .files = {{"/sys/lcm/lcm_id", "AB\rC\nD"}}, .body = q("AB")},
    Case{.line = "AT+QXLCMID=0", .tag = "Long", .files = {{"/sys/lcm/lcm_id", kLongArg}},
         .body = q(kLongArg.substr(0, 49))},
    Case{.line = "AT+QXLCMID=0", .tag = "Missing", .remove = {"/sys/lcm/lcm_id"}, .word = "ERROR"},
    Case{.line = "AT+QXPID=0", .body = q("0x3A")},
    Case{.line = "AT+QXPID=1", .word = "ERROR"},
    Case{.line = "AT+QX_LCM_COLOR=0", .body = "1"},
    Case{.line = "AT+QX_LCM_COLOR=0,x", .files = {{"/sys/lcm/lcm_color", "01\n"}}, .body = "2"},
    Case{.line = "AT+QX_LCM_COLOR=0", .tag = "Odd", .files = {{"/sys/lcm/lcm_color", "02"}}, .body = "error clolr 02:",
         .word = "ERROR"},
    Case{.line = "AT+QX_LCM_COLOR=0", .tag = "Short", .files = {{"/sys/lcm/lcm_color", "0"}},
         .body = "lcm_color file have no data !", .word = "ERROR"},
    Case{.line = "AT+QX_LCM_COLOR=0", .tag = "Missing", .remove = {"/sys/lcm/lcm_color"}, .body = "open lcm_color failed !",
         .word = "ERROR"},
    Case{.line = "AT+QX_LCM_COLOR=1", .body = "invalid command: AT+QX_LCM_COLOR=1", .word = "ERROR"},
    Case{.line = "AT+SECSCREEN=0", .word = "ATOK", .events = "nv write\nsetprop ro.kael.secscreen=disable\n",
         .nv_after = {{nv::kSpecialProduct, 0x959493D2}}},
    Case{.line = "AT+SECSCREEN=1", .nv = {{nv::kSpecialProduct, 0xFFFFFFFF}}, .word = "ATOK",
         .events = "nv write\nsetprop ro.kael.secscreen=enable\n", .nv_after = {{nv::kSpecialProduct, 0xFFFFFFBF}}},
    Case{.line = "AT+SECSCREEN=0", .tag = "NvWriteFails", .fault = "nv-write", .word = "ATNG"},
    Case{.line = "AT+SECSCREEN=2", .nv = {{nv::kSpecialProduct, 0x40}}, .body = "\"disable\"", .word = "ATOK"},
    Case{.line = "AT+SECSCREEN=2", .tag = "Enabled", .body = "\"enable\"", .word = "ATOK"},
    Case{.line = "AT+SECSCREEN=2", .tag = "NvReadFails", .fault = "nv-read", .word = "ATNG"},
    Case{.line = "AT+QXMMIUI=1,42", .events = "nv write\n", .nv_after = {{nv::kWallpaperId, 42}}},
    Case{.line = "AT+QXMMIUI=1,4a", .word = "ERROR"},
    Case{.line = "AT+QXMMIUI=1,99999999999", .word = "ERROR"},
    Case{.line = "AT+QXMMIUI=1", .word = "ERROR"},
    Case{.line = "AT+QXMMIUI=1,42", .tag = "NvWriteFails", .fault = "nv-write", .word = "ERROR"},
    Case{.line = "AT+QXMMIUI=0", .nv = {{nv::kWallpaperId, 7}}, .body = q("7")},
    Case{.line = "AT+QXMMIUI=0", .tag = "NvReadFails", .fault = "nv-read", .word = "ERROR"},
    Case{.line = "AT+QXMMIUI=2", .word = "ERROR"}), case_name);
// clang-format on

// Names reach a handler only in capitals; past the table, the plain backlight forms ignore
// case and the back forms keep it.
TEST_F(DisplayTest, BacklightFormsAndCase) {
    two_panels();
    EXPECT_EQ(serve("AT+qxscb=0"), "AT+qxscb=0\r\n\"AT not support\"\r\nERROR\r\n");
    char resp[kRespSize] = {0};
    char plain[] = "AT+QXSCB=1,0", lower[] = "at+qxscb=1,0", back_lower[] = "AT+QXSCB_back=0", back[] = "AT+QXSCB_BACK=0";
    EXPECT_EQ(mmi_backlight_test_handler(plain, 36, resp), RC_OK);
    EXPECT_EQ(mmi_backlight_test_handler(lower, 36, resp), RC_OK);
    EXPECT_EQ(mmi_backlight_test_handler(back_lower, 36, resp), RC_ERROR);
    EXPECT_EQ(mmi_backlight_test_handler(back, 36, resp), RC_OK);
    EXPECT_EQ(box.events(), msg("backlight 1 display_id:0") + msg("backlight 1 display_id:0") +
                                msg("backlight 0 display_id:4096"));
}

// The panel model takes only what its driver would: decimal 0x58RRGGBB, one line end
// allowed; anything else leaves a lost calibration lost.
struct PanelWrite {
    std::string name, text, event, node;
};
void PrintTo(const PanelWrite &w, std::ostream *os) { *os << w.name; }
class PanelModel : public DisplayTest, public ::testing::WithParamInterface<PanelWrite> {};

TEST_P(PanelModel, TakesOnlyCalibrationValues) {
    const PanelWrite &w = GetParam();
    box.write(kMainCali, kLost);
    ASSERT_EQ(dev::write_node(kMainCali, w.text.c_str()), static_cast<int>(w.text.size()));
    EXPECT_EQ(box.events(), "panel main calibrate " + w.event + "\n");
    EXPECT_EQ(box.read(kMainCali), w.node);
}

INSTANTIATE_TEST_SUITE_P(Writes, PanelModel, ::testing::Values(
    PanelWrite{"Value", "1491132640", "1491132640", "0xE0 0xE0 0xE0\n"},
    PanelWrite{"LineEnd", "1491132640\n", "1491132640|", "0xE0 0xE0 0xE0\n"},
    PanelWrite{"NoMarker", "14737632", "14737632 -> rejected", kLost},
    PanelWrite{"Word", "white", "white -> rejected", kLost},
    PanelWrite{"TooLong", "99999999999", "99999999999 -> rejected", kLost}),
    [](const ::testing::TestParamInfo<PanelWrite> &info) { return info.param.name; });

}  // namespace
