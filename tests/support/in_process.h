#pragma once
// The command core driven in-process: a sandbox, and a socket pair standing in for the
// station connection of the source under test.
#include <gtest/gtest.h>
#include <sys/socket.h>
#include <unistd.h>

#include <string>

#include "core/dispatch.h"
#include "core/port_state.h"
#include "core/response.h"
#include "core/workers.h"
#include "tests/support/daemon.h"
#include "tests/support/sandbox.h"

class InProcess : public ::testing::Test {
protected:
    Sandbox box;
    int station = -1;  // our end of the pair; the daemon's end sits in PortState

    void SetUp() override {
        box.activate();
        initSerialDevice(&g_port);
        connect_source(SRC_TCP);
    }
    void TearDown() override {
        // Workers the handlers started act on this sandbox: let them finish (a stuck one is given up on).
        if (!wait_workers_done(5000)) fprintf(stderr, "note: a worker is still running after its test\n");
        for (int fd : {g_port.uart_fd, g_port.usb_fd, g_port.tcp_client_fd, g_port.local_client_fd})
            if (fd >= 0) close(fd);
        if (station >= 0) close(station);
        initSerialDevice(&g_port);
    }

    // Routes answers of source type src to a fresh socket pair.
    void connect_source(int src) {
        int sv[2];
        socketpair(AF_UNIX, SOCK_STREAM, 0, sv);
        if (station >= 0) close(station);
        station = sv[0];
        int *slot = src == SRC_UART ? &g_port.uart_fd
                    : src == SRC_USB ? &g_port.usb_fd
                    : src == SRC_LOCAL ? &g_port.local_client_fd
                                       : &g_port.tcp_client_fd;
        *slot = sv[1];
        force_current_source(src);
    }

    // Dispatches a received line as its transport would hand it over.
    std::string serve(std::string line, int src = SRC_TCP, size_t want = 4096) {
        connect_source(src);
        char buf[kLineSize] = {0};
        line.copy(buf, kLineSize - 1);
        int len = static_cast<int>(line.size()) + (src == SRC_TCP ? 1 : 0);
        dispatch_command(buf, len, src);
        return answer(want);
    }

    std::string answer(size_t want = 4096, int timeout_ms = 200) { return read_some(station, want, timeout_ms); }
};
