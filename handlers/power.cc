// Battery and charging: voltage and capacity, charging on and off, the charging and
// high-temperature protections, the fast-charge test that the test app runs, and the
// direct-charging microcontroller behind its debugfs nodes. These handlers log under the
// power team's own tag (EM_LOG_*), which the line's logcat filters look for.
#include <android-base/unique_fd.h>
#include <fcntl.h>
#include <strings.h>
#include <unistd.h>

#include <array>
#include <cctype>
#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <initializer_list>
#include <string>

#include "core/command_tables/handlers.h"
#include "core/port_state.h"
#include "handlers/common.h"
#include "platform/android.h"
#include "platform/charger_control.h"
#include "platform/device.h"
#include "platform/factory.h"
#include "platform/log.h"

namespace {

using android::base::unique_fd;

#define MCU_NODE(name) "/sys/kernel/debug/stm32l011/" name
constexpr char kBurnCtl[] = MCU_NODE("burn_ctl");
constexpr char kChgEnable[] = MCU_NODE("chg_enable");
constexpr char kDchgState[] = MCU_NODE("dchg_state");
constexpr char kInVersion[] = MCU_NODE("in_version");
constexpr char kOutVersion[] = MCU_NODE("out_version");
constexpr char kCoutPin[] = MCU_NODE("ffc_cout_pin_state");
constexpr char kBurnResult[] = MCU_NODE("mcu_fw_inside_burn_result");
// These two have always been opened relative to the daemon's working directory, the root.
constexpr char kPcaReset[] = "sys/kernel/debug/stm32l011/pca9468_rst";
constexpr char kIcVendor[] = "sys/kernel/debug/stm32l011/dchg_ic_vendor";

constexpr char kBatteryStatus[] = "/sys/class/power_supply/battery/status";
constexpr char kBatteryVolt[] = "/sys/class/power_supply/battery/voltage_now";
constexpr char kBatteryCapacity[] = "/sys/class/power_supply/battery/capacity";
constexpr char kVbatDiff[] = "/sys/class/power_supply/battery/chg_est_vbat_diff";
constexpr char kAcCurrent[] = "/sys/class/power_supply/cms/current_ac_avg_now";

constexpr char kTestFinish[] = "persist.sys.fast_charge.test_finish";
constexpr char kFastParams[] = "persist.sys.fast_charge";
constexpr char kFastResult[] = "/cache/recovery/last_ChargeResult_fastCharge";
constexpr char kNormalResult[] = "/cache/recovery/last_ChargeResult_normalCharge";

constexpr char kNotFinished[] = "\r\n\"current test not finish!\"\r\n";
constexpr char kParamError[] = "\r\n\"parameter error\"\r\n";

// A sample is taken every 100 ms; the station waits on the answer for the whole run, so
// a count beyond one minute of sampling is refused rather than block every channel.
constexpr long kMaxAcSamples = 600;
constexpr useconds_t kPollStep = 100 * 1000;

int power_invalid(const char *cmd) {
    EM_LOGE("invalid command: %s", cmd);
    return RC_ERROR;
}

// The charging state the controller reports: 1 on, 0 off, -1 unknown or unreadable.
int charge_state() {
    unique_fd fd(dev::open(kChgEnable, O_RDONLY));
    if (fd < 0) {
        EM_LOGE("open error:%s", strerror(errno));
        return -1;
    }
    char text[41] = {0};
    if (::read(fd, text, 40) < 0) {
        EM_LOGE("read error:%s", strerror(errno));
        return -1;
    }
    if (strchr(text, '1')) return 1;
    return strchr(text, '0') ? 0 : -1;
}

// Opens the control node afresh (truncated) and writes each record with its own write().
bool send_records(std::initializer_list<charger::Record> records) {
    unique_fd fd(dev::open(kBurnCtl, O_WRONLY | O_CREAT | O_TRUNC, 0666));
    if (fd < 0) {
        EM_LOGE("open error:%s", strerror(errno));
        return false;
    }
    for (const charger::Record &r : records) {
        charger::Bytes bytes;
        size_t n = charger::encode(r, bytes);
        ssize_t wrote = ::write(fd, bytes.data(), n);
        EM_LOGI("burn_ctl 0x%02X %d: wrote %zd", bytes[0], r.value, wrote);
    }
    return true;
}

// The ","-field n of the line (0 is the form itself), or nullptr; the line is cut in place.
char *nth_field(char *cmd, int n) {
    char *save = nullptr;
    char *field = strtok_r(cmd, ",", &save);
    for (int i = 0; i < n && field; ++i) field = strtok_r(nullptr, ",", &save);
    return field;
}

void drop_newline(char *text) {
    size_t len = strlen(text);
    if (len > 0 && text[len - 1] == '\n') text[len - 1] = '\0';
}

int charge_test_read_version(char *cmd, char *resp) {
    bool out = false;
    const char *node = nullptr;
    if (strstr(cmd, "3,1")) {
        node = kInVersion;
    } else if (strstr(cmd, "3,0")) {
        node = kOutVersion;
        out = true;
    } else {
        return power_invalid(cmd);
    }
    unique_fd fd(dev::open(node, O_RDONLY));
    if (fd < 0) {
        EM_LOGE("open error:%s", strerror(errno));
        return RC_ERROR;
    }
    char version[65] = {0};
    if (::read(fd, version, 64) <= 0) {
        EM_LOGE("read error:%s", strerror(errno));
        return RC_ERROR;
    }
    drop_newline(version);
    if (out && strcmp(version, "2") == 0) {
        body_printf(resp, "\"MCU out version %s is not suitable\"", version);
        return RC_ERROR;
    }
    quote_reason(resp, version);
    return RC_OK;
}

int charge_test_dchg_state(char *resp) {
    int state = charge_state();
    if (state < 0) return RC_ATNG;
    char text[201] = {0};
    if (readFromFile(kDchgState, text, 200) < 0) {
        EM_LOGE("read %s error:%s", kDchgState, strerror(errno));
        return RC_ATNG;
    }
    body_printf(resp, "\"%d,%s\"", state, text);
    return RC_ATOK;
}

enum class Write { Ok, OpenFailed, Short };

// Opens a node write-only (created, truncated) and writes text whole.
Write write_whole(const char *path, const char *text) {
    unique_fd fd(dev::open(path, O_WRONLY | O_CREAT | O_TRUNC, 0666));
    if (fd < 0) {
        EM_LOGE("open the file fail");
        return Write::OpenFailed;
    }
    ssize_t len = static_cast<ssize_t>(strlen(text));
    if (::write(fd, text, len) != len) {
        EM_LOGE("write the file fail");
        return Write::Short;
    }
    return Write::Ok;
}

int switch_node(const char *cmd, const char *path, const char *on_form, const char *on, const char *off_form,
                const char *off) {
    const char *text = line_is(cmd, on_form) ? on : line_is(cmd, off_form) ? off : nullptr;
    if (text == nullptr) return power_invalid(cmd);
    return write_whole(path, text) == Write::Ok ? RC_OK : RC_ERROR;
}

// A pin or bus state node that reads "1" when good: 7, else 8 (9 when it cannot be opened).
int state_node_is_one(const char *path, char *resp, bool report) {
    char text[10] = {0};
    unique_fd fd(dev::open(path, O_RDONLY));
    if (fd < 0) {
        EM_LOGE("open %s error:%s", path, strerror(errno));
        return RC_ATERROR;
    }
    if (::read(fd, text, 9) < 0) EM_LOGE("read %s error:%s", path, strerror(errno));
    if (text[0] == '1') return RC_ATOK;
    if (report) body_printf(resp, "\"error state : %c \"", text[0]);
    return RC_ATNG;
}

// "persist.sys.fast_charge.test_finish" is "0" while the test app runs a fast-charge test.
bool fast_test_running() {
    char finish[PROPERTY_VALUE_MAX] = {0};
    property_get(kTestFinish, finish, "x");
    return strcmp(finish, "0") == 0;
}

int fast_charge_start(char *cmd, char *resp) {
    if (fast_test_running()) {
        body_printf(resp, "%s", kNotFinished);
        return RC_ATERROR;
    }
    char *save = nullptr;
    strtok_r(cmd, ",", &save);
    const char *p1 = strtok_r(nullptr, ",", &save);
    const char *p2 = p1 ? strtok_r(nullptr, ",", &save) : nullptr;
    if (p1 == nullptr || p2 == nullptr) {
        body_printf(resp, "%s", kParamError);
        return RC_ATERROR;
    }
    property_set(kFastParams, "0,0");
    char message[256];
    snprintf(message, sizeof message, "fast_charge %s %s", p1, p2);
    if (is_sp) {
        body_printf(resp, "\r\n\"not support AT mode\"\r\n");
        return RC_ATERROR;
    }
    property_set(kTestFinish, "0");
    return test_app_ok(message) ? RC_ATOK : RC_ATERROR;
}

// Average of n readings of the adapter current, 100 ms apart, summed in single precision.
int fast_charge_average(char *cmd, char *resp) {
    const char *comma = strchr(cmd, ',');
    const char *count = comma ? comma + 1 : "";
    if (!isDigitValue(count) || count[0] == '0' || strlen(count) > 3 || atol(count) > kMaxAcSamples) {
        body_printf(resp, "%s", kParamError);
        return RC_ATERROR;
    }
    int n = atoi(count);
    dev::shell("/system/bin/sh -c \"echo 1 > /sys/class/power_supply/cms/factory_mode_state\"");
    float sum = 0;
    for (int i = 0; i < n; ++i) {
        char text[21] = {0};
        if (readFromFile(kAcCurrent, text, 20) < 0) {
            EM_LOGE("read %s error:%s", kAcCurrent, strerror(errno));
            return RC_ATERROR;
        }
        sum += static_cast<float>(atof(text));
        usleep(kPollStep);
    }
    body_printf(resp, "\r\n\"%.2f\"\r\n", sum / n);
    return RC_ATOK;
}

// The battery status text; its line end is not part of the status.
void read_status(char (&status)[101]) {
    memset(status, 0, sizeof status);
    if (readFromFile(kBatteryStatus, status, 100) < 0) EM_LOGE("read %s error:%s", kBatteryStatus, strerror(errno));
    status[100] = '\0';
    drop_newline(status);
}

bool is_charging(const char *status) { return strcasecmp(status, "charging") == 0; }

// Pulls VBUS down to fake an unplug, waits for charging to stop, releases it and waits
// for charging to resume: at most 1 s and then 2 s, polled every 100 ms.
int fast_charge_replug(char *resp) {
    char status[101];
    read_status(status);
    dev::shell("chmod 0666 /sys/class/power_supply/usb/usb_con_vbus_pull_down");
    dev::shell("echo 1 >  /sys/class/power_supply/usb/usb_con_vbus_pull_down");
    int polls = 0;
    for (; polls < 10 && is_charging(status); ++polls) {
        usleep(kPollStep);
        read_status(status);
    }
    if (polls >= 9) {
        // The pull-down stays on: the station repeats the check with the cable replugged.
        EM_LOGE("check discharge timeout");
        quote_body(resp, status);
        return RC_ATNG;
    }
    dev::shell("echo 0 >  /sys/class/power_supply/usb/usb_con_vbus_pull_down");
    for (int i = 0; i < 20; ++i) {
        read_status(status);
        if (is_charging(status)) {
            EM_LOGI("success!");
            return RC_ATOK;
        }
        usleep(kPollStep);
    }
    EM_LOGE("check charging timeout");
    quote_body(resp, status);
    return RC_ATNG;
}

// The value of key in a result text: the first line that holds the key, its second
// ":"-piece, cut before any "[". A missing key or value gives "".
std::string result_value(const char *text, const char *key) {
    std::string copy(text);
    char *save = nullptr;
    for (char *line = strtok_r(copy.data(), "\n", &save); line; line = strtok_r(nullptr, "\n", &save)) {
        if (!strstr(line, key)) continue;
        char *piece_save = nullptr;
        strtok_r(line, ":", &piece_save);
        const char *value = strtok_r(nullptr, ":", &piece_save);
        if (value == nullptr) return "";
        std::string v(value);
        return v.substr(0, v.find('['));
    }
    return "";
}

struct ChargeLine {
    const char *type;
    const char *format;
};

// The fast-charge current is reported on the line of the charger type the test app used.
constexpr std::array<ChargeLine, 5> kFastLines{{
    {"9.0V/2.0A", "+CHG2:\"%s\"\r\n"},
    {"5.0V/4.5A", "+CHG3:\"%s\"\r\n"},
    {"10.0V/2.25A", "+CHG4:\"%s\"\r\n"},
    {"11.0V/4.0A", "+CHG5:\"%s\"\r\n"},
    {"11.0V/5.0A", "+CHG5:\"%s\"\r\n"},
}};

void append(char *resp, const char *fmt, const std::string &a, const std::string &b = "") {
    size_t used = strlen(resp);
    snprintf(resp + used, kRespSize - used, fmt, a.c_str(), b.c_str());
}

}  // namespace

