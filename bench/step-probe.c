/* Preloaded into the daemon: how late the waits of its sequences end, beside a thread that does
 * nothing but wait, and how long the sequences take between two waits. At the end one line for each
 * figure, its kind and nanoseconds, goes to the file BENCH_STEPS. */
#define _GNU_SOURCE
#include <dlfcn.h>
#include <errno.h>
#include <pthread.h>
#include <stdatomic.h>
#include <stdint.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <time.h>

enum { MOST = 65536, PERIOD_NS = 2000000 };

struct figures {
  const char *kind;
  atomic_uint count;
  int64_t ns[MOST];
};
static struct figures steps = {.kind = "step"};
static struct figures works = {.kind = "work"};
static struct figures sleeps = {.kind = "sleep"};

typedef int (*timed_wait)(pthread_cond_t *, pthread_mutex_t *, const struct timespec *);
static timed_wait real_wait;
static atomic_int waiting; /* a sequence runs */

static int64_t in_ns(const struct timespec *time) {
  return time->tv_sec * INT64_C(1000000000) + time->tv_nsec;
}

static int64_t now_ns(void) {
  struct timespec now;
  clock_gettime(CLOCK_MONOTONIC, &now);
  return in_ns(&now);
}

static void add(struct figures *figures, int64_t ns) {
  unsigned index = atomic_fetch_add(&figures->count, 1);
  if (index < MOST) {
    figures->ns[index] = ns;
  }
}

static void print(FILE *file, struct figures *figures) {
  unsigned count = atomic_load(&figures->count);
  for (unsigned index = 0; index < count && index < MOST; ++index) {
    fprintf(file, "%s %lld\n", figures->kind, (long long)figures->ns[index]);
  }
}

static void *sleep_beside(void *unused) {
  (void)unused;
  for (;;) {
    int64_t until = now_ns() + PERIOD_NS;
    struct timespec deadline = {until / 1000000000, until % 1000000000};
    clock_nanosleep(CLOCK_MONOTONIC, TIMER_ABSTIME, &deadline, NULL);
    if (atomic_load(&waiting)) {
      add(&sleeps, now_ns() - until);
    }
  }
  return NULL;
}

static int in_a_sequence(void) {
  char name[16] = "";
  pthread_getname_np(pthread_self(), name, sizeof name);
  return strcmp(name, "Action thread") == 0;
}

int pthread_cond_timedwait(pthread_cond_t *cond, pthread_mutex_t *mutex,
                           const struct timespec *deadline) {
  static _Thread_local int64_t woken;
  if (!in_a_sequence()) {
    return real_wait(cond, mutex, deadline);
  }
  if (woken != 0) {
    add(&works, now_ns() - woken);
  }
  atomic_store(&waiting, 1);
  int result = real_wait(cond, mutex, deadline);
  woken = now_ns();
  if (result == ETIMEDOUT) {
    add(&steps, woken - in_ns(deadline));
  }
  return result;
}

__attribute__((constructor)) static void begin(void) {
  pthread_t thread;
  real_wait = (timed_wait)dlvsym(RTLD_NEXT, "pthread_cond_timedwait", "GLIBC_2.3.2");
  pthread_create(&thread, NULL, sleep_beside, NULL);
  pthread_detach(thread);
}

__attribute__((destructor)) static void end(void) {
  const char *path = getenv("BENCH_STEPS");
  FILE *file = path ? fopen(path, "w") : NULL;
  if (file) {
    print(file, &steps);
    print(file, &works);
    print(file, &sleeps);
    fclose(file);
  }
}
