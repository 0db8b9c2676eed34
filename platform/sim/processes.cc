// The process list of the simulated phone. On a phone, ps lists every process; the ones a
// station cares about are background programs that ftcmd starts through the shell, above
// all the DDR stress test (stressapptest -s <seconds>), which runs for its seconds and then
// ends. The model runs nothing: init and ftcmd are always listed, a stress test counts as
// running from the time its start was recorded in events.log until its seconds have
// passed, and .sim/processes names further programs that run whatever was started. Process
// ids, sizes and states are made up; no memory is stressed and no stress log is written.
#include "platform/sim/processes.h"

#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <vector>

#include "platform/sim/sim.h"

namespace sim {
namespace {

constexpr char kStressProgram[] = "stressapptest";

// "<ms> shell <command>" lines of stress test starts: still running at now?
bool stress_running(long long now) {
    for (const auto &l : read_lines(state("events.log"))) {
        long long at = 0;
        int skip = 0;
        if (sscanf(l.c_str(), "%lld shell %n", &at, &skip) != 1 || skip == 0) continue;
        const char *command = l.c_str() + skip;
        if (strstr(command, kStressProgram) == nullptr) continue;
        const char *secs = strstr(command, " -s ");
        if (secs != nullptr && now < at + atoll(secs + 4) * 1000) return true;
    }
    return false;
}

std::string row(int pid, const std::string &name) {
    char line[160];
    snprintf(line, sizeof line, "root         %5d     1  2170416  91124 0                   0 R %s\n", pid, name.c_str());
    return line;
}

}  // namespace

std::string process_list() {
    std::string out = "USER           PID  PPID     VSZ    RSS WCHAN            ADDR S NAME\n"
                      "root             1     0 10871512  8968 0                   0 S init\n"
                      "root           612     1 10800160  4436 0                   0 S ftcmd\n";
    int pid = 3100;
    if (stress_running(now_ms())) out += row(pid++, kStressProgram);
    for (const auto &name : read_lines(state("processes"))) {
        if (name.empty() || name[0] == '#') continue;
        out += row(pid++, name);
    }
    return out;
}

}  // namespace sim
