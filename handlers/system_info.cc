// System information queries: boot state, software build, clock, model, chip and CPU
// identifiers, RAM and flash sizes, radio family, USB link speed, and the NV flags that
// mark the phone's progress along the line.
#include <errno.h>
#include <strings.h>
#include <unistd.h>

#include <array>
#include <climits>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <ctime>
#include <string>
#include <string_view>
#include <vector>

#include "core/command_tables/handlers.h"
#include "core/nv.h"
#include "core/port_state.h"
#include "handlers/common.h"
#include "platform/android.h"
#include "platform/device.h"
#include "platform/factory.h"
#include "platform/log.h"

namespace {

constexpr size_t kBrandSize = 50;   // the brand marker field
constexpr size_t kChipIdSize = 68;  // the flash chip identifier field
constexpr size_t kChipIdKept = 66;  // characters of the identifier the field keeps

using Prop = std::array<char, PROPERTY_VALUE_MAX>;

Prop prop(const char *name, const char *def) {
    Prop v{};
    kaelatcmd_get_system_property(name, v.data(), def);
    return v;
}

bool prop_is(const Prop &v, const char *text) { return strcmp(v.data(), text) == 0; }

// Non-empty pieces of text between any of the separators (strtok's view of a line).
std::vector<std::string> pieces(std::string_view text, std::string_view seps) {
    std::vector<std::string> out;
    size_t i = 0;
    while (i < text.size()) {
        size_t j = text.find_first_of(seps, i);
        if (j == std::string_view::npos) j = text.size();
        if (j > i) out.emplace_back(text.substr(i, j - i));
        i = j + 1;
    }
    return out;
}

// Index of the first entry that the field starts with; the table size when none does.
// Entry 0 is a single space, so real names count from 1.
template <size_t N>
int table_index(const std::array<const char *, N> &table, const std::string &field) {
    for (size_t i = 0; i < N; ++i)
        if (strncmp(field.c_str(), table[i], strlen(table[i])) == 0) return static_cast<int>(i);
    return static_cast<int>(N);
}

constexpr std::array<const char *, 13> kMonths = {" ",   "Jan", "Feb", "Mar", "Apr", "May", "Jun",
                                                   "Jul", "Aug", "Sep", "Oct", "Nov", "Dec"};
constexpr std::array<const char *, 8> kWeekdays = {" ", "Mon", "Tue", "Wed", "Thu", "Fri", "Sat", "Sun"};

constexpr const char *kSystemTimeFile = "/data/vendor/engineermode/systemtime";
constexpr const char *kTestInfoFile = "/cache/recovery/last_test_info";

int show_system_time(char *resp) {
    dev::shell("/system/bin/sh -c \"date > /data/vendor/engineermode/systemtime\"");
    FILE *f = dev::fopen(kSystemTimeFile, "r");
    if (f == nullptr) {
        LOGE("/data/vendor/engineermode/systemtime open file failed");
        return RC_ERROR;
    }
    std::array<char, 100> line{};
    bool got = fgets(line.data(), static_cast<int>(line.size()), f) != nullptr;
    fclose(f);
    // weekday month day time zone year; a space-padded day leaves an empty field that
    // is skipped like any other run of spaces.
    std::vector<std::string> f6 = got ? pieces(line.data(), " ") : std::vector<std::string>{};
    if (f6.size() < 6) {
        LOGE("unexpected date output: %s", line.data());
        return RC_ERROR;
    }
    std::string year = f6[5].substr(0, f6[5].find_first_of("\r\n"));
    int month = table_index(kMonths, f6[1]);
    int weekday = table_index(kWeekdays, f6[0]);
    body_printf(resp, "\r\n\"%s-%d-%s\"\r\n\"%s\"\r\n\"%d\"\r\n", year.c_str(), month, f6[2].c_str(),
                f6[3].c_str(), weekday);
    return RC_OK;
}

// The clock fields as a station gives them, with the range each may take. The ranges
// keep the values inside what mktime can hold (a year of 2147483648 overflowed the int,
// 2147483647 set an absurd clock); mktime still normalises within them (31 February is
// 3 March), as it always has.
struct ClockField {
    const char *name;
    long long min, max;
};
constexpr ClockField kClockFields[6] = {
    {"year", 1970, 2099}, {"month", 1, 12}, {"day", 1, 31}, {"hour", 0, 23}, {"minute", 0, 59}, {"second", 0, 60},
};

int set_system_time(const char *cmd) {
    std::vector<std::string> p = pieces(cmd, ", -:\"");
    if (p.size() < 7) {
        LOGE("time incomplete: %s", cmd);
        return RC_ERROR;
    }
    std::array<long long, 6> v{};
    for (size_t i = 0; i < v.size(); ++i) {
        const ClockField &f = kClockFields[i];
        if (!leading_number(p[i + 1].c_str(), f.min, f.max, &v[i])) {
            LOGE("%s out of range (%lld-%lld): %s", f.name, f.min, f.max, p[i + 1].c_str());
            return RC_ERROR;
        }
    }
    time_t now = dev::now();
    struct tm tm {};
    localtime_r(&now, &tm);
    tm.tm_year = static_cast<int>(v[0] - 1900);
    tm.tm_mon = static_cast<int>(v[1] - 1);
    tm.tm_mday = static_cast<int>(v[2]);
    tm.tm_hour = static_cast<int>(v[3]);
    tm.tm_min = static_cast<int>(v[4]);
    tm.tm_sec = static_cast<int>(v[5]);
    struct timeval tv {};
    tv.tv_sec = mktime(&tm);
    if (dev::set_clock(&tv) != 0) {
        LOGE("settimeofday %ld failed: %s", static_cast<long>(tv.tv_sec), strerror(errno));
        return RC_ERROR;
    }
    LOGI("system time set to %ld", static_cast<long>(tv.tv_sec));
    return RC_OK;
}

// The operator tag of a customer code; the first name it contains wins.
const char *operator_tag(const char *cust) {
    for (const char *tag : {"YD-A", "YD-B", "YD-C", "YD", "DX"})
        if (strstr(cust, tag) != nullptr) return tag;
    return nullptr;
}

struct RadioRow {
    const char *abbr;
    const char *name;
};

constexpr RadioRow kRadioTypes[] = {
    {"T", "TD+GSM"},
    {"W", "WCDMA+GSM"},
    {"E", "EVD0+GSM"},
    {"L", "TDD-LTE+TD+GSM"},
    {"M", "TDD-LTE+TD+WCDMA+GSM"},
    {"F", "FDD-LTE+WCDMA+GSM"},
    {"H", "FDD-LTE+TDD-LTE+WCDMA+GSM"},
    {"V", "FDD-LTE+EVDO+GSM"},
    {"U", "FDD-LTE+WCDMA+EVDO+GSM"},
};

struct CpuRule {
    const char *marker;  // the full marker, e.g. "cpu--AB"
    const char *part;    // or "cpu" and this part anywhere on the line; null: marker only
    const char *chip;
};

constexpr CpuRule kCpuRules[] = {
    {"cpu--AB", "AB", "8974AB"}, {"cpu--AC", "AC", "8974AC"}, {"cpu--AA", "AA", "8974AA"},
    {"cpu--26", "26", "8926"},   {"cpu--28", "28", "8928"},   {"cpu-16", nullptr, "8916"},
};

}  // namespace

