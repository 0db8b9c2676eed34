// Display, touch and backlight tests: colours and patterns on the panels, keeping the
// screen awake, backlight steps, wake-up, panel identifiers and colour calibration, the
// second screen switch and the touch panel's self-test. Most screen work is the test
// app's: the daemon starts its activities or asks it by message. A phone may have a back
// panel (display 4096); every "_BACK" command answers OK and does nothing on a phone
// without one.
#include "handlers/display.h"

#include <android-base/unique_fd.h>
#include <errno.h>
#include <fcntl.h>
#include <unistd.h>

#include <array>
#include <climits>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <memory>
#include <string_view>

#include "core/command_tables/handlers.h"
#include "core/nv.h"
#include "core/port_state.h"
#include "handlers/common.h"
#include "platform/android.h"
#include "platform/device.h"
#include "platform/factory.h"
#include "platform/log.h"

using android::base::unique_fd;

bool back_panel_supported() { return is_calibrate_item_support("\"double_lcm_support\"") == 1; }

bool is_back_command(const char *cmd) {
    std::string_view line(cmd);
    return line.substr(0, line.find_first_of("=?")).ends_with("_BACK");
}

namespace {

constexpr char kLcmTest[] = "com.pyxa.engineermode/.ATLcmTest";
constexpr char kLcmAction[] = "android.factorytest.ATLCM";
constexpr char kFloatingService[] = "com.pyxa.engineermode/.FloatingService";
constexpr char kLcmChooseTest[] = "com.pyxa.engineermode/.verifytest.lcm.LcmChooseTest";
constexpr char kFingerTouch[] = "com.pyxa.engineermode/.FingerTouchActivity";
constexpr char kWakeLock[] = "ftcmd";
constexpr char kOledAcl[] = "sys/lcm/oled_acl";  // relative: the daemon runs in "/"
constexpr char kTestInfo[] = "/cache/recovery/last_test_info";

// A panel's lost calibration shows as this in its calibration node.
constexpr char kLostCalibration[] = "0x00 0x00 0x00";
// Calibrated colours lie in this band; pure white itself means the value was never set.
constexpr uint32_t kColourLow = 0xD7D7D8;
constexpr uint32_t kColourWhite = 0xFFFFFF;
// The panel driver takes a calibration value with these marker bits set.
constexpr uint32_t kCalibrationMark = 0x58000000;

// The two panels as the colour forms of AT+LCMT use them. `index` is how the colour
// restore names a panel: 1 the main panel, anything else the back panel.
struct Panel {
    int index;
    const char *calidata;
    const char *cali_property;
    size_t nv_colour;
    const char *extras_tail;  // after "-e lcm_color <colour>"
    const char *read_failed;
    const char *not_calibrated;
};

constexpr Panel kMainPanel{1,
                           "sys/lcm/mainpanel_calidata",
                           "ro.sys.mainlcm.cali",
                           nv::kMainPanelColour,
                           "",
                           "\r\n\"get main lcm calibrate state failed\"\r\n",
                           "\r\n\"main lcm not calibrate\"\r\n"};
constexpr Panel kBackPanel{0,
                           "sys/lcm/subpanel_calidata",
                           "ro.sys.sublcm.cali",
                           nv::kBackPanelColour,
                           " --ei display_id 4096",
                           "\r\n\"get sub lcm calibrate state failed\"\r\n",
                           "\r\n\"sub lcm not calibrate\"\r\n"};

// The panel-choice forms of AT+LCMT: the property value and the chooser's extras.
struct ChooseForm {
    const char *line;
    const char *choose;
    const char *extras;
};
constexpr std::array<ChooseForm, 4> kChooseForms{{
    {"AT+LCMT=2,1", "1", "-e enter 1"},
    {"AT+LCMT=2,0", "0", "-e exit 1"},
    {"AT+LCMT_BACK=2,1", "1", "-e enter 1 --ei display_id 4096"},
    {"AT+LCMT_BACK=2,0", "0", "-e exit 1 --ei display_id 4096"},
}};

// A fixed form and the message it sends to the test app.
struct MessageForm {
    const char *line;
    const char *message;
};
// The AT+QXSCB forms compare without regard to case, the AT+QXSCB_BACK forms with it.
constexpr std::array<MessageForm, 4> kBacklightSteps{{
    {"AT+QXSCB=1,0", "backlight 1 display_id:0"},
    {"AT+QXSCB=1,1", "backlight 2 display_id:0"},
    {"AT+QXSCB=1,2", "backlight 3 display_id:0"},
    {"AT+QXSCB=0", "backlight 0 display_id:0"},
}};
constexpr std::array<MessageForm, 4> kBackBacklightSteps{{
    {"AT+QXSCB_BACK=1,0", "backlight 1 display_id:4096"},
    {"AT+QXSCB_BACK=1,1", "backlight 2 display_id:4096"},
    {"AT+QXSCB_BACK=1,2", "backlight 3 display_id:4096"},
    {"AT+QXSCB_BACK=0", "backlight 0 display_id:4096"},
}};

// The wake-up forms; step 0 is the result query. Back forms compare with regard to case.
struct WakeForm {
    const char *line;
    int step;
    int display;
};
constexpr std::array<WakeForm, 6> kWakeForms{{
    {"AT+QXWAKE=1", 1, kMainDisplayId},
    {"AT+QXWAKE=2", 2, kMainDisplayId},
    {"AT+QXWAKE=0", 0, kMainDisplayId},
    {"AT+QXWAKE_BACK=1", 1, kBackDisplayId},
    {"AT+QXWAKE_BACK=2", 2, kBackDisplayId},
    {"AT+QXWAKE_BACK=0", 0, kBackDisplayId},
}};

// Where the touch panel of each screen leaves its verdicts, and the sensor-test item codes.
struct TouchPanel {
    const char *test_result;
    const char *cali_result;
    const char *test_item;
    const char *cali_item;
    int display;
};
constexpr TouchPanel kMainTouch{"/data/engineermode/tp_at_sensor_test", "/data/engineermode/tp_at_sensor_cali", "166",
                                "165", kMainDisplayId};
constexpr TouchPanel kBackTouch{"/data/engineermode/tp_at_sensor_test_back",
                                "/data/engineermode/tp_at_sensor_cali_back", "168", "167", kBackDisplayId};

// Lines are compared whole; the back forms of some commands with regard to case.
bool form_is(const char *cmd, const char *form, bool with_case) {
    return with_case ? strcmp(cmd, form) == 0 : line_is(cmd, form);
}

// A "_BACK" command on a phone without a back panel: answered OK, nothing done.
bool back_panel_missing(const char *cmd) {
    if (!is_back_command(cmd) || back_panel_supported()) return false;
    LOGI("no back panel: %s answered without action", cmd);
    return true;
}

// The argument after the first comma as strtok gives it (empty fields skipped, as every
// family splits its fields), cut at the next comma in place; nullptr when there is none.
char *first_argument(char *cmd) {
    char *arg = strchr(cmd, ',');
    if (arg == nullptr) return nullptr;
    arg += strspn(arg, ",");
    if (*arg == '\0') return nullptr;
    arg[strcspn(arg, ",")] = '\0';
    return arg;
}

// The decimal number a text starts with. A text without one, or with one beyond an int,
// is refused: the station's argument is then absurd, not a value to send on.
bool leading_int(const char *text, int &value) {
    char *end = nullptr;
    errno = 0;
    long v = strtol(text, &end, 10);
    if (end == text || errno == ERANGE || v < INT_MIN || v > INT_MAX) return false;
    value = static_cast<int>(v);
    return true;
}

int ask_ok_or(const char *message, int failure) { return test_app_ok(message) ? RC_OK : failure; }

void start_lcm_test(const char *extras) { startActivityFromFtcmd(kLcmTest, kLcmAction, extras); }

// ---- colour restore

// The panel's calibrated colour kept in the NV record, or -1.
int get_rgb_from_backup(int panel) {
    nv::Record rec;
    if (!nv::read(rec)) {
        LOGE("read backup Error: %s", strerror(errno));
        return -1;
    }
    uint32_t colour = static_cast<uint32_t>(rec.i32(panel == 1 ? nv::kMainPanelColour : nv::kBackPanelColour));
    if (colour < kColourLow || colour >= kColourWhite) {
        LOGE("invalid rgb: %x", colour);
        return -1;
    }
    return static_cast<int>(colour);
}

// Gives the panel its calibrated colour back; 0, or -1 when the node cannot take it.
int write_rgb_to_tp(int colour, int panel) {
    const Panel &p = panel == 1 ? kMainPanel : kBackPanel;
    char text[16];
    snprintf(text, sizeof text, "%d", colour);
    kaelatcmd_set_system_property(p.cali_property, text);
    unique_fd fd(dev::open(p.calidata, O_RDWR));
    if (fd.get() < 0) {
        LOGE("open %s failed: %s", p.calidata, strerror(errno));
        return -1;
    }
    int len = snprintf(text, sizeof text, "%u", static_cast<uint32_t>(colour) | kCalibrationMark);
    ssize_t n = ::write(fd.get(), text, static_cast<size_t>(len));
    if (n != len) {
        LOGE("write %s to %s failed: %zd", text, p.calidata, n);
        return -1;
    }
    // The panel driver takes each write whole; a node that is a plain file would keep the
    // tail of a longer old text. Cut only after a full write, so a failed one leaves the
    // node as it was (a sysfs node ignores the cut).
    if (ftruncate(fd.get(), len) != 0) LOGD("%s keeps its length: %s", p.calidata, strerror(errno));
    fsync(fd.get());
    return 0;
}

// AT+LCMT=1,colour and AT+LCMT_BACK=1,colour: shows the colour; where the phone has two
// panels, first gives a panel that lost its calibration the colour kept in the NV record.
int show_colour(char *cmd, char *resp, const Panel &p) {
    const char *colour = first_argument(cmd);
    if (colour == nullptr) return invalid_command(cmd);
    char extras[100];
    snprintf(extras, sizeof extras, "-e lcm_color %s%s", colour, p.extras_tail);
    if (back_panel_supported()) {
        char state[51] = {0};
        if (read_policy_file(0, p.calidata, state, 50) < 0) {
            LOGE("read %s failed", p.calidata);
            body_printf(resp, "%s", p.read_failed);
            return RC_ATNG;
        }
        if (strstr(state, kLostCalibration) != nullptr) {
            int rgb = get_rgb_from_backup(p.index);
            if (rgb < 0 || write_rgb_to_tp(rgb, p.index) != 0) {
                body_printf(resp, "%s", p.not_calibrated);
                return RC_ATNG;
            }
            LOGI("panel %d calibration restored: %x", p.index, rgb);
        }
    }
    start_lcm_test(extras);
    return RC_OK;
}

int choose_panel(const ChooseForm &f) {
    kaelatcmd_set_system_property("persist.sys.em.lcm_choose", f.choose);
    startServiceFromFtcmd(kFloatingService, nullptr, nullptr);
    startActivityFromFtcmd(kLcmChooseTest, nullptr, f.extras);
    return RC_OK;
}

// AT+QX_LCM_IC=0: the backlight driver answers with its register map.
int backlight_driver_check(char *resp) {
    char regs[1025] = {0};
    if (!read_node("/sys/class/leds/lm3697-backlight/registers", regs, sizeof regs) || regs[0] == '\0') {
        LOGE("lm3697 registers unreadable");
        return RC_ATNG;
    }
    if (strstr(regs, "OUTPUT_CFG_REG") != nullptr) return RC_ATOK;
    body_printf(resp, "%s", regs);
    return RC_ATNG;
}

// A panel flag node that reads exactly "01" when set (a failed read is "not set").
int panel_flag(char *resp, const char *node, const char *set, const char *clear) {
    char text[51] = {0};
    read_node(node, text, sizeof text);
    quote_body(resp, strcmp(text, "01") == 0 ? set : clear);
    return RC_ATOK;
}

// ---- keep the screen on

int hold_screen(int display, int failure) {
    acquire_wake_lock(PARTIAL_WAKE_LOCK, kWakeLock);
    write_int(kOledAcl, 0);
    char message[48];
    snprintf(message, sizeof message, "keep_screen_on 1,display_id:%d", display);
    return ask_ok_or(message, failure);
}

int let_screen_go(int display, int failure) {
    release_wake_lock(kWakeLock);
    char message[48];
    snprintf(message, sizeof message, "keep_screen_on 0,display_id:%d", display);
    return ask_ok_or(message, failure);
}

// ---- backlight and wake-up

// AT+QXSCB=2,n and AT+QXSCB_BACK=2,n: n taken as unsigned, so a negative value is above 100.
int backlight_percentage(const char *text, int display) {
    int percent = 0;
    if (!leading_int(text, percent) || static_cast<unsigned>(percent) > 100) {
        LOGE("backlight percentage invalid: %s", text);
        return RC_ATNG;
    }
    char message[64];
    snprintf(message, sizeof message, "backlight percentage %d display_id:%d", percent, display);
    return ask_ok_or(message, RC_ATNG);
}

int wake_up(char *resp, const WakeForm &f) {
    char message[48];
    snprintf(message, sizeof message, "wakeup %d display_id:%d", f.step, f.display);
    if (f.step != 0) return ask_ok_or(message, RC_ERROR);
    const char *reply = ask_test_app(message);
    if (reply == nullptr) return RC_ERROR;
    const char *state = strcmp(reply, "ok") == 0        ? "wake:1"
                        : strcmp(reply, "error") == 0   ? "wake:0"
                        : strcmp(reply, "testing") == 0 ? "wake:2"
                                                        : nullptr;
    if (state == nullptr) return RC_ERROR;
    quote_body(resp, state);
    return RC_OK;
}

// ---- touch panel

// A panel fitted without a screen marks it in the touch controller's factory key; its
// tests then run through files and the library instead of the test app.
bool touch_without_screen(const char *cmd) {
    char key[513] = {0};
    if (read_policy_file(0, "/sys/touchscreen/factory_key", key, 512) < 0) return false;
    if (strstr(cmd, "AT+QXTOUCH_BACK") != nullptr)
        return strstr(key, "bad_screen_back:null:null:null:null:null") != nullptr ||
               strstr(key, "bad_screen_sec:null:null:null:null:null") != nullptr;
    return strstr(key, "bad_screen:null:null:null:null:null") != nullptr;
}

int touch_result(char *resp, const TouchPanel &tp, bool screenless) {
    int verdict = 0;  // touchscreen:0 failed, 1 passed, 2 still testing
    if (screenless) {
        char text[51] = {0};
        if (readFromFile(tp.test_result, text, 50) < 0) {
            LOGE("read tp_at_sensor_test fail, error:%s", strerror(errno));
            return RC_ERROR;
        }
        verdict = strstr(text, "Pass") ? 1 : strstr(text, "testing") ? 2 : 0;
    } else {
        char message[48];
        snprintf(message, sizeof message, "touchscreen_selfcheck 0,display_id:%d", tp.display);
        const char *reply = ask_test_app(message);
        if (reply == nullptr || reply[0] == '\0') return RC_ERROR;
        verdict = strcmp(reply, "ok") == 0 ? 1 : strcmp(reply, "testing") == 0 ? 2 : 0;
    }
    body_printf(resp, "\r\n\"touchscreen:%d\"\r\n", verdict);
    return RC_OK;
}

// The library's sensor test for an item; the station's argument is the count.
int touch_sensor_test(const char *arg, const char *item) {
    int count = 0;
    if (!leading_int(arg, count)) {
        LOGE("touch test count invalid: %s", arg);
        return RC_ERROR;
    }
    return touchpanel_sensor_test(count, item) == 0 ? RC_OK : RC_ERROR;
}

int touch_selfcheck(char *cmd, const TouchPanel &tp, bool screenless) {
    const char *arg = first_argument(cmd);
    if (arg == nullptr) return RC_ERROR;
    if (screenless) return touch_sensor_test(arg, tp.test_item);
    char message[50];
    snprintf(message, sizeof message, "touchscreen_selfcheck 1 %s,display_id:%d", arg, tp.display);
    return ask_ok_or(message, RC_ERROR);
}

// A verdict file of the touch panel: OK when it says "Pass".
int touch_verdict(const char *path, size_t max) {
    char text[51] = {0};
    if (readFromFile(path, text, static_cast<int>(max)) < 0) {
        LOGE("read %s failed: %s", path, strerror(errno));
        return RC_ERROR;
    }
    return strstr(text, "Pass") ? RC_OK : RC_ERROR;
}

int touch_key_bus_test() {
    unique_fd fd(dev::open("/sys/kernel/debug/touchscreen/key_i2c_test", O_RDONLY));
    if (fd.get() < 0) {
        LOGE("failed to open key_i2c_test:%s", strerror(errno));
        return RC_ERROR;
    }
    char text[21] = {0};
    if (::read(fd.get(), text, 20) < 0) return RC_ERROR;
    return strstr(text, "Pass") ? RC_OK : RC_ERROR;
}

// AT+QXTOUCH=WE,0 and =WE,1: the wafer-edge node; a panel without one answers "0".
int wafer_edge(char *resp, bool first_char) {
    unique_fd fd(dev::open("/sys/touch/wafer_edge", O_RDONLY));
    if (fd.get() < 0) {
        quote_reason(resp, "0");
        return RC_OK;
    }
    char text[21] = {0};
    if (::read(fd.get(), text, 20) < 0) text[0] = '\0';
    if (first_char) {
        text[1] = '\0';
        quote_reason(resp, text);
    } else {
        quote_reason(resp, strstr(text, "255") ? "0" : "1");
    }
    return RC_OK;
}

// AT+QX_TPL_CAL=0 and _BACK=0: whether the panel's calibration is supported, one bit each.
int cali_support(char *resp, int bit) {
    char text[21] = {0};
    if (readFromFile("/sys/touchscreen/cali_support", text, 20) < 0) {
        body_printf(resp, "\"read cali_support error:%s\"", strerror(errno));
        return RC_ATNG;
    }
    body_printf(resp, "\"%d\"", (atoi(text) & bit) ? 1 : 0);
    return RC_ATOK;
}

// ---- identifiers and the second screen

// One line of an identifier node, at most 49 characters, without its line end.
int answer_first_line(const char *path, char *resp) {
    std::unique_ptr<FILE, decltype(&fclose)> f(dev::fopen(path, "r"), &fclose);
    if (!f) {
        LOGE("open %s failed: %s", path, strerror(errno));
        return RC_ERROR;
    }
    char line[50] = {0};
    if (fgets(line, sizeof line, f.get()) == nullptr) line[0] = '\0';
    line[strcspn(line, "\r\n")] = '\0';
    quote_body(resp, line);
    return RC_OK;
}

int panel_colour(char *resp) {
    unique_fd fd(dev::open("/sys/lcm/lcm_color", O_RDONLY));
    if (fd.get() < 0) {
        body_printf(resp, "open lcm_color failed !");
        return RC_ERROR;
    }
    char text[3] = {0};
    if (::read(fd.get(), text, 2) < 2) {
        body_printf(resp, "lcm_color file have no data !");
        return RC_ERROR;
    }
    if (strcmp(text, "00") == 0 || strcmp(text, "01") == 0) {
        body_printf(resp, "%s", text[1] == '0' ? "1" : "2");
        return RC_OK;
    }
    body_printf(resp, "error clolr %s:", text);
    return RC_ERROR;
}

int set_second_screen(bool off) {
    nv::Update u = nv::update([off](nv::Record &rec) {
        uint32_t flags = static_cast<uint32_t>(rec.i32(nv::kSpecialProduct));
        flags = off ? flags | nv::kSecondScreenOff : flags & ~nv::kSecondScreenOff;
        rec.set_i32(nv::kSpecialProduct, static_cast<int32_t>(flags));
    });
    if (u != nv::Update::Ok) {
        LOGE("special_product %s failed", u == nv::Update::ReadFailed ? "read" : "write");
        return RC_ATNG;
    }
    kaelatcmd_set_system_property("ro.kael.secscreen", off ? "disable" : "enable");
    return RC_ATOK;
}

int second_screen_state(char *resp) {
    nv::Record rec;
    if (!nv::read(rec)) {
        LOGE("special_product read failed");
        return RC_ATNG;
    }
    bool off = static_cast<uint32_t>(rec.i32(nv::kSpecialProduct)) & nv::kSecondScreenOff;
    quote_reason(resp, off ? "disable" : "enable");
    return RC_ATOK;
}

}  // namespace

