/* Storage that is slow, hangs or fails as the files in /run/storage say, and that tells what was
 * asked of it. Loaded into the daemon by tests. */
#define _GNU_SOURCE
#include <dlfcn.h>
#include <errno.h>
#include <fcntl.h>
#include <stdarg.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <sys/syscall.h>
#include <time.h>
#include <unistd.h>

#define FOLDER "/run/storage/"

static void *real(const char *name) { return dlsym(RTLD_NEXT, name); }

static void note(const char *what, const char *path) {
  char line[512];
  const int length = snprintf(line, sizeof line, "%s %s\n", what, path);
  const int fd = (int)syscall(SYS_openat, AT_FDCWD, FOLDER "log", O_WRONLY | O_APPEND | O_CLOEXEC, 0);
  if (fd >= 0 && write(fd, line, (size_t)length) < 0) {
    abort();
  }
  close(fd);
}

/* What /run/storage/NAME says in milliseconds, 0 without such a file. */
static long number_in(const char *path) {
  char text[32] = "";
  const int fd = (int)syscall(SYS_openat, AT_FDCWD, path, O_RDONLY | O_CLOEXEC, 0);
  if (fd < 0) {
    return 0;
  }
  const ssize_t length = read(fd, text, sizeof text - 1);
  close(fd);
  return length > 0 ? atol(text) : 0;
}

int fsync(int fd) {
  char link[64];
  char path[256] = "";
  snprintf(link, sizeof link, "/proc/self/fd/%d", fd);
  if (readlink(link, path, sizeof path - 1) < 0) {
    path[0] = '\0';
  }
  note("fsync", path);
  const struct timespec step = {0, 1000000};
  for (long waited = 0; waited < number_in(FOLDER "delay"); ++waited) {
    nanosleep(&step, NULL);
  }
  return ((int (*)(int))real("fsync"))(fd);
}

int rename(const char *from, const char *to) {
  note("rename", to);
  return ((int (*)(const char *, const char *))real("rename"))(from, to);
}

static int fails(const char *path) {
  static const char name[] = "/portd.conf";
  const size_t length = strlen(path);
  const size_t end = sizeof name - 1;
  if (length < end || strcmp(path + length - end, name) != 0 || number_in(FOLDER "errno") == 0) {
    return 0;
  }
  errno = (int)number_in(FOLDER "errno");
  return 1;
}

int access(const char *path, int mode) {
  return fails(path) ? -1 : ((int (*)(const char *, int))real("access"))(path, mode);
}

typedef int (*Open)(const char *, int, ...);

int open(const char *path, int flags, ...) {
  va_list arguments;
  va_start(arguments, flags);
  const int mode = va_arg(arguments, int);
  va_end(arguments);
  return fails(path) ? -1 : ((Open)real("open"))(path, flags, mode);
}

int open64(const char *path, int flags, ...) {
  va_list arguments;
  va_start(arguments, flags);
  const int mode = va_arg(arguments, int);
  va_end(arguments);
  return fails(path) ? -1 : ((Open)real("open64"))(path, flags, mode);
}
