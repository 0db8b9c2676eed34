// Line cleaning, table lookup and the frames the dispatcher itself writes.
#include <cstring>
#include <span>

#include "tests/support/in_process.h"
#include "tests/support/test_name.h"

namespace {

// Only a repeat of the same command in one line is cut off.
TEST(Lines, CutKeepsOnlyTheFirstOfTwinCommands) {
    for (auto [in, out] : {std::pair{"AT+QXCN=1AT+QXCN=1", "AT+QXCN=1"},
                           {"AT+QXCN=1AT+QXWLAN=1", "AT+QXCN=1AT+QXWLAN=1"}}) {
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
    int result, calls;
    const char *frame;  // "": nothing is written
    bool after;
};

class SearchTest : public InProcess, public ::testing::WithParamInterface<SearchCase> {};

// The first row whose name equals the text before "=" or "?" answers (case-sensitive), framed
// with the trailer word of its result (every code without one is UNKNOWN); frames are logged.
TEST_P(SearchTest, FirstEqualNameAnswers) {
    const SearchCase &c = GetParam();
    g_calls = 0;
    g_result = c.result;
    g_after_cmd.clear();
    char line[kLineSize] = {0};
    strcpy(line, c.line);
    EXPECT_EQ(search_command_table(kFakeTable, 3, line), c.calls == 1 && c.result != RC_DECLINE);
    EXPECT_EQ(g_calls, c.calls);
    EXPECT_STREQ(line, c.line);
    EXPECT_EQ(answer(), c.frame);
    EXPECT_EQ(box.exists("/cache/recovery/last_atcmd0"), *c.frame != '\0');
    EXPECT_EQ(g_after_cmd, c.after ? "#" + std::string(c.line + 1) : "");
}

INSTANTIATE_TEST_SUITE_P(
    Rows, SearchTest,
    ::testing::Values(SearchCase{"AT+ONE=1", 0, 1, "AT+ONE=1\r\nbody\r\nOK\r\n", true},
                      SearchCase{"AT+ONE?", 4, 1, "AT+ONE?\r\nbody\r\nERROR\r\n", false},
                      SearchCase{"AT+ONE=1", 1, 1, "", false},  // declines: next table
                      SearchCase{"AT+ONE=1", 3, 1, "AT+ONE=1\r\nbody\r\nUNKNOWN\r\n", false},
                      SearchCase{"AT+ONE=1", 5, 1, "", false},  // answered without a frame
                      SearchCase{"AT+ONE=1", 6, 1, "AT+ONE=1\r\nbody\r\n\r\n", false},
                      SearchCase{"AT+ONE=1", 8, 1, "AT+ONE=1\r\nbody\r\nATNG\r\n", false},
                      SearchCase{"AT+ONE=1", 9, 1, "AT+ONE=1\r\nbody\r\nATERROR\r\n", false},
                      SearchCase{"AT+ONE=1", 101, 1, "AT+ONE=1\r\nbody\r\nNot Implement\r\n", false},
                      SearchCase{"AT+ONE", 0, 0, "", false},  // no "=" or "?"
                      SearchCase{"at+one=1", 0, 0, "", false},
                      SearchCase{"AT+ABCDEFGHIJKLMNOPQRSTUVWXYZ0123456=1", 7, 1,
                                 "AT+ABCDEFGHIJKLMNOPQRSTUVWXYZ0123456=1\r\nbody\r\nATOK\r\n", false}),
    [](const auto &i) {
        return test_name(i.param.line) + "_Rc" + std::to_string(i.param.result) + "_" + std::to_string(i.index);
    });

// Every row can be reached and run: a name without "=" or "?", a handler, the common argument.
TEST(Tables, RowsAreWellFormed) {
    const std::pair<const CommandEntry *, std::size_t> tables[] = {
        {modem_table, modem_table_rows}, {sensor_table, sensor_table_rows}, {general_table, general_table_rows}};
    for (auto [table, rows] : tables)
        for (const CommandEntry &r : std::span(table, rows))
            EXPECT_TRUE(r.arg == 36 && r.handler && !r.after_response && !strncmp(r.name, "AT", 2) &&
                        !strpbrk(r.name, "=?"))
                << r.name;
}

struct DispatchCase {
    std::string received;
    int source;
    std::string frame;
    const char *fault = nullptr;
};

class DispatchTest : public InProcess, public ::testing::WithParamInterface<DispatchCase> {};

const std::string kNotSupported = "\"AT not support\"\r\nERROR\r\n";
const std::string kLong = "AT+" + std::string(300, 'Z'), kFull = "AT+QXWLAN=" + std::string(2038, '1');

// Line ends, spaces and noise before the first "a" go (TCP keeps its line end in the echo); the
// emergency call answers on any line starting ATD112;; not-supported frames are cut at 156 bytes.
TEST_P(DispatchTest, AnswersOnTheSource) {
    const DispatchCase &c = GetParam();
    if (c.fault != nullptr) box.fault(c.fault);
    EXPECT_EQ(serve(c.received, c.source), c.frame);
    EXPECT_EQ(current_source(), c.source);
}

INSTANTIATE_TEST_SUITE_P(
    Lines, DispatchTest,
    ::testing::Values(DispatchCase{"AT+QXWLAN\r\n", SRC_TCP, "AT+QXWLAN\r\n\r\n" + kNotSupported},
                      DispatchCase{"xxAT+QXWLAN=1\r\n", SRC_UART, "AT+QXWLAN=1\r\n\r\nNot Implement\r\n"},
                      DispatchCase{"AT+QXNOPE=1", SRC_LOCAL, "AT+QXNOPE=1\r\n" + kNotSupported},
                      DispatchCase{"ATD112;\r\n", SRC_USB, "ATD112;\r\nOK\r\n"},
                      DispatchCase{"ATD112;=1\n", SRC_USB, "ATD112;=1\r\nOK\r\n"},
                      DispatchCase{"ATD112;\n", SRC_USB, "ATD112;\r\nERROR\r\n", "testapp-silent"},
                      DispatchCase{"\xEF\xBB\xBF" "at+qxcn=1 \r", SRC_USB, "at+qxcn=1\r\n" + kNotSupported},
                      DispatchCase{"AT+X=1\t\r\n", SRC_USB, "AT+X=1\t\r\n" + kNotSupported},
                      DispatchCase{" \r\n \n", SRC_USB, ""}, DispatchCase{"12345\r\n", SRC_USB, ""},  // no "a" at all
                      DispatchCase{kLong + "\n", SRC_USB, (kLong + "\r\n" + kNotSupported).substr(0, 156)},
                      DispatchCase{kFull, SRC_TCP, (kFull + "\r\n\r\nNot Implement\r\n").substr(0, 2047)}),
    [](const auto &i) {
        return test_name(i.param.received) + (i.param.fault ? "_Refused_" : "_") + std::to_string(i.index);
    });

TEST_F(InProcess, NullLineRunsTheHangUpCommandOnTheLastSource) {
    serve("AT+QXWLAN\n", SRC_USB);  // records USB as the last source
    box.set_prop("sys.qrcode.view", "0");
    dispatch_command(nullptr, 0, SRC_TCP);
    EXPECT_EQ(box.prop("sys.qrcode.view"), "1");
    EXPECT_EQ(current_source(), SRC_USB);
    EXPECT_EQ(answer(), "AT+QXMT=1,0\r\n\r\nATOK\r\n");  // nothing was open
}

}  // namespace
