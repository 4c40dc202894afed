// The commands that change one thing and say nothing when it is done.
#include <cstdio>
#include <cstring>

#include "portctl/describe.h"
#include "portctl/session.h"

namespace {

void check(bool done, const Error &error, const std::string &word) {
  if (!done) {
    fail_call(error, "port " + word);
  }
}

// The side that is meant: the given one, or the one that the port has or uses.
bool input_side(Session &session, const std::string &word) {
  if (session.options.input_side) {
    return *session.options.input_side;
  }
  Ports ports = fetch_ports(session.bus);
  return find_port(ports, word).input;
}

void print_sides(const Session &session, const std::string &input, const std::string &output) {
  if (session.options.json) {
    std::printf("%s\n", JsonObject().add("input", input).add("output", output).text().c_str());
    return;
  }
  if (!input.empty()) {
    std::printf("input: %s\n", visible(input).c_str());
  }
  if (!output.empty()) {
    std::printf("output: %s\n", visible(output).c_str());
  }
}

void print_names(Session &session, std::uint32_t number) {
  char *input = nullptr;
  char *output = nullptr;
  Error error;
  check(iocontrol_state_call_get_names_sync(session.bus.control(), number, &input, &output, nullptr,
                                            error.out()),
        error, session.words[0]);
  print_sides(session, GCharPtr(input).get(), GCharPtr(output).get());
}

void print_active(Session &session, std::uint32_t number) {
  char *input = nullptr;
  char *output = nullptr;
  Error error;
  check(iocontrol_state_call_get_active_sync(session.bus.control(), number, &input, &output,
                                             nullptr, error.out()),
        error, session.words[0]);
  print_sides(session, GCharPtr(input).get(), GCharPtr(output).get());
}

// The bus knows "open" and "closed"; "low" and "high" say the same of the level.
const char *active_word(const std::string &word) {
  if (word == "open" || word == "low") {
    return "open";
  }
  if (word == "closed" || word == "high") {
    return "closed";
  }
  fail(STATUS_USAGE,
       "\"" + visible(word) + "\" is no active level: give low (open) or high (closed)");
}

void set_state(Session &session, const std::string &word, std::uint32_t number, bool active) {
  Error error;
  check(iocontrol_state_call_set_state_sync(session.bus.control(), number, active, nullptr,
                                            error.out()),
        error, word);
}

}  // namespace

bool parse_state(const std::string &word) {
  for (const char *on : {"active", "on", "1", "true"}) {
    if (word == on) {
      return true;
    }
  }
  for (const char *off : {"inactive", "off", "0", "false"}) {
    if (word == off) {
      return false;
    }
  }
  fail(STATUS_USAGE,
       "\"" + visible(word) + "\" is no state: give active or inactive (on, off, 1, 0)");
}

int set_command(Session &session) {
  const bool active = parse_state(session.words[1]);
  set_state(session, session.words[0], port_number(session.bus, session.words[0]), active);
  return STATUS_OK;
}

int toggle_command(Session &session) {
  const std::string &word = session.words[0];
  const std::uint32_t number = port_number(session.bus, word);
  gboolean active = FALSE;
  Error error;
  check(iocontrol_state_call_get_state_sync(session.bus.control(), number, &active, nullptr,
                                            error.out()),
        error, word);
  set_state(session, word, number, !active);
  std::puts(active ? "inactive" : "active");
  return STATUS_OK;
}

int virtual_command(Session &session) {
  const bool active = parse_state(session.words[1]);
  const std::uint32_t number = port_number(session.bus, session.words[0]);
  Error error;
  check(iocontrol_state_call_set_virtual_sync(session.bus.control(), number, active, nullptr,
                                              error.out()),
        error, session.words[0]);
  return STATUS_OK;
}

int direction_command(Session &session) {
  const std::string &word = session.words[0];
  if (session.words.size() > 1 && session.words[1] != "input" && session.words[1] != "output") {
    fail(STATUS_USAGE,
         "\"" + visible(session.words[1]) + "\" is no direction: give input or output");
  }
  const std::uint32_t number = port_number(session.bus, word);
  Error error;
  if (session.words.size() > 1) {
    check(iocontrol_state_call_set_direction_sync(session.bus.control(), number,
                                                  session.words[1].c_str(), nullptr, error.out()),
          error, word);
    return STATUS_OK;
  }
  char *direction = nullptr;
  check(iocontrol_state_call_get_direction_sync(session.bus.control(), number, &direction, nullptr,
                                                error.out()),
        error, word);
  const GCharPtr owned(direction);
  if (session.options.json) {
    std::printf("%s\n",
                JsonObject().add("number", number).add("direction", direction).text().c_str());
  } else {
    std::puts(visible(direction).c_str());
  }
  return STATUS_OK;
}

int name_command(Session &session) {
  const std::string &word = session.words[0];
  const std::uint32_t number = port_number(session.bus, word);
  if (session.words.size() == 1) {
    print_names(session, number);
    return STATUS_OK;
  }
  const std::string &name = session.words[1];
  if (!g_utf8_validate(name.c_str(), -1, nullptr)) {
    fail(STATUS_USAGE, "the name is not UTF-8: it could not be sent to the daemon");
  }
  Error error;
  check(iocontrol_state_call_set_name_sync(session.bus.control(), number, input_side(session, word),
                                           name.c_str(), nullptr, error.out()),
        error, word);
  return STATUS_OK;
}

int active_command(Session &session) {
  const std::string &word = session.words[0];
  const char *level = session.words.size() > 1 ? active_word(session.words[1]) : nullptr;
  const std::uint32_t number = port_number(session.bus, word);
  if (!level) {
    print_active(session, number);
    return STATUS_OK;
  }
  Error error;
  check(iocontrol_state_call_set_active_sync(
            session.bus.control(), number, input_side(session, word), level, nullptr, error.out()),
        error, word);
  return STATUS_OK;
}

int drop_command(Session &session) {
  Ports ports = fetch_ports(session.bus);
  std::vector<std::string> ids;
  std::vector<const char *> wanted;
  ids.reserve(session.words.size());
  wanted.reserve(session.words.size() + 1);
  for (const auto &word : session.words) {
    ids.push_back(find_port(ports, word).id);
  }
  for (const auto &id : ids) {
    wanted.push_back(id.c_str());
  }
  wanted.push_back(nullptr);
  char **dropped = nullptr;
  Error error;
  if (!iocontrol_state_call_drop_ioports_sync(session.bus.control(), wanted.data(), &dropped,
                                              nullptr, error.out())) {
    fail_call(error, "drop");
  }
  const GStrvPtr owned(dropped);
  for (const auto &id : ids) {
    if (!g_strv_contains(dropped, id.c_str())) {
      fail(STATUS_REFUSED, visible(id) +
                               " stays in service: only ports that the hardware description "
                               "marks optional=\"true\" can be dropped");
    }
  }
  return STATUS_OK;
}

int refresh_command(Session &session) {
  const auto before = fetch_ports(session.bus).size();
  Error error;
  if (!iocontrol_state_call_refresh_ioports_sync(session.bus.control(), nullptr, error.out())) {
    fail_call(error, "refresh");
  }
  const auto after = fetch_ports(session.bus).size();
  std::printf("%zu ports came back, %zu are in service\n", after > before ? after - before : 0,
              after);
  return STATUS_OK;
}
