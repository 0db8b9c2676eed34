// The rest of the factory support library on the simulated phone: display and touch,
// storage, the camera service, NFC and text helpers. Scripts and settings live under
// <root>/.sim (config, camera.replies, shell.replies); every effect on the device is
// recorded in <root>/.sim/events.log and nothing runs on the host.
#include <errno.h>
#include <fcntl.h>

#include <algorithm>
#include <cctype>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <sstream>
#include <string>
#include <vector>

#include "platform/android.h"
#include "platform/device.h"
#include "platform/factory.h"
#include "platform/sim/script.h"
#include "platform/sim/sim.h"

namespace fs = std::filesystem;

struct tf_data_list {
    std::vector<std::string> files;  // host paths inside the sandbox
};

namespace {

thread_local std::string t_camera_reply;  // storage behind sendMessageToCamera's answer

std::string opt(const char *s) { return s ? s : ""; }

// Copies text into a C buffer of size bytes, cut to fit; the count copied.
int put(char *buf, int size, const std::string &text) {
    if (!buf || size <= 0) return 0;
    size_t n = std::min(text.size(), static_cast<size_t>(size - 1));
    memcpy(buf, text.data(), n);
    buf[n] = '\0';
    return static_cast<int>(n);
}

std::vector<std::string> split(const std::string &s, char sep) {
    std::vector<std::string> out;
    std::string cur;
    std::istringstream in(s);
    while (std::getline(in, cur, sep)) out.push_back(cur);
    return out;
}

// ---- the shell behind ext_system

// ext_system also takes commands with their stderr folded in or sent to the background.
std::string unwrap(const std::string &command) {
    std::string c = sim::shell_unwrap(command);
    for (size_t at; (at = c.find("2>&1")) != std::string::npos;) c.erase(at, 4);
    while (!c.empty() && (c.back() == ' ' || c.back() == '&')) c.pop_back();
    return c;
}

std::string base(const std::string &prog) {
    size_t slash = prog.rfind('/');
    return slash == std::string::npos ? prog : prog.substr(slash + 1);
}

// du -sk: kilobytes under a path of the sandbox.
std::string disk_usage(const std::string &device_path) {
    std::error_code ec;
    fs::path p = sim::map(device_path.c_str());
    if (!fs::exists(p, ec)) return "";
    unsigned long long bytes = 0;
    if (fs::is_regular_file(p, ec)) {
        bytes = fs::file_size(p, ec);
    } else {
        for (auto it = fs::recursive_directory_iterator(p, ec); !ec && it != fs::recursive_directory_iterator(); it.increment(ec))
            if (it->is_regular_file(ec)) bytes += it->file_size(ec);
    }
    return std::to_string((bytes + 1023) / 1024) + "\t" + device_path + "\n";
}

// btnvtool -b B0.B1.B2.B3.B4.B5 stores the Bluetooth address as item 1 of the
// persist NV file, least significant byte first, keeping every other item.
void btnvtool(const std::vector<std::string> &w) {
    if (w.size() < 3 || w[1] != "-b") return;
    std::vector<std::string> parts = split(w[2], '.');
    if (parts.size() != 6) return;
    std::string addr;
    for (const auto &p : parts) addr += static_cast<char>(strtoul(p.c_str(), nullptr, 16));
    std::string file = sim::map("/mnt/vendor/persist/bluetooth/.bt_nv.bin"), old, out;
    std::error_code ec;
    fs::create_directories(fs::path(file).parent_path(), ec);
    sim::read_file(file, old);
    bool done = false;
    for (size_t i = 0; i + 3 <= old.size();) {
        size_t len = static_cast<unsigned char>(old[i + 2]);
        std::string item = old.substr(i, 3 + len);
        if (old[i] == 1 && !done) {
            item = std::string{1, old[i + 1], 6} + addr;
            done = true;
        }
        out += item;
        i += 3 + len;
    }
    if (!done) out += std::string{1, 0, 6} + addr;
    sim::write_file_atomic(file, out);
}

// One stage of a command line; only the programs below give output or act.
std::string run_stage(const std::vector<std::string> &w, const std::string &input, bool first) {
    std::string prog = base(w[0]), out;
    if (!first) {
        if (prog != "grep" || w.size() < 2) return input;
        std::istringstream in(input);
        for (std::string l; std::getline(in, l);)
            if (l.find(w.back()) != std::string::npos) out += l + "\n";
        return out;
    }
    if (prog == "echo") {
        for (size_t i = 1; i < w.size(); ++i) out += (i > 1 ? " " : "") + w[i];
        return out + "\n";
    }
    if (prog == "cat") {
        for (size_t i = 1; i < w.size(); ++i) {
            std::string part;
            if (sim::read_file(sim::map(w[i].c_str()), part)) out += part;
        }
        return out;
    }
    if (prog == "du" && w.size() >= 2) return disk_usage(w.back());
    if (prog == "ps") {
        return "USER           PID  PPID     VSZ    RSS WCHAN            ADDR S NAME\n"
               "root             1     0 10871512  8968 0                   0 S init\n"
               "root           612     1 10800160  4436 0                   0 S ftcmd\n";
    }
    if (prog == "bdt" && w.size() >= 2) {
        // The controller's test mode shows in the property that AT+EMBT=4 reads.
        if (w[1] == "entrydut" || w[1] == "txcontinuous") property_set("bluetooth.bdt.kaeldut", "true");
        if (w[1] == "exitdut") property_set("bluetooth.bdt.kaeldut", "false");
        return "";
    }
    if (prog == "btnvtool") btnvtool(w);
    return "";
}

}  // namespace

