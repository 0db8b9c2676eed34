// Battery and charging commands.
// Not built yet: every handler of this family answers "Not Implement" (101) until it is.
#include "core/command_tables/handlers.h"
#include "core/result.h"

// clang-format off
int no_charge_and_power_suplly_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
int get_battery_info_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
int check_battery_test_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
int set_charging_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
int charge_reset_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
int fast_charge_test_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
int read_new_fast_charge_result_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
int check_cout_pin_state_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
int remove_charging_protection_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
int remove_high_temperatrue_protection_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
int check_battery_id_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
int battery_mode_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
int check_power_fg_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
int query_charger_update_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
// clang-format on
