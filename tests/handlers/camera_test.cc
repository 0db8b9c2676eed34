// Camera tests: exact frames, camera and test-app messages in order, marker files, and the
// answers of a gated project, a silent or failing camera service and missing nodes.
#include <filesystem>
#include <functional>
#include <string>
#include <vector>

#include "platform/sim/sim.h"
#include "tests/support/checks.h"
#include "tests/support/in_process.h"
#include "tests/support/test_name.h"

namespace {

const std::string kGate = "above RX6290 or RT6203, not support";
const char *kPdaf = "/data/engineermode/pdaf_test";
const char *kRefocus = "/data/engineermode/refocus_check";
const char *kFrontRefocus = "/data/engineermode/front_refocus_check";
const std::string kFocus = "eng_AT_camera#NULL#NULL#focus_control#distance ";
const std::string kBackStart = "camera start#cameraId back#eng_AT_command true -> success";
const std::string kManyParams = "," + std::string(1800, '7');
const std::string kGetResult = "eng_AT_camera#rear#main#auto_test_get_result#params 0";

std::string nv_pattern() { return nv_fill(0x21, 91); }  // every byte non-zero, so a stray write shows

using Setup = std::function<void(const Sandbox &)>;
Setup config(const std::string &key, const std::string &value) {
    return [=](const Sandbox &b) { sim::write_kv(b.root + "/.sim/config", key, &value); };
}
Setup says(const std::string &message, const std::string &reply) {  // the camera service's reply, ahead of the others
    return [=](const Sandbox &b) {
        b.write("/.sim/camera.replies", message + " => " + reply + "\n" + b.read("/.sim/camera.replies"));
    };
}
Setup put(const char *path, const std::string &text) { return [=](const Sandbox &b) { b.write(path, text); }; }
Setup gone(const char *path) { return [=](const Sandbox &b) { std::filesystem::remove(b.path(path)); }; }
Setup both(Setup a, Setup b) { return [=](const Sandbox &s) { a(s), b(s); }; }
Setup leak(const char *value) { return says("front_light_leak", std::string("success#leak#") + value); }
const Setup gated = config("project_number", "6291"), td_gated = config("project_number", "6204");
const Setup at_gate = config("project_number", "6203");  // not above either
const Setup proximity = config("project", "RT6102_EX");
const Setup mismatch = both(proximity, put("/.sim/sensor", "841=absent\n842=absent\n"));
const Setup all_fail = put("/.sim/camera.replies", "* => fail#busy\n");
const Setup markers = [](const Sandbox &b) {
    for (const char *m : {kPdaf, kRefocus, kFrontRefocus}) b.write(m, "");
};
const Setup otp_fails = [](const Sandbox &b) { b.set_prop("sys.camera.rear_camera_wide_otp_status", "0"); };
Setup pdaf_reply(const std::string &reply) { return says("eng_AT_camera#qx_ccm_pdaf#1#rear", reply); }
std::string touch(const char *marker) { return "touch " + std::string(marker); }
const Setup rgb = [](const Sandbox &b) { b.set_prop("persist.camera.is_rgb", "1"); };
const Setup uart = [](const Sandbox &) { is_uart_flag = 1; };
const std::string kPdafLine = "AT+QX_CCM_PDAF=1,rear", kSelf = "camera eng_AT_camera#rear#main#auto_test_";
Setup fault(const char *name) { return [=](const Sandbox &b) { b.fault(name); }; }

struct Case {
    const char *tag;  // tells apart cases of one line
    std::string line;
    Setup setup;
    std::string body;
    const char *word;
    std::vector<std::string> events = {};  // recorded in this order
    std::vector<std::string> absent = {};  // never recorded
    std::vector<std::pair<const char *, bool>> files = {};
};
void PrintTo(const Case &c, std::ostream *os) { *os << c.line.substr(0, 40) << " " << c.tag; }
const auto by_tag = named_by([](const Case &c) { return c.line.substr(0, 30) + "," + c.tag; });

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
    const std::string want = frame(c.line, c.body, c.word);
    EXPECT_EQ(serve(c.line, SRC_TCP, want.size()), want);
    const std::string log = box.events();
    expect_in_order(log, c.events);
    for (const auto &a : c.absent) EXPECT_EQ(log.find(a), std::string::npos) << a << "\n" << log;
    for (auto [path, present] : c.files) EXPECT_EQ(box.exists(path), present) << path;
    EXPECT_EQ(box.read("/.sim/nv.bin"), nv_pattern());
}

