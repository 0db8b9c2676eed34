// Dispatch: every received line is cleaned, then offered to the modem, sensor and
// general tables and last to the emergency-call command, one line at a time.
#include "core/dispatch.h"

#include <cstdio>
#include <cstdlib>
#include <cstring>

#include "core/port_state.h"
#include "core/response.h"
#include "platform/factory.h"
#include "platform/log.h"

char *trim_string(char *buf, int len) {
    if (buf == nullptr || len < 1) return buf;
    while (len > 0 && (buf[len - 1] == '\n' || buf[len - 1] == '\r' || buf[len - 1] == ' ')) {
        buf[len - 1] = '\0';
        --len;
    }
    if (len == 0) return buf;
    // Noise before the command (a stray prompt, a byte-order mark) is skipped up to the
    // first "a" or "A"; a line without one is served as the empty string at its end.
    for (int i = 0; i < len; ++i)
        if (buf[i] == 'a' || buf[i] == 'A') return buf + i;
    return buf + strnlen(buf, static_cast<size_t>(len));
}

void run_null_line() {
    char line[kLineSize] = "AT+QXMT=1,0";
    kaelatcmd_set_system_property("sys.qrcode.view", "1");
    process_cmd_line(line);
}

void dispatch_command(char *buf, int len, int source_type) {
    if (buf == nullptr || len < 1) {
        LOGD("readline: NULL");
        run_null_line();  // deliberately without the mutex and the source type
        return;
    }
    char *line = trim_string(buf, len);
    if (line[0] == '\0') {
        LOGE("error readline");
        return;
    }
    g_port.mutex.lock();
    set_current_source(source_type);
    LOGI("recv line:%s, type:%d", line, source_type);
    if (process_cmd_line(line) == 0) {
        char frame[158] = {0};
        snprintf(frame, 157, "%s\r\n\"AT not support\"\r\nERROR\r\n", line);
        writeDataToSerial(frame, static_cast<int>(strlen(frame)));
    }
    g_port.mutex.unlock();
}

int search_command_table(const CommandEntry *table, std::size_t rows, char *line) {
    if (line == nullptr || line[0] == '\0') return 0;
    const char *sep = strpbrk(line, "=?");
    if (sep == nullptr) return 0;
    char name[33] = {0};
    size_t n = static_cast<size_t>(sep - line);
    memcpy(name, line, n < 32 ? n : 32);
    if (name[0] == '\0') return 0;
    for (std::size_t i = 0; i < rows; ++i) {
        const CommandEntry &row = table[i];
        if (strncmp(name, row.name, sizeof row.name) != 0) continue;
        char resp[kRespSize] = {0};
        char copy[kLineSize] = {0};
        memcpy(copy, line, strnlen(line, kLineSize - 1));  // at most 2048 characters
        int rc = row.handler(copy, static_cast<int>(row.arg), resp);
        if (rc == RC_DECLINE) return 0;
        writeDataToserialByResponseType(line, resp, rc);
        if (rc == RC_OK && row.after_response != nullptr) row.after_response(copy);
        return 1;
    }
    return 0;
}

int qcom_command_hdlr(char *line) { return search_command_table(modem_table, modem_table_rows, line); }
int qcom_samsung_command_hdlr(char *line) { return search_command_table(sensor_table, sensor_table_rows, line); }
int kael_command_hdlr(char *line) { return search_command_table(general_table, general_table_rows, line); }

int special_command(char *line) {
    if (strncmp(line, "ATD112;", 7) != 0) return 0;
    const char *reply = sendMessage("emerg_call");
    bool ok = reply != nullptr && strcmp(reply, "ok") == 0;
    char frame[128];
    int n = snprintf(frame, sizeof frame, ok ? "%s\r\nOK\r\n" : "%s\r\nERROR\r\n", line);
    if (n < 0 || n >= static_cast<int>(sizeof frame)) {
        // The emergency-call frame has never had room for a longer line; overrunning it
        // has always ended the process, and the signal handler closes the ports first.
        LOGE("emergency call line too long for its frame (%d bytes)", n);
        abort();
    }
    writeDataToSerial(frame, n);
    return 1;
}

int process_cmd_line(char *line) {
    if (qcom_command_hdlr(line)) return 4;
    if (qcom_samsung_command_hdlr(line)) return 4;
    if (kael_command_hdlr(line)) return 4;
    if (special_command(line)) return 4;
    return 0;
}

void cut_mutil_command(char *buf) {
    size_t len = strlen(buf);
    if (len < 4) return;
    char *again = strstr(buf + 3, "AT+");
    if (again == nullptr) return;
    size_t n = static_cast<size_t>(again - buf);
    if (strncmp(buf, again, n) == 0) {
        LOGI("mutil command cut off:%s", buf);
        buf[n] = '\0';
        buf[n + 1] = '\0';
    }
}
