// The input event devices of the simulated phone (dev/input/event*). Each device file in
// the sandbox describes one device, key=value lines:
//
//   name=gpio-keys          what EVIOCGNAME answers
//   key=114,115,116         EV_KEY codes it can report
//   sw=0                    EV_SW codes
//   abs=0,1,53,54           EV_ABS codes
//
// EVIOCGBIT answers the bits of these lists (type 0: the event types present, with EV_SYN
// always), EVIOCGNAME the name, EVIOCGVERSION and EVIOCGID fixed values. A read gives
// 24-byte input_event records (time, type, code, value). The station sends
//   "input key <code> [press|release|click] [eventN]"   (click, the default: press then release)
//   "input sw <code> <value> [eventN]"
//   "input touch <x> <y> [eventN]"
// each followed by a synchronisation report, to every open of the device named, or else
// of the first device (in name order) whose lists hold the code.
#include <linux/input.h>
#include <sys/time.h>

#include <algorithm>
#include <cstdlib>
#include <cstring>
#include <set>
#include <sstream>
#include <string>
#include <vector>

#include "platform/device.h"
#include "platform/sim/chardev.h"
#include "platform/sim/sim.h"

namespace sim {
extern const DeviceModel kInputEventModel;
}

namespace {

struct Caps {
    std::string name;
    std::set<int> key, sw, abs;
};

std::set<int> codes(const std::string &list) {
    std::set<int> out;
    std::istringstream in(list);
    for (std::string c; std::getline(in, c, ',');)
        if (!c.empty()) out.insert(static_cast<int>(strtol(c.c_str(), nullptr, 0)));
    return out;
}

Caps caps_of(const std::string &path) {
    Caps c;
    std::string v, file = sim::map(path.c_str());
    if (sim::read_kv(file, "name", v)) c.name = v;
    if (sim::read_kv(file, "key", v)) c.key = codes(v);
    if (sim::read_kv(file, "sw", v)) c.sw = codes(v);
    if (sim::read_kv(file, "abs", v)) c.abs = codes(v);
    return c;
}

bool serves(const std::string &path) {
    return path.compare(0, 16, "/dev/input/event") == 0 && path.size() > 16 && path.find('/', 16) == std::string::npos;
}

int open(sim::Device &d) {
    d.data = new Caps(caps_of(d.path));
    return 0;
}

void close(sim::Device &d) { delete static_cast<Caps *>(d.data); }

// Copies a bitmap of max_code + 1 bits, in longs as the kernel lays it out, cut to size.
int put_bits(const std::set<int> &bits, int max_code, void *arg, size_t size) {
    size_t longs = (static_cast<size_t>(max_code) + 1 + 63) / 64;
    std::vector<unsigned char> map(longs * 8, 0);
    for (int b : bits)
        if (b >= 0 && b <= max_code) map[static_cast<size_t>(b) / 8] |= static_cast<unsigned char>(1u << (b % 8));
    size_t n = std::min(size, map.size());
    memcpy(arg, map.data(), n);
    return static_cast<int>(n);
}

int ioctl(sim::Device &d, unsigned long request, void *arg) {
    const Caps &c = *static_cast<Caps *>(d.data);
    unsigned nr = _IOC_NR(request);
    size_t size = _IOC_SIZE(request);
    if (_IOC_TYPE(request) != 'E' || arg == nullptr) {
        errno = _IOC_TYPE(request) != 'E' ? ENOTTY : EFAULT;
        return -1;
    }
    if (_IOC_DIR(request) == _IOC_READ && nr >= 0x20 && nr < 0x20 + EV_MAX + 1) {
        switch (nr - 0x20) {
            case 0: {
                std::set<int> types{EV_SYN};
                if (!c.key.empty()) types.insert(EV_KEY);
                if (!c.abs.empty()) types.insert(EV_ABS);
                if (!c.sw.empty()) types.insert(EV_SW);
                return put_bits(types, EV_MAX, arg, size);
            }
            case EV_KEY: return put_bits(c.key, KEY_MAX, arg, size);
            case EV_ABS: return put_bits(c.abs, ABS_MAX, arg, size);
            case EV_SW: return put_bits(c.sw, SW_MAX, arg, size);
            default: return put_bits({}, nr - 0x20 == EV_REL ? REL_MAX : 0x7f, arg, size);
        }
    }
    if (_IOC_DIR(request) == _IOC_READ && nr == _IOC_NR(EVIOCGNAME(0))) {
        size_t n = std::min(size, c.name.size() + 1);
        memcpy(arg, c.name.c_str(), n);
        return static_cast<int>(n);
    }
    if (request == EVIOCGVERSION) {
        *static_cast<int *>(arg) = EV_VERSION;
        return 0;
    }
    if (request == EVIOCGID) {
        struct input_id id {BUS_HOST, 0, 0, 1};
        memcpy(arg, &id, sizeof id);
        return 0;
    }
    if (request == EVIOCGRAB || request == EVIOCSCLOCKID) return 0;
    errno = EINVAL;
    return -1;
}

struct input_event record(int type, int code, int value) {
    struct input_event e {};
    struct timeval tv {};
    dev::gettimeofday(&tv);
    e.input_event_sec = tv.tv_sec;
    e.input_event_usec = tv.tv_usec;
    e.type = static_cast<__u16>(type);
    e.code = static_cast<__u16>(code);
    e.value = value;
    return e;
}

// The device that gets an event: the one named, else the first whose list holds the code.
std::string target(const std::string &named, int type, int code) {
    std::vector<std::string> names = dev::list_dir("/dev/input");
    std::sort(names.begin(), names.end(), [](const std::string &a, const std::string &b) {
        return a.size() != b.size() ? a.size() < b.size() : a < b;
    });
    for (const auto &n : names) {
        if (n.compare(0, 5, "event") != 0) continue;
        if (!named.empty()) {
            if (n == named) return "/dev/input/" + n;
            continue;
        }
        Caps c = caps_of("/dev/input/" + n);
        const std::set<int> &list = type == EV_KEY ? c.key : type == EV_SW ? c.sw : c.abs;
        if (list.count(code)) return "/dev/input/" + n;
    }
    return "";
}

void deliver(const std::string &path, const std::vector<struct input_event> &events, const std::string &what) {
    int opens = 0;
    sim::for_each_open(sim::kInputEventModel, [&](sim::Device &d) {
        if (d.path != path) return;
        ++opens;
        sim::device_send(d, events.data(), events.size() * sizeof(struct input_event));
    });
    sim::record("input", path.substr(11) + " " + what + (opens ? "" : " (not read)"));
}

void station(const std::string &text) {
    std::istringstream in(text);
    std::string verb, a, b, c;
    in >> verb >> a >> b >> c;
    auto device_word = [](const std::string &w) { return w.compare(0, 5, "event") == 0 ? w : std::string(); };
    if (verb == "key" && !a.empty()) {
        int code = atoi(a.c_str());
        std::string how = b.empty() || device_word(b) == b ? "click" : b;
        std::string named = device_word(b).empty() ? device_word(c) : device_word(b);
        std::string path = target(named, EV_KEY, code);
        if (path.empty()) return sim::record("input", "no device for key " + a);
        std::vector<struct input_event> ev;
        if (how == "press" || how == "click") ev.push_back(record(EV_KEY, code, 1)), ev.push_back(record(EV_SYN, SYN_REPORT, 0));
        if (how == "release" || how == "click") ev.push_back(record(EV_KEY, code, 0)), ev.push_back(record(EV_SYN, SYN_REPORT, 0));
        if (ev.empty()) return sim::record("input", "unknown key action " + how);
        deliver(path, ev, "key " + a + " " + how);
    } else if (verb == "sw" && !a.empty() && !b.empty()) {
        int code = atoi(a.c_str());
        std::string path = target(device_word(c), EV_SW, code);
        if (path.empty()) return sim::record("input", "no device for switch " + a);
        deliver(path, {record(EV_SW, code, atoi(b.c_str())), record(EV_SYN, SYN_REPORT, 0)}, "sw " + a + " " + b);
    } else if (verb == "touch" && !a.empty() && !b.empty()) {
        std::string path = target(device_word(c), EV_ABS, ABS_MT_POSITION_X);
        if (path.empty()) path = target(device_word(c), EV_ABS, ABS_X);
        if (path.empty()) return sim::record("input", "no touch device");
        Caps caps = caps_of(path);
        bool mt = caps.abs.count(ABS_MT_POSITION_X) > 0;
        deliver(path,
                {record(EV_ABS, mt ? ABS_MT_POSITION_X : ABS_X, atoi(a.c_str())),
                 record(EV_ABS, mt ? ABS_MT_POSITION_Y : ABS_Y, atoi(b.c_str())), record(EV_SYN, SYN_REPORT, 0)},
                "touch " + a + " " + b);
    } else {
        sim::record("input", "unknown station line: " + text);
    }
}

}  // namespace

namespace sim {
extern const DeviceModel kInputEventModel = {
    .name = "input",
    .serves = serves,
    .socket_type = SOCK_STREAM,
    .open = open,
    .ioctl = ioctl,
    .close = close,
    .station = station,
};
}  // namespace sim
