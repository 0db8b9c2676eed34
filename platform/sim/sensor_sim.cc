// The sensor test library on the simulated phone. On a phone the library drives the
// accelerometer, gyroscope, magnetometer and infrared parts through the sensor hub: a
// numbered test samples or calibrates one part, which takes from a few milliseconds to a
// few seconds, and fills the 116-byte result record. The model has no physics: each test's
// outcome is scripted in the key=value file <root>/.sim/sensor.
//   <test>=<success>,<word 1>,<word 2>,...   fills the record (missing words stay 0)
//   <test>=absent                            reports the part as missing (nonzero return)
//   <test>.ms=<milliseconds>                 how long the test takes (a slow or silent part)
// An unlisted test passes with zero values. The fault "sensor" makes every part missing.
// Every run is recorded, when it ends, as "sensor test <n> -> <return> success=<word 0>",
// and every record the daemon shows as "sensor show success=<word 0> <words 1-3>".
// Left out: noise, drift, sampling rates and the units of the values.
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <sstream>
#include <string>
#include <thread>

#include "platform/log.h"
#include "platform/sensor.h"
#include "platform/sim/sim.h"

namespace {

// A slow part is bounded so that a typing slip in the script cannot hang a test run for hours.
constexpr long kMaxTestMs = 60 * 1000;

// "<success>,<word 1>,..." into the record; the one place that reads the script's form.
void fill_record(const std::string &script, SensorTestResult &r) {
    std::istringstream in(script);
    std::string field;
    for (int word = 0; word < 29 && std::getline(in, field, ','); ++word) {
        if (word == 0) r.success = static_cast<uint32_t>(strtoul(field.c_str(), nullptr, 0));
        else set_sensor_word(r, word, strtof(field.c_str(), nullptr));
    }
}

void take_time(int test) {
    std::string ms;
    if (!sim::read_kv(sim::state("sensor"), std::to_string(test) + ".ms", ms)) return;
    long wait = strtol(ms.c_str(), nullptr, 10);
    if (wait <= 0) return;
    std::this_thread::sleep_for(std::chrono::milliseconds(wait < kMaxTestMs ? wait : kMaxTestMs));
}

}  // namespace

extern "C" {

long kael_sensor_factory_test(int test, SensorTestResult *result, int, int) {
    std::string script;
    bool listed = sim::read_kv(sim::state("sensor"), std::to_string(test), script);
    take_time(test);
    long rc = 0;
    if (sim::fault("sensor") || (listed && script == "absent") || result == nullptr) {
        rc = -1;
    } else {
        memset(result, 0, sizeof *result);
        result->success = 1;
        if (listed) fill_record(script, *result);
    }
    sim::record("sensor", "test " + std::to_string(test) + " -> " + std::to_string(rc) +
                              (rc == 0 ? " success=" + std::to_string(result->success) : ""));
    return rc;
}

void show_sensor_test_result(const SensorTestResult *r) {
    if (!r) return;
    LOGD("sensor result: success=%u data=%f,%f,%f,%f,%f,%f", r->success, r->value[0], r->value[1], r->value[2], r->value[3],
         r->value[4], r->value[5]);
    char detail[96];
    snprintf(detail, sizeof detail, "show success=%u %g,%g,%g", r->success, sensor_word(*r, kSensorX),
             sensor_word(*r, kSensorY), sensor_word(*r, kSensorZ));
    sim::record("sensor", detail);
}

}  // extern "C"
