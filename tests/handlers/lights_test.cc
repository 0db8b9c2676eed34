// Vibrator and indicator lights: exact frames, what the LED and vibrator nodes were
// written, the panels' brightness, and the timing of the vibration and blink workers.
#include <chrono>
#include <cstring>
#include <filesystem>
#include <thread>

#include "handlers/lights.h"
#include "platform/factory.h"
#include "platform/sim/sim.h"
#include "tests/support/in_process.h"
#include "tests/support/test_name.h"

namespace {

constexpr char kPanel0[] = "/sys/class/backlight/panel0-backlight/brightness";  // max 2047
constexpr char kPanel1[] = "/sys/class/backlight/panel1-backlight/brightness";  // max 1023
constexpr char kButton[] = "/sys/class/leds/button-backlight/brightness";
constexpr char kEffect[] = "/sys/class/leds/aw22xxx_led/effect";
constexpr char kCfg[] = "/sys/class/leds/aw22xxx_led/cfg";
constexpr char kInfo[] = "/cache/recovery/last_test_info";
const std::string kLcm = "activity com.pyxa.engineermode/.ATLcmTest android.factorytest.ATLCM ";

std::string nv_record(int32_t assembly_at_mode) {
    std::string rec(PYXA_NV_SIZE, '\0');
    for (size_t i = 0; i < rec.size(); ++i) rec[i] = static_cast<char>(0x11 + i % 199);
    memcpy(rec.data() + 488, &assembly_at_mode, 4);
    return rec;
}

struct Case {
    std::string name, line;
    int sp = 0;
    bool back = false;            // the phone has a back panel
    void (*setup)(const Sandbox &) = nullptr;
    std::string body, word;
    std::string events;           // the whole record of device effects
    std::vector<std::pair<const char *, const char *>> nodes = {};
    int assembly_after = 7;       // the NV field after the line (7: record untouched)
};

class LightsTest : public InProcess {
protected:
    int saved_sp = 0;
    void SetUp() override {
        InProcess::SetUp();
        saved_sp = is_sp;
        box.write("/.sim/nv.bin", nv_record(7));
    }
    void TearDown() override {
        g_vibrator_run = 0;
        g_lights_run = 0;
        is_sp = saved_sp;
        InProcess::TearDown();
    }
    void two_panels() const {
        std::string items = "\"double_lcm_support\"";
        sim::write_kv(box.path("/.sim/config"), "calibrate_items", &items);
    }
    // The "led" events (name and value) once count of them have been recorded, bounded.
    std::vector<Event> leds(size_t count, int ms = 3000) const {
        std::vector<Event> out;
        for (int waited = 0; waited <= ms; waited += 20) {
            out.clear();
            for (const Event &e : box.event_list())
                if (e.kind == "led") out.push_back(e);
            if (out.size() >= count) break;
            std::this_thread::sleep_for(std::chrono::milliseconds(20));
        }
        return out;
    }
};
class LightsLine : public LightsTest, public ::testing::WithParamInterface<Case> {};

TEST_P(LightsLine, Answers) {
    const Case &c = GetParam();
    is_sp = c.sp;
    if (c.back) two_panels();
    if (c.assembly_after != 7) box.write("/.sim/nv.bin", nv_record(1));
    if (c.setup) c.setup(box);
    const std::string frame = c.line + "\r\n" + c.body + "\r\n" + c.word + "\r\n";
    EXPECT_EQ(serve(c.line, SRC_TCP, frame.size()), frame);
    EXPECT_EQ(box.events(), c.events);
    for (auto [path, value] : c.nodes) EXPECT_EQ(box.read(path), value) << path;
    const std::string nv = box.read("/.sim/nv.bin");
    if (c.assembly_after == 7) {
        EXPECT_EQ(nv, nv_record(7));
    } else {
        EXPECT_EQ(nv, nv_record(c.assembly_after));
    }
}

void no_button(const Sandbox &b) { std::filesystem::remove(b.path(kButton)); }
void no_red(const Sandbox &b) { std::filesystem::remove(b.path("/sys/class/leds/red/brightness")); }
void no_blue(const Sandbox &b) { std::filesystem::remove(b.path("/sys/class/leds/blue/brightness")); }
void engineering(const Sandbox &b) {
    std::string project = "WQ2207_EX";
    sim::write_kv(b.path("/.sim/config"), "project", &project);
    b.write("/sys/class/leds/green/engineering", "0\n");
}
void ring_drivers(const Sandbox &b, bool a, bool bdrv) {
    std::filesystem::remove(b.path("/sys/class/leds/aw22xxx_led/effect"));
    if (a) b.write("/sys/class/leds/aw22xxx_led_a/effect", "0\n");
    if (bdrv) b.write("/sys/class/leds/aw22xxx_led_b/effect", "0\n");
}
void nv_write(const Sandbox &b) { b.fault("nv-write"); }
void nv_read(const Sandbox &b) { b.fault("nv-read"); }
void app_refuses(const Sandbox &b) { b.fault("testapp-refuse"); }

const std::string kKeepBack = "wakelock acquire 1 ftcmd\nmessage keep_screen_on 1,display_id:4096 -> ok\n";

INSTANTIATE_TEST_SUITE_P(Lights, LightsLine, ::testing::Values(
    Case{"VibratorOff", "AT+EDFT=6,0", 0, false, nullptr, "", "OK", "led vibrator/activate 0\n"},
    Case{"ButtonOn", "AT+EDFT=5,1", 0, false, nullptr, "", "OK", "", {{kButton, "255"}}},
    Case{"ButtonOff", "AT+EDFT=5,0", 0, false, nullptr, "", "OK", "", {{kButton, "0"}}},
    Case{"ButtonMissing", "AT+EDFT=5,1", 0, false, no_button, "", "ERROR", ""},
    Case{"PanelWhite", "AT+EDFT=0,5", 0, false, nullptr, "", "OK", kLcm + "-e lcm_color W\n", {{kPanel0, "2047"}}},
    Case{"PanelWhiteAtMode", "AT+EDFT=0,5", 1, false, nullptr, "", "OK", "fb blank 1\n", {{kPanel0, "2047"}}},
    Case{"PanelLevelWritesMax", "AT+EDFT=0,5,3", 0, false, nullptr, "", "OK", "fb blank 1\n", {{kPanel0, "2047"}}},
    Case{"PanelLevelAtMax", "AT+EDFT=0,5,2047", 0, false, nullptr, "", "OK", "fb blank 1\n", {{kPanel0, "2047"}}},
    Case{"PanelLevelAboveMax", "AT+EDFT=0,5,2048", 0, false, nullptr, "", "ERROR", "fb blank 1\n", {{kPanel0, "1023\n"}}},
    Case{"PanelLevelNegative", "AT+EDFT=0,5,-1", 0, false, nullptr, "", "ERROR", "fb blank 1\n", {{kPanel0, "1023\n"}}},
    Case{"PanelLevelMissing", "AT+EDFT=0,5,", 0, false, nullptr, "", "ERROR", "", {{kPanel0, "1023\n"}}},
    Case{"PanelOffAtMode", "AT+EDFT=0,0", 1, false, nullptr, "", "OK", "fb blank 0\n", {{kPanel0, "0"}}},
    Case{"PanelOff", "AT+EDFT=0,0", 0, false, nullptr, "", "OK", "", {{kPanel0, "0"}}},
    Case{"PanelDark", "AT+EDFT=0,1", 0, false, nullptr, "", "OK", kLcm + "\n", {{kPanel0, "0"}}},
    Case{"PanelDarkAtMode", "AT+EDFT=0,1", 1, false, nullptr, "", "OK", "", {{kPanel0, "0"}}},
    Case{"Unknown", "AT+EDFT=7,1", 0, false, nullptr, "", "ERROR", ""},
    Case{"BackWithoutBackPanel", "AT+EDFT_BACK=0,5", 0, false, nullptr, "", "OK", "", {{kPanel1, "0\n"}}},
    Case{"BackWhite", "AT+EDFT_BACK=0,5", 0, true, nullptr, "", "ATOK",
         kKeepBack + kLcm + "-e lcm_color W --ei display_id 4096\n", {{kPanel1, "1023"}}},
    Case{"BackWhiteAppRefuses", "AT+EDFT_BACK=0,5", 0, true, app_refuses, "\r\nexit airplane mode failed\r\n", "ATNG",
         "wakelock acquire 1 ftcmd\nmessage keep_screen_on 1,display_id:4096 -> error\n", {{kPanel1, "0\n"}}},
    // In AT mode the system ADC sample is not built: its "Not Implement" makes the line fail.
    Case{"BackWhiteAtModeResetsAssembly", "AT+EDFT_BACK=0,5", 1, true, nullptr, "", "ATNG",
         "nv write\nfb second blank 1\n", {{kPanel1, "1023"}}, 0},
    Case{"BackWhiteAtModeNvWriteFails", "AT+EDFT_BACK=0,5", 1, true, nv_write, "", "ATERROR", "", {{kPanel1, "0\n"}}, 1},
    Case{"BackWhiteAtModeNvReadFails", "AT+EDFT_BACK=0,5", 1, true, nv_read, "", "ATNG", "fb second blank 1\n",
         {{kPanel1, "1023"}}, 1},
    Case{"BackOff", "AT+EDFT_BACK=0,0", 0, true, nullptr, "", "ATOK",
         "wakelock release ftcmd\nmessage keep_screen_on 0,display_id:4096 -> ok\n" + kLcm + "\n", {{kPanel1, "0"}}},
    Case{"BackOffAtMode", "AT+EDFT_BACK=0,0", 1, true, nullptr, "", "ATOK", "fb second blank 0\n", {{kPanel1, "0"}}},
    Case{"InstantStop", "AT+QX_VBR_STH_TS=0", 0, false, nullptr, "", "ATOK", ""},
    Case{"InstantSameTimes", "AT+QX_VBR_STH_TS=1,500,500", 0, false, nullptr, "time invalid", "ATNG", ""},
    Case{"InstantOnLonger", "AT+QX_VBR_STH_TS=1,600,500", 0, false, nullptr, "time invalid", "ATNG", ""},
    Case{"InstantOneTime", "AT+QX_VBR_STH_TS=1,500", 0, false, nullptr, "parameter invalid", "ATNG", ""},
    Case{"InstantNotNumbers", "AT+QX_VBR_STH_TS=1,a,b", 0, false, nullptr, "parameter invalid", "ATNG", ""},
    Case{"InstantHuge", "AT+QX_VBR_STH_TS=1,5,99999999999", 0, false, nullptr, "parameter invalid", "ATNG", ""},
    Case{"InstantOther", "AT+QX_VBR_STH_TS=2", 0, false, nullptr, "", "ERROR", ""},
    Case{"LedsOff", "AT+MMILED=1,0", 0, false, nullptr, "", "OK", "led red/brightness 0\nled green/brightness 0\n"},
    Case{"LedRed", "AT+MMILED=1,1", 0, false, nullptr, "", "OK", "led green/brightness 0\nled red/brightness 255\n"},
    Case{"LedGreen", "AT+MMILED=1,2", 0, false, nullptr, "", "OK", "led red/brightness 0\nled green/brightness 255\n"},
    Case{"LedGreenEngineering", "AT+MMILED=1,2", 0, false, engineering, "", "OK",
         "led red/brightness 0\nled green/engineering 255\n"},
    Case{"LedBlue", "AT+MMILED=1,3", 0, false, nullptr, "", "OK", "led blue/brightness 255\n"},
    Case{"LedBlueMissing", "AT+MMILED=1,3", 0, false, no_blue, "", "ERROR", ""},
    Case{"LedRedMissingLastWriteOk", "AT+MMILED=1,0", 0, false, no_red, "", "OK", "led green/brightness 0\n"},
    Case{"LedCount", "AT+MMILED=2", 0, false, nullptr, "\r\n+TYPE:\"3\"\r\n", "OK", ""},
    Case{"LedCountEngineeringNodeMissing", "AT+MMILED=2", 0, false,
         [](const Sandbox &b) { std::string p = "RX3310"; sim::write_kv(b.path("/.sim/config"), "project", &p); },
         "\r\n+TYPE:\"2\"\r\n", "OK", ""},
    Case{"LedOther", "AT+MMILED=3", 0, false, nullptr, "", "ERROR", ""},
    Case{"BlinkStop", "AT+QXLIGHT=0", 0, false, nullptr, "", "OK", ""},
    Case{"BlinkOther", "AT+QXLIGHT=2", 0, false, nullptr, "", "ERROR", ""},
    Case{"RingEffectBlue", "AT+QX_BREATH_LGT=1,B", 0, false, nullptr, "", "ATOK", "", {{kEffect, "32"}, {kCfg, "1"}}},
    Case{"RingEffectGreen", "AT+QX_BREATH_LGT=1,Gx", 0, false, nullptr, "", "ATOK", "", {{kEffect, "31"}, {kCfg, "1"}}},
    Case{"RingEffectH", "AT+QX_BREATH_LGT=1,H", 0, false, nullptr, "", "ATOK", "", {{kEffect, "2f"}, {kCfg, "1"}}},
    Case{"RingEffectRed", "AT+QX_BREATH_LGT=1,R", 0, false, nullptr, "", "ATOK", "", {{kEffect, "30"}, {kCfg, "1"}}},
    Case{"RingEffectOff", "AT+QX_BREATH_LGT=1,0", 0, false, nullptr, "", "ATOK", "", {{kEffect, "0"}, {kCfg, "1"}}},
    Case{"RingEffectLowerCase", "AT+QX_BREATH_LGT=1,b", 0, false, nullptr, "\r\n\"param 2 error\"\r\n", "ATERROR", "",
         {{kEffect, "0\n"}}},
    Case{"RingEffectMissing", "AT+QX_BREATH_LGT=1", 0, false, nullptr, "", "ATERROR", "", {{kEffect, "0\n"}}},
    Case{"RingEffectEmpty", "AT+QX_BREATH_LGT=1,", 0, false, nullptr, "", "ATERROR", "", {{kEffect, "0\n"}}},
    Case{"RingEffectOther", "AT+QX_BREATH_LGT=2,B", 0, false, nullptr, "", "ATERROR", ""},
    Case{"RingEffectNoDriver", "AT+QX_BREATH_LGT=1,B", 0, false,
         [](const Sandbox &b) { std::filesystem::remove(b.path(kEffect)); }, "", "ATNG", "", {{kCfg, "0\n"}}},
    Case{"RingEffectNoCfg", "AT+QX_BREATH_LGT=1,R", 0, false,
         [](const Sandbox &b) { std::filesystem::remove(b.path(kCfg)); }, "", "ATNG", "", {{kEffect, "30"}}},
    Case{"FeedbackOn", "AT+QXCGFK=1", 0, false, nullptr, "", "OK", "message feedback 1 -> ok\n"},
    Case{"FeedbackOffRefused", "AT+QXCGFK=0", 0, false, app_refuses, "", "ERROR", "message feedback 0 -> error\n"},
    Case{"FeedbackStateOn", "AT+QXCGFK=2", 0, false, [](const Sandbox &b) { b.reply("feedback 2", "ok 1"); },
         "\r\n\"1\"\r\n", "OK", "message feedback 2 -> ok 1\n"},
    Case{"FeedbackStateOff", "AT+QXCGFK=2", 0, false, [](const Sandbox &b) { b.reply("feedback 2", "ok 0"); },
         "\r\n\"0\"\r\n", "OK", "message feedback 2 -> ok 0\n"},
    Case{"FeedbackStateOther", "AT+QXCGFK=2", 0, false, nullptr, "", "ERROR", "message feedback 2 -> ok\n"},
    Case{"FeedbackStateSilent", "AT+QXCGFK=2", 0, false, [](const Sandbox &b) { b.fault("testapp-silent"); }, "",
         "ERROR", "message feedback 2 -> (silent)\n"},
    Case{"FeedbackOther", "AT+QXCGFK=3", 0, false, nullptr, "", "ERROR", ""},
    Case{"BootChinese", "AT+QX_BOOT_SET=1,chinese", 0, false, nullptr, "", "ATOK",
         "setprop persist.sys.lockguide.skip=yes\nmessage setupwizard chinese -> ok\n", {{kInfo, "setupwizard=ZH\n"}}},
    Case{"BootEnglishRefused", "AT+QX_BOOT_SET=1,english", 0, false, app_refuses, "", "ATNG",
         "setprop persist.sys.lockguide.skip=yes\nmessage setupwizard english -> error\n", {{kInfo, "setupwizard=EN\n"}}},
    Case{"BootEnglishAtMode", "AT+QX_BOOT_SET=1,english", 1, false, nullptr, "", "ATOK",
         "setprop persist.sys.lockguide.skip=yes\n", {{kInfo, "setupwizard=EN\n"}}},
    Case{"BootOther", "AT+QX_BOOT_SET=1,french", 0, false, nullptr, "", "ERROR", ""},
    Case{"RingIcSingleDriver", "AT+QX_RING_IC=0", 0, false, nullptr, "\r\n\"a:OK\"\r\n", "ATOK", ""},
    Case{"RingIcOnlyB", "AT+QX_RING_IC=0", 0, false, [](const Sandbox &b) { ring_drivers(b, false, true); },
         "\r\n\"a:NG,b:OK\"\r\n", "ATOK", ""},
    Case{"RingIcOnlyA", "AT+QX_RING_IC=0", 0, false, [](const Sandbox &b) { ring_drivers(b, true, false); },
         "\r\n\"a:OK,b:NG\"\r\n", "ATOK", ""},
    Case{"RingIcNone", "AT+QX_RING_IC=0", 0, false, [](const Sandbox &b) { ring_drivers(b, false, false); }, "",
         "ATNG", ""},
    Case{"RingOff", "AT+QX_RING_LGT=0,0", 0, false, nullptr, "", "ATOK", ""},
    Case{"RingExitLowBattery", "AT+QX_RING_LGT=0,1", 0, false, nullptr, "", "ATNG",
         "message battery_mode set 0,display_id:4096 -> ok\nservice-start com.zdr.SuperPowerSave/.SuperPowerSaveService "
         "intent.action.SUPER_POWER_SAVE_SERVICE --es service_action stop\n"},
    Case{"RingExitLowBatteryRefused", "AT+QX_RING_LGT=0,1", 0, false, app_refuses,
         "\r\nexit low bat mode failed\r\n", "ATNG", "message battery_mode set 0,display_id:4096 -> error\n"},
    Case{"RingExitLowBatteryAtMode", "AT+QX_RING_LGT=0,1", 1, false, nullptr, "", "ATOK", ""},
    Case{"RingColour", "AT+QX_RING_LGT=1,R", 0, false, nullptr, "", "ATNG",
         "message ring_light 1 R,display_id:4096 -> ok\n"},
    Case{"RingColourRefused", "AT+QX_RING_LGT=2,W", 0, false, app_refuses, "\r\nring_light failed\r\n", "ATNG",
         "message ring_light 2 W,display_id:4096 -> error\n"},
    Case{"RingColourTwoChars", "AT+QX_RING_LGT=1,RG", 0, false, nullptr, "", "ATERROR", ""},
    Case{"RingColourMissing", "AT+QX_RING_LGT=2", 0, false, nullptr, "", "ATERROR", ""},
    Case{"RingStop", "AT+QX_RING_LGT=3", 0, false, nullptr, "", "ATNG",
         "message ring_light 0,display_id:4096 -> ok\nsetprop sys.ring_light.cali.para=0\n"},
    Case{"RingStopRefused", "AT+QX_RING_LGT=3", 0, false, app_refuses, "\r\nring_light failed\r\n", "ATNG",
         "message ring_light 0,display_id:4096 -> error\n"},
    Case{"RingMode7", "AT+QX_RING_LGT=6", 0, false, nullptr, "", "ATNG", "message ring_light 3,display_id:4096 -> ok\n"},
    Case{"RingMode3", "AT+QX_RING_LGT=7", 0, false, nullptr, "", "ATNG", "message ring_light 4,display_id:4096 -> ok\n"},
    Case{"RingOther", "AT+QX_RING_LGT=9", 0, false, nullptr, "", "ATERROR", ""}),
    [](const ::testing::TestParamInfo<Case> &info) { return info.param.name; });

// One pulse of 10 s, then the worker sleeps; a second start while it runs does nothing.
TEST_F(LightsTest, VibratorPulsesOnceAndRefusesASecondStart) {
    EXPECT_EQ(serve("AT+EDFT=6,1"), "AT+EDFT=6,1\r\n\r\nOK\r\n");
    auto ev = leds(2);
    ASSERT_EQ(ev.size(), 2u) << box.events();
    EXPECT_EQ(ev[0].detail, "vibrator/duration 10000");
    EXPECT_EQ(ev[1].detail, "vibrator/activate 1");
    EXPECT_EQ(serve("AT+EDFT=6,1"), "AT+EDFT=6,1\r\n\r\nOK\r\n");
    EXPECT_EQ(serve("AT+EDFT=6,0"), "AT+EDFT=6,0\r\n\r\nOK\r\n");
    ev = leds(3);
    ASSERT_EQ(ev.size(), 3u) << box.events();
    EXPECT_EQ(ev[2].detail, "vibrator/activate 0");
    EXPECT_EQ(g_vibrator_run, 0);
}

// Pulses of "on" every interval until stopped; a start while it runs is "not stop".
TEST_F(LightsTest, InstantVibrationPulsesEveryIntervalUntilStopped) {
    EXPECT_EQ(serve("AT+QX_VBR_STH_TS=1,100,300"), "AT+QX_VBR_STH_TS=1,100,300\r\n\r\nATOK\r\n");
    EXPECT_EQ(serve("AT+QX_VBR_STH_TS=1,100,300"), "AT+QX_VBR_STH_TS=1,100,300\r\nnot stop\r\nATNG\r\n");
    auto ev = leds(6);  // three pulses
    ASSERT_GE(ev.size(), 6u) << box.events();
    for (size_t i = 0; i < 6; i += 2) {
        EXPECT_EQ(ev[i].detail, "vibrator/duration 100");
        EXPECT_EQ(ev[i + 1].detail, "vibrator/activate 1");
    }
    for (size_t i = 2; i < 6; i += 2) {
        long long gap = ev[i].ms - ev[i - 2].ms;
        EXPECT_GE(gap, 290);
        EXPECT_LE(gap, 1000);
    }
    EXPECT_EQ(serve("AT+QX_VBR_STH_TS=0"), "AT+QX_VBR_STH_TS=0\r\n\r\nATOK\r\n");
    ASSERT_TRUE(wait_workers_done(3000));
    ev = leds(0);
    ASSERT_FALSE(ev.empty());
    EXPECT_EQ(ev.back().detail, "vibrator/activate 0");
    EXPECT_EQ(g_vibrator_run, 0);
}

// The total ends the vibration by itself: after 20 s (2 x 10 s here) the worker stops.
TEST_F(LightsTest, InstantVibrationEndsAfterTwentySeconds) {
    EXPECT_EQ(serve("AT+QX_VBR_STH_TS=1,1,9999"), "AT+QX_VBR_STH_TS=1,1,9999\r\n\r\nATOK\r\n");
    ASSERT_TRUE(wait_workers_done(25000));
    auto ev = leds(0);
    ASSERT_EQ(ev.size(), 5u) << box.events();
    EXPECT_EQ(ev[4].detail, "vibrator/activate 0");
    long long run = ev[4].ms - ev[0].ms;
    EXPECT_GE(run, 19990);
    EXPECT_LE(run, 21500);
    EXPECT_EQ(g_vibrator_run, 0);
}

// Red on even passes, green on odd ones, both cleared at the start of every pass and at
// the end; a pass every 500 ms.
TEST_F(LightsTest, IndicatorBlinksRedThenGreen) {
    EXPECT_EQ(serve("AT+QXLIGHT=1"), "AT+QXLIGHT=1\r\n\r\nOK\r\n");
    EXPECT_EQ(serve("AT+QXLIGHT=1"), "AT+QXLIGHT=1\r\n\r\nOK\r\n");
    auto ev = leds(9);
    EXPECT_EQ(serve("AT+QXLIGHT=0"), "AT+QXLIGHT=0\r\n\r\nOK\r\n");
    ASSERT_TRUE(wait_workers_done(3000));
    ev = leds(0);
    ASSERT_GE(ev.size(), 8u) << box.events();
    const char *on[] = {"red/brightness 255", "green/brightness 255"};
    for (size_t pass = 0; pass < 2; ++pass) {
        EXPECT_EQ(ev[pass * 3].detail, "red/brightness 0");
        EXPECT_EQ(ev[pass * 3 + 1].detail, "green/brightness 0");
        EXPECT_EQ(ev[pass * 3 + 2].detail, on[pass]);
    }
    long long gap = ev[3].ms - ev[0].ms;
    EXPECT_GE(gap, 490);
    EXPECT_LE(gap, 1200);
    EXPECT_EQ(ev[ev.size() - 2].detail, "red/brightness 0");
    EXPECT_EQ(ev.back().detail, "green/brightness 0");
    EXPECT_EQ((ev.size() - 2) % 3, 0u) << box.events();  // whole passes, then the two clears
}

}  // namespace
