#include "portctl/describe.h"

#include <sys/time.h>

#include <ctime>

namespace {

std::string supervision_json(const Supervision &supervision) {
  JsonArray ranges;
  for (const auto &range : supervision.ranges) {
    ranges.add_raw(JsonObject()
                       .add("state", range.state)
                       .add("lower", range.lower)
                       .add("upper", range.upper)
                       .text());
  }
  JsonObject object;
  object.add("on", supervision.on);
  if (supervision.line.empty()) {
    object.add_raw("line", "null").add_raw("level", "null");
  } else {
    object.add("line", supervision.line).add("level", supervision.level);
  }
  return object.add_raw("ranges", ranges.text()).text();
}

}  // namespace

std::string port_json(const Port &port) {
  JsonObject flags;
  for (const auto &flag : port.flags) {
    flags.add(flag.name, flag.set);
  }
  JsonObject object;
  object.add("number", port.number)
      .add("identifier", port.id)
      .add("name", port.name())
      .add("input_name", port.input_name)
      .add("output_name", port.output_name)
      .add("direction", port.input ? "input" : "output")
      .add("configurable", port.configurable)
      .add("active", port.active)
      .add("active_low", port.active_low)
      .add_raw("flags", flags.text());
  if (port.supervision) {
    object.add_raw("supervision", supervision_json(*port.supervision));
  }
  return object.text();
}

Table::Cell state_cell(const Port &port) {
  return {port.state(), port.active ? Style::kGood : Style::kPlain};
}

bool is_tampered(const std::string &line) {
  return line == "short" || line == "cut";
}

Table::Cell line_cell(const Port &port) {
  if (!port.supervision) {
    return {"-", Style::kDim};
  }
  if (!port.supervision->on) {
    return {"off", Style::kDim};
  }
  if (port.supervision->line.empty()) {
    return {"unreadable", Style::kWarn};
  }
  const std::string text = port.supervision->line + " " + std::to_string(port.supervision->level);
  return {text, is_tampered(port.supervision->line) ? Style::kBad : Style::kPlain};
}

std::string time_stamp() {
  timeval now = {};
  gettimeofday(&now, nullptr);
  tm parts = {};
  localtime_r(&now.tv_sec, &parts);
  char date[32];
  char zone[8];
  char text[64];
  std::strftime(date, sizeof date, "%Y-%m-%dT%H:%M:%S", &parts);
  std::strftime(zone, sizeof zone, "%z", &parts);
  std::snprintf(text, sizeof text, "%s.%03d%.3s:%s", date, static_cast<int>(now.tv_usec / 1000),
                zone, zone + 3);
  return text;
}
