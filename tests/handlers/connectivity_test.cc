// Bluetooth, GPS, WLAN address and antenna-chain commands: exact frames, the files they
// write (byte order of the addresses), the shell lines and modem requests they make.
#include <algorithm>
#include <chrono>
#include <filesystem>
#include <functional>
#include <sstream>
#include <thread>

#include "handlers/connectivity.h"
#include "tests/support/checks.h"
#include "tests/support/daemon.h"
#include "tests/support/in_process.h"

namespace {

const char *kBtNv = "/mnt/vendor/persist/bluetooth/.bt_nv.bin";
const char *kMac = "/persist/wlan_mac.bin";
const char *kMacFallback = "/mnt/vendor/persist/wlan_mac.bin";

std::string mac_lines(const std::string &m, const std::string &second) {
    return "Intf0MacAddress=" + m + "\nIntf1MacAddress=" + second + "\nIntf2MacAddress=" + m + "\nIntf3MacAddress=" + m +
           "\n";
}
const std::string kMacWritten = mac_lines("02AABBCCDDEE", "04AABBCCDDEE");

using Setup = std::function<void(const Sandbox &)>;
Setup fault(const char *name) { return [=](const Sandbox &b) { b.fault(name); }; }
Setup put(const char *path, const std::string &text) { return [=](const Sandbox &b) { b.write(path, text); }; }
Setup rm(const char *path) { return [=](const Sandbox &b) { std::filesystem::remove_all(b.path(path)); }; }
Setup prop(const char *name, const char *value) { return [=](const Sandbox &b) { b.set_prop(name, value); }; }
Setup both(Setup a, Setup b) { return [=](const Sandbox &s) { a(s), b(s); }; }
const Setup refuse = fault("testapp-refuse");
const char *kDevices = "/data/vendor/engineermode/bt_device";

struct Case {
    const char *name;
    std::string line;
    Setup setup;
    std::string body;
    const char *word;
    std::vector<std::string> events = {};  // in this order
    const char *absent = nullptr;          // never recorded
    std::vector<std::pair<std::string, std::string>> files = {};  // none: the MAC file is left as it was
};

class Wireless : public InProcess {
protected:
    void SetUp() override {
        InProcess::SetUp();
        is_sp = 0;
    }
    void TearDown() override {
        box.write("/.sim/faults", "");
        serve("AT+QXGPS=0", SRC_TCP, 19);  // the GPS state lives for the process
        InProcess::TearDown();
    }
    void served(const std::string &line, const std::string &body = "", const char *word = "OK") {
        const std::string want = frame(line, body, word);  // the answer only, not the values that follow it
        EXPECT_EQ(serve(line, SRC_TCP, want.size()), want);
    }
};
class Connectivity : public Wireless, public ::testing::WithParamInterface<Case> {};

TEST_P(Connectivity, Answers) {
    const Case &c = GetParam();
    if (c.setup) c.setup(box);
    const std::string mac = box.read(kMac);
    served(c.line, c.body, c.word);
    const std::string log = box.events();
    expect_in_order(log, c.events);
    if (c.absent) {
        EXPECT_EQ(log.find(c.absent), std::string::npos) << log;
    }
    for (const auto &[path, text] : c.files) EXPECT_EQ(box.read(path), text) << path;
    if (c.files.empty()) {
        EXPECT_EQ(box.read(kMac), mac);
    }
}

const auto by_name = [](const auto &info) { return std::string(info.param.name); };
const std::string kBtNvDefault("\1\0\6\x55\x44\x33\x22\x11\x00", 9), kDut = "shell /system/bin/bdt entrydut 2>&1\n",
                  kTx = "shell /system/bin/bdt txcontinuous 2402 7 2>&1\n";

INSTANTIATE_TEST_SUITE_P(Bluetooth, Connectivity, ::testing::Values(
    Case{"ReadAddressSkipsOtherItems", "AT+EMBT=5", put(kBtNv, std::string("\2\0\2\x77\x77\1\5\6\x11\x22\x33\x44\x55\x66", 14)),
         "+EMBT: \"665544332211\"", "OK"},
    Case{"ReadAddressNoItem", "AT+EMBT=5", put(kBtNv, std::string("\2\0\1\x77", 4)), "", "ERROR"},
    Case{"ReadAddressNoFile", "AT+EMBT=5", rm(kBtNv), "", "ERROR"},
    Case{"TestModeOff", "AT+EMBT=4", nullptr, "", "ERROR"},
    Case{"TestModeOn", "AT+EMBT=4", prop("bluetooth.bdt.kaeldut", "is true"), "", "OK"},
    Case{"WriteAddress", "AT+EMBT=0,BT,A1B2C3D4E5F6", nullptr, "", "OK", {"shell btnvtool -b F6.E5.D4.C3.B2.A1\n"}, nullptr,
         {{kBtNv, std::string("\1\0\6\xF6\xE5\xD4\xC3\xB2\xA1", 9)}}},
    Case{"WriteLowerCaseShort", "AT+EMBT=0,bt,a1b2", nullptr, "", "OK", {"shell btnvtool -b 00.00.00.00.B2.A1\n"}},
    Case{"WriteAddressMissing", "AT+EMBT=0,BT", nullptr, "", "ERROR", {}, "btnvtool", {{kBtNv, kBtNvDefault}}},
    Case{"WriteAddressNoFileAfter", "AT+EMBT=0,BT,001122334455", both(rm(kBtNv), fault("ext-system")),
         "\"No such file or directory\"", "ERROR"},
    Case{"EnterTestModeByPrefix", "AT+EMBT=10", nullptr, "", "OK", {kDut}},
    Case{"TransmitRefusesShellText", "AT+EMBT=1,5;reboot", nullptr, "", "ERROR", {}, "bdt"},
    // A TCP station's line end stays in the line; it is not part of the argument.
    Case{"TransmitTcpLineEnd", "AT+EMBT=1,2402 7\r\n", nullptr, "", "OK", {kTx}},
    Case{"LeaveTestModeStartsCnss", "AT+EMBT=2", nullptr, "", "OK",
         {"shell /system/bin/sh -c \"/system/bin/bdt exitdut\"\n", "shell /system/bin/sh -c \"start cnss-daemon\"\n"}},
    Case{"LeaveTestModeCnssRunning", "AT+EMBT=2", prop("init.svc.cnss-daemon", "running"), "", "OK", {"bdt exitdut"},
         "start cnss"},
    Case{"On", "AT+EMBT=6", nullptr, "", "OK", {"message bluetooth on -> ok"}},
    Case{"OnRefused", "AT+EMBT=6", refuse, "", "ERROR"},
    Case{"Off", "AT+EMBT=8", nullptr, "", "OK", {"message bluetooth off -> ok"}},
    Case{"OffRefused", "AT+EMBT=8", refuse, "", "ERROR"},
    Case{"DevicesFirstFive", "AT+EMBT=7", put(kDevices, "aa\nbb\ncc\ndd\nee\nff\n"), "\r\naa\r\nbb\r\ncc\r\ndd\r\nee\r\n", "OK"},
    Case{"DevicesLongLineSplits", "AT+EMBT=7", put(kDevices, std::string(300, 'x') + "\n"),
         "\r\n" + std::string(255, 'x') + "\r\n" + std::string(45, 'x') + "\r\n", "OK"},
    Case{"DevicesMissing", "AT+EMBT=7", rm(kDevices), "", "ERROR"},
    Case{"Unknown", "AT+EMBT=9", nullptr, "", "ERROR"}), by_name);

// Any row without files (an unclosed quote included) leaves the MAC file as it was.
INSTANTIATE_TEST_SUITE_P(WlanMac, Connectivity, ::testing::Values(
    Case{"Read", "AT+QXWMAC=0", nullptr, "\"00A0C6112233\"", "OK"},
    Case{"ReadFallback", "AT+QXWMAC=0", both(rm(kMac), put(kMacFallback, "Intf0MacAddress=0A1B2C3D4E5F\n")),
         "\"0A1B2C3D4E5F\"", "OK"},
    Case{"ReadNoFile", "AT+QXWMAC=0", rm(kMac), "\r\n\"\"\r\n", "ERROR"},
    Case{"ReadNoEquals", "AT+QXWMAC=0", put(kMac, "garbage\n"), "\r\n\"\"\r\n", "ERROR"},
    Case{"WriteTcpLineEnd", "AT+QXWMAC=1,02AABBCCDDEE\r\n", nullptr, "", "OK",
         {"chown /persist/wlan_mac.bin 1000:1000", "shell chmod 0664 /persist/wlan_mac.bin\n"}, nullptr, {{kMac, kMacWritten}}},
    Case{"WriteQuotedWraps", "AT+QXWMAC=1,\"FFAABBCCDDEE\"", nullptr, "", "OK", {}, nullptr,
         {{kMac, mac_lines("FFAABBCCDDEE", "01AABBCCDDEE")}}},
    Case{"WriteCarry", "AT+QXWMAC=1,0eaabbccddee", nullptr, "", "OK", {}, nullptr, {{kMac, mac_lines("0eaabbccddee", "10aabbccddee")}}},
    Case{"WriteUnclosedQuote", "AT+QXWMAC=1,\"FFAABBCCDDEE", nullptr, "", "ERROR", {}, "chown"},
    Case{"WriteNotHex", "AT+QXWMAC=1,G0AABBCCDDEE", nullptr, "", "ERROR", {}, "chown"},
    Case{"WriteMissing", "AT+QXWMAC=1", nullptr, "", "ERROR", {}, "chown"},
    // A quoted address must end in its quote, and a TCP line end comes after it.
    Case{"WriteQuotedTcpLineEnd", "AT+QXWMAC=1,\"02AABBCCDDEE\"\r\n", nullptr, "", "ERROR", {}, "chown"},
    Case{"WriteLineBreakRefused", "AT+QXWMAC=1,00A0C6\tIntf9", nullptr, "", "ERROR", {}, "chown"},
    Case{"WriteChownRefused", "AT+QXWMAC=1,02AABBCCDDEE", fault("chown"), "\"Operation not permitted\"", "ERROR",
         {"shell chmod 0664 /persist/wlan_mac.bin"}, nullptr, {{kMac, kMacWritten}}},
    // The fall-back file gets the owner and the mode, not the one that could not be made.
    Case{"WriteFallback", "AT+QXWMAC=1,02AABBCCDDEE", rm("/persist"), "", "OK",
         {"chown /mnt/vendor/persist/wlan_mac.bin 1000:1000", "shell chmod 0664 /mnt/vendor/persist/wlan_mac.bin\n"},
         "chown /persist", {{kMacFallback, kMacWritten}}},
    Case{"WriteNowhere", "AT+QXWMAC=1,02AABBCCDDEE", both(rm("/persist"), rm("/mnt/vendor/persist")), "", "ERROR", {},
         "chmod"},
    Case{"Unknown", "AT+QXWMAC=2", nullptr, "", "ERROR"}), by_name);

// The chain command is kept for later, never run; an unknown chain keeps the last one.
TEST_F(Wireless, AntennaChainIsStoredNotRun) {
    for (auto [line, word, chain] : {std::tuple{"AT+QXWANT=1", "OK", '8'}, {"AT+QXWANT=0", "OK", '7'}, {"AT+QXWANT=2", "ERROR", '7'}}) {
        served(line, "", word);
        EXPECT_EQ(std::string(g_antsel_cmd), std::string("/system/bin/sh -c \"iwpriv wlan0 ena_chain ") + chain + "\"");
    }
    EXPECT_EQ(box.events().find("iwpriv"), std::string::npos);
}

// GPS: a line and its answer, in order, from a closed engine.
struct Step {
    std::string line, body;
    const char *word;
    const char *faults = nullptr;  // the faults file from this step on
};
struct GpsCase {
    const char *name;
    Setup setup;
    int at_mode;
    std::vector<Step> steps;
    std::vector<std::string> events;  // the gps and message records, in order, exactly
};

class GpsSteps : public Wireless, public ::testing::WithParamInterface<GpsCase> {};

std::vector<std::string> gps_records(const std::string &log) {
    std::vector<std::string> out;
    std::istringstream in(log);
    for (std::string l; std::getline(in, l);)
        if (l.rfind("gps ", 0) == 0 || l.rfind("message ", 0) == 0) out.push_back(l);
    return out;
}

TEST_P(GpsSteps, Answer) {
    const GpsCase &c = GetParam();
    is_sp = c.at_mode;
    if (c.setup) c.setup(box);
    box.write("/.sim/events.log", "");
    for (const Step &s : c.steps) {
        if (s.faults) box.write("/.sim/faults", s.faults);
        served(s.line, s.body, s.word);
    }
    EXPECT_EQ(gps_records(box.events()), c.events);
}

const Setup gps_down = fault("gps");

INSTANTIATE_TEST_SUITE_P(Gps, GpsSteps, ::testing::Values(
    GpsCase{"OpenOnce", nullptr, 0, {{"AT+QXGPS=1", "", "OK"}, {"AT+QXGPS=1", "", "OK"}},
            {"message keep_screen_on 2 -> ok", "gps option 1", "message keep_screen_on 2 -> ok"}},
    GpsCase{"OpenSecondMode", nullptr, 0, {{"AT+QXGPS=3", "", "OK"}}, {"message keep_screen_on 2 -> ok", "gps option 3"}},
    GpsCase{"ScreenRefused", refuse, 0, {{"AT+QXGPS=1", "", "ERROR"}}, {"message keep_screen_on 2 -> error"}},
    GpsCase{"OpenFailsStaysClosed", gps_down, 1, {{"AT+QXGPS=1", "", "ERROR"}, {"AT+QXGPS=2", "", "ERROR"}},
            {"gps option 1 (failed)"}},
    GpsCase{"Results", nullptr, 1, {{"AT+QXGPS=5", "OK,cn0=41", "OK"}, {"AT+QXGPS=6", "OK,ttff=28", "OK"}},
            {"gps option 5 -> OK,cn0=41", "gps option 6 -> OK,ttff=28"}},
    GpsCase{"ResultNg", [](const Sandbox &b) { b.write("/.sim/modem", "gps.5=ng\n" + b.read("/.sim/modem")); }, 1,
            {{"AT+QXGPS=5", "", "ATNG"}}, {"gps option 5 -> ng"}},
    GpsCase{"ResultFails", gps_down, 1, {{"AT+QXGPS=6", "", "ERROR"}}, {"gps option 6 (failed)"}},
    GpsCase{"ResultScreenRefused", refuse, 0, {{"AT+QXGPS=5", "", "ERROR"}}, {"message keep_screen_on 2 -> error"}},
    GpsCase{"AtModeCloseThenOpenAgain", nullptr, 1, {{"AT+QXGPS=1", "", "OK"}, {"AT+QXGPS=0", "", "OK"}, {"AT+QXGPS=1", "", "OK"}},
            {"gps option 1", "gps option 0", "gps option 1"}},
    GpsCase{"FailedCloseStaysOpen", nullptr, 1, {{"AT+QXGPS=1", "", "OK"}, {"AT+QXGPS=0", "", "ERROR", "gps\n"},
            {"AT+QXGPS=1", "", "OK", ""}}, {"gps option 1", "gps option 0 (failed)"}},
    GpsCase{"Unknown", nullptr, 1, {{"AT+QXGPS=4", "", "ERROR"}}, {}}), by_name);

// A worker that ended on a failed request stays recorded: AT+QXGPS=2 answers OK without a
// new worker until AT+QXGPS=0 has cleared it; after that a stream starts again.
TEST_F(Wireless, GpsWorkerEndedByAFailureStaysRecordedUntilClosed) {
    is_sp = 1;
    auto reads = [&](long n, int ms = 2000) {  // waits (bounded) for n stream reads
        long r = 0;
        auto counted = [](const std::string &l) { return l.starts_with("gps option 2"); };
        wait_until([&] { return (r = std::ranges::count_if(gps_records(box.events()), counted)) >= n; }, ms);
        return r;
    };
    served("AT+QXGPS=1");
    box.fault("gps");
    box.write("/.sim/events.log", "");
    served("AT+QXGPS=2");
    ASSERT_EQ(reads(1), 1);
    EXPECT_EQ(gps_records(box.events()), std::vector<std::string>{"gps option 2 (failed)"});
    box.write("/.sim/faults", "");
    served("AT+QXGPS=2");
    EXPECT_EQ(reads(2, 400), 1) << box.events();  // a new worker would have read within 400 ms
    for (const char *line : {"AT+QXGPS=0", "AT+QXGPS=1", "AT+QXGPS=2"}) served(line);
    EXPECT_GE(reads(2), 2) << box.events();
}

}  // namespace

