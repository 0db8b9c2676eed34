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
    // modem script lines; "project=", "fault=" and "adb=" (the NV debug-port field) set those instead
    std::vector<std::string> script;
    std::string body;
    const char *word;
    std::vector<std::string> records;  // modem, rf, service and NV records, exactly, in order
    const char *dpdt = "";             // persist.sys.dpdt afterwards
};

std::vector<std::string> rf_records(const std::string &log) {
    std::vector<std::string> out;
    std::istringstream in(log);
    for (std::string l; std::getline(in, l);)
        for (const char *kind : {"modem ", "rf ", "service-start ", "nv "})
            if (l.rfind(kind, 0) == 0) out.push_back(l);
    return out;
}

class ModemLine : public InProcess, public ::testing::WithParamInterface<Case> {
protected:
    void SetUp() override {
        InProcess::SetUp();
        box.write("/.sim/nv.bin", nv_pattern());
        box.write("/.sim/events.log", "");
    }
};

TEST_P(ModemLine, Answers) {
    const Case &c = GetParam();
    std::string script, nv = nv_pattern();
    for (const auto &l : c.script) {
        if (l.starts_with("project=")) box.write("/.sim/config", l + "\n" + box.read("/.sim/config"));
        else if (l.starts_with("fault=")) box.fault(l.substr(6));
        else if (l.starts_with("adb=")) box.write("/.sim/nv.bin", nv = with_i32(nv, 12, std::stoi(l.substr(4))));
        else script += l + "\n";
    }
    box.write("/.sim/modem", script + box.read("/.sim/modem"));
    const std::string want = frame(c.line, c.body, c.word);
    EXPECT_EQ(serve(c.line, SRC_TCP, want.size()), want);
    const auto records = rf_records(box.events());
    EXPECT_EQ(records, c.records);
    // The only NV write sets the DPDT service flag.
    const bool wrote = !records.empty() && records[0] == "nv write";
    EXPECT_EQ(box.read("/.sim/nv.bin"), wrote ? with_i32(nv, 104, 1) : nv);
    EXPECT_EQ(box.prop("persist.sys.dpdt"), c.dpdt);
}

const std::string kEm = "modem em_status ";
const std::string kService = "service-start com.pyxa.engineermode/.DpdtService  ";
const auto by_name = [](const auto &i) { return std::string(i.param.name); };

