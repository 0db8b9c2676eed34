// The NFC controller behind dev/nq-nci. On a phone it is an NCI controller on I2C: the
// driver's power ioctl (0x4004E901, argument 0 off, 1 on) switches it, each write() is one
// NCI control message, and each read() returns the bytes of a message as asked while the
// controller's interrupt line is raised. This model answers the control messages of the
// factory tests as such a controller would: reset and init with its NCI version and
// firmware, the proprietary activate, set-config, the SWP self-test with its notification,
// and discovery, after which a tag or a reader in the field (as scripted) activates an RF
// interface. It leaves out RF data, deactivation, NFCEE management, credits and timing; a
// powered-off controller takes writes and never answers. Each open has its own controller
// state (power, discovery), so an open left behind by a worker never disturbs the next.
//
// Script: <root>/.sim/nfc, key=value lines (read at each frame, so sequences "nfc:<key>"
// work), see docs/devices/nfc.md:
//   mode=normal | silent | <hex byte>  silent: never answers; a byte such as 51: every
//                                       answer is that byte and two zero bytes
//   nci=1.0 | 2.0                       the NCI version the controller speaks
//   firmware=11010190                   4 bytes hex, in the reset notification (2.0) or
//                                       the init response (1.0)
//   swp=0 | 3 | <n> | refused | no-ntf  SWP self-test status, or the test refused, or a
//                                       response without its notification
//   tag=0a1b2c3d | none                 NFCID1 of the tag on the antenna
//   reader=0 | 1                        a reader's field activates the phone in listen mode
//   before=61070101                     frames (comma-separated) sent after the discover
//                                       response, before the activation
//   activation=61050C...                the activation notification sent instead of the
//                                       built one (malformed controllers)
// Station lines "nfc tag <id>" and "nfc reader" put a tag or a reader into the field of
// every open that is discovering. Every frame in and out is recorded, kind "nfc":
// "in <hex>" (from the phone, " (off)" when unpowered), "out <hex>", "power N", "open",
// "close".
#include <cctype>
#include <cerrno>
#include <cstdlib>
#include <cstdint>
#include <cstdio>
#include <string>
#include <vector>

#include "platform/sim/chardev.h"
#include "platform/sim/script.h"
#include "platform/sim/sim.h"

namespace sim {
extern const DeviceModel kNfcControllerModel;
}

