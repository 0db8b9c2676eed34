// Line cleaning, table lookup and the frames the dispatcher itself writes.
#include <cstring>

#include "tests/support/in_process.h"

namespace {

struct TrimCase {
    const char *in;
    int len;  // bytes handed over; -1: strlen
    const char *out;
};

class TrimTest : public ::testing::TestWithParam<TrimCase> {};

TEST_P(TrimTest, CleansInPlace) {
    const TrimCase &c = GetParam();
    char buf[kLineSize] = {0};
    memcpy(buf, c.in, strlen(c.in));
    int len = c.len < 0 ? static_cast<int>(strlen(c.in)) : c.len;
    char *got = trim_string(buf, len);
    EXPECT_STREQ(got, c.out);
    EXPECT_TRUE(got >= buf && got < buf + kLineSize);
}

INSTANTIATE_TEST_SUITE_P(
    Lines, TrimTest,
    ::testing::Values(TrimCase{"AT+QXCN=1\r\n", -1, "AT+QXCN=1"},
                      TrimCase{"xxAT+QXWLAN=1\r\n", -1, "AT+QXWLAN=1"},
                      TrimCase{"\xEF\xBB\xBF" "at+qxcn=1 \r", -1, "at+qxcn=1"},
                      TrimCase{" \r\n \n", -1, ""},
                      TrimCase{"AT+X=1\t\r\n", -1, "AT+X=1\t"},       // tabs stay
                      TrimCase{"12345\r\n", -1, ""},                  // no "a" at all
                      TrimCase{"AT+QXCN=1\r\n", 12, "AT+QXCN=1\r\n"},  // TCP: starts at the NUL
                      TrimCase{"zzz", 4, ""}));

struct CutCase {
    const char *in;
    const char *out;
};

class CutTest : public ::testing::TestWithParam<CutCase> {};

TEST_P(CutTest, KeepsOnlyTheFirstOfTwinCommands) {
    char buf[kLineSize] = {0};
    strcpy(buf, GetParam().in);
    cut_mutil_command(buf);
    EXPECT_STREQ(buf, GetParam().out);
}

INSTANTIATE_TEST_SUITE_P(Lines, CutTest,
                         ::testing::Values(CutCase{"AT+QXCN=1AT+QXCN=1", "AT+QXCN=1"},
                                           CutCase{"AT+QXCN=1\r\nAT+QXCN=1\r\n", "AT+QXCN=1\r\n"},
                                           CutCase{"AT+QXCN=1AT+QXWLAN=1", "AT+QXCN=1AT+QXWLAN=1"},
                                           CutCase{"AT+", "AT+"}, CutCase{"AT+QXCN=1", "AT+QXCN=1"}));

// A private table to watch the search: which rows run, with what, and what follows.
int g_calls = 0;
int g_result = 0;
std::string g_seen_cmd, g_after_cmd;
int fake_handler(char *cmd, int arg, char *resp) {
    ++g_calls;
    g_seen_cmd = cmd;
    EXPECT_EQ(arg, 36);
    EXPECT_EQ(resp[0], '\0');
    cmd[0] = '#';  // handlers may cut their copy up; the echo must not change
    strcpy(resp, "body");
    return g_result;
}
void fake_after(char *cmd) { g_after_cmd = cmd; }

CommandEntry kFakeTable[] = {
    {"AT+ONE", 36, fake_handler, fake_after},
    {"", 36, fake_handler, nullptr},  // a name of the full 32 characters, no NUL
    {"AT+ONE", 36, fake_handler, nullptr},
};
const bool kLongName = (memcpy(kFakeTable[1].name, "AT+ABCDEFGHIJKLMNOPQRSTUVWXYZ0123", 32), true);

struct SearchCase {
    const char *line;
    int result;
    int answered;
    int calls;
    const char *frame;
    bool after;
};

class SearchTest : public InProcess, public ::testing::WithParamInterface<SearchCase> {};

TEST_P(SearchTest, FirstEqualNameAnswers) {
    const SearchCase &c = GetParam();
    g_calls = 0;
    g_result = c.result;
    g_after_cmd.clear();
    char line[kLineSize] = {0};
    strcpy(line, c.line);
    EXPECT_EQ(search_command_table(kFakeTable, 3, line), c.answered);
    EXPECT_EQ(g_calls, c.calls);
    EXPECT_STREQ(line, c.line);
    EXPECT_EQ(answer(), c.frame);
    EXPECT_EQ(!g_after_cmd.empty(), c.after);
    if (c.after) {
        EXPECT_EQ(g_after_cmd, "#" + std::string(c.line + 1));
    }
}

INSTANTIATE_TEST_SUITE_P(
    Rows, SearchTest,
    ::testing::Values(SearchCase{"AT+ONE=1", 0, 1, 1, "AT+ONE=1\r\nbody\r\nOK\r\n", true},
                      SearchCase{"AT+ONE?", 4, 1, 1, "AT+ONE?\r\nbody\r\nERROR\r\n", false},
                      SearchCase{"AT+ONE=1", 1, 0, 1, "", false},  // declines: next table
                      SearchCase{"AT+ONE", 0, 0, 0, "", false},    // no "=" or "?"
                      SearchCase{"at+one=1", 0, 0, 0, "", false},  // names compare with case
                      SearchCase{"=AT+ONE", 0, 0, 0, "", false},
                      SearchCase{"AT+ABCDEFGHIJKLMNOPQRSTUVWXYZ0123456=1", 7, 1, 1,
                                 "AT+ABCDEFGHIJKLMNOPQRSTUVWXYZ0123456=1\r\nbody\r\nATOK\r\n", false}));

TEST(Tables, RowsAreWellFormed) {
    const std::pair<const CommandEntry *, std::size_t> tables[] = {
        {modem_table, modem_table_rows}, {sensor_table, sensor_table_rows}, {general_table, general_table_rows}};
    for (auto [table, rows] : tables) {
        for (std::size_t i = 0; i < rows; ++i) {
            EXPECT_EQ(table[i].arg, 36) << table[i].name;
            EXPECT_NE(table[i].handler, nullptr) << table[i].name;
            EXPECT_EQ(table[i].after_response, nullptr) << table[i].name;
            EXPECT_EQ(strncmp(table[i].name, "AT", 2), 0) << table[i].name;
            EXPECT_EQ(strpbrk(table[i].name, "=?"), nullptr) << table[i].name;
        }
    }
    // Lookup order is data: the first and last rows of each table, and the twins.
    EXPECT_STREQ(modem_table[0].name, "AT+EMBT");
    EXPECT_STREQ(sensor_table[sensor_table_rows - 1].name, "AT+QXMPPS");
    EXPECT_STREQ(general_table[0].name, "AT+QXCN");
    EXPECT_STREQ(general_table[general_table_rows - 1].name, "AT+QX_CCM_PARA");
    int rpmb = 0;
    for (std::size_t i = 0; i < general_table_rows; ++i) rpmb += strcmp(general_table[i].name, "AT+QX_SAFE_RPMB") == 0;
    EXPECT_EQ(rpmb, 2);
}

struct DispatchCase {
    const char *received;
    int source;
    const char *frame;
};

class DispatchTest : public InProcess, public ::testing::WithParamInterface<DispatchCase> {};

TEST_P(DispatchTest, AnswersOnTheSource) {
    const DispatchCase &c = GetParam();
    EXPECT_EQ(serve(c.received, c.source), c.frame);
    EXPECT_EQ(g_port.source_type, c.source);
}

INSTANTIATE_TEST_SUITE_P(
    Lines, DispatchTest,
    ::testing::Values(
        DispatchCase{"AT+QXWLAN\r\n", SRC_TCP, "AT+QXWLAN\r\n\r\n\"AT not support\"\r\nERROR\r\n"},
        DispatchCase{"AT+QXWLAN\n", SRC_USB, "AT+QXWLAN\r\n\"AT not support\"\r\nERROR\r\n"},
        DispatchCase{"xxAT+QXWLAN=1\r\n", SRC_UART, "AT+QXWLAN=1\r\n\r\nNot Implement\r\n"},
        DispatchCase{"AT+QXWLAN=1\r\n", SRC_TCP, "AT+QXWLAN=1\r\n\r\n\r\nNot Implement\r\n"},
        DispatchCase{"AT+QXNOPE=1", SRC_LOCAL, "AT+QXNOPE=1\r\n\"AT not support\"\r\nERROR\r\n"},
        DispatchCase{"ATD112;\r\n", SRC_USB, "ATD112;\r\nOK\r\n"},
        DispatchCase{"ATD112;=1\n", SRC_USB, "ATD112;=1\r\nOK\r\n"},
        DispatchCase{"ATD112;\r\n", SRC_TCP, "ATD112;\r\n\r\nOK\r\n"},
        DispatchCase{" \r\n", SRC_USB, ""}));

TEST_F(InProcess, EmergencyCallRefusedAnswersError) {
    box.fault("testapp-silent");
    EXPECT_EQ(serve("ATD112;\n", SRC_USB), "ATD112;\r\nERROR\r\n");
    EXPECT_NE(box.events().find("message emerg_call"), std::string::npos);
}

TEST_F(InProcess, NotSupportedFrameStaysWithin156Characters) {
    std::string line = "AT+" + std::string(300, 'Z');
    std::string got = serve(line + "\n", SRC_USB);
    EXPECT_EQ(got.size(), 156u);
    EXPECT_EQ(got, (line + "\r\n\"AT not support\"\r\nERROR\r\n").substr(0, 156));
}

TEST_F(InProcess, NullLineRunsTheHangUpCommandOnTheLastSource) {
    serve("AT+QXWLAN\n", SRC_USB);  // records USB as the last source
    box.set_prop("sys.qrcode.view", "0");
    dispatch_command(nullptr, 0, SRC_TCP);
    EXPECT_EQ(box.prop("sys.qrcode.view"), "1");
    EXPECT_EQ(g_port.source_type, SRC_USB);
    EXPECT_EQ(answer(), "AT+QXMT=1,0\r\n\r\nATOK\r\n");  // nothing was open
}

TEST_F(InProcess, TcpPacketOfFullLengthIsServedWhole) {
    std::string line = "AT+QXWLAN=" + std::string(2038, '1');
    ASSERT_EQ(line.size(), 2048u);
    char buf[kLineSize] = {0};
    line.copy(buf, 2048);
    connect_source(SRC_TCP);
    dispatch_command(buf, 2049, SRC_TCP);
    EXPECT_EQ(buf[2048], '\0');
    std::string got = answer(4096);
    EXPECT_EQ(got, (line + "\r\n\r\nNot Implement\r\n").substr(0, 2047));
}

}  // namespace
