#include "tests/support/sandbox.h"

#include <unistd.h>

#include <chrono>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <sstream>
#include <stdexcept>
#include <thread>

#include "platform/sim/chardev.h"
#include "platform/sim/sequence.h"
#include "platform/sim/sim.h"

namespace fs = std::filesystem;

namespace {

std::string temp_base() {
    for (const char *var : {"FTCMD_TEST_TMP", "TMPDIR"}) {
        const char *v = getenv(var);
        if (v && *v) return v;
    }
    return "/tmp";
}

// A daemon still winding down may create a file while we remove the tree: a few rounds.
void remove_tree(const std::string &dir) {
    for (int round = 0; round < 20; ++round) {
        std::error_code ec;
        fs::remove_all(dir, ec);
        if (!fs::exists(fs::symlink_status(dir, ec))) return;
        std::this_thread::sleep_for(std::chrono::milliseconds(10));
    }
}

}  // namespace

Sandbox::Sandbox() {
    std::string tmpl = temp_base() + "/ftcmd-test.XXXXXX";
    if (mkdtemp(tmpl.data()) == nullptr) throw std::runtime_error("mkdtemp failed in " + temp_base());
    dir = tmpl;
    root = dir + "/root";
    try {
        fs::copy(FTCMD_DEVICE_TREE, root, fs::copy_options::recursive | fs::copy_options::copy_symlinks);
    } catch (...) {
        remove_tree(dir);
        throw;
    }
}

Sandbox::~Sandbox() { remove_tree(dir); }

void Sandbox::activate() const { sim::set_root(root); }

std::string Sandbox::path(const std::string &device_path) const {
    return root + (device_path.empty() || device_path[0] != '/' ? "/" : "") + device_path;
}

std::string Sandbox::read(const std::string &device_path) const {
    sim::settle();  // writes of this process to a node that a device model owns have landed
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

std::vector<Event> Sandbox::event_list() const {
    std::vector<Event> out;
    std::istringstream in(read("/.sim/events.log"));
    for (std::string l; std::getline(in, l);) {
        size_t a = l.find(' ');
        if (a == std::string::npos) continue;
        size_t b = l.find(' ', a + 1);  // npos: a kind without detail
        out.push_back({strtoll(l.c_str(), nullptr, 10), l.substr(a + 1, b - a - 1),
                       b == std::string::npos ? "" : l.substr(b + 1)});
    }
    return out;
}

std::string Sandbox::events() const {
    std::string out;
    for (const auto &e : event_list()) out += e.kind + " " + e.detail + "\n";
    return out;
}

void Sandbox::fault(const std::string &name) const {
    std::ofstream(root + "/.sim/faults", std::ios::app) << name << "\n";
}

void Sandbox::reply(const std::string &message, const std::string &reply) const {
    std::string script = read("/.sim/testapp.replies");
    write("/.sim/testapp.replies", message + " => " + reply + "\n" + script);
}

void Sandbox::sequence(const std::string &what, const std::vector<std::string> &values) const {
    if (!sim::sequence_set(root, what, values)) throw std::runtime_error("cannot set the sequence " + what);
}
