#pragma once

// The daemon's main: start-up in order, then park the main thread for ever.
int ftcmd_main();
void parse_command();
void init_sepolicy();
void init_assembly_at_mode();
int assembly_at_mode_test();
void ftcmd_signal_handler(int sig);
