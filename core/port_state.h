#pragma once
#include <pthread.h>

#include "core/result.h"
#include "core/thread_annotations.h"

// Source type of the line being served: where its answer goes.
enum SourceType : int { SRC_NONE = 0, SRC_UART = 1, SRC_USB = 2, SRC_TCP = 3, SRC_LOCAL = 4 };

// The dispatch mutex: one command at a time. A zeroed one is a valid default mutex.
struct CAPABILITY("mutex") DispatchMutex {
    pthread_mutex_t m;
    void lock() ACQUIRE() { pthread_mutex_lock(&m); }
    void unlock() RELEASE() { pthread_mutex_unlock(&m); }
};

// The one global record of the command service, shared by every transport and by the
// response writer. Field order is kept as the service has always had it.
struct PortState {
    int uart_fd;
    int usb_fd;
    int tcp_listen_fd;
    int tcp_client_fd;
    int spare_fd;  // initialised with the others, used by nobody
    int local_listen_fd;
    int local_client_fd;  // owned by whoever takes it out: see take_local_client
    DispatchMutex mutex;
    int source_type GUARDED_BY(mutex);  // written only while serving a line
    // Each reader gathers its line in a buffer of its own: with one buffer shared by the
    // three readers, a line arriving on one port overwrote the line (and the echo) being
    // served for another. A reader's buffer is only touched by its own thread.
    char uart_buf[kLineSize];
    char usb_buf[kLineSize];
    char tcp_buf[kLineSize];
};

extern PortState g_port;

// Boot-mode flags, written once at start-up.
extern int is_uart_flag;  // AT commands on the UART (normal or AT console mode)
extern int is_sp;         // AT mode without the Android UI

void initSerialDevice(PortState *ps);

// The source of the line being served. Workers and the hang-up line read it without the
// dispatch mutex on purpose (their frames go to whatever source is current).
int current_source();
// Records the source of the line about to be served.
void set_current_source(int src) REQUIRES(g_port.mutex);
// Sets the source outside any dispatch: only for code that drives the core directly.
void force_current_source(int src);

// The local client slot has one owner at a time: taking it empties the slot, so a
// descriptor is closed exactly once, by whoever took it.
int take_local_client();
// Records a new local client; the one it replaces (if any) is returned for closing.
int swap_local_client(int fd);
