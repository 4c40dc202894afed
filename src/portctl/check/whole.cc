// The part of the checker for what only a whole port, or all ports together, tell.
#include <algorithm>

#include "portctl/check/description.h"

namespace {

constexpr std::size_t kLegacyPorts = 5;  // that older tools see without first_virtual_input

bool is_input(const DescribedPort &port) {
  return port.type != "output";
}

// Both exist only where the hardware id says so, and not on the same device as far as we can tell.
bool may_share(const DescribedPort &a, const DescribedPort &b) {
  return a.by_hardware && b.by_hardware;
}

}  // namespace

void DescriptionChecker::finish() {
  for (const auto &port : ports_) {
    finish_port(port);
  }
  check_numbers();
  check_default_names();
  if (ports_.size() > kLegacyPorts && !has_first_virtual_input_) {
    findings_.warning(ports_[kLegacyPorts].place,
                      "more than five ports, and no <first_virtual_input>: older configuration "
                      "tools see the first five only; write <first_virtual_input nbr=\"" +
                          std::to_string(ports_.size()) + "\"/> after the ports");
  }
}

void DescriptionChecker::finish_port(const DescribedPort &port) {
  const std::string who = port.id.empty() ? "the port" : "the port " + quoted(port.id);
  if (port.type.empty() && !port.type_place) {
    findings_.error(port.place, who + " has no <port_type type=\"...\"/>: it becomes an input");
  }
  if (!port.number_place) {
    findings_.error(port.place, who + " has no <port_no nbr=\"...\"/>: nobody can reach it");
  }
  if (!port.has_flag) {
    findings_.error(port.place, who +
                                    " has no <properties ioport=\"true\"/>: clients are told that "
                                    "there is no such port");
  }
  if (!port.backend_place) {
    findings_.error(port.place, who + " has no <backend name=\"...\">: there is nothing behind it");
  }
  check_needs(port);
}

void DescriptionChecker::check_needs(const DescribedPort &port) {
  if (!port.backend || !port.type_place) {
    return;
  }
  const auto &backend = *port.backend;
  if (!vocabulary::holds_word("input output io_ctrl", port.type)) {
    return;  // said already
  }
  if (!vocabulary::holds_word(backend.port_types, port.type)) {
    findings_.error(*port.backend_place,
                    "the backend " + std::string(backend.name) + " serves ports of the type " +
                        std::string(backend.port_types) + " only, not " + port.type);
    return;
  }
  for (const auto &need : backend.needs) {
    if ((need.port_type.empty() || need.port_type == port.type) &&
        !port.sections.contains(std::string(need.section))) {
      findings_.error(*port.backend_place, "the backend " + std::string(backend.name) + " needs <" +
                                               std::string(need.section) +
                                               " .../> for a port of the type " + port.type);
    }
  }
  const char *other = port.type == "input" ? "output" : port.type == "output" ? "input" : "";
  const auto superfluous = port.sections.find(other);
  if (superfluous != port.sections.end() && backend.name != "spiadc") {
    findings_.error(superfluous->second, std::string("a port of the type ") + port.type +
                                             " has no <" + other +
                                             ">: leave it out, or make the port an io_ctrl");
  }
}

void DescriptionChecker::check_numbers() {
  for (std::size_t i = 0; i < ports_.size(); ++i) {
    for (std::size_t j = 0; j < i; ++j) {
      const bool same = ports_[i].number && ports_[i].number == ports_[j].number;
      if (same && !may_share(ports_[i], ports_[j])) {
        findings_.error(*ports_[i].number_place, "the number " + std::to_string(*ports_[i].number) +
                                                     " is taken by " + quoted(ports_[j].id) +
                                                     " (line " +
                                                     std::to_string(ports_[j].place.line) +
                                                     "), which is the one that clients reach");
        break;
      }
    }
  }
}

// The daemon walks the numbers from 0 and stops at the number of ports.
void DescriptionChecker::check_default_names() {
  const auto count = static_cast<std::int64_t>(ports_.size());
  const bool from_one =
      !ports_.empty() &&
      std::none_of(ports_.begin(), ports_.end(), [](const auto &port) { return port.number == 0; });
  for (const auto &port : ports_) {
    if (!port.number || *port.number < count) {
      continue;
    }
    const bool named = is_input(port) ? port.input_named : port.output_named;
    findings_.warning(*port.number_place,
                      "number " + std::to_string(*port.number) + " is beyond the " +
                          std::to_string(count) + " ports that there are: the port gets no " +
                          (named ? "" : "name by default, and no ") +
                          "entry in the settings file at start-up; number the ports from 0 " +
                          (from_one ? "(these begin at 1)" : "without holes"));
  }
}
