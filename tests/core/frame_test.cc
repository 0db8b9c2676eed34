// The answer frame for every ResultCode, and where frames are routed.
#include "tests/support/checks.h"
#include "tests/support/in_process.h"

namespace {

struct FrameCase {
    int result;
    const char *body, *word;  // word nullptr: nothing is written
};

class FrameTest : public InProcess, public ::testing::WithParamInterface<FrameCase> {};

// One row per trailer word (every other code is UNKNOWN); written frames are also logged.
TEST_P(FrameTest, ResultCodeGivesTrailerWord) {
    const FrameCase &c = GetParam();
    writeDataToserialByResponseType("AT+QXCN=0", c.body, c.result);
    EXPECT_EQ(answer(), c.word ? frame("AT+QXCN=0", c.body, c.word) : "");
    EXPECT_EQ(box.exists("/cache/recovery/last_atcmd0"), c.word != nullptr);
}

INSTANTIATE_TEST_SUITE_P(AllCodes, FrameTest,
                         ::testing::Values(FrameCase{0, "\r\n\"v\"\r\n", "OK"}, FrameCase{3, "", "UNKNOWN"},
                                           FrameCase{4, "\"x\"", "ERROR"}, FrameCase{5, "ignored", nullptr},
                                           FrameCase{6, "b", ""}, FrameCase{7, "", "ATOK"}, FrameCase{8, "", "ATNG"},
                                           FrameCase{9, "", "ATERROR"}, FrameCase{101, "", "Not Implement"}),
                         [](const auto &i) { return "Code" + std::to_string(i.param.result); });

TEST_F(InProcess, LocalSocketGetsOneAnswerPerConnection) {
    connect_source(SRC_LOCAL);
    writeDataToSerial("first", 5);
    EXPECT_EQ(g_port.local_client_fd, -1);
    writeDataToSerial("second", 6);  // dropped: "socket is closed!"
    EXPECT_EQ(answer(), "first");
    EXPECT_FALSE(box.exists("/cache/recovery/last_atcmd0"));  // local answers are not logged
}

TEST_F(InProcess, UnknownSourceSendsNothingButLogs) {
    force_current_source(0);
    writeDataToSerial("AT+X=1\r\n\r\nOK\r\n", 14);
    EXPECT_EQ(answer(), "");
    EXPECT_NE(box.read("/cache/recovery/last_atcmd0").find("AT+X=1\r\n\r\nOK\r\n\r\n"), std::string::npos);
}

TEST_F(InProcess, VanishedStationDoesNotKillTheDaemon) {
    close(station);
    station = -1;
    writeDataToSerial("AT+X=1\r\n", 8);  // about ten retries, then silence; no SIGPIPE
}

TEST_F(InProcess, ReadDataFromSerialReadsTheCurrentSource) {
    connect_source(SRC_USB);
    ASSERT_EQ(write(station, "abc", 3), 3);
    char buf[16] = {0};
    EXPECT_EQ(readDataFromSerial(buf, sizeof buf), 3);
    EXPECT_STREQ(buf, "abc");
    force_current_source(SRC_LOCAL);
    EXPECT_EQ(readDataFromSerial(buf, sizeof buf), 0);
}

}  // namespace
