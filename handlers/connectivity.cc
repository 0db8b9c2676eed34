// Bluetooth, GPS and WLAN address commands: the Bluetooth controller's test mode and its
// device address, the modem-side GPS engine and its value stream, the WLAN MAC file of the
// four Wi-Fi interfaces, and the Wi-Fi transmit antenna chain. Addresses are written in
// the byte order each consumer wants: btnvtool takes the Bluetooth address least
// significant byte first, the station sends and reads it most significant first.
#include <pthread.h>
#include <unistd.h>

#include <strings.h>

#include <algorithm>
#include <array>
#include <atomic>
#include <cctype>
#include <cerrno>
#include <chrono>
#include <cstdio>
#include <cstring>
#include <string>
#include <string_view>
#include <thread>
#include <vector>

#include "core/command_tables/handlers.h"
#include "core/port_state.h"
#include "core/response.h"
#include "core/workers.h"
#include "handlers/common.h"
#include "handlers/connectivity.h"
#include "platform/android.h"
#include "platform/device.h"
#include "platform/factory.h"
#include "platform/log.h"
#include "platform/modem.h"

char g_antsel_cmd[kAntselCmdSize] = {};

namespace {

constexpr const char *kBtNvFile = "/mnt/vendor/persist/bluetooth/.bt_nv.bin";
constexpr const char *kBtDeviceFile = "/data/vendor/engineermode/bt_device";
constexpr const char *kBtTestModeProp = "bluetooth.bdt.kaeldut";
constexpr int kBtAddressItem = 1;
constexpr int kBtDeviceLines = 5;
// ext_system's output buffer: the answers here never show it, but the tool needs room.
constexpr int kShellOutputSize = 256;

constexpr std::array<const char *, 2> kWlanMacFiles = {"/persist/wlan_mac.bin", "/mnt/vendor/persist/wlan_mac.bin"};
constexpr size_t kWlanMacFileSize = 120;  // four lines of 29 bytes fit
constexpr size_t kWlanMacLineMax = 1023;
constexpr size_t kMacDigits = 12;

constexpr int kGpsReplySize = ZDR_GPS_REPLY_SIZE;
constexpr auto kGpsPeriod = std::chrono::milliseconds(300);

// ---- Bluetooth NV file

// One item of the Bluetooth NV file: a 3-byte header (id, a second byte kept as it is,
// payload length) and the first payload bytes, enough for the address.
struct BtNvItem {
    int32_t id;
    int32_t second;
    uint8_t length;
    std::array<uint8_t, 6> payload;
};

// Reads every item of the file; the count, or -1 when it cannot be opened. A payload read
// that falls short is logged and reading goes on with the next header, as the file's own
// tools do.
int bt_nv_read(std::vector<BtNvItem> &items) {
    FILE *f = dev::fopen(kBtNvFile, "rb");
    if (f == nullptr) {
        LOGE("BT-NV-READ: Open of firmware file failed");
        return -1;
    }
    unsigned char header[3];
    while (fread(header, 1, sizeof header, f) == sizeof header) {
        BtNvItem item{header[0], header[1], header[2], {}};
        std::array<uint8_t, 255> payload{};
        if (fread(payload.data(), 1, item.length, f) != item.length) LOGE("BT-NV-READ: fread failed !!! ");
        std::copy_n(payload.begin(), item.payload.size(), item.payload.begin());
        items.push_back(item);
    }
    fclose(f);
    return static_cast<int>(items.size());
}

// A hexadecimal digit's value as the address tool has always taken it: the low four bits
// after moving "A" and above down by 7. Nothing is refused.
uint8_t nibble(char c) {
    int code = static_cast<unsigned char>(c);
    if (code >= 'A') code -= 7;
    return static_cast<uint8_t>(code & 0x0f);
}

// AT+EMBT=0,BT,<12 hex digits, most significant first>.
int write_bt_address(const char *cmd, char *resp) {
    std::vector<std::string_view> f = comma_fields(cmd);
    if (f.size() < 3) {
        LOGE("bt_addr is NULL");
        return RC_ERROR;
    }
    // Digits missing from a short address count as zero rather than reading past the field.
    std::array<char, kMacDigits> digits{};
    std::copy_n(f[2].begin(), std::min(f[2].size(), digits.size()), digits.begin());
    std::array<uint8_t, 6> b{};
    for (size_t i = 0; i < b.size(); ++i) b[i] = static_cast<uint8_t>(nibble(digits[2 * i]) << 4 | nibble(digits[2 * i + 1]));
    char command[64];
    snprintf(command, sizeof command, "btnvtool -b %02X.%02X.%02X.%02X.%02X.%02X", b[5], b[4], b[3], b[2], b[1], b[0]);
    char output[kShellOutputSize] = {};
    ext_system(command, output, sizeof output);
    if (dev::access(kBtNvFile, F_OK) != 0) {
        quote_reason(resp, strerror(errno));
        return RC_ERROR;
    }
    return RC_OK;
}

int read_bt_address(char *resp) {
    std::vector<BtNvItem> items;
    if (bt_nv_read(items) < 0) {
        LOGE("BT-NV-CMD: Read from NV persist failed");
        return RC_ERROR;
    }
    for (const BtNvItem &item : items) {
        if (item.id != kBtAddressItem) continue;
        const auto &p = item.payload;
        body_printf(resp, "+EMBT: \"%02X%02X%02X%02X%02X%02X\"", p[5], p[4], p[3], p[2], p[1], p[0]);
        return RC_OK;
    }
    LOGE("BT-NV-CMD: no address item");  // nothing true could be printed
    return RC_ERROR;
}

bool bt_test_mode_on() {
    char value[PROPERTY_VALUE_MAX] = {};
    kaelatcmd_get_system_property(kBtTestModeProp, value, "");
    if (strstr(value, "true") != nullptr) return true;
    LOGE("is not enter BT ftm Test mode");
    return false;
}

// The arguments go to the shell, so only what a transmit test takes is passed on: a
// station line must never become a second shell command.
bool safe_shell_argument(std::string_view arg) {
    for (char c : arg)
        if (!isalnum(static_cast<unsigned char>(c)) && !strchr(" ._-", c)) return false;
    return true;
}

// AT+EMBT=1[,<args>]: the controller's test mode, or a continuous transmission.
int enter_bt_test_mode(const char *cmd) {
    std::vector<std::string_view> f = comma_fields(cmd);
    char command[kShellOutputSize];
    if (f.size() >= 2) {
        std::string_view args = without_line_end(f[1]);
        if (!safe_shell_argument(args)) return invalid_command(cmd);
        snprintf(command, sizeof command, "/system/bin/bdt txcontinuous %.*s 2>&1", static_cast<int>(args.size()), args.data());
    } else {
        snprintf(command, sizeof command, "/system/bin/bdt entrydut 2>&1");
    }
    char output[kShellOutputSize] = {};
    ext_system(command, output, sizeof output);
    return bt_test_mode_on() ? RC_OK : RC_ERROR;
}

int leave_bt_test_mode() {
    dev::shell("/system/bin/sh -c \"/system/bin/bdt exitdut\"");
    char state[PROPERTY_VALUE_MAX] = {};
    kaelatcmd_get_system_property("init.svc.cnss-daemon", state, "0");
    if (strncmp(state, "running", 7) != 0) dev::shell("/system/bin/sh -c \"start cnss-daemon\"");
    return RC_OK;
}

// AT+EMBT=7: the devices the test app found, one per line.
int list_bt_devices(char *resp) {
    FILE *f = dev::fopen(kBtDeviceFile, "r");
    if (f == nullptr) {
        LOGE("fail to open bt_device");
        return RC_ERROR;
    }
    std::string body;
    char line[256];
    for (int i = 0; i < kBtDeviceLines && fgets(line, sizeof line, f) != nullptr; ++i) {
        size_t n = strlen(line);
        if (n > 0 && line[n - 1] == '\n') line[n - 1] = '\0';
        body += i == 0 ? "\r\n" : "";
        body += line;
        body += "\r\n";
    }
    fclose(f);
    body_printf(resp, "%s", body.c_str());
    return RC_OK;
}

// ---- GPS

// The worker and the handler share these without the dispatch mutex; AT+QXGPS=0 ends the
// worker's generation, so a stream started again at once never has two workers.
std::atomic<bool> g_gps_opened{false};
std::atomic<bool> g_gps_streaming{false};
std::atomic<bool> g_gps_worker{false};  // a worker id is recorded
WorkerGeneration g_gps_generation;

bool gps_request(int option, char *reply) {
    zdr_gps_option_req req{option};
    return qmi_zdr_gps_option_msg(&req, reply) == 0;
}

void *update_gps_value_thread(void *arg) {
    // Nobody joins a stream worker: detached, its stack goes back when it ends instead of
    // piling up with every AT+QXGPS=2 of a long shift.
    pthread_detach(pthread_self());
    LOGI("Start");
    wait_for_current_answer();
    while (g_gps_streaming && g_gps_generation.current(arg)) {
        char reply[kGpsReplySize] = {};
        bool sent = gps_request(2, reply);
        writeDataToSerial(reply, static_cast<int>(strnlen(reply, sizeof reply)));
        if (!sent) {
            LOGE("send qmi msg fail");
            break;  // the recorded id stays until AT+QXGPS=0
        }
        std::this_thread::sleep_for(kGpsPeriod);
    }
    LOGI("Exit");
    return nullptr;
}

// The screen must stay on while a station watches the GPS test; in AT mode there is none.
bool keep_screen_on_for_gps() {
    if (is_sp) return true;
    if (test_app_ok("keep_screen_on 2")) return true;
    LOGE("keep screen on error!");
    return false;
}

int gps_open(int option) {
    if (!keep_screen_on_for_gps()) return RC_ERROR;
    if (g_gps_opened) {
        LOGI("gps has open");
        return RC_OK;
    }
    LOGI("gps first  open");
    if (!gps_request(option, nullptr)) {
        LOGE("send qmi msg fail");
        return RC_ERROR;
    }
    g_gps_opened = true;
    return RC_OK;
}

int gps_close() {
    LOGI("gps first close");
    if (!gps_request(0, nullptr)) {
        LOGE("send qmi msg fail");
        return RC_ERROR;
    }
    g_gps_opened = false;
    g_gps_streaming = false;
    g_gps_worker = false;
    g_gps_generation.end();
    return RC_OK;
}

int gps_stream() {
    g_gps_streaming = true;
    if (g_gps_worker) return RC_OK;
    int rc = start_worker(update_gps_value_thread, g_gps_generation.now());
    if (rc != 0) {
        LOGE("fail to create adc_test_thread errno:%d", rc);
        return RC_ERROR;
    }
    g_gps_worker = true;
    return RC_OK;
}

int gps_result(int option, char *resp) {
    if (!keep_screen_on_for_gps()) return RC_ERROR;
    char reply[kGpsReplySize] = {};
    if (!gps_request(option, reply)) {
        LOGE("send qmi msg fail");
        return RC_ERROR;
    }
    if (strcasecmp(reply, "NG") == 0) {
        LOGE("qmi return NG");
        return RC_ATNG;
    }
    body_printf(resp, "%.*s", static_cast<int>(strnlen(reply, sizeof reply)), reply);
    return RC_OK;
}

// ---- WLAN MAC file

int read_wlan_mac(char *resp) {
    FILE *f = nullptr;
    for (const char *file : kWlanMacFiles) {
        if ((f = dev::fopen(file, "r")) != nullptr) break;
        LOGE("open file %s is not exist.", file);
    }
    if (f == nullptr) {
        quote_body(resp, "");
        return RC_ERROR;
    }
    std::array<char, kWlanMacLineMax + 1> line{};
    bool read = fgets(line.data(), static_cast<int>(line.size()), f) != nullptr;
    fclose(f);
    const char *eq = read ? strchr(line.data(), '=') : nullptr;
    if (eq == nullptr) {  // no address on the first line: answered as a missing file
        LOGE("no address in wlan mac file");
        quote_body(resp, "");
        return RC_ERROR;
    }
    body_printf(resp, "\"%.*s\"", static_cast<int>(kMacDigits), eq + 1);
    return RC_OK;
}

int hex_value(char c) {
    if (c >= '0' && c <= '9') return c - '0';
    if (c >= 'A' && c <= 'F') return c - 'A' + 10;
    if (c >= 'a' && c <= 'f') return c - 'a' + 10;
    return -1;
}

// The second interface's address: the first octet raised by 2, modulo 256.
bool second_interface_address(std::string &mac) {
    if (mac.size() < 2) return false;
    int high = hex_value(mac[0]), low = hex_value(mac[1]);
    if (high < 0 || low < 0) return false;
    if (low >= 14) high = (high + 1) % 16;
    low = (low + 2) % 16;
    constexpr char kDigits[] = "0123456789ABCDEF";
    mac[0] = kDigits[high];
    mac[1] = kDigits[low];
    return true;
}

// AT+QXWMAC=1,<mac>
int write_wlan_mac(const char *cmd, char *resp) {
    std::vector<std::string_view> f = comma_fields(cmd);
    if (f.size() < 2) {
        LOGE("The wlan addr is NULL");
        return RC_ERROR;
    }
    std::string field(f[1]);
    std::string mac(field.size() + 1, '\0');
    if (remove_double_quotes(field.c_str(), mac.data()) < 0) {
        LOGE("wrong format MAC:%s", field.c_str());
        return RC_ERROR;
    }
    mac.resize(without_line_end(mac.c_str()).size());
    // The file is read line by line: a line break in the address would add an interface.
    bool control = std::any_of(mac.begin(), mac.end(), [](char c) { return static_cast<unsigned char>(c) < 0x20; });
    std::string second = mac;
    if (control || !second_interface_address(second)) {
        LOGE("wrong format MAC:%s", field.c_str());
        return RC_ERROR;
    }
    // Each line holds the 12 address characters: a longer value must not push the last line
    // past the file's 120 bytes.
    char text[kWlanMacFileSize];
    snprintf(text, sizeof text,
             "Intf0MacAddress=%.12s\nIntf1MacAddress=%.12s\nIntf2MacAddress=%.12s\nIntf3MacAddress=%.12s\n",
             mac.c_str(), second.c_str(), mac.c_str(), mac.c_str());
    const char *written = nullptr;
    for (const char *file : kWlanMacFiles) {
        kaelatcmd_remove_system_file(file);
        if (write_policy_file(1, file, 66, text) >= 0) {
            written = file;
            break;
        }
        LOGE("create file %s failed", file);
    }
    if (written == nullptr) return RC_ERROR;
    int rc = dev::chown(written, 1000, 1000);
    int chown_errno = errno;
    char chmod[96];
    snprintf(chmod, sizeof chmod, "chmod 0664 %s", written);
    dev::shell(chmod);
    if (rc != 0) {
        quote_reason(resp, strerror(chown_errno));
        return RC_ERROR;
    }
    return RC_OK;
}

}  // namespace

