// Vibrator and lights: exact frames, the LED, vibrator and panel nodes, and the vibration and blink workers' timing.
#include <cstring>
#include <filesystem>
#include <functional>

#include "handlers/lights.h"
#include "platform/factory.h"
#include "tests/support/checks.h"
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

std::string nv_record(int32_t assembly_at_mode) {  // every byte non-zero but the assembly field
    std::string rec = nv_fill(0x11, 199).substr(0, PYXA_NV_SIZE);
    memcpy(rec.data() + 488, &assembly_at_mode, 4);
    return rec;
}

using Setup = std::function<void(const Sandbox &)>;
Setup rm(const char *path) { return [=](const Sandbox &b) { std::filesystem::remove(b.path(path)); }; }
Setup fault(const char *name) { return [=](const Sandbox &b) { b.fault(name); }; }
Setup rep(const char *message, const char *reply) { return [=](const Sandbox &b) { b.reply(message, reply); }; }
Setup config(const char *key, const char *value) {
    return [=](const Sandbox &b) { b.sequence(std::string("config:") + key, {value}); };
}
Setup all(std::initializer_list<Setup> steps) {
    return [v = std::vector<Setup>(steps)](const Sandbox &b) {
        for (const auto &s : v) s(b);
    };
}
Setup put(const char *path) { return [=](const Sandbox &b) { b.write(path, "0\n"); }; }
void at_mode(const Sandbox &) { is_sp = 1; }
const Setup back_panel = config("calibrate_items", "\"double_lcm_support\""), app_refuses = fault("testapp-refuse");
const Setup back_at_mode = all({at_mode, back_panel});
const Setup engineering = all({config("project", "WQ2207_EX"), put("/sys/class/leds/green/engineering")});
// The ring's two drivers instead of the single one.
const Setup only_a = all({rm(kEffect), put("/sys/class/leds/aw22xxx_led_a/effect")}),
            only_b = all({rm(kEffect), put("/sys/class/leds/aw22xxx_led_b/effect")});

struct Case {
    std::string line, body, word;
    std::string events;  // the whole record of device effects
    std::vector<std::pair<const char *, const char *>> nodes = {};
    Setup setup = nullptr;
    int assembly_after = 7;  // the NV field after the line (7: record untouched; else it starts at 1)
};

class LightsTest : public InProcess {
protected:
    int saved_sp = is_sp;
    void SetUp() override {
        InProcess::SetUp();
        is_sp = 0;
        box.write("/.sim/nv.bin", nv_record(7));
    }
    void TearDown() override {
        g_vibrator_run = 0;
        g_lights_run = 0;
        is_sp = saved_sp;
        InProcess::TearDown();
    }
    void served(const std::string &line, const std::string &body, const std::string &word) {
        EXPECT_EQ(serve(line), frame(line, body, word));
    }
    // The "led" events once count of them have been recorded (bounded wait).
    std::vector<Event> leds(size_t count, int ms = 3000) const {
        std::vector<Event> out;
        wait_until([&] {
            out.clear();
            for (const Event &e : box.event_list())
                if (e.kind == "led") out.push_back(e);
            return out.size() >= count;
        }, ms);
        return out;
    }
    static std::vector<std::string> details(const std::vector<Event> &ev, size_t from = 0, size_t n = 99) {
        std::vector<std::string> out;
        for (size_t i = from; i < ev.size() && i < from + n; ++i) out.push_back(ev[i].detail);
        return out;
    }
};
class LightsLine : public LightsTest, public ::testing::WithParamInterface<Case> {};

TEST_P(LightsLine, Answers) {
    const Case &c = GetParam();
    if (c.assembly_after != 7) box.write("/.sim/nv.bin", nv_record(1));
    if (c.setup) c.setup(box);
    const std::string want = frame(c.line, c.body, c.word);
    EXPECT_EQ(serve(c.line, SRC_TCP, want.size()), want);
    EXPECT_EQ(box.events(), c.events);
    for (auto [path, value] : c.nodes) EXPECT_EQ(box.read(path), value) << path;
    EXPECT_EQ(box.read("/.sim/nv.bin"), nv_record(c.assembly_after));
}

