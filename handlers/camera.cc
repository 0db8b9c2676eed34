// Camera tests: open, capture, focus and stop each camera module through the camera
// service, run its own tests and read their results, and read the modules' identities.
// The camera service answers every message with a text; a reply passes when it holds
// "success" anywhere, and a failing reply goes to the station unchanged, because the
// station's operators read the camera's own words. The flash LEDs are in camera_flash.cc.
#include <strings.h>

#include <array>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string>
#include <string_view>

#include "core/command_tables/handlers.h"
#include "core/port_state.h"
#include "handlers/camera.h"
#include "handlers/common.h"
#include "platform/device.h"
#include "platform/factory.h"
#include "platform/log.h"
#include "platform/sensor.h"

namespace {

constexpr char kGateNotice[] = "above RX6290 or RT6203, not support";

constexpr char kPdafMarker[] = "/data/engineermode/pdaf_test";
constexpr char kRefocusMarker[] = "/data/engineermode/refocus_check";
constexpr char kFrontRefocusMarker[] = "/data/engineermode/front_refocus_check";

// On these projects the camera module sits over the proximity sensor, whose LED A must be
// closed while a camera runs and opened again when it stops. Device configuration.
constexpr std::array<const char *, 4> kProximityBlockingProjects{"RX5101", "RX5102", "RT6102", "RT6102_EX"};
constexpr int kProximityCloseLedA = 841;  // PROX_B_CLOSE_LEDA
constexpr int kProximityOpenLedA = 842;   // PROX_B_OPEN_LEDA

// A camera selector of AT+MMICCM. The plain ones open with a start message; the rear
// tele, macro and periscope modules are addressed by name in every message.
struct Selector {
    const char *name;
    const char *start;   // plain dialect: the open message
    const char *module;  // addressed dialect: the module
};

constexpr std::array<Selector, 11> kSelectors{{
    {"B", "start#cameraId back#eng_AT_command true", nullptr},
    {"F", "start#cameraId front#eng_AT_command true", nullptr},
    {"BB", "start#cameraId back#eng_single_camera_test true#eng_AT_command true", nullptr},
    {"BS", "start#cameraId back_sub#eng_single_camera_test true#eng_AT_command true", nullptr},
    {"FB", "start#cameraId front#eng_single_camera_test true#eng_AT_command true", nullptr},
    {"FS", "start#cameraId front_sub#eng_single_camera_test true#eng_AT_command true", nullptr},
    {"BT", "start#cameraId back_trio#eng_single_camera_test true#eng_AT_command true", nullptr},
    {"FT", "start#cameraId front_trio#eng_single_camera_test true#eng_AT_command true", nullptr},
    {"BTELE", nullptr, "tele"},
    {"BMACRO", nullptr, "macro"},
    {"BPERI", nullptr, "peri"},
}};

// The operations every selector offers, with their plain message and failure code.
struct BasicOp {
    int op;
    const char *action;  // plain message, and the action of the addressed one
    int fail_rc;
};

constexpr std::array<BasicOp, 4> kBasicOps{{
    {1, "start", RC_ERROR},
    {2, "capture", RC_ATNG},
    {3, "auto_focus", RC_ATNG},
    {0, "stop", RC_ATNG},
}};

// The forms offered only to projects that are not gated.
enum class Step {
    Ask,          // pass (substring) 0, else the reply and fail_rc
    Mark,         // whole reply "success" creates the marker and 0; else removes it
    Check,        // 0 when the marker exists
    Unsupported,  // logged, ATERROR with an empty body
};

struct GatedForm {
    const char *line;
    Step step;
    const char *message;  // or the marker of a Check
    const char *marker;   // of a Mark
    int fail_rc;
};

constexpr const char *kOisOn = "ois_control#value on#ois_mode ois-still";
constexpr const char *kOisOff = "ois_control#value off#ois_mode ois-centering-on";

constexpr std::array<GatedForm, 19> kGatedForms{{
    {"AT+MMICCM=B,4", Step::Ask, kOisOn, nullptr, RC_ATNG},
    {"AT+MMICCM=BB,4", Step::Ask, kOisOn, nullptr, RC_ATNG},
    {"AT+MMICCM=B,5", Step::Ask, kOisOff, nullptr, RC_ATNG},
    {"AT+MMICCM=BB,5", Step::Ask, kOisOff, nullptr, RC_ATNG},
    {"AT+MMICCM=B,6", Step::Mark, "pdaf_test", kPdafMarker, RC_ATNG},
    {"AT+MMICCM=BB,6", Step::Mark, "pdaf_test", kPdafMarker, RC_ATNG},
    {"AT+MMICCM=B,7", Step::Check, kPdafMarker, nullptr, RC_ATNG},
    {"AT+MMICCM=BB,7", Step::Check, kPdafMarker, nullptr, RC_ATNG},
    {"AT+MMICCM=BTELE,7", Step::Ask, "eng_AT_camera#rear#tele#pdaf_test#NULL#NULL", nullptr, RC_ATNG},
    {"AT+MMICCM=BPERI,7", Step::Ask, "eng_AT_camera#rear#peri#pdaf_test#NULL#NULL", nullptr, RC_ATNG},
    {"AT+MMICCM=BMACRO,7", Step::Unsupported, nullptr, nullptr, RC_ATERROR},
    {"AT+MMICCM=B,8", Step::Mark, "refocus_check", kRefocusMarker, RC_ERROR},
    {"AT+MMICCM=BB,8", Step::Mark, "refocus_check", kRefocusMarker, RC_ERROR},
    {"AT+MMICCM=F,8", Step::Mark, "front_refocus_check", kFrontRefocusMarker, RC_ERROR},
    {"AT+MMICCM=FB,8", Step::Mark, "front_refocus_check", kFrontRefocusMarker, RC_ERROR},
    {"AT+MMICCM=B,9", Step::Check, kRefocusMarker, nullptr, RC_ERROR},
    {"AT+MMICCM=BB,9", Step::Check, kRefocusMarker, nullptr, RC_ERROR},
    {"AT+MMICCM=F,9", Step::Check, kFrontRefocusMarker, nullptr, RC_ERROR},
    {"AT+MMICCM=FB,9", Step::Check, kFrontRefocusMarker, nullptr, RC_ERROR},
}};

// The free-text forms: the camera message is the line's third ","-field.
struct TextForm {
    const char *prefix;
    size_t length;
};

constexpr std::array<TextForm, 12> kTextForms{{
    {"AT+MMICCM=BB,test", 17}, {"AT+MMICCM=BS,test", 17}, {"AT+MMICCM=FB,test", 17}, {"AT+MMICCM=FS,test", 17},
    {"AT+MMICCM=B,test", 16},  {"AT+MMICCM=F,test", 16},  {"AT+MMICCM=BB,para", 17}, {"AT+MMICCM=BS,para", 17},
    {"AT+MMICCM=FB,para", 17}, {"AT+MMICCM=FS,para", 17}, {"AT+MMICCM=B,para", 16},  {"AT+MMICCM=F,para", 16},
}};

constexpr char kLongShotForm[] = "AT+MMICCM=BB,10";
constexpr char kLongShotStop[] = "AT+MMICCM=BB,11";
// The long-shot message was always built in a 48-byte buffer: a count that does not fit
// is cut there rather than written past it.
constexpr size_t kLongShotSize = 48;
constexpr size_t kTextMessageMax = 199;

// The front light-leak test is the one form matched with regard to case: the stations
// send it exactly so, and a lower-case variant has always been refused.
constexpr char kLightLeakForm[] = "AT+MMICCM=F,11";
constexpr double kLightLeakLimit = 999.0;

// The self test of a camera through the camera service.
// AT+QX_CCM_SLTS=<n>: the form's first 16 characters name the action.
struct SelfTestForm {
    const char *prefix;
    const char *action;
};
constexpr std::array<SelfTestForm, 3> kSelfTestForms{{
    {"AT+QX_CCM_SLTS=1", "auto_test_execute"},
    {"AT+QX_CCM_SLTS=2", "auto_test_set_param"},
    {"AT+QX_CCM_SLTS=3", "auto_test_get_result"},
}};
constexpr size_t kSelfTestResults = 2;  // the form whose reply carries the results
constexpr size_t kSelfTestLineMax = 4095;
constexpr size_t kCameraMessageSize = 1024;

// The fitted cameras whose OTP memory AT+QX_CCM_OTP=1 checks, in order. The rear macro
// camera has no status property of its own and is checked with the rear wide one.
struct OtpCamera {
    int facing;  // 1 front, 0 rear
    const char *role;
    const char *property;
};

constexpr std::array<OtpCamera, 7> kOtpCameras{{
    {1, "Master", "sys.camera.front_camera_main_otp_status"},
    {1, "RTBOnly", "sys.camera.front_camera_rtb_otp_status"},
    {1, "Wide", "sys.camera.front_camera_wide_otp_status"},
    {0, "Master", "sys.camera.rear_camera_main_otp_status"},
    {0, "RTBOnly", "sys.camera.rear_camera_rtb_otp_status"},
    {0, "Wide", "sys.camera.rear_camera_wide_otp_status"},
    {0, "Macro", "sys.camera.rear_camera_wide_otp_status"},
}};
constexpr int kOtpBodySize = 128;

struct SerialForm {
    const char *line;
    const char *camera;
};

constexpr std::array<SerialForm, 10> kSerialForms{{
    {"AT+QX_CCM_SN=1,F,MAIN", "front_camera_main"},
    {"AT+QX_CCM_SN=1,F,WIDE", "front_camera_wide"},
    {"AT+QX_CCM_SN=1,F,RTB", "front_camera_rtb"},
    {"AT+QX_CCM_SN=1,R,MAIN", "rear_camera_main"},
    {"AT+QX_CCM_SN=1,R,WIDE", "rear_camera_wide"},
    {"AT+QX_CCM_SN=1,R,RTB", "rear_camera_rtb"},
    {"AT+QX_CCM_SN=1,R,TELE", "rear_camera_tele"},
    {"AT+QX_CCM_SN=1,R,MACRO", "rear_camera_macro"},
    {"AT+QX_CCM_SN=1,R,PERI", "rear_camera_peri"},
    {"AT+QX_CCM_SN=1,R,PORT", "rear_camera_port"},
}};

// The older numbered forms, matched on their first 16 characters.
constexpr std::array<SerialForm, 4> kNumberedSerialForms{{
    {"AT+QX_CCM_SN=0,1", "front_camera_main"},
    {"AT+QX_CCM_SN=0,2", "front_camera_wide"},
    {"AT+QX_CCM_SN=0,3", "rear_camera_main"},
    {"AT+QX_CCM_SN=0,4", "rear_camera_wide"},
}};

constexpr char kIrIdFile[] = "/persist/camera/ir_id_sub";

std::string field_text(std::string_view text, std::string_view seps, size_t n) {
    std::optional<std::string_view> f = nth_field(text, seps, n);
    return f ? std::string(*f) : std::string();
}

// Runs the proximity sensor's LED A test on the projects where the camera covers it;
// RC_OK to go on, else the answer.
int proximity_led_step(int test, char *resp) {
    bool blocking = false;
    for (const char *code : kProximityBlockingProjects) blocking = blocking || is_project(code);
    if (!blocking) return RC_OK;
    auto *result = static_cast<SensorTestResult *>(calloc(1, sizeof(SensorTestResult)));
    if (result == nullptr) {
        LOGE("sensor_test_result malloc fail");
        quote_reason(resp, "sensor_test_result malloc fail");
        return RC_ERROR;
    }
    long rc = kael_sensor_factory_test(test, result, 0, 0);
    free(result);
    if (static_cast<int32_t>(rc) != 0) {
        LOGE("sensor test %d: %ld", test, rc);
        quote_reason(resp, "sensor material mismatch");
        return RC_ERROR;
    }
    return RC_OK;
}

int basic_operation(const Selector &sel, const BasicOp &op, char *resp) {
    if (op.op == 1 || op.op == 0) {
        int rc = proximity_led_step(op.op == 1 ? kProximityCloseLedA : kProximityOpenLedA, resp);
        if (rc != RC_OK) return rc;
    }
    char message[96];
    if (sel.module != nullptr)
        snprintf(message, sizeof message, "eng_AT_camera#rear#%s#%s#NULL#NULL", sel.module, op.op == 1 ? "open" : op.action);
    else
        snprintf(message, sizeof message, "%s", op.op == 1 ? sel.start : op.action);
    return camera_ask(message, resp, op.fail_rc);
}

void touch_marker(const char *marker) {
    char command[128];
    snprintf(command, sizeof command, "/system/bin/sh -c \"touch %s\"", marker);
    dev::shell(command);
}

int gated_step(const GatedForm &form, char *resp) {
    switch (form.step) {
        case Step::Ask:
            return camera_ask(form.message, resp, form.fail_rc);
        case Step::Check:
            return dev::exists(form.message) ? RC_OK : form.fail_rc;
        case Step::Unsupported:
            LOGE("cmdline not support!!");
            return form.fail_rc;
        case Step::Mark: {
            const char *reply = sendMessageToCamera(form.message);
            LOGI("%s reply: %s", form.message, reply ? reply : "(null)");
            if (reply != nullptr && strcasecmp(reply, "success") == 0) {
                touch_marker(form.marker);
                return RC_OK;
            }
            dev::unlink(form.marker);
            return form.fail_rc;
        }
    }
    return RC_ERROR;
}

int long_shot_start(const char *cmd, char *resp) {
    char message[kLongShotSize];
    std::optional<std::string_view> count = nth_field(cmd, ",", 2);
    if (count)
        snprintf(message, sizeof message, "long_shot#value start#number %.*s", static_cast<int>(count->size()), count->data());
    else
        snprintf(message, sizeof message, "long_shot#value start#");
    return camera_ask(message, resp, RC_ERROR);
}

int text_message(const char *cmd, char *resp) {
    std::optional<std::string_view> text = nth_field(cmd, ",", 2);
    if (!text) {
        quote_body(resp, "invalid parameter");
        return RC_ATERROR;
    }
    std::string message(text->substr(0, kTextMessageMax));
    return camera_ask(message.c_str(), resp, RC_ATNG, RC_ATOK);
}

int front_light_leak(char *resp) {
    const char *reply = sendMessageToCamera("front_light_leak");
    LOGI("front_light_leak reply: %s", reply ? reply : "(null)");
    if (!camera_passed(reply)) return RC_ATERROR;
    std::string value = field_text(reply, "#", 2);
    body_printf(resp, "\r\n\"+Light:%s\"\r\n", value.c_str());
    char *end = nullptr;
    double v = strtod(value.c_str(), &end);
    bool number = end != value.c_str();
    return number && v >= -kLightLeakLimit && v <= kLightLeakLimit ? RC_ATOK : RC_ATNG;
}

// AT+QX_CCM_SLTS=<n>,<facing>,<module>,<p1>[,<p2>...]: the camera's own self test.
int camera_self_test(const char *cmd, char *resp, size_t action) {
    std::string_view line(cmd, strnlen(cmd, kSelfTestLineMax));
    std::optional<std::string_view> facing = nth_field(line, " ,#", 1), module = nth_field(line, " ,#", 2),
                                    first = nth_field(line, " ,#", 3);
    if (!nth_field(line, " ,#", 0)) return RC_ERROR;
    // A line without facing, module or first parameter would put no text where the
    // message needs one; it is refused like a line with no field at all.
    if (!facing || !module || !first) {
        LOGE("invalid command: %s", cmd);
        return RC_ERROR;
    }
    std::string tail;
    for (size_t i = 4;; ++i) {
        std::optional<std::string_view> f = nth_field(line, " ,#", i);
        if (!f) break;
        tail += ',';
        tail += *f;
    }
    tail.resize(std::min(tail.size(), kCameraMessageSize));
    std::array<char, kCameraMessageSize> message{};
    snprintf(message.data(), message.size(), "eng_AT_camera#%.*s#%.*s#%s#params %.*s%s", static_cast<int>(facing->size()),
             facing->data(), static_cast<int>(module->size()), module->data(), kSelfTestForms[action].action,
             static_cast<int>(first->size()), first->data(), tail.c_str());
    const char *reply = sendMessageToCamera(message.data());
    LOGI("%s reply: %s", message.data(), reply ? reply : "(null)");
    if (!camera_passed(reply)) {
        body_printf(resp, "%s", reply ? reply : "");
        return RC_ERROR;
    }
    if (action != kSelfTestResults) return RC_ATOK;
    std::string_view text(reply, strnlen(reply, kSelfTestLineMax));
    if (!nth_field(text, "#", 0)) return RC_ERROR;
    std::string body;
    for (size_t i = 2;; ++i) {
        std::optional<std::string_view> f = nth_field(text, "#", i);
        if (!f) break;
        size_t blank = f->find(' ');
        std::string_view key = f->substr(0, blank), value = blank == std::string_view::npos ? "" : f->substr(blank + 1);
        body += "\r\n\"+" + std::string(key) + ":" + std::string(value) + "\"\r\n";
    }
    body_printf(resp, "%s", body.c_str());
    return RC_ATOK;
}

// The newer camera interface: the factory library translates the command into a camera
// message and the reply into the answer; a pass with a calibration item records it.
int newer_camera_command(const char *cmd, char *resp) {
    std::array<char, kCameraMessageSize> message{};
    std::array<char, CAMERA_ITEM_NAME_SIZE> item{};
    if (transform_at_cmd_to_camera_info(cmd, message.data(), static_cast<int>(message.size()), item.data()) == -1) {
        LOGE("transform_at_cmd_to_camera_info failed: %s", cmd);
        return RC_ATERROR;
    }
    message.back() = '\0';
    item.back() = '\0';
    const char *reply = sendMessageToCamera(message.data());
    LOGI("%s reply: %s", message.data(), reply);
    int rc = transform_camera_ret_to_at_resp(reply, resp, static_cast<int>(kCameraMessageSize));
    if (rc != RC_ATOK) return rc;
    if (strlen(item.data()) >= 3) {
        int saved = set_calibrate_item_state(item.data(), "1", is_uart_flag);
        if (saved != 0) {
            LOGE("set_calibrate_item_state(%s): %d", item.data(), saved);
            body_printf(resp, "save_ret=%d", saved);
            return RC_ATNG;
        }
    }
    return RC_ATOK;
}

int otp_status(char *resp) {
    if (!is_support_new_camera_interface()) {
        LOGE("no longer support old scheme");
        return RC_ATNG;
    }
    bool good = true;
    for (const OtpCamera &cam : kOtpCameras) {
        if (!is_support_target_camera(cam.facing, cam.role)) continue;
        bool ok = get_target_camera_otp_status(resp, kOtpBodySize, cam.property) != 0;
        LOGI("%s: %d", cam.property, ok);
        good = good && ok;
    }
    return good ? RC_ATOK : RC_ATNG;
}

// One line of a sensor id node, as fgets reads it (the line end stays).
bool read_sensor_id(const char *path, char *buf, int size) {
    FILE *f = dev::fopen(path, "r");
    if (f == nullptr) return false;
    if (fgets(buf, size, f) == nullptr) buf[0] = '\0';
    fclose(f);
    return true;
}

}  // namespace