namespace {

// A parameter as atoi reads it ("x" is 0), except that a number beyond the record's signed
// 32 bits is refused instead of wrapped: atoi's overflow is undefined.
bool record_value(const char *text, int32_t &out) {
    const char *p = text;
    while (isspace(static_cast<unsigned char>(*p))) ++p;
    const char *digits = (*p == '+' || *p == '-') ? p + 1 : p;
    if (!isdigit(static_cast<unsigned char>(*digits))) {
        out = 0;
        return true;
    }
    long long v = 0;
    if (!leading_number(p, INT32_MIN, INT32_MAX, &v)) return false;
    out = static_cast<int32_t>(v);
    return true;
}

}  // namespace

int check_battery_test_handler(char *cmd, int arg, char *resp) {
    if (line_is(cmd, "AT+QXCHARGE=0")) {
        char status[41] = {0};
        if (readFromFile(kBatteryStatus, status, 40) < 0) return RC_ERROR;
        if (strstr(status, "Full") || strstr(status, "Charging")) return RC_OK;
        EM_LOGE("status is not charging");
        return RC_ERROR;
    }
    if (line_starts(cmd, "AT+QXCHARGE=1", 13)) {
        int state = charge_state();
        if (state != 1) {
            quote_body(resp, state == 0 ? "state:discharge" : "state:exception");
            return RC_ERROR;
        }
        char *save = nullptr;
        char *first = strtok_r(cmd, ",", &save);
        const char *a = strtok_r(nullptr, ",", &save);
        const char *b = a ? strtok_r(nullptr, ",", &save) : nullptr;
        if (a == nullptr || b == nullptr) {
            EM_LOGE("parameter error:%s", first);
            return RC_ERROR;
        }
        int32_t va = 0, vb = 0;
        if (!record_value(a, va) || !record_value(b, vb)) {
            EM_LOGE("parameter error:%s", first);
            return RC_ERROR;
        }
        return send_records({{charger::Op::ParamA, va}, {charger::Op::ParamB, vb}}) ? RC_OK : RC_ERROR;
    }
    if (line_starts(cmd, "AT+QXCHARGE=2", 13)) {
        if (strstr(cmd, "2,1") || strstr(cmd, "2,0"))
            return send_records({{charger::Op::Switch, strstr(cmd, "2,1") ? 1 : 0}}) ? RC_OK : RC_ERROR;
        if (strstr(cmd, "2,2")) return charge_test_dchg_state(resp);
        EM_LOGE("parameter error:%s", cmd);
        return RC_ERROR;
    }
    if (line_starts(cmd, "AT+QXCHARGE=3", 13)) return charge_test_read_version(cmd, resp);
    if (line_starts(cmd, "AT+QXCHARGE=4", 13)) {
        const char *c = nth_field(cmd, 1);
        if (c == nullptr) {
            EM_LOGE("parameter error");
            return RC_ERROR;
        }
        int32_t vc = 0;
        if (!record_value(c, vc)) {
            EM_LOGE("parameter error");
            return RC_ERROR;
        }
        return send_records({{charger::Op::ParamC, vc}}) ? RC_OK : RC_ERROR;
    }
    return power_invalid(cmd);
}

