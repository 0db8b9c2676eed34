#pragma once
// NCI control messages to the NFC controller behind "/dev/nq-nci": the frames the factory
// tests send, one message buffer, the exchange (send, receive) and the controller cycle
// (open, power-cycle, start-up, power off and close) that every controller test shares.
#include <signal.h>

#include <array>
#include <atomic>
#include <cstddef>
#include <cstdint>
#include <initializer_list>
#include <memory>

// One NCI control message as received: a 3-byte header (type and group, opcode, payload
// length L) and L payload bytes from byte 3 on.
struct NciMessage {
    static constexpr size_t kHeader = 3;
    // Zeroed before each receive: the reader checks bytes up to here.
    static constexpr size_t kZeroed = 255;
    std::array<uint8_t, kHeader + 255> bytes{};

    void clear();
    uint8_t operator[](size_t i) const { return bytes[i]; }
    // The first bytes equal these (a header prefix such as 61 05).
    bool starts_with(std::initializer_list<uint8_t> prefix) const;
};

// One open of the controller. A worker may outlive the command that opened it, so the
// descriptor is shared: close() makes every later use fail as on a closed descriptor
// (EBADF), and the number itself is released only when the last user lets go. A number
// the system has handed out again is never touched.
struct NciChannel {
    int fd = -1;
    std::atomic<bool> closed{false};

    explicit NciChannel(int descriptor) : fd(descriptor) {}
    ~NciChannel();
    NciChannel(const NciChannel &) = delete;
    NciChannel &operator=(const NciChannel &) = delete;
    void close() { closed = true; }
};

using NciLink = std::shared_ptr<NciChannel>;

// The frames, byte for byte.
namespace nci {
inline constexpr std::array<uint8_t, 4> kReset{0x20, 0x00, 0x01, 0x00};
inline constexpr std::array<uint8_t, 3> kInitV10{0x20, 0x01, 0x00};
inline constexpr std::array<uint8_t, 5> kInitV20{0x20, 0x01, 0x02, 0x00, 0x00};
inline constexpr std::array<uint8_t, 3> kPropActivate{0x2F, 0x02, 0x00};
inline constexpr std::array<uint8_t, 16> kSwpInterruptEnable{0x20, 0x02, 0x0D, 0x03, 0xA0, 0xEC, 0x01, 0x01,
                                                             0xA0, 0xD4, 0x01, 0x01, 0xA0, 0xED, 0x01, 0x01};
inline constexpr std::array<uint8_t, 4> kSwpSelfTest{0x2F, 0x3E, 0x01, 0x00};
inline constexpr std::array<uint8_t, 8> kPollModeConfig{0x20, 0x02, 0x05, 0x01, 0xA0, 0x44, 0x01, 0x00};
inline constexpr std::array<uint8_t, 18> kListenConfig1{0x20, 0x02, 0x0F, 0x01, 0xA0, 0x0E, 0x0B, 0x11, 0x01,
                                                        0xC2, 0xB2, 0x00, 0xB2, 0x1E, 0x1F, 0x00, 0xD0, 0x0C};
inline constexpr std::array<uint8_t, 8> kListenConfig2{0x20, 0x02, 0x05, 0x01, 0xA0, 0x03, 0x01, 0x08};
inline constexpr std::array<uint8_t, 12> kDiscover{0x21, 0x03, 0x09, 0x04, 0x00, 0x01,
                                                   0x01, 0x01, 0x02, 0x01, 0x81, 0x01};

// The controller's chip type, set by the NFC service's start-up.
inline constexpr const char *kChipTypeProp = "persist.kael.nfc.chip.type";

// What recv_nci_data returns when the controller's first header byte is 0x51.
constexpr int kNoInterrupt = 81;

enum class Version { V10, V20 };
// NCI 2.0 for the projects and the chip type that speak it; NCI 1.0 for every other phone.
Version family();
}  // namespace nci

// Writes one frame (retrying a failed write up to five times); the last write's result.
int send_nci_data(NciChannel &ch, const uint8_t *frame, int len);
template <size_t N>
int send_nci_data(NciChannel &ch, const std::array<uint8_t, N> &frame) {
    return send_nci_data(ch, frame.data(), static_cast<int>(N));
}
// Reads one message into msg (header, then payload from byte 3): the payload byte count,
// nci::kNoInterrupt for a 0x51 header, or an errno value when a read fails.
int recv_nci_data(NciChannel &ch, NciMessage &msg);
// Sends a frame and reads one answer into a freshly zeroed message.
template <size_t N>
int nci_exchange(NciChannel &ch, const std::array<uint8_t, N> &frame, NciMessage &msg) {
    send_nci_data(ch, frame);
    msg.clear();
    return recv_nci_data(ch, msg);
}

// The controller cycle: opens the device read-write and power-cycles the controller
// (nullptr when the open fails, logged) ...
NciLink nci_open();
// ... runs the start-up of an NCI version (reset, init, proprietary activate) ...
void nci_startup(NciChannel &ch, nci::Version version);
// ... and at the end powers it off and closes it.
void nci_finish(NciChannel &ch);

// Blocks SIGUSR2 while a worker that may be ended by it is created (the worker inherits
// the mask) and restores the caller's mask after.
struct NciKillableStart {
    NciKillableStart();
    ~NciKillableStart();
    NciKillableStart(const NciKillableStart &) = delete;
    NciKillableStart &operator=(const NciKillableStart &) = delete;

private:
    sigset_t saved_;
};
