// NFC tests over NCI.
// Not built yet: every handler of this family answers "Not Implement" (101) until it is.
#include "core/command_tables/handlers.h"
#include "core/result.h"

// clang-format off
int set_nfc_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
int check_nfc_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
// clang-format on
