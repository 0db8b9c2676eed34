// ADC, voltage and temperature sampling: battery voltage, temperature and current streamed
// to the station while a worker runs (AT+EADC), the charger controller's battery reading
// streamed the same way (AT+BATADC), one-shot charge-current readings, a raw PMIC register
// read, and VBUS sampled over a replug. Streamed lines go straight to the current channel
// between answers; the workers stop when their flag is cleared by the stop form.
#include "handlers/adc.h"

#include <fcntl.h>
#include <pthread.h>
#include <unistd.h>

#include <atomic>
#include <new>
#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>

#include "core/command_tables/handlers.h"
#include "core/nv.h"
#include "core/port_state.h"
#include "core/response.h"
#include "core/workers.h"
#include "handlers/common.h"
#include "platform/android.h"
#include "platform/device.h"
#include "platform/factory.h"
#include "platform/log.h"

namespace {

// The flags are read by the workers once per sample while handlers write them; atomics
// keep that well defined without changing when a worker notices a stop.
std::atomic<int> g_eadc_run{0};
std::atomic<int> g_batadc_run{0};
std::atomic<int> g_vbus_run{0};
std::atomic<int> g_workers_alive{0};

constexpr char kBatteryVolt[] = "/sys/class/power_supply/battery/voltage_now";
constexpr char kBatteryTemp[] = "/sys/class/power_supply/battery/temp";
constexpr char kBatteryCharge[] = "/sys/class/power_supply/battery/charge_now";
constexpr char kBatteryCurrent[] = "/sys/class/power_supply/battery/current_now";
constexpr char kKeepChgSoc[] = "/sys/class/power_supply/battery/keep_chg_soc";
constexpr char kAcCurrent[] = "/sys/class/power_supply/cms/current_ac_avg_now";
constexpr char kChargeCurrentResult[] = "/cache/recovery/last_ChargeCurrent";
constexpr char kAdapter[] = "/sys/class/power_supply/battery/supported_adapter";
constexpr char kBatTempMv[] = "/sys/kernel/debug/stm32l011/bat_temp_mv";
constexpr char kRegCount[] = "/d/regmap/spmi0-00/count";
constexpr char kRegAddress[] = "/d/regmap/spmi0-00/address";
constexpr char kRegData[] = "/d/regmap/spmi0-00/data";
constexpr char kUsbOnline[] = "/sys/class/power_supply/usb/online";
constexpr char kUsbVolt[] = "/sys/class/power_supply/usb/voltage_now";
constexpr char kTestInfo[] = "/cache/recovery/last_test_info";
constexpr char kUsbVoltageKey[] = "usb_voltage";

constexpr useconds_t kEadcPeriod = 300 * 1000;
constexpr useconds_t kBatadcPeriod = 200 * 1000;
constexpr int kEadcLineSize = 50;  // longer lines are cut, as the station has always seen them

// The older projects read the charger controller without asking which adapter is fitted.
constexpr const char *kOldProjects[] = {"RX2101", "RX2102", "RX2201", "RX2202", "WQ2101", "WQ2102"};

constexpr long kMaxVbusDelayMs = 10000;
constexpr long kMaxVbusSamples = 100;

struct CoreLimit {
    const char *node;
    int limited, restored;
};

// Sampling runs on one little core so the readings are not disturbed by the big ones.
constexpr CoreLimit kCoreLimits[] = {
    {"/sys/devices/system/cpu/cpu4/core_ctl/min_cpus", 0, 2},
    {"/sys/devices/system/cpu/cpu4/core_ctl/max_cpus", 0, 4},
    {"/sys/devices/system/cpu/cpu0/core_ctl/max_cpus", 1, 4},
    {"/sys/devices/system/cpu/cpu0/core_ctl/min_cpus", 1, 1},
};

// Counted from the start, not from when the thread first runs, so that a stop right after
// a start never sees "no worker" while one is about to run.
int start_sampling(void *(*fn)(void *), void *arg) {
    ++g_workers_alive;
    int rc = start_worker(fn, arg);
    if (rc != 0) --g_workers_alive;
    return rc;
}

struct WorkerLife {
    ~WorkerLife() { --g_workers_alive; }
};

bool factory_mode() {
    char mode[PROPERTY_VALUE_MAX] = {0};
    property_get("persist.sys.factory.mode", mode, "no");
    return strncmp(mode, "yes", 3) == 0;
}

// Holds the charge level while sampling in the factory, and lets it go afterwards.
void keep_charge_level(const char *level) {
    if (!factory_mode() || !dev::exists(kKeepChgSoc)) return;
    if (write_policy_file(0, kKeepChgSoc, O_RDWR, level) < 0) EM_LOGE("write error: %s", strerror(errno));
}

void limit_cores() {
    EM_LOGI("not at mode begin, limit cpu");
    for (const CoreLimit &c : kCoreLimits) write_int(c.node, c.limited);
}

void restore_cores() {
    EM_LOGI("not at mode, restore cpu");
    for (const CoreLimit &c : kCoreLimits) write_int(c.node, c.restored);
}

// A node read as one decimal integer; false when it cannot be opened.
bool read_int(const char *path, int &value) {
    FILE *f = dev::fopen(path, "r");
    if (f == nullptr) return false;
    value = 0;
    if (fscanf(f, "%d", &value) != 1) EM_LOGW("no number in %s", path);
    fclose(f);
    return true;
}

// Below 3.8 V the line has always been shown a voltage just under full, so that a phone
// sampled in AT mode is not failed for a battery shipped half charged.
int reported_voltage(int microvolts) {
    if (is_sp == 1 && microvolts > 3500000 && microvolts < 3800000) {
        int d = 3800000 - microvolts;
        return 3830000 - d % 50000;
    }
    return microvolts;
}

// One sample; false when a node could not be opened, which ends the stream.
bool eadc_sample() {
    int volt = 0, temp = 0, current = 0;
    if (!read_int(kBatteryVolt, volt)) {
        EM_LOGE("fopen the file BATTERY_VOL error:%s", strerror(errno));
        return false;
    }
    if (!read_int(kBatteryTemp, temp)) {
        EM_LOGE("fopen the file BATTERY_TEMP error:%s", strerror(errno));
        return false;
    }
    if (FILE *charge = dev::fopen(kBatteryCharge, "r")) fclose(charge);  // opened, never read
    if (!read_int(kBatteryCurrent, current)) {
        EM_LOGE("fopen the file CHARGE_CUR error:%s", strerror(errno));
        return false;
    }
    float volts = static_cast<float>(reported_voltage(volt)) / 1000000;
    char line[kEadcLineSize];
    snprintf(line, sizeof line, "+EADC: \"%.2f,%.2f,%.2f,%.2f,%.2f\"\r\n", volts, temp / 10.0, 0.584,
             current / 1000.0, 4.5);
    writeDataToSerial(line, static_cast<int>(strlen(line)));
    return true;
}

void *eadc_thread(void *) {
    WorkerLife life;
    EM_LOGI("Start");
    keep_charge_level("100");
    if (!is_sp) limit_cores();
    wait_for_current_answer();
    while (g_eadc_run == 1) {
        if (!eadc_sample()) break;
        usleep(kEadcPeriod);
    }
    keep_charge_level("70");
    g_eadc_run = 0;
    if (!is_sp) restore_cores();
    EM_LOGI("Exit");
    pthread_detach(pthread_self());
    return nullptr;
}

void *batadc_thread(void *) {
    WorkerLife life;
    EM_LOGI("Start");
    wait_for_current_answer();
    while (g_batadc_run == 1) {
        int millivolts = 0;
        // A missing node ends the stream but leaves the flag set: the station must stop it
        // with AT+BATADC=0 before it can start again.
        if (!read_int(kBatTempMv, millivolts)) {
            EM_LOGE("fopen %s error:%s", kBatTempMv, strerror(errno));
            break;
        }
        char line[64];
        snprintf(line, sizeof line, "+BATADC: \"%d\"\r\n", millivolts);
        writeDataToSerial(line, static_cast<int>(strlen(line)));
        usleep(kBatadcPeriod);
    }
    EM_LOGI("Exit");
    pthread_detach(pthread_self());
    return nullptr;
}

// 0, 1 or 2 from the first character of the adapter node; -22 for anything else.
int adapter_type() {
    char text[21] = {0};
    if (readFromFile(kAdapter, text, 20) < 0) return -EINVAL;
    if (text[0] >= '0' && text[0] <= '2') return text[0] - '0';
    return -EINVAL;
}

bool old_project() {
    for (const char *code : kOldProjects)
        if (is_project(code)) return true;
    return false;
}

struct VbusParams {
    int start_delay_ms, interval_ms, count;
};

void store_vbus(const char *text) {
    int rc = set_property_file_item_value(kTestInfo, kUsbVoltageKey, text);
    if (rc != 0) EM_LOGE("save result errno:%d", errno);
}

// Waits up to the start delay for the cable to be pulled; false when stopped meanwhile.
bool wait_vbus_start(int delay_ms) {
    dev::shell("/system/bin/sh -c \"chmod 664 /sys/class/power_supply/usb/online\"");
    char online[16] = {0};
    readFromFile(kUsbOnline, online, sizeof online - 1);
    if (online[0] != '1') {
        usleep(static_cast<useconds_t>(delay_ms) * 1000);
        return true;
    }
    EM_LOGI("wait for usb disconnect");
    for (int remaining = delay_ms; remaining >= 1; remaining -= 1000) {
        memset(online, 0, sizeof online);
        readFromFile(kUsbOnline, online, sizeof online - 1);
        sleep(1);
        if (online[0] == '0') break;
        if (g_vbus_run != 1) return false;
    }
    return true;
}

void *vbus_thread(void *arg) {
    WorkerLife life;
    EM_LOGI("Start");
    VbusParams p = *static_cast<VbusParams *>(arg);
    delete static_cast<VbusParams *>(arg);
    if (wait_vbus_start(p.start_delay_ms)) {
        long long sum = 0;
        int max = 0, min = 9999999, taken = 0;
        for (; taken < p.count; ++taken) {
            int microvolts = 0;
            if (!read_int(kUsbVolt, microvolts)) {
                EM_LOGE("fopen %s error:%s", kUsbVolt, strerror(errno));
                break;
            }
            int millivolts = microvolts / 1000;
            sum += millivolts;
            if (millivolts > max) max = millivolts;
            if (millivolts < min) min = millivolts;
            usleep(static_cast<useconds_t>(p.interval_ms) * 1000);
            if (g_vbus_run != 1) break;
        }
        if (taken == p.count) {
            char result[48];
            snprintf(result, sizeof result, "%d,%d,%d", max, min, static_cast<int>(sum / p.count));
            store_vbus(result);
        }
    }
    g_vbus_run = 0;
    EM_LOGI("Exit");
    pthread_detach(pthread_self());
    return nullptr;
}

// The three ","-fields after the form, each a decimal number within its range; a body and
// a ResultCode otherwise.
int parse_vbus(char *cmd, char *resp, VbusParams &p) {
    char *save = nullptr;
    strtok_r(cmd, ",", &save);
    const char *field[3] = {};
    for (const char *&f : field) {
        f = strtok_r(nullptr, ",", &save);
        if (f == nullptr) {
            quote_reason(resp, "parameter error");
            return RC_ATNG;
        }
    }
    long long value[3];
    for (int i = 0; i < 3; ++i) {
        if (!isDigitValue(field[i])) {
            quote_reason(resp, "digitValue error");
            return RC_ATNG;
        }
        value[i] = strtoll(field[i], nullptr, 10);  // saturates, so an absurd value is out of range
    }
    if (value[0] > kMaxVbusDelayMs || value[1] > kMaxVbusDelayMs || value[2] < 1 || value[2] > kMaxVbusSamples) {
        quote_reason(resp, "range error");
        return RC_ATNG;
    }
    p = {static_cast<int>(value[0]), static_cast<int>(value[1]), static_cast<int>(value[2])};
    return RC_OK;
}

}  // namespace

