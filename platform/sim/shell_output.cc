// ext_system: commands run for their output on the simulated phone. A scripted command
// (.sim/shell.replies) gives its scripted output; a few programs are emulated inside the
// sandbox; everything else gives no output. Nothing runs on the host.
#include <errno.h>
#include <fcntl.h>

#include <cctype>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string>
#include <vector>
#include <filesystem>
#include <sstream>

#include "platform/android.h"
#include "platform/device.h"
#include "platform/factory.h"
#include "platform/sim/cbuf.h"
#include "platform/sim/processes.h"
#include "platform/sim/script.h"
#include "platform/sim/sim.h"

using sim::opt;
using sim::put;
using sim::split;

namespace fs = std::filesystem;

namespace {

// ext_system also takes commands with their stderr folded in or sent to the background.
std::string unwrap(const std::string &command) {
    std::string c = sim::shell_unwrap(command);
    for (size_t at; (at = c.find("2>&1")) != std::string::npos;) c.erase(at, 4);
    while (!c.empty() && (c.back() == ' ' || c.back() == '&')) c.pop_back();
    return c;
}

std::string base(const std::string &prog) {
    size_t slash = prog.rfind('/');
    return slash == std::string::npos ? prog : prog.substr(slash + 1);
}

// du -sk: kilobytes under a path of the sandbox.
std::string disk_usage(const std::string &device_path) {
    std::error_code ec;
    fs::path p = sim::map(device_path.c_str());
    if (!fs::exists(p, ec)) return "";
    unsigned long long bytes = 0;
    if (fs::is_regular_file(p, ec)) {
        bytes = fs::file_size(p, ec);
    } else {
        for (auto it = fs::recursive_directory_iterator(p, ec); !ec && it != fs::recursive_directory_iterator(); it.increment(ec))
            if (it->is_regular_file(ec)) bytes += it->file_size(ec);
    }
    return std::to_string((bytes + 1023) / 1024) + "\t" + device_path + "\n";
}

// btnvtool -b B0.B1.B2.B3.B4.B5 stores the Bluetooth address as item 1 of the
// persist NV file, least significant byte first, keeping every other item.
void btnvtool(const std::vector<std::string> &w) {
    if (w.size() < 3 || w[1] != "-b") return;
    std::vector<std::string> parts = split(w[2], '.');
    if (parts.size() != 6) return;
    std::string addr;
    for (const auto &p : parts) addr += static_cast<char>(strtoul(p.c_str(), nullptr, 16));
    std::string file = sim::map("/mnt/vendor/persist/bluetooth/.bt_nv.bin"), old, out;
    std::error_code ec;
    fs::create_directories(fs::path(file).parent_path(), ec);
    sim::read_file(file, old);
    bool done = false;
    for (size_t i = 0; i + 3 <= old.size();) {
        size_t len = static_cast<unsigned char>(old[i + 2]);
        std::string item = old.substr(i, 3 + len);
        if (old[i] == 1 && !done) {
            item = std::string{1, old[i + 1], 6} + addr;
            done = true;
        }
        out += item;
        i += 3 + len;
    }
    if (!done) out += std::string{1, 0, 6} + addr;
    sim::write_file_atomic(file, out);
}

// One stage of a command line; only the programs below give output or act.
std::string run_stage(const std::vector<std::string> &w, const std::string &input, bool first) {
    std::string prog = base(w[0]), out;
    if (!first) {
        if (prog != "grep" || w.size() < 2) return input;
        std::istringstream in(input);
        for (std::string l; std::getline(in, l);)
            if (l.find(w.back()) != std::string::npos) out += l + "\n";
        return out;
    }
    if (prog == "echo") {
        for (size_t i = 1; i < w.size(); ++i) out += (i > 1 ? " " : "") + w[i];
        return out + "\n";
    }
    if (prog == "cat") {
        for (size_t i = 1; i < w.size(); ++i) {
            std::string part;
            if (sim::read_file(sim::map(w[i].c_str()), part)) out += part;
        }
        return out;
    }
    if (prog == "du" && w.size() >= 2) return disk_usage(w.back());
    if (prog == "ps") return sim::process_list();
    if (prog == "bdt" && w.size() >= 2) {
        // The controller's test mode shows in the property that AT+EMBT=4 reads.
        if (w[1] == "entrydut" || w[1] == "txcontinuous") property_set("bluetooth.bdt.kaeldut", "true");
        if (w[1] == "exitdut") property_set("bluetooth.bdt.kaeldut", "false");
        return "";
    }
    if (prog == "btnvtool") btnvtool(w);
    return "";
}

}  // namespace

extern "C" {

int ext_system(const char *command, char *buf, int size) {
    std::string cmd = opt(command);
    if (sim::fault("ext-system")) {
        sim::record("shell", cmd + " (failed)");
        return -1;
    }
    std::string c = unwrap(cmd), out;
    if (sim::script_reply(sim::state("shell.replies"), c, out)) {
        sim::record("shell", cmd);
    } else if (c.find('>') != std::string::npos) {
        dev::shell(c.c_str());  // redirections are emulated, and recorded, by the shell itself
    } else {
        sim::record("shell", cmd);
        bool first = true;
        for (const auto &stage : split(c, '|')) {
            std::vector<std::string> w = sim::shell_words(stage);
            if (w.empty()) continue;
            out = run_stage(w, out, first);
            first = false;
        }
    }
    if (out.empty()) return 0;  // the caller's preset text stays
    return put(buf, size, out);
}

}  // extern "C"
