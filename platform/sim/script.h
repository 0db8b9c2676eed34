#pragma once
// Scripts of the simulated phone's libraries: plain files under <root>/.sim that a
// station engineer edits while the simulator runs (every call reads them afresh).
#include <string>

namespace sim {

// A reply script of "message => reply" lines. "*" in a message pattern stands for any
// text; an exact line wins over patterns, and among patterns the one with the most
// fixed characters wins (the first of equals). "\n" in a reply is a line break.
// True when a line matched; reply then holds its reply text. A sequence set for the
// message (see sequence.h; the kind is the file's name before ".replies") wins over
// the file.
bool script_reply(const std::string &file, const std::string &message, std::string &reply);

// Match where only "*" is special, standing for any text.
bool glob_match(const char *pattern, const char *text);

// One key of a key=value state file, or def when it is missing or not a number. Like every
// read_kv of a state file, a sequence "<file name>:<key>" wins over the file.
long script_long(const std::string &file, const std::string &key, long def);
std::string script_text(const std::string &file, const std::string &key, const std::string &def);

}  // namespace sim
