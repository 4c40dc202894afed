// The daemon's ports at one moment, and how a word of the user's finds one of them. Main thread
// only.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "portctl/bus.h"

struct Range {
  std::string state;
  std::uint32_t lower;
  std::uint32_t upper;
};

// Of a port whose line is measured.
struct Supervision {
  bool on = false;
  std::string line;  // the state of the line; empty when it could not be read
  std::uint32_t level = 0;
  std::vector<Range> ranges;
};

struct Flag {
  std::string name;
  bool set;
};

struct Port {
  std::string id;
  int number = -1;
  bool active = false;
  bool input = false;
  bool configurable = false;
  bool active_low = false;  // of the side in use
  std::vector<Flag> flags;  // in alphabetical order
  std::string input_name;
  std::string output_name;
  std::optional<Supervision> supervision;  // only where the port can be supervised

  bool has_flag(std::string_view name) const;
  // The name of the side in use; the identifier where there is none.
  const std::string &name() const;
  const char *role() const;
  const char *state() const { return active ? "active" : "inactive"; }
  // The flags that are set, in a row.
  std::string flag_words() const;
};

using Ports = std::vector<Port>;

// Asks for all ports, with their names and the supervision of those that have one. They come by
// number. Calls go out together, so that the time of many ports is little more than that of one.
// Gives nothing, with the error set, when the daemon can't be asked.
std::optional<Ports> try_fetch_ports(Bus &bus, Error &error);
// The same, ending the program on failure.
Ports fetch_ports(Bus &bus);

// Asks again for line state and level.
void refresh_readout(Bus &bus, Port &port);

// Whether the text is a port number.
std::optional<std::uint32_t> parse_number(const std::string &text);

// The port that a word of the user's means: its number, its identifier or one of its names. Ends
// the program, with the candidates named, when none or several fit.
Port &find_port(Ports &ports, const std::string &word);

// Only the number, which for a word that is one already costs no call.
std::uint32_t port_number(Bus &bus, const std::string &word);
