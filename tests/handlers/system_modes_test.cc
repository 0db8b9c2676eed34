// Flight mode, sleep, default AT mode and SIM / memory card presence: exact frames, NV
// record and device effects, with and without the Android UI (is_sp).
#include <filesystem>

#include "core/nv.h"
#include "tests/support/in_process.h"
#include "tests/support/test_name.h"

namespace {

// A record with a byte in every place; default_at_mode, when given, replaced.
std::string nv_with(char at_mode = 0) {
    std::string rec(PYXA_NV_SIZE, '\0');
    for (size_t i = 0; i < rec.size(); ++i) rec[i] = static_cast<char>(i * 5 + 1);
    if (at_mode) rec[nv::kDefaultAtMode] = at_mode;
    return rec;
}

const char kEarly[] = "AT+EQSB=0\r\n\r\nOK\r\n";

struct Case {
    const char *line;
    int sp = 0;
    const char *fault = nullptr;
    const char *message = nullptr, *reply = nullptr;  // a test-app answer of this case
    const char *remove = nullptr;                     // a device path missing on this phone
    std::string early, body, trailer, events;
    char nv_at_mode = 0;  // default_at_mode afterwards; 0: the record is unchanged
};

class SystemModesTest : public InProcess, public ::testing::WithParamInterface<Case> {};

TEST_P(SystemModesTest, AnswersAndEffects) {
    const Case &c = GetParam();
    const int saved_sp = is_sp;
    is_sp = c.sp;
    box.write("/.sim/nv.bin", nv_with());
    if (c.fault) box.fault(c.fault);
    if (c.message) box.reply(c.message, c.reply);
    if (c.remove) std::filesystem::remove_all(box.path(c.remove));

    const std::string frame = c.early + c.line + "\r\n" + c.body + "\r\n" + c.trailer + "\r\n";
    EXPECT_EQ(serve(c.line, SRC_TCP, frame.size()), frame);
    EXPECT_EQ(answer(1, 0), "");
    EXPECT_EQ(box.events(), c.events);
    EXPECT_EQ(box.read("/.sim/nv.bin"), nv_with(c.nv_at_mode));
    is_sp = saved_sp;
}

const std::string kSimState = "message sim_state -> SIM1,SIM2\n";
const std::string kLongSims(60, 'S');

const auto by_line = named_by([](const Case &c) { return c.line; });

// clang-format off
INSTANTIATE_TEST_SUITE_P(FlightAndSleep, SystemModesTest, ::testing::Values(
    Case{.line = "AT+OFFL=1", .sp = 1, .trailer = "OK", .events = "setprop sys.stop.all=1\n"},
    Case{.line = "AT+OFFL=1", .trailer = "OK", .events = "message airplane_mode 1 -> ok\n"},
    Case{.line = "AT+OFFL=1", .fault = "testapp-refuse", .trailer = "ERROR",
         .events = "message airplane_mode 1 -> error\n"},
    Case{.line = "AT+OFFL=0", .sp = 1, .trailer = "OK"},
    Case{.line = "AT+OFFL=0", .trailer = "OK", .events = "message airplane_mode 0 -> ok\n"},
    Case{.line = "AT+OFFL=2", .trailer = "ERROR"},
    Case{.line = "AT+EQSB=0", .fault = "testapp-silent", .trailer = "ERROR",
         .events = "message go_to_sleep -> (silent)\n"},
    Case{.line = "AT+EQSB=0", .sp = 1, .early = kEarly, .trailer = "OK", .events = "sync \nfb blank 0\n"},
    Case{.line = "AT+EQSB=0", .sp = 1, .remove = "/sys/power/autosleep", .early = kEarly, .body = "\"error:-2\"",
         .trailer = "ERROR", .events = "sync \nfb blank 0\n"}), by_line);

INSTANTIATE_TEST_SUITE_P(AtMode, SystemModesTest, ::testing::Values(
    Case{.line = "AT+ESLP=1", .trailer = "OK", .events = "nv write\n", .nv_at_mode = '0'},
    Case{.line = "AT+ESLP=1", .fault = "nv-read", .trailer = "OK"},
    Case{.line = "AT+ESLP=1", .fault = "nv-write", .trailer = "ERROR"},
    Case{.line = "AT+ESLP=2", .trailer = "OK"},
    Case{.line = "AT+ESLP=3", .sp = 1, .body = "\r\n\"1\"\r\n", .trailer = "OK"},
    Case{.line = "AT+ESLP=4", .trailer = "ERROR"}), by_line);

INSTANTIATE_TEST_SUITE_P(Cards, SystemModesTest, ::testing::Values(
    Case{.line = "AT+QXSIM=1", .trailer = "OK", .events = kSimState},
    Case{.line = "AT+QXSIM=2", .message = "sim_state", .reply = "SIM1", .trailer = "ERROR",
         .events = "message sim_state -> SIM1\n"},
    Case{.line = "AT+QXSIM=1", .sp = 1, .trailer = "ERROR"},
    Case{.line = "AT+QXCARD=1", .body = "+cards:SIM1,SIM2,\"TF\"", .trailer = "OK", .events = kSimState},
    Case{.line = "AT+QXCARD=1", .sp = 1, .body = "+cards:,\"TF\"", .trailer = "OK"},
    Case{.line = "AT+QXCARD=1", .remove = "/storage/sdcard1", .body = "+cards:SIM1,SIM2,\"\"", .trailer = "OK",
         .events = kSimState},
    Case{.line = "AT+QXCARD=1", .message = "sim_state", .reply = kLongSims.c_str(),
         .body = "+cards:" + kLongSims.substr(0, 55) + ",\"TF\"", .trailer = "OK",
         .events = "message sim_state -> " + kLongSims + "\n"},
    Case{.line = "AT+QXCARD=0", .trailer = "OK"},
    Case{.line = "AT+QX_SIM_USE=1", .body = "\r\n\"1\"\n\r", .trailer = "ATOK",
         .events = "message sim_card_test 0 -> ok=1,slot\n"},
    Case{.line = "AT+QX_SIM_REP=2", .message = "sim_card_test 4", .reply = "error1=2", .body = "\r\n\"2\"\n\r",
         .trailer = "ATNG", .events = "message sim_card_test 4 -> error1=2\n"},
    Case{.line = "AT+QX_SIM_REP=0", .message = "sim_card_test 5", .reply = "failed=3,x", .trailer = "ERROR",
         .events = "message sim_card_test 5 -> failed=3,x\n"},
    Case{.line = "AT+QX_SIM_USE=3", .trailer = "ERROR"}), by_line);
// clang-format on

class SystemModesOnceTest : public InProcess {};

// Each SIM card test line has its own message to the test app.
TEST_F(SystemModesOnceTest, SimTestMessages) {
    std::string expected;
    int n = 0;
    for (const char *line : {"AT+QX_SIM_USE=1", "AT+QX_SIM_USE=2", "AT+QX_SIM_USE=0", "AT+QX_SIM_REP=1",
                             "AT+QX_SIM_REP=2", "AT+QX_SIM_REP=0"}) {
        serve(line, SRC_TCP, 1);
        expected += "message sim_card_test " + std::to_string(n++) + " -> ok=1,slot\n";
    }
    EXPECT_EQ(box.events(), expected);
}

// Asleep without the Android UI: the gauge, the panel and the power state are driven directly.
TEST_F(SystemModesOnceTest, SleepInAtModeDrivesTheNodes) {
    const int saved_sp = is_sp;
    is_sp = 1;
    for (const char *node : {"/sys/kernel/debug/cms/debug", "/sys/power/ftcmd_state", "/sys/power/autosleep"})
        box.write(node, "");
    serve("AT+EQSB=0", SRC_TCP, 34);
    is_sp = saved_sp;
    EXPECT_EQ(
        box.read("/sys/kernel/debug/cms/debug") + box.read("/sys/power/ftcmd_state") + box.read("/sys/power/autosleep"),
        "fg-cutoff1mem");
    EXPECT_EQ(box.read("/sys/class/backlight/panel0-backlight/brightness"), "0");
}

}  // namespace
