// Audio path tests: microphone loopbacks to the earpiece or a headset, headset loopbacks to
// the speakers, tone and file playback, multi-microphone tests, timed recordings, the
// smart amplifier's calibration and headset identification. The paths themselves are run
// by the audio factory-test library; what a reader must know is that one shared state
// says which path is open: a path is opened once, a repeated open answers without
// reopening, and any close tears down whatever is open.
#include "handlers/audio.h"

#include <pthread.h>
#include <unistd.h>

#include <array>
#include <climits>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <new>

#include "core/command_tables/handlers.h"
#include "core/port_state.h"
#include "core/workers.h"
#include "handlers/common.h"
#include "platform/android.h"
#include "platform/audio.h"
#include "platform/device.h"
#include "platform/factory.h"
#include "platform/log.h"

std::atomic<int> g_audio_test_state{0};

namespace {

// ---- the shared path state

// An open of path state: false (logged "reopen") when that path is already the open one;
// otherwise the state is taken before the library is called, so a failed open stays set.
bool open_path(int state) {
    if (g_audio_test_state.load() == state) {
        LOGI("reopen");
        return false;
    }
    g_audio_test_state.store(state);
    return true;
}

// A close tears down whatever is open, whichever path the closing command names: false
// (logged "reclose") when nothing is open. The state is cleared before the library call.
bool close_path() {
    if (g_audio_test_state.exchange(0) == 0) {
        LOGI("reclose");
        return false;
    }
    return true;
}

// ---- arguments

// The line cut at every "," in place (the handler's copy is its own to cut); empty
// fields are kept. Fields beyond the last slot stay joined to it.
struct Fields {
    std::array<char *, 4> at{};
    int count = 0;
    const char *operator[](int i) const { return i < count ? at[i] : nullptr; }
};

Fields split_fields(char *cmd) {
    Fields f;
    f.at[f.count++] = cmd;
    for (char *p = cmd; *p != '\0' && f.count < static_cast<int>(f.at.size()); ++p) {
        if (*p != ',') continue;
        *p = '\0';
        f.at[f.count++] = p + 1;
    }
    return f;
}

// atoi, but a number longer than an int holds is clamped rather than undefined.
int to_int(const char *text) {
    long v = strtol(text, nullptr, 10);
    if (v > INT_MAX) return INT_MAX;
    if (v < INT_MIN) return INT_MIN;
    return static_cast<int>(v);
}

bool gain_valid(const char *gain) {
    if (isDigitValue(gain)) return true;
    LOGE("the gain multiples invalid:%s", gain);
    return false;
}

bool file_exists(const char *path) { return dev::access(path, F_OK) == 0; }

// ---- loopbacks opened with one or two gains

struct Loopback {
    const char *open;   // an open is any line that begins with this
    const char *close;  // a close is exactly this line
    int state;
    int (*start)(int gain);
    int (*start2)(int gain1, int gain2);  // for the paths with two gains
    int (*exit)(void);
};

constexpr Loopback kMicToHeadset{"AT+QXMTE=1", "AT+QXMTE=0", 7, startMic2headset, nullptr, exitMic2headset};
constexpr Loopback kMainToHeadsetR{"AT+QXMTER=1", "AT+QXMTER=0", 8, startMain2headsetR, nullptr, exitMain2headsetR};
constexpr Loopback kSubToHeadsetL{"AT+QXVMTEL=1", "AT+QXVMTEL=0", 9, startSub2headsetL, nullptr, exitSub2headsetL};
constexpr Loopback kHeadsetToSpeaker{"AT+QXEMTS=1", "AT+QXEMTS=0", 10, startHeadset2speaker, nullptr,
                                     exitHeadset2speaker};
constexpr Loopback kHeadsetToEarpiece{"AT+QXEMTR=1", "AT+QXEMTR=0", 11, startHeadset2earpiece, nullptr,
                                      exitHeadset2earpiece};
constexpr Loopback kHeadsetToSpeakerGains{"AT+QXEMTSA=1", "AT+QXEMTSA=0", 12, nullptr, startHeadset2SpeakerWithGain,
                                          exitHeadset2SpeakerWithGain};
constexpr Loopback kHeadsetToEarpieceGains{"AT+QXEMTRA=1", "AT+QXEMTRA=0", 13, nullptr,
                                           startHeadset2EarpieceWithGain, exitHeadset2EarpieceWithGain};
constexpr Loopback kHeadsetToRightSpeaker{"AT+QXEMTSR=1", "AT+QXEMTSR=0", 14, startHeadset2RightSpeaker, nullptr,
                                          exitHeadset2RightSpeaker};
constexpr Loopback kHeadsetToLeftSpeaker{"AT+QXEMTSL=1", "AT+QXEMTSL=0", 15, startHeadset2LeftSpeaker, nullptr,
                                         exitHeadset2LeftSpeaker};

int open_loopback(const Loopback &path, char *cmd) {
    Fields f = split_fields(cmd);
    const int gains = path.start2 ? 2 : 1;
    for (int i = 1; i <= gains; ++i)
        if (f[i] == nullptr) return RC_ERROR;
    for (int i = 1; i <= gains; ++i)
        if (!gain_valid(f[i])) return RC_ERROR;
    if (!open_path(path.state)) return RC_OK;
    int rc = path.start2 ? path.start2(to_int(f[1]), to_int(f[2])) : path.start(to_int(f[1]));
    if (rc != 0) {
        LOGE("open Receive Test test fail!");
        return RC_ERROR;
    }
    return RC_OK;
}

int run_loopback(const Loopback &path, char *cmd) {
    if (line_starts(cmd, path.open, strlen(path.open))) return open_loopback(path, cmd);
    if (line_is(cmd, path.close)) {
        if (close_path()) path.exit();  // answered OK whatever the exit returns
        return RC_OK;
    }
    return invalid_command(cmd);
}

// ---- AT+QXMT: the earpiece and microphone loopbacks

struct EchoPath {
    const char *open, *close;
    int state;
    bool gain;  // opened by prefix, with an optional gain as third field
    int (*start)(int gain);
    int (*start_plain)(void);
    int (*exit)(void);
};

constexpr std::array<EchoPath, 4> kEchoPaths{{
    {"AT+QXMT=0,1", "AT+QXMT=0,0", 3, true, startReceiveTest, nullptr, exitReceiveTest},
    {"AT+QXMT=1,1", "AT+QXMT=1,0", 4, true, startSendTest, nullptr, exitSendTest},
    {"AT+QXMT=2,1", "AT+QXMT=2,0", 5, false, nullptr, startSubEchoTest, exitSubEchoTest},
    {"AT+QXMT=3,1", "AT+QXMT=3,0", 6, false, nullptr, startHeadsetEchoTest, exitHeadsetEchoTest},
}};

constexpr int kDefaultGain = 100;

// ---- AT+QX_AUD_MIC: the multi-microphone cases

struct MicCase {
    const char *open, *close;
    int state, test_case;
};

constexpr std::array<MicCase, 3> kMicCases{{
    {"AT+QX_AUD_MIC=1,1", "AT+QX_AUD_MIC=1,0", 22, 41},
    {"AT+QX_AUD_MIC=2,1", "AT+QX_AUD_MIC=2,0", 23, 42},
    {"AT+QX_AUD_MIC=3,1", "AT+QX_AUD_MIC=3,0", 24, 43},
}};

// The "=0" close of AT+QX_AUD_MIC stops the test case numbered state + 19, whichever
// handler opened that state.
constexpr int kMicCaseOffset = 19;

// ---- playback

struct Playback {
    const char *open;  // "AT+QXPTS=1", followed by ",path"
    const char *close;
    int state, test_case;
};

constexpr Playback kPlaySpeaker{"AT+QXPTS=1", "AT+QXPTS=0", 20, 22};
constexpr Playback kPlayReceiver{"AT+QXPTR=1", "AT+QXPTR=0", 21, 21};
constexpr int kSpeakerCase = 22;  // AT+QXXL's tone
constexpr int kDoubleReceiverCase = 25;
constexpr int kSpeakerMicToEarpieceCase = 6;

int play_file(const Playback &p, char *cmd) {
    if (line_starts(cmd, p.open, strlen(p.open))) {
        Fields f = split_fields(cmd);
        char *path = f.at[1];
        if (f[1] == nullptr) return RC_ERROR;
        uppercase_to_lowcase(path, static_cast<int>(strlen(path)));
        if (!file_exists(path)) {
            LOGE("access %s error", path);
            return RC_ERROR;
        }
        if (!open_path(p.state)) return RC_OK;
        return audio_ftm_process_full(p.test_case, 1, 1, path) == 0 ? RC_OK : RC_ERROR;
    }
    if (line_starts(cmd, p.close, strlen(p.close))) {
        if (!close_path()) return RC_OK;
        return audio_ftm_process_full(p.test_case, 0, 1, nullptr) == 0 ? RC_OK : RC_ERROR;
    }
    return invalid_command(cmd);
}

// ---- recording

struct Mic {
    const char *type;
    int test_case;
    const char *busy;  // "1" while recording; setting it to "0" ends the recording
    const char *file;
};

constexpr std::array<Mic, 5> kMics{{
    {"MainMic", 51, "sys.is_audio_working.main_mic", "/sdcard/engineermode/main-record.wav"},
    {"SubMic", 52, "sys.is_audio_working.sub_mic", "/sdcard/engineermode/sub-record.wav"},
    {"STMic", 53, "sys.is_audio_working.st_mic", "/sdcard/engineermode/smart-record.wav"},
    {"HPMic", 54, "sys.is_audio_working.hp_mic", "/sdcard/engineermode/hp-record.wav"},
    {"DoubleMic", 55, "sys.is_audio_working.double_mic", "/sdcard/engineermode/double-record.wav"},
}};

// A new recording accepts any part of this text as its type; the worker then refuses
// anything that is not a whole name.
constexpr char kMicTypeNames[] = "MainMic SubMic STMic HPMic DoubleMic";
constexpr int kRecordLimitMs = 30000;
constexpr useconds_t kRecordPollUs = 10 * 1000;

// Handed to a recording worker, which frees it.
struct RecordRequest {
    char type[32];  // the microphone type name, cut to 31 characters
    int32_t ms;     // how long to record
};
static_assert(sizeof(RecordRequest) == 36);

const Mic *find_mic(const char *type) {
    if (type == nullptr) return nullptr;
    for (const Mic &m : kMics)
        if (strcmp(m.type, type) == 0) return &m;
    return nullptr;
}

long long ms_between(const struct timeval &from, const struct timeval &to) {
    return (to.tv_usec - from.tv_usec) / 1000 + (to.tv_sec - from.tv_sec) * 1000LL;
}

// Records until the time is up or the busy property is set to "0" from outside.
void record_until_stopped(const Mic &mic, int32_t ms) {
    char busy[PROPERTY_VALUE_MAX] = {0};
    struct timeval start {}, now {};
    property_set(mic.busy, "1");
    dev::gettimeofday(&start);
    const int32_t limit = ms > kRecordLimitMs ? kRecordLimitMs : ms;
    if (limit < 0) return;
    property_get(mic.busy, busy, "0");
    long long elapsed = 0;
    do {
        if (strcmp(busy, "0") == 0) break;
        usleep(kRecordPollUs);
        dev::gettimeofday(&now);
        elapsed = ms_between(start, now);
        property_get(mic.busy, busy, "0");
    } while (limit >= elapsed);
}

void *audio_record_thread(void *arg) {
    LOGI("Start");
    auto *req = static_cast<RecordRequest *>(arg);
    const Mic *mic = find_mic(req->type);
    if (mic == nullptr) {
        LOGE("parameter error!!");
    } else {
        dev::unlink(mic->file);
        int rc = audio_ftm_process(mic->test_case, 1, 100);
        if (rc != 0) {
            LOGE("start record error!!: ret = %d", rc);
        } else {
            record_until_stopped(*mic, req->ms);
            rc = audio_ftm_process(mic->test_case, 0, 0);
            if (rc == 0) {
                property_set(mic->busy, "0");
                ask_test_app("set_silent_mode 1");
                LOGI("%s record finished!!", mic->type);
            } else {
                LOGE("stop record error!!: ret = %d", rc);  // the busy property stays "1"
            }
        }
    }
    delete req;
    LOGI("Exit");
    pthread_detach(pthread_self());
    return nullptr;
}

void start_recording(const char *type, int32_t ms) {
    auto *req = new (std::nothrow) RecordRequest{};
    if (req == nullptr) {
        LOGE("no memory for the recording");
        return;
    }
    snprintf(req->type, sizeof req->type, "%s", type);
    req->ms = ms;
    if (start_worker(audio_record_thread, req) != 0) {
        LOGE("record thread not started");
        delete req;
    }
}

// The seconds field in whole milliseconds; false when it is missing, or too large or not
// a number at all to be a time (the conversion would be undefined).
bool record_ms(const char *seconds, int32_t &ms) {
    if (seconds == nullptr) return false;
    double v = strtod(seconds, nullptr) * 1000;
    if (!(v > INT32_MIN - 1.0 && v < INT32_MAX + 1.0)) return false;
    ms = static_cast<int32_t>(v);
    return true;
}

int mic_type_error(char *resp, int rc) {
    quote_reason(resp, "mic-type set error!!");
    return rc;
}

// ---- smart amplifier

// The sub amplifier's item is asked for with its quotation marks, as the item list names it.
constexpr char kSubAmplifierSupport[] = "\"sub_smart_spearker_amplifier_cali_support\"";
constexpr char kAmplifierItem[] = "smart_speaker_amplifier_cali";
constexpr char kSubAmplifierItem[] = "smart_speaker_amplifier2_cali";
constexpr size_t kCalibrateTextMin = 120;
constexpr int kCalibrateTextSize = 512;
constexpr size_t kCalibrateResultSize = 511;
// The amplifiers of makers 1 and 2 need half a second before they can be calibrated.
constexpr useconds_t kAmplifierSettleUs = 500 * 1000;

int speaker_amplifier_calibrate(char *text, size_t size) {
    if (text == nullptr || size < kCalibrateTextMin) {
        LOGE("priv null");
        return -1;
    }
    char result[kCalibrateTextSize] = "start calibrate fail";
    int maker = get_smartpa_manufacturer();
    if (maker == 1 || maker == 2) usleep(kAmplifierSettleUs);
    int rc = smartpa_calibrate(result, kCalibrateTextSize);
    snprintf(text, size, "%s", result);
    return rc;
}

void set_amplifier_items(const char *state) {
    set_calibrate_item_state(kAmplifierItem, state, is_uart_flag);
    if (is_calibrate_item_support(kSubAmplifierSupport) == 1)
        set_calibrate_item_state(kSubAmplifierItem, state, is_uart_flag);
}

// The whole line calibration: the test app plays the calibration tone around it.
int calibrate_on_line(char *resp) {
    if (!test_app_ok("speakerld 2")) {
        quote_reason(resp, "start audio fail");
        return RC_ERROR;
    }
    char text[kCalibrateResultSize] = {0};
    int rc = speaker_amplifier_calibrate(text, sizeof text);
    ask_test_app("speakerld 0");
    if (rc != 0) {
        LOGE("errot ret:%d", rc);
        return RC_ERROR;
    }
    set_amplifier_items("1");
    return RC_OK;
}

void *speaker_calibrate_thread(void *) {
    LOGI("Start");
    char body[kRespSize] = {0};
    int rc = calibrate_on_line(body);
    LOGI("calibration ended with %d", rc);
    LOGI("Exit");
    pthread_detach(pthread_self());
    return nullptr;
}

int mos_answer(char *resp, int rc) {
    switch (rc) {
        case -1: return RC_ATNG;
        case 0: quote_reason(resp, "Fail"); return RC_ATNG;
        case 1: quote_reason(resp, "Pass"); return RC_ATOK;
        default: body_printf(resp, "\"Unknown error %d\"", rc); return RC_ATNG;
    }
}

int hp_type_answer(char *resp, int type) {
    switch (type) {
        case 1: quote_reason(resp, "1"); return RC_ATOK;  // standard headset
        case 2: quote_reason(resp, "2"); return RC_ATOK;  // not standard
        case 0: quote_reason(resp, "3"); return RC_ATOK;  // none detected
        default: body_printf(resp, "\"Unknown error %d\"", type); return RC_ATNG;
    }
}

}  // namespace

