// Storage tests: the emulated shared storage and the SD card, the data partition's size,
// the flash chip's remaining life, firmware and bill of materials, a DDR stress run, the
// USB host (OTG) port and the USB mass-storage switch. Most answers are read straight off
// kernel nodes; the ones that need Android (sizes the media provider knows, the OTG and
// mass-storage switches) go through the test app.
#include <errno.h>
#include <pthread.h>
#include <unistd.h>

#include <atomic>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string>
#include <string_view>
#include <thread>
#include <vector>

#include "core/command_tables/handlers.h"
#include "core/port_state.h"
#include "handlers/common.h"
#include "handlers/storage.h"
#include "platform/android.h"
#include "platform/device.h"
#include "platform/factory.h"
#include "platform/log.h"

namespace {

// statfs figures to gigabytes of 2^30 bytes, and byte counts to megabytes of 2^20.
constexpr double kBytesToGb = 9.313225746154785e-10;
constexpr double kBytesToMb = 9.5367431640625e-7;

constexpr char kRwTestCard[] = "/storage/sdcard1/sdcard_rw_test";
constexpr char kRwTestShared[] = "/sdcard/sdcard_rw_test";
constexpr char kRwTestText[] = "nihao";

constexpr char kDdrLog[] = "/data/vendor/last_ddr.txt";
// The stress program is started with the seconds the station gives; the text goes into a
// shell command line, so only this many decimal digits are taken.
constexpr size_t kDdrSecondsMax = 9;

constexpr char kOtgProperty[] = "sys.otg.dev";
constexpr char kUsbDevices[] = "/sys/kernel/debug/usb/devices";
constexpr int kOtgSecondsMax = 600;
// "otg_test 1 <x>" with any x a line can carry: the message is never cut.
constexpr size_t kOtgMessageSize = sizeof "otg_test 1 " + kLineSize;

std::atomic<int> g_otg_checks{0};

// One line (fgets of size - 1 characters at most, its line end kept) of a node; an empty
// text when the node cannot be opened or is empty. False when it cannot be opened.
bool read_line(const char *path, char *buf, int size) {
    buf[0] = '\0';
    FILE *f = dev::fopen(path, "r");
    if (f == nullptr) return false;
    if (fgets(buf, size, f) == nullptr) buf[0] = '\0';
    fclose(f);
    return true;
}

// Sizes in gigabytes of the data partition; false when statfs fails.
bool data_total_gb(double &gb) {
    struct statfs st {};
    if (dev::statfs("/data", &st) != 0) {
        LOGE("statfs /data failed: %s", strerror(errno));
        return false;
    }
    gb = static_cast<double>(st.f_bsize) * static_cast<double>(st.f_blocks) * kBytesToGb;
    return true;
}

// Used space of the shared storage in megabytes: the test app knows it when Android runs;
// otherwise (or when it will not say) du counts it. False when neither can.
bool shared_used_mb(double &mb) {
    if (is_uart_flag == 0) {
        const char *reply = ask_test_app("SystemCommand:fileSize:/sdcard/");
        if (reply != nullptr && strncmp(reply, "ok", 2) == 0) {
            mb = static_cast<double>(atoll(reply + 2)) / 1024 / 1024;
            return true;
        }
    }
    char out[256] = {0};
    if (ext_system("du -sk /sdcard/", out, sizeof out) < 0) return false;
    std::string_view kb(out, strcspn(out, "\t"));
    if (kb.empty()) return false;
    mb = atof(out) / 1024;
    return true;
}

int data_room(char *resp) {
    double total = 0, used = 0;
    if (!data_total_gb(total)) {
        body_printf(resp, "\r\n\" statfs data failed \"\r\n");
        return RC_ERROR;
    }
    if (!shared_used_mb(used)) {
        body_printf(resp, "\r\n\" sdcard mount failed \"\r\n");
        return RC_ERROR;
    }
    body_printf(resp, "\r\n\"%.2f,%.3f\"\r\n", total, used);
    return RC_OK;
}

int test_data_room(char *resp) {
    double total = 0, data_mb = 0;
    data_total_gb(total);  // a failure answers a total of 0
    if (tf_data_list *list = get_tf_data_file_list(get_tfdata_type(0))) {
        data_mb = static_cast<double>(get_tf_data_file_size(list)) * kBytesToMb;
        tf_data_list_free(list);
    }
    body_printf(resp, "\r\n\"%.2f,%.3f\"\r\n", total, data_mb);
    return RC_OK;
}

// The flash's life-time estimates, A and B: eMMC keeps them under the block device, UFS
// under its own node directory, with two naming schemes.
struct LifeNodes {
    const char *a, *b;
};

LifeNodes life_nodes() {
    if (!dev::exists("sys/ufs/ufsid"))
        return {"/sys/class/block/mmcblk0/device/dev_left_time_a", "/sys/class/block/mmcblk0/device/dev_left_time_b"};
    return {dev::exists("/sys/ufs/DeviceLifeTimeEstA") ? "/sys/ufs/DeviceLifeTimeEstA" : "/sys/ufs/life_time_a",
            dev::exists("/sys/ufs/DeviceLifeTimeEstB") ? "/sys/ufs/DeviceLifeTimeEstB" : "/sys/ufs/life_time_b"};
}

int ddr_start(char *cmd, char *resp) {
    // Fields: "AT+QXDDR=1", the seconds, and one more that the station always sends.
    std::vector<std::string_view> fields = comma_fields(cmd);
    std::string_view secs = fields.size() >= 3 ? fields[1] : std::string_view{};
    bool digits = !secs.empty() && secs.size() <= kDdrSecondsMax &&
                  secs.find_first_not_of("0123456789") == std::string_view::npos;
    if (!digits) {
        LOGE("parameter error");
        body_printf(resp, "parameter error");
        return RC_ERROR;
    }
    char ps[1024] = {0};
    ext_system("ps|grep stressapptest", ps, sizeof ps);
    if (strstr(ps, "stressapptest") != nullptr) {
        LOGI("running");
        return RC_OK;
    }
    // Half of the memory in megabytes: the rest is left to the system while it runs.
    long long bytes = static_cast<long long>(dev::sysconf(_SC_PHYS_PAGES)) * dev::sysconf(_SC_PAGESIZE);
    long long megabytes = bytes / 0x200000;
    char command[256];
    snprintf(command, sizeof command, "/vendor/bin/stressapptest -s %.*s -M %lld -W > %s&", static_cast<int>(secs.size()),
             secs.data(), megabytes, kDdrLog);
    LOGI("%s", command);
    dev::shell(command);
    dev::sync();
    return RC_OK;
}

int ddr_result(char *resp) {
    int passed = 1;
    if (FILE *f = dev::fopen(kDdrLog, "r")) {
        char line[256];
        while (fgets(line, sizeof line, f) != nullptr) {
            if (strstr(line, "Hardware Error") != nullptr) {
                passed = 0;
                break;
            }
        }
        fclose(f);
    }
    body_printf(resp, "\"%d\"", passed);
    return RC_OK;
}

// The boot loader's DDR training leaves its verdict on the kernel command line.
int ddr_boot_check(char *resp) {
    char text[4097];
    if (!read_node("/proc/cmdline", text, sizeof text)) return RC_ERROR;
    if (strstr(text, "DDR_CHECK=OK") != nullptr) return RC_OK;
    if (const char *at = strstr(text, "DDR_CHECK")) body_printf(resp, "%.30s", at);
    return RC_ERROR;
}

int otg_enable(char *cmd) {
    const char *comma = strchr(cmd, ',');
    if (comma == nullptr || comma[1] == '\0') return invalid_command(cmd);
    char message[kOtgMessageSize];
    snprintf(message, sizeof message, "otg_test 1 %s", comma + 1);
    return test_app_ok(message) ? RC_OK : RC_ERROR;
}

int otg_state(char *resp) {
    const char *reply = ask_test_app("otg_test 0");
    if (reply == nullptr || reply[0] == '\0') return RC_ERROR;
    quote_body(resp, strcmp(reply, "ok") == 0 ? "otg:1" : "otg:0");
    return RC_OK;
}

int otg_device_start(char *cmd, char *resp) {
    const char *comma = strchr(cmd, ',');
    long long seconds = 0;
    // Read as atoi reads it, range-checked so that a huge count cannot wrap round into it.
    if (comma == nullptr || !leading_number(comma + 1, 1, kOtgSecondsMax, &seconds)) {
        quote_reason(resp, "para error");
        return RC_ATNG;
    }
    if (!test_app_ok("otg_test enable")) {
        quote_reason(resp, "open otg error");
        return RC_ATNG;
    }
    int *arg = new (std::nothrow) int(static_cast<int>(seconds));
    if (arg == nullptr) return RC_ATNG;
    ++g_otg_checks;
    pthread_t t;
    if (pthread_create(&t, nullptr, otg_device_check_thread, arg) != 0) {
        LOGE("start otg_device_check_thread failed");
        --g_otg_checks;
        delete arg;
        return RC_ATNG;
    }
    return RC_ATOK;
}

int otg_device_result(char *resp) {
    char value[PROPERTY_VALUE_MAX] = {0};
    property_get(kOtgProperty, value, "-1");
    if (value[0] == '1') return RC_ATOK;
    quote_reason(resp, value);
    return RC_ATNG;
}

// A USB stick or keyboard shows as an interface line naming its driver.
bool otg_device_seen(bool &opened) {
    FILE *f = dev::fopen(kUsbDevices, "r");
    opened = f != nullptr;
    if (f == nullptr) return false;
    char line[256];
    bool seen = false;
    while (!seen && fgets(line, sizeof line, f) != nullptr)
        seen = strstr(line, "Driver=usb-storage") != nullptr || strstr(line, "Driver=usbhid") != nullptr;
    fclose(f);
    return seen;
}

}  // namespace

