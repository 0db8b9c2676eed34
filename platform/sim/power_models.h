#pragma once
// Power devices of the simulated phone: the direct-charging microcontroller behind its
// control node, and the PMIC register map's debug interface.
#include <cstddef>
#include <cstdint>
#include <string>

namespace sim {

// One write() to the charger controller's "burn_ctl" node: the record is decoded and
// recorded as a "charger" event, and the controller's state nodes follow it. A record the
// controller does not know is recorded as "charger bad-record <hex>" and changes nothing.
// False for such a record.
bool charger_mcu_write(const uint8_t *data, size_t n);

// What the register map's "data" node reads after count and address were written (their
// texts as written): one "addr: value" line per register, from the register table
// .sim/pmic_registers. Empty when count or address is not a number.
std::string pmic_regmap_data(const std::string &count_text, const std::string &address_text);

}  // namespace sim
