// Fuzz target: one station line, as the TCP reader hands it to the dispatcher, served on
// a simulated phone. Every handler a line can reach runs against the sandbox.
#include <fcntl.h>
#include <sys/socket.h>
#include <unistd.h>

#include <cstdint>
#include <cstring>
#include <memory>

#include "core/dispatch.h"
#include "core/port_state.h"
#include "core/workers.h"
#include "tests/support/sandbox.h"

namespace {

struct Phone {
    Sandbox box;
    int station = -1;
    Phone() {
        box.activate();
        initSerialDevice(&g_port);
        int sv[2];
        socketpair(AF_UNIX, SOCK_STREAM, 0, sv);
        station = sv[0];
        fcntl(station, F_SETFL, O_NONBLOCK);
        // Every source answers on the one connection, so all four routes are exercised.
        g_port.uart_fd = g_port.usb_fd = g_port.tcp_client_fd = sv[1];
    }
    ~Phone() {
        // Workers the handlers started act on the sandbox: they finish before it goes.
        wait_workers_done(15000);
        close(station);
        close(g_port.tcp_client_fd);
    }
    void drain() const {
        char buf[4096];
        while (read(station, buf, sizeof buf) > 0) {
        }
    }
};

// The emergency-call frame has no room for a long line, and overrunning it ends the
// daemon on purpose: such lines are not what this target looks for.
bool ends_the_daemon_on_purpose(const char *buf, int len) {
    char copy[kLineSize] = {0};
    memcpy(copy, buf, static_cast<size_t>(len));
    const char *line = trim_string(copy, len);
    return strncmp(line, "ATD112;", 7) == 0 && strlen(line) > 120;
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t *data, size_t size) {
    static std::unique_ptr<Phone> phone = std::make_unique<Phone>();
    if (size < 1) return 0;
    // The first byte picks the source (so that the echo rules of each are met), the rest
    // is the received data.
    int source = SRC_UART + data[0] % 4;
    size_t n = size - 1 < kLineSize - 1 ? size - 1 : kLineSize - 1;
    char buf[kLineSize] = {0};
    memcpy(buf, data + 1, n);
    int len = static_cast<int>(n);
    if (source == SRC_TCP) {
        cut_mutil_command(buf);
        len = static_cast<int>(n) + 1;  // as the socket reader passes it on
    }
    if (ends_the_daemon_on_purpose(buf, len)) return 0;
    if (source == SRC_LOCAL) {
        int sv[2];
        socketpair(AF_UNIX, SOCK_STREAM, 0, sv);
        int old = swap_local_client(sv[1]);
        if (old >= 0) close(old);
        buf[127] = '\0';
        dispatch_command(buf, static_cast<int>(strlen(buf)), SRC_LOCAL);
        close(sv[0]);
    } else {
        dispatch_command(buf, len, source);
    }
    phone->drain();
    return 0;
}
