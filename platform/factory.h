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
// Writes text into an existing file opened with flags; 0 on success, negative on failure.
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
int startActivityFromFtcmd(const char *component, int flags, const char *extras);
int startServiceFromFtcmd(const char *component, const char *action, const char *extras);
int stopServiceFromFtcmd(const char *component, const char *action, const char *extras);
int sendBroadcastFromFtcmd(const char *action, const char *component, const char *extras);
int isServiceWork(const char *component);  // 1 while the service runs

// ---- device and build identity
int is_project(const char *code);
int is_above_PD_project(void);
int is_above_TD_project(void);
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

}  // extern "C"
