#pragma once
// The control records of the direct-charging microcontroller (an STM32L011 behind the
// debugfs node "burn_ctl"). The driver hands each write() to the controller as one record,
// so a record is always written whole and alone. Encoded and decoded only here: the
// handlers write records, the simulated controller reads them.
#include <array>
#include <cstddef>
#include <cstdint>
#include <optional>

namespace charger {

enum class Op : uint8_t {
    Switch = 0xC0,  // charging on (1) or off (0)
    ParamA = 0xC1,  // the three tuning parameters of the direct-charging loop
    ParamB = 0xC2,
    ParamC = 0xC3,
};

struct Record {
    Op op;
    int32_t value;  // Switch: 1 or 0; parameters: any signed value
};

constexpr size_t kSwitchSize = 2;  // op, on/off byte
constexpr size_t kParamSize = 5;   // op, signed 32-bit value little-endian
using Bytes = std::array<uint8_t, kParamSize>;

// The record's bytes in out; returns how many of them make the record.
inline size_t encode(const Record &r, Bytes &out) {
    out = {};
    out[0] = static_cast<uint8_t>(r.op);
    if (r.op == Op::Switch) {
        out[1] = r.value ? 1 : 0;
        return kSwitchSize;
    }
    uint32_t v = static_cast<uint32_t>(r.value);
    for (size_t i = 0; i < 4; ++i) out[1 + i] = static_cast<uint8_t>(v >> (8 * i));
    return kParamSize;
}

// The record in one write of n bytes; nothing for an unknown op or a wrong length.
inline std::optional<Record> decode(const uint8_t *data, size_t n) {
    if (n == 0) return std::nullopt;
    switch (static_cast<Op>(data[0])) {
    case Op::Switch:
        if (n != kSwitchSize || data[1] > 1) return std::nullopt;
        return Record{Op::Switch, data[1]};
    case Op::ParamA:
    case Op::ParamB:
    case Op::ParamC: {
        if (n != kParamSize) return std::nullopt;
        uint32_t v = 0;
        for (size_t i = 0; i < 4; ++i) v |= static_cast<uint32_t>(data[1 + i]) << (8 * i);
        return Record{static_cast<Op>(data[0]), static_cast<int32_t>(v)};
    }
    }
    return std::nullopt;
}

}  // namespace charger