void *otg_device_check_thread(void *arg) {
    int tries = *static_cast<int *>(arg);
    delete static_cast<int *>(arg);
    pthread_detach(pthread_self());
    LOGI("Start: %d tries", tries);
    property_set(kOtgProperty, "0");
    for (int i = 0; i < tries; ++i) {
        std::this_thread::sleep_for(std::chrono::seconds(1));
        bool opened = false;
        if (otg_device_seen(opened)) {
            property_set(kOtgProperty, "1");
            break;
        }
        if (!opened) {
            LOGE("open %s fail: %s", kUsbDevices, strerror(errno));
            break;
        }
    }
    LOGI("Exit");
    --g_otg_checks;
    return nullptr;
}

int otg_checks_running() { return g_otg_checks.load(); }

int check_tcard_handler(char *cmd, int arg, char *resp) {
    if (!line_is(cmd, "AT+QXSD=0")) return invalid_command(cmd);
    char mounts[4097];
    if (!read_node("/proc/mounts", mounts, sizeof mounts)) {
        LOGE("read /proc/mounts failed");
        return RC_ERROR;
    }
    return strstr(mounts, "mnt/shell/emulated") || strstr(mounts, "/storage/emulated") ? RC_OK : RC_ERROR;
}

int sdcard_rw_test_handler(char *cmd, int arg, char *resp) {
    if (!line_is(cmd, "AT+QXTFWR=0")) return invalid_command(cmd);
    if (kaelatcmd_fwrite_system_file(kRwTestCard, "w+", kRwTestText) != 0) {
        LOGE("create %s fail: %s", kRwTestCard, strerror(errno));
        quote_reason(resp, "create /storage/sdcard1/sdcard_rw_test fail");
        return RC_ERROR;
    }
    kaelatcmd_remove_system_file(kRwTestCard);
    return RC_OK;
}

