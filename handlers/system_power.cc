// End-of-line commands: closing the debug port, powering off, rebooting, and choosing
// the USB function set. Every device effect goes through the platform layer.
#include <errno.h>
#include <fcntl.h>
#include <pthread.h>
#include <unistd.h>

#include <cstdio>
#include <cstring>
#include <memory>
#include <string_view>

#include "core/command_tables/handlers.h"
#include "core/nv.h"
#include "core/workers.h"
#include "handlers/common.h"
#include "platform/android.h"
#include "platform/device.h"
#include "platform/factory.h"
#include "platform/log.h"

namespace {

// Fields of the NV record that only the debug-port close touches: it clears them.
constexpr size_t kCloseClear100 = 100;
constexpr size_t kCloseClear104 = 104;
constexpr size_t kCloseClear396 = 396;  // checked again with adb_flag after the write
constexpr size_t kCloseClear496 = 496;

constexpr const char *kFastSearchService = "com.android.phone.fastSearchNet.FastSearchNetService";
constexpr const char *kDpdtService = "com.pyxa.engineermode.DpdtService";
constexpr int kFastSearchStopTries = 25;  // 200 ms apart
constexpr int kDpdtStopTries = 50;        // 100 ms apart
constexpr const char *kDpdtComponent = "com.pyxa.engineermode/.DpdtService";
constexpr const char *kPnActivity = "com.pyxa.engineermode/.PnActivity";
constexpr const char *kPnService = "com.pyxa.engineermode/.PnService";
constexpr const char *kShutDownService = "com.pyxa.engineermode/.socketcommand.ShutDownService";
constexpr const char *kStopExtras = "--es status 0";

constexpr const char *kAtTestFile = "/data/vendor/engineermode/at_test";
constexpr size_t kAtTestBlock = 0x200000;  // one 2 MiB block proves the data partition takes writes
constexpr const char *kKeepChgSoc = "/sys/class/power_supply/battery/keep_chg_soc";
constexpr const char *kUsbAdbFunctions = "diag,serial_cdev,serial_tty,rmnet_ipa,mass_storage,adb";

constexpr int kMaxShutdownSeconds = 1200;
constexpr int kActivityAboveSeconds = 35;  // longer waits show the countdown screen
constexpr size_t kPnTextMax = 120;

void finish_worker() {
    LOGI("Exit");
    pthread_detach(pthread_self());
}

void *shutdown_thread(void *) {
    LOGI("Start");
    dev::sync();
    LOGI("sync emmc flash complete! shutdown now.");
    sleep(2);  // let the answer frame leave first
    android_reboot(ANDROID_RB_POWEROFF, 0, "ATcommand");
    finish_worker();
    return nullptr;
}

void *set_charging_thread(void *) {
    LOGI("Start");
    sleep(1);
    LOGI("set adb to charging");
    kaelatcmd_set_system_property("sys.usb.config", "charging");
    finish_worker();
    return nullptr;
}

void *shutdown_exit_thread(void *) {
    LOGI("Start");
    stopServiceFromFtcmd(kDpdtComponent, nullptr, nullptr);
    sendBroadcastFromFtcmd(nullptr, kFastSearchService, kStopExtras);
    sleep(2);
    LOGI("set usb charging");
    kaelatcmd_set_system_property("sys.usb.config", "charging");
    finish_worker();
    return nullptr;
}

// Proves the data partition still takes writes before the phone leaves the line.
int write_file_to_data() {
    int fd = dev::open(kAtTestFile, O_WRONLY | O_CREAT | O_TRUNC, 0666);
    if (fd < 0) {
        LOGE("open file at_test failed:%s", strerror(errno));
        return -1;
    }
    auto block = std::make_unique<char[]>(kAtTestBlock);  // zeroed; the contents do not matter
    ssize_t n = ::write(fd, block.get(), kAtTestBlock);
    LOGD("at_test wrote %zd bytes", n);  // a short write is not treated as a failure
    ::close(fd);
    dev::sync();
    dev::unlink(kAtTestFile);
    return 0;
}

// The NV write must have landed: both flags read back as 0, within five tries.
bool close_flags_read_back() {
    for (int i = 0; i < 5; ++i) {
        nv::Record rec;
        if (nv::read(rec) && rec.i32(nv::kAdbFlag) == 0 && rec.i32(kCloseClear396) == 0) return true;
        usleep(100 * 1000);
    }
    return false;
}

// Closes the debug port for shipping and restores the user settings: 0, or -1 on any failure.
int close_adb() {
    const auto held = nv::hold();
    nv::Record rec;
    if (!nv::read(rec)) {
        LOGE("get_PYXA_NV_item failed");
        return -1;
    }
    rec.set_i32(nv::kAdbFlag, 0);
    rec.set_i32(kCloseClear100, 0);
    rec.set_i32(nv::kFirstBootDone, 0);

    // A service that never stops (or restarts itself) would hold the dispatch lock, and every
    // station with it, for ever: each wait ends after 5 s and the close goes on.
    int tries = 0;
    while (isServiceWork(kFastSearchService) && tries++ < kFastSearchStopTries) {
        sendBroadcastFromFtcmd(nullptr, kFastSearchService, kStopExtras);
        usleep(200 * 1000);
    }
    if (tries > kFastSearchStopTries) LOGE("%s still runs", kFastSearchService);
    tries = 0;
    while (isServiceWork(kDpdtService) && tries++ < kDpdtStopTries) {
        stopServiceFromFtcmd(kDpdtComponent, nullptr, nullptr);
        usleep(100 * 1000);
    }
    if (tries > kDpdtStopTries) LOGE("%s still runs", kDpdtService);

    rec.set_i32(kCloseClear104, 0);
    kaelatcmd_set_system_property("sys.dpdt.floating", "0");
    rec.set_i32(kCloseClear396, 0);
    rec.set_i32(kCloseClear496, 0);
    rec.set_i32(nv::kAssemblyAtMode, 0);

    if (!nv::write(rec)) {
        LOGE("put_PYXA_NV_item failed");
        return -1;
    }
    if (clear_certificate() != 0) {
        LOGE("clear_certificate failed");
        return -1;
    }
    if (write_file_to_data() != 0) return -1;
    const char *reply = ask_test_app("restoreSystemSettings");
    if (reply == nullptr || strstr(reply, "ok") == nullptr) {
        LOGE("restoreSystemSettings refused");
        return -1;
    }

    if (!close_flags_read_back()) {
        LOGE("adb_flag still set after the NV write");
        return -1;
    }
    if (dev::exists(kKeepChgSoc) && write_policy_file(0, kKeepChgSoc, O_RDWR, "100") < 0) {
        LOGE("write %s failed", kKeepChgSoc);
        return -1;
    }

    dev::shell("/system/bin/sh -c \"rm -r /storage/sdcard0/ram_dump\"");
    kaelatcmd_set_system_property("persist.sys.dloadmode", "0");
    kaelatcmd_set_system_property("persist.sys.factory.mode", "no");
    return 0;
}

// The text after the line's first comma; empty when there is none.
std::string_view after_comma(std::string_view line) {
    size_t comma = line.find(',');
    return comma == std::string_view::npos ? std::string_view{} : line.substr(comma + 1);
}

int open_adb_for_good(char *resp) {
    nv::Update u = nv::update([](nv::Record &rec) {
        rec.set_i32(nv::kAdbFlag, 1);
        LOGI("set pyxa_nvram.adb_flag: %d", rec.i32(nv::kAdbFlag));
    });
    if (u == nv::Update::ReadFailed) {
        LOGE("get_PYXA_NV_item failed");
        quote_reason(resp, "get nv failed");
        return RC_ERROR;
    }
    if (u == nv::Update::WriteFailed) {
        LOGE("put_PYXA_NV_item failed");
        return RC_ERROR;
    }
    char config[PROPERTY_VALUE_MAX] = {0};
    kaelatcmd_get_system_property("sys.usb.config", config, "");
    if (strstr(config, "adb") == nullptr) kaelatcmd_set_system_property("sys.usb.config", kUsbAdbFunctions);
    kaelatcmd_set_system_property("persist.sys.zdrem", "1");
    return RC_OK;
}

// Closes the port, then asks the test app to power off in the way message names.
int close_then_ask(const char *message, char *resp) {
    if (close_adb() != 0) {
        quote_reason(resp, "close_adb failed");
        return RC_ERROR;
    }
    return test_app_ok(message) ? RC_OK : RC_ERROR;
}

int timed_shutdown(const char *cmd, char *resp) {
    int seconds = 0;
    for (char c : after_comma(cmd)) {
        if (c < '0' || c > '9') {
            LOGE("invalid paramter: %s", cmd);
            quote_reason(resp, "invalid paramter");
            return RC_ATNG;
        }
        if (seconds <= kMaxShutdownSeconds) seconds = seconds * 10 + (c - '0');  // stays small
    }
    if (seconds > kMaxShutdownSeconds) {
        LOGE("shutdown time %d above %d", seconds, kMaxShutdownSeconds);
        return RC_ATNG;
    }
    if (close_adb() != 0) {
        LOGE("close debug port fail");
        quote_reason(resp, "close debug port fail");
        return RC_ATNG;
    }
    if (seconds > kActivityAboveSeconds) {
        char extras[32];
        snprintf(extras, sizeof extras, "--ei time %d", seconds);
        startActivityFromFtcmd(kPnActivity, nullptr, extras);
        startServiceFromFtcmd(kPnService, nullptr, extras);
    } else {
        startServiceFromFtcmd(kShutDownService, nullptr, nullptr);
    }
    // The test app powers the phone off; the answer does not depend on the worker.
    int rc = start_worker(shutdown_exit_thread, nullptr);
    if (rc != 0) LOGE("start shutdown_exit_thread error:%d", rc);
    return RC_ATOK;
}

int show_pn(const char *cmd, const char *key) {
    char extras[160];
    std::string_view text = after_comma(cmd).substr(0, kPnTextMax);
    snprintf(extras, sizeof extras, "--es %s %.*s", key, static_cast<int>(text.size()), text.data());
    startActivityFromFtcmd(kPnActivity, nullptr, extras);
    return RC_ATOK;
}

}  // namespace