INSTANTIATE_TEST_SUITE_P(Dpdt, ModemLine, ::testing::Values(
    Case{"Main", "AT+QXDPDT=0", {}, "", "OK", {kEm + "110 -> 0"}},
    Case{"MainRefused", "AT+QXDPDT=0", {"em.110=1"}, "", "ERROR", {kEm + "110 -> 1"}},
    Case{"MainUndelivered", "AT+QXDPDT=0", {"fault=modem"}, "", "ERROR", {kEm + "110 (undelivered)"}},
    Case{"MainProjectFirst", "AT+QXDPDT=0", {"project=RX5280F_EX"}, "", "OK", {kEm + "122 -> 0", kEm + "110 -> 0"}},
    Case{"MainProjectRefused", "AT+QXDPDT=0", {"em.122=2", "project=RX5280F_EX"}, "", "ATNG", {kEm + "122 -> 2"}},
    Case{"Diversity", "AT+QXDPDT=1", {}, "", "OK", {kEm + "111 -> 0"}},
    Case{"DiversityProjectRefused", "AT+QXDPDT=1", {"em.121=x", "project=RX5280F_EX"}, "", "ATNG", {kEm + "121 -> x"}},
    Case{"CrossOnOtherProjects", "AT+QXDPDT=2", {}, "", "OK", {"rf dpdt cross"}, "cross"},
    Case{"NormalOnRx6105", "AT+QXDPDT=2", {"project=RX6105"}, "", "OK", {"rf dpdt normal"}, "cross"},
    Case{"Form3NormalOnOtherProjects", "AT+QXDPDT=3", {}, "", "OK", {"rf dpdt normal"}, "cross"},
    Case{"Form3CrossOnRx6105F", "AT+QXDPDT=3", {"project=RX6105F_EX"}, "", "OK", {"rf dpdt cross"}, "cross"},
    Case{"SwitchFails", "AT+QXDPDT=2", {"fault=dpdt"}, "", "ERROR", {"rf dpdt cross (failed)"}},
    Case{"State", "AT+QXDPDT=4", {"em.118=6"}, "\r\n\"2,1\"\r\n", "OK", {kEm + "118 -> 6"}},
    Case{"StateHighBits", "AT+QXDPDT=4", {"em.118=29"}, "\r\n\"1,3\"\r\n", "OK", {kEm + "118 -> 29"}},
    Case{"StateUndelivered", "AT+QXDPDT=4", {"fault=modem"}, "", "ERROR", {kEm + "118 (undelivered)"}},
    Case{"Tuner6OnOtherProjects", "AT+QXDPDT=6", {}, "", "OK", {kEm + "116 -> 0"}},
    Case{"Tuner6OnRx6105", "AT+QXDPDT=6", {"project=RX6105"}, "", "OK", {kEm + "117 -> 0"}},
    Case{"Tuner7OnOtherProjects", "AT+QXDPDT=7", {"em.117=1"}, "", "ERROR", {kEm + "117 -> 1"}},
    Case{"Tuner7OnRx6105", "AT+QXDPDT=7", {"project=RX6105"}, "", "OK", {kEm + "116 -> 0"}},
    // The service always starts; the NV flag is set only when the debug-port field is 1 or 2.
    Case{"ServiceFieldOne", "AT+QXDPDT=5", {"adb=1"}, "", "OK", {"nv write", kService}},
    Case{"ServiceFieldTwo", "AT+QXDPDT=5", {"adb=2"}, "", "OK", {"nv write", kService}},
    Case{"ServiceFieldThree", "AT+QXDPDT=5", {"adb=3"}, "", "OK", {kService}},
    Case{"ServiceNvReadFails", "AT+QXDPDT=5", {"adb=1", "fault=nv-read"}, "", "ERROR", {}},
    Case{"ServiceNvWriteFails", "AT+QXDPDT=5", {"adb=1", "fault=nv-write"}, "", "ERROR", {}},
    Case{"RawState", "AT+QXDPDT=8", {"em.118=6"}, "\r\n6\r\n", "OK", {kEm + "118 -> 6"}},
    Case{"Status9", "AT+QXDPDT=9", {}, "", "OK", {kEm + "9 -> 0"}},
    Case{"Status10Refused", "AT+QXDPDT=10", {"em.10=9"}, "", "ERROR", {kEm + "10 -> 9"}},
    Case{"Reply115", "AT+QXDPDT=115", {}, "\r\n0,main antenna\r\n", "OK", {kEm + "115 -> 0,main antenna"}},
    Case{"Reply119NotVerified", "AT+QXDPDT=119", {"em.119=7,off"}, "\r\n7,off\r\n", "OK", {kEm + "119 -> 7,off"}},
    Case{"Status121", "AT+QXDPDT=121", {}, "", "ATOK", {kEm + "121 -> 0"}},
    Case{"Status122Refused", "AT+QXDPDT=122", {"em.122=1"}, "", "ATNG", {kEm + "122 -> 1"}},
    Case{"TunerNv", "AT+QXDPDT=123", {}, "\"3\"", "ATOK", {"modem nv-read 26693 -> 3"}},
    Case{"TunerNvZeroIsEmpty", "AT+QXDPDT=123", {"nv.26693=0"}, "\"0\"", "ATNG", {"modem nv-read 26693 -> 0"}},
    Case{"TunerNvFails", "AT+QXDPDT=123", {"fault=modem"}, "", "ATERROR", {"modem nv-read 26693 (failed)"}},
    Case{"SmartAntenna", "AT+QXSMT_DEFAULT_ANT=1", {}, "\"1\"", "ATOK", {"modem nv-read 30001 -> 1"}},
    Case{"SmartAntennaFails", "AT+QXSMT_DEFAULT_ANT=1", {"fault=modem"}, "\"modem errror\"", "ATNG",
         {"modem nv-read 30001 (failed)"}},
    Case{"SmartAntennaOtherForm", "AT+QXSMT_DEFAULT_ANT=0", {}, "", "ERROR", {}},
    Case{"AntDefHasNoForm", "AT+QX_ANT_DEF=1", {}, "", "ERROR", {}},
    Case{"Unknown", "AT+QXDPDT=11", {}, "", "ERROR", {}}),
    by_name);

INSTANTIATE_TEST_SUITE_P(DiversityAndSar, ModemLine, ::testing::Values(
    Case{"DrxOff", "AT+QX_DRX_OPT=0", {}, "", "ATOK", {kEm + "150 -> 0"}},
    Case{"DrxOnRefused", "AT+QX_DRX_OPT=1", {"em.151=1"}, "", "ATNG", {kEm + "151 -> 1"}},
    Case{"DrxStateZero", "AT+QX_DRX_OPT=2", {"em.152=0,x"}, "\r\n\"0\"\r\n", "ATOK", {kEm + "152 -> 0,x"}},
    Case{"DrxStateOne", "AT+QX_DRX_OPT=2", {"em.152=1"}, "\r\n\"1\"\r\n", "ATOK", {kEm + "152 -> 1"}},
    Case{"DrxStateOther", "AT+QX_DRX_OPT=2", {"em.152=2"}, "", "ATNG", {kEm + "152 -> 2"}},
    Case{"DrxUnknown", "AT+QX_DRX_OPT=3", {}, "", "ATERROR", {}},
    Case{"SarOff", "AT+QXSAR=0", {}, "", "OK", {kEm + "210 -> 0"}},
    Case{"SarOnRefused", "AT+QXSAR=1", {"em.211=1"}, "", "ERROR", {kEm + "211 -> 1"}},
    Case{"SarUnknown", "AT+QXSAR=2", {}, "", "ERROR", {}}),
    by_name);

}  // namespace