int get_battery_info_handler(char *cmd, int arg, char *resp) {
    if (line_is(cmd, "AT+QXDLJ=1")) {
        char diff[31] = {0};
        if (readFromFile(kVbatDiff, diff, 30) < 0) {
            body_printf(resp, "\r\n\"read chg_est_vbat_diff failed:%d\"\r\n", errno);
            return RC_ERROR;
        }
        if (diff[0] != '0') {
            body_printf(resp, "\r\n\"chg_est_vbat_diff state error:%c\"\r\n", diff[0]);
            return RC_ERROR;
        }
        FILE *volt = dev::fopen(kBatteryVolt, "r");
        if (volt == nullptr) {
            EM_LOGE("fopen %s error:%s", kBatteryVolt, strerror(errno));
            return RC_ERROR;
        }
        int microvolts = 0, capacity = 0;
        if (fscanf(volt, "%d", &microvolts) != 1) EM_LOGW("no reading in %s", kBatteryVolt);
        fclose(volt);
        FILE *cap = dev::fopen(kBatteryCapacity, "r");
        if (cap == nullptr) {
            EM_LOGE("fopen %s error:%s", kBatteryCapacity, strerror(errno));
            return RC_ERROR;
        }
        if (fscanf(cap, "%d", &capacity) != 1) EM_LOGW("no reading in %s", kBatteryCapacity);
        fclose(cap);
        float volts = static_cast<float>(microvolts) / 1000000;
        body_printf(resp, "\"%.2f,%d%s\"\r\n", volts, capacity, "%");
        return RC_OK;
    }
    if (line_is(cmd, "AT+QXDLJ=0")) {
        char ret[41] = {0};
        if (readFromFile("sys/lcm/avdd_i2c_w_ret", ret, 40) < 0) return RC_ERROR;
        body_printf(resp, "%s", ret[0] == '0' ? "\"1\"" : "\"2\"");
        return RC_OK;
    }
    return power_invalid(cmd);
}

