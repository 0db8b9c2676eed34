#pragma once
// A throw-away simulated phone for one test: a temp directory holding a copy of the
// default device tree. Only this directory is ever removed. It is made under
// $FTCMD_TEST_TMP when that is set (a test run's own directory), else $TMPDIR, else /tmp.
#include <string>
#include <vector>

// One line of the record of device effects: when (ms since the phone started), what, detail.
struct Event {
    long long ms;
    std::string kind;
    std::string detail;
};

struct Sandbox {
    std::string dir;   // the temp directory
    std::string root;  // dir/root: the phone's file system

    Sandbox();
    ~Sandbox();
    Sandbox(const Sandbox &) = delete;
    Sandbox &operator=(const Sandbox &) = delete;

    // Makes this sandbox the one the in-process platform layer works on.
    void activate() const;
    std::string path(const std::string &device_path) const;
    std::string read(const std::string &device_path) const;  // "" when missing
    void write(const std::string &device_path, const std::string &data) const;
    bool exists(const std::string &device_path) const;
    std::string prop(const std::string &name) const;  // "" when unset
    void set_prop(const std::string &name, const std::string &value) const;
    std::string events() const;  // the record of device effects: "kind detail" lines, without times
    std::vector<Event> event_list() const;  // the same, parsed, with their times
    void fault(const std::string &name) const;
    void reply(const std::string &message, const std::string &reply) const;  // test-app script
    // Gives what a sequence of values, one per read or call, the last one repeating, and
    // starts it from the first. what: a device path ("/sys/class/power_supply/usb/online"),
    // or "testapp:<message>", "camera:<message>", "shell:<command>", "sensor:<key>",
    // "audio:<key>", "modem:<key>", "config:<key>". No values removes the sequence.
    void sequence(const std::string &what, const std::vector<std::string> &values) const;
};