bool append_ntc_value(char *line, size_t size, const char *raw, const char *label_format) {
    float value = static_cast<float>(atof(raw));
    if (value == -40.0f) {
        EM_LOGI("ignore this NTC");
        return false;
    }
    value /= 1000;
    if (value == -40.0f) {
        EM_LOGI("ignore this NTC");
        return false;
    }
    // A zone's entry is never longer than its label format and three more characters.
    size_t limit = strlen(label_format) + 3;
    char entry[64] = {0};
    snprintf(entry, limit + 1 < sizeof entry ? limit + 1 : sizeof entry, label_format, value);
    size_t used = strnlen(line, size);
    if (used < size) snprintf(line + used, size - used, "%s", entry);
    return true;
}

int sampling_workers_alive() { return g_workers_alive; }

int adc_handler(char *cmd, int arg, char *resp) {
    if (line_is(cmd, "AT+EADC=1")) {
        if (g_eadc_run == 1) {
            EM_LOGI("already start");
            return RC_OK;
        }
        g_eadc_run = 1;
        if (start_sampling(eadc_thread, nullptr) != 0) EM_LOGE("create eadc thread error:%s", strerror(errno));
        return RC_OK;
    }
    if (line_is(cmd, "AT+EADC=0")) {
        g_eadc_run = 0;
        return RC_OK;
    }
    if (line_is(cmd, "AT+EADC=2")) {
        FILE *f = dev::fopen(kAcCurrent, "r");
        if (f == nullptr) {
            EM_LOGE("fopen %s error:%s", kAcCurrent, strerror(errno));
            return RC_ERROR;
        }
        int current = 0;
        if (fscanf(f, "%d", &current) != 1) EM_LOGW("no number in %s", kAcCurrent);
        fclose(f);
        body_printf(resp, "\"%.2f\"", current / 1000.0);
        return RC_OK;
    }
    if (line_is(cmd, "AT+EADC=3")) {
        char text[31] = {0};
        if (kaelatcmd_read_system_file(kChargeCurrentResult, text, 30) == 0 && strlen(text) >= 2) {
            quote_body(resp, text);
            return RC_OK;
        }
        quote_reason(resp, "not Test!");
        return RC_ERROR;
    }
    if (line_is(cmd, "AT+EADC=4") || line_is(cmd, "AT+EADC=5")) {
        EM_LOGI("no need modify refresh freq");
        return RC_OK;
    }
    if (line_is(cmd, "AT+EADC=6")) {
        if (quote_nv_field(resp, nv::kEadcWord)) return RC_OK;
        EM_LOGE("get pyxa nv item fial");
        return RC_ERROR;
    }
    EM_LOGE("invalid command: %s", cmd);
    return RC_ERROR;
}

