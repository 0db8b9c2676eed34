// The command log: record format, text cut, and rotation at its size boundaries.
#include <regex>

#include "tests/support/in_process.h"

namespace {

constexpr const char *kLog0 = "/cache/recovery/last_atcmd0";
constexpr const char *kLog1 = "/cache/recovery/last_atcmd1";
constexpr size_t kNone = std::string::npos;

// Time-stamped, cut after 60 characters; a text under 2 characters is not logged.
TEST_F(InProcess, RecordIsTimeStampedAndCut) {
    const std::string kStamp = "\\d{4}-\\d{2}-\\d{2} \\d{2}:\\d{2}:\\d{2} ";
    for (auto [len, kept] : {std::pair<size_t, int>{60, 60}, {61, 60}, {2, 2}, {1, 0}}) {  // 0: no record
        box.write(kLog0, "");
        saveCommand2File(std::string(len, 'x').c_str());
        std::string record = kept == 0 ? "" : kStamp + "x{" + std::to_string(kept) + "}\r\n";
        EXPECT_TRUE(std::regex_match(box.read(kLog0), std::regex(record))) << len << ": " << box.read(kLog0);
    }
}

struct RotationCase {
    size_t size0, size1;    // before the record; kNone: the file does not exist
    size_t after0, after1;  // after it
};

class RotationTest : public InProcess, public ::testing::WithParamInterface<RotationCase> {};

// Files switch at 512000 bytes; in the last 100 bytes before the limit the other file goes.
TEST_P(RotationTest, WritingSwitchesFilesAtTheLimit) {
    const RotationCase &c = GetParam();
    if (c.size0 != kNone) box.write(kLog0, std::string(c.size0, '0'));
    if (c.size1 != kNone) box.write(kLog1, std::string(c.size1, '1'));
    saveCommand2File("AT+QXCN=0\r\n\r\nOK\r\n");  // a record of 39 bytes
    auto size = [this](const char *log) { return box.exists(log) ? box.read(log).size() : kNone; };
    EXPECT_EQ(size(kLog0), c.after0);
    EXPECT_EQ(size(kLog1), c.after1);
}

INSTANTIATE_TEST_SUITE_P(Boundaries, RotationTest,
                         ::testing::Values(RotationCase{kNone, kNone, 39, kNone}, RotationCase{511900, 10, 511939, 10},
                                           RotationCase{511901, 10, 511940, kNone},
                                           RotationCase{512000, kNone, 512000, 39},
                                           RotationCase{512000, 511950, kNone, 511989},
                                           RotationCase{512000, 512000, 39, 512000}),
                         [](const auto &i) {
                             auto size = [](size_t s) { return s == kNone ? std::string("None") : std::to_string(s); };
                             return "Log0_" + size(i.param.size0) + "_Log1_" + size(i.param.size1);
                         });

}  // namespace
