// The command log: record format, text cut, and rotation at its size boundaries.
#include <regex>

#include "tests/support/in_process.h"

namespace {

constexpr const char *kLog0 = "/cache/recovery/last_atcmd0";
constexpr const char *kLog1 = "/cache/recovery/last_atcmd1";
constexpr size_t kNone = std::string::npos;

// Time-stamped, cut after 60 characters; a text under 2 characters is not logged.
TEST_F(InProcess, RecordIsTimeStampedAndCut) {
    for (auto [len, kept] : {std::pair<size_t, long>{60, 60}, {61, 60}, {1, -1}}) {
        box.write(kLog0, "");
        saveCommand2File(std::string(len, 'x').c_str());
        std::string rec = box.read(kLog0);
        std::smatch m;
        if (kept < 0) {
            EXPECT_EQ(rec, "");
            continue;
        }
        ASSERT_TRUE(std::regex_match(rec, m, std::regex("\\d{4}-\\d{2}-\\d{2} \\d{2}:\\d{2}:\\d{2} (x*)\r\n"))) << rec;
        EXPECT_EQ(m[1].length(), kept) << len;
    }
}

struct RotationCase {
    size_t size0, size1;  // before the record; kNone: the file does not exist
    bool to0;             // where the record lands
    bool log0_deleted_first, log1_deleted, log0_deleted;
};

class RotationTest : public InProcess, public ::testing::WithParamInterface<RotationCase> {};

// Files switch at 512000 bytes; in the last 100 bytes before the limit the other file goes.
TEST_P(RotationTest, WritingSwitchesFilesAtTheLimit) {
    const RotationCase &c = GetParam();
    if (c.size0 != kNone) box.write(kLog0, std::string(c.size0, '0'));
    if (c.size1 != kNone) box.write(kLog1, std::string(c.size1, '1'));
    saveCommand2File("AT+QXCN=0\r\n\r\nOK\r\n");
    auto size = [](size_t s) { return s == kNone ? 0 : s; };
    if (c.to0) {
        EXPECT_EQ(box.read(kLog0).size(), (c.log0_deleted_first ? 0 : size(c.size0)) + 39);
        EXPECT_EQ(box.exists(kLog1), !c.log1_deleted);
    } else {
        EXPECT_EQ(box.read(kLog1).size(), size(c.size1) + 39);
        EXPECT_EQ(box.exists(kLog0), !c.log0_deleted);
    }
}

INSTANTIATE_TEST_SUITE_P(Boundaries, RotationTest,
                         ::testing::Values(RotationCase{kNone, kNone, true, false, true, false},
                                           RotationCase{511900, 10, true, false, false, false},
                                           RotationCase{511901, 10, true, false, true, false},
                                           RotationCase{512000, kNone, false, false, false, false},
                                           RotationCase{512000, 511950, false, false, false, true},
                                           RotationCase{512000, 512000, true, true, false, false}),
                         [](const auto &i) {
                             auto size = [](size_t s) { return s == kNone ? std::string("None") : std::to_string(s); };
                             return "Log0_" + size(i.param.size0) + "_Log1_" + size(i.param.size1);
                         });

}  // namespace
