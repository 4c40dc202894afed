/* Preloaded into the daemon: fails one of its calls, once, and counts them all.
 *
 * FAULTS_CALL names the call, FAULTS_NTH says which of them, from 1 on, and FAULTS_ERRNO the error,
 * or -1 for half of what was asked for. FAULTS_COUNTS is a file that holds the counts, one 32-bit
 * number a call in the order of the list below, and in the end whether the fault came.
 *
 * Counted are the calls of the daemon's own code, also by way of GLib's helpers, and not those that
 * GIO makes for itself on its connection. */
#define _GNU_SOURCE
#include <dirent.h>
#include <dlfcn.h>
#include <errno.h>
#include <execinfo.h>
#include <fcntl.h>
#include <poll.h>
#include <pthread.h>
#include <stdarg.h>
#include <stdint.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <sys/eventfd.h>
#include <sys/mman.h>
#include <sys/resource.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/types.h>
#include <unistd.h>

static const char *const calls[] = {
    "open",       "read",           "write",     "ioctl",     "fsync",   "rename",     "poll",
    "eventfd",    "pthread_create", "stat",      "fstat",     "lstat",   "access",     "fchmod",
    "fchown",     "unlink",         "lseek",     "ftruncate", "opendir", "mkdir",      "setgid",
    "initgroups", "setuid",         "setrlimit", "socket",    "send",    "readlinkat",
};
enum { kCalls = sizeof calls / sizeof calls[0], kFrames = 12 };

static uint32_t *counts;
static const char *wanted;
static uint32_t wanted_nth;
static int wanted_errno;
static __thread int inside;

__attribute__((constructor)) static void begin(void) {
  void *frames[1];
  const char *path = getenv("FAULTS_COUNTS");
  const int fd = path ? open(path, O_RDWR | O_CLOEXEC) : -1;
  backtrace(frames, 1); /* what it loads, it loads now */
  if (fd >= 0) {
    void *memory =
        mmap(NULL, (kCalls + 1) * sizeof *counts, PROT_READ | PROT_WRITE, MAP_SHARED, fd, 0);
    close(fd);
    wanted = getenv("FAULTS_CALL");
    wanted_nth = getenv("FAULTS_NTH") ? (uint32_t)atoi(getenv("FAULTS_NTH")) : 0;
    wanted_errno = getenv("FAULTS_ERRNO") ? atoi(getenv("FAULTS_ERRNO")) : 0;
    counts = memory == MAP_FAILED ? NULL : memory;
  }
}

/* Libraries that only do what they were asked. */
static int is_between(const char *file) {
  return strstr(file, "libglib") || strstr(file, "libc.so") || strstr(file, "libstdc++") ||
         strstr(file, "libgpiod") || strstr(file, "faults.so") || strstr(file, "shim.so");
}

static int is_own(void) {
  void *frames[kFrames];
  const int depth = backtrace(frames, kFrames);
  for (int i = 1; i < depth; ++i) {
    Dl_info info;
    if (!dladdr(frames[i], &info) || !info.dli_fname) {
      return 0;
    }
    /* For a thread of GLib's own: it ends the program without it. */
    if (info.dli_sname && strcmp(info.dli_sname, "g_thread_new") == 0) {
      return 0;
    }
    if (!is_between(info.dli_fname)) {
      return strstr(info.dli_fname, "/portd") != NULL;
    }
  }
  return 0;
}

/* 0: the call is to be made, otherwise the error, or -1 for half of it. */
static int fault(const char *call) {
  int number = 0;
  if (!counts || inside) {
    return 0;
  }
  inside = 1;
  const int error = errno;
  const int own = is_own();
  errno = error;
  inside = 0;
  if (!own) {
    return 0;
  }
  while (strcmp(calls[number], call) != 0) {
    ++number;
  }
  const uint32_t nth = __atomic_add_fetch(&counts[number], 1, __ATOMIC_SEQ_CST);
  if (!wanted || nth != wanted_nth || strcmp(wanted, call) != 0) {
    return 0;
  }
  counts[kCalls] = 1;
  return wanted_errno;
}

static void *real(const char *name) {
  return dlsym(RTLD_NEXT, name);
}

#define FAIL_OR_CALL(call, symbol, type, types, arguments) \
  const int failed = fault(call);                          \
  if (failed) {                                            \
    errno = failed;                                        \
    return (type)-1;                                       \
  }                                                        \
  return ((type(*) types)real(symbol))arguments

