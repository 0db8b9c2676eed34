// Modem and RF commands: which EM status requests each form sends, in which order, and how
// the modem's reply becomes the answer (OK/ERROR, ATOK/ATNG/ATERROR, quoted values).
#include <sstream>

#include "tests/support/checks.h"
#include "tests/support/in_process.h"

namespace {

std::string nv_pattern() { return nv_fill(0x21, 191); }  // every byte non-zero, so a stray write shows
std::string with_i32(std::string nv, size_t off, int32_t v) { return nv.replace(off, 4, reinterpret_cast<const char *>(&v), 4); }

struct Case {
    const char *name;
    std::string line;
    std::vector<std::string> script;  // lines put before the modem script
    std::string project;              // empty: the default phone's
    const char *fault;
    std::string body;
    const char *word;
    std::vector<std::string> records;  // modem, rf and service records, exactly, in order
};

std::vector<std::string> rf_records(const std::string &log) {
    std::vector<std::string> out;
    std::istringstream in(log);
    for (std::string l; std::getline(in, l);)
        for (const char *kind : {"modem ", "rf ", "service-start ", "nv "})
            if (l.rfind(kind, 0) == 0) out.push_back(l);
    return out;
}

class Modem : public InProcess {
protected:
    void SetUp() override {
        InProcess::SetUp();
        box.write("/.sim/nv.bin", nv_pattern());
        box.write("/.sim/events.log", "");
    }
    void served(const std::string &line, const std::string &body, const std::string &word) {
        const std::string want = frame(line, body, word);
        EXPECT_EQ(serve(line, SRC_TCP, want.size()), want);
    }
};
class ModemLine : public Modem, public ::testing::WithParamInterface<Case> {};

TEST_P(ModemLine, Answers) {
    const Case &c = GetParam();
    std::string script;
    for (const auto &l : c.script) script += l + "\n";
    box.write("/.sim/modem", script + box.read("/.sim/modem"));
    if (!c.project.empty()) box.write("/.sim/config", "project=" + c.project + "\n" + box.read("/.sim/config"));
    if (c.fault) box.fault(c.fault);
    served(c.line, c.body, c.word);
    EXPECT_EQ(rf_records(box.events()), c.records);
    EXPECT_EQ(box.read("/.sim/nv.bin"), nv_pattern());
}

const std::string kEm = "modem em_status ";
const auto by_name = [](const auto &i) { return std::string(i.param.name); };

INSTANTIATE_TEST_SUITE_P(Dpdt, ModemLine, ::testing::Values(
    Case{"Main", "AT+QXDPDT=0", {}, "", nullptr, "", "OK", {kEm + "110 -> 0"}},
    Case{"MainRefused", "AT+QXDPDT=0", {"em.110=1"}, "", nullptr, "", "ERROR", {kEm + "110 -> 1"}},
    Case{"MainUndelivered", "AT+QXDPDT=0", {}, "", "modem", "", "ERROR", {kEm + "110 (undelivered)"}},
    Case{"MainProjectFirst", "AT+QXDPDT=0", {}, "RX5280F_EX", nullptr, "", "OK", {kEm + "122 -> 0", kEm + "110 -> 0"}},
    Case{"MainProjectRefused", "AT+QXDPDT=0", {"em.122=2"}, "RX5280F_EX", nullptr, "", "ATNG", {kEm + "122 -> 2"}},
    Case{"Diversity", "AT+QXDPDT=1", {}, "", nullptr, "", "OK", {kEm + "111 -> 0"}},
    Case{"DiversityProjectRefused", "AT+QXDPDT=1", {"em.121=x"}, "RX5280F_EX", nullptr, "", "ATNG", {kEm + "121 -> x"}},
    Case{"CrossOnOtherProjects", "AT+QXDPDT=2", {}, "", nullptr, "", "OK", {"rf dpdt cross"}},
    Case{"NormalOnRx6105", "AT+QXDPDT=2", {}, "RX6105", nullptr, "", "OK", {"rf dpdt normal"}},
    Case{"Form3NormalOnOtherProjects", "AT+QXDPDT=3", {}, "", nullptr, "", "OK", {"rf dpdt normal"}},
    Case{"Form3CrossOnRx6105F", "AT+QXDPDT=3", {}, "RX6105F_EX", nullptr, "", "OK", {"rf dpdt cross"}},
    Case{"SwitchFails", "AT+QXDPDT=2", {}, "", "dpdt", "", "ERROR", {"rf dpdt cross (failed)"}},
    Case{"State", "AT+QXDPDT=4", {"em.118=6"}, "", nullptr, "\r\n\"2,1\"\r\n", "OK", {kEm + "118 -> 6"}},
    Case{"StateHighBits", "AT+QXDPDT=4", {"em.118=29"}, "", nullptr, "\r\n\"1,3\"\r\n", "OK", {kEm + "118 -> 29"}},
    Case{"StateUndelivered", "AT+QXDPDT=4", {}, "", "modem", "", "ERROR", {kEm + "118 (undelivered)"}},
    Case{"Tuner6OnOtherProjects", "AT+QXDPDT=6", {}, "", nullptr, "", "OK", {kEm + "116 -> 0"}},
    Case{"Tuner6OnRx6105", "AT+QXDPDT=6", {}, "RX6105", nullptr, "", "OK", {kEm + "117 -> 0"}},
    Case{"Tuner7OnOtherProjects", "AT+QXDPDT=7", {"em.117=1"}, "", nullptr, "", "ERROR", {kEm + "117 -> 1"}},
    Case{"Tuner7OnRx6105", "AT+QXDPDT=7", {}, "RX6105", nullptr, "", "OK", {kEm + "116 -> 0"}},
    Case{"RawState", "AT+QXDPDT=8", {"em.118=6"}, "", nullptr, "\r\n6\r\n", "OK", {kEm + "118 -> 6"}},
    Case{"Status9", "AT+QXDPDT=9", {}, "", nullptr, "", "OK", {kEm + "9 -> 0"}},
    Case{"Status10Refused", "AT+QXDPDT=10", {"em.10=9"}, "", nullptr, "", "ERROR", {kEm + "10 -> 9"}},
    Case{"Reply115", "AT+QXDPDT=115", {}, "", nullptr, "\r\n0,main antenna\r\n", "OK", {kEm + "115 -> 0,main antenna"}},
    Case{"Reply119NotVerified", "AT+QXDPDT=119", {"em.119=7,off"}, "", nullptr, "\r\n7,off\r\n", "OK", {kEm + "119 -> 7,off"}},
    Case{"Status121", "AT+QXDPDT=121", {}, "", nullptr, "", "ATOK", {kEm + "121 -> 0"}},
    Case{"Status122Refused", "AT+QXDPDT=122", {"em.122=1"}, "", nullptr, "", "ATNG", {kEm + "122 -> 1"}},
    Case{"TunerNv", "AT+QXDPDT=123", {}, "", nullptr, "\"3\"", "ATOK", {"modem nv-read 26693 -> 3"}},
    Case{"TunerNvZeroIsEmpty", "AT+QXDPDT=123", {"nv.26693=0"}, "", nullptr, "\"0\"", "ATNG", {"modem nv-read 26693 -> 0"}},
    Case{"TunerNvFails", "AT+QXDPDT=123", {}, "", "modem", "", "ATERROR", {"modem nv-read 26693 (failed)"}},
    Case{"SmartAntenna", "AT+QXSMT_DEFAULT_ANT=1", {}, "", nullptr, "\"1\"", "ATOK", {"modem nv-read 30001 -> 1"}},
    Case{"SmartAntennaFails", "AT+QXSMT_DEFAULT_ANT=1", {}, "", "modem", "\"modem errror\"", "ATNG",
         {"modem nv-read 30001 (failed)"}},
    Case{"SmartAntennaOtherForm", "AT+QXSMT_DEFAULT_ANT=0", {}, "", nullptr, "", "ERROR", {}},
    Case{"AntDefHasNoForm", "AT+QX_ANT_DEF=1", {}, "", nullptr, "", "ERROR", {}},
    Case{"Unknown", "AT+QXDPDT=11", {}, "", nullptr, "", "ERROR", {}}),
    by_name);

INSTANTIATE_TEST_SUITE_P(DiversityAndSar, ModemLine, ::testing::Values(
    Case{"DrxOff", "AT+QX_DRX_OPT=0", {}, "", nullptr, "", "ATOK", {kEm + "150 -> 0"}},
    Case{"DrxOnRefused", "AT+QX_DRX_OPT=1", {"em.151=1"}, "", nullptr, "", "ATNG", {kEm + "151 -> 1"}},
    Case{"DrxOnUndelivered", "AT+QX_DRX_OPT=1", {}, "", "modem", "", "ATNG", {kEm + "151 (undelivered)"}},
    Case{"DrxStateZero", "AT+QX_DRX_OPT=2", {"em.152=0,x"}, "", nullptr, "\r\n\"0\"\r\n", "ATOK", {kEm + "152 -> 0,x"}},
    Case{"DrxStateOne", "AT+QX_DRX_OPT=2", {"em.152=1"}, "", nullptr, "\r\n\"1\"\r\n", "ATOK", {kEm + "152 -> 1"}},
    Case{"DrxStateOther", "AT+QX_DRX_OPT=2", {"em.152=2"}, "", nullptr, "", "ATNG", {kEm + "152 -> 2"}},
    Case{"DrxUnknown", "AT+QX_DRX_OPT=3", {}, "", nullptr, "", "ATERROR", {}},
    Case{"SarOff", "AT+QXSAR=0", {}, "", nullptr, "", "OK", {kEm + "210 -> 0"}},
    Case{"SarOnRefused", "AT+QXSAR=1", {"em.211=1"}, "", nullptr, "", "ERROR", {kEm + "211 -> 1"}},
    Case{"SarUnknown", "AT+QXSAR=2", {}, "", nullptr, "", "ERROR", {}}),
    by_name);

TEST_F(Modem, DpdtCrossIsRecordedByBothSwitchForms) {
    for (const char *line : {"AT+QXDPDT=2", "AT+QXDPDT=3"}) {
        box.set_prop("persist.sys.dpdt", "");
        served(line, "", "OK");
        EXPECT_EQ(box.prop("persist.sys.dpdt"), "cross") << line;
    }
    box.set_prop("persist.sys.dpdt", "normal");
    box.fault("dpdt");
    served("AT+QXDPDT=2", "", "ERROR");
    EXPECT_EQ(box.prop("persist.sys.dpdt"), "normal");
}

// AT+QXDPDT=5: the service always starts; the NV flag only when the debug-port field asks.
struct ServiceCase {
    const char *name;
    int32_t adb_field;
    const char *fault;
    const char *word;
    bool written, started;  // the NV flag (the service then always starts)
};
class DpdtService : public Modem, public ::testing::WithParamInterface<ServiceCase> {};

TEST_P(DpdtService, StartsTheService) {
    const ServiceCase &c = GetParam();
    const std::string before = with_i32(nv_pattern(), 12, c.adb_field);
    box.write("/.sim/nv.bin", before);
    if (c.fault) box.fault(c.fault);
    served("AT+QXDPDT=5", "", c.word);
    EXPECT_EQ(box.read("/.sim/nv.bin"), c.written ? with_i32(before, 104, 1) : before);
    const std::string start = "service-start com.pyxa.engineermode/.DpdtService  ";
    using Lines = std::vector<std::string>;
    EXPECT_EQ(rf_records(box.events()), (c.written ? Lines{"nv write", start} : c.started ? Lines{start} : Lines{}));
}

INSTANTIATE_TEST_SUITE_P(Dpdt, DpdtService, ::testing::Values(
    ServiceCase{"FieldOneWritesFlag", 1, nullptr, "OK", true, true},
    ServiceCase{"FieldTwoWritesFlag", 2, nullptr, "OK", true, true},
    ServiceCase{"FieldThreeOnlyStarts", 3, nullptr, "OK", false, true},
    ServiceCase{"ReadFails", 1, "nv-read", "ERROR", false, false},
    ServiceCase{"WriteFails", 1, "nv-write", "ERROR", false, false}),
    by_name);

}  // namespace
