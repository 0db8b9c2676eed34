#pragma once
// The device-access facade. Handlers and the core reach device nodes, the shell, the
// clock and the file systems only through these calls. On a phone they are the plain
// libc calls on the given path; on the simulated phone they act inside the sandbox.
#include <fcntl.h>
#include <sys/statfs.h>
#include <sys/time.h>
#include <sys/types.h>

#include <cstdint>
#include <cstdio>
#include <ctime>
#include <string>
#include <vector>

namespace dev {

// Device path (absolute, or relative to "/" where the daemon runs) to the path opened.
std::string path(const char *device_path);

// open(): attribute nodes (sysfs, procfs, debugfs) hold one value that each write replaces;
// a character device gives a descriptor that read, write, select, poll and epoll serve.
int open(const char *path, int flags, mode_t mode = 0);
FILE *fopen(const char *path, const char *mode);
bool exists(const char *path);
int access(const char *path, int mode);
int unlink(const char *path);
int mkdir(const char *path, mode_t mode);
int statfs(const char *path, struct statfs *st);
std::vector<std::string> list_dir(const char *path);  // names, without "." and ".."

// Reads at most max bytes of a node; false when it cannot be opened or read.
bool read_node(const char *path, std::string &out, size_t max = 4096);
// Writes text to an existing node (or creates it with O_CREAT in flags); bytes or -1.
int write_node(const char *path, const char *text, int flags = O_WRONLY);

int shell(const char *command);  // system(): the shell's exit status
int set_clock(const struct timeval *tv);  // settimeofday()
time_t now();
int gettimeofday(struct timeval *tv);
void sync();
int ioctl(int fd, unsigned long request, void *arg);  // reaches the device behind fd
// sysconf(): the phone's own figures (_SC_PHYS_PAGES, _SC_PAGESIZE, _SC_NPROCESSORS_CONF...).
long sysconf(int name);

// Where the station services listen. On a phone: port 6988 on every IPv4 interface and
// the local socket "ftcmd_cmd_socket"; a simulated phone may be given others.
int tcp_service_port();
unsigned int tcp_service_address();  // IPv4, network byte order
const char *local_socket_name();

}  // namespace dev

namespace dev {

// chown(): gives a file an owner and group (the system user, 1000, for persist files).
int chown(const char *path, uid_t owner, gid_t group);

}  // namespace dev
