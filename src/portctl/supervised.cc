// Supervision: which ports have it, what their lines measure, and the ranges that tell states
// apart.
#include <algorithm>
#include <cstdio>

#include "portctl/describe.h"
#include "portctl/session.h"

namespace {

const Supervision &supervision_of(const Port &port, const std::string &word) {
  if (!port.supervision) {
    fail(STATUS_REFUSED,
         "port " + visible(word) +
             ": it can't be supervised: \"portctl supervised\" lists those that can");
  }
  return *port.supervision;
}

std::string ranges_in_words(const Supervision &supervision) {
  std::string words;
  for (const auto &range : supervision.ranges) {
    words += (words.empty() ? "" : ", ") + range.state + " " + std::to_string(range.lower) + "-" +
             std::to_string(range.upper);
  }
  return words;
}

int list(Session &session, const Ports &ports) {
  JsonArray array;
  Table table;
  table.add({{"No", Style::kBold},
             {"Name", Style::kBold},
             {"Supervised", Style::kBold},
             {"Line", Style::kBold},
             {"Level", Style::kBold},
             {"Ranges", Style::kBold}});
  for (const auto &port : ports) {
    if (!port.supervision) {
      continue;
    }
    const Supervision &supervision = *port.supervision;
    const bool known = !supervision.line.empty();
    table.add({{std::to_string(port.number)},
               {port.name()},
               {supervision.on ? "on" : "off"},
               {known ? supervision.line : "unreadable",
                is_tampered(supervision.line) ? Style::kBad : Style::kPlain},
               {known ? std::to_string(supervision.level) : "-"},
               {ranges_in_words(supervision)}});
    array.add_raw(port_json(port));
  }
  std::fputs(
      session.options.json ? (array.text() + "\n").c_str() : table.text(session.colours).c_str(),
      stdout);
  return STATUS_OK;
}

int print_readout(Session &session, const Port &port) {
  char *state = nullptr;
  guint level = 0;
  Error error;
  if (!iosupervised_supervised_call_get_supervised_readout_sync(
          session.bus.supervised(), static_cast<guint>(port.number), &state, &level, nullptr,
          error.out())) {
    fail_call(error, "port " + session.words[0]);
  }
  const GCharPtr owned(state);
  if (session.options.json) {
    std::printf("%s\n", JsonObject()
                            .add("number", port.number)
                            .add("line", state)
                            .add("level", level)
                            .text()
                            .c_str());
  } else {
    std::printf("%s %u\n", visible(state).c_str(), level);
  }
  return STATUS_OK;
}

int print_ranges(const Session &session, const Supervision &supervision) {
  JsonArray array;
  Table table;
  for (const auto &range : supervision.ranges) {
    const std::string lower = std::to_string(range.lower);
    const std::string upper = std::to_string(range.upper);
    table.add({{range.state}, {lower}, {upper}});
    array.add_raw(JsonObject()
                      .add("state", range.state)
                      .add("lower", range.lower)
                      .add("upper", range.upper)
                      .text());
  }
  std::fputs(
      session.options.json ? (array.text() + "\n").c_str() : table.text(session.colours).c_str(),
      stdout);
  return STATUS_OK;
}

int switch_supervision(Session &session, bool on) {
  const std::uint32_t number = port_number(session.bus, session.words[0]);
  Error error;
  if (!iosupervised_supervised_call_set_supervised_sync(session.bus.supervised(), number, on,
                                                        nullptr, error.out())) {
    fail_call(error, "port " + session.words[0]);
  }
  return STATUS_OK;
}

std::uint32_t parse_limit(const std::string &text) {
  const auto limit = parse_number(text);
  if (!limit) {
    fail(STATUS_USAGE, "\"" + visible(text) + "\" is no limit: give a number from 0 to 65535");
  }
  return *limit;
}

// PORT range STATE LOWER UPPER
int set_range(Session &session) {
  const auto &words = session.words;
  if (words.size() != 5) {
    fail(STATUS_USAGE, "usage: portctl supervised PORT range STATE LOWER UPPER");
  }
  const std::uint32_t lower = parse_limit(words[3]);
  const std::uint32_t upper = parse_limit(words[4]);
  const std::uint32_t number = port_number(session.bus, words[0]);
  Error error;
  if (!iosupervised_supervised_call_set_supervised_ranges_sync(
          session.bus.supervised(), number, words[2].c_str(), lower, upper, nullptr, error.out())) {
    fail_call(error, "port " + words[0]);
  }
  return STATUS_OK;
}

}  // namespace

int supervised_command(Session &session) {
  const std::string action = session.words.size() > 1 ? session.words[1] : "";
  if (action == "range") {
    return set_range(session);
  }
  if (session.words.size() > 2) {
    fail(STATUS_USAGE, "too many words: see \"portctl supervised --help\"");
  }
  if (action == "on" || action == "off") {
    return switch_supervision(session, action == "on");
  }
  Ports ports = fetch_ports(session.bus);
  if (session.words.empty()) {
    return list(session, ports);
  }
  const Port &port = find_port(ports, session.words[0]);
  const Supervision &supervision = supervision_of(port, session.words[0]);
  if (action.empty()) {
    return list(session, {port});
  }
  if (action == "readout") {
    return print_readout(session, port);
  }
  if (action == "ranges") {
    return print_ranges(session, supervision);
  }
  fail(STATUS_USAGE,
       "\"" + visible(action) +
           "\" is nothing to do with supervision: give on, off, readout, ranges or range");
}
