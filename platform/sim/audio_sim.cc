// The audio factory-test library on the simulated phone. Results come from the
// key=value script <root>/.sim/audio (a call's name, or "ftm.<case>" for a numbered test
// case, gives its return value; "ftm.<case>.stop" overrides it for stopping the case;
// unlisted calls succeed). The fault "audio" fails every path call, "smartpa" takes the
// amplifier off its bus and "mbhc" silences the headset detection. Every call is recorded
// as "audio <call>(<args>) -> <result>"; the recording cases drive the recorder model
// (audio_recorder.cc).
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string>
#include <thread>

#include "platform/audio.h"
#include "platform/device.h"
#include "platform/sim/audio_recorder.h"
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

// The amplifier does not answer on its bus: the fault "smartpa", or "audio" for all parts.
bool amplifier_absent() { return sim::fault("audio") || sim::fault("smartpa"); }

int ftm(const char *name, int test_case, int enable, int volume, const char *path) {
    std::string args = num(test_case) + "," + num(enable) + "," + num(volume) + (path ? std::string(",") + path : "");
    std::string key = "ftm." + num(test_case);
    // One script read per call, so a sequence of results advances once per call.
    std::string stop = enable ? "" : sim::script_text(sim::state("audio"), key + ".stop", "");
    long scripted_rc = stop.empty() ? scripted(key.c_str(), 0) : strtol(stop.c_str(), nullptr, 10);
    int rc = sim::fault("audio") ? -1 : static_cast<int>(scripted_rc);
    if (rc == 0 && enable && path && *path && !dev::exists(path)) rc = 2;  // nothing to play
    sim::record("audio", std::string(name) + "(" + args + ") -> " + num(rc));
    if (rc == 0 && sim::recorder_file(test_case)) {
        if (enable)
            sim::recorder_start(test_case);
        else
            sim::recorder_stop(test_case);
    }
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
    int type = sim::fault("mbhc") ? -1 : static_cast<int>(scripted("hp_type", 1));
    sim::record("audio", "ftm_mbhc_get_hp_type() -> " + num(type));
    return type;
}

int ftm_mbhc_mos_test(void) {
    int rc = sim::fault("audio") || sim::fault("mbhc") ? -1 : static_cast<int>(scripted("mos_test", 1));
    sim::record("audio", "ftm_mbhc_mos_test() -> " + num(rc));
    return rc;
}

int get_smartpa_manufacturer(void) {
    int maker = amplifier_absent() ? -1 : static_cast<int>(scripted("smartpa_manufacturer", 0));
    sim::record("audio", "get_smartpa_manufacturer() -> " + num(maker));
    return maker;
}

// A calibration plays its tone for smartpa_calibrate_ms before the result is known.
int smartpa_calibrate(char *text, int len) {
    long ms = scripted("smartpa_calibrate_ms", 0);
    if (ms > 0 && !amplifier_absent()) std::this_thread::sleep_for(std::chrono::milliseconds(ms < 60000 ? ms : 60000));
    int rc = amplifier_absent() ? -1 : static_cast<int>(scripted("smartpa_calibrate", 0));
    const char *plain = rc == 0 ? "calibrate ok" : "calibrate fail";
    std::string result = amplifier_absent() ? "smartpa not found"
                                            : sim::script_text(sim::state("audio"), "smartpa_calibrate_text", plain);
    if (text && len > 0) snprintf(text, static_cast<size_t>(len), "%s", result.c_str());
    sim::record("audio", "smartpa_calibrate() -> " + num(rc));
    return rc;
}

int smartpa_check_mtpex(void) {
    int rc = amplifier_absent() ? -1 : static_cast<int>(scripted("smartpa_mtpex", 1));
    sim::record("audio", "smartpa_check_mtpex() -> " + num(rc));
    return rc;
}

int smartpa_reset_mtpex(void) {
    int rc = amplifier_absent() ? -1 : static_cast<int>(scripted("smartpa_reset_mtpex", 0));
    sim::record("audio", "smartpa_reset_mtpex() -> " + num(rc));
    return rc;
}

}  // extern "C"