int check_system_init_handler(char *cmd, int arg, char *resp) {
    if (!line_is(cmd, "AT+QXCN=0")) {
        LOGE("unknow cmdline: %s", cmd);
        quote_reason(resp, "unknow cmdline!");
        return RC_ERROR;
    }
    Prop boot = prop("sys.boot_completed", "");
    if (!prop_is(boot, "1")) {
        LOGE("boot not completed: %s", boot.data());
        return RC_ERROR;
    }
    switch (nv::update([](nv::Record &rec) { rec.set_i32(nv::kQxsnOk, 1); })) {
        case nv::Update::ReadFailed:
            LOGE("get_PYXA_NV_item failed");
            quote_reason(resp, "read backup fail!");
            return RC_ERROR;
        case nv::Update::WriteFailed:
            LOGE("put_PYXA_NV_item failed");
            quote_reason(resp, "write backup fail!");
            return RC_ERROR;
        case nv::Update::Ok:
            break;
    }
    if (is_uart_flag == 1) {
        LOGI("enable log with uart connected (only after AT+QXKJ=1)");
        control_kael_Log(is_sp, 1);
    }
    return RC_OK;
}

int version_info_handler(char *cmd, int arg, char *resp) {
    if (!line_is(cmd, "AT+ETST=1")) return invalid_command(cmd);

    if (is_uart_flag == 0) {
        const char *reply = ask_test_app("SystemCommand:getPyxaSoftwareVersion:132");
        quote_body(resp, reply);
        return (reply == nullptr || strncmp(reply, "error", 5) == 0) ? RC_ERROR : RC_OK;
    }

    Prop version = prop("ro.build.version.zdr", " ");
    if (prop_is(version, " ")) {
        if (!is_bsp_version()) {
            LOGE("ro.build.version.zdr not set");
            return RC_ERROR;
        }
        Prop incremental = prop("ro.build.version.incremental", "bsp version");
        body_printf(resp, "%s", incremental.data());
        return RC_OK;
    }

    std::string_view v = version.data();
    size_t us = v.find('_');
    if (us == std::string_view::npos || us + 1 == v.size()) {
        LOGE("buf1 is null");
        return RC_ERROR;
    }
    std::string build_prefix(v.substr(0, us)), build_suffix(v.substr(us + 1));

    Prop cust = prop("ro.product.customize.zdr", "null");
    if (prop_is(cust, "null")) cust = prop("persist.sys.kael.product.cust", "null");
    if (prop_is(cust, "null")) cust = prop("persist.kael.product.cust", "N");
    Prop custom = prop("ro.build.gn.custom", "null");

    // prefix[-TAG][-custom]_suffix
    std::string head = build_prefix;
    if (const char *tag = operator_tag(cust.data())) head += std::string("-") + tag;
    if (!prop_is(custom, "null")) head += std::string("-") + custom.data();
    body_printf(resp, "\r\n\"%s_%s\"\r\n", head.c_str(), build_suffix.c_str());
    return RC_OK;
}

