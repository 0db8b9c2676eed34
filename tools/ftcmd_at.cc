// ftcmd-at: a station's side of the factory-test command service. Sends command lines
// over TCP, a serial port or the local socket and reports each answer frame: as the raw
// bytes received, or as one JSON object per frame.
//
// An answer frame is the echo of the line as the daemon served it, the body, and a
// trailer word line (OK, ERROR, ATOK, ATNG, ATERROR, UNKNOWN, "Not Implement", or an
// empty line), every line ending in CR LF. Long-running tests may write lines of their
// own between answers; whatever comes before the echo of the line just sent is reported
// as unsolicited.
#include <cutils/sockets.h>
#include <errno.h>
#include <fcntl.h>
#include <netdb.h>
#include <netinet/in.h>
#include <netinet/tcp.h>
#include <poll.h>
#include <signal.h>
#include <sys/socket.h>
#include <termios.h>
#include <unistd.h>

#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <iostream>
#include <string>
#include <vector>

namespace {

constexpr int kQuietMs = 300;  // after an empty line: how long a silence ends a frame
constexpr int kExitUsage = 2;

const char *kUsage =
    "usage: ftcmd-at (--tcp HOST:PORT | --serial PATH | --local NAME) [--json]\n"
    "                [--timeout SEC] [--crlf | --no-crlf] [LINE...]\n"
    "\n"
    "Sends each LINE (or each non-empty line of stdin) and prints its answer frame as\n"
    "received, or with --json one object per frame: line, echo, body, result.\n"
    "Over TCP a line is one packet and goes out as it is: the phone keeps a TCP line's\n"
    "own ending in the command, so --crlf (CR LF appended, as some stations send) gets\n"
    "whole-line commands refused. Over a serial port a line goes out with CR (none with\n"
    "--no-crlf); over the local socket as it is, on a connection of its own.\n"
    "Exit status: 0 when every result is OK or ATOK, 1 otherwise (a line with no answer\n"
    "within --timeout, default 10 s, has the result \"no answer\"), 2 on usage or\n"
    "connection errors.\n";

enum class Via { None, Tcp, Serial, Local };

struct Options {
    Via via = Via::None;
    std::string target;
    bool json = false;
    int timeout_ms = 10000;
    bool tcp_crlf = false;  // append CR LF over TCP
    bool serial_cr = true;  // append CR over a serial port
    std::vector<std::string> lines;
};

struct Answer {
    std::string unsolicited;  // bytes before the frame
    std::string raw;          // the frame's bytes as received
    bool started = false;     // the echo arrived
    bool complete = false;    // the trailer arrived
    std::string echo, body, result;
};

[[noreturn]] void fail(const std::string &msg) {
    fprintf(stderr, "ftcmd-at: %s\n", msg.c_str());
    exit(kExitUsage);
}

using Clock = std::chrono::steady_clock;

int ms_left(Clock::time_point deadline) {
    auto left = std::chrono::duration_cast<std::chrono::milliseconds>(deadline - Clock::now()).count();
    return left < 0 ? 0 : static_cast<int>(left);
}

Options parse_args(int argc, char **argv) {
    Options o;
    auto set_via = [&](Via v, const char *value) {
        if (o.via != Via::None) fail("give one of --tcp, --serial, --local");
        o.via = v;
        o.target = value;
    };
    for (int i = 1; i < argc; ++i) {
        std::string a = argv[i];
        bool has_value = i + 1 < argc;
        if ((a == "--tcp" || a == "--serial" || a == "--local" || a == "--timeout") && !has_value)
            fail(a + " needs a value");
        if (a == "--tcp") set_via(Via::Tcp, argv[++i]);
        else if (a == "--serial") set_via(Via::Serial, argv[++i]);
        else if (a == "--local") set_via(Via::Local, argv[++i]);
        else if (a == "--json") o.json = true;
        else if (a == "--crlf") o.tcp_crlf = true;
        else if (a == "--no-crlf") o.serial_cr = false;
        else if (a == "--timeout") {
            char *end = nullptr;
            double s = strtod(argv[++i], &end);
            if (*end != '\0' || !(s > 0) || s > 86400) fail("bad --timeout");
            o.timeout_ms = static_cast<int>(s * 1000);
        } else if (a == "-h" || a == "--help") {
            fputs(kUsage, stdout);
            exit(0);
        } else if (a == "--") {
            for (++i; i < argc; ++i) o.lines.push_back(argv[i]);
        } else if (a.size() > 1 && a.compare(0, 2, "--") == 0) {
            fail("unknown option " + a + "\n" + kUsage);
        } else {
            o.lines.push_back(a);
        }
    }
    if (o.via == Via::None) fail(std::string("no channel given\n") + kUsage);
    return o;
}

// ---- channels

int connect_tcp(const std::string &target, int timeout_ms) {
    size_t colon = target.rfind(':');
    if (colon == std::string::npos || colon + 1 == target.size()) fail("--tcp needs HOST:PORT");
    std::string host = target.substr(0, colon), port = target.substr(colon + 1);
    if (host.size() >= 2 && host.front() == '[' && host.back() == ']') host = host.substr(1, host.size() - 2);
    struct addrinfo hints {}, *res = nullptr;
    hints.ai_family = AF_UNSPEC;
    hints.ai_socktype = SOCK_STREAM;
    int rc = getaddrinfo(host.c_str(), port.c_str(), &hints, &res);
    if (rc != 0) fail("cannot resolve " + target + ": " + gai_strerror(rc));
    std::string why = "no address";
    int fd = -1;
    for (struct addrinfo *ai = res; ai && fd < 0; ai = ai->ai_next) {
        fd = socket(ai->ai_family, ai->ai_socktype | SOCK_CLOEXEC | SOCK_NONBLOCK, ai->ai_protocol);
        if (fd < 0) continue;
        int err = connect(fd, ai->ai_addr, ai->ai_addrlen) == 0 ? 0 : errno;
        if (err == EINPROGRESS) {
            struct pollfd p = {fd, POLLOUT, 0};
            socklen_t len = sizeof err;
            err = ETIMEDOUT;
            if (poll(&p, 1, timeout_ms) == 1) getsockopt(fd, SOL_SOCKET, SO_ERROR, &err, &len);
        }
        if (err != 0) {
            why = strerror(err);
            close(fd);
            fd = -1;
        }
    }
    freeaddrinfo(res);
    if (fd < 0) fail("cannot connect to " + target + ": " + why);
    int one = 1;
    setsockopt(fd, IPPROTO_TCP, TCP_NODELAY, &one, sizeof one);
    return fd;
}

int open_serial(const std::string &path) {
    int fd = open(path.c_str(), O_RDWR | O_NOCTTY | O_NONBLOCK | O_CLOEXEC);
    if (fd < 0) fail("cannot open " + path + ": " + strerror(errno));
    struct termios t {};
    if (tcgetattr(fd, &t) != 0) fail(path + " is not a serial port");
    cfmakeraw(&t);
    cfsetspeed(&t, B115200);
    t.c_cflag |= CLOCAL | CREAD;
    t.c_cc[VMIN] = 1;
    t.c_cc[VTIME] = 0;
    if (tcsetattr(fd, TCSANOW, &t) != 0) fail("cannot set up " + path + ": " + strerror(errno));
    tcflush(fd, TCIFLUSH);  // what the phone said before we came is not ours
    return fd;
}

int connect_local(const std::string &name) {
    int fd = socket_local_client(name.c_str(), ANDROID_SOCKET_NAMESPACE_ABSTRACT, SOCK_STREAM);
    if (fd < 0) fail("cannot connect to the local socket " + name + ": " + strerror(errno));
    return fd;
}

bool send_all(int fd, const std::string &data, bool socket, int timeout_ms) {
    size_t off = 0;
    while (off < data.size()) {
        ssize_t n = socket ? send(fd, data.data() + off, data.size() - off, MSG_NOSIGNAL)
                           : write(fd, data.data() + off, data.size() - off);
        if (n > 0) {
            off += static_cast<size_t>(n);
            continue;
        }
        if (n < 0 && (errno == EAGAIN || errno == EINTR)) {
            struct pollfd p = {fd, POLLOUT, 0};
            if (poll(&p, 1, timeout_ms) == 1) continue;
        }
        return false;
    }
    return true;
}

// Waits up to ms for input. 1: bytes appended; 0: nothing came; -1: the peer is gone.
int receive(int fd, std::string &buf, int ms) {
    struct pollfd p = {fd, POLLIN, 0};
    int rc = poll(&p, 1, ms);
    if (rc < 0) return errno == EINTR ? 0 : -1;
    if (rc == 0) return 0;
    char tmp[4096];
    ssize_t n = read(fd, tmp, sizeof tmp);
    if (n > 0) {
        buf.append(tmp, static_cast<size_t>(n));
        return 1;
    }
    if (n < 0 && (errno == EAGAIN || errno == EINTR)) return 0;
    return -1;
}

// ---- frames

bool is_trailer(const std::string &w) {
    static const char *words[] = {"OK", "ERROR", "ATOK", "ATNG", "ATERROR", "UNKNOWN", "Not Implement"};
    for (const char *t : words)
        if (w == t) return true;
    return false;
}

// The first bytes of the frame that answers line: the echo as the daemon serves it
// (from the first "A" on; without trailing line ends and blanks, except over TCP where
// the station's line ending is kept) followed by the frame's own CR LF.
std::string frame_head(const std::string &sent, bool keeps_line_end) {
    size_t a = sent.find_first_of("aA");
    if (a == std::string::npos) return "";  // such a line is never answered
    std::string e = sent.substr(a);
    if (!keeps_line_end)
        while (!e.empty() && (e.back() == '\r' || e.back() == '\n' || e.back() == ' ')) e.pop_back();
    return e.empty() ? "" : e + "\r\n";
}

size_t find_head(const std::string &buf, const std::string &head) {
    if (head.empty()) return std::string::npos;
    for (size_t p = 0; p < buf.size();) {
        if (buf.compare(p, head.size(), head) == 0) return p;
        p = buf.find('\n', p);
        if (p == std::string::npos) break;
        ++p;
    }
    return std::string::npos;
}

struct Tail {
    size_t end = std::string::npos;         // just past the trailer line
    size_t trailer = std::string::npos;     // where the trailer line starts
    size_t last_line = std::string::npos;   // start of the last complete line
    bool empty_last = false;                // that line is empty and nothing follows it
};

// Scans the lines after the head (from) for the trailer word line.
Tail find_tail(const std::string &buf, size_t from) {
    Tail t;
    size_t p = from;
    for (;;) {
        size_t nl = buf.find('\n', p);
        if (nl == std::string::npos) break;
        std::string line = buf.substr(p, nl - p);
        if (!line.empty() && line.back() == '\r') line.pop_back();
        if (is_trailer(line)) {
            t.trailer = p;
            t.end = nl + 1;
            return t;
        }
        t.last_line = p;
        t.empty_last = line.empty();
        p = nl + 1;
    }
    t.empty_last = t.empty_last && p == buf.size();
    return t;
}

std::string chomp(std::string s) {
    if (!s.empty() && s.back() == '\n') s.pop_back();
    if (!s.empty() && s.back() == '\r') s.pop_back();
    return s;
}

// Fills echo, body and result from a frame's bytes; head is the length of its head.
void split_frame(Answer &a, size_t head, size_t trailer) {
    a.echo = chomp(a.raw.substr(0, head));
    if (trailer == std::string::npos || trailer < head) trailer = a.raw.size();
    std::string body = a.raw.substr(head, trailer - head);
    a.body = trailer > head ? chomp(body) : "";
    if (a.complete) {
        size_t nl = a.raw.find('\n', trailer);
        a.result = chomp(a.raw.substr(trailer, nl == std::string::npos ? std::string::npos : nl + 1 - trailer));
    }
}

// One line over a stream (TCP or serial): send, then read until its frame has ended.
// buf holds what was received and not yet reported; it is kept for the next line.
Answer exchange_stream(int fd, bool socket, const std::string &sent, const std::string &head, std::string &buf,
                       int timeout_ms, bool *gone) {
    Answer a;
    if (!send_all(fd, sent, socket, timeout_ms)) *gone = true;
    auto deadline = Clock::now() + std::chrono::milliseconds(timeout_ms);
    size_t start = std::string::npos;
    Tail tail;
    for (;;) {
        if (start == std::string::npos) start = find_head(buf, head);
        if (start != std::string::npos) {
            tail = find_tail(buf, start + head.size());
            if (tail.end != std::string::npos) break;
        }
        if (*gone) break;
        bool quiet_ends = start != std::string::npos && tail.empty_last && tail.last_line >= start + head.size();
        int wait = ms_left(deadline);
        if (quiet_ends && wait > kQuietMs) wait = kQuietMs;
        int rc = receive(fd, buf, wait);
        if (rc < 0) *gone = true;
        if (rc == 0 && quiet_ends) {  // an empty trailer line: the frame is over
            tail.trailer = tail.last_line;
            tail.end = buf.size();
            break;
        }
        if (rc == 0 && ms_left(deadline) == 0) break;
    }
    if (start == std::string::npos) {
        a.unsolicited.swap(buf);
        return a;
    }
    a.started = true;
    a.complete = tail.end != std::string::npos;
    size_t end = a.complete ? tail.end : buf.size();
    a.unsolicited = buf.substr(0, start);
    a.raw = buf.substr(start, end - start);
    buf.erase(0, end);
    split_frame(a, head.size(), a.complete ? tail.trailer - start : std::string::npos);
    return a;
}

// One line over the local socket: a connection of its own, and all that comes back on
// it until the daemon closes it is the answer.
Answer exchange_local(const std::string &name, const std::string &line, int timeout_ms) {
    Answer a;
    int fd = connect_local(name);
    auto deadline = Clock::now() + std::chrono::milliseconds(timeout_ms);
    bool closed = false;
    if (send_all(fd, line, true, timeout_ms)) {
        for (int rc; !closed && (rc = receive(fd, a.raw, ms_left(deadline))) != 0;) closed = rc < 0;
    }
    close(fd);
    if (a.raw.empty()) return a;
    a.started = true;
    // The echo is normally the line itself; if not, the first line stands for it.
    std::string head = frame_head(line, false);
    size_t h;
    if (!head.empty() && a.raw.compare(0, head.size(), head) == 0) {
        h = head.size();
    } else {
        size_t nl = a.raw.find('\n');
        h = nl == std::string::npos ? a.raw.size() : nl + 1;
    }
    Tail tail = find_tail(a.raw, h);
    if (tail.end == std::string::npos && closed) tail.trailer = tail.last_line;  // the close ended it
    a.complete = tail.trailer != std::string::npos;
    split_frame(a, h, tail.trailer);
    return a;
}

// ---- output

std::string json_string(const std::string &s) {
    std::string out = "\"";
    for (size_t i = 0; i < s.size(); ++i) {
        unsigned char c = static_cast<unsigned char>(s[i]);
        char esc[8];
        if (c == '"') out += "\\\"";
        else if (c == '\\') out += "\\\\";
        else if (c == '\r') out += "\\r";
        else if (c == '\n') out += "\\n";
        else if (c == '\t') out += "\\t";
        else if (c < 0x20 || c == 0x7f) {
            snprintf(esc, sizeof esc, "\\u%04x", c);
            out += esc;
        } else if (c < 0x80) {
            out += static_cast<char>(c);
        } else {
            // Valid UTF-8 passes; any other byte stands for the character of its value.
            size_t len = (c >= 0xc2 && c <= 0xdf) ? 2 : (c >= 0xe0 && c <= 0xef) ? 3 : (c >= 0xf0 && c <= 0xf4) ? 4 : 0;
            bool ok = len > 0 && i + len <= s.size();
            for (size_t k = 1; ok && k < len; ++k) ok = (static_cast<unsigned char>(s[i + k]) & 0xc0) == 0x80;
            if (ok) {
                out.append(s, i, len);
                i += len - 1;
            } else {
                snprintf(esc, sizeof esc, "\\u%04x", c);
                out += esc;
            }
        }
    }
    return out + "\"";
}

void emit(const Options &o, const std::string &line, const Answer &a) {
    if (!o.json) {
        fwrite(a.unsolicited.data(), 1, a.unsolicited.size(), stdout);
        fwrite(a.raw.data(), 1, a.raw.size(), stdout);
    } else {
        if (!a.unsolicited.empty()) printf("{\"unsolicited\": %s}\n", json_string(a.unsolicited).c_str());
        std::string result = a.complete ? a.result : "no answer";
        printf("{\"line\": %s, \"echo\": %s, \"body\": %s, \"result\": %s}\n", json_string(line).c_str(),
               a.started ? json_string(a.echo).c_str() : "null", a.started ? json_string(a.body).c_str() : "null",
               json_string(result).c_str());
    }
    fflush(stdout);
}

bool passed(const Answer &a) { return a.complete && (a.result == "OK" || a.result == "ATOK"); }

}  // namespace

