// Device facade calls that change ownership: on the simulated phone the sandbox files
// keep the host user's ownership, and the change is only recorded.
#include <errno.h>

#include <string>

#include "platform/device.h"
#include "platform/sim/sim.h"

namespace dev {

int chown(const char *p, uid_t owner, gid_t group) {
    std::string detail = std::string(p ? p : "") + " " + std::to_string(owner) + ":" + std::to_string(group);
    if (!exists(p)) {
        errno = ENOENT;
        return -1;
    }
    if (sim::fault("chown")) {
        errno = EPERM;
        return -1;
    }
    sim::record("chown", detail);
    return 0;
}

}  // namespace dev
