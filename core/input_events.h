#pragma once
// Key capture from the kernel's input devices: a small epoll loop over every key-capable
// event device, run by one input thread while a key test is on. Each released key is
// appended as one letter to the capture file that the key-test commands read back.
#include <linux/input.h>

#include <cstdint>

constexpr const char *kKeyCaptureFile = "/data/engineermode/keycodeTest";
constexpr int kMaxInputDevices = 16;

// Called for a ready device with its descriptor, the epoll event bits and its user data.
typedef int (*ev_callback)(int fd, uint32_t epevents, void *data);

// Opens the event devices under /dev/input that report keys and registers them with one
// epoll instance (at most kMaxInputDevices). 0 on success, -1 on failure.
int ev_init(ev_callback cb, void *data);
// Closes every registered device and the epoll instance.
void ev_exit();
// Waits at most timeout_ms for events: 0 when at least one device is ready, else -1.
int ev_wait(int timeout_ms);
// Calls the callback of each device found ready by the last wait.
void ev_dispatch();
// Reads exactly one input event record; 0 on success.
int ev_get_input(int fd, uint32_t epevents, struct input_event *ev);
// Handles one event: keys, switches and touch coordinates.
int input_callback(int fd, uint32_t epevents, void *data);

// Starts the input thread (a second start while it runs does nothing); 0 or -1.
int create_input_threads();
// Stops it: the thread notices within its 500 ms turn.
void exit_input_threads();
// Stops the thread and reads at most len bytes of the capture file into buf (which has
// room for len + 1 bytes and is zero-filled by the caller); 0, or -1 without a file.
int get_input_key(char *buf, int len);
// Appends one letter to the capture file.
void save_key_code(char letter);

// A function called once with the key code on the next volume-up event, then forgotten.
void set_volume_up_hook(void (*hook)(int code));
// Switch n (n < 16) is on while bit n is set; cleared at every start.
uint64_t input_switch_mask();
// The last reported touch position, (-1, -1) until one is reported.
void input_touch_position(int32_t &x, int32_t &y);
