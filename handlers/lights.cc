// Vibrator and indicator lights: the vibrator pulse and instant vibration, the touch-key
// backlight, the panels' full-brightness test, the notification LEDs and their blink,
// the LED ring's effects, haptic feedback and the first-boot setup language.
#include "handlers/lights.h"

#include <fcntl.h>
#include <pthread.h>
#include <unistd.h>

#include <strings.h>

#include <array>
#include <atomic>
#include <chrono>
#include <climits>
#include <cmath>
#include <cstdlib>
#include <cstring>
#include <string>
#include <thread>
#include <vector>

#include "core/command_tables/handlers.h"
#include "core/nv.h"
#include "core/port_state.h"
#include "core/result.h"
#include "core/workers.h"
#include "handlers/common.h"
#include "handlers/display.h"
#include "platform/android.h"
#include "platform/device.h"
#include "platform/factory.h"
#include "platform/log.h"

int g_vibrator_run = 0;
int g_lights_run = 0;
int g_panel_test = 0;
int g_ring_mode = 0;

namespace {

constexpr char kVibDuration[] = "/sys/class/leds/vibrator/duration";
constexpr char kVibActivate[] = "/sys/class/leds/vibrator/activate";
constexpr char kButtonLight[] = "/sys/class/leds/button-backlight/brightness";
constexpr char kPanel0Max[] = "/sys/class/backlight/panel0-backlight/max_brightness";
constexpr char kPanel0[] = "/sys/class/backlight/panel0-backlight/brightness";
constexpr char kPanel1Max[] = "/sys/class/backlight/panel1-backlight/max_brightness";
constexpr char kPanel1[] = "/sys/class/backlight/panel1-backlight/brightness";
constexpr char kLcmTest[] = "com.pyxa.engineermode/.ATLcmTest";
constexpr char kLcmAction[] = "android.factorytest.ATLCM";
constexpr char kRed[] = "sys/class/leds/red/brightness";
constexpr char kBlue[] = "sys/class/leds/blue/brightness";
constexpr char kRingEffect[] = "/sys/class/leds/aw22xxx_led/effect";
constexpr char kRingCfg[] = "/sys/class/leds/aw22xxx_led/cfg";
constexpr char kTestInfo[] = "/cache/recovery/last_test_info";
constexpr char kAirplaneFailed[] = "\r\nexit airplane mode failed\r\n";
WorkerGeneration g_instant_generation;
WorkerGeneration g_lights_generation;

struct InstantTimes {
    int on, interval;
    void *generation;
};

// Boards whose green LED is driven through its engineering node.
bool green_engineering() {
    for (const char *code : {"RX3310", "RX3311", "WQ2207", "WQ2207_EX"})
        if (is_project(code)) return true;
    return false;
}
const char *green_node(const char *plain) { return green_engineering() ? "sys/class/leds/green/engineering" : plain; }

// Lets a panel go to its full brightness, whatever its max_brightness node says.
void panel_to_max(const char *max_node, const char *node) { write_int(node, get_max_brightness(max_node)); }

// Calls another family's handler with one of its own lines; its body is not ours.
int call_handler(int (*handler)(char *, int, char *), const char *line) {
    char cmd[kLineSize] = {0};
    char scratch[kRespSize] = {0};
    strncpy(cmd, line, sizeof cmd - 1);
    return handler(cmd, 36, scratch);  // the argument every table row carries
}

// AT+EDFT=0,5,level: the level is checked, but the panel always goes to its maximum.
int panel_level(const char *cmd) {
    std::string_view level = without_line_end(cmd + strlen("AT+EDFT=0,5,"));
    if (level.empty()) return invalid_command(cmd);
    minui_gr_fb_blank(1);
    int max = get_max_brightness(kPanel0Max);
    long long value = 0;
    // A level that is no number at all is refused like one out of range.
    if (!leading_number(std::string(level).c_str(), INT_MIN, INT_MAX, &value) || value < 0 || value > max) {
        LOGE("%d is not in 0~%d", static_cast<int>(value), max);
        return RC_ERROR;
    }
    write_int(kPanel0, max);
    return RC_OK;
}

int back_panel_on(char *resp) {
    if (is_sp) {
        nv::Update u = nv::update([](nv::Record &rec) {
            if (rec.i32(nv::kAssemblyAtMode) == 1) {
                LOGI("reset assembly_at_mode");
                rec.set_i32(nv::kAssemblyAtMode, 0);
            }
        });
        if (u == nv::Update::WriteFailed) return RC_ATERROR;
        minui_gr_fb_blank_second(1);
    } else {
        if (call_handler(keep_screen_on_handler, "AT+QXSP_BACK=0") != RC_OK) {
            body_printf(resp, "%s", kAirplaneFailed);
            return RC_ATNG;
        }
        startActivityFromFtcmd(kLcmTest, kLcmAction, "-e lcm_color W --ei display_id 4096");
    }
    panel_to_max(kPanel1Max, kPanel1);
    if (!is_sp) return RC_ATOK;
    LOGI("AT mode auto start system adc sample test!!!");
    return call_handler(system_adc_sample_handler, "AT+QX_SYS_ADC=1,1") == RC_ATOK ? RC_ATOK : RC_ATNG;
}

int back_panel_off(char *resp) {
    if (!is_sp) {
        if (call_handler(keep_screen_on_handler, "AT+QXSP_BACK=1") != RC_OK) {
            body_printf(resp, "%s", kAirplaneFailed);
            return RC_ATNG;
        }
        startActivityFromFtcmd(kLcmTest, kLcmAction, nullptr);
    } else {
        minui_gr_fb_blank_second(0);
    }
    write_int(kPanel1, 0);
    return RC_ATOK;
}

// The two numbers after "AT+QX_VBR_STH_TS=1,"; false when either is missing or is no
// millisecond count (negative, not a number, beyond int).
bool vibrate_times(const char *cmd, int times[2]) {
    auto fields = comma_fields(cmd);
    if (fields.size() < 3) return false;
    for (int i = 0; i < 2; ++i) {
        long long v = 0;
        if (!leading_number(std::string(fields[1 + i]).c_str(), 0, INT_MAX, &v)) return false;
        times[i] = static_cast<int>(v);
    }
    return true;
}

}  // namespace

