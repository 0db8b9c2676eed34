// The simulator's own mechanisms: how writes land on nodes and files, the time stamps of
// the record of effects, and values that change from one read or call to the next.
#include <fcntl.h>
#include <gtest/gtest.h>

#include <chrono>
#include <functional>
#include <string>
#include <thread>
#include <vector>

#include "platform/audio.h"
#include "platform/device.h"
#include "platform/factory.h"
#include "platform/modem.h"
#include "platform/sensor.h"
#include "platform/sim/sim.h"
#include "tests/support/sandbox.h"

namespace {

class Mechanisms : public ::testing::Test {
protected:
    void SetUp() override { box.activate(); }
    Sandbox box;
};

// Writes "100" through one API: the text a regular file holding "12345\n" has afterwards.
struct Writer {
    const char *name;
    std::function<void(const char *path)> write;
    const char *file_after;
};

void through_fopen(const char *p, const char *mode) {
    FILE *f = dev::fopen(p, mode);
    ASSERT_NE(f, nullptr);
    fputs("100", f);
    fclose(f);
}

// One writer per way the open flags reach the file: plain, read-write, truncating, appending, stdio.
const Writer kWriters[] = {
    {"WritePolicyFileReadWrite", [](const char *p) { write_policy_file(0, p, O_RDWR, "100"); }, "10045\n"},
    {"WriteNode", [](const char *p) { dev::write_node(p, "100"); }, "10045\n"},
    {"WriteInt", [](const char *p) { write_int(p, 100); }, "100"},
    {"SystemFileAppend", [](const char *p) { kaelatcmd_write_system_file(p, O_WRONLY | O_CREAT | O_APPEND, "100"); },
     "12345\n100"},
    {"FopenUpdate", [](const char *p) { through_fopen(p, "r+"); }, "10045\n"},
    {"FopenAppend", [](const char *p) { through_fopen(p, "a"); }, "12345\n100"},
};

struct Node {
    const char *name, *path;
    bool attribute;
};

// One node per top directory that holds attributes, a regular file, and relative spellings.
const Node kNodes[] = {
    {"SysfsRelative", "sys/lcm/oled_acl", true},
    {"Procfs", "/proc/sysrq-trigger", true},
    {"Regmap", "/d/regmap/spmi0-00/data", true},
    {"DataFile", "/data/vendor/engineermode/bt_device", false},
    {"CacheFile", "cache/recovery/last_atcmd0", false},
};

class NodeWrites : public Mechanisms, public ::testing::WithParamInterface<std::tuple<int, int>> {};

// Every write API replaces an attribute node's value whole; regular files keep their tail.
TEST_P(NodeWrites, ReplaceAttributesOverwriteFileHeads) {
    const Writer &w = kWriters[std::get<0>(GetParam())];
    const Node &n = kNodes[std::get<1>(GetParam())];
    box.write(n.path, "12345\n");
    w.write(n.path);
    EXPECT_EQ(box.read(n.path), n.attribute ? "100" : w.file_after);
}

INSTANTIATE_TEST_SUITE_P(WriterByNode, NodeWrites,
                         ::testing::Combine(::testing::Range(0, static_cast<int>(std::size(kWriters))),
                                            ::testing::Range(0, static_cast<int>(std::size(kNodes)))),
                         [](const auto &i) {
                             return std::string(kWriters[std::get<0>(i.param)].name) + "_" + kNodes[std::get<1>(i.param)].name;
                         });

// A missing attribute node is never created; a sysrq write is recorded and keeps errno.
TEST_F(Mechanisms, MissingAttributeStaysMissingSysrqKeepsErrno) {
    EXPECT_NE(write_int("/sys/class/leds/absent/brightness", 1), 0);
    EXPECT_FALSE(box.exists("/sys/class/leds/absent/brightness"));
    errno = EAGAIN;
    ASSERT_EQ(write_policy_file(0, "/proc/sysrq-trigger", 2, "c"), 0);
    EXPECT_EQ(errno, EAGAIN);
    EXPECT_EQ(box.events(), "sysrq c\n");
    EXPECT_EQ(box.read("/proc/sysrq-trigger"), "c");
}

long long steady_ms() {
    return std::chrono::duration_cast<std::chrono::milliseconds>(std::chrono::steady_clock::now().time_since_epoch()).count();
}

// Stamps differ by the time that passed (within the bounds measured around them), and
// never go back when threads record at once.
TEST_F(Mechanisms, TimeStampsFollowTheElapsedTimeAcrossThreads) {
    long long a0 = steady_ms();
    sim::record("mark", "one");
    long long a1 = steady_ms();
    std::this_thread::sleep_for(std::chrono::milliseconds(150));
    long long b0 = steady_ms();
    sim::record("mark", "two");
    long long b1 = steady_ms();
    std::vector<Event> e = box.event_list();
    ASSERT_EQ(box.events(), "mark one\nmark two\n");
    EXPECT_GE(e[1].ms - e[0].ms, b0 - a1 - 1);
    EXPECT_LE(e[1].ms - e[0].ms, b1 - a0 + 1);

    std::vector<std::thread> threads;
    for (int t = 0; t < 4; ++t)
        threads.emplace_back([] {
            for (int i = 0; i < 25; ++i) sim::record("tick", "");
        });
    for (auto &t : threads) t.join();
    e = box.event_list();
    ASSERT_EQ(e.size(), 102u);
    for (size_t i = 1; i < e.size(); ++i) EXPECT_LE(e[i - 1].ms, e[i].ms) << "line " << i;
}

// Another process of the same phone (a restarted daemon) reads the same start; a new boot starts from zero.
TEST_F(Mechanisms, TimeBaseIsSharedThroughTheSandbox) {
    sim::now_ms();
    std::string start = box.read("/.sim/started");
    ASSERT_FALSE(start.empty());
    box.write("/.sim/started", std::to_string(std::stoll(start) - 5000) + "\n");
    long long later = sim::now_ms();
    EXPECT_GE(later, 5000);
    EXPECT_LT(later, 5000 + 60000);
    ASSERT_TRUE(sim::restart_clock(box.root));
    EXPECT_LT(sim::now_ms(), std::min(later, 60000LL));
}

std::string text_of(const char *r) { return r ? r : "(none)"; }
std::string node_text(const char *path) {
    std::string s;
    dev::read_node(path, s);
    return s;
}
std::string fopen_line(const char *path) {
    char buf[16] = "";
    FILE *f = dev::fopen(path, "r");
    if (!f) return "(none)";
    if (!fgets(buf, sizeof buf, f)) buf[0] = '\0';
    fclose(f);
    return buf;
}
std::string shell_out(const char *cmd) {
    char buf[32] = "(none)";
    ext_system(cmd, buf, sizeof buf);
    return buf;
}
std::string sensor48() {
    SensorTestResult r{};
    if (kael_sensor_factory_test(48, &r, 0, 0) != 0) return "absent";
    return std::to_string(r.success) + "," + std::to_string(static_cast<int>(r.value[0]));
}
std::string em118() {
    char reply[ZDR_EM_REPLY_SIZE] = {0};
    qmi_zdr_set_em_status(118, reply);
    return reply;
}

struct SeqCase {
    const char *name, *what;
    std::vector<std::string> values;
    std::function<std::string()> read;  // one read or call of what the sequence drives
};
void PrintTo(const SeqCase &c, std::ostream *os) { *os << c.name; }

// One row per place that takes sequence values; the shell row also carries the texts that need escaping.
const SeqCase kSeqCases[] = {
    {"Node", "/sys/class/power_supply/usb/online", {"1", "0", "1"},
     [] { return node_text("/sys/class/power_supply/usb/online"); }},
    {"NodeByFopen", "sys/class/power_supply/battery/capacity", {"87", "15"},
     [] { return fopen_line("/sys/class/power_supply/battery/capacity"); }},
    {"NodeByShellCat", "/sys/class/power_supply/usb/online", {"0", "1"},
     [] { return shell_out("cat /sys/class/power_supply/usb/online"); }},
    {"TestApp", "testapp:battery_mode get", {"busy", "(silent)", "ok"},
     [] { return text_of(sendMessage("battery_mode get")); }},
    {"TestAppPattern", "testapp:shutdown *", {"busy", "ok"}, [] { return text_of(sendMessage("shutdown delay")); }},
    {"Camera", "camera:capture", {"fail#busy", "success#capture"},
     [] { return text_of(sendMessageToCamera("capture")); }},
    {"Shell", "shell:getprop x", {"line1\nline2", "#hash", "", "back\\slash", "[not a name]"},
     [] { return shell_out("getprop x"); }},
    {"Sensor", "sensor:48", {"0,1", "1,2", "absent"}, sensor48},
    {"Audio", "audio:startMainEchoTest", {"-1", "0"}, [] { return std::to_string(startMainEchoTest()); }},
    {"Modem", "modem:em.118", {"6", "0"}, em118},
    {"Config", "config:project", {"RX3310", "WQ2207"},
     [] { return std::string(is_project("WQ2207") ? "WQ2207" : "RX3310"); }},
};

class Sequences : public Mechanisms, public ::testing::WithParamInterface<SeqCase> {};

// Values come in order, the last repeats, and setting the sequence again starts it over.
// A node reads its value as a line; no answer (silent, or an empty shell output) leaves "(none)".
TEST_P(Sequences, ReadInOrderThenTheLastRepeats) {
    const SeqCase &c = GetParam();
    bool node = c.what[0] == '/' || std::string(c.what).rfind("sys/", 0) == 0;
    auto expected = [&](const std::string &v) { return node ? v + "\n" : v.empty() || v == "(silent)" ? "(none)" : v; };
    box.sequence(c.what, c.values);
    for (size_t i = 0; i < c.values.size() + 2; ++i)
        EXPECT_EQ(c.read(), expected(c.values[std::min(i, c.values.size() - 1)])) << "read " << i;
    box.sequence(c.what, c.values);
    EXPECT_EQ(c.read(), expected(c.values[0]));
}

INSTANTIATE_TEST_SUITE_P(Kinds, Sequences, ::testing::ValuesIn(kSeqCases), [](const auto &i) { return std::string(i.param.name); });

// The position is a file (a restarted daemon goes on); edited values start over; removed, the script answers.
TEST_F(Mechanisms, SequenceStateLivesInTheSandbox) {
    box.sequence("testapp:go_to_sleep", {"busy", "wait", "ok"});
    EXPECT_STREQ(sendMessage("go_to_sleep"), "busy");
    EXPECT_NE(box.read("/.sim/sequences.pos").find("1 "), std::string::npos);
    EXPECT_STREQ(sendMessage("go_to_sleep"), "wait");
    box.write("/.sim/sequences.pos", "");
    EXPECT_STREQ(sendMessage("go_to_sleep"), "busy");
    std::string text = box.read("/.sim/sequences");
    box.write("/.sim/sequences", text.replace(text.find("busy"), 4, "late"));
    EXPECT_STREQ(sendMessage("go_to_sleep"), "late");
    EXPECT_STREQ(sendMessage("go_to_sleep"), "wait");
    box.sequence("testapp:go_to_sleep", {});
    EXPECT_STREQ(sendMessage("go_to_sleep"), "ok");
}

}  // namespace
