// ftcmd-sim: starts the daemon as a simulated phone on the host.
//
// It prepares a sandbox (a copy of the default device tree), writes the boot mode into
// the sandbox's kernel command line, gives each serial port of the phone a pair of
// pseudo-terminals joined by a relay, runs the daemon as a child process, and says when
// the phone is ready for a station.
//
// Why two pseudo-terminals per port: the daemon configures its side of the line
// (canonical mode, no echo) and the station configures its own (raw, or whatever its
// terminal program wants), just as the two ends of a real cable are two devices.
// A pseudo-terminal has one set of modes only, so each end gets its own, and the
// relay copies bytes between the two masters.
//
// A station hangs up by sending ^D (0x04) at the start of a line: the daemon's side is
// in canonical mode, so its read returns 0 exactly as when a USB cable is pulled, and
// the daemon runs its reopen path.
//
// Like init on a phone, the launcher restarts a daemon that ends on its own (a fatal
// signal, a crash), records it in events.log and counts it; one that keeps ending within
// moments of its start is given up after a few tries. --no-restart ends with the daemon.
//
// Given a command after the options (key, sw, touch, send, seq), it does not start a
// phone but acts on the one running in --root: input events and device-model lines go
// through the FIFO <root>/station/devices, sequences into <root>/.sim/sequences.
#include <arpa/inet.h>
#include <errno.h>
#include <fcntl.h>
#include <limits.h>
#include <poll.h>
#include <signal.h>
#include <stdlib.h>
#include <sys/prctl.h>
#include <sys/wait.h>
#include <termios.h>
#include <time.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <cstdio>
#include <cstring>
#include <filesystem>
#include <sstream>
#include <string>
#include <thread>
#include <vector>

#include "platform/sim/chardev.h"
#include "platform/sim/sequence.h"
#include "platform/sim/sim.h"

namespace fs = std::filesystem;

