// Factory reset, log sets and crash dump: exact frames, the NV record and device effects.
#include <filesystem>

#include "core/nv.h"
#include "tests/support/checks.h"
#include "tests/support/in_process.h"
#include "tests/support/test_name.h"

namespace {

// A record with a byte in every place, a stale delay and the factory-logging bit.
std::string nv_with(int delay = 77, int flag = 0x20) {
    nv::Record rec;
    for (size_t i = 0; i < PYXA_NV_SIZE; ++i) rec.bytes[i] = static_cast<unsigned char>(i * 7 + 3);
    rec.set_i32(nv::kResetDelay, delay);
    rec.set_i32(nv::kUpdateFlag, flag);
    return std::string(reinterpret_cast<char *>(rec.bytes), PYXA_NV_SIZE);
}
std::string ask(int v, const char *reply = "ok") {
    return "message system_restore " + std::to_string(v) + " -> " + reply + "\n";
}

const std::string kFmt = "format /dev/block/bootdevice/by-name/msadp\nformat /dev/block/bootdevice/by-name/apdp\n";
const std::string kMissing = "\r\n\"Missing TF_Data!\"\r\n", kNv = "nv write\n";
const char *const kLogs[] = {"/cache/recovery/last_AT_adb.log", "/cache/recovery/last_AT_kernel.log"};

struct Case {
    const char *line;
    int sp = 0;
    // app: the test app's answer to "system_restore *"; remove: a device node missing on this phone
    const char *fault = nullptr, *app = nullptr, *remove = nullptr;
    std::pair<const char *, const char *> config = {};  // a key of the simulator's config
    std::string body, word, events;  // events: after the two partition formats of the reset forms
    std::string nv = nv_with();  // the record afterwards
    bool logs_gone = false;
};

class SystemResetTest : public InProcess, public ::testing::WithParamInterface<Case> {};

TEST_P(SystemResetTest, AnswersAndEffects) {
    const Case &c = GetParam();
    const int saved_sp = is_sp;
    is_sp = c.sp;
    box.write("/.sim/nv.bin", nv_with());
    for (const char *log : kLogs) box.write(log, "log");
    if (c.fault) box.fault(c.fault);
    if (c.config.first) box.sequence(std::string("config:") + c.config.first, {c.config.second});
    if (c.app) box.reply("system_restore *", c.app);
    if (c.remove) std::filesystem::remove(box.path(c.remove));

    const std::string want = frame(c.line, c.body, c.word);
    EXPECT_EQ(serve(c.line, SRC_TCP, want.size()), want);
    EXPECT_EQ(answer(1, 0), "");
    const std::string_view line = c.line;  // every line of the reset forms formats the two partitions first
    const bool resets = line.starts_with("AT+QXRTALL") || line.starts_with("AT+QX_FRS_SHD");
    const std::string events = (resets ? kFmt : "") + c.events;
    wait_until([&] { return box.events().size() >= events.size(); }, 2000);  // the modem worker reports late
    EXPECT_EQ(box.events(), events);
    EXPECT_EQ(box.read("/.sim/nv.bin"), c.nv);
    for (const char *log : kLogs) EXPECT_EQ(box.exists(log), !c.logs_gone) << log;
    is_sp = saved_sp;
}

const auto by_line = named_by([](const Case &c) { return c.line; });
const std::pair<const char *, const char *> kNoTfData = {"tfdata", "0"};

// clang-format off
INSTANTIATE_TEST_SUITE_P(Restore, SystemResetTest, ::testing::Values(
    Case{.line = "AT+QXRTALL=1", .word = "OK", .events = ask(1) + "modem clean_gprs_anite\n", .logs_gone = true},
    Case{.line = "AT+QXRTALL=2", .word = "OK", .events = ask(2), .logs_gone = true},
    Case{.line = "AT+QXRTALL=1", .app = "busy", .body = "\"busy\"", .word = "ERROR", .events = ask(1, "busy")},
    Case{.line = "AT+QXRTALL=2", .config = kNoTfData, .body = kMissing, .word = "ERROR"},
    Case{.line = "AT+QXRTALL=3", .word = "ERROR"},
    Case{.line = "AT+QX_FRS_SHD=2", .word = "ATOK", .events = "shell /system/bin/sh -c \"stop kael_em_float\"\n"},
    Case{.line = "AT+QX_FRS_SHD=1,180,0", .word = "ATOK", .events = kNv + ask(1), .nv = nv_with(180, 0x21)},
    Case{.line = "AT+QX_FRS_SHD=1,900,1", .word = "ATOK", .events = kNv + ask(2), .nv = nv_with(900, 0x21)},
    Case{.line = "AT+QX_FRS_SHD=1,179,0", .word = "ATNG"},
    Case{.line = "AT+QX_FRS_SHD=1,901,0", .word = "ATNG"},
    Case{.line = "AT+QX_FRS_SHD=1,300,2", .word = "ATNG"},
    Case{.line = "AT+QX_FRS_SHD=1,300", .word = "ATNG"},
    Case{.line = "AT+QX_FRS_SHD=1,3a0,0", .word = "ATNG"},
    Case{.line = "AT+QX_FRS_SHD=1,300,0", .config = kNoTfData, .body = kMissing, .word = "ERROR"},
    Case{.line = "AT+QX_FRS_SHD=1,300,0", .fault = "nv-write", .word = "ERROR"},
    // Refused: the delay is cleared again, the pending bit stays.
    Case{.line = "AT+QX_FRS_SHD=1,300,0", .app = "busy", .word = "ERROR", .events = kNv + ask(1, "busy") + kNv,
         .nv = nv_with(0, 0x21)},
    // An unreadable record is skipped, but a refusal writes the zeroed buffer back.
    Case{.line = "AT+QX_FRS_SHD=1,300,1", .fault = "nv-read", .word = "ATOK", .events = ask(2)},
    Case{.line = "AT+QX_FRS_SHD=1,300,1", .fault = "nv-read", .app = "busy", .word = "ERROR",
         .events = ask(2, "busy") + kNv, .nv = std::string(PYXA_NV_SIZE, '\0')}), by_line);

INSTANTIATE_TEST_SUITE_P(LogAndDump, SystemResetTest, ::testing::Values(
    Case{.line = "AT+QXLOG=0", .word = "OK", .events = "kaellog at_mode=0 mask=0x0\n"},
    Case{.line = "AT+QXLOG=1", .sp = 1, .word = "OK", .events = "kaellog at_mode=1 mask=0x7\n"},
    Case{.line = "AT+QXLOG=3", .word = "OK", .events = "kaellog at_mode=0 mask=0x1\n"},
    Case{.line = "AT+QXLOG=2", .config = {"kaellog_running", "3"}, .word = "ERROR"},
    Case{.line = "AT+QXLOG=2", .config = {"kaellog_running", "2"}, .word = "OK"},  // only bit 0 counts
    Case{.line = "AT+QXLOG=5,adb", .sp = 1, .word = "ATOK", .events = "kaellog at_mode=1 mask=0x1\n"},
    // Added, not or-ed: sensor and gps make 64, wifi brings 64 more.
    Case{.line = "AT+QXLOG=5,Sensor,gps,WIFI,bluetooth,audio,modem,qsee,camera", .word = "ATOK",
         .events = "kaellog at_mode=0 mask=0xE048085\n"},
    Case{.line = "AT+QXLOG=5,camera,foo", .body = "\r\n\"unknown log name\"\r\n", .word = "ATNG"},
    Case{.line = "AT+QXLOG=5", .body = "\r\n\"invalid log name\"\r\n", .word = "ATERROR"},
    // Over TCP the station's line end stays in the line; it is no part of the last name.
    Case{.line = "AT+QXLOG=5,camera\r\n", .word = "ATOK", .events = "kaellog at_mode=0 mask=0x40001\n"},
    Case{.line = "AT+QXLOG=5,\r\n", .body = "\r\n\"invalid log name\"\r\n", .word = "ATERROR"},
    Case{.line = "AT+QXLOG=6", .word = "ATOK"},
    Case{.line = "AT+QXLOG=4", .word = "ERROR"},
    Case{.line = "AT+QX_TRG_DUMP=0", .word = "ATOK", .events = "sysrq c\n"},
    Case{.line = "AT+QX_TRG_DUMP=0", .remove = "/proc/sysrq-trigger", .body = "\"errno:No such file or directory\"",
         .word = "ATNG"},
    Case{.line = "AT+QX_TRG_DUMP=00", .word = "ATERROR"}), by_line);
// clang-format on

}  // namespace