int battery_mode_handler(char *cmd, int arg, char *resp) {
    if (line_starts(cmd, "AT+QX_BAT_MODE=1", 16)) {
        // A line without a "," sets nothing in particular: the text stays empty.
        const char *comma = strchr(cmd, ',');
        char message[50];
        snprintf(message, sizeof message, "battery_mode set %s", comma ? comma + 1 : "");
        quote_reason(resp, test_app_ok(message) ? "Pass" : "Fail");
        return RC_OK;
    }
    if (line_is(cmd, "AT+QX_BAT_MODE=0")) {
        // A silent test app has no mode to report: answered as its refusal.
        const char *reply = ask_test_app("battery_mode get");
        if (reply == nullptr || strcmp(reply, "error") == 0) return RC_ERROR;
        quote_reason(resp, reply);
        return RC_OK;
    }
    const bool start = line_is(cmd, "AT+QX_BAT_MODE=2,1");
    if (start || line_is(cmd, "AT+QX_BAT_MODE=2,0")) {
        startServiceFromFtcmd("com.zdr.SuperPowerSave/.SuperPowerSaveService", "intent.action.SUPER_POWER_SAVE_SERVICE",
                              start ? "--es service_action start" : "--es service_action stop");
        return RC_ATOK;
    }
    return power_invalid(cmd);
}

