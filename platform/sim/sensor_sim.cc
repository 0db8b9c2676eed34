// The sensor test library on the simulated phone. Each test's outcome comes from the
// key=value script <root>/.sim/sensor: "<test>=<success>,<word 1>,<word 2>,..." fills the
// record, "<test>=absent" reports the part as missing, and an unlisted test passes with
// zero values. The fault "sensor" makes every part missing. Every run is recorded as
// "sensor test <n> -> <return> success=<word 0>".
#include <cstdlib>
#include <cstring>
#include <sstream>
#include <string>

#include "platform/log.h"
#include "platform/sensor.h"
#include "platform/sim/sim.h"

extern "C" {

long kael_sensor_factory_test(int test, SensorTestResult *result, int, int) {
    std::string script;
    bool listed = sim::read_kv(sim::state("sensor"), std::to_string(test), script);
    long rc = 0;
    if (sim::fault("sensor") || (listed && script == "absent") || result == nullptr) {
        rc = -1;
    } else {
        memset(result, 0, sizeof *result);
        result->success = 1;
        if (listed) {
            std::istringstream in(script);
            std::string field;
            for (int word = 0; word < 29 && std::getline(in, field, ','); ++word) {
                if (word == 0) result->success = static_cast<uint32_t>(strtoul(field.c_str(), nullptr, 0));
                else result->value[word - 1] = strtof(field.c_str(), nullptr);
            }
        }
    }
    sim::record("sensor", "test " + std::to_string(test) + " -> " + std::to_string(rc) +
                              (rc == 0 ? " success=" + std::to_string(result->success) : ""));
    return rc;
}

void show_sensor_test_result(const SensorTestResult *r) {
    if (!r) return;
    LOGD("sensor result: success=%u data=%f,%f,%f,%f,%f,%f", r->success, r->value[0], r->value[1], r->value[2], r->value[3],
         r->value[4], r->value[5]);
}

}  // extern "C"
