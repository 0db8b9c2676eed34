// The mechanism behind emulated devices: socket pairs handed to the daemon, one thread
// that carries what the daemon writes (and what the station sends) to the models, and the
// registry that lets dev::ioctl find the model of a descriptor.
#include "platform/sim/chardev.h"

#include <fcntl.h>
#include <sys/epoll.h>
#include <sys/ioctl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <chrono>
#include <condition_variable>
#include <cstring>
#include <list>
#include <map>
#include <memory>
#include <mutex>
#include <thread>
#include <vector>

#include "platform/log.h"
#include "platform/sim/sim.h"

namespace sim {

// The device models, one file each. A new model adds its line here.
extern const DeviceModel kInputEventModel;
extern const DeviceModel kSideKeyModel;
extern const DeviceModel kFlashLedModel;
extern const DeviceModel kNfcControllerModel;
extern const DeviceModel kLcmPanelModel;
extern const DeviceModel kChargerMcuModel;
extern const DeviceModel kPmicRegmapModel;
extern const DeviceModel kIndicatorLedModel;
extern const DeviceModel kLedRingModel;

namespace {

const DeviceModel *const kModels[] = {
    &kInputEventModel,
    &kSideKeyModel,
    &kFlashLedModel,
    &kNfcControllerModel,
    &kLcmPanelModel,
    &kChargerMcuModel,
    &kPmicRegmapModel,
    &kIndicatorLedModel,
    &kLedRingModel,
};

struct Session {
    const DeviceModel *model;
    Device dev;
    int client_fd = -1;  // the number the daemon holds, as handed out
    dev_t client_dev = 0;
    ino_t client_ino = 0;  // the socket behind that number: a reused number names another
    bool node = false;     // a write session of an owned attribute node
};

// Every model call runs under g_mu. It is recursive because a model may use the facade
// (write another node, open a file) from within its own calls.
std::recursive_mutex g_mu;
std::condition_variable_any g_cv;
thread_local bool t_in_model = false;  // this thread is inside a model call
std::list<std::unique_ptr<Session>> g_sessions;
std::map<int, Session *> g_by_fd;
int g_epoll = -1;
int g_station_fd = -1;
std::string g_station_root;
std::string g_station_pending;
char g_station_marker;  // the epoll data of the station FIFO

std::mutex g_models_mu;
std::vector<const DeviceModel *> g_added;  // models added at run time (tests)

std::vector<const DeviceModel *> models() {
    std::vector<const DeviceModel *> all(std::begin(kModels), std::end(kModels));
    std::lock_guard<std::mutex> lk(g_models_mu);
    all.insert(all.end(), g_added.begin(), g_added.end());
    return all;
}

const DeviceModel *serving(const std::string &path) {
    for (const DeviceModel *m : models())
        if (m->serves && m->serves(path)) return m;
    return nullptr;
}

const DeviceModel *owning(const std::string &path) {
    for (const DeviceModel *m : models())
        if (m->owns && m->owns(path)) return m;
    return nullptr;
}

void close_session(Session *s) {
    if (s->model->close) s->model->close(s->dev);
    epoll_ctl(g_epoll, EPOLL_CTL_DEL, s->dev.model_fd, nullptr);
    ::close(s->dev.model_fd);
    auto at = g_by_fd.find(s->client_fd);
    if (at != g_by_fd.end() && at->second == s) g_by_fd.erase(at);
    g_sessions.remove_if([s](const std::unique_ptr<Session> &p) { return p.get() == s; });
}

// Takes what the daemon wrote; false once the daemon has closed its end.
bool drain(Session *s) {
    std::vector<char> buf(65536);
    for (;;) {
        ssize_t n = ::recv(s->dev.model_fd, buf.data(), buf.size(), MSG_DONTWAIT);
        if (n > 0) {
            if (s->node && s->model->node_write) s->model->node_write(s->dev.path, std::string(buf.data(), static_cast<size_t>(n)));
            else if (!s->node && s->model->write) s->model->write(s->dev, buf.data(), static_cast<size_t>(n));
            continue;
        }
        if (n < 0 && errno == EINTR) continue;
        return n < 0 && (errno == EAGAIN || errno == EWOULDBLOCK);
    }
}

void station_lines() {
    char buf[4096];
    for (;;) {
        ssize_t n = ::read(g_station_fd, buf, sizeof buf);
        if (n <= 0) break;
        g_station_pending.append(buf, static_cast<size_t>(n));
    }
    for (size_t nl; (nl = g_station_pending.find('\n')) != std::string::npos;) {
        std::string line = g_station_pending.substr(0, nl);
        g_station_pending.erase(0, nl + 1);
        size_t sp = line.find(' ');
        std::string name = line.substr(0, sp), text = sp == std::string::npos ? "" : line.substr(sp + 1);
        bool known = false;
        for (const DeviceModel *m : models()) {
            if (name == m->name && m->station) {
                m->station(text);
                known = true;
            }
        }
        if (!known) LOGW("station line for no device model: %s", line.c_str());
    }
}

void serve() {
    struct epoll_event ev[16];
    for (;;) {
        int n = epoll_wait(g_epoll, ev, 16, -1);
        if (n < 0) {
            if (errno == EINTR) continue;
            LOGE("device thread: epoll_wait: %s", strerror(errno));
            return;
        }
        {
            std::lock_guard<std::recursive_mutex> lk(g_mu);
            t_in_model = true;
            for (int i = 0; i < n; ++i) {
                if (ev[i].data.ptr == &g_station_marker) {
                    if (g_station_fd >= 0) station_lines();
                    continue;
                }
                // Sessions end only here, so the pointer is still alive; one closed earlier in
                // this round has left the list.
                Session *s = static_cast<Session *>(ev[i].data.ptr);
                bool alive = false;
                for (const auto &p : g_sessions) alive |= p.get() == s;
                if (alive && !drain(s)) close_session(s);
            }
            t_in_model = false;
        }
        g_cv.notify_all();
    }
}

// The device thread and the station FIFO of the current sandbox; under g_mu.
void ensure_service() {
    if (g_epoll < 0) {
        g_epoll = epoll_create1(EPOLL_CLOEXEC);
        std::thread(serve).detach();
    }
    const std::string &r = root();
    if (g_station_root == r && g_station_fd >= 0) return;
    if (g_station_fd >= 0) {
        epoll_ctl(g_epoll, EPOLL_CTL_DEL, g_station_fd, nullptr);
        ::close(g_station_fd);
        g_station_fd = -1;
    }
    g_station_root = r;
    g_station_pending.clear();
    std::string dir = r + "/station", fifo = dir + "/devices";
    ::mkdir(dir.c_str(), 0755);
    if (::mkfifo(fifo.c_str(), 0660) != 0 && errno != EEXIST) return;
    // Read-write: the FIFO always has a writer, so it never reads as ended between stations.
    g_station_fd = ::open(fifo.c_str(), O_RDWR | O_NONBLOCK | O_CLOEXEC);
    if (g_station_fd < 0) return;
    struct epoll_event ev {};
    ev.events = EPOLLIN;
    ev.data.ptr = &g_station_marker;
    epoll_ctl(g_epoll, EPOLL_CTL_ADD, g_station_fd, &ev);
}

}  // namespace

void add_device_model(const DeviceModel &model) {
    std::lock_guard<std::mutex> lk(g_models_mu);
    g_added.push_back(&model);
}

bool device_send(Device &d, const void *bytes, size_t len) {
    ssize_t n = ::send(d.model_fd, bytes, len, MSG_DONTWAIT | MSG_NOSIGNAL);
    return n == static_cast<ssize_t>(len);
}

void for_each_open(const DeviceModel &model, const std::function<void(Device &)> &fn) {
    for (const auto &s : g_sessions)
        if (s->model == &model && !s->node) fn(s->dev);
}

int device_open(const char *device_path, int flags) {
    std::string path = rooted_path(device_path);
    const DeviceModel *model = serving(path);
    bool node = false;
    if (model == nullptr && (flags & O_ACCMODE) != O_RDONLY) {
        model = owning(path);
        node = model != nullptr;
    }
    if (model == nullptr) return -2;
    if (::access(map(device_path).c_str(), F_OK) != 0) return -1;  // the device is not fitted

    int sv[2];
    if (::socketpair(AF_UNIX, (node ? SOCK_SEQPACKET : model->socket_type) | SOCK_CLOEXEC, 0, sv) != 0) return -1;
    if (flags & O_NONBLOCK) fcntl(sv[0], F_SETFL, fcntl(sv[0], F_GETFL) | O_NONBLOCK);
    struct stat st {};
    fstat(sv[0], &st);

    auto s = std::make_unique<Session>();
    s->model = model;
    s->dev.path = path;
    s->dev.flags = flags;
    s->dev.model_fd = sv[1];
    s->client_fd = sv[0];
    s->client_dev = st.st_dev;
    s->client_ino = st.st_ino;
    s->node = node;

    std::lock_guard<std::recursive_mutex> lk(g_mu);
    bool was = t_in_model;
    t_in_model = true;
    int refused = (!node && model->open) ? model->open(s->dev) : 0;
    t_in_model = was;
    if (refused != 0) {
        ::close(sv[0]);
        ::close(sv[1]);
        errno = refused;
        return -1;
    }
    ensure_service();
    struct epoll_event ev {};
    ev.events = EPOLLIN | EPOLLRDHUP;
    ev.data.ptr = s.get();
    epoll_ctl(g_epoll, EPOLL_CTL_ADD, sv[1], &ev);
    g_by_fd[sv[0]] = s.get();
    g_sessions.push_back(std::move(s));
    return sv[0];
}

// The open behind a descriptor the daemon holds, or nullptr. The number must still name
// the same socket: a closed and reused number never reaches the old open. Under g_mu.
static Session *session_of(int fd) {
    auto at = g_by_fd.find(fd);
    if (at == g_by_fd.end()) return nullptr;
    struct stat st {};
    if (fstat(fd, &st) != 0 || st.st_ino != at->second->client_ino || st.st_dev != at->second->client_dev)
        return nullptr;
    return at->second;
}

bool device_ioctl(int fd, unsigned long request, void *arg, int *result) {
    std::unique_lock<std::recursive_mutex> lk(g_mu);
    Session *s = session_of(fd);
    if (s == nullptr) return false;
    int err = 0;
    if (s->node || s->model->ioctl == nullptr) {
        *result = -1;
        err = ENOTTY;
    } else {
        errno = 0;
        bool was = t_in_model;
        t_in_model = true;
        *result = s->model->ioctl(s->dev, request, arg);
        t_in_model = was;
        err = errno;
    }
    lk.unlock();
    if (*result < 0) errno = err;
    return true;
}

bool device_read(int fd, void *buf, size_t len, ssize_t *result) {
    std::unique_lock<std::recursive_mutex> lk(g_mu);
    Session *s = session_of(fd);
    if (s == nullptr) return false;
    if (s->node || s->model->read == nullptr) return false;
    errno = 0;
    bool was = t_in_model;
    t_in_model = true;
    *result = s->model->read(s->dev, buf, len);
    t_in_model = was;
    int err = errno;
    lk.unlock();
    if (*result < 0) errno = err;
    return true;
}

bool node_owned(const char *device_path) { return owning(rooted_path(device_path)) != nullptr; }

void settle() {
    int saved = errno;
    struct Restore {
        int value;
        ~Restore() { errno = value; }
    } restore{saved};
    if (t_in_model) return;  // the device thread itself: what is queued comes after this call
    std::unique_lock<std::recursive_mutex> lk(g_mu);
    auto deadline = std::chrono::steady_clock::now() + std::chrono::seconds(2);
    for (;;) {
        bool pending = false;
        for (const auto &s : g_sessions) {
            int queued = 0;
            if (s->node && ::ioctl(s->dev.model_fd, FIONREAD, &queued) == 0 && queued > 0) pending = true;
        }
        if (!pending || g_cv.wait_until(lk, deadline) == std::cv_status::timeout) return;
    }
}

bool station_send(const std::string &r, const std::string &line) {
    int fd = ::open((r + "/station/devices").c_str(), O_WRONLY | O_NONBLOCK | O_CLOEXEC);
    if (fd < 0) {
        if (errno == ENOENT) errno = ENXIO;  // no device of this phone was ever opened
        return false;
    }
    std::string text = line + "\n";
    ssize_t n = ::write(fd, text.data(), text.size());
    int err = errno;
    ::close(fd);
    errno = err;
    return n == static_cast<ssize_t>(text.size());
}

}  // namespace sim
