// The audio factory-test library on the simulated phone. Results come from the
// key=value script <root>/.sim/audio (a call's name, or "ftm.<case>" for a numbered test
// case, gives its return value; unlisted calls succeed); the fault "audio" fails every
// path call. Every call is recorded as "audio <call>(<args>) -> <result>". The recorder
// cases leave a short silent WAV file where the phone's recorder would write its take.
#include <cstdio>
#include <cstring>
#include <filesystem>
#include <string>

#include "platform/audio.h"
#include "platform/device.h"
#include "platform/sim/script.h"
#include "platform/sim/sim.h"

namespace {

long scripted(const char *key, long def) { return sim::script_long(sim::state("audio"), key, def); }

int path_call(const char *name, const std::string &args) {
    int rc = sim::fault("audio") ? -1 : static_cast<int>(scripted(name, 0));
    sim::record("audio", std::string(name) + "(" + args + ") -> " + std::to_string(rc));
    return rc;
}

std::string num(int n) { return std::to_string(n); }

// 44-byte header of an empty 16-bit mono 48 kHz WAV file.
std::string empty_wav() {
    auto le32 = [](unsigned v) { return std::string{char(v), char(v >> 8), char(v >> 16), char(v >> 24)}; };
    auto le16 = [](unsigned v) { return std::string{char(v), char(v >> 8)}; };
    return "RIFF" + le32(36) + "WAVEfmt " + le32(16) + le16(1) + le16(1) + le32(48000) + le32(96000) + le16(2) + le16(16) +
           "data" + le32(0);
}

const char *record_file(int test_case) {
    switch (test_case) {
        case 51: return "/sdcard/engineermode/main-record.wav";
        case 52: return "/sdcard/engineermode/sub-record.wav";
        case 53: return "/sdcard/engineermode/smart-record.wav";
        case 54: return "/sdcard/engineermode/hp-record.wav";
        case 55: return "/sdcard/engineermode/double-record.wav";
        default: return nullptr;
    }
}

int ftm(const char *name, int test_case, int enable, int volume, const char *path) {
    std::string args = num(test_case) + "," + num(enable) + "," + num(volume) + (path ? std::string(",") + path : "");
    std::string key = "ftm." + num(test_case);
    int rc = sim::fault("audio") ? -1 : static_cast<int>(scripted(key.c_str(), 0));
    if (rc == 0 && enable && path && *path && !dev::exists(path)) rc = 2;  // nothing to play
    if (rc == 0 && enable && record_file(test_case)) {
        std::string file = sim::map(record_file(test_case));
        std::error_code ec;
        std::filesystem::create_directories(std::filesystem::path(file).parent_path(), ec);
        sim::write_file_atomic(file, empty_wav());
    }
    sim::record("audio", std::string(name) + "(" + args + ") -> " + num(rc));
    return rc;
}

}  // namespace

extern "C" {

int startMainEchoTest(void) { return path_call("startMainEchoTest", ""); }
int exitMainEchoTest(void) { return path_call("exitMainEchoTest", ""); }
int startSubEchoTest(void) { return path_call("startSubEchoTest", ""); }
int exitSubEchoTest(void) { return path_call("exitSubEchoTest", ""); }
int startReceiveTest(int gain) { return path_call("startReceiveTest", num(gain)); }
int exitReceiveTest(void) { return path_call("exitReceiveTest", ""); }
int startSendTest(int gain) { return path_call("startSendTest", num(gain)); }
int exitSendTest(void) { return path_call("exitSendTest", ""); }
int startHeadsetEchoTest(void) { return path_call("startHeadsetEchoTest", ""); }
int exitHeadsetEchoTest(void) { return path_call("exitHeadsetEchoTest", ""); }
int startMic2headset(int gain) { return path_call("startMic2headset", num(gain)); }
int exitMic2headset(void) { return path_call("exitMic2headset", ""); }
int startMain2headsetR(int gain) { return path_call("startMain2headsetR", num(gain)); }
int exitMain2headsetR(void) { return path_call("exitMain2headsetR", ""); }
int startSub2headsetL(int gain) { return path_call("startSub2headsetL", num(gain)); }
int exitSub2headsetL(void) { return path_call("exitSub2headsetL", ""); }
int startHeadset2speaker(int gain) { return path_call("startHeadset2speaker", num(gain)); }
int exitHeadset2speaker(void) { return path_call("exitHeadset2speaker", ""); }
int startHeadset2earpiece(int gain) { return path_call("startHeadset2earpiece", num(gain)); }
int exitHeadset2earpiece(void) { return path_call("exitHeadset2earpiece", ""); }
int startHeadset2SpeakerWithGain(int g1, int g2) {
    return path_call("startHeadset2SpeakerWithGain", num(g1) + "," + num(g2));
}
int exitHeadset2SpeakerWithGain(void) { return path_call("exitHeadset2SpeakerWithGain", ""); }
int startHeadset2EarpieceWithGain(int g1, int g2) {
    return path_call("startHeadset2EarpieceWithGain", num(g1) + "," + num(g2));
}
int exitHeadset2EarpieceWithGain(void) { return path_call("exitHeadset2EarpieceWithGain", ""); }
int startHeadset2RightSpeaker(int gain) { return path_call("startHeadset2RightSpeaker", num(gain)); }
int exitHeadset2RightSpeaker(void) { return path_call("exitHeadset2RightSpeaker", ""); }
int startHeadset2LeftSpeaker(int gain) { return path_call("startHeadset2LeftSpeaker", num(gain)); }
int exitHeadset2LeftSpeaker(void) { return path_call("exitHeadset2LeftSpeaker", ""); }

int audio_ftm_process(int test_case, int enable, int volume, const char *path) {
    return ftm("audio_ftm_process", test_case, enable, volume, path);
}

int audio_ftm_process_full(int test_case, int enable, int volume, const char *path) {
    return ftm("audio_ftm_process_full", test_case, enable, volume, path);
}

int ftm_mbhc_get_hp_type(void) {
    int type = static_cast<int>(scripted("hp_type", 1));
    sim::record("audio", "ftm_mbhc_get_hp_type() -> " + num(type));
    return type;
}

int ftm_mbhc_mos_test(void) {
    int rc = sim::fault("audio") ? -1 : static_cast<int>(scripted("mos_test", 1));
    sim::record("audio", "ftm_mbhc_mos_test() -> " + num(rc));
    return rc;
}

int get_smartpa_manufacturer(void) { return static_cast<int>(scripted("smartpa_manufacturer", 0)); }

int smartpa_calibrate(char *text, int len) {
    int rc = sim::fault("audio") ? -1 : static_cast<int>(scripted("smartpa_calibrate", 0));
    std::string result = sim::script_text(sim::state("audio"), "smartpa_calibrate_text", rc == 0 ? "calibrate ok" : "calibrate fail");
    if (text && len > 0) snprintf(text, static_cast<size_t>(len), "%s", result.c_str());
    sim::record("audio", "smartpa_calibrate() -> " + num(rc));
    return rc;
}

int smartpa_check_mtpex(void) {
    int rc = sim::fault("audio") ? -1 : static_cast<int>(scripted("smartpa_mtpex", 1));
    sim::record("audio", "smartpa_check_mtpex() -> " + num(rc));
    return rc;
}

int smartpa_reset_mtpex(void) {
    int rc = sim::fault("audio") ? -1 : static_cast<int>(scripted("smartpa_reset_mtpex", 0));
    sim::record("audio", "smartpa_reset_mtpex() -> " + num(rc));
    return rc;
}

}  // extern "C"
