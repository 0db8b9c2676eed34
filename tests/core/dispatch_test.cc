// Line cleaning, table lookup and the frames the dispatcher itself writes.
#include <cstring>

#include "tests/support/in_process.h"
#include "tests/support/test_name.h"

namespace {

struct TrimCase {
    const char *in;
    int len;  // bytes handed over; -1: strlen
    const char *out;
};

class TrimTest : public ::testing::TestWithParam<TrimCase> {};

// Line ends and spaces go, noise before the first "a" goes, anything else stays.
TEST_P(TrimTest, CleansInPlace) {
    const TrimCase &c = GetParam();
    char buf[kLineSize] = {0};
    memcpy(buf, c.in, strlen(c.in));
    char *got = trim_string(buf, c.len < 0 ? static_cast<int>(strlen(c.in)) : c.len);
    EXPECT_STREQ(got, c.out);
    EXPECT_TRUE(got >= buf && got < buf + kLineSize);
}

INSTANTIATE_TEST_SUITE_P(Lines, TrimTest,
                         ::testing::Values(TrimCase{"xxAT+QXWLAN=1\r\n", -1, "AT+QXWLAN=1"},
                                           TrimCase{"\xEF\xBB\xBF" "at+qxcn=1 \r", -1, "at+qxcn=1"},
                                           TrimCase{" \r\n \n", -1, ""}, TrimCase{"AT+X=1\t\r\n", -1, "AT+X=1\t"},
                                           TrimCase{"12345\r\n", -1, ""},                   // no "a" at all
                                           TrimCase{"AT+QXCN=1\r\n", 12, "AT+QXCN=1\r\n"}),  // TCP: ends at the NUL
                         named_by([](const TrimCase &c) { return c.in; }));

// Only a repeat of the same command in one line is cut off.
TEST(Lines, CutKeepsOnlyTheFirstOfTwinCommands) {
    for (auto [in, out] : {std::pair{"AT+QXCN=1AT+QXCN=1", "AT+QXCN=1"}, {"AT+QXCN=1AT+QXWLAN=1", "AT+QXCN=1AT+QXWLAN=1"},
                           {"AT+QXCN=1", "AT+QXCN=1"}}) {
        char buf[kLineSize] = {0};
        strcpy(buf, in);
        cut_mutil_command(buf);
        EXPECT_STREQ(buf, out) << in;
    }
}

// A private table to watch the search: which rows run, with what, and what follows.
int g_calls = 0, g_result = 0;
std::string g_after_cmd;
int fake_handler(char *cmd, int arg, char *resp) {
    ++g_calls;
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
    int result, answered, calls;
    const char *frame;
    bool after;
};

class SearchTest : public InProcess, public ::testing::WithParamInterface<SearchCase> {};

// The first row whose name equals the text before "=" or "?" answers (case-sensitive).
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
    EXPECT_EQ(g_after_cmd, c.after ? "#" + std::string(c.line + 1) : "");
}

INSTANTIATE_TEST_SUITE_P(
    Rows, SearchTest,
    ::testing::Values(SearchCase{"AT+ONE=1", 0, 1, 1, "AT+ONE=1\r\nbody\r\nOK\r\n", true},
                      SearchCase{"AT+ONE?", 4, 1, 1, "AT+ONE?\r\nbody\r\nERROR\r\n", false},
                      SearchCase{"AT+ONE=1", 1, 0, 1, "", false},  // declines: next table
                      SearchCase{"AT+ONE", 0, 0, 0, "", false},    // no "=" or "?"
                      SearchCase{"at+one=1", 0, 0, 0, "", false}, SearchCase{"=AT+ONE", 0, 0, 0, "", false},
                      SearchCase{"AT+ABCDEFGHIJKLMNOPQRSTUVWXYZ0123456=1", 7, 1, 1,
                                 "AT+ABCDEFGHIJKLMNOPQRSTUVWXYZ0123456=1\r\nbody\r\nATOK\r\n", false}),
    named_by([](const SearchCase &c) { return c.line; }));

