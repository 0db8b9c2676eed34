#pragma once
// Small helpers of the simulated libraries that fill the caller's C buffers.
#include <algorithm>
#include <cstring>
#include <sstream>
#include <string>
#include <vector>

namespace sim {

inline std::string opt(const char *s) { return s ? s : ""; }

// Copies text into a C buffer of size bytes, cut to fit; the count copied.
inline int put(char *buf, int size, const std::string &text) {
    if (!buf || size <= 0) return 0;
    size_t n = std::min(text.size(), static_cast<size_t>(size - 1));
    memcpy(buf, text.data(), n);
    buf[n] = '\0';
    return static_cast<int>(n);
}

inline std::vector<std::string> split(const std::string &s, char sep) {
    std::vector<std::string> out;
    std::string cur;
    std::istringstream in(s);
    while (std::getline(in, cur, sep)) out.push_back(cur);
    return out;
}

}  // namespace sim
