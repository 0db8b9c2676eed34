// Audio path tests: the one path state shared by every opening and closing command, the
// audio library calls each line makes (in order, with their arguments), recordings on
// their worker, the amplifier calibration and headset identification.
#include <functional>

#include "handlers/audio.h"
#include "platform/sim/sim.h"
#include "tests/support/checks.h"
#include "tests/support/in_process.h"
#include "tests/support/test_name.h"

namespace {

using Calls = std::vector<std::string>;
const std::string kTone = "/sdcard/music/tone.wav";
const std::string kMainFile = "/sdcard/engineermode/main-record.wav";
const std::string kMainBusy = "sys.is_audio_working.main_mic";
const std::string kSubBusy = "sys.is_audio_working.sub_mic";

std::string nv_pattern() { return nv_fill(0x21, 181); }  // every byte non-zero, so a stray write shows

// The audio library's calls recorded in events.log, in order, without their kind.
Calls audio_calls(const Sandbox &b) {
    Calls calls;
    for (const Event &e : b.event_list())
        if (e.kind == "audio") calls.push_back(e.detail);
    return calls;
}

// The time from the first event holding from to the first holding to; -1 if either is missing.
long long ms_from_to(const Sandbox &b, const std::string &from, const std::string &to) {
    long long f = -1, t = -1;
    for (const Event &e : b.event_list()) {
        const std::string text = e.kind + " " + e.detail;
        if (f < 0 && text.find(from) != std::string::npos) f = e.ms;
        if (t < 0 && text.find(to) != std::string::npos) t = e.ms;
    }
    return f < 0 || t < 0 ? -1 : t - f;
}

bool wait_for(const Sandbox &b, const std::string &text, int ms = 5000) {
    return wait_until([&] { return b.events().find(text) != std::string::npos; }, ms);
}

// Sets one key of the audio library's script ("ftm.22", "-5").
void script(const Sandbox &b, const std::string &key, const std::string &value) { sim::write_kv(b.path("/.sim/audio"), key, &value); }

using Setup = std::function<void(const Sandbox &)>;
Setup lib(std::string key, std::string value) { return [=](const Sandbox &b) { script(b, key, value); }; }
Setup fault(std::string name) { return [=](const Sandbox &b) { b.fault(name); }; }

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
    void expect(const std::string &line, const std::string &body, const std::string &word, int src = SRC_TCP) {
        const std::string want = frame(line, body, word);
        EXPECT_EQ(serve(line, src, want.size()), want);
    }
};

// ---- each path opened, opened again, closed and closed again (a repeat calls nothing)

struct Path {
    std::string open, close;
    int state;
    std::string start, exit;
    const char *word = "OK", *again = "OK", *reclose = nullptr;  // reclose: as again when not given
    std::vector<std::string> effects = {};  // other events, in order
};
class AudioPath : public AudioTest, public ::testing::WithParamInterface<Path> {};

TEST_P(AudioPath, OpensAndCloses) {
    const Path &p = GetParam();
    expect(p.open, "", p.word);
    expect(p.open, "", p.again);
    EXPECT_EQ(g_audio_test_state.load(), p.state);
    expect(p.close, "", p.word);
    EXPECT_EQ(g_audio_test_state.load(), 0);
    expect(p.close, "", p.reclose ? p.reclose : p.again);
    EXPECT_EQ(audio_calls(box), (Calls{p.start + " -> 0", p.exit + " -> 0"}));
    expect_in_order(box.events(), p.effects);
    EXPECT_EQ(box.read("/.sim/nv.bin"), nv_pattern());
}

