// The two socket command sources: the TCP service port for stations and the local
// control socket for on-device clients (one command per connection).
#include <arpa/inet.h>
#include <errno.h>
#include <netinet/in.h>
#include <netinet/tcp.h>
#include <pthread.h>
#include <poll.h>
#include <sys/socket.h>
#include <unistd.h>

#include <cstdlib>
#include <cstring>

#include "core/dispatch.h"
#include "core/port_state.h"
#include "core/response.h"
#include "core/transports.h"
#include "platform/android.h"
#include "platform/device.h"
#include "platform/factory.h"
#include "platform/log.h"

namespace {

// A local client that connects and sends nothing held the local socket for everyone;
// one that has sent nothing after this long is dropped (as a failed receive).
constexpr int kLocalIdleSeconds = 2;

void start_detached(void *(*fn)(void *)) {
    pthread_t tid;
    if (pthread_create(&tid, nullptr, fn, nullptr) == 0) pthread_detach(tid);
}

void set_flag(int fd, int level, int opt, const char *what) {
    int one = 1;
    if (setsockopt(fd, level, opt, &one, sizeof one) < 0) LOGE("%s error:%s", what, strerror(errno));
}

void close_tcp_client() {
    tcp_station_dropped(g_port.tcp_client_fd);  // a drop pending for it is done with
    close(g_port.tcp_client_fd);
    g_port.tcp_client_fd = -1;  // a stale number must never reach a reused descriptor
}

}  // namespace

void socket_init() { start_detached(create_service_socket); }

void *create_service_socket(void *) {
    int port = dev::tcp_service_port();
    LOGI("socket %d", port);
    int fd = socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0);
    if (fd < 0) {
        LOGE("Failed to create socket! errno:%s", strerror(errno));
        return nullptr;
    }
    set_flag(fd, SOL_SOCKET, SO_REUSEADDR, "SO_REUSEADDR");
    set_flag(fd, IPPROTO_TCP, TCP_NODELAY, "TCP_NODELAY");
    struct sockaddr_in addr {};
    addr.sin_family = AF_INET;
    addr.sin_addr.s_addr = dev::tcp_service_address();
    addr.sin_port = htons(static_cast<uint16_t>(port));
    if (bind(fd, reinterpret_cast<sockaddr *>(&addr), sizeof addr) < 0) {
        LOGE("Bind socket error:%s", strerror(errno));
        close(fd);
        return nullptr;
    }
    if (listen(fd, 20) < 0) {
        LOGE("Listen socket error:%s", strerror(errno));
        close(fd);
        return nullptr;
    }
    g_port.tcp_listen_fd = fd;
    socket_monitor();
    return nullptr;
}

void socket_monitor() {
    char *buf = g_port.tcp_buf;
    accept_service_socket();
    for (;;) {
        memset(buf, 0, kLineSize);
        int n = read_service_socket(buf, kLineSize - 1);
        dispatch_command(buf, n, SRC_TCP);  // 0: the station has gone
        if (n <= 0) accept_service_socket();
    }
}

void accept_service_socket() {
    kaelatcmd_set_system_property("sys.qrcode.view", "1");
    LOGI("start accept");
    struct sockaddr_in peer {};
    socklen_t len = sizeof peer;
    for (int failures = 0;;) {
        len = sizeof peer;
        g_port.tcp_client_fd = accept4(g_port.tcp_listen_fd, reinterpret_cast<sockaddr *>(&peer), &len, SOCK_CLOEXEC);
        if (g_port.tcp_client_fd >= 0) break;
        LOGE("accept failed!!!");
        if (++failures >= 100) break;
        sleep(1);
    }
    set_flag(g_port.tcp_client_fd, SOL_SOCKET, SO_REUSEADDR, "SO_REUSEADDR");
    set_flag(g_port.tcp_client_fd, IPPROTO_TCP, TCP_NODELAY, "TCP_NODELAY");
    char ip[INET_ADDRSTRLEN] = {0};
    inet_ntop(AF_INET, &peer.sin_addr, ip, sizeof ip);
    LOGI("accept %d, addr:%s:%d", g_port.tcp_client_fd, ip, ntohs(peer.sin_port));
    kaelatcmd_set_system_property("sys.qrcode.view", "0");
}

int read_service_socket(char *buf, int len) {
    int fd = g_port.tcp_client_fd;
    if (fd < 0) {
        // Only after 100 failed accepts in a row: the port is unusable.
        LOGE("invalid station descriptor %d", fd);
        abort();
    }
    if (tcp_station_dropped(fd)) {
        LOGE("ERROR in socket:%d", ESHUTDOWN);
        close_tcp_client();
        return 0;
    }
    struct pollfd pfd = {fd, POLLIN, 0};
    int ret = poll(&pfd, 1, -1);
    if (ret <= 0) {
        if (ret == 0) LOGE("ERROR:No data from socket. error: %d", errno);
        else LOGE("Fail to select in readline. error: %d", errno);
        close_tcp_client();
        return 0;
    }
    ssize_t n = recv(fd, buf, static_cast<size_t>(len), 0);
    if (n >= 1) {
        cut_mutil_command(buf);
        // One more than received: cleaning then starts at the NUL, so a station's own
        // line ending stays in the line and comes back in the echo.
        return static_cast<int>(n) + 1;
    }
    LOGE("ERROR in socket:%d", errno);
    close_tcp_client();
    return 0;
}

void socket_local_init() { start_detached(socket_local_thread); }

void *socket_local_thread(void *) {
    const char *name = dev::local_socket_name();
    int fd = socket_local_server(name, ANDROID_SOCKET_NAMESPACE_ABSTRACT, SOCK_STREAM);
    if (fd < 0) {
        LOGE("Failed to get ftcmd_vendor_socket erron:%d", errno);
        return nullptr;
    }
    g_port.local_listen_fd = fd;
    LOGI("control socket %d %s", fd, name);
    if (listen(fd, 4) < 0) {
        close(fd);
        LOGE("Failed to listen on control socket %d %s", fd, strerror(errno));
        return nullptr;
    }
    for (int budget = 100;;) {
        LOGD("accept...");
        int client = accept4(fd, nullptr, nullptr, SOCK_CLOEXEC);
        if (client < 0) {
            LOGE("accept error:%s", strerror(errno));
            sleep(1);
            if (--budget == 0) return nullptr;
            continue;
        }
        LOGI("accept %d", client);
        struct timeval idle = {kLocalIdleSeconds, 0};
        setsockopt(client, SOL_SOCKET, SO_RCVTIMEO, &idle, sizeof idle);
        char buf[128] = {0};
        ssize_t n = recv(client, buf, 126, 0);
        buf[127] = '\0';
        if (n < 0) {
            LOGE("recv error:%s", strerror(errno));
            close(client);
        } else {
            LOGI("recv_buf %s", buf);
            int old = swap_local_client(client);
            if (old >= 0) {
                LOGI("close old fd_local_client %d", old);
                close(old);
            }
            dispatch_command(buf, static_cast<int>(strlen(buf)), SRC_LOCAL);
        }
        budget = 100;
    }
}