int set_charging_handler(char *cmd, int arg, char *resp) {
    const char *value = line_is(cmd, "AT+QXCHARG=0") ? "0" : line_is(cmd, "AT+QXCHARG=1") ? "1" : nullptr;
    if (value == nullptr) return power_invalid(cmd);
    unique_fd fd(dev::open("sys/bus/platform/devices/pm8921-charger/charge", O_WRONLY | O_CREAT | O_TRUNC, 0666));
    if (fd < 0) {
        EM_LOGE("open charge error:%s", strerror(errno));
        return RC_ERROR;
    }
    ssize_t wrote = ::write(fd, value, 1);
    EM_LOGI("write charge %s: %zd", value, wrote);
    return RC_OK;
}

int remove_charging_protection_handler(char *cmd, int arg, char *resp) {
    if (!line_is(cmd, "AT+RMCHARGEP=0")) return power_invalid(cmd);
    return write_whole("/sys/class/power_supply/cms/present", "0") == Write::Ok ? RC_OK : RC_ERROR;
}

int remove_high_temperatrue_protection_handler(char *cmd, int arg, char *resp) {
    return switch_node(cmd, "/sys/devices/platform/battery/Charging_TemputerSet", "AT+QXQXGWBH=1,1", "1",
                       "AT+QXQXGWBH=1,0", "0");
}

