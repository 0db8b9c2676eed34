// Factory reset, log sets and crash dump: exact frames, the NV record and device effects.
#include <chrono>
#include <filesystem>
#include <thread>

#include "core/nv.h"
#include "platform/sim/sim.h"
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

const std::string kFmt = "format /dev/block/bootdevice/by-name/msadp\nformat /dev/block/bootdevice/by-name/apdp\n";
const std::string kMissing = "\r\n\"Missing TF_Data!\"\r\n", kNv = "nv write\n";
const std::string kAsk1 = "message system_restore 1 -> ok\n", kAsk2 = "message system_restore 2 -> ok\n";
const std::string kBusy1 = "message system_restore 1 -> busy\n";

struct Case {
    const char *line;
    int sp = 0;
    const char *fault = nullptr, *tfdata = nullptr, *running = nullptr;  // tfdata, running: sim config
    const char *app = nullptr;                                           // the test app's answer to "system_restore *"
    const char *remove = nullptr;                                        // a device node missing on this phone
    std::string body, trailer, events;
    std::string nv = nv_with();  // the record afterwards
    bool logs_gone = false;
};

class SystemResetTest : public InProcess, public ::testing::WithParamInterface<Case> {};

TEST_P(SystemResetTest, AnswersAndEffects) {
    const Case &c = GetParam();
    const int saved_sp = is_sp;
    is_sp = c.sp;
    box.write("/.sim/nv.bin", nv_with());
    box.write("/cache/recovery/last_AT_adb.log", "adb");
    box.write("/cache/recovery/last_AT_kernel.log", "kernel");
    if (c.fault) box.fault(c.fault);
    std::string v;
    if (c.tfdata) sim::write_kv(box.root + "/.sim/config", "tfdata", &(v = c.tfdata));
    if (c.running) sim::write_kv(box.root + "/.sim/config", "kaellog_running", &(v = c.running));
    if (c.app) box.reply("system_restore *", c.app);
    if (c.remove) std::filesystem::remove(box.path(c.remove));

    const std::string want = frame(c.line, c.body, c.trailer);
    EXPECT_EQ(serve(c.line, SRC_TCP, want.size()), want);
    EXPECT_EQ(answer(1, 0), "");
    // The modem clean-up worker reports after the answer.
    wait_until([&] { return box.events().size() >= c.events.size(); }, 2000);
    EXPECT_EQ(box.events(), c.events);
    EXPECT_EQ(box.read("/.sim/nv.bin"), c.nv);
    EXPECT_EQ(box.exists("/cache/recovery/last_AT_adb.log"), !c.logs_gone);
    EXPECT_EQ(box.exists("/cache/recovery/last_AT_kernel.log"), !c.logs_gone);
    is_sp = saved_sp;
}

const auto by_line = named_by([](const Case &c) { return c.line; });

