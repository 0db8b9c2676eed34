// Key tests: the physical keys (captured by the daemon's own input thread), the capacitive
// virtual keys under the touch panel, and the pressure-sensing side keys. The side-key
// controller is asked directly through its character device; its calibration and tests
// run in the test app. Every side-key form is compared with regard to case.
#include <fcntl.h>
#include <unistd.h>

#include <array>
#include <chrono>
#include <cstdio>
#include <cstring>
#include <string>
#include <thread>

#include "core/command_tables/handlers.h"
#include "core/input_events.h"
#include "core/port_state.h"
#include "handlers/common.h"
#include "platform/device.h"
#include "platform/factory.h"
#include "platform/log.h"

namespace {

constexpr const char *kLcmComponent = "com.pyxa.engineermode/.ATLcmTest";
constexpr const char *kLcmAction = "android.factorytest.ATLCM";
constexpr const char *kButtonBacklight = "/sys/class/leds/button-backlight/brightness";
constexpr const char *kVirtualKeyTest = "/sys/touchscreen/virtual_key/key_capacitance_test";
constexpr const char *kForceCaliApp = "/system/app/ForceCaliTest/ForceCaliTest.apk";
constexpr const char *kSideKeyDevice = "dev/ndt";  // relative, as the driver names it
constexpr int kKeyTextMax = 199;
constexpr size_t kStartMessageMax = 120;

// ---- the side-key controller

constexpr unsigned char kNdtWake = 0x0A;
constexpr unsigned char kNdtVersionReg = 0x10;

// Reads a register: the buffer carries the register number in its first byte and gets the
// data after it; the count the controller returned.
ssize_t ndt_read(int fd, unsigned char *buf, size_t len) { return dev::read(fd, buf, len); }

}  // namespace

// The controller's firmware version as a non-negative number, or -1.
int get_sidekey_version() {
    int fd = dev::open(kSideKeyDevice, O_RDWR);
    if (fd < 0) {
        LOGE("open %s failed: %s", kSideKeyDevice, strerror(errno));
        return -1;
    }
    ssize_t n = 0;
    for (int tries = 0; tries < 50 && (n = dev::write(fd, &kNdtWake, 1)) <= 0; ++tries)
        std::this_thread::sleep_for(std::chrono::microseconds(10));
    std::array<unsigned char, 5> v{kNdtVersionReg};
    n = ndt_read(fd, v.data(), 4);
    if (n != 2) {
        LOGE("read version failed: %d", static_cast<int>(n));
        close(fd);
        return -1;
    }
    int version = (v[1] & 0x0f) << 16 | (v[2] & 0x0f) << 12 | (v[3] & 0x0f) << 8 | v[4];
    for (unsigned char reg : {0x04, 0x4E}) {  // for the log only
        std::array<unsigned char, 3> r{reg};
        if (ndt_read(fd, r.data(), 2) < 0) LOGE("read reg 0x%02x failed", reg);
        else LOGI("reg 0x%02x: %02x %02x", reg, r[1], r[2]);
    }
    close(fd);
    LOGI("sidekey version: %d", version);
    return version;
}

