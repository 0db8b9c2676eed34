// Camera tests.
// Not built yet: every handler of this family answers "Not Implement" (101) until it is.
#include "core/command_tables/handlers.h"
#include "core/result.h"

// clang-format off
int camera_id_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
int set_camera_test_handler_mode(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
int camera_test_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
int camera_fill_light_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
int front_flashlight_test_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
int check_camera_status_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
int set_flashlight_status_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
int flashlight_test_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
int flashlight_amp_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
int get_camera_color_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
int get_camera_sn_number_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
int get_camera_ir_id_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
int camera_otp_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
int camera_pdaf_test_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
int camera_single_test_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
int set_camera_para_handler(char *, int, char *) { return RC_NOT_IMPLEMENTED; }
// clang-format on
