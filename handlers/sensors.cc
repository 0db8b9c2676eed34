// Motion-sensor tests: accelerometer, gyroscope and magnetometer calibration, self-checks
// and readings, the accelerometer's z-axis stream and the infrared poll status. Every
// measurement is one run of the sensor library's numbered test. The one thing to know:
// calibrations and self-checks started with the "_SNS_" forms run on detached workers that
// answer nothing; the station learns their outcome only from a property ("2" running,
// "1" passed, "0" failed), so every path of those functions must leave it at "1" or "0".
#include <errno.h>
#include <pthread.h>
#include <unistd.h>

#include <array>
#include <atomic>
#include <bit>
#include <climits>
#include <cmath>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <memory>
#include <mutex>

#include "core/command_tables/handlers.h"
#include "core/nv.h"
#include "core/port_state.h"
#include "core/response.h"
#include "core/workers.h"
#include "handlers/common.h"
#include "platform/android.h"
#include "platform/device.h"
#include "platform/factory.h"
#include "platform/log.h"
#include "platform/sensor.h"

namespace {

// Sensor test numbers: which command runs which test is fixed; what each measures is the
// library's business.
constexpr int kGsensorCalibrate = 48;
constexpr int kGsensorData = 49;
constexpr int kGsensorSelfCheck = 51;
constexpr int kGsensorCalValues = 96;
constexpr int kGyroCalibrate = 80;
constexpr int kGyroData = 81;
constexpr int kGyroSelfCheck = 83;
constexpr int kGyroCalValues = 97;
constexpr int kMsensorData3 = 64;
constexpr int kMsensorData2 = 65;
constexpr int kMsensorSelfTest = 66;
constexpr int kIrPollStatus = 519;

constexpr const char *kGsCalFlag = "persist.sys.gs_cal_flag";
constexpr const char *kGsCheck = "sys.gsensor.check";
constexpr const char *kGyroCalFlag = "persist.sys.gyroscope_cal_flag";
constexpr const char *kGyroCheck = "sys.gyroscope.check";

// The gyroscope's radians-to-degrees divisor has always been one float step below pi;
// the values the station compares against were made with it.
constexpr float kGyroPi = 3.1415925f;
static_assert(std::bit_cast<uint32_t>(kGyroPi) == 0x40490FDA);

constexpr useconds_t kStreamPeriodUs = 200 * 1000;
// One stream text: "\r\n" and the z value, at most 9 characters kept.
constexpr size_t kStreamTextSize = 10;
// The calibration file's text, at most 29 characters kept.
constexpr size_t kCalTextSize = 30;

// A calibration: where its result goes.
struct Calibration {
    const char *property;
    int test;
    size_t nv_flag, nv_offsets;
    const char *file;
    const char *chmod;  // the test app reads the file as another user
    const char *item;
};

constexpr Calibration kGsensorCalibration{
    kGsCalFlag, kGsensorCalibrate, nv::kGsensorCalFlag, nv::kGsensorCalOffsets,
    "/data/vendor/engineermode/accelerometer_calibration",
    "chmod 0666 /data/vendor/engineermode/accelerometer_calibration", "gsensor_calibration"};
constexpr Calibration kGyroCalibration{
    kGyroCalFlag, kGyroCalibrate, nv::kGyroCalFlag, nv::kGyroCalOffsets,
    "/data/vendor/engineermode/gyroscope_calibration",
    "chmod 0666 /data/vendor/engineermode/gyroscope_calibration", "gyroscope_calibration"};

// A reading of three values answered on one line.
struct Reading {
    const char *line;
    int test;
    bool hundredths;  // "%.2f" rather than "%.f"
    bool marks_gs_cal;  // a reading that ran but failed sets kGsCalFlag to "2"
};

constexpr std::array<Reading, 4> kGsensorReadings{{
    {"AT+QXZLJC=0,3", kGsensorData, true, true},
    {"AT+QXZLJC=0,8", 98, false, false},
    {"AT+QXZLJC=0,9", 101, false, false},
    {"AT+QXZLJC=0,a", 102, false, false},
}};
constexpr Reading kGyroReading{"AT+QXTLY=8", 99, false, false};
constexpr Reading kMsensorReading2{"AT+QXDZLP=2", kMsensorData2, true, true};
constexpr Reading kMsensorReading3{"AT+QXDZLP=3", kMsensorData3, false, true};

// 1 while the z-axis stream is meant to run. Only AT+QXZLJC=0,0 clears it; the stream
// reads it once per reading. Atomic so that the unlocked sharing is well defined.
std::atomic<unsigned char> g_gsensor_stream{0};
// Set by the first gyroscope self-check that passes; never cleared.
std::atomic<unsigned char> g_gyro_check_passed{0};

std::mutex g_calibration_results;

struct FreeResult {
    void operator()(SensorTestResult *r) const { free(r); }
};
using ResultPtr = std::unique_ptr<SensorTestResult, FreeResult>;

// A zero-filled record from the heap, freed on every path; null when memory is short.
ResultPtr new_result() { return ResultPtr(static_cast<SensorTestResult *>(calloc(1, sizeof(SensorTestResult)))); }

// Runs a test into r; false when the part is absent or not the expected one. Only the
// low 32 bits of the library's answer count.
bool run_test(int test, SensorTestResult *r) {
    long rc = kael_sensor_factory_test(test, r, 0, 0);
    LOGI("kael_sensor_factory_test(%d) = %ld success=%u", test, rc, r->success);
    return static_cast<uint32_t>(rc) == 0;
}

bool passed(const SensorTestResult &r) { return r.success == 1; }

// Float to int by truncation toward zero. The library's values are small, but one out of
// int range (or not a number) would make the plain conversion undefined, so it saturates.
int trunc_to_int(float v) {
    if (std::isnan(v)) return 0;
    if (v >= 2147483648.0f) return INT_MAX;
    if (v <= -2147483648.0f) return INT_MIN;
    return static_cast<int>(v);
}

int malloc_fail(char *resp) {
    LOGE("malloc fail!");
    quote_reason(resp, "malloc fail");
    return RC_ERROR;
}

int material_mismatch(char *resp) {
    LOGE("material mismatch");
    quote_reason(resp, "material mismatch");
    return RC_ERROR;
}

void set_prop(const char *name, const char *value) { kaelatcmd_set_system_property(name, value); }

// Unit conversion in place, all in single precision. "zhongli": words 4-6 are the
// accelerometer values scaled by 1000/1024 and truncated. "tly": words 4-6 the gyroscope
// values as read, 7-9 scaled by 70/1000 and truncated, 10-12 turned into degrees.
void change_data(SensorTestResult &r, const char *mode) {
    const float v[3] = {sensor_word(r, kSensorX), sensor_word(r, kSensorY), sensor_word(r, kSensorZ)};
    if (line_is(mode, "zhongli")) {
        for (int i = 0; i < 3; ++i) set_sensor_word(r, 4 + i, std::trunc(v[i] * 1000.0f * 0.0009765625f));
    } else if (line_is(mode, "tly")) {
        for (int i = 0; i < 3; ++i) {
            set_sensor_word(r, 4 + i, v[i]);
            set_sensor_word(r, 7 + i, std::trunc(v[i] * 70.0f / 1000.0f));
            set_sensor_word(r, 10 + i, v[i] * 180.0f / kGyroPi);
        }
    }
}

// The calibration file the test app reads: "x y z 0  ov", no line end.
void write_calibration_file(const Calibration &c, const int offsets[3]) {
    char text[kCalTextSize];
    snprintf(text, sizeof text, "%d %d %d 0  ov", offsets[0], offsets[1], offsets[2]);
    FILE *f = dev::fopen(c.file, "w");
    if (f == nullptr) {
        LOGE("Open %s error:%s", c.file, strerror(errno));
        return;  // the NV record holds the result; the file is only a copy for the test app
    }
    dev::shell(c.chmod);
    fwrite(text, 1, strlen(text), f);
    fclose(f);
}

int calibrate(const Calibration &c, char *resp) {
    set_prop(c.property, "2");
    ResultPtr r = new_result();
    if (!r) {
        set_prop(c.property, "0");
        return malloc_fail(resp);
    }
    if (!run_test(c.test, r.get())) {
        set_prop(c.property, "0");
        return material_mismatch(resp);
    }
    if (!passed(*r)) {
        set_prop(c.property, "0");
        return RC_ERROR;
    }
    const int offsets[3] = {trunc_to_int(sensor_word(*r, kSensorX)), trunc_to_int(sensor_word(*r, kSensorY)),
                            trunc_to_int(sensor_word(*r, kSensorZ))};
    // Calibration workers run outside the dispatch mutex, and the accelerometer's and the
    // gyroscope's may run at once: their read-change-write of the one NV record and their
    // files are taken in turn, so neither result overwrites the other's.
    std::lock_guard<std::mutex> one_result_at_a_time(g_calibration_results);
    nv::Update u = nv::update([&](nv::Record &rec) {
        for (int i = 0; i < 3; ++i) rec.set_i32(c.nv_offsets + 4 * i, offsets[i]);
        rec.set_i32(c.nv_flag, 1);
    });
    if (u != nv::Update::Ok) {
        if (u == nv::Update::ReadFailed) LOGE("Read backup fail");
        else LOGE("Put pyxa_nv from backup fail");
        set_prop(c.property, "0");
        return RC_ERROR;
    }
    write_calibration_file(c, offsets);
    set_prop(c.property, "1");
    set_calibrate_item_state(c.item, "1", is_uart_flag);
    return RC_OK;
}

int self_check(const char *property, int test, char *resp) {
    ResultPtr r = new_result();
    if (!r) {
        set_prop(property, "0");
        return malloc_fail(resp);
    }
    set_prop(property, "2");
    if (!run_test(test, r.get())) {
        set_prop(property, "0");
        return material_mismatch(resp);
    }
    set_prop(property, passed(*r) ? "1" : "0");
    return passed(*r) ? RC_OK : RC_ERROR;
}

int gsensor_calibration_function(char *resp) { return calibrate(kGsensorCalibration, resp); }
int gyroscope_calibration_function(char *resp) { return calibrate(kGyroCalibration, resp); }
int gsensor_selfcheck_function(char *resp) { return self_check(kGsCheck, kGsensorSelfCheck, resp); }
int gyroscope_selfcheck_function(char *resp) { return self_check(kGyroCheck, kGyroSelfCheck, resp); }

// A worker's function answers into a private buffer: nothing reaches the source. It is
// as large as a response body so that the functions' bounded writes always fit.
void run_unanswered(int (*fn)(char *)) {
    std::array<char, kRespSize> resp{};
    fn(resp.data());
}

void end_worker() {
    LOGI("Exit");
    pthread_detach(pthread_self());
}

void *gsensor_calibration_thread(void *) {
    LOGI("start");
    run_unanswered(gsensor_calibration_function);
    end_worker();
    return nullptr;
}

void *gsensor_selfcheck_thread(void *) {
    LOGI("start");
    run_unanswered(gsensor_selfcheck_function);
    end_worker();
    return nullptr;
}

void *gyroscope_calibration_thread(void *) {
    LOGI("start");
    run_unanswered(gyroscope_calibration_function);
    end_worker();
    return nullptr;
}

void *gyroscope_selfcheck_thread(void *) {
    LOGI("start");
    run_unanswered(gyroscope_selfcheck_function);
    end_worker();
    return nullptr;
}

// ATOK at once; the worker's outcome is read back from its property.
int start_unanswered(void *(*worker)(void *), char *resp) {
    int rc = start_worker(worker, nullptr);
    if (rc != 0) {
        LOGE("pthread_create fail: %d", rc);
        quote_reason(resp, "pthread_create fail");
        return RC_ATNG;
    }
    return RC_ATOK;
}

int answer_property(const char *name, char *resp) {
    char value[PROPERTY_VALUE_MAX] = {0};
    kaelatcmd_get_system_property(name, value, "-1");
    quote_reason(resp, value);
    return RC_ATOK;
}

// Without it, a stop and a new start within one period would give the station two
// readings each period.
WorkerGeneration g_gsensor_generation;

void *update_gsensor_z_thread(void *arg) {
    LOGI("start");
    wait_for_current_answer();
    while (g_gsensor_stream.load() == 1 && g_gsensor_generation.current(arg)) {
        ResultPtr r = new_result();
        if (!r) {
            LOGE("malloc fail!");
            break;
        }
        run_test(kGsensorData, r.get());
        if (!passed(*r)) break;  // the flag stays set: no new stream until AT+QXZLJC=0,0
        char text[kStreamTextSize];
        snprintf(text, sizeof text, "\r\n%.f", sensor_word(*r, kSensorZ));
        r.reset();
        writeDataToSerial(text, static_cast<int>(strlen(text)));
        usleep(kStreamPeriodUs);
    }
    end_worker();
    return nullptr;
}

int start_z_stream() {
    if (g_gsensor_stream.load() == 1) {
        LOGI("running");
        return RC_OK;
    }
    g_gsensor_stream = 1;
    int rc = start_worker(update_gsensor_z_thread, g_gsensor_generation.next());
    if (rc != 0) {
        // The flag stays set, as after a stream that a failed reading ended: only
        // AT+QXZLJC=0,0 clears it.
        LOGE("fail to create gps_test_thread errno:%d,%d", rc, errno);
        return RC_ERROR;
    }
    return RC_OK;
}

int read_three(const Reading &f, char *resp) {
    ResultPtr r = new_result();
    if (!r) return malloc_fail(resp);
    if (!run_test(f.test, r.get())) return material_mismatch(resp);
    if (!passed(*r)) {
        if (f.marks_gs_cal) set_prop(kGsCalFlag, "2");
        return RC_ERROR;
    }
    const float x = sensor_word(*r, kSensorX), y = sensor_word(*r, kSensorY), z = sensor_word(*r, kSensorZ);
    if (f.hundredths) body_printf(resp, "\"%.2f,%.2f,%.2f\"\r\n", x, y, z);
    else body_printf(resp, "\"%.f,%.f,%.f\"\r\n", x, y, z);
    return RC_OK;
}

// AT+QXZLJC=0,7: the reading as read and converted, and the calibration values.
int gsensor_report(char *resp) {
    ResultPtr data = new_result();
    if (!data) return malloc_fail(resp);
    ResultPtr cal = new_result();
    if (!cal) return malloc_fail(resp);
    bool data_ran = run_test(kGsensorData, data.get());
    bool cal_ran = run_test(kGsensorCalValues, cal.get());
    if (!data_ran && !cal_ran) return material_mismatch(resp);
    if (!passed(*data)) {
        set_prop(kGsCalFlag, "2");
        return RC_ERROR;
    }
    change_data(*data, "zhongli");
    const SensorTestResult &d = *data, &c = *cal;
    body_printf(resp, "+orig:\"%.f,%.f,%.f\"\r\n+switch:\"%.f,%.f,%.f\"\r\n+cal:\"%.f,%.f,%.f\"\r\n", sensor_word(d, 1),
                sensor_word(d, 2), sensor_word(d, 3), sensor_word(d, 4), sensor_word(d, 5), sensor_word(d, 6),
                sensor_word(c, 1), sensor_word(c, 2), sensor_word(c, 3));
    return RC_OK;
}

// AT+QXTLY=3: as the accelerometer's, but either test passing is enough.
int gyroscope_report(char *resp) {
    ResultPtr data = new_result();
    if (!data) return malloc_fail(resp);
    ResultPtr cal = new_result();
    if (!cal) return malloc_fail(resp);
    bool data_ran = run_test(kGyroData, data.get());
    show_sensor_test_result(cal.get());  // the empty record first: line logs are compared
    bool cal_ran = run_test(kGyroCalValues, cal.get());
    if (!data_ran && !cal_ran) return material_mismatch(resp);
    if (!passed(*data) && !passed(*cal)) return RC_ERROR;
    change_data(*data, "tly");
    const SensorTestResult &d = *data, &c = *cal;
    float scaled[3];
    for (int i = 0; i < 3; ++i) scaled[i] = sensor_word(c, 1 + i) * 70.0f / 1000.0f;
    body_printf(resp, "+orig:\"%.f,%.f,%.f\"\r\n+switch:\"%.f,%.f,%.f\"\r\n+cal:\"%.2f,%.2f,%.2f\"\r\n", sensor_word(d, 4),
                sensor_word(d, 5), sensor_word(d, 6), sensor_word(d, 7), sensor_word(d, 8), sensor_word(d, 9),
                scaled[0], scaled[1], scaled[2]);
    return RC_OK;
}

int gsensor_calibration_flag(char *resp) {
    nv::Record rec;
    if (!nv::read(rec)) {
        LOGE("get_PYXA_NV_item fail");
        return RC_ERROR;
    }
    body_printf(resp, "\"%d\"\r\n", rec.i32(nv::kGsensorCalFlag));
    return RC_OK;
}

// A test read back by its success word only, with an empty body.
int pass_or_error(int test, char *resp) {
    ResultPtr r = new_result();
    if (!r) return malloc_fail(resp);
    if (!run_test(test, r.get())) return material_mismatch(resp);
    return passed(*r) ? RC_OK : RC_ERROR;
}

}  // namespace

