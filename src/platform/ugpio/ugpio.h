// The device's GPIO library: one context per requested line.
//
// A line reads and writes logical levels: what is active-low is inverted below this interface. The
// initial level of an output alone is the physical one.
//
// Results of type int are -1 on failure, with errno. A null context gives -1 and EINVAL, or nothing
// happens where there is no result, so that a line which could not be requested needs no special
// care. Contexts may be used from any thread, one context by one thread at a time.
#pragma once

#ifdef __cplusplus
extern "C" {
#endif

typedef struct Ugpio ugpio_t;  // NOLINT(modernize-use-using): a header for C as well

enum {
  UGPIOF_DIR_IN = 1 << 0,      // otherwise the line becomes an output
  UGPIOF_INIT_HIGH = 1 << 1,   // an output starts high, otherwise low
  UGPIOF_TRIG_FALL = 1 << 2,   // falling edges are signalled
  UGPIOF_TRIG_RISE = 1 << 3,   // rising edges are signalled
  UGPIOF_ALTER_DIR = 1 << 6,   // the direction may change later
  UGPIOF_ALTER_EDGE = 1 << 8,  // the edges may change later
};

// Takes the line and leaves its direction as it is. Null on failure, with errno.
ugpio_t *ugpio_request(unsigned int gpio, const char *label);
ugpio_t *ugpio_request_named(const char *name);
// Takes the line and sets direction, initial level and edges. An output gets its direction and its
// level in one step, so it never shows another level in between. Null on failure, with errno; the
// line is then as free as it was before.
ugpio_t *ugpio_request_one(unsigned int gpio, unsigned int flags, const char *label);
ugpio_t *ugpio_request_one_named(const char *name, unsigned int flags);

// Opens the line for the calls below, ugpio_set_activelow() excepted.
int ugpio_full_open(ugpio_t *context);
// 1: the line is active-low from now on. The physical level stays.
int ugpio_set_activelow(ugpio_t *context, int activelow);
// 0 or 1. Acknowledges a signalled edge.
int ugpio_get_value(ugpio_t *context);
int ugpio_set_value(ugpio_t *context, int value);
// The descriptor that signals an edge as POLLPRI | POLLERR. It stays the context's.
int ugpio_fd(ugpio_t *context);
void ugpio_close(ugpio_t *context);
// Gives the line back, unless somebody else had taken it before, and frees the context.
void ugpio_free(ugpio_t *context);

#ifdef __cplusplus
}
#endif
