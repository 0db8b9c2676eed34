// Modem and RF commands: the DPDT antenna switch (normal or crossed), the antenna tuner,
// receive diversity and the SAR back-off, for conducted and radiated tests. Nearly every
// form is one EM status request to the modem; a request has succeeded only when it was
// delivered AND the modem's reply text begins with "0".
#include <array>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>

#include "core/command_tables/handlers.h"
#include "core/nv.h"
#include "handlers/common.h"
#include "platform/factory.h"
#include "platform/log.h"
#include "platform/modem.h"

namespace {

constexpr const char *kDpdtComponent = "com.pyxa.engineermode/.DpdtService";
constexpr uint32_t kTunerNvItem = 26693;         // the antenna tuner's setting
constexpr uint32_t kSmartAntennaNvItem = 30001;  // the smart-antenna default
constexpr int kNvReplySize = 23;

// One EM status request and the modem's reply text.
struct EmStatus {
    bool delivered;
    std::array<char, ZDR_EM_REPLY_SIZE> reply;

    bool succeeded() const { return delivered && reply[0] == '0'; }
};

EmStatus em_status(int request) {
    EmStatus s{};
    s.delivered = qmi_zdr_set_em_status(request, s.reply.data()) == 0;
    s.reply.back() = '\0';
    if (!s.delivered) LOGE("em status %d not delivered", request);
    return s;
}

int verified(int request, int fail = RC_ERROR) { return em_status(request).succeeded() ? RC_OK : fail; }

// The reply of a delivered request, on a line of its own; ERROR when it was not delivered.
int answer_reply(int request, char *resp) {
    EmStatus s = em_status(request);
    if (!s.delivered) return RC_ERROR;
    body_printf(resp, "\r\n%s\r\n", s.reply.data());
    return RC_OK;
}

// A modem NV item read as a 32-bit value; the raw reply is kept for the tuner's text test.
bool read_modem_nv(uint32_t item, int32_t &value, std::array<char, kNvReplySize> &reply) {
    std::array<unsigned char, sizeof(uint32_t) + kNvReplySize> request{};
    memcpy(request.data(), &item, sizeof item);
    reply.fill(0);
    if (qmi_zdr_read_nv_msg(request.data(), reply.data(), kNvReplySize) != 0) return false;
    memcpy(&value, reply.data(), sizeof value);
    return true;
}

bool is_rx6105() { return is_project("RX6105") || is_project("RX6105F_EX"); }

// AT+QXDPDT=0 and =1 (the main or the diversity antenna): one project must first be told
// the switch position with a status of its own.
int dpdt_select(int project_request, int request) {
    if (is_project("RX5280F_EX") && !em_status(project_request).succeeded()) return RC_ATNG;
    return verified(request);
}

// AT+QXDPDT=2 and =3 both record "cross", whichever way the switch was set.
int dpdt_set(int cross) {
    if (dpdt_normal_or_cross(cross) != 0) return RC_ERROR;
    kaelatcmd_set_system_property("persist.sys.dpdt", "cross");
    return RC_OK;
}

int dpdt_state(char *resp) {
    EmStatus s = em_status(118);
    if (!s.delivered) return RC_ERROR;
    int n = atoi(s.reply.data());
    body_printf(resp, "\r\n\"%d,%d\"\r\n", n & 3, (n >> 2) & 3);
    return RC_OK;
}

int dpdt_service_start() {
    const auto held = nv::hold();
    nv::Record rec;
    if (!nv::read(rec)) return RC_ERROR;
    int32_t adb = rec.i32(nv::kAdbFlag);
    if (adb == 1 || adb == 2) {
        rec.set_i32(nv::kDpdtService, 1);
        if (!nv::write(rec)) return RC_ERROR;
    }
    startServiceFromFtcmd(kDpdtComponent, nullptr, nullptr);
    return RC_OK;
}

int tuner_setting(char *resp) {
    int32_t value = 0;
    std::array<char, kNvReplySize> reply;
    if (!read_modem_nv(kTunerNvItem, value, reply)) return RC_ATERROR;
    body_printf(resp, "\"%d\"", value);
    return reply[0] == '\0' ? RC_ATNG : RC_ATOK;
}

int smart_antenna_default(char *resp) {
    int32_t value = 0;
    std::array<char, kNvReplySize> reply;
    if (!read_modem_nv(kSmartAntennaNvItem, value, reply)) {
        quote_reason(resp, "modem errror");
        return RC_ATNG;
    }
    body_printf(resp, "\"%d\"", value);
    return RC_ATOK;
}

// Forms of AT+QXDPDT that are a single verified status request.
struct DpdtRequest {
    const char *line;
    int request;
};
constexpr std::array<DpdtRequest, 2> kDpdtVerified{{{"AT+QXDPDT=9", 9}, {"AT+QXDPDT=10", 10}}};
constexpr std::array<DpdtRequest, 3> kDpdtReplies{{{"AT+QXDPDT=8", 118}, {"AT+QXDPDT=115", 115}, {"AT+QXDPDT=119", 119}}};

}  // namespace