// clang-format off
// Open, capture and stop: each camera's message, the proximity LED closed and opened again on some projects.
INSTANTIATE_TEST_SUITE_P(BasicOps, CameraLine, ::testing::Values(
    Case{"", "AT+MMICCM=B,1", nullptr, "", "OK", {kBackStart}, {"sensor"}},
    Case{"", "AT+MMICCM=bmacro,1", nullptr, "", "OK", {"camera eng_AT_camera#rear#macro#open#NULL#NULL -> "}},
    Case{"ProximityLedClosed", "AT+MMICCM=B,1", proximity, "", "OK", {"sensor test 841 -> 0", kBackStart}, {"842"}},
    Case{"SensorMismatch", "AT+MMICCM=B,1", mismatch, "\"sensor material mismatch\"", "ERROR", {"sensor test 841 -> -1"},
         {"camera"}},
    Case{"CameraFails", "AT+MMICCM=B,1", all_fail, "fail#busy", "ERROR", {"camera start#"}},
    Case{"NotGated", "AT+MMICCM=B,1", gated, "", "OK", {kBackStart}},
    Case{"", "AT+MMICCM=B,2", nullptr, "", "OK", {"camera capture -> success"}},
    Case{"", "AT+MMICCM=BPERI,2", nullptr, "", "OK", {"camera eng_AT_camera#rear#peri#capture#NULL#NULL -> "}},
    Case{"CameraFails", "AT+MMICCM=FS,2", all_fail, "fail#busy", "ATNG", {"camera capture -> fail#busy"}},
    Case{"", "AT+MMICCM=FB,0", nullptr, "", "OK", {"camera stop -> success"}, {"sensor"}},
    Case{"CameraFails", "AT+MMICCM=B,0", all_fail, "fail#busy", "ATNG"},
    Case{"ProximityLedOpened", "AT+MMICCM=B,0", proximity, "", "OK", {"sensor test 842 -> 0", "camera stop"}, {"841"}}),
    by_tag);

