// The factory support library on the simulated phone. The NV record is the raw file
// <root>/.sim/nv.bin, the test app answers from the script <root>/.sim/testapp.replies,
// the hardware identity comes from <root>/.sim/config, and every effect on the device
// is recorded in <root>/.sim/events.log.
#include <errno.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string>

#include "platform/android.h"
#include "platform/device.h"
#include "platform/factory.h"
#include "platform/sim/chardev.h"
#include "platform/sim/script.h"
#include "platform/sim/sim.h"

namespace {

thread_local std::string t_reply;  // storage behind sendMessage's answer
thread_local std::string t_item;   // storage behind get_property_file_item_value

// "pkg/.Cls" and "pkg/full.Cls" name the same service as "pkg.Cls" and "full.Cls".
std::string component_class(const char *component) {
    std::string c = component ? component : "";
    size_t slash = c.find('/');
    if (slash == std::string::npos) return c;
    std::string pkg = c.substr(0, slash), cls = c.substr(slash + 1);
    return (!cls.empty() && cls[0] == '.') ? pkg + cls : cls;
}

bool services_edit(const std::string &cls, bool running) {
    std::string file = sim::state("services"), out;
    bool was = false;
    for (const auto &l : sim::read_lines(file)) {
        if (l == cls) was = true;
        else if (!l.empty()) out += l + "\n";
    }
    if (running) out += cls + "\n";
    sim::write_file_atomic(file, out);
    return was;
}

std::string opt(const char *s) { return s ? s : ""; }

}  // namespace

