// The answer frame for every ResultCode, and where frames are routed.
#include <fcntl.h>

#include <cstdlib>

#include "tests/support/in_process.h"
#include "tests/support/test_name.h"

namespace {

struct FrameCase {
    int result;
    const char *body;
    const char *frame;  // nullptr: nothing at all
};

class FrameTest : public InProcess, public ::testing::WithParamInterface<FrameCase> {};

TEST_P(FrameTest, ResultCodeGivesTrailerWord) {
    const FrameCase &c = GetParam();
    writeDataToserialByResponseType("AT+QXCN=0", c.body, c.result);
    EXPECT_EQ(answer(), c.frame ? c.frame : "");
    // Nothing written means nothing logged either.
    EXPECT_EQ(box.exists("/cache/recovery/last_atcmd0"), c.frame != nullptr);
}

INSTANTIATE_TEST_SUITE_P(
    AllCodes, FrameTest,
    ::testing::Values(FrameCase{0, "1", "AT+QXCN=0\r\n1\r\nOK\r\n"},
                      FrameCase{0, "", "AT+QXCN=0\r\n\r\nOK\r\n"},
                      FrameCase{0, "\r\n\"v\"\r\n", "AT+QXCN=0\r\n\r\n\"v\"\r\n\r\nOK\r\n"},
                      FrameCase{1, "", "AT+QXCN=0\r\n\r\nUNKNOWN\r\n"},
                      FrameCase{2, "", "AT+QXCN=0\r\n\r\nUNKNOWN\r\n"},
                      FrameCase{3, "", "AT+QXCN=0\r\n\r\nUNKNOWN\r\n"},
                      FrameCase{4, "\"x\"", "AT+QXCN=0\r\n\"x\"\r\nERROR\r\n"},
                      FrameCase{5, "ignored", nullptr},
                      FrameCase{6, "b", "AT+QXCN=0\r\nb\r\n\r\n"},
                      FrameCase{7, "", "AT+QXCN=0\r\n\r\nATOK\r\n"},
                      FrameCase{8, "", "AT+QXCN=0\r\n\r\nATNG\r\n"},
                      FrameCase{9, "", "AT+QXCN=0\r\n\r\nATERROR\r\n"},
                      FrameCase{101, "", "AT+QXCN=0\r\n\r\nNot Implement\r\n"},
                      FrameCase{42, "", "AT+QXCN=0\r\n\r\nUNKNOWN\r\n"},
                      FrameCase{-1, "", "AT+QXCN=0\r\n\r\nUNKNOWN\r\n"}),
    [](const ::testing::TestParamInfo<FrameCase> &i) {
        return "Code" + std::string(i.param.result < 0 ? "Minus" : "") + std::to_string(std::abs(i.param.result)) +
               "_" + std::to_string(i.index);
    });

TEST_F(InProcess, LongFrameIsCutAt2047Bytes) {
    std::string body(3000, 'b');
    writeDataToserialByResponseType("AT+QXCN=0", body.c_str(), 0);
    std::string got = answer(4096);
    ASSERT_EQ(got.size(), 2047u);
    EXPECT_EQ(got.substr(0, 11), "AT+QXCN=0\r\n");
    EXPECT_EQ(got.back(), 'b');
}

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
    SUCCEED();
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
