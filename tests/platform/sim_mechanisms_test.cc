// The simulator's own mechanisms: how writes land on nodes and files, the time stamps of
// the record of effects, and values that change from one read or call to the next.
#include <gtest/gtest.h>

#include <fcntl.h>
#include <unistd.h>

#include <cerrno>
#include <chrono>
#include <cstring>
#include <functional>
#include <string>
#include <thread>
#include <vector>

#include "platform/android.h"
#include "platform/audio.h"
#include "platform/device.h"
#include "platform/factory.h"
#include "platform/modem.h"
#include "platform/sensor.h"
#include "platform/sim/sim.h"
#include "tests/support/in_process.h"
#include "tests/support/sandbox.h"

namespace {

class Mechanisms : public ::testing::Test {
protected:
    void SetUp() override { box.activate(); }
    Sandbox box;
};

// ---- writes: attribute nodes are replaced, files keep their tail

struct Writer {
    const char *name;
    std::function<void(const char *path)> write;  // writes "100"
    const char *file_after;                       // a regular file holding "12345\n" afterwards
};

const Writer kWriters[] = {
    {"WritePolicyFile", [](const char *p) { write_policy_file(0, p, O_WRONLY, "100"); }, "10045\n"},
    {"WritePolicyFileReadWrite", [](const char *p) { write_policy_file(0, p, O_RDWR, "100"); }, "10045\n"},
    {"WriteInt", [](const char *p) { write_int(p, 100); }, "100"},
    {"SystemFileAppend", [](const char *p) { kaelatcmd_write_system_file(p, O_WRONLY | O_CREAT | O_APPEND, "100"); },
     "12345\n100"},
    {"WriteNode", [](const char *p) { dev::write_node(p, "100"); }, "10045\n"},
    {"RawOpenWrite",
     [](const char *p) {
         int fd = dev::open(p, O_WRONLY);
         ASSERT_GE(fd, 0);
         ASSERT_EQ(::write(fd, "100", 3), 3);
         ::close(fd);
     },
     "10045\n"},
    {"FopenUpdate",
     [](const char *p) {
         FILE *f = dev::fopen(p, "r+");
         ASSERT_NE(f, nullptr);
         fputs("100", f);
         fclose(f);
     },
     "10045\n"},
    {"FopenAppend",
     [](const char *p) {
         FILE *f = dev::fopen(p, "a");
         ASSERT_NE(f, nullptr);
         fputs("100", f);
         fclose(f);
     },
     "12345\n100"},
};

struct Node {
    const char *name;
    const char *path;
    bool attribute;
};

const Node kNodes[] = {
    {"Sysfs", "/sys/class/power_supply/battery/keep_chg_soc", true},
    {"SysfsRelative", "sys/lcm/oled_acl", true},
    {"Procfs", "/proc/sysrq-trigger", true},
    {"Regmap", "/d/regmap/spmi0-00/address", true},
    {"Debugfs", "/sys/kernel/debug/cms/debug", true},
    {"DataFile", "/data/vendor/engineermode/bt_device", false},
    {"PersistFile", "/persist/wlan_mac.bin", false},
    {"CacheFile", "cache/recovery/last_atcmd0", false},
};

class NodeWrites : public Mechanisms, public ::testing::WithParamInterface<std::tuple<int, int>> {};

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
                         [](const ::testing::TestParamInfo<std::tuple<int, int>> &i) {
                             return std::string(kWriters[std::get<0>(i.param)].name) + "_" + kNodes[std::get<1>(i.param)].name;
                         });

TEST_F(Mechanisms, AttributeWriteNeverCreatesAMissingNode) {
    EXPECT_LT(write_policy_file(0, "/sys/class/leds/absent/brightness", O_WRONLY, "1"), 0);
    EXPECT_NE(write_int("/sys/class/leds/absent/brightness", 1), 0);
    EXPECT_FALSE(box.exists("/sys/class/leds/absent/brightness"));
}

TEST_F(Mechanisms, SysrqRecordKeepsErrno) {
    errno = EAGAIN;
    ASSERT_EQ(write_policy_file(0, "/proc/sysrq-trigger", 2, "c"), 0);
    EXPECT_EQ(errno, EAGAIN);
    EXPECT_EQ(box.events(), "sysrq c\n");
    EXPECT_EQ(box.read("/proc/sysrq-trigger"), "c");
}

// ---- time stamps

long long steady_ms() {
    return std::chrono::duration_cast<std::chrono::milliseconds>(std::chrono::steady_clock::now().time_since_epoch()).count();
}