int no_charge_and_power_suplly_handler(char *cmd, int arg, char *resp) {
    return switch_node(cmd, "/sys/kernel/debug/cms/debug", "AT+QXDISRECHARGE=0", "chg-cutoff", "AT+QXDISRECHARGE=1",
                       "chg-open");
}

int charge_reset_handler(char *cmd, int arg, char *resp) {
    if (strcmp(cmd, "AT+QX_PWR_RESET=1") != 0) {
        quote_body(resp, "cmdline error!!");
        return RC_ATERROR;
    }
    if (!dev::exists(kPcaReset)) {
        EM_LOGE("%s not exist", kPcaReset);
        return RC_ATERROR;
    }
    char text[101] = {0};
    if (read_policy_file(0, kPcaReset, text, 100) < 0) {
        body_printf(resp, "%s", strerror(errno));
        return RC_ATNG;
    }
    if (strcmp(text, "1") == 0) return RC_ATOK;
    body_printf(resp, "%s", strcmp(text, "0") == 0 ? "Reset Test Fail" : text);
    return RC_ATNG;
}

int fast_charge_test_handler(char *cmd, int arg, char *resp) {
    if (line_starts(cmd, "AT+QX_PWR_CHG=0", 15)) return fast_charge_start(cmd, resp);
    if (line_is(cmd, "AT+QX_PWR_CHG=1")) {
        if (fast_test_running()) {
            body_printf(resp, "%s", kNotFinished);
            return RC_ATERROR;
        }
        char params[PROPERTY_VALUE_MAX] = {0};
        property_get(kFastParams, params, "0,0");
        quote_body(resp, params);
        return RC_ATOK;
    }
    if (line_starts(cmd, "AT+QX_PWR_CHG=2", 15)) return fast_charge_average(cmd, resp);
    if (line_starts(cmd, "AT+QX_PWR_CHG=3", 15)) return fast_charge_replug(resp);
    EM_LOGE("invalid command: %s", cmd);
    quote_body(resp, "invalid command");
    return RC_ATERROR;
}

