// Key capture from the kernel's input devices. The input thread waits on one epoll instance
// in 500 ms turns; a stop closes the devices at once and the thread ends on its next turn.
#include "core/input_events.h"

#include <fcntl.h>
#include <pthread.h>
#include <signal.h>
#include <sys/epoll.h>
#include <unistd.h>

#include <array>
#include <atomic>
#include <cerrno>
#include <cstring>
#include <mutex>
#include <string>

#include "core/workers.h"
#include "platform/android.h"
#include "platform/device.h"
#include "platform/log.h"

namespace {

struct KeyAction {
    int code;
    const char *log;
    char letter;       // 0: nothing saved
    const char *prop;  // set to "1"; nullptr: none
};

// What each released key does; any other key is only logged.
constexpr std::array<KeyAction, 16> kKeys{{
    {KEY_HOME, "KEY_HOME up", 'H', nullptr},
    {KEY_VOLUMEDOWN, "KEY_VOLUMEDOWN up", '-', "sys.key.volumedown"},
    {KEY_VOLUMEUP, "KEY_VOLUMEUP up", '+', "sys.key.volumeup"},
    {KEY_POWER, "KEY_POWER up", 'P', "sys.key.power"},
    {KEY_MENU, "KEY_MENU up", 'M', nullptr},
    {143, "double click", 'W', nullptr},
    {KEY_BACK, "KEYBACK up", 'R', nullptr},
    {164, "KEY_MEDIA up", 'C', nullptr},
    {KEY_HOMEPAGE, "KEY_HOMEPAGE up", 'T', nullptr},
    {KEY_MEDIA, "KEY_MEDIA up", 'C', nullptr},
    {308, "KEY_AI up", 'A', nullptr},
    {311, "left sidekey click", 0, "sys.key.left"},
    {312, "right sidekey click", 0, "sys.key.right"},
    {600, "KEY_AI up", 'A', nullptr},
    {752, "up sidekey click", 'U', nullptr},
    {753, "double click", 'D', nullptr},
}};

struct EvDevice {
    int fd;
    ev_callback cb;
    void *data;
};

// The registered devices. Only handlers (under the dispatch mutex) change the table; the
// input thread reads it between its waits.
int g_epfd = -1;
std::array<EvDevice, kMaxInputDevices> g_devices{};
int g_device_count = 0;

// The ready events of the last wait belong to the thread that waited: a thread that is
// about to end must not overwrite those of the one that replaced it.
thread_local std::array<epoll_event, kMaxInputDevices> t_ready{};
thread_local int t_ready_count = 0;

// A stop closes the devices while the thread may be about to read one: the thread holds
// this while it dispatches, so it never reads a descriptor number already given to
// someone else.
std::mutex g_table_mu;

std::atomic<int> g_running{0};
WorkerGeneration g_generation;
pthread_t g_input_thread{};
volatile sig_atomic_t g_signalled = 0;

uint64_t g_switch_mask = 0;
int32_t g_cur_x = 0, g_cur_y = 0;
int32_t g_last_x = -1, g_last_y = -1;
struct timeval g_last_time {};
std::atomic<void (*)(int)> g_volume_up_hook{nullptr};

void on_sigusr1(int) {
    if (pthread_equal(pthread_self(), g_input_thread)) g_signalled = SIGUSR1;
}

const KeyAction *key_action(int code) {
    for (const KeyAction &k : kKeys)
        if (k.code == code) return &k;
    return nullptr;
}

void handle_key(const struct input_event &ev) {
    if (ev.code == KEY_VOLUMEUP) {
        if (void (*hook)(int) = g_volume_up_hook.exchange(nullptr)) {
            hook(KEY_VOLUMEUP);
            return;
        }
    }
    if (ev.value != 0) return;  // presses are not recorded
    const KeyAction *k = key_action(ev.code);
    if (k == nullptr) {
        LOGI("ftcmd_input: %s: key:%d up", __func__, ev.code);
        return;
    }
    LOGI("ftcmd_input: %s: %s", __func__, k->log);
    if (k->letter) save_key_code(k->letter);
    if (k->prop) property_set(k->prop, "1");
}

void *input_waiting_thread(void *arg) {
    LOGI("ftcmd_input: %s: thread(input_waiting_thread) started", __func__);
    while (g_generation.current(arg) && g_signalled == 0) {
        if (ev_wait(500) == 0) {
            std::lock_guard<std::mutex> lk(g_table_mu);
            if (g_generation.current(arg) && g_running) ev_dispatch();
        }
        if (!g_running) break;
    }
    if (g_signalled != 0) {
        LOGI("ftcmd_input: %s: thread(thread id=%lu) received singal(%d) exit", __func__,
             static_cast<unsigned long>(pthread_self()), static_cast<int>(g_signalled));
    }
    LOGI("ftcmd_input: %s: thread(input_waiting_thread) exit", __func__);
    return nullptr;
}

}  // namespace

