// Storage tests: SD card, eMMC/UFS, DDR stress, OTG.
// Not built yet: every handler of this family answers "Not Implement" (101) until it is.
#include "core/command_tables/handlers.h"
#include "core/result.h"

// clang-format off
int check_tcard_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
int sdcard_rw_test_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
int check_otg_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
int sdcard_access_on_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
int sdcard_size_on_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
int sdcard_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
int get_emmc_left_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
int sdcard_cali(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
int emmcfw_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
int ddr_stress_test_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
int otg_udrw_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
// clang-format on