extern "C" {

// ---- display and touch

int minui_gr_fb_blank_second(int blank) {
    sim::record("fb", "second blank " + std::to_string(blank));
    return 0;
}

int get_max_brightness(const char *path) {
    std::string text;
    if (!dev::read_node(path, text, 32) || text.empty()) return -1;
    return atoi(text.c_str());
}

// The panel's test writes its verdict where the result queries look for it.
int touchpanel_sensor_test(int count, const char *item) {
    std::string code = opt(item);
    int rc = sim::fault("touchpanel") ? -1 : static_cast<int>(sim::script_long(sim::state("config"), "touchpanel_test", 0));
    const char *file = code == "165"   ? "/data/engineermode/tp_at_sensor_cali"
                       : code == "166" ? "/data/engineermode/tp_at_sensor_test"
                       : code == "167" ? "/data/engineermode/tp_at_sensor_cali_back"
                       : code == "168" ? "/data/engineermode/tp_at_sensor_test_back"
                                       : nullptr;
    if (file) dev::write_node(file, rc == 0 ? "Pass\n" : "Fail\n", O_WRONLY | O_CREAT | O_TRUNC);
    sim::record("touchpanel", "sensor_test count=" + std::to_string(count) + " item=" + code + " -> " + std::to_string(rc));
    return rc;
}

// ---- storage

int ext_system(const char *command, char *buf, int size) {
    std::string cmd = opt(command);
    if (sim::fault("ext-system")) {
        sim::record("shell", cmd + " (failed)");
        return -1;
    }
    std::string c = unwrap(cmd), out;
    if (sim::script_reply(sim::state("shell.replies"), c, out)) {
        sim::record("shell", cmd);
    } else if (c.find('>') != std::string::npos) {
        dev::shell(c.c_str());  // redirections are emulated, and recorded, by the shell itself
    } else {
        sim::record("shell", cmd);
        bool first = true;
        for (const auto &stage : split(c, '|')) {
            std::vector<std::string> w = sim::shell_words(stage);
            if (w.empty()) continue;
            out = run_stage(w, out, first);
            first = false;
        }
    }
    if (out.empty()) return 0;  // the caller's preset text stays
    return put(buf, size, out);
}

struct tf_data_list *get_tf_data_file_list(int type) {
    std::string dir = sim::config("tfdata_dir", "/storage/sdcard1/TestData");
    auto *list = new tf_data_list;
    std::error_code ec;
    for (auto it = fs::recursive_directory_iterator(sim::map(dir.c_str()), ec); !ec && it != fs::recursive_directory_iterator();
         it.increment(ec))
        if (it->is_regular_file(ec)) list->files.push_back(it->path().string());
    if (list->files.empty()) {
        delete list;
        return nullptr;
    }
    return list;
}

long long get_tf_data_file_size(struct tf_data_list *list) {
    if (!list) return 0;
    long long bytes = 0;
    std::error_code ec;
    for (const auto &f : list->files) {
        auto n = fs::file_size(f, ec);
        if (!ec) bytes += static_cast<long long>(n);
    }
    return bytes;
}

void tf_data_list_free(struct tf_data_list *list) { delete list; }

int get_emmc_manufacture(char *buf) {
    std::string v = sim::config("emmc_manufacturer");
    if (v.empty() || sim::fault("emmc-bom")) return -1;
    put(buf, 64, v);
    return 0;
}

int get_emmc_bom(char *buf) {
    std::string v = sim::config("emmc_bom");
    if (v.empty() || sim::fault("emmc-bom")) return -1;
    put(buf, 64, v);
    return 0;
}

// ---- camera service

const char *sendMessageToCamera(const char *message) {
    std::string msg = opt(message);
    if (sim::fault("camera")) t_camera_reply = "fail#camera service not available";
    else if (!sim::script_reply(sim::state("camera.replies"), msg, t_camera_reply)) t_camera_reply = "fail#no reply scripted";
    sim::record("camera", msg + " -> " + t_camera_reply);
    return t_camera_reply.c_str();
}

int get_camera_info_code(const char *kind, const char *camera, char *buf, int len) {
    std::string v = sim::config(("camera_sn." + opt(camera)).c_str());
    if (opt(kind) != "sn_code" || v.empty() || sim::fault("camera")) {
        put(buf, len, "");
        return -1;
    }
    put(buf, len, v);
    return 0;
}

// AT+QX_CCM_PDAF=1,rear becomes "eng_AT_camera#qx_ccm_pdaf#1#rear"; the item name of a
// command comes from config ("camera_item.AT+QX_CCM_PDAF=...").
int transform_at_cmd_to_camera_info(const char *command, char *msg, int msg_len, char *item) {
    std::string c = opt(command);
    size_t eq = c.find('=');
    if (item) item[0] = '\0';
    if (eq == std::string::npos || c.compare(0, 3, "AT+") != 0 || sim::fault("camera-transform")) return -1;
    std::string name = c.substr(3, eq - 3), args = c.substr(eq + 1), m = "eng_AT_camera#";
    for (char ch : name) m += static_cast<char>(tolower(static_cast<unsigned char>(ch)));
    for (char ch : args) m += ch == ',' ? '#' : ch;
    put(msg, msg_len, m);
    std::string upper;
    for (char ch : c.substr(0, eq)) upper += static_cast<char>(toupper(static_cast<unsigned char>(ch)));
    put(item, CAMERA_ITEM_NAME_SIZE, sim::config(("camera_item." + upper).c_str()));
    return 0;
}

// A passing reply "success#action#key value#..." gives a line "+key:value" per field.
int transform_camera_ret_to_at_resp(const char *reply, char *body, int len) {
    std::string r = opt(reply), out;
    if (r.find("success") == std::string::npos) {
        put(body, len, "\"" + r + "\"");
        return 8;
    }
    std::vector<std::string> f = split(r, '#');
    for (size_t i = 2; i < f.size(); ++i) {
        size_t sp = f[i].find(' ');
        out += "\r\n\"+" + f[i].substr(0, sp) + ":" + (sp == std::string::npos ? "" : f[i].substr(sp + 1)) + "\"\r\n";
    }
    put(body, len, out);
    return 7;
}

int is_support_new_camera_interface(void) { return sim::config("camera_new_interface", "1") == "1"; }

int is_support_target_camera(int facing, const char *role) {
    std::string want = std::string(facing == 1 ? "front:" : "rear:") + opt(role);
    for (const auto &c : split(sim::config("cameras"), ','))
        if (c == want) return 1;
    return 0;
}

// The OTP verdict of a camera is the value of its status property ("1" good, the
// default); the body gets one "name:pass" or "name:fail" line per camera.
int get_target_camera_otp_status(char *body, int len, const char *property) {
    char value[PROPERTY_VALUE_MAX];
    property_get(opt(property).c_str(), value, "1");
    bool good = strcmp(value, "1") == 0;
    std::string name = opt(property);
    for (const char *cut : {"sys.camera.", "_otp_status"}) {
        size_t at = name.find(cut);
        if (at != std::string::npos) name.erase(at, strlen(cut));
    }
    if (body && len > 0) {
        std::string text = body;
        text += name + (good ? ":pass\r\n" : ":fail\r\n");
        put(body, len, text);
    }
    return good;
}

// ---- NFC

int kaelatcmd_getCPLC(int mode) {
    int rc = sim::fault("cplc") ? -1 : 0;
    sim::record("nfc", "getCPLC " + std::to_string(mode) + " -> " + std::to_string(rc));
    return rc;
}

char *substring(char *text) {
    if (!text) return text;
    auto trimmed = [](char c) { return c == ' ' || c == '"' || c == '\t' || c == '\r' || c == '\n'; };
    size_t len = strlen(text), start = 0;
    while (start < len && trimmed(text[start])) ++start;
    while (len > start && trimmed(text[len - 1])) --len;
    memmove(text, text + start, len - start);
    text[len - start] = '\0';
    return text;
}

bool is_hex_string(const char *text) {
    if (!text || !*text) return false;
    for (const char *p = text; *p; ++p)
        if (!isxdigit(static_cast<unsigned char>(*p))) return false;
    return true;
}

// ---- more text helpers

bool isDigitValue(const char *text) {
    if (!text || !*text) return false;
    for (const char *p = text; *p; ++p)
        if (!isdigit(static_cast<unsigned char>(*p))) return false;
    return true;
}

void uppercase_to_lowcase(char *text, int len) {
    if (!text) return;
    for (int i = 0; i < len && text[i]; ++i) text[i] = static_cast<char>(tolower(static_cast<unsigned char>(text[i])));
}

char *get_substring(const char *text, int start, int len) {
    if (!text || start < 0 || len < 0) return nullptr;
    size_t total = strlen(text);
    if (static_cast<size_t>(start) > total) return nullptr;
    size_t n = std::min(total - static_cast<size_t>(start), static_cast<size_t>(len));
    char *out = static_cast<char *>(malloc(n + 1));
    if (!out) return nullptr;
    memcpy(out, text + start, n);
    out[n] = '\0';
    return out;
}

}  // extern "C"
