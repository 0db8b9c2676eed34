// The device facade on the simulated phone: every path is taken inside the sandbox,
// and every call that would change the host (clock, shell, sync) is recorded instead.
#include <dirent.h>
#include <sys/ioctl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>

#include "platform/device.h"
#include "platform/sim/chardev.h"
#include "platform/sim/sequence.h"
#include "platform/sim/sim.h"

namespace dev {

std::string path(const char *device_path) { return sim::map(device_path); }

// Every writer of the facade and of the simulated libraries opens through here, so the
// rule of attribute nodes (one value, replaced by each write) is kept in this one place:
// an open for writing empties the node and never appends. A device path with a model
// behind it (or an attribute node that a model owns, opened for writing) gives a
// descriptor of that model. A read takes the next value of a node that has a sequence,
// and sees the effect of every earlier write to an owned node.
int open(const char *p, int flags, mode_t mode) {
    sim::settle();
    int fd = sim::device_open(p, flags);
    if (fd != -2) return fd;
    if ((flags & O_ACCMODE) == O_RDONLY) sim::sequence_node(p);
    else if (sim::attribute_node(p)) flags = (flags & ~O_APPEND) | O_TRUNC;
    return ::open(path(p).c_str(), flags | O_CLOEXEC, mode);
}

FILE *fopen(const char *p, const char *mode) {
    std::string m = mode ? mode : "";
    bool writes = m.find_first_of("wa+") != std::string::npos;
    sim::settle();
    int fd = sim::device_open(p, writes ? (m.find('+') != std::string::npos ? O_RDWR : O_WRONLY) : O_RDONLY);
    if (fd >= 0) {
        FILE *f = ::fdopen(fd, m.c_str());
        if (!f) ::close(fd);
        return f;
    }
    if (fd == -1) return nullptr;
    if (!writes) sim::sequence_node(p);
    else if (sim::attribute_node(p)) m = m.find('+') != std::string::npos ? "w+" : "w";
    m += 'e';
    return ::fopen(path(p).c_str(), m.c_str());
}

bool exists(const char *p) { return ::access(path(p).c_str(), F_OK) == 0; }
int access(const char *p, int mode) { return ::access(path(p).c_str(), mode); }
int unlink(const char *p) { return ::unlink(path(p).c_str()); }
int mkdir(const char *p, mode_t mode) { return ::mkdir(path(p).c_str(), mode); }

int statfs(const char *p, struct statfs *st) {
    int rc = ::statfs(path(p).c_str(), st);
    if (rc != 0) return rc;
    // The simulated partitions can be given sizes of their own: "statfs./data=blocks,free,bsize".
    std::string v = sim::config((std::string("statfs.") + p).c_str());
    unsigned long long blocks = 0, bfree = 0, bsize = 0;
    if (!v.empty() && sscanf(v.c_str(), "%llu,%llu,%llu", &blocks, &bfree, &bsize) == 3) {
        st->f_blocks = blocks;
        st->f_bfree = bfree;
        st->f_bavail = bfree;
        st->f_bsize = static_cast<long>(bsize);
    }
    return 0;
}

std::vector<std::string> list_dir(const char *p) {
    std::vector<std::string> names;
    DIR *d = ::opendir(path(p).c_str());
    if (!d) return names;
    while (struct dirent *e = ::readdir(d)) {
        if (strcmp(e->d_name, ".") != 0 && strcmp(e->d_name, "..") != 0) names.emplace_back(e->d_name);
    }
    ::closedir(d);
    return names;
}

bool read_node(const char *p, std::string &out, size_t max) {
    int fd = open(p, O_RDONLY);
    if (fd < 0) return false;
    out.assign(max, '\0');
    ssize_t n = ::read(fd, out.data(), max);
    ::close(fd);
    if (n < 0) return false;
    out.resize(static_cast<size_t>(n));
    return true;
}

int write_node(const char *p, const char *text, int flags) {
    int fd = open(p, flags, 0666);
    if (fd < 0) return -1;
    ssize_t n = ::write(fd, text, strlen(text));
    int err = errno;
    ::close(fd);
    sim::settle();  // a model that owns the node has taken the write
    errno = err;
    return static_cast<int>(n);
}

int set_clock(const struct timeval *tv) {
    if (sim::fault("clock")) {
        errno = EPERM;
        return -1;
    }
    sim::record("clock", std::to_string(tv->tv_sec));
    long offset = static_cast<long>(tv->tv_sec - ::time(nullptr));
    return sim::write_file_atomic(sim::state("clock"), std::to_string(offset) + "\n") ? 0 : -1;
}

static long clock_offset() {
    std::string s;
    return sim::read_file(sim::state("clock"), s) ? strtol(s.c_str(), nullptr, 10) : 0;
}

time_t now() { return ::time(nullptr) + clock_offset(); }

int gettimeofday(struct timeval *tv) {
    int rc = ::gettimeofday(tv, nullptr);
    tv->tv_sec += clock_offset();
    return rc;
}

void sync() { sim::record("sync", ""); }

int ioctl(int fd, unsigned long request, void *arg) {
    int result = 0;
    if (sim::device_ioctl(fd, request, arg, &result)) return result;
    return ::ioctl(fd, request, arg);
}

// The simulated phone's memory is the MemTotal of its own proc/meminfo, in 4 KiB pages, so
// the same command answers the same on every workstation; the processor count is config's
// "cpus" (8 by default). Other names are not the phone's to answer.
long sysconf(int name) {
    constexpr long kPageSize = 4096;
    if (name == _SC_PAGESIZE) return kPageSize;
    if (name == _SC_PHYS_PAGES) {
        std::string text;
        if (!read_node("/proc/meminfo", text, 8192)) return -1;
        size_t at = text.find("MemTotal:");
        if (at == std::string::npos) return -1;
        long long kb = strtoll(text.c_str() + at + 9, nullptr, 10);
        return kb > 0 ? static_cast<long>(kb * 1024 / kPageSize) : -1;
    }
    if (name == _SC_NPROCESSORS_CONF || name == _SC_NPROCESSORS_ONLN) {
        long n = strtol(sim::config("cpus", "8").c_str(), nullptr, 10);
        return n > 0 ? n : 8;
    }
    errno = EINVAL;
    return -1;
}

}  // namespace dev

#include <arpa/inet.h>

namespace dev {

// A simulated phone listens on loopback unless told otherwise, so that trying ftcmd on a
// workstation does not open a port to the network; two can run side by side.
int tcp_service_port() {
    const char *p = getenv("FTCMD_TCP_PORT");
    return (p && *p) ? atoi(p) : 6988;
}

unsigned int tcp_service_address() {
    const char *a = getenv("FTCMD_SIM_LISTEN");
    struct in_addr addr {};
    if (a && *a && inet_pton(AF_INET, a, &addr) == 1) return addr.s_addr;
    return htonl(INADDR_LOOPBACK);
}

const char *local_socket_name() {
    const char *n = getenv("FTCMD_LOCAL_SOCKET");
    return (n && *n) ? n : "ftcmd_cmd_socket";
}

}  // namespace dev

// chown(): the sandbox files keep the host user's ownership, and the change is only recorded.
namespace dev {

int chown(const char *p, uid_t owner, gid_t group) {
    std::string detail = std::string(p ? p : "") + " " + std::to_string(owner) + ":" + std::to_string(group);
    if (!exists(p)) {
        errno = ENOENT;
        return -1;
    }
    if (sim::fault("chown")) {
        errno = EPERM;
        return -1;
    }
    sim::record("chown", detail);
    return 0;
}

}  // namespace dev
