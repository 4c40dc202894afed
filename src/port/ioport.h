// The port object: one digital input, output, configurable or virtual port. Nobody but the port
// layer sees its fields; the operations below apply the active-low sense, keep the port's lock,
// forward to the backend and report changes through the port listener.
//
// Unless an operation says otherwise: it runs on the main thread, a null port is a programming
// error that ends the daemon, and it reports nothing but its result.
#pragma once

#include <glib.h>

#include <cstddef>
#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "port/io-event.h"
#include "port/port-functions.h"
#include "port/supervised-range.h"

enum PortType {
  PORT_INPUT = 0,
  PORT_OUTPUT = 1,
  PORT_CONFIGURABLE = 2,  // input or output, by the port's direction
};

enum ButtonType { BUTTON_NONE = 0, BUTTON_PULSE = 1, BUTTON_ACTINACT = 2 };
enum PortMode { PORT_MODE_MONOSTABLE = 1, PORT_MODE_BISTABLE = 2 };

struct IOPort;

// --- Lifetime -----------------------------------------------------------------------------------

// A new port with one reference, the caller's.
IOPort *io_port_new();
// Any thread; null is ignored.
void io_port_ref(IOPort *port);
// Any thread; null is ignored. The last reference stops a running sequence and frees the port.
void io_port_unref(IOPort *port);

struct IOPortUnref {
  void operator()(IOPort *port) const { io_port_unref(port); }
};
using IOPortRef = std::unique_ptr<IOPort, IOPortUnref>;

// One more reference, or none where there is no port.
inline IOPortRef io_port_new_reference(IOPort *port) {
  io_port_ref(port);
  return IOPortRef(port);
}

// --- Backend ------------------------------------------------------------------------------------

// Makes a backend known, in place of an earlier one of its kind. Its word and its table must stay
// for good.
void io_port_register_backend(const Backend &backend);
// The kind for a word of the hardware description, compared exactly.
std::optional<BackendKind> io_port_backend_kind(std::string_view word);
// Chooses the backend, and gives the port its private record if it has none. A kind that nobody
// registered leaves the port without a table.
void io_port_set_backend(IOPort *port, BackendKind kind);
// Whether the port has a table. The operations that say "needs a backend" may be called only then.
bool io_port_has_backend(const IOPort *port);
// Hands an attribute of the hardware description to the backend. Without a backend it is lost, with
// a warning.
void io_port_set_backend_property(IOPort *port, const char *section, const char *key,
                                  const char *value);
// The backend's private record: never null while the backend is called, if it has one at all. Any
// thread that may call the backend.
PortBackendData *io_port_backend_data(const IOPort *port);

// Brings the backend up; needs a backend. A port that was dropped gets a fresh backend first, with
// the attributes of the hardware description. False: it does not come up, or it has to wait for a
// service first; once io_port_when_idle() calls, io_port_is_set_up() tells.
bool io_port_begin_setup(IOPort *port);
// The same for who needs the outcome at once: serves the main loop's sources until the port has
// settled.
bool io_port_setup(IOPort *port);
bool io_port_is_set_up(const IOPort *port);
// For a backend whose set-up had to ask a service first: the port is in service from now on.
void io_port_finish_setup(IOPort *port);
// Notes, for the log, what a set-up could not have: the port is out of service for it, or lacks a
// part. Once the port is set up nothing more is noted; the next set-up begins with nothing.
void io_port_note_fault(IOPort *port, const char *format, ...) G_GNUC_PRINTF(2, 3);
// What was noted, as one text for a message: never empty for a port that is not set up.
std::string io_port_fault(const IOPort *port);
// Whether the port is set up and nothing was noted.
bool io_port_in_service(const IOPort *port);
// Takes the port out of service: ends a running sequence and lets the backend release what it
// holds. The port reads 0 and refuses to be driven until it is set up again.
void io_port_drop(IOPort *port);

// --- Identity, flags and legacy settings --------------------------------------------------------

PortType io_port_get_type(const IOPort *port);
void io_port_set_type(IOPort *port, PortType type);
// The identifier in the hardware description; unset until given.
const std::optional<std::string> &io_port_get_id(const IOPort *port);
void io_port_set_id(IOPort *port, std::string id);
// The identifier for a message: never null.
const char *io_port_describe(const IOPort *port);
int io_port_get_number(const IOPort *port);
void io_port_set_number(IOPort *port, int number);
bool io_port_is_optional(const IOPort *port);
void io_port_set_optional(IOPort *port, bool optional);

