#include "core/workers.h"

#include <pthread.h>
#include <unistd.h>

#include "core/port_state.h"
#include <atomic>
#include <chrono>
#include <thread>

#include "platform/android.h"
#include "platform/device.h"
#include "platform/factory.h"
#include "platform/log.h"

namespace {

std::atomic<int> g_live_workers{0};

struct WorkerStart {
    void *(*fn)(void *);
    void *arg;
};

// Counts the worker out once its function has returned, after its last device access.
void *run_worker(void *p) {
    WorkerStart start = *static_cast<WorkerStart *>(p);
    delete static_cast<WorkerStart *>(p);
    void *result = start.fn(start.arg);
    --g_live_workers;
    return result;
}

}  // namespace

int start_worker(void *(*fn)(void *), void *arg) {
    pthread_t tid;
    ++g_live_workers;
    auto *start = new WorkerStart{fn, arg};
    int rc = pthread_create(&tid, nullptr, run_worker, start);
    if (rc != 0) {
        delete start;
        --g_live_workers;
    }
    return rc;
}

bool wait_workers_done(int timeout_ms) {
    auto deadline = std::chrono::steady_clock::now() + std::chrono::milliseconds(timeout_ms);
    while (g_live_workers.load() > 0) {
        if (std::chrono::steady_clock::now() >= deadline) return false;
        std::this_thread::sleep_for(std::chrono::milliseconds(10));
    }
    return true;
}

void wait_for_current_answer() {
    g_port.mutex.lock();
    g_port.mutex.unlock();
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
