#pragma once
// Checks that every handler family's tests share.
#include <gtest/gtest.h>

#include <chrono>
#include <functional>
#include <string>
#include <thread>
#include <vector>

// The answer frame of a line: echo, body and result word, each followed by CR LF.
inline std::string frame(const std::string &line, const std::string &body, const std::string &word) {
    return line + "\r\n" + body + "\r\n" + word + "\r\n";
}

// A factory NV record whose every byte is non-zero (first + i % period): a cleared or stray field shows.
inline std::string nv_fill(unsigned char first, unsigned period) {
    std::string nv(1012, '\0');
    for (size_t i = 0; i < nv.size(); ++i) nv[i] = static_cast<char>(first + i % period);
    return nv;
}

// Polls until done() holds, for at most ms: effects of other threads are awaited, never slept for.
inline bool wait_until(const std::function<bool()> &done, int ms = 3000) {
    for (auto end = std::chrono::steady_clock::now() + std::chrono::milliseconds(ms);;) {
        if (done()) return true;
        if (std::chrono::steady_clock::now() >= end) return false;
        std::this_thread::sleep_for(std::chrono::milliseconds(10));
    }
}

// The texts stand in the log in this order (each after the end of the one before).
inline void expect_in_order(const std::string &log, const std::vector<std::string> &texts) {
    size_t at = 0;
    for (const auto &t : texts) {
        size_t pos = log.find(t, at);
        ASSERT_NE(pos, std::string::npos) << "missing in order: " << t << "\n" << log;
        at = pos + t.size();
    }
}
