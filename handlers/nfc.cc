// NFC tests over NCI. Some commands only ask the test app, which owns the phone's NFC
// service, to switch NFC or to report; the others talk to the controller directly, and for
// those the test app must first release it: two users of one controller never agree.
// Reading a tag and the card-emulation check wait for the field on a worker thread for at
// most 2 seconds from the start-up exchange.
#include <pthread.h>
#include <semaphore.h>
#include <signal.h>
#include <time.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <chrono>
#include <cstdio>
#include <cstring>
#include <memory>
#include <string_view>
#include <thread>
#include <vector>

#include "core/command_tables/handlers.h"
#include "core/port_state.h"
#include "core/workers.h"
#include "handlers/common.h"
#include "handlers/nci.h"
#include "platform/android.h"
#include "platform/factory.h"
#include "platform/log.h"

namespace {

constexpr int kCloseWaitMs = 2000;  // how long the test app gets to release the controller
constexpr int kClosePollMs = 200;
constexpr const char *kCloseFail = "close nfc fail";
// The outcome text area of a tag read or card-emulation check, zero-filled by its caller.
constexpr size_t kOutcomeSize = 32;
constexpr const char *kOpenError = "open nfc error";
constexpr const char *kTimeout = "timeout 2s";
constexpr time_t kFieldWindowSec = 2;
constexpr int kCardReadAgain = 10;
constexpr auto kCardReadPause = std::chrono::microseconds(100);
constexpr auto kTagReadPause = std::chrono::milliseconds(10);
constexpr size_t kCplcDigits = 84;
constexpr const char *kCalibratedChip = "S3NRN82";
constexpr uint8_t kIdLengthAt = 12;  // NFCID1 length in an NFC-A activation; the ID follows

using Outcome = std::array<char, kOutcomeSize>;

// What a field worker shares with its command. The card-emulation worker may outlive the
// command, so the job (semaphore included) lives until its last user lets go.
struct FieldJob {
    NciLink link;
    sem_t done;
    bool sem_ok = false;
    int result = -1;
    Outcome text{};  // the worker's own outcome text: copied out only when it finished in time

