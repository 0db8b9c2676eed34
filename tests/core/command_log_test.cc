// The command log: record format, text cut, and rotation at its size boundaries.
#include <regex>

#include "tests/support/in_process.h"

namespace {

constexpr const char *kLog0 = "/cache/recovery/last_atcmd0";
constexpr const char *kLog1 = "/cache/recovery/last_atcmd1";

TEST_F(InProcess, RecordIsTimeStampedAndCut) {
    struct {
        size_t len;
        size_t kept;
    } cases[] = {{50, 50}, {51, 51}, {60, 60}, {61, 60}, {100, 60}};
    for (auto c : cases) {
        box.write(kLog0, "");
        saveCommand2File(std::string(c.len, 'x').c_str());
        std::string rec = box.read(kLog0);
        std::smatch m;
        ASSERT_TRUE(std::regex_match(rec, m, std::regex("\\d{4}-\\d{2}-\\d{2} \\d{2}:\\d{2}:\\d{2} (x*)\r\n")))
            << rec;
        EXPECT_EQ(m[1].length(), static_cast<long>(c.kept)) << c.len;
    }
    box.write(kLog0, "");
    saveCommand2File("x");  // shorter than 2 characters: nothing
    EXPECT_EQ(box.read(kLog0), "");
}

struct RotationCase {
    size_t size0, size1;  // before the record; npos: the file does not exist
    bool to0;             // where the record lands
    bool log0_deleted_first, log1_deleted, log0_deleted;
};

class RotationTest : public InProcess, public ::testing::WithParamInterface<RotationCase> {};

TEST_P(RotationTest, WritingSwitchesFilesAtTheLimit) {
    const RotationCase &c = GetParam();
    if (c.size0 != std::string::npos) box.write(kLog0, std::string(c.size0, '0'));
    if (c.size1 != std::string::npos) box.write(kLog1, std::string(c.size1, '1'));
    saveCommand2File("AT+QXCN=0\r\n\r\nOK\r\n");
    std::string log0 = box.read(kLog0), log1 = box.read(kLog1);
    if (c.to0) {
        EXPECT_EQ(log0.size(), (c.log0_deleted_first || c.size0 == std::string::npos ? 0 : c.size0) + 39) << log0.substr(0, 40);
        EXPECT_EQ(box.exists(kLog1), !c.log1_deleted);
    } else {
        EXPECT_EQ(log1.size(), (c.size1 == std::string::npos ? 0 : c.size1) + 39);
        EXPECT_EQ(box.exists(kLog0), !c.log0_deleted);
    }
}

constexpr size_t kNone = std::string::npos;
INSTANTIATE_TEST_SUITE_P(
    Boundaries, RotationTest,
    ::testing::Values(RotationCase{kNone, kNone, true, false, true, false},
                      RotationCase{511900, 10, true, false, false, false},  // not yet in the margin
                      RotationCase{511901, 10, true, false, true, false},   // margin: drop the other
                      RotationCase{511999, 10, true, false, true, false},
                      RotationCase{512000, kNone, false, false, false, false},  // switch to a fresh file 1
                      RotationCase{512000, 511950, false, false, false, true},
                      RotationCase{512000, 512000, true, true, false, false}),  // both full: 0 anew
    [](const ::testing::TestParamInfo<RotationCase> &i) {
        auto size = [](size_t s) { return s == kNone ? std::string("None") : std::to_string(s); };
        return "Log0_" + size(i.param.size0) + "_Log1_" + size(i.param.size1);
    });

}  // namespace
