// The PMIC's register map debug interface (debugfs regmap/spmi0-00). On a phone a reader
// writes how many registers it wants to "count" and the first address to "address", and
// then reads "data": one "addr: value" line per register, in hexadecimal.
// The model answers from a register table, .sim/pmic_registers ("0x305e=0x80" lines); a
// register that the table does not list reads 00. It does not model register writes, the
// other regmap files, or the PMIC's behaviour behind the registers. It owns "count" and
// "address": each write is kept as the node's text and "data" is made afresh from both.
#include <cstdio>
#include <cstdlib>
#include <string>

#include "platform/sim/chardev.h"
#include "platform/sim/power_models.h"
#include "platform/sim/sim.h"

namespace sim {
namespace {

// A hexadecimal (0x...) or decimal text, up to a line end; false when it is none.
bool parse_number(const std::string &text, long &value) {
    const char *s = text.c_str();
    char *end = nullptr;
    value = strtol(s, &end, 0);
    if (end == s) return false;
    while (*end == '\n' || *end == '\r' || *end == ' ') ++end;
    return *end == '\0' && value >= 0;
}

}  // namespace

std::string pmic_regmap_data(const std::string &count_text, const std::string &address_text) {
    long count = 0, address = 0;
    if (!parse_number(count_text, count) || !parse_number(address_text, address)) return "";
    if (count > 256) count = 256;  // a debugfs read is one page at most
    std::string out;
    for (long a = address; a < address + count; ++a) {
        char key[24];
        snprintf(key, sizeof key, "0x%lx", a);
        std::string value = "0";
        read_kv(state("pmic_registers"), key, value);
        char line[32];
        snprintf(line, sizeof line, "%lx: %02lx\n", a, strtol(value.c_str(), nullptr, 0) & 0xff);
        out += line;
    }
    return out;
}

}  // namespace sim

namespace {

constexpr char kRegmap[] = "/d/regmap/spmi0-00/";

std::string regmap_node(const char *name) { return sim::map((std::string(kRegmap) + name).c_str()); }

bool owns_selector(const std::string &path) { return path == std::string(kRegmap) + "count" || path == std::string(kRegmap) + "address"; }

void select_registers(const std::string &path, const std::string &text) {
    sim::write_file_atomic(sim::map(path.c_str()), text);
    std::string count, address;
    sim::read_file(regmap_node("count"), count);
    sim::read_file(regmap_node("address"), address);
    sim::write_file_atomic(regmap_node("data"), sim::pmic_regmap_data(count, address));
}

}  // namespace

namespace sim {
extern const DeviceModel kPmicRegmapModel = {
    .name = "pmic", .owns = owns_selector, .node_write = select_registers};
}  // namespace sim
