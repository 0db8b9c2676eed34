// Bluetooth, GPS and WLAN address commands.
// Not built yet: every handler of this family answers "Not Implement" (101) until it is.
#include "core/command_tables/handlers.h"
#include "core/result.h"

// clang-format off
int bt_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
int wifi_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
int wifi_antsel_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
int gps_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
int wlan_addr_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
// clang-format on
