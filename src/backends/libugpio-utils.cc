#include "backends/libugpio-utils.h"

#include <cerrno>
#include <string_view>
#include <utility>

#include "base/log.h"
#include "port/ioport.h"

namespace {

constexpr int kDecimal = 10;
constexpr const char *kLabel = "pin";

// The device's flags, passed as they stand.
constexpr unsigned int kInput =
    UGPIOF_DIR_IN | UGPIOF_TRIG_FALL | UGPIOF_TRIG_RISE | UGPIOF_ALTER_DIR | UGPIOF_ALTER_EDGE;
constexpr unsigned int kOutputLow = UGPIOF_ALTER_DIR;
constexpr unsigned int kOutputHigh = UGPIOF_ALTER_DIR | UGPIOF_INIT_HIGH;
static_assert(kInput == 0x14D && kOutputLow == 0x40 && kOutputHigh == 0x42);

unsigned int request_flags(const GpioPin *pin, bool is_input, bool value) {
  if (is_input) {
    return kInput;
  }
  return value != (pin->inverted != 0) ? kOutputHigh : kOutputLow;
}

ugpio_t *request_line(const GpioPin *pin, unsigned int flags) {
  return pin->alias ? ugpio_request_one_named(pin->alias->c_str(), flags)
                    : ugpio_request_one(static_cast<unsigned int>(pin->pin), flags, kLabel);
}

// What failed, with errno; null when nothing did.
const char *prepare_line(const GpioPin *pin) {
  if (ugpio_full_open(pin->handle) == -1) {
    return "Failed to open pin fd!";
  }
  return ugpio_set_activelow(pin->handle, pin->inverted != 0 ? 1 : 0) != 0
             ? "Failed set active low!"
             : nullptr;
}

// A library that is not ours may not take a null handle as kindly.
bool has_handle(const GpioPin *pin) {
  if (!pin || !pin->handle) {
    errno = pin ? pin->refusal : EINVAL;
    return false;
  }
  return true;
}

// As the hardware description has it.
std::string describe(const GpioPin *pin) {
  return pin->alias ? *pin->alias : std::to_string(pin->pin);
}

}  // namespace

const char *libugpio_alias_text(const GpioPin *pin) {
  return pin->alias ? pin->alias->c_str() : "(null)";
}

bool libugpio_request_gpio_pin(GpioPin *pin, bool is_input, bool value, GLogLevelFlags level) {
  libugpio_close_gpio_pin(pin);
  pin->handle = request_line(pin, request_flags(pin, is_input, value));
  const char *failure = pin->handle ? prepare_line(pin) : "Failed to allocate pin";
  if (!failure) {
    return true;
  }
  const int reason = errno;
  if (pin->handle) {
    log_at(level, "%s", failure);
  } else {
    pin->refusal = reason;
    log_at(level, "%s %d/%s", failure, pin->pin, libugpio_alias_text(pin));
  }
  errno = reason;
  return false;
}

bool libugpio_request_port_pin(IOPort *port, const char *role, GpioPin *pin, bool is_input,
                               bool value, GLogLevelFlags level) {
  const bool had = libugpio_request_gpio_pin(pin, is_input, value, level);
  if (!had) {
    libugpio_note_missing(port, role, pin);
  }
  return had;
}

void libugpio_note_missing(IOPort *port, const char *role, const GpioPin *pin) {
  const char *reason = g_strerror(errno);
  const std::string name = describe(pin);
  io_port_note_fault(port, "%s pin %s: %s", role, name.c_str(), reason);
  log_warning("Port %s has to do without its %s pin %s: %s", io_port_describe(port), role,
              name.c_str(), reason);
}

void libugpio_note_driven(IOPort *port, const char *role, GpioPin *pin, bool driven, int reason) {
  if (!std::exchange(pin->fault_logged, !driven) && !driven) {
    log_warning("Port %s: its %s pin %s can't be driven: %s", io_port_describe(port), role,
                describe(pin).c_str(), g_strerror(reason));
  }
}

int libugpio_get_gpio_pin(const GpioPin *pin) {
  return has_handle(pin) ? ugpio_get_value(pin->handle) : -1;
}

int libugpio_write_gpio_pin(const GpioPin *pin, int value) {
  return has_handle(pin) ? ugpio_set_value(pin->handle, value) : -1;
}

bool libugpio_set_gpio_pin(const GpioPin *pin, int value) {
  g_assert(pin);
  errno = 0;
  if (libugpio_write_gpio_pin(pin, value) != -1) {
    return true;
  }
  const int reason = errno;
  log_warning("Failed to set gpio pin %s: %s", libugpio_alias_text(pin), g_strerror(reason));
  errno = reason;
  return false;
}

int libugpio_gpio_pin_fd(const GpioPin *pin) {
  return has_handle(pin) ? ugpio_fd(pin->handle) : -1;
}

void libugpio_close_gpio_pin(GpioPin *pin) {
  if (!pin || !pin->handle) {
    return;
  }
  ugpio_close(pin->handle);
  ugpio_free(pin->handle);
  pin->handle = nullptr;
}

void libugpio_free_gpio_pin(GpioPin *pin) {
  libugpio_close_gpio_pin(pin);
  delete pin;
}

void libugpio_set_gpio_pin_property(GpioPin *pin, const char *key, const char *value) {
  const std::string_view name = key;
  if (name == "pin") {
    pin->pin = static_cast<std::int32_t>(g_ascii_strtoll(value, nullptr, kDecimal));
  } else if (name == "alias") {
    pin->alias = value;
  } else if (name == "inverted") {
    pin->inverted = std::string_view(value) == "true" ? 1 : 0;
  }
}

std::int32_t libugpio_compare_gpio_pin(const GpioPin *a, const GpioPin *b) {
  return static_cast<std::int32_t>(static_cast<std::uint32_t>(a->pin) -
                                   static_cast<std::uint32_t>(b->pin));
}

GpioPin *libugpio_make_gpio_pin(GpioPinPtr &pin) {
  if (!pin) {
    pin.reset(new GpioPin);
  }
  return pin.get();
}
