// Audio path tests: the one path state shared by every opening and closing command, the
// audio library calls each line makes (in order, with their arguments), recordings on
// their worker, the amplifier calibration and headset identification.
#include <sys/socket.h>
#include <unistd.h>

#include <chrono>
#include <cstring>
#include <filesystem>
#include <thread>

#include "handlers/audio.h"
#include "platform/sim/sim.h"
#include "tests/support/checks.h"
#include "tests/support/in_process.h"

namespace {

const std::string kTone = "/sdcard/music/tone.wav";
const std::string kMainFile = "/sdcard/engineermode/main-record.wav";
const char *kMainBusy = "sys.is_audio_working.main_mic";
const char *kSubBusy = "sys.is_audio_working.sub_mic";

std::string nv_pattern() {  // every byte non-zero, so a stray write shows
    return nv_fill(0x21, 181);
}

// The audio library's calls recorded in events.log, in order, without their kind.
std::vector<std::string> audio_calls(const std::string &log) {
    std::vector<std::string> calls;
    size_t at = 0;
    while (at < log.size()) {
        size_t end = log.find('\n', at);
        if (end == std::string::npos) end = log.size();
        std::string line = log.substr(at, end - at);
        if (line.rfind("audio ", 0) == 0) calls.push_back(line.substr(6));
        at = end + 1;
    }
    return calls;
}

// The time stamp of the first event of kind whose detail starts with detail; -1 if none.
long long event_ms(const Sandbox &box, const std::string &kind, const std::string &detail) {
    for (const Event &e : box.event_list())
        if (e.kind == kind && e.detail.rfind(detail, 0) == 0) return e.ms;
    return -1;
}


// Sets one key of the audio library's script ("ftm.22=-5").
void script(const Sandbox &b, const std::string &line) {
    size_t eq = line.find('=');
    std::string value = line.substr(eq + 1);
    sim::write_kv(b.path("/.sim/audio"), line.substr(0, eq), &value);
}

// A gtest name from a command line and a tag: "AT+QXMTE=1,12a" + "BadGain" reads
// AtQxmte_1_12a_BadGain.
std::string case_name(const std::string &line, const std::string &tag) {
    std::string out;
    bool word_start = true;
    for (char c : line) {
        if (isalnum(static_cast<unsigned char>(c))) {
            out += word_start ? static_cast<char>(toupper(c)) : static_cast<char>(tolower(c));
            word_start = false;
        } else {
            if (c != '+' && !out.empty() && out.back() != '_') out += '_';
            word_start = true;
        }
    }
    while (!out.empty() && out.back() == '_') out.pop_back();
    return tag.empty() ? out : out + "_" + tag;
}

using Setup = void (*)(const Sandbox &);

class AudioTest : public InProcess {
protected:
    void SetUp() override {
        InProcess::SetUp();
        g_audio_test_state = 0;
        box.write("/.sim/nv.bin", nv_pattern());
        box.write(kTone, "RIFF");
    }
    void TearDown() override {
        g_audio_test_state = 0;
        InProcess::TearDown();
    }
    bool wait_event(const std::string &text, int ms = 5000) const {
        for (int waited = 0; waited < ms; waited += 10) {
            if (box.events().find(text) != std::string::npos) return true;
            std::this_thread::sleep_for(std::chrono::milliseconds(10));
        }
        return false;
    }
};

// ---- one line against a path state

struct Case {
    const char *tag;
    int state;  // the path state before the line
    std::string line;
    Setup setup;
    std::string body;
    const char *word;
    std::vector<std::string> calls;  // every audio library call, in order
    int after;                       // the path state after the line
    std::vector<std::string> effects = {};  // other events, in order
    std::vector<std::pair<const char *, const char *>> props = {};
};

// ctest lists a case by its line, not by its bytes.
void PrintTo(const Case &c, std::ostream *os) { *os << c.line << (*c.tag ? " (" : "") << c.tag << (*c.tag ? ")" : ""); }

class AudioLine : public AudioTest, public ::testing::WithParamInterface<Case> {};

TEST_P(AudioLine, Answers) {
    const Case &c = GetParam();
    if (c.setup) c.setup(box);
    g_audio_test_state = c.state;
    const std::string frame = c.line + "\r\n" + c.body + "\r\n" + c.word + "\r\n";
    EXPECT_EQ(serve(c.line, SRC_TCP, frame.size()), frame);
    const std::string log = box.events();
    EXPECT_EQ(audio_calls(log), c.calls) << log;
    EXPECT_EQ(g_audio_test_state.load(), c.after);
    expect_in_order(log, c.effects);
    for (auto [name, value] : c.props) EXPECT_EQ(box.prop(name), value) << name;
    EXPECT_EQ(box.read("/.sim/nv.bin"), nv_pattern());
}

std::string line_name(const ::testing::TestParamInfo<Case> &info) {
    return case_name(info.param.line, info.param.tag);
}

void main_fails(const Sandbox &b) { script(b, "startMic2headset=-1"); }
void exit_fails(const Sandbox &b) {
    for (const char *call : {"exitMic2headset", "exitReceiveTest", "exitSendTest", "exitMainEchoTest", "exitSubEchoTest"})
        script(b, std::string(call) + "=3");
}
void audio_fault(const Sandbox &b) { b.fault("audio"); }
void receive_fails(const Sandbox &b) { script(b, "startReceiveTest=-2"); }

INSTANTIATE_TEST_SUITE_P(Loopbacks, AudioLine, ::testing::Values(
    Case{"", 0, "AT+QXMTE=1,50", nullptr, "", "OK", {"startMic2headset(50) -> 0"}, 7},
    Case{"Reopen", 7, "AT+QXMTE=1,50", nullptr, "", "OK", {}, 7},
    Case{"OverAnotherPath", 3, "AT+QXMTE=1,50", nullptr, "", "OK", {"startMic2headset(50) -> 0"}, 7},
    Case{"Fails", 0, "AT+QXMTE=1,50", main_fails, "", "ERROR", {"startMic2headset(50) -> -1"}, 7},
    Case{"BadGain", 0, "AT+QXMTE=1,12a", nullptr, "", "ERROR", {}, 0},
    Case{"NoGain", 0, "AT+QXMTE=1", nullptr, "", "ERROR", {}, 0},
    Case{"EmptyGain", 5, "AT+QXMTE=1,", nullptr, "", "ERROR", {}, 5},
    Case{"HugeGain", 0, "AT+QXMTE=1,99999999999", nullptr, "", "OK", {"startMic2headset(2147483647) -> 0"}, 7},
    Case{"ExtraField", 0, "AT+QXMTE=1,80,5", nullptr, "", "OK", {"startMic2headset(80) -> 0"}, 7},
    // The line is cut as a tokeniser cuts it: an empty field is no field.
    Case{"EmptyFieldSkipped", 0, "AT+QXMTE=1,,50", nullptr, "", "OK", {"startMic2headset(50) -> 0"}, 7},
    Case{"EmptyFieldSkipped", 0, "AT+QXEMTSA=1,30,,40", nullptr, "", "OK", {"startHeadset2SpeakerWithGain(30,40) -> 0"}, 12},
    Case{"", 7, "AT+QXMTE=0", nullptr, "", "OK", {"exitMic2headset() -> 0"}, 0},
    Case{"ClosesAnyPath", 12, "AT+QXMTE=0", nullptr, "", "OK", {"exitMic2headset() -> 0"}, 0},
    Case{"ExitFails", 7, "AT+QXMTE=0", exit_fails, "", "OK", {"exitMic2headset() -> 3"}, 0},
    Case{"Reclose", 0, "AT+QXMTE=0", nullptr, "", "OK", {}, 0},
    Case{"", 7, "AT+QXMTE=0,1", nullptr, "", "ERROR", {}, 7},
    Case{"", 0, "AT+QXMTER=1,80", nullptr, "", "OK", {"startMain2headsetR(80) -> 0"}, 8},
    Case{"", 8, "AT+QXMTER=0", nullptr, "", "OK", {"exitMain2headsetR() -> 0"}, 0},
    Case{"", 0, "AT+QXVMTEL=1,80", nullptr, "", "OK", {"startSub2headsetL(80) -> 0"}, 9},
    Case{"", 9, "AT+QXVMTEL=0", nullptr, "", "OK", {"exitSub2headsetL() -> 0"}, 0},
    Case{"BadGain", 0, "AT+QXVMTEL=1,-5", nullptr, "", "ERROR", {}, 0},
    Case{"", 0, "AT+QXEMTS=1,80", nullptr, "", "OK", {"startHeadset2speaker(80) -> 0"}, 10},
    Case{"", 10, "AT+QXEMTS=0", nullptr, "", "OK", {"exitHeadset2speaker() -> 0"}, 0},
    Case{"", 0, "AT+QXEMTR=1,80", nullptr, "", "OK", {"startHeadset2earpiece(80) -> 0"}, 11},
    Case{"", 11, "AT+QXEMTR=0", nullptr, "", "OK", {"exitHeadset2earpiece() -> 0"}, 0},
    Case{"", 0, "AT+QXEMTSR=1,80", nullptr, "", "OK", {"startHeadset2RightSpeaker(80) -> 0"}, 14},
    Case{"", 14, "AT+QXEMTSR=0", nullptr, "", "OK", {"exitHeadset2RightSpeaker() -> 0"}, 0},
    Case{"", 0, "AT+QXEMTSL=1,80", nullptr, "", "OK", {"startHeadset2LeftSpeaker(80) -> 0"}, 15},
    Case{"", 15, "AT+QXEMTSL=0", nullptr, "", "OK", {"exitHeadset2LeftSpeaker() -> 0"}, 0},
    Case{"", 0, "AT+QXEMTSA=1,30,40", nullptr, "", "OK", {"startHeadset2SpeakerWithGain(30,40) -> 0"}, 12},
    Case{"Reopen", 12, "AT+QXEMTSA=1,30,40", nullptr, "", "OK", {}, 12},
    Case{"OneGain", 0, "AT+QXEMTSA=1,30", nullptr, "", "ERROR", {}, 0},
    Case{"BadGain", 0, "AT+QXEMTSA=1,30,4x", nullptr, "", "ERROR", {}, 0},
    Case{"", 12, "AT+QXEMTSA=0", nullptr, "", "OK", {"exitHeadset2SpeakerWithGain() -> 0"}, 0},
    Case{"", 0, "AT+QXEMTRA=1,30,40", nullptr, "", "OK", {"startHeadset2EarpieceWithGain(30,40) -> 0"}, 13},
    Case{"Fails", 0, "AT+QXEMTRA=1,30,40", audio_fault, "", "ERROR", {"startHeadset2EarpieceWithGain(30,40) -> -1"}, 13},
    Case{"", 13, "AT+QXEMTRA=0", nullptr, "", "OK", {"exitHeadset2EarpieceWithGain() -> 0"}, 0}), line_name);

INSTANTIATE_TEST_SUITE_P(Echo, AudioLine, ::testing::Values(
    Case{"", 0, "AT+QXMT=0,1", nullptr, "", "OK", {"startReceiveTest(100) -> 0"}, 3},
    Case{"", 0, "AT+QXMT=0,1,70", nullptr, "", "OK", {"startReceiveTest(70) -> 0"}, 3},
    Case{"EmptyGainIsNoGain", 0, "AT+QXMT=0,1,", nullptr, "", "OK", {"startReceiveTest(100) -> 0"}, 3},
    Case{"Reopen", 3, "AT+QXMT=0,1", nullptr, "", "ATOK", {}, 3},
    Case{"Fails", 0, "AT+QXMT=0,1", receive_fails, "", "ERROR", {"startReceiveTest(100) -> -2"}, 3},
    Case{"", 3, "AT+QXMT=0,0", nullptr, "", "OK", {"exitReceiveTest() -> 0"}, 0},
    Case{"ExitFails", 3, "AT+QXMT=0,0", exit_fails, "", "ERROR", {"exitReceiveTest() -> 3"}, 0},
    Case{"Reclose", 0, "AT+QXMT=0,0", nullptr, "", "ATOK", {}, 0},
    Case{"", 0, "AT+QXMT=1,1,60", nullptr, "", "OK", {"startSendTest(60) -> 0"}, 4},
    Case{"Reopen", 4, "AT+QXMT=1,1", nullptr, "", "ATOK", {}, 4},
    Case{"", 4, "AT+QXMT=1,0", nullptr, "", "OK", {"exitSendTest() -> 0"}, 0},
    Case{"ClosesAnyPath", 6, "AT+QXMT=1,0", nullptr, "", "OK", {"exitSendTest() -> 0"}, 0},
    Case{"ExitFails", 4, "AT+QXMT=1,0", exit_fails, "", "ERROR", {"exitSendTest() -> 3"}, 0},
    Case{"Reclose", 0, "AT+QXMT=1,0", nullptr, "", "ATOK", {}, 0},
    Case{"", 0, "AT+QXMT=2,1", nullptr, "", "OK", {"startSubEchoTest() -> 0"}, 5},
    Case{"Fails", 0, "AT+QXMT=2,1", audio_fault, "", "ERROR", {"startSubEchoTest() -> -1"}, 5},
    Case{"", 5, "AT+QXMT=2,0", nullptr, "", "OK", {"exitSubEchoTest() -> 0"}, 0},
    Case{"", 0, "AT+QXMT=3,1", nullptr, "", "OK", {"startHeadsetEchoTest() -> 0"}, 6},
    Case{"Reopen", 6, "AT+QXMT=3,1", nullptr, "", "ATOK", {}, 6},
    Case{"", 6, "AT+QXMT=3,0", nullptr, "", "OK", {"exitHeadsetEchoTest() -> 0"}, 0},
    Case{"", 0, "AT+QXMT=2,1,50", nullptr, "", "ERROR", {}, 0},
    Case{"", 4, "AT+QXMT=4,1", nullptr, "", "ERROR", {}, 4},
    Case{"", 0, "AT+EALT=1,1", nullptr, "", "OK", {"startMainEchoTest() -> 0"}, 1},
    Case{"Reopen", 1, "AT+EALT=1,1", nullptr, "", "OK", {}, 1},
    Case{"Fails", 0, "AT+EALT=1,1", audio_fault, "", "ERROR", {"startMainEchoTest() -> -1"}, 1},
    Case{"", 1, "AT+EALT=1,2", nullptr, "", "OK", {"startSubEchoTest() -> 0"}, 2},
    Case{"", 0, "AT+EALT=1,3", nullptr, "", "ERROR", {}, 0},
    Case{"", 1, "AT+EALT=0,1", nullptr, "", "OK", {"exitMainEchoTest() -> 0"}, 0},
    Case{"ExitFails", 1, "AT+EALT=0,1", exit_fails, "", "ERROR", {"exitMainEchoTest() -> 3"}, 0},
    Case{"ExitFails", 2, "AT+EALT=0,2", exit_fails, "", "OK", {"exitSubEchoTest() -> 3"}, 0},
    Case{"ClosesAll", 2, "AT+EALT=0,3", nullptr, "", "ERROR", {}, 0},
    Case{"Reclose", 0, "AT+EALT=0,1", nullptr, "", "ATOK", {}, 0},
    Case{"", 1, "AT+EALT=2", nullptr, "", "ERROR", {}, 1},
    Case{"", 0, "AT+QXFM=3", nullptr, "", "OK", {}, 0, {"message mbhc_status -> ok"}},
    Case{"Refused", 0, "AT+QXFM=3", [](const Sandbox &b) { b.fault("testapp-refuse"); }, "", "ERROR", {}, 0},
    Case{"Silent", 0, "AT+QXFM=3", [](const Sandbox &b) { b.fault("testapp-silent"); }, "", "ERROR", {}, 0},
    Case{"", 0, "AT+QXFM=1", nullptr, "", "ERROR", {}, 0}), line_name);

void tone_fails(const Sandbox &b) { script(b, "ftm.22=-5"); }
void close_fails(const Sandbox &b) {
    for (const char *c : {"ftm.22.stop=3", "ftm.41.stop=3", "ftm.25.stop=3", "ftm.6.stop=3", "ftm.48.stop=3"}) script(b, c);
}
void refuse(const Sandbox &b) { b.fault("testapp-refuse"); }

INSTANTIATE_TEST_SUITE_P(Playback, AudioLine, ::testing::Values(
    Case{"", 0, "AT+QXXL=1", nullptr, "", "OK", {"audio_ftm_process(22,1,1) -> 0"}, 19},
    Case{"Reopen", 19, "AT+QXXL=1", nullptr, "", "OK", {}, 19},
    Case{"Fails", 0, "AT+QXXL=1", tone_fails, "", "ERROR", {"audio_ftm_process(22,1,1) -> -5"}, 19},
    Case{"", 19, "AT+QXXL=0", nullptr, "", "OK", {"audio_ftm_process(22,0,1) -> 0"}, 0},
    Case{"StopFails", 19, "AT+QXXL=0", close_fails, "", "ERROR", {"audio_ftm_process(22,0,1) -> 3"}, 0},
    Case{"Reclose", 0, "AT+QXXL=0", nullptr, "", "OK", {}, 0},
    Case{"", 0, "AT+QXXL=2", nullptr, "", "ERROR", {}, 0},
    Case{"Lowered", 0, "AT+QXPTS=1,/SDCARD/Music/Tone.WAV", nullptr, "", "OK",
         {"audio_ftm_process_full(22,1,1,/sdcard/music/tone.wav) -> 0"}, 20},
    Case{"Reopen", 20, "AT+QXPTS=1," + kTone, nullptr, "", "OK", {}, 20},
    Case{"Missing", 0, "AT+QXPTS=1,/sdcard/music/none.wav", nullptr, "", "ERROR", {}, 0},
    Case{"NoPath", 0, "AT+QXPTS=1", nullptr, "", "ERROR", {}, 0},
    Case{"EmptyFieldSkipped", 0, "AT+QXPTS=1,," + kTone, nullptr, "", "OK",
         {"audio_ftm_process_full(22,1,1,/sdcard/music/tone.wav) -> 0"}, 20},
    Case{"Fails", 0, "AT+QXPTS=1," + kTone, tone_fails, "", "ERROR",
         {"audio_ftm_process_full(22,1,1,/sdcard/music/tone.wav) -> -5"}, 20},
    Case{"", 20, "AT+QXPTS=0", nullptr, "", "OK", {"audio_ftm_process_full(22,0,1) -> 0"}, 0},
    Case{"Prefix", 20, "AT+QXPTS=0,x", nullptr, "", "OK", {"audio_ftm_process_full(22,0,1) -> 0"}, 0},
    Case{"Reclose", 0, "AT+QXPTS=0", nullptr, "", "OK", {}, 0},
    Case{"", 0, "AT+QXPTR=1," + kTone, nullptr, "", "OK", {"audio_ftm_process_full(21,1,1,/sdcard/music/tone.wav) -> 0"}, 21},
    Case{"", 21, "AT+QXPTR=0", nullptr, "", "OK", {"audio_ftm_process_full(21,0,1) -> 0"}, 0},
    Case{"", 0, "AT+QXPTR=2", nullptr, "", "ERROR", {}, 0},
    Case{"", 0, "AT+QXPTRTS=1,80," + kTone, nullptr, "", "OK", {"audio_ftm_process(25,1,80,/sdcard/music/tone.wav) -> 0"}, 28},
    Case{"Lowered", 0, "AT+QXPTRTS=1,/SDCARD/MUSIC/TONE.WAV", nullptr, "", "OK",
         {"audio_ftm_process(25,1,100,/sdcard/music/tone.wav) -> 0"}, 28},
    Case{"NoPath", 0, "AT+QXPTRTS=1", nullptr, "", "ERROR", {}, 0},
    Case{"EmptyPathIsNoPath", 0, "AT+QXPTRTS=1,", nullptr, "", "ERROR", {}, 0},
    Case{"EmptyVolumeIsNoVolume", 0, "AT+QXPTRTS=1,," + kTone, nullptr, "", "OK",
         {"audio_ftm_process(25,1,100,/sdcard/music/tone.wav) -> 0"}, 28},
    Case{"Missing", 0, "AT+QXPTRTS=1,/sdcard/none.wav", nullptr, "\"file not exisit.\"", "ERROR", {}, 0},
    Case{"Reopen", 28, "AT+QXPTRTS=1," + kTone, nullptr, "", "ATOK", {}, 28},
    Case{"Fails", 0, "AT+QXPTRTS=1," + kTone, audio_fault, "", "ERROR", {"audio_ftm_process(25,1,100,/sdcard/music/tone.wav) -> -1"}, 28},
    Case{"", 28, "AT+QXPTRTS=0", nullptr, "", "OK", {"audio_ftm_process(25,0,0) -> 0"}, 0},
    Case{"StopFails", 28, "AT+QXPTRTS=0", close_fails, "", "ERROR", {"audio_ftm_process(25,0,0) -> 3"}, 0},
    Case{"Reclose", 0, "AT+QXPTRTS=0", nullptr, "", "ATOK", {}, 0},
    Case{"", 28, "AT+QXPTRTS=5", nullptr, "", "OK", {}, 28},
    Case{"", 0, "AT+QX_AUD_STM=1," + kTone, nullptr, "", "ATOK", {"audio_ftm_process(6,1,100) -> 0"}, 29,
         {"message play_audio 3/sdcard/music/tone.wav -> ok"}},
    Case{"Refused", 0, "AT+QX_AUD_STM=1," + kTone, refuse, "", "ATNG", {"audio_ftm_process(6,1,100) -> 0"}, 29},
    Case{"Fails", 0, "AT+QX_AUD_STM=1," + kTone, [](const Sandbox &b) { script(b, "ftm.6=3"); },
         "\"DOUBLE_MIC_TO_HP error:3\"", "ERROR", {"audio_ftm_process(6,1,100) -> 3"}, 29},
    Case{"Reopen", 29, "AT+QX_AUD_STM=1," + kTone, nullptr, "", "ATOK", {}, 29},
    Case{"Missing", 0, "AT+QX_AUD_STM=1,/sdcard/none.wav", nullptr, "\"file not exisit.\"", "ATNG", {}, 0},
    Case{"NoPath", 0, "AT+QX_AUD_STM=1", nullptr, "\"file not exisit.\"", "ATNG", {}, 0},
    Case{"", 29, "AT+QX_AUD_STM=0", nullptr, "", "ATOK", {"audio_ftm_process(6,0,100) -> 0"}, 0,
         {"message play_audio 6 -> ok"}},
    Case{"Refused", 29, "AT+QX_AUD_STM=0", refuse, "", "ATNG", {"audio_ftm_process(6,0,100) -> 0"}, 0},
    Case{"StopFails", 29, "AT+QX_AUD_STM=0", close_fails, "\"DOUBLE_MIC_TO_HP error:3\"", "ATNG",
         {"audio_ftm_process(6,0,100) -> 3"}, 0},
    Case{"Reclose", 0, "AT+QX_AUD_STM=0", nullptr, "", "ATOK", {}, 0},
    Case{"", 29, "AT+QX_AUD_STM=2", nullptr, "", "ATERROR", {}, 29}), line_name);

INSTANTIATE_TEST_SUITE_P(MultiMic, AudioLine, ::testing::Values(
    Case{"", 0, "AT+QX_AUD_MIC=1,1", nullptr, "", "ATOK", {"audio_ftm_process(41,1,100) -> 0"}, 22},
    Case{"Reopen", 22, "AT+QX_AUD_MIC=1,1", nullptr, "", "ATOK", {}, 22},
    Case{"Fails", 0, "AT+QX_AUD_MIC=1,1", [](const Sandbox &b) { script(b, "ftm.41=2"); }, "", "ATNG",
         {"audio_ftm_process(41,1,100) -> 2"}, 22},
    Case{"", 0, "AT+QX_AUD_MIC=2,1", nullptr, "", "ATOK", {"audio_ftm_process(42,1,100) -> 0"}, 23},
    Case{"", 0, "AT+QX_AUD_MIC=3,1", nullptr, "", "ATOK", {"audio_ftm_process(43,1,100) -> 0"}, 24},
    Case{"", 22, "AT+QX_AUD_MIC=1,0", nullptr, "", "ATOK", {"audio_ftm_process(41,0,0) -> 0"}, 0},
    Case{"StopFails", 22, "AT+QX_AUD_MIC=1,0", close_fails, "", "ATNG", {"audio_ftm_process(41,0,0) -> 3"}, 0},
    Case{"ClosesAnyPath", 22, "AT+QX_AUD_MIC=3,0", nullptr, "", "ATOK", {"audio_ftm_process(43,0,0) -> 0"}, 0},
    Case{"Reclose", 0, "AT+QX_AUD_MIC=2,0", nullptr, "", "ATOK", {}, 0},
    Case{"", 0, "AT+QX_AUD_MIC=5,1", nullptr, "", "ATOK", {"startMic2headset(100) -> 0"}, 26},
    Case{"Reopen", 26, "AT+QX_AUD_MIC=5,1", nullptr, "", "ATOK", {}, 26},
    Case{"Fails", 0, "AT+QX_AUD_MIC=5,1", main_fails, "", "ATNG", {"startMic2headset(100) -> -1"}, 26},
    Case{"", 26, "AT+QX_AUD_MIC=5,0", nullptr, "", "ATOK", {"exitMic2headset() -> 0"}, 0},
    Case{"ExitFails", 26, "AT+QX_AUD_MIC=5,0", exit_fails, "", "ATOK", {"exitMic2headset() -> 3"}, 0},
    Case{"Reclose", 0, "AT+QX_AUD_MIC=5,0", nullptr, "", "ATOK", {}, 0},
    // "=0" stops the test case numbered state + 19, whoever opened the state.
    Case{"AfterReceiveTest", 3, "AT+QX_AUD_MIC=0", nullptr, "", "ATOK", {"audio_ftm_process(22,0,0) -> 0"}, 0},
    Case{"AfterSpeakerMic", 29, "AT+QX_AUD_MIC=0", close_fails, "", "ATNG", {"audio_ftm_process(48,0,0) -> 3"}, 0},
    Case{"Reclose", 0, "AT+QX_AUD_MIC=0", nullptr, "", "ATOK", {}, 0},
    Case{"", 22, "AT+QX_AUD_MIC=4,1", nullptr, "", "ATERROR", {}, 22}), line_name);

void mos(const Sandbox &b, int v) { script(b, "mos_test=" + std::to_string(v)); }
void hp(const Sandbox &b, int v) { script(b, "hp_type=" + std::to_string(v)); }
void mbhc_fault(const Sandbox &b) { b.fault("mbhc"); }

INSTANTIATE_TEST_SUITE_P(Headset, AudioLine, ::testing::Values(
    Case{"Pass", 0, "AT+QX_AUD_EAR=1", nullptr, "\"Pass\"", "ATOK", {"ftm_mbhc_mos_test() -> 1"}, 0},
    Case{"Fail", 0, "AT+QX_AUD_EAR=1", [](const Sandbox &b) { mos(b, 0); }, "\"Fail\"", "ATNG", {"ftm_mbhc_mos_test() -> 0"}, 0},
    Case{"Error", 0, "AT+QX_AUD_EAR=1", [](const Sandbox &b) { mos(b, -1); }, "", "ATNG", {"ftm_mbhc_mos_test() -> -1"}, 0},
    Case{"Unknown", 0, "AT+QX_AUD_EAR=1", [](const Sandbox &b) { mos(b, 5); }, "\"Unknown error 5\"", "ATNG",
         {"ftm_mbhc_mos_test() -> 5"}, 0},
    Case{"Silent", 0, "AT+QX_AUD_EAR=1", mbhc_fault, "", "ATNG", {"ftm_mbhc_mos_test() -> -1"}, 0},
    Case{"Prefix", 0, "AT+QX_AUD_EAR=1,9", nullptr, "\"Pass\"", "ATOK", {"ftm_mbhc_mos_test() -> 1"}, 0},
    Case{"Standard", 0, "AT+QX_AUD_EAR=2", nullptr, "\"1\"", "ATOK", {"ftm_mbhc_get_hp_type() -> 1"}, 0},
    Case{"NotStandard", 0, "AT+QX_AUD_EAR=2", [](const Sandbox &b) { hp(b, 2); }, "\"2\"", "ATOK",
         {"ftm_mbhc_get_hp_type() -> 2"}, 0},
    Case{"None", 0, "AT+QX_AUD_EAR=2", [](const Sandbox &b) { hp(b, 0); }, "\"3\"", "ATOK", {"ftm_mbhc_get_hp_type() -> 0"}, 0},
    Case{"Unknown", 0, "AT+QX_AUD_EAR=2", [](const Sandbox &b) { hp(b, 7); }, "\"Unknown error 7\"", "ATNG",
         {"ftm_mbhc_get_hp_type() -> 7"}, 0},
    Case{"Silent", 0, "AT+QX_AUD_EAR=2", mbhc_fault, "\"Unknown error -1\"", "ATNG", {"ftm_mbhc_get_hp_type() -> -1"}, 0},
    Case{"", 0, "AT+QX_AUD_EAR=3", nullptr, "", "ATERROR", {}, 0}), line_name);

const std::string kMaker0 = "get_smartpa_manufacturer() -> 0";
const std::string kCalOk = "smartpa_calibrate() -> 0";
const std::string kCalItem = "calibrate smart_speaker_amplifier_cali=";
const std::string kSubItem = "calibrate smart_speaker_amplifier2_cali=";
// The item list names the sub amplifier's item with its quotation marks, as it is asked for.
void sub_amplifier(const Sandbox &b) {
    const std::string items = "\"sub_smart_spearker_amplifier_cali_support\"";
    sim::write_kv(b.path("/.sim/config"), "calibrate_items", &items);
}
void calibration_fails(const Sandbox &b) { script(b, "smartpa_calibrate=6"); }
void smartpa_fault(const Sandbox &b) { b.fault("smartpa"); }

INSTANTIATE_TEST_SUITE_P(Amplifier, AudioLine, ::testing::Values(
    Case{"", 0, "AT+ZNGF=0", nullptr, "", "OK", {kMaker0, kCalOk}, 0,
         {"message speakerld 2 -> ok", kCalOk, "message speakerld 0 -> ok", kCalItem + "1 uart=0"}},
    Case{"SubAmplifier", 0, "AT+ZNGF=0", sub_amplifier, "", "OK", {kMaker0, kCalOk}, 0,
         {kCalItem + "1 uart=0", kSubItem + "1 uart=0"}},
    Case{"AppRefuses", 0, "AT+ZNGF=0", refuse, "\"start audio fail\"", "ERROR", {}, 0},
    Case{"AppSilent", 0, "AT+ZNGF=0", [](const Sandbox &b) { b.fault("testapp-silent"); }, "\"start audio fail\"", "ERROR", {}, 0},
    Case{"CalibrationFails", 0, "AT+ZNGF=0", calibration_fails, "", "ERROR", {kMaker0, "smartpa_calibrate() -> 6"}, 0,
         {"message speakerld 2 -> ok", "smartpa_calibrate() -> 6", "message speakerld 0 -> ok"}},
    Case{"NoAmplifier", 0, "AT+ZNGF=0", smartpa_fault, "", "ERROR",
         {"get_smartpa_manufacturer() -> -1", "smartpa_calibrate() -> -1"}, 0},
    Case{"", 0, "AT+ZNGF=apk", nullptr, "R0=7.21ohm F0=812Hz", "OK", {kMaker0, kCalOk}, 0},
    Case{"NoAmplifier", 0, "AT+ZNGF=apk", smartpa_fault, "smartpa not found", "ERROR",
         {"get_smartpa_manufacturer() -> -1", "smartpa_calibrate() -> -1"}, 0},
    Case{"", 0, "AT+ZNGF=2", nullptr, "\r\n1\r\n", "OK", {"smartpa_check_mtpex() -> 1"}, 0},
    Case{"NotCalibrated", 0, "AT+ZNGF=2", [](const Sandbox &b) { script(b, "smartpa_mtpex=0"); }, "\r\n0\r\n", "OK",
         {"smartpa_check_mtpex() -> 0"}, 0},
    Case{"NoAmplifier", 0, "AT+ZNGF=2", smartpa_fault, "", "ERROR", {"smartpa_check_mtpex() -> -1"}, 0},
    Case{"", 0, "AT+ZNGF=3", sub_amplifier, "", "OK", {kMaker0, "smartpa_reset_mtpex() -> 0"}, 0,
         {kCalItem + "0 uart=0", kSubItem + "0 uart=0"}},
    Case{"OtherMaker", 0, "AT+ZNGF=3", [](const Sandbox &b) { script(b, "smartpa_manufacturer=1"); }, "\"Not support\"",
         "ERROR", {"get_smartpa_manufacturer() -> 1"}, 0},
    Case{"ResetFails", 0, "AT+ZNGF=3", [](const Sandbox &b) { script(b, "smartpa_reset_mtpex=-4"); }, "", "ERROR",
         {kMaker0, "smartpa_reset_mtpex() -> -4"}, 0},
    Case{"", 0, "AT+ZNGF=4", nullptr, "", "OK", {}, 0},
    Case{"", 0, "AT+ZNGF=6", nullptr, "", "ERROR", {}, 0}), line_name);

INSTANTIATE_TEST_SUITE_P(RecordingForms, AudioLine, ::testing::Values(
    Case{"NotTenths", 0, "AT+QX_AUD_RECD=0,MainMic,2.55", nullptr, "\"time set error!!\"", "ATERROR", {}, 0},
    Case{"NoTime", 0, "AT+QX_AUD_RECD=0,MainMic", nullptr, "\"time set error!!\"", "ATERROR", {}, 0},
    Case{"Absurd", 0, "AT+QX_AUD_RECD=0,MainMic,1e300", nullptr, "\"time set error!!\"", "ATERROR", {}, 0},
    Case{"NotAName", 0, "AT+QX_AUD_RECD=0,BackMic,2", nullptr, "\"mic-type set error!!\"", "ATERROR", {}, 0},
    Case{"Busy", 0, "AT+QX_AUD_RECD=1,MainMic", [](const Sandbox &b) { b.set_prop(kMainBusy, "1"); }, "\"0\"", "ATOK", {}, 0},
    Case{"NoFile", 0, "AT+QX_AUD_RECD=1,MainMic", [](const Sandbox &b) { b.set_prop(kMainBusy, "0"); }, "\"0\"", "ATOK", {}, 0},
    Case{"NeverRecorded", 0, "AT+QX_AUD_RECD=1,SubMic", nullptr, "\"0\"", "ATOK", {}, 0},
    Case{"Done", 0, "AT+QX_AUD_RECD=1,MainMic", [](const Sandbox &b) { b.set_prop(kMainBusy, "0"); b.write(kMainFile, "RIFF"); },
         "\"1\"", "ATOK", {}, 0},
    Case{"BusyWithFile", 0, "AT+QX_AUD_RECD=1,MainMic", [](const Sandbox &b) { b.set_prop(kMainBusy, "1"); b.write(kMainFile, "RIFF"); },
         "\"0\"", "ATOK", {}, 0},
    Case{"OddBusyValue", 0, "AT+QX_AUD_RECD=1,DoubleMic", [](const Sandbox &b) { b.set_prop("sys.is_audio_working.double_mic", "2"); },
         "\"1\"", "ATOK", {}, 0},
    Case{"PartOfAName", 0, "AT+QX_AUD_RECD=1,Main", nullptr, "\"mic-type set error!!\"", "ERROR", {}, 0},
    Case{"", 0, "AT+QX_AUD_RECD=3,HPMic", [](const Sandbox &b) { b.set_prop("sys.is_audio_working.hp_mic", "1"); }, "", "ATOK",
         {}, 0, {"setprop sys.is_audio_working.hp_mic=0"}, {{"sys.is_audio_working.hp_mic", "0"}}},
    Case{"Unknown", 0, "AT+QX_AUD_RECD=3,hpmic", nullptr, "\"mic-type set error!!\"", "ERROR", {}, 0},
    Case{"NoType", 0, "AT+QX_AUD_RECD=2,", nullptr, "", "ATOK", {}, 0},
    Case{"", 0, "AT+QX_AUD_RECD=1", nullptr, "\"parameter error\"", "ATERROR", {}, 0},
    Case{"", 0, "AT+QX_AUD_RECD=4,MainMic", nullptr, "\"parameter error\"", "ATERROR", {}, 0}), line_name);

// ---- path state across lines

TEST_F(AudioTest, OneStateForEveryPathAndAnyCloseTearsItDown) {
    EXPECT_EQ(serve("AT+QXMT=0,1"), "AT+QXMT=0,1\r\n\r\nOK\r\n");
    EXPECT_EQ(serve("AT+QXMT=0,1"), "AT+QXMT=0,1\r\n\r\nATOK\r\n");
    EXPECT_EQ(serve("AT+QXEMTS=1,80"), "AT+QXEMTS=1,80\r\n\r\nOK\r\n");  // opens over it
    EXPECT_EQ(serve("AT+QX_AUD_MIC=0"), "AT+QX_AUD_MIC=0\r\n\r\nATOK\r\n");
    EXPECT_EQ(serve("AT+QXXL=0"), "AT+QXXL=0\r\n\r\nOK\r\n");  // nothing left to close
    EXPECT_EQ(audio_calls(box.events()),
              (std::vector<std::string>{"startReceiveTest(100) -> 0", "startHeadset2speaker(80) -> 0",
                                        "audio_ftm_process(29,0,0) -> 0"}));
}

TEST_F(AudioTest, AFailedOpenIsReopenedWithoutTheLibraryUntilClosed) {
    script(box, "startMic2headset=-1");
    EXPECT_EQ(serve("AT+QXMTE=1,50"), "AT+QXMTE=1,50\r\n\r\nERROR\r\n");
    EXPECT_EQ(serve("AT+QXMTE=1,50"), "AT+QXMTE=1,50\r\n\r\nOK\r\n");
    EXPECT_EQ(serve("AT+QXMTE=0"), "AT+QXMTE=0\r\n\r\nOK\r\n");
    EXPECT_EQ(serve("AT+QXMTE=1,50"), "AT+QXMTE=1,50\r\n\r\nERROR\r\n");
    EXPECT_EQ(audio_calls(box.events()), (std::vector<std::string>{"startMic2headset(50) -> -1", "exitMic2headset() -> 0",
                                                                    "startMic2headset(50) -> -1"}));
}

TEST_F(AudioTest, HangUpLineClosesTheOpenPathOnTheLastSource) {
    EXPECT_EQ(serve("AT+QXEMTR=1,70", SRC_USB), "AT+QXEMTR=1,70\r\n\r\nOK\r\n");
    dispatch_command(nullptr, 0, SRC_TCP);
    EXPECT_EQ(answer(), "AT+QXMT=1,0\r\n\r\nOK\r\n");
    EXPECT_EQ(g_audio_test_state.load(), 0);
    dispatch_command(nullptr, 0, SRC_TCP);
    EXPECT_EQ(answer(), "AT+QXMT=1,0\r\n\r\nATOK\r\n");
    EXPECT_EQ(audio_calls(box.events()), (std::vector<std::string>{"startHeadset2earpiece(70) -> 0", "exitSendTest() -> 0"}));
}

// ---- recordings

TEST_F(AudioTest, RecordingRunsItsTimeThenReportsDone) {
    EXPECT_EQ(serve("AT+QX_AUD_RECD=0,MainMic,0.3"), "AT+QX_AUD_RECD=0,MainMic,0.3\r\n\r\nATOK\r\n");
    ASSERT_TRUE(wait_event("message set_silent_mode 1")) << box.events();
    expect_in_order(box.events(), {"message set_silent_mode 0 -> ok", "audio audio_ftm_process(51,1,100) -> 0",
                                    "recorder start /sdcard/engineermode/main-record.wav",
                                    "setprop sys.is_audio_working.main_mic=1", "audio audio_ftm_process(51,0,0) -> 0",
                                    "recorder stop /sdcard/engineermode/main-record.wav",
                                    "setprop sys.is_audio_working.main_mic=0", "message set_silent_mode 1 -> ok"});
    // Recorded from the busy mark until the poll that found the time up: 300 ms and at
    // most one poll late, with room for a loaded machine.
    long long busy = event_ms(box, "setprop", std::string(kMainBusy) + "=1");
    long long stop = event_ms(box, "audio", "audio_ftm_process(51,0,0)");
    ASSERT_GE(busy, 0);
    EXPECT_GE(stop - busy, 300);
    EXPECT_LE(stop - busy, 1300);
    // The take holds at least the asked time of 8 kHz 16-bit samples.
    EXPECT_GE(box.read(kMainFile).size(), 44u + 300 * 16);
    EXPECT_EQ(serve("AT+QX_AUD_RECD=1,MainMic"), "AT+QX_AUD_RECD=1,MainMic\r\n\"1\"\r\nATOK\r\n");
}

TEST_F(AudioTest, StopFormEndsARunningRecordingAtItsNextPoll) {
    box.write("/sdcard/engineermode/sub-record.wav", "old take");
    EXPECT_EQ(serve("AT+QX_AUD_RECD=2,SubMic"), "AT+QX_AUD_RECD=2,SubMic\r\n\r\nATOK\r\n");
    ASSERT_TRUE(wait_event(std::string("setprop ") + kSubBusy + "=1"));
    EXPECT_EQ(box.read("/sdcard/engineermode/sub-record.wav").substr(0, 4), "RIFF");  // the old take went first
    EXPECT_EQ(serve("AT+QX_AUD_RECD=1,SubMic"), "AT+QX_AUD_RECD=1,SubMic\r\n\"0\"\r\nATOK\r\n");
    EXPECT_EQ(serve("AT+QX_AUD_RECD=3,SubMic"), "AT+QX_AUD_RECD=3,SubMic\r\n\r\nATOK\r\n");
    ASSERT_TRUE(wait_event("message set_silent_mode 1", 3000)) << box.events();
    // The worker polls every 10 ms: the stop follows the cleared mark at once, not after 30 s.
    long long cleared = event_ms(box, "setprop", std::string(kSubBusy) + "=0");
    long long stop = event_ms(box, "audio", "audio_ftm_process(52,0,0)");
    EXPECT_GE(stop, cleared);
    EXPECT_LE(stop - cleared, 1000);
    EXPECT_EQ(serve("AT+QX_AUD_RECD=1,SubMic"), "AT+QX_AUD_RECD=1,SubMic\r\n\"1\"\r\nATOK\r\n");
    EXPECT_EQ(box.events().find("set_silent_mode 0"), std::string::npos);  // the "=2" form sends none
}

TEST_F(AudioTest, RecordingIsCappedAtThirtySeconds) {
    // The phone's clock jumps ahead under a 100 s take: at 29 s it records on, past 30 s
    // it ends, long before its asked time.
    EXPECT_EQ(serve("AT+QX_AUD_RECD=0,MainMic,100"), "AT+QX_AUD_RECD=0,MainMic,100\r\n\r\nATOK\r\n");
    ASSERT_TRUE(wait_event(std::string("setprop ") + kMainBusy + "=1"));
    box.write("/.sim/clock", "29\n");
    EXPECT_FALSE(wait_event("audio_ftm_process(51,0,0)", 300));  // some thirty polls
    box.write("/.sim/clock", "31\n");
    ASSERT_TRUE(wait_event(std::string("setprop ") + kMainBusy + "=0", 3000)) << box.events();
}

TEST_F(AudioTest, ClockSetBackDoesNotKeepARecordingOpen) {
    EXPECT_EQ(serve("AT+QX_AUD_RECD=0,MainMic,1"), "AT+QX_AUD_RECD=0,MainMic,1\r\n\r\nATOK\r\n");
    ASSERT_TRUE(wait_event(std::string("setprop ") + kMainBusy + "=1"));
    box.write("/.sim/clock", "-3600\n");  // an hour back: the phone's clock alone would record for an hour
    ASSERT_TRUE(wait_event(std::string("setprop ") + kMainBusy + "=0", 5000)) << box.events();
    EXPECT_GE(box.read(kMainFile).size(), 44u + 1000 * 16);  // still the whole asked second
}

TEST_F(AudioTest, NegativeTimeRecordsNoLoop) {
    EXPECT_EQ(serve("AT+QX_AUD_RECD=0,HPMic,-1"), "AT+QX_AUD_RECD=0,HPMic,-1\r\n\r\nATOK\r\n");
    ASSERT_TRUE(wait_event("message set_silent_mode 1"));
    expect_in_order(box.events(), {"audio_ftm_process(54,1,100) -> 0", "setprop sys.is_audio_working.hp_mic=1",
                                   "audio_ftm_process(54,0,0) -> 0", "setprop sys.is_audio_working.hp_mic=0"});
}

TEST_F(AudioTest, RecordingThatCannotStartLeavesTheBusyPropertyAlone) {
    script(box, "ftm.53=-19");
    EXPECT_EQ(serve("AT+QX_AUD_RECD=0,STMic,1"), "AT+QX_AUD_RECD=0,STMic,1\r\n\r\nATOK\r\n");
    ASSERT_TRUE(wait_event("audio_ftm_process(53,1,100) -> -19"));
    EXPECT_EQ(audio_calls(box.events()), std::vector<std::string>{"audio_ftm_process(53,1,100) -> -19"});
    EXPECT_EQ(box.prop("sys.is_audio_working.st_mic"), "");
}

TEST_F(AudioTest, RecordingThatCannotStopStaysBusy) {
    script(box, "ftm.55.stop=-4");
    EXPECT_EQ(serve("AT+QX_AUD_RECD=0,DoubleMic,0.1"), "AT+QX_AUD_RECD=0,DoubleMic,0.1\r\n\r\nATOK\r\n");
    ASSERT_TRUE(wait_event("audio_ftm_process(55,0,0) -> -4"));
    EXPECT_EQ(box.prop("sys.is_audio_working.double_mic"), "1");
    EXPECT_EQ(box.events().find("set_silent_mode 1"), std::string::npos);
    EXPECT_EQ(serve("AT+QX_AUD_RECD=1,DoubleMic"), "AT+QX_AUD_RECD=1,DoubleMic\r\n\"0\"\r\nATOK\r\n");
}

// ---- amplifier worker

TEST_F(AudioTest, CalibrationWorkerAnswersAtOnceAndCalibratesBehind) {
    script(box, "smartpa_calibrate_ms=400");
    EXPECT_EQ(serve("AT+ZNGF=5"), "AT+ZNGF=5\r\n\r\nOK\r\n");
    EXPECT_EQ(box.events().find("smartpa_calibrate()"), std::string::npos);  // the tone still plays
    ASSERT_TRUE(wait_event(kCalItem + "1"));
    expect_in_order(box.events(), {"message speakerld 2 -> ok", "audio " + kMaker0, "audio " + kCalOk,
                                   "message speakerld 0 -> ok", kCalItem + "1 uart=0"});
}

TEST_F(AudioTest, LineCalibrationWaitsForTheWorkersToEnd) {
    script(box, "smartpa_calibrate_ms=600");
    EXPECT_EQ(serve("AT+ZNGF=5"), "AT+ZNGF=5\r\n\r\nOK\r\n");
    ASSERT_TRUE(wait_event("get_smartpa_manufacturer()"));  // the worker's calibration is under way
    EXPECT_EQ(serve("AT+ZNGF=apk"), "AT+ZNGF=apk\r\nR0=7.21ohm F0=812Hz\r\nOK\r\n");
    std::vector<long long> ends;
    for (const Event &e : box.event_list())
        if (e.kind == "audio" && e.detail.rfind("smartpa_calibrate()", 0) == 0) ends.push_back(e.ms);
    ASSERT_EQ(ends.size(), 2u) << box.events();
    EXPECT_GE(ends[1] - ends[0], 600);  // the second tone started when the first had ended
}

// ---- results that change between calls, and the amplifier's settle time

TEST_F(AudioTest, HeadsetPluggedBetweenTwoQueries) {
    box.sequence("audio:hp_type", {"0", "1"});
    EXPECT_EQ(serve("AT+QX_AUD_EAR=2"), "AT+QX_AUD_EAR=2\r\n\"3\"\r\nATOK\r\n");
    EXPECT_EQ(serve("AT+QX_AUD_EAR=2"), "AT+QX_AUD_EAR=2\r\n\"1\"\r\nATOK\r\n");
}

TEST_F(AudioTest, FailedSendLoopbackIsRetriedOnlyAfterAClose) {
    box.sequence("audio:startSendTest", {"-1", "0"});
    EXPECT_EQ(serve("AT+QXMT=1,1"), "AT+QXMT=1,1\r\n\r\nERROR\r\n");
    EXPECT_EQ(serve("AT+QXMT=1,1"), "AT+QXMT=1,1\r\n\r\nATOK\r\n");
    EXPECT_EQ(serve("AT+QXMT=1,0"), "AT+QXMT=1,0\r\n\r\nOK\r\n");
    EXPECT_EQ(serve("AT+QXMT=1,1"), "AT+QXMT=1,1\r\n\r\nOK\r\n");
    EXPECT_EQ(audio_calls(box.events()),
              (std::vector<std::string>{"startSendTest(100) -> -1", "exitSendTest() -> 0", "startSendTest(100) -> 0"}));
}

TEST_F(AudioTest, CalibrationWaitsForTheTestAppTone) {
    box.sequence("testapp:speakerld 2", {"busy", "ok"});
    EXPECT_EQ(serve("AT+ZNGF=0"), "AT+ZNGF=0\r\n\"start audio fail\"\r\nERROR\r\n");
    EXPECT_EQ(serve("AT+ZNGF=0"), "AT+ZNGF=0\r\n\r\nOK\r\n");
    EXPECT_EQ(audio_calls(box.events()), (std::vector<std::string>{kMaker0, kCalOk}));
}

class AmplifierSettle : public AudioTest, public ::testing::WithParamInterface<int> {};

TEST_P(AmplifierSettle, MakersOneAndTwoWaitHalfASecond) {
    const int maker = GetParam();
    script(box, "smartpa_manufacturer=" + std::to_string(maker));
    EXPECT_EQ(serve("AT+ZNGF=apk"), "AT+ZNGF=apk\r\nR0=7.21ohm F0=812Hz\r\nOK\r\n");
    long long asked = event_ms(box, "audio", "get_smartpa_manufacturer()");
    long long calibrated = event_ms(box, "audio", "smartpa_calibrate()");
    ASSERT_GE(asked, 0);
    if (maker == 1 || maker == 2)
        EXPECT_GE(calibrated - asked, 500);
    else
        EXPECT_LT(calibrated - asked, 500);
}

INSTANTIATE_TEST_SUITE_P(Audio, AmplifierSettle, ::testing::Values(0, 1, 2, 3),
                         [](const ::testing::TestParamInfo<int> &i) { return "Maker" + std::to_string(i.param); });

// ---- over the daemon's transports

// TCP stations send their lines bare; the daemon answers each with one frame.
std::string exchange(int fd, const std::string &line, const std::string &want) {
    send(fd, line.data(), line.size(), MSG_NOSIGNAL);
    return read_some(fd, want.size());
}

bool wait_events(const Sandbox &box, const std::string &text, int ms = 5000) {
    for (int waited = 0; waited < ms; waited += 20) {
        if (box.events().find(text) != std::string::npos) return true;
        std::this_thread::sleep_for(std::chrono::milliseconds(20));
    }
    return false;
}

TEST(AudioDaemon, StationThatHangsUpClosesTheOpenLoopback) {
    Sandbox box;
    Daemon d(box);
    int s = d.connect_tcp();
    ASSERT_GE(s, 0);
    ASSERT_TRUE(d.wait_prop("sys.qrcode.view", "0"));
    const std::string open = "AT+QXMT=0,1\r\n\r\nOK\r\n";
    EXPECT_EQ(exchange(s, "AT+QXMT=0,1", open), open);
    close(s);
    // The hang-up line closes whatever is open, here the receive loopback.
    ASSERT_TRUE(wait_events(box, "audio exitSendTest() -> 0")) << box.events();
    EXPECT_EQ(box.prop("sys.qrcode.view"), "1");
    int s2 = d.connect_tcp();
    ASSERT_GE(s2, 0);
    const std::string reclose = "AT+QXMT=0,0\r\n\r\nATOK\r\n";
    EXPECT_EQ(exchange(s2, "AT+QXMT=0,0", reclose), reclose);
    close(s2);
    EXPECT_EQ(audio_calls(box.events()), (std::vector<std::string>{"init_ftm", "startReceiveTest(100) -> 0", "exitSendTest() -> 0"}));
}

TEST(AudioDaemon, RecordingWorkerRefusesAPartOfANameAndRecordsAWholeOne) {
    Sandbox box;
    Daemon d(box);
    int s = d.connect_tcp();
    ASSERT_GE(s, 0);
    const std::string part = "AT+QX_AUD_RECD=0,Mic,0.1\r\n\r\nATOK\r\n";
    EXPECT_EQ(exchange(s, "AT+QX_AUD_RECD=0,Mic,0.1", part), part);
    EXPECT_TRUE(d.wait_log("parameter error!!"));
    const std::string whole = "AT+QX_AUD_RECD=0,HPMic,0.2\r\n\r\nATOK\r\n";
    EXPECT_EQ(exchange(s, "AT+QX_AUD_RECD=0,HPMic,0.2", whole), whole);
    EXPECT_TRUE(d.wait_log("HPMic record finished!!"));
    const std::string done = "AT+QX_AUD_RECD=1,HPMic\r\n\"1\"\r\nATOK\r\n";
    EXPECT_EQ(exchange(s, "AT+QX_AUD_RECD=1,HPMic", done), done);
    close(s);
    // Only the whole name reached the recorder; the part was refused before the library.
    EXPECT_EQ(audio_calls(box.events()),
              (std::vector<std::string>{"init_ftm", "audio_ftm_process(54,1,100) -> 0", "audio_ftm_process(54,0,0) -> 0"}));
    expect_in_order(box.events(), {"message set_silent_mode 0 -> ok", "message set_silent_mode 0 -> ok",
                                   "setprop sys.is_audio_working.hp_mic=1", "message set_silent_mode 1 -> ok"});
}

TEST(AudioDaemon, CalibrationWorkerRunsAfterTheAnswerHasLeft) {
    Sandbox box;
    script(box, "smartpa_calibrate_ms=600");
    Daemon d(box);
    int s = d.connect_local();
    ASSERT_GE(s, 0);
    const std::string answer = "AT+ZNGF=5\r\n\r\nOK\r\n";
    EXPECT_EQ(exchange(s, "AT+ZNGF=5", answer), answer);
    close(s);
    EXPECT_EQ(box.events().find("calibrate smart_speaker_amplifier_cali"), std::string::npos);
    ASSERT_TRUE(wait_events(box, "calibrate smart_speaker_amplifier_cali=1 uart=0")) << box.events();
}

}  // namespace