int ev_init(ev_callback cb, void *data) {
    g_epfd = epoll_create(32);
    if (g_epfd < 0) {
        LOGE("ftcmd_input: %s: epoll_create fail, error=%s", __func__, strerror(errno));
        return -1;
    }
    fcntl(g_epfd, F_SETFD, FD_CLOEXEC);
    g_device_count = 0;
    if (!dev::exists("/dev/input")) {
        LOGE("ftcmd_input: %s: dir(%s) open fail, error=%s", __func__, "/dev/input", strerror(ENOENT));
        close(g_epfd);  // every failed start would otherwise leave one epoll descriptor open
        g_epfd = -1;
        return -1;
    }
    bool add_failed = false;
    for (const std::string &name : dev::list_dir("/dev/input")) {
        if (name.compare(0, 5, "event") != 0) continue;
        std::string path = "/dev/input/" + name;
        int fd = dev::open(path.c_str(), O_RDONLY);
        if (fd < 0) continue;
        unsigned long types = 0;
        if (dev::ioctl(fd, EVIOCGBIT(0, sizeof types), &types) < 0) {
            LOGE("ftcmd_input: %s: EVIOCGBIT, %s error=%s", __func__, name.c_str(), strerror(errno));
            close(fd);
            continue;
        }
        if ((types & (1UL << EV_KEY)) == 0) {
            LOGE("ftcmd_input: %s: EV_KEY, %s error=%s", __func__, name.c_str(), strerror(errno));
            close(fd);
            continue;
        }
        EvDevice &d = g_devices[static_cast<size_t>(g_device_count)];
        struct epoll_event ev {};
        ev.events = EPOLLIN | EPOLLWAKEUP;
        ev.data.ptr = &d;
        if (epoll_ctl(g_epfd, EPOLL_CTL_ADD, fd, &ev) != 0) {
            LOGE("ftcmd_input: %s: EPOLL_CTL_ADD, %s error=%s", __func__, name.c_str(), strerror(errno));
            close(fd);
            add_failed = true;
            continue;
        }
        d = EvDevice{fd, cb, data};
        ++g_device_count;
        LOGI("ftcmd_input: %s: add : %d, %s", __func__, fd, name.c_str());
        if (g_device_count == kMaxInputDevices) break;
    }
    if (add_failed && g_device_count == 0) {
        close(g_epfd);
        g_epfd = -1;
        LOGE("ftcmd_input: %s: epollfd, error", __func__);
        return -1;
    }
    return 0;
}

void ev_exit() {
    std::lock_guard<std::mutex> lk(g_table_mu);
    for (int i = 0; i < g_device_count; ++i) close(g_devices[static_cast<size_t>(i)].fd);
    g_device_count = 0;
    if (g_epfd >= 0) close(g_epfd);
    g_epfd = -1;
}

int ev_wait(int timeout_ms) {
    int max = g_device_count > 0 ? g_device_count : 1;
    t_ready_count = epoll_wait(g_epfd, t_ready.data(), max, timeout_ms);
    return t_ready_count > 0 ? 0 : -1;
}

void ev_dispatch() {
    for (int i = 0; i < t_ready_count; ++i) {
        auto *d = static_cast<EvDevice *>(t_ready[static_cast<size_t>(i)].data.ptr);
        if (d->cb) d->cb(d->fd, t_ready[static_cast<size_t>(i)].events, d->data);
    }
}