int wall_paper_handler(char *cmd, int arg, char *resp) {
    if (line_starts(cmd, "AT+QXMMIUI=1", 12)) {
        char *id = first_argument(cmd);
        if (id == nullptr) return invalid_command(cmd);
        int value = 0;
        if (!isDigitValue(id) || !leading_int(id, value)) {
            LOGE("this at wall paper id invalid:%s", id);
            return RC_ERROR;
        }
        nv::Update u = nv::update([value](nv::Record &rec) { rec.set_i32(nv::kWallpaperId, value); });
        if (u != nv::Update::Ok) {
            LOGE("wallpaper_id %s failed", u == nv::Update::ReadFailed ? "read" : "write");
            return RC_ERROR;
        }
        return RC_OK;
    }
    if (line_is(cmd, "AT+QXMMIUI=0")) return quote_nv_field(resp, nv::kWallpaperId) ? RC_OK : RC_ERROR;
    return invalid_command(cmd);
}

int keep_screen_on_handler(char *cmd, int arg, char *resp) {
    if (back_panel_missing(cmd)) return RC_OK;
    // The sense is inverted on purpose: 0 holds the screen awake, 1 lets it go.
    if (line_is(cmd, "AT+QXSP=0")) return hold_screen(kMainDisplayId, RC_ERROR);
    if (line_is(cmd, "AT+QXSP=1")) return let_screen_go(kMainDisplayId, RC_ERROR);
    if (line_is(cmd, "AT+QXSP_BACK=0")) return hold_screen(kBackDisplayId, RC_ATERROR);
    if (line_is(cmd, "AT+QXSP_BACK=1")) return let_screen_go(kBackDisplayId, RC_ATERROR);
    if (line_is(cmd, "AT+QXSP=3")) return ask_ok_or("keep_screen_on 5", RC_ERROR);
    return invalid_command(cmd);
}