namespace {

using Bytes = std::vector<uint8_t>;

constexpr unsigned long kNfcSetPower = 0x4004E901;
constexpr uint8_t kManufacturerId = 0x04;
constexpr uint8_t kStatusOk = 0x00, kStatusRejected = 0x01, kStatusSyntaxError = 0x05;

struct Nfcc {
    Bytes pending;  // bytes of a message not yet whole
    bool powered = false;
    bool listen = false;  // a listen configuration was set since power-on
    bool discovering = false;
};

std::string script(const char *key, const char *def) { return sim::script_text(sim::state("nfc"), key, def); }

std::string hex(const Bytes &b) {
    std::string out;
    char two[4];
    for (size_t i = 0; i < b.size(); ++i) {
        snprintf(two, sizeof two, i ? " %02X" : "%02X", b[i]);
        out += two;
    }
    return out;
}

// Hex digits, blanks and colons ignored; an odd last digit is dropped.
Bytes parse_hex(const std::string &text) {
    Bytes out;
    std::string digits;
    for (char c : text)
        if (isxdigit(static_cast<unsigned char>(c))) digits += c;
    for (size_t i = 0; i + 1 < digits.size(); i += 2) out.push_back(static_cast<uint8_t>(std::stoi(digits.substr(i, 2), nullptr, 16)));
    return out;
}

void send(sim::Device &d, const Bytes &frame) {
    sim::device_send(d, frame.data(), frame.size());
    sim::record("nfc", "out " + hex(frame));
}

Bytes message(uint8_t b0, uint8_t b1, Bytes payload) {
    // Reserved first: GCC 12 warns (falsely, -Warray-bounds) when the header's storage grows.
    Bytes m;
    m.reserve(3 + payload.size());
    m.push_back(b0);
    m.push_back(b1);
    m.push_back(static_cast<uint8_t>(payload.size()));
    m.insert(m.end(), payload.begin(), payload.end());
    return m;
}

Bytes firmware() {
    Bytes fw = parse_hex(script("firmware", "11010190"));
    fw.resize(4, 0);
    return fw;
}

bool speaks_v20() { return script("nci", "1.0") == "2.0"; }

void reset(sim::Device &d, Nfcc &c, const Bytes &frame) {
    uint8_t config = frame.size() > 3 && frame[3] ? 0x01 : 0x00;  // type 1 resets the configuration
    c.listen = c.discovering = false;
    if (!speaks_v20()) return send(d, message(0x40, 0x00, {kStatusOk, 0x10, config}));
    send(d, message(0x40, 0x00, {kStatusOk}));
    Bytes ntf{0x02, config, 0x20, kManufacturerId, 0x04};
    Bytes fw = firmware();
    ntf.insert(ntf.end(), fw.begin(), fw.end());
    send(d, message(0x60, 0x00, ntf));
}

void init(sim::Device &d, const Bytes &frame) {
    bool v20_frame = frame[2] == 2;
    if (v20_frame != speaks_v20()) return send(d, message(0x40, 0x01, {kStatusSyntaxError}));
    if (v20_frame)
        return send(d, message(0x40, 0x01, {kStatusOk, 0x1A, 0x1E, 0x03, 0x00, 0x01, 0x00, 0x02, 0xFF, 0xFF, 0x01, 0x00,
                                            0x01, 0x02, 0x01, 0x00, 0x02, 0x00}));
    Bytes rsp{kStatusOk, 0x03, 0x1E, 0x03, 0x00, 0x04, 0x00, 0x01, 0x02, 0x03, 0x01, 0x00, 0x02, 0xFF, 0x00, 0x01, kManufacturerId};
    Bytes fw = firmware();
    rsp.insert(rsp.end(), fw.begin(), fw.end());
    send(d, message(0x40, 0x01, rsp));
}

// Parameters A003 and A00E configure listen mode (NXP's extended, two-byte identifiers).
void set_config(sim::Device &d, Nfcc &c, const Bytes &frame) {
    for (size_t i = 4; i + 1 < frame.size();) {
        bool extended = frame[i] == 0xA0;
        size_t id_len = extended ? 2 : 1;
        if (i + id_len >= frame.size()) break;
        if (extended && (frame[i + 1] == 0x03 || frame[i + 1] == 0x0E)) c.listen = true;
        i += id_len + 1 + frame[i + id_len];
    }
    send(d, message(0x40, 0x02, {kStatusOk, 0x00}));
}

void swp_self_test(sim::Device &d) {
    std::string how = script("swp", "0");
    if (how == "refused") return send(d, message(0x4F, 0x3E, {kStatusRejected}));
    send(d, message(0x4F, 0x3E, {kStatusOk}));
    if (how == "no-ntf") return;
    send(d, message(0x6F, 0x3E, {static_cast<uint8_t>(strtol(how.c_str(), nullptr, 0) & 0xFF), 0x00}));
}

// RF_INTF_ACTIVATED_NTF of an ISO-DEP tag in NFC-A poll mode: the NFCID1 length sits at
// payload byte 9 (message byte 12), the NFCID1 behind it.
Bytes tag_activation(const Bytes &nfcid1) {
    Bytes p{0x01, 0x02, 0x04, 0x00, 0xFF, 0x01, static_cast<uint8_t>(nfcid1.size() + 5), 0x44, 0x00,
            static_cast<uint8_t>(nfcid1.size())};
    p.insert(p.end(), nfcid1.begin(), nfcid1.end());
    p.insert(p.end(), {0x01, 0x20, 0x00, 0x00, 0x00, 0x00});
    return message(0x61, 0x05, p);
}

// The phone activated by a reader in NFC-A listen mode, ISO-DEP.
Bytes reader_activation() { return message(0x61, 0x05, {0x01, 0x02, 0x04, 0x80, 0xFF, 0x01, 0x00, 0x80, 0x00, 0x00, 0x01, 0x80}); }

void field(sim::Device &d, Nfcc &c) {
    std::string raw = script("activation", "");
    if (!raw.empty()) return send(d, parse_hex(raw));
    bool reader = script("reader", "0") == "1";
    Bytes id = parse_hex(script("tag", "none"));
    if (c.listen && reader) return send(d, reader_activation());
    if (!id.empty()) send(d, tag_activation(id));
}

void discover(sim::Device &d, Nfcc &c) {
    send(d, message(0x41, 0x03, {kStatusOk}));
    c.discovering = true;
    std::string before = script("before", "");
    for (size_t at = 0; at < before.size();) {
        size_t comma = before.find(',', at);
        if (comma == std::string::npos) comma = before.size();
        Bytes frame = parse_hex(before.substr(at, comma - at));
        if (!frame.empty()) send(d, frame);
        at = comma + 1;
    }
    field(d, c);
}

void answer(sim::Device &d, Nfcc &c, const Bytes &frame) {
    sim::record("nfc", "in " + hex(frame) + (c.powered ? "" : " (off)"));
    if (!c.powered) return;
    std::string mode = script("mode", "normal");
    if (mode == "silent") return;
    if (mode != "normal") {
        Bytes odd = parse_hex(mode);
        return send(d, {odd.empty() ? uint8_t{0} : odd[0], 0x00, 0x00});
    }
    uint16_t op = static_cast<uint16_t>(frame[0] << 8 | frame[1]);
    switch (op) {
        case 0x2000: return reset(d, c, frame);
        case 0x2001: return init(d, frame);
        case 0x2002: return set_config(d, c, frame);
        case 0x2F02: return send(d, message(0x4F, 0x02, {kStatusOk}));
        case 0x2F3E: return swp_self_test(d);
        case 0x2103: return discover(d, c);
        default: return send(d, message(0x60, 0x07, {kStatusSyntaxError}));  // CORE_GENERIC_ERROR_NTF
    }
}

bool serves(const std::string &path) { return path == "/dev/nq-nci"; }

int open(sim::Device &d) {
    d.data = new Nfcc;
    sim::record("nfc", "open");
    return 0;
}

// The daemon's writes arrive as a stream: messages are cut out by their length byte.
void write(sim::Device &d, const char *data, size_t len) {
    Nfcc &c = *static_cast<Nfcc *>(d.data);
    c.pending.insert(c.pending.end(), data, data + len);
    while (c.pending.size() >= 3 && c.pending.size() >= 3u + c.pending[2]) {
        Bytes frame(c.pending.begin(), c.pending.begin() + 3 + c.pending[2]);
        c.pending.erase(c.pending.begin(), c.pending.begin() + 3 + c.pending[2]);
        answer(d, c, frame);
    }
}

int ioctl(sim::Device &d, unsigned long request, void *arg) {
    Nfcc &c = *static_cast<Nfcc *>(d.data);
    if (request != kNfcSetPower) {
        errno = ENOTTY;
        return -1;
    }
    auto value = reinterpret_cast<uintptr_t>(arg);
    sim::record("nfc", "power " + std::to_string(value));
    if (value > 1) {
        errno = EINVAL;  // firmware download mode is not modelled
        return -1;
    }
    c.powered = value == 1;
    c.listen = c.discovering = false;
    return 0;
}

void close(sim::Device &d) {
    Nfcc *c = static_cast<Nfcc *>(d.data);
    sim::record("nfc", c->pending.empty() ? "close" : "close (incomplete " + hex(c->pending) + ")");
    delete c;
}

void station(const std::string &text) {
    std::string what = text.substr(0, text.find(' '));
    Bytes id = parse_hex(text.size() > 4 ? text.substr(4) : "");
    if (what != "reader" && (what != "tag" || id.empty())) return sim::record("nfc", "unknown station line: " + text);
    int reached = 0;
    sim::for_each_open(sim::kNfcControllerModel, [&](sim::Device &d) {
        Nfcc &c = *static_cast<Nfcc *>(d.data);
        if (!c.powered || !c.discovering) return;
        ++reached;
        send(d, what == "reader" ? reader_activation() : tag_activation(id));
    });
    if (reached == 0) sim::record("nfc", text + " (no discovery running)");
}

}  // namespace

namespace sim {
extern const DeviceModel kNfcControllerModel = {
    .name = "nfc",
    .serves = serves,
    .socket_type = SOCK_STREAM,
    .open = open,
    .write = write,
    .ioctl = ioctl,
    .close = close,
    .station = station,
};
}  // namespace sim
