// The answer frame, output routing by source type, and the rotating command log.
#include "core/response.h"

#include <errno.h>
#include <fcntl.h>
#include <poll.h>
#include <sys/socket.h>
#include <unistd.h>

#include <atomic>
#include <chrono>
#include <cstdio>
#include <cstring>
#include <ctime>
#include <mutex>

#include "core/port_state.h"
#include "platform/device.h"
#include "platform/factory.h"
#include "platform/log.h"

namespace {

constexpr const char *kLog0 = "cache/recovery/last_atcmd0";
constexpr const char *kLog1 = "cache/recovery/last_atcmd1";
constexpr int kLogLimit = 512000;
constexpr int kLogSwitchMargin = 511900;  // in the last 100 bytes the other file is dropped
constexpr int kLogAppend = O_WRONLY | O_CREAT | O_APPEND;  // 1089

// A peer that stops taking output (an XOFF byte on a serial line, a TCP station that
// never reads) would block a plain write while the dispatch mutex is held, and with it
// every station. Output gets this long to leave; the rest is abandoned and logged.
constexpr int kWriteLimitMs = 2000;

// Size check, append and delete of the command log are one step: a worker and a
// transport logging at once could otherwise both see the old sizes, and one of them
// delete the file that the other has just switched to.
std::mutex g_log_lock;

// One writer at a time on each serial port (a worker's frames and the dispatcher's),
// so that toggling a descriptor's blocking mode for a bounded write cannot be undone
// under another writer's feet. The stall mark belongs to the same port.
struct SerialOut {
    std::mutex lock;
    bool stalled = false;  // the last write timed out
};
SerialOut g_serial_out[2];  // UART, USB

using Clock = std::chrono::steady_clock;

// The TCP station that was found not reading, until its reader has let it go.
std::atomic<int> g_dropped_station{-1};

int ms_left(Clock::time_point deadline) {
    auto left = std::chrono::duration_cast<std::chrono::milliseconds>(deadline - Clock::now()).count();
    return left > 0 ? static_cast<int>(left) : 0;
}

void wait_writable(int fd, int timeout_ms) {
    struct pollfd pfd = {fd, POLLOUT, 0};
    poll(&pfd, 1, timeout_ms);
}

// Writes all of data within the limit: the count written, or -1 when nothing was. A port
// whose last write timed out gets no fresh wait until it takes output again, so a stopped
// station costs the others one wait, not one per line.
ssize_t write_serial_bounded(const int *slot, const char *data, size_t len, SerialOut &out) {
    std::lock_guard<std::mutex> hold(out.lock);
    const int fd = *slot;  // read under the lock: a reopen replaces it only under the lock
    bool *stalled = &out.stalled;
    int flags = fcntl(fd, F_GETFL);
    if (flags < 0) return -1;
    fcntl(fd, F_SETFL, flags | O_NONBLOCK);
    auto deadline = Clock::now() + std::chrono::milliseconds(*stalled ? 0 : kWriteLimitMs);
    size_t done = 0;
    int err = 0;
    bool timed_out = false;
    while (done < len) {
        ssize_t n = write(fd, data + done, len - done);
        if (n > 0) {
            if (*stalled) deadline = Clock::now() + std::chrono::milliseconds(kWriteLimitMs);
            *stalled = false;
            done += static_cast<size_t>(n);
            continue;
        }
        if (n < 0 && errno != EAGAIN && errno != EINTR) {
            err = errno;
            break;
        }
        int left = ms_left(deadline);
        if (left == 0) {
            timed_out = true;
            err = EAGAIN;
            break;
        }
        wait_writable(fd, left);
    }
    fcntl(fd, F_SETFL, flags);
    *stalled = timed_out;
    errno = err;
    return done > 0 ? static_cast<ssize_t>(done) : (len == 0 ? 0 : -1);
}

// Sends within limit_ms (0: what fits at once): the count sent, or -1 when nothing was.
ssize_t send_within(int fd, const char *data, size_t len, int limit_ms) {
    auto deadline = Clock::now() + std::chrono::milliseconds(limit_ms);
    size_t done = 0;
    int err = 0;
    while (done < len) {
        ssize_t n = send(fd, data + done, len - done, MSG_NOSIGNAL | MSG_DONTWAIT);
        if (n > 0) {
            done += static_cast<size_t>(n);
            continue;
        }
        err = n < 0 ? errno : EAGAIN;
        if (n < 0 && errno != EAGAIN && errno != EINTR) break;
        int left = ms_left(deadline);
        if (left == 0) break;
        wait_writable(fd, left);
    }
    errno = err;
    return done > 0 || len == 0 ? static_cast<ssize_t>(done) : -1;
}

// One blocking read, also while a bounded write has the descriptor non-blocking.
ssize_t read_blocking(int fd, char *buf, size_t len) {
    for (;;) {
        ssize_t n = read(fd, buf, len);
        if (n >= 0 || errno != EAGAIN) return n;
        struct pollfd pfd = {fd, POLLIN, 0};
        poll(&pfd, 1, -1);
    }
}

// Logs the first len bytes of data (the data need not end in NUL).
void save_command(const char *data, size_t len) {
    if (data == nullptr || len < 2) return;
    char text[61] = {0};
    // Texts under 51 characters are kept whole, longer ones are copied up to 60: so 51
    // to 60 stay whole too, and only what is longer is cut.
    memcpy(text, data, len < 60 ? len : 60);

    time_t now = dev::now();
    struct tm tm {};
    localtime_r(&now, &tm);
    char record[100] = {0};
    snprintf(record, sizeof record, "%d-%02d-%02d %02d:%02d:%02d %s\r\n", tm.tm_year + 1900, tm.tm_mon + 1,
             tm.tm_mday, tm.tm_hour, tm.tm_min, tm.tm_sec, text);

    std::lock_guard<std::mutex> hold(g_log_lock);
    int size0 = kaelatcmd_sizeof_system_file(kLog0);
    int size1 = kaelatcmd_sizeof_system_file(kLog1);
    if (size0 < kLogLimit) {
        kaelatcmd_write_system_file(kLog0, kLogAppend, record);
        if (size0 > kLogSwitchMargin) kaelatcmd_remove_system_file(kLog1);
    } else if (size1 < kLogLimit) {
        kaelatcmd_write_system_file(kLog1, kLogAppend, record);
        if (size1 > kLogSwitchMargin) kaelatcmd_remove_system_file(kLog0);
    } else {
        kaelatcmd_remove_system_file(kLog0);
        kaelatcmd_write_system_file(kLog0, kLogAppend, record);
    }
}

SerialOut &serial_out(const int *slot) { return g_serial_out[slot == &g_port.uart_fd ? 0 : 1]; }

void write_serial(const int *slot, const char *data, int len, const char *what) {
    ssize_t n = write_serial_bounded(slot, data, static_cast<size_t>(len), serial_out(slot));
    if (n < len) LOGW("Couldn't write all data to %s. Wrote only %d error: %d", what, static_cast<int>(n), errno);
}

}  // namespace