INSTANTIATE_TEST_SUITE_P(Audio, AudioPath, ::testing::Values(
    Path{"AT+QXMTE=1,50", "AT+QXMTE=0", 7, "startMic2headset(50)", "exitMic2headset()"},
    Path{"AT+QXMTER=1,80", "AT+QXMTER=0", 8, "startMain2headsetR(80)", "exitMain2headsetR()"},
    Path{"AT+QXVMTEL=1,80", "AT+QXVMTEL=0", 9, "startSub2headsetL(80)", "exitSub2headsetL()"},
    Path{"AT+QXEMTS=1,80", "AT+QXEMTS=0", 10, "startHeadset2speaker(80)", "exitHeadset2speaker()"},
    Path{"AT+QXEMTR=1,80", "AT+QXEMTR=0", 11, "startHeadset2earpiece(80)", "exitHeadset2earpiece()"},
    // An empty field is no field, as a tokeniser cuts the line.
    Path{"AT+QXEMTSA=1,30,,40", "AT+QXEMTSA=0", 12, "startHeadset2SpeakerWithGain(30,40)", "exitHeadset2SpeakerWithGain()"},
    Path{"AT+QXEMTRA=1,30,40", "AT+QXEMTRA=0", 13, "startHeadset2EarpieceWithGain(30,40)", "exitHeadset2EarpieceWithGain()"},
    Path{"AT+QXEMTSR=1,80", "AT+QXEMTSR=0", 14, "startHeadset2RightSpeaker(80)", "exitHeadset2RightSpeaker()"},
    Path{"AT+QXEMTSL=1,80", "AT+QXEMTSL=0", 15, "startHeadset2LeftSpeaker(80)", "exitHeadset2LeftSpeaker()"},
    Path{"AT+QXMT=0,1", "AT+QXMT=0,0", 3, "startReceiveTest(100)", "exitReceiveTest()", "OK", "ATOK"},
    Path{"AT+QXMT=1,1,60", "AT+QXMT=1,0", 4, "startSendTest(60)", "exitSendTest()", "OK", "ATOK"},
    Path{"AT+QXMT=2,1", "AT+QXMT=2,0", 5, "startSubEchoTest()", "exitSubEchoTest()", "OK", "ATOK"},
    Path{"AT+QXMT=3,1", "AT+QXMT=3,0", 6, "startHeadsetEchoTest()", "exitHeadsetEchoTest()", "OK", "ATOK"},
    Path{"AT+EALT=1,1", "AT+EALT=0,1", 1, "startMainEchoTest()", "exitMainEchoTest()", "OK", "OK", "ATOK"},
    Path{"AT+EALT=1,2", "AT+EALT=0,2", 2, "startSubEchoTest()", "exitSubEchoTest()", "OK", "OK", "ATOK"},
    Path{"AT+QXXL=1", "AT+QXXL=0", 19, "audio_ftm_process(22,1,1)", "audio_ftm_process(22,0,1)"},
    // The path is lowered; the close is any line that begins with it.
    Path{"AT+QXPTS=1,/SDCARD/Music/Tone.WAV", "AT+QXPTS=0,x", 20, "audio_ftm_process_full(22,1,1,/sdcard/music/tone.wav)",
         "audio_ftm_process_full(22,0,1)"},
    Path{"AT+QXPTR=1," + kTone, "AT+QXPTR=0", 21, "audio_ftm_process_full(21,1,1,/sdcard/music/tone.wav)",
         "audio_ftm_process_full(21,0,1)"},
    Path{"AT+QXPTRTS=1,80," + kTone, "AT+QXPTRTS=0", 28, "audio_ftm_process(25,1,80,/sdcard/music/tone.wav)",
         "audio_ftm_process(25,0,0)", "OK", "ATOK"},
    Path{"AT+QX_AUD_STM=1," + kTone, "AT+QX_AUD_STM=0", 29, "audio_ftm_process(6,1,100)", "audio_ftm_process(6,0,100)", "ATOK",
         "ATOK", nullptr, {"message play_audio 3/sdcard/music/tone.wav -> ok", "message play_audio 6 -> ok"}},
    Path{"AT+QX_AUD_MIC=1,1", "AT+QX_AUD_MIC=1,0", 22, "audio_ftm_process(41,1,100)", "audio_ftm_process(41,0,0)", "ATOK", "ATOK"},
    Path{"AT+QX_AUD_MIC=3,1", "AT+QX_AUD_MIC=3,0", 24, "audio_ftm_process(43,1,100)", "audio_ftm_process(43,0,0)", "ATOK", "ATOK"},
    Path{"AT+QX_AUD_MIC=5,1", "AT+QX_AUD_MIC=5,0", 26, "startMic2headset(100)", "exitMic2headset()", "ATOK", "ATOK"}),
    named_by([](const Path &p) { return p.open; }));

// ---- one line against a path state

struct Case {
    const char *tag;
    int state;  // the path state before the line
    std::string line;
    Setup setup;
    std::string body;
    const char *word;
    Calls calls;  // every audio library call, in order
    int after;    // the path state after the line
    std::vector<std::string> effects = {};  // other events, in order (after any worker the line started)
    std::vector<std::string> absent = {};   // texts not in the events
};
void PrintTo(const Case &c, std::ostream *os) { *os << c.line << " " << c.tag; }

