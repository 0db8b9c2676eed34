// Display, touch and backlight tests.
// Not built yet: every handler of this family answers "Not Implement" (101) until it is.
#include "core/command_tables/handlers.h"
#include "core/result.h"

// clang-format off
int wall_paper_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
int keep_screen_on_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
int keep_screen_on_always_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
int lcm_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
int lcmid_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
int get_touch_screen_id_handle(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
int touchsrceen_mmi_test_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
int touchscreen_selfcheck_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
int mmi_backlight_test_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
int mmi_wakeup_test_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
int get_lcm_color_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
// clang-format on