void *update_vibrator_thread(void *) {
    LOGI("Start");
    do {
        write_int(kVibDuration, 10000);
        write_int(kVibActivate, 1);
        sleep(10100000);
    } while (g_vibrator_run);
    LOGI("Exit");
    pthread_detach(pthread_self());
    return nullptr;
}

void *instant_vibrate_thread(void *arg) {
    const InstantTimes times = *static_cast<InstantTimes *>(arg);
    delete static_cast<InstantTimes *>(arg);
    const auto current = [&] { return g_instant_generation.current(times.generation); };
    LOGI("Start on %d interval %d", times.on, times.interval);
    g_vibrator_run = 1;
    long long total = 0;
    while (g_vibrator_run && current()) {
        write_int(kVibDuration, times.on);
        write_int(kVibActivate, 1);
        // Milliseconds, not usleep: an interval above 4294 s would wrap usleep's argument.
        std::this_thread::sleep_for(std::chrono::milliseconds(times.interval));
        total += static_cast<long long>(times.on) + times.interval;
        if (total > 19999) break;
    }
    if (!current()) {
        LOGI("Exit, replaced");
        pthread_detach(pthread_self());
        return nullptr;
    }
    g_vibrator_run = 0;
    write_int(kVibActivate, 0);
    LOGI("Exit");
    pthread_detach(pthread_self());
    return nullptr;
}

void *update_indicate_lights_thread(void *arg) {
    const auto current = [&] { return g_lights_generation.current(arg); };
    LOGI("Start");
    const char *red = "/sys/class/leds/red/brightness";
    const char *green = green_node("/sys/class/leds/green/brightness");
    for (unsigned pass = 0; g_lights_run && current(); ++pass) {
        write_int(red, 0);
        write_int(green, 0);
        write_int(pass % 2 == 0 ? red : green, 255);
        usleep(500 * 1000);
    }
    if (current()) {
        write_int(red, 0);
        write_int(green, 0);
    }
    LOGI("Exit");
    pthread_detach(pthread_self());
    return nullptr;
}