// A text in double quotes must close them and gives what stands between; any other text is
// taken whole. out has room for the whole text.
int remove_double_quotes(const char *text, char *out) {
    size_t n = strlen(text);
    if (n > 0 && text[0] == '"') {
        if (n < 2 || text[n - 1] != '"') return -1;
        memcpy(out, text + 1, n - 2);
        out[n - 2] = '\0';
        return 0;
    }
    memcpy(out, text, n + 1);
    return 0;
}

int bt_handler(char *cmd, int arg, char *resp) {
    if (line_is(cmd, "AT+EMBT=5")) return read_bt_address(resp);
    if (line_is(cmd, "AT+EMBT=4")) return bt_test_mode_on() ? RC_OK : RC_ERROR;
    if (line_starts(cmd, "AT+EMBT=0,BT", 12)) return write_bt_address(cmd, resp);
    if (line_starts(cmd, "AT+EMBT=1", 9)) return enter_bt_test_mode(cmd);
    if (line_is(cmd, "AT+EMBT=2")) return leave_bt_test_mode();
    if (line_is(cmd, "AT+EMBT=6")) return test_app_ok("bluetooth on") ? RC_OK : RC_ERROR;
    if (line_is(cmd, "AT+EMBT=7")) return list_bt_devices(resp);
    if (line_is(cmd, "AT+EMBT=8")) return test_app_ok("bluetooth off") ? RC_OK : RC_ERROR;
    return invalid_command(cmd);
}