const std::string kKeepBack = "wakelock acquire 1 ftcmd\nmessage keep_screen_on 1,display_id:4096 -> ";
const std::string kBatteryMode = "message battery_mode set 0,display_id:4096 -> ", kSaveStop = "service-start "
    "com.zdr.SuperPowerSave/.SuperPowerSaveService intent.action.SUPER_POWER_SAVE_SERVICE --es service_action stop\n";
const std::string kAirplane = "\r\nexit airplane mode failed\r\n", kRingFailed = "\r\nring_light failed\r\n";
const std::string kSkip = "setprop persist.sys.lockguide.skip=yes\n";
std::string ring(const char *message, const char *reply = "ok") {  // the test app asked to light the ring
    return std::string("message ring_light ") + message + ",display_id:4096 -> " + reply + "\n";
}
const char *kOld0 = "1023\n";  // the panel nodes' value before the line

INSTANTIATE_TEST_SUITE_P(Lights, LightsLine, ::testing::Values(
    Case{"AT+EDFT=5,1", "", "OK", "", {{kButton, "255"}}},
    Case{"AT+EDFT=5,0", "", "OK", "", {{kButton, "0"}}},
    Case{"AT+EDFT=5,1", "", "ERROR", "", {}, rm(kButton)},
    Case{"AT+EDFT=0,5", "", "OK", kLcm + "-e lcm_color W\n", {{kPanel0, "2047"}}},
    Case{"AT+EDFT=0,5", "", "OK", "fb blank 1\n", {{kPanel0, "2047"}}, at_mode},
    Case{"AT+EDFT=0,5,0", "", "OK", "fb blank 1\n", {{kPanel0, "2047"}}},
    Case{"AT+EDFT=0,5,2047", "", "OK", "fb blank 1\n", {{kPanel0, "2047"}}},
    Case{"AT+EDFT=0,5,2048", "", "ERROR", "fb blank 1\n", {{kPanel0, kOld0}}},
    Case{"AT+EDFT=0,5,-1", "", "ERROR", "fb blank 1\n", {{kPanel0, kOld0}}},
    Case{"AT+EDFT=0,5,", "", "ERROR", "", {{kPanel0, kOld0}}},
    Case{"AT+EDFT=0,0", "", "OK", "fb blank 0\n", {{kPanel0, "0"}}, at_mode},
    Case{"AT+EDFT=0,0", "", "OK", "", {{kPanel0, "0"}}},
    Case{"AT+EDFT=0,1", "", "OK", kLcm + "\n", {{kPanel0, "0"}}},
    Case{"AT+EDFT=0,1", "", "OK", "", {{kPanel0, "0"}}, at_mode},
    Case{"AT+EDFT=7,1", "", "ERROR", ""},
    Case{"AT+EDFT_BACK=0,5", "", "OK", "", {{kPanel1, "0\n"}}},
    Case{"AT+EDFT_BACK=0,5", "", "ATOK", kKeepBack + "ok\n" + kLcm + "-e lcm_color W --ei display_id 4096\n",
         {{kPanel1, "1023"}}, back_panel},
    Case{"AT+EDFT_BACK=0,5", kAirplane, "ATNG", kKeepBack + "error\n", {{kPanel1, "0\n"}},
         all({back_panel, app_refuses})},
    // In AT mode the system ADC sample is not built: its "Not Implement" makes the line fail.
    Case{"AT+EDFT_BACK=0,5", "", "ATNG", "nv write\nfb second blank 1\n", {{kPanel1, "1023"}}, back_at_mode, 0},
    Case{"AT+EDFT_BACK=0,5", "", "ATERROR", "", {{kPanel1, "0\n"}}, all({back_at_mode, fault("nv-write")}), 1},
    Case{"AT+EDFT_BACK=0,5", "", "ATNG", "fb second blank 1\n", {{kPanel1, "1023"}},
         all({back_at_mode, fault("nv-read")}), 1},
    Case{"AT+EDFT_BACK=0,0", "", "ATOK",
         "wakelock release ftcmd\nmessage keep_screen_on 0,display_id:4096 -> ok\n" + kLcm + "\n", {{kPanel1, "0"}},
         back_panel},
    Case{"AT+EDFT_BACK=0,0", "", "ATOK", "fb second blank 0\n", {{kPanel1, "0"}}, back_at_mode},
    Case{"AT+QX_VBR_STH_TS=1,500,500", "time invalid", "ATNG", ""},
    Case{"AT+QX_VBR_STH_TS=1,500", "parameter invalid", "ATNG", ""},
    Case{"AT+QX_VBR_STH_TS=1,a,b", "parameter invalid", "ATNG", ""},
    Case{"AT+QX_VBR_STH_TS=1,5,99999999999", "parameter invalid", "ATNG", ""},
    Case{"AT+QX_VBR_STH_TS=1,25000,100", "time invalid", "ATNG", ""},
    Case{"AT+QX_VBR_STH_TS=2", "", "ATERROR", ""},
    Case{"AT+MMILED=1,0", "", "OK", "led red/brightness 0\nled green/brightness 0\n"},
    Case{"AT+MMILED=1,1", "", "OK", "led green/brightness 0\nled red/brightness 255\n"},
    Case{"AT+MMILED=1,2", "", "OK", "led red/brightness 0\nled green/brightness 255\n"},
    Case{"AT+MMILED=1,2", "", "OK", "led red/brightness 0\nled green/engineering 255\n", {}, engineering},
    Case{"AT+MMILED=1,3", "", "OK", "led blue/brightness 255\n"},
    Case{"AT+MMILED=1,3", "", "ERROR", "", {}, rm("/sys/class/leds/blue/brightness")},
    Case{"AT+MMILED=1,0", "", "OK", "led green/brightness 0\n", {}, rm("/sys/class/leds/red/brightness")},
    Case{"AT+MMILED=2", "\r\n+TYPE:\"3\"\r\n", "OK", ""},
    Case{"AT+MMILED=2", "\r\n+TYPE:\"2\"\r\n", "OK", "", {}, config("project", "RX3310")},
    Case{"AT+QX_BREATH_LGT=1,B", "", "ATOK", "", {{kEffect, "32"}, {kCfg, "1"}}},
    Case{"AT+QX_BREATH_LGT=1,Gx", "", "ATOK", "", {{kEffect, "31"}, {kCfg, "1"}}},
    Case{"AT+QX_BREATH_LGT=1,H", "", "ATOK", "", {{kEffect, "2f"}, {kCfg, "1"}}},
    Case{"AT+QX_BREATH_LGT=1,R", "", "ATOK", "", {{kEffect, "30"}, {kCfg, "1"}}},
    Case{"AT+QX_BREATH_LGT=1,0", "", "ATOK", "", {{kEffect, "0"}, {kCfg, "1"}}},
    Case{"AT+QX_BREATH_LGT=1,b", "\r\n\"param 2 error\"\r\n", "ATERROR", "", {{kEffect, "0\n"}}},
    Case{"AT+QX_BREATH_LGT=1", "", "ATERROR", "", {{kEffect, "0\n"}}},
    Case{"AT+QX_BREATH_LGT=2,B", "", "ATERROR", ""},
    Case{"AT+QX_BREATH_LGT=1,B", "", "ATNG", "", {{kCfg, "0\n"}}, rm(kEffect)},
    Case{"AT+QX_BREATH_LGT=1,R", "", "ATNG", "", {{kEffect, "30"}}, rm(kCfg)},
    Case{"AT+QXCGFK=1", "", "OK", "message feedback 1 -> ok\n"},
    Case{"AT+QXCGFK=0", "", "ERROR", "message feedback 0 -> error\n", {}, app_refuses},
    Case{"AT+QXCGFK=2", "\r\n\"1\"\r\n", "OK", "message feedback 2 -> ok 1\n", {}, rep("feedback 2", "ok 1")},
    Case{"AT+QXCGFK=2", "\r\n\"0\"\r\n", "OK", "message feedback 2 -> ok 0\n", {}, rep("feedback 2", "ok 0")},
    Case{"AT+QXCGFK=2", "", "ERROR", "message feedback 2 -> ok\n"},
    Case{"AT+QXCGFK=2", "", "ERROR", "message feedback 2 -> (silent)\n", {}, fault("testapp-silent")},
    Case{"AT+QX_BOOT_SET=1,chinese", "", "ATOK", kSkip + "message setupwizard chinese -> ok\n",
         {{kInfo, "setupwizard=ZH\n"}}},
    Case{"AT+QX_BOOT_SET=1,english", "", "ATNG", kSkip + "message setupwizard english -> error\n",
         {{kInfo, "setupwizard=EN\n"}}, app_refuses},
    Case{"AT+QX_BOOT_SET=1,english", "", "ATOK", kSkip, {{kInfo, "setupwizard=EN\n"}}, at_mode},
    Case{"AT+QX_BOOT_SET=1,french", "", "ERROR", ""},
    Case{"AT+QX_RING_IC=0", "\r\n\"a:OK\"\r\n", "ATOK", ""},
    Case{"AT+QX_RING_IC=0", "\r\n\"a:NG,b:OK\"\r\n", "ATOK", "", {}, only_b},
    Case{"AT+QX_RING_IC=0", "\r\n\"a:OK,b:NG\"\r\n", "ATOK", "", {}, only_a},
    Case{"AT+QX_RING_IC=0", "", "ATNG", "", {}, rm(kEffect)},
    Case{"AT+QX_RING_LGT=0,0", "", "ATOK", ""},
    Case{"AT+QX_RING_LGT=0,1", "", "ATNG", kBatteryMode + "ok\n" + kSaveStop},
    Case{"AT+QX_RING_LGT=0,1", "\r\nexit low bat mode failed\r\n", "ATNG", kBatteryMode + "error\n", {}, app_refuses},
    Case{"AT+QX_RING_LGT=0,1", "", "ATOK", "", {}, at_mode},
    Case{"AT+QX_RING_LGT=1,R", "", "ATNG", ring("1 R")},
    Case{"AT+QX_RING_LGT=2,W", kRingFailed, "ATNG", ring("2 W", "error"), {}, app_refuses},
    Case{"AT+QX_RING_LGT=1,RG", "", "ATERROR", ""},
    Case{"AT+QX_RING_LGT=2", "", "ATERROR", ""},
    Case{"AT+QX_RING_LGT=3", "", "ATNG", ring("0") + "setprop sys.ring_light.cali.para=0\n"},
    Case{"AT+QX_RING_LGT=3", kRingFailed, "ATNG", ring("0", "error"), {}, app_refuses},
    Case{"AT+QX_RING_LGT=6", "", "ATNG", ring("3")},
    Case{"AT+QX_RING_LGT=7", "", "ATNG", ring("4")},
    Case{"AT+QX_RING_LGT=9", "", "ATERROR", ""}),
    named_by([](const Case &c) { return c.line; }));