int vibrator_button_light_test_handler(char *cmd, int, char *resp) {
    if (is_back_command(cmd) && !back_panel_supported()) return RC_OK;
    if (line_is(cmd, "AT+EDFT=6,1")) {
        if (g_vibrator_run) return RC_OK;
        g_vibrator_run = 1;
        // Not a counted worker: after its pulse it sleeps for months, and nothing may wait
        // for it to end.
        pthread_t tid;
        if (pthread_create(&tid, nullptr, update_vibrator_thread, nullptr) != 0) {
            LOGE("vibrator thread not started");
            g_vibrator_run = 0;
            return RC_ERROR;
        }
        return RC_OK;
    }
    if (line_is(cmd, "AT+EDFT=6,0")) {
        g_vibrator_run = 0;
        write_int(kVibActivate, 0);
        return RC_OK;
    }
    if (line_is(cmd, "AT+EDFT=5,1")) return write_int(kButtonLight, 255) == 0 ? RC_OK : RC_ERROR;
    if (line_is(cmd, "AT+EDFT=5,0")) return write_int(kButtonLight, 0) == 0 ? RC_OK : RC_ERROR;
    if (line_is(cmd, "AT+EDFT=0,5")) {
        if (is_sp) {
            g_panel_test = 1;
            minui_gr_fb_blank(1);
        } else {
            startActivityFromFtcmd(kLcmTest, kLcmAction, "-e lcm_color W");
        }
        panel_to_max(kPanel0Max, kPanel0);
        return RC_OK;
    }
    if (line_starts(cmd, "AT+EDFT=0,5,", 12)) return panel_level(cmd);
    if (line_is(cmd, "AT+EDFT=0,0")) {
        g_panel_test = 0;
        if (is_sp == 1) minui_gr_fb_blank(0);
        write_int(kPanel0, 0);
        return RC_OK;
    }
    if (line_is(cmd, "AT+EDFT=0,1")) {
        write_int(kPanel0, 0);
        if (!is_sp) startActivityFromFtcmd(kLcmTest, kLcmAction, nullptr);
        return RC_OK;
    }
    if (line_is(cmd, "AT+EDFT_BACK=0,5")) return back_panel_on(resp);
    if (line_is(cmd, "AT+EDFT_BACK=0,0")) return back_panel_off(resp);
    return invalid_command(cmd);
}

int vibrator_instant_handler(char *cmd, int, char *resp) {
    if (line_is(cmd, "AT+QX_VBR_STH_TS=0")) {
        g_vibrator_run = 0;
        return RC_ATOK;
    }
    if (!line_starts(cmd, "AT+QX_VBR_STH_TS=1", 18)) {
        LOGE("invalid command: %s", cmd);
        return RC_ATERROR;
    }
    if (g_vibrator_run) {
        body_printf(resp, "not stop");
        return RC_ATNG;
    }
    int times[2] = {0, 0};
    if (!vibrate_times(cmd, times)) {
        body_printf(resp, "parameter invalid");
        return RC_ATNG;
    }
    if (times[0] >= times[1]) {
        body_printf(resp, "time invalid");
        return RC_ATNG;
    }
    auto *arg = new (std::nothrow) InstantTimes{times[0], times[1], g_instant_generation.next()};
    if (arg == nullptr) return RC_ATNG;
    // Raised here as well as in the worker, so a second start right after this one is
    // refused even before the worker has run.
    g_vibrator_run = 1;
    if (start_worker(instant_vibrate_thread, arg) != 0) {
        delete arg;
        g_vibrator_run = 0;
        return RC_ATNG;
    }
    return RC_ATOK;
}

