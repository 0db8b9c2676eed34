// The vibrator and the notification LEDs of the simulated phone (sys/class/leds). On a
// phone the vibrator's "duration" node takes a pulse length in milliseconds and its
// "activate" node starts (1) or stops (0) the pulse; each colour LED's "brightness" node
// (and the green LED's "engineering" node on some boards) takes a level from 0 to 255.
//
// The model keeps the last value in the node file and records every write as
// "led <name>/<node> <value>" ("led vibrator/activate 1"), so the pulses and the blink
// can be timed from events.log. It does not model the pulse running out by itself. A node
// missing from the sandbox is a part the board does not have: writes to it fail.
#include <cstring>
#include <string>

#include "platform/sim/chardev.h"
#include "platform/sim/sim.h"

namespace {

constexpr char kLedDir[] = "/sys/class/leds/";

bool owns(const std::string &path) {
    if (path.compare(0, sizeof kLedDir - 1, kLedDir) != 0) return false;
    std::string name = path.substr(sizeof kLedDir - 1);
    for (const char *node : {"vibrator/duration", "vibrator/activate", "red/brightness", "green/brightness",
                             "green/engineering", "blue/brightness"})
        if (name == node) return true;
    return false;
}

void node_write(const std::string &path, const std::string &data) {
    sim::write_file_atomic(sim::map(path.c_str()), data);
    std::string value = data;
    while (!value.empty() && (value.back() == '\n' || value.back() == '\r')) value.pop_back();
    sim::record("led", path.substr(sizeof kLedDir - 1) + " " + value);
}

}  // namespace

namespace sim {
extern const DeviceModel kIndicatorLedModel = {.name = "led", .owns = owns, .node_write = node_write};
}  // namespace sim
