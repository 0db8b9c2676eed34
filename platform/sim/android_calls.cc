// Android calls on the simulated phone: the property store is <root>/.sim/properties
// (name=value lines), and reboot, power-off and wake locks are recorded, never done.
#include <cstdio>
#include <cstring>
#include <string>

#include "platform/android.h"
#include "platform/sim/sim.h"

extern "C" {

int property_get(const char *key, char *value, const char *default_value) {
    std::string v;
    if (!sim::read_kv(sim::state("properties"), key, v) || v.empty()) v = default_value ? default_value : "";
    snprintf(value, PROPERTY_VALUE_MAX, "%s", v.c_str());
    return static_cast<int>(strlen(value));
}

int property_set(const char *key, const char *value) {
    if (key == nullptr || key[0] == '\0' || sim::fault("property-set")) return -1;
    std::string v = value ? value : "";
    if (v.size() >= PROPERTY_VALUE_MAX) return -1;
    for (char &c : v)
        if (c == '\n') c = ' ';
    sim::record("setprop", std::string(key) + "=" + v);
    return sim::write_kv(sim::state("properties"), key, &v) ? 0 : -1;
}

int android_reboot(unsigned cmd, int flags, const char *reason) {
    const char *what = cmd == ANDROID_RB_POWEROFF ? "poweroff" : "reboot";
    char detail[160];
    snprintf(detail, sizeof detail, "cmd=0x%X flags=%d reason=%s", cmd, flags, reason ? reason : "");
    sim::record(what, detail);
    return 0;
}

int acquire_wake_lock(int lock, const char *id) {
    sim::record("wakelock", std::string("acquire ") + std::to_string(lock) + " " + (id ? id : ""));
    return 0;
}

int release_wake_lock(const char *id) {
    sim::record("wakelock", std::string("release ") + (id ? id : ""));
    return 0;
}

}  // extern "C"

// A host build of liblog drops debug lines by default; a simulated phone shows them all,
// as logcat on a phone would.
#include <android/log.h>
namespace {
const int g_log_all = (__android_log_set_minimum_priority(ANDROID_LOG_DEBUG), 0);
}
