// Motion-sensor tests.
// Not built yet: every handler of this family answers "Not Implement" (101) until it is.
#include "core/command_tables/handlers.h"
#include "core/result.h"

// clang-format off
int gsensor_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
int msensor_test_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
int hw_poll_status_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
int gyroscope_calibration_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
// clang-format on
