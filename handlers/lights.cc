// Vibrator, indicator lights and the LED ring.
// Not built yet: every handler of this family answers "Not Implement" (101) until it is.
#include "core/command_tables/handlers.h"
#include "core/result.h"

// clang-format off
int vibrator_instant_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
int vibrator_button_light_test_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
int ring_light_test_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
int breathlight_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
int indicatelights_test_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
int haptic_feedback_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
int set_breath_light_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
// clang-format on