bool camera_gated() { return is_above_PD_project(6290) || is_above_TD_project(6203); }

int camera_gate_answer(char *resp) {
    LOGW("%s", kGateNotice);
    body_printf(resp, "%s", kGateNotice);
    return RC_ATERROR;
}

bool camera_passed(const char *reply) { return reply != nullptr && strstr(reply, "success") != nullptr; }

int camera_ask(const char *message, char *resp, int fail_rc, int pass_rc) {
    const char *reply = sendMessageToCamera(message);
    LOGI("%s reply: %s", message, reply ? reply : "(null)");
    if (camera_passed(reply)) return pass_rc;
    body_printf(resp, "%s", reply ? reply : "");
    return fail_rc;
}

std::optional<std::string_view> nth_field(std::string_view text, std::string_view seps, size_t n) {
    size_t at = 0;
    for (size_t i = 0;; ++i) {
        at = text.find_first_not_of(seps, at);
        if (at == std::string_view::npos) return std::nullopt;
        size_t end = text.find_first_of(seps, at);
        if (end == std::string_view::npos) end = text.size();
        if (i == n) return text.substr(at, end - at);
        at = end;
    }
}

int camera_id_handler(char *cmd, int arg, char *resp) {
    if (!line_is(cmd, "AT+QXCCMID=0")) return invalid_command(cmd);
    if (camera_gated()) return camera_gate_answer(resp);
    char front[50] = {0}, back[50] = {0};
    if (!read_sensor_id("sys/ccm/FrontSensorId", front, sizeof front) ||
        !read_sensor_id("sys/ccm/RearSensorId", back, sizeof back)) {
        LOGE("failed to open file");
        return RC_ERROR;
    }
    body_printf(resp, "\r\n\"front:%s\r\nback:%s\"\r\n ", front, back);
    return RC_OK;
}