TEST_F(Mechanisms, TimeStampsFollowTheElapsedTime) {
    long long a0 = steady_ms();
    sim::record("mark", "one");
    long long a1 = steady_ms();
    std::this_thread::sleep_for(std::chrono::milliseconds(150));
    long long b0 = steady_ms();
    sim::record("mark", "two");
    long long b1 = steady_ms();

    std::vector<Event> e = box.event_list();
    ASSERT_EQ(e.size(), 2u);
    EXPECT_EQ(e[0].kind, "mark");
    EXPECT_EQ(e[1].detail, "two");
    long long between = e[1].ms - e[0].ms;
    EXPECT_GE(between, b0 - a1 - 1);
    EXPECT_LE(between, b1 - a0 + 1);
    EXPECT_EQ(box.events(), "mark one\nmark two\n");
}

TEST_F(Mechanisms, TimeStampsAreMonotonicAcrossThreads) {
    std::vector<std::thread> threads;
    for (int t = 0; t < 4; ++t)
        threads.emplace_back([] {
            for (int i = 0; i < 25; ++i) sim::record("tick", "");
        });
    for (auto &t : threads) t.join();
    std::vector<Event> e = box.event_list();
    ASSERT_EQ(e.size(), 100u);
    for (size_t i = 1; i < e.size(); ++i) EXPECT_LE(e[i - 1].ms, e[i].ms) << "line " << i;
}

TEST_F(Mechanisms, TimeBaseIsSharedThroughTheSandbox) {
    sim::now_ms();
    std::string start = box.read("/.sim/started");
    ASSERT_FALSE(start.empty());
    // Another process of the same phone (a restarted daemon) reads the same start.
    box.write("/.sim/started", std::to_string(std::stoll(start) - 5000) + "\n");
    long long later = sim::now_ms();
    EXPECT_GE(later, 5000);
    EXPECT_LT(later, 5000 + 60000);
    ASSERT_TRUE(sim::restart_clock(box.root));  // a new boot starts from zero
    EXPECT_LT(sim::now_ms(), 60000);
    EXPECT_LT(sim::now_ms(), later);
}

// ---- sequences

struct SeqCase {
    const char *name;
    const char *what;
    std::vector<std::string> values;
    std::function<std::string()> read;  // one read or call of what the sequence drives
};
void PrintTo(const SeqCase &c, std::ostream *os) { *os << c.name; }

const SeqCase kSeqCases[] = {
    {"Node", "/sys/class/power_supply/usb/online", {"1", "0", "1"},
     [] {
         std::string s;
         dev::read_node("/sys/class/power_supply/usb/online", s);
         return s;
     }},
    {"NodeByFopen", "sys/class/power_supply/battery/capacity", {"87", "15"},
     [] {
         char buf[16] = "";
         FILE *f = dev::fopen("/sys/class/power_supply/battery/capacity", "r");
         if (!f) return std::string("(none)");
         if (!fgets(buf, sizeof buf, f)) buf[0] = '\0';
         fclose(f);
         return std::string(buf);
     }},
    {"NodeByShellCat", "/sys/class/power_supply/usb/online", {"0", "1"},
     [] {
         char buf[16] = "";
         ext_system("cat /sys/class/power_supply/usb/online", buf, sizeof buf);
         return std::string(buf);
     }},
    {"TestApp", "testapp:battery_mode get", {"busy", "(silent)", "ok"},
     [] {
         const char *r = sendMessage("battery_mode get");
         return std::string(r ? r : "(none)");
     }},
    {"TestAppPattern", "testapp:shutdown *", {"busy", "ok"},
     [] {
         const char *r = sendMessage("shutdown delay");
         return std::string(r ? r : "(none)");
     }},
    {"Camera", "camera:capture", {"fail#busy", "success#capture"}, [] { return std::string(sendMessageToCamera("capture")); }},
    {"Shell", "shell:ftcmd_camera", {"0,0,0,0", "1,1,1,1"},
     [] {
         char buf[32] = "";
         ext_system("ftcmd_camera", buf, sizeof buf);
         return std::string(buf);
     }},
    {"Sensor", "sensor:48", {"0,1", "1,2", "absent"},
     [] {
         SensorTestResult r{};
         long rc = kael_sensor_factory_test(48, &r, 0, 0);
         return rc != 0 ? std::string("absent") : std::to_string(r.success) + "," + std::to_string(static_cast<int>(r.value[0]));
     }},
    {"Audio", "audio:startMainEchoTest", {"-1", "0"}, [] { return std::to_string(startMainEchoTest()); }},
    {"Modem", "modem:em.118", {"6", "0"},
     [] {
         char reply[ZDR_EM_REPLY_SIZE] = {0};
         qmi_zdr_set_em_status(118, reply);
         return std::string(reply);
     }},
    {"Config", "config:project", {"RX3310", "WQ2207"}, [] { return std::string(is_project("WQ2207") ? "WQ2207" : "RX3310"); }},
};

