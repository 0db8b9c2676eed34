// Flight mode, sleep, default AT mode and SIM / memory card presence: exact frames, NV
// record and device effects, with and without the Android UI (is_sp).
#include <filesystem>

#include "core/nv.h"
#include "tests/support/checks.h"
#include "tests/support/in_process.h"
#include "tests/support/test_name.h"

namespace {

// Every byte non-zero; default_at_mode, when given, replaced.
std::string nv_with(char at_mode = 0) {
    std::string rec = nv_fill(0x41, 199);
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
    std::string early, body, word, events;
    char nv_at_mode = 0;  // default_at_mode afterwards; 0: the record is unchanged
    std::string nodes = "0\n1023\n";  // gauge, power state, autosleep and backlight afterwards
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

    const std::string want = c.early + frame(c.line, c.body, c.word);
    EXPECT_EQ(serve(c.line, SRC_TCP, want.size()), want);
    is_sp = saved_sp;
    EXPECT_EQ(answer(1, 0), "");
    EXPECT_EQ(box.events(), c.events);
    EXPECT_EQ(box.read("/.sim/nv.bin"), nv_with(c.nv_at_mode));
    std::string nodes;
    for (const char *n : {"/sys/kernel/debug/cms/debug", "/sys/power/ftcmd_state", "/sys/power/autosleep",
                          "/sys/class/backlight/panel0-backlight/brightness"})
        nodes += box.read(n);
    EXPECT_EQ(nodes, c.nodes);
}

const std::string kSimState = "message sim_state -> SIM1,SIM2\n";
const std::string kLongSims(60, 'S');

// A SIM card test line whose test-app message is number n, answered "ok=1,slot".
Case sim_ok(const char *line, int n) {
    return {.line = line, .body = "\r\n\"1\"\n\r", .word = "ATOK",
            .events = "message sim_card_test " + std::to_string(n) + " -> ok=1,slot\n"};
}
const auto by_line = named_by([](const Case &c) { return c.line; });

// clang-format off
INSTANTIATE_TEST_SUITE_P(FlightAndSleep, SystemModesTest, ::testing::Values(
    Case{.line = "AT+OFFL=1", .sp = 1, .word = "OK", .events = "setprop sys.stop.all=1\n"},
    Case{.line = "AT+OFFL=1", .word = "OK", .events = "message airplane_mode 1 -> ok\n"},
    Case{.line = "AT+OFFL=1", .fault = "testapp-refuse", .word = "ERROR",
         .events = "message airplane_mode 1 -> error\n"},
    Case{.line = "AT+OFFL=0", .sp = 1, .word = "OK"},
    Case{.line = "AT+OFFL=0", .word = "OK", .events = "message airplane_mode 0 -> ok\n"},
    Case{.line = "AT+OFFL=2", .word = "ERROR"},
    Case{.line = "AT+EQSB=0", .fault = "testapp-silent", .word = "ERROR",
         .events = "message go_to_sleep -> (silent)\n"},
    // Asleep without the Android UI: the gauge, the panel and the power state are driven directly.
    Case{.line = "AT+EQSB=0", .sp = 1, .early = kEarly, .word = "OK", .events = "sync \nfb blank 0\n",
         .nodes = "fg-cutoff1mem0"},
    Case{.line = "AT+EQSB=0", .sp = 1, .remove = "/sys/power/autosleep", .early = kEarly, .body = "\"error:-2\"",
         .word = "ERROR", .events = "sync \nfb blank 0\n", .nodes = "fg-cutoff10"}), by_line);

INSTANTIATE_TEST_SUITE_P(AtMode, SystemModesTest, ::testing::Values(
    Case{.line = "AT+ESLP=1", .word = "OK", .events = "nv write\n", .nv_at_mode = '0'},
    Case{.line = "AT+ESLP=1", .fault = "nv-read", .word = "OK"},
    Case{.line = "AT+ESLP=1", .fault = "nv-write", .word = "ERROR"},
    Case{.line = "AT+ESLP=2", .word = "OK"},
    Case{.line = "AT+ESLP=3", .sp = 1, .body = "\r\n\"1\"\r\n", .word = "OK"},
    Case{.line = "AT+ESLP=4", .word = "ERROR"}), by_line);

// Each SIM card test line has its own message to the test app.
INSTANTIATE_TEST_SUITE_P(Cards, SystemModesTest, ::testing::Values(
    Case{.line = "AT+QXSIM=1", .word = "OK", .events = kSimState},
    Case{.line = "AT+QXSIM=2", .message = "sim_state", .reply = "SIM1", .word = "ERROR",
         .events = "message sim_state -> SIM1\n"},
    Case{.line = "AT+QXSIM=1", .sp = 1, .word = "ERROR"},
    Case{.line = "AT+QXCARD=1", .body = "+cards:SIM1,SIM2,\"TF\"", .word = "OK", .events = kSimState},
    Case{.line = "AT+QXCARD=1", .sp = 1, .body = "+cards:,\"TF\"", .word = "OK"},
    Case{.line = "AT+QXCARD=1", .remove = "/storage/sdcard1", .body = "+cards:SIM1,SIM2,\"\"", .word = "OK",
         .events = kSimState},
    Case{.line = "AT+QXCARD=1", .message = "sim_state", .reply = kLongSims.c_str(),
         .body = "+cards:" + kLongSims.substr(0, 55) + ",\"TF\"", .word = "OK",
         .events = "message sim_state -> " + kLongSims + "\n"},
    Case{.line = "AT+QXCARD=0", .word = "OK"},
    sim_ok("AT+QX_SIM_USE=1", 0),
    sim_ok("AT+QX_SIM_USE=2", 1),
    sim_ok("AT+QX_SIM_USE=0", 2),
    sim_ok("AT+QX_SIM_REP=1", 3),
    Case{.line = "AT+QX_SIM_REP=2", .message = "sim_card_test 4", .reply = "error1=2", .body = "\r\n\"2\"\n\r",
         .word = "ATNG", .events = "message sim_card_test 4 -> error1=2\n"},
    Case{.line = "AT+QX_SIM_REP=0", .message = "sim_card_test 5", .reply = "failed=3,x", .word = "ERROR",
         .events = "message sim_card_test 5 -> failed=3,x\n"},
    Case{.line = "AT+QX_SIM_USE=3", .word = "ERROR"}), by_line);
// clang-format on

}  // namespace