    explicit FieldJob(NciLink l) : link(std::move(l)) { sem_ok = sem_init(&done, 0, 0) == 0; }
    ~FieldJob() {
        if (sem_ok) sem_destroy(&done);
    }
};

thread_local bool t_tag_worker = false;

void set_outcome(Outcome &out, const char *text) { snprintf(out.data(), out.size(), "%s", text); }

// ---- releasing the controller

int close_nfc_wait(int ms) {
    if (is_sp == 1) return 0;  // no test app holds the controller in AT mode
    if (!test_app_ok("nfc_test 0")) {
        LOGE("close nfc error");
        return -1;
    }
    for (int budget = ms + kClosePollMs;;) {
        budget -= kClosePollMs;
        if (budget < 1) {
            LOGE("timeout");
            return 1;
        }
        std::this_thread::sleep_for(std::chrono::milliseconds(kClosePollMs));
        const char *state = ask_test_app("nfc_test c");
        if (state != nullptr && (strcmp(state, "0") == 0 || strcmp(state, "ok") == 0)) return 0;
    }
}

// The tag read and card emulation release the controller only when NFC is on.
bool release_if_on() {
    const char *state = ask_test_app("nfc_test c");
    if (state == nullptr || state[0] != '1') return true;
    if (close_nfc_wait(kCloseWaitMs) == 0) return true;
    LOGE("close nfc fail");
    return false;
}

// ---- chip and SWP checks

int nfc_ic_chek() {
    NciLink link = nci_open();
    if (!link) return -1;
    NciMessage msg;
    int n = nci_exchange(*link, nci::kReset, msg);
    int result = (msg[0] & 0xF0) == 0x40 ? 0 : n;
    nci_finish(*link);
    return result;
}

int swp_self_test_check(NciChannel &ch, const NciMessage &rsp) {
    if (!rsp.starts_with({0x4F, 0x3E, 0x01, 0x00})) {
        LOGE("swp test cmd rsp error");
        return -1;
    }
    NciMessage ntf;
    ntf.clear();
    recv_nci_data(ch, ntf);
    if (!ntf.starts_with({0x6F, 0x3E, 0x02})) {
        LOGE("swp test ntf response errer");
        return -1;
    }
    switch (ntf[3]) {
        case 0: LOGI("swp link ok"); return 0;
        case 3: LOGE("swp link dead"); return -1;
        default: LOGE("swp link unknown status"); return -1;
    }
}

// uicc is set to 1 when the SWP link to the UICC works.
int nfc_self_chek(int &uicc) {
    NciLink link = nci_open();
    if (!link) return -1;
    nci_startup(*link, nci::family());
    NciMessage msg;
    nci_exchange(*link, nci::kSwpInterruptEnable, msg);
    nci_exchange(*link, nci::kSwpSelfTest, msg);
    int rc = swp_self_test_check(*link, msg);
    nci_finish(*link);
    if (rc != 0) return -1;
    uicc = 1;
    return 0;
}

// ---- reading a tag

int nci_tag_notification_v10(NciChannel &ch, Outcome &out) {
    NciMessage msg;
    nci_exchange(ch, nci::kPollModeConfig, msg);
    nci_exchange(ch, nci::kDiscover, msg);
    msg.clear();
    int n = recv_nci_data(ch, msg);  // the activation notification
    if (msg[kIdLengthAt] == 0) {
        std::this_thread::sleep_for(kTagReadPause);
        LOGI("read again");
        msg.clear();
        n = recv_nci_data(ch, msg);
    }
    int id_len = msg[kIdLengthAt];
    if (n < kIdLengthAt + 1 || id_len == 0 || n <= id_len) {
        LOGE("no tag id: read %d, id length %d", n, id_len);
        return -1;
    }
    // An NFCID1 has at most 10 bytes; of a longer one only the whole bytes that fit the
    // text area are written.
    size_t digits = std::min<size_t>(static_cast<size_t>(id_len), (out.size() - 1) / 2);
    for (size_t i = 0; i < digits; ++i) snprintf(out.data() + 2 * i, 3, "%02x", msg[kIdLengthAt + 1 + i]);
    return 0;
}

void *nfc_read_tagid_thread(void *arg) {
    t_tag_worker = true;
    auto *job = static_cast<FieldJob *>(arg);
    job->result = nci_tag_notification_v10(*job->link, job->text);
    sem_post(&job->done);
    return nullptr;
}

// Ends a tag-read worker. Only such a worker ends here: a stray SIGUSR2 sent to the
// process must not end a transport or the dispatcher.
void handleExit(int sig) {
    if (sig == SIGUSR2 && t_tag_worker) pthread_exit(nullptr);
}

void handle_exit_action(int sig, siginfo_t *, void *) { handleExit(sig); }

void install_handle_exit() {
    struct sigaction sa {};
    sa.sa_sigaction = handle_exit_action;
    sa.sa_flags = SA_SIGINFO;
    sigemptyset(&sa.sa_mask);
    sigaction(SIGUSR2, &sa, nullptr);
}

// Waits for a field worker until start + 2 s; true when it finished in time.
bool wait_field(FieldJob &job, struct timespec start) {
    struct timespec deadline = start;
    deadline.tv_sec += kFieldWindowSec;
    int rc;
    while ((rc = sem_timedwait(&job.done, &deadline)) != 0 && errno == EINTR) {
    }
    return rc == 0;
}

// The worker is joined in both outcomes, so the job may live on this stack frame's owner.
int read_tag_in_window(FieldJob &job, struct timespec start, Outcome &out) {
    pthread_t worker;
    int created;
    {
        NciKillableStart masked;  // the worker takes SIGUSR2 only while it waits for the controller
        created = pthread_create(&worker, nullptr, nfc_read_tagid_thread, &job);
    }
    if (created != 0) {
        LOGE("pthread_create error: %d", created);
        return -1;
    }
    if (!wait_field(job, start)) {
        LOGE("read tag id timeout");
        set_outcome(out, kTimeout);
        install_handle_exit();
        pthread_kill(worker, SIGUSR2);
        pthread_join(worker, nullptr);
        return -1;
    }
    pthread_join(worker, nullptr);
    out = job.text;
    return job.result;
}

int nfc_read_tagid(Outcome &out) {
    NciLink link = nci_open();
    if (!link) {
        set_outcome(out, kOpenError);
        return -1;
    }
    FieldJob job(link);
    struct timespec start {};
    int result;
    if (!job.sem_ok) {
        LOGE("sem_init error");
        result = 0;
    } else if (clock_gettime(CLOCK_REALTIME, &start) != 0) {
        LOGE("clock_gettime error");
        result = -1;
    } else {
        nci_startup(*link, nci::family());
        result = read_tag_in_window(job, start, out);
    }
    nci_finish(*link);
    return result;
}

// ---- card emulation

int nci_card_emulation_v10(NciChannel &ch) {
    NciMessage msg;
    nci_exchange(ch, nci::kPollModeConfig, msg);
    nci_exchange(ch, nci::kListenConfig1, msg);
    nci_exchange(ch, nci::kListenConfig2, msg);
    nci_exchange(ch, nci::kDiscover, msg);
    msg.clear();
    recv_nci_data(ch, msg);
    for (int tries = 1;; ++tries) {
        if (msg.starts_with({0x61, 0x05})) {
            LOGI("card emulation activated");
            return 0;
        }
        if (tries > kCardReadAgain) break;
        std::this_thread::sleep_for(kCardReadPause);
        LOGI("read again :%d", tries + 1);
        msg.clear();
        recv_nci_data(ch, msg);
    }
    LOGE("card emulation not activated");
    return -1;
}

void *nfc_card_emulation_thread(void *arg) {
    pthread_detach(pthread_self());
    std::unique_ptr<std::shared_ptr<FieldJob>> hold(static_cast<std::shared_ptr<FieldJob> *>(arg));
    FieldJob &job = **hold;
    job.result = nci_card_emulation_v10(*job.link);
    sem_post(&job.done);
    return nullptr;
}

int nfc_card_emulation(Outcome &out) {
    NciLink link = nci_open();
    if (!link) {
        set_outcome(out, kOpenError);
        return -1;
    }
    auto job = std::make_shared<FieldJob>(link);
    struct timespec start {};
    int result;
    if (!job->sem_ok) {
        LOGE("sem_init error");
        result = 0;
    } else if (clock_gettime(CLOCK_REALTIME, &start) != 0) {
        LOGE("clock_gettime error");
        result = -1;
    } else {
        nci_startup(*link, nci::Version::V10);
        auto *share = new std::shared_ptr<FieldJob>(job);
        if (start_worker(nfc_card_emulation_thread, share) != 0) {
            delete share;
            LOGE("pthread_create error");
            result = -1;
        } else if (!wait_field(*job, start)) {
            // The worker is left to finish; the close below makes its reads fail at once.
            LOGE("card emulation timeout");
            set_outcome(out, kTimeout);
            result = -1;
        } else {
            out = job->text;
            result = job->result;
        }
    }
    nci_finish(*link);
    return result;
}

// ---- test-app forms

// Answers the test app's reply quoted; a refusal (or no reply) is ERROR without a body.
int quote_reply(const char *message, char *resp) {
    const char *reply = ask_test_app(message);
    if (reply == nullptr || strcmp(reply, "error") == 0) return RC_ERROR;
    quote_body(resp, reply);
    return RC_OK;
}

int cplc_read(char *resp) {
    const char *reply = ask_test_app("nfc_test cplc");
    if (reply != nullptr && strcmp(reply, "not support") == 0) return RC_ERROR;
    quote_reason(resp, reply);
    return reply == nullptr || strcmp(reply, "error") == 0 ? RC_ATNG : RC_ATOK;
}

// "AT+QX_NFC_CPLC=1,<value>": a well-formed CPLC value lets the test app check the card.
int cplc_check(const char *cmd, char *resp) {
    std::vector<std::string_view> fields = comma_fields(cmd);
    if (fields.size() < 2) return RC_ATERROR;
    std::array<char, kLineSize> value{};
    fields[1].copy(value.data(), value.size() - 1);
    substring(value.data());
    size_t len = strlen(value.data());
    if (len == kCplcDigits && is_hex_string(value.data())) {
        LOGI("cplc:%s", value.data());
        const char *reply = ask_test_app("nfc_test card");
        quote_reason(resp, reply);
        return reply != nullptr && reply[0] == '0' ? RC_ATOK : RC_ATNG;
    }
    if (len != kCplcDigits) LOGE("cplc length:%d", static_cast<int>(len));
    quote_reason(resp, "1");
    return RC_ATNG;
}

int calibration_value(char *resp) {
    const char *reply = ask_test_app("nfc_get_cali_val 1");
    if (reply == nullptr || strcmp(reply, "error") == 0) {
        quote_reason(resp, "IKaelNfcAdapter error");
        return RC_ATNG;
    }
    if (strcmp(reply, "null") == 0) {
        body_printf(resp, "\"0,%s\"", reply);
        return RC_ATNG;
    }
    body_printf(resp, "\"1,%s\"", reply);
    return RC_ATOK;
}

}  // namespace

