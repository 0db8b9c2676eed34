#include "platform/sim/sequence.h"

#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <mutex>

#include "platform/sim/script.h"
#include "platform/sim/sim.h"

namespace sim {
namespace {

std::mutex g_pos_mu;  // one read-modify-write of the position file at a time

struct Sequence {
    std::string name;
    std::vector<std::string> values;
};

constexpr const char *kKinds[] = {"testapp", "camera", "shell", "sensor", "audio", "modem", "config"};

// A name is "<kind>:<what>", or else a device path; a node's sequence may be named with
// or without the leading "/".
std::string canonical_name(const std::string &name) {
    size_t colon = name.find(':');
    if (colon != std::string::npos)
        for (const char *kind : kKinds)
            if (name.compare(0, colon, kind) == 0) return name;
    return rooted_path(name.c_str());
}

std::vector<Sequence> parse(const std::string &file) {
    std::vector<Sequence> out;
    for (const auto &l : read_lines(file)) {
        if (l.empty() || l[0] == '#') continue;
        if (l.size() >= 2 && l.front() == '[' && l.back() == ']') {
            out.push_back({canonical_name(l.substr(1, l.size() - 2)), {}});
        } else if (!out.empty()) {
            out.back().values.push_back(l == "(empty)" ? "" : unescape(l));
        }
    }
    return out;
}

// FNV-1a over the values: a sequence that a station rewrites starts again.
std::string fingerprint(const std::vector<std::string> &values) {
    unsigned long long h = 1469598103934665603ULL;
    for (const auto &v : values) {
        for (unsigned char c : v + '\x1f') {
            h ^= c;
            h *= 1099511628211ULL;
        }
    }
    char buf[24];
    snprintf(buf, sizeof buf, "%016llx", h);
    return buf;
}

// Position lines: "<next index> <fingerprint> <name>", the name last so that it may hold
// any text.
struct Position {
    size_t next = 0;
    std::string print, name;
};

std::vector<Position> read_positions(const std::string &file) {
    std::vector<Position> out;
    for (const auto &l : read_lines(file)) {
        size_t a = l.find(' ');
        size_t b = a == std::string::npos ? a : l.find(' ', a + 1);
        if (b == std::string::npos) continue;
        out.push_back({strtoul(l.c_str(), nullptr, 10), l.substr(a + 1, b - a - 1), l.substr(b + 1)});
    }
    return out;
}

bool write_positions(const std::string &file, const std::vector<Position> &pos) {
    std::string text;
    for (const auto &p : pos) text += std::to_string(p.next) + " " + p.print + " " + p.name + "\n";
    return write_file_atomic(file, text);
}

// Takes the next value of seq and moves its position on (the last value repeats).
std::string step_on(const std::string &dir, const Sequence &seq) {
    std::lock_guard<std::mutex> lk(g_pos_mu);
    std::string file = dir + "/sequences.pos";
    std::vector<Position> pos = read_positions(file);
    std::string print = fingerprint(seq.values);
    Position *mine = nullptr;
    for (auto &p : pos)
        if (p.name == seq.name) mine = &p;
    if (mine == nullptr) {
        pos.push_back({0, print, seq.name});
        mine = &pos.back();
    }
    if (mine->print != print) *mine = {0, print, seq.name};
    size_t at = std::min(mine->next, seq.values.size() - 1);
    mine->next = std::min(at + 1, seq.values.size() - 1);
    write_positions(file, pos);
    return seq.values[at];
}

bool take(const std::string &dir, const std::vector<Sequence> &all, const std::string &name, std::string &value) {
    for (const auto &s : all) {
        if (s.name == name && !s.values.empty()) {
            value = step_on(dir, s);
            return true;
        }
    }
    return false;
}

// Sequences are optional: without the file every call costs one failed stat.
std::vector<Sequence> load(const std::string &dir) {
    struct stat st {};
    std::string file = dir + "/sequences";
    if (::stat(file.c_str(), &st) != 0 || st.st_size == 0) return {};
    return parse(file);
}

}  // namespace

std::string unescape(const std::string &s) {
    std::string out;
    for (size_t i = 0; i < s.size(); ++i) {
        char next = i + 1 < s.size() ? s[i + 1] : '\0';
        if (s[i] == '\\' && (next == 'n' || next == 't' || next == '\\' || ((next == '#' || next == '[') && i == 0))) {
            out += next == 'n' ? '\n' : next == 't' ? '\t' : next;
            ++i;
        } else {
            out += s[i];
        }
    }
    return out;
}

std::string escape(const std::string &s) {
    if (s.empty()) return "(empty)";
    std::string out = s[0] == '#' || s[0] == '[' ? "\\" : "";
    for (char c : s) out += c == '\n' ? "\\n" : c == '\t' ? "\\t" : c == '\\' ? "\\\\" : std::string(1, c);
    return out;
}

bool sequence_next_in(const std::string &dir, const std::string &what, std::string &value) {
    int saved = errno;
    bool found = take(dir, load(dir), canonical_name(what), value);
    errno = saved;
    return found;
}

bool sequence_next(const std::string &what, std::string &value) { return sequence_next_in(root() + "/.sim", what, value); }

bool sequence_reply(const std::string &kind, const std::string &message, std::string &value) {
    int saved = errno;
    std::string dir = root() + "/.sim";
    std::vector<Sequence> all = load(dir);
    std::string prefix = kind + ":";
    bool found = take(dir, all, prefix + message, value);
    if (!found) {
        const Sequence *best = nullptr;
        long best_fixed = -1;
        for (const auto &s : all) {
            if (s.values.empty() || s.name.compare(0, prefix.size(), prefix) != 0) continue;
            std::string pat = s.name.substr(prefix.size());
            if (pat.find('*') == std::string::npos || !glob_match(pat.c_str(), message.c_str())) continue;
            long fixed = 0;
            for (char c : pat) fixed += c != '*';
            if (fixed > best_fixed) best_fixed = fixed, best = &s;
        }
        if (best) value = step_on(dir, *best), found = true;
    }
    errno = saved;
    return found;
}

void sequence_node(const char *device_path) {
    std::string value;
    if (!sequence_next(rooted_path(device_path), value)) return;
    int saved = errno;
    // "(missing)": the part drops off, so this read (and every later open) fails.
    if (value == "(missing)") ::unlink(map(device_path).c_str());
    else write_file_atomic(map(device_path), value + "\n");
    errno = saved;
}

bool sequence_set(const std::string &r, const std::string &what, const std::vector<std::string> &values) {
    std::string file = r + "/.sim/sequences", out;
    std::string name = canonical_name(what);
    bool skipping = false;
    for (const auto &l : read_lines(file)) {
        if (l.size() >= 2 && l.front() == '[' && l.back() == ']') skipping = canonical_name(l.substr(1, l.size() - 2)) == name;
        if (!skipping) out += l + "\n";
    }
    if (!values.empty()) {
        out += "[" + what + "]\n";
        for (const auto &v : values) out += escape(v) + "\n";
    }
    std::lock_guard<std::mutex> lk(g_pos_mu);
    std::string pos_file = r + "/.sim/sequences.pos";
    std::vector<Position> pos = read_positions(pos_file), kept;
    for (const auto &p : pos)
        if (p.name != name) kept.push_back(p);
    return write_file_atomic(file, out) && write_positions(pos_file, kept);
}

bool sequence_rewind(const std::string &r) {
    std::lock_guard<std::mutex> lk(g_pos_mu);
    return write_file_atomic(r + "/.sim/sequences.pos", "");
}

}  // namespace sim
