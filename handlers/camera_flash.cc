// Flash LED tests of the camera family: the rear, second rear and front flash LEDs (the
// front one is also the infrared fill light), switched by writing a level to their
// nodes. A pulse switches itself off: a detached timer writes 0 after its delay, and
// nothing cancels it, so a flash the station forgets never stays on at full current.
#include <pthread.h>

#include <array>
#include <chrono>
#include <cstdlib>
#include <cstring>
#include <optional>
#include <string>
#include <string_view>
#include <thread>

#include "core/command_tables/handlers.h"
#include "core/port_state.h"
#include "core/workers.h"
#include "handlers/camera.h"
#include "handlers/common.h"
#include "platform/device.h"
#include "platform/factory.h"
#include "platform/log.h"

namespace {

constexpr char kRearFlash1[] = "/sys/ext_led/EXT_REAR_FLASH_LED1";  // preferred rear main flash
constexpr char kRearFlash[] = "/sys/ext_led/EXT_REAR_FLASH_LED";    // rear main flash of older boards
constexpr char kRearFlash2[] = "/sys/ext_led/EXT_REAR_FLASH_LED2";
constexpr char kFrontFlash[] = "/sys/ext_led/EXT_FRONT_FLASH_LED";  // also the infrared fill light

constexpr int kTorchLevel = 75;
constexpr int kPulseLevel = 900;

// Delays of the self-closing timers: a default when the line gives none, and a cap (an
// upper bound only) that keeps the LED from overheating.
struct TimerLimits {
    int default_ms;
    int max_ms;
};
constexpr TimerLimits kFrontTorchTimer{200, 10000};
constexpr TimerLimits kRearPulseTimer{500, 500};
constexpr TimerLimits kSecondPulseTimer{500, 500};
constexpr int kInfraredSeconds = 3;

constexpr char kInfraredMessageFile[] = "/data/engineermode/infrared_fill_light_msg";
constexpr int kInfraredMessageMax = 80;

const char *rear_main_flash() { return dev::exists(kRearFlash1) ? kRearFlash1 : kRearFlash; }

int set_led(const char *node, int level) {
    int rc = write_int(node, level);
    if (rc != 0) LOGE("write %d to %s failed: %d", level, node, rc);
    return rc;
}

int take_cell(void *cell) {
    int value = *static_cast<int *>(cell);
    free(cell);
    return value;
}

void close_rear() {
    set_led(kRearFlash1, 0);  // both names: the board has one of them
    set_led(kRearFlash, 0);
}
void close_second() { set_led(kRearFlash2, 0); }
void close_infrared() { set_led(kFrontFlash, 0); }

void *rear_flash_close_thread(void *cell) {
    LOGI("Start");
    int ms = take_cell(cell);
    std::this_thread::sleep_for(std::chrono::milliseconds(ms));
    close_rear();
    LOGI("Exit");
    pthread_detach(pthread_self());
    return nullptr;
}

void *second_flash_close_thread(void *cell) {
    LOGI("Start");
    int ms = take_cell(cell);
    std::this_thread::sleep_for(std::chrono::milliseconds(ms));
    close_second();
    LOGI("Exit");
    pthread_detach(pthread_self());
    return nullptr;
}

void *infrared_close_thread(void *cell) {
    LOGI("Start");
    int seconds = take_cell(cell);
    std::this_thread::sleep_for(std::chrono::seconds(seconds));
    close_infrared();
    LOGI("Exit");
    pthread_detach(pthread_self());
    return nullptr;
}

// Hands the delay to a timer in a heap cell that the timer frees; false when the cell
// could not be allocated. When the timer's thread cannot start, the light is closed at
// once: a flash with no timer would stay on at pulse current.
bool start_timer(void *(*timer)(void *), int delay, void (*close)()) {
    auto *cell = static_cast<int *>(malloc(sizeof(int)));
    if (cell == nullptr) {
        LOGE("timer cell malloc fail");
        return false;
    }
    *cell = delay;
    int rc = start_worker(timer, cell);
    if (rc != 0) {
        LOGE("start timer failed: %d", rc);
        free(cell);
        close();
    }
    return true;
}

// The delay of an AT+FLAMP pulse: the line's third ","-field, read as atoi reads it
// (leading digits, 0 when there are none). A number too large for an int is capped like
// any other long delay, and a negative one, which would sleep for ever, closes at once.
int pulse_ms(const char *cmd, TimerLimits limits) {
    std::optional<std::string_view> field = nth_field(cmd, ",", 2);
    if (!field) return limits.default_ms;
    long ms = strtol(std::string(*field).c_str(), nullptr, 10);
    if (ms > limits.max_ms) return limits.max_ms;
    return ms < 0 ? 0 : static_cast<int>(ms);
}

struct FlashForm {
    const char *line;
    const char *node;  // nullptr: the rear main flash
    int level;
    int ok_rc, fail_rc;
};

constexpr std::array<FlashForm, 9> kFlashForms{{
    {"AT+QXSG=1", nullptr, kTorchLevel, RC_OK, RC_ERROR},
    {"AT+QXSG=1,1", nullptr, kTorchLevel, RC_OK, RC_ERROR},
    {"AT+QXSG=0", nullptr, 0, RC_OK, RC_ERROR},
    {"AT+QXSG=0,1", nullptr, 0, RC_OK, RC_ERROR},
    {"AT+QXSG=2", kRearFlash2, kTorchLevel, RC_ATOK, RC_ATNG},
    {"AT+QXSG=1,2", kRearFlash2, kTorchLevel, RC_ATOK, RC_ATNG},
    {"AT+QXSG=0,2", kRearFlash2, 0, RC_ATOK, RC_ATNG},
    {"AT+QXSG=1,3", kFrontFlash, kTorchLevel, RC_OK, RC_ERROR},
    {"AT+QXSG=0,3", kFrontFlash, 0, RC_OK, RC_ERROR},
}};

struct FlashMode {
    const char *line;
    const char *message;
};

constexpr std::array<FlashMode, 3> kFlashModes{{
    {"AT+QXFLIGHT=0", "flash_mode#off"},
    {"AT+QXFLIGHT=1", "flash_mode#on"},
    {"AT+QXFLIGHT=2", "flash_mode#auto"},
}};

int infrared_fill_light_test(char *resp) {
    if (is_sp) {
        quote_body(resp, "AT mode not support");
        return RC_ATERROR;
    }
    const char *reply = ask_test_app("infrared_fill_light 1");
    if (reply != nullptr && strcmp(reply, "ok") == 0) return RC_ATOK;
    quote_reason(resp, reply);
    return RC_ATNG;
}

int infrared_fill_light_result(char *resp) {
    if (is_sp) {
        quote_body(resp, "AT mode not support");
        return RC_ATERROR;
    }
    char text[kInfraredMessageMax + 1] = {0};
    if (readFromFile(kInfraredMessageFile, text, kInfraredMessageMax) < 0) {
        LOGE("read %s failed", kInfraredMessageFile);
        quote_body(resp, "access msg failed");
        return RC_ATERROR;
    }
    quote_body(resp, text);
    return strstr(text, "error") != nullptr ? RC_ATNG : RC_ATOK;
}

}  // namespace

