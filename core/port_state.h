#pragma once
#include <pthread.h>

#include "core/result.h"

// Source type of the line being served: where its answer goes.
enum SourceType : int { SRC_NONE = 0, SRC_UART = 1, SRC_USB = 2, SRC_TCP = 3, SRC_LOCAL = 4 };

// The one global record of the command service, shared by every transport and by the
// response writer. Field order is kept as the service has always had it.
struct PortState {
    int uart_fd;
    int usb_fd;
    int tcp_listen_fd;
    int tcp_client_fd;
    int spare_fd;  // initialised with the others, used by nobody
    int local_listen_fd;
    int local_client_fd;  // closed and reset to -1 after every answer
    pthread_mutex_t mutex;  // the dispatch mutex: one command at a time
    int source_type;
    char recv_buf[kLineSize];  // shared by the UART, USB and TCP readers
};

extern PortState g_port;

// Boot-mode flags, written once at start-up.
extern int is_uart_flag;  // AT commands on the UART (normal or AT console mode)
extern int is_sp;         // AT mode without the Android UI

void initSerialDevice(PortState *ps);
