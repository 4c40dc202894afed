// One GPIO line of a port: what the hardware description says of it, and its handle while it is
// requested. The pins belong to the backends that make them; a pin is used by one thread at a time.
//
// A pin without a handle can be used like any other: its reads and writes fail.
#pragma once

#include <glib.h>
#include <ugpio/ugpio.h>

#include <cerrno>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>

struct IOPort;

struct GpioPin {
  std::int32_t inverted = 0;         // 1: the line is active low
  std::optional<std::string> alias;  // the line's name; when set, it is requested by that
  std::int32_t pin = 0;              // the line's number
  ugpio_t *handle = nullptr;         // none while the line is not requested
  int refusal = EINVAL;              // why there is none, as errno
  bool fault_logged = false;         // it could not be driven, and the log says so
  bool driven_high = false;          // for backends that have to know what they last wrote
};

// Requests and opens the line and sets its active-low sense; what an earlier request left is given
// back first. An output starts at the logical level `value` without a glitch. False: it failed, and
// the log says at what, at that level, and errno why. A line that was had but could not be prepared
// keeps its handle.
bool libugpio_request_gpio_pin(GpioPin *pin, bool is_input, bool value,
                               GLogLevelFlags level = G_LOG_LEVEL_WARNING);
// The same for a port, which lives on without the line: another message, and the fault noted with
// the port, say which of its pins it is and why.
bool libugpio_request_port_pin(IOPort *port, const char *role, GpioPin *pin, bool is_input,
                               bool value, GLogLevelFlags level = G_LOG_LEVEL_WARNING);
// Says that a pin of the port could not be had; errno says why.
void libugpio_note_missing(IOPort *port, const char *role, const GpioPin *pin);
// Takes note whether a pin of the port could be driven; `reason`, an errno, says why not. The log
// is told once, until it can be again.
void libugpio_note_driven(IOPort *port, const char *role, GpioPin *pin, bool driven, int reason);
// The pin's alias for a message, as printf writes an absent text.
const char *libugpio_alias_text(const GpioPin *pin);
// The logical level, or -1 with errno. No pin reads like one without a handle. Acknowledges an
// edge.
int libugpio_get_gpio_pin(const GpioPin *pin);
// Writes a logical level; -1 with errno on failure. No pin fails like one without a handle.
int libugpio_write_gpio_pin(const GpioPin *pin, int value);
// The same, with a warning when it fails, and errno. No pin is a programming error.
bool libugpio_set_gpio_pin(const GpioPin *pin, int value);
// The descriptor that signals the line's edges, or -1 with errno. It stays the line's.
int libugpio_gpio_pin_fd(const GpioPin *pin);
// Gives the line back. The pin stays, and can be requested again.
void libugpio_close_gpio_pin(GpioPin *pin);
// The same, and frees the pin.
void libugpio_free_gpio_pin(GpioPin *pin);
// Applies an attribute of the hardware description: "pin", "alias" or "inverted". Others are
// ignored.
void libugpio_set_gpio_pin_property(GpioPin *pin, const char *key, const char *value);
// Orders by number: below, equal to or above 0.
std::int32_t libugpio_compare_gpio_pin(const GpioPin *a, const GpioPin *b);

struct GpioPinFree {
  void operator()(GpioPin *pin) const { libugpio_free_gpio_pin(pin); }
};
using GpioPinPtr = std::unique_ptr<GpioPin, GpioPinFree>;

// The pin, made on its first mention.
GpioPin *libugpio_make_gpio_pin(GpioPinPtr &pin);
