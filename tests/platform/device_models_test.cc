// Devices that answer: descriptors of emulated devices behave as the handlers use them
// (epoll, read, write, ioctl, close), the input event devices report what a station
// injects, and a model that owns an attribute node sees every write to it.
#include <gtest/gtest.h>

#include <fcntl.h>
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
    int open_input(const char *name, int flags = O_RDONLY) {
        int fd = dev::open((std::string("/dev/input/") + name).c_str(), flags);
        if (fd >= 0) fds.push_back(fd);
        return fd;
    }
    void inject(const std::string &line) { ASSERT_TRUE(sim::station_send(box.root, "input " + line)) << strerror(errno); }
    Sandbox box;
    std::vector<int> fds;
};

bool bit(const unsigned char *map, int n) { return (map[n / 8] >> (n % 8)) & 1; }

// Reads count records, waiting at most timeout_ms for each.
std::vector<struct input_event> read_records(int fd, size_t count, int timeout_ms = 5000) {
    std::vector<struct input_event> out;
    int ep = epoll_create1(EPOLL_CLOEXEC);
    struct epoll_event ev {};
    ev.events = EPOLLIN;
    epoll_ctl(ep, EPOLL_CTL_ADD, fd, &ev);
    while (out.size() < count) {
        if (epoll_wait(ep, &ev, 1, timeout_ms) != 1) break;
        struct input_event e {};
        if (::read(fd, &e, sizeof e) != static_cast<ssize_t>(sizeof e)) break;
        out.push_back(e);
    }
    ::close(ep);
    return out;
}

std::string text(const std::vector<struct input_event> &events) {
    std::string s;
    for (const auto &e : events) s += std::to_string(e.type) + ":" + std::to_string(e.code) + "=" + std::to_string(e.value) + " ";
    return s;
}

// ---- capabilities

struct CapsCase {
    const char *device;
    const char *name;
    std::vector<int> types;          // EV_* bits set
    std::vector<int> keys, no_keys;  // EV_KEY codes set and not set
    std::vector<int> sw, abs;
};
void PrintTo(const CapsCase &c, std::ostream *os) { *os << c.device; }

class Capabilities : public Devices, public ::testing::WithParamInterface<CapsCase> {};

TEST_P(Capabilities, EviocgbitAnswersPerDevice) {
    const CapsCase &c = GetParam();
    int fd = open_input(c.device);
    ASSERT_GE(fd, 0);

    unsigned char types[8] = {0};
    ASSERT_EQ(dev::ioctl(fd, EVIOCGBIT(0, sizeof types), types), 8);
    for (int t = 0; t <= EV_MAX; ++t) {
        bool want = t == EV_SYN;
        for (int x : c.types) want |= x == t;
        EXPECT_EQ(bit(types, t), want) << "event type " << t;
    }
    unsigned char keys[KEY_MAX / 8 + 1] = {0};
    EXPECT_EQ(dev::ioctl(fd, EVIOCGBIT(EV_KEY, sizeof keys), keys), static_cast<int>(sizeof keys));
    for (int k : c.keys) EXPECT_TRUE(bit(keys, k)) << "key " << k;
    for (int k : c.no_keys) EXPECT_FALSE(bit(keys, k)) << "key " << k;
    unsigned char sw[8] = {0}, abs[8] = {0};
    dev::ioctl(fd, EVIOCGBIT(EV_SW, sizeof sw), sw);
    dev::ioctl(fd, EVIOCGBIT(EV_ABS, sizeof abs), abs);
    for (int s : c.sw) EXPECT_TRUE(bit(sw, s)) << "switch " << s;
    for (int a : c.abs) EXPECT_TRUE(bit(abs, a)) << "axis " << a;

    char name[64] = {0};
    EXPECT_EQ(dev::ioctl(fd, EVIOCGNAME(sizeof name), name), static_cast<int>(strlen(c.name) + 1));
    EXPECT_STREQ(name, c.name);
    char cut[4] = {'x', 'x', 'x', 'x'};  // a short buffer gets the name cut to it
    EXPECT_EQ(dev::ioctl(fd, EVIOCGNAME(3), cut), 3);
    EXPECT_EQ(std::string(cut, 4), std::string(c.name, 3) + "x");
}

