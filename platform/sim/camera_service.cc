// The camera service and camera helpers of the factory library on the simulated phone.
// On a phone the camera HAL service takes "#"-separated messages from the factory library,
// opens, captures, focuses and tests the named module, and answers with a text that holds
// "success" when it worked; the library also reads module serial numbers and OTP status
// and translates the newer AT camera commands. The model answers each message from the
// reply script .sim/camera.replies (the fault "camera" fails every message), and takes the
// fitted cameras, serial numbers and calibration items from .sim/config. It leaves out
// the cameras themselves: nothing is opened or captured, a reply comes at once, and no
// state carries from one message to the next unless the script says so.
#include <errno.h>
#include <fcntl.h>

#include <cctype>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string>
#include <vector>

#include "platform/android.h"
#include "platform/device.h"
#include "platform/factory.h"
#include "platform/sim/cbuf.h"
#include "platform/sim/script.h"
#include "platform/sim/sim.h"

using sim::opt;
using sim::put;
using sim::split;

namespace {
thread_local std::string t_camera_reply;  // storage behind sendMessageToCamera's answer
}  // namespace

extern "C" {


const char *sendMessageToCamera(const char *message) {
    std::string msg = opt(message);
    if (sim::fault("camera")) t_camera_reply = "fail#camera service not available";
    else if (!sim::script_reply(sim::state("camera.replies"), msg, t_camera_reply)) t_camera_reply = "fail#no reply scripted";
    sim::record("camera", msg + " -> " + t_camera_reply);
    return t_camera_reply.c_str();
}

int get_camera_info_code(const char *kind, const char *camera, char *buf, int len) {
    std::string v = sim::config(("camera_sn." + opt(camera)).c_str());
    if (opt(kind) != "sn_code" || v.empty() || sim::fault("camera")) {
        put(buf, len, "");
        return -1;
    }
    put(buf, len, v);
    return 0;
}

// AT+QX_CCM_PDAF=1,rear becomes "eng_AT_camera#qx_ccm_pdaf#1#rear"; the item name of a
// command comes from config ("camera_item.AT+QX_CCM_PDAF=...").
int transform_at_cmd_to_camera_info(const char *command, char *msg, int msg_len, char *item) {
    std::string c = opt(command);
    size_t eq = c.find('=');
    if (item) item[0] = '\0';
    if (eq == std::string::npos || c.compare(0, 3, "AT+") != 0 || sim::fault("camera-transform")) return -1;
    std::string name = c.substr(3, eq - 3), args = c.substr(eq + 1), m = "eng_AT_camera#";
    for (char ch : name) m += static_cast<char>(tolower(static_cast<unsigned char>(ch)));
    m += '#';
    for (char ch : args) m += ch == ',' ? '#' : ch;
    put(msg, msg_len, m);
    std::string upper;
    for (char ch : c.substr(0, eq)) upper += static_cast<char>(toupper(static_cast<unsigned char>(ch)));
    put(item, CAMERA_ITEM_NAME_SIZE, sim::config(("camera_item." + upper).c_str()));
    return 0;
}

// A passing reply "success#action#key value#..." gives a line "+key:value" per field.
int transform_camera_ret_to_at_resp(const char *reply, char *body, int len) {
    std::string r = opt(reply), out;
    if (r.find("success") == std::string::npos) {
        put(body, len, "\"" + r + "\"");
        return 8;
    }
    std::vector<std::string> f = split(r, '#');
    for (size_t i = 2; i < f.size(); ++i) {
        size_t sp = f[i].find(' ');
        out += "\r\n\"+" + f[i].substr(0, sp) + ":" + (sp == std::string::npos ? "" : f[i].substr(sp + 1)) + "\"\r\n";
    }
    put(body, len, out);
    return 7;
}

int is_support_new_camera_interface(void) { return sim::config("camera_new_interface", "1") == "1"; }

int is_support_target_camera(int facing, const char *role) {
    std::string want = std::string(facing == 1 ? "front:" : "rear:") + opt(role);
    for (const auto &c : split(sim::config("cameras"), ','))
        if (c == want) return 1;
    return 0;
}

// The OTP verdict of a camera is the value of its status property ("1" good, the
// default); the body gets one "name:pass" or "name:fail" line per camera.
int get_target_camera_otp_status(char *body, int len, const char *property) {
    char value[PROPERTY_VALUE_MAX];
    property_get(opt(property).c_str(), value, "1");
    bool good = strcmp(value, "1") == 0;
    std::string name = opt(property);
    for (const char *cut : {"sys.camera.", "_otp_status"}) {
        size_t at = name.find(cut);
        if (at != std::string::npos) name.erase(at, strlen(cut));
    }
    if (body && len > 0) {
        std::string text = body;
        text += name + (good ? ":pass\r\n" : ":fail\r\n");
        put(body, len, text);
    }
    return good;
}

}  // extern "C"
