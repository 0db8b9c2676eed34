// The host tools as processes: ftcmd-sim runs a simulated phone, ftcmd-at (and stock
// clients: nc, socat) talk to it. Each test has its own sandbox, port and socket name.
#include <arpa/inet.h>
#include <fcntl.h>
#include <gtest/gtest.h>
#include <netinet/in.h>
#include <signal.h>
#include <sys/socket.h>
#include <sys/wait.h>
#include <unistd.h>

#include <chrono>
#include <filesystem>
#include <string>
#include <thread>
#include <vector>

#include "platform/device.h"
#include "tests/support/checks.h"
#include "tests/support/daemon.h"

namespace fs = std::filesystem;

namespace {

const std::string kNotSupportedTcp = "AT+QXWLAN\r\n\r\n\"AT not support\"\r\nERROR\r\n";
const std::string kNotSupportedBare = "AT+QXWLAN\r\n\"AT not support\"\r\nERROR\r\n";

int exit_status(int status) { return WIFEXITED(status) ? WEXITSTATUS(status) : 128 + WTERMSIG(status); }

// Starts argv with its stdout on *out_fd and stdin on *in_fd (or none), stderr to err_path.
pid_t spawn(const std::vector<std::string> &argv, int *out_fd, int *in_fd, const std::string &err_path) {
    int in[2] = {-1, -1}, out[2];
    if ((in_fd && pipe(in) != 0) || pipe(out) != 0) return -1;
    pid_t pid = fork();
    if (pid == 0) {
        if (in_fd) dup2(in[0], 0);
        dup2(out[1], 1);
        if (!err_path.empty()) dup2(open(err_path.c_str(), O_WRONLY | O_CREAT | O_APPEND, 0644), 2);
        for (int fd : {in[0], in[1], out[0], out[1]}) close(fd);
        std::vector<char *> args;
        for (const auto &a : argv) args.push_back(const_cast<char *>(a.c_str()));
        args.push_back(nullptr);
        execvp(args[0], args.data());
        _exit(127);
    }
    for (int fd : {in[0], out[1]}) close(fd);
    if (in_fd) *in_fd = in[1];
    *out_fd = out[0];
    return pid;
}

struct Outcome {
    int status = -1;
    std::string out;
};

// Runs argv with input on stdin; stdout is returned, stderr goes to the test's log.
Outcome run(const std::vector<std::string> &argv, const std::string &input = "") {
    int in = -1, out = -1;
    pid_t pid = spawn(argv, &out, &in, "");
    if (pid < 0) return {};
    signal(SIGPIPE, SIG_IGN);
    if (write(in, input.data(), input.size()) < 0) ADD_FAILURE() << "stdin not taken";
    close(in);
    Outcome r;
    r.out = read_some(out, SIZE_MAX, 30000);
    close(out);
    int status = 0;
    waitpid(pid, &status, 0);
    r.status = exit_status(status);
    return r;
}

Outcome at(const std::vector<std::string> &args) {
    std::vector<std::string> argv = {FTCMD_AT_BIN};
    argv.insert(argv.end(), args.begin(), args.end());
    return run(argv);
}

// One ftcmd-sim process; a test that fails half-way still ends it (and so its daemon).
struct Launcher {
    std::string root;
    int port = free_tcp_port();
    std::string local;
    pid_t pid = -1;
    int out_fd = -1;
    std::string out;  // its stdout so far