// clang-format off
INSTANTIATE_TEST_SUITE_P(Restore, SystemResetTest, ::testing::Values(
    Case{.line = "AT+QXRTALL=1", .trailer = "OK", .events = kFmt + kAsk1 + "modem clean_gprs_anite\n",
         .logs_gone = true},
    Case{.line = "AT+QXRTALL=2", .trailer = "OK", .events = kFmt + kAsk2, .logs_gone = true},
    Case{.line = "AT+QXRTALL=1", .app = "busy", .body = "\"busy\"", .trailer = "ERROR", .events = kFmt + kBusy1},
    Case{.line = "AT+QXRTALL=2", .tfdata = "0", .body = kMissing, .trailer = "ERROR", .events = kFmt},
    Case{.line = "AT+QXRTALL=3", .trailer = "ERROR", .events = kFmt},
    Case{.line = "AT+QX_FRS_SHD=2", .trailer = "ATOK",
         .events = kFmt + "shell /system/bin/sh -c \"stop kael_em_float\"\n"},
    Case{.line = "AT+QX_FRS_SHD=1,180,0", .trailer = "ATOK", .events = kFmt + kNv + kAsk1, .nv = nv_with(180, 0x21)},
    Case{.line = "AT+QX_FRS_SHD=1,900,1", .trailer = "ATOK", .events = kFmt + kNv + kAsk2, .nv = nv_with(900, 0x21)},
    Case{.line = "AT+QX_FRS_SHD=1,179,0", .trailer = "ATNG", .events = kFmt},
    Case{.line = "AT+QX_FRS_SHD=1,901,0", .trailer = "ATNG", .events = kFmt},
    Case{.line = "AT+QX_FRS_SHD=1,300,2", .trailer = "ATNG", .events = kFmt},
    Case{.line = "AT+QX_FRS_SHD=1,300", .trailer = "ATNG", .events = kFmt},
    Case{.line = "AT+QX_FRS_SHD=1,3a0,0", .trailer = "ATNG", .events = kFmt},
    Case{.line = "AT+QX_FRS_SHD=1,300,0", .tfdata = "0", .body = kMissing, .trailer = "ERROR", .events = kFmt},
    Case{.line = "AT+QX_FRS_SHD=1,300,0", .fault = "nv-write", .trailer = "ERROR", .events = kFmt},
    // Refused: the delay is cleared again, the pending bit stays.
    Case{.line = "AT+QX_FRS_SHD=1,300,0", .app = "busy", .trailer = "ERROR", .events = kFmt + kNv + kBusy1 + kNv,
         .nv = nv_with(0, 0x21)},
    // An unreadable record is skipped, but a refusal writes the zeroed buffer back.
    Case{.line = "AT+QX_FRS_SHD=1,300,1", .fault = "nv-read", .trailer = "ATOK", .events = kFmt + kAsk2},
    Case{.line = "AT+QX_FRS_SHD=1,300,1", .fault = "nv-read", .app = "busy", .trailer = "ERROR",
         .events = kFmt + "message system_restore 2 -> busy\n" + kNv, .nv = std::string(PYXA_NV_SIZE, '\0')}), by_line);

INSTANTIATE_TEST_SUITE_P(LogAndDump, SystemResetTest, ::testing::Values(
    Case{.line = "AT+QXLOG=0", .trailer = "OK", .events = "kaellog at_mode=0 mask=0x0\n"},
    Case{.line = "AT+QXLOG=1", .sp = 1, .trailer = "OK", .events = "kaellog at_mode=1 mask=0x7\n"},
    Case{.line = "AT+QXLOG=3", .trailer = "OK", .events = "kaellog at_mode=0 mask=0x1\n"},
    Case{.line = "AT+QXLOG=2", .running = "3", .trailer = "ERROR"},
    Case{.line = "AT+QXLOG=2", .running = "2", .trailer = "OK"},  // only bit 0 counts
    Case{.line = "AT+QXLOG=5,camera,sensor", .trailer = "ATOK", .events = "kaellog at_mode=0 mask=0x40021\n"},
    Case{.line = "AT+QXLOG=5,adb", .sp = 1, .trailer = "ATOK", .events = "kaellog at_mode=1 mask=0x1\n"},
    // Added, not or-ed: sensor and gps make 64, wifi brings 64 more.
    Case{.line = "AT+QXLOG=5,Sensor,gps,WIFI,bluetooth,audio,modem,qsee", .trailer = "ATOK",
         .events = "kaellog at_mode=0 mask=0xE008085\n"},
    Case{.line = "AT+QXLOG=5,camera,foo", .body = "\r\n\"unknown log name\"\r\n", .trailer = "ATNG"},
    Case{.line = "AT+QXLOG=5", .body = "\r\n\"invalid log name\"\r\n", .trailer = "ATERROR"},
    Case{.line = "AT+QXLOG=6", .trailer = "ATOK"},
    Case{.line = "AT+QXLOG=4", .trailer = "ERROR"},
    Case{.line = "AT+QX_TRG_DUMP=0", .trailer = "ATOK", .events = "sysrq c\n"},
    Case{.line = "AT+QX_TRG_DUMP=0", .remove = "/proc/sysrq-trigger", .body = "\"errno:No such file or directory\"",
         .trailer = "ATNG"},
    Case{.line = "AT+QX_TRG_DUMP=00", .trailer = "ATERROR"}), by_line);
// clang-format on

}  // namespace
