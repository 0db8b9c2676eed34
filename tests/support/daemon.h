#pragma once
// Runs the real daemon binary on a sandbox and talks to it over its transports.
#include <sys/types.h>

#include <termios.h>

#include <string>

#include "tests/support/sandbox.h"

// Reads from fd until want bytes arrived or timeout_ms passed with nothing new.
std::string read_some(int fd, size_t want, int timeout_ms = 3000);
int free_tcp_port();

struct Daemon {
    const Sandbox &box;
    pid_t pid = -1;
    int port = 0;
    std::string local_name;
    std::string log_path;  // the daemon's stderr: its Android log

    // Starts the daemon with this kernel command line; waits until TCP awaits a station (if wait_ready).
    Daemon(const Sandbox &box, const std::string &cmdline = "", bool wait_ready = true);
    ~Daemon();

    bool wait_prop(const std::string &name, const std::string &value, int timeout_ms = 5000) const;
    bool wait_log(const std::string &text, int timeout_ms = 5000) const;
    std::string log() const;
    int connect_tcp() const;
    int connect_local() const;
    // A local client's line and the daemon's answer (it closes after one).
    std::string ask_local(const std::string &line) const;
    // Sends a signal and returns the exit status (or 128+signal when killed by it).
    int stop(int sig);
};

// A pseudo-terminal whose slave the daemon opens as a serial port; the test is the station on the master.
struct Pty {
    int master = -1;
    int keep = -1;  // the slave held open, so that the master sees no hang-up on reopens
    std::string slave;

    Pty(const Sandbox &box, const char *device);
    ~Pty();
    Pty(const Pty &) = delete;
    Pty &operator=(const Pty &) = delete;

    bool send(const std::string &s) const;
    // Waits until the daemon serves the port (a probe line is answered), then drains.
    bool ready() const;
    speed_t speed() const;
};