TEST(Tables, RowsAreWellFormed) {
    const std::pair<const CommandEntry *, std::size_t> tables[] = {
        {modem_table, modem_table_rows}, {sensor_table, sensor_table_rows}, {general_table, general_table_rows}};
    for (auto [table, rows] : tables) {
        for (std::size_t i = 0; i < rows; ++i) {
            const CommandEntry &r = table[i];
            EXPECT_TRUE(r.arg == 36 && r.handler && !r.after_response && !strncmp(r.name, "AT", 2) && !strpbrk(r.name, "=?"))
                << r.name;
        }
    }
    int rpmb = 0;  // the twin row stays: lookup stops at the first
    for (std::size_t i = 0; i < general_table_rows; ++i) rpmb += strcmp(general_table[i].name, "AT+QX_SAFE_RPMB") == 0;
    EXPECT_EQ(rpmb, 2);
}

struct DispatchCase {
    const char *received;
    int source;
    const char *frame;
};

class DispatchTest : public InProcess, public ::testing::WithParamInterface<DispatchCase> {};

// TCP keeps the line end in the echo; the emergency call answers on any line starting ATD112;.
TEST_P(DispatchTest, AnswersOnTheSource) {
    const DispatchCase &c = GetParam();
    EXPECT_EQ(serve(c.received, c.source), c.frame);
    EXPECT_EQ(current_source(), c.source);
}

INSTANTIATE_TEST_SUITE_P(
    Lines, DispatchTest,
    ::testing::Values(DispatchCase{"AT+QXWLAN\r\n", SRC_TCP, "AT+QXWLAN\r\n\r\n\"AT not support\"\r\nERROR\r\n"},
                      DispatchCase{"AT+QXWLAN\n", SRC_USB, "AT+QXWLAN\r\n\"AT not support\"\r\nERROR\r\n"},
                      DispatchCase{"xxAT+QXWLAN=1\r\n", SRC_UART, "AT+QXWLAN=1\r\n\r\nNot Implement\r\n"},
                      DispatchCase{"AT+QXWLAN=1\r\n", SRC_TCP, "AT+QXWLAN=1\r\n\r\n\r\nNot Implement\r\n"},
                      DispatchCase{"AT+QXNOPE=1", SRC_LOCAL, "AT+QXNOPE=1\r\n\"AT not support\"\r\nERROR\r\n"},
                      DispatchCase{"ATD112;\r\n", SRC_USB, "ATD112;\r\nOK\r\n"},
                      DispatchCase{"ATD112;=1\n", SRC_USB, "ATD112;=1\r\nOK\r\n"},
                      DispatchCase{"ATD112;\r\n", SRC_TCP, "ATD112;\r\n\r\nOK\r\n"}, DispatchCase{" \r\n", SRC_USB, ""}),
    named_by([](const DispatchCase &c) { return c.received; }));

TEST_F(InProcess, EmergencyCallRefusedAnswersError) {
    box.fault("testapp-silent");
    EXPECT_EQ(serve("ATD112;\n", SRC_USB), "ATD112;\r\nERROR\r\n");
    EXPECT_NE(box.events().find("message emerg_call"), std::string::npos);
}

TEST_F(InProcess, NotSupportedFrameStaysWithin156Characters) {
    std::string line = "AT+" + std::string(300, 'Z');
    EXPECT_EQ(serve(line + "\n", SRC_USB), (line + "\r\n\"AT not support\"\r\nERROR\r\n").substr(0, 156));
}

TEST_F(InProcess, NullLineRunsTheHangUpCommandOnTheLastSource) {
    serve("AT+QXWLAN\n", SRC_USB);  // records USB as the last source
    box.set_prop("sys.qrcode.view", "0");
    dispatch_command(nullptr, 0, SRC_TCP);
    EXPECT_EQ(box.prop("sys.qrcode.view"), "1");
    EXPECT_EQ(current_source(), SRC_USB);
    EXPECT_EQ(answer(), "AT+QXMT=1,0\r\n\r\nATOK\r\n");  // nothing was open
}

// A TCP packet of 2048 characters is one line; its frame is cut at 2047 bytes.
TEST_F(InProcess, TcpPacketOfFullLengthIsServedWhole) {
    std::string line = "AT+QXWLAN=" + std::string(2038, '1');
    char buf[kLineSize] = {0};
    line.copy(buf, 2048);
    dispatch_command(buf, 2049, SRC_TCP);
    EXPECT_EQ(buf[2048], '\0');
    EXPECT_EQ(answer(4096), (line + "\r\n\r\nNot Implement\r\n").substr(0, 2047));
}

}  // namespace