int check_otg_handler(char *cmd, int arg, char *resp) {
    if (line_starts(cmd, "AT+QXOTG=1", 10)) return otg_enable(cmd);
    if (line_is(cmd, "AT+QXOTG=0")) return otg_state(resp);
    if (strncmp(cmd, "AT+QX_OTG_DEV=1", 15) == 0) return otg_device_start(cmd, resp);
    if (line_is(cmd, "AT+QX_OTG_DEV=0")) return otg_device_result(resp);
    return invalid_command(cmd);
}

int sdcard_access_on_handler(char *cmd, int arg, char *resp) {
    if (!line_is(cmd, "AT+QXUDWR=0")) return invalid_command(cmd);
    if (kaelatcmd_fwrite_system_file(kRwTestShared, "w+", kRwTestText) != 0) {
        body_printf(resp, "\"error:%s\"", strerror(errno));
        return RC_ERROR;
    }
    // The card's test file goes, not this one; stations have always seen it so.
    kaelatcmd_remove_system_file(kRwTestCard);
    return RC_OK;
}

int sdcard_size_on_handler(char *cmd, int arg, char *resp) {
    if (line_is(cmd, "AT+QXUDROOM=0")) return data_room(resp);
    if (line_is(cmd, "AT+QXUDROOM=1")) return test_data_room(resp);
    return invalid_command(cmd);
}

int sdcard_handler(char *cmd, int arg, char *resp) {
    if (line_is(cmd, "AT+OMENU=1,1")) {
        // Mass storage is offered only when there is something on the shared storage.
        if (dev::list_dir("/sdcard").empty()) {
            LOGE("/sdcard is empty or missing");
            return RC_ERROR;
        }
        return test_app_ok("change_usb_mass 1") ? RC_OK : RC_ERROR;
    }
    if (line_is(cmd, "AT+OMENU=0,1")) return test_app_ok("change_usb_mass 0") ? RC_OK : RC_ERROR;
    return invalid_command(cmd);
}