int front_flashlight_test_handler(char *cmd, int arg, char *resp) {
    if (line_is(cmd, "AT+QXBGD=1") || line_is(cmd, "AT+QXBGD=0")) {
        set_led(kFrontFlash, line_is(cmd, "AT+QXBGD=1") ? kTorchLevel : 0);
        return RC_OK;  // the station judges the light by eye
    }
    if (line_is(cmd, "AT+QX_FLED_INF=0")) {
        dev::unlink(kInfraredMessageFile);
        return RC_OK;
    }
    if (line_is(cmd, "AT+QX_FLED_INF=1")) return infrared_fill_light_test(resp);
    if (line_is(cmd, "AT+QX_FLED_INF=2")) return infrared_fill_light_result(resp);
    if (line_is(cmd, "AT+QX_FLED_INF=3,0")) {
        set_led(kFrontFlash, 0);
        return RC_ATOK;
    }
    if (line_is(cmd, "AT+QX_FLED_INF=3,1")) {
        set_led(kFrontFlash, kTorchLevel);
        return start_timer(infrared_close_thread, kInfraredSeconds, close_infrared) ? RC_ATOK : RC_ATERROR;
    }
    LOGE("this at command invalid: %s", cmd);
    return RC_ERROR;
}

int set_flashlight_status_handler(char *cmd, int arg, char *resp) {
    for (const FlashMode &m : kFlashModes)
        if (line_is(cmd, m.line)) return camera_ask(m.message, resp, RC_ERROR);
    return invalid_command(cmd);
}

int flashlight_test_handler(char *cmd, int arg, char *resp) {
    for (const FlashForm &f : kFlashForms) {
        if (!line_is(cmd, f.line)) continue;
        return set_led(f.node ? f.node : rear_main_flash(), f.level) == 0 ? f.ok_rc : f.fail_rc;
    }
    return invalid_command(cmd);
}

int flashlight_amp_handler(char *cmd, int arg, char *resp) {
    if (line_is(cmd, "AT+FLAMP=0,0")) {
        set_led(kFrontFlash, 0);
        return RC_OK;
    }
    if (line_starts(cmd, "AT+FLAMP=0,1", 12)) {
        // The front torch is closed only by AT+FLAMP=0,0; this timer closes the rear
        // flash, as the station's sequence has always relied on.
        set_led(kFrontFlash, kTorchLevel);
        start_timer(rear_flash_close_thread, pulse_ms(cmd, kFrontTorchTimer), close_rear);
        return RC_OK;
    }
    if (line_is(cmd, "AT+FLAMP=1,0")) {
        set_led(kRearFlash1, 0);
        set_led(kRearFlash, 0);
        return RC_OK;
    }
    if (line_starts(cmd, "AT+FLAMP=1,1", 12)) {
        if (set_led(rear_main_flash(), kPulseLevel) != 0) return RC_ERROR;
        start_timer(rear_flash_close_thread, pulse_ms(cmd, kRearPulseTimer), close_rear);
        return RC_OK;
    }
    if (line_is(cmd, "AT+FLAMP=2,0")) {
        set_led(kRearFlash2, 0);
        set_led(kRearFlash, 0);
        return RC_OK;
    }
    if (line_starts(cmd, "AT+FLAMP=2,1", 12)) {
        if (set_led(kRearFlash2, kPulseLevel) != 0) return RC_ATNG;
        start_timer(second_flash_close_thread, pulse_ms(cmd, kSecondPulseTimer), close_second);
        return RC_ATOK;
    }
    return invalid_command(cmd);
}