// The answer goes out now; the worker powers off or restarts two seconds later.
static int answer_then(void *(*worker)(void *)) {
    int rc = start_worker(worker, nullptr);
    if (rc != 0) {
        LOGE("start reboot_thread error:%d", rc);
        return RC_ERROR;
    }
    return RC_OK;
}

int shutdown_handler(char *cmd, int, char *) {
    if (!line_is(cmd, "AT+QXGJ=0")) return invalid_command(cmd);
    return answer_then(shutdown_thread);
}

int reboot_handler(char *cmd, int, char *) {
    if (!line_is(cmd, "AT+QXREBOOT=1")) return invalid_command(cmd);
    return answer_then(reboot_thread);
}

int master_handler(char *cmd, int, char *resp) {
    if (line_is(cmd, "AT+QXRT=0")) {
        if (!quote_nv_field(resp, nv::kRtFlag)) {
            LOGE("get_PYXA_NV_item(&pyxa_nvram) fail");
            return RC_ERROR;
        }
        return RC_OK;
    }
    if (line_is(cmd, "AT+QXRT=1")) {
        quote_reason(resp, "not support");
        return RC_ERROR;
    }
    return invalid_command(cmd);
}

int vcom_set_handler(char *cmd, int, char *) {
    static constexpr struct {
        const char *line;
        const char *functions;
    } kForms[] = {
        {"AT+QXCOM=1,DIAG", "diag,adb"},
        {"AT+QXCOM=1,ADB", "adb"},
        {"AT+QXCOM=1,NMEA", "serial_smd,serial_tty"},
    };
    for (const auto &f : kForms) {
        if (line_is(cmd, f.line)) {
            kaelatcmd_set_system_property("sys.usb.config", f.functions);
            return RC_OK;
        }
    }
    return invalid_command(cmd);
}