INSTANTIATE_TEST_SUITE_P(
    DefaultPhone, Capabilities,
    ::testing::Values(CapsCase{"event0", "qpnp_pon", {EV_KEY}, {KEY_POWER, KEY_VOLUMEDOWN}, {KEY_VOLUMEUP}},
                      CapsCase{"event1", "gpio-keys", {EV_KEY}, {KEY_VOLUMEUP, KEY_HOME, KEY_BACK, 308, 600}, {KEY_POWER}},
                      CapsCase{"event2", "fts_ts", {EV_KEY, EV_ABS}, {BTN_TOUCH}, {KEY_POWER}, {}, {ABS_X, ABS_MT_POSITION_X, ABS_MT_POSITION_Y}},
                      CapsCase{"event3", "hall_sensor", {EV_SW}, {}, {KEY_POWER, KEY_VOLUMEUP}, {0, 1}},
                      CapsCase{"event4", "sidekey", {EV_KEY}, {311, 312, 752, 753}, {KEY_POWER}}),
    [](const ::testing::TestParamInfo<CapsCase> &i) { return std::string(i.param.device); });

TEST_F(Devices, CapabilitiesComeFromTheSandbox) {
    box.write("/dev/input/event7", "name=extra\nkey=0x2ff\n");
    int fd = open_input("event7");
    ASSERT_GE(fd, 0);
    unsigned char keys[KEY_MAX / 8 + 1] = {0};
    ASSERT_EQ(dev::ioctl(fd, EVIOCGBIT(EV_KEY, sizeof keys), keys), static_cast<int>(sizeof keys));
    EXPECT_TRUE(bit(keys, KEY_MAX));
    EXPECT_EQ(dev::ioctl(fd, EVIOCGBIT(EV_KEY, 4), keys), 4);  // cut to the caller's length
    EXPECT_EQ(dev::ioctl(fd, _IOR('T', 1, int), keys), -1);   // not an input request
    EXPECT_EQ(errno, ENOTTY);
}

TEST_F(Devices, AMissingDeviceDoesNotOpen) {
    ::unlink(box.path("/dev/input/event1").c_str());
    errno = 0;
    EXPECT_LT(dev::open("/dev/input/event1", O_RDONLY), 0);
    EXPECT_EQ(errno, ENOENT);
    EXPECT_EQ(dev::fopen("/dev/input/event1", "r"), nullptr);
}

// ---- events

