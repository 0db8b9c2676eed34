// The factory library's display and touch calls on the simulated phone: the second
// framebuffer, panel brightness limits and the touch panel's sensor test.
//
// On a phone the touch controller runs its open/short sensor test or its calibration for
// an item code (165 main calibration, 166 main sensor test, 167 and 168 the same for the
// back panel) and leaves "Pass" or "Fail" in the verdict file that the result queries
// read. The model gives the result that config scripts ("touchpanel_test.<item>", else
// "touchpanel_test"; 0 passes) and writes the verdict the same way; it does not model
// the test's duration, its "testing" state (write that into the verdict file yourself)
// or the per-channel readings. Framebuffer blanking is recorded only.
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


int minui_gr_fb_blank_second(int blank) {
    sim::record("fb", "second blank " + std::to_string(blank));
    return 0;
}

int get_max_brightness(const char *path) {
    std::string text;
    if (!dev::read_node(path, text, 32) || text.empty()) return -1;
    return atoi(text.c_str());
}

// The panel's test writes its verdict where the result queries look for it.
int touchpanel_sensor_test(int count, const char *item) {
    std::string code = opt(item);
    long scripted = sim::script_long(sim::state("config"), "touchpanel_test", 0);
    scripted = sim::script_long(sim::state("config"), "touchpanel_test." + code, scripted);
    int rc = sim::fault("touchpanel") ? -1 : static_cast<int>(scripted);
    const char *file = code == "165"   ? "/data/engineermode/tp_at_sensor_cali"
                       : code == "166" ? "/data/engineermode/tp_at_sensor_test"
                       : code == "167" ? "/data/engineermode/tp_at_sensor_cali_back"
                       : code == "168" ? "/data/engineermode/tp_at_sensor_test_back"
                                       : nullptr;
    if (file) dev::write_node(file, rc == 0 ? "Pass\n" : "Fail\n", O_WRONLY | O_CREAT | O_TRUNC);
    sim::record("touchpanel", "sensor_test count=" + std::to_string(count) + " item=" + code + " -> " + std::to_string(rc));
    return rc;
}

}  // extern "C"
