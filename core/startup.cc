// Start-up: boot mode from the kernel command line, factory flags from the NV record,
// the transports, and the fatal-signal handler.
#include "core/startup.h"

#include <fcntl.h>
#include <signal.h>
#include <strings.h>
#include <unistd.h>

#include <cstring>

#include "core/dispatch.h"
#include "core/nv.h"
#include "core/port_state.h"
#include "core/transports.h"
#include "platform/android.h"
#include "platform/device.h"
#include "platform/factory.h"
#include "platform/log.h"

namespace {
constexpr const char *kAssemblyProp = "sys.factory.assembly_at_mode";
}

void parse_command() {
    int fd = dev::open("/proc/cmdline", O_RDONLY);
    if (fd < 0) {
        LOGE("open cmdline error:%s", strerror(errno));
        return;
    }
    char text[4097] = {0};
    ssize_t n = read(fd, text, 4096);
    close(fd);
    if (n <= 0) return;
    text[n] = '\0';
    // A plain substring test: it fires for "console-at=sendAT_assembly" as well.
    if (strstr(text, "console-at=sendAT")) {
        is_sp = 1;
        is_uart_flag = 1;
    }
    if (strstr(text, "console-at=sendNormal")) {
        is_uart_flag = 1;
    } else if (strstr(text, "console-at=sendAT_assembly")) {
        is_uart_flag = 0;
        init_assembly_at_mode();
    }
    LOGI("is_uart_flag=%d, is_sp=%d", is_uart_flag, is_sp);
}

void init_sepolicy() {
    nv::Record rec;
    if (!nv::read(rec)) {
        LOGE("get_PYXA_NV_item error!!!");
        return;
    }
    int32_t flag = rec.i32(nv::kUpdateFlag);
    LOGI("pyxa_nvram.update_flag: %d", flag);
    if (flag & 32) kaelatcmd_set_system_property("sys.factory.log", "1");
}

void init_assembly_at_mode() {
    LOGI("entry init_assembly_at_mode");
    char mode[PROPERTY_VALUE_MAX] = {0};
    kaelatcmd_get_system_property(kAssemblyProp, mode, "0");
    if (strcasecmp(mode, "0") != 0) return;  // entered earlier in this boot
    kaelatcmd_set_system_property("sys.factory.log", "1");
    kaelatcmd_set_system_property(kAssemblyProp, "1");
    nv::Record rec;
    if (nv::read(rec)) {
        rec.set_i32(nv::kAssemblyAtMode, 0);
        if (!nv::write(rec)) {
            LOGE("put_PYXA_NV_item failed");
            return;
        }
        LOGI("pyxa_nvram.assembly_at_mode=%d", rec.i32(nv::kAssemblyAtMode));
    }
    dev::sync();
}

int assembly_at_mode_test() {
    char mode[PROPERTY_VALUE_MAX] = {0};
    kaelatcmd_get_system_property(kAssemblyProp, mode, "0");
    LOGI("sys.factory.assembly_at_mode :%s", mode);
    if (strcasecmp(mode, "1") != 0) return 0;
    const char *current = get_property_file_item_value("/cache/recovery/last_ftcmd_sys_adc_test", "current_test");
    if (current != nullptr && strncmp(current, "lcm_back", 8) == 0) {
        LOGI("lcm_back current test autostart!!!");
        char line[kLineSize] = "AT+EDFT_BACK=0,5";
        process_cmd_line(line);
    }
    return 1;
}

namespace {

// Appends the decimal digits of v; async-signal-safe (no stdio, no locale).
char *put_int(char *at, int v) {
    char digits[12];
    int n = 0;
    unsigned u = v < 0 ? 0u - static_cast<unsigned>(v) : static_cast<unsigned>(v);
    do {
        digits[n++] = static_cast<char>('0' + u % 10);
        u /= 10;
    } while (u != 0);
    if (v < 0) *at++ = '-';
    while (n > 0) *at++ = digits[--n];
    return at;
}

char *put_text(char *at, const char *text) {
    while (*text != '\0') *at++ = *text++;
    return at;
}

// Closes a descriptor slot once: whoever empties the slot closes what was in it.
void close_slot(int *slot, bool only_if_open) {
    int fd = __atomic_exchange_n(slot, -1, __ATOMIC_ACQ_REL);
    if (fd >= 0 || !only_if_open) close(fd);
}

}  // namespace

// Runs on whichever thread got the signal, possibly in the middle of the Android log,
// stdio or malloc holding a lock: so only async-signal-safe calls here. The "signal:%d"
// line is formatted by hand and written straight to stderr, where the daemon's log goes
// on the simulated phone and where init's service logging picks it up on a phone.
void ftcmd_signal_handler(int sig) {
    char line[128];
    char *at = put_text(line, FTCMD_LOG_TAG ": ");
    at = put_int(at, __LINE__);
    at = put_text(at, ":ftcmd_signal_handler(): signal:");
    at = put_int(at, sig);
    *at++ = '\n';
    ssize_t ignored = write(STDERR_FILENO, line, static_cast<size_t>(at - line));
    (void)ignored;
    close_slot(&g_port.local_client_fd, true);
    close_slot(&g_port.local_listen_fd, true);
    close_slot(&g_port.uart_fd, true);
    close_slot(&g_port.usb_fd, true);
    close_slot(&g_port.tcp_listen_fd, false);
    close_slot(&g_port.tcp_client_fd, false);
    _exit(sig);
}

int ftcmd_main() {
    LOGI("ftcmd-daemon start!!!");
    signal(SIGPIPE, SIG_IGN);  // a vanished peer must never end the daemon
    parse_command();
    init_sepolicy();
    initSerialDevice(&g_port);

    struct sigaction sa {};
    sa.sa_handler = ftcmd_signal_handler;
    sigemptyset(&sa.sa_mask);
    sa.sa_flags = SA_RESTART;
    for (int sig : {SIGTERM, SIGHUP, SIGINT, SIGABRT, SIGBUS, SIGILL, SIGSEGV}) sigaction(sig, &sa, nullptr);

    if (is_uart_flag) uart_init();
    vcom_init();
    socket_init();
    socket_local_init();
    if (is_sp == 0) {
        at_set_audio_init_ftm();
        LOGI("at_set_audio_init_ftm");
    }
    if (is_uart_flag == 1) {
        kaelatcmd_set_system_property("sys.factory.log", "1");
    } else if (assembly_at_mode_test()) {
        kaelatcmd_set_system_property(kAssemblyProp, "2");
    }
    for (;;) sleep(30);
}