extern "C" {

// ---- properties and files

int kaelatcmd_get_system_property(const char *name, char *buf, const char *def) {
    return property_get(name, buf, def);
}

int kaelatcmd_set_system_property(const char *name, const char *value) { return property_set(name, value); }

int kaelatcmd_sizeof_system_file(const char *path) {
    struct stat st {};
    if (::stat(dev::path(path).c_str(), &st) != 0) return 0;
    return static_cast<int>(st.st_size);
}

int kaelatcmd_write_system_file(const char *path, int flags, const char *text) {
    int fd = dev::open(path, flags, 0666);
    if (fd < 0) return -1;
    size_t len = strlen(text);
    ssize_t n = ::write(fd, text, len);
    ::close(fd);
    sim::settle();
    return n == static_cast<ssize_t>(len) ? 0 : -1;
}

int kaelatcmd_remove_system_file(const char *path) { return dev::unlink(path); }

long kaelatcmd_fread_system_file(const char *path, char *buf, int max) {
    int n = readFromFile(path, buf, max);
    return n < 0 ? -1 : 0;
}

int kaelatcmd_read_system_file(const char *path, char *buf, int len) { return readFromFile(path, buf, len) < 0 ? -1 : 0; }

int kaelatcmd_fwrite_system_file(const char *path, const char *mode, const char *text) {
    FILE *f = dev::fopen(path, mode);
    if (!f) return -1;
    size_t len = strlen(text);
    size_t n = fwrite(text, 1, len, f);
    int rc = fclose(f);
    sim::settle();
    return (n == len && rc == 0) ? 0 : -1;
}

int readFromFile(const char *path, char *buf, int len) {
    if (len <= 0) return -1;
    int fd = dev::open(path, O_RDONLY);
    if (fd < 0) return -1;
    ssize_t n = ::read(fd, buf, static_cast<size_t>(len));
    ::close(fd);
    if (n < 0) return -1;
    if (n < len) buf[n] = '\0';
    return static_cast<int>(n);
}

int read_policy_file(int, const char *path, char *buf, int len) { return readFromFile(path, buf, len); }

int write_policy_file(int, const char *path, int flags, const char *text) {
    int fd = dev::open(path, flags, 0666);  // the persist files are created with O_CREAT
    if (fd < 0) return -errno;
    size_t len = strlen(text);
    ssize_t n = ::write(fd, text, len);
    int err = errno;
    ::close(fd);
    sim::settle();
    if (std::string(path) == "/proc/sysrq-trigger") sim::record("sysrq", text);
    return n < 0 ? -err : 0;
}

int write_int(const char *path, int value) {
    char text[16];
    snprintf(text, sizeof text, "%d", value);
    return dev::write_node(path, text, O_WRONLY | O_TRUNC) < 0 ? -1 : 0;
}

// ---- key=value item files

const char *get_property_file_item_value(const char *file, const char *key) {
    if (!sim::read_kv(dev::path(file), opt(key), t_item)) return nullptr;
    return t_item.c_str();
}

int set_property_file_item_value(const char *file, const char *key, const char *value) {
    std::string v = opt(value);
    return sim::write_kv(dev::path(file), opt(key), &v) ? 0 : -1;
}

int delete_property_file_item(const char *file, const char *key) {
    std::string v;
    if (!sim::read_kv(dev::path(file), opt(key), v)) return -1;
    return sim::write_kv(dev::path(file), opt(key), nullptr) ? 0 : -1;
}

// ---- factory NV record

int get_PYXA_NV_item(void *record) {
    if (sim::fault("nv-read")) return -1;
    std::string data;
    if (!sim::read_file(sim::state("nv.bin"), data)) data.assign(PYXA_NV_SIZE, '\0');
    data.resize(std::max<size_t>(data.size(), PYXA_NV_SIZE), '\0');
    memcpy(record, data.data(), PYXA_NV_SIZE);
    return 0;
}

int put_PYXA_NV_item(const void *record) {
    if (sim::fault("nv-write")) return -1;
    std::string data;
    if (!sim::read_file(sim::state("nv.bin"), data)) data.clear();
    data.resize(std::max<size_t>(data.size(), PYXA_NV_SIZE), '\0');
    memcpy(data.data(), record, PYXA_NV_SIZE);  // bytes beyond the record are kept
    sim::record("nv", "write");
    return sim::write_file_atomic(sim::state("nv.bin"), data) ? 0 : -1;
}

// ---- the test app

const char *sendMessage(const char *text) {
    std::string msg = opt(text);
    const char *reply = nullptr;
    if (sim::fault("testapp-silent")) {
        reply = nullptr;
    } else if (sim::fault("testapp-refuse")) {
        t_reply = "error";
        reply = t_reply.c_str();
    } else if (sim::script_reply(sim::state("testapp.replies"), msg, t_reply) && t_reply != "(silent)") {
        reply = t_reply.c_str();
    }
    sim::record("message", msg + " -> " + (reply ? reply : "(silent)"));
    return reply;
}

int startActivityFromFtcmd(const char *component, const char *action, const char *extras) {
    sim::record("activity", opt(component) + " " + opt(action) + " " + opt(extras));
    return 0;
}

int startServiceFromFtcmd(const char *component, const char *action, const char *extras) {
    sim::record("service-start", opt(component) + " " + opt(action) + " " + opt(extras));
    services_edit(component_class(component), true);
    return 0;
}

int stopServiceFromFtcmd(const char *component, const char *action, const char *extras) {
    sim::record("service-stop", opt(component) + " " + opt(action) + " " + opt(extras));
    if (!sim::fault("service-stuck")) services_edit(component_class(component), false);
    return 0;
}

// A service told "--es status 0" stops itself, as the fast-search service does.
int sendBroadcastFromFtcmd(const char *action, const char *component, const char *extras) {
    sim::record("broadcast", opt(action) + " " + opt(component) + " " + opt(extras));
    if (opt(extras).find("status 0") != std::string::npos && !sim::fault("service-stuck"))
        services_edit(component_class(component), false);
    return 0;
}

int isServiceWork(const char *component) {
    std::string cls = component_class(component);
    for (const auto &l : sim::read_lines(sim::state("services")))
        if (l == cls) return 1;
    return 0;
}

// ---- device and build identity

int is_project(const char *code) { return code && sim::config("project") == code; }
// "Above" is strictly greater: project N itself is not above N.
int is_above_PD_project(int number) { return atoi(sim::config("project_number", "0").c_str()) > number; }
int is_above_TD_project(int number) { return atoi(sim::config("project_number", "0").c_str()) > number; }
int is_bsp_version(void) { return sim::config("bsp_version", "0") == "1"; }

bool get_emmcid(char *buf) {
    std::string id = sim::config("emmcid");
    if (id.empty() || sim::fault("emmcid")) {
        errno = ENODEV;
        return false;
    }
    snprintf(buf, 101, "%s", id.c_str());
    return true;
}

int get_cpuid(char *buf, int len) {
    std::string id = sim::config("cpuid");
    if (id.empty() || sim::fault("cpuid")) {
        errno = ENODEV;
        return -1;
    }
    snprintf(buf, static_cast<size_t>(len), "%s", id.c_str());
    return 0;
}

int is_calibrate_item_support(const char *item) {
    // Appended piece by piece: GCC 12 warns (falsely) on "," + a temporary string.
    std::string items(1, ','), wanted(1, ',');
    items += sim::config("calibrate_items");
    items += ',';
    wanted += opt(item);
    wanted += ',';
    return items.find(wanted) != std::string::npos;
}

// The fault "calibrate-item" makes the item store refuse the state (an I/O error).
int set_calibrate_item_state(const char *item, const char *state, int uart_flag) {
    bool failed = sim::fault("calibrate-item");
    sim::record("calibrate", opt(item) + "=" + opt(state) + " uart=" + std::to_string(uart_flag) + (failed ? " (failed)" : ""));
    return failed ? -EIO : 0;
}

// ---- logging, reset and end-of-line operations

int control_kael_Log(int at_mode, unsigned int mask) {
    char detail[64];
    snprintf(detail, sizeof detail, "at_mode=%d mask=0x%X", at_mode, mask);
    sim::record("kaellog", detail);
    std::string running = mask ? "1" : "0";
    sim::write_kv(sim::state("config"), "kaellog_running", &running);
    return 0;
}

int is_kaellog_running(void) { return atoi(sim::config("kaellog_running", "0").c_str()); }

int partition_format(const char *device_path) {
    sim::record("format", opt(device_path));
    return 0;
}

int get_tfdata_type(int) { return atoi(sim::config("tfdata", "1").c_str()); }

int diag_cmd_clean_gprs_anite(void) {
    sim::record("modem", "clean_gprs_anite");
    return 0;
}

int clear_certificate(void) {
    sim::record("certificate", "clear");
    return sim::fault("clear-certificate") ? -1 : 0;
}

int minui_gr_fb_blank(int blank) {
    sim::record("fb", std::string("blank ") + std::to_string(blank));
    return 0;
}

char *delete_char(char *text, char c) {
    if (!text) return text;
    char *w = text;
    for (char *r = text; *r; ++r)
        if (*r != c) *w++ = *r;
    *w = '\0';
    return text;
}

int at_set_audio_init_ftm(void) {
    sim::record("audio", "init_ftm");
    return 0;
}

}  // extern "C"
