// Key tests: side keys, pressure keys, virtual keys.
// Not built yet: every handler of this family answers "Not Implement" (101) until it is.
#include "core/command_tables/handlers.h"
#include "core/result.h"

// clang-format off
int virtual_key_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
int key_test_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
int sidekey_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
// clang-format on