int get_emmc_left_handler(char *cmd, int arg, char *resp) {
    if (!line_is(cmd, "AT+EMMCLEFT=0")) return invalid_command(cmd);
    char result[16] = "0x000000";
    LifeNodes nodes = life_nodes();
    char a[12], b[12];
    bool opened_a = read_line(nodes.a, a, sizeof a);
    bool opened_b = read_line(nodes.b, b, sizeof b);
    if (!opened_a && !opened_b) {
        LOGE("open fail : %s", nodes.a);
        return RC_ERROR;
    }
    const char *chosen = a[0] && b[0] ? (strcmp(a, b) >= 0 ? a : b) : a[0] ? a : b;
    LOGI("life time a:%s b:%s", a, b);
    // The two digits after "0x". A text too short to hold them says nothing about the
    // flash, and the phone must not pass on it.
    char *digits = get_substring(chosen, 2, 2);
    bool enough = digits != nullptr && digits[0] != '\0' && strcmp(digits, "04") <= 0;
    if (digits != nullptr) strncat(result, digits, 2);
    free(digits);
    body_printf(resp, enough ? "%s\r\rPass" : "%s\r\rNot Enough", result);
    return enough ? RC_OK : RC_ERROR;
}

int sdcard_cali(char *cmd, int arg, char *resp) {
    quote_reason(resp, "Not support!");
    return RC_ERROR;
}

int emmcfw_handler(char *cmd, int arg, char *resp) {
    if (line_is(cmd, "AT+EMMCFW=0")) {
        // Only one maker's chips (manufacturer id 0x15) have a firmware known to be bad.
        char cid[120];
        read_line("/sys/block/mmcblk0/device/cid", cid, sizeof cid);
        if (strncmp(cid, "15", 2) != 0) return RC_OK;
        char fw[121];
        if (!read_node("/sys/block/mmcblk0/device/firmware_version", fw, sizeof fw)) {
            LOGE("open fail : %s", strerror(errno));
            return RC_ERROR;
        }
        return strstr(fw, "0x00000012") != nullptr ? RC_OK : RC_ERROR;
    }
    if (line_is(cmd, "AT+EMMCFW=1")) {
        const char *node = dev::exists("/sys/block/sda/device/rev") ? "/sys/block/sda/device/rev"
                                                                     : "/sys/block/mmcblk0/device/firmware_version";
        char fw[121];
        if (!read_node(node, fw, sizeof fw)) {
            LOGE("open fail : %s", node);
            return RC_ERROR;
        }
        body_printf(resp, "\"%s\"\n", fw);
        return RC_OK;
    }
    if (line_is(cmd, "AT+QX_EMMC_TLC=1")) {
        char status[21];
        if (!read_node("/sys/kernel/debug/mmc0/bkops_status", status, sizeof status)) {
            body_printf(resp, "\"open bkops_status error : %s\"", strerror(errno));
            return RC_ATNG;
        }
        body_printf(resp, "\"%c\"\n", status[0]);
        return RC_ATOK;
    }
    if (line_is(cmd, "AT+QX_EMMC_BOM=1")) {
        char maker[64] = {0}, bom[64] = {0};
        bool ok = get_emmc_manufacture(maker) == 0;
        ok = get_emmc_bom(bom) == 0 && ok;
        body_printf(resp, "\"MANUFACTURER:%s,BOM:%s\"\n", maker, bom);
        return ok ? RC_ATOK : RC_ATNG;
    }
    return invalid_command(cmd);
}

int ddr_stress_test_handler(char *cmd, int arg, char *resp) {
    if (line_starts(cmd, "AT+QXDDR=1", 10)) return ddr_start(cmd, resp);
    if (line_is(cmd, "AT+QXDDR=0")) return ddr_result(resp);
    if (line_is(cmd, "AT+QXDDR=2")) return ddr_boot_check(resp);
    return invalid_command(cmd);
}

int otg_udrw_handler(char *cmd, int arg, char *resp) {
    LOGI("%s", cmd);
    if (line_is(cmd, "AT+QX_OTG_UDRW=1")) {
        const char *reply = ask_test_app("otg_udrw_test 1");
        if (reply == nullptr || strstr(reply, "error") != nullptr) return RC_ATERROR;
        quote_body(resp, reply);
        return RC_ATOK;
    }
    if (line_is(cmd, "AT+QX_OTG_UDRW=0")) {
        ask_test_app("otg_udrw_test 0");
        return RC_ATOK;
    }
    return RC_ATERROR;
}