namespace {

// ---- side-key forms

// Sends the message and writes its reply quoted; the reply, or "" for a silent test app.
std::string ask_quoted(const char *message, char *resp, const char *fmt = "\"%s\"") {
    const char *reply = ask_test_app(message);
    std::string text = reply ? reply : "";
    body_printf(resp, fmt, text.c_str());
    return text;
}

// Calibration and test starts: the argument after the first comma is appended to the
// message; "ok" starts it.
int start_rule(const char *cmd, const char *format, char *resp) {
    const char *comma = strchr(cmd, ',');
    if (comma == nullptr || comma[1] == '\0') {
        quote_reason(resp, "Param error");
        return RC_ATNG;
    }
    char message[kStartMessageMax];
    snprintf(message, sizeof message, format, comma + 1);
    const char *reply = ask_test_app(message);
    if (reply != nullptr && strcmp(reply, "ok") == 0) return RC_ATOK;
    quote_reason(resp, reply);
    return RC_ATNG;
}

int check_rule(const char *message, char *resp) {
    std::string r = ask_quoted(message, resp);
    return !r.empty() && (r[0] == '0' || r[0] == '1' || r[0] == '2') ? RC_ATOK : RC_ATNG;
}

int read_rule(const char *message, char *resp) {
    std::string r = ask_quoted(message, resp);
    return !r.empty() && (r[0] == '0' || r[0] == '1') ? RC_ATOK : RC_ATNG;
}

constexpr std::array<const char *, 8> kTempProjects = {"RX6103", "RX6104", "RX6103F_EX", "RX6104F_EX",
                                                       "RX6105", "RX6105F_EX", "RX6106", "RX6106F_EX"};

// The right key's calibration needs the battery temperature in the pressure driver first.
int calibrate_right(const char *cmd, char *resp) {
    const char *comma = strchr(cmd, ',');
    bool temp_step = false;
    for (const char *p : kTempProjects) temp_step = temp_step || is_project(p);
    if (temp_step && comma != nullptr && comma[1] != '\0') {
        char temp[21] = {};
        if (!read_node("/sys/class/power_supply/battery/temp", temp, sizeof temp)) {
            quote_body(resp, "read battery temp failed");
            return RC_ATNG;
        }
        if (write_policy_file(1, "/sys/cs_press/cs_press/temperature", O_WRONLY, temp) < 0) {
            body_printf(resp, "write cs_press temp not exsit !");
            return RC_ATNG;
        }
    }
    return start_rule(cmd, "sidekey:cali_right_start%s", resp);
}

struct PressureKey {
    const char *command;  // echoed into the pressure driver
    const char *failure;
};
constexpr std::array<PressureKey, 3> kPressureKeys{{
    {"echo 82 > /sys/cs_press/cs_press/cmd", "Volume down Key Test Failed"},
    {"echo 81 > /sys/cs_press/cs_press/cmd", "Power Key Test Failed"},
    {"echo 80 > /sys/cs_press/cs_press/cmd", "Volume up Test Failed"},
}};

// AT+QX_KEY_VBR=1: each pressure key must fire the vibrator's trigger.
int pressure_keys_trigger_vibrator(char *resp) {
    for (const char *node : {"/sys/cs_press/cs_press/factory_mode", "/sys/cs_press/cs_press/cmd",
                             "/sys/class/leds/vibrator/at_trigger_state"}) {
        if (!dev::exists(node)) {
            quote_body(resp, "This device does not support !");
            return RC_ATERROR;
        }
    }
    for (const PressureKey &k : kPressureKeys) {
        dev::shell("echo 1 > /sys/class/leds/vibrator/at_trigger_state");
        dev::shell("echo 1 > /sys/cs_press/cs_press/factory_mode");
        dev::shell(k.command);
        dev::shell("echo 0 > /sys/cs_press/cs_press/factory_mode");
        std::this_thread::sleep_for(std::chrono::milliseconds(100));
        char out[64] = {};
        ext_system("cat /sys/class/leds/vibrator/at_trigger_state", out, sizeof out);
        if (out[0] != '1') {
            quote_body(resp, k.failure);
            return RC_ATNG;
        }
    }
    quote_body(resp, "Volume up Key,Volume Down key,Power Key check OK !");
    return RC_ATOK;
}

struct SideKeyAsk {
    const char *line;
    const char *message;
    int (*rule)(const char *, char *);
};
constexpr std::array<SideKeyAsk, 8> kSideKeyAsks{{
    {"AT+QX_KEY_QUEY=0", "sidekey:cali_left_check", check_rule},
    {"AT+QX_KEY_QUEY=1", "sidekey:cali_right_check", check_rule},
    {"AT+QX_KEY_QUEY=2", "sidekey:test_left_check", check_rule},
    {"AT+QX_KEY_QUEY=3", "sidekey:test_right_check", check_rule},
    {"AT+QX_KEY_READ=0", "sidekey:cali_left_read", read_rule},
    {"AT+QX_KEY_READ=1", "sidekey:cali_right_read", read_rule},
    {"AT+QX_KEY_READ=2", "sidekey:test_left_read", read_rule},
    {"AT+QX_KEY_READ=3", "sidekey:test_right_read", read_rule},
}};

bool is(const char *cmd, const char *form) { return strcmp(cmd, form) == 0; }
bool starts(const char *cmd, const char *form) { return strncmp(cmd, form, strlen(form)) == 0; }

int side_key_self_check(char *resp) {
    create_input_threads();  // the check presses the keys: they are captured meanwhile
    std::string r = ask_quoted("sidekey:check_self", resp);
    exit_input_threads();
    return !r.empty() && r[0] == '0' ? RC_ATNG : RC_ATOK;
}

int side_key_version(char *resp) {
    int version = get_sidekey_version();
    body_printf(resp, "\"%d\"", version);
    return version < 0 ? RC_ATNG : RC_ATOK;
}

int write_raw_data(char *resp) {
    if (!dev::exists(kForceCaliApp)) return RC_ATERROR;
    std::string r = ask_quoted("sidekey:write_raw_data", resp, "\"support:%s\"");
    return !r.empty() && r[0] == '0' ? RC_ATOK : RC_ATNG;
}

int lcm_activity(const char *extras) { return startActivityFromFtcmd(kLcmComponent, kLcmAction, extras); }

// The second line of the virtual keys' capacitance test as fgets gives it, line feed kept.
int virtual_key_capacitance(char *resp) {
    FILE *f = dev::fopen(kVirtualKeyTest, "r");
    if (f == nullptr) return RC_ERROR;
    char line[256] = {};
    bool second = fgets(line, sizeof line, f) != nullptr && fgets(line, sizeof line, f) != nullptr;
    fclose(f);
    if (second) quote_body(resp, line);
    return RC_OK;
}

}  // namespace