int ev_get_input(int fd, uint32_t epevents, struct input_event *ev) {
    if ((epevents & EPOLLIN) == 0) return -1;
    ssize_t n = read(fd, ev, sizeof *ev);
    return n == static_cast<ssize_t>(sizeof *ev) ? 0 : -1;
}

int input_callback(int fd, uint32_t epevents, void *) {
    struct input_event ev {};
    if (ev_get_input(fd, epevents, &ev) != 0) {
        LOGE("ftcmd_input: %s: input event get fail", __func__);
        return -1;
    }
    if (ev.type == EV_SYN && ev.code == SYN_REPORT && (g_cur_x != g_last_x || g_cur_y != g_last_y)) {
        g_last_x = g_cur_x;
        g_last_y = g_cur_y;
        g_last_time = ev.time;
    }
    if (ev.type == EV_ABS) {
        if (ev.code == ABS_X || ev.code == ABS_MT_POSITION_X) g_cur_x = ev.value;
        if (ev.code == ABS_Y || ev.code == ABS_MT_POSITION_Y) g_cur_y = ev.value;
    }
    if (ev.type == EV_SYN || ev.type == EV_ABS) {
        LOGD("ftcmd_input: %s: type:%d, code:%d, value:%d", __func__, ev.type, ev.code, ev.value);
    } else if (ev.type == EV_SW) {
        if (ev.code < 16) {
            if (ev.value) g_switch_mask |= 1ULL << ev.code;
            else g_switch_mask &= ~(1ULL << ev.code);
            LOGI("ftcmd_input: %s: EV_SW info: keycode=%d, value=%d", __func__, ev.code, ev.value);
        } else {
            LOGE("ftcmd_input: %s: Code of EV_SW error, code=%d", __func__, ev.code);
        }
    } else if (ev.type == EV_KEY) {
        handle_key(ev);
    }
    return 0;
}

int create_input_threads() {
    if (g_running) {
        LOGI("ftcmd_input: %s: input thread is runing", __func__);
        return 0;
    }
    g_switch_mask = 0;
    if (ev_init(input_callback, nullptr) != 0) return -1;
    dev::unlink(kKeyCaptureFile);
    struct sigaction sa {};
    sa.sa_handler = on_sigusr1;
    sigaction(SIGUSR1, &sa, nullptr);
    g_signalled = 0;
    void *generation = g_generation.next();
    g_running = 1;
    pthread_t tid;
    int rc = pthread_create(&tid, nullptr, input_waiting_thread, generation);
    if (rc != 0) {
        g_running = 0;
        ev_exit();
        LOGE("ftcmd_input: %s: create thread fail, error=%s", __func__, strerror(rc));
        return -1;
    }
    g_input_thread = tid;
    pthread_detach(tid);
    LOGI("ftcmd_input: %s: input thread id=%lu", __func__, static_cast<unsigned long>(tid));
    return 0;
}

void exit_input_threads() {
    g_running = 0;
    g_generation.end();
    ev_exit();
}

int get_input_key(char *buf, int len) {
    exit_input_threads();
    int fd = dev::open(kKeyCaptureFile, O_RDONLY);
    if (fd < 0) {
        LOGE("ftcmd_input: %s: open keycodeTest error=%s", __func__, strerror(errno));
        return -1;
    }
    ssize_t n = read(fd, buf, static_cast<size_t>(len));
    close(fd);
    buf[n > 0 ? n : 0] = '\0';
    LOGI("ftcmd_input: %s: buf_key=%s", __func__, buf);
    return 0;
}

void save_key_code(char letter) {
    int fd = dev::open(kKeyCaptureFile, O_WRONLY | O_CREAT | O_APPEND, 0666);
    if (fd < 0) {
        LOGE("ftcmd_input: %s: open keycodeTest error:%s", __func__, strerror(errno));
        return;
    }
    ssize_t n = write(fd, &letter, 1);
    (void)n;
    dev::shell("/system/bin/sh -c \"chmod 0666 /data/engineermode/keycodeTest\"");
    close(fd);
}

void set_volume_up_hook(void (*hook)(int code)) { g_volume_up_hook = hook; }

uint64_t input_switch_mask() { return g_switch_mask; }

void input_touch_position(int32_t &x, int32_t &y) {
    x = g_last_x;
    y = g_last_y;
}
