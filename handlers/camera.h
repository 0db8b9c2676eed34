#pragma once
// Steps shared by the camera handlers (handlers/camera.cc) and the flash handlers
// (handlers/camera_flash.cc).
#include <cstddef>
#include <optional>
#include <string_view>

// Newer projects (above RX6290 or RT6203) no longer offer the old camera commands.
bool camera_gated();
// The answer of a gated command on such a project: the notice and ATERROR.
int camera_gate_answer(char *resp);

// True when a camera reply counts as a pass: it holds "success" anywhere.
bool camera_passed(const char *reply);
// Sends a camera message; a pass gives pass_rc, any other reply goes into the body
// unchanged and gives fail_rc.
int camera_ask(const char *message, char *resp, int fail_rc, int pass_rc = 0);

// Field n (from 0) of text split at any of seps, as strtok splits it: runs of separators
// count as one and empty fields are skipped. Nothing when there are fewer fields.
std::optional<std::string_view> nth_field(std::string_view text, std::string_view seps, size_t n);