    explicit Launcher(const std::string &root_dir, std::vector<std::string> extra = {}) : root(root_dir) {
        local = "ftcmd_tools_test_" + std::to_string(getpid()) + "_" + std::to_string(port);
        std::vector<std::string> argv = {FTCMD_SIM_BIN, "--root", root, "--port", std::to_string(port), "--local", local};
        argv.insert(argv.end(), extra.begin(), extra.end());
        pid = spawn(argv, &out_fd, nullptr, root + ".log");
    }
    ~Launcher() {
        if (pid > 0) stop(SIGKILL);
        if (out_fd >= 0) close(out_fd);
    }
    bool wait_for(const std::string &text, int timeout_ms = 10000) {
        auto seen = [&] { return out.find(text) != std::string::npos; };
        return wait_until([&] { return seen() || (out += read_some(out_fd, 1, 100), seen()); }, timeout_ms);
    }
    bool ready() { return wait_for("ftcmd-sim: ready\n"); }
    // The exit status after sig, or the status it ended with by itself within timeout_ms.
    int stop(int sig, int timeout_ms = 5000) {
        if (sig != 0) kill(pid, sig);
        int status = 0;
        if (!wait_until([&] { return waitpid(pid, &status, WNOHANG) != 0; }, timeout_ms)) {
            kill(pid, SIGKILL);
            waitpid(pid, &status, 0);
        }
        pid = -1;
        return exit_status(status);
    }
    std::string tcp() const { return "127.0.0.1:" + std::to_string(port); }
    std::string station(const char *port_name) const { return root + "/station/" + port_name; }
};

struct AtCase {
    const char *name, *channel;  // the channel option, given this phone's address
    std::vector<std::string> args;  // options and lines after the channel
    std::string input;              // stdin
    std::string expected;
    int status;
};
void PrintTo(const AtCase &c, std::ostream *os) { *os << c.name; }

class AtTest : public ::testing::TestWithParam<AtCase> {};

// The station tool over each channel: raw and JSON output, stdin lines, the exit status.
TEST_P(AtTest, PrintsTheFramesAndJudgesTheResults) {
    const AtCase &c = GetParam();
    Sandbox box;
    Launcher sim(box.root);
    ASSERT_TRUE(sim.ready()) << sim.out;
    const std::string ch = c.channel;
    std::string to = ch == "--tcp" ? sim.tcp() : ch == "--local" ? sim.local : sim.station("ttyGS0");
    std::vector<std::string> argv = {FTCMD_AT_BIN, ch, to};
    argv.insert(argv.end(), c.args.begin(), c.args.end());
    Outcome r = run(argv, c.input);
    EXPECT_EQ(r.out, c.expected);
    EXPECT_EQ(r.status, c.status);
}

const std::string kJsonOk = "{\"line\": \"ATD112;\", \"echo\": \"ATD112;\", \"body\": \"\", \"result\": \"OK\"}\n";

INSTANTIATE_TEST_SUITE_P(
    Station, AtTest,
    ::testing::Values(
        AtCase{"TcpRaw", "--tcp", {"AT+QXWLAN"}, "", kNotSupportedBare, 1},
        AtCase{"TcpRawCrlf", "--tcp", {"--crlf", "AT+QXWLAN"}, "", kNotSupportedTcp, 1},
        AtCase{"TcpJsonOkCrlf", "--tcp", {"--json", "--crlf", "ATD112;"}, "",
               "{\"line\": \"ATD112;\", \"echo\": \"ATD112;\\r\\n\", \"body\": \"\", \"result\": \"OK\"}\n", 0},
        AtCase{"TcpJsonStdin", "--tcp", {"--json"}, "AT+QXWLAN=1\n\nAT+QXWLAN\n",
               "{\"line\": \"AT+QXWLAN=1\", \"echo\": \"AT+QXWLAN=1\", \"body\": \"\", \"result\": \"Not Implement\"}\n"
               "{\"line\": \"AT+QXWLAN\", \"echo\": \"AT+QXWLAN\", \"body\": \"\\\"AT not support\\\"\", \"result\": \"ERROR\"}\n",
               1},
        AtCase{"LocalOneAnswerPerConnection", "--local", {"--json", "ATD112;", "ATD112;"}, "", kJsonOk + kJsonOk, 0},
        AtCase{"SerialRaw", "--serial", {"AT+QXWLAN", "ATD112;"}, "", kNotSupportedBare + "ATD112;\r\nOK\r\n", 1},
        AtCase{"NoAnswerTimesOut", "--serial", {"--json", "--timeout", "0.5", "xyz"}, "",
               "{\"line\": \"xyz\", \"echo\": null, \"body\": null, \"result\": \"no answer\"}\n", 1}),
    [](const auto &i) { return std::string(i.param.name); });

struct CannedCase {
    const char *name;
    std::string reply, expected;
};
void PrintTo(const CannedCase &c, std::ostream *os) { *os << c.name; }

class CannedTest : public ::testing::TestWithParam<CannedCase> {};

// Frame shapes the handlers do not produce yet, from a canned phone that answers the first
// line with reply: an empty trailer ends on quiet, a frame for another line is unsolicited.
TEST_P(CannedTest, SplitsFramesFromUnsolicitedLines) {
    const CannedCase &c = GetParam();
    int ls = socket(AF_INET, SOCK_STREAM, 0);
    struct sockaddr_in a {};
    a.sin_family = AF_INET;
    a.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
    socklen_t len = sizeof a;
    ASSERT_EQ(bind(ls, reinterpret_cast<sockaddr *>(&a), sizeof a), 0);
    ASSERT_EQ(listen(ls, 1), 0);
    getsockname(ls, reinterpret_cast<sockaddr *>(&a), &len);
    struct timeval most {5, 0};  // a station that never connects must not hang the test
    setsockopt(ls, SOL_SOCKET, SO_RCVTIMEO, &most, sizeof most);
    std::thread phone([&] {
        int s = accept(ls, nullptr, nullptr);
        if (s < 0) return;
        read_some(s, 1);
        send(s, c.reply.data(), c.reply.size(), MSG_NOSIGNAL);
        read_some(s, SIZE_MAX, 5000);  // until the station closes
        close(s);
    });
    EXPECT_EQ(at({"--tcp", "127.0.0.1:" + std::to_string(ntohs(a.sin_port)), "--json", "--crlf", "--timeout", "1", "AT+QX=1"}).out,
              c.expected);
    phone.join();
    close(ls);
}

INSTANTIATE_TEST_SUITE_P(
    Station, CannedTest,
    ::testing::Values(
        CannedCase{"EmptyTrailerEndsOnQuiet", "RING\r\nAT+QX=1\r\n\r\n\r\n\"v\"\r\n\r\n\r\n",
                   "{\"unsolicited\": \"RING\\r\\n\"}\n"
                   "{\"line\": \"AT+QX=1\", \"echo\": \"AT+QX=1\\r\\n\", \"body\": \"\\r\\n\\\"v\\\"\\r\\n\", \"result\": \"\"}\n"},
        CannedCase{"StreamedFrameBeforeTheAnswer", "\xff\x01\r\nAT+QX=2\r\n\r\n1\r\nOK\r\nAT+QX=1\r\n\r\nx\r\ny\r\nATNG\r\n",
                   "{\"unsolicited\": \"\\u00ff\\u0001\\r\\nAT+QX=2\\r\\n\\r\\n1\\r\\nOK\\r\\n\"}\n"
                   "{\"line\": \"AT+QX=1\", \"echo\": \"AT+QX=1\\r\\n\", \"body\": \"x\\r\\ny\", \"result\": \"ATNG\"}\n"}),
    [](const auto &i) { return std::string(i.param.name); });

// A stock client on the serial station; a hang-up's frame reaches the station unasked;
// a sequence set from the station changes the answers of the running phone, in order.
TEST(Tools, StockClientHangUpAndSequencesOnARunningPhone) {
    Sandbox box;
    Launcher sim(box.root);
    ASSERT_TRUE(sim.ready()) << sim.out;
    EXPECT_EQ(run({"socat", "-t1", "-", sim.station("ttyGS0") + ",raw,echo=0"}, "AT+QXWLAN\r").out, kNotSupportedBare);
    // ^D at the start of a line ends the daemon's read: it reopens the port and runs its hang-up command.
    Outcome hup = at({"--serial", sim.station("ttyGS0"), "--json", "--timeout", "1", "\x04", "ATD112;"});
    EXPECT_NE(hup.out.find("{\"unsolicited\": \"AT+QXMT=1,0\\r\\n"), std::string::npos) << hup.out;
    EXPECT_NE(hup.out.find("{\"line\": \"\\u0004\", \"echo\": null, \"body\": null, \"result\": \"no answer\"}\n"), std::string::npos);
    EXPECT_NE(hup.out.find("\"echo\": \"ATD112;\", \"body\": \"\", \"result\": \"OK\"}\n"), std::string::npos);

    box.write("/.sim/events.log", "");
    EXPECT_EQ(run({FTCMD_SIM_BIN, "--root", box.root, "seq", "testapp:emerg_call", "busy", "ok"}).status, 0);
    for (const char *frame : {"ATD112;\r\nERROR\r\n", "ATD112;\r\nOK\r\n", "ATD112;\r\nOK\r\n"})
        EXPECT_EQ(at({"--tcp", sim.tcp(), "ATD112;"}).out, frame);
    std::string messages;  // in the order recorded
    for (const auto &e : box.event_list())
        if (e.kind == "message") messages += e.detail + "\n";
    EXPECT_EQ(messages, "emerg_call -> busy\nemerg_call -> ok\nemerg_call -> ok\n");
}

struct ModeCase {
    const char *name;
    std::vector<std::string> args;
    const char *flags;    // the mode line
    const char *cmdline;  // expected in proc/cmdline ("": no console-at key at all)
    bool uart;
    bool enters_assembly;  // sets the assembly mode property anew
};
void PrintTo(const ModeCase &c, std::ostream *os) { *os << c.name; }

class ModeTest : public ::testing::TestWithParam<ModeCase> {};

// The launcher replaces only the console-at key of an earlier boot's command line and
// links a UART station only in the modes that serve it.
TEST_P(ModeTest, WritesTheCommandLineAndServesTheUartOnlyWhenUsed) {
    const ModeCase &c = GetParam();
    Sandbox box;
    box.write("/proc/cmdline", "console=ttyMSM0,115200n8 console-at=sendNormal loop.max_part=7\n");
    box.set_prop("sys.factory.assembly_at_mode", "2");  // assembly mode was running
    Launcher sim(box.root, c.args);
    ASSERT_TRUE(sim.ready()) << sim.out;
    EXPECT_NE(sim.out.find(std::string("ftcmd-sim: mode ") + c.flags + "\n"), std::string::npos) << sim.out;
    std::string cmdline = box.read("/proc/cmdline");
    EXPECT_NE(cmdline.find(*c.cmdline ? c.cmdline : "console=ttyMSM0,115200n8 loop.max_part=7\n"), std::string::npos) << cmdline;
    EXPECT_EQ(fs::is_symlink(sim.station("ttyMSM0")), c.uart);
    EXPECT_EQ(sim.out.find("ftcmd-sim: uart /dev/pts/") != std::string::npos, c.uart);
    if (c.uart) {
        EXPECT_EQ(at({"--serial", sim.station("ttyMSM0"), "AT+QXWLAN"}).out, kNotSupportedBare);
    }
    EXPECT_EQ(box.events().find("setprop sys.factory.assembly_at_mode=1") != std::string::npos, c.enters_assembly);
}

INSTANTIATE_TEST_SUITE_P(
    Launcher, ModeTest,
    ::testing::Values(
        ModeCase{"Plain", {"--mode", "plain"}, "plain (is_uart_flag 0, is_sp 0)", "", false, false},
        ModeCase{"At", {"--mode", "at"}, "at (is_uart_flag 1, is_sp 1)", " console-at=sendAT\n", true, false},
        ModeCase{"Normal", {"--mode", "normal"}, "normal (is_uart_flag 1, is_sp 0)", " console-at=sendNormal\n", true, false},
        ModeCase{"AssemblyNewBoot", {"--mode", "assembly"}, "assembly (is_uart_flag 0, is_sp 1)", " console-at=sendAT_assembly\n", false, true},
        ModeCase{"AssemblySameBoot", {"--mode", "assembly", "--keep-boot"}, "assembly (is_uart_flag 0, is_sp 1)",
                 " console-at=sendAT_assembly\n", false, false},
        ModeCase{"WholeCommandLine", {"--cmdline", "quiet console-at=sendAT"}, "at (is_uart_flag 1, is_sp 1)",
                 "quiet console-at=sendAT\n", true, false}),
    [](const auto &i) { return std::string(i.param.name); });

TEST(Tools, TwoPhonesSideBySideStopOnTheirSignals) {
    Sandbox box;
    Launcher a(box.root);
    Launcher b(box.dir + "/second");  // made from the device tree
    ASSERT_TRUE(a.ready()) << a.out;
    ASSERT_TRUE(b.ready()) << b.out;
    for (Launcher *sim : {&a, &b}) EXPECT_EQ(at({"--tcp", sim->tcp(), "ATD112;"}).status, 0);
    EXPECT_EQ(at({"--local", b.local, "ATD112;"}).status, 0);
    EXPECT_EQ(a.stop(SIGTERM), 15);
    EXPECT_EQ(b.stop(SIGINT), 2);
    EXPECT_FALSE(fs::exists(fs::symlink_status(box.root + "/dev/ttyGS0")));
    EXPECT_FALSE(fs::exists(fs::symlink_status(box.dir + "/second/station/ttyGS0")));
    EXPECT_EQ(at({"--tcp", a.tcp(), "ATD112;"}).status, 2);  // nothing listens any more
}

TEST(Tools, FreshEmptiesOnlyASandbox) {
    Sandbox box;
    box.write("/not-a-sandbox/keep", "mine");
    EXPECT_EQ(run({FTCMD_SIM_BIN, "--root", box.path("/not-a-sandbox"), "--fresh"}).status, 2);
    EXPECT_EQ(run({FTCMD_SIM_BIN, "--root", box.path("/not-a-sandbox")}).status, 2);
    EXPECT_EQ(box.read("/not-a-sandbox/keep"), "mine");
    box.write("/data/leftover", "x");
    Launcher sim(box.root, {"--fresh"});
    ASSERT_TRUE(sim.ready()) << sim.out;
    EXPECT_FALSE(box.exists("/data/leftover"));
    EXPECT_TRUE(box.exists("/.sim/testapp.replies"));
}

// A line that ends the daemon (the emergency-call frame has no room for it): the launcher
// restarts it, or with --no-restart ends with its status.
TEST(Tools, ADaemonThatEndsIsRestartedUnlessToldNot) {
    const std::string fatal = "ATD112;" + std::string(115, 'x');
    Sandbox box;
    Launcher sim(box.root);
    ASSERT_TRUE(sim.ready()) << sim.out;
    at({"--tcp", sim.tcp(), "--timeout", "2", fatal});
    ASSERT_TRUE(sim.wait_for("ftcmd-sim: restarting the daemon (restart 1)\n")) << sim.out;
    EXPECT_NE(sim.out.find("ftcmd-sim: daemon exited with status 6\n"), std::string::npos) << sim.out;
    sim.out.clear();
    ASSERT_TRUE(sim.ready()) << sim.out;
    EXPECT_EQ(at({"--tcp", sim.tcp(), "AT+QXWLAN"}).out, kNotSupportedBare);
    EXPECT_NE(box.events().find("init ftcmd: daemon exited with status 6; restart 1\n"), std::string::npos) << box.events();
    EXPECT_EQ(sim.stop(SIGINT), 2);  // Ctrl-C still ends both

    Sandbox box2;
    Launcher once(box2.root, {"--no-restart"});
    ASSERT_TRUE(once.ready()) << once.out;
    at({"--tcp", once.tcp(), "--timeout", "2", fatal});
    EXPECT_EQ(once.stop(0, 10000), 6);
    EXPECT_EQ(box2.events().find("init "), std::string::npos);
}

// Nothing reads the input devices: the station is told (1); a bad key code is refused (2).
TEST(Tools, StationInjectsKeysIntoAnOpenDevice) {
    Sandbox box;
    box.activate();
    EXPECT_EQ(run({FTCMD_SIM_BIN, "--root", box.root, "key", "115"}).status, 1);
    int fd = dev::open("/dev/input/event1", O_RDONLY);  // this process stands in for the daemon
    ASSERT_GE(fd, 0);
    EXPECT_EQ(run({FTCMD_SIM_BIN, "--root", box.root, "key", "115", "press"}).status, 0);
    std::string got = read_some(fd, 48, 5000);
    ASSERT_EQ(got.size(), 48u);
    EXPECT_EQ(got.substr(16, 8), std::string("\x01\x00\x73\x00\x01\x00\x00\x00", 8));  // EV_KEY 115 pressed
    EXPECT_EQ(got.substr(40, 8), std::string(8, '\0'));                                     // the report
    EXPECT_EQ(run({FTCMD_SIM_BIN, "--root", box.root, "key", "volume"}).status, 2);
    close(fd);
}

}  // namespace