std::string expected_text(const SeqCase &c, const std::string &v) {
    if (c.what[0] == '/' || std::string(c.what).rfind("sys/", 0) == 0) return v + "\n";
    if (v == "(silent)") return "(none)";
    return v;
}

class Sequences : public Mechanisms, public ::testing::WithParamInterface<SeqCase> {};

TEST_P(Sequences, ReadInOrderThenTheLastRepeats) {
    const SeqCase &c = GetParam();
    box.sequence(c.what, c.values);
    for (size_t i = 0; i < c.values.size() + 2; ++i) {
        const std::string &v = c.values[std::min(i, c.values.size() - 1)];
        EXPECT_EQ(c.read(), expected_text(c, v)) << "read " << i;
    }
    // Set again: it starts from the first value.
    box.sequence(c.what, c.values);
    EXPECT_EQ(c.read(), expected_text(c, c.values[0]));
}

INSTANTIATE_TEST_SUITE_P(Kinds, Sequences, ::testing::ValuesIn(kSeqCases),
                         [](const ::testing::TestParamInfo<SeqCase> &i) { return std::string(i.param.name); });

TEST_F(Mechanisms, SequenceStateLivesInTheSandbox) {
    box.sequence("testapp:go_to_sleep", {"busy", "wait", "ok"});
    EXPECT_STREQ(sendMessage("go_to_sleep"), "busy");
    // The position is a file: a daemon that restarts goes on where the last one stopped.
    EXPECT_NE(box.read("/.sim/sequences.pos").find("1 "), std::string::npos);
    EXPECT_STREQ(sendMessage("go_to_sleep"), "wait");
    box.write("/.sim/sequences.pos", "");  // rewound by hand
    EXPECT_STREQ(sendMessage("go_to_sleep"), "busy");

    // A station that edits the values while the phone runs starts the sequence again.
    std::string text = box.read("/.sim/sequences");
    box.write("/.sim/sequences", text.replace(text.find("busy"), 4, "late"));
    EXPECT_STREQ(sendMessage("go_to_sleep"), "late");
    EXPECT_STREQ(sendMessage("go_to_sleep"), "wait");

    // Removed: the reply script answers again.
    box.sequence("testapp:go_to_sleep", {});
    EXPECT_STREQ(sendMessage("go_to_sleep"), "ok");
}

TEST_F(Mechanisms, SequenceValuesKeepSpecialText) {
    box.sequence("shell:getprop x", {"line1\nline2", "#hash", "", "back\\slash", "[not a name]"});
    auto run = [] {
        char buf[64] = "preset";
        ext_system("getprop x", buf, sizeof buf);
        return std::string(buf);
    };
    EXPECT_EQ(run(), "line1\nline2");
    EXPECT_EQ(run(), "#hash");
    EXPECT_EQ(run(), "preset");  // empty output: the preset text stays
    EXPECT_EQ(run(), "back\\slash");
    EXPECT_EQ(run(), "[not a name]");
}

// ---- the writes that motivated the node rule, end to end

class NodeCommands : public InProcess {};

TEST_F(NodeCommands, CloseAdbLeavesKeepChargeSocAtExactly100) {
    box.write("/sys/class/power_supply/battery/keep_chg_soc", "12345\n");
    EXPECT_EQ(serve("AT+QXADB=0,0"), "AT+QXADB=0,0\r\n\r\nOK\r\n");
    EXPECT_EQ(box.read("/sys/class/power_supply/battery/keep_chg_soc"), "100");
}

TEST_F(NodeCommands, SleepInAtModeLeavesAutosleepAtExactlyMem) {
    const int saved_sp = is_sp;
    is_sp = 1;
    box.write("/sys/power/autosleep", "freeze\n");
    box.write("/sys/power/ftcmd_state", "0\n");
    std::string frame = "AT+EQSB=0\r\n\r\nOK\r\nAT+EQSB=0\r\n\r\nOK\r\n";
    EXPECT_EQ(serve("AT+EQSB=0", SRC_TCP, frame.size()), frame);
    EXPECT_EQ(box.read("/sys/power/autosleep"), "mem");
    EXPECT_EQ(box.read("/sys/power/ftcmd_state"), "1");
    EXPECT_EQ(box.read("/sys/kernel/debug/cms/debug"), "fg-cutoff");
    is_sp = saved_sp;
}

}  // namespace
