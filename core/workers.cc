#include "core/workers.h"

#include <pthread.h>
#include <unistd.h>

#include "core/port_state.h"
#include "platform/android.h"
#include "platform/device.h"
#include "platform/factory.h"
#include "platform/log.h"

int g_vibrator_run = 0;
int g_lights_run = 0;

int start_worker(void *(*fn)(void *), void *arg) {
    pthread_t tid;
    return pthread_create(&tid, nullptr, fn, arg);
}

void wait_for_current_answer() {
    pthread_mutex_lock(&g_port.mutex);
    pthread_mutex_unlock(&g_port.mutex);
}

void *reboot_thread(void *reason) {
    LOGI("Start");
    if (reason != nullptr) {
        LOGI("boot_reason: %s", static_cast<const char *>(reason));
        dev::sync();
    }
    sleep(2);  // let the answer frame leave first
    android_reboot(ANDROID_RB_RESTART, 0, "ATcommand");
    LOGI("Exit");
    pthread_detach(pthread_self());
    return nullptr;
}

void *update_vibrator_thread(void *) {
    LOGI("Start");
    do {
        write_int("/sys/class/leds/vibrator/duration", 10000);
        write_int("/sys/class/leds/vibrator/activate", 1);
        sleep(10100000);  // whole seconds, as the vibrator worker has always slept
    } while (g_vibrator_run);
    LOGI("Exit");
    pthread_detach(pthread_self());
    return nullptr;
}

static const char *green_light_node() {
    for (const char *code : {"RX3310", "RX3311", "WQ2207", "WQ2207_EX"})
        if (is_project(code)) return "sys/class/leds/green/engineering";
    return "/sys/class/leds/green/brightness";
}

void *update_indicate_lights_thread(void *) {
    LOGI("Start");
    const char *red = "/sys/class/leds/red/brightness";
    const char *green = green_light_node();
    bool red_on = true;
    while (g_lights_run) {
        write_int(red, red_on ? 255 : 0);
        write_int(green, red_on ? 0 : 255);
        red_on = !red_on;
        usleep(500 * 1000);
    }
    write_int(red, 0);
    write_int(green, 0);
    LOGI("Exit");
    pthread_detach(pthread_self());
    return nullptr;
}