// Forms only ungated projects have (above 6290 or TD above 6203): OIS, PDAF and refocus
// markers, long shots, free text.
INSTANTIATE_TEST_SUITE_P(GatedForms, CameraLine, ::testing::Values(
    Case{"", "AT+MMICCM=B,4", nullptr, "", "OK", {"camera ois_control#value on#ois_mode ois-still -> success"}},
    Case{"", "AT+MMICCM=BB,5", nullptr, "", "OK", {"camera ois_control#value off#ois_mode ois-centering-on -> success"}},
    Case{"CameraFails", "AT+MMICCM=B,4", all_fail, "fail#busy", "ATNG"},
    Case{"Gated", "AT+MMICCM=B,4", gated, kGate, "ATERROR", {}, {"camera"}},
    Case{"GatedByTd", "AT+MMICCM=BB,4", td_gated, kGate, "ATERROR", {}, {"camera"}},
    Case{"AtTheGate", "AT+MMICCM=B,4", at_gate, "", "OK", {"camera ois"}},
    Case{"", "AT+MMICCM=B,6", nullptr, "", "OK", {"camera pdaf_test -> success",
         "shell /system/bin/sh -c \"touch /data/engineermode/pdaf_test\""}, {}, {{kPdaf, true}}},
    Case{"UpperCaseSuccess", "AT+MMICCM=BB,6", says("pdaf_test", "SUCCESS"), "", "OK", {}, {}, {{kPdaf, true}}},
    Case{"WholeReplyOnly", "AT+MMICCM=B,6", both(markers, says("pdaf_test", "success#partly")), "", "ATNG", {}, {"touch"},
         {{kPdaf, false}}},
    Case{"", "AT+MMICCM=B,7", markers, "", "OK", {}, {"camera"}},
    Case{"NoMarker", "AT+MMICCM=BB,7", nullptr, "", "ATNG", {}, {"camera"}},
    Case{"", "AT+MMICCM=BTELE,7", nullptr, "", "OK", {"camera eng_AT_camera#rear#tele#pdaf_test#NULL#NULL -> "}},
    Case{"", "AT+MMICCM=BMACRO,7", nullptr, "", "ATERROR", {}, {"camera"}},
    Case{"", "AT+MMICCM=B,8", nullptr, "", "OK", {"camera refocus_check -> success", touch(kRefocus)}, {},
         {{kRefocus, true}, {kFrontRefocus, false}}},
    Case{"", "AT+MMICCM=FB,8", nullptr, "", "OK", {"camera front_refocus_check -> ", touch(kFrontRefocus)}, {},
         {{kFrontRefocus, true}, {kRefocus, false}}},
    Case{"Fails", "AT+MMICCM=F,8", both(markers, all_fail), "", "ERROR", {}, {}, {{kFrontRefocus, false}, {kRefocus, true}}},
    Case{"OnlyRearMarker", "AT+MMICCM=F,9", put(kRefocus, ""), "", "ERROR"},
    Case{"", "AT+MMICCM=BB,10", nullptr, "", "OK", {"camera long_shot#value start# -> success"}},
    Case{"", "AT+MMICCM=BB,10,25", nullptr, "", "OK", {"camera long_shot#value start#number 25 -> "}},
    // The count is cut where the 48-byte message ends.
    Case{"", "AT+MMICCM=BB,10,123456789012345678901234", nullptr, "", "OK",
         {"camera long_shot#value start#number 123456789012345678 -> "}},
    Case{"PrefixOnly", "AT+MMICCM=BB,100", nullptr, "", "OK", {"camera long_shot#value start# -> "}},
    Case{"CameraFails", "AT+MMICCM=BB,10,9", all_fail, "fail#busy", "ERROR"},
    Case{"Gated", "AT+MMICCM=BB,10", gated, kGate, "ATERROR", {}, {"camera"}},
    Case{"", "AT+MMICCM=BB,11", nullptr, "", "OK", {"camera long_shot#value stop# -> success"}},
    Case{"", "AT+MMICCM=B,test,af_check#on", nullptr, "", "ATOK", {"camera af_check#on -> success"}},
    Case{"", "AT+MMICCM=FS,para,iso 100,extra", nullptr, "", "ATOK", {"camera iso 100 -> success"}},
    Case{"", "AT+MMICCM=BB,test", nullptr, "\r\n\"invalid parameter\"\r\n", "ATERROR", {}, {"camera"}},
    Case{"", "AT+MMICCM=B,test," + std::string(250, 'm'), nullptr, "", "ATOK",
         {"camera " + std::string(199, 'm') + " -> success"}},
    Case{"Gated", "AT+MMICCM=BS,test,x", gated, kGate, "ATERROR", {}, {"camera"}}), by_tag);