int get_system_time_handler(char *cmd, int arg, char *resp) {
    if (line_is(cmd, "AT+QXSJ=0")) return show_system_time(resp);
    if (line_starts(cmd, "AT+QXSJ=1", 9)) return set_system_time(cmd);
    return invalid_command(cmd);
}

int get_factoryreset_time_handler(char *cmd, int arg, char *resp) {
    if (!line_is(cmd, "AT+QX_FACTORYRESET_TIME=0")) return invalid_command(cmd);
    Prop boot = prop("sys.boot_completed", "");
    Prop boot_time = prop("sys.boot_completed.time", "0");
    if (prop_is(boot_time, "0")) {
        LOGE("sys.boot_completed.time not set");
        quote_reason(resp, "Fail");
        return RC_ERROR;
    }
    if (!prop_is(boot, "1")) {
        LOGE("boot not completed: %s", boot.data());
        return RC_ERROR;
    }
    // The property can hold any text (AT+QXPROP sets properties): a difference that does
    // not fit is taken as the largest one of its sign.
    long long since = 0;
    if (__builtin_sub_overflow(static_cast<long long>(dev::now()), strtoll(boot_time.data(), nullptr, 10), &since))
        since = boot_time.data()[0] == '-' ? LLONG_MAX : LLONG_MIN;
    LOGI("%lld seconds since boot completed", since);
    if (since > 180) {
        quote_reason(resp, "Pass");
        return RC_OK;
    }
    quote_reason(resp, "Fail");
    return RC_ERROR;
}

