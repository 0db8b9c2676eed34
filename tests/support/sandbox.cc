#include "tests/support/sandbox.h"

#include <unistd.h>

#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <sstream>
#include <stdexcept>

#include "platform/sim/sim.h"

namespace fs = std::filesystem;

Sandbox::Sandbox() {
    char tmpl[] = "/tmp/ftcmd-test.XXXXXX";
    if (mkdtemp(tmpl) == nullptr) throw std::runtime_error("mkdtemp failed");
    dir = tmpl;
    root = dir + "/root";
    fs::copy(FTCMD_DEVICE_TREE, root, fs::copy_options::recursive | fs::copy_options::copy_symlinks);
}

Sandbox::~Sandbox() {
    std::error_code ec;
    fs::remove_all(dir, ec);
}

void Sandbox::activate() const { sim::set_root(root); }

std::string Sandbox::path(const std::string &device_path) const {
    return root + (device_path.empty() || device_path[0] != '/' ? "/" : "") + device_path;
}

std::string Sandbox::read(const std::string &device_path) const {
    std::ifstream in(path(device_path), std::ios::binary);
    std::ostringstream ss;
    ss << in.rdbuf();
    return ss.str();
}

void Sandbox::write(const std::string &device_path, const std::string &data) const {
    fs::create_directories(fs::path(path(device_path)).parent_path());
    std::ofstream(path(device_path), std::ios::binary | std::ios::trunc) << data;
}

bool Sandbox::exists(const std::string &device_path) const { return fs::exists(path(device_path)); }

std::string Sandbox::prop(const std::string &name) const {
    std::string v;
    return sim::read_kv(root + "/.sim/properties", name, v) ? v : "";
}

void Sandbox::set_prop(const std::string &name, const std::string &value) const {
    sim::write_kv(root + "/.sim/properties", name, &value);
}

std::string Sandbox::events() const { return read("/.sim/events.log"); }

void Sandbox::fault(const std::string &name) const {
    std::ofstream(root + "/.sim/faults", std::ios::app) << name << "\n";
}

void Sandbox::reply(const std::string &message, const std::string &reply) const {
    std::string script = read("/.sim/testapp.replies");
    write("/.sim/testapp.replies", message + " => " + reply + "\n" + script);
}
