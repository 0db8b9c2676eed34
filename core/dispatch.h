#pragma once
#include <cstddef>

#include "core/command_tables/tables.h"

// The entry point of every transport: clean the line, serve it under the dispatch mutex.
void dispatch_command(char *buf, int len, int source_type);
// Offers a line to the modem, sensor and general tables, then the special command;
// 4 when one of them answered, 0 when none did.
int process_cmd_line(char *line);
int qcom_command_hdlr(char *line);
int qcom_samsung_command_hdlr(char *line);
int kael_command_hdlr(char *line);
int special_command(char *line);
char *trim_string(char *buf, int len);
void cut_mutil_command(char *buf);

// One table search; returns 1 when the line was answered there.
int search_command_table(const CommandEntry *table, std::size_t rows, char *line);
// The line that a read error, a hang-up or a vanished station makes the daemon run.
void run_null_line();