// Sets a flag: true when the text is "true" in any letter case.
void io_port_set_flag(IOPort *port, const std::string &name, const char *text);
// False when the flag is absent or the port has no backend.
bool io_port_get_flag(const IOPort *port, const char *name);
// Unset when the flag is absent.
std::optional<bool> io_port_lookup_flag(const IOPort *port, const char *name);
// All flags, by name.
std::vector<std::pair<std::string, bool>> io_port_get_flags(const IOPort *port);
// Whether the port is one of the device's own, visible on the control interface. Null gives false.
bool io_port_is_ioport(const IOPort *port);

// Accepts PORT_MODE_MONOSTABLE and PORT_MODE_BISTABLE; false: refused.
bool io_port_set_mode(IOPort *port, int mode);
int io_port_get_mode(const IOPort *port);  // null gives 0
void io_port_set_delay_time(IOPort *port, std::int32_t delay_time);
std::int32_t io_port_get_delay_time(const IOPort *port);  // null gives -1
void io_port_set_pulse_time(IOPort *port, std::uint32_t pulse_time);
std::uint32_t io_port_get_pulse_time(const IOPort *port);
void io_port_set_button(IOPort *port, int button);
int io_port_get_button(const IOPort *port);
void io_port_set_spare_setting(IOPort *port, std::uint32_t value);  // 0 is ignored
std::uint32_t io_port_get_spare_setting(const IOPort *port);        // null gives 0

// --- Role ---------------------------------------------------------------------------------------

// Whether the port acts as an input now. Needs a backend. Any thread.
bool io_port_input(const IOPort *port);
// The same from the type and the direction alone, so for a port without backend too. Any thread.
bool io_port_direction_input(const IOPort *port);
// Whether the port acts as an input whose supervision is on. Needs a backend. Any thread.
bool io_port_supervised_input(const IOPort *port);
bool io_port_is_supervised(const IOPort *port);
// The active-low flag of the input or the output side. Any thread.
bool io_port_get_activelow(const IOPort *port, bool input);
// Whether the port's lock is taken or a sequence runs. Never waits.
bool io_port_is_busy(IOPort *port);

// --- State --------------------------------------------------------------------------------------

// The logical state; false before set-up and while the level is unknown. Any thread.
bool io_port_get_state(IOPort *port);
// Drives an output. False, with a warning, for a port that acts as an input, is on the virtual
// backend or is not set up.
bool io_port_set_state(IOPort *port, bool state);
// The same without the checks. The caller holds the port's lock. Any thread.
void io_port_set_state_internal(IOPort *port, bool state);
// Reports a state without touching hardware; on a virtual output also stores it. Always true. Any
// thread.
bool io_port_set_virtual(IOPort *port, bool state);
// What a backend's watch calls: sends the events for the state and PortChanged. A supervised input
// reports its line state; whatever is not 0 counts as active.
void io_port_report_state(IOPort *port, std::int32_t state);
// Emits PortChanged while the port's events are enabled. Any thread.
void io_port_send_signal(IOPort *port, bool virtual_change, bool state);
// The same for an input whose backend knows the state of the line as well as the level: events for
// supervised inputs carry the state of the line, all others, and PortChanged, the logical state.
void io_port_report_line(IOPort *port, SupervisedRangeState line);
// Calls `done` when a service that the port depends on has answered, or failed to answer, what
// was asked of it for the port so far: at once when nothing is under way, else from the main loop.
// Nobody waits meanwhile, and the port can be used.
void io_port_when_idle(IOPort *port, std::function<void()> done);
// Arms the backend's watch while the port acts as an input and its events are enabled. Needs a
// backend.
void io_port_set_watch(IOPort *port);

// --- Names --------------------------------------------------------------------------------------

// The name of the role in use. Null gives a critical message and no name.
std::optional<std::string> io_port_get_name(const IOPort *port);
// The names that apply to the port's type; the others are left alone. Null does nothing.
void io_port_get_names(const IOPort *port, std::optional<std::string> *input_name,
                       std::optional<std::string> *output_name);