const char *trailer_for(int result) {
    switch (result) {
        case 0: return "OK\r\n";
        case 4: return "ERROR\r\n";
        case 5: return nullptr;
        case 6: return "\r\n";
        case 7: return "ATOK\r\n";
        case 8: return "ATNG\r\n";
        case 9: return "ATERROR\r\n";
        case 101: return "Not Implement\r\n";
        default: return "UNKNOWN\r\n";
    }
}

void writeDataToserialByResponseType(const char *echo, const char *body, int result) {
    const char *word = trailer_for(result);
    if (word == nullptr) {
        LOGI("AT_NO_NEED_RETURN");
        return;
    }
    char trailer[kTrailerSize] = {0};
    snprintf(trailer, sizeof trailer, "%s", word);
    char frame[kLineSize] = {0};
    snprintf(frame, kLineSize - 1, "%s\r\n%s\r\n%s", echo, body, trailer);
    writeDataToSerial(frame, static_cast<int>(strlen(frame)));
}

void writeDataToSerial(const char *data, int len) {
    if (data == nullptr || len < 0) return;
    size_t text_len = strnlen(data, static_cast<size_t>(len));
    int src = current_source();
    switch (src) {
        case SRC_UART:
            write_serial(&g_port.uart_fd, data, len, "UART");
            break;
        case SRC_USB:
            write_serial(&g_port.usb_fd, data, len, "USB");
            break;
        case SRC_TCP:
            writeDataToSocket(data, len);
            break;
        case SRC_LOCAL: {
            int fd = take_local_client();  // ours now: nobody else closes it
            if (fd < 0) {
                LOGE("socket is closed!");
                return;
            }
            // A frame always fits the socket's buffer; never wait for a client that
            // does not read.
            ssize_t n = send(fd, data, static_cast<size_t>(len), MSG_NOSIGNAL | MSG_DONTWAIT);
            LOGI("local socket sent %d bytes", static_cast<int>(n));
            close(fd);
            return;  // one answer per connection, and no command-log record
        }
        default:
            LOGE("No idea which device from!%d", src);
            break;
    }
    save_command(data, text_len);
}

void replace_serial_fd(int *slot, int fd) {
    std::lock_guard<std::mutex> hold(serial_out(slot).lock);
    if (*slot >= 0) close(*slot);
    *slot = fd;
}

void writeDataToSocket(const char *data, int len) {
    int fd = g_port.tcp_client_fd;
    ssize_t sent = send_within(fd, data, static_cast<size_t>(len), kWriteLimitMs);
    if (sent == len) return;
    LOGW("Couldn't write all data to socket. Wrote only %d bytes with %d", static_cast<int>(sent), errno);
    int remaining = len;
    int offset = 0;
    for (int attempt = 0; attempt < 10; ++attempt) {
        int done = sent < 0 ? 0 : static_cast<int>(sent);
        remaining -= done;
        offset += done;
        usleep(100 * 1000);
        sent = send_within(fd, data + offset, static_cast<size_t>(remaining), 0);
        LOGW("try again. Wrote %d bytes with %d, error:%d", static_cast<int>(sent), remaining, errno);
        if (sent == remaining) return;
    }
    // A station that has taken no answer for seconds is not reading: let its reader see
    // the connection end (the reader owns the descriptor and closes it), so that it
    // cannot hold the dispatch mutex line after line.
    if (fd >= 0) {
        LOGE("station %d takes no answers, disconnecting it", fd);
        g_dropped_station = fd;
        shutdown(fd, SHUT_RDWR);
    }
}

bool tcp_station_dropped(int fd) {
    int dropped = fd;
    return fd >= 0 && g_dropped_station.compare_exchange_strong(dropped, -1);
}

void saveCommand2File(const char *text) {
    if (text != nullptr) save_command(text, strlen(text));
}

int readDataFromSerial(char *buf, int len) {
    ssize_t n;
    int src = current_source();
    switch (src) {
        case SRC_UART: n = read_blocking(g_port.uart_fd, buf, static_cast<size_t>(len)); break;
        case SRC_USB: n = read_blocking(g_port.usb_fd, buf, static_cast<size_t>(len)); break;
        case SRC_TCP: n = recv(g_port.tcp_client_fd, buf, static_cast<size_t>(len), 0); break;
        default:
            LOGE("ERROR device type:%d", src);
            return 0;
    }
    LOGD("readCount :%d", static_cast<int>(n));
    return static_cast<int>(n);
}
