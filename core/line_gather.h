#pragma once
// Line assembly of the USB serial reader, kept apart from the descriptor so that it can
// be driven (and fuzzed) without a port.
#include <sys/types.h>

#include "core/result.h"

// What one read means for the line being gathered in a reader's buffer.
enum class Gathered {
    Partial,      // no line end yet: keep gathering at the new offset
    LoneLineEnd,  // a line end on its own: ignored
    Line,         // a line is complete: dispatch `total` bytes
    PortDead,     // nothing gathered and the read failed or saw end of file
};

// The reader's buffer holds *offset gathered bytes followed by the n bytes just read (n is
// the read's result, 0 or negative on end of file or error). Updates *offset for the
// next read and sets *total to the length to dispatch. A partial line is never thrown
// away: a full buffer or a failed read dispatches what was gathered.
Gathered usb_gather(const char *buf, int *offset, ssize_t n, int *total);

// How many bytes the next read may ask for at this offset (0 once the buffer is full:
// that read then returns 0 and the gathered 2048 bytes go out as one line).
inline int usb_read_room(int offset) { return kLineSize - 1 - offset; }