// One pulse of 10 s, then the worker sleeps; a second start while it runs does nothing; the stop ends the pulse.
TEST_F(LightsTest, VibratorPulsesOnceAndRefusesASecondStart) {
    served("AT+EDFT=6,1", "", "OK");
    EXPECT_EQ(details(leds(2)), (std::vector<std::string>{"vibrator/duration 10000", "vibrator/activate 1"}));
    served("AT+EDFT=6,1", "", "OK");
    served("AT+EDFT=6,0", "", "OK");
    EXPECT_EQ(details(leds(3), 2), std::vector<std::string>{"vibrator/activate 0"}) << box.events();
    EXPECT_EQ(g_vibrator_run, 0);
}

// Pulses of "on" every interval until stopped; a start while it runs is "not stop".
TEST_F(LightsTest, InstantVibrationPulsesEveryIntervalUntilStopped) {
    served("AT+QX_VBR_STH_TS=1,100,300", "", "ATOK");
    served("AT+QX_VBR_STH_TS=1,100,300", "not stop", "ATNG");
    auto ev = leds(6);  // three pulses
    ASSERT_GE(ev.size(), 6u) << box.events();
    for (size_t i = 0; i < 6; i += 2)
        EXPECT_EQ(details(ev, i, 2), (std::vector<std::string>{"vibrator/duration 100", "vibrator/activate 1"}));
    for (size_t i = 2; i < 6; i += 2) {
        EXPECT_GE(ev[i].ms - ev[i - 2].ms, 290);
        EXPECT_LE(ev[i].ms - ev[i - 2].ms, 1000);
    }
    served("AT+QX_VBR_STH_TS=0", "", "ATOK");
    ASSERT_TRUE(wait_workers_done(3000));
    ev = leds(0);
    ASSERT_FALSE(ev.empty());
    EXPECT_EQ(ev.back().detail, "vibrator/activate 0");
    EXPECT_EQ(g_vibrator_run, 0);
}