int keep_screen_on_always_handler(char *cmd, int arg, char *resp) {
    if (back_panel_missing(cmd)) return RC_OK;
    if (line_is(cmd, "AT+QXBS=1")) {
        // Without the Android UI the screen stays on by the item the next boot reads.
        if (is_sp) return set_property_file_item_value(kTestInfo, "keepscreen", "yes") != 0 ? RC_ERROR : RC_OK;
        kaelatcmd_set_system_property("persist.sys.keep.screenon", "1");
        write_int(kOledAcl, 0);
        return ask_ok_or("keep_screen_on 3,display_id:0", RC_ERROR);
    }
    if (line_is(cmd, "AT+QXBS=0")) {
        if (delete_property_file_item(kTestInfo, "keepscreen") != 0) LOGW("delete keepscreen fail");
        if (is_sp) return RC_OK;
        kaelatcmd_set_system_property("persist.sys.keep.screenon", "0");
        return ask_ok_or("keep_screen_on 4,display_id:0", RC_ERROR);
    }
    const bool on = line_is(cmd, "AT+QXBS_BACK=1");
    if (on || line_is(cmd, "AT+QXBS_BACK=0")) {
        if (is_sp) {
            body_printf(resp, "\r\nAT mode not support\r\n");
            return RC_ATERROR;
        }
        return ask_ok_or(on ? "keep_screen_on 3,display_id:4096" : "keep_screen_on 4,display_id:4096", RC_ATERROR);
    }
    return invalid_command(cmd);
}

