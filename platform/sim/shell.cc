// Shell commands on the simulated phone. Every command is recorded; a small safe set
// (date, echo, cat, touch, rm of single files) is carried out inside the sandbox, with
// "> file" and ">> file" redirection. Anything else (rm -r, iwpriv, setprop, stop...)
// is only recorded, and answers success as a phone's shell mostly would.
#include <fcntl.h>
#include <unistd.h>

#include <ctime>
#include <string>
#include <vector>

#include "platform/device.h"
#include "platform/sim/sim.h"

namespace sim {

std::string shell_unwrap(std::string c) {
    for (const char *pre : {"/system/bin/sh -c ", "sh -c "}) {
        std::string p = pre;
        if (c.compare(0, p.size(), p) == 0) {
            c = c.substr(p.size());
            if (c.size() >= 2 && (c.front() == '"' || c.front() == '\'') && c.back() == c.front())
                c = c.substr(1, c.size() - 2);
            break;
        }
    }
    return c;
}

std::vector<std::string> shell_words(const std::string &s) {
    std::vector<std::string> out;
    std::string cur;
    char quote = 0;
    bool have = false;
    for (char ch : s) {
        if (quote) {
            if (ch == quote) quote = 0;
            else cur += ch;
        } else if (ch == '"' || ch == '\'') {
            quote = ch;
            have = true;
        } else if (ch == ' ' || ch == '\t') {
            if (have || !cur.empty()) out.push_back(cur);
            cur.clear();
            have = false;
        } else {
            cur += ch;
        }
    }
    if (have || !cur.empty()) out.push_back(cur);
    return out;
}

}  // namespace sim

namespace {

std::string date_text() {
    time_t t = dev::now();
    struct tm tm {};
    localtime_r(&t, &tm);
    char buf[64];
    strftime(buf, sizeof buf, "%a %b %e %H:%M:%S %Z %Y\n", &tm);
    return buf;
}

}  // namespace

namespace dev {

int shell(const char *command) {
    sim::record("shell", command ? command : "");
    if (command == nullptr) return 1;
    std::string c = sim::shell_unwrap(command);

    std::string target;
    bool append = false;
    size_t gt = c.find('>');
    if (gt != std::string::npos) {
        append = gt + 1 < c.size() && c[gt + 1] == '>';
        std::vector<std::string> t = sim::shell_words(c.substr(gt + (append ? 2 : 1)));
        if (t.size() != 1) return 0;  // not a shape we emulate
        target = t[0];
        c = c.substr(0, gt);
    }
    std::vector<std::string> w = sim::shell_words(c);
    if (w.empty()) return 0;
    std::string prog = w[0].substr(w[0].rfind('/') == std::string::npos ? 0 : w[0].rfind('/') + 1);

    std::string out;
    int status = 0;
    if (prog == "date" && w.size() == 1) {
        out = date_text();
    } else if (prog == "echo") {
        for (size_t i = 1; i < w.size(); ++i) out += (i > 1 ? " " : "") + w[i];
        out += "\n";
    } else if (prog == "cat") {
        for (size_t i = 1; i < w.size(); ++i) {
            std::string part;
            if (sim::read_file(sim::map(w[i].c_str()), part)) out += part;
            else status = 1;
        }
    } else if (prog == "touch") {
        for (size_t i = 1; i < w.size(); ++i) {
            int fd = dev::open(w[i].c_str(), O_WRONLY | O_CREAT, 0666);
            if (fd >= 0) ::close(fd);
            else status = 1;
        }
    } else if (prog == "rm") {
        for (size_t i = 1; i < w.size(); ++i)
            if (!w[i].empty() && w[i][0] == '-') return 0;  // recursive or forced: recorded only
        for (size_t i = 1; i < w.size(); ++i)
            if (dev::unlink(w[i].c_str()) != 0) status = 1;
        return status;
    } else {
        return 0;
    }

    if (target.empty()) return status;
    int fd = dev::open(target.c_str(), O_WRONLY | O_CREAT | (append ? O_APPEND : O_TRUNC), 0666);
    if (fd < 0) return 1;
    ssize_t n = ::write(fd, out.data(), out.size());
    ::close(fd);
    return n == static_cast<ssize_t>(out.size()) ? status : 1;
}

}  // namespace dev
