#include "core/port_state.h"

#include <cstring>

PortState g_port;
int is_uart_flag = 0;
int is_sp = 0;

void initSerialDevice(PortState *ps) NO_THREAD_SAFETY_ANALYSIS {
    memset(ps, 0, sizeof(*ps));  // a zeroed mutex is a valid default mutex
    ps->uart_fd = -1;
    ps->usb_fd = -1;
    ps->tcp_listen_fd = -1;
    ps->tcp_client_fd = -1;
    ps->spare_fd = -1;
    ps->local_listen_fd = -1;
    ps->local_client_fd = -1;
    ps->source_type = SRC_NONE;
}

int current_source() NO_THREAD_SAFETY_ANALYSIS { return __atomic_load_n(&g_port.source_type, __ATOMIC_ACQUIRE); }

void set_current_source(int src) { __atomic_store_n(&g_port.source_type, src, __ATOMIC_RELEASE); }

void force_current_source(int src) NO_THREAD_SAFETY_ANALYSIS {
    __atomic_store_n(&g_port.source_type, src, __ATOMIC_RELEASE);
}

int take_local_client() { return __atomic_exchange_n(&g_port.local_client_fd, -1, __ATOMIC_ACQ_REL); }

int swap_local_client(int fd) { return __atomic_exchange_n(&g_port.local_client_fd, fd, __ATOMIC_ACQ_REL); }