class AudioLine : public AudioTest, public ::testing::WithParamInterface<Case> {};

TEST_P(AudioLine, Answers) {
    const Case &c = GetParam();
    if (c.setup) c.setup(box);
    g_audio_test_state = c.state;
    expect(c.line, c.body, c.word);
    ASSERT_TRUE(wait_workers_done(5000));
    const std::string log = box.events();
    EXPECT_EQ(audio_calls(box), c.calls) << log;
    EXPECT_EQ(g_audio_test_state.load(), c.after);
    expect_in_order(log, c.effects);
    for (const auto &text : c.absent) EXPECT_EQ(log.find(text), std::string::npos) << text << "\n" << log;
    EXPECT_EQ(box.read("/.sim/nv.bin"), nv_pattern());
}

std::string line_name(const ::testing::TestParamInfo<Case> &info) {
    return test_name(info.param.line) + (*info.param.tag ? "_" : "") + info.param.tag;
}

const Setup main_fails = lib("startMic2headset", "-1"), refuse = fault("testapp-refuse"), audio_fault = fault("audio");
const Setup tone_fails = lib("ftm.22", "-5");
void exit_fails(const Sandbox &b) {
    for (const char *call : {"exitMic2headset", "exitReceiveTest", "exitSendTest", "exitMainEchoTest", "exitSubEchoTest"})
        script(b, call, "3");
}
void close_fails(const Sandbox &b) {
    for (const char *c : {"ftm.22.stop", "ftm.41.stop", "ftm.25.stop", "ftm.6.stop", "ftm.48.stop"}) script(b, c, "3");
}
std::string ftm(int test_case, const std::string &args, int rc) {
    return "audio_ftm_process(" + std::to_string(test_case) + "," + args + ") -> " + std::to_string(rc);
}
const std::string kToneArg = ",/sdcard/music/tone.wav";

// Opens over another path, reopens without the library, failed opens that keep their
// state, closes of whatever is open, and refused arguments.
INSTANTIATE_TEST_SUITE_P(Paths, AudioLine, ::testing::Values(
    Case{"OverAnotherPath", 3, "AT+QXMTE=1,50", nullptr, "", "OK", {"startMic2headset(50) -> 0"}, 7},
    Case{"Fails", 0, "AT+QXMTE=1,50", main_fails, "", "ERROR", {"startMic2headset(50) -> -1"}, 7},
    Case{"BadGain", 0, "AT+QXMTE=1,12a", nullptr, "", "ERROR", {}, 0},
    Case{"EmptyGain", 5, "AT+QXMTE=1,", nullptr, "", "ERROR", {}, 5},
    Case{"HugeGainExtraField", 0, "AT+QXMTE=1,99999999999,5", nullptr, "", "OK", {"startMic2headset(2147483647) -> 0"},
         7},
    Case{"ClosesAnyPath", 12, "AT+QXMTE=0", nullptr, "", "OK", {"exitMic2headset() -> 0"}, 0},
    Case{"ExitFails", 7, "AT+QXMTE=0", exit_fails, "", "OK", {"exitMic2headset() -> 3"}, 0},
    Case{"", 7, "AT+QXMTE=0,1", nullptr, "", "ERROR", {}, 7},
    Case{"OneGain", 0, "AT+QXEMTSA=1,30", nullptr, "", "ERROR", {}, 0},
    Case{"BadGain", 0, "AT+QXEMTSA=1,30,4x", nullptr, "", "ERROR", {}, 0},
    Case{"Fails", 0, "AT+QXMT=0,1", lib("startReceiveTest", "-2"), "", "ERROR", {"startReceiveTest(100) -> -2"}, 3},
    Case{"ExitFails", 3, "AT+QXMT=0,0", exit_fails, "", "ERROR", {"exitReceiveTest() -> 3"}, 0},
    Case{"", 4, "AT+QXMT=2,1,50", nullptr, "", "ERROR", {}, 4},
    Case{"Fails", 0, "AT+EALT=1,1", audio_fault, "", "ERROR", {"startMainEchoTest() -> -1"}, 1},
    Case{"", 1, "AT+EALT=1,3", nullptr, "", "ERROR", {}, 1},
    Case{"ExitFails", 1, "AT+EALT=0,1", exit_fails, "", "ERROR", {"exitMainEchoTest() -> 3"}, 0},
    Case{"ExitFails", 2, "AT+EALT=0,2", exit_fails, "", "OK", {"exitSubEchoTest() -> 3"}, 0},
    Case{"ClosesAll", 2, "AT+EALT=0,3", nullptr, "", "ERROR", {}, 0},
    Case{"", 1, "AT+EALT=2", nullptr, "", "ERROR", {}, 1},
    Case{"", 0, "AT+QXFM=3", nullptr, "", "OK", {}, 0, {"message mbhc_status -> ok"}},
    Case{"Refused", 0, "AT+QXFM=3", refuse, "", "ERROR", {}, 0},
    Case{"", 0, "AT+QXFM=1", nullptr, "", "ERROR", {}, 0}), line_name);

