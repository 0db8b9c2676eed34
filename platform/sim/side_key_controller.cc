// The side-key (pressure key) controller behind dev/ndt. The real controller wakes on the
// one-byte command 0x0A; a read names the register in the first byte of the caller's
// buffer and gets len bytes of the register after it (the buffer holds len + 1 bytes). The model answers the version register
// (0x10) and the two status registers (0x04, 0x4E) from the key=value script .sim/sidekey:
//
//   version=01 02 03 2d     the four version bytes after the register byte
//   version_count=2         what the version read returns (the driver reports 2)
//   reg.04=00 11            the bytes of another register
//
// The fault "sidekey" makes every read fail (EIO); deleting dev/ndt removes the device.
// Calibration, key pressure and the controller's other registers are not modelled.
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <sstream>
#include <string>
#include <vector>

#include "platform/sim/chardev.h"
#include "platform/sim/script.h"
#include "platform/sim/sim.h"

namespace {

bool serves(const std::string &path) { return path == "/dev/ndt"; }

std::vector<unsigned char> bytes_of(const std::string &text) {
    std::vector<unsigned char> out;
    std::istringstream in(text);
    for (std::string b; in >> b;) out.push_back(static_cast<unsigned char>(strtoul(b.c_str(), nullptr, 16)));
    return out;
}

std::string hex(const unsigned char *p, size_t n) {
    std::string out;
    char b[4];
    for (size_t i = 0; i < n; ++i) {
        snprintf(b, sizeof b, i ? " %02x" : "%02x", p[i]);
        out += b;
    }
    return out;
}

void write(sim::Device &, const char *data, size_t len) {
    sim::record("sidekey", "write " + hex(reinterpret_cast<const unsigned char *>(data), len));
}

ssize_t read(sim::Device &, void *buf, size_t len) {
    auto *p = static_cast<unsigned char *>(buf);
    if (len == 0) return 0;
    char reg[8];
    snprintf(reg, sizeof reg, "%02x", p[0]);
    if (sim::fault("sidekey")) {
        sim::record("sidekey", std::string("read reg=") + reg + " (failed)");
        errno = EIO;
        return -1;
    }
    const std::string file = sim::state("sidekey");
    bool version = p[0] == 0x10;
    std::vector<unsigned char> data =
        bytes_of(sim::script_text(file, version ? "version" : std::string("reg.") + reg, version ? "01 02 03 2d" : "00 00"));
    size_t n = std::min(data.size(), len);
    memcpy(p + 1, data.data(), n);
    long count = version ? sim::script_long(file, "version_count", 2) : static_cast<long>(n);
    sim::record("sidekey", std::string("read reg=") + reg + " -> " + hex(p + 1, n) + " (" + std::to_string(count) + ")");
    return count;
}

}  // namespace

namespace sim {
extern const DeviceModel kSideKeyModel = {.name = "sidekey", .serves = serves, .write = write, .read = read};
}  // namespace sim
