#include "portctl/ports.h"

#include <algorithm>
#include <charconv>

#include "portctl/text.h"

namespace {

// Calls that are under way together. Their replies come on a main context of their own: signals
// that arrive meanwhile wait, so that the ports do not change during the wait.
class Batch {
 public:
  explicit Batch(Ports &of_ports) : ports(of_ports), context_(g_main_context_new()) {
    g_main_context_push_thread_default(context_.get());
  }
  Batch(const Batch &) = delete;
  Batch &operator=(const Batch &) = delete;
  ~Batch() { g_main_context_pop_thread_default(context_.get()); }

  void wait() const {
    while (pending > 0) {
      g_main_context_iteration(context_.get(), TRUE);
    }
  }

  Ports &ports;
  int pending = 0;

 private:
  std::unique_ptr<GMainContext, GlibDeleter<g_main_context_unref>> context_;
};

// One call's reply: which port it is for.
struct Reply {
  Batch *batch;
  std::size_t port;
};

Reply *expect(Batch &batch, std::size_t port) {
  ++batch.pending;
  return new Reply{&batch, port};
}

// The port a reply is for; the reply is done with.
Port &arrived(gpointer data) {
  const std::unique_ptr<Reply> reply(static_cast<Reply *>(data));
  --reply->batch->pending;
  return reply->batch->ports[reply->port];
}

void on_names(GObject *proxy, GAsyncResult *result, gpointer data) {
  Port &port = arrived(data);
  char *input = nullptr;
  char *output = nullptr;
  // A port that is not one of the device's own has none; one that has gone needs none.
  if (iocontrol_state_call_get_names_finish(IOCONTROL_STATE(proxy), &input, &output, result,
                                            nullptr)) {
    port.input_name = GCharPtr(input).get();
    port.output_name = GCharPtr(output).get();
  }
}

void on_supervised(GObject *proxy, GAsyncResult *result, gpointer data) {
  Port &port = arrived(data);
  gboolean on = FALSE;
  if (iosupervised_supervised_call_get_supervised_finish(IOSUPERVISED_SUPERVISED(proxy), &on,
                                                         result, nullptr)) {
    port.supervision->on = on;
  }
}

void store_ranges(Port &port, GVariant *ranges) {
  GVariantIter iter;
  const char *state = nullptr;
  Range range;
  port.supervision->ranges.clear();
  g_variant_iter_init(&iter, ranges);
  while (g_variant_iter_next(&iter, "(&suu)", &state, &range.lower, &range.upper)) {
    range.state = state;
    port.supervision->ranges.push_back(range);
  }
}

void on_ranges(GObject *proxy, GAsyncResult *result, gpointer data) {
  Port &port = arrived(data);
  GVariant *ranges = nullptr;
  if (iosupervised_supervised_call_get_supervised_ranges_finish(IOSUPERVISED_SUPERVISED(proxy),
                                                                &ranges, result, nullptr)) {
    store_ranges(port, GVariantPtr(ranges).get());
  }
}

void on_readout(GObject *proxy, GAsyncResult *result, gpointer data) {
  Port &port = arrived(data);
  char *state = nullptr;
  port.supervision->line.clear();
  if (iosupervised_supervised_call_get_supervised_readout_finish(
          IOSUPERVISED_SUPERVISED(proxy), &state, &port.supervision->level, result, nullptr)) {
    port.supervision->line = GCharPtr(state).get();
  }
}

Port port_from(GVariant *entry) {
  Port port;
  const char *id = nullptr;
  gboolean active = FALSE;
  gboolean input = FALSE;
  gboolean configurable = FALSE;
  gboolean active_low = FALSE;
  GVariantIter *flags = nullptr;
  g_variant_get(entry, "(&sibbbba(sb))", &id, &port.number, &active, &input, &configurable,
                &active_low, &flags);
  port.id = id;
  port.active = active;
  port.input = input;
  port.configurable = configurable;
  port.active_low = active_low;
  const char *flag = nullptr;
  gboolean set = FALSE;
  while (g_variant_iter_next(flags, "(&sb)", &flag, &set)) {
    port.flags.push_back({flag, set != FALSE});
  }
  g_variant_iter_free(flags);
  std::sort(port.flags.begin(), port.flags.end(),
            [](const Flag &a, const Flag &b) { return a.name < b.name; });
  return port;
}

bool fetch_properties(Bus &bus, Ports &ports, Error &error) {
  int count = 0;
  GVariant *properties = nullptr;
  if (!iocontrol_state_call_get_port_props_sync(bus.control(), &count, &properties, nullptr,
                                                error.out())) {
    return false;
  }
  const GVariantPtr owned(properties);
  for (gsize i = 0; i < g_variant_n_children(properties); ++i) {
    const GVariantPtr entry(g_variant_get_child_value(properties, i));
    ports.push_back(port_from(entry.get()));
  }
  // The daemon lists the newest first.
  std::reverse(ports.begin(), ports.end());
  std::stable_sort(ports.begin(), ports.end(),
                   [](const Port &a, const Port &b) { return a.number < b.number; });
  return true;
}

// The interface of supervision comes a moment after the other one; without it no port is
// supervised.
void mark_supervisable(Bus &bus, Ports &ports) {
  GVariant *numbers = nullptr;
  if (!iosupervised_supervised_call_get_supervised_port_numbers_sync(bus.supervised(), &numbers,
                                                                     nullptr, nullptr)) {
    return;
  }
  const GVariantPtr owned(numbers);
  for (gsize i = 0; i < g_variant_n_children(numbers); ++i) {
    const GVariantPtr child(g_variant_get_child_value(numbers, i));
    const auto number = static_cast<int>(g_variant_get_uint32(child.get()));
    for (auto &port : ports) {
      if (port.number == number && port.has_flag("ioport")) {
        port.supervision.emplace();
      }
    }
  }
}

void fetch_details(Bus &bus, Ports &ports) {
  Batch batch(ports);
  for (std::size_t i = 0; i < ports.size(); ++i) {
    const auto number = static_cast<guint>(ports[i].number);
    if (ports[i].has_flag("ioport")) {
      iocontrol_state_call_get_names(bus.control(), number, nullptr, on_names, expect(batch, i));
    }
    if (ports[i].supervision) {
      auto *supervised = bus.supervised();
      iosupervised_supervised_call_get_supervised(supervised, number, nullptr, on_supervised,
                                                  expect(batch, i));
      iosupervised_supervised_call_get_supervised_ranges(supervised, number, nullptr, on_ranges,
                                                         expect(batch, i));
      iosupervised_supervised_call_get_supervised_readout(supervised, number, nullptr, on_readout,
                                                          expect(batch, i));
    }
  }
  batch.wait();
}

std::string described(const Port &port) {
  return std::to_string(port.number) + " (" + visible(port.id) + ", \"" + visible(port.name()) +
         "\")";
}

bool is_called(const Port &port, const std::string &word) {
  return port.id == word || (!port.input_name.empty() && port.input_name == word) ||
         (!port.output_name.empty() && port.output_name == word);
}

std::string folded(const std::string &text) {
  const GCharPtr folded(g_utf8_casefold(text.c_str(), -1));
  return folded.get();
}

// Ports whose identifier or name has the word in it, whatever the letter case.
std::string similar(const Ports &ports, const std::string &word) {
  const std::string wanted = folded(word);
  std::string list;
  for (const auto &port : ports) {
    for (const auto *name : {&port.id, &port.input_name, &port.output_name}) {
      if (!wanted.empty() && folded(*name).find(wanted) != std::string::npos) {
        list += "\n  " + described(port);
        break;
      }
    }
  }
  return list;
}

}  // namespace

