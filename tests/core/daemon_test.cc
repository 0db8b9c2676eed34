// The daemon as a process: its transports, boot modes and signals on a simulated phone.
#include <gtest/gtest.h>
#include <signal.h>
#include <sys/socket.h>
#include <termios.h>
#include <unistd.h>

#include "tests/support/daemon.h"

namespace {

const std::string kNotSupported = "\"AT not support\"\r\nERROR\r\n";

std::string exchange(int fd, const std::string &data, size_t want) {
    send(fd, data.data(), data.size(), MSG_NOSIGNAL);
    return read_some(fd, want);
}

// Echo with the line end, a twin cut, one station at a time, hang-up, and a full-length packet.
TEST(Daemon, TcpStationsAreServedOneAfterTheOther) {
    Sandbox box;
    Daemon d(box);
    int s = d.connect_tcp();
    ASSERT_GE(s, 0);
    ASSERT_TRUE(d.wait_prop("sys.qrcode.view", "0"));
    std::string a = "AT+QXNOPE=1\r\n\r\n" + kNotSupported;
    EXPECT_EQ(exchange(s, "AT+QXNOPE=1\r\nAT+QXNOPE=1\r\n", a.size() + 1), a);

    int second = d.connect_tcp();
    ASSERT_GE(second, 0);
    send(second, "AT+QXNOPE=2\r\n", 13, MSG_NOSIGNAL);
    EXPECT_EQ(read_some(second, 1, 300), "");  // waits for the first station
    close(s);
    // The first station has gone: the hang-up command runs and the second is served.
    ASSERT_TRUE(d.wait_log("readline: NULL"));
    ASSERT_TRUE(d.wait_prop("sys.qrcode.view", "1"));
    std::string a2 = "AT+QXNOPE=2\r\n\r\n" + kNotSupported;
    EXPECT_EQ(read_some(second, a2.size()), a2);
    EXPECT_NE(box.read("/cache/recovery/last_atcmd0").find("AT+QXMT=1,0"), std::string::npos);
    // A byte cut off a full-length read would come back as a line of its own.
    std::string line = "AT+QXRAM=9" + std::string(2037, '9') + "A";
    EXPECT_EQ(exchange(second, line, 2047), line.substr(0, 2047));  // the frame is cut at 2047
    EXPECT_EQ(read_some(second, 1, 700), "");
    close(second);
}

// One command per connection, cut to 126 characters; a client that sends nothing is dropped
// (else the others would wait past the answer's 5 s bound).
TEST(Daemon, LocalSocketServesOneCommandPerConnection) {
    Sandbox box;
    Daemon d(box);
    int idle = d.connect_local();  // connects and never sends
    ASSERT_GE(idle, 0);
    for (auto [sent, echo] : {std::pair<std::string, std::string>{"AT+QXNOPE=1\r\n", "AT+QXNOPE=1"},
                              {"AT+QXNOPE=" + std::string(190, '7'), "AT+QXNOPE=" + std::string(116, '7')}})
        EXPECT_EQ(d.ask_local(sent), echo + "\r\n" + kNotSupported);
    EXPECT_EQ(read_some(idle, 1, 1000), "");  // closed without an answer
    EXPECT_TRUE(d.wait_log("recv error"));
    close(idle);
}

// Pieces pushed mid-line make one line; end of file reopens the port after the hang-up.
TEST(Daemon, UsbSerialJoinsPiecesAndReopensAfterHangUp) {
    Sandbox box;
    Pty usb(box, "/dev/ttyGS0");
    Daemon d(box);
    ASSERT_TRUE(usb.ready());
    ASSERT_TRUE(usb.send("AT+QXNO\x04") && usb.send("PE=j\x04") && usb.send("oined\r"));
    std::string a = "AT+QXNOPE=joined\r\n" + kNotSupported;
    EXPECT_EQ(read_some(usb.master, a.size() + 1, 3000), a);
    ASSERT_TRUE(usb.send("\r"));  // a lone line end is ignored
    EXPECT_EQ(read_some(usb.master, 1, 300), "");

    box.set_prop("sys.qrcode.view", "0");
    ASSERT_TRUE(usb.send("\x04"));  // end of file at the start of a line: the port reads 0
    std::string hangup = "AT+QXMT=1,0\r\n\r\nATOK\r\n";  // on the last source; nothing was open
    EXPECT_EQ(read_some(usb.master, hangup.size(), 3000), hangup) << d.log();
    EXPECT_TRUE(d.wait_log("The FD is reopen successfully"));
    EXPECT_EQ(box.prop("sys.qrcode.view"), "1");
    ASSERT_TRUE(usb.send("AT+QXNOPE=1\r"));
    a = "AT+QXNOPE=1\r\n" + kNotSupported;
    EXPECT_EQ(read_some(usb.master, a.size()), a);
}

struct BootCase {
    const char *name, *cmdline;
    int uart, sp;
    const char *factory_log, *assembly;
    bool audio_init, nv_write;
};

class BootModeTest : public ::testing::TestWithParam<BootCase> {};

// console-at= picks UART service and its line speed, the sp flag, the log property, assembly
// mode (cleared in the NV record) and audio start.
TEST_P(BootModeTest, KernelCommandLineSelectsTheMode) {
    const BootCase &c = GetParam();
    Sandbox box;
    Pty uart(box, "/dev/ttyMSM0");
    Pty usb(box, "/dev/ttyGS0");
    Daemon d(box, c.cmdline);
    EXPECT_TRUE(d.wait_log("is_uart_flag=" + std::to_string(c.uart) + ", is_sp=" + std::to_string(c.sp)));
    EXPECT_TRUE(d.wait_prop("sys.factory.assembly_at_mode", c.assembly)) << box.prop("sys.factory.assembly_at_mode");
    EXPECT_TRUE(*c.factory_log == '\0' || d.wait_prop("sys.factory.log", c.factory_log));  // set last
    EXPECT_EQ(box.prop("sys.factory.log"), c.factory_log);
    ASSERT_TRUE(usb.ready());
    EXPECT_EQ(usb.speed(), c.uart ? B115200 : B38400);  // without UART service the speed is left alone
    if (c.uart == 1) {
        ASSERT_TRUE(uart.ready());
        EXPECT_EQ(uart.speed(), B115200);
    } else {
        EXPECT_EQ(d.log().find("Opened serial port:/dev/ttyMSM0"), std::string::npos);
    }
    EXPECT_EQ(box.events().find("audio init_ftm") != std::string::npos, c.audio_init);
    EXPECT_EQ(box.events().find("nv write") != std::string::npos, c.nv_write);
}

INSTANTIATE_TEST_SUITE_P(Modes, BootModeTest,
                         ::testing::Values(BootCase{"Plain", "console=ttyMSM0", 0, 0, "", "", true, false},
                                           BootCase{"SendAt", "console-at=sendAT quiet", 1, 1, "1", "", false, false},
                                           BootCase{"SendNormal", "console-at=sendNormal", 1, 0, "1", "", true, false},
                                           BootCase{"SendAtAssembly", "console-at=sendAT_assembly", 0, 1, "1", "2",
                                                    false, true}),
                         [](const auto &i) { return std::string(i.param.name); });

// A restart in the same boot (the mode already entered) resumes: no NV write, and the pending
// back-panel test runs.
TEST(Daemon, AssemblyModeIsEnteredOncePerBoot) {
    Sandbox box;
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
        EXPECT_NE(d.log().find("signal:" + std::to_string(sig)), std::string::npos);
    }
}

}  // namespace