// ---- sensor table

int mic_echo_handler(char *cmd, int arg, char *resp) {
    if (line_starts(cmd, "AT+EALT=1", 9)) {
        const bool main_mic = line_is(cmd, "AT+EALT=1,1");
        if (!main_mic && !line_is(cmd, "AT+EALT=1,2")) return invalid_command(cmd);
        if (!open_path(main_mic ? 1 : 2)) return RC_OK;
        int rc = main_mic ? startMainEchoTest() : startSubEchoTest();
        if (rc != 0) LOGE("echo test open fail: %d", rc);
        return rc == 0 ? RC_OK : RC_ERROR;
    }
    if (line_starts(cmd, "AT+EALT=0", 9)) {
        if (!close_path()) return RC_ATOK;
        if (line_is(cmd, "AT+EALT=0,1")) return exitMainEchoTest() == 0 ? RC_OK : RC_ERROR;
        if (line_is(cmd, "AT+EALT=0,2")) {
            exitSubEchoTest();
            return RC_OK;
        }
        return invalid_command(cmd);  // the path is closed all the same
    }
    return invalid_command(cmd);
}

int play_ring_handler(char *cmd, int arg, char *resp) {
    if (line_is(cmd, "AT+QXXL=1")) {
        if (!open_path(19)) return RC_OK;
        int rc = audio_ftm_process(kSpeakerCase, 1, 1);
        if (rc != 0) {
            LOGE("Start Speaker Playback failed, error %d", rc);
            return RC_ERROR;
        }
        return RC_OK;
    }
    if (line_is(cmd, "AT+QXXL=0")) {
        if (!close_path()) return RC_OK;
        return audio_ftm_process(kSpeakerCase, 0, 1) == 0 ? RC_OK : RC_ERROR;
    }
    if (line_starts(cmd, "AT+QXPTS=", 9)) return play_file(kPlaySpeaker, cmd);
    if (line_starts(cmd, "AT+QXPTR=", 9)) return play_file(kPlayReceiver, cmd);
    return invalid_command(cmd);
}

