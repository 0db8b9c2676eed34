// The panels' colour calibration nodes, "sys/lcm/mainpanel_calidata" and
// "sys/lcm/subpanel_calidata", as the panel driver keeps them.
//
// On a phone the driver takes a calibration value written as decimal text of 0x58RRGGBB
// (marker bits, then the white point's red, green and blue), programs the panel with it
// and from then on reports it as "0xRR 0xGG 0xBB"; a panel that has lost its calibration
// reports "0x00 0x00 0x00". The model keeps that report in the node, records every write
// as "panel <main|sub> calibrate <text written>" and leaves the node as it was for a text
// that is not such a value (recorded with "-> rejected"), as the driver refuses it. With
// the fault "panel-calibration" the panel takes no value at all (recorded with
// "-> ignored"). It does not model the colour shown, nor the time the panel takes.
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <string>

#include "platform/sim/chardev.h"
#include "platform/sim/sim.h"

namespace sim {
namespace {

constexpr char kMain[] = "/sys/lcm/mainpanel_calidata";
constexpr char kSub[] = "/sys/lcm/subpanel_calidata";
constexpr uint32_t kMarkMask = 0xFF000000, kMark = 0x58000000;

bool owns(const std::string &path) { return path == kMain || path == kSub; }

// The colour of a written calibration value; false for any other text. A driver's number
// parser takes one trailing line break.
bool calibration_value(std::string text, uint32_t &colour) {
    if (!text.empty() && text.back() == '\n') text.pop_back();
    if (text.empty() || text.size() > 10 || text.find_first_not_of("0123456789") != std::string::npos) return false;
    unsigned long long v = std::strtoull(text.c_str(), nullptr, 10);
    if ((v & kMarkMask) != kMark || v > UINT32_MAX) return false;
    colour = static_cast<uint32_t>(v) & ~kMarkMask;
    return true;
}

void node_write(const std::string &path, const std::string &data) {
    std::string what = std::string(path == kMain ? "main" : "sub") + " calibrate " + data;
    uint32_t colour = 0;
    if (fault("panel-calibration")) {
        record("panel", what + " -> ignored");
        return;
    }
    if (!calibration_value(data, colour)) {
        record("panel", what + " -> rejected");
        return;
    }
    char report[32];
    snprintf(report, sizeof report, "0x%02X 0x%02X 0x%02X\n", colour >> 16, (colour >> 8) & 0xFF, colour & 0xFF);
    write_file_atomic(map(path.c_str()), report);  // the node file itself: the facade would come back here
    record("panel", what);
}

}  // namespace

extern const DeviceModel kLcmPanelModel = {.name = "panel", .owns = owns, .node_write = node_write};

}  // namespace sim
