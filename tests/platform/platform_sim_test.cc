// The simulated phone: the scripts a station engineer edits must steer the platform
// calls as documented, and no call may reach the host outside the sandbox.
#include <fcntl.h>
#include <gtest/gtest.h>

#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <ostream>
#include <regex>
#include <string>

#include "platform/android.h"
#include "platform/audio.h"
#include "platform/device.h"
#include "platform/factory.h"
#include "platform/modem.h"
#include "platform/sensor.h"
#include "tests/support/sandbox.h"

namespace {

class SimTest : public ::testing::Test {
protected:
    void SetUp() override { box.activate(); }
    bool recorded(const std::string &line) const { return box.events().find(line + "\n") != std::string::npos; }
    Sandbox box;
};

struct ReplyCase {
    const char *script, *fault, *message;
    const char *reply;  // nullptr: no answer
};
void PrintTo(const ReplyCase &c, std::ostream *os) { *os << c.message << " / " << c.fault; }

class TestAppScript : public SimTest, public ::testing::WithParamInterface<ReplyCase> {};

// Exact lines, then the longest "prefix *" pattern; "(silent)" and the faults give no or a refusing answer.
TEST_P(TestAppScript, Answers) {
    const ReplyCase &c = GetParam();
    box.write("/.sim/testapp.replies", c.script);
    if (*c.fault) box.fault(c.fault);
    const char *got = sendMessage(c.message);
    EXPECT_EQ(std::string(got ? got : "(none)"), c.reply ? c.reply : "(none)");
    EXPECT_TRUE(recorded(std::string("message ") + c.message + " -> " + (c.reply ? c.reply : "(silent)")));
}

INSTANTIATE_TEST_SUITE_P(
    Scripts, TestAppScript,
    ::testing::Values(ReplyCase{"go_to_sleep => ok\n", "", "go_to_sleep", "ok"},
                      ReplyCase{"go_to_sleep => ok\n", "", "go_to_sleep now", nullptr},
                      ReplyCase{"shutdown * => yes\nshutdown delay => later\n", "", "shutdown delay", "later"},
                      ReplyCase{"* => any\nshutdown * => some\n", "", "shutdown immediately", "some"},
                      ReplyCase{"sim_state => (silent)\n* => ok\n", "", "sim_state", nullptr},
                      ReplyCase{"* => ok\n", "testapp-silent", "emerg_call", nullptr},
                      ReplyCase{"* => ok\n", "testapp-refuse", "emerg_call", "error"}));

TEST_F(SimTest, PropertyStoreKeepsValuesWithinAndProtectsLimits) {
    char value[PROPERTY_VALUE_MAX];
    property_get("sys.ftcmd.none", value, "dflt");
    EXPECT_STREQ(value, "dflt");
    std::string longest(PROPERTY_VALUE_MAX - 1, 'v');
    ASSERT_EQ(property_set("sys.ftcmd.a", longest.c_str()), 0);
    kaelatcmd_get_system_property("sys.ftcmd.a", value, "");
    EXPECT_EQ(std::string(value), longest);
    EXPECT_NE(property_set("sys.ftcmd.a", (longest + "v").c_str()), 0);  // too long: refused, old value kept
    EXPECT_EQ(box.prop("sys.ftcmd.a"), longest);
    box.set_prop("sys.ftcmd.b", std::string(120, 'x'));  // written by hand: cut to the reader's buffer
    property_get("sys.ftcmd.b", value, "");
    EXPECT_EQ(strlen(value), static_cast<size_t>(PROPERTY_VALUE_MAX - 1));
    box.fault("property-set");
    EXPECT_NE(property_set("sys.ftcmd.c", "1"), 0);
}

// Missing reads as zeros; a write keeps bytes past the record; a failed call leaves it alone.
TEST_F(SimTest, NvRecordRoundTripsAndFaultsLeaveItAlone) {
    unsigned char rec[PYXA_NV_SIZE];
    memset(rec, 0x55, sizeof rec);
    ASSERT_EQ(get_PYXA_NV_item(rec), 0);
    EXPECT_EQ(rec[100], 0);
    box.write("/.sim/nv.bin", std::string(PYXA_NV_SIZE, '\0') + "TAIL");
    memset(rec, 0xAA, sizeof rec);
    ASSERT_EQ(get_PYXA_NV_item(rec), 0);
    EXPECT_EQ(rec[0] | rec[PYXA_NV_SIZE - 1], 0);
    int32_t flag = 1;
    memcpy(rec + 688, &flag, sizeof flag);
    ASSERT_EQ(put_PYXA_NV_item(rec), 0);
    std::string file = box.read("/.sim/nv.bin");
    EXPECT_EQ(file.substr(PYXA_NV_SIZE), "TAIL");
    EXPECT_EQ(file[688], 1);

    box.fault("nv-read");
    box.fault("nv-write");
    memset(rec, 0x55, sizeof rec);
    EXPECT_NE(get_PYXA_NV_item(rec), 0);
    EXPECT_EQ(rec[100], 0x55);
    EXPECT_NE(put_PYXA_NV_item(rec), 0);
    EXPECT_EQ(box.read("/.sim/nv.bin"), file);
}

// Redirections land in the sandbox: a node holds one value, a file grows; rm -r and ".." stay inside.
TEST_F(SimTest, ShellActsOnlyInsideTheSandbox) {
    EXPECT_EQ(dev::shell("/system/bin/sh -c \"date > /data/vendor/engineermode/systemtime\""), 0);
    EXPECT_TRUE(std::regex_match(box.read("/data/vendor/engineermode/systemtime"),
                                 std::regex("[A-Z][a-z]{2} [A-Z][a-z]{2} [ 0-9][0-9] [0-9]{2}:[0-9]{2}:[0-9]{2} .* [0-9]{4}\n")));
    const std::string node = "/sys/class/power_supply/cms/factory_mode_state", file = "/data/vendor/engineermode/log.txt";
    for (const char *cmd : {"echo 1 > ", "echo more >> "}) EXPECT_EQ(dev::shell((cmd + node).c_str()), 0);
    EXPECT_EQ(box.read(node), "more\n");
    for (const char *cmd : {"echo more >> ", "echo again >> "}) EXPECT_EQ(dev::shell((cmd + file).c_str()), 0);
    EXPECT_EQ(box.read(file), "more\nagain\n");

    box.write("/storage/sdcard0/ram_dump/dump.bin", "x");
    EXPECT_EQ(dev::shell("/system/bin/sh -c \"rm -r /storage/sdcard0/ram_dump\""), 0);
    EXPECT_TRUE(box.exists("/storage/sdcard0/ram_dump/dump.bin"));  // recorded only
    EXPECT_TRUE(recorded("shell /system/bin/sh -c \"rm -r /storage/sdcard0/ram_dump\""));
    box.write("/tmp/.keep", "");
    std::string escape = "ftcmd-escape-" + std::to_string(getpid());
    dev::shell(("echo x > ../../../../../../tmp/" + escape).c_str());
    EXPECT_NE(::access(("/tmp/" + escape).c_str(), F_OK), 0);
    EXPECT_TRUE(box.exists("/tmp/" + escape));
}

TEST_F(SimTest, ServicesRunUntilStoppedOrToldToStop) {
    const char *dpdt = "com.pyxa.engineermode.DpdtService";
    startServiceFromFtcmd("com.pyxa.engineermode/.DpdtService", nullptr, nullptr);
    EXPECT_EQ(isServiceWork(dpdt), 1);
    stopServiceFromFtcmd("com.pyxa.engineermode/.DpdtService", nullptr, nullptr);
    EXPECT_EQ(isServiceWork(dpdt), 0);
    const char *fast = "com.android.phone.fastSearchNet.FastSearchNetService";
    startServiceFromFtcmd("com.android.phone/.fastSearchNet.FastSearchNetService", nullptr, nullptr);
    sendBroadcastFromFtcmd(nullptr, fast, "--es status 1");
    EXPECT_EQ(isServiceWork(fast), 1);
    sendBroadcastFromFtcmd(nullptr, fast, "--es status 0");
    EXPECT_EQ(isServiceWork(fast), 0);
}

TEST_F(SimTest, PolicyWriteCreatesOnlyWhenAsked) {
    EXPECT_LT(write_policy_file(0, "/persist/new.bin", O_RDWR, "a"), 0);
    EXPECT_FALSE(box.exists("/persist/new.bin"));
    EXPECT_EQ(write_policy_file(1, "/persist/new.bin", O_RDWR | O_CREAT, "Intf0MacAddress=00A0C6112233\n"), 0);
    EXPECT_EQ(box.read("/persist/new.bin"), "Intf0MacAddress=00A0C6112233\n");
    EXPECT_EQ(dev::chown("/persist/new.bin", 1000, 1000), 0);
    EXPECT_TRUE(recorded("chown /persist/new.bin 1000:1000"));
    EXPECT_NE(dev::chown("/persist/missing.bin", 1000, 1000), 0);
}

struct ExtCase {
    const char *command;
    int size;
    const char *preset, *output;  // the buffer before and after
    const char *where = nullptr;  // a file, or else a property, that the command sets
    std::string effect = "";
};
void PrintTo(const ExtCase &c, std::ostream *os) { *os << c.command; }

class ExtSystem : public SimTest, public ::testing::WithParamInterface<ExtCase> {};

// Scripted, emulated and unknown commands; silence keeps the preset, output is cut to the size;
// the Bluetooth tools act on the sandbox.
TEST_P(ExtSystem, CapturesOutput) {
    const ExtCase &c = GetParam();
    box.write("/sdcard/a.txt", std::string(3000, 'a'));
    box.write("/.sim/shell.replies", "ftcmd_camera => 2,1,1,0\n*bdt txcontinuous * => line1\\nline2\n");
    char buf[64];
    snprintf(buf, sizeof buf, "%s", c.preset);
    ext_system(c.command, buf, c.size);
    EXPECT_STREQ(buf, c.output);
    EXPECT_EQ(!c.where ? "" : *c.where == '/' ? box.read(c.where) : box.prop(c.where), c.effect);
}

INSTANTIATE_TEST_SUITE_P(
    Commands, ExtSystem,
    ::testing::Values(ExtCase{"ftcmd_camera", 50, "0,0,0,0", "2,1,1,0"}, ExtCase{"/system/bin/unknown", 50, "0,0,0,0", "0,0,0,0"},
                      ExtCase{"/system/bin/bdt txcontinuous 3 2>&1", 64, "", "line1\nline2"},
                      ExtCase{"cat /sys/kernel/debug/stm32l011/in_version", 64, "", "7\n"},
                      ExtCase{"du -sk /sdcard/", 64, "", "3\t/sdcard/\n"}, ExtCase{"ps|grep stressapptest", 64, "keep", "keep"},
                      ExtCase{"cat /persist/wlan_mac.bin | grep Intf1", 64, "", "Intf1MacAddress=02A0C6112233\n"},
                      ExtCase{"echo 0123456789abcdefXYZ", 16, "", "0123456789abcde"},
                      ExtCase{"btnvtool -b F6.E5.D4.C3.B2.A1", 64, "", "", "/mnt/vendor/persist/bluetooth/.bt_nv.bin",
                              std::string("\x01\x00\x06\xF6\xE5\xD4\xC3\xB2\xA1", 9)},
                      ExtCase{"/system/bin/bdt entrydut 2>&1", 64, "", "", "bluetooth.bdt.kaeldut", "true"},
                      ExtCase{"/system/bin/sh -c \"/system/bin/bdt exitdut\"", 64, "", "", "bluetooth.bdt.kaeldut",
                              "false"}));

// "verdict,v0,v1,v2,v3" of a sensor test whose record was preset with a stray value.
std::string sensor(int id) {
    SensorTestResult r{};
    r.value[1] = 99;
    if (kael_sensor_factory_test(id, &r, 0, 0) != 0) return "failed";
    std::string s = std::to_string(r.success);
    for (int i = 0; i < 4; ++i) s += "," + std::to_string(static_cast<int>(r.value[i] * 10));
    return s;
}
std::string em(int id) {
    char reply[ZDR_EM_REPLY_SIZE] = {0};
    return qmi_zdr_set_em_status(id, reply) != 0 ? "failed" : reply;
}
std::string modem_nv(uint32_t id) {
    uint32_t req[8] = {id};
    int32_t value[6] = {0};
    return qmi_zdr_read_nv_msg(req, value, 23) != 0 ? "failed" : std::to_string(value[0]);
}
std::string gps(int option) {
    char reply[ZDR_GPS_REPLY_SIZE] = {0};
    zdr_gps_option_req g{option};
    return qmi_zdr_gps_option_msg(&g, reply) != 0 ? "failed" : reply;
}

// Camera, sensor, modem and audio libraries answer from their scripts (the longest
// pattern first, defaults for what is not listed) and fail with their fault set.
TEST_F(SimTest, LibrariesAnswerFromTheirScriptsAndFailOnFaults) {
    box.write("/.sim/camera.replies",
              "eng_AT_camera#*#auto_test_get_result#* => success#r#af 1\neng_AT_camera#* => fail#generic\ncapture => success\n");
    box.write("/.sim/sensor", "48=1,12.5,-7,25\n49=0,1,2,3\n51=absent\n");
    box.write("/.sim/modem", "em.118=6\nnv.26693=3\ngps.2=+QXGPS: 12\n");
    box.write("/.sim/audio", "exitSendTest=5\nftm.22=7\n");
    EXPECT_STREQ(sendMessageToCamera("capture"), "success");
    EXPECT_STREQ(sendMessageToCamera("eng_AT_camera#rear#main#auto_test_get_result#params 0"), "success#r#af 1");
    EXPECT_STREQ(sendMessageToCamera("eng_AT_camera#rear#tele#open#NULL#NULL"), "fail#generic");
    EXPECT_STREQ(sendMessageToCamera("stop"), "fail#no reply scripted");
    EXPECT_EQ(sensor(48), "1,125,-70,250,0");
    EXPECT_EQ(sensor(49), "0,10,20,30,0");
    EXPECT_EQ(sensor(51), "failed");
    EXPECT_EQ(sensor(519), "1,0,0,0,0");  // unlisted: passes with zeros
    EXPECT_EQ(em(118) + em(110), "60");
    EXPECT_EQ(modem_nv(26693) + modem_nv(30001), "3failed");  // 30001 never written
    uint32_t req[8] = {30001, 2};
    ASSERT_EQ(qmi_zdr_write_nv_msg(req, 4), 0);
    EXPECT_EQ(modem_nv(30001), "2");
    EXPECT_EQ(gps(2), "+QXGPS: 12");
    EXPECT_EQ(startSendTest(80), 0);
    EXPECT_EQ(exitSendTest(), 5);
    EXPECT_EQ(audio_ftm_process(22, 1, 1), 7);
    EXPECT_TRUE(recorded("audio startSendTest(80) -> 0"));
    EXPECT_NE(audio_ftm_process_full(21, 1, 1, "/sdcard/music/missing.wav"), 0);
    box.write("/sdcard/music/tone.wav", "RIFF");
    EXPECT_EQ(audio_ftm_process_full(21, 1, 1, "/sdcard/music/tone.wav"), 0);
    EXPECT_FALSE(box.exists("/data/media/0/engineermode/main-record.wav"));
    EXPECT_EQ(audio_ftm_process(51, 1, 100), 0);  // /sdcard is the emulated storage
    EXPECT_EQ(box.read("/data/media/0/engineermode/main-record.wav").substr(0, 4), "RIFF");

    for (const char *f : {"camera", "sensor", "modem", "audio"}) box.fault(f);
    EXPECT_EQ(std::string(sendMessageToCamera("capture")).find("success"), std::string::npos);
    EXPECT_TRUE(recorded("camera capture -> success"));
    EXPECT_EQ(sensor(48) + em(118) + gps(2), "failedfailedfailed");
    EXPECT_NE(startMainEchoTest(), 0);
}

TEST_F(SimTest, TextHelpersAndTouchPanelVerdict) {
    EXPECT_TRUE(isDigitValue("0123"));
    EXPECT_FALSE(isDigitValue("") || isDigitValue("12a") || isDigitValue("-1"));
    char cplc[] = " \"9F7F2A\" ";
    EXPECT_STREQ(substring(cplc), "9F7F2A");
    EXPECT_TRUE(is_hex_string(cplc));
    EXPECT_FALSE(is_hex_string("9F7G"));
    char path[] = "/SDCARD/Tone.WAV";
    uppercase_to_lowcase(path, 7);
    EXPECT_STREQ(path, "/sdcard/Tone.WAV");
    char *s = get_substring("0x000003", 6, 5);
    EXPECT_STREQ(s, "03");
    free(s);
    EXPECT_EQ(get_substring("abc", 4, 1), nullptr);

    EXPECT_EQ(touchpanel_sensor_test(3, "166"), 0);
    EXPECT_EQ(box.read("/data/engineermode/tp_at_sensor_test"), "Pass\n");
    box.fault("touchpanel");
    EXPECT_NE(touchpanel_sensor_test(1, "167"), 0);
    EXPECT_EQ(box.read("/data/engineermode/tp_at_sensor_cali_back"), "Fail\n");
}

}  // namespace