// The front light leak judged against -999..1000, lines no form takes, and the camera's self-test.
INSTANTIATE_TEST_SUITE_P(LightLeakAndSelfTest, CameraLine, ::testing::Values(
    Case{"", "AT+MMICCM=F,11", nullptr, "\r\n\"+Light:12.5\"\r\n", "ATOK", {"camera front_light_leak -> "}},
    Case{"AboveLimit", "AT+MMICCM=F,11", leak("1000.5"), "\r\n\"+Light:1000.5\"\r\n", "ATNG"},
    Case{"AtLowerLimit", "AT+MMICCM=F,11", leak("-999"), "\r\n\"+Light:-999\"\r\n", "ATOK"},
    Case{"BelowLimit", "AT+MMICCM=F,11", leak("-999.01"), "\r\n\"+Light:-999.01\"\r\n", "ATNG"},
    Case{"NotANumber", "AT+MMICCM=F,11", leak("dark"), "\r\n\"+Light:dark\"\r\n", "ATNG"},
    Case{"NoValue", "AT+MMICCM=F,11", says("front_light_leak", "success"), "\r\n\"+Light:\"\r\n", "ATNG"},
    Case{"CameraFails", "AT+MMICCM=F,11", all_fail, "", "ATERROR", {"camera front_light_leak -> fail#busy"}},
    Case{"", "AT+MMICCM=f,11", nullptr, "", "ERROR", {}, {"camera"}},
    Case{"", "AT+MMICCM=B,1,1", nullptr, "", "ERROR", {}, {"camera"}},
    // The self-test's execute, set and result forms.
    Case{"", "AT+QX_CCM_SLTS=1,rear,main,1,2", nullptr, "", "ATOK", {kSelf + "execute#params 1,2 -> success"}},
    Case{"", "AT+QX_CCM_SLTS=2,front,wide,7", nullptr, "", "ATOK",
         {"camera eng_AT_camera#front#wide#auto_test_set_param#params 7 -> "}},
    Case{"", "AT+QX_CCM_SLTS=1 rear#main,,3 4", nullptr, "", "ATOK", {kSelf + "execute#params 3,4 -> "}},
    Case{"", "AT+QX_CCM_SLTS=3,rear,main,0", nullptr, "\r\n\"+af:1\"\r\n\r\n\"+ae:0\"\r\n", "ATOK",
         {kSelf + "get_result#params 0 -> success#auto_test_get_result#af 1#ae 0"}},
    Case{"NoResults", "AT+QX_CCM_SLTS=3,rear,main,0", says(kGetResult, "success#x"), "", "ATOK"},
    Case{"KeyWithoutValue", "AT+QX_CCM_SLTS=3,rear,main,0", says(kGetResult, "success#x#flag#k v w"),
         "\r\n\"+flag:\"\r\n\r\n\"+k:v w\"\r\n", "ATOK"},
    Case{"CameraFails", "AT+QX_CCM_SLTS=3,rear,main,0", all_fail, "fail#busy", "ERROR"},
    // The message is cut where its 1024-byte buffer ends.
    Case{"", "AT+QX_CCM_SLTS=2,rear,main,0" + kManyParams, nullptr, "", "ATOK",
         {kSelf + "set_param#params 0" + kManyParams.substr(0, 1023 - 52) + " -> "}},
    Case{"", "AT+QX_CCM_SLTS=1,rear,main", nullptr, "", "ERROR", {}, {"camera"}},
    Case{"", "AT+QX_CCM_SLTS=4,rear,main,1", nullptr, "", "ERROR", {}, {"camera"}}), by_tag);

// The test mode, the screen fill light and the connection checks.
INSTANTIATE_TEST_SUITE_P(ModeLightAndConnection, CameraLine, ::testing::Values(
    Case{"", "AT+QX_CCM_CVT=1", nullptr, "", "OK", {}, {"camera"}},
    Case{"", "AT+QX_CCM_CVT=2", nullptr, "", "ERROR"},
    Case{"Gated", "AT+QX_CCM_CVT=1", gated, kGate, "ATERROR"},
    Case{"", "AT+LCML=0,0", nullptr, "", "OK",
         {"camera screen_front_flash#value reset -> success", "camera stop -> success"}},
    Case{"ResetFails", "AT+LCML=0,0", all_fail, "fail#busy", "ERROR", {"camera screen_front_flash#value reset -> fail"},
         {"camera stop"}},
    Case{"StopFails", "AT+LCML=0,0", says("stop", "fail#not open"), "fail#not open", "ERROR",
         {"camera screen_front_flash#value reset -> success", "camera stop -> fail#not open"}},
    Case{"Gated", "AT+LCML=0,0", gated, kGate, "ATERROR", {}, {"camera"}},
    Case{"", "AT+LCML=0,1", nullptr, "", "OK", {"camera start#eng_screen_front_flash true -> success"}},
    Case{"", "AT+LCML=1", nullptr, "", "OK", {"camera screen_front_flash#value on -> success"}},
    Case{"NotGated", "AT+LCML=2", gated, "", "OK", {"camera screen_front_flash#value capture -> success"}},
    Case{"CameraDown", "AT+LCML=2", fault("camera"), "fail#camera service not available", "ERROR"},
    Case{"", "AT+LCML=3", nullptr, "", "ERROR", {}, {"camera"}},
    // Whether the cameras are connected: the test app's count and the camera tool's flags.
    Case{"", "AT+QXCCM=1", [](const Sandbox &b) { b.reply("CameraConnect", "3"); }, "", "OK",
         {"message CameraConnect -> 3"}},
    Case{"NotConnected", "AT+QXCCM=1", nullptr, "", "ERROR", {"message CameraConnect -> ok"}},
    Case{"TestAppSilent", "AT+QXCCM=1", fault("testapp-silent"), "", "ERROR"},
    Case{"Gated", "AT+QXCCM=1", gated, kGate, "ATERROR", {}, {"message"}},
    Case{"ToolSilent", "AT+QX_CCM_CONN=1", nullptr, "\"0,0,0,0\"", "ATOK", {"shell ftcmd_camera"}},
    Case{"", "AT+QX_CCM_CONN=1", put("/.sim/shell.replies", "ftcmd_camera => 2,1,0,1\n"), "\"2,1,0,1\"", "ATOK"},
    Case{"NotConnected", "AT+QX_CCM_CONN=1", put("/.sim/shell.replies", "ftcmd_camera => 3,1,1,1\n"), "\"3,1,1,1\"", "ATNG"},
    Case{"Gated", "AT+QX_CCM_CONN=1", gated, kGate, "ATERROR", {}, {"shell"}},
    Case{"", "AT+QX_CCM_CONN=0", nullptr, "", "ERROR", {}, {"shell"}}), by_tag);