const std::string kStmError = "\"DOUBLE_MIC_TO_HP error:3\"", kNoFile = "\"file not exisit.\"";

INSTANTIATE_TEST_SUITE_P(Playback, AudioLine, ::testing::Values(
    Case{"Fails", 0, "AT+QXXL=1", tone_fails, "", "ERROR", {ftm(22, "1,1", -5)}, 19},
    Case{"StopFails", 19, "AT+QXXL=0", close_fails, "", "ERROR", {ftm(22, "0,1", 3)}, 0},
    Case{"", 0, "AT+QXXL=2", nullptr, "", "ERROR", {}, 0},
    Case{"Missing", 0, "AT+QXPTS=1,/sdcard/music/none.wav", nullptr, "", "ERROR", {}, 0},
    Case{"NoPath", 0, "AT+QXPTS=1", nullptr, "", "ERROR", {}, 0},
    Case{"Fails", 0, "AT+QXPTS=1," + kTone, tone_fails, "", "ERROR",
         {"audio_ftm_process_full(22,1,1" + kToneArg + ") -> -5"}, 20},
    Case{"", 0, "AT+QXPTR=2", nullptr, "", "ERROR", {}, 0},
    // Two fields are the path alone, lowered, at volume 100.
    Case{"EmptyVolumeLowered", 0, "AT+QXPTRTS=1,,/SDCARD/MUSIC/TONE.WAV", nullptr, "", "OK",
         {ftm(25, "1,100" + kToneArg, 0)}, 28},
    Case{"EmptyPathIsNoPath", 0, "AT+QXPTRTS=1,", nullptr, "", "ERROR", {}, 0},
    Case{"Missing", 0, "AT+QXPTRTS=1,/sdcard/none.wav", nullptr, kNoFile, "ERROR", {}, 0},
    Case{"Fails", 0, "AT+QXPTRTS=1," + kTone, audio_fault, "", "ERROR", {ftm(25, "1,100" + kToneArg, -1)}, 28},
    Case{"StopFails", 28, "AT+QXPTRTS=0", close_fails, "", "ERROR", {ftm(25, "0,0", 3)}, 0},
    Case{"", 28, "AT+QXPTRTS=5", nullptr, "", "OK", {}, 28},
    Case{"Refused", 0, "AT+QX_AUD_STM=1," + kTone, refuse, "", "ATNG", {ftm(6, "1,100", 0)}, 29},
    Case{"Fails", 0, "AT+QX_AUD_STM=1," + kTone, lib("ftm.6", "3"), kStmError, "ERROR", {ftm(6, "1,100", 3)}, 29},
    Case{"Missing", 0, "AT+QX_AUD_STM=1,/sdcard/none.wav", nullptr, kNoFile, "ATNG", {}, 0},
    Case{"NoPath", 0, "AT+QX_AUD_STM=1", nullptr, kNoFile, "ATNG", {}, 0},
    Case{"Refused", 29, "AT+QX_AUD_STM=0", refuse, "", "ATNG", {ftm(6, "0,100", 0)}, 0},
    Case{"StopFails", 29, "AT+QX_AUD_STM=0", close_fails, kStmError, "ATNG", {ftm(6, "0,100", 3)}, 0},
    Case{"", 29, "AT+QX_AUD_STM=2", nullptr, "", "ATERROR", {}, 29}), line_name);

