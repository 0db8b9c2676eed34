// Time from a station's key injection to the daemon's read of the record, through the
// simulated phone's input devices: the station FIFO, the device thread and the socket
// pair that the daemon waits on in epoll. Prints p50 and p99 in milliseconds; the target
// is 50 ms at p99. Runs in a sandbox of its own under $TMPDIR (or /tmp), removed at the end.
#include <fcntl.h>
#include <linux/input.h>
#include <sys/epoll.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <string>
#include <vector>

#include "platform/device.h"
#include "platform/sim/chardev.h"
#include "platform/sim/sim.h"

namespace fs = std::filesystem;

int main(int argc, char **argv) {
    int rounds = argc > 1 ? atoi(argv[1]) : 500;
    const char *tmp = getenv("TMPDIR");
    std::string dir = std::string(tmp && *tmp ? tmp : "/tmp") + "/ftcmd-bench.XXXXXX";
    if (!mkdtemp(dir.data())) {
        perror("mkdtemp");
        return 1;
    }
    fs::create_directories(dir + "/.sim");
    fs::create_directories(dir + "/dev/input");
    std::ofstream(dir + "/dev/input/event0") << "name=bench-keys\nkey=115\n";
    sim::set_root(dir);

    int fd = dev::open("/dev/input/event0", O_RDONLY);
    int ep = epoll_create1(EPOLL_CLOEXEC);
    struct epoll_event ev {};
    ev.events = EPOLLIN;
    if (fd < 0 || epoll_ctl(ep, EPOLL_CTL_ADD, fd, &ev) != 0) {
        perror("open");
        fs::remove_all(dir);
        return 1;
    }

    std::vector<double> ms;
    for (int i = 0; i < rounds; ++i) {
        auto t0 = std::chrono::steady_clock::now();
        if (!sim::station_send(dir, "input key 115 press")) break;
        if (epoll_wait(ep, &ev, 1, 5000) != 1) break;
        struct input_event rec[2];
        if (read(fd, rec, sizeof rec) != static_cast<ssize_t>(sizeof rec)) break;
        auto t1 = std::chrono::steady_clock::now();
        ms.push_back(std::chrono::duration<double, std::milli>(t1 - t0).count());
    }
    close(ep);
    close(fd);
    fs::remove_all(dir);
    if (ms.size() != static_cast<size_t>(rounds)) {
        fprintf(stderr, "input_latency: only %zu of %d injections were read\n", ms.size(), rounds);
        return 1;
    }
    std::sort(ms.begin(), ms.end());
    auto at = [&](double q) { return ms[std::min(ms.size() - 1, static_cast<size_t>(q * ms.size()))]; };
    printf("input_latency: %d injections, p50 %.3f ms, p99 %.3f ms, max %.3f ms (target p99 <= 50 ms)\n", rounds, at(0.5),
           at(0.99), ms.back());
    return at(0.99) <= 50.0 ? 0 : 1;
}