// A stop and a restart within one pass: the old worker leaves when it wakes instead of
// pulsing beside the new one, so the pulses stay a full interval apart.
TEST_F(LightsTest, InstantRestartWithinAPassLeavesOneWorker) {
    served("AT+QX_VBR_STH_TS=1,100,1000", "", "ATOK");
    leds(2);
    served("AT+QX_VBR_STH_TS=0", "", "ATOK");
    served("AT+QX_VBR_STH_TS=1,100,1000", "", "ATOK");
    std::vector<long long> pulses;  // the old worker's pulse, then three of the new one
    wait_until([&] {
        pulses.clear();
        for (const Event &e : leds(0))
            if (e.detail == "vibrator/duration 100") pulses.push_back(e.ms);
        return pulses.size() >= 4;
    }, 5000);
    served("AT+QX_VBR_STH_TS=0", "", "ATOK");
    ASSERT_TRUE(wait_workers_done(3000));
    ASSERT_GE(pulses.size(), 4u) << box.events();
    for (size_t i = 2; i < pulses.size(); ++i) EXPECT_GE(pulses[i] - pulses[i - 1], 995) << box.events();
}

// The total ends the vibration by itself: after 20 s (2 x 10 s here) the worker stops.
TEST_F(LightsTest, InstantVibrationEndsAfterTwentySeconds) {
    served("AT+QX_VBR_STH_TS=1,1,9999", "", "ATOK");
    ASSERT_TRUE(wait_workers_done(25000));
    auto ev = leds(0);
    ASSERT_EQ(ev.size(), 5u) << box.events();
    EXPECT_EQ(ev[4].detail, "vibrator/activate 0");
    EXPECT_GE(ev[4].ms - ev[0].ms, 19990);
    EXPECT_LE(ev[4].ms - ev[0].ms, 21500);
    EXPECT_EQ(g_vibrator_run, 0);
}

// Red on even passes, green on odd ones, both cleared at the start of every pass and at the end; a pass every 500 ms.
TEST_F(LightsTest, IndicatorBlinksRedThenGreen) {
    served("AT+QXLIGHT=1", "", "OK");
    served("AT+QXLIGHT=1", "", "OK");
    leds(9);
    served("AT+QXLIGHT=0", "", "OK");
    ASSERT_TRUE(wait_workers_done(3000));
    auto ev = leds(0);
    ASSERT_GE(ev.size(), 8u) << box.events();
    const std::vector<std::string> clear = {"red/brightness 0", "green/brightness 0"};
    EXPECT_EQ(details(ev, 0, 3), std::vector<std::string>({clear[0], clear[1], "red/brightness 255"}));
    EXPECT_EQ(details(ev, 3, 3), std::vector<std::string>({clear[0], clear[1], "green/brightness 255"}));
    EXPECT_GE(ev[3].ms - ev[0].ms, 490);
    EXPECT_LE(ev[3].ms - ev[0].ms, 1200);
    EXPECT_EQ(details(ev, ev.size() - 2), clear);
    EXPECT_EQ((ev.size() - 2) % 3, 0u) << box.events();  // whole passes, then the two clears
}

}  // namespace