int lcm_handler(char *cmd, int arg, char *resp) {
    if (back_panel_missing(cmd)) return RC_OK;
    if (line_starts(cmd, "AT+LCMT=1", 9)) return show_colour(cmd, resp, kMainPanel);
    if (line_is(cmd, "AT+LCMT=0") || line_is(cmd, "AT+LCMT_BACK=0")) {
        start_lcm_test(nullptr);
        return RC_OK;
    }
    for (const ChooseForm &f : kChooseForms)
        if (line_is(cmd, f.line)) return choose_panel(f);
    if (line_starts(cmd, "AT+LCMT_BACK=1", 14)) return show_colour(cmd, resp, kBackPanel);
    if (line_is(cmd, "AT+QX_LCM_IC=0")) return backlight_driver_check(resp);
    if (line_is(cmd, "AT+QX_LCM_IC=2")) return panel_flag(resp, "/sys/lcm/lcm_brightness", "b", "a");
    if (line_is(cmd, "AT+QX_LCM_IC=3")) return panel_flag(resp, "/sys/lcm/lcm_vddi_high", "1", "0");
    return invalid_command(cmd);
}

int lcmid_handler(char *cmd, int arg, char *resp) {
    if (line_is(cmd, "AT+QXLCMID=0")) return answer_first_line("/sys/lcm/lcm_id", resp);
    return invalid_command(cmd);
}