int breathlight_handler(char *cmd, int, char *resp) {
    const char *green = green_node("sys/class/leds/green/brightness");
    int rc = 0;
    if (line_is(cmd, "AT+MMILED=1,0")) {
        write_int(kRed, 0);
        rc = write_int(green, 0);
    } else if (line_is(cmd, "AT+MMILED=1,1")) {
        write_int(green, 0);
        rc = write_int(kRed, 255);
    } else if (line_is(cmd, "AT+MMILED=1,2")) {
        write_int(kRed, 0);
        rc = write_int(green, 255);
    } else if (line_is(cmd, "AT+MMILED=1,3")) {
        rc = write_int(kBlue, 255);
    } else if (line_is(cmd, "AT+MMILED=2")) {
        int count = 0;
        for (const char *node : {kRed, green, kBlue}) count += dev::exists(node) ? 1 : 0;
        body_printf(resp, "\r\n+TYPE:\"%d\"\r\n", count);
        return RC_OK;
    } else {
        return invalid_command(cmd);
    }
    return rc == 0 ? RC_OK : RC_ERROR;
}

int indicatelights_test_handler(char *cmd, int, char *) {
    if (line_is(cmd, "AT+QXLIGHT=1")) {
        if (g_lights_run) return RC_OK;
        g_lights_run = 1;
        if (start_worker(update_indicate_lights_thread, g_lights_generation.next()) != 0) {
            g_lights_run = 0;
            return RC_ERROR;
        }
        return RC_OK;
    }
    if (line_is(cmd, "AT+QXLIGHT=0")) {
        g_lights_run = 0;
        return RC_OK;
    }
    return invalid_command(cmd);
}

int set_breath_light_handler(char *cmd, int, char *resp) {
    if (!line_starts(cmd, "AT+QX_BREATH_LGT=1", 18)) return RC_ATERROR;
    const char *comma = strchr(cmd, ',');
    if (comma == nullptr || comma[1] == '\0') return RC_ATERROR;
    const char *effect = nullptr;
    switch (comma[1]) {
        case '0': effect = "0"; break;
        case 'B': effect = "32"; break;
        case 'G': effect = "31"; break;
        case 'H': effect = "2f"; break;
        case 'R': effect = "30"; break;
        default:
            body_printf(resp, "\r\n\"param 2 error\"\r\n");
            return RC_ATERROR;
    }
    if (write_policy_file(0, kRingEffect, O_RDWR, effect) < 0) return RC_ATNG;
    // A driver that takes the effect but not its start has not shown it: that fails too.
    if (write_policy_file(0, kRingCfg, O_RDWR, "1") < 0) return RC_ATNG;
    return RC_ATOK;
}

int haptic_feedback_handler(char *cmd, int, char *resp) {
    if (line_is(cmd, "AT+QXCGFK=1")) return test_app_ok("feedback 1") ? RC_OK : RC_ERROR;
    if (line_is(cmd, "AT+QXCGFK=0")) return test_app_ok("feedback 0") ? RC_OK : RC_ERROR;
    if (line_is(cmd, "AT+QXCGFK=2")) {
        const char *reply = ask_test_app("feedback 2");
        if (reply == nullptr) return RC_ERROR;
        if (strcmp(reply, "ok 1") == 0) return quote_body(resp, "1"), RC_OK;
        if (strcmp(reply, "ok 0") == 0) return quote_body(resp, "0"), RC_OK;
        return RC_ERROR;
    }
    const bool chinese = line_is(cmd, "AT+QX_BOOT_SET=1,chinese");
    if (!chinese && !line_is(cmd, "AT+QX_BOOT_SET=1,english")) return invalid_command(cmd);
    set_property_file_item_value(kTestInfo, "setupwizard", chinese ? "ZH" : "EN");
    property_set("persist.sys.lockguide.skip", "yes");
    if (is_sp) return RC_ATOK;
    return test_app_ok(chinese ? "setupwizard chinese" : "setupwizard english") ? RC_ATOK : RC_ATNG;
}

