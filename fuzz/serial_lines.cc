// Fuzz target: the USB reader's line assembly, fed a sequence of reads. Whatever the
// reads, every byte read is dispatched once, in order, or still gathered; only a failed
// read drops the byte before it (the dispatch is one shorter then), and no line is
// longer than 2048 bytes.
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <string>

#include "core/dispatch.h"
#include "core/line_gather.h"

extern "C" int LLVMFuzzerTestOneInput(const uint8_t *data, size_t size) {
    char buf[kLineSize] = {0};
    int offset = 0;
    std::string read_so_far, accounted;  // bytes read; bytes dispatched, ignored or dropped
    size_t at = 0;
    while (at < size) {
        // One read: a length byte (0xFF a failed read, 0 end of file), then that many bytes.
        uint8_t want = data[at++];
        if (offset == 0) memset(buf, 0, sizeof buf);
        ssize_t n;
        if (want == 0xFF) {
            n = -1;
        } else {
            size_t room = static_cast<size_t>(usb_read_room(offset));
            size_t got = want;
            if (got > size - at) got = size - at;
            if (got > room) got = room;
            memcpy(buf + offset, data + at, got);
            at += got;
            n = static_cast<ssize_t>(got);
            read_so_far.append(buf + offset, got);
        }
        int before = offset, total = 0;
        switch (usb_gather(buf, &offset, n, &total)) {
            case Gathered::Partial:
                if (offset <= before || offset > kLineSize - 1) abort();
                break;
            case Gathered::LoneLineEnd:
                accounted.append(buf, 1);
                if (n < 0) accounted += read_so_far[accounted.size()];  // the dropped byte
                break;
            case Gathered::Line: {
                if (total < 2 || total > kLineSize - 1) abort();
                accounted.append(buf, static_cast<size_t>(total));
                if (n < 0) accounted += read_so_far[accounted.size()];  // the dropped byte
                char copy[kLineSize] = {0};
                memcpy(copy, buf, static_cast<size_t>(total));
                const char *line = trim_string(copy, total);
                if (line < copy || line > copy + total) abort();
                break;
            }
            case Gathered::PortDead:
                if (before > 1) abort();  // something gathered would have been dispatched
                if (before == 1) accounted += read_so_far[accounted.size()];
                break;
        }
        if (offset != 0 && offset != static_cast<int>(read_so_far.size() - accounted.size())) abort();
        if (read_so_far.compare(0, accounted.size(), accounted) != 0) abort();
    }
    return 0;
}
