#pragma once
// What the display family shares with the other screen users (the lights family drives
// the back panel too): whether the phone has a back panel at all.

// Display identifiers the test app knows the panels by.
constexpr int kMainDisplayId = 0;
constexpr int kBackDisplayId = 4096;

// True when the phone has a back panel: its calibration item "\"double_lcm_support\""
// (the quotes are part of the item's name). Without it every "_BACK" command answers OK
// and does nothing.
bool back_panel_supported();

// True when the command name (the text before "=" or "?") ends in "_BACK", compared with
// regard to case as the command tables compare names.
bool is_back_command(const char *cmd);