namespace {

// ---- The LED ring's trim table

constexpr int kTrimEntries = 50;
// One entry as the driver takes it, "0x%02x", and the table of both drivers.
using TrimEntry = std::array<char, sizeof "0xff">;
using TrimTable = std::array<TrimEntry, kTrimEntries>;
constexpr unsigned char kDefaultTrim[kTrimEntries] = {
    0xff, 0xff, 0xff, 0xff, 0xff, 0xff, 0x0f, 0x00, 0x00, 0xf3, 0x3e, 0x00, 0x49, 0xff, 0x39, 0xe3, 0x36,
    0x26, 0x05, 0x00, 0x0a, 0x88, 0x00, 0x02, 0x05, 0x40, 0xff, 0xff, 0xff, 0xff, 0x0f, 0x00, 0x00, 0xf3,
    0x3e, 0x00, 0x49, 0xff, 0x36, 0x7b, 0x32, 0x3a, 0x08, 0x00, 0x07, 0x49, 0x02, 0x01, 0x04, 0x2d};
constexpr const char *kTrimData[2] = {"/sys/class/leds/aw22xxx_led_a/trim_data",
                                      "/sys/class/leds/aw22xxx_led_b/trim_data"};
constexpr const char *kTrim[2] = {"/sys/class/leds/aw22xxx_led_a/trim", "/sys/class/leds/aw22xxx_led_b/trim"};
// The trim node reads back a 27-character title, then the registers: 0 and 1 at 27,
// 2 to 25 at 37, 26 to 49 at 157.
constexpr size_t kTrimFirst = 27, kTrimSecond = 37, kTrimUpper = 157;

// The default table, or the calibration base: the default with entries 0 and 1 at 0x18, 0x06.
TrimTable trim_table(bool calibration_base) {
    TrimTable t;
    for (int i = 0; i < kTrimEntries; ++i) {
        unsigned value = kDefaultTrim[i];
        if (calibration_base && i < 2) value = i == 0 ? 0x18 : 0x06;
        snprintf(t[i].data(), t[i].size(), "0x%02x", value);
    }
    return t;
}

// Moves one entry by delta, kept within a byte.
void change_color_hex(TrimEntry &text, int delta) {
    long value = strtol(text.data(), nullptr, 16) + delta;
    value = value < 0 ? 0 : value > 255 ? 255 : value;
    snprintf(text.data(), text.size(), "0x%02lx", value);
}

// The given entries, each followed by a comma: what the drivers must read back.
std::string trim_text(const TrimTable &t, const std::vector<int> &indexes) {
    std::string out;
    for (int i : indexes) out.append(t[i].data()).push_back(',');
    return out;
}

std::vector<int> trim_range(int first, int last, std::vector<int> out = {}) {
    for (int i = first; i <= last; ++i) out.push_back(i);
    return out;
}

// Loads the given entries into driver a and then b, index by index, and starts both
// trims. 0 when every write was taken, else the answer with its body written.
int load_trim(const TrimTable &t, const std::vector<int> &indexes, char *resp) {
    for (int i : indexes) {
        for (int d = 0; d < 2; ++d) {
            char line[16];
            snprintf(line, sizeof line, "%x %s\n", i, t[i].data());
            if (dev::write_node(kTrimData[d], line) < 0) {
                body_printf(resp, "\r\n\"write the trim_data %c fail\"\r\n", 'a' + d);
                return RC_ATERROR;
            }
        }
    }
    for (int d = 0; d < 2; ++d) {
        if (dev::write_node(kTrim[d], "1") < 0) {
            body_printf(resp, "\r\n\"write the trim %c fail\"\r\n", 'a' + d);
            return RC_ATERROR;
        }
    }
    return 0;
}

// Both drivers read back: from trim_data (at most 253 bytes, the first 249 characters)
// or, with upper set, from the trim registers (at most 400 bytes, the entries 0 and 1
// and the 24 entries at upper, 130 characters). Line feeds are removed first; the
// comparison ignores case.
int verify_trim(const std::string &want, bool registers, size_t upper, char *resp) {
    const size_t compared = registers ? 130 : 249;
    for (int d = 0; d < 2; ++d) {
        std::string got;
        if (!dev::read_node(registers ? kTrim[d] : kTrimData[d], got, registers ? 400 : 253)) return RC_ATNG;
        std::erase(got, '\n');
        if (registers) {
            auto slice = [&got](size_t at, size_t n) { return at < got.size() ? got.substr(at, n) : std::string(); };
            got = slice(kTrimFirst, 10) + slice(upper, 120);
        }
        if (got.size() < compared || strncasecmp(got.c_str(), want.c_str(), compared) != 0) {
            body_printf(resp, "\r\n\"cali trim_data %c mismatch\"\r\n", 'a' + d);
            return RC_ATNG;
        }
    }
    return RC_ATOK;
}

int load_and_verify(const TrimTable &t, const std::vector<int> &indexes, size_t upper, char *resp) {
    if (int rc = load_trim(t, indexes, resp)) return rc;
    return verify_trim(trim_text(t, indexes), true, upper, resp);
}

// The colour-meter readings after the command: exactly count of them, none zero. A
// reading that is not a number reads as 0, as atof reads it. NaN and infinities are
// refused too: a NaN would reach the integer conversion of a step, which is undefined.
bool ring_readings(const char *cmd, size_t count, std::vector<double> &out) {
    std::vector<std::string_view> fields = comma_fields(cmd);
    if (fields.size() != count + 1) return false;
    out.clear();
    for (size_t i = 1; i < fields.size(); ++i) {
        const double v = atof(std::string(fields[i]).c_str());
        if (v == 0 || !std::isfinite(v)) return false;
        out.push_back(v);
    }
    return true;
}

int invalid_parameter(char *resp) {
    quote_reason(resp, "invalid parameter");
    return RC_ATERROR;
}

int restore_default_trim(char *resp) {
    property_set("sys.ring_light.cali.para", "1");
    g_ring_mode = -2;
    const TrimTable t = trim_table(false);
    const std::vector<int> all = trim_range(0, kTrimEntries - 1);
    if (int rc = load_trim(t, all, resp)) return rc;
    return verify_trim(trim_text(t, all), false, 0, resp);
}

// White balance from six readings: entry 14 follows the difference of readings 4 and 1,
// entry 15 that of readings 2 and 5. The divisors are single-precision constants, so the
// steps are truncated exactly as the station's calibration tables expect.
int white_balance_step(const char *cmd, char *resp) {
    std::vector<double> m;
    if (!ring_readings(cmd, 6, m)) return invalid_parameter(resp);
    TrimTable t = trim_table(true);
    const double d1 = std::fabs(m[3] - m[0]);
    const int step = d1 >= 0.03 ? 15 : static_cast<int>(d1 / 0.002f);
    change_color_hex(t[14], m[0] < m[3] ? step : -step);
    const double d2 = std::fabs(m[1] - m[4]);
    if (m[1] > m[4]) {
        // A large difference raises the entry although a small one lowers it: the
        // calibration line depends on this asymmetry.
        if (d2 > 0.006 && d2 < 0.024) change_color_hex(t[15], -static_cast<int>(d2 / 0.0003f));
        else if (d2 >= 0.024) change_color_hex(t[15], 80);
    } else if (d2 < 0.024) {
        change_color_hex(t[15], static_cast<int>(d2 / 0.0003f));
    }
    return load_and_verify(t, trim_range(0, 25), kTrimSecond, resp);
}

// One colour adjustment of AT+QX_RING_LGT=8: two readings, and the entry and threshold in
// ring mode 3 and in ring mode 7.
struct ColourAdjust {
    int first, second;
    int entry3;
    double limit3;
    int entry7;
    double limit7;
};
constexpr ColourAdjust kColourAdjust[] = {
    {18, 21, 39, 0.5984, 15, 0.6},    {19, 22, 40, 0.7404, 16, 0.6146}, {0, 3, 42, 1.2964, 18, 1.3202},
    {1, 4, 43, 0.6538, 19, 0.6528},   {6, 9, 45, 0.5038, 21, 0.5052},   {7, 10, 46, 1.2496, 22, 1.2936},
    {12, 15, 48, 0.3046, 24, 0.3022}, {13, 16, 49, 0.1554, 25, 0.1518},
};

// Colour from 36 readings, for the half of the ring that mode 3 or 7 lit: one step up or
// down per reading pair; only that half's entries (and entries 0 and 1) are written.
int colour_step(const char *cmd, char *resp) {
    const int mode = g_ring_mode;  // read once: the table, the writes and the read-back agree
    if (mode == -2) return quote_reason(resp, "brightness not set"), RC_ATERROR;
    if (mode == -1) return quote_reason(resp, "calibration not set"), RC_ATERROR;
    std::vector<double> r;
    if (!ring_readings(cmd, 36, r)) return invalid_parameter(resp);
    TrimTable t = trim_table(true);
    if (mode == 3 || mode == 7) {
        for (const ColourAdjust &a : kColourAdjust) {
            const double sum = r[a.first] + r[a.second];
            const int entry = mode == 3 ? a.entry3 : a.entry7;
            change_color_hex(t[entry], sum > (mode == 3 ? a.limit3 : a.limit7) ? -1 : 1);
        }
    }
    std::vector<int> indexes = trim_range(0, kTrimEntries - 1);
    if (mode == 3) indexes = trim_range(26, kTrimEntries - 1, {0, 1});
    if (mode == 7) indexes = trim_range(0, 25);
    return load_and_verify(t, indexes, mode == 3 ? kTrimUpper : kTrimSecond, resp);
}

// The app-driven ring forms answer ATNG even when the test app took the request; only the
// body "ring_light failed" tells a refusal apart (the station has always read them so).
int ring_light_by_app(const char *message, char *resp) {
    if (!test_app_ok(message)) body_printf(resp, "\r\nring_light failed\r\n");
    return RC_ATNG;
}

}  // namespace