int set_camera_test_handler_mode(char *cmd, int arg, char *resp) {
    if (camera_gated()) return camera_gate_answer(resp);
    // The switch between test modes does nothing on these phones; stations still send it.
    if (line_is(cmd, "AT+QX_CCM_CVT=1") || line_is(cmd, "AT+QX_CCM_CVT=0")) return RC_OK;
    return invalid_command(cmd);
}

int camera_test_handler(char *cmd, int arg, char *resp) {
    char form[32];
    for (const Selector &sel : kSelectors) {
        for (const BasicOp &op : kBasicOps) {
            snprintf(form, sizeof form, "AT+MMICCM=%s,%d", sel.name, op.op);
            if (line_is(cmd, form)) return basic_operation(sel, op, resp);
        }
    }
    for (const GatedForm &g : kGatedForms) {
        if (!line_is(cmd, g.line)) continue;
        return camera_gated() ? camera_gate_answer(resp) : gated_step(g, resp);
    }
    if (line_starts(cmd, kLongShotForm, sizeof kLongShotForm - 1))
        return camera_gated() ? camera_gate_answer(resp) : long_shot_start(cmd, resp);
    if (line_is(cmd, kLongShotStop))
        return camera_gated() ? camera_gate_answer(resp) : camera_ask("long_shot#value stop#", resp, RC_ERROR);
    for (const TextForm &t : kTextForms) {
        if (!line_starts(cmd, t.prefix, t.length)) continue;
        return camera_gated() ? camera_gate_answer(resp) : text_message(cmd, resp);
    }
    if (strcmp(cmd, kLightLeakForm) == 0) return front_light_leak(resp);
    for (size_t i = 0; i < kSelfTestForms.size(); ++i)
        if (line_starts(cmd, kSelfTestForms[i].prefix, 16)) return camera_self_test(cmd, resp, i);
    return invalid_command(cmd);
}

