// The two LED drivers of the ring around the back camera (AW22xxx class, halves "a" and
// "b"). On a phone each driver has 50 trim registers, loaded in two steps: every write of
// a line "<index in hex> <value>" to "trim_data" sets one pending entry, and a write of
// "1" to "trim" copies the pending entries into the registers.
//
// The model keeps the pending entries in the trim_data node itself, read back as the 50
// entries "0x%02x," on one line; the trim node reads back as a 27-character title and
// the 50 registers in the same form. A node file that does not hold 50 entries starts
// from the driver's power-on table. Every write is recorded as "ring <a|b>/<node> <text>"
// ("ring a/trim_data e 0x3f", "ring b/trim 1"); a line the driver cannot take (an index
// above 0x31, a value that is not a byte) is recorded with "refused" and changes nothing.
//
// A driver that does not keep what it is given, or a read that fails, is scripted with a
// sequence on the node (docs/devices/lights.md).
#include <cstdio>
#include <cstdlib>
#include <string>

#include "platform/sim/chardev.h"
#include "platform/sim/sim.h"

namespace {

constexpr char kDir[] = "/sys/class/leds/aw22xxx_led_";
constexpr int kEntries = 50;
// What the driver prints before the registers; its length places the entries.
constexpr char kTitle[] = "aw22xxx_led trim registers:";
static_assert(sizeof kTitle - 1 == 27, "the registers start at character 27");
constexpr unsigned char kPowerOn[kEntries] = {
    0xff, 0xff, 0xff, 0xff, 0xff, 0xff, 0x0f, 0x00, 0x00, 0xf3, 0x3e, 0x00, 0x49, 0xff, 0x39, 0xe3, 0x36,
    0x26, 0x05, 0x00, 0x0a, 0x88, 0x00, 0x02, 0x05, 0x40, 0xff, 0xff, 0xff, 0xff, 0x0f, 0x00, 0x00, 0xf3,
    0x3e, 0x00, 0x49, 0xff, 0x36, 0x7b, 0x32, 0x3a, 0x08, 0x00, 0x07, 0x49, 0x02, 0x01, 0x04, 0x2d};

struct Table {
    unsigned char v[kEntries];
};

// "a/trim_data" for "/sys/class/leds/aw22xxx_led_a/trim_data"; empty for other paths.
std::string node_name(const std::string &path) {
    if (path.compare(0, sizeof kDir - 1, kDir) != 0) return "";
    std::string name = path.substr(sizeof kDir - 1);
    if (name == "a/trim" || name == "b/trim" || name == "a/trim_data" || name == "b/trim_data") return name;
    return "";
}

bool owns(const std::string &path) { return !node_name(path).empty(); }

std::string node_path(char driver, const char *node) { return std::string(kDir) + driver + "/" + node; }

std::string entries(const Table &t) {
    std::string out;
    char e[8];
    for (unsigned char v : t.v) {
        snprintf(e, sizeof e, "0x%02x,", v);
        out += e;
    }
    return out;
}

// The entries that follow the title (if any) in a node's text; the power-on table when
// the text does not hold all 50.
Table parse(const std::string &text, size_t from) {
    Table t;
    const char *p = text.c_str() + (from < text.size() ? from : text.size());
    for (int i = 0; i < kEntries; ++i) {
        char *end = nullptr;
        unsigned long v = strtoul(p, &end, 16);
        if (end == p || *end != ',' || v > 0xff) {
            Table power_on;
            for (int k = 0; k < kEntries; ++k) power_on.v[k] = kPowerOn[k];
            return power_on;
        }
        t.v[i] = static_cast<unsigned char>(v);
        p = end + 1;
    }
    return t;
}

Table pending(char driver) {
    std::string text;
    sim::read_file(sim::map(node_path(driver, "trim_data").c_str()), text);
    return parse(text, 0);
}

// One line "<index> <value>" sets one pending entry.
void set_entry(char driver, const std::string &line) {
    const std::string who = std::string(1, driver) + "/trim_data ";
    char *end = nullptr;
    unsigned long index = strtoul(line.c_str(), &end, 16);
    const char *value_text = end;
    unsigned long value = strtoul(value_text, &end, 16);
    if (value_text == line.c_str() || index >= kEntries || end == value_text || value > 0xff) {
        sim::record("ring", who + line + " refused");
        return;
    }
    Table t = pending(driver);
    t.v[index] = static_cast<unsigned char>(value);
    sim::write_file_atomic(sim::map(node_path(driver, "trim_data").c_str()), entries(t) + "\n");
    sim::record("ring", who + line);
}

void node_write(const std::string &path, const std::string &data) {
    const std::string name = node_name(path);
    const char driver = name[0];
    if (name.size() > 2 && name.compare(1, 10, "/trim_data") == 0) {
        size_t at = 0;
        while (at < data.size()) {
            size_t end = data.find('\n', at);
            if (end == std::string::npos) end = data.size();
            if (end > at) set_entry(driver, data.substr(at, end - at));
            at = end + 1;
        }
        return;
    }
    std::string value = data;
    while (!value.empty() && (value.back() == '\n' || value.back() == '\r')) value.pop_back();
    sim::record("ring", name + " " + value);
    if (value != "1") return;
    sim::write_file_atomic(sim::map(path.c_str()), kTitle + entries(pending(driver)) + "\n");
}

}  // namespace

namespace sim {
extern const DeviceModel kLedRingModel = {.name = "ring", .owns = owns, .node_write = node_write};
}  // namespace sim
