#include "core/port_state.h"

#include <cstring>

PortState g_port;
int is_uart_flag = 0;
int is_sp = 0;

void initSerialDevice(PortState *ps) {
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
