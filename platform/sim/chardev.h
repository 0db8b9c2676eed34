#pragma once
// Devices that answer: the simulator puts a device model behind a device path.
//
// A character device (an input event device, the NFC controller...): dev::open of its path
// gives the daemon a real descriptor, one end of a socket pair, so read, write, select,
// poll and epoll work on it exactly as on the phone; the model holds the other end. What
// the daemon writes reaches the model's write(); what the model sends with device_send()
// is what the daemon reads; dev::ioctl on the descriptor reaches the model's ioctl(). When
// the daemon closes the descriptor the model's close() runs. A descriptor number that is
// closed and used again never reaches the old open: every ioctl checks that the number
// still names the same socket.
//
// An attribute node that a model owns (the charger microcontroller's control node, the LED
// ring's trim nodes...): every write to it from the daemon, one call per write(), reaches
// the model's node_write(), which may update other nodes; reads come from the node file.
// The writers of the facade wait until the model has taken the write (settle()), so a read
// that follows a write sees its effect.
//
// A station reaches a running model through the FIFO <root>/station/devices: the line
// "<model name> <text>" calls the model's station() with the text (ftcmd-sim sends them).
//
// Each model is one small file under platform/sim/ holding one DeviceModel, listed in
// kModels in chardev.cc. The device file must exist in the sandbox for an open to succeed
// (delete it to simulate a missing device). A model runs on the simulator's one device
// thread, or, for ioctl(), on the daemon's thread, always under one lock: it needs none of
// its own. Example, a device that answers every write with "ok" and every ioctl with 0:
//
//   namespace {
//   bool serves(const std::string &path) { return path == "/dev/echo"; }
//   void write(sim::Device &d, const char *, size_t) { sim::device_send(d, "ok", 2); }
//   int ioctl(sim::Device &, unsigned long, void *) { return 0; }
//   }  // namespace
//   extern const sim::DeviceModel kEchoModel = {.name = "echo", .serves = serves,
//                                               .write = write, .ioctl = ioctl};
#include <sys/socket.h>
#include <sys/types.h>

#include <cstddef>
#include <functional>
#include <string>

namespace sim {

// One open of an emulated character device.
struct Device {
    std::string path;     // the device path opened, in the form "/dev/input/event0"
    int flags = 0;        // the open flags
    int model_fd = -1;    // the model's end of the socket pair
    void *data = nullptr; // the model's own state for this open (the model frees it in close)
};

struct DeviceModel {
    const char *name = "";  // station lines "<name> ..." reach station()
    // The character devices the model sits behind, by device path ("/dev/nq-nci").
    bool (*serves)(const std::string &path) = nullptr;
    int socket_type = SOCK_STREAM;  // SOCK_SEQPACKET keeps each write() of the daemon whole
    // An open: 0, or an errno that makes the open fail.
    int (*open)(Device &d) = nullptr;
    // Bytes the daemon wrote (a SOCK_SEQPACKET model gets one call per write()).
    void (*write)(Device &d, const char *data, size_t len) = nullptr;
    // The result of ioctl(); -1 with errno set refuses. Unset: every ioctl fails ENOTTY.
    int (*ioctl)(Device &d, unsigned long request, void *arg) = nullptr;
    void (*close)(Device &d) = nullptr;
    // Attribute nodes the model owns, by device path, and the writes the daemon makes to them.
    bool (*owns)(const std::string &path) = nullptr;
    void (*node_write)(const std::string &path, const std::string &data) = nullptr;
    // A line from the station, without the model's name.
    void (*station)(const std::string &text) = nullptr;
};

// Adds a model at run time (a test's own model); the phone's models are listed in chardev.cc.
void add_device_model(const DeviceModel &model);

// Sends bytes to the daemon's end of one open (what its read() returns). Never blocks: when
// the daemon does not read and its buffer is full the bytes are lost, as an input device
// drops events. False when not all were sent.
bool device_send(Device &d, const void *bytes, size_t len);
// Every open of the model, in the order opened. Only from within the model's own calls.
void for_each_open(const DeviceModel &model, const std::function<void(Device &)> &fn);

// For the facade. A descriptor for path when a model serves it: >= 0, or -1 with errno;
// -2 when no model serves the path.
int device_open(const char *device_path, int flags);
// dev::ioctl on a descriptor of an emulated device: true with *result set; false when fd
// is no such descriptor.
bool device_ioctl(int fd, unsigned long request, void *arg, int *result);
// True when a model owns the attribute node.
bool node_owned(const char *device_path);
// Waits (bounded) until every write to an owned node has reached its model.
void settle();

// Station side: sends "<model> <text>" to the models of the running phone in the sandbox
// root given. False with errno ENXIO when no device of that phone is open (nobody reads).
bool station_send(const std::string &root, const std::string &line);

}  // namespace sim