int gps_handler(char *cmd, int arg, char *resp) {
    if (line_is(cmd, "AT+QXGPS=1")) return gps_open(1);
    if (line_is(cmd, "AT+QXGPS=3")) return gps_open(3);
    if (line_is(cmd, "AT+QXGPS=0")) return gps_close();
    if (line_is(cmd, "AT+QXGPS=2") && g_gps_opened) return gps_stream();
    if (line_is(cmd, "AT+QXGPS=5")) return gps_result(5, resp);
    if (line_is(cmd, "AT+QXGPS=6")) return gps_result(6, resp);
    return invalid_command(cmd);
}

int wlan_addr_handler(char *cmd, int arg, char *resp) {
    if (line_is(cmd, "AT+QXWMAC=0")) return read_wlan_mac(resp);
    if (line_starts(cmd, "AT+QXWMAC=1", 11)) return write_wlan_mac(cmd, resp);
    return invalid_command(cmd);
}

int wifi_antsel_handler(char *cmd, int arg, char *resp) {
    const char *chain = line_is(cmd, "AT+QXWANT=0") ? "7" : line_is(cmd, "AT+QXWANT=1") ? "8" : nullptr;
    if (chain == nullptr) return invalid_command(cmd);
    snprintf(g_antsel_cmd, sizeof g_antsel_cmd, "/system/bin/sh -c \"iwpriv wlan0 ena_chain %s\"", chain);
    return RC_OK;
}

// The Wi-Fi RF test is not carried out by this daemon.
int wifi_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
