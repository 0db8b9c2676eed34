#include "handlers/common.h"

#include <fcntl.h>
#include <strings.h>
#include <unistd.h>

#include <cstdarg>
#include <cstdio>
#include <cstring>

#include "core/nv.h"
#include "platform/device.h"
#include "platform/factory.h"
#include "platform/log.h"

bool line_is(const char *cmd, const char *form) { return strcasecmp(cmd, form) == 0; }

bool line_starts(const char *cmd, const char *form, size_t n) { return strncasecmp(cmd, form, n) == 0; }

int body_printf(char *resp, const char *fmt, ...) {
    va_list ap;
    va_start(ap, fmt);
    int n = vsnprintf(resp, kRespSize, fmt, ap);
    va_end(ap);
    return n;
}

int quote_body(char *resp, const char *value) { return body_printf(resp, "\r\n\"%s\"\r\n", value ? value : ""); }

int quote_reason(char *resp, const char *reason) { return body_printf(resp, "\"%s\"", reason ? reason : ""); }

bool quote_nv_field(char *resp, size_t offset) {
    nv::Record rec;
    if (!nv::read(rec)) return false;
    body_printf(resp, "\r\n\"%d\"\r\n", rec.i32(offset));
    return true;
}

int invalid_command(const char *cmd) {
    LOGE("invalid command: %s", cmd);
    return RC_ERROR;
}

const char *ask_test_app(const char *message) {
    const char *reply = sendMessage(message);
    LOGI("sendMessage(%s) reply:%s", message, reply ? reply : "(null)");
    return reply;
}

bool test_app_ok(const char *message) {
    const char *reply = ask_test_app(message);
    return reply != nullptr && strcmp(reply, "ok") == 0;
}

bool read_node(const char *path, char *buf, size_t size) {
    if (size == 0) return false;
    int fd = dev::open(path, O_RDONLY);
    if (fd < 0) return false;
    ssize_t n = ::read(fd, buf, size - 1);
    ::close(fd);
    if (n < 0) return false;
    buf[n] = '\0';
    return true;
}

std::vector<std::string_view> comma_fields(std::string_view line) {
    std::vector<std::string_view> fields;
    for (size_t i = 0; i <= line.size();) {
        size_t comma = line.find(',', i);
        if (comma == std::string_view::npos) comma = line.size();
        if (comma > i) fields.push_back(line.substr(i, comma - i));
        i = comma + 1;
    }
    return fields;
}