int sdcard_version_handler(char *cmd, int arg, char *resp) {
    if (!line_is(cmd, "AT+TFST=0")) return invalid_command(cmd);
    if (is_bsp_version()) {
        Prop name = prop("ro.product.name", "BSP");
        body_printf(resp, "\r\n\"%s_Data_1.01\"\r\n", name.data());
        return RC_OK;
    }
    std::array<char, 256> file{};
    int rc = static_cast<int>(kaelatcmd_fread_system_file("/data/media/0/.sdcard_version", file.data(), 255));
    if (rc != 0 || strlen(file.data()) <= 4) {
        LOGE("read .sdcard_version failed (%d): %s", rc, file.data());
        quote_body(resp, "read .sdcard_version error");
        return RC_ERROR;
    }
    Prop model = prop("ro.kael.product.model", "");
    std::vector<std::string> lines = pieces(file.data(), "\n");
    if (lines.empty()) {
        body_printf(resp, "\r\n\"Not found %s\"\r\n", model.data());
        return RC_ERROR;
    }
    // The first line naming the model; a file without one gives its last line.
    std::string found = lines.back();
    for (const auto &l : lines) {
        if (l.find(model.data()) != std::string::npos) {
            found = l;
            break;
        }
    }
    delete_char(found.data(), '\r');
    quote_body(resp, found.c_str());
    return RC_OK;
}

int first_boot_handler(char *cmd, int arg, char *resp) {
    if (!line_is(cmd, "AT+QXKJ=1")) {
        LOGE("unknow cmdline %s", cmd);
        return RC_ERROR;
    }
    const auto held = nv::hold();
    nv::Record rec;
    if (!nv::read(rec)) {
        // An unreadable record must not stop the line here: the station moves on.
        LOGE("get_PYXA_NV_item failed, first boot flag not set");
        return RC_OK;
    }
    rec.set_i32(nv::kFirstBootDone, 1);
    if (!nv::write(rec)) {
        LOGE("put_PYXA_NV_item failed");
        return RC_ERROR;
    }
    return RC_OK;
}

int check_is_pyxa_handler(char *cmd, int arg, char *resp) {
    if (line_is(cmd, "AT+QXIQ=1")) {
        nv::Update u = nv::update([](nv::Record &rec) {
            memset(rec.text(nv::kBrand), 0, kBrandSize);
            memcpy(rec.text(nv::kBrand), "zdr", 3);
        });
        if (u != nv::Update::Ok) LOGE("brand marker not written (%s)", u == nv::Update::ReadFailed ? "read" : "write");
        return u == nv::Update::Ok ? RC_OK : RC_ERROR;
    }
    if (line_is(cmd, "AT+QXIQ=0")) {
        nv::Record rec;
        if (!nv::read(rec)) {
            LOGE("get_PYXA_NV_item failed");
            return RC_ERROR;
        }
        const char *brand = rec.text(nv::kBrand);
        body_printf(resp, "\r\n\"%.*s\"\r\n", static_cast<int>(strnlen(brand, kBrandSize)), brand);
        return RC_OK;
    }
    return invalid_command(cmd);
}

int system_init_flag_on_handler(char *cmd, int arg, char *resp) {
    if (!line_is(cmd, "AT+QXRDNV=0")) return invalid_command(cmd);
    if (!quote_nv_field(resp, nv::kQxsnOk)) {
        LOGE("get_PYXA_NV_item failed");
        return RC_ERROR;
    }
    return RC_OK;
}

int check_product_name_handler(char *cmd, int arg, char *resp) {
    if (!line_starts(cmd, "AT+QXMODEL=0", 12)) return invalid_command(cmd);
    bool net_model = is_project("RX5012C") || is_project("RX5012D");
    Prop model = prop(net_model ? "ro.kael.product.net.model" : "ro.product.model", "");
    quote_body(resp, model.data());
    return RC_OK;
}

