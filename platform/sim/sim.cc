#include "platform/sim/sim.h"

#include <fcntl.h>
#include <unistd.h>

#include <atomic>
#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <ctime>
#include <fstream>
#include <mutex>
#include <sstream>

#include "platform/log.h"
#include "platform/sim/sequence.h"

namespace sim {
namespace {
std::mutex g_mu;  // guards the root and every read-modify-write of a state file
std::string g_root;
bool g_root_set = false;
}  // namespace

const std::string &root() {
    std::lock_guard<std::mutex> lk(g_mu);
    if (!g_root_set) {
        const char *env = getenv("FTCMD_SIM_ROOT");
        if (env == nullptr || env[0] == '\0') {
            fprintf(stderr, "ftcmd: FTCMD_SIM_ROOT is not set; the simulated phone needs a sandbox\n");
            _exit(2);
        }
        char resolved[4096];
        g_root = realpath(env, resolved) ? resolved : env;
        g_root_set = true;
    }
    return g_root;
}

void set_root(const std::string &r) {
    std::lock_guard<std::mutex> lk(g_mu);
    char resolved[4096];
    g_root = realpath(r.c_str(), resolved) ? resolved : r;
    g_root_set = true;
}

// Built by appending: GCC 12 warns (falsely, -Wrestrict) on "/" + a temporary string.
std::string rooted_path(const char *device_path) {
    std::string out(1, '/');
    out += normal_path(device_path);
    return out;
}

std::string normal_path(const char *device_path) {
    std::vector<std::string> parts;
    std::string p = device_path ? device_path : "";
    size_t i = 0;
    while (i <= p.size()) {
        size_t j = p.find('/', i);
        if (j == std::string::npos) j = p.size();
        std::string part = p.substr(i, j - i);
        if (part == "..") {
            if (!parts.empty()) parts.pop_back();
        } else if (!part.empty() && part != ".") {
            parts.push_back(part);
        }
        i = j + 1;
    }
    std::string out;
    for (const auto &part : parts) out += (out.empty() ? "" : "/") + part;
    return out;
}

std::string map(const char *device_path) {
    std::string rel = normal_path(device_path);
    return rel.empty() ? root() : root() + "/" + rel;
}

bool attribute_node(const char *device_path) {
    std::string rel = normal_path(device_path);
    for (const char *top : {"sys/", "proc/", "d/"})
        if (rel.compare(0, strlen(top), top) == 0) return true;
    return false;
}

std::string state(const char *name) { return root() + "/.sim/" + name; }

namespace {

long long monotonic_ms() {
    struct timespec ts {};
    clock_gettime(CLOCK_MONOTONIC, &ts);
    return static_cast<long long>(ts.tv_sec) * 1000 + ts.tv_nsec / 1000000;
}

// The start as written in <root>/.sim/started, or -1.
long long read_start(const std::string &file) {
    std::string text;
    if (!read_file(file, text) || text.empty()) return -1;
    char *end = nullptr;
    long long v = strtoll(text.c_str(), &end, 10);
    return end != text.c_str() ? v : -1;
}

// Writes the start so that racing writers agree: the file appears whole or not at all,
// and only the first of several creators wins (link fails when the name exists).
void create_start(const std::string &file, long long start, bool replace) {
    std::string tmp = file + ".tmp." + std::to_string(getpid()) + "." + std::to_string(start);
    {
        std::ofstream out(tmp, std::ios::trunc);
        out << start << "\n";
    }
    if (replace) {
        ::rename(tmp.c_str(), file.c_str());
    } else {
        (void)!::link(tmp.c_str(), file.c_str());
        ::unlink(tmp.c_str());
    }
}

}  // namespace

long long now_ms() {
    int saved = errno;
    std::string file = state("started");
    long long now = monotonic_ms();
    long long start = read_start(file);
    if (start < 0) {
        create_start(file, now, false);
        start = read_start(file);
    } else if (start > now) {
        // Kept from before the host last booted: the monotonic clock began again.
        create_start(file, now, true);
        start = now;
    }
    errno = saved;
    return start < 0 || start > now ? 0 : now - start;
}

bool restart_clock(const std::string &r) {
    create_start(r + "/.sim/started", monotonic_ms(), true);
    return read_start(r + "/.sim/started") >= 0;
}

void record(const char *kind, const std::string &detail) {
    static std::mutex events_mu;  // time stamps go into the log in the order taken
    int saved = errno;
    std::string text = std::string(kind) + " ";
    for (char c : detail) text += (c == '\n') ? '|' : c;
    text += '\n';
    std::string file = state("events.log");
    {
        std::lock_guard<std::mutex> lk(events_mu);
        std::string line = std::to_string(now_ms()) + " " + text;
        int fd = ::open(file.c_str(), O_WRONLY | O_CREAT | O_APPEND | O_CLOEXEC, 0644);
        if (fd >= 0) {
            ssize_t n = ::write(fd, line.data(), line.size());
            (void)n;
            ::close(fd);
        }
    }
    errno = saved;
}

bool fault(const char *name) {
    for (const auto &l : read_lines(state("faults")))
        if (l == name) return true;
    return false;
}

std::string config(const char *key, const char *def) {
    std::string v;
    return read_kv(state("config"), key, v) ? v : def;
}

bool read_file(const std::string &host_path, std::string &out) {
    // A node of the phone read by the simulator itself (the shell's cat) takes the next
    // value of its sequence too.
    std::string rel;
    {
        std::lock_guard<std::mutex> lk(g_mu);
        if (g_root_set && host_path.size() > g_root.size() + 1 && host_path.compare(0, g_root.size(), g_root) == 0 &&
            host_path[g_root.size()] == '/')
            rel = host_path.substr(g_root.size());
    }
    if (!rel.empty() && rel.compare(0, 6, "/.sim/") != 0) sequence_node(rel.c_str());
    std::ifstream in(host_path, std::ios::binary);
    if (!in) return false;
    std::ostringstream ss;
    ss << in.rdbuf();
    out = ss.str();
    return true;
}

bool write_file_atomic(const std::string &host_path, const std::string &data) {
    // Unique per writer, threads included: two writers never share a temp file.
    static std::atomic<unsigned> serial{0};
    std::string tmp = host_path + ".tmp." + std::to_string(getpid()) + "." + std::to_string(serial++);
    std::ofstream out(tmp, std::ios::binary | std::ios::trunc);
    if (!out) return false;
    out << data;
    out.close();
    bool ok = !out.fail() && ::rename(tmp.c_str(), host_path.c_str()) == 0;
    if (!ok) ::unlink(tmp.c_str());
    return ok;
}

std::vector<std::string> read_lines(const std::string &host_path) {
    std::vector<std::string> lines;
    std::string data;
    if (!read_file(host_path, data)) return lines;
    std::istringstream in(data);
    std::string l;
    while (std::getline(in, l)) {
        while (!l.empty() && (l.back() == '\r' || l.back() == ' ')) l.pop_back();
        lines.push_back(l);
    }
    return lines;
}

bool read_kv(const std::string &file, const std::string &key, std::string &value) {
    // The scripts of the simulated hardware may give a key a sequence of values.
    size_t slash = file.rfind('/');
    if (slash != std::string::npos && slash >= 5 && file.compare(slash - 5, 5, "/.sim") == 0) {
        std::string name = file.substr(slash + 1);
        if ((name == "sensor" || name == "audio" || name == "modem" || name == "config") &&
            sequence_next_in(file.substr(0, slash), name + ":" + key, value))
            return true;
    }
    for (const auto &l : read_lines(file)) {
        if (l.empty() || l[0] == '#') continue;
        size_t eq = l.find('=');
        if (eq == std::string::npos || l.compare(0, eq, key) != 0 || eq != key.size()) continue;
        value = l.substr(eq + 1);
        return true;
    }
    return false;
}

// Sets (value) or deletes (nullptr) one key, keeping every other line as it stands.
bool write_kv(const std::string &file, const std::string &key, const std::string *value) {
    static std::mutex kv_mu;
    std::lock_guard<std::mutex> lk(kv_mu);
    std::string out;
    bool done = false;
    for (const auto &l : read_lines(file)) {
        size_t eq = l.find('=');
        bool same = l.empty() || l[0] == '#' || eq == std::string::npos
                        ? false
                        : (eq == key.size() && l.compare(0, eq, key) == 0);
        if (!same) {
            out += l + "\n";
        } else if (value && !done) {
            out += key + "=" + *value + "\n";
            done = true;
        }
    }
    if (value && !done) out += key + "=" + *value + "\n";
    return write_file_atomic(file, out);
}

}  // namespace sim