int read_new_fast_charge_result_handler(char *cmd, int arg, char *resp) {
    if (!line_is(cmd, "AT+QX_CHG_CHARGE=1")) {
        quote_reason(resp, "AT not support");
        return RC_ATERROR;
    }
    char finish[PROPERTY_VALUE_MAX] = {0};
    property_get(kTestFinish, finish, "0");
    body_printf(resp, "+RESULT:\"%s\"\r\n", finish);
    if (strcmp(finish, "1") != 0) {
        append(resp, "%s", "  test result failed!");
        return RC_ATNG;
    }
    const bool fast = dev::exists(kFastResult);
    char fast_text[1025] = {0};
    if (fast && kaelatcmd_read_system_file(kFastResult, fast_text, 1024) != 0) {
        quote_reason(resp, "save fast charge result failed!");
        return RC_ATNG;
    }
    if (!dev::exists(kNormalResult)) {
        body_printf(resp, "access normal test result failed!");
        return RC_ATNG;
    }
    char normal_text[1025] = {0};
    if (kaelatcmd_read_system_file(kNormalResult, normal_text, 1024) != 0) {
        quote_reason(resp, "save normal charge result failed!");
        return RC_ATNG;
    }
    const char *source = fast ? fast_text : normal_text;
    append(resp, "+VR:\"%s,%s\"\r\n", result_value(source, "battery_volt"), result_value(source, "cableR"));
    append(resp, "+CHG1:\"%s\"\r\n", result_value(normal_text, "charge_current"));
    if (fast) {
        const std::string type = result_value(fast_text, "charge_type");
        for (const ChargeLine &l : kFastLines) {
            if (type != l.type) continue;
            append(resp, l.format, result_value(fast_text, "charge_current"));
            break;
        }
    }
    return RC_ATOK;
}

int check_cout_pin_state_handler(char *cmd, int arg, char *resp) {
    if (line_is(cmd, "AT+QX_PWR_COUT=0")) return state_node_is_one(kCoutPin, resp, true);
    quote_reason(resp, "invalid command");
    return RC_ATERROR;
}

int check_power_fg_handler(char *cmd, int arg, char *resp) {
    if (line_is(cmd, "AT+QX_PWR_FG=0")) return state_node_is_one("/sys/class/power_supply/bq_bms/ex_fg_state", resp, false);
    quote_reason(resp, "invalid command");
    return RC_ATERROR;
}

int check_battery_id_handler(char *cmd, int arg, char *resp) {
    if (!line_is(cmd, "AT+QXDCID=1")) return power_invalid(cmd);
    char text[257] = {0};
    if (readFromFile("/sys/class/power_supply/cms/power_avg", text, 256) < 0) return RC_ERROR;
    return strtoul(text, nullptr, 16) == 0 ? RC_OK : RC_ERROR;
}

int query_charger_update_handler(char *cmd, int arg, char *resp) {
    if (line_starts(cmd, "AT+QX_CHG_UPD=1", 15)) {
        if (!dev::exists(kBurnResult)) {
            quote_reason(resp, "1");
            return RC_ATOK;
        }
        char text[100] = {0};
        if (readFromFile(kBurnResult, text, 99) < 0) {
            body_printf(resp, "\"read %s fail!\"", kBurnResult);
            return RC_ATNG;
        }
        // "0" is looked for first, so a text holding both reads as a finished update.
        if (strchr(text, '0') || strchr(text, '1')) {
            quote_body(resp, strchr(text, '0') ? "0" : "1");
            return RC_ATOK;
        }
        quote_body(resp, text);
        return RC_ATNG;
    }
    if (line_is(cmd, "AT+QX_CHG_IC=1")) {
        unique_fd fd(dev::open(kIcVendor, O_RDONLY));
        if (fd < 0) {
            EM_LOGE("open %s error:%s", kIcVendor, strerror(errno));
            return RC_ERROR;
        }
        char vendor[50] = {0};
        errno = 0;  // an empty node is no error of the system: reported as "Success"
        if (::read(fd, vendor, 49) <= 0) {
            body_printf(resp, "\"read error:%s\"", strerror(errno));
            return RC_ATNG;
        }
        drop_newline(vendor);
        quote_reason(resp, vendor);
        return RC_ATOK;
    }
    return RC_ATERROR;
}
