#pragma once
// A throw-away simulated phone for one test: a temp directory holding a copy of the
// default device tree. Only this directory is ever removed.
#include <string>

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
    std::string events() const;  // the record of device effects
    void fault(const std::string &name) const;
    void reply(const std::string &message, const std::string &reply) const;  // test-app script
};