int camera_fill_light_handler(char *cmd, int arg, char *resp) {
    if (line_is(cmd, "AT+LCML=0,0")) {
        if (camera_gated()) return camera_gate_answer(resp);
        int rc = camera_ask("screen_front_flash#value reset", resp, RC_ERROR);
        return rc != RC_OK ? rc : camera_ask("stop", resp, RC_ERROR);
    }
    if (line_is(cmd, "AT+LCML=0,1")) {
        if (camera_gated()) return camera_gate_answer(resp);
        return camera_ask("start#eng_screen_front_flash true", resp, RC_ERROR);
    }
    if (line_is(cmd, "AT+LCML=1")) return camera_ask("screen_front_flash#value on", resp, RC_ERROR);
    if (line_is(cmd, "AT+LCML=2")) return camera_ask("screen_front_flash#value capture", resp, RC_ERROR);
    LOGE("this at command invalid: %s", cmd);
    return RC_ERROR;
}

int check_camera_status_handler(char *cmd, int arg, char *resp) {
    if (line_is(cmd, "AT+QXCCM=1")) {
        if (camera_gated()) return camera_gate_answer(resp);
        const char *reply = ask_test_app("CameraConnect");
        return reply != nullptr && strcmp(reply, "3") == 0 ? RC_OK : RC_ERROR;
    }
    if (line_is(cmd, "AT+QX_CCM_CONN=1")) {
        if (camera_gated()) return camera_gate_answer(resp);
        char state[50] = "0,0,0,0";  // what the station reads when the tool says nothing
        ext_system("ftcmd_camera", state, sizeof state);
        body_printf(resp, "\"%s\"", state);
        return state[0] == '0' || state[0] == '1' || state[0] == '2' ? RC_ATOK : RC_ATNG;
    }
    return invalid_command(cmd);
}

