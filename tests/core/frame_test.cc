// Where frames are routed, by the source of the line being served.
#include "tests/support/in_process.h"

namespace {

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
