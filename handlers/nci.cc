// The NCI exchange with the NFC controller: frames out one write each, messages in as a
// header read and a payload read, and the cycle of open, power and start-up around them.
#include "handlers/nci.h"

#include <poll.h>
#include <signal.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <cstdio>
#include <cstring>
#include <string>
#include <thread>

#include "platform/android.h"
#include "platform/device.h"
#include "platform/factory.h"
#include "platform/log.h"

namespace {

constexpr const char *kNciDevice = "/dev/nq-nci";
constexpr unsigned long kNfcSetPower = 0x4004E901;
constexpr int kWriteTries = 6;  // the first write and five retries
constexpr auto kWriteRetryPause = std::chrono::milliseconds(5);
// A controller answers within milliseconds; one that stays silent would block the read, and
// with it the dispatch mutex, for ever. Each read waits at most this long. It is longer than
// the 2-second tag and card-emulation windows, so those waits end as they always have.
constexpr int kReadLimitMs = 3000;
// How often a waiting read looks whether its channel has been closed meanwhile.
constexpr int kReadSliceMs = 20;

constexpr std::array<const char *, 12> kNci20Projects{"RX6101", "RX6102", "RX6103",     "RX6104",
                                                      "RX6103F_EX", "RX6104F_EX", "RT6201", "RT6202",
                                                      "RX6105", "RX6105F_EX", "RX6106", "RX6106F_EX"};

std::string hex_bytes(const uint8_t *bytes, size_t len) {
    std::string out;
    char two[4];
    for (size_t i = 0; i < len; ++i) {
        snprintf(two, sizeof two, "%02X", bytes[i]);
        out += two;
    }
    return out;
}

// Waits until ch can be read. 1 when it can; 0 with errno ETIMEDOUT after the read limit;
// -1 with errno EBADF when the channel was closed meanwhile. SIGUSR2, which ends a tag-read
// worker, is let through only here, where the worker holds no lock.
int wait_readable(NciChannel &ch) {
    sigset_t mask;
    pthread_sigmask(SIG_BLOCK, nullptr, &mask);
    sigdelset(&mask, SIGUSR2);
    const auto deadline = std::chrono::steady_clock::now() + std::chrono::milliseconds(kReadLimitMs);
    for (;;) {
        if (ch.closed) {
            errno = EBADF;
            return -1;
        }
        auto left = std::chrono::duration_cast<std::chrono::milliseconds>(deadline - std::chrono::steady_clock::now());
        if (left.count() <= 0) {
            errno = ETIMEDOUT;
            return 0;
        }
        struct pollfd pfd {ch.fd, POLLIN, 0};
        long ms = std::min<long>(left.count(), kReadSliceMs);
        struct timespec slice {0, ms * 1000000L};
        int n = ppoll(&pfd, 1, &slice, &mask);
        if (n > 0) return 1;
        if (n < 0 && errno != EINTR) return -1;
    }
}

// One read of at most len bytes, bounded by the read limit; negative with errno on failure.
ssize_t bounded_read(NciChannel &ch, uint8_t *into, size_t len) {
    if (wait_readable(ch) != 1) return -1;
    // A driver without a poll method is "readable" at once and blocks in read itself: the
    // tag-read worker must be endable there as well, and it holds no lock here either.
    sigset_t usr2, old;
    sigemptyset(&usr2);
    sigaddset(&usr2, SIGUSR2);
    pthread_sigmask(SIG_UNBLOCK, &usr2, &old);
    ssize_t n;
    do n = ::read(ch.fd, into, len);
    while (n < 0 && errno == EINTR);
    pthread_sigmask(SIG_SETMASK, &old, nullptr);
    return n;
}

void power(NciChannel &ch, int on) {
    if (ch.closed) return;
    if (dev::ioctl(ch.fd, kNfcSetPower, reinterpret_cast<void *>(static_cast<uintptr_t>(on))) < 0)
        LOGE("nfc power %d error: %s", on, strerror(errno));
}

}  // namespace

void NciMessage::clear() { std::fill(bytes.begin(), bytes.begin() + kZeroed, 0); }

bool NciMessage::starts_with(std::initializer_list<uint8_t> prefix) const {
    return std::equal(prefix.begin(), prefix.end(), bytes.begin());
}

NciChannel::~NciChannel() {
    if (fd >= 0) ::close(fd);
}

nci::Version nci::family() {
    for (const char *project : kNci20Projects)
        if (is_project(project)) return Version::V20;
    char chip[PROPERTY_VALUE_MAX] = {0};
    property_get(nci::kChipTypeProp, chip, "unknow");
    return strncmp(chip, "SN100", 6) == 0 ? Version::V20 : Version::V10;
}

int send_nci_data(NciChannel &ch, const uint8_t *frame, int len) {
    LOGI("send nci len:%d data:%s", frame[2] + 3, hex_bytes(frame, static_cast<size_t>(len)).c_str());
    ssize_t rc = -1;
    for (int attempt = 0; attempt < kWriteTries; ++attempt) {
        if (ch.closed) {
            errno = EBADF;
            rc = -1;
        } else {
            rc = ::write(ch.fd, frame, static_cast<size_t>(len));
        }
        if (rc >= 0) break;
        LOGE("nci write error: ret=%zd errno=%d (%s)", rc, errno, strerror(errno));
        if (attempt + 1 < kWriteTries) std::this_thread::sleep_for(kWriteRetryPause);
    }
    return static_cast<int>(rc);
}

int recv_nci_data(NciChannel &ch, NciMessage &msg) {
    uint8_t *buf = msg.bytes.data();
    if (bounded_read(ch, buf, NciMessage::kHeader) < 0) {
        int err = errno;
        LOGE("nci read header error: %d (%s)", err, strerror(err));
        ch.close();
        return err;
    }
    if (buf[0] == 0x51) {
        LOGE("nci header 0x51: the controller's interrupt line may not work");
        return nci::kNoInterrupt;
    }
    size_t want = buf[2];
    ssize_t n = want == 0 ? 0 : bounded_read(ch, buf + NciMessage::kHeader, want);
    if (n < 0) {
        int err = errno;
        LOGE("nci read payload error: %d (%s)", err, strerror(err));
        return err;
    }
    LOGI("recv nci len:%zd data:%s", n, hex_bytes(buf, NciMessage::kHeader + static_cast<size_t>(n)).c_str());
    return static_cast<int>(n);
}

NciLink nci_open() {
    int fd = dev::open(kNciDevice, O_RDWR);
    if (fd < 0) {
        LOGE("open %s error: %s", kNciDevice, strerror(errno));
        return nullptr;
    }
    auto link = std::make_shared<NciChannel>(fd);
    power(*link, 0);
    power(*link, 1);
    return link;
}

void nci_startup(NciChannel &ch, nci::Version version) {
    NciMessage msg;
    nci_exchange(ch, nci::kReset, msg);
    if (version == nci::Version::V20) {
        msg.clear();
        recv_nci_data(ch, msg);  // the reset notification
        nci_exchange(ch, nci::kInitV20, msg);
    } else {
        nci_exchange(ch, nci::kInitV10, msg);
    }
    nci_exchange(ch, nci::kPropActivate, msg);
}

void nci_finish(NciChannel &ch) {
    power(ch, 0);
    ch.close();
}

NciKillableStart::NciKillableStart() {
    sigset_t block;
    sigemptyset(&block);
    sigaddset(&block, SIGUSR2);
    pthread_sigmask(SIG_BLOCK, &block, &saved_);
}

NciKillableStart::~NciKillableStart() { pthread_sigmask(SIG_SETMASK, &saved_, nullptr); }
