#pragma once
// The maker's sensor test library: one entry point that runs a numbered sensor test
// synchronously and fills a result record.
#include <cstdint>

// The result record: 29 consecutive 32-bit words. Word 0 is the success word (1 when
// the test passed); words 1 to 28 are floats, value[n - 1] holding word n.
typedef struct SensorTestResult {
    uint32_t success;
    float value[28];
} SensorTestResult;

static_assert(sizeof(SensorTestResult) == 116, "the library fills exactly 116 bytes");

extern "C" {

// Runs sensor test number test into result (which the caller zero-fills); the two last
// arguments are always 0. The low 32 bits are 0 when the test could be run; nonzero
// means the sensor part is absent or not the expected one.
long kael_sensor_factory_test(int test, SensorTestResult *result, int arg1, int arg2);
// Logs a result record; no other effect.
void show_sensor_test_result(const SensorTestResult *result);

}  // extern "C"

// Word numbers of the record as the handlers name them. Word 0 is success; words 1 to 28
// live in value[] one place lower, and sensor_word() is the only place that knows it.
enum SensorWord : int { kSensorX = 1, kSensorY = 2, kSensorZ = 3 };

inline float sensor_word(const SensorTestResult &r, int word) { return r.value[word - 1]; }
inline void set_sensor_word(SensorTestResult &r, int word, float v) { r.value[word - 1] = v; }