int key_test_handler(char *cmd, int arg, char *resp) {
    if (line_is(cmd, "AT+QXKEY=1")) {
        create_input_threads();
        return test_app_ok("key_test 1") ? RC_OK : RC_ERROR;
    }
    if (line_is(cmd, "AT+QXKEY=0")) {
        char keys[kKeyTextMax + 1] = {};
        get_input_key(keys, kKeyTextMax);
        if (keys[0] != '\0') {
            quote_body(resp, keys);
            return RC_OK;
        }
        const char *reply = ask_test_app("key_test 0");
        if (reply == nullptr || reply[0] == '\0') return RC_ERROR;
        quote_body(resp, reply);
        return RC_OK;
    }
    return invalid_command(cmd);
}

int virtual_key_handler(char *cmd, int arg, char *resp) {
    if (line_is(cmd, "AT+QXVIRKEY=1")) return virtual_key_capacitance(resp);
    if (line_is(cmd, "AT+QXVIRKEY=2") || line_is(cmd, "AT+QXVIRKEY=0")) {
        bool on = cmd[12] == '2';
        if (write_int(kButtonBacklight, on ? 255 : 0) != 0) return RC_ERROR;
        if (!is_sp) lcm_activity(on ? "-e lcm_color 0" : nullptr);
        return RC_OK;
    }
    return invalid_command(cmd);
}

int sidekey_handler(char *cmd, int arg, char *resp) {
    if (starts(cmd, "AT+QX_KEY_CAL=0")) return start_rule(cmd, "sidekey:cali_left_start%s", resp);
    if (starts(cmd, "AT+QX_KEY_CAL=1")) return calibrate_right(cmd, resp);
    if (starts(cmd, "AT+QX_KEY_TEST=0")) return start_rule(cmd, "sidekey:test_left_start%s", resp);
    if (starts(cmd, "AT+QX_KEY_TEST=1")) return start_rule(cmd, "sidekey:test_right_start%s", resp);
    if (is(cmd, "AT+QX_KEY_CAL=2") || is(cmd, "AT+QX_KEY_TEST=2")) {
        const char *reply = ask_test_app("sidekey:stop_app");
        if (reply != nullptr && strcmp(reply, "ok") == 0) return RC_ATOK;
        quote_reason(resp, reply);
        return RC_ATNG;
    }
    for (const SideKeyAsk &a : kSideKeyAsks)
        if (is(cmd, a.line)) return a.rule(a.message, resp);
    if (is(cmd, "AT+QX_KEY_CHK=0")) return side_key_version(resp);
    if (is(cmd, "AT+QX_KEY_CHK=1")) return side_key_self_check(resp);
    if (is(cmd, "AT+QX_KEY_CHK=2")) return ask_quoted("sidekey:check_self_backgroud", resp) == "ok" ? RC_ATOK : RC_ATNG;
    if (is(cmd, "AT+QX_KEY_CHK=3")) {
        std::string r = ask_quoted("sidekey:check_self_result", resp);
        return !r.empty() && r[0] == '0' ? RC_ATNG : RC_ATOK;
    }
    if (is(cmd, "AT+QX_KEY_CHK=4")) {
        if (!dev::exists(kForceCaliApp)) return RC_ATERROR;
        quote_reason(resp, "0");
        return RC_ATOK;
    }
    if (is(cmd, "AT+QXPKEY_CALI=1")) return write_raw_data(resp);
    if (is(cmd, "AT+QX_KEY_VBR=1")) return pressure_keys_trigger_vibrator(resp);
    return RC_ATERROR;  // not logged
}