int get_chip_id(char *cmd, int arg, char *resp) {
    if (!line_is(cmd, "AT+QXRID=1")) return invalid_command(cmd);
    std::array<char, 101> id{};
    if (!get_emmcid(id.data())) {
        const char *why = strerror(errno);
        LOGE("get cid failed:%s", why);
        quote_reason(resp, why);
        return RC_ERROR;
    }
    id.back() = '\0';
    quote_body(resp, id.data());
    nv::Update u = nv::update([&id](nv::Record &rec) {
        memset(rec.text(nv::kChipId), 0, kChipIdSize);
        memcpy(rec.text(nv::kChipId), id.data(), strnlen(id.data(), kChipIdKept));
    });
    if (u != nv::Update::Ok) {
        LOGE("chip id not stored (%s)", u == nv::Update::ReadFailed ? "read" : "write");
        return RC_ERROR;
    }
    return RC_OK;
}

int read_ram_capacity_handle(char *cmd, int arg, char *resp) {
    if (!line_starts(cmd, "AT+QXRAM=0", 10)) return invalid_command(cmd);
    FILE *f = dev::fopen("/proc/meminfo", "r");
    if (f == nullptr) {
        LOGE("open /proc/meminfo failed: %s", strerror(errno));
        return RC_ERROR;
    }
    std::array<char, 50> line{};
    bool got = fgets(line.data(), static_cast<int>(line.size()), f) != nullptr;
    fclose(f);
    std::vector<std::string> w = got ? pieces(line.data(), " ") : std::vector<std::string>{};
    if (w.size() < 2 || w[0].find("MemTotal") == std::string::npos) {
        LOGE("no MemTotal in: %s", line.data());
        return RC_ERROR;
    }
    body_printf(resp, "\r\n\"%d\"\r\n", static_cast<int>(strtol(w[1].c_str(), nullptr, 10) / 1024));
    return RC_OK;
}

int get_radio_type_handle(char *cmd, int arg, char *resp) {
    if (!line_is(cmd, "AT+QXRADIO=0")) return invalid_command(cmd);
    Prop abbr = prop("persist.kael.radio.type.abbr", "");
    if (strcasecmp(abbr.data(), "A") == 0 || strcasecmp(abbr.data(), "D") == 0) {
        Prop cust = prop("ro.product.customize.zdr", "N");
        quote_body(resp, strstr(cust.data(), "CN-YD") ? "TDD-LTE+TD+GSM" : "TDD-LTE+FDD-LTE+WCDMA+TD+GSM");
        return RC_OK;
    }
    for (const RadioRow &r : kRadioTypes) {
        if (strcasecmp(abbr.data(), r.abbr) == 0) {
            quote_body(resp, r.name);
            return RC_OK;
        }
    }
    LOGW("unknown radio type: %s", abbr.data());
    return RC_OK;
}

int check_cpu_type_handler(char *cmd, int arg, char *resp) {
    if (!line_is(cmd, "AT+QXBBTYPE=0")) return invalid_command(cmd);
    FILE *f = dev::fopen("/sys/devs_list/mpps_value", "r");
    if (f == nullptr) {
        LOGE("the file  /sys/devs_list/mpps_value NOT exist");
        return RC_ERROR;
    }
    std::array<char, 128> line{};
    if (fgets(line.data(), static_cast<int>(line.size()), f) == nullptr) line[0] = '\0';
    fclose(f);
    const char *l = line.data();
    for (const CpuRule &r : kCpuRules) {
        bool hit = strstr(l, r.marker) || (r.part && strstr(l, "cpu") && strstr(l, r.part));
        if (hit) {
            quote_body(resp, r.chip);
            return RC_OK;
        }
    }
    LOGE("unknown cpu type: %s", l);
    return RC_ERROR;
}

