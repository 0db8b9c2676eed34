// The direct-charging controller (an STM32L011 on the charger board). On a phone its
// driver passes each write() on "burn_ctl" to the controller as one control record:
// switch charging on or off, or set one of three tuning parameters of the direct-charging
// loop. The controller then reports through "chg_enable" and "dchg_state".
// The model keeps only what the station can see: the decoded record in events.log, the
// switch reflected in chg_enable ("1"/"0") and dchg_state ("dchg_running"/"dchg_stop"),
// and the parameters in .sim/charger (param_a, param_b, param_c). It owns "burn_ctl", so
// every write() of the daemon reaches it as one record. It does not model the firmware,
// its update, or any effect of the parameters on the readings.
#include <cstdio>
#include <string>

#include "platform/charger_control.h"
#include "platform/sim/chardev.h"
#include "platform/sim/power_models.h"
#include "platform/sim/sim.h"

namespace sim {
namespace {

constexpr char kMcuDir[] = "/sys/kernel/debug/stm32l011/";

std::string hex(const uint8_t *data, size_t n) {
    std::string out;
    char b[4];
    for (size_t i = 0; i < n && i < 16; ++i) {
        snprintf(b, sizeof b, i ? " %02X" : "%02X", data[i]);
        out += b;
    }
    return out;
}

void set_node(const char *name, const std::string &text) {
    write_file_atomic(map((std::string(kMcuDir) + name).c_str()), text + "\n");
}

const char *param_key(charger::Op op) {
    switch (op) {
    case charger::Op::ParamA: return "param_a";
    case charger::Op::ParamB: return "param_b";
    default: return "param_c";
    }
}

}  // namespace

bool charger_mcu_write(const uint8_t *data, size_t n) {
    std::optional<charger::Record> r = charger::decode(data, n);
    if (!r) {
        record("charger", "bad-record " + hex(data, n));
        return false;
    }
    if (r->op == charger::Op::Switch) {
        record("charger", r->value ? "switch on" : "switch off");
        set_node("chg_enable", r->value ? "1" : "0");
        set_node("dchg_state", r->value ? "dchg_running" : "dchg_stop");
        return true;
    }
    const std::string key = param_key(r->op), value = std::to_string(r->value);
    record("charger", key + " " + value);
    write_kv(state("charger"), key, &value);
    return true;
}

}  // namespace sim

namespace {

bool owns_control_node(const std::string &path) { return path == "/sys/kernel/debug/stm32l011/burn_ctl"; }

void take_record(const std::string &, const std::string &data) {
    sim::charger_mcu_write(reinterpret_cast<const uint8_t *>(data.data()), data.size());
}

}  // namespace

namespace sim {
extern const DeviceModel kChargerMcuModel = {
    .name = "charger", .owns = owns_control_node, .node_write = take_record};
}  // namespace sim
