#pragma once

// Serial lines: the debug UART and the USB gadget serial port.
void uart_init();
void vcom_init();
int open_serial_device(const char *path);
void *uart_thread(void *);
void *vcom_thread(void *);
void uart_monitor();
void vcom_monitor();

// Sockets: the TCP service port and the local control socket.
void socket_init();
void *create_service_socket(void *);
void socket_monitor();
void accept_service_socket();
int read_service_socket(char *buf, int len);
void socket_local_init();
void *socket_local_thread(void *);
