// The commands that only look: list, get, connectors, events, and the words that shells complete.
#include <cstdio>

#include "portctl/describe.h"
#include "portctl/session.h"

namespace {

void print(const Session &session, const Table &table) {
  std::fputs(table.text(session.colours).c_str(), stdout);
}

Table::Row heading(std::initializer_list<const char *> titles) {
  Table::Row row;
  for (const char *title : titles) {
    row.push_back({title, Style::kBold});
  }
  return row;
}

std::string ports_json(const Ports &ports) {
  JsonArray array;
  for (const auto &port : ports) {
    array.add_raw(port_json(port));
  }
  return array.text();
}

// --- Connectors ---

struct Connector {
  const char *kind;  // as the interface describes it
  const Port *port;  // null where the daemon has one that the list of ports lacks
  int state;
};

std::vector<int> connector_states(Session &session, const char *kind) {
  Error error;
  GVariant *states = nullptr;
  if (!pcd_connector_call_get_connector_states_sync(session.bus.connector(), kind, &states, nullptr,
                                                    error.out())) {
    fail_call(error, "connectors");
  }
  const GVariantPtr owned(states);
  std::vector<int> values;
  for (gsize i = 0; i < g_variant_n_children(states); ++i) {
    const GVariantPtr child(g_variant_get_child_value(states, i));
    values.push_back(g_variant_get_int32(child.get()));
  }
  return values;
}

// The interface tells states only; the ports behind them are those with the flag, where that is as
// many. The daemon's order is its own, so a state is taken from the port where both are known.
void add_connectors(Session &session, const Ports &ports, const char *kind, const char *flag,
                    std::vector<Connector> &connectors) {
  std::vector<const Port *> flagged;
  for (const auto &port : ports) {
    const bool other_kind =
        std::string_view(flag) == "audio_connector" && port.has_flag("video_connector");
    if (port.has_flag(flag) && !other_kind) {
      flagged.push_back(&port);
    }
  }
  const auto states = connector_states(session, kind);
  for (std::size_t i = 0; i < states.size(); ++i) {
    const bool known = flagged.size() == states.size();
    connectors.push_back({kind, known ? flagged[i] : nullptr,
                          known ? static_cast<int>(flagged[i]->active) : states[i]});
  }
}

std::string connector_json(const Connector &connector) {
  JsonObject object;
  object.add("kind", connector.kind).add("plugged", connector.state != 0);
  if (connector.port) {
    object.add("number", connector.port->number).add("identifier", connector.port->id);
  }
  return object.text();
}

// --- Events ---

std::string text_of(GVariant *entry, const char *key) {
  const char *text = "";
  g_variant_lookup(entry, key, "&s", &text);
  return text;
}

// "port 3, state false"
std::string keys_in_words(GVariant *entry) {
  const GVariantPtr keys(g_variant_lookup_value(entry, "keys", G_VARIANT_TYPE_VARDICT));
  return keys ? event_keys_text(keys.get(), " ", ", ") : "";
}

std::string topic_of(GVariant *entry) {
  const GVariantPtr keys(g_variant_lookup_value(entry, "keys", G_VARIANT_TYPE_VARDICT));
  std::string topic;
  const char *level = nullptr;
  for (const char *key : {"topic0", "topic1", "topic2", "topic3"}) {
    if (keys && g_variant_lookup(keys.get(), key, "&s", &level)) {
      topic += (topic.empty() ? "" : "/") + std::string(level);
    }
  }
  const std::string type = text_of(entry, "type");
  return type.empty() ? topic : type;
}

GVariantPtr fetch_declarations(Session &session) {
  Error error;
  GVariant *reply = g_dbus_connection_call_sync(
      session.bus.connection(), kControlName, kProducerPath, kProducerInterface, "List", nullptr,
      G_VARIANT_TYPE("(a(ua{sv}))"), G_DBUS_CALL_FLAGS_NONE, -1, nullptr, error.out());
  if (!reply) {
    fail_call(error, "events");
  }
  const GVariantPtr owned(reply);
  return GVariantPtr(g_variant_get_child_value(reply, 0));
}

}  // namespace

