// Factory reset (at once or after a delay), the device's log sets, and the forced crash
// dump. The reset itself is done by the test app; we clear what it cannot reach.
#include <pthread.h>
#include <strings.h>

#include <array>
#include <cerrno>
#include <charconv>
#include <climits>
#include <cstdio>
#include <cstring>
#include <string_view>
#include <vector>

#include "core/command_tables/handlers.h"
#include "core/nv.h"
#include "core/port_state.h"
#include "core/workers.h"
#include "handlers/common.h"
#include "platform/device.h"
#include "platform/factory.h"
#include "platform/log.h"

void *clean_gprs_anite_thread(void *);

namespace {

constexpr const char *kMissingTfData = "Missing TF_Data!";
constexpr int kDelayMin = 180;
constexpr int kDelayMax = 900;

// Immediate reset: the test app wipes the phone; the modem's test-network settings and
// the old AT logs would survive it, so they go too.
int restore_now(char *resp, int variant) {
    if (get_tfdata_type(0) == 0) {
        quote_body(resp, kMissingTfData);
        return RC_ERROR;
    }
    char message[32];
    snprintf(message, sizeof message, "system_restore %d", variant);
    const char *reply = ask_test_app(message);
    if (reply == nullptr || strcmp(reply, "ok") != 0) {
        quote_reason(resp, reply);
        return RC_ERROR;
    }
    if (variant == 1) start_worker(clean_gprs_anite_thread, nullptr);
    kaelatcmd_remove_system_file("/cache/recovery/last_AT_adb.log");
    kaelatcmd_remove_system_file("/cache/recovery/last_AT_kernel.log");
    return RC_OK;
}

// AT+QX_FRS_SHD=1,<seconds>,<oemFlag>: the delay is kept in the NV record so that the
// test app can carry out the reset when it runs out, even across a restart.
int restore_delayed(char *cmd, char *resp) {
    std::vector<std::string_view> f = comma_fields(cmd);
    if (f.size() < 3) {
        LOGE("paramter error");
        return RC_ATNG;
    }
    std::string_view secs = f[1], oem = f[2];
    if (oem[0] != '0' && oem[0] != '1') {
        LOGE("oemFlag:%.*s", static_cast<int>(oem.size()), oem.data());
        return RC_ATNG;
    }
    for (size_t i = 0; i < secs.size(); ++i) {
        if (secs[i] < '0' || secs[i] > '9') {
            LOGE("seconds[%d]:%c", static_cast<int>(i), secs[i]);
            return RC_ATNG;
        }
    }
    long long value = 0;
    if (std::from_chars(secs.data(), secs.data() + secs.size(), value).ec != std::errc()) value = LLONG_MAX;
    int seconds = value > INT_MAX ? INT_MAX : static_cast<int>(value);
    if (seconds < kDelayMin || seconds > kDelayMax) {
        LOGE("error:%d", seconds);
        return RC_ATNG;
    }
    if (get_tfdata_type(seconds) == 0) {
        quote_body(resp, kMissingTfData);
        return RC_ERROR;
    }

    const auto held = nv::hold();  // the buffer is written back again below
    nv::Record rec;
    if (nv::read(rec)) {
        rec.set_i32(nv::kResetDelay, seconds);
        rec.set_i32(nv::kUpdateFlag, rec.i32(nv::kUpdateFlag) | 1);
        if (!nv::write(rec)) {
            LOGE("put_PYXA_NV_item(&pyxa_nvram) fail");
            return RC_ERROR;
        }
    }
    char message[32];
    snprintf(message, sizeof message, "system_restore %d", oem[0] - '0' + 1);
    if (test_app_ok(message)) return RC_ATOK;

    // The test app will not do it: no reset may stay pending. The buffer is written back
    // as it stands, also when it could not be read.
    rec.set_i32(nv::kResetDelay, 0);
    if (!nv::write(rec)) LOGE("put_PYXA_NV_item(&pyxa_nvram) fail");
    return RC_ERROR;
}

struct LogSet {
    const char *name;
    unsigned int value;
};

constexpr std::array<LogSet, 9> kLogSets{{
    {"adb", 0},
    {"camera", 0x40000},
    {"sensor", 32},
    {"bluetooth", 0x4000000},
    {"audio", 0x8000000},
    {"wifi", 0x2000040},
    {"modem", 4},
    {"qsee", 32768},
    {"gps", 32},
}};

// AT+QXLOG=5,<name>[,<name>...]: the values are added, so a set named twice counts twice.
int log_sets(char *cmd, char *resp) {
    unsigned int mask = 1;
    int names = 0;
    std::vector<std::string_view> fields = comma_fields(cmd);  // the first is the command itself
    for (size_t i = 1; i < fields.size(); ++i) {
        // Over TCP the station's line end stays in the line; it is no part of the last name.
        std::string_view name = i + 1 < fields.size() ? fields[i] : without_line_end(fields[i]);
        if (name.empty()) continue;
        const LogSet *set = nullptr;
        for (const LogSet &s : kLogSets)
            if (name.size() == strlen(s.name) && strncasecmp(name.data(), s.name, name.size()) == 0) set = &s;
        if (set == nullptr) {
            LOGE("unknown log name: %.*s", static_cast<int>(name.size()), name.data());
            quote_body(resp, "unknown log name");
            return RC_ATNG;
        }
        mask += set->value;
        ++names;
    }
    if (names == 0) {
        quote_body(resp, "invalid log name");
        return RC_ATERROR;
    }
    LOGI("log mask: 0x%X", mask);
    control_kael_Log(is_sp, mask);
    return RC_ATOK;
}

}  // namespace