int fm_test_handler(char *cmd, int arg, char *resp) {
    if (!line_is(cmd, "AT+QXFM=3")) return invalid_command(cmd);
    return test_app_ok("mbhc_status") ? RC_OK : RC_ERROR;
}

int echo_handler(char *cmd, int arg, char *resp) {
    for (const EchoPath &p : kEchoPaths) {
        if (p.gain ? line_starts(cmd, p.open, strlen(p.open)) : line_is(cmd, p.open)) {
            // A repeated open answers ATOK where a first one answers OK.
            if (g_audio_test_state.load() == p.state) return RC_ATOK;
            g_audio_test_state.store(p.state);
            int rc;
            if (p.gain) {
                Fields f = split_fields(cmd);
                rc = p.start(f[2] ? to_int(f[2]) : kDefaultGain);
            } else {
                rc = p.start_plain();
            }
            return rc == 0 ? RC_OK : RC_ERROR;
        }
        if (line_is(cmd, p.close)) {
            if (!close_path()) return RC_ATOK;
            return p.exit() == 0 ? RC_OK : RC_ERROR;
        }
    }
    return invalid_command(cmd);
}

int multi_mic_handler(char *cmd, int arg, char *resp) {
    for (const MicCase &m : kMicCases) {
        if (line_is(cmd, m.open)) {
            if (!open_path(m.state)) return RC_ATOK;
            return audio_ftm_process(m.test_case, 1, 100) == 0 ? RC_ATOK : RC_ATNG;
        }
        if (line_is(cmd, m.close)) {
            if (!close_path()) return RC_ATOK;
            return audio_ftm_process(m.test_case, 0, 0) == 0 ? RC_ATOK : RC_ATNG;
        }
    }
    if (line_is(cmd, "AT+QX_AUD_MIC=5,1")) {
        if (!open_path(26)) return RC_ATOK;
        return startMic2headset(100) == 0 ? RC_ATOK : RC_ATNG;
    }
    if (line_is(cmd, "AT+QX_AUD_MIC=5,0")) {
        if (close_path()) exitMic2headset();
        return RC_ATOK;
    }
    if (line_is(cmd, "AT+QX_AUD_MIC=0")) {
        int state = g_audio_test_state.exchange(0);
        if (state == 0) return RC_ATOK;
        LOGI("test_case:%d", state + kMicCaseOffset);
        return audio_ftm_process(state + kMicCaseOffset, 0, 0) == 0 ? RC_ATOK : RC_ATNG;
    }
    return RC_ATERROR;
}

