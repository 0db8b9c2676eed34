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

size_t count(const std::string &text, const std::string &what) {
    size_t n = 0;
    for (size_t at = text.find(what); at != std::string::npos; at = text.find(what, at + what.size())) ++n;
    return n;
}

// Lines of varying length from four stations at once: each gets exactly its own answers.
TEST(Stations, FourStationsAtOnceEachGetTheirOwnAnswers) {
    Sandbox box;
    Pty uart(box, "/dev/ttyMSM0");
    Pty usb(box, "/dev/ttyGS0");
    Daemon d(box, "console-at=sendNormal");
    ASSERT_TRUE(uart.ready() && usb.ready());
    int tcp = d.connect_tcp();
    ASSERT_GE(tcp, 0);
    ASSERT_TRUE(d.wait_prop("sys.qrcode.view", "0"));
    // A station: where its line goes (serial lines end in CR) and where its answer comes from.
    auto over = [](int fd, const char *end) {
        return [fd, end](const std::string &line) {
            std::string sent = line + end;
            bool all = write(fd, sent.data(), sent.size()) == static_cast<ssize_t>(sent.size());
            return all ? read_some(fd, line.size() + kNotSupported.size(), 5000) : "(unsent)";
        };
    };
    std::vector<std::pair<std::string, std::function<std::string(const std::string &)>>> stations = {
        {"uart", over(uart.master, "\r")}, {"usb", over(usb.master, "\r")}, {"tcp", over(tcp, "")},
        {"local", [&d](const std::string &line) { return d.ask_local(line); }}};
    std::vector<std::string> wrong(stations.size());
    std::vector<std::thread> threads;
    for (size_t s = 0; s < stations.size(); ++s) {
        threads.emplace_back([&, s] {
            for (int i = 0; i < 150; ++i) {
                std::string line = "AT+QXNOPE=" + stations[s].first + std::to_string(i) + std::string(i % 7 * 5, 'x');
                std::string got = stations[s].second(line);
                if (got != line + kNotSupported && wrong[s].empty()) wrong[s] = line + " -> " + got;
            }
        });
    }
    for (auto &t : threads) t.join();
    close(tcp);
    for (size_t s = 0; s < stations.size(); ++s) EXPECT_EQ(wrong[s], "") << stations[s].first;
}

// One station stops taking answers; the others are still served within a few seconds.
class StuckStation : public ::testing::Test {
protected:
    Sandbox box;
    Pty usb{box, "/dev/ttyGS0"};
    Daemon d{box};

    void SetUp() override { ASSERT_TRUE(usb.ready()); }

    // Answered within the read's bound. The hang-up frame of a dropped TCP station may follow:
    // it answers on the last source.
    void expect_usb_answered(const std::string &line) {
        ASSERT_TRUE(usb.send(line + "\r"));
        std::string want = line + kNotSupported;
        EXPECT_EQ(read_some(usb.master, want.size(), 6000).substr(0, want.size()), want);
    }
};

TEST_F(StuckStation, XoffOnTheUsbPortDoesNotStopTheOthers) {
    ASSERT_TRUE(usb.send("\x13"));  // XOFF: the port's output stops
    ASSERT_TRUE(usb.send("AT+QXNOPE=stopped1\r") && usb.send("AT+QXNOPE=stopped2\r"));
    EXPECT_EQ(d.ask_local("AT+QXNOPE=local1"), "AT+QXNOPE=local1" + kNotSupported);  // within its 5 s bound
    EXPECT_TRUE(d.wait_log("Couldn't write all data to USB", 6000));
    EXPECT_EQ(d.ask_local("AT+QXNOPE=local2"), "AT+QXNOPE=local2" + kNotSupported);
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
            struct pollfd p = {s, POLLOUT, 0};
            if (n < 0) poll(&p, 1, 50);
        }
    });
    EXPECT_TRUE(d.wait_log("try again.", 60000)) << "the daemon never had to wait for the station";
    expect_usb_answered("AT+QXNOPE=usb");
    EXPECT_TRUE(d.wait_log("takes no answers, disconnecting it", 6000));
    stop = true;
    flood.join();
    close(s);
    // The stuck frame was retried ten times, each logged, before the disconnect.
    std::string log = d.log();
    EXPECT_EQ(count(log.substr(0, log.find("takes no answers")), "try again."), 10u);
    ASSERT_TRUE(d.wait_prop("sys.qrcode.view", "1"));
    int next = d.connect_tcp();  // the next station is served
    std::string cmd = "AT+QXNOPE=next";
    send(next, cmd.data(), cmd.size(), MSG_NOSIGNAL);
    EXPECT_EQ(read_some(next, cmd.size() + kNotSupported.size(), 6000), cmd + kNotSupported);
    close(next);
}

// A port that reads end of file after every reopen is reopened at most once a second.
TEST(FailingPort, EndOfFileAfterEveryReopenIsReopenedAtABoundedRate) {
    Sandbox box;
    box.write("/dev/ttyGS0", "");
    Daemon d(box);
    ASSERT_TRUE(d.wait_log("The FD is reopen successfully"));
    auto start = Clock::now();
    std::this_thread::sleep_for(std::chrono::seconds(3));
    double elapsed = std::chrono::duration<double>(Clock::now() - start).count();
    size_t reopens = count(d.log(), "The FD is reopen successfully");
    EXPECT_LE(reopens, static_cast<size_t>(elapsed) + 3) << reopens << " reopens in " << elapsed << " s";  // + edges
}

}  // namespace
