#pragma once
// The simulated phone's process list, as ps shows it (see processes.cc).
#include <string>

namespace sim {

// ps output: a header, then one line per running process.
std::string process_list();

}  // namespace sim
