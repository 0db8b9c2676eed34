// Measures a simulated phone in one run: start-up to ready, the TCP round trip of a cheap
// command against two loopback echo servers (a bare one, and one doing the same file
// work per line as the daemon: read one node, append one log record), commands per
// second, wake-ups while idle, and resident memory.
//
//   ftcmd_bench [--rounds N] [--idle-seconds S]
#include <arpa/inet.h>
#include <dirent.h>
#include <fcntl.h>
#include <netinet/in.h>
#include <netinet/tcp.h>
#include <sys/socket.h>
#include <unistd.h>

#include <algorithm>
#include <atomic>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <fstream>
#include <functional>
#include <map>
#include <string>
#include <thread>
#include <vector>

#include "tests/support/daemon.h"
#include "tests/support/sandbox.h"

namespace {

using Clock = std::chrono::steady_clock;
constexpr const char *kCommand = "AT+QXRAM=0";  // reads one node, appends one log record

double us_since(Clock::time_point t) { return std::chrono::duration<double, std::micro>(Clock::now() - t).count(); }

void no_delay(int fd) {
    int one = 1;
    setsockopt(fd, IPPROTO_TCP, TCP_NODELAY, &one, sizeof one);
}

int connect_to(int port) {
    int s = socket(AF_INET, SOCK_STREAM, 0);
    struct sockaddr_in a {};
    a.sin_family = AF_INET;
    a.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
    a.sin_port = htons(static_cast<uint16_t>(port));
    if (connect(s, reinterpret_cast<sockaddr *>(&a), sizeof a) != 0) {
        close(s);
        return -1;
    }
    no_delay(s);
    return s;
}

// A loopback echo server on its own thread; work runs on every line before the echo.
struct EchoServer {
    int listen_fd = -1;
    int port = 0;
    std::thread thread;

    explicit EchoServer(std::function<void()> work) {
        listen_fd = socket(AF_INET, SOCK_STREAM, 0);
        struct sockaddr_in a {};
        a.sin_family = AF_INET;
        a.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
        bind(listen_fd, reinterpret_cast<sockaddr *>(&a), sizeof a);
        socklen_t len = sizeof a;
        getsockname(listen_fd, reinterpret_cast<sockaddr *>(&a), &len);
        port = ntohs(a.sin_port);
        listen(listen_fd, 1);
        thread = std::thread([this, work] {
            int c = accept(listen_fd, nullptr, nullptr);
            no_delay(c);
            char buf[2049];
            for (;;) {
                ssize_t n = recv(c, buf, sizeof buf - 1, 0);
                if (n <= 0) break;
                work();
                send(c, buf, static_cast<size_t>(n), MSG_NOSIGNAL);
            }
            close(c);
        });
    }
    ~EchoServer() {
        thread.join();
        close(listen_fd);
    }
};

struct Stats {
    double p50, p90, p99, mean;
};

Stats stats(std::vector<double> v) {
    std::sort(v.begin(), v.end());
    double sum = 0;
    for (double x : v) sum += x;
    auto at = [&](double q) { return v[std::min(v.size() - 1, static_cast<size_t>(q * static_cast<double>(v.size())))]; };
    return {at(0.50), at(0.90), at(0.99), sum / static_cast<double>(v.size())};
}

// Sends the line and reads until `want` bytes came back; the round trip in microseconds.
double round_trip(int fd, const std::string &line, size_t want) {
    auto start = Clock::now();
    send(fd, line.data(), line.size(), MSG_NOSIGNAL);
    if (read_some(fd, want, 5000).size() != want) {
        fprintf(stderr, "short answer\n");
        exit(1);
    }
    return us_since(start);
}

std::vector<double> measure(int fd, const std::string &line, size_t want, int rounds) {
    for (int i = 0; i < rounds / 10; ++i) round_trip(fd, line, want);  // warm-up
    std::vector<double> v;
    v.reserve(static_cast<size_t>(rounds));
    for (int i = 0; i < rounds; ++i) v.push_back(round_trip(fd, line, want));
    return v;
}

// Context switches of each thread of the process (by thread id): each is one wake-up
// (or preemption).
std::map<std::string, long> wakeups(pid_t pid) {
    std::map<std::string, long> per_thread;
    std::string dir = "/proc/" + std::to_string(pid) + "/task";
    DIR *d = opendir(dir.c_str());
    if (d == nullptr) return per_thread;
    while (struct dirent *e = readdir(d)) {
        if (e->d_name[0] == '.') continue;
        std::ifstream in(dir + "/" + e->d_name + "/status");
        std::string key;
        long value;
        while (in >> key) {
            if (key == "voluntary_ctxt_switches:" || key == "nonvoluntary_ctxt_switches:") {
                in >> value;
                per_thread[e->d_name] += value;
            }
        }
    }
    closedir(d);
    return per_thread;
}

// Wake-ups between two samples; a thread that ended in between counts as one more.
long wakeups_between(const std::map<std::string, long> &before, const std::map<std::string, long> &after) {
    long total = 0;
    for (const auto &[tid, n] : after) {
        auto was = before.find(tid);
        total += n - (was == before.end() ? 0 : was->second);
    }
    for (const auto &[tid, n] : before) total += after.count(tid) == 0 ? 1 : 0;
    return total;
}

long rss_kb(pid_t pid) {
    std::ifstream in("/proc/" + std::to_string(pid) + "/status");
    std::string key;
    while (in >> key) {
        if (key == "VmRSS:") {
            long kb;
            in >> kb;
            return kb;
        }
    }
    return -1;
}

void print_row(const char *what, const Stats &s) {
    printf("  %-26s p50 %8.1f  p90 %8.1f  p99 %8.1f  mean %8.1f\n", what, s.p50, s.p90, s.p99, s.mean);
}

}  // namespace