INSTANTIATE_TEST_SUITE_P(MultiMic, AudioLine, ::testing::Values(
    Case{"Fails", 0, "AT+QX_AUD_MIC=1,1", lib("ftm.41", "2"), "", "ATNG", {ftm(41, "1,100", 2)}, 22},
    Case{"StopFails", 22, "AT+QX_AUD_MIC=1,0", close_fails, "", "ATNG", {ftm(41, "0,0", 3)}, 0},
    Case{"Fails", 0, "AT+QX_AUD_MIC=5,1", main_fails, "", "ATNG", {"startMic2headset(100) -> -1"}, 26},
    Case{"ExitFails", 26, "AT+QX_AUD_MIC=5,0", exit_fails, "", "ATOK", {"exitMic2headset() -> 3"}, 0},
    // "=0" stops the test case numbered state + 19, whoever opened the state.
    Case{"AfterReceiveTest", 3, "AT+QX_AUD_MIC=0", nullptr, "", "ATOK", {ftm(22, "0,0", 0)}, 0},
    Case{"AfterSpeakerMic", 29, "AT+QX_AUD_MIC=0", close_fails, "", "ATNG", {ftm(48, "0,0", 3)}, 0},
    Case{"Reclose", 0, "AT+QX_AUD_MIC=0", nullptr, "", "ATOK", {}, 0},
    Case{"", 22, "AT+QX_AUD_MIC=4,1", nullptr, "", "ATERROR", {}, 22}), line_name);

const std::string kMos = "ftm_mbhc_mos_test() -> ", kHp = "ftm_mbhc_get_hp_type() -> ";

INSTANTIATE_TEST_SUITE_P(Headset, AudioLine, ::testing::Values(
    Case{"Pass", 0, "AT+QX_AUD_EAR=1,9", nullptr, "\"Pass\"", "ATOK", {kMos + "1"}, 0},
    Case{"Fail", 0, "AT+QX_AUD_EAR=1", lib("mos_test", "0"), "\"Fail\"", "ATNG", {kMos + "0"}, 0},
    Case{"Silent", 0, "AT+QX_AUD_EAR=1", fault("mbhc"), "", "ATNG", {kMos + "-1"}, 0},
    Case{"Unknown", 0, "AT+QX_AUD_EAR=1", lib("mos_test", "5"), "\"Unknown error 5\"", "ATNG", {kMos + "5"}, 0},
    Case{"Standard", 0, "AT+QX_AUD_EAR=2", nullptr, "\"1\"", "ATOK", {kHp + "1"}, 0},
    Case{"NotStandard", 0, "AT+QX_AUD_EAR=2", lib("hp_type", "2"), "\"2\"", "ATOK", {kHp + "2"}, 0},
    Case{"None", 0, "AT+QX_AUD_EAR=2", lib("hp_type", "0"), "\"3\"", "ATOK", {kHp + "0"}, 0},
    Case{"Unknown", 0, "AT+QX_AUD_EAR=2", lib("hp_type", "-1"), "\"Unknown error -1\"", "ATNG", {kHp + "-1"}, 0},
    Case{"", 0, "AT+QX_AUD_EAR=3", nullptr, "", "ATERROR", {}, 0}), line_name);

const std::string kMaker0 = "get_smartpa_manufacturer() -> 0";
const std::string kCalOk = "smartpa_calibrate() -> 0", kCalFails = "smartpa_calibrate() -> 6";
const std::string kTone2 = "message speakerld 2 -> ok", kTone0 = "message speakerld 0 -> ok";
const std::string kCalItem = "calibrate smart_speaker_amplifier_cali=";
const std::string kSubItem = "calibrate smart_speaker_amplifier2_cali=";
const std::string kMtpex = "smartpa_check_mtpex() -> ", kReset = "smartpa_reset_mtpex() -> ";
// The item list names the sub amplifier's item with its quotation marks, as it is asked for.
void sub_amplifier(const Sandbox &b) {
    const std::string items = "\"sub_smart_spearker_amplifier_cali_support\"";
    sim::write_kv(b.path("/.sim/config"), "calibrate_items", &items);
}
const Setup smartpa_fault = fault("smartpa");

