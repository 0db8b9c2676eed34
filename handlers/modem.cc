// Modem and RF commands.
// Not built yet: every handler of this family answers "Not Implement" (101) until it is.
#include "core/command_tables/handlers.h"
#include "core/result.h"

// clang-format off
int set_dpdt_status_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
int set_antenna_diversity_status_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
int sar_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
// clang-format on
