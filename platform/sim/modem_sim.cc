// Modem requests on the simulated phone. The key=value script <root>/.sim/modem holds
// the modem's side: "em.<request>=<reply text>" (unlisted requests answer "0"),
// "nv.<item>=<value>" (an item without a line cannot be read; a write adds the line),
// and "gps.<option>=<reply text>" for the GPS reads. The fault "modem" makes every
// request undeliverable, "gps" only the GPS ones, "dpdt" the antenna switch.
#include <cstdint>
#include <cstdio>
#include <cstring>
#include <string>

#include "platform/modem.h"
#include "platform/sim/script.h"
#include "platform/sim/sim.h"

namespace {

std::string file() { return sim::state("modem"); }

uint32_t item_of(const void *request) {
    uint32_t item = 0;
    memcpy(&item, request, sizeof item);
    return item;
}

}  // namespace

extern "C" {

int qmi_zdr_set_em_status(int request, char *reply) {
    if (sim::fault("modem") || reply == nullptr) {
        sim::record("modem", "em_status " + std::to_string(request) + " (undelivered)");
        return -1;
    }
    std::string text = sim::script_text(file(), "em." + std::to_string(request), "0");
    snprintf(reply, ZDR_EM_REPLY_SIZE, "%s", text.c_str());
    sim::record("modem", "em_status " + std::to_string(request) + " -> " + text);
    return 0;
}

int qmi_zdr_read_nv_msg(const void *request, void *reply, int len) {
    if (request == nullptr || reply == nullptr || len < 4) return -1;
    uint32_t item = item_of(request);
    std::string v;
    bool set = sim::read_kv(file(), "nv." + std::to_string(item), v);
    if (sim::fault("modem") || !set) {
        sim::record("modem", "nv-read " + std::to_string(item) + " (failed)");
        return -1;
    }
    int32_t value = static_cast<int32_t>(strtol(v.c_str(), nullptr, 0));
    memset(reply, 0, static_cast<size_t>(len));
    memcpy(reply, &value, sizeof value);
    sim::record("modem", "nv-read " + std::to_string(item) + " -> " + std::to_string(value));
    return 0;
}

int qmi_zdr_write_nv_msg(const void *request, int len) {
    if (request == nullptr || len < 0) return -1;
    uint32_t item = item_of(request);
    const unsigned char *data = static_cast<const unsigned char *>(request) + sizeof item;
    std::string hex;
    char byte[4];
    for (int i = 0; i < len; ++i) {
        snprintf(byte, sizeof byte, "%02X", data[i]);
        hex += byte;
    }
    if (sim::fault("modem")) {
        sim::record("modem", "nv-write " + std::to_string(item) + " " + hex + " (failed)");
        return -1;
    }
    int32_t value = 0;
    memcpy(&value, data, static_cast<size_t>(len < 4 ? len : 4));
    std::string text = std::to_string(value);
    sim::record("modem", "nv-write " + std::to_string(item) + " " + hex);
    return sim::write_kv(file(), "nv." + std::to_string(item), &text) ? 0 : -1;
}

int qmi_zdr_gps_option_msg(const zdr_gps_option_req *request, char *reply) {
    if (request == nullptr) return -1;
    int option = request->option;
    bool known = option == 0 || option == 1 || option == 2 || option == 3 || option == 5 || option == 6;
    if (!known || sim::fault("modem") || sim::fault("gps")) {
        sim::record("gps", "option " + std::to_string(option) + " (failed)");
        return -1;
    }
    std::string text;
    if (option == 2 || option == 5 || option == 6) {
        text = sim::script_text(file(), "gps." + std::to_string(option), "");
        if (reply) snprintf(reply, ZDR_GPS_REPLY_SIZE, "%s", text.c_str());
    }
    sim::record("gps", "option " + std::to_string(option) + (text.empty() ? "" : " -> " + text));
    return 0;
}

int dpdt_normal_or_cross(int cross) {
    if (sim::fault("dpdt")) {
        sim::record("rf", "dpdt " + std::string(cross ? "cross" : "normal") + " (failed)");
        return -1;
    }
    sim::record("rf", "dpdt " + std::string(cross ? "cross" : "normal"));
    return 0;
}

}  // extern "C"