INSTANTIATE_TEST_SUITE_P(Amplifier, AudioLine, ::testing::Values(
    Case{"", 0, "AT+ZNGF=0", nullptr, "", "OK", {kMaker0, kCalOk}, 0, {kTone2, kCalOk, kTone0, kCalItem + "1 uart=0"}},
    Case{"SubAmplifier", 0, "AT+ZNGF=0", sub_amplifier, "", "OK", {kMaker0, kCalOk}, 0,
         {kCalItem + "1 uart=0", kSubItem + "1 uart=0"}},
    Case{"AppRefuses", 0, "AT+ZNGF=0", refuse, "\"start audio fail\"", "ERROR", {}, 0},
    Case{"CalibrationFails", 0, "AT+ZNGF=0", lib("smartpa_calibrate", "6"), "", "ERROR", {kMaker0, kCalFails}, 0,
         {kTone2, kCalFails, kTone0}, {"calibrate "}},
    Case{"", 0, "AT+ZNGF=apk", nullptr, "R0=7.21ohm F0=812Hz", "OK", {kMaker0, kCalOk}, 0},
    Case{"NoAmplifier", 0, "AT+ZNGF=apk", smartpa_fault, "smartpa not found", "ERROR",
         {"get_smartpa_manufacturer() -> -1", "smartpa_calibrate() -> -1"}, 0},
    Case{"", 0, "AT+ZNGF=2", nullptr, "\r\n1\r\n", "OK", {kMtpex + "1"}, 0},
    Case{"NotCalibrated", 0, "AT+ZNGF=2", lib("smartpa_mtpex", "0"), "\r\n0\r\n", "OK", {kMtpex + "0"}, 0},
    Case{"NoAmplifier", 0, "AT+ZNGF=2", smartpa_fault, "", "ERROR", {kMtpex + "-1"}, 0},
    Case{"", 0, "AT+ZNGF=3", sub_amplifier, "", "OK", {kMaker0, kReset + "0"}, 0,
         {kCalItem + "0 uart=0", kSubItem + "0 uart=0"}},
    Case{"OtherMaker", 0, "AT+ZNGF=3", lib("smartpa_manufacturer", "1"), "\"Not support\"", "ERROR",
         {"get_smartpa_manufacturer() -> 1"}, 0},
    Case{"ResetFails", 0, "AT+ZNGF=3", lib("smartpa_reset_mtpex", "-4"), "", "ERROR", {kMaker0, kReset + "-4"}, 0},
    Case{"", 0, "AT+ZNGF=4", nullptr, "", "OK", {}, 0},
    // The worker form answers at once (the read gives up long before the tone ends) and calibrates behind.
    Case{"", 0, "AT+ZNGF=5", lib("smartpa_calibrate_ms", "400"), "", "OK", {kMaker0, kCalOk}, 0,
         {kTone2, "audio " + kMaker0, "audio " + kCalOk, kTone0, kCalItem + "1 uart=0"}},
    Case{"", 0, "AT+ZNGF=6", nullptr, "", "ERROR", {}, 0}), line_name);

const std::string kBusy = "sys.is_audio_working.", kHpMic = "setprop sys.is_audio_working.hp_mic";
// The microphone's busy mark (kBusy + mic) set to value, with a take on file or not.
Setup busy(std::string mic, std::string value, bool take = false) {
    return [=](const Sandbox &b) {
        b.set_prop(kBusy + mic, value);
        if (take) b.write(kMainFile, "RIFF");
    };
}
const std::string kTimeError = "\"time set error!!\"", kTypeError = "\"mic-type set error!!\"";

