// Several stations at once, stations that misbehave, and ports that fail: each station
// gets exactly its own answers, and none can stop the others for long.
#include <gtest/gtest.h>
#include <netinet/in.h>
#include <poll.h>
#include <sys/socket.h>
#include <unistd.h>

#include <atomic>
#include <chrono>
#include <functional>
#include <thread>
#include <vector>

#include "tests/support/daemon.h"

namespace {

using Clock = std::chrono::steady_clock;
const std::string kNotSupported = "\r\n\"AT not support\"\r\nERROR\r\n";

double seconds_since(Clock::time_point t) { return std::chrono::duration<double>(Clock::now() - t).count(); }

size_t count(const std::string &text, const std::string &what) {
    size_t n = 0;
    for (size_t at = text.find(what); at != std::string::npos; at = text.find(what, at + what.size())) ++n;
    return n;
}

// Waits until the daemon reads the port: probes until one is answered, then drains.
bool serial_ready(const Pty &p) {
    for (int i = 0; i < 50; ++i) {
        if (!p.send("AT+QXNOPE=probe\r")) return false;
        if (!read_some(p.master, 1, 200).empty()) {
            read_some(p.master, 1 << 16, 300);
            return true;
        }
    }
    return false;
}

// One station's conversation: sends each line, reads its answer, keeps what differed.
struct Station {
    std::string name;
    std::function<std::string(const std::string &)> ask;  // line -> answer
    std::vector<std::string> wrong;
};

std::string local_ask(const Daemon &d, const std::string &line) {
    int s = d.connect_local();
    if (s < 0) return "(no connection)";
    send(s, line.data(), line.size(), MSG_NOSIGNAL);
    std::string got = read_some(s, 1 << 16, 5000);  // the daemon closes after its answer
    close(s);
    return got;
}

TEST(Stations, FourStationsAtOnceEachGetTheirOwnAnswers) {
    Sandbox box;
    Pty uart(box, "/dev/ttyMSM0");
    Pty usb(box, "/dev/ttyGS0");
    Daemon d(box, "console-at=sendNormal");
    ASSERT_TRUE(serial_ready(uart));
    ASSERT_TRUE(serial_ready(usb));
    int tcp = d.connect_tcp();
    ASSERT_GE(tcp, 0);
    ASSERT_TRUE(d.wait_prop("sys.qrcode.view", "0"));

    auto serial = [](const Pty &p) {
        return [&p](const std::string &line) {
            p.send(line + "\r");
            return read_some(p.master, line.size() + kNotSupported.size(), 5000);
        };
    };
    std::vector<Station> stations = {
        {"uart", serial(uart), {}},
        {"usb", serial(usb), {}},
        {"tcp",
         [tcp](const std::string &line) {
             send(tcp, line.data(), line.size(), MSG_NOSIGNAL);
             return read_some(tcp, line.size() + kNotSupported.size(), 5000);
         },
         {}},
        {"local", [&d](const std::string &line) { return local_ask(d, line); }, {}},
    };
    constexpr int kLines = 150;
    std::vector<std::thread> threads;
    for (Station &s : stations) {
        threads.emplace_back([&s] {
            for (int i = 0; i < kLines; ++i) {
                // Lengths vary so that a line overwritten by a shorter one shows.
                std::string line = "AT+QXNOPE=" + s.name + std::to_string(i) + std::string(i % 7 * 5, 'x');
                std::string got = s.ask(line);
                if (got != line + kNotSupported) s.wrong.push_back(line + " -> " + got);
            }
        });
    }
    for (auto &t : threads) t.join();
    close(tcp);
    for (const Station &s : stations) {
        EXPECT_TRUE(s.wrong.empty()) << s.name << ": " << s.wrong.size() << " wrong, first: " << s.wrong[0];
    }
}

// One station stops taking answers (or never sends its line); the others must still be
// served within a few seconds. Each test makes one station stuck in its own way.
class StuckStation : public ::testing::Test {
protected:
    Sandbox box;
    Pty usb{box, "/dev/ttyGS0"};
    Daemon d{box};

    void SetUp() override { ASSERT_TRUE(serial_ready(usb)); }