int dual_mic_to_headset_handler(char *cmd, int arg, char *resp) { return run_loopback(kMicToHeadset, cmd); }
int main_mic_to_headset_right_handler(char *cmd, int arg, char *resp) { return run_loopback(kMainToHeadsetR, cmd); }
int sub_mic_to_headset_left_handler(char *cmd, int arg, char *resp) { return run_loopback(kSubToHeadsetL, cmd); }
int headset_to_speaker_handler(char *cmd, int arg, char *resp) { return run_loopback(kHeadsetToSpeaker, cmd); }
int headset_to_earpiece_handler(char *cmd, int arg, char *resp) { return run_loopback(kHeadsetToEarpiece, cmd); }
int headset_to_right_speaker_handler(char *cmd, int arg, char *resp) {
    return run_loopback(kHeadsetToRightSpeaker, cmd);
}
int headset_to_left_speaker_handler(char *cmd, int arg, char *resp) { return run_loopback(kHeadsetToLeftSpeaker, cmd); }
int headset_to_speaker_with_gain_handler(char *cmd, int arg, char *resp) {
    return run_loopback(kHeadsetToSpeakerGains, cmd);
}
int headset_to_earpiece_with_gain_handler(char *cmd, int arg, char *resp) {
    return run_loopback(kHeadsetToEarpieceGains, cmd);
}

