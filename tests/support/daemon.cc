#include "tests/support/daemon.h"

#include <arpa/inet.h>
#include <cutils/sockets.h>
#include <fcntl.h>
#include <netinet/in.h>
#include <poll.h>
#include <signal.h>
#include <sys/socket.h>
#include <sys/wait.h>
#include <unistd.h>

#include <chrono>
#include <filesystem>
#include <stdexcept>
#include <thread>

#include "platform/sim/sim.h"

std::string read_some(int fd, size_t want, int timeout_ms) {
    std::string out;
    char buf[4096];
    while (out.size() < want) {
        struct pollfd p = {fd, POLLIN, 0};
        if (poll(&p, 1, timeout_ms) <= 0) break;
        ssize_t n = read(fd, buf, sizeof buf);
        if (n <= 0) break;
        out.append(buf, static_cast<size_t>(n));
    }
    return out;
}

static sockaddr_in loopback(int port) {
    sockaddr_in a{};
    a.sin_family = AF_INET;
    a.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
    a.sin_port = htons(static_cast<uint16_t>(port));
    return a;
}

// Polls every 20 ms until done() holds, for at most timeout_ms.
template <typename F>
static bool poll_for(F done, int timeout_ms) {
    for (int waited = 0; waited < timeout_ms; waited += 20) {
        if (done()) return true;
        std::this_thread::sleep_for(std::chrono::milliseconds(20));
    }
    return false;
}

int free_tcp_port() {
    int s = socket(AF_INET, SOCK_STREAM, 0);
    sockaddr_in a = loopback(0);
    socklen_t len = sizeof a;
    bind(s, reinterpret_cast<sockaddr *>(&a), len);
    getsockname(s, reinterpret_cast<sockaddr *>(&a), &len);
    close(s);
    return ntohs(a.sin_port);
}

Daemon::Daemon(const Sandbox &b, const std::string &cmdline, bool wait_ready) : box(b) {
    port = free_tcp_port();
    local_name = "ftcmd_test_" + std::to_string(getpid()) + "_" + std::to_string(port);
    log_path = box.dir + "/daemon.log";
    box.write("/proc/cmdline", cmdline + "\n");
    pid = fork();
    if (pid == 0) {
        int fd = open(log_path.c_str(), O_WRONLY | O_CREAT | O_TRUNC, 0644);
        dup2(fd, 2);
        setenv("FTCMD_SIM_ROOT", box.root.c_str(), 1);
        setenv("FTCMD_TCP_PORT", std::to_string(port).c_str(), 1);
        setenv("FTCMD_LOCAL_SOCKET", local_name.c_str(), 1);
        setenv("FTCMD_SIM_LISTEN", "127.0.0.1", 1);
        // Another build of the daemon can be measured against this one (benchmarks).
        const char *bin = getenv("FTCMD_DAEMON_BIN");
        execl(bin != nullptr ? bin : FTCMD_BIN, "ftcmd", static_cast<char *>(nullptr));
        _exit(127);
    }
    if (wait_ready && !wait_prop("sys.qrcode.view", "1")) {
        stop(SIGKILL);  // no destructor runs for a half-made daemon: end it here
        throw std::runtime_error("daemon did not come up");
    }
}

Daemon::~Daemon() {
    if (pid > 0) {
        kill(pid, SIGKILL);
        waitpid(pid, nullptr, 0);
    }
}

bool Daemon::wait_prop(const std::string &name, const std::string &value, int timeout_ms) const {
    return poll_for([&] { return box.prop(name) == value; }, timeout_ms);
}

std::string Daemon::log() const {
    std::string text;
    sim::read_file(log_path, text);  // outside the phone's root: no sequence moves on
    return text;
}

bool Daemon::wait_log(const std::string &text, int timeout_ms) const {
    return poll_for([&] { return log().find(text) != std::string::npos; }, timeout_ms);
}

int Daemon::connect_tcp() const {
    int s = socket(AF_INET, SOCK_STREAM, 0);
    sockaddr_in a = loopback(port);
    if (connect(s, reinterpret_cast<sockaddr *>(&a), sizeof a) == 0) return s;
    close(s);
    return -1;
}

int Daemon::connect_local() const {
    return socket_local_client(local_name.c_str(), ANDROID_SOCKET_NAMESPACE_ABSTRACT, SOCK_STREAM);
}

std::string Daemon::ask_local(const std::string &line) const {
    int s = connect_local();
    if (s < 0) return "(no connection)";
    send(s, line.data(), line.size(), MSG_NOSIGNAL);
    std::string got = read_some(s, 1 << 16, 5000);
    close(s);
    return got;
}

int Daemon::stop(int sig) {
    kill(pid, sig);
    int status = 0;
    waitpid(pid, &status, 0);
    pid = -1;
    return WIFEXITED(status) ? WEXITSTATUS(status) : 128 + WTERMSIG(status);
}

Pty::Pty(const Sandbox &box, const char *device) {
    master = posix_openpt(O_RDWR | O_NOCTTY);
    if (master < 0 || grantpt(master) != 0 || unlockpt(master) != 0) throw std::runtime_error("no pty");
    slave = ptsname(master);
    std::filesystem::create_directories(std::filesystem::path(box.path(device)).parent_path());
    std::filesystem::create_symlink(slave, box.path(device));
    keep = open(slave.c_str(), O_RDWR | O_NOCTTY);
}

Pty::~Pty() {
    close(keep);
    close(master);
}

bool Pty::send(const std::string &s) const {
    return write(master, s.data(), s.size()) == static_cast<ssize_t>(s.size());
}

bool Pty::ready() const {
    for (int i = 0; i < 50; ++i) {
        if (!send("AT+QXNOPE=probe\r")) return false;
        if (!read_some(master, 1, 200).empty()) {
            read_some(master, 1 << 16, 300);
            return true;
        }
    }
    return false;
}

speed_t Pty::speed() const {
    int fd = open(slave.c_str(), O_RDWR | O_NOCTTY);
    struct termios t {};
    tcgetattr(fd, &t);
    close(fd);
    return cfgetospeed(&t);
}
