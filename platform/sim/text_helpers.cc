// The factory library's text helpers: the same on the simulated phone as on the phone.
#include <errno.h>
#include <fcntl.h>

#include <cctype>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string>
#include <vector>
#include <algorithm>

#include "platform/android.h"
#include "platform/device.h"
#include "platform/factory.h"
#include "platform/sim/cbuf.h"
#include "platform/sim/script.h"
#include "platform/sim/sim.h"

using sim::opt;
using sim::put;
using sim::split;

extern "C" {

char *substring(char *text) {
    if (!text) return text;
    auto trimmed = [](char c) { return c == ' ' || c == '"' || c == '\t' || c == '\r' || c == '\n'; };
    size_t len = strlen(text), start = 0;
    while (start < len && trimmed(text[start])) ++start;
    while (len > start && trimmed(text[len - 1])) --len;
    memmove(text, text + start, len - start);
    text[len - start] = '\0';
    return text;
}

bool is_hex_string(const char *text) {
    if (!text || !*text) return false;
    for (const char *p = text; *p; ++p)
        if (!isxdigit(static_cast<unsigned char>(*p))) return false;
    return true;
}


bool isDigitValue(const char *text) {
    if (!text || !*text) return false;
    for (const char *p = text; *p; ++p)
        if (!isdigit(static_cast<unsigned char>(*p))) return false;
    return true;
}

void uppercase_to_lowcase(char *text, int len) {
    if (!text) return;
    for (int i = 0; i < len && text[i]; ++i) text[i] = static_cast<char>(tolower(static_cast<unsigned char>(text[i])));
}

char *get_substring(const char *text, int start, int len) {
    if (!text || start < 0 || len < 0) return nullptr;
    size_t total = strlen(text);
    if (static_cast<size_t>(start) > total) return nullptr;
    size_t n = std::min(total - static_cast<size_t>(start), static_cast<size_t>(len));
    char *out = static_cast<char *>(malloc(n + 1));
    if (!out) return nullptr;
    memcpy(out, text + start, n);
    out[n] = '\0';
    return out;
}

}  // extern "C"