// Karaoke and hi-fi playback own path states 16 to 18 but are not built.
int ktv_test_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
int play_hifi_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }

int double_receiver_handler(char *cmd, int arg, char *resp) {
    if (strstr(cmd, "AT+QXPTRTS=1") != nullptr) {
        Fields f = split_fields(cmd);
        if (f.count < 2) {
            LOGE("filepath error");
            return RC_ERROR;
        }
        char *path = f.count >= 3 ? f.at[2] : f.at[1];
        int volume = f.count >= 3 ? to_int(f.at[1]) : 100;
        uppercase_to_lowcase(path, static_cast<int>(strlen(path)));
        if (!file_exists(path)) {
            quote_reason(resp, "file not exisit.");
            return RC_ERROR;
        }
        if (!open_path(28)) return RC_ATOK;
        int rc = audio_ftm_process(kDoubleReceiverCase, 1, volume, path);
        if (rc != 0) {
            LOGE("double receiver, error %d", rc);
            return RC_ERROR;
        }
        return RC_OK;
    }
    if (line_is(cmd, "AT+QXPTRTS=0")) {
        if (!close_path()) return RC_ATOK;
        return audio_ftm_process(kDoubleReceiverCase, 0, 0) == 0 ? RC_OK : RC_ERROR;
    }
    return RC_OK;  // every other form is accepted without action
}

