// Flight mode, sleep for the current-consumption test, the default AT mode, and which SIM
// cards and memory card are present. In AT mode (is_sp) there is no Android UI, so the
// test app is not asked and the device is driven directly.
#include <fcntl.h>
#include <unistd.h>

#include <array>
#include <cstdio>
#include <cstring>
#include <string_view>

#include "core/command_tables/handlers.h"
#include "core/nv.h"
#include "core/port_state.h"
#include "core/response.h"
#include "handlers/common.h"
#include "platform/device.h"
#include "platform/factory.h"
#include "platform/log.h"

namespace {

// In AT mode the device may be asleep before the normal frame could leave, so the station
// gets this whole answer first.
constexpr char kEarlySleepAnswer[] = "AT+EQSB=0\r\n\r\nOK\r\n";

int ask_ok_or_error(const char *message) { return test_app_ok(message) ? RC_OK : RC_ERROR; }

int sleep_without_ui(char *resp) {
    writeDataToSerial(kEarlySleepAnswer, static_cast<int>(sizeof kEarlySleepAnswer - 1));
    if (write_policy_file(0, "/sys/kernel/debug/cms/debug", O_WRONLY, "fg-cutoff") != 0) LOGW("write fg-cutoff error");
    dev::sync();
    minui_gr_fb_blank(0);
    write_int("/sys/class/backlight/panel0-backlight/brightness", 0);
    int rc = write_policy_file(0, "/sys/power/ftcmd_state", O_WRONLY, "1");
    if (rc != 0) LOGE("write ftcmd_state error: %d", rc);
    rc = write_policy_file(0, "/sys/power/autosleep", O_WRONLY, "mem");
    if (rc != 0) {
        body_printf(resp, "\"error:%d\"", rc);
        return RC_ERROR;
    }
    return RC_OK;  // answered again once the device wakes
}

struct SimTest {
    const char *line;
    const char *message;
};

constexpr std::array<SimTest, 6> kSimTests{{
    {"AT+QX_SIM_USE=1", "sim_card_test 0"},
    {"AT+QX_SIM_USE=2", "sim_card_test 1"},
    {"AT+QX_SIM_USE=0", "sim_card_test 2"},
    {"AT+QX_SIM_REP=1", "sim_card_test 3"},
    {"AT+QX_SIM_REP=2", "sim_card_test 4"},
    {"AT+QX_SIM_REP=0", "sim_card_test 5"},
}};

// The value of a test-app reply such as "ok=1,slot": the text between its first "=" and
// the next ",".
std::string_view reply_value(std::string_view reply) {
    size_t eq = reply.find('=');
    if (eq == std::string_view::npos) return {};
    reply.remove_prefix(eq + 1);
    return reply.substr(0, reply.find(','));
}

}  // namespace

int plan_mode_test_handler(char *cmd, int arg, char *resp) {
    if (line_is(cmd, "AT+OFFL=1")) {
        if (is_sp == 1) {
            LOGI("sys.stop.all");
            kaelatcmd_set_system_property("sys.stop.all", "1");
            return RC_OK;
        }
        return ask_ok_or_error("airplane_mode 1");
    }
    if (line_is(cmd, "AT+OFFL=0")) return is_sp ? RC_OK : ask_ok_or_error("airplane_mode 0");
    return invalid_command(cmd);
}

int sleep_mode_test_handler(char *cmd, int arg, char *resp) {
    if (!line_is(cmd, "AT+EQSB=0")) return invalid_command(cmd);
    return is_sp ? sleep_without_ui(resp) : ask_ok_or_error("go_to_sleep");
}

int eslp_handler(char *cmd, int arg, char *resp) {
    if (line_is(cmd, "AT+ESLP=0")) return RC_OK;
    if (line_is(cmd, "AT+ESLP=1")) {
        nv::Update u = nv::update([](nv::Record &rec) {
            rec.bytes[nv::kDefaultAtMode] = '0';
            LOGI("set pyxa_nvram.item_ext.default_at_mode: %c", rec.bytes[nv::kDefaultAtMode]);
        });
        if (u == nv::Update::WriteFailed) {
            LOGE("put_PYXA_NV_item(&pyxa_nvram) fail");
            return RC_ERROR;
        }
        return RC_OK;  // an unreadable record is not reported
    }
    if (line_is(cmd, "AT+ESLP=2")) {
        nv::Record rec;
        nv::read(rec);
        return RC_OK;
    }
    if (line_is(cmd, "AT+ESLP=3")) {
        body_printf(resp, "\r\n\"%d\"\r\n", is_sp);
        return RC_OK;
    }
    return RC_ERROR;
}

int check_SIM_handler(char *cmd, int arg, char *resp) {
    const char *card = line_is(cmd, "AT+QXSIM=1") ? "SIM1" : line_is(cmd, "AT+QXSIM=2") ? "SIM2" : nullptr;
    if (card == nullptr) return invalid_command(cmd);
    if (is_sp) return RC_ERROR;
    const char *reply = ask_test_app("sim_state");
    return reply != nullptr && strstr(reply, card) != nullptr ? RC_OK : RC_ERROR;
}

int check_sim_tcard_handler(char *cmd, int arg, char *resp) {
    if (!line_is(cmd, "AT+QXCARD=1")) return RC_OK;
    // In AT mode the SIM part stays empty: its placeholder always went to the memory-card
    // part, which overwrites it.
    char sims[56] = {0};
    if (!is_sp) {
        const char *reply = ask_test_app("sim_state");
        snprintf(sims, sizeof sims, "%s", reply ? reply : "");
    }
    int state = dev::access("/storage/sdcard1", W_OK);
    LOGI("TFcardstate:%d", state);
    body_printf(resp, "+cards:%s,%s", sims, state == 0 ? "\"TF\"" : "\"\"");
    return RC_OK;
}

int sim_test_handler(char *cmd, int arg, char *resp) {
    for (const SimTest &t : kSimTests) {
        if (!line_is(cmd, t.line)) continue;
        const char *reply = ask_test_app(t.message);
        if (reply == nullptr) return RC_ERROR;
        int rc = strstr(reply, "ok") ? RC_ATOK : strstr(reply, "error1") ? RC_ATNG : RC_ERROR;
        if (rc != RC_ERROR) {
            std::string_view value = reply_value(reply);
            body_printf(resp, "\r\n\"%.*s\"\n\r", static_cast<int>(value.size()), value.data());
        }
        return rc;
    }
    return RC_ERROR;
}