int get_camera_color_handler(char *cmd, int arg, char *resp) {
    bool single = line_is(cmd, "AT+QX_CCM_COLOR=FB,1") || line_is(cmd, "AT+QX_CCM_COLOR=FS,1") ||
                  line_is(cmd, "AT+QX_CCM_COLOR=BB,1");
    bool rear_sub = line_is(cmd, "AT+QX_CCM_COLOR=BS,1");
    if (!single && !rear_sub) {
        LOGE("invalid command: %s", cmd);
        return RC_ATERROR;
    }
    if (camera_gated()) return camera_gate_answer(resp);
    char rgb[92] = {0};  // the property helper writes up to 92 bytes
    if (rear_sub) kaelatcmd_get_system_property("persist.camera.is_rgb", rgb, "0");
    quote_body(resp, rear_sub && strcmp(rgb, "1") == 0 ? "1" : "2");
    return RC_ATOK;
}

int get_camera_sn_number_handler(char *cmd, int arg, char *resp) {
    for (const SerialForm &f : kSerialForms) {
        if (!line_is(cmd, f.line)) continue;
        char sn[50] = {0};
        int rc = get_camera_info_code("sn_code", f.camera, sn, sizeof sn);
        LOGI("%s sn: %s (%d)", f.camera, sn, rc);
        quote_body(resp, sn);
        return RC_ATOK;
    }
    for (const SerialForm &f : kNumberedSerialForms) {
        if (!line_starts(cmd, f.line, 16)) continue;
        char sn[64] = {0};
        int rc = get_camera_info_code("sn_code", f.camera, sn, sizeof sn);
        LOGI("%s sn: %s (%d)", f.camera, sn, rc);
        quote_body(resp, sn);
        return RC_ATOK;
    }
    LOGE("unknown camera module: %s", cmd);
    return RC_ATERROR;
}

