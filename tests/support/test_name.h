#pragma once
// Readable names for parameterised cases, so that a failure reads
// "Power/PowerLine.Answers/AtQxadb_0_1_3" and not a dump of the case's bytes.
#include <gtest/gtest.h>

#include <cctype>
#include <string>
#include <string_view>

// "AT+QXADB=0,1" -> "AtQxadb_0_1": the command name in camel case, then the arguments
// (letters and digits only, each run of other characters one "_"). At most 48 characters.
inline std::string test_name(std::string_view text) {
    std::string out;
    bool in_args = false, word_start = true;
    for (char c : text) {
        if (c == '=' || c == '?') in_args = true;
        if (std::isalnum(static_cast<unsigned char>(c)) == 0) {
            if (in_args && !out.empty() && out.back() != '_') out += '_';
            word_start = true;
            continue;
        }
        if (in_args) out += c;
        else out += static_cast<char>(word_start ? std::toupper(c) : std::tolower(c));
        word_start = false;
        if (out.size() >= 48) break;
    }
    while (!out.empty() && out.back() == '_') out.pop_back();
    return out.empty() ? "Empty" : out;
}

// A name generator for INSTANTIATE_TEST_SUITE_P: the text that text_of picks from the
// case, then the case's index (the same line often stands in several cases).
template <typename F>
auto named_by(F text_of) {
    return [text_of](const auto &info) { return test_name(text_of(info.param)) + "_" + std::to_string(info.index); };
}