int spk_mic_to_earpiece_handler(char *cmd, int arg, char *resp) {
    // "play_audio 3" and the path, with no separator; a line is at most 2048 characters.
    char message[kLineSize + 16] = {0};
    if (line_starts(cmd, "AT+QX_AUD_STM=1", 15)) {
        Fields f = split_fields(cmd);
        if (f[1] == nullptr || !file_exists(f[1])) {
            quote_reason(resp, "file not exisit.");
            return RC_ATNG;
        }
        if (!open_path(29)) return RC_ATOK;
        int rc = audio_ftm_process(kSpeakerMicToEarpieceCase, 1, 100);
        if (rc != 0) {
            body_printf(resp, "\"DOUBLE_MIC_TO_HP error:%d\"", rc);
            return RC_ERROR;
        }
        snprintf(message, sizeof message, "play_audio 3%s", f[1]);
        return test_app_ok(message) ? RC_ATOK : RC_ATNG;
    }
    if (line_is(cmd, "AT+QX_AUD_STM=0")) {
        if (!close_path()) return RC_ATOK;
        int rc = audio_ftm_process(kSpeakerMicToEarpieceCase, 0, 100);
        if (rc != 0) {
            body_printf(resp, "\"DOUBLE_MIC_TO_HP error:%d\"", rc);
            return RC_ATNG;
        }
        return test_app_ok("play_audio 6") ? RC_ATOK : RC_ATNG;
    }
    return RC_ATERROR;
}

