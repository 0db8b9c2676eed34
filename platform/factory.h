#pragma once
// The factory support library (the maker's closed library on the phone). Declarations
// follow how the daemon calls it; on a host build platform/sim implements them.
#include <cstddef>
#include <cstdint>

// The factory NV record: read whole, change one field, write whole.
#define PYXA_NV_SIZE 1012

extern "C" {

// ---- system properties and files
// Copies property name into buf (at least 92 bytes), or def when unset; returns the length.
int kaelatcmd_get_system_property(const char *name, char *buf, const char *def);
int kaelatcmd_set_system_property(const char *name, const char *value);  // 0 on success
int kaelatcmd_sizeof_system_file(const char *path);  // 0 for a missing file
int kaelatcmd_write_system_file(const char *path, int flags, const char *text);  // <0 fails
int kaelatcmd_remove_system_file(const char *path);
// Reads up to max bytes into buf and terminates it; 0 (low 32 bits) on success.
long kaelatcmd_fread_system_file(const char *path, char *buf, int max);
int kaelatcmd_read_system_file(const char *path, char *buf, int len);  // 0 on success
// Creates or writes a file with an fopen mode; nonzero with errno set on failure.
int kaelatcmd_fwrite_system_file(const char *path, const char *mode, const char *text);
// Reads a node through the policy layer; bytes read, negative on failure.
int read_policy_file(int mode, const char *path, char *buf, int len);
// Writes text into a file opened with flags (an existing node, or a new file, mode 0666,
// when flags hold O_CREAT); 0 on success, negative on failure.
int write_policy_file(int mode, const char *path, int flags, const char *text);
int write_int(const char *path, int value);  // 0 on success
int readFromFile(const char *path, char *buf, int len);  // bytes read, negative on failure

// ---- key=value item files
// The value stored under key, or NULL. Valid until the next call on this thread.
const char *get_property_file_item_value(const char *file, const char *key);
int set_property_file_item_value(const char *file, const char *key, const char *value);
int delete_property_file_item(const char *file, const char *key);  // nonzero on failure

// ---- factory NV record
int get_PYXA_NV_item(void *record);        // fills PYXA_NV_SIZE bytes; 0 on success
int put_PYXA_NV_item(const void *record);  // 0 on success

// ---- the test app (engineering-mode application)
// Sends a text to the test app and returns its reply, or NULL when it did not answer.
// The reply stays valid until the next call on this thread.
const char *sendMessage(const char *text);
// action may be null (the activity's default), as the end-of-line commands start them.
int startActivityFromFtcmd(const char *component, const char *action, const char *extras);
int startServiceFromFtcmd(const char *component, const char *action, const char *extras);
int stopServiceFromFtcmd(const char *component, const char *action, const char *extras);
int sendBroadcastFromFtcmd(const char *action, const char *component, const char *extras);
int isServiceWork(const char *component);  // 1 while the service runs

// ---- device and build identity
int is_project(const char *code);
// True when the phone's project number is at or above the given one.
int is_above_PD_project(int number);
int is_above_TD_project(int number);
int is_bsp_version(void);
bool get_emmcid(char *buf);           // 101 bytes; false with errno set on failure
int get_cpuid(char *buf, int len);    // 0 on success, errno set on failure
int is_calibrate_item_support(const char *item);
int set_calibrate_item_state(const char *item, const char *state, int uart_flag);

// ---- logging, reset and end-of-line operations
int control_kael_Log(int at_mode, unsigned int mask);
int is_kaellog_running(void);  // bit 0 set while the device log runs
int partition_format(const char *device_path);
int get_tfdata_type(int type);  // nonzero when the factory data package is present
int diag_cmd_clean_gprs_anite(void);
int clear_certificate(void);  // 0 on success
int minui_gr_fb_blank(int blank);

// ---- text helpers
char *delete_char(char *text, char c);

// ---- audio factory-test layer (start-up)
int at_set_audio_init_ftm(void);

// ---- display and touch
// Blanks (1) or unblanks (0) the second screen's framebuffer when there is no Android UI.
int minui_gr_fb_blank_second(int blank);
// The value of a max_brightness node, or negative when it cannot be read.
int get_max_brightness(const char *path);
// Runs the touch panel's sensor test for an item code ("165" to "168"); 0 on success.
int touchpanel_sensor_test(int count, const char *item);

// ---- storage
// Runs a shell command line. Its output (at most size - 1 bytes, NUL-terminated) goes
// into buf only when there is some: a caller's preset text survives a silent command.
// Returns the count of output bytes, or negative when the command could not be run.
int ext_system(const char *command, char *buf, int size);
// The factory test-data files on the card, as an opaque list; NULL when there are none.
struct tf_data_list;
struct tf_data_list *get_tf_data_file_list(int type);
long long get_tf_data_file_size(struct tf_data_list *list);  // bytes of all files
void tf_data_list_free(struct tf_data_list *list);
// Fill the flash chip's maker / bill-of-materials text (buffers of at least 64 bytes).
int get_emmc_manufacture(char *buf);  // 0 on success
int get_emmc_bom(char *buf);          // 0 on success

// ---- camera service
// Sends one "#"-separated camera message and blocks until the reply, which is never
// NULL and stays valid until the next call on this thread; the caller does not free it.
const char *sendMessageToCamera(const char *message);
// Serial number text of a camera module ("rear_camera_main"...); kind is "sn_code".
int get_camera_info_code(const char *kind, const char *camera, char *buf, int len);  // 0 on success
#define CAMERA_ITEM_NAME_SIZE 46
// Newer camera interface: turns an AT command into a camera message (msg, msg_len bytes)
// and a calibration item name (item, CAMERA_ITEM_NAME_SIZE bytes, empty if none);
// -1 when the command cannot be translated.
int transform_at_cmd_to_camera_info(const char *command, char *msg, int msg_len, char *item);
// Turns a camera reply into the response body (len bytes); returns a ResultCode, 7 on pass.
int transform_camera_ret_to_at_resp(const char *reply, char *body, int len);
int is_support_new_camera_interface(void);
// facing: 1 front, 0 rear; role: "Master", "RTBOnly", "Wide" or "Macro".
int is_support_target_camera(int facing, const char *role);
// Checks the OTP memory of the camera named by a status property, noting it in body
// (len bytes); nonzero when the OTP data is good.
int get_target_camera_otp_status(char *body, int len, const char *property);

// ---- NFC
int kaelatcmd_getCPLC(int mode);  // reads the secure element's CPLC data; 0 on success
// Trims surrounding blanks and double quotes from text in place; returns text.
char *substring(char *text);
bool is_hex_string(const char *text);  // true for a non-empty text of hexadecimal digits

// ---- more text helpers
bool isDigitValue(const char *text);  // true for a non-empty text of decimal digits
void uppercase_to_lowcase(char *text, int len);  // lowers the letters of text[0..len) in place
// A new string (free() it) holding len characters of text from start; NULL when start
// lies beyond the text.
char *get_substring(const char *text, int start, int len);

}  // extern "C"
