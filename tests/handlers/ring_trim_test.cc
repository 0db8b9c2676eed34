// The LED ring's trim table (default restore, white-balance and colour steps): the frame, every line loaded
// into the two drivers in order, and what the registers hold afterwards.
#include <cctype>
#include <cstdio>
#include <filesystem>
#include <functional>
#include <map>

#include "handlers/lights.h"
#include "tests/support/in_process.h"

namespace {

constexpr char kTitle[] = "aw22xxx_led trim registers:";
const char *const kTrimA = "/sys/class/leds/aw22xxx_led_a/trim";
const char *const kTrimB = "/sys/class/leds/aw22xxx_led_b/trim";
const char *const kDataA = "/sys/class/leds/aw22xxx_led_a/trim_data";
const char *const kDataB = "/sys/class/leds/aw22xxx_led_b/trim_data";

using Table = std::vector<int>;
const Table kDefault = {
    0xff, 0xff, 0xff, 0xff, 0xff, 0xff, 0x0f, 0x00, 0x00, 0xf3, 0x3e, 0x00, 0x49, 0xff, 0x39, 0xe3, 0x36, 0x26, 0x05,
    0x00, 0x0a, 0x88, 0x00, 0x02, 0x05, 0x40, 0xff, 0xff, 0xff, 0xff, 0x0f, 0x00, 0x00, 0xf3, 0x3e, 0x00, 0x49, 0xff,
    0x36, 0x7b, 0x32, 0x3a, 0x08, 0x00, 0x07, 0x49, 0x02, 0x01, 0x04, 0x2d};

// The calibration base (entries 0 and 1 at 0x18 and 0x06) with some entries changed.
Table base(const std::map<int, int> &changes = {}) {
    Table t = kDefault;
    t[0] = 0x18;
    t[1] = 0x06;
    for (auto [i, v] : changes) t[i] = v;
    return t;
}

std::vector<int> range(int first, int last, std::vector<int> out = {}) {
    for (int i = first; i <= last; ++i) out.push_back(i);
    return out;
}

// The given entries as a driver reads them back, "0x%02x," each.
std::string entries(const Table &t, const std::vector<int> &indexes = range(0, 49)) {
    std::string out;
    char e[8];
    for (int i : indexes) out.append(e, snprintf(e, sizeof e, "0x%02x,", t[i]));
    return out;
}

// The events of loading the given entries into a and b, index by index, and starting both.
std::string loads(const Table &t, const std::vector<int> &indexes, bool started = true) {
    std::string out;
    char line[64];
    for (int i : indexes)
        for (char d : {'a', 'b'})
            out.append(line, snprintf(line, sizeof line, "ring %c/trim_data %x 0x%02x\n", d, i, t[i]));
    return started ? out + "ring a/trim 1\nring b/trim 1\n" : out;
}

using Setup = std::function<void(const Sandbox &)>;

struct Case {
    std::string name;
    int mode;  // the ring mode before the line
    std::string line;
    Setup setup;
    std::string body, word, events;
    Table registers = kDefault;  // what driver a's trim registers hold afterwards
};

class RingTrim : public InProcess, public ::testing::WithParamInterface<Case> {
protected:
    void TearDown() override {
        g_ring_mode = 0;
        InProcess::TearDown();
    }
};

TEST_P(RingTrim, Answers) {
    const Case &c = GetParam();
    g_ring_mode = c.mode;
    if (c.setup) c.setup(box);
    const std::string frame = c.line + "\r\n" + c.body + "\r\n" + c.word + "\r\n";
    EXPECT_EQ(serve(c.line, SRC_TCP, frame.size()), frame);
    EXPECT_EQ(box.events(), c.events);
    if (box.exists(kTrimA)) {
        EXPECT_EQ(box.read(kTrimA), kTitle + entries(c.registers) + "\n");
    }
}

const std::string kBalance = "AT+QX_RING_LGT=4,", kNeutral = kBalance + "0.3,0.3,1,0.3,0.3,1";
// 36 readings of 0.1, except readings 0 and 3 at 1.0.
const std::string kColour = [] {
    std::string line = "AT+QX_RING_LGT=8";
    for (int i = 0; i < 36; ++i) line += (i == 0 || i == 3) ? ",1.0" : ",0.1";
    return line;
}();
// A white-balance or colour step that the drivers took: the entries loaded, and the registers.
Case taken(const char *name, int mode, const std::string &line, const Table &t, const std::vector<int> &indexes) {
    return Case{name, mode, line, nullptr, "", "ATOK", loads(t, indexes), t};
}
Case balance(const char *name, const char *readings, const Table &t) {
    return taken(name, 0, kBalance + readings, t, range(0, 25));
}

// What a driver node reads back, or the node missing.
Setup reads(const char *node, const std::string &text) { return [=](const Sandbox &b) { b.sequence(node, {text}); }; }
Setup gone(const char *node) { return [=](const Sandbox &b) { std::filesystem::remove(b.path(node)); }; }
const Setup b_registers_stale = reads(kTrimB, kTitle + entries(kDefault)), b_data_missing = gone(kDataB);
const Setup a_registers_unreadable = reads(kTrimA, "(missing)"), a_data_unreadable = reads(kDataA, "(missing)");
const Setup a_data_without_last_comma = reads(kDataA, entries(kDefault).substr(0, 249)), b_trim_missing = gone(kTrimB);
const Setup b_data_wrong_last = reads(kDataB, entries(kDefault).substr(0, 245) + "0x2c,");
const Setup a_data_upper_case_in_lines = [](const Sandbox &b) {
    std::string text;
    for (int i = 0; i < 50; i += 10) text += entries(kDefault, range(i, i + 9)) + "\n";
    for (char &ch : text) ch = static_cast<char>(toupper(ch));
    b.sequence(kDataA, {text});
};
// The drivers hold a calibrated table that the restore must replace.
void calibrated(const Sandbox &b) {
    for (const char *node : {kDataA, kDataB}) b.write(node, entries(base({{14, 0x48}})) + "\n");
}

const std::string kRestore = "AT+QX_RING_LGT=5", kCaliProp = "setprop sys.ring_light.cali.para=1\n";
const std::string kRestored = kCaliProp + loads(kDefault, range(0, 49));
const std::string kInvalid = "\"invalid parameter\"", kMismatchB = "\r\n\"cali trim_data b mismatch\"\r\n";
const std::string kNoDataB = "\r\n\"write the trim_data b fail\"\r\n", kBalanced = loads(base(), range(0, 25));
const std::string kFirstOnlyA = kCaliProp + "ring a/trim_data 0 0xff\n";  // trim_data b refused the first entry

INSTANTIATE_TEST_SUITE_P(Ring, RingTrim, ::testing::Values(
    // White balance: entry 14 from readings 1 and 4, entry 15 from readings 2 and 5. The
    // single-precision divisors truncate 0.01 / 0.002 to 4 and 0.006 / 0.0003 to 19.
    balance("BalanceUp", "0.3,0.3015,1,0.31,0.3,1", base({{14, 0x3d}})),
    balance("BalanceDownAndBlueUp", "0.31,0.3,1,0.3,0.3060,1", base({{14, 0x35}, {15, 0xf6}})),
    balance("BalanceMiddleLowersBlue", "0.3,0.3120,1,0.3,0.3,1", base({{15, 0xbc}})),
    // Past 0.03 the step is capped at 15; past 0.024 the entry gains 80, held at 0xff.
    balance("BalanceCappedAndClamped", "0.3,0.33,1,0.4,0.3,1", base({{14, 0x48}, {15, 0xff}})),
    balance("BalanceCappedDownBlueLeft", "0.4,0.3,1,0.3,0.33,1", base({{14, 0x2a}})),
    Case{"BalanceFiveValues", 0, kBalance + "0.3,0.3,1,0.3,0.3", nullptr, kInvalid, "ATERROR", ""},
    Case{"BalanceSevenValues", 0, kNeutral + ",1", nullptr, kInvalid, "ATERROR", ""},
    Case{"BalanceZero", 0, kBalance + "0.3,0.3,0,0.3,0.3,1", nullptr, kInvalid, "ATERROR", ""},
    Case{"BalanceNaN", 0, kBalance + "0.3,nan,1,0.3,0.3,1", nullptr, kInvalid, "ATERROR", ""},
    Case{"BalanceStaleRegistersB", 0, kNeutral, b_registers_stale, kMismatchB, "ATNG", kBalanced, base()},
    Case{"BalanceRegistersUnreadable", 0, kNeutral, a_registers_unreadable, "", "ATNG", kBalanced},
    Case{"BalanceNoTrimDataB", 0, kNeutral, b_data_missing, kNoDataB, "ATERROR", "ring a/trim_data 0 0x18\n"},
    Case{"BalanceNoTrimB", 0, kNeutral, b_trim_missing, "\r\n\"write the trim b fail\"\r\n", "ATERROR",
         loads(base(), range(0, 25), false) + "ring a/trim 1\n", base()},
    // The default restore loads all 50 entries; trim_data reads back 249 characters, any case, lines joined.
    Case{"Restore", 0, kRestore, calibrated, "", "ATOK", kRestored},
    Case{"RestoreReadBackUpperCaseInLines", 0, kRestore, a_data_upper_case_in_lines, "", "ATOK", kRestored},
    Case{"RestoreComparesOnly249", 0, kRestore, a_data_without_last_comma, "", "ATOK", kRestored},
    Case{"RestoreMismatchB", 0, kRestore, b_data_wrong_last, kMismatchB, "ATNG", kRestored},
    Case{"RestoreUnreadable", 0, kRestore, a_data_unreadable, "", "ATNG", kRestored},
    Case{"RestoreNoTrimDataB", 0, kRestore, b_data_missing, kNoDataB, "ATERROR", kFirstOnlyA},
    // The colour step adjusts the half the mode lit: readings 0 + 3 and 13 + 16 exceed
    // their limits (one down), every other pair is below (one up); only that half is loaded.
    taken("ColourMode3", 3, kColour,
          base({{39, 0x7c}, {40, 0x33}, {42, 0x07}, {43, 0x01}, {45, 0x4a}, {46, 0x03}, {48, 0x05}, {49, 0x2c}}),
          range(26, 49, {0, 1})),
    taken("ColourMode7", 7, kColour,
          base({{15, 0xe4}, {16, 0x37}, {18, 0x04}, {19, 0x01}, {21, 0x89}, {22, 0x01}, {24, 0x06}, {25, 0x3f}}),
          range(0, 25)),
    taken("ColourOtherModeLoadsBase", 0, kColour, base(), range(0, 49)),
    Case{"ColourAfterRestore", -2, kColour, nullptr, "\"brightness not set\"", "ATERROR", ""},
    Case{"ColourBeforeCalibration", -1, kColour, nullptr, "\"calibration not set\"", "ATERROR", ""},
    Case{"Colour35Readings", 3, kColour.substr(0, kColour.size() - 4), nullptr, kInvalid, "ATERROR", ""}),
    [](const ::testing::TestParamInfo<Case> &info) { return info.param.name; });

// The modes come from the forms that light the ring and restore the defaults.
TEST_F(InProcess, RingColourStepFollowsTheModeSetByTheOtherForms) {
    EXPECT_EQ(serve(kRestore), kRestore + "\r\n\r\nATOK\r\n");
    EXPECT_EQ(serve(kColour), kColour + "\r\n\"brightness not set\"\r\nATERROR\r\n");
    EXPECT_EQ(serve("AT+QX_RING_LGT=0,1"), "AT+QX_RING_LGT=0,1\r\n\r\nATNG\r\n");
    EXPECT_EQ(serve(kColour), kColour + "\r\n\"calibration not set\"\r\nATERROR\r\n");
    EXPECT_EQ(serve("AT+QX_RING_LGT=7"), "AT+QX_RING_LGT=7\r\n\r\nATNG\r\n");
    EXPECT_EQ(serve(kColour), kColour + "\r\n\r\nATOK\r\n");
    EXPECT_NE(box.read(kTrimA).find("0x07,0x01,0x07,0x4a,0x03,0x01,0x05,0x2c,"), std::string::npos) << box.read(kTrimA);
    g_ring_mode = 0;
}

}  // namespace
