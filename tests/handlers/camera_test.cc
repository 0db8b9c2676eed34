// Camera tests: exact frames, the camera messages and test-app messages in order, the
// marker files, and the answers of a gated project, a silent or failing camera service
// and missing nodes.
#include <filesystem>
#include <string>
#include <vector>

#include "platform/sim/sim.h"
#include "tests/support/checks.h"
#include "tests/support/in_process.h"

namespace {

const std::string kGate = "above RX6290 or RT6203, not support";
const char *kPdaf = "/data/engineermode/pdaf_test";
const char *kRefocus = "/data/engineermode/refocus_check";
const char *kFrontRefocus = "/data/engineermode/front_refocus_check";
const std::string kFocus = "eng_AT_camera#NULL#NULL#focus_control#distance ";
std::string repeat(const std::string &s, int n) {
    std::string out;
    while (n-- > 0) out += s;
    return out;
}
const std::string kManyParams = repeat(",77", 600);
const std::string kBackStart = "camera start#cameraId back#eng_AT_command true -> success";

std::string nv_pattern() {  // every byte non-zero, so a stray write shows
    return nv_fill(0x21, 91);
}


void config(const Sandbox &b, const std::string &key, const std::string &value) {
    sim::write_kv(b.root + "/.sim/config", key, &value);
}
void camera_says(const Sandbox &b, const std::string &message, const std::string &reply) {
    b.write("/.sim/camera.replies", message + " => " + reply + "\n" + b.read("/.sim/camera.replies"));
}

using Setup = void (*)(const Sandbox &);
void gated(const Sandbox &b) { config(b, "project_number", "6291"); }
void td_gated(const Sandbox &b) { config(b, "project_number", "6204"); }
void at_gate(const Sandbox &b) { config(b, "project_number", "6203"); }  // not above either
void proximity(const Sandbox &b) { config(b, "project", "RT6102_EX"); }
void mismatch(const Sandbox &b) {
    proximity(b);
    b.write("/.sim/sensor", "841=absent\n842=absent\n");
}
void camera_down(const Sandbox &b) { b.fault("camera"); }
void all_fail(const Sandbox &b) { b.write("/.sim/camera.replies", "* => fail#busy\n"); }
void markers(const Sandbox &b) {
    for (const char *m : {kPdaf, kRefocus, kFrontRefocus}) b.write(m, "");
}
void leak(const Sandbox &b, const char *value) { camera_says(b, "front_light_leak", std::string("success#leak#") + value); }

struct Case {
    std::string line;
    Setup setup;
    std::string body;
    const char *word;
    std::vector<std::string> events = {};  // recorded in this order
    std::vector<std::string> absent = {};  // never recorded
    std::vector<std::pair<const char *, bool>> files = {};
    const char *tag = nullptr;  // tells apart cases of one line
};

std::string case_name(const ::testing::TestParamInfo<Case> &info) {
    std::string name;
    for (char c : info.param.line.substr(0, 40)) {
        bool word = isalnum(static_cast<unsigned char>(c));
        if (word) name += c;
        else if (!name.empty() && name.back() != '_') name += '_';
    }
    while (!name.empty() && name.back() == '_') name.pop_back();
    if (info.param.tag) name += std::string("_") + info.param.tag;
    return name;
}

class CameraTest : public InProcess {
protected:
    void SetUp() override {
        InProcess::SetUp();
        box.write("/.sim/nv.bin", nv_pattern());
    }
    void TearDown() override {
        is_uart_flag = 0;
        InProcess::TearDown();
    }
};
class CameraLine : public CameraTest, public ::testing::WithParamInterface<Case> {};

TEST_P(CameraLine, Answers) {
    const Case &c = GetParam();
    if (c.setup) c.setup(box);
    const std::string frame = c.line + "\r\n" + c.body + "\r\n" + c.word + "\r\n";
    EXPECT_EQ(serve(c.line, SRC_TCP, frame.size()), frame);
    const std::string log = box.events();
    expect_in_order(log, c.events);
    for (const auto &a : c.absent) EXPECT_EQ(log.find(a), std::string::npos) << a << "\n" << log;
    for (auto [path, present] : c.files) EXPECT_EQ(box.exists(path), present) << path;
    EXPECT_EQ(box.read("/.sim/nv.bin"), nv_pattern());
}

INSTANTIATE_TEST_SUITE_P(Open, CameraLine, ::testing::Values(
    Case{"AT+MMICCM=B,1", nullptr, "", "OK", {kBackStart}, {"sensor"}},
    Case{"AT+MMICCM=BS,1", nullptr, "", "OK",
         {"camera start#cameraId back_sub#eng_single_camera_test true#eng_AT_command true -> "}},
    Case{"AT+MMICCM=BTELE,1", nullptr, "", "OK", {"camera eng_AT_camera#rear#tele#open#NULL#NULL -> success"}},
    Case{"AT+MMICCM=bmacro,1", nullptr, "", "OK", {"camera eng_AT_camera#rear#macro#open#NULL#NULL -> "}},
    Case{"AT+MMICCM=B,1", proximity, "", "OK", {"sensor test 841 -> 0", kBackStart}, {"842"}, {}, "ProximityLedClosed"},
    Case{"AT+MMICCM=B,1", mismatch, "\"sensor material mismatch\"", "ERROR", {"sensor test 841 -> -1"}, {"camera"}, {},
         "SensorMismatch"},
    Case{"AT+MMICCM=B,1", all_fail, "fail#busy", "ERROR", {"camera start#"}, {}, {}, "CameraFails"},
    Case{"AT+MMICCM=B,1", gated, "", "OK", {kBackStart}, {}, {}, "NotGated"}), case_name);

INSTANTIATE_TEST_SUITE_P(CaptureFocusStop, CameraLine, ::testing::Values(
    Case{"AT+MMICCM=B,2", nullptr, "", "OK", {"camera capture -> success"}},
    Case{"AT+MMICCM=BPERI,2", nullptr, "", "OK", {"camera eng_AT_camera#rear#peri#capture#NULL#NULL -> "}},
    Case{"AT+MMICCM=FS,2", all_fail, "fail#busy", "ATNG", {"camera capture -> fail#busy"}, {}, {}, "CameraFails"},
    Case{"AT+MMICCM=BMACRO,3", nullptr, "", "OK", {"camera eng_AT_camera#rear#macro#auto_focus#NULL#NULL -> "}},
    Case{"AT+MMICCM=FB,0", nullptr, "", "OK", {"camera stop -> success"}, {"sensor"}},
    Case{"AT+MMICCM=B,0", proximity, "", "OK", {"sensor test 842 -> 0", "camera stop"}, {"841"}, {}, "ProximityLedOpened"},
    Case{"AT+MMICCM=B,0", mismatch, "\"sensor material mismatch\"", "ERROR", {}, {"camera"}, {}, "SensorMismatch"},
    Case{"AT+MMICCM=B,0", all_fail, "fail#busy", "ATNG", {}, {}, {}, "CameraFails"}), case_name);

INSTANTIATE_TEST_SUITE_P(GatedForms, CameraLine, ::testing::Values(
    Case{"AT+MMICCM=B,4", nullptr, "", "OK", {"camera ois_control#value on#ois_mode ois-still -> success"}},
    Case{"AT+MMICCM=BB,5", nullptr, "", "OK", {"camera ois_control#value off#ois_mode ois-centering-on -> success"}},
    Case{"AT+MMICCM=B,4", all_fail, "fail#busy", "ATNG", {}, {}, {}, "CameraFails"},
    Case{"AT+MMICCM=B,4", gated, kGate, "ATERROR", {}, {"camera"}, {}, "Gated"},
    Case{"AT+MMICCM=BB,4", td_gated, kGate, "ATERROR", {}, {"camera"}, {}, "GatedByTd"},
    Case{"AT+MMICCM=B,4", at_gate, "", "OK", {"camera ois"}, {}, {}, "AtTheGate"},
    Case{"AT+MMICCM=B,6", nullptr, "", "OK",
         {"camera pdaf_test -> success", "shell /system/bin/sh -c \"touch /data/engineermode/pdaf_test\""}, {}, {{kPdaf, true}}},
    Case{"AT+MMICCM=BB,6", [](const Sandbox &b) { camera_says(b, "pdaf_test", "SUCCESS"); }, "", "OK", {}, {}, {{kPdaf, true}},
         "UpperCaseSuccess"},
    Case{"AT+MMICCM=B,6", [](const Sandbox &b) { markers(b), camera_says(b, "pdaf_test", "success#partly"); }, "", "ATNG", {},
         {"touch"}, {{kPdaf, false}}, "WholeReplyOnly"},
    Case{"AT+MMICCM=B,7", markers, "", "OK", {}, {"camera"}},
    Case{"AT+MMICCM=BB,7", nullptr, "", "ATNG", {}, {"camera"}, {}, "NoMarker"},
    Case{"AT+MMICCM=BTELE,7", nullptr, "", "OK", {"camera eng_AT_camera#rear#tele#pdaf_test#NULL#NULL -> "}},
    Case{"AT+MMICCM=BMACRO,7", nullptr, "", "ATERROR", {}, {"camera"}},
    Case{"AT+MMICCM=B,8", nullptr, "", "OK", {"camera refocus_check -> success", "touch /data/engineermode/refocus_check"},
         {}, {{kRefocus, true}, {kFrontRefocus, false}}},
    Case{"AT+MMICCM=FB,8", nullptr, "", "OK", {"camera front_refocus_check -> ", "touch " + std::string(kFrontRefocus)}, {},
         {{kFrontRefocus, true}, {kRefocus, false}}},
    Case{"AT+MMICCM=F,8", [](const Sandbox &b) { markers(b), all_fail(b); }, "", "ERROR", {}, {},
         {{kFrontRefocus, false}, {kRefocus, true}}, "Fails"},
    Case{"AT+MMICCM=B,9", markers, "", "OK"},
    Case{"AT+MMICCM=BB,9", nullptr, "", "ERROR", {}, {}, {}, "NoMarker"},
    Case{"AT+MMICCM=F,9", [](const Sandbox &b) { b.write(kRefocus, ""); }, "", "ERROR", {}, {}, {}, "OnlyRearMarker"},
    Case{"AT+MMICCM=BB,10", nullptr, "", "OK", {"camera long_shot#value start# -> success"}},
    Case{"AT+MMICCM=BB,10,25", nullptr, "", "OK", {"camera long_shot#value start#number 25 -> "}},
    // The count is cut where the 48-byte message ends.
    Case{"AT+MMICCM=BB,10,123456789012345678901234", nullptr, "", "OK",
         {"camera long_shot#value start#number 123456789012345678 -> "}},
    Case{"AT+MMICCM=BB,100", nullptr, "", "OK", {"camera long_shot#value start# -> "}, {}, {}, "PrefixOnly"},
    Case{"AT+MMICCM=BB,10,9", all_fail, "fail#busy", "ERROR", {}, {}, {}, "CameraFails"},
    Case{"AT+MMICCM=BB,10", gated, kGate, "ATERROR", {}, {"camera"}, {}, "Gated"},
    Case{"AT+MMICCM=BB,11", nullptr, "", "OK", {"camera long_shot#value stop# -> success"}},
    Case{"AT+MMICCM=B,test,af_check#on", nullptr, "", "ATOK", {"camera af_check#on -> success"}},
    Case{"AT+MMICCM=FS,para,iso 100,extra", nullptr, "", "ATOK", {"camera iso 100 -> success"}},
    Case{"AT+MMICCM=BB,test", nullptr, "\r\n\"invalid parameter\"\r\n", "ATERROR", {}, {"camera"}},
    Case{"AT+MMICCM=B,test," + std::string(250, 'm'), nullptr, "", "ATOK",
         {"camera " + std::string(199, 'm') + " -> success"}},
    Case{"AT+MMICCM=BS,test,x", gated, kGate, "ATERROR", {}, {"camera"}, {}, "Gated"}), case_name);

INSTANTIATE_TEST_SUITE_P(LightLeakAndInvalid, CameraLine, ::testing::Values(
    Case{"AT+MMICCM=F,11", nullptr, "\r\n\"+Light:12.5\"\r\n", "ATOK", {"camera front_light_leak -> "}},
    Case{"AT+MMICCM=F,11", [](const Sandbox &b) { leak(b, "1000.5"); }, "\r\n\"+Light:1000.5\"\r\n", "ATNG", {}, {}, {},
         "AboveLimit"},
    Case{"AT+MMICCM=F,11", [](const Sandbox &b) { leak(b, "-999"); }, "\r\n\"+Light:-999\"\r\n", "ATOK", {}, {}, {},
         "AtLowerLimit"},
    Case{"AT+MMICCM=F,11", [](const Sandbox &b) { leak(b, "-999.01"); }, "\r\n\"+Light:-999.01\"\r\n", "ATNG", {}, {}, {},
         "BelowLimit"},
    Case{"AT+MMICCM=F,11", [](const Sandbox &b) { leak(b, "dark"); }, "\r\n\"+Light:dark\"\r\n", "ATNG", {}, {}, {},
         "NotANumber"},
    Case{"AT+MMICCM=F,11", [](const Sandbox &b) { camera_says(b, "front_light_leak", "success"); }, "\r\n\"+Light:\"\r\n",
         "ATNG", {}, {}, {}, "NoValue"},
    Case{"AT+MMICCM=F,11", all_fail, "", "ATERROR", {"camera front_light_leak -> fail#busy"}, {}, {}, "CameraFails"},
    Case{"AT+MMICCM=F,11", gated, "\r\n\"+Light:12.5\"\r\n", "ATOK", {}, {}, {}, "NotGated"},
    Case{"AT+MMICCM=f,11", nullptr, "", "ERROR", {}, {"camera"}},
    Case{"AT+MMICCM=B,1,1", nullptr, "", "ERROR", {}, {"camera"}},
    Case{"AT+MMICCM=BMACRO,4", nullptr, "", "ERROR", {}, {"camera"}}), case_name);

INSTANTIATE_TEST_SUITE_P(SelfTest, CameraLine, ::testing::Values(
    Case{"AT+QX_CCM_SLTS=1,rear,main,1,2", nullptr, "", "ATOK",
         {"camera eng_AT_camera#rear#main#auto_test_execute#params 1,2 -> success"}},
    Case{"AT+QX_CCM_SLTS=2,front,wide,7", nullptr, "", "ATOK",
         {"camera eng_AT_camera#front#wide#auto_test_set_param#params 7 -> "}},
    Case{"AT+QX_CCM_SLTS=1 rear#main,,3 4", nullptr, "", "ATOK",
         {"camera eng_AT_camera#rear#main#auto_test_execute#params 3,4 -> "}},
    Case{"AT+QX_CCM_SLTS=3,rear,main,0", nullptr, "\r\n\"+af:1\"\r\n\r\n\"+ae:0\"\r\n", "ATOK",
         {"camera eng_AT_camera#rear#main#auto_test_get_result#params 0 -> success#auto_test_get_result#af 1#ae 0"}},
    Case{"AT+QX_CCM_SLTS=3,rear,main,0",
         [](const Sandbox &b) { camera_says(b, "eng_AT_camera#rear#main#auto_test_get_result#params 0", "success#x"); }, "",
         "ATOK", {}, {}, {}, "NoResults"},
    Case{"AT+QX_CCM_SLTS=3,rear,main,0",
         [](const Sandbox &b) { camera_says(b, "eng_AT_camera#rear#main#auto_test_get_result#params 0", "success#x#flag#k v w"); },
         "\r\n\"+flag:\"\r\n\r\n\"+k:v w\"\r\n", "ATOK", {}, {}, {}, "KeyWithoutValue"},
    Case{"AT+QX_CCM_SLTS=3,rear,main,0", all_fail, "fail#busy", "ERROR", {}, {}, {}, "CameraFails"},
    Case{"AT+QX_CCM_SLTS=1,rear,main,1", gated, "", "ATOK", {}, {}, {}, "NotGated"},
    // The message is cut where its 1024-byte buffer ends.
    Case{"AT+QX_CCM_SLTS=2,rear,main,0" + kManyParams, nullptr, "", "ATOK",
         {"camera eng_AT_camera#rear#main#auto_test_set_param#params 0" + kManyParams.substr(0, 1023 - 52) + " -> "}},
    Case{"AT+QX_CCM_SLTS=1", nullptr, "", "ERROR", {}, {"camera"}},
    Case{"AT+QX_CCM_SLTS=1,rear,main", nullptr, "", "ERROR", {}, {"camera"}},
    Case{"AT+QX_CCM_SLTS=4,rear,main,1", nullptr, "", "ERROR", {}, {"camera"}}), case_name);

INSTANTIATE_TEST_SUITE_P(ModeAndFillLight, CameraLine, ::testing::Values(
    Case{"AT+QX_CCM_CVT=1", nullptr, "", "OK", {}, {"camera"}},
    Case{"AT+QX_CCM_CVT=2", nullptr, "", "ERROR"},
    Case{"AT+QX_CCM_CVT=1", gated, kGate, "ATERROR", {}, {}, {}, "Gated"},
    Case{"AT+LCML=0,0", nullptr, "", "OK", {"camera screen_front_flash#value reset -> success", "camera stop -> success"}},
    Case{"AT+LCML=0,0", all_fail, "fail#busy", "ERROR", {"camera screen_front_flash#value reset -> fail"},
         {"camera stop"}, {}, "ResetFails"},
    Case{"AT+LCML=0,0", [](const Sandbox &b) { camera_says(b, "stop", "fail#not open"); }, "fail#not open", "ERROR",
         {"camera screen_front_flash#value reset -> success", "camera stop -> fail#not open"}, {}, {}, "StopFails"},
    Case{"AT+LCML=0,0", gated, kGate, "ATERROR", {}, {"camera"}, {}, "Gated"},
    Case{"AT+LCML=0,1", nullptr, "", "OK", {"camera start#eng_screen_front_flash true -> success"}},
    Case{"AT+LCML=1", nullptr, "", "OK", {"camera screen_front_flash#value on -> success"}},
    Case{"AT+LCML=2", gated, "", "OK", {"camera screen_front_flash#value capture -> success"}, {}, {}, "NotGated"},
    Case{"AT+LCML=2", camera_down, "fail#camera service not available", "ERROR", {}, {}, {}, "CameraDown"},
    Case{"AT+LCML=3", nullptr, "", "ERROR", {}, {"camera"}}), case_name);

INSTANTIATE_TEST_SUITE_P(Connection, CameraLine, ::testing::Values(
    Case{"AT+QXCCM=1", [](const Sandbox &b) { b.reply("CameraConnect", "3"); }, "", "OK", {"message CameraConnect -> 3"}},
    Case{"AT+QXCCM=1", nullptr, "", "ERROR", {"message CameraConnect -> ok"}, {}, {}, "NotConnected"},
    Case{"AT+QXCCM=1", [](const Sandbox &b) { b.fault("testapp-silent"); }, "", "ERROR", {}, {}, {}, "TestAppSilent"},
    Case{"AT+QXCCM=1", gated, kGate, "ATERROR", {}, {"message"}, {}, "Gated"},
    Case{"AT+QXCCM=2", nullptr, "", "ERROR", {}, {"message"}},
    Case{"AT+QX_CCM_CONN=1", nullptr, "\"0,0,0,0\"", "ATOK", {"shell ftcmd_camera"}, {}, {}, "ToolSilent"},
    Case{"AT+QX_CCM_CONN=1", [](const Sandbox &b) { b.write("/.sim/shell.replies", "ftcmd_camera => 2,1,0,1\n"); },
         "\"2,1,0,1\"", "ATOK"},
    Case{"AT+QX_CCM_CONN=1", [](const Sandbox &b) { b.write("/.sim/shell.replies", "ftcmd_camera => 3,1,1,1\n"); },
         "\"3,1,1,1\"", "ATNG", {}, {}, {}, "NotConnected"},
    Case{"AT+QX_CCM_CONN=1", [](const Sandbox &b) { b.fault("ext-system"); }, "\"0,0,0,0\"", "ATOK", {}, {}, {}, "ToolFails"},
    Case{"AT+QX_CCM_CONN=1", gated, kGate, "ATERROR", {}, {"shell"}, {}, "Gated"},
    Case{"AT+QX_CCM_CONN=0", nullptr, "", "ERROR", {}, {"shell"}}), case_name);

INSTANTIATE_TEST_SUITE_P(Identity, CameraLine, ::testing::Values(
    Case{"AT+QXCCMID=0", nullptr, "\r\n\"front:s5k3p9sp\n\r\nback:imx586\n\"\r\n ", "OK"},
    Case{"AT+QXCCMID=0", [](const Sandbox &b) { b.write("/sys/ccm/FrontSensorId", "ov16a1q\nsecond line\n"); },
         "\r\n\"front:ov16a1q\n\r\nback:imx586\n\"\r\n ", "OK", {}, {}, {}, "OneLineOnly"},
    Case{"AT+QXCCMID=0", [](const Sandbox &b) { std::filesystem::remove(b.path("/sys/ccm/RearSensorId")); }, "", "ERROR",
         {}, {}, {}, "RearNodeMissing"},
    Case{"AT+QXCCMID=0", [](const Sandbox &b) { std::filesystem::remove(b.path("/sys/ccm/FrontSensorId")); }, "", "ERROR",
         {}, {}, {}, "FrontNodeMissing"},
    Case{"AT+QXCCMID=0", gated, kGate, "ATERROR", {}, {}, {}, "Gated"},
    Case{"AT+QXCCMID=1", nullptr, "", "ERROR"},
    Case{"AT+QX_CCM_SN=1,F,MAIN", nullptr, "\r\n\"FM5012A0131\"\r\n", "ATOK"},
    Case{"AT+QX_CCM_SN=1,r,macro", nullptr, "\r\n\"RC5012D0019\"\r\n", "ATOK"},
    Case{"AT+QX_CCM_SN=1,R,PORT", [](const Sandbox &b) { config(b, "camera_sn.rear_camera_port", "RP77"); },
         "\r\n\"RP77\"\r\n", "ATOK"},
    Case{"AT+QX_CCM_SN=1,R,TELE", nullptr, "\r\n\"\"\r\n", "ATOK", {}, {}, {}, "NotFitted"},
    Case{"AT+QX_CCM_SN=1,R,FOO", nullptr, "", "ATERROR"},
    Case{"AT+QX_CCM_SN=0,1", nullptr, "\r\n\"FM5012A0131\"\r\n", "ATOK"},
    Case{"AT+QX_CCM_SN=0,3,extra", nullptr, "\r\n\"RM5012B0457\"\r\n", "ATOK"},
    Case{"AT+QX_CCM_SN=0,5", nullptr, "", "ATERROR"},
    Case{"AT+QX_CCM_IRID=0", nullptr, "\r\n\"1\"\r\n", "ATOK"},
    Case{"AT+QX_CCM_IRID=0", [](const Sandbox &b) { b.write("/persist/camera/ir_id_sub", "2"); }, "\r\n\"2\"\r\n", "ATOK",
         {}, {}, {}, "Module2"},
    Case{"AT+QX_CCM_IRID=0", [](const Sandbox &b) { b.write("/persist/camera/ir_id_sub", "1\n"); }, "\r\n\"1\n\"\r\n", "ATNG",
         {}, {}, {}, "UnknownModule"},
    Case{"AT+QX_CCM_IRID=0", [](const Sandbox &b) { std::filesystem::remove(b.path("/persist/camera/ir_id_sub")); },
         "/persist/camera/ir_id_sub : not exist ", "ATNG", {}, {}, {}, "FileMissing"},
    Case{"AT+QX_CCM_IRID=0", gated, kGate, "ATERROR", {}, {}, {}, "Gated"},
    Case{"AT+QX_CCM_IRID=1", nullptr, "", "ERROR"},
    Case{"AT+QX_CCM_COLOR=FB,1", nullptr, "\r\n\"2\"\r\n", "ATOK"},
    Case{"AT+QX_CCM_COLOR=BB,1", [](const Sandbox &b) { b.set_prop("persist.camera.is_rgb", "1"); }, "\r\n\"2\"\r\n", "ATOK"},
    Case{"AT+QX_CCM_COLOR=BS,1", [](const Sandbox &b) { b.set_prop("persist.camera.is_rgb", "1"); }, "\r\n\"1\"\r\n", "ATOK",
         {}, {}, {}, "Rgb"},
    Case{"AT+QX_CCM_COLOR=BS,1", nullptr, "\r\n\"2\"\r\n", "ATOK", {}, {}, {}, "Mono"},
    Case{"AT+QX_CCM_COLOR=FS,1", gated, kGate, "ATERROR", {}, {}, {}, "Gated"},
    Case{"AT+QX_CCM_COLOR=BS,2", gated, "", "ATERROR"}), case_name);

void otp_fails(const Sandbox &b) { b.set_prop("sys.camera.rear_camera_wide_otp_status", "0"); }
void pdaf_reply(const Sandbox &b, const std::string &reply) { camera_says(b, "eng_AT_camera#qx_ccm_pdaf#1#rear", reply); }

INSTANTIATE_TEST_SUITE_P(NewerInterface, CameraLine, ::testing::Values(
    Case{"AT+QX_CCM_OTP=1", nullptr,
         "front_camera_main:pass\r\nrear_camera_main:pass\r\nrear_camera_wide:pass\r\nrear_camera_wide:pass\r\n", "ATOK"},
    // The macro camera is checked with the wide camera's property, so both fail.
    Case{"AT+QX_CCM_OTP=1", otp_fails,
         "front_camera_main:pass\r\nrear_camera_main:pass\r\nrear_camera_wide:fail\r\nrear_camera_wide:fail\r\n", "ATNG", {}, {},
         {}, "WideFails"},
    Case{"AT+QX_CCM_OTP=1", [](const Sandbox &b) { config(b, "cameras", "front:RTBOnly,rear:Macro,front:Wide"); },
         "front_camera_rtb:pass\r\nfront_camera_wide:pass\r\nrear_camera_wide:pass\r\n", "ATOK", {}, {}, {}, "OtherCameras"},
    Case{"AT+QX_CCM_OTP=1", [](const Sandbox &b) { config(b, "camera_new_interface", "0"); }, "", "ATNG", {}, {}, {},
         "OldScheme"},
    Case{"AT+QX_CCM_OTP=3", nullptr, "", "ATERROR", {}, {"camera"}},
    Case{"AT+QX_CCM_OTP=2", nullptr, "", "ATERROR", {}, {"camera"}},
    Case{"AT+QX_CCM_OTP=2,rear", nullptr, "", "ATOK", {"camera eng_AT_camera#qx_ccm_otp#2#rear -> success"}, {"calibrate"}},
    Case{"AT+QX_CCM_PDAF=1,rear", nullptr, "", "ATOK",
         {"camera eng_AT_camera#qx_ccm_pdaf#1#rear -> success", "calibrate pdaf_calibration=1 uart=0"}},
    Case{"AT+QX_CCM_PDAF=1,rear", [](const Sandbox &b) { pdaf_reply(b, "success#pdaf#shift 0.8#conf 97"); },
         "\r\n\"+shift:0.8\"\r\n\r\n\"+conf:97\"\r\n", "ATOK", {"calibrate pdaf_calibration=1"}, {}, {}, "Values"},
    Case{"AT+QX_CCM_PDAF=1,rear", [](const Sandbox &b) { pdaf_reply(b, "fail#no target"); }, "\"fail#no target\"", "ATNG", {},
         {"calibrate"}, {}, "CameraFails"},
    Case{"AT+QX_CCM_PDAF=1,rear", [](const Sandbox &) { is_uart_flag = 1; }, "", "ATOK",
         {"calibrate pdaf_calibration=1 uart=1"}, {}, {}, "UartConsole"},
    Case{"AT+QX_CCM_PDAF=1,rear", [](const Sandbox &b) { b.fault("calibrate-item"); }, "save_ret=-5", "ATNG",
         {"calibrate pdaf_calibration=1 uart=0 (failed)"}, {}, {}, "ItemNotSaved"},
    Case{"AT+QX_CCM_PDAF=1,rear", [](const Sandbox &b) { config(b, "camera_item.AT+QX_CCM_PDAF", "ab"); }, "", "ATOK", {},
         {"calibrate"}, {}, "ShortItemName"},
    Case{"AT+QX_CCM_PDAF=1,rear", [](const Sandbox &b) { b.fault("camera-transform"); }, "", "ATERROR", {}, {"camera"}, {},
         "Untranslatable"},
    Case{"AT+QX_CCM_SINGLE=3,front,main", nullptr, "", "ATOK",
         {"camera eng_AT_camera#qx_ccm_single#3#front#main -> success"}, {"calibrate"}},
    Case{"AT+QX_CCM_PARA=2,5", nullptr, "", "ATOK", {"camera eng_AT_camera#qx_ccm_para#2#5 -> "}},
    Case{"AT+QX_CCM_PARA=1,120", nullptr, "", "ATOK", {"camera eng_AT_camera#NULL#NULL#focus_control#distance 120 -> "}},
    Case{"AT+QX_CCM_PARA=1,120", all_fail, "", "ATOK", {"camera eng_AT_camera#NULL#NULL#focus_control#distance 120 -> fail"},
         {}, {}, "CameraFails"},
    Case{"AT+QX_CCM_PARA=1,", nullptr, "", "ATOK", {"camera eng_AT_camera#NULL#NULL#focus_control#distance  -> "}, {}, {},
         "NoDistance"},
    Case{"AT+QX_CCM_PARA=1," + std::string(200, '9'), nullptr, "", "ATOK",
         {"camera " + kFocus + std::string(127 - kFocus.size(), '9') + " -> "}}),
    case_name);

TEST_F(CameraTest, PdafMarkerFollowsTheLastTest) {
    box.sequence("camera:pdaf_test", {"success", "fail#out of range"});
    EXPECT_EQ(serve("AT+MMICCM=B,7", SRC_TCP, 23), "AT+MMICCM=B,7\r\n\r\nATNG\r\n");
    EXPECT_EQ(serve("AT+MMICCM=B,6", SRC_TCP, 21), "AT+MMICCM=B,6\r\n\r\nOK\r\n");
    EXPECT_EQ(serve("AT+MMICCM=BB,7", SRC_TCP, 22), "AT+MMICCM=BB,7\r\n\r\nOK\r\n");
    EXPECT_EQ(serve("AT+MMICCM=BB,6", SRC_TCP, 24), "AT+MMICCM=BB,6\r\n\r\nATNG\r\n");
    EXPECT_EQ(serve("AT+MMICCM=B,7", SRC_TCP, 23), "AT+MMICCM=B,7\r\n\r\nATNG\r\n");
    expect_in_order(box.events(), {"camera pdaf_test -> success", "touch /data/engineermode/pdaf_test",
                                   "camera pdaf_test -> fail#out of range"});
}

TEST_F(CameraTest, EachLightLeakReadingIsJudgedAlone) {
    box.sequence("camera:front_light_leak", {"success#leak#998.9", "success#leak#-1000", "fail#cover open", "success#leak#0"});
    const struct {
        const char *body, *word;
    } answers[] = {{"\r\n\"+Light:998.9\"\r\n", "ATOK"},
                   {"\r\n\"+Light:-1000\"\r\n", "ATNG"},
                   {"", "ATERROR"},
                   {"\r\n\"+Light:0\"\r\n", "ATOK"}};
    for (const auto &a : answers) {
        const std::string frame = std::string("AT+MMICCM=F,11\r\n") + a.body + "\r\n" + a.word + "\r\n";
        EXPECT_EQ(serve("AT+MMICCM=F,11", SRC_TCP, frame.size()), frame);
    }
}

TEST_F(CameraTest, SelfTestResultsChangeBetweenReads) {
    const std::string get = "eng_AT_camera#rear#main#auto_test_get_result#params 0";
    box.sequence("camera:" + get, {"success#r#af 0#ae 0", "success#r#af 1#ae 1"});
    const std::string line = "AT+QX_CCM_SLTS=3,rear,main,0";
    EXPECT_EQ(serve("AT+QX_CCM_SLTS=1,rear,main,0", SRC_TCP, 36), "AT+QX_CCM_SLTS=1,rear,main,0\r\n\r\nATOK\r\n");
    const std::string first = line + "\r\n\r\n\"+af:0\"\r\n\r\n\"+ae:0\"\r\n\r\nATOK\r\n";
    EXPECT_EQ(serve(line, SRC_TCP, first.size()), first);
    const std::string second = line + "\r\n\r\n\"+af:1\"\r\n\r\n\"+ae:1\"\r\n\r\nATOK\r\n";
    EXPECT_EQ(serve(line, SRC_TCP, second.size()), second);
    // The camera service is asked once per line, in the station's order.
    std::vector<Event> camera;
    for (const Event &e : box.event_list())
        if (e.kind == "camera") camera.push_back(e);
    ASSERT_EQ(camera.size(), 3u);
    EXPECT_EQ(camera[0].detail, "eng_AT_camera#rear#main#auto_test_execute#params 0 -> success");
    EXPECT_EQ(camera[2].detail, get + " -> success#r#af 1#ae 1");
    EXPECT_LE(camera[0].ms, camera[1].ms);
    EXPECT_LE(camera[1].ms, camera[2].ms);
}

}  // namespace