int get_camera_ir_id_handler(char *cmd, int arg, char *resp) {
    if (!line_starts(cmd, "AT+QX_CCM_IRID=0", 16)) return invalid_command(cmd);
    if (camera_gated()) return camera_gate_answer(resp);
    char id[51] = {0};
    if (readFromFile(kIrIdFile, id, 50) < 0) {
        LOGE("%s : not exist", kIrIdFile);
        body_printf(resp, "%s : not exist ", kIrIdFile);
        return RC_ATNG;
    }
    if (id[0] == '0' || id[0] == '2') {
        quote_body(resp, id[0] == '0' ? "1" : "2");
        return RC_ATOK;
    }
    quote_body(resp, id);
    return RC_ATNG;
}

int camera_otp_handler(char *cmd, int arg, char *resp) {
    if (line_is(cmd, "AT+QX_CCM_OTP=1")) return otp_status(resp);
    if (line_starts(cmd, "AT+QX_CCM_OTP=2,", 16)) return newer_camera_command(cmd, resp);
    LOGE("invalid command: %s", cmd);
    return RC_ATERROR;
}

int camera_pdaf_test_handler(char *cmd, int arg, char *resp) { return newer_camera_command(cmd, resp); }

int camera_single_test_handler(char *cmd, int arg, char *resp) { return newer_camera_command(cmd, resp); }

int set_camera_para_handler(char *cmd, int arg, char *resp) {
    if (strncmp(cmd, "AT+QX_CCM_PARA=1,", 17) != 0) return newer_camera_command(cmd, resp);
    std::string distance = field_text(cmd, ",", 1);
    char message[128];
    snprintf(message, sizeof message, "eng_AT_camera#NULL#NULL#focus_control#distance %s", distance.c_str());
    const char *reply = sendMessageToCamera(message);
    LOGI("rsp = %s", reply ? reply : "(null)");
    return RC_ATOK;  // the focus is set whatever the service says
}