#define SIMPLE(type, name, symbol, parameters, types, arguments) \
  type symbol parameters {                                       \
    FAIL_OR_CALL(name, #symbol, type, types, arguments);         \
  }

/* The mode is there or not; to read it does no harm. */
#define OPEN(symbol)                                                                   \
  int symbol(const char *path, int flags, ...) {                                       \
    va_list list;                                                                      \
    va_start(list, flags);                                                             \
    const mode_t mode = va_arg(list, mode_t);                                          \
    va_end(list);                                                                      \
    FAIL_OR_CALL("open", #symbol, int, (const char *, int, ...), (path, flags, mode)); \
  }
#define OPENAT(symbol)                                                \
  int symbol(int folder, const char *path, int flags, ...) {          \
    va_list list;                                                     \
    va_start(list, flags);                                            \
    const mode_t mode = va_arg(list, mode_t);                         \
    va_end(list);                                                     \
    FAIL_OR_CALL("open", #symbol, int, (int, const char *, int, ...), \
                 (folder, path, flags, mode));                        \
  }
OPEN(open)
OPEN(open64)
OPENAT(openat)
OPENAT(openat64)
SIMPLE(int, "open", __open_2, (const char *path, int flags), (const char *, int), (path, flags))
SIMPLE(int, "open", __open64_2, (const char *path, int flags), (const char *, int), (path, flags))

/* GLib wakes its main loop up with these, and loses the wake-up for good where that fails. */
static int is_wake_up(int fd) {
  char link[64];
  char target[32];
  snprintf(link, sizeof link, "/proc/self/fd/%d", fd);
  const ssize_t size = readlink(link, target, sizeof target);
  return size > 0 && strncmp(target, "anon_inode:[eventfd]", (size_t)size) == 0;
}

/* Half of what was asked for, where that is something. */
#define PART(symbol, call, parameters, types, arguments)            \
  ssize_t symbol parameters {                                       \
    const int failed = counts && !is_wake_up(fd) ? fault(call) : 0; \
    if (failed > 0) {                                               \
      errno = failed;                                               \
      return -1;                                                    \
    }                                                               \
    size = failed < 0 && size > 1 ? size / 2 : size;                \
    return ((ssize_t(*) types)real(#symbol))arguments;              \
  }
PART(read, "read", (int fd, void *data, size_t size), (int, void *, size_t), (fd, data, size))
PART(pread64, "read", (int fd, void *data, size_t size, off64_t at), (int, void *, size_t, off64_t),
     (fd, data, size, at))
PART(write, "write", (int fd, const void *data, size_t size), (int, const void *, size_t),
     (fd, data, size))
PART(pwrite64, "write", (int fd, const void *data, size_t size, off64_t at),
     (int, const void *, size_t, off64_t), (fd, data, size, at))

int ioctl(int fd, unsigned long request, ...) {
  va_list list;
  va_start(list, request);
  void *argument = va_arg(list, void *);
  va_end(list);
  FAIL_OR_CALL("ioctl", "ioctl", int, (int, unsigned long, ...), (fd, request, argument));
}

SIMPLE(int, "fsync", fsync, (int fd), (int), (fd))
SIMPLE(int, "rename", rename, (const char *from, const char *to), (const char *, const char *),
       (from, to))
SIMPLE(int, "poll", poll, (struct pollfd * fds, nfds_t count, int wait),
       (struct pollfd *, nfds_t, int), (fds, count, wait))
SIMPLE(int, "eventfd", eventfd, (unsigned count, int flags), (unsigned, int), (count, flags))
SIMPLE(int, "stat", stat, (const char *path, struct stat *to), (const char *, struct stat *),
       (path, to))
SIMPLE(int, "stat", stat64, (const char *path, struct stat64 *to), (const char *, struct stat64 *),
       (path, to))
SIMPLE(int, "fstat", fstat, (int fd, struct stat *to), (int, struct stat *), (fd, to))
SIMPLE(int, "fstat", fstat64, (int fd, struct stat64 *to), (int, struct stat64 *), (fd, to))
SIMPLE(int, "lstat", lstat, (const char *path, struct stat *to), (const char *, struct stat *),
       (path, to))
SIMPLE(int, "lstat", lstat64, (const char *path, struct stat64 *to),
       (const char *, struct stat64 *), (path, to))
SIMPLE(int, "access", access, (const char *path, int mode), (const char *, int), (path, mode))
SIMPLE(int, "fchmod", fchmod, (int fd, mode_t mode), (int, mode_t), (fd, mode))
SIMPLE(int, "fchown", fchown, (int fd, uid_t user, gid_t group), (int, uid_t, gid_t),
       (fd, user, group))
SIMPLE(int, "unlink", unlink, (const char *path), (const char *), (path))
SIMPLE(off64_t, "lseek", lseek64, (int fd, off64_t at, int from), (int, off64_t, int),
       (fd, at, from))
SIMPLE(int, "ftruncate", ftruncate64, (int fd, off64_t size), (int, off64_t), (fd, size))
SIMPLE(int, "mkdir", mkdir, (const char *path, mode_t mode), (const char *, mode_t), (path, mode))
SIMPLE(int, "setgid", setgid, (gid_t group), (gid_t), (group))
SIMPLE(int, "setuid", setuid, (uid_t user), (uid_t), (user))
SIMPLE(int, "initgroups", initgroups, (const char *user, gid_t group), (const char *, gid_t),
       (user, group))
SIMPLE(int, "socket", socket, (int family, int type, int protocol), (int, int, int),
       (family, type, protocol))
SIMPLE(ssize_t, "readlinkat", readlinkat, (int folder, const char *path, char *data, size_t size),
       (int, const char *, char *, size_t), (folder, path, data, size))
SIMPLE(ssize_t, "send", send, (int fd, const void *data, size_t size, int flags),
       (int, const void *, size_t, int), (fd, data, size, flags))

int setrlimit64(__rlimit_resource_t what, const struct rlimit64 *limit) {
  FAIL_OR_CALL("setrlimit", "setrlimit64", int, (__rlimit_resource_t, const struct rlimit64 *),
               (what, limit));
}

DIR *opendir(const char *path) {
  const int failed = fault("opendir");
  if (failed) {
    errno = failed;
    return NULL;
  }
  return ((DIR * (*)(const char *)) real("opendir"))(path);
}

int pthread_create(pthread_t *thread, const pthread_attr_t *attributes, void *(*run)(void *),
                   void *data) {
  const int failed = fault("pthread_create");
  return failed ? failed
                : ((int (*)(pthread_t *, const pthread_attr_t *, void *(*)(void *), void *))real(
                      "pthread_create"))(thread, attributes, run, data);
}