int check_cpu_id_handler(char *cmd, int arg, char *resp) {
    if (!line_is(cmd, "AT+QXCPUID=1")) return invalid_command(cmd);
    std::array<char, 256> id{};
    if (get_cpuid(id.data(), 255) != 0) {
        const char *why = strerror(errno);
        LOGE("get_cpuid failed: %s", why);
        quote_reason(resp, why);
        return RC_ERROR;
    }
    quote_body(resp, id.data());
    return RC_OK;
}

int get_emmc_size_handler(char *cmd, int arg, char *resp) {
    if (!line_is(cmd, "AT+QXFQ=0")) return invalid_command(cmd);
    // UFS phones show the flash as sda; eMMC phones as mmcblk0.
    const char *node = dev::access("/sys/block/sda/size", F_OK) == 0 ? "/sys/block/sda/size"
                                                                      : "sys/class/block/mmcblk0/size";
    std::array<char, 101> size{};
    if (read_policy_file(1, node, size.data(), 100) < 0) {
        LOGE("read %s failed", node);
        return RC_ERROR;
    }
    long long sectors = strtoll(size.data(), nullptr, 10);
    body_printf(resp, "\r\n\"%.2f\"\r\n", static_cast<double>(sectors) * 4.76837158203125e-7);
    return RC_OK;
}

int usb_protocol_query(char *cmd, int arg, char *resp) {
    if (!line_is(cmd, "AT+QXUSB=0")) return invalid_command(cmd);
    std::array<char, 6> power{};
    if (!read_node("sys/class/power_supply/usb/power_now", power.data(), power.size())) {
        LOGE("read usb power_now failed");
        return RC_ERROR;
    }
    int v = atoi(power.data());
    body_printf(resp, "\r\n\"%d\"\r\n", v == 5 ? 3 : v == 3 ? 2 : 0);
    return RC_OK;
}

int cache_last_test_info_handler(char *cmd, int arg, char *resp) {
    std::vector<std::string> f = pieces(cmd, ",");
    if (f.size() < 2) {
        LOGE("key is null: %s", cmd);
        quote_body(resp, "key is null");
        return RC_ATERROR;
    }
    const char *key = f[1].c_str();
    // A key or value with a line end (or a key with "=") would add items of the
    // station's choosing to the file: such an item cannot exist, be set or be deleted.
    const bool key_ok = file_item_ok(key, true);

    if (line_starts(cmd, "AT+QX_CACHE_PROP=0", 18)) {
        const char *value = key_ok ? get_property_file_item_value(kTestInfoFile, key) : nullptr;
        if (value == nullptr) {
            quote_body(resp, "get value failed!");
            return RC_ATNG;
        }
        quote_body(resp, value);
        return RC_ATOK;
    }
    if (line_starts(cmd, "AT+QX_CACHE_PROP=1", 18)) {
        if (f.size() < 3) {
            quote_body(resp, "value is null");
            return RC_ATERROR;
        }
        const char *value = f[2].c_str();
        if (!key_ok || !file_item_ok(value, false) || set_property_file_item_value(kTestInfoFile, key, value) < 0) {
            LOGE("set %s=%s failed", key, value);
            quote_body(resp, "set value failed");
            return RC_ATNG;
        }
        const char *stored = get_property_file_item_value(kTestInfoFile, key);
        if (stored == nullptr || strcmp(stored, value) != 0) {
            LOGE("check %s failed: %s", key, stored ? stored : "(null)");
            quote_body(resp, "check value failed");
            return RC_ATNG;
        }
        return RC_ATOK;
    }
    if (line_starts(cmd, "AT+QX_CACHE_PROP=2", 18)) {
        if (!key_ok || delete_property_file_item(kTestInfoFile, key) != 0) {
            body_printf(resp, "\r\n\"delete %s error\"\r\n", key);
            return RC_ATNG;
        }
        return RC_ATOK;
    }
    LOGE("invalid command: %s", cmd);
    quote_body(resp, "invalid command");
    return RC_ATERROR;
}