// The GPS stream over a real TCP station: raw reply text every 300 ms, until AT+QXGPS=0.
TEST(GpsStream, RepliesArriveEvery300MsUntilClosed) {
    Sandbox box;
    Daemon d(box, "console-at=sendAT");  // AT mode: no screen to keep on
    int s = d.connect_tcp();
    ASSERT_GE(s, 0);
    auto send_line = [&](const std::string &line) { send(s, line.data(), line.size(), MSG_NOSIGNAL); };
    send_line("AT+QXGPS=1");
    EXPECT_EQ(read_some(s, 18), frame("AT+QXGPS=1", "", "OK"));
    // The answer leaves first; the first value follows at once, then one every 300 ms.
    std::string want = frame("AT+QXGPS=2", "", "OK");
    for (int i = 0; i < 5; ++i) want += "+QXGPS: 12,38.5,3.2";
    const auto start = std::chrono::steady_clock::now();
    send_line("AT+QXGPS=2");
    EXPECT_EQ(read_some(s, want.size(), 3000), want);
    const double ms = std::chrono::duration<double, std::milli>(std::chrono::steady_clock::now() - start).count();
    EXPECT_GT(ms, 4 * 300 * 0.8);  // five values, the first at once: four periods
    EXPECT_LT(ms, 4 * 300 * 3.0);  // a loaded machine stretches the periods, never shortens them
    send_line("AT+QXGPS=0");
    const std::string after = read_some(s, 4096, 600);
    ASSERT_NE(after.find(frame("AT+QXGPS=0", "", "OK")), std::string::npos) << after;
    EXPECT_EQ(read_some(s, 4096, 700), "");  // at most one value was on its way; then the stream is over
    close(s);
}
