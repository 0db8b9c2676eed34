#pragma once

// Frames the handler's answer and sends it to the source of the current line.
void writeDataToserialByResponseType(const char *echo, const char *body, int result);
// Raw bytes to the current source; logged to the command log except for the local socket.
void writeDataToSerial(const char *data, int len);
void writeDataToSocket(const char *data, int len);
// Closes a serial port's descriptor (if open) and stores fd in its slot (&g_port.uart_fd or
// &g_port.usb_fd), under the lock of that port's writers: a worker streaming frames to the
// port never writes to a descriptor that its reader closed, and perhaps opened again as
// another file, under it.
void replace_serial_fd(int *slot, int fd);
// True once for a TCP station that took no answers and was disconnected: its reader
// then serves nothing more of what the station had already sent.
bool tcp_station_dropped(int fd);
void saveCommand2File(const char *text);
// One blocking read from the current source; 0 for a source that cannot be read.
int readDataFromSerial(char *buf, int len);

// The trailer line (word and CR LF) of a ResultCode; nullptr for "no answer at all".
const char *trailer_for(int result);
