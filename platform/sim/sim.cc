#include "platform/sim/sim.h"

#include <fcntl.h>
#include <unistd.h>

#include <cstdio>
#include <cstdlib>
#include <ctime>
#include <fstream>
#include <mutex>
#include <sstream>

#include "platform/log.h"

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

std::string map(const char *device_path) {
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
    std::string out = root();
    for (const auto &part : parts) out += "/" + part;
    return out;
}

std::string state(const char *name) { return root() + "/.sim/" + name; }

void record(const char *kind, const std::string &detail) {
    std::string line = kind;
    line += ' ';
    for (char c : detail) line += (c == '\n') ? '|' : c;
    line += '\n';
    std::string file = state("events.log");
    std::lock_guard<std::mutex> lk(g_mu);
    int fd = ::open(file.c_str(), O_WRONLY | O_CREAT | O_APPEND | O_CLOEXEC, 0644);
    if (fd < 0) return;
    ssize_t n = ::write(fd, line.data(), line.size());
    (void)n;
    ::close(fd);
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
    std::ifstream in(host_path, std::ios::binary);
    if (!in) return false;
    std::ostringstream ss;
    ss << in.rdbuf();
    out = ss.str();
    return true;
}

bool write_file_atomic(const std::string &host_path, const std::string &data) {
    std::string tmp = host_path + ".tmp." + std::to_string(getpid());
    {
        std::ofstream out(tmp, std::ios::binary | std::ios::trunc);
        if (!out) return false;
        out << data;
        if (!out) return false;
    }
    return ::rename(tmp.c_str(), host_path.c_str()) == 0;
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