int gsensor_handler(char *cmd, int, char *resp) {
    resp[0] = '\0';
    if (line_is(cmd, "AT+QXZLJC=0,1")) return start_z_stream();
    if (line_is(cmd, "AT+QXZLJC=0,5")) return gsensor_calibration_function(resp);
    if (line_is(cmd, "AT+QX_SNS_GRA=0,0")) return start_unanswered(gsensor_calibration_thread, resp);
    if (line_is(cmd, "AT+QX_SNS_GRA=0,1")) return answer_property(kGsCalFlag, resp);
    if (line_is(cmd, "AT+QXZLJC=0,6")) return gsensor_selfcheck_function(resp);
    if (line_is(cmd, "AT+QX_SNS_GRAV=1,0")) return start_unanswered(gsensor_selfcheck_thread, resp);
    if (line_is(cmd, "AT+QX_SNS_GRAV=1,1")) return answer_property(kGsCheck, resp);
    if (line_is(cmd, "AT+QXZLJC=0,0")) {
        g_gsensor_stream = 0;  // the stream ends after its current reading
        return RC_OK;
    }
    if (line_is(cmd, "AT+QXZLJC=0,2")) return gsensor_calibration_flag(resp);
    if (line_is(cmd, "AT+QXZLJC=0,7")) return gsensor_report(resp);
    for (const Reading &f : kGsensorReadings)
        if (line_is(cmd, f.line)) return read_three(f, resp);
    return invalid_command(cmd);
}

