// Camera and flash commands through the real daemon: the long flash timers outlast their
// answer on the station's TCP connection, the local socket carries a multi-line result,
// and the AT-console boot mode refuses the infrared test.
#include <sys/socket.h>
#include <unistd.h>

#include <chrono>
#include <string>
#include <thread>

#include "tests/support/daemon.h"
#include "tests/support/sandbox.h"

#include <gtest/gtest.h>

namespace {

using Clock = std::chrono::steady_clock;

// Stations send TCP lines bare: a line end sent with them is echoed back.
std::string exchange(int fd, const std::string &line, size_t want) {
    send(fd, line.data(), line.size(), MSG_NOSIGNAL);
    return read_some(fd, want);
}

// Milliseconds from since until node reads text, or -1 after limit_ms.
long long wait_node(const Sandbox &box, const char *node, const std::string &text, Clock::time_point since, int limit_ms) {
    while (Clock::now() - since < std::chrono::milliseconds(limit_ms)) {
        if (box.read(node) == text)
            return std::chrono::duration_cast<std::chrono::milliseconds>(Clock::now() - since).count();
        std::this_thread::sleep_for(std::chrono::milliseconds(10));
    }
    return -1;
}

TEST(CameraDaemon, FrontTorchTimerIsCappedAtTenSecondsAndClosesTheRearFlash) {
    Sandbox box;
    box.write("/sys/ext_led/EXT_REAR_FLASH_LED1", "75");
    Daemon d(box);
    int s = d.connect_tcp();
    ASSERT_GE(s, 0);
    const std::string frame = "AT+FLAMP=0,1,20000\r\n\r\nOK\r\n";
    const auto start = Clock::now();
    EXPECT_EQ(exchange(s, "AT+FLAMP=0,1,20000", frame.size()), frame);
    EXPECT_EQ(box.read("/sys/ext_led/EXT_FRONT_FLASH_LED"), "75");
    // The station is served while the timer runs.
    const std::string pulse = "AT+FLAMP=1,1,2000\r\n\r\nOK\r\n";
    const auto pulse_start = Clock::now();
    EXPECT_EQ(exchange(s, "AT+FLAMP=1,1,2000", pulse.size()), pulse);
    EXPECT_EQ(box.read("/sys/ext_led/EXT_REAR_FLASH_LED1"), "900");
    long long pulse_ms = wait_node(box, "/sys/ext_led/EXT_REAR_FLASH_LED1", "0", pulse_start, 3000);
    EXPECT_GE(pulse_ms, 490);
    EXPECT_LT(pulse_ms, 2000);
    box.write("/sys/ext_led/EXT_REAR_FLASH_LED1", "75");
    long long torch_ms = wait_node(box, "/sys/ext_led/EXT_REAR_FLASH_LED1", "0", start, 14000);
    EXPECT_GE(torch_ms, 9990);
    EXPECT_LT(torch_ms, 12000);
    EXPECT_EQ(box.read("/sys/ext_led/EXT_FRONT_FLASH_LED"), "75") << "the front torch stays on until AT+FLAMP=0,0";
    const std::string off = "AT+FLAMP=0,0\r\n\r\nOK\r\n";
    EXPECT_EQ(exchange(s, "AT+FLAMP=0,0", off.size()), off);
    EXPECT_EQ(box.read("/sys/ext_led/EXT_FRONT_FLASH_LED"), "0");
    close(s);
}

TEST(CameraDaemon, SelfTestResultsOverTheLocalSocket) {
    Sandbox box;
    Daemon d(box);
    int s = -1;
    for (int tries = 0; tries < 100 && s < 0; ++tries) {  // the local socket opens after the TCP service
        s = d.connect_local();
        if (s < 0) std::this_thread::sleep_for(std::chrono::milliseconds(20));
    }
    ASSERT_GE(s, 0);
    EXPECT_EQ(exchange(s, "AT+QX_CCM_SLTS=3,rear,main,0", 4096),  // read until the daemon closes
              "AT+QX_CCM_SLTS=3,rear,main,0\r\n\r\n\"+af:1\"\r\n\r\n\"+ae:0\"\r\n\r\nATOK\r\n");
    close(s);
    EXPECT_NE(box.events().find("camera eng_AT_camera#rear#main#auto_test_get_result#params 0 -> success"),
              std::string::npos);
}

TEST(CameraDaemon, AtConsoleModeRefusesTheInfraredTest) {
    Sandbox box;
    Daemon d(box, "console-at=sendAT_assembly");
    int s = d.connect_tcp();
    ASSERT_GE(s, 0);
    for (const char *line : {"AT+QX_FLED_INF=1", "AT+QX_FLED_INF=2"}) {
        const std::string frame = std::string(line) + "\r\n\r\n\"AT mode not support\"\r\n\r\nATERROR\r\n";
        EXPECT_EQ(exchange(s, line, frame.size()), frame);
    }
    close(s);
    EXPECT_EQ(box.events().find("infrared_fill_light"), std::string::npos);
}

}  // namespace
