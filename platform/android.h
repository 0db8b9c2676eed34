#pragma once
// Android platform calls the daemon imports (libcutils, libhardware_legacy).
// socket_local_server comes from libcutils itself on every build.
#include <cutils/sockets.h>

#define PROPERTY_KEY_MAX 32
#define PROPERTY_VALUE_MAX 92

#define ANDROID_RB_RESTART 0xDEAD0001
#define ANDROID_RB_POWEROFF 0xDEAD0002
#define ANDROID_RB_RESTART2 0xDEAD0003

#define PARTIAL_WAKE_LOCK 1

extern "C" {
// Reads a system property into value (PROPERTY_VALUE_MAX bytes); the default when unset.
int property_get(const char *key, char *value, const char *default_value);
int property_set(const char *key, const char *value);
int android_reboot(unsigned cmd, int flags, const char *reason);
int acquire_wake_lock(int lock, const char *id);
int release_wake_lock(const char *id);
}