int main(int argc, char **argv) {
    int rounds = 2000, idle_seconds = 10;
    for (int i = 1; i + 1 < argc; i += 2) {
        if (strcmp(argv[i], "--rounds") == 0) rounds = atoi(argv[i + 1]);
        if (strcmp(argv[i], "--idle-seconds") == 0) idle_seconds = atoi(argv[i + 1]);
    }
    if (rounds < 10) rounds = 10;
    Sandbox box;
    Pty usb(box, "/dev/ttyGS0");  // a gadget port with a host, as on a phone on the line

    // Start-up: from the start of the process to the first answer over TCP.
    auto start = Clock::now();
    Daemon d(box, "", false);
    int s = -1;
    while ((s = connect_to(d.port)) < 0) {
        if (us_since(start) > 10e6) {
            fprintf(stderr, "the daemon did not come up\n");
            return 1;
        }
        std::this_thread::sleep_for(std::chrono::microseconds(200));
    }
    const std::string line = kCommand;
    send(s, line.data(), line.size(), MSG_NOSIGNAL);
    std::string first;
    while (!first.ends_with("OK\r\n")) {
        std::string more = read_some(s, 1, 5000);
        if (more.empty()) break;
        first += more;
    }
    double startup_us = us_since(start);
    if (first.find("OK\r\n") == std::string::npos) {
        fprintf(stderr, "unexpected answer: %s\n", first.c_str());
        return 1;
    }
    const size_t want = first.size();

    // The daemon's work per line, done by the second echo server the same way.
    const std::string node = box.path("/proc/meminfo");
    const std::string log = box.dir + "/echo_log";
    auto file_work = [&] {
        char buf[256];
        int fd = open(node.c_str(), O_RDONLY);
        ssize_t n = read(fd, buf, sizeof buf);
        close(fd);
        int out = open(log.c_str(), O_WRONLY | O_CREAT | O_APPEND, 0644);
        if (write(out, buf, n > 60 ? 60 : static_cast<size_t>(n > 0 ? n : 0)) < 0) perror("log");
        close(out);
    };
    std::vector<double> bare, work;
    {
        EchoServer echo([] {});
        int e = connect_to(echo.port);
        bare = measure(e, std::string(want, 'x'), want, rounds);
        close(e);
    }
    {
        EchoServer echo(file_work);
        int e = connect_to(echo.port);
        work = measure(e, std::string(want, 'x'), want, rounds);
        close(e);
    }
    std::vector<double> daemon = measure(s, line, want, rounds);

    // Commands per second: one station, each command waiting for its answer.
    int served = 0;
    auto t0 = Clock::now();
    while (us_since(t0) < 2e6) {
        round_trip(s, line, want);
        ++served;
    }
    double per_second = served / (us_since(t0) / 1e6);
    long rss = rss_kb(d.pid);
    close(s);

    // Idle: no station connected (the hang-up line has run), nothing to do.
    std::this_thread::sleep_for(std::chrono::milliseconds(1500));
    auto before = wakeups(d.pid);
    std::this_thread::sleep_for(std::chrono::seconds(idle_seconds));
    long idle = wakeups_between(before, wakeups(d.pid));

    Stats b = stats(bare), w = stats(work), f = stats(daemon);
    printf("ftcmd on a simulated phone, %d round trips each, line \"%s\" (%zu-byte answer)\n", rounds, kCommand,
           want);
    printf("start-up to first answer     %10.1f ms\n", startup_us / 1000);
    printf("TCP round trip (us):\n");
    print_row("bare loopback echo", b);
    print_row("echo with the file work", w);
    print_row("ftcmd", f);
    printf("ftcmd p50 / file-work echo   %10.2f x\n", f.p50 / w.p50);
    printf("ftcmd p50 / bare echo        %10.2f x\n", f.p50 / b.p50);
    printf("commands per second          %10.0f\n", per_second);
    printf("idle wake-ups over %2d s      %10ld\n", idle_seconds, idle);
    printf("RSS                          %10.1f MB\n", static_cast<double>(rss) / 1024);
    return 0;
}
