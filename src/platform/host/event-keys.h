// What the event library keeps of a declaration or an event: its keys and their values.
#pragma once

#include <glib.h>

#include <optional>
#include <string>
#include <vector>

#include "platform/event.h"

inline constexpr gint kTypeUnknown = 0;

// A value is what the type says (EVENT_KEY_...); the other members are not looked at. No variant:
// with a sanitizer on, the compiler sees uninitialised strings in its moves.
struct EventValue {
  gint type;
  gint32 integer = 0;
  bool boolean = false;
  double real = 0.0;
  std::string text = {};
};

struct NiceNames {
  std::string key;
  std::string value;
};

struct EventKey {
  std::string name;
  gint type = kTypeUnknown;
  std::optional<EventValue> value;  // unset: never set or sent
  std::optional<std::string> name_space;
  std::optional<std::string> tag;
  std::optional<NiceNames> nice_names;
};

// Few enough to be searched one by one, and kept in the order in which they were added.
using EventKeys = std::vector<EventKey>;

struct Inspectable {
  EventKeys keys;
  bool takes_new_keys = false;
  bool takes_names = false;
};

struct EventDeclaration {
  std::string type;
  std::string property;
  EventPropertyCallback callback = nullptr;
  gpointer user_data = nullptr;
  Inspectable inspectable;
};

// Whether text from outside may be kept and sent on: it is there, and the bus takes only UTF-8.
bool is_text(const gchar *text);
bool is_name(const gchar *text);

bool is_key_type(gint type);
std::optional<EventValue> value_from_text(gint type, const gchar *text);

// The keys alone, for an event or a property callback to fill in.
Inspectable empty_inspectable(const Inspectable &declared);

// Takes over what is set in `values`. False, and nothing is taken over: the two disagree on the
// type of a key. Both hold the same keys in the same order.
bool merge_values(Inspectable &into, const Inspectable &values);

// What the property callback says now; nothing set when there is none. With no lock held.
Inspectable query_property(const EventDeclaration &declaration);