    // A local client's command, answered within a few seconds.
    void expect_local_answered(const std::string &line) {
        auto start = Clock::now();
        EXPECT_EQ(local_ask(d, line), line + kNotSupported);
        EXPECT_LT(seconds_since(start), 6.0) << "the local client waited too long";
    }
    // A USB line answered within a few seconds.
    void expect_usb_answered(const std::string &line) {
        auto start = Clock::now();
        ASSERT_TRUE(usb.send(line + "\r"));
        // The hang-up line of a dropped TCP station may follow: it answers on whatever
        // source was served last.
        std::string want = line + kNotSupported;
        EXPECT_EQ(read_some(usb.master, want.size(), 6000).substr(0, want.size()), want);
        EXPECT_LT(seconds_since(start), 6.0) << "the USB station waited too long";
    }
};

TEST_F(StuckStation, XoffOnTheUsbPortDoesNotStopTheOthers) {
    ASSERT_TRUE(usb.send("\x13"));  // XOFF: the port's output stops
    ASSERT_TRUE(usb.send("AT+QXNOPE=stopped1\r"));
    ASSERT_TRUE(usb.send("AT+QXNOPE=stopped2\r"));
    expect_local_answered("AT+QXNOPE=local1");
    EXPECT_TRUE(d.wait_log("Couldn't write all data to USB", 6000));
    expect_local_answered("AT+QXNOPE=local2");
    // Output allowed again: the port is served as before (the stopped answers are lost).
    ASSERT_TRUE(usb.send("\x11"));
    read_some(usb.master, 1 << 16, 300);
    expect_usb_answered("AT+QXNOPE=again");
}

TEST_F(StuckStation, TcpStationThatNeverReadsIsDisconnected) {
    int s = socket(AF_INET, SOCK_STREAM, 0);
    int small = 4096;
    setsockopt(s, SOL_SOCKET, SO_RCVBUF, &small, sizeof small);
    struct sockaddr_in a {};
    a.sin_family = AF_INET;
    a.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
    a.sin_port = htons(static_cast<uint16_t>(d.port));
    ASSERT_EQ(connect(s, reinterpret_cast<sockaddr *>(&a), sizeof a), 0);
    ASSERT_TRUE(d.wait_prop("sys.qrcode.view", "0"));
    // Lines whose answers are full-length frames, sent until the daemon stops reading.
    std::string line = "AT+QXRAM=9" + std::string(2038, '9');
    std::atomic<bool> stop{false};
    std::thread flood([&] {
        while (!stop) {
            ssize_t n = send(s, line.data(), line.size(), MSG_NOSIGNAL | MSG_DONTWAIT);
            if (n < 0 && errno != EAGAIN) break;  // the daemon has hung up
            if (n < 0) {
                struct pollfd p = {s, POLLOUT, 0};
                poll(&p, 1, 50);
            }
        }
    });
    EXPECT_TRUE(d.wait_log("try again.", 60000)) << "the daemon never had to wait for the station";
    expect_usb_answered("AT+QXNOPE=usb");
    EXPECT_TRUE(d.wait_log("takes no answers, disconnecting it", 6000));
    stop = true;
    flood.join();
    close(s);
    // The frame that could not leave was retried ten times, each logged (the hang-up
    // line that follows the disconnect retries its own answer again).
    std::string log = d.log();
    EXPECT_EQ(count(log.substr(0, log.find("takes no answers")), "try again."), 10u);
    // The next station is served.
    ASSERT_TRUE(d.wait_prop("sys.qrcode.view", "1"));
    int next = d.connect_tcp();
    std::string cmd = "AT+QXNOPE=next";
    send(next, cmd.data(), cmd.size(), MSG_NOSIGNAL);
    EXPECT_EQ(read_some(next, cmd.size() + kNotSupported.size(), 6000), cmd + kNotSupported);
    close(next);
}

TEST_F(StuckStation, IdleLocalClientIsDropped) {
    int idle = d.connect_local();  // connects and never sends
    ASSERT_GE(idle, 0);
    expect_local_answered("AT+QXNOPE=after_idle");
    EXPECT_EQ(read_some(idle, 1, 1000), "");  // closed without an answer
    EXPECT_TRUE(d.wait_log("recv error"));
    close(idle);
    expect_usb_answered("AT+QXNOPE=usb");
}

TEST(FailingPort, EndOfFileAfterEveryReopenIsReopenedAtABoundedRate) {
    Sandbox box;
    box.write("/dev/ttyGS0", "");  // opens fine, and every read is end of file
    Daemon d(box);
    ASSERT_TRUE(d.wait_log("The FD is reopen successfully"));
    auto start = Clock::now();
    std::this_thread::sleep_for(std::chrono::seconds(3));
    double elapsed = seconds_since(start);
    size_t reopens = count(d.log(), "The FD is reopen successfully");
    // At most one a second (plus the ones on either edge of the window).
    EXPECT_LE(reopens, static_cast<size_t>(elapsed) + 3) << reopens << " reopens in " << elapsed << " s";
}

// The socket reader takes a station's packet of full length whole: one line, one frame.
TEST(TcpReader, PacketOfFullLengthIsOneLine) {
    Sandbox box;
    Daemon d(box);
    int s = d.connect_tcp();
    ASSERT_GE(s, 0);
    ASSERT_TRUE(d.wait_prop("sys.qrcode.view", "0"));
    // A byte cut off the read would come back as a line of its own ("A" is not supported).
    std::string line = "AT+QXRAM=9" + std::string(2037, '9') + "A";
    ASSERT_EQ(line.size(), 2048u);
    ASSERT_EQ(send(s, line.data(), line.size(), MSG_NOSIGNAL), 2048);
    EXPECT_EQ(read_some(s, 2047, 5000), line.substr(0, 2047));  // the frame is cut at 2047
    EXPECT_EQ(read_some(s, 1, 700), "");
    close(s);
}

// The gadget port hands over a line in pieces when the host pushes a partial line (an
// end-of-file character mid-line): the pieces make one line.
TEST(UsbReader, PiecesOfALineAreJoined) {
    Sandbox box;
    Pty usb(box, "/dev/ttyGS0");
    Daemon d(box);
    ASSERT_TRUE(serial_ready(usb));
    ASSERT_TRUE(usb.send("AT+QXNO\x04"));
    ASSERT_TRUE(usb.send("PE=j\x04"));
    ASSERT_TRUE(usb.send("oined\r"));
    std::string a = "AT+QXNOPE=joined" + kNotSupported;
    EXPECT_EQ(read_some(usb.master, a.size() + 1, 3000), a);
}

}  // namespace
