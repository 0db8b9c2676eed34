// The two serial command sources: the debug UART and the USB gadget serial port.
#include <errno.h>
#include <fcntl.h>
#include <pthread.h>
#include <poll.h>
#include <termios.h>
#include <unistd.h>

#include <chrono>
#include <cstring>
#include <thread>

#include "core/dispatch.h"
#include "core/line_gather.h"
#include "core/port_state.h"
#include "core/response.h"
#include "core/transports.h"
#include "platform/device.h"
#include "platform/log.h"

namespace {

constexpr const char *kUartPath = "/dev/ttyMSM0";
constexpr const char *kUsbPath = "/dev/ttyGS0";

// A port that reads end of file again right after every reopen (a gadget without a host,
// a broken cable) was reopened as fast as the CPU allowed, each time running the hang-up
// line and growing the command log. Reopens of one port are kept this far apart.
constexpr auto kReopenGap = std::chrono::seconds(1);

using Clock = std::chrono::steady_clock;

void start_thread(void *(*fn)(void *)) {
    pthread_t tid;
    pthread_create(&tid, nullptr, fn, nullptr);
}

bool wait_readable(int fd) {
    struct pollfd pfd = {fd, POLLIN, 0};
    int ret = poll(&pfd, 1, -1);
    if (ret < 0) {
        LOGE("select  Fail ret:%d, errno:%d", ret, errno);
        return false;
    }
    return true;
}

// A bounded write may have the descriptor non-blocking for a moment: a read that finds
// nothing then is not a port error.
bool nothing_to_read(ssize_t n) { return n < 0 && (errno == EAGAIN || errno == EINTR); }

// After a read error or end of file: close, one reopen, and on success the NULL line.
// False when the port cannot be reopened: the transport's thread then ends.
bool reopen(int *slot, const char *path, Clock::time_point *last) {
    LOGE("Error in serail read:%d", errno);
    replace_serial_fd(slot, -1);
    auto now = Clock::now();
    if (now - *last < kReopenGap) std::this_thread::sleep_for(kReopenGap - (now - *last));
    *last = Clock::now();
    replace_serial_fd(slot, open_serial_device(path));
    if (*slot < 0) {
        LOGE("The process is terminated due to fatal error");
        return false;
    }
    LOGI("The FD is reopen successfully");
    run_null_line();
    return true;
}

void *serial_thread(int *slot, const char *path, void (*monitor)()) {
    for (int attempt = 0; attempt < 5; ++attempt) {
        replace_serial_fd(slot, open_serial_device(path));
        if (*slot >= 0) {
            monitor();
            break;
        }
        LOGE("Fail to open %s, errno = %d", path, errno);
        sleep(2);
    }
    pthread_detach(pthread_self());
    return nullptr;
}

}  // namespace

int open_serial_device(const char *path) {
    LOGI("Opened serial port:%s", path);
    int fd;
    do {
        fd = dev::open(path, O_RDWR | O_NOCTTY | O_NONBLOCK);
    } while (fd < 0 && errno == EINTR);
    if (fd < 0) {
        LOGE("Fail to open serial device(%s) with error code:%d", path, errno);
        return -1;
    }
    fcntl(fd, F_SETFL, fcntl(fd, F_GETFL) & ~O_NONBLOCK);

    struct termios tio {};
    tcgetattr(fd, &tio);
    if (is_uart_flag == 1) {
        cfsetispeed(&tio, B115200);
        cfsetospeed(&tio, B115200);
    }
    tio.c_lflag = ICANON;  // one read, one line; no echo, no signals
    tio.c_oflag &= ~(OPOST | OLCUC | OCRNL | ONOCR | ONLRET);
    tcflush(fd, TCIFLUSH);
    tcsetattr(fd, TCSANOW, &tio);
    return fd;
}

void uart_init() { start_thread(uart_thread); }
void vcom_init() { start_thread(vcom_thread); }

void *uart_thread(void *) { return serial_thread(&g_port.uart_fd, kUartPath, uart_monitor); }
void *vcom_thread(void *) { return serial_thread(&g_port.usb_fd, kUsbPath, vcom_monitor); }

void uart_monitor() {
    char *buf = g_port.uart_buf;
    Clock::time_point last_reopen{};
    for (;;) {
        if (!wait_readable(g_port.uart_fd)) continue;
        memset(buf, 0, kLineSize);
        ssize_t n = read(g_port.uart_fd, buf, kLineSize - 1);
        if (nothing_to_read(n)) continue;
        if (n == 1) continue;  // a lone line end
        if (n <= 0) {
            if (!reopen(&g_port.uart_fd, kUartPath, &last_reopen)) return;
            continue;
        }
        dispatch_command(buf, static_cast<int>(n), SRC_UART);
    }
}

Gathered usb_gather(const char *buf, int *offset, ssize_t n, int *total) {
    *total = *offset + static_cast<int>(n);
    if (n >= 1 && buf[*total - 1] != '\r' && buf[*total - 1] != '\n') {
        *offset = *total;
        return Gathered::Partial;
    }
    *offset = 0;
    if (*total == 1) return Gathered::LoneLineEnd;
    if (*total > 1) return Gathered::Line;
    return Gathered::PortDead;
}

// The gadget port may deliver a line in pieces: gather until a line end arrives, and
// never throw gathered input away (a full buffer or a failed read dispatches it).
void vcom_monitor() {
    char *buf = g_port.usb_buf;
    Clock::time_point last_reopen{};
    int offset = 0;
    for (;;) {
        if (!wait_readable(g_port.usb_fd)) continue;
        if (offset == 0) memset(buf, 0, kLineSize);
        ssize_t n = read(g_port.usb_fd, buf + offset, static_cast<size_t>(usb_read_room(offset)));
        if (nothing_to_read(n)) continue;
        int total = 0;
        switch (usb_gather(buf, &offset, n, &total)) {
            case Gathered::Partial:
            case Gathered::LoneLineEnd:
                break;
            case Gathered::Line:
                dispatch_command(buf, total, SRC_USB);
                break;
            case Gathered::PortDead:
                if (!reopen(&g_port.usb_fd, kUsbPath, &last_reopen)) return;
                break;
        }
    }
}