int ring_light_test_handler(char *cmd, int, char *resp) {
    if (line_is(cmd, "AT+QX_RING_IC=0")) {
        if (dev::exists(kRingEffect)) return quote_body(resp, "a:OK"), RC_ATOK;
        const bool a = dev::exists("/sys/class/leds/aw22xxx_led_a/effect");
        const bool b = dev::exists("/sys/class/leds/aw22xxx_led_b/effect");
        if (!a && !b) return RC_ATNG;
        body_printf(resp, "\r\n\"%s,%s\"\r\n", a ? "a:OK" : "a:NG", b ? "b:OK" : "b:NG");
        return RC_ATOK;
    }
    if (line_is(cmd, "AT+QX_RING_LGT=0,0")) return RC_ATOK;
    if (line_is(cmd, "AT+QX_RING_LGT=0,1")) {
        g_ring_mode = -1;
        if (is_sp) return RC_ATOK;
        if (!test_app_ok("battery_mode set 0,display_id:4096")) {
            body_printf(resp, "\r\nexit low bat mode failed\r\n");
        } else if (call_handler(battery_mode_handler, "AT+QX_BAT_MODE=2,0") != RC_ATOK) {
            body_printf(resp, "\r\nexit super power save mode failed\r\n");
        }
        return RC_ATNG;
    }
    for (char form : {'1', '2'}) {
        const std::string head = std::string("AT+QX_RING_LGT=") + form + ",";
        if (!line_starts(cmd, head.c_str(), 16)) continue;
        const char *comma = strchr(cmd, ',');
        if (comma == nullptr || strlen(comma + 1) != 1) return RC_ATERROR;
        char message[64];
        snprintf(message, sizeof message, "ring_light %c %s,display_id:4096", form, comma + 1);
        return ring_light_by_app(message, resp);
    }
    if (line_is(cmd, "AT+QX_RING_LGT=3")) {
        const char *reply = ask_test_app("ring_light 0,display_id:4096");
        const bool ok = reply != nullptr && strcmp(reply, "ok") == 0;
        if (ok) property_set("sys.ring_light.cali.para", "0");
        else body_printf(resp, "\r\nring_light failed\r\n");
        return RC_ATNG;
    }
    if (line_is(cmd, "AT+QX_RING_LGT=6")) {
        g_ring_mode = 7;
        return ring_light_by_app("ring_light 3,display_id:4096", resp);
    }
    if (line_is(cmd, "AT+QX_RING_LGT=7")) {
        g_ring_mode = 3;
        return ring_light_by_app("ring_light 4,display_id:4096", resp);
    }
    if (line_is(cmd, "AT+QX_RING_LGT=5")) return restore_default_trim(resp);
    if (line_starts(cmd, "AT+QX_RING_LGT=4", 16)) return white_balance_step(cmd, resp);
    if (line_starts(cmd, "AT+QX_RING_LGT=8", 16)) return colour_step(cmd, resp);
    return RC_ATERROR;
}
