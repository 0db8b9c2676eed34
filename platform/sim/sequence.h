#pragma once
// Values that change: a node, a reply or a scripted result can be given a sequence of
// values, one per read or per call, the last one repeating. The sequences are the plain
// file <root>/.sim/sequences, read afresh on every call so that a station can change them
// while the daemon runs:
//
//   [/sys/class/power_supply/usb/online]
//   1
//   0
//   [testapp:battery_mode get]
//   busy
//   ok
//
// A block is named by what it drives: a device path (a node: the value followed by a line
// break becomes the node's text on each read), or "<kind>:<name>" with kind testapp,
// camera or shell (a message or command; "*" may stand for any text, an exact name wins
// over patterns, and a sequence wins over the reply script), or sensor, audio, modem or
// config (a key of that key=value script). In a value "\n" is a line break, "\t" a tab,
// "\\" a backslash, a leading "\#" or "\[" a "#" or "["; "(empty)" is the empty value, and
// for a node "(missing)" removes the node before the read (a part that drops off); lines
// starting with "#" are comments. How far each sequence has got is kept in
// <root>/.sim/sequences.pos, so it survives a daemon restart; a sequence whose values
// change, or whose position line is deleted, starts again from its first value.
#include <string>
#include <vector>

namespace sim {

// The next value of the sequence named exactly what; false when there is none.
bool sequence_next(const std::string &what, std::string &value);
// The same in the simulator state directory given (<root>/.sim).
bool sequence_next_in(const std::string &sim_dir, const std::string &what, std::string &value);
// The next value of the best sequence "<kind>:<pattern>" for a message or command.
bool sequence_reply(const std::string &kind, const std::string &message, std::string &value);
// Before a node is read: a node with a sequence gets its next value as its text.
void sequence_node(const char *device_path);

// Station side, on the sandbox root given: sets (or with no values removes) a sequence
// and starts it again from its first value.
bool sequence_set(const std::string &root, const std::string &what, const std::vector<std::string> &values);
// Starts every sequence again from its first value.
bool sequence_rewind(const std::string &root);

// The escapes of sequence values and reply scripts.
std::string unescape(const std::string &s);
std::string escape(const std::string &s);

}  // namespace sim