// Refused recordings and the done query: "0" while busy or before a take exists.
INSTANTIATE_TEST_SUITE_P(RecordingForms, AudioLine, ::testing::Values(
    Case{"NotTenths", 0, "AT+QX_AUD_RECD=0,MainMic,2.55", nullptr, kTimeError, "ATERROR", {}, 0},
    Case{"NoTime", 0, "AT+QX_AUD_RECD=0,MainMic", nullptr, kTimeError, "ATERROR", {}, 0},
    Case{"Absurd", 0, "AT+QX_AUD_RECD=0,MainMic,1e300", nullptr, kTimeError, "ATERROR", {}, 0},
    Case{"NotAName", 0, "AT+QX_AUD_RECD=0,BackMic,2", nullptr, kTypeError, "ATERROR", {}, 0},
    Case{"NeverRecorded", 0, "AT+QX_AUD_RECD=1,SubMic", nullptr, "\"0\"", "ATOK", {}, 0},
    Case{"Done", 0, "AT+QX_AUD_RECD=1,MainMic", busy("main_mic", "0", true), "\"1\"", "ATOK", {}, 0},
    Case{"BusyWithFile", 0, "AT+QX_AUD_RECD=1,MainMic", busy("main_mic", "1", true), "\"0\"", "ATOK", {}, 0},
    Case{"OddBusyValue", 0, "AT+QX_AUD_RECD=1,DoubleMic", busy("double_mic", "2"), "\"1\"", "ATOK", {}, 0},
    Case{"PartOfAName", 0, "AT+QX_AUD_RECD=1,Main", nullptr, kTypeError, "ERROR", {}, 0},
    Case{"", 0, "AT+QX_AUD_RECD=3,HPMic", busy("hp_mic", "1"), "", "ATOK", {}, 0, {kHpMic + "=0"}},
    Case{"Unknown", 0, "AT+QX_AUD_RECD=3,hpmic", nullptr, kTypeError, "ERROR", {}, 0},
    Case{"NoType", 0, "AT+QX_AUD_RECD=2,", nullptr, "", "ATOK", {}, 0},
    Case{"", 0, "AT+QX_AUD_RECD=1", nullptr, "\"parameter error\"", "ATERROR", {}, 0},
    // Takes run on their worker: a negative time records no loop, a part of a name is refused
    // there, a take that cannot start leaves the busy mark alone, one that cannot stop stays busy.
    Case{"Negative", 0, "AT+QX_AUD_RECD=0,HPMic,-1", nullptr, "", "ATOK", {ftm(54, "1,100", 0), ftm(54, "0,0", 0)}, 0,
         {"silent_mode 0", ftm(54, "1,100", 0), kHpMic + "=1", ftm(54, "0,0", 0), kHpMic + "=0", "silent_mode 1"}},
    Case{"PartOfAName", 0, "AT+QX_AUD_RECD=0,Mic,0.1", nullptr, "", "ATOK", {}, 0, {}, {"set_silent_mode 1"}},
    Case{"CannotStart", 0, "AT+QX_AUD_RECD=0,STMic,1", lib("ftm.53", "-19"), "", "ATOK", {ftm(53, "1,100", -19)}, 0, {},
         {kBusy + "st_mic"}},
    Case{"CannotStop", 0, "AT+QX_AUD_RECD=0,DoubleMic,0.1", lib("ftm.55.stop", "-4"), "", "ATOK",
         {ftm(55, "1,100", 0), ftm(55, "0,0", -4)}, 0, {"double_mic=1"}, {"double_mic=0", "set_silent_mode 1"}}),
    line_name);

// ---- results across lines

TEST_F(AudioTest, HangUpLineClosesTheOpenPathOnTheLastSource) {
    expect("AT+QXEMTR=1,70", "", "OK", SRC_USB);
    dispatch_command(nullptr, 0, SRC_TCP);
    EXPECT_EQ(answer(), "AT+QXMT=1,0\r\n\r\nOK\r\n");
    EXPECT_EQ(g_audio_test_state.load(), 0);
    dispatch_command(nullptr, 0, SRC_TCP);
    EXPECT_EQ(answer(), "AT+QXMT=1,0\r\n\r\nATOK\r\n");
    EXPECT_EQ(audio_calls(box), (Calls{"startHeadset2earpiece(70) -> 0", "exitSendTest() -> 0"}));
}

// The library's answers change between calls: each line asks again.
TEST_F(AudioTest, HeadsetPluggedBetweenTwoQueries) {
    box.sequence("audio:hp_type", {"0", "1"});
    expect("AT+QX_AUD_EAR=2", "\"3\"", "ATOK");
    expect("AT+QX_AUD_EAR=2", "\"1\"", "ATOK");
}

// ---- recordings

TEST_F(AudioTest, RecordingRunsItsTimeThenReportsDone) {
    expect("AT+QX_AUD_RECD=0,MainMic,0.3", "", "ATOK");
    ASSERT_TRUE(wait_for(box, "message set_silent_mode 1")) << box.events();
    expect_in_order(box.events(), {"set_silent_mode 0 -> ok", ftm(51, "1,100", 0), "recorder start " + kMainFile,
                                   kMainBusy + "=1", ftm(51, "0,0", 0), "recorder stop " + kMainFile, kMainBusy + "=0",
                                   "set_silent_mode 1 -> ok"});
    // From the busy mark to the poll that found the time up: at most a poll late, with room for a loaded machine.
    const long long took = ms_from_to(box, kMainBusy + "=1", ftm(51, "0,0", 0));
    EXPECT_GE(took, 300);
    EXPECT_LE(took, 1300);
    EXPECT_GE(box.read(kMainFile).size(), 44u + 300 * 16);  // the asked time of 8 kHz 16-bit samples
    expect("AT+QX_AUD_RECD=1,MainMic", "\"1\"", "ATOK");
}

