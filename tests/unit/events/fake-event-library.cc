#include "events/fake-event-library.h"

#include <gio/gio.h>

#include <memory>
#include <utility>

struct EventProducer {
  std::string name;
};

struct Inspectable {
  std::map<std::string, std::string> values;
  FakeDeclaration *declaration = nullptr;  // null for the values of an event
};

struct EventDeclaration {
  FakeDeclaration described;
  Inspectable inspectable{{}, &described};
};

struct Event {
  guint32 id;
  Inspectable inspectable;
};

namespace {

EventProducer the_producer;

std::string text_or_empty(const char *text) {
  return text ? text : "";
}

bool set(Inspectable *inspectable, const std::string &key, const std::string &value) {
  if (key == fake_event_library().refused_key) {
    return false;
  }
  auto &values = inspectable->declaration ? inspectable->declaration->keys : inspectable->values;
  values[key] = value;
  return true;
}

const char *type_word(int type) {
  const char *const words[] = {"?", "int", "bool", "double", "string"};
  return words[type];
}

std::string bool_value(bool value) {
  return value ? "bool 1" : "bool 0";
}

}  // namespace

FakeEventLibrary &fake_event_library() {
  static FakeEventLibrary library;
  return library;
}

std::string FakeEventLibrary::read(guint32 id, const std::string &key) {
  const FakeDeclaration &declaration = declared.at(id);
  Inspectable values;
  declaration.callback(&values, declaration.user_data);
  return values.values[key];
}

FakeLines FakeEventLibrary::take_calls() {
  return std::exchange(calls, {});
}

EventProducer *event_producer_new(const gchar *name) {
  the_producer.name = name;
  ++fake_event_library().producers;
  return &the_producer;
}

EventProducer *event_producer_new_full(const gchar *name, guint /*flags*/, guint /*reserved*/) {
  return event_producer_new(name);
}

void event_producer_free(EventProducer * /*producer*/) {
  --fake_event_library().producers;
}

guint32 event_producer_declare(EventProducer * /*producer*/, const EventDeclaration *declaration) {
  auto &library = fake_event_library();
  if (library.refuses_declarations) {
    return 0;
  }
  library.declared[++library.last_id] = declaration->described;
  library.calls.push_back("declare " + std::to_string(library.last_id));
  return library.last_id;
}

gboolean event_producer_undeclare(EventProducer * /*producer*/, guint32 id) {
  fake_event_library().calls.push_back("undeclare " + std::to_string(id));
  return fake_event_library().declared.erase(id) > 0 ? TRUE : FALSE;
}

Event *event_producer_prepare_event(EventProducer * /*producer*/, guint32 id) {
  const auto &library = fake_event_library();
  return library.refuses_events || !library.declared.count(id) ? nullptr : new Event{id, {}};
}

gboolean event_producer_send_event(EventProducer * /*producer*/, const Event *event,
                                   GError **error) {
  auto &library = fake_event_library();
  if (library.send_error) {
    g_set_error_literal(error, G_IO_ERROR, G_IO_ERROR_FAILED, library.send_error);
    return FALSE;
  }
  std::string line = "send " + std::to_string(event->id);
  for (const auto &[key, value] : event->inspectable.values) {
    line.append(" ").append(key).append("=").append(value);
  }
  library.calls.push_back(line);
  return TRUE;
}

EventDeclaration *event_declaration_new() {
  return new EventDeclaration;
}

EventDeclaration *event_declaration_new_from_type(const gchar *type) {
  if (*type == '\0' || fake_event_library().refused_type == type) {
    return nullptr;
  }
  auto declaration = std::make_unique<EventDeclaration>();
  declaration->described.type = type;
  return declaration.release();
}

void event_declaration_free(EventDeclaration *declaration) {
  delete declaration;
}

Inspectable *event_declaration_get_inspectable(EventDeclaration *declaration) {
  return &declaration->inspectable;
}

gboolean event_declaration_add_key(EventDeclaration *declaration, const gchar *key, gint type) {
  declaration->described.keys[key] = type_word(type);
  return TRUE;
}

gboolean event_declaration_set_nice_names(EventDeclaration *declaration, const gchar *key,
                                          const gchar *key_nice_name,
                                          const gchar *value_nice_name) {
  if (fake_event_library().refused_key == key) {
    return FALSE;
  }
  declaration->described.nice_names[key] =
      text_or_empty(key_nice_name) + "|" + text_or_empty(value_nice_name);
  return TRUE;
}

gboolean event_declaration_set_namespace(EventDeclaration *declaration, const gchar *key,
                                         const gchar *name_space) {
  declaration->described.namespaces[key] = name_space;
  return TRUE;
}

gboolean event_declaration_set_key_tag(EventDeclaration *declaration, const gchar *key,
                                       const gchar *tag) {
  declaration->described.tags[key] = tag;
  return TRUE;
}

gboolean event_declaration_set_property(EventDeclaration *declaration, const gchar *key,
                                        EventPropertyCallback callback, gpointer user_data) {
  if (fake_event_library().refuses_property) {
    return FALSE;
  }
  declaration->described.property = key;
  declaration->described.callback = callback;
  declaration->described.user_data = user_data;
  return TRUE;
}

gboolean event_declaration_is_property(const EventDeclaration *declaration) {
  return declaration->described.property.empty() ? FALSE : TRUE;
}

Inspectable *event_get_inspectable(Event *event) {
  return &event->inspectable;
}

void event_free(Event *event) {
  delete event;
}

gboolean inspectable_set_int(Inspectable *inspectable, const gchar *key, gint32 value) {
  return set(inspectable, key, "int " + std::to_string(value)) ? TRUE : FALSE;
}

gboolean inspectable_set_bool(Inspectable *inspectable, const gchar *key, gboolean value) {
  return set(inspectable, key, bool_value(value)) ? TRUE : FALSE;
}

gboolean inspectable_set_double(Inspectable *inspectable, const gchar *key, gdouble value) {
  return set(inspectable, key, "double " + std::to_string(value)) ? TRUE : FALSE;
}

gboolean inspectable_set_string(Inspectable *inspectable, const gchar *key, const gchar *value) {
  return set(inspectable, key, std::string("string ") + value) ? TRUE : FALSE;
}

gboolean inspectable_set_value_as_string(Inspectable *inspectable, const gchar *key, gint type,
                                         const gchar *value) {
  return set(inspectable, key, std::string(type_word(type)) + " " + value) ? TRUE : FALSE;
}

gboolean inspectable_set_nice_names(Inspectable *inspectable, const gchar *key,
                                    const gchar *key_nice_name, const gchar *value_nice_name) {
  if (fake_event_library().refused_key == key) {
    return FALSE;
  }
  inspectable->declaration->nice_names[key] =
      text_or_empty(key_nice_name) + "|" + text_or_empty(value_nice_name);
  return TRUE;
}