namespace {

constexpr int kReadyTimeoutMs = 10000;
constexpr int kStopGraceMs = 5000;       // after a forwarded signal, before SIGKILL
constexpr size_t kRelayBacklog = 65536;  // bytes kept for a side that is not reading
constexpr int kRestartDelayMs = 300;     // between a daemon's end and its restart
constexpr int kQuickEndMs = 2000;        // a daemon that ends this soon after its start...
constexpr int kMaxQuickEnds = 5;         // ...this many times in a row is not restarted again

const char *kUsage =
    "usage: ftcmd-sim [--root DIR] [--fresh] [--keep] [--keep-boot]\n"
    "                 [--mode plain|at|normal|assembly | --cmdline TEXT]\n"
    "                 [--port N] [--local NAME] [--listen ADDR] [--daemon PATH] [--no-restart]\n"
    "       ftcmd-sim --root DIR key CODE [press|release|click] [eventN]\n"
    "       ftcmd-sim --root DIR sw CODE VALUE [eventN]\n"
    "       ftcmd-sim --root DIR touch X Y [eventN]\n"
    "       ftcmd-sim --root DIR send MODEL TEXT...\n"
    "       ftcmd-sim --root DIR seq WHAT [VALUE...] | seq --rewind\n"
    "\n"
    "Runs the ftcmd daemon as a simulated phone over a sandbox directory.\n"
    "  --root DIR     the sandbox; made from the default device tree when missing or empty\n"
    "                 (default: a new temp dir, removed at exit unless --keep)\n"
    "  --fresh        recreate the sandbox from the device tree (only a dir holding .sim/)\n"
    "  --keep-boot    a daemon restart within the same boot: keep the boot's properties\n"
    "  --mode M       boot mode written to proc/cmdline (default: the sandbox's line as is)\n"
    "  --cmdline TEXT the whole kernel command line\n"
    "  --port N       TCP service port (default 6988)\n"
    "  --local NAME   abstract local socket name (default ftcmd_cmd_socket)\n"
    "  --listen ADDR  IPv4 address the TCP service binds (default 127.0.0.1)\n"
    "  --daemon PATH  the daemon binary (default: ftcmd next to this program)\n"
    "  --no-restart   end when the daemon ends on its own (default: restart it, as init does)\n"
    "\n"
    "With a command after the options, acts on the phone running in DIR instead:\n"
    "  key, sw, touch inject input events (a key click by default) into dev/input\n"
    "  send           sends a line to a device model of the running phone\n"
    "  seq            gives WHAT a sequence of values (none: removes it); --rewind restarts all\n"
    "\n"
    "A station opens <root>/station/ttyGS0 (and ttyMSM0 in the UART boot modes); they\n"
    "start in raw mode. Sending ^D (0x04) at the start of a line simulates a hang-up of\n"
    "the port. The device tree can be overridden with FTCMD_DEVICE_TREE.\n";

struct Options {
    std::string root;
    bool fresh = false;
    bool keep = false;
    bool keep_boot = false;
    std::string mode;
    std::string cmdline;
    bool have_cmdline = false;
    int port = 6988;
    std::string local = "ftcmd_cmd_socket";
    std::string listen = "127.0.0.1";
    std::string daemon;
    bool restart = true;
    std::vector<std::string> command;  // a station command on a running phone
};

[[noreturn]] void die(const std::string &msg, int status = 2) {
    fprintf(stderr, "ftcmd-sim: %s\n", msg.c_str());
    exit(status);
}

void say(const std::string &line) {
    printf("ftcmd-sim: %s\n", line.c_str());
    fflush(stdout);
}

bool parse_int(const std::string &s, int lo, int hi, int &out) {
    char *end = nullptr;
    errno = 0;
    long v = strtol(s.c_str(), &end, 10);
    if (s.empty() || *end != '\0' || errno != 0 || v < lo || v > hi) return false;
    out = static_cast<int>(v);
    return true;
}

Options parse_args(int argc, char **argv) {
    Options o;
    for (int i = 1; i < argc; ++i) {
        std::string a = argv[i];
        auto value = [&]() -> std::string {
            if (i + 1 >= argc) die(a + " needs a value\n" + kUsage);
            return argv[++i];
        };
        if (a == "--root") o.root = value();
        else if (a == "--fresh") o.fresh = true;
        else if (a == "--keep") o.keep = true;
        else if (a == "--keep-boot") o.keep_boot = true;
        else if (a == "--mode") o.mode = value();
        else if (a == "--cmdline") o.cmdline = value(), o.have_cmdline = true;
        else if (a == "--port") {
            if (!parse_int(value(), 1, 65535, o.port)) die("bad --port");
        } else if (a == "--local") o.local = value();
        else if (a == "--listen") o.listen = value();
        else if (a == "--daemon") o.daemon = value();
        else if (a == "--no-restart") o.restart = false;
        else if (!a.empty() && a[0] != '-') {
            for (; i < argc; ++i) o.command.push_back(argv[i]);
            break;
        }
        else if (a == "-h" || a == "--help") {
            fputs(kUsage, stdout);
            exit(0);
        } else die("unknown argument " + a + "\n" + kUsage);
    }
    if (!o.mode.empty() && o.have_cmdline) die("--mode and --cmdline exclude each other");
    if (!o.mode.empty() && o.mode != "plain" && o.mode != "at" && o.mode != "normal" && o.mode != "assembly")
        die("unknown mode " + o.mode + " (plain, at, normal, assembly)");
    if (o.local.empty()) die("--local needs a name");
    struct in_addr addr {};
    if (inet_pton(AF_INET, o.listen.c_str(), &addr) != 1) die("--listen needs an IPv4 address");
    return o;
}

// ---- the sandbox

std::string device_tree() {
    const char *env = getenv("FTCMD_DEVICE_TREE");
    std::string tree = (env && *env) ? env : FTCMD_DEVICE_TREE;
    if (!fs::is_directory(tree + "/.sim")) die("no device tree at " + tree + " (it needs a .sim/ dir)");
    return tree;
}

void populate(const std::string &root) {
    std::error_code ec;
    fs::copy(device_tree(), root, fs::copy_options::recursive | fs::copy_options::copy_symlinks, ec);
    if (ec) die("cannot copy the device tree into " + root + ": " + ec.message());
}

// Returns the sandbox's real path; *made is set when this run created the directory.
std::string prepare_root(const Options &o, bool *made) {
    *made = false;
    std::error_code ec;
    if (o.root.empty()) {
        const char *tmp = getenv("TMPDIR");
        std::string tmpl = std::string((tmp && *tmp) ? tmp : "/tmp") + "/ftcmd-sim.XXXXXX";
        if (mkdtemp(tmpl.data()) == nullptr) die("cannot make a temp dir " + tmpl + ": " + strerror(errno));
        *made = true;
        populate(tmpl);
        return fs::canonical(tmpl).string();
    }
    if (!fs::exists(o.root)) {
        if (!fs::create_directories(o.root, ec) || ec) die("cannot create " + o.root + ": " + ec.message());
        populate(o.root);
    } else if (!fs::is_directory(o.root)) {
        die(o.root + " is not a directory");
    } else if (o.fresh) {
        // Only a directory that is clearly a sandbox is ever emptied.
        if (!fs::is_directory(o.root + "/.sim")) die("refusing --fresh: " + o.root + " has no .sim/, not a sandbox");
        for (const auto &e : fs::directory_iterator(o.root)) {
            fs::remove_all(e.path(), ec);
            if (ec) die("cannot remove " + e.path().string() + ": " + ec.message());
        }
        populate(o.root);
    } else if (fs::is_empty(o.root)) {
        populate(o.root);
    } else if (!fs::is_directory(o.root + "/.sim")) {
        die(o.root + " is not empty and has no .sim/: not a sandbox");
    }
    return fs::canonical(o.root).string();
}

// ---- boot mode

struct BootMode {
    std::string name;
    int is_uart_flag = 0;
    int is_sp = 0;
};

// The same reading of the command line as the daemon's start-up.
BootMode boot_mode_of(const std::string &line) {
    BootMode m;
    bool at = line.find("console-at=sendAT") != std::string::npos;
    bool normal = line.find("console-at=sendNormal") != std::string::npos;
    bool assembly = line.find("console-at=sendAT_assembly") != std::string::npos;
    if (at) m.is_sp = m.is_uart_flag = 1;
    if (normal) m.is_uart_flag = 1;
    else if (assembly) m.is_uart_flag = 0;
    m.name = normal ? "normal" : assembly ? "assembly" : at ? "at" : "plain";
    return m;
}

std::string read_text(const std::string &path) {
    std::string s;
    sim::read_file(path, s);
    while (!s.empty() && (s.back() == '\n' || s.back() == '\r')) s.pop_back();
    return s;
}

std::string apply_mode(const std::string &root, const Options &o) {
    std::string file = root + "/proc/cmdline";
    std::string line = read_text(file);
    if (o.have_cmdline) {
        line = o.cmdline;
    } else if (!o.mode.empty()) {
        std::istringstream in(line);
        std::string word, kept;
        while (in >> word)
            if (word.rfind("console-at=", 0) != 0) kept += (kept.empty() ? "" : " ") + word;
        line = kept;
        if (o.mode == "at") line += " console-at=sendAT";
        else if (o.mode == "normal") line += " console-at=sendNormal";
        else if (o.mode == "assembly") line += " console-at=sendAT_assembly";
    } else {
        return line;
    }
    std::error_code ec;
    fs::create_directories(root + "/proc", ec);
    if (!sim::write_file_atomic(file, line + "\n")) die("cannot write " + file);
    return line;
}

// Properties that live for one boot start out unset; a restart within the boot keeps them.
void reset_boot_properties(const std::string &root, bool keep_boot) {
    std::string props = root + "/.sim/properties";
    std::string offset;
    long off = sim::read_file(root + "/.sim/clock", offset) ? strtol(offset.c_str(), nullptr, 10) : 0;
    std::string boot_time = std::to_string(static_cast<long>(time(nullptr)) + off);
    std::string known;
    bool ok = sim::write_kv(props, "sys.qrcode.view", nullptr);
    if (!keep_boot || !sim::read_kv(props, "sys.boot_completed.time", known))
        ok = ok && sim::write_kv(props, "sys.boot_completed.time", &boot_time);
    if (!keep_boot) {
        ok = ok && sim::write_kv(props, "sys.factory.assembly_at_mode", nullptr);
        ok = ok && sim::write_kv(props, "sys.factory.log", nullptr);
    }
    if (!ok) die("cannot update " + props);
    // The time stamps of events.log count from the start of this boot.
    if (!keep_boot && !sim::restart_clock(root)) die("cannot write " + root + "/.sim/started");
}

// ---- serial ports

struct Pty {
    int master = -1;
    int hold = -1;  // our own descriptor of the slave: the master never sees a hang-up
    std::string slave;
};

Pty open_pty(bool raw) {
    Pty p;
    p.master = posix_openpt(O_RDWR | O_NOCTTY | O_CLOEXEC);
    if (p.master < 0 || grantpt(p.master) != 0 || unlockpt(p.master) != 0) die(std::string("posix_openpt: ") + strerror(errno));
    char name[PATH_MAX];
    if (ptsname_r(p.master, name, sizeof name) != 0) die("ptsname_r failed");
    p.slave = name;
    p.hold = open(name, O_RDWR | O_NOCTTY | O_CLOEXEC);
    if (p.hold < 0) die("cannot open " + p.slave + ": " + strerror(errno));
    fcntl(p.master, F_SETFL, fcntl(p.master, F_GETFL) | O_NONBLOCK);
    struct termios t {};
    tcgetattr(p.hold, &t);
    if (raw) {
        cfmakeraw(&t);
    } else {
        // The daemon's side before the daemon sets it: no echo of what a station sends.
        t.c_lflag = ICANON;
        t.c_oflag &= ~OPOST;
    }
    cfsetspeed(&t, B115200);
    tcsetattr(p.hold, TCSANOW, &t);
    return p;
}

struct Port {
    std::string device;      // ttyGS0 or ttyMSM0
    Pty phone, station;      // the daemon's end and the station's end
    std::string to_station;  // bytes read from the phone's master, not yet written on
    std::string to_phone;
    std::vector<std::string> links;
};

void link_into(Port &port, const std::string &link, const std::string &target) {
    std::error_code ec;
    fs::create_directories(fs::path(link).parent_path(), ec);
    if (fs::is_symlink(fs::symlink_status(link, ec)) || fs::is_regular_file(fs::symlink_status(link, ec)))
        fs::remove(link, ec);
    fs::create_symlink(target, link, ec);
    if (ec) die("cannot link " + link + ": " + ec.message());
    port.links.push_back(link);
}

void remove_stale_link(const std::string &link) {
    std::error_code ec;
    if (fs::is_symlink(fs::symlink_status(link, ec))) fs::remove(link, ec);
}

void unlink_ours(const Port &port) {
    for (const auto &l : port.links) {
        std::error_code ec;
        fs::path target = fs::read_symlink(l, ec);
        if (!ec && (target == port.phone.slave || target == port.station.slave)) fs::remove(l, ec);
    }
}

// Moves what one master has to say into the other's pending bytes; a side that nobody
// reads keeps at most kRelayBacklog bytes and loses the rest, as a serial line would.
void pump(int from, std::string &pending) {
    char buf[4096];
    for (;;) {
        ssize_t n = read(from, buf, sizeof buf);
        if (n <= 0) return;
        size_t room = kRelayBacklog > pending.size() ? kRelayBacklog - pending.size() : 0;
        pending.append(buf, std::min(room, static_cast<size_t>(n)));
    }
}

void flush(int to, std::string &pending) {
    while (!pending.empty()) {
        ssize_t n = write(to, pending.data(), pending.size());
        if (n <= 0) return;
        pending.erase(0, static_cast<size_t>(n));
    }
}

void relay(std::vector<Port> *ports, int stop_fd) {
    std::vector<struct pollfd> fds;
    for (;;) {
        fds.clear();
        fds.push_back({stop_fd, POLLIN, 0});
        for (auto &p : *ports) {
            fds.push_back({p.phone.master, static_cast<short>(POLLIN | (p.to_phone.empty() ? 0 : POLLOUT)), 0});
            fds.push_back({p.station.master, static_cast<short>(POLLIN | (p.to_station.empty() ? 0 : POLLOUT)), 0});
        }
        if (poll(fds.data(), fds.size(), -1) < 0) {
            if (errno == EINTR) continue;
            return;
        }
        if (fds[0].revents) return;
        for (size_t i = 0; i < ports->size(); ++i) {
            Port &p = (*ports)[i];
            short phone = fds[1 + 2 * i].revents, station = fds[2 + 2 * i].revents;
            if (phone & POLLIN) pump(p.phone.master, p.to_station);
            if (station & POLLIN) pump(p.station.master, p.to_phone);
            flush(p.station.master, p.to_station);
            flush(p.phone.master, p.to_phone);
        }
        // A master in an error state (it should not happen: we hold both slaves) must not spin.
        bool errors = false;
        for (size_t i = 1; i < fds.size(); ++i) errors |= (fds[i].revents & (POLLERR | POLLHUP | POLLNVAL)) != 0;
        if (errors) usleep(10000);
    }
}

// ---- the daemon process

std::string default_daemon() {
    char self[PATH_MAX];
    ssize_t n = readlink("/proc/self/exe", self, sizeof self - 1);
    if (n <= 0) die("cannot find my own path; give --daemon");
    self[n] = '\0';
    return (fs::path(self).parent_path() / "ftcmd").string();
}

pid_t spawn_daemon(const std::string &path, const std::string &root, const Options &o, const sigset_t &old_mask) {
    std::vector<std::string> env_text;
    for (char **e = environ; *e; ++e) {
        std::string v = *e;
        if (v.rfind("FTCMD_SIM_ROOT=", 0) && v.rfind("FTCMD_TCP_PORT=", 0) && v.rfind("FTCMD_SIM_LISTEN=", 0) &&
            v.rfind("FTCMD_LOCAL_SOCKET=", 0))
            env_text.push_back(v);
    }
    env_text.push_back("FTCMD_SIM_ROOT=" + root);
    env_text.push_back("FTCMD_TCP_PORT=" + std::to_string(o.port));
    env_text.push_back("FTCMD_SIM_LISTEN=" + o.listen);
    env_text.push_back("FTCMD_LOCAL_SOCKET=" + o.local);
    std::vector<char *> envp;
    for (auto &s : env_text) envp.push_back(s.data());
    envp.push_back(nullptr);
    std::string arg0 = "ftcmd";
    char *argv[] = {arg0.data(), nullptr};

    pid_t parent = getpid();
    pid_t pid = fork();
    if (pid < 0) die(std::string("fork: ") + strerror(errno));
    if (pid > 0) return pid;
    // The child: only async-signal-safe calls from here on.
    prctl(PR_SET_PDEATHSIG, SIGTERM);  // a launcher that is killed outright takes the phone along
    if (getppid() != parent) _exit(127);
    signal(SIGPIPE, SIG_DFL);
    sigprocmask(SIG_SETMASK, &old_mask, nullptr);
    int null_fd = open("/dev/null", O_RDONLY);
    if (null_fd >= 0) dup2(null_fd, 0);
    dup2(2, 1);  // our stdout carries only the launcher's own lines
    // Relative paths opened by the daemon then land inside the sandbox.
    if (chdir(root.c_str()) != 0) _exit(127);
    execve(path.c_str(), argv, envp.data());
    const char msg[] = "ftcmd-sim: cannot run the daemon\n";
    ssize_t ignored = write(2, msg, sizeof msg - 1);
    (void)ignored;
    _exit(127);
}

int status_code(int status) {
    return WIFEXITED(status) ? WEXITSTATUS(status) : 128 + WTERMSIG(status);
}

// ---- station commands on a running phone

int station_command(const Options &o) {
    if (o.root.empty()) die("a station command needs --root");
    std::string root = o.root;
    if (!fs::is_directory(root + "/.sim")) die(root + " is not a sandbox (no .sim/)");
    const std::vector<std::string> &w = o.command;
    std::string verb = w[0], line;
    auto join = [&](size_t from) {
        std::string t;
        for (size_t i = from; i < w.size(); ++i) t += (t.empty() ? "" : " ") + w[i];
        return t;
    };
    int code = 0;
    if (verb == "seq") {
        if (w.size() == 2 && w[1] == "--rewind") return sim::sequence_rewind(root) ? 0 : 1;
        if (w.size() < 2) die("seq needs WHAT\n" + std::string(kUsage));
        std::vector<std::string> values(w.begin() + 2, w.end());
        if (!sim::sequence_set(root, w[1], values)) die("cannot write " + root + "/.sim/sequences", 1);
        return 0;
    }
    if (verb == "key" && w.size() >= 2 && w.size() <= 4 && parse_int(w[1], 0, 0x2ff, code)) line = "input " + join(0);
    else if (verb == "sw" && w.size() >= 3 && w.size() <= 4 && parse_int(w[1], 0, 0x10, code)) line = "input " + join(0);
    else if (verb == "touch" && w.size() >= 3 && w.size() <= 4 && parse_int(w[1], -100000, 100000, code) &&
             parse_int(w[2], -100000, 100000, code))
        line = "input " + join(0);
    else if (verb == "send" && w.size() >= 3) line = join(1);
    else die("bad station command: " + join(0) + "\n" + kUsage);
    if (!sim::station_send(root, line)) {
        if (errno == ENXIO)
            die("no device of the phone in " + root + " is open: nothing reads (is the daemon running, and the test started?)", 1);
        die("cannot send to " + root + "/station/devices: " + strerror(errno), 1);
    }
    return 0;
}

std::string describe(int status) {
    if (WIFEXITED(status)) return "daemon exited with status " + std::to_string(WEXITSTATUS(status));
    return "daemon killed by signal " + std::to_string(WTERMSIG(status)) + " (" + strsignal(WTERMSIG(status)) + ")";
}

bool tcp_waiting(const std::string &root) {
    std::string v;
    return sim::read_kv(root + "/.sim/properties", "sys.qrcode.view", v) && v == "1";
}

}  // namespace