int batadc_handler(char *cmd, int arg, char *resp) {
    if (old_project()) {
        EM_LOGI("old project support test");
    } else {
        int type = adapter_type();
        if (type != 1 && type != 2) {
            body_printf(resp, "\r\n\"current not supported_adapter: %d\"\r\n", type);
            return RC_ERROR;
        }
    }
    if (line_is(cmd, "AT+BATADC=1")) {
        if (g_batadc_run == 1) {
            EM_LOGI("already start");
            return RC_OK;
        }
        g_batadc_run = 1;
        if (start_sampling(batadc_thread, nullptr) != 0) {
            EM_LOGE("create batadc thread error:%s", strerror(errno));
            g_batadc_run = 0;
            return RC_ERROR;
        }
        return RC_OK;
    }
    if (line_is(cmd, "AT+BATADC=0")) {
        g_batadc_run = 0;
        return RC_OK;
    }
    EM_LOGE("invalid command: %s", cmd);
    return RC_ERROR;
}

int adc_register_handler(char *cmd, int arg, char *resp) {
    if (!line_is(cmd, "AT+QX_ADC_REG=1")) {
        EM_LOGE("invalid command: %s", cmd);
        return RC_ATERROR;
    }
    if (kaelatcmd_write_system_file(kRegCount, O_RDWR, "1") < 0) {
        body_printf(resp, "\"write %s error:%s\"", kRegCount, strerror(errno));
        return RC_ATNG;
    }
    if (kaelatcmd_write_system_file(kRegAddress, O_RDWR, "0x305e") < 0) {
        body_printf(resp, "\"write %s error:%s\"", kRegAddress, strerror(errno));
        return RC_ATNG;
    }
    char data[101] = {0};
    if (kaelatcmd_read_system_file(kRegData, data, 100) != 0) {
        EM_LOGE("read the trim_data a fail");
        return RC_ATNG;
    }
    quote_body(resp, data);
    return RC_ATOK;
}

