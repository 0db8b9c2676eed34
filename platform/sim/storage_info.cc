// The factory library's storage queries on the simulated phone: the factory test-data
// files on the card and the flash chip's maker and BOM (from config).
#include <errno.h>
#include <fcntl.h>

#include <cctype>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string>
#include <vector>
#include <filesystem>

#include "platform/android.h"
#include "platform/device.h"
#include "platform/factory.h"
#include "platform/sim/cbuf.h"
#include "platform/sim/script.h"
#include "platform/sim/sim.h"

using sim::opt;
using sim::put;
using sim::split;

namespace fs = std::filesystem;

struct tf_data_list {
    std::vector<std::string> files;  // host paths inside the sandbox
};

extern "C" {


struct tf_data_list *get_tf_data_file_list(int type) {
    std::string dir = sim::config("tfdata_dir", "/storage/sdcard1/TestData");
    auto *list = new tf_data_list;
    std::error_code ec;
    for (auto it = fs::recursive_directory_iterator(sim::map(dir.c_str()), ec); !ec && it != fs::recursive_directory_iterator();
         it.increment(ec))
        if (it->is_regular_file(ec)) list->files.push_back(it->path().string());
    if (list->files.empty()) {
        delete list;
        return nullptr;
    }
    return list;
}

long long get_tf_data_file_size(struct tf_data_list *list) {
    if (!list) return 0;
    long long bytes = 0;
    std::error_code ec;
    for (const auto &f : list->files) {
        auto n = fs::file_size(f, ec);
        if (!ec) bytes += static_cast<long long>(n);
    }
    return bytes;
}

void tf_data_list_free(struct tf_data_list *list) { delete list; }

int get_emmc_manufacture(char *buf) {
    std::string v = sim::config("emmc_manufacturer");
    if (v.empty() || sim::fault("emmc-bom")) return -1;
    put(buf, 64, v);
    return 0;
}

int get_emmc_bom(char *buf) {
    std::string v = sim::config("emmc_bom");
    if (v.empty() || sim::fault("emmc-bom")) return -1;
    put(buf, 64, v);
    return 0;
}

}  // extern "C"
