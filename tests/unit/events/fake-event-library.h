// The event library as the tests of the events see it: it writes down what it is told, and fails
// where the test wants it to.
#pragma once

#include <map>
#include <string>
#include <vector>

#include "platform/event.h"

using FakeLines = std::vector<std::string>;

struct FakeDeclaration {
  std::string type;
  std::map<std::string, std::string> keys;        // key -> "TYPE VALUE"
  std::map<std::string, std::string> nice_names;  // key -> "KEY NAME|VALUE NAME"
  std::map<std::string, std::string> namespaces;
  std::map<std::string, std::string> tags;
  std::string property;
  EventPropertyCallback callback = nullptr;
  gpointer user_data = nullptr;
};

struct FakeEventLibrary {
  std::map<guint32, FakeDeclaration> declared;
  FakeLines calls;           // "declare ID", "undeclare ID", "send ID KEY=VALUE ..."
  std::string refused_type;  // no declaration of this type can be made
  std::string refused_key;   // no value and no nice name of this key is taken
  bool refuses_declarations = false;
  bool refuses_property = false;
  bool refuses_events = false;       // none can be prepared
  const char *send_error = nullptr;  // what sending answers
  int producers = 0;                 // that are held

  // The value that the declaration's callback reads for a key, as "TYPE VALUE".
  std::string read(guint32 id, const std::string &key);
  FakeLines take_calls();
  guint32 last_id = 0;
};

FakeEventLibrary &fake_event_library();