int gyroscope_calibration_handler(char *cmd, int, char *resp) {
    resp[0] = '\0';
    if (line_is(cmd, "AT+QXTLY=0")) return gyroscope_calibration_function(resp);
    if (line_is(cmd, "AT+QX_SNS_GYR=0,0")) return start_unanswered(gyroscope_calibration_thread, resp);
    if (line_is(cmd, "AT+QX_SNS_GYR=0,1")) return answer_property(kGyroCalFlag, resp);
    if (line_is(cmd, "AT+QXTLY=2")) {
        // In AT mode a phone whose gyroscope has passed once is not checked again.
        if (g_gyro_check_passed.load() == 1 && is_sp == 1) {
            LOGI("check_pass");
            return RC_ATOK;
        }
        int rc = gyroscope_selfcheck_function(resp);
        if (rc == RC_OK) g_gyro_check_passed = 1;
        return rc;
    }
    if (line_is(cmd, "AT+QX_SNS_GYR=1,0")) return start_unanswered(gyroscope_selfcheck_thread, resp);
    if (line_is(cmd, "AT+QX_SNS_GYR=1,1")) return answer_property(kGyroCheck, resp);
    if (line_is(cmd, "AT+QXTLY=3")) return gyroscope_report(resp);
    if (line_is(cmd, kGyroReading.line)) return read_three(kGyroReading, resp);
    return invalid_command(cmd);
}

int msensor_test_handler(char *cmd, int, char *resp) {
    resp[0] = '\0';
    if (line_is(cmd, "AT+QXDZLP=1")) return RC_OK;
    if (line_is(cmd, kMsensorReading2.line)) return read_three(kMsensorReading2, resp);
    // Stations send this form with trailing characters of their own: only the start counts.
    if (line_starts(cmd, kMsensorReading3.line, 11)) return read_three(kMsensorReading3, resp);
    if (line_is(cmd, "AT+QXDZLP=4")) return pass_or_error(kMsensorSelfTest, resp);
    if (line_is(cmd, "AT+QXDZLP=0")) return RC_OK;
    return invalid_command(cmd);
}

int hw_poll_status_handler(char *cmd, int, char *resp) {
    if (!line_is(cmd, "AT+QX_IR_POLL_STATUS=0")) return invalid_command(cmd);
    ResultPtr r = new_result();
    if (!r) return malloc_fail(resp);
    if (!run_test(kIrPollStatus, r.get())) return material_mismatch(resp);
    if (!passed(*r)) return RC_ERROR;
    body_printf(resp, "\"%d,%d\"", trunc_to_int(sensor_word(*r, 2)), trunc_to_int(sensor_word(*r, 3)));
    return RC_OK;
}