int list_command(Session &session) {
  const Ports ports = fetch_ports(session.bus);
  if (session.options.json) {
    std::printf("%s\n", ports_json(ports).c_str());
    return STATUS_OK;
  }
  Table table;
  table.add(heading({"No", "Identifier", "Name", "Role", "State", "Active", "Line", "Flags"}));
  for (const auto &port : ports) {
    table.add({{std::to_string(port.number)},
               {port.id},
               {port.name()},
               {port.role()},
               state_cell(port),
               {port.active_low ? "low" : "high"},
               line_cell(port),
               {port.flag_words()}});
  }
  print(session, table);
  return STATUS_OK;
}

int get_command(Session &session) {
  for (const auto &word : session.words) {
    const std::uint32_t number = port_number(session.bus, word);
    gboolean active = FALSE;
    Error error;
    if (!session.bus.get_state(number, &active, error)) {
      fail_call(error, "port " + word);
    }
    if (session.options.json) {
      std::printf("%s\n",
                  JsonObject().add("number", number).add("active", active != FALSE).text().c_str());
    } else {
      std::puts(active ? "active" : "inactive");
    }
  }
  return STATUS_OK;
}

int connectors_command(Session &session) {
  const Ports ports = fetch_ports(session.bus);
  std::vector<Connector> connectors;
  add_connectors(session, ports, "video connector", "video_connector", connectors);
  add_connectors(session, ports, "audio connector", "audio_connector", connectors);
  if (session.options.json) {
    JsonArray array;
    for (const auto &connector : connectors) {
      array.add_raw(connector_json(connector));
    }
    std::printf("%s\n", array.text().c_str());
    return STATUS_OK;
  }
  Table table;
  table.add(heading({"Kind", "No", "Identifier", "State"}));
  for (const auto &connector : connectors) {
    table.add({{connector.kind},
               {connector.port ? std::to_string(connector.port->number) : "-"},
               {connector.port ? connector.port->id : "-"},
               {connector.state ? "plugged in" : "not plugged in"}});
  }
  print(session, table);
  return STATUS_OK;
}

int events_command(Session &session) {
  const GVariantPtr declarations = fetch_declarations(session);
  JsonArray array;
  Table table;
  table.add(heading({"Id", "Event", "Property", "Keys"}));
  for (gsize i = 0; i < g_variant_n_children(declarations.get()); ++i) {
    guint32 id = 0;
    GVariant *content = nullptr;
    g_variant_get_child(declarations.get(), i, "(u@a{sv})", &id, &content);
    const GVariantPtr entry(content);
    array.add_raw(JsonObject().add("id", id).add_raw("declaration", json_variant(content)).text());
    table.add({{std::to_string(id)},
               {topic_of(content)},
               {text_of(content, "property")},
               {keys_in_words(content)}});
  }
  if (session.options.json) {
    std::printf("%s\n", array.text().c_str());
  } else {
    print(session, table);
  }
  return STATUS_OK;
}

// What a shell offers: commands, or each port's number and identifier. Never an error: a completion
// that complains is in the way.
int words_command(Session &session) {
  if (session.words.front() == "commands") {
    for (const auto &command : commands()) {
      if (*command.summary) {
        std::printf("%s:%s\n", command.name, command.summary);
      }
    }
    return STATUS_OK;
  }
  Error error;
  const auto ports = try_fetch_ports(session.bus, error);
  for (const auto &port : ports.value_or(Ports())) {
    std::printf("%d:%s\n%s:%s\n", port.number, visible(port.name()).c_str(),
                visible(port.id).c_str(), visible(port.name()).c_str());
  }
  return STATUS_OK;
}