int main(int argc, char **argv) {
    signal(SIGPIPE, SIG_IGN);  // a phone that goes away must not end us mid-report
    Options o = parse_args(argc, argv);
    bool from_stdin = o.lines.empty();

    int fd = -1;
    if (o.via == Via::Tcp) fd = connect_tcp(o.target, o.timeout_ms);
    if (o.via == Via::Serial) fd = open_serial(o.target);

    std::string buf;
    bool all_passed = true, gone = false;
    size_t next = 0;
    for (;;) {
        std::string line;
        if (from_stdin) {
            if (!std::getline(std::cin, line)) break;
            if (!line.empty() && line.back() == '\r') line.pop_back();
            if (line.empty()) continue;
        } else {
            if (next == o.lines.size()) break;
            line = o.lines[next++];
        }
        Answer a;
        if (gone) {
            // Nothing more can be sent; the line is reported unanswered.
        } else if (o.via == Via::Local) {
            a = exchange_local(o.target, line, o.timeout_ms);
        } else {
            bool tcp = o.via == Via::Tcp;
            std::string sent = line + (tcp ? (o.tcp_crlf ? "\r\n" : "") : (o.serial_cr ? "\r" : ""));
            a = exchange_stream(fd, tcp, sent, frame_head(tcp ? sent : line, tcp), buf, o.timeout_ms, &gone);
            if (gone) fprintf(stderr, "ftcmd-at: the phone closed the connection\n");
        }
        emit(o, line, a);
        all_passed = all_passed && passed(a);
    }
    if (!buf.empty()) {
        if (o.json) printf("{\"unsolicited\": %s}\n", json_string(buf).c_str());
        else fwrite(buf.data(), 1, buf.size(), stdout);
        fflush(stdout);
    }
    if (fd >= 0) close(fd);
    if (gone) return kExitUsage;
    return all_passed ? 0 : 1;
}