bool Port::has_flag(std::string_view name) const {
  return std::any_of(flags.begin(), flags.end(),
                     [&](const Flag &flag) { return flag.name == name && flag.set; });
}

const std::string &Port::name() const {
  const std::string &named = input ? input_name : output_name;
  return named.empty() ? id : named;
}

const char *Port::role() const {
  if (configurable) {
    return input ? "configurable input" : "configurable output";
  }
  return input ? "input" : "output";
}

std::string Port::flag_words() const {
  std::string words;
  for (const auto &flag : flags) {
    if (flag.set) {
      words += (words.empty() ? "" : " ") + flag.name;
    }
  }
  return words;
}

std::optional<Ports> try_fetch_ports(Bus &bus, Error &error) {
  Ports ports;
  if (!fetch_properties(bus, ports, error)) {
    return std::nullopt;
  }
  mark_supervisable(bus, ports);
  fetch_details(bus, ports);
  return ports;
}

Ports fetch_ports(Bus &bus) {
  Error error;
  auto ports = try_fetch_ports(bus, error);
  if (!ports) {
    fail_call(error, "");
  }
  return std::move(*ports);
}

void refresh_readout(Bus &bus, Port &port) {
  Ports one = {port};
  Batch batch(one);
  iosupervised_supervised_call_get_supervised_readout(
      bus.supervised(), static_cast<guint>(port.number), nullptr, on_readout, expect(batch, 0));
  batch.wait();
  port = one.front();
}

std::optional<std::uint32_t> parse_number(const std::string &text) {
  std::uint32_t number = 0;
  const char *end = text.data() + text.size();
  const auto [rest, error] = std::from_chars(text.data(), end, number);
  return error == std::errc() && rest == end ? std::optional(number) : std::nullopt;
}

Port &find_port(Ports &ports, const std::string &word) {
  const auto number = parse_number(word);
  std::vector<Port *> found;
  for (auto &port : ports) {
    if (number ? port.number == static_cast<int>(*number) : is_called(port, word)) {
      found.push_back(&port);
    }
  }
  if (found.size() == 1) {
    return *found.front();
  }
  if (!found.empty()) {
    std::string candidates;
    for (const Port *port : found) {
      candidates += "\n  " + described(*port);
    }
    fail(STATUS_NO_PORT, "\"" + visible(word) + "\" fits several ports; give the number or the " +
                             "identifier of one of them:" + candidates);
  }
  const std::string near = similar(ports, word);
  fail(STATUS_NO_PORT, "no port has the number, identifier or name \"" + visible(word) + "\"" +
                           (near.empty() ? ": \"portctl list\" shows those in service"
                                         : "; similar ones are:" + near));
}

std::uint32_t port_number(Bus &bus, const std::string &word) {
  if (const auto number = parse_number(word)) {
    return *number;
  }
  Ports ports = fetch_ports(bus);
  return static_cast<std::uint32_t>(find_port(ports, word).number);
}
