#pragma once
// The simulated phone: a sandbox directory that holds the phone's files, plus the
// simulator's own state under <root>/.sim (properties, NV record, test-app script,
// faults, the record of device effects). Nothing here touches the host outside the root.
#include <string>
#include <vector>

namespace sim {

// The sandbox root, from FTCMD_SIM_ROOT. A process that has none refuses to run.
const std::string &root();
// Overrides the root (tests); the next calls use it.
void set_root(const std::string &root);

// A device path (absolute, or relative to "/") to the host path inside the sandbox.
// ".." never climbs above the root.
std::string map(const char *device_path);
// The device path in its plain form: no leading "/", no "." or "..", single slashes.
std::string normal_path(const char *device_path);
// The same with one leading "/": the key under which models and sequences know a path.
std::string rooted_path(const char *device_path);
// Attribute nodes (sysfs, procfs, the regmap and other debugfs nodes: everything under
// sys/, proc/ and d/) hold one value that every write replaces, whatever the open flags;
// every other file behaves as a real file.
bool attribute_node(const char *device_path);
// A file of the simulator's own state: <root>/.sim/<name>.
std::string state(const char *name);

// Appends "<ms> <kind> <detail>" to <root>/.sim/events.log: every device effect that the
// simulated phone does not really perform (reboot, clock, format, shell, messages...).
// <ms> is now_ms(). errno is left as the caller had it.
void record(const char *kind, const std::string &detail);
// Milliseconds since the simulated phone started, on the host's monotonic clock. The start
// is kept in <root>/.sim/started, so the daemon, its restarts and the station tools of one
// sandbox share one time base; the launcher sets it afresh at each boot.
long long now_ms();
// Makes "now" the start of the simulated phone in the sandbox root given.
bool restart_clock(const std::string &root);
// True when <root>/.sim/faults holds a line equal to name (read on every call, so a
// running simulator can be given faults by editing the file).
bool fault(const char *name);
// A setting of the simulated hardware from <root>/.sim/config (key=value lines).
std::string config(const char *key, const char *def = "");

// key=value files, shared by the property store, config and the item files.
bool read_kv(const std::string &file, const std::string &key, std::string &value);
bool write_kv(const std::string &file, const std::string &key, const std::string *value);

bool read_file(const std::string &host_path, std::string &out);
bool write_file_atomic(const std::string &host_path, const std::string &data);
std::vector<std::string> read_lines(const std::string &host_path);

// The command inside "/system/bin/sh -c \"...\"" (or the command itself), and its words
// with quotes removed: how the simulated shell reads a command line.
std::string shell_unwrap(std::string command);
std::vector<std::string> shell_words(const std::string &s);

}  // namespace sim
