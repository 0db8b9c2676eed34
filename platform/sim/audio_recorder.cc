// The recorder of the simulated phone. On a phone, starting a recording test case opens a
// microphone (main, sub, smart-amplifier feedback, headset or both main ones) and streams
// its samples into a WAV file under /sdcard/engineermode until the case is stopped. The
// model writes silence: a 16-bit mono 8 kHz file whose length is the time between start
// and stop on the host's clock, so a station can read how long a take really lasted. It
// leaves out the sound itself, the gain, and the microphone routing.
#include "platform/sim/audio_recorder.h"

#include <sys/time.h>

#include <cstdlib>
#include <filesystem>
#include <string>

#include "platform/sim/sim.h"

namespace sim {
namespace {

constexpr unsigned kRate = 8000;         // samples per second
constexpr unsigned kBytesPerMs = 16;     // 8 samples of 2 bytes
constexpr long long kMaxKeptMs = 120000;

std::string le32(unsigned v) { return {char(v), char(v >> 8), char(v >> 16), char(v >> 24)}; }
std::string le16(unsigned v) { return {char(v), char(v >> 8)}; }

std::string wav(unsigned data_bytes) {
    return "RIFF" + le32(36 + data_bytes) + "WAVEfmt " + le32(16) + le16(1) + le16(1) + le32(kRate) +
           le32(kRate * 2) + le16(2) + le16(16) + "data" + le32(data_bytes) + std::string(data_bytes, '\0');
}

long long host_ms() {
    struct timeval tv {};
    ::gettimeofday(&tv, nullptr);
    return tv.tv_sec * 1000LL + tv.tv_usec / 1000;
}

// Start times of running recordings, by test case: <root>/.sim/recorder.
std::string started_file() { return state("recorder"); }

}  // namespace

const char *recorder_file(int test_case) {
    switch (test_case) {
        case 51: return "/sdcard/engineermode/main-record.wav";
        case 52: return "/sdcard/engineermode/sub-record.wav";
        case 53: return "/sdcard/engineermode/smart-record.wav";
        case 54: return "/sdcard/engineermode/hp-record.wav";
        case 55: return "/sdcard/engineermode/double-record.wav";
        default: return nullptr;
    }
}

void recorder_start(int test_case) {
    const char *device_file = recorder_file(test_case);
    if (device_file == nullptr) return;
    std::string file = map(device_file);
    std::error_code ec;
    std::filesystem::create_directories(std::filesystem::path(file).parent_path(), ec);
    write_file_atomic(file, wav(0));
    std::string start = std::to_string(host_ms());
    write_kv(started_file(), std::to_string(test_case), &start);
    record("recorder", std::string("start ") + device_file);
}

void recorder_stop(int test_case) {
    const char *device_file = recorder_file(test_case);
    std::string start;
    if (device_file == nullptr || !read_kv(started_file(), std::to_string(test_case), start)) return;
    write_kv(started_file(), std::to_string(test_case), nullptr);
    long long ms = host_ms() - strtoll(start.c_str(), nullptr, 10);
    if (ms < 0) ms = 0;
    // A take forgotten for hours would fill the sandbox; the file keeps its first minutes.
    long long kept = ms < kMaxKeptMs ? ms : kMaxKeptMs;
    write_file_atomic(map(device_file), wav(static_cast<unsigned>(kept) * kBytesPerMs));
    record("recorder", std::string("stop ") + device_file + " " + std::to_string(ms) + " ms");
}

}  // namespace sim
