#pragma once
// What the Bluetooth, GPS and WLAN commands share with the rest of the daemon.
#include <cstddef>

// The shell command that AT+QXWANT chose for the Wi-Fi transmit test, empty until then;
// the RF test runs it right after switching the driver into its test mode.
constexpr size_t kAntselCmdSize = 100;
extern char g_antsel_cmd[kAntselCmdSize];

// Copies text to out without its enclosing double quotes; a text that opens a quote must
// close it (-1 otherwise). out has room for the whole text. 0 on success.
int remove_double_quotes(const char *text, char *out);
