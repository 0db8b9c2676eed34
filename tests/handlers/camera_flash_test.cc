// Flash LED tests: the levels written to each flash node, the failure answers of missing
// nodes, the infrared fill-light test, and the self-closing timers with their limits.
#include <chrono>
#include <filesystem>
#include <functional>
#include <thread>

#include "tests/support/checks.h"
#include "tests/support/in_process.h"
#include "tests/support/test_name.h"

namespace {

const char *kLed1 = "/sys/ext_led/EXT_REAR_FLASH_LED1";
const char *kLed = "/sys/ext_led/EXT_REAR_FLASH_LED";
const char *kLed2 = "/sys/ext_led/EXT_REAR_FLASH_LED2";
const char *kFront = "/sys/ext_led/EXT_FRONT_FLASH_LED";
const char *kIrMsg = "/data/engineermode/infrared_fill_light_msg";
const char *kGone = nullptr;  // the node must not exist
const std::string kAtModeNotice = "\r\n\"AT mode not support\"\r\n";

using Setup = std::function<void(const Sandbox &)>;
Setup gone(const char *node) { return [=](const Sandbox &b) { std::filesystem::remove(b.path(node)); }; }
Setup put(const char *path, const std::string &text) { return [=](const Sandbox &b) { b.write(path, text); }; }
Setup ir_msg(const std::string &text) { return put(kIrMsg, text); }
Setup fault(const char *name) { return [=](const Sandbox &b) { b.fault(name); }; }
Setup both(Setup a, Setup b) { return [=](const Sandbox &s) { a(s), b(s); }; }
const Setup kOldBoard = [](const Sandbox &b) {  // the rear main flash under its older name only
    std::filesystem::remove(b.path(kLed1));
    b.write(kLed, "0\n");
};
const Setup kBothNames = [](const Sandbox &b) { b.write(kLed, "5\n"); };
const Setup kLit = [](const Sandbox &b) {
    for (const char *n : {kLed1, kLed2, kFront}) b.write(n, "75");
};
const Setup kAtMode = [](const Sandbox &) { is_sp = 1; };

struct Case {
    const char *tag;
    std::string line;
    Setup setup;
    std::string body;
    const char *word;
    std::vector<std::pair<const char *, const char *>> nodes = {};  // node, text (kGone: missing)
    std::vector<std::string> events = {};                           // recorded in this order
    int delay_ms = -1;  // a pulse: its two flash records, the timer's 0 this long after the line's write
};
void PrintTo(const Case &c, std::ostream *os) { *os << c.line << " " << c.tag; }

class FlashTest : public InProcess {
protected:
    void TearDown() override {
        is_sp = 0;
        InProcess::TearDown();
    }
    std::vector<Event> flashes() const {  // the flash driver's records, "<node> <level>" with their times
        std::vector<Event> out;
        for (const Event &e : box.event_list())
            if (e.kind == "flash") out.push_back(e);
        return out;
    }
    std::vector<Event> wait_flashes(size_t count, int limit_ms) const {  // bounded
        wait_until([&] { return flashes().size() >= count; }, limit_ms);
        return flashes();
    }
};
class FlashLine : public FlashTest, public ::testing::WithParamInterface<Case> {};

TEST_P(FlashLine, Answers) {
    const Case &c = GetParam();
    if (c.setup) c.setup(box);
    const std::string want = frame(c.line, c.body, c.word);
    EXPECT_EQ(serve(c.line, SRC_TCP, want.size()), want);
    for (auto [node, text] : c.nodes) {
        if (text == kGone) EXPECT_FALSE(box.exists(node)) << node;
        else EXPECT_EQ(box.read(node), text) << node;
    }
    if (c.delay_ms >= 0) {
        std::vector<Event> f = wait_flashes(2, c.delay_ms + 3000);
        ASSERT_EQ(f.size(), 2u) << box.events();
        for (size_t i : {0, 1}) EXPECT_EQ("flash " + f[i].detail, c.events[i]);
        EXPECT_GE(f[1].ms - f[0].ms, c.delay_ms - 1);  // the times are whole milliseconds
        EXPECT_LT(f[1].ms - f[0].ms, c.delay_ms + 1000);
        std::this_thread::sleep_for(std::chrono::milliseconds(50));
        EXPECT_EQ(flashes().size(), 2u) << "one write of 0, and nothing after it";
    }
    expect_in_order(box.events(), c.events);
}

const auto by_tag = named_by([](const Case &c) { return c.line + "," + c.tag; });
using Flashes = std::vector<std::string>;
const Flashes kRearPulse{"flash EXT_REAR_FLASH_LED1 900", "flash EXT_REAR_FLASH_LED1 0"};
const Flashes kSecondPulse{"flash EXT_REAR_FLASH_LED2 900", "flash EXT_REAR_FLASH_LED2 0"};
const Flashes kFrontTorch{"flash EXT_FRONT_FLASH_LED 75", kRearPulse[1]};

// clang-format off
// Torches: each form lights or clears its own node only; the rear main flash's two names.
INSTANTIATE_TEST_SUITE_P(Torch, FlashLine, ::testing::Values(
    Case{"", "AT+QXSG=1", nullptr, "", "OK", {{kLed1, "75"}, {kLed, kGone}, {kLed2, "0\n"}, {kFront, "0\n"}}},
    Case{"OlderNodeName", "AT+QXSG=1", kOldBoard, "", "OK", {{kLed, "75"}, {kLed1, kGone}}},
    Case{"PrefersLed1", "AT+QXSG=1", kBothNames, "", "OK", {{kLed1, "75"}, {kLed, "5\n"}}},
    Case{"NoRearFlash", "AT+QXSG=1", gone(kLed1), "", "ERROR", {{kLed, kGone}}},
    Case{"", "AT+QXSG=0", kLit, "", "OK", {{kLed1, "0"}, {kLed2, "75"}, {kFront, "75"}}},
    Case{"", "AT+QXSG=2", nullptr, "", "ATOK", {{kLed2, "75"}, {kLed1, "0\n"}}},
    Case{"", "AT+QXSG=0,2", kLit, "", "ATOK", {{kLed2, "0"}, {kLed1, "75"}}},
    Case{"NoSecondFlash", "AT+QXSG=2", gone(kLed2), "", "ATNG", {{kLed2, kGone}}},
    Case{"", "AT+QXSG=1,3", nullptr, "", "OK", {{kFront, "75"}, {kLed1, "0\n"}}},
    Case{"", "AT+QXSG=0,3", kLit, "", "OK", {{kFront, "0"}}},
    Case{"NoFrontFlash", "AT+QXSG=1,3", gone(kFront), "", "ERROR"},
    Case{"", "AT+QXSG=1,1,1", nullptr, "", "ERROR", {{kLed1, "0\n"}}},
    Case{"", "AT+QXBGD=1", nullptr, "", "OK", {{kFront, "75"}}},
    Case{"", "AT+QXBGD=0", kLit, "", "OK", {{kFront, "0"}, {kLed1, "75"}}},
    Case{"NoFrontFlash", "AT+QXBGD=1", gone(kFront), "", "OK", {{kFront, kGone}}},
    Case{"", "AT+QXBGD=2", nullptr, "", "ERROR", {{kFront, "0\n"}}}), by_tag);

// Pulses switched off, missing nodes, and the camera's flash modes.
INSTANTIATE_TEST_SUITE_P(PulseOff, FlashLine, ::testing::Values(
    Case{"", "AT+FLAMP=0,0", kLit, "", "OK", {{kFront, "0"}, {kLed1, "75"}}},
    Case{"NoFrontFlash", "AT+FLAMP=0,0", gone(kFront), "", "OK"},
    Case{"BothNames", "AT+FLAMP=1,0", both(kLit, kBothNames), "", "OK", {{kLed1, "0"}, {kLed, "0"}, {kFront, "75"}},
         {"flash EXT_REAR_FLASH_LED1 0", "flash EXT_REAR_FLASH_LED 0"}},
    Case{"", "AT+FLAMP=2,0", both(kLit, kBothNames), "", "OK", {{kLed2, "0"}, {kLed, "0"}, {kLed1, "75"}},
         {"flash EXT_REAR_FLASH_LED2 0", "flash EXT_REAR_FLASH_LED 0"}},
    Case{"NoRearFlash", "AT+FLAMP=1,1", gone(kLed1), "", "ERROR", {{kLed, kGone}}},
    Case{"NoSecondFlash", "AT+FLAMP=2,1", gone(kLed2), "", "ATNG"},
    Case{"", "AT+FLAMP=0,0,5", kLit, "", "ERROR", {{kFront, "75"}}},
    Case{"", "AT+QXFLIGHT=1", nullptr, "", "OK", {}, {"camera flash_mode#on -> success"}},
    Case{"", "AT+QXFLIGHT=2", nullptr, "", "OK", {}, {"camera flash_mode#auto -> success"}},
    Case{"CameraFails", "AT+QXFLIGHT=1", put("/.sim/camera.replies", "flash_mode#on => fail#no flash\n"),
         "fail#no flash", "ERROR", {}, {"camera flash_mode#on -> fail#no flash"}},
    Case{"CameraDown", "AT+QXFLIGHT=2", fault("camera"), "fail#camera service not available", "ERROR"},
    Case{"", "AT+QXFLIGHT=3", nullptr, "", "ERROR"}), by_tag);

// The infrared fill-light test: the test app starts it, its message file holds the result.
INSTANTIATE_TEST_SUITE_P(Infrared, FlashLine, ::testing::Values(
    Case{"", "AT+QX_FLED_INF=0", ir_msg("pass"), "", "OK", {{kIrMsg, kGone}}},
    Case{"", "AT+QX_FLED_INF=1", nullptr, "", "ATOK", {}, {"message infrared_fill_light 1 -> ok"}},
    Case{"TestAppRefuses", "AT+QX_FLED_INF=1", fault("testapp-refuse"), "\"error\"", "ATNG"},
    Case{"TestAppSilent", "AT+QX_FLED_INF=1", fault("testapp-silent"), "\"\"", "ATNG"},
    Case{"AtMode", "AT+QX_FLED_INF=1", kAtMode, kAtModeNotice, "ATERROR"},
    Case{"", "AT+QX_FLED_INF=2", ir_msg("fill light 35 lux"), "\r\n\"fill light 35 lux\"\r\n", "ATOK"},
    Case{"ErrorText", "AT+QX_FLED_INF=2", ir_msg("sensor error 3"), "\r\n\"sensor error 3\"\r\n", "ATNG"},
    Case{"CutAt80Bytes", "AT+QX_FLED_INF=2", ir_msg(std::string(79, 'x') + "error"),
         "\r\n\"" + std::string(79, 'x') + "e\"\r\n", "ATOK"},
    Case{"NoMessageFile", "AT+QX_FLED_INF=2", nullptr, "\r\n\"access msg failed\"\r\n", "ATERROR"},
    Case{"AtMode", "AT+QX_FLED_INF=2", both(kAtMode, ir_msg("ok")), kAtModeNotice, "ATERROR"},
    Case{"", "AT+QX_FLED_INF=3,0", kLit, "", "ATOK", {{kFront, "0"}, {kLed1, "75"}}},
    Case{"", "AT+QX_FLED_INF=3", nullptr, "", "ERROR"}), by_tag);

// Pulses: the line's write, and the timer's single write of 0 after its delay (default, capped).
INSTANTIATE_TEST_SUITE_P(Timers, FlashLine, ::testing::Values(
    Case{"RearDefault", "AT+FLAMP=1,1", nullptr, "", "OK", {}, kRearPulse, 500},
    Case{"RearGiven", "AT+FLAMP=1,1,100", nullptr, "", "OK", {}, kRearPulse, 100},
    Case{"RearHugeCapped", "AT+FLAMP=1,1,99999999999", nullptr, "", "OK", {}, kRearPulse, 500},
    Case{"RearNegativeClosesAtOnce", "AT+FLAMP=1,1,-40", nullptr, "", "OK", {}, kRearPulse, 0},
    Case{"RearOlderNode", "AT+FLAMP=1,1,150", kOldBoard, "", "OK", {{kLed1, kGone}},
         {"flash EXT_REAR_FLASH_LED 900", "flash EXT_REAR_FLASH_LED 0"}, 150},
    Case{"SecondDefault", "AT+FLAMP=2,1", nullptr, "", "ATOK", {}, kSecondPulse, 500},
    Case{"SecondCapped", "AT+FLAMP=2,1,2000", nullptr, "", "ATOK", {}, kSecondPulse, 500},
    // The front torch stays on; its timer closes the rear main flash.
    Case{"FrontTorchDefault", "AT+FLAMP=0,1", nullptr, "", "OK", {}, kFrontTorch, 200},
    Case{"FrontTorchCapped", "AT+FLAMP=0,1,20000", nullptr, "", "OK", {}, kFrontTorch, 10000},
    Case{"InfraredThreeSeconds", "AT+QX_FLED_INF=3,1", nullptr, "", "ATOK", {},
         {"flash EXT_FRONT_FLASH_LED 75", "flash EXT_FRONT_FLASH_LED 0"}, 3000}), by_tag);
// clang-format on

TEST_F(FlashTest, OverlappingTimersEachCloseAtTheirOwnTime) {
    for (const char *line : {"AT+FLAMP=1,1,400", "AT+FLAMP=1,1,100"}) EXPECT_EQ(serve(line), frame(line, "", "OK"));
    std::vector<Event> f = wait_flashes(4, 3000);
    ASSERT_EQ(f.size(), 4u) << box.events();
    for (size_t i : {0, 1, 2, 3}) EXPECT_EQ("flash " + f[i].detail, kRearPulse[i / 2]);
    EXPECT_GE(f[2].ms - f[1].ms, 99);   // the later, shorter pulse closes first
    EXPECT_GE(f[3].ms - f[0].ms, 399);  // and the first timer still writes 0 at its time
    EXPECT_LT(f[2].ms, f[3].ms);
}

}  // namespace