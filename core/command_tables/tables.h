#pragma once
#include <cstddef>
#include <cstdint>

using HandlerFn = int (*)(char *cmd, int arg, char *resp);
using AfterResponseFn = void (*)(char *cmd);

// One row of a command table: constant data, searched in order.
struct CommandEntry {
    char name[32];  // the name as it stands before the first "=" or "?"
    int64_t arg;    // handed to the handler unchanged
    HandlerFn handler;
    AfterResponseFn after_response;  // run only when the handler answered 0
};

extern const CommandEntry modem_table[];
extern const std::size_t modem_table_rows;
extern const CommandEntry sensor_table[];
extern const std::size_t sensor_table_rows;
extern const CommandEntry general_table[];
extern const std::size_t general_table_rows;