int audio_record_handler(char *cmd, int arg, char *resp) {
    if (line_starts(cmd, "AT+QX_AUD_RECD=0,", 17)) {
        Fields f = split_fields(cmd);
        int32_t ms = 0;
        if (!record_ms(f[2], ms) || ms % 100 != 0) {
            quote_reason(resp, "time set error!!");
            return RC_ATERROR;
        }
        if (f[1] == nullptr || strstr(kMicTypeNames, f[1]) == nullptr) return mic_type_error(resp, RC_ATERROR);
        ask_test_app("set_silent_mode 0");
        start_recording(f[1], ms);
        return RC_ATOK;
    }
    if (line_starts(cmd, "AT+QX_AUD_RECD=1,", 17)) {
        const Mic *mic = find_mic(split_fields(cmd)[1]);
        if (mic == nullptr) return mic_type_error(resp, RC_ERROR);
        char busy[PROPERTY_VALUE_MAX] = {0};
        property_get(mic->busy, busy, "0");
        const bool pending = strcmp(busy, "1") == 0 || (strcmp(busy, "0") == 0 && !file_exists(mic->file));
        quote_reason(resp, pending ? "0" : "1");
        return RC_ATOK;
    }
    if (line_starts(cmd, "AT+QX_AUD_RECD=2,", 17)) {
        start_recording(split_fields(cmd)[1], kRecordLimitMs);  // the worker judges the type
        return RC_ATOK;
    }
    if (line_starts(cmd, "AT+QX_AUD_RECD=3,", 17)) {
        const Mic *mic = find_mic(split_fields(cmd)[1]);
        if (mic == nullptr) return mic_type_error(resp, RC_ERROR);
        property_set(mic->busy, "0");
        return RC_ATOK;
    }
    quote_reason(resp, "parameter error");
    return RC_ATERROR;
}

// ---- general table

int smart_speaker_Amplifier_calibrate_handler(char *cmd, int arg, char *resp) {
    if (line_is(cmd, "AT+ZNGF=0")) return calibrate_on_line(resp);
    if (line_is(cmd, "AT+ZNGF=apk")) {
        // The station's app shows the amplifier's own result text.
        return speaker_amplifier_calibrate(resp, kRespSize) == 0 ? RC_OK : RC_ERROR;
    }
    if (line_is(cmd, "AT+ZNGF=2")) {
        int status = smartpa_check_mtpex();
        if (status < 0) return RC_ERROR;
        body_printf(resp, "\r\n%d\r\n", status);
        return RC_OK;
    }
    if (line_is(cmd, "AT+ZNGF=3")) {
        if (get_smartpa_manufacturer() != 0) {
            quote_reason(resp, "Not support");
            return RC_ERROR;
        }
        if (smartpa_reset_mtpex() < 0) return RC_ERROR;
        set_amplifier_items("0");
        return RC_OK;
    }
    if (line_is(cmd, "AT+ZNGF=4")) {
        LOGI("do nothing");
        return RC_OK;
    }
    if (line_is(cmd, "AT+ZNGF=5")) {
        if (start_worker(speaker_calibrate_thread, nullptr) != 0) LOGE("calibrate thread not started");
        return RC_OK;
    }
    LOGE("command invalid");
    return RC_ERROR;
}

int headset_type_handler(char *cmd, int arg, char *resp) {
    if (line_starts(cmd, "AT+QX_AUD_EAR=1", 15)) return mos_answer(resp, ftm_mbhc_mos_test());
    if (line_starts(cmd, "AT+QX_AUD_EAR=2", 15)) return hp_type_answer(resp, ftm_mbhc_get_hp_type());
    LOGE("command invalid");
    return RC_ATERROR;
}