int adb_port_handler(char *cmd, int, char *resp) {
    if (line_is(cmd, "AT+QXADB=1") || line_is(cmd, "AT+QXACM=1")) return open_adb_for_good(resp);

    if (line_is(cmd, "AT+QXADB=0,0")) {
        LOGI("only close adb");
        if (close_adb() != 0) {
            quote_reason(resp, "close_adb failed");
            return RC_ERROR;
        }
        return RC_OK;
    }
    if (line_is(cmd, "AT+QXADB=0,1") || line_is(cmd, "AT+QXACM=0")) {
        LOGI("shut down immediately after close adb");
        return close_then_ask("shutdown immediately", resp);
    }
    if (line_is(cmd, "AT+QXADB=0,2")) {
        LOGI("reboot after close adb");
        return close_then_ask("shutdown autoreboot", resp);
    }
    if (line_is(cmd, "AT+QXADB=0,3") || line_is(cmd, "AT+QXACM=3")) {
        if (close_adb() != 0 || !test_app_ok("shutdown delay")) return RC_ERROR;
        int rc = start_worker(set_charging_thread, nullptr);
        if (rc != 0) LOGE("start set_charging_thread error:%d", rc);
        return RC_OK;
    }
    if (line_is(cmd, "AT+QXADB=2") || line_is(cmd, "AT+QXACM=2")) {
        if (!quote_nv_field(resp, nv::kAdbFlag)) {
            LOGE("get_PYXA_NV_item failed");
            quote_reason(resp, "get NV failed");
            return RC_ERROR;
        }
        return RC_OK;
    }
    if (line_is(cmd, "AT+QXACM=4")) {
        // Stations rely on this form closing the port and still answering ERROR: the
        // close gives 0 or -1, so the charging worker never starts from here.
        if (close_adb() == 1) start_worker(set_charging_thread, nullptr);
        return RC_ERROR;
    }
    return invalid_command(cmd);
}

int exec_shutdown_handler(char *cmd, int, char *resp) {
    if (line_starts(cmd, "AT+QX_LCM_DISP=1", 16)) return show_pn(cmd, "pn");
    if (line_starts(cmd, "AT+QX_LCM_DISP=2", 16)) return show_pn(cmd, "point");
    if (line_starts(cmd, "AT+QX_SHD_TIME=1", 16)) return timed_shutdown(cmd, resp);
    LOGE("invalid command: %s", cmd);
    quote_reason(resp, "invalid command");
    return RC_ATERROR;
}