// Sensor names, serial numbers, the infrared module, the colour type and the OTP status.
INSTANTIATE_TEST_SUITE_P(Identity, CameraLine, ::testing::Values(
    Case{"", "AT+QXCCMID=0", nullptr, "\r\n\"front:s5k3p9sp\n\r\nback:imx586\n\"\r\n ", "OK"},
    Case{"OneLineOnly", "AT+QXCCMID=0", put("/sys/ccm/FrontSensorId", "ov16a1q\nsecond line\n"),
         "\r\n\"front:ov16a1q\n\r\nback:imx586\n\"\r\n ", "OK"},
    Case{"FrontNodeMissing", "AT+QXCCMID=0", gone("/sys/ccm/FrontSensorId"), "", "ERROR"},
    Case{"Gated", "AT+QXCCMID=0", gated, kGate, "ATERROR"},
    Case{"", "AT+QXCCMID=1", nullptr, "", "ERROR"},
    Case{"", "AT+QX_CCM_SN=1,r,macro", nullptr, "\r\n\"RC5012D0019\"\r\n", "ATOK"},
    Case{"", "AT+QX_CCM_SN=1,R,PORT", config("camera_sn.rear_camera_port", "RP77"), "\r\n\"RP77\"\r\n", "ATOK"},
    Case{"NotFitted", "AT+QX_CCM_SN=1,R,TELE", nullptr, "\r\n\"\"\r\n", "ATOK"},
    Case{"", "AT+QX_CCM_SN=1,R,FOO", nullptr, "", "ATERROR"},
    Case{"", "AT+QX_CCM_SN=0,3,extra", nullptr, "\r\n\"RM5012B0457\"\r\n", "ATOK"},
    Case{"", "AT+QX_CCM_IRID=0", nullptr, "\r\n\"1\"\r\n", "ATOK"},
    Case{"Module2", "AT+QX_CCM_IRID=0", put("/persist/camera/ir_id_sub", "2"), "\r\n\"2\"\r\n", "ATOK"},
    Case{"UnknownModule", "AT+QX_CCM_IRID=0", put("/persist/camera/ir_id_sub", "1\n"), "\r\n\"1\n\"\r\n", "ATNG"},
    Case{"FileMissing", "AT+QX_CCM_IRID=0", gone("/persist/camera/ir_id_sub"), "/persist/camera/ir_id_sub : not exist ",
         "ATNG"},
    Case{"Gated", "AT+QX_CCM_IRID=0", gated, kGate, "ATERROR"},
    Case{"", "AT+QX_CCM_IRID=1", nullptr, "", "ERROR"},
    Case{"", "AT+QX_CCM_COLOR=BB,1", rgb, "\r\n\"2\"\r\n", "ATOK"},
    Case{"Rgb", "AT+QX_CCM_COLOR=BS,1", rgb, "\r\n\"1\"\r\n", "ATOK"},
    Case{"Mono", "AT+QX_CCM_COLOR=BS,1", nullptr, "\r\n\"2\"\r\n", "ATOK"},
    Case{"Gated", "AT+QX_CCM_COLOR=FS,1", gated, kGate, "ATERROR"},
    Case{"", "AT+QX_CCM_COLOR=BS,2", gated, "", "ATERROR"},

    // The newer interface: OTP status from properties, commands translated for the service.
    Case{"", "AT+QX_CCM_OTP=1", nullptr,
         "front_camera_main:pass\r\nrear_camera_main:pass\r\nrear_camera_wide:pass\r\nrear_camera_wide:pass\r\n", "ATOK"},
    // The macro camera is checked with the wide camera's property, so both fail.
    Case{"WideFails", "AT+QX_CCM_OTP=1", otp_fails,
         "front_camera_main:pass\r\nrear_camera_main:pass\r\nrear_camera_wide:fail\r\nrear_camera_wide:fail\r\n", "ATNG"},
    Case{"OtherCameras", "AT+QX_CCM_OTP=1", config("cameras", "front:RTBOnly,rear:Macro,front:Wide"),
         "front_camera_rtb:pass\r\nfront_camera_wide:pass\r\nrear_camera_wide:pass\r\n", "ATOK"},
    Case{"OldScheme", "AT+QX_CCM_OTP=1", config("camera_new_interface", "0"), "", "ATNG"},
    Case{"", "AT+QX_CCM_OTP=2", nullptr, "", "ATERROR", {}, {"camera"}},
    Case{"", "AT+QX_CCM_OTP=2,rear", nullptr, "", "ATOK", {"camera eng_AT_camera#qx_ccm_otp#2#rear -> success"},
         {"calibrate"}},
    Case{"", kPdafLine, nullptr, "", "ATOK",
         {"camera eng_AT_camera#qx_ccm_pdaf#1#rear -> success", "calibrate pdaf_calibration=1 uart=0"}},
    Case{"Values", kPdafLine, pdaf_reply("success#pdaf#shift 0.8#conf 97"),
         "\r\n\"+shift:0.8\"\r\n\r\n\"+conf:97\"\r\n", "ATOK", {"calibrate pdaf_calibration=1"}},
    Case{"CameraFails", kPdafLine, pdaf_reply("fail#no target"), "\"fail#no target\"", "ATNG", {}, {"calibrate"}},
    Case{"UartConsole", kPdafLine, uart, "", "ATOK", {"calibrate pdaf_calibration=1 uart=1"}},
    Case{"ItemNotSaved", kPdafLine, fault("calibrate-item"), "save_ret=-5", "ATNG",
         {"calibrate pdaf_calibration=1 uart=0 (failed)"}},
    Case{"ShortItemName", kPdafLine, config("camera_item.AT+QX_CCM_PDAF", "ab"), "", "ATOK", {}, {"calibrate"}},
    Case{"Untranslatable", kPdafLine, fault("camera-transform"), "", "ATERROR", {}, {"camera"}},
    Case{"", "AT+QX_CCM_SINGLE=3,front,main", nullptr, "", "ATOK",
         {"camera eng_AT_camera#qx_ccm_single#3#front#main -> success"}, {"calibrate"}},
    Case{"", "AT+QX_CCM_PARA=2,5", nullptr, "", "ATOK", {"camera eng_AT_camera#qx_ccm_para#2#5 -> "}},
    Case{"", "AT+QX_CCM_PARA=1,120", nullptr, "", "ATOK", {"camera " + kFocus + "120 -> success"}},
    Case{"CameraFails", "AT+QX_CCM_PARA=1,120", all_fail, "", "ATOK", {"camera " + kFocus + "120 -> fail"}},
    Case{"NoDistance", "AT+QX_CCM_PARA=1,", nullptr, "", "ATOK", {"camera " + kFocus + " -> "}},
    Case{"", "AT+QX_CCM_PARA=1," + std::string(200, '9'), nullptr, "", "ATOK",
         {"camera " + kFocus + std::string(127 - kFocus.size(), '9') + " -> "}}),
    by_tag);
// clang-format on

}  // namespace
