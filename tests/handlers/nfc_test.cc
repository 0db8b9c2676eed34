// NFC commands: exact frames, the NCI messages the controller got, the test-app messages, the 2-second field window.
#include <algorithm>
#include <chrono>
#include <filesystem>
#include <functional>
#include <thread>

#include "platform/sim/chardev.h"
#include "tests/support/checks.h"
#include "tests/support/daemon.h"
#include "tests/support/in_process.h"

namespace {

// The controller's record of what the phone sent, as "in" lines.
const std::string kReset = "in 20 00 01 00", kInit10 = "in 20 01 00", kInit20 = "in 20 01 02 00 00",
                  kActivate = "in 2F 02 00", kSwpEnable = "in 20 02 0D 03 A0 EC 01 01 A0 D4 01 01 A0 ED 01 01",
                  kSwpTest = "in 2F 3E 01 00", kPollMode = "in 20 02 05 01 A0 44 01 00",
                  kListen1 = "in 20 02 0F 01 A0 0E 0B 11 01 C2 B2 00 B2 1E 1F 00 D0 0C",
                  kListen2 = "in 20 02 05 01 A0 03 01 08", kDiscover = "in 21 03 09 04 00 01 01 01 02 01 81 01";
const std::string kCplc(84, 'A'), kId = "\r\n\"0a1b2c3d\"\r\n";
const char *kChipType = "persist.kael.nfc.chip.type";

using Lines = std::vector<std::string>;
Lines cat(std::initializer_list<Lines> parts) {
    Lines out;
    for (const auto &p : parts) out.insert(out.end(), p.begin(), p.end());
    return out;
}
// One controller cycle: opened, power-cycled, the exchange, powered off and closed.
Lines cycle(const Lines &exchange) { return cat({{"open", "power 0", "power 1"}, exchange, {"power 0", "close"}}); }
const Lines kV10 = {kReset, kInit10, kActivate}, kV20 = {kReset, kInit20, kActivate};
const Lines kRead10 = cycle(cat({kV10, {kPollMode, kDiscover}})), kRead20 = cycle(cat({kV20, {kPollMode, kDiscover}}));
const Lines kChk10 = cycle(cat({kV10, {kSwpEnable, kSwpTest}})), kChk20 = cycle(cat({kV20, {kSwpEnable, kSwpTest}}));
const Lines kCard10 = cycle(cat({kV10, {kPollMode, kListen1, kListen2, kDiscover}})), kIc = cycle({kReset});

std::string quoted(const std::string &v) { return "\r\n\"" + v + "\"\r\n"; }

// The controller script: these lines go first, and the first line of a key wins.
void nfc_script(const Sandbox &b, const Lines &lines) {
    std::string text;
    for (const auto &l : lines) text += l + "\n";
    b.write("/.sim/nfc", text + b.read("/.sim/nfc"));
}

using Setup = std::function<void(const Sandbox &)>;
Setup rep(const char *message, const char *reply) { return [=](const Sandbox &b) { b.reply(message, reply); }; }
Setup fault(const char *name) { return [=](const Sandbox &b) { b.fault(name); }; }
Setup chip(const char *type) { return [=](const Sandbox &b) { b.set_prop(kChipType, type); }; }
Setup project(const char *name) { return [=](const Sandbox &b) { b.sequence("config:project", {name}); }; }
void absent(const Sandbox &b) { std::filesystem::remove(b.path("/dev/nq-nci")); }
void at_mode(const Sandbox &) { is_sp = 1; }
const Setup refuse = fault("testapp-refuse"), silent = fault("testapp-silent");
void nfc_on(const Sandbox &b) { b.sequence("testapp:nfc_test c", {"1", "1", "0"}); }
void nfc_on_refuses(const Sandbox &b) {
    b.reply("nfc_test c", "1");
    b.reply("nfc_test 0", "error");
}

struct Case {
    const char *name;
    std::string line;
    Lines script;  // controller script lines
    Setup setup;
    std::string body;
    const char *word;
    Lines nfc;               // the controller's record without its answers, exactly
    Lines messages = {"*"};  // test-app messages, exactly and in this order ("*": not checked)
};
std::string case_name(const ::testing::TestParamInfo<Case> &info) { return info.param.name; }

long long ms_since(std::chrono::steady_clock::time_point t0) {
    return std::chrono::duration_cast<std::chrono::milliseconds>(std::chrono::steady_clock::now() - t0).count();
}

class Nfc : public InProcess {
protected:
    int saved_sp = is_sp;
    void SetUp() override {
        InProcess::SetUp();
        is_sp = 0;
    }
    void TearDown() override {
        EXPECT_TRUE(all_closed()) << box.events();
        is_sp = saved_sp;
        InProcess::TearDown();
    }
    void expect_frame(const std::string &line, const std::string &body, const char *word) {
        const std::string want = frame(line, body, word);
        EXPECT_EQ(serve(line, SRC_TCP, want.size()), want);
    }
    // The details of one kind of event, without the controller's answers and CPLC reads.
    Lines of(const char *kind, bool answers = false) const {
        Lines out;
        for (const auto &e : box.event_list())
            if (e.kind == kind && e.detail.rfind("getCPLC", 0) != 0 && (answers || e.detail.rfind("out ", 0) != 0))
                out.push_back(e.detail);
        return out;
    }
    // The controller's record once every open is closed (the device thread records it a moment later).
    Lines record(bool answers = false) const {
        all_closed();
        return of("nfc", answers);
    }
    // A worker left running holds its open until it ends: wait (bounded) until it has.
    bool all_closed(int ms = 5000) const {
        return wait_until([&] {
            Lines r = of("nfc");
            return std::count(r.begin(), r.end(), "open") == std::count(r.begin(), r.end(), "close");
        }, ms);
    }
    // When the nth event of kind with this detail was recorded; -1: not (yet).
    long long at(const std::string &detail, int nth = 1, const char *kind = "nfc") const {
        for (const auto &e : box.event_list())
            if (e.kind == kind && e.detail == detail && --nth == 0) return e.ms;
        return -1;
    }
    // No tag or no reader: "timeout 2s" once the 2-second window from the power-up has passed;
    // then the next command (script then) opens the controller afresh and answers body.
    void times_out(const std::string &line, const Lines &script, const Lines &cycle, const Lines &then,
                   const std::string &body) {
        nfc_script(box, script);
        const auto t0 = std::chrono::steady_clock::now();
        expect_frame(line, quoted("timeout 2s"), "ERROR");
        EXPECT_GE(ms_since(t0), 1950);
        EXPECT_EQ(record(), cycle);
        const long long window = at("power 0", 2) - at("power 1");
        EXPECT_GE(window, 1950) << box.events();
        EXPECT_LT(window, 2600) << box.events();
        nfc_script(box, then);
        expect_frame(line, body, "OK");
    }
};
class NfcLine : public Nfc, public ::testing::WithParamInterface<Case> {};

TEST_P(NfcLine, Answers) {
    const Case &c = GetParam();
    nfc_script(box, c.script);
    if (c.setup) c.setup(box);
    expect_frame(c.line, c.body, c.word);
    EXPECT_EQ(record(), c.nfc) << box.events();
    if (c.messages != Lines{"*"}) {
        EXPECT_EQ(of("message"), c.messages);
    }
}

INSTANTIATE_TEST_SUITE_P(TestApp, NfcLine, ::testing::Values(
    Case{"On", "AT+QXNFC=1,1", {}, nullptr, "", "OK", {}, {"nfc_test 1 -> ok"}},
    Case{"OnRefused", "AT+QXNFC=1,1", {}, refuse, "", "ERROR", {}, {"nfc_test 1 -> error"}},
    Case{"On2", "AT+QXNFC=1,2", {}, nullptr, "", "OK", {}, {"nfc_test 2 -> ok"}},
    Case{"On2Silent", "AT+QXNFC=1,2", {}, silent, "", "ATERROR", {}, {"nfc_test 2 -> (silent)"}},
    Case{"Off", "AT+QXNFC=1,0", {}, nullptr, "", "OK", {}, {"nfc_test 0 -> ok"}},
    Case{"State", "AT+QXNFC=0", {}, rep("nfc_test c", "1"), quoted("1"), "OK", {}},
    Case{"StateError", "AT+QXNFC=0", {}, refuse, "", "ERROR", {}, {"nfc_test c -> error"}},
    Case{"StateSilent", "AT+QXNFC=0", {}, silent, "", "ERROR", {}},
    Case{"Cplc3", "AT+QXNFC=3", {}, rep("nfc_test cplc", "9F7F2A4790"), quoted("9F7F2A4790"), "OK", {},
         {"nfc_test cplc -> 9F7F2A4790"}},
    Case{"CplcRead", "AT+QX_NFC_CPLC=0", {}, rep("nfc_test cplc", "9F7F2A"), "\"9F7F2A\"", "ATOK", {}},
    Case{"CplcNotSupported", "AT+QX_NFC_CPLC=0", {}, rep("nfc_test cplc", "not support"), "", "ERROR", {}},
    Case{"CplcReadError", "AT+QX_NFC_CPLC=0", {}, refuse, "\"error\"", "ATNG", {}},
    Case{"CplcReadSilent", "AT+QX_NFC_CPLC=0", {}, silent, "\"\"", "ATNG", {}},
    Case{"Spi", "AT+QX_NFC_SPI=1", {}, nullptr, "", "ATOK", {}, {}},
    Case{"SpiFails", "AT+QX_NFC_SPI=1", {}, fault("cplc"), "", "ATNG", {}},
    Case{"CplcCheck", "AT+QX_NFC_CPLC=1," + kCplc, {}, rep("nfc_test card", "0,pass"), "\"0,pass\"", "ATOK", {},
         {"nfc_test card -> 0,pass"}},
    Case{"CplcCheckQuoted", "AT+QX_NFC_CPLC=1,\" " + kCplc + "\"", {}, rep("nfc_test card", "0"), "\"0\"", "ATOK", {}},
    Case{"CplcCheckFails", "AT+QX_NFC_CPLC=1," + kCplc, {}, rep("nfc_test card", "1"), "\"1\"", "ATNG", {}},
    Case{"CplcCheckSilent", "AT+QX_NFC_CPLC=1," + kCplc, {}, silent, "\"\"", "ATNG", {}},
    Case{"Cplc83", "AT+QX_NFC_CPLC=1," + kCplc.substr(1), {}, nullptr, "\"1\"", "ATNG", {}, {}},
    Case{"Cplc85", "AT+QX_NFC_CPLC=1," + kCplc + "0", {}, nullptr, "\"1\"", "ATNG", {}, {}},
    Case{"CplcNotHex", "AT+QX_NFC_CPLC=1," + kCplc.substr(1) + "G", {}, nullptr, "\"1\"", "ATNG", {}, {}},
    Case{"CplcThirdFieldIgnored", "AT+QX_NFC_CPLC=1,," + kCplc + ",x", {}, nullptr, "\"ok\"", "ATNG", {}},
    Case{"CplcEmptyField", "AT+QX_NFC_CPLC=1,", {}, nullptr, "", "ATERROR", {}, {}},
    Case{"CalChip", "AT+QX_NFC_CAL=0", {}, chip("S3NRN82"), "\"1\"", "ATOK", {}},
    Case{"CalOtherChip", "AT+QX_NFC_CAL=0", {}, chip("SN100"), "\"0\"", "ATOK", {}},
    Case{"Calibrate", "AT+QX_NFC_CAL=1", {}, nullptr, "\"1\"", "ATOK", {}, {"nfc_cali 1 -> ok"}},
    Case{"CalibrateRefusedStillAtok", "AT+QX_NFC_CAL=1", {}, refuse, "\"0\"", "ATOK", {}},
    Case{"CalValue", "AT+QX_NFC_CAL=2", {}, rep("nfc_get_cali_val 1", "37"), "\"1,37\"", "ATOK", {},
         {"nfc_get_cali_val 1 -> 37"}},
    Case{"CalValueNull", "AT+QX_NFC_CAL=2", {}, rep("nfc_get_cali_val 1", "null"), "\"0,null\"", "ATNG", {}},
    Case{"CalValueError", "AT+QX_NFC_CAL=2", {}, refuse, "\"IKaelNfcAdapter error\"", "ATNG", {}},
    Case{"CalValueSilent", "AT+QX_NFC_CAL=2", {}, silent, "\"IKaelNfcAdapter error\"", "ATNG", {}},
    Case{"UnknownSet", "AT+QXNFC=4", {}, nullptr, "", "ATERROR", {}, {}},
    Case{"UnknownIc", "AT+QX_NFC_IC=0", {}, nullptr, "", "ERROR", {}, {}}), case_name);

// Reading a tag: the controller cycle, the start-up the project asks for, the activation.
INSTANTIATE_TEST_SUITE_P(TagRead, NfcLine, ::testing::Values(
    Case{"FourByteId", "AT+QXNFC=2", {"tag=0A1B2C3D"}, nullptr, kId, "OK", kRead10, {"nfc_test c -> ok"}},
    Case{"TenByteId", "AT+QXNFC=2", {"tag=00112233445566778899"}, nullptr, quoted("00112233445566778899"), "OK", kRead10},
    Case{"NotificationFirstReadsAgain", "AT+QXNFC=2", {"before=61 07 01 01"}, nullptr, kId, "OK", kRead10},
    // 12 payload bytes naming a 4-byte ID, then an ID longer than the payload.
    Case{"ShortActivation", "AT+QXNFC=2", {"activation=61 05 0C 01 02 04 00 FF 01 09 44 00 04 0A 1B"}, nullptr,
         quoted(""), "ERROR", kRead10},
    Case{"IdLongerThanPayload", "AT+QXNFC=2", {"activation=61 05 0D 01 02 04 00 FF 01 09 44 00 0D 0A 1B 2C"}, nullptr,
         quoted(""), "ERROR", kRead10},
    // An ID length of 0 makes the phone read once more, and nothing else comes.
    Case{"NoIdReadsAgain", "AT+QXNFC=2", {"activation=61 05 0D 01 02 04 00 FF 01 09 44 00 00 0A 1B 2C"}, nullptr,
         quoted("timeout 2s"), "ERROR", kRead10},
    Case{"Nci20ByProject", "AT+QXNFC=2", {"nci=2.0"}, project("RX6101"), kId, "OK", kRead20},
    Case{"Nci20ByChip", "AT+QXNFC=2", {"nci=2.0"}, chip("SN100"), kId, "OK", kRead20},
    Case{"LongerChipNameIsNci10", "AT+QXNFC=2", {}, chip("SN1000"), kId, "OK", kRead10},
    // One 51 00 00 per frame: the activation never comes.
    Case{"Header51", "AT+QXNFC=2", {"mode=51"}, nullptr, quoted("timeout 2s"), "ERROR", kRead10},
    Case{"Absent", "AT+QXNFC=2", {}, absent, quoted("open nfc error"), "ERROR", {}},
    Case{"NfcOnIsReleasedFirst", "AT+QXNFC=2", {}, nfc_on, kId, "OK", kRead10,
         {"nfc_test c -> 1", "nfc_test 0 -> ok", "nfc_test c -> 1", "nfc_test c -> 0"}},
    Case{"NfcOnNotReleased", "AT+QXNFC=2", {}, nfc_on_refuses, "close nfc fail", "ERROR", {},
         {"nfc_test c -> 1", "nfc_test 0 -> error"}},
    Case{"AtModeStillAsksTheState", "AT+QXNFC=2", {}, [](const Sandbox &b) { b.reply("nfc_test c", "1"); is_sp = 1; },
         kId, "OK", kRead10, {"nfc_test c -> 1"}}), case_name);

INSTANTIATE_TEST_SUITE_P(Controller, NfcLine, ::testing::Values(
    Case{"IcCheck", "AT+QX_NFC_IC=1", {}, nullptr, "", "ATOK", kIc, {"nfc_test 0 -> ok", "nfc_test c -> ok"}},
    Case{"IcCheckAtModeAsksNothing", "AT+QX_NFC_IC=1", {}, at_mode, "", "ATOK", kIc, {}},
    Case{"IcHeader51", "AT+QX_NFC_IC=1", {"mode=51"}, nullptr, "", "ATNG", kIc},
    Case{"IcNotificationIsNoResponse", "AT+QX_NFC_IC=1", {"mode=61"}, nullptr, "", "ATOK", kIc},
    Case{"IcAbsent", "AT+QX_NFC_IC=1", {}, absent, "", "ATNG", {}},
    Case{"IcNotReleased", "AT+QX_NFC_IC=1", {}, refuse, "close nfc fail", "ATNG", {}, {"nfc_test 0 -> error"}},
    Case{"SelfCheck", "AT+QX_NFC_CHK=0", {}, nullptr, "\"UICC:1;\"", "ATOK", kChk10},
    Case{"SelfCheckNci20", "AT+QX_NFC_CHK=0", {"nci=2.0"}, chip("SN100"), "\"UICC:1;\"", "ATOK", kChk20},
    Case{"SwpLinkDead", "AT+QX_NFC_CHK=0", {"swp=3"}, nullptr, "\"UICC:0;\"", "ATNG", kChk10},
    Case{"SwpUnknownStatus", "AT+QX_NFC_CHK=0", {"swp=1"}, nullptr, "\"UICC:0;\"", "ATNG", kChk10},
    Case{"SwpRefused", "AT+QX_NFC_CHK=0", {"swp=refused"}, nullptr, "\"UICC:0;\"", "ATNG", kChk10},
    Case{"SelfCheckAbsent", "AT+QX_NFC_CHK=0", {}, absent, "\"UICC:0;\"", "ATNG", {}},
    Case{"CardEmulation", "AT+QX_NFC_CARD=0", {"tag=none"}, nullptr, "", "OK", kCard10, {"nfc_test c -> ok"}},
    Case{"CardFieldNotificationFirst", "AT+QX_NFC_CARD=0", {"before=61070101,61070101"}, nullptr, "", "OK", kCard10},
    Case{"CardAlwaysNci10", "AT+QX_NFC_CARD=0", {}, project("RX6101"), "", "OK", kCard10}), case_name);


TEST_F(Nfc, ControllerAnswersAsScripted) {
    nfc_script(box, {"nci=2.0", "firmware=12 02 03 04", "tag=0A1B2C3D"});
    chip("SN100")(box);
    expect_frame("AT+QXNFC=2", kId, "OK");
    EXPECT_EQ(record(true), cycle({kReset, "out 40 00 01 00", "out 60 00 09 02 00 20 04 04 12 02 03 04", kInit20,
                                   "out 40 01 12 00 1A 1E 03 00 01 00 02 FF FF 01 00 01 02 01 00 02 00", kActivate,
                                   "out 4F 02 01 00", kPollMode, "out 40 02 02 00 00", kDiscover, "out 41 03 01 00",
                                   "out 61 05 14 01 02 04 00 FF 01 09 44 00 04 0A 1B 2C 3D 01 20 00 00 00 00"}));
}

TEST_F(Nfc, NoTagTimesOutAfterTwoSeconds) { times_out("AT+QXNFC=2", {"tag=none"}, kRead10, {"tag=0a1b2c3d"}, kId); }

// The card worker left behind ends without writing to the controller again.
TEST_F(Nfc, CardEmulationWithoutReaderTimesOut) {
    times_out("AT+QX_NFC_CARD=0", {"tag=none", "reader=0"}, kCard10, {"reader=1"}, "");
}

// A controller that never answers holds the dispatcher for one bounded read, not for ever.
TEST_F(Nfc, SilentControllerIsBounded) {
    nfc_script(box, {"mode=silent"});
    const auto t0 = std::chrono::steady_clock::now();
    expect_frame("AT+QX_NFC_IC=1", "", "ATNG");
    expect_frame("AT+QX_NFC_CHK=0", "\"UICC:0;\"", "ATNG");
    EXPECT_LT(ms_since(t0), 2 * (3000 + 200 + 600)) << "each command waits for one read and the release poll";
    const Lines cut = {"open", "power 0", "power 1", kReset, "close"};  // nothing reaches it after the failed read
    EXPECT_EQ(record(), cat({cut, cut}));
    expect_frame("AT+QXNFC=2", quoted("timeout 2s"), "ERROR");
}

// NFC that is on and never released: ten polls of the state, 200 ms apart.
TEST_F(Nfc, ReleaseIsPolledTenTimes) {
    box.reply("nfc_test c", "1");
    expect_frame("AT+QX_NFC_IC=1", "close nfc fail", "ATNG");
    ASSERT_EQ(of("message"), cat({{"nfc_test 0 -> ok"}, Lines(10, "nfc_test c -> 1")})) << box.events();
    const long long polled = at("nfc_test c -> 1", 10, "message") - at("nfc_test c -> 1", 1, "message");
    EXPECT_GE(polled, 9 * 200 - 20);
    EXPECT_LT(polled, 9 * 200 + 600);
    EXPECT_EQ(record(), Lines{});
}

// A tag that comes to the antenna while the phone is discovering.
TEST_F(Nfc, TagArrivingFromTheStation) {
    nfc_script(box, {"tag=none"});
    std::thread station([&] {
        for (int i = 0; i < 150 && at(kDiscover) < 0; ++i) std::this_thread::sleep_for(std::chrono::milliseconds(10));
        sim::station_send(box.root, "nfc tag 0a1b2c3d4e5f60");
    });
    expect_frame("AT+QXNFC=2", quoted("0a1b2c3d4e5f60"), "OK");
    station.join();
}

// Over TCP the daemon keeps serving after a silent controller; writes after the failed read are retried five times.
TEST(NfcDaemon, AnswersOverTcpAndRetriesWrites) {
    Sandbox box;
    nfc_script(box, {"tag=04a1b2c3d4e580"});
    Daemon d(box);
    int s = d.connect_tcp();
    ASSERT_GE(s, 0);
    auto exchange = [&](const std::string &line, const std::string &body, const char *word) {
        const std::string want = frame(line, body, word);
        send(s, line.data(), line.size(), MSG_NOSIGNAL);
        EXPECT_EQ(read_some(s, want.size(), 5000), want) << line;
    };
    exchange("AT+QXNFC=2", quoted("04a1b2c3d4e580"), "OK");
    exchange("AT+QX_NFC_CHK=0", "\"UICC:1;\"", "ATOK");
    nfc_script(box, {"mode=silent"});
    exchange("AT+QX_NFC_CHK=0", "\"UICC:0;\"", "ATNG");
    exchange("AT+QX_NFC_CAL=0", "\"0\"", "ATOK");
    close(s);
    const std::string log = d.log();
    size_t errors = 0;
    for (size_t at = 0; (at = log.find("nci write error", at)) != std::string::npos; ++at) ++errors;
    EXPECT_EQ(errors, 4u * 6u) << "init, activate, SWP enable and self-test: six writes each";
    EXPECT_NE(log.find("send nci len:16 data:20020D03A0EC0101A0D40101A0ED0101"), std::string::npos) << log;
}

}  // namespace
