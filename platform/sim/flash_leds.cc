// The flash LED driver of the simulated phone (sys/ext_led). On a phone each node is the
// brightness control of one channel of the camera flash driver: a decimal level written
// to it drives that LED (75 is the torch, 900 a flash pulse), 0 switches it off, and the
// node reads back the last level. The channels are the rear main flash
// (EXT_REAR_FLASH_LED1, or EXT_REAR_FLASH_LED on older boards), the second rear flash
// (EXT_REAR_FLASH_LED2) and the front flash, which is also the infrared fill light
// (EXT_FRONT_FLASH_LED).
//
// The model keeps the level in the node file and records every write as
// "flash <node> <level>", so the times a pulse went on and off can be read from
// events.log. It leaves out the driver's own protection (no thermal cut-off, no hardware
// time-out: a flash stays on until something writes 0) and takes any text as the level.
// A channel whose node is missing from the sandbox is a channel the board does not have:
// writes to it fail.
#include <cstring>
#include <string>

#include "platform/sim/chardev.h"
#include "platform/sim/sim.h"

namespace {

constexpr char kLedDir[] = "/sys/ext_led/";

bool owns(const std::string &path) {
    if (path.compare(0, sizeof kLedDir - 1, kLedDir) != 0) return false;
    std::string name = path.substr(sizeof kLedDir - 1);
    return name == "EXT_REAR_FLASH_LED1" || name == "EXT_REAR_FLASH_LED" || name == "EXT_REAR_FLASH_LED2" ||
           name == "EXT_FRONT_FLASH_LED";
}

void node_write(const std::string &path, const std::string &data) {
    sim::write_file_atomic(sim::map(path.c_str()), data);
    std::string level = data;
    while (!level.empty() && (level.back() == '\n' || level.back() == '\r')) level.pop_back();
    sim::record("flash", path.substr(sizeof kLedDir - 1) + " " + level);
}

}  // namespace

namespace sim {
extern const DeviceModel kFlashLedModel = {.name = "flash", .owns = owns, .node_write = node_write};
}  // namespace sim