int set_dpdt_status_handler(char *cmd, int arg, char *resp) {
    if (line_is(cmd, "AT+QXDPDT=0")) return dpdt_select(122, 110);
    if (line_is(cmd, "AT+QXDPDT=1")) return dpdt_select(121, 111);
    if (line_is(cmd, "AT+QXDPDT=2")) return dpdt_set(is_rx6105() ? 0 : 1);
    if (line_is(cmd, "AT+QXDPDT=3")) return dpdt_set(is_rx6105() ? 1 : 0);
    if (line_is(cmd, "AT+QXDPDT=4")) return dpdt_state(resp);
    if (line_is(cmd, "AT+QXDPDT=5")) return dpdt_service_start();
    if (line_is(cmd, "AT+QXDPDT=6")) return verified(is_rx6105() ? 117 : 116);
    if (line_is(cmd, "AT+QXDPDT=7")) return verified(is_rx6105() ? 116 : 117);
    for (const DpdtRequest &r : kDpdtVerified)
        if (line_is(cmd, r.line)) return verified(r.request);
    for (const DpdtRequest &r : kDpdtReplies)
        if (line_is(cmd, r.line)) return answer_reply(r.request, resp);
    if (line_is(cmd, "AT+QXDPDT=121")) return verified(121, RC_ATNG) == RC_OK ? RC_ATOK : RC_ATNG;
    if (line_is(cmd, "AT+QXDPDT=122")) return verified(122, RC_ATNG) == RC_OK ? RC_ATOK : RC_ATNG;
    if (line_is(cmd, "AT+QXDPDT=123")) return tuner_setting(resp);
    if (line_is(cmd, "AT+QXSMT_DEFAULT_ANT=1")) return smart_antenna_default(resp);
    return invalid_command(cmd);  // AT+QX_ANT_DEF has no form at all
}

int set_antenna_diversity_status_handler(char *cmd, int arg, char *resp) {
    if (line_is(cmd, "AT+QX_DRX_OPT=0")) return em_status(150).succeeded() ? RC_ATOK : RC_ATNG;
    if (line_is(cmd, "AT+QX_DRX_OPT=1")) return em_status(151).succeeded() ? RC_ATOK : RC_ATNG;
    if (line_is(cmd, "AT+QX_DRX_OPT=2")) {
        EmStatus s = em_status(152);
        if (!s.delivered || (s.reply[0] != '0' && s.reply[0] != '1')) return RC_ATNG;
        quote_body(resp, s.reply[0] == '0' ? "0" : "1");
        return RC_ATOK;
    }
    LOGE("invalid command: %s", cmd);
    return RC_ATERROR;
}

int sar_handler(char *cmd, int arg, char *resp) {
    if (line_is(cmd, "AT+QXSAR=0")) return verified(210);
    if (line_is(cmd, "AT+QXSAR=1")) return verified(211);
    return invalid_command(cmd);
}
