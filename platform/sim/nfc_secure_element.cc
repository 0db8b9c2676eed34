// The secure element's CPLC read of the factory library on the simulated phone.
#include <errno.h>
#include <fcntl.h>

#include <cctype>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string>
#include <vector>

#include "platform/android.h"
#include "platform/device.h"
#include "platform/factory.h"
#include "platform/sim/cbuf.h"
#include "platform/sim/script.h"
#include "platform/sim/sim.h"

using sim::opt;
using sim::put;
using sim::split;

extern "C" {


int kaelatcmd_getCPLC(int mode) {
    int rc = sim::fault("cplc") ? -1 : 0;
    sim::record("nfc", "getCPLC " + std::to_string(mode) + " -> " + std::to_string(rc));
    return rc;
}

}  // extern "C"