int main(int argc, char **argv) {
    Options o = parse_args(argc, argv);
    signal(SIGPIPE, SIG_IGN);
    if (!o.command.empty()) return station_command(o);

    // The signals are taken synchronously in the main loop; every thread inherits the mask.
    sigset_t sigs, old_mask;
    sigemptyset(&sigs);
    sigaddset(&sigs, SIGINT);
    sigaddset(&sigs, SIGTERM);
    sigaddset(&sigs, SIGCHLD);
    sigaddset(&sigs, SIGHUP);
    sigprocmask(SIG_BLOCK, &sigs, &old_mask);

    std::string daemon = o.daemon.empty() ? default_daemon() : o.daemon;
    if (access(daemon.c_str(), X_OK) != 0) die("no daemon binary at " + daemon + " (give --daemon)");

    bool made_root = false;
    std::string root = prepare_root(o, &made_root);
    bool remove_root = made_root && o.root.empty() && !o.keep;
    std::string cmdline = apply_mode(root, o);
    BootMode mode = boot_mode_of(cmdline);
    reset_boot_properties(root, o.keep_boot);

    // The UART exists for the station only in the boot modes where the daemon opens it.
    std::vector<Port> ports;
    ports.reserve(2);
    for (const char *device : {"ttyGS0", "ttyMSM0"}) {
        if (std::string(device) == "ttyMSM0" && !mode.is_uart_flag) {
            remove_stale_link(root + "/dev/ttyMSM0");
            remove_stale_link(root + "/station/ttyMSM0");
            continue;
        }
        Port p;
        p.device = device;
        p.phone = open_pty(false);
        p.station = open_pty(true);
        link_into(p, root + "/dev/" + device, p.phone.slave);
        link_into(p, root + "/station/" + device, p.station.slave);
        ports.push_back(std::move(p));
    }
    int stop_pipe[2];
    if (pipe2(stop_pipe, O_CLOEXEC) != 0) die("pipe failed");
    std::thread relay_thread(relay, &ports, stop_pipe[0]);

    say("root " + root);
    say("tcp " + o.listen + ":" + std::to_string(o.port));
    say("local " + o.local);
    say("usb serial " + ports[0].station.slave + " (" + root + "/station/ttyGS0)");
    if (ports.size() > 1) say("uart " + ports[1].station.slave + " (" + root + "/station/ttyMSM0)");
    else say("uart off in this boot mode");
    say("mode " + mode.name + " (is_uart_flag " + std::to_string(mode.is_uart_flag) + ", is_sp " +
        std::to_string(mode.is_sp) + ")");

    sim::set_root(root);  // the launcher records the restarts in the phone's events.log
    pid_t child = spawn_daemon(daemon, root, o, old_mask);
    bool ready = false;
    int exit_code = 1;
    auto start = std::chrono::steady_clock::now();
    auto since = [](std::chrono::steady_clock::time_point t) {
        return std::chrono::duration_cast<std::chrono::milliseconds>(std::chrono::steady_clock::now() - t).count();
    };
    bool stopping = false, killed = false, timed_out = false;
    std::chrono::steady_clock::time_point stop_at, restart_at;
    int restarts = 0, quick_ends = 0;
    for (;;) {
        struct timespec tick = {0, 50 * 1000 * 1000};
        int sig = sigtimedwait(&sigs, nullptr, &tick);
        if (sig == SIGINT || sig == SIGTERM || sig == SIGHUP) {
            if (child < 0) {  // between a daemon's end and its restart: nothing left to stop
                exit_code = sig;
                break;
            }
            kill(child, sig);
            if (!stopping) stop_at = std::chrono::steady_clock::now();
            stopping = true;
        }
        int status = 0;
        if (child > 0 && waitpid(child, &status, WNOHANG) == child) {
            say(describe(status));
            if (!ready && !stopping) fprintf(stderr, "ftcmd-sim: the daemon ended before it was ready\n");
            exit_code = timed_out ? 1 : status_code(status);
            if (stopping || !o.restart) break;
            // Ended on its own: init restarts the service, unless it keeps dying at once.
            quick_ends = since(start) < kQuickEndMs ? quick_ends + 1 : 0;
            ++restarts;
            sim::record("init", "ftcmd: " + describe(status) + "; restart " + std::to_string(restarts));
            if (quick_ends >= kMaxQuickEnds) {
                fprintf(stderr, "ftcmd-sim: the daemon ended %d times within %d ms of its start; not restarting it\n",
                        quick_ends, kQuickEndMs);
                break;
            }
            say("restarting the daemon (restart " + std::to_string(restarts) + ")");
            sim::write_kv(root + "/.sim/properties", "sys.qrcode.view", nullptr);  // "ready" is told again
            ready = false;
            child = -1;
            restart_at = std::chrono::steady_clock::now() + std::chrono::milliseconds(kRestartDelayMs);
        }
        if (child < 0 && std::chrono::steady_clock::now() >= restart_at) {
            child = spawn_daemon(daemon, root, o, old_mask);
            start = std::chrono::steady_clock::now();
        }
        if (stopping && !killed && since(stop_at) > kStopGraceMs) {
            fprintf(stderr, "ftcmd-sim: the daemon did not stop; killing it\n");
            kill(child, SIGKILL);
            killed = true;
        }
        if (child > 0 && !ready && !stopping) {
            if (tcp_waiting(root)) {
                ready = true;
                say("ready");
            } else if (since(start) > kReadyTimeoutMs) {
                fprintf(stderr, "ftcmd-sim: the daemon did not get ready within %d s (no sys.qrcode.view=1 in %s)\n",
                        kReadyTimeoutMs / 1000, (root + "/.sim/properties").c_str());
                kill(child, SIGTERM);
                stop_at = std::chrono::steady_clock::now();
                stopping = timed_out = true;
            }
        }
    }

    ssize_t w = write(stop_pipe[1], "x", 1);
    (void)w;
    relay_thread.join();
    for (auto &p : ports) {
        unlink_ours(p);
        for (int fd : {p.phone.master, p.phone.hold, p.station.master, p.station.hold}) close(fd);
    }
    if (remove_root) {
        std::error_code ec;
        fs::remove_all(root, ec);
    }
    return exit_code;
}
