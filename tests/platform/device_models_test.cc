// Devices that answer: descriptors of emulated devices behave as the handlers use them
// (epoll, read, write, ioctl, close), the input event devices report what a station
// injects, and a model that owns an attribute node sees every write to it.
#include <fcntl.h>
#include <gtest/gtest.h>
#include <linux/input.h>
#include <sys/epoll.h>
#include <sys/socket.h>
#include <sys/syscall.h>
#include <sys/time.h>
#include <unistd.h>

#include <atomic>
#include <cerrno>
#include <chrono>
#include <cstring>
#include <fstream>
#include <string>
#include <thread>
#include <vector>

#include "platform/device.h"
#include "platform/factory.h"
#include "platform/sim/chardev.h"
#include "platform/sim/sim.h"
#include "tests/support/sandbox.h"

namespace {

static_assert(sizeof(struct input_event) == 24, "input records are 24 bytes on this host");

class Devices : public ::testing::Test {
protected:
    void SetUp() override { box.activate(); }
    void TearDown() override {
        for (int fd : fds) ::close(fd);
    }
    int open_input(const std::string &name) {
        int fd = dev::open(("/dev/input/" + name).c_str(), O_RDONLY);
        if (fd >= 0) fds.push_back(fd);
        return fd;
    }
    void inject(const std::string &line) { ASSERT_TRUE(sim::station_send(box.root, "input " + line)) << strerror(errno); }
    // The record of effects once something is in it (the device thread writes it).
    std::string events_when_any() const {
        for (int i = 0; i < 500 && box.events().empty(); ++i) std::this_thread::sleep_for(std::chrono::milliseconds(2));
        return box.events();
    }
    Sandbox box;
    std::vector<int> fds;
};

// Waits at most timeout_ms for readiness, then reads once.
std::string read_when_ready(int fd, size_t size, int timeout_ms = 5000) {
    int ep = epoll_create1(EPOLL_CLOEXEC);
    struct epoll_event ev {};
    ev.events = EPOLLIN | EPOLLWAKEUP;  // as the key reader registers
    epoll_ctl(ep, EPOLL_CTL_ADD, fd, &ev);
    std::string got(size, '\0');
    ssize_t n = epoll_wait(ep, &ev, 1, timeout_ms) == 1 ? ::read(fd, got.data(), size) : 0;
    ::close(ep);
    got.resize(n > 0 ? static_cast<size_t>(n) : 0);
    return got;
}

// The records as "type:code=value " each.
std::string records(const std::string &raw) {
    std::string s;
    for (size_t at = 0; at + sizeof(struct input_event) <= raw.size(); at += sizeof(struct input_event)) {
        struct input_event e {};
        memcpy(&e, raw.data() + at, sizeof e);
        s += std::to_string(e.type) + ":" + std::to_string(e.code) + "=" + std::to_string(e.value) + " ";
    }
    return s;
}

// The codes set in the map EVIOCGBIT gives for a buffer of size bytes, as "1,116".
std::string set_bits(int fd, int type, size_t size) {
    unsigned char map[KEY_MAX / 8 + 1] = {0};
    EXPECT_EQ(dev::ioctl(fd, EVIOCGBIT(type, size), map), static_cast<int>(size)) << "type " << type;
    std::string s;
    for (size_t b = 0; b < size * 8; ++b)
        if ((map[b / 8] >> (b % 8)) & 1) s += (s.empty() ? "" : ",") + std::to_string(b);
    return s;
}

struct CapsCase {
    const char *device, *name;
    const char *types, *keys, *abs, *sw;  // every code set, in order
    const char *file;                     // the sandbox's device file, or nullptr: the default phone's
};
void PrintTo(const CapsCase &c, std::ostream *os) { *os << c.device; }

class Capabilities : public Devices, public ::testing::WithParamInterface<CapsCase> {};

// EVIOCGBIT and EVIOCGNAME answer from the device file; a short buffer gets a cut map or name.
TEST_P(Capabilities, EviocgbitAnswersPerDevice) {
    const CapsCase &c = GetParam();
    if (c.file) box.write(std::string("/dev/input/") + c.device, c.file);
    int fd = open_input(c.device);
    ASSERT_GE(fd, 0);
    EXPECT_EQ(set_bits(fd, 0, 8), c.types);
    EXPECT_EQ(set_bits(fd, EV_KEY, KEY_MAX / 8 + 1), c.keys);
    EXPECT_EQ(set_bits(fd, EV_KEY, 4), "");  // cut to the caller's length: every key is above 31
    EXPECT_EQ(set_bits(fd, EV_ABS, 8), c.abs);
    EXPECT_EQ(set_bits(fd, EV_SW, 8), c.sw);
    char name[64] = {0}, cut[4] = {'x', 'x', 'x', 'x'};
    EXPECT_EQ(dev::ioctl(fd, EVIOCGNAME(sizeof name), name), static_cast<int>(strlen(c.name) + 1));
    EXPECT_STREQ(name, c.name);
    EXPECT_EQ(dev::ioctl(fd, EVIOCGNAME(3), cut), 3);
    EXPECT_EQ(std::string(cut, 4), std::string(c.name, 3) + "x");
}

const CapsCase kCaps[] = {
    {"event0", "qpnp_pon", "0,1", "114,116", "", "", nullptr},
    {"event1", "gpio-keys", "0,1", "102,115,139,143,158,164,172,226,308,600", "", "", nullptr},
    {"event2", "fts_ts", "0,1,3", "330", "0,1,47,53,54,57", "", nullptr},
    {"event3", "hall_sensor", "0,5", "", "", "0,1", nullptr},
    {"event4", "sidekey", "0,1", "311,312,752,753", "", "", nullptr},
    {"event7", "extra", "0,1", "767", "", "", "name=extra\nkey=0x2ff\n"},
};
INSTANTIATE_TEST_SUITE_P(Phone, Capabilities, ::testing::ValuesIn(kCaps),
                         [](const auto &i) { return std::string(i.param.device); });

// A request that is not an input one, a reused descriptor number and a device the phone lacks all fail.
TEST_F(Devices, ForeignRequestsReusedNumbersAndMissingDevicesFail) {
    int fd = dev::open("/dev/input/event0", O_RDONLY);
    unsigned char map[8] = {0};
    EXPECT_EQ(dev::ioctl(fd, _IOR('T', 1, int), map), -1);
    EXPECT_EQ(errno, ENOTTY);
    fds.push_back(dup(fd));  // the open lives on: only its number is free again
    ::close(fd);
    int pipe_fds[2];
    ASSERT_EQ(pipe(pipe_fds), 0);
    fds.insert(fds.end(), pipe_fds, pipe_fds + 2);
    ASSERT_EQ(pipe_fds[0], fd) << "the lowest free number is used again";
    EXPECT_EQ(dev::ioctl(fd, EVIOCGBIT(0, sizeof map), map), -1);
    EXPECT_EQ(errno, ENOTTY);  // the pipe's own answer, not the closed device's

    ::unlink(box.path("/dev/input/event1").c_str());
    errno = 0;
    EXPECT_LT(dev::open("/dev/input/event1", O_RDONLY), 0);
    EXPECT_EQ(errno, ENOENT);
    EXPECT_EQ(dev::fopen("/dev/input/event1", "r"), nullptr);
}

// A thread asleep in epoll_wait is woken by an injected key, stamped between the bounds taken around it.
TEST_F(Devices, StationKeyWakesAThreadWaitingInEpoll) {
    int fd = open_input("event1");
    ASSERT_GE(fd, 0);
    std::atomic<pid_t> tid{0};
    std::string got;
    std::thread waiter([&] {
        tid = static_cast<pid_t>(syscall(SYS_gettid));
        got = read_when_ready(fd, 2 * sizeof(struct input_event), 10000);
    });
    for (int i = 0; i < 500; ++i) {  // inject only once the thread sleeps in the kernel
        std::ifstream st("/proc/self/task/" + std::to_string(tid.load()) + "/stat");
        std::string all((std::istreambuf_iterator<char>(st)), std::istreambuf_iterator<char>());
        size_t paren = all.rfind(')');
        if (tid && paren != std::string::npos && paren + 2 < all.size() && all[paren + 2] == 'S') break;
        std::this_thread::sleep_for(std::chrono::milliseconds(2));
    }
    struct timeval before {}, after {};
    dev::gettimeofday(&before);
    inject("key 115 press");
    waiter.join();
    dev::gettimeofday(&after);
    ASSERT_EQ(got.size(), 48u);  // the press and its report
    EXPECT_EQ(records(got), "1:115=1 0:0=0 ");
    struct input_event press {};
    memcpy(&press, got.data(), sizeof press);
    long long t = press.input_event_sec * 1000000LL + press.input_event_usec;
    EXPECT_GE(t, before.tv_sec * 1000000LL + before.tv_usec);
    EXPECT_LE(t, after.tv_sec * 1000000LL + after.tv_usec);
}

struct InjectCase {
    const char *name, *line;
    const char *device;  // the device that reports it
    const char *events;  // type:code=value, in order
    const char *record;  // events.log line
};
void PrintTo(const InjectCase &c, std::ostream *os) { *os << c.line; }

class Injection : public Devices, public ::testing::WithParamInterface<InjectCase> {};

// Every open of the reporting device gets its own copy; other devices hear nothing.
TEST_P(Injection, ReachesTheDeviceThatReportsIt) {
    const InjectCase &c = GetParam();
    int fd = open_input(c.device), twin = open_input(c.device);
    int other = open_input(std::string(c.device) == "event0" ? "event1" : "event0");
    ASSERT_TRUE(fd >= 0 && twin >= 0 && other >= 0);
    inject(c.line);
    EXPECT_EQ(records(read_when_ready(fd, 256)), c.events);
    EXPECT_EQ(records(read_when_ready(twin, 256)), c.events);
    EXPECT_EQ(read_when_ready(other, 256, 100), "");
    EXPECT_EQ(box.events(), std::string(c.record) + "\n");
}

INSTANTIATE_TEST_SUITE_P(
    Station, Injection,
    ::testing::Values(
        InjectCase{"PowerClick", "key 116", "event0", "1:116=1 0:0=0 1:116=0 0:0=0 ", "input event0 key 116 click"},
        InjectCase{"VolumeUpRelease", "key 115 release", "event1", "1:115=0 0:0=0 ", "input event1 key 115 release"},
        InjectCase{"NamedDevice", "key 116 press event1", "event1", "1:116=1 0:0=0 ", "input event1 key 116 press"},
        InjectCase{"SideKey", "key 311 click", "event4", "1:311=1 0:0=0 1:311=0 0:0=0 ", "input event4 key 311 click"},
        InjectCase{"Switch", "sw 1 1", "event3", "5:1=1 0:0=0 ", "input event3 sw 1 1"},
        InjectCase{"Touch", "touch 540 1200", "event2", "3:53=540 3:54=1200 0:0=0 ", "input event2 touch 540 1200"}),
    [](const auto &i) { return std::string(i.param.name); });

// No phone device open: the station is told; opened and closed again: the key is recorded as lost.
TEST_F(Devices, NobodyReadingIsReportedToTheStation) {
    errno = 0;
    EXPECT_FALSE(sim::station_send(box.root, "input key 116"));
    EXPECT_EQ(errno, ENXIO);
    ::close(dev::open("/dev/input/event0", O_RDONLY));
    inject("key 116");
    EXPECT_EQ(events_when_any(), "input event0 key 116 click (not read)\n");
}

// A model of the mechanism itself: a device that answers writes, and a node owner.
std::vector<std::string> g_node_writes;

const sim::DeviceModel kTestModel = {
    .name = "test",
    .serves = [](const std::string &p) { return p == "/dev/testdev"; },
    .socket_type = SOCK_SEQPACKET,
    .open = [](sim::Device &d) { return d.flags & O_EXCL ? EBUSY : 0; },
    .write =
        [](sim::Device &d, const char *data, size_t len) {
            std::string reply = "re:" + std::string(data, len);
            sim::device_send(d, reply.data(), reply.size());
        },
    .ioctl = [](sim::Device &, unsigned long request, void *arg) { return *static_cast<int *>(arg) = static_cast<int>(request) + 1; },
    .close = [](sim::Device &d) { sim::record("testdev", "closed " + d.path); },
    .owns = [](const std::string &p) { return p == "/sys/kernel/debug/test/ctl"; },
    .node_write =
        [](const std::string &, const std::string &data) {
            g_node_writes.push_back(data);
            dev::write_node("/sys/kernel/debug/test/state", ("got " + data).c_str());
        },
    .station = [](const std::string &text) { sim::record("testdev", "station " + text); },
};

class Mechanism : public Devices {
protected:
    static void SetUpTestSuite() { sim::add_device_model(kTestModel); }
    void SetUp() override {
        Devices::SetUp();
        box.write("/dev/testdev", "");
        box.write("/sys/kernel/debug/test/ctl", "");
        box.write("/sys/kernel/debug/test/state", "none\n");
        g_node_writes.clear();
    }
};

// One write, one reply message; ioctl and close reach the model; it may refuse an open; station lines reach it by name.
TEST_F(Mechanism, WritesIoctlsAndStationLinesReachTheModel) {
    errno = 0;
    EXPECT_LT(dev::open("/dev/testdev", O_RDWR | O_EXCL), 0);
    EXPECT_EQ(errno, EBUSY);
    int fd = dev::open("/dev/testdev", O_RDWR);
    ASSERT_GE(fd, 0);
    ASSERT_EQ(::write(fd, "ping", 4), 4);
    ASSERT_EQ(::write(fd, "again", 5), 5);
    EXPECT_EQ(read_when_ready(fd, 64), "re:ping");
    EXPECT_EQ(read_when_ready(fd, 64), "re:again");
    int arg = 0;
    EXPECT_EQ(dev::ioctl(fd, 41, &arg), 42);
    EXPECT_EQ(arg, 42);
    ASSERT_TRUE(sim::station_send(box.root, "test hello there"));
    EXPECT_EQ(events_when_any(), "testdev station hello there\n");
    box.write("/.sim/events.log", "");
    ::close(fd);
    EXPECT_EQ(events_when_any(), "testdev closed /dev/testdev\n");
}

// Raw writes, write_policy_file and write_int all reach the owner; the node itself is only read.
TEST_F(Mechanism, EveryWriteToAnOwnedNodeReachesItsModel) {
    int fd = dev::open("/sys/kernel/debug/test/ctl", O_WRONLY | O_CREAT | O_TRUNC, 0666);
    ASSERT_GE(fd, 0);
    ASSERT_EQ(::write(fd, "\xC0\x01", 2), 2);
    ASSERT_EQ(::write(fd, "\xC1\x02", 2), 2);
    ::close(fd);
    std::string state;
    ASSERT_TRUE(dev::read_node("/sys/kernel/debug/test/state", state));  // a read after the writes sees them
    EXPECT_EQ(state, "got \xC1\x02");
    EXPECT_EQ(write_policy_file(0, "/sys/kernel/debug/test/ctl", O_WRONLY, "on"), 0);
    EXPECT_EQ(box.read("/sys/kernel/debug/test/state"), "got on");
    EXPECT_EQ(write_int("/sys/kernel/debug/test/ctl", 7), 0);
    EXPECT_EQ(box.read("/sys/kernel/debug/test/state"), "got 7");
    EXPECT_EQ(g_node_writes, (std::vector<std::string>{"\xC0\x01", "\xC1\x02", "on", "7"}));
    EXPECT_EQ(box.read("/sys/kernel/debug/test/ctl"), "");
}

}  // namespace