int get_touch_screen_id_handle(char *cmd, int arg, char *resp) {
    if (line_is(cmd, "AT+QXPID=0")) return answer_first_line("/sys/touchscreen/firmware_module_id", resp);
    return invalid_command(cmd);
}

int touchsrceen_mmi_test_handler(char *cmd, int arg, char *resp) {
    if (line_is(cmd, "AT+MMITW=1")) {
        startActivityFromFtcmd(kFingerTouch, nullptr, nullptr);
        return RC_OK;
    }
    if (line_is(cmd, "AT+MMITW=0")) {
        startActivityFromFtcmd(kFingerTouch, nullptr, "--ez finish true");
        return RC_OK;
    }
    return invalid_command(cmd);
}

int touchscreen_selfcheck_handler(char *cmd, int arg, char *resp) {
    if (back_panel_missing(cmd)) return RC_OK;
    const bool screenless = touch_without_screen(cmd);
    const TouchPanel &tp = is_back_command(cmd) ? kBackTouch : kMainTouch;
    if (line_is(cmd, "AT+QXTOUCH=0") || line_is(cmd, "AT+QXTOUCH_BACK=0")) return touch_result(resp, tp, screenless);
    if (line_starts(cmd, "AT+QXTOUCH=1", 12) || line_starts(cmd, "AT+QXTOUCH_BACK=1", 17))
        return touch_selfcheck(cmd, tp, screenless);
    if (line_is(cmd, "AT+QXTOUCH=2")) return touch_key_bus_test();
    if (line_is(cmd, "AT+QXTOUCH=3") || line_is(cmd, "AT+QXTOUCH_BACK=3")) return touch_verdict(tp.cali_result, 50);
    if (line_starts(cmd, "AT+QXTOUCH=3,", 13) || line_starts(cmd, "AT+QXTOUCH_BACK=3,", 18)) {
        const char *count = first_argument(cmd);
        return count == nullptr ? RC_ERROR : touch_sensor_test(count, tp.cali_item);
    }
    if (line_is(cmd, "AT+QXTOUCH=WE,0")) return wafer_edge(resp, false);
    if (line_is(cmd, "AT+QXTOUCH=WE,1")) return wafer_edge(resp, true);
    if (line_is(cmd, "AT+QX_TPL_CAL=0")) return cali_support(resp, 0x1);
    if (line_is(cmd, "AT+QX_TPL_CAL_BACK=0")) return cali_support(resp, 0x2);
    return RC_ERROR;  // not logged: the station probes these lines
}

