// Flash LED tests: the levels written to each flash node, the failure answers of missing
// nodes, the infrared fill-light test, and the self-closing timers with their limits.
#include <chrono>
#include <filesystem>
#include <string>
#include <thread>
#include <vector>

#include "tests/support/in_process.h"

namespace {

using Clock = std::chrono::steady_clock;

const char *kLed1 = "/sys/ext_led/EXT_REAR_FLASH_LED1";
const char *kLed = "/sys/ext_led/EXT_REAR_FLASH_LED";
const char *kLed2 = "/sys/ext_led/EXT_REAR_FLASH_LED2";
const char *kFront = "/sys/ext_led/EXT_FRONT_FLASH_LED";
const char *kIrMsg = "/data/engineermode/infrared_fill_light_msg";
const char *kGone = nullptr;  // the node must not exist

using Setup = void (*)(const Sandbox &);
void remove_node(const Sandbox &b, const char *node) { std::filesystem::remove(b.path(node)); }
void old_board(const Sandbox &b) {  // the rear main flash under its older name only
    remove_node(b, kLed1);
    b.write(kLed, "0\n");
}
void both_names(const Sandbox &b) { b.write(kLed, "5\n"); }
void lit(const Sandbox &b) {
    for (const char *n : {kLed1, kLed2, kFront}) b.write(n, "75");
}

struct Case {
    std::string line;
    Setup setup;
    std::string body;
    const char *word;
    std::vector<std::pair<const char *, const char *>> nodes = {};  // node, text (kGone: missing)
    std::vector<std::string> events = {};
    const char *tag = nullptr;
};

std::string case_name(const ::testing::TestParamInfo<Case> &info) {
    std::string name;
    for (char c : info.param.line) {
        if (isalnum(static_cast<unsigned char>(c))) name += c;
        else if (!name.empty() && name.back() != '_') name += '_';
    }
    while (!name.empty() && name.back() == '_') name.pop_back();
    if (info.param.tag) name += std::string("_") + info.param.tag;
    return name;
}

class FlashTest : public InProcess {
protected:
    void TearDown() override {
        is_sp = 0;
        InProcess::TearDown();
    }
    // The flash driver's records, "<node> <level>" with their times.
    std::vector<Event> flashes() const {
        std::vector<Event> out;
        for (const Event &e : box.event_list())
            if (e.kind == "flash") out.push_back(e);
        return out;
    }
    // Waits (bounded) until the flash driver has taken count writes; they are returned.
    std::vector<Event> wait_flashes(size_t count, int limit_ms) const {
        const auto since = Clock::now();
        std::vector<Event> got = flashes();
        while (got.size() < count && Clock::now() - since < std::chrono::milliseconds(limit_ms)) {
            std::this_thread::sleep_for(std::chrono::milliseconds(5));
            got = flashes();
        }
        return got;
    }
};
class FlashLine : public FlashTest, public ::testing::WithParamInterface<Case> {};

TEST_P(FlashLine, Answers) {
    const Case &c = GetParam();
    if (c.setup) c.setup(box);
    const std::string frame = c.line + "\r\n" + c.body + "\r\n" + c.word + "\r\n";
    EXPECT_EQ(serve(c.line, SRC_TCP, frame.size()), frame);
    for (auto [node, text] : c.nodes) {
        if (text == kGone) EXPECT_FALSE(box.exists(node)) << node;
        else EXPECT_EQ(box.read(node), text) << node;
    }
    const std::string log = box.events();
    size_t at = 0;
    for (const auto &e : c.events) {
        at = log.find(e, at);
        ASSERT_NE(at, std::string::npos) << "missing in order: " << e << "\n" << log;
    }
}

INSTANTIATE_TEST_SUITE_P(Torch, FlashLine, ::testing::Values(
    Case{"AT+QXSG=1", nullptr, "", "OK", {{kLed1, "75"}, {kLed, kGone}, {kLed2, "0\n"}, {kFront, "0\n"}}},
    Case{"AT+QXSG=1", old_board, "", "OK", {{kLed, "75"}, {kLed1, kGone}}, {}, "OlderNodeName"},
    Case{"AT+QXSG=1", both_names, "", "OK", {{kLed1, "75"}, {kLed, "5\n"}}, {}, "PrefersLed1"},
    Case{"AT+QXSG=1", [](const Sandbox &b) { remove_node(b, kLed1); }, "", "ERROR", {{kLed, kGone}}, {}, "NoRearFlash"},
    Case{"AT+QXSG=0", lit, "", "OK", {{kLed1, "0"}, {kLed2, "75"}, {kFront, "75"}}},
    Case{"AT+QXSG=2", nullptr, "", "ATOK", {{kLed2, "75"}, {kLed1, "0\n"}}},
    Case{"AT+QXSG=0,2", lit, "", "ATOK", {{kLed2, "0"}, {kLed1, "75"}}},
    Case{"AT+QXSG=2", [](const Sandbox &b) { remove_node(b, kLed2); }, "", "ATNG", {{kLed2, kGone}}, {}, "NoSecondFlash"},
    Case{"AT+QXSG=1,3", nullptr, "", "OK", {{kFront, "75"}, {kLed1, "0\n"}}},
    Case{"AT+QXSG=0,3", lit, "", "OK", {{kFront, "0"}}},
    Case{"AT+QXSG=1,3", [](const Sandbox &b) { remove_node(b, kFront); }, "", "ERROR", {}, {}, "NoFrontFlash"},
    Case{"AT+QXSG=3", lit, "", "ERROR", {{kLed1, "75"}, {kLed2, "75"}, {kFront, "75"}}},
    Case{"AT+QXSG=1,1,1", nullptr, "", "ERROR", {{kLed1, "0\n"}}},
    Case{"AT+QXBGD=1", nullptr, "", "OK", {{kFront, "75"}}},
    Case{"AT+QXBGD=0", lit, "", "OK", {{kFront, "0"}, {kLed1, "75"}}},
    Case{"AT+QXBGD=1", [](const Sandbox &b) { remove_node(b, kFront); }, "", "OK", {{kFront, kGone}}, {}, "NoFrontFlash"},
    Case{"AT+QXBGD=2", nullptr, "", "ERROR", {{kFront, "0\n"}}}),
    case_name);

INSTANTIATE_TEST_SUITE_P(PulseOff, FlashLine, ::testing::Values(
    Case{"AT+FLAMP=0,0", lit, "", "OK", {{kFront, "0"}, {kLed1, "75"}}},
    Case{"AT+FLAMP=0,0", [](const Sandbox &b) { remove_node(b, kFront); }, "", "OK", {}, {}, "NoFrontFlash"},
    Case{"AT+FLAMP=1,0", lit, "", "OK", {{kLed1, "0"}, {kLed, kGone}, {kFront, "75"}}},
    Case{"AT+FLAMP=1,0", [](const Sandbox &b) { lit(b), both_names(b); }, "", "OK", {{kLed1, "0"}, {kLed, "0"}},
         {"flash EXT_REAR_FLASH_LED1 0", "flash EXT_REAR_FLASH_LED 0"},
         "BothNames"},
    Case{"AT+FLAMP=2,0", [](const Sandbox &b) { lit(b), both_names(b); }, "", "OK", {{kLed2, "0"}, {kLed, "0"}, {kLed1, "75"}},
         {"flash EXT_REAR_FLASH_LED2 0", "flash EXT_REAR_FLASH_LED 0"}},
    Case{"AT+FLAMP=1,1", [](const Sandbox &b) { remove_node(b, kLed1); }, "", "ERROR", {{kLed, kGone}}, {}, "NoRearFlash"},
    Case{"AT+FLAMP=2,1", [](const Sandbox &b) { remove_node(b, kLed2); }, "", "ATNG", {}, {}, "NoSecondFlash"},
    Case{"AT+FLAMP=3,1", nullptr, "", "ERROR"},
    Case{"AT+FLAMP=0,0,5", lit, "", "ERROR", {{kFront, "75"}}},
    Case{"AT+QXFLIGHT=1", nullptr, "", "OK", {}, {"camera flash_mode#on -> success"}},
    Case{"AT+QXFLIGHT=2", nullptr, "", "OK", {}, {"camera flash_mode#auto -> success"}},
    Case{"AT+QXFLIGHT=1", [](const Sandbox &b) { b.write("/.sim/camera.replies", "flash_mode#on => fail#no flash\n"); },
         "fail#no flash", "ERROR", {}, {"camera flash_mode#on -> fail#no flash"}, "CameraFails"},
    Case{"AT+QXFLIGHT=2", [](const Sandbox &b) { b.fault("camera"); }, "fail#camera service not available", "ERROR", {}, {},
         "CameraDown"},
    Case{"AT+QXFLIGHT=3", nullptr, "", "ERROR"}),
    case_name);

void at_mode(const Sandbox &) { is_sp = 1; }
void ir_msg(const Sandbox &b, const std::string &text) { b.write(kIrMsg, text); }

INSTANTIATE_TEST_SUITE_P(Infrared, FlashLine, ::testing::Values(
    Case{"AT+QX_FLED_INF=0", [](const Sandbox &b) { ir_msg(b, "pass"); }, "", "OK", {{kIrMsg, kGone}}},
    Case{"AT+QX_FLED_INF=1", nullptr, "", "ATOK", {}, {"message infrared_fill_light 1 -> ok"}},
    Case{"AT+QX_FLED_INF=1", [](const Sandbox &b) { b.fault("testapp-refuse"); }, "\"error\"", "ATNG", {}, {},
         "TestAppRefuses"},
    Case{"AT+QX_FLED_INF=1", [](const Sandbox &b) { b.fault("testapp-silent"); }, "\"\"", "ATNG", {}, {}, "TestAppSilent"},
    Case{"AT+QX_FLED_INF=1", at_mode, "\r\n\"AT mode not support\"\r\n", "ATERROR", {}, {}, "AtMode"},
    Case{"AT+QX_FLED_INF=2", [](const Sandbox &b) { ir_msg(b, "fill light 35 lux"); }, "\r\n\"fill light 35 lux\"\r\n",
         "ATOK"},
    Case{"AT+QX_FLED_INF=2", [](const Sandbox &b) { ir_msg(b, "sensor error 3"); }, "\r\n\"sensor error 3\"\r\n", "ATNG", {},
         {}, "ErrorText"},
    Case{"AT+QX_FLED_INF=2", [](const Sandbox &b) { ir_msg(b, std::string(79, 'x') + "error"); },
         "\r\n\"" + std::string(79, 'x') + "e\"\r\n", "ATOK", {}, {}, "CutAt80Bytes"},
    Case{"AT+QX_FLED_INF=2", nullptr, "\r\n\"access msg failed\"\r\n", "ATERROR", {}, {}, "NoMessageFile"},
    Case{"AT+QX_FLED_INF=2", [](const Sandbox &b) { at_mode(b), ir_msg(b, "ok"); }, "\r\n\"AT mode not support\"\r\n",
         "ATERROR", {}, {}, "AtMode"},
    Case{"AT+QX_FLED_INF=3,0", lit, "", "ATOK", {{kFront, "0"}, {kLed1, "75"}}},
    Case{"AT+QX_FLED_INF=3", nullptr, "", "ERROR"},
    Case{"AT+QX_FLED_INF=4", nullptr, "", "ERROR"}),
    case_name);

// A pulse's level at once, and its timer's delay: node written back to "0".
// A pulse: the write that lights it, and the timer's write of 0 after its delay.
struct Pulse {
    const char *line;
    const char *on;   // the flash driver's record of the line's write
    const char *off;  // ... and of the timer's
    int delay_ms;
    const char *word;
    const char *name;
};

class FlashPulse : public FlashTest, public ::testing::WithParamInterface<Pulse> {};

TEST_P(FlashPulse, ClosesAfterItsDelay) {
    const Pulse &p = GetParam();
    const std::string line = p.line, frame = line + "\r\n\r\n" + p.word + "\r\n";
    EXPECT_EQ(serve(line, SRC_TCP, frame.size()), frame);
    std::vector<Event> f = wait_flashes(2, p.delay_ms + 3000);
    ASSERT_EQ(f.size(), 2u) << box.events();
    EXPECT_EQ(f[0].detail, p.on);
    EXPECT_EQ(f[1].detail, p.off);
    EXPECT_GE(f[1].ms - f[0].ms, p.delay_ms - 1);  // the times are whole milliseconds
    EXPECT_LT(f[1].ms - f[0].ms, p.delay_ms + 1000);
    std::this_thread::sleep_for(std::chrono::milliseconds(50));
    EXPECT_EQ(flashes().size(), 2u) << "one write of 0, and nothing after it";
}

INSTANTIATE_TEST_SUITE_P(Timers, FlashPulse, ::testing::Values(
    Pulse{"AT+FLAMP=1,1", "EXT_REAR_FLASH_LED1 900", "EXT_REAR_FLASH_LED1 0", 500, "OK", "RearDefault"},
    Pulse{"AT+FLAMP=1,1,100", "EXT_REAR_FLASH_LED1 900", "EXT_REAR_FLASH_LED1 0", 100, "OK", "RearGiven"},
    Pulse{"AT+FLAMP=1,1,2000", "EXT_REAR_FLASH_LED1 900", "EXT_REAR_FLASH_LED1 0", 500, "OK", "RearCapped"},
    Pulse{"AT+FLAMP=1,1,99999999999", "EXT_REAR_FLASH_LED1 900", "EXT_REAR_FLASH_LED1 0", 500, "OK", "RearHugeCapped"},
    Pulse{"AT+FLAMP=1,1,-40", "EXT_REAR_FLASH_LED1 900", "EXT_REAR_FLASH_LED1 0", 0, "OK", "RearNegativeClosesAtOnce"},
    Pulse{"AT+FLAMP=2,1", "EXT_REAR_FLASH_LED2 900", "EXT_REAR_FLASH_LED2 0", 500, "ATOK", "SecondDefault"},
    Pulse{"AT+FLAMP=2,1,2000", "EXT_REAR_FLASH_LED2 900", "EXT_REAR_FLASH_LED2 0", 500, "ATOK", "SecondCapped"},
    // The front torch stays on; its timer closes the rear main flash.
    Pulse{"AT+FLAMP=0,1", "EXT_FRONT_FLASH_LED 75", "EXT_REAR_FLASH_LED1 0", 200, "OK", "FrontTorchDefault"},
    Pulse{"AT+QX_FLED_INF=3,1", "EXT_FRONT_FLASH_LED 75", "EXT_FRONT_FLASH_LED 0", 3000, "ATOK", "InfraredThreeSeconds"}),
    [](const ::testing::TestParamInfo<Pulse> &info) { return std::string(info.param.name); });

TEST_F(FlashTest, RearTimerClosesTheOlderNodeToo) {
    old_board(box);
    EXPECT_EQ(serve("AT+FLAMP=1,1,150", SRC_TCP, 24), "AT+FLAMP=1,1,150\r\n\r\nOK\r\n");
    std::vector<Event> f = wait_flashes(2, 3000);
    ASSERT_EQ(f.size(), 2u) << box.events();
    EXPECT_EQ(f[0].detail, "EXT_REAR_FLASH_LED 900");
    EXPECT_EQ(f[1].detail, "EXT_REAR_FLASH_LED 0");
    EXPECT_GE(f[1].ms - f[0].ms, 149);
    EXPECT_FALSE(box.exists(kLed1));
}

TEST_F(FlashTest, OverlappingTimersEachCloseAtTheirOwnTime) {
    EXPECT_EQ(serve("AT+FLAMP=1,1,400", SRC_TCP, 24), "AT+FLAMP=1,1,400\r\n\r\nOK\r\n");
    EXPECT_EQ(serve("AT+FLAMP=1,1,100", SRC_TCP, 24), "AT+FLAMP=1,1,100\r\n\r\nOK\r\n");
    std::vector<Event> f = wait_flashes(4, 3000);
    ASSERT_EQ(f.size(), 4u) << box.events();
    for (size_t i : {0, 1}) EXPECT_EQ(f[i].detail, "EXT_REAR_FLASH_LED1 900");
    for (size_t i : {2, 3}) EXPECT_EQ(f[i].detail, "EXT_REAR_FLASH_LED1 0");
    EXPECT_GE(f[2].ms - f[1].ms, 99);   // the later, shorter pulse closes first
    EXPECT_GE(f[3].ms - f[0].ms, 399);  // and the first timer still writes 0 at its time
    EXPECT_LT(f[2].ms, f[3].ms);
}

}  // namespace
