// The answer frame, output routing by source type, and the rotating command log.
#include "core/response.h"

#include <errno.h>
#include <fcntl.h>
#include <sys/socket.h>
#include <unistd.h>

#include <cstdio>
#include <cstring>
#include <ctime>

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

void write_serial(int fd, const char *data, int len, const char *what) {
    ssize_t n = write(fd, data, static_cast<size_t>(len));
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
    switch (g_port.source_type) {
        case SRC_UART:
            write_serial(g_port.uart_fd, data, len, "UART");
            break;
        case SRC_USB:
            write_serial(g_port.usb_fd, data, len, "USB");
            break;
        case SRC_TCP:
            writeDataToSocket(data, len);
            break;
        case SRC_LOCAL: {
            if (g_port.local_client_fd < 0) {
                LOGE("socket is closed!");
                return;
            }
            ssize_t n = send(g_port.local_client_fd, data, static_cast<size_t>(len), MSG_NOSIGNAL);
            LOGI("local socket sent %d bytes", static_cast<int>(n));
            close(g_port.local_client_fd);
            g_port.local_client_fd = -1;
            return;  // one answer per connection, and no command-log record
        }
        default:
            LOGE("No idea which device from!%d", g_port.source_type);
            break;
    }
    save_command(data, text_len);
}

void writeDataToSocket(const char *data, int len) {
    int fd = g_port.tcp_client_fd;
    ssize_t sent = send(fd, data, static_cast<size_t>(len), MSG_NOSIGNAL);
    if (sent == len) return;
    LOGW("Couldn't write all data to socket. Wrote only %d bytes with %d", static_cast<int>(sent), errno);
    int remaining = len;
    int offset = 0;
    for (int attempt = 0; attempt < 10; ++attempt) {
        int done = sent < 0 ? 0 : static_cast<int>(sent);
        remaining -= done;
        offset += done;
        usleep(100 * 1000);
        sent = send(fd, data + offset, static_cast<size_t>(remaining), MSG_NOSIGNAL);
        LOGW("try again. Wrote %d bytes with %d, error:%d", static_cast<int>(sent), remaining, errno);
        if (sent == remaining) return;
    }
}

void saveCommand2File(const char *text) {
    if (text != nullptr) save_command(text, strlen(text));
}

int readDataFromSerial(char *buf, int len) {
    ssize_t n;
    switch (g_port.source_type) {
        case SRC_UART: n = read(g_port.uart_fd, buf, static_cast<size_t>(len)); break;
        case SRC_USB: n = read(g_port.usb_fd, buf, static_cast<size_t>(len)); break;
        case SRC_TCP: n = recv(g_port.tcp_client_fd, buf, static_cast<size_t>(len), 0); break;
        default:
            LOGE("ERROR device type:%d", g_port.source_type);
            return 0;
    }
    LOGD("readCount :%d", static_cast<int>(n));
    return static_cast<int>(n);
}
