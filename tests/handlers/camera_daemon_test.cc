// Camera and flash commands through the real daemon: the long flash timers outlast their
// answer on the station's TCP connection, the local socket carries a multi-line result,
// and the AT-console boot mode refuses the infrared test.
#include <sys/socket.h>
#include <unistd.h>

#include <chrono>
#include <string>
#include <thread>
#include <vector>

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

// The flash driver's records ("<node> <level>" with their times), once there are count
// of them or limit_ms have passed.
std::vector<Event> wait_flashes(const Sandbox &box, size_t count, int limit_ms) {
    const auto since = Clock::now();
    std::vector<Event> got;
    for (;;) {
        got.clear();
        for (const Event &e : box.event_list())
            if (e.kind == "flash") got.push_back(e);
        if (got.size() >= count || Clock::now() - since > std::chrono::milliseconds(limit_ms)) return got;
        std::this_thread::sleep_for(std::chrono::milliseconds(20));
    }
}

TEST(CameraDaemon, FrontTorchTimerIsCappedAtTenSecondsAndClosesTheRearFlash) {
    Sandbox box;
    Daemon d(box);
    int s = d.connect_tcp();
    ASSERT_GE(s, 0);
    const std::string frame = "AT+FLAMP=0,1,20000\r\n\r\nOK\r\n";
    EXPECT_EQ(exchange(s, "AT+FLAMP=0,1,20000", frame.size()), frame);
    // The station is served while the timer runs.
    const std::string pulse = "AT+FLAMP=1,1,2000\r\n\r\nOK\r\n";
    EXPECT_EQ(exchange(s, "AT+FLAMP=1,1,2000", pulse.size()), pulse);
    std::vector<Event> f = wait_flashes(box, 4, 14000);
    ASSERT_EQ(f.size(), 4u) << box.events();
    EXPECT_EQ(f[0].detail, "EXT_FRONT_FLASH_LED 75");
    EXPECT_EQ(f[1].detail, "EXT_REAR_FLASH_LED1 900");
    EXPECT_EQ(f[2].detail, "EXT_REAR_FLASH_LED1 0");
    EXPECT_EQ(f[3].detail, "EXT_REAR_FLASH_LED1 0");
    EXPECT_GE(f[2].ms - f[1].ms, 499);  // the pulse's 2000 ms are cut to 500
    EXPECT_LT(f[2].ms - f[1].ms, 1500);
    EXPECT_GE(f[3].ms - f[0].ms, 9999);  // the torch's 20000 ms are cut to 10000
    EXPECT_LT(f[3].ms - f[0].ms, 11000);
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