int usb_voltage_sample_handler(char *cmd, int arg, char *resp) {
    if (line_starts(cmd, "AT+QX_VBUS_VOLT=0", 17)) {
        VbusParams p{};
        int rc = parse_vbus(cmd, resp, p);
        if (rc != RC_OK) return rc;
        auto *block = new (std::nothrow) VbusParams(p);
        if (block == nullptr) {
            quote_reason(resp, "malloc fail");
            return RC_ATNG;
        }
        if (g_vbus_run == 1) {
            delete block;
            quote_reason(resp, "vbus_reading");
            return RC_ATNG;
        }
        store_vbus("null");
        g_vbus_run = 1;
        if (start_sampling(vbus_thread, block) != 0) {
            EM_LOGE("create vbus thread error:%s", strerror(errno));
            delete block;
            g_vbus_run = 0;
            return RC_ATNG;
        }
        return RC_ATOK;
    }
    if (strcmp(cmd, "AT+QX_VBUS_VOLT=1") == 0) {
        const char *stored = get_property_file_item_value(kTestInfo, kUsbVoltageKey);
        char text[kRespSize / 2];
        snprintf(text, sizeof text, "%s", stored ? stored : "");
        g_vbus_run = 0;
        quote_reason(resp, text);
        return strchr(text, ',') ? RC_ATOK : RC_ATNG;
    }
    EM_LOGE("invalid command: %s", cmd);
    return RC_ATERROR;
}
