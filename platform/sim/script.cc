#include "platform/sim/script.h"

#include <cstdlib>

#include "platform/sim/sequence.h"
#include "platform/sim/sim.h"

namespace sim {
bool glob_match(const char *p, const char *s) {
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

bool script_reply(const std::string &file, const std::string &message, std::string &reply) {
    std::string name = file.substr(file.rfind('/') + 1);
    if (name.size() > 8 && name.compare(name.size() - 8, 8, ".replies") == 0 &&
        sequence_reply(name.substr(0, name.size() - 8), message, reply))
        return true;
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
        if (pat.find('*') == std::string::npos || !glob_match(pat.c_str(), message.c_str())) continue;
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