TEST_F(AudioTest, StopFormEndsARunningRecordingAtItsNextPoll) {
    box.write("/sdcard/engineermode/sub-record.wav", "old take");
    expect("AT+QX_AUD_RECD=2,SubMic", "", "ATOK");
    ASSERT_TRUE(wait_for(box, "setprop " + kSubBusy + "=1"));
    EXPECT_EQ(box.read("/sdcard/engineermode/sub-record.wav").substr(0, 4), "RIFF");  // the old take went first
    expect("AT+QX_AUD_RECD=1,SubMic", "\"0\"", "ATOK");
    expect("AT+QX_AUD_RECD=3,SubMic", "", "ATOK");
    ASSERT_TRUE(wait_for(box, "message set_silent_mode 1", 3000)) << box.events();
    // The worker polls every 10 ms: the stop follows the cleared mark at once, not after 30 s.
    const long long took = ms_from_to(box, kSubBusy + "=0", ftm(52, "0,0", 0));
    EXPECT_GE(took, 0);
    EXPECT_LE(took, 1000);
    expect("AT+QX_AUD_RECD=1,SubMic", "\"1\"", "ATOK");
    EXPECT_EQ(box.events().find("set_silent_mode 0"), std::string::npos);  // the "=2" form sends none
}

TEST_F(AudioTest, RecordingIsCappedAtThirtySeconds) {
    // The phone's clock jumps under a 100 s take: at 29 s it records on, past 30 s it ends. The first
    // jump waits for the polls to run, so a start noted late (just after the busy mark) cannot take it in.
    expect("AT+QX_AUD_RECD=0,MainMic,100", "", "ATOK");
    ASSERT_TRUE(wait_for(box, "setprop " + kMainBusy + "=1"));
    EXPECT_FALSE(wait_for(box, "audio_ftm_process(51,0,0)", 300));
    box.write("/.sim/clock", "29\n");
    EXPECT_FALSE(wait_for(box, "audio_ftm_process(51,0,0)", 300));  // some thirty polls
    box.write("/.sim/clock", "31\n");
    ASSERT_TRUE(wait_for(box, "setprop " + kMainBusy + "=0", 3000)) << box.events();
}

TEST_F(AudioTest, ClockSetBackDoesNotKeepARecordingOpen) {
    expect("AT+QX_AUD_RECD=0,MainMic,1", "", "ATOK");
    ASSERT_TRUE(wait_for(box, "setprop " + kMainBusy + "=1"));
    box.write("/.sim/clock", "-3600\n");  // the phone's clock alone would record for an hour
    ASSERT_TRUE(wait_for(box, "setprop " + kMainBusy + "=0", 5000)) << box.events();
    EXPECT_GE(box.read(kMainFile).size(), 44u + 1000 * 16);  // still the whole asked second
}

// ---- amplifier worker and settle time

TEST_F(AudioTest, LineCalibrationWaitsForTheWorkersToEnd) {
    script(box, "smartpa_calibrate_ms", "600");
    expect("AT+ZNGF=5", "", "OK");
    ASSERT_TRUE(wait_for(box, "get_smartpa_manufacturer()"));  // the worker's calibration is under way
    expect("AT+ZNGF=apk", "R0=7.21ohm F0=812Hz", "OK");
    std::vector<long long> ends;
    for (const Event &e : box.event_list())
        if (e.kind == "audio" && e.detail.rfind("smartpa_calibrate()", 0) == 0) ends.push_back(e.ms);
    ASSERT_EQ(ends.size(), 2u) << box.events();
    EXPECT_GE(ends[1] - ends[0], 600);  // the second tone started when the first had ended
}

class AmplifierSettle : public AudioTest, public ::testing::WithParamInterface<int> {};

TEST_P(AmplifierSettle, MakersOneAndTwoWaitHalfASecond) {
    const int maker = GetParam();
    script(box, "smartpa_manufacturer", std::to_string(maker));
    expect("AT+ZNGF=apk", "R0=7.21ohm F0=812Hz", "OK");
    const long long took = ms_from_to(box, "get_smartpa_manufacturer()", "smartpa_calibrate()");
    ASSERT_GE(took, 0);
    EXPECT_EQ(took >= 500, maker == 1 || maker == 2) << took;
}

INSTANTIATE_TEST_SUITE_P(Audio, AmplifierSettle, ::testing::Values(0, 1, 2, 3),
                         [](const ::testing::TestParamInfo<int> &i) { return "Maker" + std::to_string(i.param); });

}  // namespace