TEST_F(Devices, StationKeyWakesAThreadWaitingInEpoll) {
    int fd = open_input("event1", O_RDONLY);
    ASSERT_GE(fd, 0);
    int ep = epoll_create1(EPOLL_CLOEXEC);
    struct epoll_event reg {};
    reg.events = EPOLLIN | EPOLLWAKEUP;
    ASSERT_EQ(epoll_ctl(ep, EPOLL_CTL_ADD, fd, &reg), 0);

    std::atomic<pid_t> tid{0};
    std::atomic<int> woke{-1};
    unsigned char got[2 * sizeof(struct input_event)] = {0};
    ssize_t got_len = 0;
    std::thread waiter([&] {
        tid = static_cast<pid_t>(syscall(SYS_gettid));
        struct epoll_event ev {};
        woke = epoll_wait(ep, &ev, 1, 10000);  // a generous bound: the key wakes it long before
        got_len = ::read(fd, got, sizeof got);
    });
    // Inject only once the thread sleeps in the kernel (bounded wait on its state).
    for (int i = 0; i < 500 && woke < 0; ++i) {
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
    ::close(ep);

    ASSERT_EQ(woke, 1);
    ASSERT_EQ(got_len, static_cast<ssize_t>(sizeof got));  // the press and its report, 24 bytes each
    struct input_event press {}, report {};
    memcpy(&press, got, sizeof press);
    memcpy(&report, got + sizeof press, sizeof report);
    EXPECT_EQ(press.type, EV_KEY);
    EXPECT_EQ(press.code, KEY_VOLUMEUP);
    EXPECT_EQ(press.value, 1);
    EXPECT_EQ(report.type, EV_SYN);
    EXPECT_EQ(report.code, SYN_REPORT);
    EXPECT_EQ(report.value, 0);
    long long t = press.input_event_sec * 1000000LL + press.input_event_usec;
    EXPECT_GE(t, before.tv_sec * 1000000LL + before.tv_usec);
    EXPECT_LE(t, after.tv_sec * 1000000LL + after.tv_usec);
    // The layout is the kernel's: time (16 bytes), type, code, value.
    EXPECT_EQ(got[16], EV_KEY);
    EXPECT_EQ(got[18], KEY_VOLUMEUP);
    EXPECT_EQ(got[20], 1);
}

struct InjectCase {
    const char *name;
    const char *line;
    const char *device;  // the device that reports it
    const char *events;  // type:code=value, in order
    const char *record;  // events.log line
};
void PrintTo(const InjectCase &c, std::ostream *os) { *os << c.line; }

class Injection : public Devices, public ::testing::WithParamInterface<InjectCase> {};

TEST_P(Injection, ReachesTheDeviceThatReportsIt) {
    const InjectCase &c = GetParam();
    int fd = open_input(c.device);
    int other = open_input(std::string(c.device) == "event0" ? "event1" : "event0");
    ASSERT_GE(fd, 0);
    ASSERT_GE(other, 0);
    inject(c.line);
    size_t count = 0;
    for (const char *p = c.events; *p; ++p) count += *p == ' ';
    EXPECT_EQ(text(read_records(fd, count)), c.events);
    EXPECT_EQ(text(read_records(other, 1, 100)), "");  // other devices hear nothing
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
    [](const ::testing::TestParamInfo<InjectCase> &i) { return std::string(i.param.name); });

TEST_F(Devices, EveryOpenGetsItsOwnCopy) {
    int a = open_input("event0"), b = open_input("event0");
    ASSERT_GE(a, 0);
    ASSERT_GE(b, 0);
    inject("key 116 press");
    EXPECT_EQ(text(read_records(a, 2)), "1:116=1 0:0=0 ");
    EXPECT_EQ(text(read_records(b, 2)), "1:116=1 0:0=0 ");
}

TEST_F(Devices, NobodyReadingIsReportedToTheStation) {
    errno = 0;
    EXPECT_FALSE(sim::station_send(box.root, "input key 116"));  // no device of this phone open yet
    EXPECT_EQ(errno, ENXIO);
    int fd = open_input("event0");
    ASSERT_GE(fd, 0);
    ::close(fd);
    fds.clear();
    inject("key 116");  // the phone runs, but the device was closed: the key is lost
    for (int i = 0; i < 500 && box.events().empty(); ++i) std::this_thread::sleep_for(std::chrono::milliseconds(2));
    EXPECT_EQ(box.events(), "input event0 key 116 click (not read)\n");
}

TEST_F(Devices, AReusedDescriptorNumberNeverReachesTheOldDevice) {
    int fd = open_input("event0");
    ASSERT_GE(fd, 0);
    ::close(fd);
    fds.clear();
    int pipe_fds[2];
    ASSERT_EQ(pipe(pipe_fds), 0);
    ASSERT_EQ(pipe_fds[0], fd) << "the lowest free number is used again";
    unsigned char types[8] = {0};
    EXPECT_EQ(dev::ioctl(fd, EVIOCGBIT(0, sizeof types), types), -1);
    EXPECT_EQ(errno, ENOTTY);  // the pipe's own answer
    ::close(pipe_fds[0]);
    ::close(pipe_fds[1]);
}

// ---- models of the mechanism itself: a device that answers writes, a node owner

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
        [](const std::string &path, const std::string &data) {
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

TEST_F(Mechanism, WritesReachTheModelAndRepliesComeBack) {
    int fd = dev::open("/dev/testdev", O_RDWR);
    ASSERT_GE(fd, 0);
    ASSERT_EQ(::write(fd, "ping", 4), 4);
    ASSERT_EQ(::write(fd, "again", 5), 5);
    char buf[64];
    struct epoll_event ev {};
    int ep = epoll_create1(EPOLL_CLOEXEC);
    ev.events = EPOLLIN;
    epoll_ctl(ep, EPOLL_CTL_ADD, fd, &ev);
    ASSERT_EQ(epoll_wait(ep, &ev, 1, 5000), 1);
    ssize_t n = ::read(fd, buf, sizeof buf);
    EXPECT_EQ(std::string(buf, n > 0 ? n : 0), "re:ping");  // one write, one message
    ASSERT_EQ(epoll_wait(ep, &ev, 1, 5000), 1);
    n = ::read(fd, buf, sizeof buf);
    EXPECT_EQ(std::string(buf, n > 0 ? n : 0), "re:again");
    ::close(ep);

    int arg = 0;
    EXPECT_EQ(dev::ioctl(fd, 41, &arg), 42);
    EXPECT_EQ(arg, 42);
    ::close(fd);
    for (int i = 0; i < 500 && box.events().empty(); ++i) std::this_thread::sleep_for(std::chrono::milliseconds(2));
    EXPECT_EQ(box.events(), "testdev closed /dev/testdev\n");
}

TEST_F(Mechanism, AModelMayRefuseAnOpen) {
    errno = 0;
    EXPECT_LT(dev::open("/dev/testdev", O_RDWR | O_EXCL), 0);
    EXPECT_EQ(errno, EBUSY);
}

TEST_F(Mechanism, StationLinesReachTheModelByName) {
    int fd = dev::open("/dev/testdev", O_RDWR);  // the phone's device thread runs
    ASSERT_GE(fd, 0);
    ASSERT_TRUE(sim::station_send(box.root, "test hello there"));
    for (int i = 0; i < 500 && box.events().empty(); ++i) std::this_thread::sleep_for(std::chrono::milliseconds(2));
    EXPECT_EQ(box.events(), "testdev station hello there\n");
    ::close(fd);
}

TEST_F(Mechanism, EveryWriteToAnOwnedNodeReachesItsModel) {
    int fd = dev::open("/sys/kernel/debug/test/ctl", O_WRONLY | O_CREAT | O_TRUNC, 0666);
    ASSERT_GE(fd, 0);
    ASSERT_EQ(::write(fd, "\xC0\x01", 2), 2);
    ASSERT_EQ(::write(fd, "\xC1\x02", 2), 2);
    ::close(fd);
    std::string state;
    ASSERT_TRUE(dev::read_node("/sys/kernel/debug/test/state", state));  // a read after the writes sees them
    EXPECT_EQ(state, "got \xC1\x02");
    EXPECT_EQ(g_node_writes, (std::vector<std::string>{"\xC0\x01", "\xC1\x02"}));

    EXPECT_EQ(write_policy_file(0, "/sys/kernel/debug/test/ctl", O_WRONLY, "on"), 0);
    EXPECT_EQ(box.read("/sys/kernel/debug/test/state"), "got on");
    EXPECT_EQ(write_int("/sys/kernel/debug/test/ctl", 7), 0);
    EXPECT_EQ(box.read("/sys/kernel/debug/test/state"), "got 7");
    EXPECT_EQ(g_node_writes.size(), 4u);
    EXPECT_EQ(box.read("/sys/kernel/debug/test/ctl"), "");  // the node itself is only read
}

}  // namespace
