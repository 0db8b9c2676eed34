// The daemon as a process: its transports, boot modes and signals on a simulated phone.
#include <fcntl.h>
#include <gtest/gtest.h>
#include <poll.h>
#include <signal.h>
#include <stdlib.h>
#include <sys/socket.h>
#include <termios.h>
#include <unistd.h>

#include <chrono>
#include <filesystem>
#include <thread>

#include "tests/support/daemon.h"

namespace {

const std::string kNotSupported = "\"AT not support\"\r\nERROR\r\n";

// A pseudo-terminal whose slave the daemon opens as one of its serial ports.
struct Pty {
    int master = -1;
    std::string slave;
    Pty(const Sandbox &box, const char *device) {
        master = posix_openpt(O_RDWR | O_NOCTTY);
        grantpt(master);
        unlockpt(master);
        slave = ptsname(master);
        std::filesystem::create_symlink(slave, box.path(device));
        // Held open so that the master does not see a hang-up while the daemon reopens.
        keep = open(slave.c_str(), O_RDWR | O_NOCTTY);
    }
    ~Pty() {
        close(keep);
        close(master);
    }
    int keep = -1;
    void send(const std::string &s) const { ASSERT_EQ(write(master, s.data(), s.size()), (ssize_t)s.size()); }
    speed_t speed() const {
        int fd = open(slave.c_str(), O_RDWR | O_NOCTTY);
        struct termios t {};
        tcgetattr(fd, &t);
        close(fd);
        return cfgetospeed(&t);
    }
};

void sleep_ms(int ms) { std::this_thread::sleep_for(std::chrono::milliseconds(ms)); }

std::string exchange(int fd, const std::string &data, size_t want) {
    send(fd, data.data(), data.size(), MSG_NOSIGNAL);
    return read_some(fd, want);
}

TEST(Daemon, TcpStationGetsItsLineEndingEchoed) {
    Sandbox box;
    Daemon d(box);
    int s = d.connect_tcp();
    ASSERT_GE(s, 0);
    ASSERT_TRUE(d.wait_prop("sys.qrcode.view", "0"));
    std::string a = "AT+QXNOPE=1\r\n\r\n" + kNotSupported;
    EXPECT_EQ(exchange(s, "AT+QXNOPE=1\r\n", a.size()), a);
    // A client that sends the same command twice in one packet is served once.
    EXPECT_EQ(exchange(s, "AT+QXNOPE=1\r\nAT+QXNOPE=1\r\n", a.size() + 1), a);
    std::string glued = "AT+QXNOPE=1AT+QXWLAN=1\r\n\r\n" + kNotSupported;
    EXPECT_EQ(exchange(s, "AT+QXNOPE=1AT+QXWLAN=1\r\n", glued.size()), glued);
    close(s);
    // The station has gone: the hang-up command runs and the next station is awaited.
    ASSERT_TRUE(d.wait_prop("sys.qrcode.view", "1"));
    ASSERT_TRUE(d.wait_log("readline: NULL"));
    for (int i = 0; i < 100 && box.read("/cache/recovery/last_atcmd0").find("AT+QXMT=1,0") == std::string::npos; ++i)
        sleep_ms(20);
    EXPECT_NE(box.read("/cache/recovery/last_atcmd0").find("AT+QXMT=1,0"), std::string::npos);
    int s2 = d.connect_tcp();
    EXPECT_EQ(exchange(s2, "AT+QXNOPE=1\r\n", a.size()), a);
    close(s2);
}

TEST(Daemon, SecondStationWaitsForTheFirst) {
    Sandbox box;
    Daemon d(box);
    int first = d.connect_tcp();
    ASSERT_TRUE(d.wait_prop("sys.qrcode.view", "0"));
    int second = d.connect_tcp();
    ASSERT_GE(second, 0);
    send(second, "AT+QXNOPE=2\r\n", 13, MSG_NOSIGNAL);
    EXPECT_EQ(read_some(second, 1, 300), "");
    close(first);
    std::string a = "AT+QXNOPE=2\r\n\r\n" + kNotSupported;
    EXPECT_EQ(read_some(second, a.size()), a);
    close(second);
}

TEST(Daemon, LocalSocketServesOneCommandPerConnection) {
    Sandbox box;
    Daemon d(box);
    struct {
        std::string sent, echo;
    } cases[] = {
        {"AT+QXNOPE=1", "AT+QXNOPE=1"},
        {"AT+QXNOPE=1\r\n", "AT+QXNOPE=1"},
        {"AT+QXNOPE=" + std::string(190, '7'), "AT+QXNOPE=" + std::string(116, '7')},  // 126 bytes kept
    };
    for (const auto &c : cases) {
        int s = d.connect_local();
        ASSERT_GE(s, 0);
        std::string got = exchange(s, c.sent, 4096);  // read until the daemon closes
        EXPECT_EQ(got, c.echo + "\r\n" + kNotSupported);
        close(s);
    }
}

TEST(Daemon, UsbSerialAssemblesLinesAndReopensAfterHangUp) {
    Sandbox box;
    Pty usb(box, "/dev/ttyGS0");
    Daemon d(box);
    ASSERT_TRUE(d.wait_log("Opened serial port:/dev/ttyGS0"));
    sleep_ms(200);
    usb.send("AT+QX");
    sleep_ms(50);
    usb.send("NOPE=");
    sleep_ms(50);
    usb.send("1\r");
    std::string a = "AT+QXNOPE=1\r\n" + kNotSupported;
    EXPECT_EQ(read_some(usb.master, a.size() + 1, 2000), a);
    EXPECT_EQ(usb.speed(), B38400);  // no UART mode: the line speed is left alone
    usb.send("\r");  // a lone line end is ignored
    EXPECT_EQ(read_some(usb.master, 1, 300), "");

    box.set_prop("sys.qrcode.view", "0");
    usb.send("\x04");  // end of file at the start of a line: the port reads 0
    std::string hangup = "AT+QXMT=1,0\r\n\r\nATOK\r\n";  // nothing was open
    EXPECT_EQ(read_some(usb.master, hangup.size(), 3000), hangup) << d.log();  // the last source was USB
    EXPECT_TRUE(d.wait_log("The FD is reopen successfully"));
    EXPECT_EQ(box.prop("sys.qrcode.view"), "1");
    usb.send("AT+QXNOPE=1\r");
    EXPECT_EQ(read_some(usb.master, a.size()), a);
}

TEST(Daemon, UartServesInConsoleModeAt115200) {
    Sandbox box;
    Pty uart(box, "/dev/ttyMSM0");
    Pty usb(box, "/dev/ttyGS0");
    Daemon d(box, "console=ttyMSM0 console-at=sendNormal");
    ASSERT_TRUE(d.wait_log("Opened serial port:/dev/ttyMSM0"));
    sleep_ms(200);
    EXPECT_EQ(uart.speed(), B115200);
    EXPECT_EQ(usb.speed(), B115200);
    uart.send("#12\x01" "AT+QXNOPE=3\r");  // noise before the command is skipped
    std::string a = "AT+QXNOPE=3\r\n" + kNotSupported;
    EXPECT_EQ(read_some(uart.master, a.size()), a);
}

struct BootCase {
    const char *cmdline;
    int uart, sp;
    const char *factory_log, *assembly;
    bool audio_init;
};

class BootModeTest : public ::testing::TestWithParam<BootCase> {};

TEST_P(BootModeTest, KernelCommandLineSelectsTheMode) {
    const BootCase &c = GetParam();
    Sandbox box;
    Daemon d(box, c.cmdline);
    EXPECT_TRUE(d.wait_log("is_uart_flag=" + std::to_string(c.uart) + ", is_sp=" + std::to_string(c.sp)));
    EXPECT_TRUE(d.wait_prop("sys.factory.assembly_at_mode", c.assembly)) << box.prop("sys.factory.assembly_at_mode");
    EXPECT_EQ(box.prop("sys.factory.log"), c.factory_log);
    EXPECT_EQ(d.log().find("Opened serial port:/dev/ttyMSM0") != std::string::npos, c.uart == 1);
    EXPECT_EQ(box.events().find("audio init_ftm") != std::string::npos, c.audio_init);
}

INSTANTIATE_TEST_SUITE_P(
    Modes, BootModeTest,
    ::testing::Values(BootCase{"console=ttyMSM0", 0, 0, "", "", true},
                      BootCase{"console-at=sendAT quiet", 1, 1, "1", "", false},
                      BootCase{"console-at=sendNormal", 1, 0, "1", "", true},
                      BootCase{"console-at=sendAT_assembly", 0, 1, "1", "2", false}));

TEST(Daemon, AssemblyModeIsEnteredOncePerBoot) {
    Sandbox box;
    {
        Daemon first(box, "console-at=sendAT_assembly");
        EXPECT_TRUE(first.wait_prop("sys.factory.assembly_at_mode", "2"));
    }
    EXPECT_NE(box.events().find("nv write"), std::string::npos);
    // A restart in the same boot resumes: no NV write, and the pending back-panel test runs.
    box.write("/.sim/events.log", "");
    box.set_prop("sys.factory.assembly_at_mode", "1");
    box.write("/cache/recovery/last_ftcmd_sys_adc_test", "current_test=lcm_back_white\n");
    Daemon again(box, "console-at=sendAT_assembly");
    EXPECT_TRUE(again.wait_prop("sys.factory.assembly_at_mode", "2"));
    EXPECT_TRUE(again.wait_log("lcm_back current test autostart!!!"));
    EXPECT_EQ(box.events().find("nv write"), std::string::npos);
    EXPECT_NE(box.read("/cache/recovery/last_atcmd0").find("AT+EDFT_BACK=0,5"), std::string::npos);
}

TEST(Daemon, FactoryLoggingBitOfTheNvRecord) {
    Sandbox box;
    std::string rec(1012, '\0');
    rec[392] = 32;
    box.write("/.sim/nv.bin", rec);
    Daemon d(box);
    EXPECT_EQ(box.prop("sys.factory.log"), "1");
}

TEST(Daemon, FatalSignalsEndWithTheSignalNumber) {
    for (int sig : {SIGTERM, SIGINT, SIGHUP}) {
        Sandbox box;
        Daemon d(box);
        EXPECT_EQ(d.stop(sig), sig);
        EXPECT_TRUE(d.log().find("signal:" + std::to_string(sig)) != std::string::npos);
    }
}

}  // namespace
