#pragma once
// Small helpers for the steps every handler family repeats: matching the command line,
// writing the body, asking the test app, reading a node. The NV record's
// read-modify-write lives in core/nv.h.
#include <cstddef>
#include <string_view>
#include <vector>

#include "core/result.h"

// The whole line equals form, without regard to case.
bool line_is(const char *cmd, const char *form);
// The first n characters of the line equal those of form, without regard to case.
bool line_starts(const char *cmd, const char *form, size_t n);

// Bounded formatting into a response body (kRespSize bytes).
int body_printf(char *resp, const char *fmt, ...) __attribute__((format(printf, 2, 3)));
// The common query body: the value quoted on a line of its own, "\r\n\"%s\"\r\n".
int quote_body(char *resp, const char *value);
// A quoted reason without line ends, "\"%s\"".
int quote_reason(char *resp, const char *reason);

// Reads the NV record and answers the 32-bit field at offset as a quoted value; false,
// with nothing written, when the record cannot be read.
bool quote_nv_field(char *resp, size_t offset);

// Logs "invalid command: %s" and answers ERROR with an empty body.
int invalid_command(const char *cmd);

// Sends a message to the test app; the reply or nullptr, logged either way.
const char *ask_test_app(const char *message);
// True when the test app replied exactly "ok" (a silent app never does).
bool test_app_ok(const char *message);

// Reads at most size-1 bytes of a node into buf and terminates it; false on failure.
bool read_node(const char *path, char *buf, size_t size);

// The non-empty comma-separated fields of a line, as a tokeniser sees them: "1,,0" has
// two fields, and the first field is the command with its "=" part.
std::vector<std::string_view> comma_fields(std::string_view line);