int set_nfc_handler(char *cmd, int arg, char *resp) {
    if (line_is(cmd, "AT+QXNFC=2")) {
        if (!release_if_on()) {
            body_printf(resp, "%s", kCloseFail);
            return RC_ERROR;
        }
        Outcome out{};
        int rc = nfc_read_tagid(out);
        quote_body(resp, out.data());
        return rc == 0 ? RC_OK : RC_ERROR;
    }
    if (line_is(cmd, "AT+QXNFC=1,1")) {
        if (test_app_ok("nfc_test 1")) return RC_OK;
        LOGE("open nfc failed");
        return RC_ERROR;
    }
    if (line_is(cmd, "AT+QXNFC=1,2")) return test_app_ok("nfc_test 2") ? RC_OK : RC_ATERROR;
    if (line_is(cmd, "AT+QXNFC=1,0")) return test_app_ok("nfc_test 0") ? RC_OK : RC_ATERROR;
    if (line_is(cmd, "AT+QXNFC=0")) return quote_reply("nfc_test c", resp);
    if (line_is(cmd, "AT+QXNFC=3")) return quote_reply("nfc_test cplc", resp);
    if (line_is(cmd, "AT+QX_NFC_CPLC=0")) return cplc_read(resp);
    if (line_is(cmd, "AT+QX_NFC_SPI=1")) return kaelatcmd_getCPLC(0) != 0 ? RC_ATNG : RC_ATOK;
    if (line_starts(cmd, "AT+QX_NFC_CPLC=1", 16)) return cplc_check(cmd, resp);
    if (line_is(cmd, "AT+QX_NFC_CARD=0")) {
        if (!release_if_on()) {
            body_printf(resp, "%s", kCloseFail);
            return RC_ERROR;
        }
        Outcome out{};
        if (nfc_card_emulation(out) == 0) return RC_OK;
        quote_body(resp, out.data());
        return RC_ERROR;
    }
    if (line_is(cmd, "AT+QX_NFC_CAL=0")) {
        char chip[PROPERTY_VALUE_MAX] = {0};
        property_get(nci::kChipTypeProp, chip, "0");
        quote_reason(resp, strcmp(chip, kCalibratedChip) == 0 ? "1" : "0");
        return RC_ATOK;
    }
    if (line_is(cmd, "AT+QX_NFC_CAL=1")) {
        // A refused calibration still answers ATOK: only the body tells.
        quote_reason(resp, test_app_ok("nfc_cali 1") ? "1" : "0");
        return RC_ATOK;
    }
    if (line_is(cmd, "AT+QX_NFC_CAL=2")) return calibration_value(resp);
    return RC_ATERROR;
}

int check_nfc_handler(char *cmd, int arg, char *resp) {
    if (line_is(cmd, "AT+QX_NFC_IC=1")) {
        if (close_nfc_wait(kCloseWaitMs) != 0) {
            body_printf(resp, "%s", kCloseFail);
            return RC_ATNG;
        }
        return nfc_ic_chek() != 0 ? RC_ATNG : RC_ATOK;
    }
    if (line_is(cmd, "AT+QX_NFC_CHK=0")) {
        if (close_nfc_wait(kCloseWaitMs) != 0) {
            body_printf(resp, "%s", kCloseFail);
            return RC_ATNG;
        }
        int uicc = 0;
        int rc = nfc_self_chek(uicc);
        body_printf(resp, "\"UICC:%d;\"", uicc);
        return rc == 0 ? RC_ATOK : RC_ATNG;
    }
    return invalid_command(cmd);
}