void *clean_gprs_anite_thread(void *) {
    LOGI("Start");
    diag_cmd_clean_gprs_anite();
    LOGI("Exit");
    pthread_detach(pthread_self());
    return nullptr;
}

int at_restore_handler(char *cmd, int arg, char *resp) {
    // The two partitions are wiped for every line of these commands, valid or not.
    partition_format("/dev/block/bootdevice/by-name/msadp");
    partition_format("/dev/block/bootdevice/by-name/apdp");

    if (line_is(cmd, "AT+QXRTALL=1")) return restore_now(resp, 1);
    if (line_is(cmd, "AT+QXRTALL=2")) return restore_now(resp, 2);
    if (line_starts(cmd, "AT+QX_FRS_SHD=1", 15)) return restore_delayed(cmd, resp);
    if (line_is(cmd, "AT+QX_FRS_SHD=2")) {
        dev::shell("/system/bin/sh -c \"stop kael_em_float\"");  // the engineering-mode floating service
        return RC_ATOK;
    }
    return invalid_command(cmd);
}

int log_handler(char *cmd, int arg, char *resp) {
    if (line_is(cmd, "AT+QXLOG=0")) return control_kael_Log(is_sp, 0), RC_OK;
    if (line_is(cmd, "AT+QXLOG=1")) return control_kael_Log(is_sp, 7), RC_OK;
    if (line_is(cmd, "AT+QXLOG=3")) return control_kael_Log(is_sp, 1), RC_OK;
    if (line_is(cmd, "AT+QXLOG=2")) return (is_kaellog_running() & 1) ? RC_ERROR : RC_OK;
    if (line_starts(cmd, "AT+QXLOG=5", 10)) return log_sets(cmd, resp);
    if (line_is(cmd, "AT+QXLOG=6")) return RC_ATOK;
    return invalid_command(cmd);
}

int trigger_dump_handler(char *cmd, int arg, char *resp) {
    if (strcmp(cmd, "AT+QX_TRG_DUMP=0") != 0) {
        LOGE("not suport cmd");
        return RC_ATERROR;
    }
    if (write_policy_file(0, "/proc/sysrq-trigger", 2, "c") != 0) {
        int err = errno;
        body_printf(resp, "\"errno:%s\"", strerror(err));
        return RC_ATNG;
    }
    return RC_ATOK;  // the kernel crashes now and writes its dump
}
