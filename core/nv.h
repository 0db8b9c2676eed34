#pragma once
// The factory NV record as handlers and start-up use it: a zero-filled block, read whole,
// one field changed, written whole. Field offsets are the record's fixed layout.
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <mutex>

#include "platform/factory.h"

namespace nv {

constexpr size_t kRtFlag = 8;             // read by AT+QXRT=0
constexpr size_t kAdbFlag = 12;           // 1 while the debug port is to stay open
constexpr size_t kBrand = 16;             // 50-byte text
constexpr size_t kQxsnOk = 112;           // the system check has passed
constexpr size_t kChipId = 172;           // 68-byte text
constexpr size_t kResetDelay = 384;       // seconds of a pending delayed reset
constexpr size_t kUpdateFlag = 392;       // bit 0 delayed reset, bit 5 factory logging
constexpr size_t kAssemblyAtMode = 488;
constexpr size_t kDefaultAtMode = 664;    // one character
constexpr size_t kFirstBootDone = 688;
constexpr size_t kDpdtService = 104;      // 1 asks the DPDT service to run; the debug-port close clears it
constexpr size_t kGsensorCalFlag = 0;     // 1 after a good accelerometer calibration
constexpr size_t kGsensorCalOffsets = 76; // accelerometer offsets x, y, z (three s32)
constexpr size_t kGyroCalFlag = 120;      // 1 after a good gyroscope calibration
constexpr size_t kGyroCalOffsets = 124;   // gyroscope offsets x, y, z (three s32)
constexpr size_t kWallpaperId = 88;         // AT+QXMMIUI
constexpr size_t kSpecialProduct = 328;     // bit set; kSecondScreenOff: AT+SECSCREEN
constexpr uint32_t kSecondScreenOff = 0x40;
constexpr size_t kMainPanelColour = 516;    // calibrated colour 0xRRGGBB, restored by AT+LCMT=1
constexpr size_t kBackPanelColour = 520;    // the same for the back panel, AT+LCMT_BACK=1
constexpr size_t kEadcWord = 460;         // signed word answered by AT+EADC=6

struct Record {
    unsigned char bytes[PYXA_NV_SIZE] = {};

    int32_t i32(size_t off) const {
        int32_t v;
        memcpy(&v, bytes + off, sizeof v);
        return v;
    }
    void set_i32(size_t off, int32_t v) { memcpy(bytes + off, &v, sizeof v); }
    char *text(size_t off) { return reinterpret_cast<char *>(bytes + off); }
};

// Zero-fills the record and reads it; true on success.
inline bool read(Record &rec) {
    memset(rec.bytes, 0, sizeof rec.bytes);
    return get_PYXA_NV_item(rec.bytes) == 0;
}
inline bool write(const Record &rec) { return put_PYXA_NV_item(rec.bytes) == 0; }

enum class Update { Ok, ReadFailed, WriteFailed };

// Handlers change the record under the dispatch mutex, but the sensor calibration workers
// write their offsets from their own threads: every read-change-write holds this lock, so
// neither overwrites the other's field with a stale copy of the record.
inline std::mutex &record_mutex() {
    static std::mutex m;
    return m;
}
// Held by a handler that reads, changes and writes the record by hand (update() holds it itself).
[[nodiscard]] inline std::unique_lock<std::mutex> hold() { return std::unique_lock<std::mutex>(record_mutex()); }

// Read, change one field, write back: the only way the record is ever changed.
template <typename Fn>
Update update(Fn &&change) {
    const std::lock_guard<std::mutex> held(record_mutex());
    Record rec;
    if (!read(rec)) return Update::ReadFailed;
    change(rec);
    return write(rec) ? Update::Ok : Update::WriteFailed;
}

}  // namespace nv