int mmi_backlight_test_handler(char *cmd, int arg, char *resp) {
    if (back_panel_missing(cmd)) return RC_OK;
    for (const MessageForm &f : kBacklightSteps)
        if (line_is(cmd, f.line)) return ask_ok_or(f.message, RC_ERROR);
    for (const MessageForm &f : kBackBacklightSteps)
        if (strcmp(cmd, f.line) == 0) return ask_ok_or(f.message, RC_ERROR);
    if (line_starts(cmd, "AT+QXSCB=2,", 11)) return backlight_percentage(cmd + 11, kMainDisplayId);
    if (strncmp(cmd, "AT+QXSCB_BACK=2,", 16) == 0) return backlight_percentage(cmd + 16, kBackDisplayId);
    return invalid_command(cmd);
}

int mmi_wakeup_test_handler(char *cmd, int arg, char *resp) {
    if (back_panel_missing(cmd)) return RC_OK;
    for (const WakeForm &f : kWakeForms)
        if (form_is(cmd, f.line, f.display == kBackDisplayId)) return wake_up(resp, f);
    return invalid_command(cmd);
}

int get_lcm_color_handler(char *cmd, int arg, char *resp) {
    if (line_starts(cmd, "AT+QX_LCM_COLOR=0", 17)) return panel_colour(resp);
    if (strcmp(cmd, "AT+SECSCREEN=0") == 0) return set_second_screen(true);
    if (strcmp(cmd, "AT+SECSCREEN=1") == 0) return set_second_screen(false);
    if (strcmp(cmd, "AT+SECSCREEN=2") == 0) return second_screen_state(resp);
    LOGE("invalid command: %s", cmd);
    body_printf(resp, "invalid command: %s", cmd);
    return RC_ERROR;
}
