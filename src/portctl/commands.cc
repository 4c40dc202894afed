// The one table of commands. The help of each, with its heading, fits 24 lines of 80 columns.
#include "portctl/session.h"

namespace {

constexpr Command kCommands[] = {
    {"list", "[--json]", "All ports in service, with state and settings",
     "Columns: number, identifier (its name in the hardware description), name, role,\n"
     "state, active level, the measured line with its level (where supervision is\n"
     "on), and the flags of the hardware description.",
     "j", 0, 0, list_command},
    {"get", "PORT... [--json]", "State of ports: active or inactive", "", "j", 1, kAny,
     get_command},
    {"set", "PORT STATE", "Drive an output",
     "STATE is active or inactive; on, off, 1 and 0 mean the same.", "", 2, 2, set_command},
    {"toggle", "PORT", "Drive an output to its other state", "Prints the state that it has now.",
     "", 1, 1, toggle_command},
    {"direction", "PORT [input|output] [--json]", "See or turn the direction of a port",
     "Only configurable ports can be turned.", "j", 1, 2, direction_command},
    {"name", "PORT [NAME] [--input|--output] [--json]", "See or give the names of a port",
     "A configurable port has a name for each side. Without --input or --output the\n"
     "name of the side in use is given.",
     "jio", 1, 2, name_command},
    {"active", "PORT [LEVEL] [--input|--output] [--json]",
     "See or choose which level is the active one",
     "LEVEL is low or high; the daemon's own words for them, open and closed, are\n"
     "taken and printed as well. A configurable port has a level for each side;\n"
     "without --input or --output that of the side in use is chosen.",
     "jio", 1, 2, active_command},
    {"pulse", "PORT MS [--wait] [--virtual]", "Make an output active for a time",
     "The daemon keeps the time: the command ends at once, unless --wait is given.\n"
     "--virtual reports the states without driving the port.",
     "wv", 2, 2, pulse_command},
    {"sequence", "PORT STEPS [--repeat N] [--wait] [--virtual]",
     "Take an output through timed states",
     "STEPS are states with milliseconds, such as on:200,off:100,on:200,off:0. The\n"
     "port keeps the last state. --repeat takes the steps N times. The daemon keeps\n"
     "the time: the command ends at once, unless --wait is given. Changing the\n"
     "direction or the active level of the port ends the sequence. --virtual reports\n"
     "the states without driving the port.",
     "rwv", 2, 2, sequence_command},
    {"virtual", "PORT STATE", "Report a state without touching hardware",
     "Clients see the state as if the port had it. Virtual ports, manual triggers\n"
     "among them, take it on.",
     "", 2, 2, virtual_command},
    {"supervised", "[PORT [ACTION]] [--json]", "Measured inputs: states, levels, ranges",
     "Without an action: what can be supervised, with line state, level and ranges.\n"
     "  PORT on | off                   switch supervision\n"
     "  PORT readout                    state of the line and measured level\n"
     "  PORT ranges                     the range of levels for each state\n"
     "  PORT range STATE LOWER UPPER    set one; STATE is open, closed, short or cut,\n"
     "                                  the limits are levels below 65536",
     "j", 0, 5, supervised_command},
    {"connectors", "[--json]", "Which video and audio connectors are plugged in", "", "j", 0, 0,
     connectors_command},
    {"drop", "PORT...", "Take optional ports out of service",
     "Their hardware can then be removed. \"portctl refresh\" brings them back.", "", 1, kAny,
     drop_command},
    {"refresh", "", "Try the ports that are out of service again", "", "", 0, 0, refresh_command},
    {"events", "[--json]", "Events that the daemon has declared", "", "j", 0, 0, events_command},
    {"monitor", "[--json]", "Print changes, ends of sequences and events as they come",
     "Goes on when the daemon restarts; ends on Ctrl-C. With --json each line is an\n"
     "object whose \"kind\" is up, down, changed, sequence-done or event.",
     "j", 0, 0, monitor_command},
    {"wait", "PORT STATE [--timeout SECONDS]", "Wait until a port has a state",
     "STATE is active or inactive, or that of a measured line: open, closed, short,\n"
     "cut. Ends at once when the port has it. A daemon that is not running is waited\n"
     "for. After SECONDS the exit status is 6.",
     "t", 2, 2, wait_command},
    {"watch", "[--title TEXT] [--notes FIFO]", "Show all ports live on the whole terminal",
     "What changed lately is highlighted. A measured line is drawn with its level (#)\n"
     "over the ranges of its states. Below stands what happened. Keys: q ends, up and\n"
     "down (j, k) scroll. --title stands in the first line; lines that come through\n"
     "the FIFO are shown among what happened.",
     "nT", 0, 0, watch_command},
    {"check", "FILE... [--settings FILE] [--strict] [--json]",
     "Find mistakes in hardware descriptions",
     "The files, or the files of a folder, are read as one description: first the main\n"
     "one, then its fragments. --settings also checks a settings file for it. Mistakes\n"
     "are printed as file:line:column and what to write instead. Exit status 1 when\n"
     "the daemon would not do what is meant; with --strict for warnings too. The\n"
     "daemon is not asked.",
     "sSj", 1, kAny, check_command},
    {"__words", "", "", "", "", 1, 1, words_command},
};

}  // namespace

std::span<const Command> commands() {
  return kCommands;
}
