#include <algorithm>
#include <cmath>
#include <memory>
#include <string_view>

#include "platform/host/event-keys.h"

namespace {

EventKey *find_key(Inspectable &inspectable, std::string_view name) {
  const auto found = std::find_if(inspectable.keys.begin(), inspectable.keys.end(),
                                  [name](const EventKey &key) { return key.name == name; });
  return found == inspectable.keys.end() ? nullptr : &*found;
}

EventKey *add_key(Inspectable &inspectable, const gchar *name) {
  EventKey &key = inspectable.keys.emplace_back();
  key.name = name;
  return &key;
}

// The key to work on, made when the declaration is one that takes new ones.
EventKey *key_for(Inspectable *inspectable, const gchar *name) {
  if (!inspectable || !is_name(name)) {
    return nullptr;
  }
  EventKey *key = find_key(*inspectable, name);
  return key || !inspectable->takes_new_keys ? key : add_key(*inspectable, name);
}

EventKey *key_for(EventDeclaration *declaration, const gchar *name) {
  return declaration ? key_for(&declaration->inspectable, name) : nullptr;
}

gboolean set_value(Inspectable *inspectable, const gchar *name, std::optional<EventValue> value) {
  EventKey *key = value ? key_for(inspectable, name) : nullptr;
  if (!key || (key->type != kTypeUnknown && key->type != value->type)) {
    return FALSE;
  }
  key->type = value->type;
  key->value = std::move(value);
  return TRUE;
}

gboolean set_key_text(EventDeclaration *declaration, const gchar *key,
                      std::optional<std::string> EventKey::*member, const gchar *text) {
  EventKey *entry = is_text(text) ? key_for(declaration, key) : nullptr;
  if (!entry) {
    return FALSE;
  }
  entry->*member = text;
  return TRUE;
}

bool is_nice_name(const gchar *name) {
  return !name || is_text(name);
}

std::string text_or_empty(const gchar *text) {
  return text ? text : "";
}

}  // namespace

EventDeclaration *event_declaration_new() {
  auto declaration = std::make_unique<EventDeclaration>();
  declaration->inspectable.takes_names = true;
  return declaration.release();
}

EventDeclaration *event_declaration_new_from_type(const gchar *type) {
  if (!is_name(type)) {
    return nullptr;
  }
  EventDeclaration *declaration = event_declaration_new();
  declaration->type = type;
  declaration->inspectable.takes_new_keys = true;
  return declaration;
}

void event_declaration_free(EventDeclaration *declaration) {
  const std::unique_ptr<EventDeclaration> owned(declaration);
}

Inspectable *event_declaration_get_inspectable(EventDeclaration *declaration) {
  return declaration ? &declaration->inspectable : nullptr;
}

gboolean event_declaration_add_key(EventDeclaration *declaration, const gchar *key, gint type) {
  if (!declaration || !is_name(key) || !is_key_type(type)) {
    return FALSE;
  }
  EventKey *entry = find_key(declaration->inspectable, key);
  if (entry && entry->type != kTypeUnknown) {
    return FALSE;
  }
  (entry ? entry : add_key(declaration->inspectable, key))->type = type;
  return TRUE;
}

gboolean event_declaration_set_nice_names(EventDeclaration *declaration, const gchar *key,
                                          const gchar *key_nice_name,
                                          const gchar *value_nice_name) {
  return inspectable_set_nice_names(event_declaration_get_inspectable(declaration), key,
                                    key_nice_name, value_nice_name);
}

gboolean event_declaration_set_namespace(EventDeclaration *declaration, const gchar *key,
                                         const gchar *name_space) {
  return set_key_text(declaration, key, &EventKey::name_space, name_space);
}

gboolean event_declaration_set_key_tag(EventDeclaration *declaration, const gchar *key,
                                       const gchar *tag) {
  return set_key_text(declaration, key, &EventKey::tag, tag);
}

gboolean event_declaration_set_property(EventDeclaration *declaration, const gchar *key,
                                        EventPropertyCallback callback, gpointer user_data) {
  if (!key_for(declaration, key)) {
    return FALSE;
  }
  declaration->property = key;
  declaration->callback = callback;
  declaration->user_data = user_data;
  return TRUE;
}

gboolean event_declaration_is_property(const EventDeclaration *declaration) {
  return declaration && !declaration->property.empty();
}

gboolean inspectable_set_int(Inspectable *inspectable, const gchar *key, gint32 value) {
  return set_value(inspectable, key, EventValue{.type = EVENT_KEY_INT, .integer = value});
}

gboolean inspectable_set_bool(Inspectable *inspectable, const gchar *key, gboolean value) {
  return set_value(inspectable, key, EventValue{.type = EVENT_KEY_BOOL, .boolean = value != FALSE});
}

gboolean inspectable_set_double(Inspectable *inspectable, const gchar *key, gdouble value) {
  return std::isfinite(value) &&
         set_value(inspectable, key, EventValue{.type = EVENT_KEY_DOUBLE, .real = value});
}

gboolean inspectable_set_string(Inspectable *inspectable, const gchar *key, const gchar *value) {
  return set_value(inspectable, key, value_from_text(EVENT_KEY_STRING, value));
}

gboolean inspectable_set_value_as_string(Inspectable *inspectable, const gchar *key, gint type,
                                         const gchar *value) {
  return set_value(inspectable, key, value_from_text(type, value));
}

gboolean inspectable_set_nice_names(Inspectable *inspectable, const gchar *key,
                                    const gchar *key_nice_name, const gchar *value_nice_name) {
  if (!inspectable || !inspectable->takes_names || !is_nice_name(key_nice_name) ||
      !is_nice_name(value_nice_name)) {
    return FALSE;
  }
  EventKey *entry = key_for(inspectable, key);
  if (!entry) {
    return FALSE;
  }
  entry->nice_names = NiceNames{text_or_empty(key_nice_name), text_or_empty(value_nice_name)};
  return TRUE;
}
