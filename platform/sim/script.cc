#include "platform/sim/script.h"

#include <cstdlib>

#include "platform/sim/sim.h"

namespace sim {
namespace {

// Glob match where only "*" is special.
bool glob(const char *p, const char *s) {
    const char *star = nullptr, *resume = nullptr;
    while (*s) {
        if (*p == '*') {
            star = p++;
            resume = s;
        } else if (*p == *s) {
            ++p;
            ++s;
        } else if (star) {
            p = star + 1;
            s = ++resume;
        } else {
            return false;
        }
    }
    while (*p == '*') ++p;
    return *p == '\0';
}

std::string unescape(const std::string &s) {
    std::string out;
    for (size_t i = 0; i < s.size(); ++i) {
        if (s[i] == '\\' && i + 1 < s.size() && (s[i + 1] == 'n' || s[i + 1] == 't' || s[i + 1] == '\\')) {
            char c = s[++i];
            out += c == 'n' ? '\n' : c == 't' ? '\t' : '\\';
        } else {
            out += s[i];
        }
    }
    return out;
}

}  // namespace

bool script_reply(const std::string &file, const std::string &message, std::string &reply) {
    long best = -1;  // fixed characters of the best pattern so far
    for (const auto &l : read_lines(file)) {
        if (l.empty() || l[0] == '#') continue;
        size_t sep = l.find(" =>");
        if (sep == std::string::npos) continue;
        std::string pat = l.substr(0, sep), rep = l.substr(sep + 3);
        if (!rep.empty() && rep[0] == ' ') rep.erase(0, 1);
        if (pat == message) {
            reply = unescape(rep);
            return true;
        }
        if (pat.find('*') == std::string::npos || !glob(pat.c_str(), message.c_str())) continue;
        long fixed = 0;
        for (char c : pat) fixed += c != '*';
        if (fixed > best) {
            best = fixed;
            reply = unescape(rep);
        }
    }
    return best >= 0;
}

long script_long(const std::string &file, const std::string &key, long def) {
    std::string v;
    if (!read_kv(file, key, v) || v.empty()) return def;
    char *end = nullptr;
    long n = strtol(v.c_str(), &end, 0);
    return *end == '\0' ? n : def;
}

std::string script_text(const std::string &file, const std::string &key, const std::string &def) {
    std::string v;
    return read_kv(file, key, v) ? v : def;
}

}  // namespace sim