// False for a null port, for a port type without that side and for a text that can't be a name
// (port/port-name.h). A changed name in use makes the port's events known anew.
bool io_port_set_input_name(IOPort *port, const std::string &name);
bool io_port_set_output_name(IOPort *port, const std::string &name);

// --- Stored settings, put in place without any report or backend call ---------------------------

void io_port_restore_direction(IOPort *port, bool input);
void io_port_restore_activelow(IOPort *port, bool activelow, bool input);
// What can't be a name is left out, with a warning.
void io_port_restore_name(IOPort *port, std::optional<std::string> name, bool input);
void io_port_restore_supervised(IOPort *port, bool supervised);

// --- Settings changes (they end a running sequence) ---------------------------------------------

// Changing an output's sense flips the line and keeps the logical state; changing an input's
// reports the state anew. False for a port type without that side.
bool io_port_set_activelow(IOPort *port, bool activelow, bool input);
// False unless the port is configurable.
bool io_port_set_direction(IOPort *port, bool input);

// --- Supervision (needs a backend) --------------------------------------------------------------

bool io_port_is_supervisable(IOPort *port);
// False unless the port is supervisable.
bool io_port_set_supervised(IOPort *port, bool supervised);
// The port's own range list, for the backends that keep theirs here: unlike a backend's record it
// stays while the port is out of service. Any thread.
SupervisedRanges io_port_range_list(const IOPort *port);
void io_port_store_range_list(IOPort *port, SupervisedRanges ranges);
// Copies the port's ranges; false unless the port is supervisable. Any thread.
bool io_port_get_supervised_ranges(IOPort *port, SupervisedRanges *ranges);
// False, at times without an error, when they were refused.
bool io_port_set_supervised_ranges(IOPort *port, SupervisedRanges ranges, GError **error);
// Adds the range of one state or replaces it, the new one going to the end of the list. Limits are
// read as signed 32-bit numbers. False and `error` when the range is refused.
bool io_port_set_supervised_range(IOPort *port, const char *state, std::uint32_t lower,
                                  std::uint32_t upper, GError **error);
// The state of the line and the level in raw converter codes. False and `error` when the port has
// none or it can't be read. Any thread.
bool io_port_get_supervised_readout(IOPort *port, SupervisedRangeState *state, std::uint32_t *level,
                                    GError **error);
// The state of the line: undefined when the readout fails, open (0) for a port that is not set up
// or not supervisable. Any thread.
SupervisedRangeState io_port_get_supervised_state(IOPort *port);

// --- Events -------------------------------------------------------------------------------------

// The port's events, newest first.
IoEvents &io_port_events(IOPort *port);
// Whether the event is for the role that the port has now. Any thread.
bool io_port_event_applies(const IOPort *port, const IoEvent &event);
bool io_port_events_enabled(const IOPort *port);  // any thread
// Off: withdraws every event and keeps the port silent. On: declares them.
void io_port_set_events_enabled(IOPort *port, bool enabled);
// Declares every event of the port; needs a backend. What can't be declared is logged.
void io_port_declare_events(IOPort *port);
// Withdraws every event and declares those that apply, since what they say of the port has changed.
// Takes the port's lock: a step of a running sequence comes before or after it.
void io_port_redeclare_events(IOPort *port);
void io_port_reset_event_filters(IOPort *port);
// Whether one of the port's events is the shared any-port event. False while events are off.
bool io_port_got_port_any(IOPort *port);

// --- Action sequences ---------------------------------------------------------------------------

struct ActionStep {
  bool state;
  // How long the state is held before the next step; 0: not at all. Counted in microseconds in 32
  // bits, which wrap: a time above 2,147,483 ms may end early, one below -2,147,483 ms may wait.
  std::int32_t time_ms;
};

// The most steps that a client may ask for in one sequence.
inline constexpr std::size_t kMaxSequenceSteps = 65'536;

struct ActionSequence {
  bool is_virtual;  // reports the states instead of driving the port
  std::vector<ActionStep> steps;
};

// Starts the sequence on a thread of its own, which takes a reference on the port. False, with a
// warning, when the port can't run it, or when a sequence runs on it already.
bool io_port_run_action_sequence(IOPort *port, ActionSequence sequence);
// Waits until no action thread of any port is left. Cancel the sequences first.
void io_port_wait_for_action_threads();
